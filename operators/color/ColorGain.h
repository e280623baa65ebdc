#pragma once
// ColorGain: gain, lift, gamma and saturation, each as a master value (red,
// green, blue) and per channel (alpha too), applied to the whole image and then once more, weighted, to its
// shadows, midtones and highlights (docs/COLOR_GAIN.md has the formulas).
//
// A frame takes one of three ways:
//  * nothing to do (every setting neutral): the input image itself is handed on;
//  * the settings are linear (no gamma, no tonal range in use): gain, lift and
//    saturation fold into one colour matrix, run by the host (RunGainMatrix);
//  * otherwise rows (PointRows.h), one chunk per output row. Float pixels take
//    the steps in float with true powers (FastPow.h); 8 and 16-bit RGBA pixels
//    read the per-channel gain, lift and gamma from tables worked out in double
//    for every stored value, and take saturation and the ranges in float.
//    When the render has a device, the tool's own kernel "ColorGain" does the
//    float steps there first (powers by the device's powf), and the rows run
//    only if it fails.
// The canvas colour goes through the same function as the pixels.
//
// RunGainMatrix is the matrix way shared by the gain tools (WhiteBalance and
// AutoGain are linear throughout).
//
// Thread safety: Process writes the members below before any chunk starts;
// chunks only read them and write rows of their own.
#include <cstdint>
#include <vector>

#include "host/flow/Operator.h"
#include "host/image/ColorMatrix.h"

namespace Orvane {

class Image;

/// The output of a linear colour tool for `src`: like the input over the
/// window the clipping mode gives, `matrix` applied by the host (on the
/// render's device when it has one), the canvas colour through the matrix
/// (kept as the input's under Domain or Frame clipping). Null when out of
/// memory.
Ref<Image> RunGainMatrix(ThreadedOperator &op, Request *req, const Input *in, const Image *src,
                         const ColorMatrixFull &matrix);

class ColorGain : public ThreadedOperator {
public:
    ColorGain(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~ColorGain() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

    /// One set of the four steps: x * gain + lift, then the signed power, then
    /// saturation about the Rec. 709 luminance (red, green, blue only).
    struct Step {
        float gain[4] = {1.f, 1.f, 1.f, 1.f}, lift[4] = {0.f, 0.f, 0.f, 0.f};
        float exponent[4] = {1.f, 1.f, 1.f, 1.f}, sat[3] = {1.f, 1.f, 1.f};
        bool power[4] = {false, false, false, false};
        bool doPower = false, doSat = false, neutral = true;
    };

    /// Everything one request works with.
    struct Values {
        Step overall;
        Step range[3]; ///< shadows, midtones, highlights
        bool doRanges = false;
        float shadowsEnd = 0.5f, highlightsStart = 0.5f;
        int depth = 0;
        /// 8 and 16-bit RGBA: the overall gain, lift and power of every stored
        /// value, per channel; null otherwise.
        const float *table[4] = {nullptr, nullptr, nullptr, nullptr};
    };

    /// The tonal weights of the range step at luminance y.
    static void RangeWeights(const Values &v, float y, float w[3]);

private:
    bool ReadValues(Request *req);
    ColorMatrixFull LinearMatrix() const;
    void BuildTables();
    bool RunDevice(Request *req, const Image *src, Image *dst) const;

    static constexpr int kSteps = 4, kChannels = 5; ///< overall + three ranges; R, G, B, A, master
    Input *gain_[kSteps][kChannels], *lift_[kSteps][kChannels], *gamma_[kSteps][kChannels];
    Input *sat_[kSteps][4]; ///< R, G, B, master
    Input *shadowsEnd_, *highlightsStart_;
    Input *input_;
    Output *output_;

    // ---- per request, written by Process, read by the chunks ----
    Values v_;
    std::vector<float> tables_[4];
    Step tableStep_;     ///< what the tables hold
    int tableDepth_ = 0; ///< 0: nothing built
};

} // namespace Orvane
