#pragma once
// DifferenceKey: keys by the difference between two images, the Background
// (the main input, whose colour the output keeps) and the Foreground. The
// largest absolute difference of red, green and blue, D, gives alpha 0 at
// D <= Low, 1 at D >= High and a straight ramp between. Beyond an image's
// data window its canvas colour counts; without a Foreground the Background
// is compared with its own canvas colour, so an empty frame keys to 0. Two
// integer images are compared in 16-bit steps, any other pair in float. The
// refining chain follows, without spill and fringe.
//
// Thread safety: as SimpleKeyer.
#include "operators/key/SimpleKeyer.h"

namespace Orvane {

class DifferenceKey : public SimpleKeyer {
public:
    DifferenceKey(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    /// The first matte in 16-bit steps (both images integer) and in float;
    /// `fg` (may be null) covers `dst`'s data window, at any depth.
    bool DoDiffKey(Request *req, const Image *src, const Image *fg, Image *dst);
    bool DoDiffKeyFlt(Request *req, const Image *src, const Image *fg, Image *dst);

protected:
    bool ReadKey(Request *req, KeyerMatte::Values &v) override;
    bool FirstMatte(Request *req, const Image *src, Image *dst) override;

private:
    bool RunDevice(Request *req, const Image *src, const Image *fg, Image *dst) const;
    template <class Px> void RunRows(const Image *src, const Image *fg, Image *dst);

    double low_ = 0.0, high_ = 0.02;
    Image *foreground_ = nullptr; ///< this request's, null when unconnected
    Input *lowIn_, *highIn_, *foregroundIn_;
};

} // namespace Orvane
