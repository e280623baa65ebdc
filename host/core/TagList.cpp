#include "host/core/TagList.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace Orvane {
namespace {

[[noreturn]] void TagKindMismatch(Tag tag, const char *given) {
    std::fprintf(stderr, "TagList: tag 0x%08x given a %s value\n", static_cast<unsigned>(tag), given);
    std::abort();
}

uint64_t DoubleBits(double v) {
    uint64_t bits;
    std::memcpy(&bits, &v, sizeof bits);
    return bits;
}

double BitsDouble(uint64_t bits) {
    double v;
    std::memcpy(&v, &bits, sizeof v);
    return v;
}

} // namespace

TagItem::TagItem(Tag t, long long v) : tag(t) {
    switch (KindOfTag(t)) {
    case TagKind::Double: value = DoubleBits(static_cast<double>(v)); break;
    case TagKind::Integer:
    case TagKind::Unknown: value = static_cast<uint64_t>(v); break;
    case TagKind::Pointer:
        if (v != 0) TagKindMismatch(t, "integer");
        value = 0;
        break;
    default: TagKindMismatch(t, "integer");
    }
}

TagItem::TagItem(Tag t, double v) : tag(t) {
    switch (KindOfTag(t)) {
    case TagKind::Double: value = DoubleBits(v); break;
    case TagKind::Integer:
    case TagKind::Unknown: value = static_cast<uint64_t>(static_cast<long long>(v)); break;
    default: TagKindMismatch(t, "double");
    }
}

TagItem::TagItem(Tag t, const char *text) : tag(t), value(reinterpret_cast<uint64_t>(text)) {
    const TagKind kind = KindOfTag(t);
    if (kind == TagKind::ID) {
        const OvID id(text); // empty or missing text is the null ID, stored as 0 like TagItem(t, OvID())
        value = reinterpret_cast<uint64_t>(id.IsNull() ? nullptr : id.Text());
    } else if (kind != TagKind::Text && kind != TagKind::Unknown)
        TagKindMismatch(t, "text");
}

TagItem::TagItem(Tag t, OvID id) : tag(t), value(reinterpret_cast<uint64_t>(id.IsNull() ? nullptr : id.Text())) {
    const TagKind kind = KindOfTag(t);
    if (kind != TagKind::ID && kind != TagKind::Text && kind != TagKind::Unknown) TagKindMismatch(t, "ID");
}

TagItem::TagItem(Tag t, const void *ptr) : tag(t), value(reinterpret_cast<uint64_t>(ptr)) {
    const TagKind kind = KindOfTag(t);
    if (kind != TagKind::Pointer && kind != TagKind::Unknown) TagKindMismatch(t, "pointer");
}

long long TagItem::AsInt() const {
    return KindOfTag(tag) == TagKind::Double ? static_cast<long long>(BitsDouble(value))
                                             : static_cast<long long>(value);
}

double TagItem::AsDouble() const {
    return KindOfTag(tag) == TagKind::Double ? BitsDouble(value) : static_cast<double>(static_cast<long long>(value));
}

TagList::TagList(const uint64_t *pairs, bool copyText) {
    if (pairs)
        for (const uint64_t *p = pairs; p[0] != 0; p += 2) items_.push_back(TagItem::Raw(static_cast<Tag>(p[0]), p[1]));
    if (copyText) Persist();
}

const TagItem *TagList::Find(Tag tag) const {
    for (const TagItem &item : items_)
        if (item.tag == tag) return &item;
    return nullptr;
}

long long TagList::GetLong(Tag tag, long long def) const {
    const TagItem *item = Find(tag);
    return item ? item->AsInt() : def;
}

double TagList::GetDouble(Tag tag, double def) const {
    const TagItem *item = Find(tag);
    return item ? item->AsDouble() : def;
}

const char *TagList::GetText(Tag tag, const char *def) const {
    const TagItem *item = Find(tag);
    return item ? item->AsText() : def;
}

OvID TagList::GetID(Tag tag, OvID def) const {
    const TagItem *item = Find(tag);
    return item ? item->AsID() : def;
}

void *TagList::GetPtr(Tag tag, void *def) const {
    const TagItem *item = Find(tag);
    return item ? item->AsPtr() : def;
}

std::vector<const TagItem *> TagList::FindAll(Tag tag) const {
    std::vector<const TagItem *> found;
    for (const TagItem &item : items_)
        if (item.tag == tag) found.push_back(&item);
    return found;
}

void TagList::Set(const TagItem &item) {
    if (!TagRepeats(item.tag))
        for (TagItem &existing : items_)
            if (existing.tag == item.tag) {
                existing = item;
                return;
            }
    items_.push_back(item);
}

void TagList::Merge(const TagList &other) {
    for (const TagItem &item : other.items_) Set(item);
    ownedText_.insert(ownedText_.end(), other.ownedText_.begin(), other.ownedText_.end());
}

bool TagList::Remove(Tag tag) {
    const size_t before = items_.size();
    std::erase_if(items_, [tag](const TagItem &item) { return item.tag == tag; });
    return items_.size() != before;
}

void TagList::Persist() {
    for (TagItem &item : items_) {
        if (KindOfTag(item.tag) != TagKind::Text || item.value == 0) continue;
        const char *text = item.AsText();
        bool owned = false;
        for (const auto &s : ownedText_)
            if (s->c_str() == text) owned = true;
        if (owned) continue;
        auto copy = std::make_shared<const std::string>(text);
        item.value = reinterpret_cast<uint64_t>(copy->c_str());
        ownedText_.push_back(std::move(copy));
    }
}

} // namespace Orvane
