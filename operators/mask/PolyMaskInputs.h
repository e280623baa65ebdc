#pragma once
// PolyMaskInputs: the controls of one polygon mask and its drawing. A Polygon
// or BSpline mask tool has one (with its tool's own mask controls and three
// rotations); each layer of a MultiPoly has one with its own full set of mask
// controls under the layer's group and one rotation, Angle.
//
// The shape of a polyline, in mask space (X 0..1 over the width, Y 0..aspect):
//   1. nothing when Size <= 0 or the line has no points;
//   2. every point and handle (handles added to their points first) is scaled
//      by (Size, aspect x Size), turned about Z, then X, then Y (the three
//      rotations, or Angle about Z), the depth dropped, and moved to Center;
//   3. a Bezier line walks its segments: a straight one is a line, any other
//      a cubic from the point's right handle to the next point's left one; a
//      B-spline line is flattened as one (rational where weights differ);
//   4. closed when the line is closed with at least 2 points; tolerance 2 /
//      (W x Size) from here on (W the mask's width in pixels);
//   5. an open or hollow (Solid off) line is the stroke of BorderWidth with
//      the join, cap, write-on range and miter limit; a closed solid one
//      grows by half of BorderWidth (the border straddles the edge), or is
//      flattened as it stands;
//   6. filled even-odd ("Alternate") or non-zero ("Non-zero Winding").
//
// The double polyline: with an outer line (Polyline2, shown once it holds a
// point or is linked) that is not the inner line and not both single points,
// the band between the two falls from 1 on the inner curve to 0 on the outer
// one (docs/MASK_BAND.md). A CardinalSplinePolyline arriving on either input
// is drawn as its Bezier copy.
//
// Thread safety: inputs are added and notified on the main thread; PixelBox
// and Render run on the owner's render thread (their rows on the workers).
#include <memory>

#include "host/flow/MaskOperator.h"
#include "host/flow/SubInputs.h"
#include "host/shape/ShapeRasterizer.h"

namespace Orvane {

class PolyLine;
class Shape;

class PolyMaskInputs : public SubInputs {
public:
    struct Options {
        bool bspline = false;        ///< the Polyline inputs hold BSplinePolyline
        bool threeRotations = false; ///< XRotation, YRotation, ZRotation and TrackerSearchSize (else Angle)
        /// The owner's mask controls; null: add a full set of the layer's own first.
        const MaskControls *controls = nullptr;
    };
    /// Adds the inputs to `owner` under `group` ("" for the plain IDs).
    PolyMaskInputs(MaskOperator *owner, std::string group, const Options &options);

    /// Shows the outer line once it holds a point or is linked. Call from the
    /// owner's NotifyChanged.
    void NotifyChanged(Input *in, Parameter *param);

    /// The mask's pixels the drawing can touch at full write-on, outer line
    /// included; empty when nothing is drawn.
    ImgRectI PixelBox(Request *req, const MaskFormat &format) const;
    /// Fills `mask`'s data window (already cleared) and sets its canvas (1
    /// when inverted). False on abort or when memory ran out.
    bool Render(Request *req, Image *mask, const MaskFormat &format) const;

    const MaskControls &Controls() const { return *controls_; }
    Input *InPolyline() const { return polyline_; }
    Input *InPolyline2() const { return polyline2_; }

private:
    struct Frame; // the transform of a request
    Frame FrameOf(Request *req, const MaskFormat &format) const;
    /// The line on `in`, a cardinal spline as its Bezier copy; null without points.
    Ref<PolyLine> LineOf(Request *req, Input *in) const;
    /// Steps 1 to 4: the line's path in mask space.
    Ref<Shape> PathOf(const PolyLine &line, const Frame &f) const;
    /// Steps 5 and 6 on the inner line; `wholeWriteOn` for the box.
    Ref<Shape> ShapeOf(Request *req, const PolyLine &line, const Frame &f, bool wholeWriteOn) const;
    /// Adds the band between the two lines to `mask`; false on abort.
    bool DrawBand(Request *req, const PolyLine &inner, const PolyLine &outer, const Frame &f, Image *mask, bool invert,
                  bool closedSolid) const;
    /// The outer line when the band is drawn, else null.
    Ref<PolyLine> BandOuter(Request *req, const PolyLine *inner) const;

    MaskOperator *owner_;
    std::unique_ptr<MaskControls> ownControls_;
    const MaskControls *controls_;
    Input *center_ = nullptr, *size_ = nullptr, *rotation_[3] = {nullptr, nullptr, nullptr}, *fillMethod_ = nullptr,
          *trackerSearchSize_ = nullptr, *polyline_ = nullptr, *polyline2_ = nullptr;
    ShapeRasterizerInputs raster_;
};

} // namespace Orvane
