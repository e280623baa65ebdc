#pragma once
// ImageFormatList: finding the format for a file. The list is the set of
// registered classes of the image-format family; a file's extension (any
// case) names the candidates, ordered by RegSortOrder, and each candidate
// confirms the stream with CheckFormat. A file whose extension names no
// format that accepts it is tried against every format, so a misnamed file
// still reads.
//
// Thread safety: lookups read the class registry; preparing a format (the
// checks) runs under one lock, FormatLock().
#include <mutex>
#include <string>
#include <vector>

#include "host/media/ImageFormat.h"

namespace Orvane {

class IOClass;

/// Format rows registered for the extension of `path`, best first.
ORVANE_API std::vector<const Registry *> FormatsForExtension(const std::string &path);
/// Format rows that write files, best first.
ORVANE_API std::vector<const Registry *> FormatsThatSave();
/// The first format whose check accepts the stream; null, with a reason, if none.
ORVANE_API Ref<ImageFormat> FindFormatForReading(const std::string &path, IOClass *io, std::string &error);
/// The row of the format that writes files with the extension of `path`; null for none.
ORVANE_API const Registry *FormatRowForWriting(const std::string &path);
/// The format that writes files with the extension of `path`.
ORVANE_API Ref<ImageFormat> FindFormatForWriting(const std::string &path, std::string &error);
/// The lock under which formats are prepared.
ORVANE_API std::mutex &FormatLock();

} // namespace Orvane
