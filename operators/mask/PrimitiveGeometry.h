#pragma once
// The outlines of the primitive masks (ellipse, rectangle, teapot) as point
// lists, and the small rules they share: the button-to-join and cap maps, the
// write-on range, the invert thresholds and the pixel box of PreProcess.
//
// Mask space: X runs 0..1 over the frame's width, Y 0..aspect over its height,
// aspect = (height x pixel aspect Y) / (width x pixel aspect X), so one unit is
// as long on X as on Y on the display. A Center control is in frame fractions:
// its Y is multiplied by aspect.
//
// Thread safety: pure functions and constant tables.
#include <vector>

#include "host/image/Rect.h"

namespace Orvane::maskgeo {

/// Differences at or below this count as zero (the float epsilon).
constexpr double kTiny = 1.1920928955078125e-7;

struct Pt {
    double x = 0.0, y = 0.0;
};

/// Join and cap kinds of the Shape calls from the stored button index
/// (rounded half up): Bevel 0 -> 0, Round 1 -> 2, Miter 2 -> 1, Miter Clip
/// 3 -> 3; Flat 0 -> 0, Rounded 1 -> 2, Square 2 -> 1; anything else 2.
int JoinOfButton(double stored);
int CapOfButton(double stored);

/// The write-on range along the path: a negative length reaches backward.
struct WriteOn {
    double start = 0.0, end = 1.0;
    bool Whole() const { return start <= 0.0 && end >= 1.0; }
};
WriteOn WriteOnRange(double position, double length);

/// Whether an Invert value is on; the ellipse compares against the float
/// just below 1.
bool InvertOn(double value, bool ellipse = false);

/// Scale by (sx, sy), rotate by `degrees` counter-clockwise, move to (tx, ty).
struct Placement {
    double m[2][2] = {{1.0, 0.0}, {0.0, 1.0}};
    double tx = 0.0, ty = 0.0;
    Placement(double sx, double sy, double degrees, double tx, double ty);
    Pt operator()(Pt p) const { return {m[0][0] * p.x + m[0][1] * p.y + tx, m[1][0] * p.x + m[1][1] * p.y + ty}; }
};

/// The ellipse's border after its lower limit: max(border, -max(2 hw, 2 hh)).
double EllipseBorder(double border, double hw, double hh);
/// The ellipse's points (a closed smooth loop) for half-sizes hw, hh, the
/// limited border b and a frame `width` pixels wide; empty unless hw and hh
/// are positive.
std::vector<Pt> EllipsePoints(double hw, double hh, double b, const Placement &place, int width);

/// The rectangle's closed outline for half-sizes hw, hh, corner radius
/// fraction `corner` and offset o (the border's half, or 0), counter-clockwise
/// from the middle of the right side; corners are arcs of n - 1 inner points.
std::vector<Pt> RectanglePoints(double hw, double hh, double corner, double o, const Placement &place, int width);

/// The teapot's outer contour (102 points) and handle hole (18), in teapot
/// space: X -0.17148..0.15, Y 0..0.1575 (the hole X 0.08373..0.135, Y
/// 0.045..0.101241). Made once from the teapot's Bezier profile curves (body
/// with lid, spout, handle), united and resampled by arc length.
extern const float kTeapotOuter[102][2];
extern const float kTeapotHole[18][2];

/// The pixels a box in mask space can touch: left = floor(minX W), bottom =
/// floor(minY W ax / ay), right = ceil(maxX W), top = ceil(maxY W ax / ay),
/// grown by a pixel on each side of an axis along which the box has width.
ImgRectI PixelBox(Pt lo, Pt hi, int width, double aspectX, double aspectY);

} // namespace Orvane::maskgeo
