#pragma once
// TeapotMask: the silhouette of the classic teapot, with the hole of its
// handle, scaled by Width and Height and turned by Angle about Center.
#include "operators/mask/PrimitiveMask.h"

namespace Orvane {

class TeapotMask : public PrimitiveMask {
public:
    TeapotMask(const Registry *reg, const ScriptVal &args, const TagList &tags);

protected:
    Outline BuildShape(Request *req, const Space &s, bool forBox) const override;
};

} // namespace Orvane
