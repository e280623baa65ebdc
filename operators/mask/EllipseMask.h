#pragma once
// EllipseMask: an ellipse (Width and Height are its diameters, as fractions
// of the frame's width), turned by Angle about Center; a border grows or
// shrinks a solid one, or is the ring drawn around a hollow one.
#include "operators/mask/PrimitiveMask.h"

namespace Orvane {

class EllipseMask : public PrimitiveMask {
public:
    EllipseMask(const Registry *reg, const ScriptVal &args, const TagList &tags);

protected:
    Outline BuildShape(Request *req, const Space &s, bool forBox) const override;
    bool InvertOf(Request *req) const override;
};

} // namespace Orvane
