#pragma once
// Loader: brings the frames of image files and numbered sequences into a
// flow. The tool holds a list of clips on the global time line; for each
// request it finds the clip under the request's time, maps the time to a
// file frame (trims, holds, loop, reverse, 2:3 cadences), reads it through
// the host's Clip and the file formats, and applies its import options:
// depth, pixel aspect, gamut, alpha, fields and proxy size.
//
// The clip list comes from the document's "Clips" table when it has one
// (several clips one after the other), else from the tool's own inputs.
//
// Thread safety: as Operator. The clip list is rebuilt under its own lock;
// requests read it under a shared lock.
#include <atomic>
#include <memory>
#include <optional>
#include <set>
#include <shared_mutex>
#include <vector>

#include "host/flow/Operator.h"
#include "host/media/Clip.h"
#include "operators/media/ClipTiming.h"

namespace Orvane {

class GamutInputs;
class Image;

class Loader : public ThreadedOperator {
public:
    Loader(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Loader() override;

    enum MissingFrameMode { MissingFail = 0, MissingHoldPrevious = 1, MissingOutputColor = 2, MissingWait = 3 };

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;
    std::string GetTitle() const override;

    /// Frames of the current clip with trims and holds; 1 without a clip.
    double GetClipLength() const;

    /// One clip of the list: the file (and its proxy), its place in time.
    struct ClipEntry {
        std::string name; ///< the file name as the document gives it
        Ref<Clip> clip, alt;
        ClipPlacement place;
    };
    /// The clips as the last request saw them.
    std::vector<ClipEntry> ClipList() const;

private:
    struct Settings;
    Settings ReadSettings(Request *req) const;
    void UpdateClipList(Request *req, const Settings &s);
    std::optional<ClipEntry> ClipAt(double t) const;
    Ref<Image> FetchFrame(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s, bool headerOnly,
                          bool report);
    Ref<Image> FetchWithMissingRule(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s);
    Ref<Image> FetchPulled(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s);
    Ref<Image> MissingFrameColor(Request *req, const ClipEntry &entry, int64_t frame, const Settings &s);
    Ref<Image> ApplyAlphaOptions(Request *req, Ref<Image> image, const Settings &s);
    Ref<Image> FitFieldAndProxy(Request *req, Ref<Image> image, const Settings &s);
    void AddFormatInputs(const std::string &fileName);
    void FillFromFile(const std::string &fileName);

    Input *inClip_, *inProxyClip_, *inGlobalIn_, *inGlobalOut_, *inTrimIn_, *inTrimOut_;
    Input *inHoldFirst_, *inHoldLast_, *inReverse_, *inLoop_, *inMissing_, *inColor_[4];
    Input *inProcessMode_, *inDepth_, *inPixelAspect_, *inCustomAspect_, *inImportMode_, *inPullType_;
    Input *inFirstFrame_, *inLocalCache_, *inSolidAlpha_, *inInvertAlpha_, *inPostMultiply_, *inSwapFields_;
    Output *outImage_;
    std::unique_ptr<GamutInputs> gamut_;

    mutable std::shared_mutex listLock_;
    std::vector<ClipEntry> clips_;
    ScriptVal clipsSource_;                ///< the table the list was built from
    std::set<std::string> formatGroups_;   ///< format option groups added so far
    bool filling_ = false;                 ///< NotifyChanged is filling inputs itself
    std::atomic<bool> cacheWarned_{false}; ///< the missing local cache was reported
};

} // namespace Orvane
