#pragma once
// Letterbox: a frame fitted into a frame of another size and pixel aspect.
//
// With the output W x H at pixel aspect (ax, ay) (proxy-divided; a field
// halves H and doubles ay) and the source SW x SH at (sax, say):
//   Letterbox / Envelope (Mode 0): the picture spans the width; its height
//     is sh = SH x say x (W x ax / ay) / (SW x sax). Shorter than H it sits
//     in the middle between bars; taller, Center Y pans it, within the
//     excess only.
//   Pan-and-Scan (Mode 1): the picture spans the height; its width is
//     sw = SW x sax x (H x ay / ax) / (SH x say), and Center X pans it.
// The host resamples by (sw / SW, sh / SH), offset by ((W - sw) / 2 + ox,
// (H - sh) / 2 + oy); the axis the picture spans repeats its border pixels
// and the other falls to the canvas colour.
//
// Clipping Mode Frame reads the source within its frame only and gives the
// output a clear canvas; a source whose canvas is not clear is first made
// real over its frame (a copy with a clear canvas), so that what lies
// beyond the picture is clear. The output's pixel aspect is (ax, ay).
//
// CheckRequest asks the input for the output region taken back through the
// same mapping and widened by the filter's reach.
//
// Thread safety: as every tool: Process and CheckRequest on the render
// thread, one request at a time; NotifyChanged on the main thread.
#include "host/flow/Operator.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

class Letterbox : public ThreadedOperator {
public:
    Letterbox(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Letterbox() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void OnDelete() override;

    /// The placement of the source in the output.
    struct Geometry {
        int width = 1, height = 1;           ///< output size (proxy and field applied)
        int fullWidth = 1, fullHeight = 1;   ///< output size at full resolution, whole frame
        double aspectX = 1.0, aspectY = 1.0; ///< output pixel aspect (of the frame: not doubled for a field)
        double sw = 0.0, sh = 0.0;           ///< the picture's size in output pixels
        double ox = 0.0, oy = 0.0;           ///< pan within the excess
        double xScale = 0.0, yScale = 0.0;   ///< output pixels per source pixel
        double xOffset = 0.0, yOffset = 0.0; ///< where the source's origin lands
        int xEdges = 0, yEdges = 0;
        bool Valid() const { return xScale > 0.0 && yScale > 0.0; }
    };
    /// The geometry for a source of w x h pixels at pixel aspect (sx, sy),
    /// a field when `field`.
    Geometry Place(const Request *req, int w, int h, double sx, double sy, bool field) const;

private:
    void FollowFrameFormat();

    Input *width_, *height_, *useFrameFormat_, *aspect_, *legacyAspectX_, *legacyAspectY_, *center_, *mode_, *hiQOnly_;
    FilterInputs filter_;
    Input *clipping_;
    Input *input_;
    Output *output_;
    ResizeTables tables_;
};

} // namespace Orvane
