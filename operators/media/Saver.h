#pragma once
// Saver: writes the image at its input to a file or numbered sequence while
// a render runs, and passes the same image on at its output.
//
// File numbers: the frame at time t goes to the file numbered
// trunc(t) + Frame Offset; with Saver-relative Numbering the render's first
// frame (or the document's global start) counts as 0. The file name's own
// number gives only the padding ("shot.0000.exr" writes shot.0012.exr).
//
// Writing goes through the host's Clip: to a temporary name, renamed when
// complete, so a failed or interrupted frame never leaves a damaged file and
// never replaces a good one.
//
// Thread safety: as Operator; one request at a time per tool.
#include <memory>
#include <set>
#include <string>

#include "host/flow/Operator.h"
#include "host/media/Clip.h"

namespace Orvane {

class GamutInputs;
class Image;

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
    /// The file the last successful save wrote.
    std::string LastWritten() const;

private:
    int64_t FileNumber(double time, double renderStart) const;
    bool SavesThisRequest(Request *req, const Image &image) const;
    bool SaveFrame(Request *req, Ref<Image> image);
    Ref<Image> GamutAndLegal(Request *req, Ref<Image> image);
    void AddFormatInputs(OvID format);

    Input *inClip_, *inCreateDir_, *inCreateDirNow_, *inOutputFormat_, *inSaveFrames_, *inRelative_, *inOffset_;
    Input *inProcessMode_, *inExportMode_, *inPullType_, *inFirstFrame_, *inClipping_, *inAlphaToColor_;
    Input *inSound_, *inSoundOffset_;
    Input *inVideoType_, *inAction_, *inAdjust_, *inSoftClip_;
    Input *inInput_;
    Output *outImage_;
    std::unique_ptr<GamutInputs> gamut_;
    std::set<OvID> formatGroups_;
    bool filling_ = false;
    bool firstFrame_ = true, audioWarned_ = false;
    mutable std::mutex lastLock_;
    std::string lastWritten_;
};

} // namespace Orvane
