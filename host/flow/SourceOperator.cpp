#include "host/flow/SourceOperator.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"

namespace Orvane {
SourceOperator::SourceOperator(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {}

void SourceOperator::FinishConstruction() {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    const bool range = RegAttrB(RegSourceRangeControls), size = RegAttrB(RegSourceSizeControls);
    const bool aspect = RegAttrB(RegSourceAspectControls), depth = RegAttrB(RegSourceDepthControls);
    if (range || size || aspect || depth) {
        // PageIcon is a pointer-typed tag: the icon name travels as a plain pointer to static text.
        const int page =
            AddControlPageTagList("Image", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Image")}});
        if (range) {
            inGlobalIn_ = AddInputTagList("Global In", "GlobalIn",
                                          {{LinkDataType, CLSID_DataType_Number},
                                           {InputControl, CLSID_InputControl_Range},
                                           {ControlPage, page},
                                           {InputInteger, 1},
                                           {ControlGroup, 30},
                                           {ControlMember, 0},
                                           {ControlShowsTime, 1},
                                           {InputDefault, GetDoc() ? GetDoc()->GlobalStart() : 0.0}});
            inGlobalOut_ = AddInputTagList("Global Out", "GlobalOut",
                                           {{LinkDataType, CLSID_DataType_Number},
                                            {InputControl, CLSID_InputControl_Range},
                                            {ControlPage, page},
                                            {InputInteger, 1},
                                            {ControlGroup, 30},
                                            {ControlMember, 1},
                                            {ControlShowsTime, 1},
                                            {InputDefault, GetDoc() ? GetDoc()->GlobalEnd() : 100.0}});
        }
        if (size) {
            for (int axis = 0; axis < 2; ++axis)
                (axis ? inHeight_ : inWidth_) =
                    AddInputTagList(axis ? "Height" : "Width", axis ? "Height" : "Width",
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_Slider},
                                     {ControlPage, page},
                                     {InputInteger, 1},
                                     {InputMinAllowed, 1.0},
                                     {InputMaxAllowed, 32768.0},
                                     {InputSliderLow, 1.0},
                                     {InputSliderHigh, 4096.0},
                                     {InputDefault, static_cast<double>(axis ? ff.height : ff.width)},
                                     {InputDelayDefault, 1},
                                     {LinkForceSave, 1}});
        }
        if (aspect)
            inAspect_ = AddInputTagList("Pixel Aspect", "PixelAspect",
                                        {{LinkDataType, CLSID_DataType_Point},
                                         {InputControl, CLSID_InputControl_Offset},
                                         {ControlPage, page},
                                         {InputDefaultX, ff.aspectX},
                                         {InputDefaultY, ff.aspectY},
                                         {InputMinAllowed, 1e-5},
                                         {InputDelayDefault, 1},
                                         {LinkForceSave, 1}});
        if (depth)
            inDepth_ = AddInputTagList("Depth", "Depth",
                                       {{LinkDataType, CLSID_DataType_Number},
                                        {InputControl, CLSID_InputControl_Combo},
                                        {ControlPage, page},
                                        {InputInteger, 1},
                                        {InputMinAllowed, 0.0},
                                        {InputMaxAllowed, 4.0},
                                        {ListAddItem, "Default"},
                                        {ListAddItem, "int8"},
                                        {ListAddItem, "int16"},
                                        {ListAddItem, "float16"},
                                        {ListAddItem, "float32"}});
    }
    ThreadedOperator::FinishConstruction();
}

SourceFrame SourceOperator::GetSourceFrame(Request *req) const {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    SourceFrame f;
    f.width = static_cast<int>(req->GetInputNumber(inWidth_, ff.width));
    f.height = static_cast<int>(req->GetInputNumber(inHeight_, ff.height));
    if (const auto *p = inAspect_ ? dynamic_cast<const Point *>(req->GetInputData(inAspect_)) : nullptr) {
        f.aspectX = p->x;
        f.aspectY = p->y;
    } else {
        f.aspectX = ff.aspectX;
        f.aspectY = ff.aspectY;
    }
    // The Depth list is Default, int8, int16, float16, float32: RGBA depths 5..8.
    const int choice = static_cast<int>(req->GetInputNumber(inDepth_, 0.0));
    f.depth = choice > 0 ? 4 + choice : 0;
    f.proxyScale = req->ProxyScale();
    f.field = req->Field() >= 0;
    f.fieldDominance = f.field ? req->Field() : 0;
    f.quick = (req->GetFlags() & ReqFlagQuick) != 0 && req->GetTask() && req->GetTask()->interactive;
    return f;
}

} // namespace Orvane
