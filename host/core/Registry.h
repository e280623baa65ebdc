#pragma once
// The class registry. Every class a module offers enters ClassRegistry while
// the module loads, as one Registry row: its class ID, its attribute tag list
// and its factory. The host later finds rows by class ID (or by an old class
// ID of earlier documents) and makes objects from them.
//
// Thread safety: rows are added and removed while modules load and unload,
// under the list's lock; lookups take the same lock and may run on any
// thread. A Registry row never changes after it is added.
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "host/core/Object.h"
#include "host/core/OvID.h"
#include "host/core/TagList.h"

namespace Orvane {

class OrvaneDoc;
class RegistryList;
class ScriptVal;

/// The factory a row carries under RegConstructor.
using ClassFactory = Object *(*)(const Registry *, const ScriptVal &, const TagList &);
using RegInitFunction = bool (*)(Registry *);
using RegCleanupFunction = void (*)(Registry *);

class ORVANE_API Registry {
public:
    /// Enters a row into *list (made on first use), keeping a copy of the
    /// tags with their text, and returns it. The row stays until Remove().
    /// A row that carries RegPlanned (a class not built yet) gives way to a
    /// built row of the same ID: entered after it, it is not entered (null);
    /// entered before it, the built row replaces it.
    static Registry *_Init(RegistryList **list, const OvID &id, TagList &tags);

    OvID ID() const { return id_; }
    const TagList &Tags() const { return tags_; }
    uint32_t TypeFlags() const { return static_cast<uint32_t>(tags_.GetLong(0x10000000)); }
    /// The class word (RegClassName), or the ID's text.
    const char *ClassName() const;
    /// The display name (RegName), or the class word.
    const char *DisplayName() const;
    /// The direct base, when it is a registered class.
    const Registry *Base() const;
    OvID BaseID() const;

    /// Makes an object of this class; null when the row has no factory or the
    /// constructor failed.
    Object *New(const ScriptVal &args, const TagList &tags) const;
    bool CanCreate() const;

    /// True when this class is `id` or derives from it.
    bool IsClassType(const OvID &id) const;
    /// True when the row's kind holds every low bit of `type` and, when
    /// `type` names a family (high half), belongs to that family.
    bool IsRegClassType(uint32_t type) const;

    /// False after RegInit refused the class: it stays out of every list.
    bool IsEnabled() const { return enabled_; }

private:
    friend class RegistryList;
    Registry(const OvID &id, const TagList &tags, RegistryList *owner);
    OvID id_;
    TagList tags_;
    RegistryList *owner_;
    bool enabled_ = true;
};

class ORVANE_API RegistryList {
public:
    /// Finds a row by class ID, then by old class ID. A non-zero `type`
    /// requires IsRegClassType(type). Disabled rows are not found.
    const Registry *Find(const OvID &id, uint32_t type = 0) const;
    /// Finds a row by any name a user may give a class: its ID or an old ID,
    /// then (ignoring case) an alias, its class word or its display name.
    const Registry *FindByName(const std::string &name) const;
    /// Finds and makes; null when the class is unknown or cannot be made.
    Object *New(const OvID &id, uint32_t type, OrvaneDoc *doc) const;

    /// Every enabled row, in the order of registration.
    std::vector<const Registry *> Rows() const;
    size_t Size() const;

    /// Runs each row's RegInitFunc once; rows whose function says no are disabled.
    void InitAll();
    /// Runs each row's RegCleanupFunc.
    void CleanupAll();
    /// Takes a row out (module unload). The pointer is invalid afterwards.
    void Remove(const Registry *row);

private:
    friend class Registry;
    Registry *Add(const OvID &id, TagList &tags);
    void Reindex();

    mutable std::mutex lock_;
    std::vector<std::unique_ptr<Registry>> rows_;
    std::vector<std::unique_ptr<Registry>> retired_; ///< placeholders a built class replaced
    std::unordered_map<OvID, Registry *> byId_;
    std::unordered_map<OvID, Registry *> byOldId_;
    bool initDone_ = false;
};

/// The global list of classes.
ORVANE_API extern RegistryList *ClassRegistry;

/// Makes an object from a row, passing the construction arguments on.
ORVANE_API Object *NewObj(const Registry &reg, const ScriptVal &args, const TagList &tags);

} // namespace Orvane
