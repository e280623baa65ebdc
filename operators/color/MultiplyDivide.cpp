#include "operators/color/MultiplyDivide.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_AlphaDivide("AlphaDivide");
static const OvID CLSID_AlphaMultiply("AlphaMultiply");

static ClassRegistration<MultiplyDivide, ThreadedOperator>
    s_AlphaDivide(CLSID_AlphaDivide, &CLSID_ThreadedOperator,
                  {{RegTypeFlags, RegKindOperator | RegKindTool},
                   {RegClassName, "MultiplyDivide"},
                   {RegPath, "Tools/Matte/AlphaDivide"},
                   {RegName, "Alpha Divide"},
                   {RegCategory, "Matte"},
                   {RegAbbreviation, "ADv"},
                   {RegHelp, "Divides the color channels by alpha"},
                   {RegIcon, "Icons.Tools.Icons.MultiplyDivide"},
                   {RegNoMotionBlurControls, 1},
                   {RegSupportsRoI, 1},
                   {RegSupportsDoD, 1},
                   {RegSupportsGPUImages, 1}});

static ClassRegistration<MultiplyDivide, ThreadedOperator>
    s_AlphaMultiply(CLSID_AlphaMultiply, &CLSID_ThreadedOperator,
                    {{RegTypeFlags, RegKindOperator | RegKindTool},
                     {RegClassName, "MultiplyDivide"},
                     {RegPath, "Tools/Matte/AlphaMultiply"},
                     {RegName, "Alpha Multiply"},
                     {RegCategory, "Matte"},
                     {RegAbbreviation, "AMl"},
                     {RegHelp, "Multiplies the color channels by alpha"},
                     {RegIcon, "Icons.Tools.Icons.MultiplyDivide"},
                     {RegNoMotionBlurControls, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1},
                     {RegSupportsGPUImages, 1}});

MultiplyDivide::MultiplyDivide(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), divide_(ClassID() == CLSID_AlphaDivide) {
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void MultiplyDivide::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src || src->IsMask()) { // a mask has no colour: hand it on
        req->SetOutputData(output_, src);
        return;
    }
    auto multiply = [](auto *p) {
        for (int c = 0; c < 3; ++c) p[c] *= p[3];
    };
    auto divide = [](auto *p) {
        for (int c = 0; c < 3; ++c) p[c] = p[3] == 0 ? 0 : p[c] / p[3];
    };
    Ref<Image> dst =
        divide_ ? RunPointColor(*this, req, input_, src, divide) : RunPointColor(*this, req, input_, src, multiply);
    if (!dst) FailOutOfMemory(req);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
