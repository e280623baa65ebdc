#pragma once
// LumaKeyer: keys by one channel of the image: blue, green, red, alpha,
// luminance, saturation, hue or depth (the image's Z channel, 0 where it has
// none). The key value v gives alpha 0 at v <= Low, 1 at v >= High and a
// straight ramp between (KeyFunctions.h); the refining chain follows,
// without spill and fringe.
//
// Thread safety: as SimpleKeyer.
#include "operators/key/SimpleKeyer.h"

namespace Orvane {

class LumaKeyer : public SimpleKeyer {
public:
    LumaKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    /// The first matte: `src`'s colour, the channel's key in alpha (device,
    /// except for depth, or rows).
    bool DoLumaKeyKROM(Request *req, const Image *src, Image *dst);

protected:
    bool ReadKey(Request *req, KeyerMatte::Values &v) override;
    bool FirstMatte(Request *req, const Image *src, Image *dst) override { return DoLumaKeyKROM(req, src, dst); }

private:
    bool RunDevice(Request *req, const Image *src, Image *dst) const;
    bool RunRows(const Image *src, Image *dst);

    int channel_ = 4;
    double low_ = 0.0, high_ = 1.0;
    Input *channelIn_, *highIn_, *lowIn_;
};

} // namespace Orvane
