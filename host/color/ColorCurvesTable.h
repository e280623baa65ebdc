#pragma once
// ColorCurvesTable: the range curves of the Color Corrector. Two editable
// curves over luminance give the weight of the shadows and of the highlights;
// the midtones take what is left, so the three weights always sum to 1.
//
// A curve is a list of points (luminance, weight), joined by straight lines or,
// when the curve is smooth, by an S-shaped step (3t^2 - 2t^3) between each pair
// of points. Before its first point a curve keeps the first weight, after its
// last the last one. Weights are clamped to 0..1; where shadows and highlights
// together exceed 1 they are scaled down to sum to 1 and the midtones get 0.
//
// Presets: "Simple" (straight falloffs: shadows from 1 at 0 to 0 at 0.5,
// highlights from 0 at 0.5 to 1 at 1) and "Smooth" (the same points joined
// smoothly). A new table is the Simple preset.
//
// Document form:
//   ColorCurves { Shadows = { Smooth = false, Points = { { 0, 1 }, { 0.5, 0 } } },
//                 Highlights = { Smooth = false, Points = { { 0.5, 0 }, { 1, 1 } } } }
//
// Thread safety: as for every Parameter, immutable once published; GetRanges
// is const and safe from any number of threads.
#include <vector>

#include "host/color/SplineCurve.h"
#include "host/flow/Parameter.h"
#include "host/image/Pixel.h"

namespace Orvane {

struct RangeCurve {
    using Point = CurvePoint;
    std::vector<Point> points; ///< sorted by x
    bool smooth = false;
    bool operator==(const RangeCurve &) const = default;

    /// The curve's weight at luminance x, clamped to 0..1; 0 for no points.
    double Evaluate(double x) const;
};

class ORVANE_API ColorCurvesTable : public Parameter {
public:
    enum class Preset { Simple, Smooth };
    /// Weights are looked up in tables of this many samples over 0..1.
    static constexpr int kSamples = 1024;

    ColorCurvesTable() : ColorCurvesTable(Preset::Simple) {}
    explicit ColorCurvesTable(Preset preset);
    ColorCurvesTable(RangeCurve shadows, RangeCurve highlights);

    const RangeCurve &Shadows() const { return shadows_; }
    const RangeCurve &Highlights() const { return highlights_; }

    /// The weights of the three ranges for a pixel, from its luminance
    /// 0.299 R + 0.587 G + 0.114 B (clamped to 0..1, nearest sample).
    void GetRanges(const FltPixel &pixel, float &shadows, float &midtones, float &highlights) const {
        WeightsAt(0.299f * pixel.R + 0.587f * pixel.G + 0.114f * pixel.B, shadows, midtones, highlights);
    }
    void WeightsAt(float luminance, float &shadows, float &midtones, float &highlights) const {
        const float x = luminance > 0.f ? (luminance < 1.f ? luminance : 1.f) : 0.f; // NaN reads as 0
        const int i = static_cast<int>(x * (kSamples - 1) + 0.5f);
        shadows = table_[i][0], midtones = table_[i][1], highlights = table_[i][2];
    }

    /// Sample i (0..kSamples-1, at luminance i / (kSamples - 1)): shadows,
    /// midtones, highlights; for device copies of the table.
    const float *Sample(int i) const { return table_[i]; }

    OvID DataType() const override;
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override { return sizeof(*this); }

    /// Reads the document form (typed ColorCurves or a plain table); null for
    /// anything malformed: a missing curve, a point that is not two finite
    /// numbers, a curve without points.
    static Ref<ColorCurvesTable> FromScript(const ScriptVal &value);

private:
    void Build();
    RangeCurve shadows_, highlights_;
    float table_[kSamples][3]; ///< shadows, midtones, highlights per sample
};

} // namespace Orvane
