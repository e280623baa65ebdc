#pragma once
// How a class of this library enters the host's class registry: one static
// ClassRegistration object per class, built while the library loads. In the
// order of construction it makes the class's ScriptInfo, its registry row
// (the attribute list plus factory, start-up hooks, base class and API
// version) and its type link; destroying it (library unload) takes the row
// out again.
//
//   static const OvID CLSID_Blur("Blur");
//   static ClassRegistration<Blur, ThreadedOperator> s_Blur(CLSID_Blur, &CLSID_ThreadedOperator, {
//       {RegTypeFlags, RegKindOperator | RegKindTool}, {RegName, "Blur"}, ...});
#include <memory>
#include <typeinfo>

#include "host/core/Registry.h"
#include "host/core/ScriptInfo.h"
#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"

namespace Orvane {

/// The factory of a class: allocates through Reuser (the class's operator
/// new), runs the constructor, and gives null when either fails.
template <class T> Object *ConstructClass(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    try {
        return new T(reg, args, tags);
    } catch (...) {
        return nullptr;
    }
}

/// Enters one row; shared by the typed form below and by table-driven rows.
class RegistrationBase {
public:
    RegistrationBase(const OvID &id, const OvID *baseId, ClassFactory factory, RegInitFunction init,
                     RegCleanupFunction cleanup, std::unique_ptr<ScriptInfo> info, const std::type_info &type,
                     const std::type_info &baseType, TagList tags);
    ~RegistrationBase();
    RegistrationBase(const RegistrationBase &) = delete;
    RegistrationBase &operator=(const RegistrationBase &) = delete;

    const Registry *Row() const { return row_; }

protected:
    std::unique_ptr<ScriptInfo> info_;
    const Registry *row_ = nullptr;
    const std::type_info *type_;
};

template <class T, class Base> class ClassRegistration : public RegistrationBase {
public:
    ClassRegistration(const OvID &id, const OvID *baseId, TagList tags)
        : RegistrationBase(id, baseId, &ConstructClass<T>, &Base::RegInit, &Base::RegCleanup,
                           std::make_unique<ScriptInfoT<T>>(1, id.Text(), "", ""), typeid(T), typeid(Base),
                           std::move(tags)) {}
};

} // namespace Orvane
