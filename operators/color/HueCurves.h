#pragma once
// HueCurves: changes colours by their hue, through three periodic spline
// curves over the input hue (0..1 a turn: 0 red, 1/3 green, 2/3 blue; the
// curve's points wrap around, host/color/SplineCurve.h):
//  - Hue: a shift added to the hue, in turns (flat at 0: no change);
//  - Saturation: a gain on the HLS saturation (flat at 1; below 0 counts as 0);
//  - Luminance: a gain on the HLS lightness, weighted by the pixel's
//    saturation (clamped to 0..1): L' = L (1 + (gain - 1) S). Greys have no
//    hue and stay as they are, and colours near grey change little, so the
//    result has no seam where a colour fades to grey.
// Each pixel goes to HLS (in double), its hue reads the three curves, and the
// result goes back to RGB; alpha passes. Values are changed as stored
// (premultiplied).
//
// Each request samples the three curves at 65536 hues into periodic tables
// (CurveTable), read between samples along straight lines. The canvas colour
// goes through the same function. With all three curves at their flat
// defaults the input is handed on. A curve with no points, two points at one
// hue, or a point outside 0 <= hue < 1 fails the tool.
//
// Thread safety: Process reads its inputs and fills its tables (on the
// workers); chunks only read the tables.
#include "operators/color/ColorCurves.h"

namespace Orvane {

class HueCurves : public CurveTool {
public:
    HueCurves(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;
};

} // namespace Orvane
