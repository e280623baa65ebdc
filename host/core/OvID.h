#pragma once
// OvID: an interned identifier. Two OvIDs made from equal text share one
// pointer, so comparison is a pointer comparison. The intern table lives for
// the life of the process and only grows.
//
// Thread safety: constructing an OvID locks the intern table; copying and
// comparing need no lock.
#include <cstddef>
#include <functional>
#include <string_view>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API OvID {
public:
    constexpr OvID() = default;
    explicit OvID(std::string_view text);
    explicit OvID(const char *text) : OvID(std::string_view(text ? text : "")) {}

    /// The text; "" for the null ID.
    const char *Text() const { return text_ ? text_ : ""; }
    bool IsNull() const { return text_ == nullptr; }
    explicit operator bool() const { return text_ != nullptr; }

    friend bool operator==(OvID a, OvID b) { return a.text_ == b.text_; }
    friend bool operator!=(OvID a, OvID b) { return a.text_ != b.text_; }
    /// Orders by text, so sorted output does not depend on addresses.
    friend bool operator<(OvID a, OvID b);

    /// Rebuilds an ID from the pointer Text() returned (as stored in a tag list).
    static OvID FromInterned(const char *interned);

private:
    const char *text_ = nullptr;
};

} // namespace Orvane

template <> struct std::hash<Orvane::OvID> {
    size_t operator()(Orvane::OvID id) const noexcept { return std::hash<const void *>()(id.Text()); }
};
