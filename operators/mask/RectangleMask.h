#pragma once
// RectangleMask: a rectangle (Width and Height as fractions of the frame's
// width) with rounded corners by Corner Radius, turned by Angle about Center.
// Its outline starts at the middle of the right side and runs counter-
// clockwise, which is the way write-on follows.
#include "operators/mask/PrimitiveMask.h"

namespace Orvane {

class RectangleMask : public PrimitiveMask {
public:
    RectangleMask(const Registry *reg, const ScriptVal &args, const TagList &tags);

protected:
    Outline BuildShape(Request *req, const Space &s, bool forBox) const override;

private:
    Input *cornerRadius_;
};

} // namespace Orvane
