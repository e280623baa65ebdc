#include "host/core/ScriptInfo.h"

#include <mutex>
#include <typeindex>
#include <unordered_map>

namespace Orvane {
namespace {

struct TypeTable {
    std::mutex lock;
    std::unordered_map<std::type_index, std::type_index> baseOf;
};

TypeTable &Types() {
    static TypeTable *table = new TypeTable; // kept for the process: modules unload after static teardown
    return *table;
}

} // namespace

ScriptInfo::ScriptInfo(unsigned int version, const char *name, const char *help, const char *extra)
    : version_(version), name_(name ? name : ""), help_(help ? help : ""), extra_(extra ? extra : "") {}

ScriptInfo::~ScriptInfo() = default;

void SetTypeInfo(const std::type_info &type, const std::type_info &base) {
    TypeTable &t = Types();
    std::lock_guard<std::mutex> guard(t.lock);
    t.baseOf.insert_or_assign(std::type_index(type), std::type_index(base));
}

void ClearTypeInfo(const std::type_info &type) {
    TypeTable &t = Types();
    std::lock_guard<std::mutex> guard(t.lock);
    t.baseOf.erase(std::type_index(type));
}

bool TypeDerivesFrom(const std::type_info &type, const std::type_info &base) {
    TypeTable &t = Types();
    std::lock_guard<std::mutex> guard(t.lock);
    std::type_index at(type);
    for (int depth = 0; depth < 64; ++depth) {
        if (at == std::type_index(base)) return true;
        auto it = t.baseOf.find(at);
        if (it == t.baseOf.end() || it->second == at) return false;
        at = it->second;
    }
    return false;
}

} // namespace Orvane
