#pragma once
// ShapeTreeRenderer: draws a ShapeTree into a premultiplied RGBA image.
//
// Nodes are drawn in tree order (a node's own shape, then its children): its
// fill (non-zero rule) in the fill colour, then its line (the stroke of the
// shape with the style's width, join, cap and miter limit) in the line
// colour, each alpha times the opacity, composited "over" what is drawn
// already. Coverage is the exact area of the shape in each pixel (the
// scan converter of ShapeRasterizer.h, with its mapping of shape units to
// pixels, so one unit is the image width).
//
// Combining (off by default): consecutive nodes whose styles CanCombine may
// be drawn as one shape: the union of their fills, then the union of their
// lines, one pass each. Where such nodes overlap, a translucent colour is
// then laid once rather than twice, and the line of an earlier node is not
// hidden by the fill of a later one. Off, every node is drawn by itself, so
// that the picture of a node never depends on whether its neighbours happen
// to share its style; it is also the faster way for shapes spread over the
// frame (docs/SHAPE_RENDER.md has the measurements).
//
// Work: the shapes are flattened and stroked once (nodes in parallel); the
// image is then drawn in bands of rows on the worker pool, each band visiting
// only the pixels each drawing covers. The bands are fixed rows of the image
// and edges are cut only there and at the frame's sides, so the bits depend
// neither on the number of workers nor on the data window.
//
// Thread safety: Render may run from any number of threads at once, each into
// its own image; the tree is only read.
#include "host/core/Export.h"

namespace Orvane {

class Image;
class Request;
class ShapeTree;

class ORVANE_API ShapeTreeRenderer {
public:
    /// Draw consecutive nodes of combinable styles as one, or each by itself (the default).
    void SetCombine(bool combine) { combine_ = combine; }
    bool Combine() const { return combine_; }

    /// Draws `tree` over transparent black into `image`'s data window (an
    /// RGBA image of any depth). `req` (may be null) gives the render whose
    /// abort stops the work. False on abort, a mask image, or when memory ran
    /// out (the rows are then partly drawn). An image without pixels
    /// (pre-calculation) succeeds at once.
    bool Render(Request *req, const ShapeTree &tree, Image *image) const;

private:
    bool combine_ = false;
};

} // namespace Orvane
