#pragma once
// XYPath: a modifier that drives a point from two animated numbers, X and Y,
// placed by Size, Angle and Center:
//   dx = (x - 0.5) * size, dy = (y - 0.5) * size * r
//   X = dx cos a - dy sin a + cx, Y = (dy cos a + dx sin a) / r + cy
// with angle and size narrowed to float first and r the path's aspect (X
// units per Y unit, kept in the document as the tool's field `r`, 1 when
// absent). The rotation is worked in square units, the centre added after.
//
// Heading is the direction of travel in degrees: the slope of each curve over
// up to half a frame either side of t (kept within the keys of the X and Y
// curves), atan2(slope y * r, slope x), plus Angle and HeadingOffset. The
// slopes are differences of the curves' values, fetched through the inputs
// at those times; a path that does not move heads at Angle + HeadingOffset.
//
// Z is an input kept with the path; the point output has two components, so
// Z goes nowhere yet.
//
// Thread safety: as ThreadedOperator; Process keeps nothing between requests.
#include "host/flow/Operator.h"

namespace Orvane {

class XYPath : public ThreadedOperator {
public:
    XYPath(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

    /// The path's aspect `r` (1 when the document gives none, or none usable).
    double Aspect() const;
    /// Sets `r`, kept in the document, and drops the document's cached results; main thread, between renders.
    void SetAspect(double r);

private:
    Input *x_, *y_, *z_, *center_, *size_, *angle_, *headingOffset_;
    Output *value_, *heading_;
};

} // namespace Orvane
