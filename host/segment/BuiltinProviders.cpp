#include "host/segment/BuiltinProviders.h"

#include <mutex>

#include "host/krom/KernelProvider.h"
#include "host/segment/OnnxObjectMask.h"

namespace Orvane {

void RegisterBuiltinProviders() {
    static std::once_flag once;
    std::call_once(once, [] {
        RegisterKernelProvider("GetObjectMask", MakeClassicalObjectMaskProvider());
        // After the classical one, so that a network named by ORVANE_MAGIC_MASK_MODEL serves while it loads.
        RegisterOnnxObjectMaskProvider();
    });
}

} // namespace Orvane
