#pragma once
// TriangleMask: the triangle of three points given in frame fractions.
#include "operators/mask/PrimitiveMask.h"

namespace Orvane {

class TriangleMask : public PrimitiveMask {
public:
    TriangleMask(const Registry *reg, const ScriptVal &args, const TagList &tags);

protected:
    Outline BuildShape(Request *req, const Space &s, bool forBox) const override;

private:
    Input *points_[3];
};

} // namespace Orvane
