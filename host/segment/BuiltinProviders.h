#pragma once
// The kernel providers the host itself supplies, registered once at start-up
// (Application's constructor) before any tool or module can register its own,
// so that a provider registered later (a learned model) takes over while it is
// available and the built-in one serves otherwise.
//
// "GetObjectMask": the classical provider (ClassicalMaskProvider.h), then the
// network provider when ORVANE_MAGIC_MASK_MODEL names a network that loads
// (OnnxObjectMask.h).
//
// Thread safety: RegisterBuiltinProviders may be called from any thread, any
// number of times; only the first call registers.
#include <memory>

#include "host/core/Export.h"

namespace Orvane {

class KernelProvider;

ORVANE_API void RegisterBuiltinProviders();

/// A new classical provider of "GetObjectMask" (stroke-seeded colour
/// segmentation, carried between frames by optical flow), unregistered.
ORVANE_API std::shared_ptr<KernelProvider> MakeClassicalObjectMaskProvider();

} // namespace Orvane
