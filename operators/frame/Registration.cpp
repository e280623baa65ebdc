#include "operators/frame/Registration.h"

namespace Orvane {

RegistrationBase::RegistrationBase(const OvID &id, const OvID *baseId, ClassFactory factory, RegInitFunction init,
                                   RegCleanupFunction cleanup, std::unique_ptr<ScriptInfo> info,
                                   const std::type_info &type, const std::type_info &baseType, TagList tags)
    : info_(std::move(info)), type_(&type) {
    if (factory) tags.Set({RegConstructor, factory});
    if (init) tags.Set({RegInitFunc, init});
    if (cleanup) tags.Set({RegCleanupFunc, cleanup});
    if (info_) tags.Set({RegScriptInfo, static_cast<const void *>(info_.get())});
    if (baseId) tags.Set({RegBaseClass, static_cast<const void *>(baseId)});
    // A row with neither factory nor start-up hook carries only what it was given.
    const bool bare = !factory && !init;
    if (!bare && !tags.Has(RegApiVersion)) tags.Set({RegApiVersion, RegApiVersionCurrent});
    if (!bare && !tags.Has(RegClassName)) tags.Set({RegClassName, id.Text()});
    row_ = Registry::_Init(&ClassRegistry, id, tags);
    SetTypeInfo(type, baseType);
}

RegistrationBase::~RegistrationBase() {
    // A placeholder that gave way to a built class has no row of its own.
    if (ClassRegistry && row_) ClassRegistry->Remove(row_);
    ClearTypeInfo(*type_);
}

} // namespace Orvane
