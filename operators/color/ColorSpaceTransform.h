#pragma once
// ColorSpaceTransform: converts images from one colour space of the
// document's colour configuration to another (host/color/ColorConfig.h says
// which configuration that is). Spaces are named by their names, roles
// ("scene_linear") or aliases ("srgb"). A configuration that cannot be read
// or a space it does not have: the tool's console line naming it, and a
// null output.
//
// Thread safety: as ColorProcessorTool.
#include "operators/color/ColorProcessorTool.h"

namespace Orvane {

class ColorSpaceTransform : public ColorProcessorTool {
public:
    ColorSpaceTransform(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

protected:
    ColorProcessorPtr ProcessorFor(Request *req, bool *passThrough, std::string *error) override;

private:
    Input *from_, *to_;
};

} // namespace Orvane
