#pragma once
// KeyerMatte: the matte refining chain the keyers share. A keyer makes its
// first matte (the key in alpha, the source colour in red, green and blue)
// and hands the image to the chain, whose stages run in this order, each
// skipped when it would change nothing (a value within 2^-23 of neutral):
//
//   1. Blur      the alpha blurred by Filter at MatteBlur (control units:
//                pixels at a frame 720 wide): Gaussian and Fast Gaussian by
//                MatteCore_DoSoftenChannel with 4 passes; Box, Bartlett and
//                Multi-box by MatteCore_DoMultiBox with 1, 2 or Num Passes
//   2. Levels    DoLevels / DoLevelsFlt on alpha: threshold low..high,
//                contract/expand (or contrast), gamma max(gamma, 1e-5)
//   3. Spill     MatteCore_DoSpill on the key channel (screen keyers only)
//   4. Fringe    the alpha, blurred at FringeSize (Gaussian, 2 passes) into a
//                work matte and put through FringeGamma, weighs the fringe
//                colour: MatteCore_DoFringe(Flt) with max(shape, 1e-5) and the
//                three colour shifts halved (screen keyers only)
//   5. Invert    MatteCore_DoInvert
//   6. Masks     the solid matte (DoGarbageMatte, solid mode), then the
//                garbage matte (garbage mode); each may widen the image
//   7. Post-multiply  MatteCore_DoPostMultiply
//   8. Canvas    the source's canvas colour
//
// The inputs come in two groups that a keyer adds where its panel wants them:
// the Image page (spill and fringe) and the Matte page (blur, levels, invert,
// masks, post-multiply). Two flavours differ in IDs and labels only:
//   Screen  (colour keyers)  MatteContractExpand "Contract / Expand", the
//           threshold pair LowMatteThreshold / High, RestoreFringe,
//           InvertMatte "Invert Matte"
//   Simple  (luma and difference keyers)  MatteContrast "Contrast",
//           Invert "Invert"; no threshold pair
//
// Every stage works in place on an image of the tool's own (or returns the
// image it made) and returns false (null) when abandoned or refused memory;
// the caller fails the request then.
//
// Thread safety: inputs are added in the tool's constructor; Read, the stages
// and CheckRequest run on the render thread of the tool's request, the stages
// spreading rows over the worker pool.
#include <memory>

#include "host/core/Object.h"

namespace Orvane {

class Image;
struct ImageDomain;
class Input;
class MaskInputs;
class Operator;
class Parameter;
class Request;

/// Below this a size or a difference from neutral does nothing.
constexpr double kKeyerNoChange = 1.1920928955078125e-7;

class KeyerMatte {
public:
    enum class Flavour { Screen, Simple };

    /// The chain's values at one request, as the controls give them.
    struct Values {
        // Matte page
        int filter = 5;        ///< BlurTypes of Filter (5: Fast Gaussian)
        double blur = 0.0;     ///< MatteBlur, control units
        int passes = 4;        ///< Num Passes, rounded
        double contrast = 0.0; ///< contract/expand (or contrast), -1..1
        double gamma = 1.0;    ///< MatteGamma
        double low = 0.0;      ///< threshold (screen keyers)
        double high = 1.0;     ///< threshold (screen keyers)
        bool invert = false;   ///< InvertMatte / Invert
        bool postMultiply = false;
        // Image page (screen keyers)
        int keyChannel = 1;       ///< spill channel: 0 blue, 1 green, 2 red
        double spill = 0.0;       ///< SpillSuppression
        int spillMethod = 0;      ///< SpillMethods: SpillMethod's index - 1, 0 for "None"
        double fringeGamma = 1.0; ///< FringeGamma
        double fringeSize = 0.0;  ///< FringeSize, control units
        double fringeShape = 1.0; ///< FringeShape
        double redCyan = 0.0, greenMagenta = 0.0, blueYellow = 0.0;
    };

    KeyerMatte(Operator &op, Flavour flavour);
    ~KeyerMatte();
    KeyerMatte(const KeyerMatte &) = delete;
    KeyerMatte &operator=(const KeyerMatte &) = delete;

    // ---- declaring (the tool's constructor, on the page it has made current) ----
    /// SpillColor (with `spillColor`), SpillSuppression, SpillMethod,
    /// FringeGamma, FringeSize, FringeShape, RedCyan, GreenMagenta, BlueYellow.
    void AddImageInputs(bool spillColor);
    /// Filter, MatteBlur, Passes, ClippingMode, the levels inputs of the
    /// flavour, RestoreFringe (screen), the invert switch, the solid and
    /// garbage mattes and PostMultiplyImage.
    void AddMatteInputs();
    /// Shows Num Passes for Multi-box; the tool calls it from its
    /// NotifyChanged.
    void NotifyChanged(Input *in, Parameter *param);

    // ---- reading ----
    /// The values at `req` (inputs not added keep their defaults).
    Values Read(Request *req) const;
    /// The connected solid / garbage mask, null when none; `inverted` gets
    /// its Invert switch.
    Image *SolidMask(Request *req, bool *inverted) const;
    Image *GarbageMask(Request *req, bool *inverted) const;

    /// Pixels the chain reaches beyond a pixel on each axis, for an image of
    /// `domain`'s frame: the matte blur's support plus the fringe blur's, and
    /// `extraSize` (control units, a Gaussian soften of the tool's own) if
    /// given.
    static void Reach(const Values &v, const ImageDomain *domain, double extraSize, int &rx, int &ry);
    /// The box passes of the matte blur's box kinds: 1 for Box, 2 for
    /// Bartlett, Num Passes for the others.
    static int MultiBoxPasses(const Values &v);
    /// CheckRequest: widens the request's region on `image` by the reach,
    /// within the frame or domain the clipping mode allows. Runs at the
    /// image's priority level, before the controls are fetched, so it asks
    /// the inputs itself.
    void CheckRequest(Request *req, Input *image, double extraSize = 0.0) const;
    /// The first matte's image for `src`: like it, over the window the
    /// clipping mode gives, cut to the request's region grown by the reach,
    /// so the blurs see past the region; valid over the region. Null when out
    /// of memory.
    Ref<Image> NewMatteImage(Request *req, const Input *in, const Image *src, const Values &v,
                             double extraSize = 0.0) const;

    // ---- stages (false / null: abandoned or out of memory) ----
    static bool BlurMatte(Request *req, Image *img, const Values &v);
    static bool Levels(Request *req, Image *img, const Values &v);
    /// Levels on one channel with the given values, skipped at neutral.
    static bool LevelsOn(Request *req, Image *img, int channel, double low, double high, double contrast, double gamma);
    static bool Spill(Request *req, Image *img, const Values &v);
    static bool Fringe(Request *req, Image *img, const Values &v);
    static bool Invert(Request *req, Image *img, const Values &v);
    /// The solid matte, then the garbage matte.
    Ref<Image> ApplyMasks(Request *req, Image *img) const;
    static bool PostMultiply(Request *req, Image *img, const Values &v);

    /// The whole chain on `img` (the first matte of `src`): stages 1 to 8,
    /// spill and fringe only for the screen flavour. Returns the result (img
    /// or the widened image), null on failure.
    Ref<Image> Refine(Request *req, Image *img, const Image *src, const Values &v) const;

    Input *FilterInput() const { return filter_; }
    Input *PassesInput() const { return passes_; }

private:
    Operator &op_;
    Flavour flavour_;
    Input *spillColor_ = nullptr, *spill_ = nullptr, *spillMethod_ = nullptr, *fringeGamma_ = nullptr,
          *fringeSize_ = nullptr, *fringeShape_ = nullptr, *shift_[3] = {nullptr, nullptr, nullptr};
    Input *filter_ = nullptr, *blur_ = nullptr, *passes_ = nullptr, *clipping_ = nullptr, *contrast_ = nullptr,
          *gamma_ = nullptr, *low_ = nullptr, *high_ = nullptr, *restoreFringe_ = nullptr, *invert_ = nullptr,
          *postMultiply_ = nullptr;
    std::unique_ptr<MaskInputs> solid_, garbage_;
};

} // namespace Orvane
