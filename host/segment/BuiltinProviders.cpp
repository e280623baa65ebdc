#include "host/segment/BuiltinProviders.h"

#include <mutex>

#include "host/krom/KernelProvider.h"

namespace Orvane {

void RegisterBuiltinProviders() {
    static std::once_flag once;
    std::call_once(once, [] { RegisterKernelProvider("GetObjectMask", MakeClassicalObjectMaskProvider()); });
}

} // namespace Orvane
