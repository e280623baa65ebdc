#include "operators/key/SimpleKeyer.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"

namespace Orvane {

SimpleKeyer::SimpleKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags, KeyerMatte::Flavour flavour)
    : ThreadedOperator(reg, args, tags), matte_(*this, flavour) {}

TagList SimpleKeyer::RangeTags(int group, int member, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Range},
            {ControlGroup, group},
            {ControlMember, member},
            {InputDefault, def},
            {InputSliderLow, 0.0},
            {InputSliderHigh, 1.0}};
}

Input *SimpleKeyer::AddImageInput(const char *name, const char *id, int main, bool required) {
    return AddInputTagList(name, id,
                           {{LinkDataType, CLSID_DataType_Image},
                            {LinkMain, main},
                            {InputPriority, PriorityImage},
                            {InputRequired, required},
                            {ImageFromRequestOK, 1}});
}

Output *SimpleKeyer::AddImageOutput() {
    return AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void SimpleKeyer::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    matte_.NotifyChanged(in, param);
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void SimpleKeyer::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    matte_.CheckRequest(req, input_);
}

void SimpleKeyer::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    KeyerMatte::Values v = matte_.Read(req);
    if (!src || !ReadKey(req, v)) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    Ref<Image> dst = matte_.NewMatteImage(req, input_, src, v);
    bool ok = dst != nullptr;
    if (ok && !dst->IsNoData() && !dst->DataWindow().IsNull()) ok = FirstMatte(req, src, dst.Get());
    Ref<Image> out = ok ? matte_.Refine(req, dst.Get(), src, v) : Ref<Image>();
    const bool aborted = dst && dst->CheckAbort();
    if (!out || aborted) {
        if (!aborted) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, out.Get());
}

} // namespace Orvane
