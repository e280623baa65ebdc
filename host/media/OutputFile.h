#pragma once
// Writing files without damaging anything: what a write may replace, the
// temporary name it goes to first, and clearing the temporaries that a
// killed render left behind.
//
// A write replaces only a regular file. A symbolic link to a regular file is
// written through (the link stays, the file it points to is replaced); a
// folder, device, FIFO, socket, a link to one of those or a dangling link is
// refused. The temporary file sits beside the file it will replace (so the
// final rename stays on one file system) and is named
//   .NAME.orvane-tmp-HOST-PID
// after the target's file name, the host and the process writing it, so the
// next render of the same output knows whose it is.
//
// Thread safety: pure functions over the file system.
#include <string>

#include "host/core/Export.h"
#include "host/media/Sequence.h"

namespace Orvane {

/// Where a write to `path` lands: `path` itself when nothing or a regular
/// file is there, the file a symbolic link points to for a link to a regular
/// file. False with a reason naming `path` when it may not be replaced.
ORVANE_API bool ResolveOutputFile(const std::string &path, std::string &target, std::string &error);

/// The temporary name this process writes `target` to, in its folder.
ORVANE_API std::string TemporaryFileFor(const std::string &target);

/// The parts of a temporary file's name (no folder); false for other names.
struct TemporaryName {
    std::string target; ///< the file name it was to become
    std::string host;
    long pid = 0;
};
ORVANE_API bool ParseTemporaryName(const std::string &fileName, TemporaryName &parts);

/// Removes the temporaries left beside the files of `seq` (or beside the one
/// file of a name without a number) by writers that are gone: on this host,
/// a process that no longer runs; from another host, one untouched for an
/// hour. Returns how many were removed.
ORVANE_API int RemoveStaleTemporaries(const SequenceName &seq);

} // namespace Orvane
