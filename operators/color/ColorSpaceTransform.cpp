#include "operators/color/ColorSpaceTransform.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ColorSpaceTransform("ColorSpaceTransform");
static ClassRegistration<ColorSpaceTransform, ThreadedOperator>
    s_Registration(CLSID_ColorSpaceTransform, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/ColorSpaceTransform"},
                    {RegName, "Color Space Transform"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "CST"},
                    {RegHelp, "Converts images between color spaces and transfer functions"},
                    {RegIcon, "Icons.Tools.Icons.ColorSpaceTransform"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

ColorSpaceTransform::ColorSpaceTransform(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ColorProcessorTool(reg, args, tags) {
    from_ = AddInputTagList(
        "Input Color Space", "FromSpace",
        {{LinkDataType, CLSID_DataType_Text}, {InputControl, CLSID_InputControl_TextEdit}, {InputDefaultText, "sRGB"}});
    to_ = AddInputTagList("Output Color Space", "ToSpace",
                          {{LinkDataType, CLSID_DataType_Text},
                           {InputControl, CLSID_InputControl_TextEdit},
                           {InputDefaultText, "scene_linear"}});
    AddImageLinks();
}

ColorProcessorPtr ColorSpaceTransform::ProcessorFor(Request *req, bool *, std::string *error) {
    auto textOf = [req](const Input *in) {
        const auto *t = dynamic_cast<const Text *>(req->GetInputData(in));
        return t ? t->value : std::string();
    };
    const std::string from = textOf(from_), to = textOf(to_);
    const std::string configPath = ColorConfig::PathFor(GetDoc());
    return Kept(
        configPath + '\n' + from + '\n' + to,
        [&](std::string *err) -> ColorProcessorPtr {
            const auto config = ColorConfig::Load(configPath, err);
            return config ? config->SpaceProcessor(from, to, err) : nullptr;
        },
        error);
}

} // namespace Orvane
