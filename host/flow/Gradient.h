#pragma once
// Gradient: a list of colour stops, the value gradient inputs carry to the
// generators and colour tools that sample it.
//
// Stops hold straight (unpremultiplied) RGBA as the user picked it, at a
// position along the gradient; they are kept sorted by position, and stops
// sharing a position keep the order they were given in (a hard edge: the
// later one wins from that position on). Sampling returns straight colour
// too; a caller that writes premultiplied pixels multiplies by alpha itself.
//
// Document form:
//   Gradient { Colors = { [0] = { 0, 0, 0, 1 }, [1] = { 1, 1, 1, 1 } } }
// Each key is a position, each value { r, g, b, a }. Stops that share a
// position are written as one key holding a list of colours in order:
//   [0.5] = { { 1, 0, 0, 1 }, { 0, 0, 1, 1 } }
//
// Thread safety: as for every Parameter, immutable once published; set the
// stops before handing it over. QuickEvaluate is const and safe from many
// threads at once.
#include <vector>

#include "host/flow/Parameter.h"

namespace Orvane {

struct GradientStop {
    double position = 0.0;
    float r = 0.0f, g = 0.0f, b = 0.0f, a = 1.0f; ///< straight colour
};

class ORVANE_API Gradient : public Parameter {
public:
    /// Black (0, 0, 0, 1) at 0 to white (1, 1, 1, 1) at 1.
    Gradient();
    explicit Gradient(std::vector<GradientStop> stops);

    /// Replaces the stops. Sorts them by position (stable, so equal positions
    /// keep their order) and drops stops whose position is not finite. An
    /// empty list is allowed and samples as transparent black.
    void SetStops(std::vector<GradientStop> stops);
    const std::vector<GradientStop> &Stops() const { return stops_; }

    /// Samples the gradient at `position`, returning straight RGBA.
    /// Positions before the first stop give the first stop, positions at or
    /// past the last give the last, and NaN gives the first. Between two stops
    /// the colour is blended linearly in `colorSpace` (a ColorSpaceType value:
    /// RGB, HLS, HSV or LAB; anything else blends in RGB) and converted back
    /// to RGB; alpha always blends linearly. In HLS and HSV the hue takes the
    /// shorter way round the circle (a half turn goes towards increasing hue),
    /// and a stop with no saturation (a grey) takes the hue of the other stop
    /// so that fading to grey does not sweep through other hues.
    /// Exactly at a stop the stop's own colour comes back unchanged.
    /// No allocation: a binary search and, outside RGB, one conversion.
    void QuickEvaluate(double position, float &r, float &g, float &b, float &a, int colorSpace) const;

    /// True when every stop has alpha >= 1 (false for an empty gradient).
    bool IsOpaque() const;

    OvID DataType() const override;
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    /// With the same stop positions on both sides, blends each stop's colour
    /// and alpha linearly; otherwise the nearer of the two.
    Ref<Parameter> Interpolate(const Parameter &other, double t) const override;
    size_t SizeOf() const override;

    /// Reads the document form (typed `Gradient { ... }` or a plain table with
    /// a Colors entry; other entries are ignored). A colour of three numbers
    /// gets alpha 1. Returns null for anything malformed: no Colors table, a
    /// key that is not a finite number, a colour that is not 3 or 4 numbers.
    static Ref<Gradient> FromScript(const ScriptVal &value);

private:
    // Each stop's colour in the blending spaces, worked out once when the
    // stops are set so that sampling converts only the result back.
    struct SpaceForms {
        float hls[3], hsv[3], lab[3];
    };
    std::vector<GradientStop> stops_;
    std::vector<SpaceForms> forms_;
};

} // namespace Orvane
