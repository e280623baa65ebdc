#pragma once
// The library's table of class identities: one row per registered class
// whose tool is not built yet, with everything a tool list, a search and a
// document need (class ID, class word, kind, base, path, name, category,
// abbreviation, help, icon, aliases, old class IDs, attributes). Built tools
// register their own rows beside their code; RegisterPlannedClasses() enters
// the rest.
#include <cstdint>
#include <vector>

#include "host/core/TagList.h"

namespace Orvane {

struct ClassDesc {
    const char *id;                     ///< class ID text
    const char *classWord;              ///< RegClassName
    uint32_t kind;                      ///< RegTypeFlags
    const char *base;                   ///< class ID text of the direct base, or nullptr
    const char *path = nullptr;         ///< RegPath, "Tools/Color/ColorGain"
    const char *name = nullptr;         ///< RegName
    const char *category = nullptr;     ///< RegCategory
    const char *abbreviation = nullptr; ///< RegAbbreviation
    const char *help = nullptr;         ///< RegHelp
    const char *icon = nullptr;         ///< RegIcon
    const char *aliases = nullptr;      ///< RegAlias entries, separated by '|'
    const char *oldIds = nullptr;       ///< RegOldClassId entries, separated by '|'
    TagList attrs = {};                 ///< further attributes (RegNoBlendControls, RegSortOrder, ...)
    bool creatable = true;              ///< false: no constructor (abstract bases, VolumeFogLighting)
};

/// Rows of the classes this library names but does not build yet.
const std::vector<ClassDesc> &PlannedClasses();

} // namespace Orvane
