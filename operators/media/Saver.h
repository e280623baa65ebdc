#pragma once
// Saver: writes the image at its input to a file or numbered sequence while
// a render runs, and passes the same image on at its output.
//
// File names (docs/OUTPUT.md): the frame at time t goes to the file numbered
// trunc(t) + Frame Offset; with Saver-relative Numbering the render's first
// frame (or the document's global start) counts as 0. A marker in the name
// ("####", "%04d", "$F4") or the name's own number gives the place and the
// padding ("shot.0000.exr" writes shot.0012.exr); a name with neither gets
// a number when the render has several frames (host/media/Sequence.h).
//
// Format: the Output Format follows the file's extension, unless it was set
// to a format other than the extension's; then that format writes.
//
// Writing goes through the host's Clip: only over a regular file, to a
// temporary name, renamed when complete, so a failed or interrupted frame
// never leaves a damaged file and never replaces a good one. Each file
// written is noted on the render task. A render's start removes the
// temporaries killed renders of the same output left.
//
// Frame Saved Script: Lua text run after each frame written (never after a
// failed write), in the trusted environment of a state the tool keeps, with
// the globals time, basetime, req and OrvaneScriptReq (the request, a
// "Request *"), OrvaneScriptReqFlags, frame (the file's number) and
// filename (the file written). Its failures, and what it passes to _ALERT,
// become console lines under the tool's name. Raw scripts run only when the
// user allowed them (host/script/ScriptPermission.h); otherwise the frame is
// still written and the render gets one line saying the script was not run.
//
// Thread safety: as Operator; one request at a time per tool.
#include <memory>
#include <mutex>
#include <set>
#include <string>

#include "host/flow/Operator.h"
#include "host/media/Clip.h"

namespace Orvane {

class GamutInputs;
class Image;
class ScriptState;

class Saver : public ThreadedOperator {
public:
    Saver(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Saver() override;

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;
    void OnStartRender() override;
    void OnEndRender() override;
    std::string GetTitle() const override;

    std::string FrameFileName(double time, const RenderTask *task) const override;
    std::string FrameFilePattern(double time, const RenderTask *task) const override;

private:
    int64_t FileNumber(double time, double renderStart) const;
    /// The files the render of `task` writes at `time` (none without a file name).
    SequenceName OutputName(double time, const RenderTask *task) const;
    /// The format that writes files named like `clip`'s (null for none).
    OvID ExtensionFormat(const Parameter *clip) const;
    bool SavesThisRequest(Request *req, const Image &image) const;
    bool SaveFrame(Request *req, Ref<Image> image);
    /// The gamut conversion and legal range; null when memory ran out, or
    /// with `error` set when the colour space cannot be found.
    Ref<Image> GamutAndLegal(Request *req, Ref<Image> image, std::string *error);
    void AddFormatInputs(OvID format);
    /// Runs the Frame Saved Script for the file `filename`, number `frame`, just written.
    void RunFrameScript(Request *req, int64_t frame, const std::string &filename);

    Input *inClip_, *inCreateDir_, *inCreateDirNow_, *inOutputFormat_, *inSaveFrames_, *inRelative_, *inOffset_;
    Input *inProcessMode_, *inExportMode_, *inPullType_, *inFirstFrame_, *inClipping_, *inAlphaToColor_;
    Input *inSound_, *inSoundOffset_;
    Input *inVideoType_, *inAction_, *inAdjust_, *inSoftClip_;
    Input *inFrameScript_;
    Input *inInput_;
    Output *outImage_;
    std::unique_ptr<GamutInputs> gamut_;
    std::set<OvID> formatGroups_;
    bool filling_ = false;
    /// The Output Format was set to one other than the file extension names.
    bool formatChosen_ = false;
    bool firstFrame_ = true, audioWarned_ = false;
    /// The state frame scripts run in, made at the first one.
    std::unique_ptr<ScriptState> script_;
    std::mutex scriptLock_;
    /// The render was told once that the frame script may not run.
    bool scriptRefused_ = false;
};

} // namespace Orvane
