#pragma once
// KernelDiskCache: compiled kernel binaries kept on disk between runs, so a
// render does not pay for the driver's compiler every time it starts.
//
// Entries are keyed by the full kernel text, the compile options and the
// driver (IDeviceContext::DriverKey), so a new driver or a changed kernel
// never loads an old binary. The folder is $ORVANE_KERNEL_CACHE, else
// $XDG_CACHE_HOME/orvane/kernels, else ~/.cache/orvane/kernels;
// ORVANE_KERNEL_CACHE=off switches the cache off. Entries are written to a
// temporary file and renamed, so a reader never sees half an entry; an entry
// that cannot be read is ignored and compiled again.
//
// Thread safety: safe from any thread and process (atomic renames).
#include <cstdint>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// A per-user cache folder: $`envVar` when set ("" when it is "off"), else
/// $XDG_CACHE_HOME/orvane/`subfolder`, else ~/.cache/orvane/`subfolder`; ""
/// when there is no home either. Shared by the host's disk caches.
ORVANE_API std::string UserCacheFolder(const char *envVar, const char *subfolder);
/// The cache folder, or "" when the cache is off or there is no home.
ORVANE_API std::string KernelCacheFolder();
/// A file name for the key parts (hex of two independent 64-bit hashes).
ORVANE_API std::string KernelCacheKey(const std::string &driver, const std::string &options, const std::string &text);
ORVANE_API bool LoadCachedKernel(const std::string &key, std::vector<uint8_t> &binary);
ORVANE_API void StoreCachedKernel(const std::string &key, const std::vector<uint8_t> &binary);

} // namespace Orvane
