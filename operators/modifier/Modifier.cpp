#include "operators/modifier/Modifier.h"

#include "host/flow/Link.h"
#include "host/flow/Operator.h"

namespace Orvane {

std::string DrivenTitle(const std::string &what, std::initializer_list<const Output *> outputs) {
    for (const Output *out : outputs)
        if (out && !out->Consumers().empty()) {
            const Input *in = out->Consumers().front();
            return what + " on " + (in->Owner() ? in->Owner()->Name() : std::string()) + ": " + in->Name();
        }
    return {};
}

} // namespace Orvane
