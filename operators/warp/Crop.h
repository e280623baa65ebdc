#pragma once
// Crop: a rectangle of the frame, as a frame of its own.
//
// The controls are in full-resolution pixels of the whole frame (the frame
// may be a proxy, or one field: rx = full width / image width and ry = full
// height / image height). Offsets (x, y) and size (w, h) are truncated;
// Keep Aspect makes h = truncate(w / (full width / full height) + 1/2) and
// Keep Centered x = floor((full width - w) / 2 + 1/2), y likewise, and both
// write what they change back into the controls (not in a write-protected
// document). The output is max(1, round(w / rx)) x max(1, round(h / ry))
// pixels; its pixel (i, j) is the source's (i + ox, j + oy) with
// ox = floor(x / rx + 1/2), oy = floor(y / ry + 1/2). Its data window is the
// source's moved by (-ox, -oy), cut to the new frame with Clipping Mode
// Frame. A render task that asks for pass-through gets the input itself.
//
// Auto Crop: the next render after the button scans the image for the box
// of pixels that differ from the border colour, and the offsets and size
// take that box. The border colour is the one that most of eight border
// samples (the corners and the middles of the edges) match, the earlier
// sample on a tie; a pixel differs when one of the chosen channels (Red,
// Green, Blue, Alpha) differs by more than 1e-6 (integer images: any
// difference). An image with no such pixel changes nothing.
//
// CheckRequest asks the input for the output region moved by (ox, oy) (the
// whole input while an auto crop is pending).
//
// Thread safety: Process and CheckRequest run on the render thread (one
// request at a time); NotifyChanged on the main thread. The pending auto
// crop and the source's format they share are guarded (an atomic, a lock).
#include <atomic>
#include <mutex>

#include "host/flow/Operator.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

class Crop : public ThreadedOperator {
public:
    Crop(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Crop() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

    /// The cut, from the source's format and the controls.
    struct Geometry {
        int x = 0, y = 0, w = 1, h = 1; ///< offsets and size, full-resolution pixels
        int iw = 1, ih = 1;             ///< output size, pixels
        int ox = 0, oy = 0;             ///< where the output's origin lies in the source, pixels
        bool heightKept = false;        ///< Keep Aspect changed h
        bool centred = false;           ///< Keep Centered changed x or y
    };
    struct Controls {
        double x = 0, y = 0, w = 1, h = 1;
        bool keepAspect = false, keepCentered = false;
    };
    static Geometry Place(const SourceFormat &src, const Controls &c);

    /// The box of pixels that differ from the border colour, in the image's
    /// pixels (half open); false when there is none. `channels`: red,
    /// green, blue, alpha.
    static bool FindContentBox(const Image &img, const bool channels[4], ImgRectI &box);

private:
    Controls ReadControls(const Request *req) const;
    SourceFormat SourceFor(const ImageDomain &domain, const Request *req) const;

    Input *xOffset_, *yOffset_, *xSize_, *ySize_, *resetSize_, *resetOffset_, *keepAspect_, *keepCentered_;
    AspectInputs aspect_;
    Input *input_;
    Output *output_;
    Input *clipping_;
    Input *channels_[4];
    Input *autoCrop_;

    std::atomic<bool> autoCropPending_{false};
    mutable std::mutex stateLock_;
    SourceFormat source_; ///< the source's format as the last render saw it
};

} // namespace Orvane
