#pragma once
// sRender: turns a shape tree into an image. A generator with the frame
// controls (size, pixel aspect, depth); its one input takes the tree, drawn
// by ShapeTreeRenderer over transparent black at the request's proxy scale.
// No tree gives a transparent frame. A field render draws the frame's rows
// of that field (rows 2y + dominance, counted from the bottom).
//
// The tree is asked for with a region whose frame is the frame rendered, so
// the shape tools upstream flatten their curves for that resolution.
//
// Thread safety: as SourceOperator; the drawing spreads over the worker pool.
#include "host/flow/SourceOperator.h"
#include "host/image/Image.h"
#include "host/image/Rect.h"
#include "host/shape/ShapeTreeRenderer.h"

namespace Orvane {

class sRender : public SourceOperator {
public:
    sRender(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

private:
    /// The frame a request renders (proxy applied), in pixels.
    ImgRectI FrameOf(Request *req) const;

    /// An output image of `size` (the frame's, or a field's) over `window`.
    Ref<Image> NewOutput(Request *req, const SourceFrame &f, const ImgRectI &size, const ImgRectI &window) const;

    Input *input_;
    Output *output_;
    ShapeTreeRenderer renderer_;
};

} // namespace Orvane
