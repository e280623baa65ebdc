#pragma once
// Lists of ID choices for ComboID and MultiButtonID inputs: the label shown
// and the ID saved, in list order.
#include <cstddef>

#include "host/core/OvID.h"
#include "host/core/TagList.h"
#include "host/core/Tags.h"

namespace Orvane {

struct IdChoice {
    const char *label, *id;
};

/// `tags` with the list's items appended.
template <size_t N> TagList WithIdChoices(TagList tags, const IdChoice (&list)[N]) {
    for (const IdChoice &c : list) {
        tags.Add({ListAddItem, c.label});
        tags.Add({ListItemId, OvID(c.id)});
    }
    return tags;
}

/// The position of `id` in the list; 0 for an unknown ID.
template <size_t N> int IdIndex(OvID id, const IdChoice (&list)[N]) {
    for (size_t i = 0; i < N; ++i)
        if (id == OvID(list[i].id)) return static_cast<int>(i);
    return 0;
}

} // namespace Orvane
