#pragma once
// BetterResize (shown as Resize): the frame resampled to a new pixel size.
//
// A frame:
//  1. Width and Height, rounded; with Use Frame Format Settings on, the
//     document's frame format instead. The source's full-resolution size and
//     pixel aspect come from its attributes (SizingCommon.h).
//  2. Keep Frame Aspect (with the frame format off): the height becomes the
//     one that keeps the source's frame aspect at the target pixel aspect
//     (Pixel Aspect when Change Pixel Aspect is on, else the source's), and
//     the Height control is written with it.
//  3. At a proxy scale p the size is divided by p; a field gets half the
//     height; never below 1.
//  4. The output's data window is the source's (in a pre-calculation, or
//     with the common Clipping Mode Domain, the input's domain) scaled by
//     the size ratios, endless sides kept; with Clipping Mode Frame it is the
//     new frame. Then it is cut to the region of interest.
//  5. The host resamples (Image::ResizeTagList) with the chosen filter and
//     window; a quick request with Only Use Filter in HiQ takes nearest
//     neighbour when the application allows quick filters. The coefficient
//     tables are kept from frame to frame while the source and output
//     frames and windows, the filter and the window stay the same.
//  6. The format attributes follow the new size; Change Pixel Aspect sets
//     the output's pixel aspect.
// CheckRequest asks the input for the output region taken back to source
// pixels and widened by the filter's reach.
//
// The controls follow one another on the main thread (NotifyChanged): with
// Keep Frame Aspect a new width gives the height and a new height the width,
// once a render has shown the source's format; Reset Size takes the source's
// size; with Use Frame Format Settings the size and pixel aspect follow the
// document's frame format.
//
// Thread safety: Process and CheckRequest run on the render thread (one
// request at a time); the source's format they note is shared with
// NotifyChanged under a lock.
#include <mutex>

#include "host/flow/Operator.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

class BetterResize : public ThreadedOperator {
public:
    BetterResize(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~BetterResize() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void OnDelete() override;

private:
    /// The target pixel aspect at `time`: Pixel Aspect with Change Pixel
    /// Aspect on, else the source's.
    std::pair<double, double> TargetAspect(const SourceFormat &src, double time) const;
    /// Keep Frame Aspect: Height from Width (or Width from Height).
    void KeepHeightFor(double width, double time);
    void KeepWidthFor(double height, double time);
    /// Width, Height and Pixel Aspect take the document's frame format.
    void FollowFrameFormat();
    SourceFormat Source() const;

    Input *width_, *height_, *useFrameFormat_, *resetSize_, *keepAspect_, *hiQOnly_;
    AspectInputs aspect_;
    FilterInputs filter_;
    Input *input_;
    Output *output_;

    ResizeTables tables_;
    // The source's format as the last render saw it, and the sizes the
    // controls were last given (so that the tool's own writes do not echo).
    mutable std::mutex stateLock_;
    SourceFormat source_;
    double knownWidth_ = -1.0, knownHeight_ = -1.0;
};

} // namespace Orvane
