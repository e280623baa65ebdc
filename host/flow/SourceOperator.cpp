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
        formatInputs_.Add(this, page, ff, size, aspect, depth);
    }
    ThreadedOperator::FinishConstruction();
}

SourceFrame SourceOperator::GetSourceFrame(Request *req) const {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    SourceFrame f;
    const ImageFormatInputs::Values v = formatInputs_.Read(req, ff);
    f.width = v.width;
    f.height = v.height;
    f.aspectX = v.aspectX;
    f.aspectY = v.aspectY;
    // The Depth list is Default, int8, int16, float16, float32: RGBA depths 5..8.
    f.depth = v.depthChoice > 0 ? 4 + v.depthChoice : 0;
    f.proxyScale = req->ProxyScale();
    f.field = req->Field() >= 0;
    f.fieldDominance = f.field ? req->Field() : 0;
    f.quick = (req->GetFlags() & ReqFlagQuick) != 0 && req->GetTask() && req->GetTask()->interactive;
    return f;
}

} // namespace Orvane
