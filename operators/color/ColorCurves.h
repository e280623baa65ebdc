#pragma once
// ColorCurves: reshapes red, green, blue and alpha with editable spline curves
// (host/color/SplineCurve.h), one per channel, plus a luminance curve that
// acts on red, green and blue alike before each channel's own curve:
//     R' = Red(Luminance(R)),  G' = Green(Luminance(G)),  B' = Blue(Luminance(B)),  A' = Alpha(A).
// Values are curved as stored (premultiplied).
//
// Each request samples the composed curve of every channel that changes into
// a table at each 16-bit code (CurveTable): integer images read their codes
// from it, float images read between its samples along straight lines and,
// beyond 0..1, go on straight with the composed curve's slope at 0 or 1. The
// canvas colour goes through the same tables. With every curve the identity
// the input is handed on. A curve with no points, or with two points at one x,
// fails the tool.
//
// Thread safety: Process reads its inputs and fills its tables (on the
// workers); chunks only read the tables.
#include <vector>

#include "host/color/SplineCurve.h"
#include "host/flow/Operator.h"
#include "host/image/Image.h"

namespace Orvane {

class Request;

/// What the curve tools share: curve inputs on the spline control, the image
/// input and output, and the start and end of Process.
class CurveTool : public ThreadedOperator {
protected:
    using ThreadedOperator::ThreadedOperator;
    /// Adds a curve input (after the ones before it in curves_), with `extra` tags.
    void AddCurveInput(const char *id, std::initializer_list<TagItem> extra = {});
    /// Adds the image input and output; after the curves.
    void AddImageLinks();
    /// The input image of this request, with its curves (read open or
    /// periodic) in `curves`; null, with the output set to null, when there
    /// is none or a curve cannot be read (after the console line naming it).
    Image *Begin(Request *req, bool periodic, std::vector<Ref<SplineCurve>> &curves);
    /// Hands `dst` over; null after the out-of-memory line.
    void Finish(Request *req, const Ref<Image> &dst);
    /// Calls sample(i) for every sample of a CurveTable, on the workers.
    void ForEachSample(const std::function<void(int)> &sample);

    std::vector<Input *> curves_;
    Input *input_ = nullptr;
    Output *output_ = nullptr;
};

class ColorCurves : public CurveTool {
public:
    ColorCurves(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;
};

} // namespace Orvane
