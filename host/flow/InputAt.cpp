#include "host/flow/InputAt.h"

#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"

namespace Orvane {

Ref<Parameter> InputValueAt(const Request *req, const Input *in, double time) {
    if (!in) return nullptr;
    if (req && in->Owner() == req->GetOperator()) {
        const Request::Slot &slot = req->SlotOf(in);
        if (slot.fetched && slot.data && slot.time == time) return slot.data;
    }
    if (Output *link = in->Link()) {
        EvalOptions options;
        if (req) {
            options.flags = req->GetFlags() & ~ReqFlagSkipRoI;
            options.task = req->GetTask();
        }
        options.flags |= ReqFlagTimeShifted;
        return Evaluate(link, time, options);
    }
    if (Ref<Parameter> value = in->ValueAt(time)) return value;
    return in->Default();
}

double InputNumberAt(const Request *req, const Input *in, double time, double fallback) {
    const Ref<Parameter> value = InputValueAt(req, in, time);
    const auto *number = dynamic_cast<const Number *>(value.Get());
    return number ? number->value : fallback;
}

void InputPointAt(const Request *req, const Input *in, double time, double &x, double &y, double fallbackX,
                  double fallbackY) {
    const Ref<Parameter> value = InputValueAt(req, in, time);
    if (const auto *point = dynamic_cast<const Point *>(value.Get())) {
        x = point->x, y = point->y;
    } else {
        x = fallbackX, y = fallbackY;
    }
}

} // namespace Orvane
