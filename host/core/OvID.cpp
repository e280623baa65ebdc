#include "host/core/OvID.h"

#include <cstring>
#include <mutex>
#include <string>
#include <unordered_set>

namespace Orvane {
namespace {

struct InternTable {
    std::mutex lock;
    std::unordered_set<std::string> strings; // node-based: element addresses never move
};

InternTable &Table() {
    static InternTable *table = new InternTable; // never destroyed: IDs outlive static teardown
    return *table;
}

} // namespace

OvID::OvID(std::string_view text) {
    if (text.empty()) return;
    InternTable &t = Table();
    std::lock_guard<std::mutex> guard(t.lock);
    text_ = t.strings.emplace(text).first->c_str();
}

OvID OvID::FromInterned(const char *interned) {
    OvID id;
    id.text_ = interned;
    return id;
}

bool operator<(OvID a, OvID b) { return std::strcmp(a.Text(), b.Text()) < 0; }

} // namespace Orvane
