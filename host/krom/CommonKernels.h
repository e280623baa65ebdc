#pragma once
// The host's common kernel library: kernels in the KROM dialect that tools
// name instead of carrying their own text (option
// "KROM_RT_UseOrvaneCommonKernel"). Each entry has its parameter block's
// declaration beside it (the same text the tool passes), so the library can
// be compiled and checked on its own.
//
// Thread safety: the table is constant.
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

struct CommonKernel {
    const char *name;
    const char *paramStructText;
    const char *source;
};

/// Every kernel of the library.
ORVANE_API const std::vector<CommonKernel> &CommonKernels();
/// The kernel called `name`, or null.
ORVANE_API const CommonKernel *FindCommonKernel(const std::string &name);

} // namespace Orvane
