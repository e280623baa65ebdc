#include "host/core/Registry.h"

#include <strings.h>

#include <algorithm>

#include "host/core/ScriptVal.h"
#include "host/core/Tags.h"

namespace Orvane {

RegistryList *ClassRegistry = nullptr;

Registry *Registry::_Init(RegistryList **list, const OvID &id, TagList &tags) {
    if (!*list) *list = new RegistryList; // lives for the process: rows may outlive static teardown order
    return (*list)->Add(id, tags);
}

Registry::Registry(const OvID &id, const TagList &tags, RegistryList *owner) : id_(id), tags_(tags), owner_(owner) {
    tags_.Persist();
}

const char *Registry::ClassName() const { return tags_.GetText(RegClassName, id_.Text()); }

const char *Registry::DisplayName() const { return tags_.GetText(RegName, ClassName()); }

OvID Registry::BaseID() const {
    // RegBaseClass holds the address of the base's OvID object.
    const auto *base = static_cast<const OvID *>(tags_.GetPtr(RegBaseClass));
    return base ? *base : OvID();
}

const Registry *Registry::Base() const {
    const OvID base = BaseID();
    return base.IsNull() || !owner_ ? nullptr : owner_->Find(base);
}

bool Registry::CanCreate() const { return tags_.GetPtr(RegConstructor) != nullptr; }

Object *Registry::New(const ScriptVal &args, const TagList &tags) const {
    auto factory = reinterpret_cast<ClassFactory>(tags_.GetPtr(RegConstructor));
    if (!factory || !enabled_) return nullptr;
    Object *obj = factory(this, args, tags);
    if (obj && !obj->GetRegistry()) obj->SetRegistry(this);
    return obj;
}

bool Registry::IsClassType(const OvID &id) const {
    int guard = 0;
    for (const Registry *r = this; r && guard < 64; r = r->Base(), ++guard) {
        if (r->id_ == id) return true;
        if (r->BaseID() == id) return true;
    }
    return false;
}

bool Registry::IsRegClassType(uint32_t type) const {
    const uint32_t flags = TypeFlags();
    const uint32_t family = type & RegFamilyMask;
    if (family && (flags & RegFamilyMask) != family) return false;
    const uint32_t low = type & ~RegFamilyMask;
    return (flags & low) == low;
}

Object *NewObj(const Registry &reg, const ScriptVal &args, const TagList &tags) { return reg.New(args, tags); }

Registry *RegistryList::Add(const OvID &id, TagList &tags) {
    Registry *row;
    bool initNow;
    {
        std::lock_guard<std::mutex> guard(lock_);
        // A class that is built replaces the placeholder row of its ID, in
        // whichever order the two arrive.
        if (auto it = byId_.find(id); it != byId_.end()) {
            const bool newPlanned = tags.GetBool(RegPlanned), oldPlanned = it->second->tags_.GetBool(RegPlanned);
            if (newPlanned && !oldPlanned) return nullptr;
            if (!newPlanned && oldPlanned) {
                const Registry *old = it->second;
                auto at = std::find_if(rows_.begin(), rows_.end(), [old](auto &r) { return r.get() == old; });
                retired_.push_back(std::move(*at)); // kept, so no later row takes its address
                rows_.erase(at);
                Reindex();
            }
        }
        rows_.push_back(std::unique_ptr<Registry>(new Registry(id, tags, this)));
        row = rows_.back().get();
        byId_[id] = row;
        for (const TagItem *old : row->tags_.FindAll(RegOldClassId)) byOldId_[old->AsID()] = row;
        initNow = initDone_;
    }
    // Outside the lock, as in InitAll: the hook may look the list up.
    if (initNow) {
        auto init = reinterpret_cast<RegInitFunction>(row->tags_.GetPtr(RegInitFunc));
        if (init && !init(row)) row->enabled_ = false;
    }
    return row;
}

void RegistryList::Reindex() {
    byId_.clear();
    byOldId_.clear();
    for (auto &row : rows_) {
        byId_[row->id_] = row.get();
        for (const TagItem *old : row->tags_.FindAll(RegOldClassId)) byOldId_[old->AsID()] = row.get();
    }
}

const Registry *RegistryList::Find(const OvID &id, uint32_t type) const {
    std::lock_guard<std::mutex> guard(lock_);
    auto it = byId_.find(id);
    const Registry *row = nullptr;
    if (it != byId_.end())
        row = it->second;
    else if (auto old = byOldId_.find(id); old != byOldId_.end())
        row = old->second;
    if (!row || !row->enabled_) return nullptr;
    if (type && !row->IsRegClassType(type)) return nullptr;
    return row;
}

const Registry *RegistryList::FindByName(const std::string &name) const {
    if (const Registry *row = Find(OvID(name))) return row;
    auto same = [&name](const char *text) { return text && strcasecmp(text, name.c_str()) == 0; };
    for (const Registry *row : Rows()) {
        for (const TagItem *alias : row->Tags().FindAll(RegAlias))
            if (same(alias->AsText())) return row;
        if (same(row->ClassName()) || same(row->DisplayName())) return row;
    }
    return nullptr;
}

Object *RegistryList::New(const OvID &id, uint32_t type, OrvaneDoc *doc) const {
    const Registry *row = Find(id, type);
    if (!row) return nullptr;
    TagList tags{{0x60020001, static_cast<const void *>(doc)}}; // ImgDocument: the document the object joins
    return row->New(ScriptVal(), tags);
}

std::vector<const Registry *> RegistryList::Rows() const {
    std::lock_guard<std::mutex> guard(lock_);
    std::vector<const Registry *> rows;
    for (auto &row : rows_)
        if (row->enabled_) rows.push_back(row.get());
    return rows;
}

size_t RegistryList::Size() const { return Rows().size(); }

void RegistryList::InitAll() {
    std::vector<Registry *> rows;
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (initDone_) return;
        initDone_ = true;
        for (auto &row : rows_) rows.push_back(row.get());
    }
    for (Registry *row : rows) {
        auto init = reinterpret_cast<RegInitFunction>(row->tags_.GetPtr(RegInitFunc));
        if (init && !init(row)) row->enabled_ = false;
    }
}

void RegistryList::CleanupAll() {
    std::vector<Registry *> rows;
    {
        std::lock_guard<std::mutex> guard(lock_);
        for (auto &row : rows_) rows.push_back(row.get());
    }
    for (Registry *row : rows) {
        auto cleanup = reinterpret_cast<RegCleanupFunction>(row->tags_.GetPtr(RegCleanupFunc));
        if (cleanup) cleanup(row);
    }
}

void RegistryList::Remove(const Registry *row) {
    std::lock_guard<std::mutex> guard(lock_);
    auto it = std::find_if(rows_.begin(), rows_.end(), [row](auto &r) { return r.get() == row; });
    if (it == rows_.end()) return;
    rows_.erase(it);
    Reindex();
}

} // namespace Orvane
