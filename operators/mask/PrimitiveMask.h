#pragma once
// PrimitiveMask: what the ellipse, rectangle, triangle and teapot masks share.
// A tool builds its Shape for a request (BuildShape); this base works out the
// pixels it can touch in PreProcess, rasterises it in Process and sets the
// canvas value (1 when inverted). The mask frame (MaskOperator) finishes.
//
// Thread safety: as MaskOperator.
#include <vector>

#include "host/flow/DataTypes.h"
#include "host/flow/MaskOperator.h"
#include "host/shape/Shape.h"
#include "host/shape/ShapeRasterizer.h"
#include "operators/mask/PrimitiveGeometry.h"

namespace Orvane {

class PrimitiveMask : public MaskOperator {
public:
    PrimitiveMask(const Registry *reg, const ScriptVal &args, const TagList &tags);

    void PreProcess(Request *req) override;
    void Process(Request *req) override;

protected:
    /// The mask's pixel frame for a request, in mask space terms.
    struct Space {
        int width = 0;       ///< W, the mask's width in pixels
        double aspect = 1.0; ///< Y runs 0..aspect over the height
        double aspectX = 1.0, aspectY = 1.0;
        double tolerance = 0; ///< curve flattening: 2 / W
    };
    Space SpaceOf(Request *req) const;

    /// A built shape and the points PreProcess bounds when the shape itself
    /// is not needed: `points` extended by `halfBorder` on each side.
    struct Outline {
        Ref<Shape> shape;
        std::vector<maskgeo::Pt> points;
        double halfBorder = 0.0;
        bool boxFromShape = false; ///< the box comes from the shape's own points
    };
    /// The tool's shape at the request's time; `forBox`: only the box is
    /// wanted (the shape may be left out unless boxFromShape).
    virtual Outline BuildShape(Request *req, const Space &s, bool forBox) const = 0;
    virtual bool InvertOf(Request *req) const;

    /// The border and solid handling of the ellipse, triangle and teapot: a
    /// solid shape grows by half the border, a hollow one becomes the stroke
    /// of the border's width with the write-on range. Fills `out`.
    void Finish(Request *req, const Space &s, Ref<Shape> base, double border, int join, bool withMiterLimit,
                bool forBox, Outline &out) const;
    /// The Shape tags of a request: join, cap, write-on, tolerance, miter limit.
    TagList ShapeTags(Request *req, const Space &s, int join, bool withMiterLimit, bool writeOn) const;
    maskgeo::WriteOn WriteOnOf(Request *req) const;

    /// The Center, Width and Height inputs of the ellipse, rectangle and
    /// teapot (`ellipse`: hard minimum 0 and scale to 2), then Angle.
    void AddCenterAndSize(bool ellipse);
    void AddAngle();
    /// The placement of the shape: rotation by Angle about the origin, then
    /// the move to Center (its Y times aspect), after scaling by (sx, sy).
    maskgeo::Placement PlacementOf(Request *req, const Space &s, double sx, double sy) const;
    double HalfWidth(Request *req) const;
    double HalfHeight(Request *req) const;

    Input *center_ = nullptr, *width_ = nullptr, *height_ = nullptr, *angle_ = nullptr;
    ShapeRasterizerInputs raster_{this};
};

/// Appends `points` to `shape` as a closed polygon.
void AddPolygon(Shape &shape, const std::vector<maskgeo::Pt> &points);

} // namespace Orvane
