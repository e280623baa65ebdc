#include "host/flow/Request.h"

#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/RenderTask.h"

namespace Orvane {

Request::Request(Operator *op, Output *asked, double time, uint32_t flags, RenderTask *task)
    : op_(op), asked_(asked), time_(time), flags_(flags), task_(task) {
    slots_.resize(op ? op->Inputs().size() : 0);
    for (Slot &s : slots_) s.time = time;
    outputs_.resize(op ? op->Outputs().size() : 0);
    outputSet_.resize(outputs_.size(), false);
}

Request::~Request() = default;

int Request::ProxyScale() const {
    if (!task_ || !(flags_ & ReqFlagProxy)) return 1;
    return task_->proxyScale > 1 ? task_->proxyScale : 1;
}

Request::Slot &Request::SlotOf(const Input *in) { return slots_.at(static_cast<size_t>(in->Index())); }
const Request::Slot &Request::SlotOf(const Input *in) const { return slots_.at(static_cast<size_t>(in->Index())); }

Parameter *Request::GetInputData(const Input *in, int) const {
    if (!in || in->Owner() != op_) return nullptr;
    return SlotOf(in).data.Get();
}

double Request::GetInputNumber(const Input *in, double fallback) const {
    if (!in) return fallback;
    if (const auto *n = dynamic_cast<const Number *>(GetInputData(in))) return n->value;
    const auto *def = dynamic_cast<const Number *>(in->Default().Get());
    return def ? def->value : fallback;
}

OvID Request::GetInputID(const Input *in, OvID fallback) const {
    if (!in) return fallback;
    if (const auto *v = dynamic_cast<const IDValue *>(GetInputData(in))) return v->value;
    const auto *def = dynamic_cast<const IDValue *>(in->Default().Get());
    return def ? def->value : fallback;
}

void Request::SetInputData(Input *in, Parameter *value, int) {
    if (!in || in->Owner() != op_) return;
    Slot &s = SlotOf(in);
    s.data = Ref<Parameter>(value);
    s.given = true;
    s.skip = value == nullptr;
}

void Request::ClearInputData(Input *in, int) {
    if (!in || in->Owner() != op_) return;
    Slot &s = SlotOf(in);
    s.data.Reset();
    s.given = s.skip = s.fetched = false;
}

void Request::SetInputRoI(Input *in, const ImageDomain *roi, int) {
    if (!in || in->Owner() != op_) return;
    Slot &s = SlotOf(in);
    if (roi)
        s.roi = *roi;
    else
        s.roi.reset();
}

const std::optional<ImageDomain> &Request::GetInputRoI(const Input *in, int) const { return SlotOf(in).roi; }
const std::optional<ImageDomain> &Request::GetInputDoD(const Input *in, int) const { return SlotOf(in).dod; }

void Request::SetInputTime(Input *in, double time, int) {
    if (in && in->Owner() == op_) SlotOf(in).time = time;
}

double Request::GetInputTime(const Input *in, int) const {
    return in && in->Owner() == op_ ? SlotOf(in).time : TimeUndefined;
}

void Request::SetInputFlags(Input *in, uint32_t flags, int) {
    if (in && in->Owner() == op_) SlotOf(in).flags |= flags;
}

void Request::ClearInputFlags(Input *in, uint32_t flags, int) {
    if (in && in->Owner() == op_) SlotOf(in).flags &= ~flags;
}

uint32_t Request::GetInputFlags(const Input *in, int) const { return in && in->Owner() == op_ ? SlotOf(in).flags : 0; }

void Request::SetOutputData(Output *out, Parameter *value) {
    if (!out || out->Owner() != op_) return;
    const size_t i = static_cast<size_t>(out->Index());
    outputs_.at(i) = Ref<Parameter>(value);
    outputSet_.at(i) = true;
}

Parameter *Request::GetOutputData(const Output *out) const {
    if (!out || out->Owner() != op_) return nullptr;
    return outputs_.at(static_cast<size_t>(out->Index())).Get();
}

bool Request::HasOutputData(const Output *out) const {
    if (!out || out->Owner() != op_) return false;
    return outputSet_.at(static_cast<size_t>(out->Index()));
}

AutoImageRoI::AutoImageRoI(const Request *req) {
    if (req) roi_ = req->RoI();
}

AutoImageRoI::AutoImageRoI(const Request *req, const Input *in, int index) {
    if (req && in) roi_ = req->GetInputRoI(in, index);
}

AutoImageDoD::AutoImageDoD(const Request *req) {
    if (req) dod_ = req->OutputDoD();
}

AutoImageDoD::AutoImageDoD(const Request *req, const Input *in, int index) {
    if (req && in) dod_ = req->GetInputDoD(in, index);
}

} // namespace Orvane
