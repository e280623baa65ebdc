#pragma once
// BrightnessContrast: gain, lift, gamma, contrast, brightness, saturation and a
// low/high remap over the chosen channels. The chain can also run backwards,
// so that a second instance with the same settings undoes the first.
//
// A frame takes one of three ways:
//  * nothing to do (neutral settings, or no channel chosen): the input image
//    itself is handed on;
//  * the chain is linear (no gamma, no pre-divide, and no clip on float): it is
//    folded into one colour matrix and left to the host's ApplyMatrixTagList;
//  * otherwise rows (PointRows.h), one chunk per output row, with the canvas
//    colour carried through the same pixel function; when the render has a device, the
//    kernels "BrightnessContrast" / "BrightnessContrastReverse" of the common
//    library do the same first, and the rows run only if they fail.
//
// Thread safety: Process writes the members below before any chunk starts;
// chunks only read them and write rows of their own.
#include <cstdint>

#include "host/color/GammaTable.h"
#include "host/flow/Operator.h"
#include "host/image/ColorMatrix.h"

namespace Orvane {

class Image;

class BrightnessContrast : public ThreadedOperator {
public:
    BrightnessContrast(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~BrightnessContrast() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;

    /// The values one request works with, derived from the inputs.
    struct Values {
        bool reverse = false;
        bool chans[4] = {true, true, true, false};
        bool doGain = false, doGamma = false, doSat = false, doBright = false, doContrast = false;
        bool useLowHigh = false, clipBlack = false, clipWhite = false, prePost = false;
        float sat = 1.f, _sat = 0.f;
        float contrast = 1.f, range = 1.f, inverseRange = 1.f;
        float gain = 1.f, gamma = 1.f, finalContrast = 1.f, finalScale = 1.f;
        float lift = 0.f, bright = 0.f, low = 0.f, high = 1.f;
        /// Red, green and blue rows of the saturation matrix as the rows apply
        /// it: forward the matrix itself, reverse its inverse.
        float satRows[3][3] = {{1.f, 0.f, 0.f}, {0.f, 1.f, 0.f}, {0.f, 0.f, 1.f}};
        double satRowsD[3][3] = {{1.0, 0.0, 0.0}, {0.0, 1.0, 0.0}, {0.0, 0.0, 1.0}}; ///< the same, for 16-bit
        // The 16-bit forms: lift, low, high and brightness times 65535, the
        // contrast times 16384, all cut to whole numbers.
        int64_t liftI = 0, lowI = 0, highI = 0xffff, brightI = 0, contrastI = 0x4000;
        bool useLowHighI = false;
        /// The gamma curve when it is read from a table (integer depths, or
        /// float without fast powers).
        const GammaTable *table = nullptr;
        int depth = 0; ///< depth of the pixels the rows read and write
    };

    /// Runs the pixel function over `count` stored pixels (src and dst may be
    /// the same memory).
    using SpanFunction = void (*)(const Values &v, const uint8_t *src, uint8_t *dst, int count);

private:
    void ReadValues(Request *req);
    ColorMatrixFull ChainMatrix() const;
    bool RunDevice(Request *req, const Image *src, Image *dst);

    Input *red_, *green_, *blue_, *alpha_;
    Input *gain_, *lift_, *gamma_, *contrast_, *brightness_, *saturation_;
    Input *low_, *high_, *direction_, *clipBlack_, *clipWhite_, *prePost_;
    Input *input_;
    Output *output_;

    // ---- per request, written by Process, read by the chunks ----
    Values v_;
    ColorMatrixFull satMat_; ///< forward saturation matrix (reverse: inverted)
    GammaTable gammaTable_;
    double tableFltExponent_ = -1.0, tableIntExponent_ = -1.0; ///< what the table holds; -1 nothing
};

} // namespace Orvane
