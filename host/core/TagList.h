#pragma once
// TagList: a list of (tag, value) pairs, the way options travel to host
// operations. A tag is 32 bits; its top nibble says what the 64-bit value holds
// (1 integer, 2 double, 3 text, 6 pointer, 8 OvID), the top byte 0x38 / 0x88 /
// 0x68 marks text or IDs that may repeat (and icon names), and the second byte
// names the domain (0x02 link, 0x03 input, 0x04 control, 0x05 control kind).
//
// Building a list on the spot needs no casts: each TagItem converts its value
// to the type its tag announces, and rejects text or pointers given to a
// numeric tag (ORVANE_TAG_CHECK).
//
//   img = NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &rect}, {ImgNoData, precalc}});
//
// Text values are borrowed pointers unless the list has been Persist()ed, which
// copies the text into storage the list (and its copies) share.
//
// Thread safety: a TagList is a value; const access from several threads is safe.
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <string>
#include <vector>

#include "host/core/OvID.h"

namespace Orvane {

using Tag = uint32_t;

enum class TagKind : uint8_t { Integer, Double, Text, Pointer, ID, Unknown };

constexpr TagKind KindOfTag(Tag tag) {
    const unsigned topByte = tag >> 24;
    if (topByte == 0x68) return TagKind::Text; // icon name of a list entry
    switch (tag >> 28) {
    case 1: return TagKind::Integer;
    case 2: return TagKind::Double;
    case 3: return TagKind::Text;
    case 6: return TagKind::Pointer;
    case 8: return TagKind::ID;
    default: return TagKind::Unknown;
    }
}
/// True for tags whose entries add up instead of replacing one another.
constexpr bool TagRepeats(Tag tag) { return ((tag >> 24) & 0x0f) == 0x08; }
/// The domain byte: 0x02 link, 0x03 input, 0x04 control, 0x05 control kind.
constexpr unsigned TagDomain(Tag tag) { return (tag >> 16) & 0xff; }

/// One pair. Constructors convert the value to the tag's kind.
struct ORVANE_API TagItem {
    Tag tag = 0;
    uint64_t value = 0;

    TagItem() = default;
    TagItem(Tag t, int v) : TagItem(t, static_cast<long long>(v)) {}
    TagItem(Tag t, unsigned v) : TagItem(t, static_cast<long long>(v)) {}
    TagItem(Tag t, long v) : TagItem(t, static_cast<long long>(v)) {}
    TagItem(Tag t, bool v) : TagItem(t, static_cast<long long>(v ? 1 : 0)) {}
    TagItem(Tag t, long long v);
    TagItem(Tag t, double v);
    TagItem(Tag t, float v) : TagItem(t, static_cast<double>(v)) {}
    TagItem(Tag t, const char *text);
    TagItem(Tag t, OvID id);
    TagItem(Tag t, const void *ptr);
    TagItem(Tag t, std::nullptr_t) : TagItem(t, static_cast<const void *>(nullptr)) {}
    /// Functions (factories, start-up hooks) travel as pointers.
    template <class R, class... A> TagItem(Tag t, R (*fn)(A...)) : TagItem(t, reinterpret_cast<const void *>(fn)) {}

    static TagItem Raw(Tag t, uint64_t bits) {
        TagItem item;
        item.tag = t;
        item.value = bits;
        return item;
    }
    long long AsInt() const;
    double AsDouble() const;
    const char *AsText() const { return reinterpret_cast<const char *>(value); }
    void *AsPtr() const { return reinterpret_cast<void *>(value); }
    OvID AsID() const { return OvID::FromInterned(reinterpret_cast<const char *>(value)); }
};

class ORVANE_API TagList {
public:
    TagList() = default;
    TagList(std::initializer_list<TagItem> items) : items_(items) {}
    /// Wraps a zero-ended array of alternating tag and value words, as call
    /// sites write them into a local array. The list copies the pairs.
    explicit TagList(const uint64_t *pairs, bool copyText = false);

    bool Empty() const { return items_.empty(); }
    size_t Size() const { return items_.size(); }
    const std::vector<TagItem> &Items() const { return items_; }

    bool Has(Tag tag) const { return Find(tag) != nullptr; }
    const TagItem *Find(Tag tag) const;

    // Typed getters: the first entry of the tag, or the default. A double tag
    // read as an integer is truncated and the other way round converted.
    long long GetLong(Tag tag, long long def = 0) const;
    double GetDouble(Tag tag, double def = 0.0) const;
    bool GetBool(Tag tag, bool def = false) const { return GetLong(tag, def ? 1 : 0) != 0; }
    const char *GetText(Tag tag, const char *def = nullptr) const;
    OvID GetID(Tag tag, OvID def = OvID()) const;
    void *GetPtr(Tag tag, void *def = nullptr) const;
    template <class T> T *GetPtrAs(Tag tag) const { return static_cast<T *>(GetPtr(tag)); }

    /// Every value of a repeated tag, in order.
    std::vector<const TagItem *> FindAll(Tag tag) const;

    /// Replaces the first entry of the tag (or appends when absent). Repeated
    /// tags are appended.
    void Set(const TagItem &item);
    void Add(const TagItem &item) { items_.push_back(item); }
    /// Applies every pair of `other` with Set().
    void Merge(const TagList &other);
    bool Remove(Tag tag);

    /// Copies borrowed text into storage owned by the list so the list can
    /// outlive the call site. Copies of a persisted list share that storage.
    void Persist();

private:
    std::vector<TagItem> items_;
    std::vector<std::shared_ptr<const std::string>> ownedText_;
};

} // namespace Orvane
