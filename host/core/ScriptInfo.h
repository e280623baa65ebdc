#pragma once
// ScriptInfo: the script layer's record of a class, and SetTypeInfo, which
// tells it that one class derives from another. ScriptInfoT<Class> adds only
// the class's identity: converting between script objects and class pointers
// is the identity, so no pointer adjustment takes place.
//
// Thread safety: records are made while modules load; lookups may run on any
// thread under the type table's lock.
#include <string>
#include <typeinfo>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API ScriptInfo {
public:
    ScriptInfo(unsigned int version, const char *name, const char *help, const char *extra);
    virtual ~ScriptInfo();
    virtual void *ToObject(void *scriptObject) const { return scriptObject; }
    virtual void *FromObject(void *object) const { return object; }

    unsigned int Version() const { return version_; }
    const std::string &Name() const { return name_; }

private:
    unsigned int version_;
    std::string name_, help_, extra_;
};

template <class T> class ScriptInfoT : public ScriptInfo {
public:
    using ScriptInfo::ScriptInfo;
};

/// Records that `type` derives from `base`.
ORVANE_API void SetTypeInfo(const std::type_info &type, const std::type_info &base);
/// Removes the record of `type` (module unload).
ORVANE_API void ClearTypeInfo(const std::type_info &type);
/// True when `type` is `base` or derives from it through recorded links.
ORVANE_API bool TypeDerivesFrom(const std::type_info &type, const std::type_info &base);

} // namespace Orvane
