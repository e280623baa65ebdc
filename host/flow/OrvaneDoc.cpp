#include "host/flow/OrvaneDoc.h"

#include <filesystem>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/Operator.h"
#include "host/flow/Parameter.h"
#include "host/flow/ResultCache.h"

namespace Orvane {
namespace {

struct PrefInfo {
    const char *name;
    double def;
};

constexpr PrefInfo Prefs[PREF_Count] = {
    {"FrameWidth", 1920}, {"FrameHeight", 1080}, {"FrameAspectX", 1.0}, {"FrameAspectY", 1.0},
    {"FrameDepth", 8},    {"FrameRate", 24.0},   {"FrameFields", 0},    {"CacheMemoryMB", 2048},
    {"UseGPU", 0},        {"ImageOverlay", 0},   {"MaskFilter", 4},
};

} // namespace

const char *PrefName(PrefID id) { return id >= 0 && id < PREF_Count ? Prefs[id].name : ""; }

OrvaneDoc::OrvaneDoc() : cache_(std::make_unique<ResultCache>()) {
    for (int i = 0; i < PREF_Count; ++i) prefs_[i] = Prefs[i].def;
    cache_->SetBudget(static_cast<size_t>(prefs_[PREF_CacheMemoryMB]) << 20);
}

OrvaneDoc::~OrvaneDoc() {
    for (auto &[name, op] : tools_) {
        op->OnRemoveFromFlow();
        op->OnDelete();
    }
    // Links point between tools; cut them before the tools go.
    for (auto &[name, op] : tools_)
        for (const auto &in : op->Inputs()) in->Disconnect();
    tools_.clear();
}

long OrvaneDoc::GetPrefLong(PrefID id) const { return id >= 0 && id < PREF_Count ? static_cast<long>(prefs_[id]) : 0; }

double OrvaneDoc::GetPrefDouble(PrefID id) const { return id >= 0 && id < PREF_Count ? prefs_[id] : 0.0; }

void OrvaneDoc::SetPref(PrefID id, double value) {
    if (id < 0 || id >= PREF_Count) return;
    prefs_[id] = value;
    if (id == PREF_CacheMemoryMB) cache_->SetBudget(static_cast<size_t>(value > 0 ? value : 0) << 20);
}

uint64_t OrvaneDoc::PrefsHash() const {
    uint64_t h = 0x9ef5;
    for (double v : prefs_) h = HashMix(h, HashDouble(v));
    for (char c : colorConfig_) h = HashMix(h, static_cast<uint64_t>(static_cast<unsigned char>(c)));
    return h;
}

bool OrvaneDoc::PrefIsSet(PrefID id) const { return id >= 0 && id < PREF_Count && prefs_[id] != Prefs[id].def; }

FrameFormat OrvaneDoc::GetFrameFormat() const {
    FrameFormat f;
    f.width = static_cast<int>(prefs_[PREF_FFWidth]);
    f.height = static_cast<int>(prefs_[PREF_FFHeight]);
    f.aspectX = prefs_[PREF_FFAspectX];
    f.aspectY = prefs_[PREF_FFAspectY];
    f.depth = static_cast<int>(prefs_[PREF_FFDepth]);
    f.frameRate = prefs_[PREF_FFFrameRate];
    f.fields = prefs_[PREF_FFFields] != 0;
    return f;
}

void OrvaneDoc::VPrintF(int code, const char *fmt, va_list args) {
    va_list copy;
    va_copy(copy, args);
    const int n = std::vsnprintf(nullptr, 0, fmt, copy);
    va_end(copy);
    std::string text(n > 0 ? static_cast<size_t>(n) : 0, '\0');
    if (n > 0) std::vsnprintf(text.data(), text.size() + 1, fmt, args);
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    ConsoleLine line{code, std::move(text)};
    std::function<void(const ConsoleLine &)> listener;
    {
        std::lock_guard<std::mutex> guard(consoleLock_);
        console_.push_back(line);
        listener = listener_;
    }
    if (listener) listener(line);
}

void OrvaneDoc::PrintF(int code, const char *fmt, ...) {
    va_list args;
    va_start(args, fmt);
    VPrintF(code, fmt, args);
    va_end(args);
}

void OrvaneDoc::PrintF(Request *, int code, const char *fmt, ...) {
    va_list args;
    va_start(args, fmt);
    VPrintF(code, fmt, args);
    va_end(args);
}

std::vector<ConsoleLine> OrvaneDoc::ConsoleLines() const {
    std::lock_guard<std::mutex> guard(consoleLock_);
    return console_;
}

void OrvaneDoc::ClearConsole() {
    std::lock_guard<std::mutex> guard(consoleLock_);
    console_.clear();
}

void OrvaneDoc::SetConsoleListener(std::function<void(const ConsoleLine &)> listener) {
    std::lock_guard<std::mutex> guard(consoleLock_);
    listener_ = std::move(listener);
}

void OrvaneDoc::DocExecute(std::function<void(OrvaneDoc &)> edit, std::string undoName) {
    std::lock_guard<std::mutex> guard(deferredLock_);
    deferred_.emplace_back(std::move(edit), std::move(undoName));
}

std::vector<std::string> OrvaneDoc::RunDeferred() {
    std::vector<std::pair<std::function<void(OrvaneDoc &)>, std::string>> edits;
    {
        std::lock_guard<std::mutex> guard(deferredLock_);
        edits.swap(deferred_);
    }
    std::vector<std::string> names;
    for (auto &[edit, name] : edits) {
        edit(*this);
        names.push_back(std::move(name));
    }
    return names;
}

Operator *OrvaneDoc::AddTool(OvID classId, const std::string &name) {
    if (!ClassRegistry) return nullptr;
    const Registry *row = ClassRegistry->Find(classId);
    if (!row || !row->CanCreate() || !(row->TypeFlags() & RegKindOperator)) return nullptr;
    TagList tags{{ImgDocument, static_cast<const void *>(this)}};
    Object *obj = row->New(ScriptVal(), tags);
    auto *op = dynamic_cast<Operator *>(obj);
    if (!op) {
        delete obj;
        return nullptr;
    }
    Ref<Operator> held = Ref<Operator>::Adopt(op);
    op->FinishConstruction();
    // Inputs that notify hear their first value, unless they ask not to. A
    // notification may add inputs (a file format's options): they are heard too.
    for (size_t i = 0; i < op->Inputs().size(); ++i) {
        Input *in = op->Inputs()[i].get();
        if (in->Tags().GetLong(InputInitialNotify, 1) != 0) in->Changed();
    }
    const char *abbreviation = row->Tags().GetText(RegAbbreviation, row->ClassName());
    const std::string chosen = name.empty() ? UniqueName(abbreviation) : name;
    if (!AddTool(op, chosen)) return nullptr;
    return op;
}

bool IsToolName(const std::string &name) {
    if (name.empty() || !(std::isalpha(static_cast<unsigned char>(name[0])) || name[0] == '_')) return false;
    return std::all_of(name.begin(), name.end(),
                       [](char c) { return std::isalnum(static_cast<unsigned char>(c)) || c == '_'; });
}

bool OrvaneDoc::AddTool(Operator *op, const std::string &name) {
    if (!op || !IsToolName(name) || tools_.count(name) || keptTools_.Find(name)) return false;
    op->SetName(name);
    op->SetDoc(this);
    tools_.emplace(name, Ref<Operator>(op));
    op->OnAddToFlow();
    return true;
}

bool OrvaneDoc::RemoveTool(const std::string &name) {
    auto it = tools_.find(name);
    if (it == tools_.end()) return false;
    Operator *op = it->second.Get();
    for (const auto &out : op->Outputs()) {
        std::vector<Input *> consumers = out->Consumers();
        for (Input *in : consumers) in->Disconnect();
        cache_->Forget(out.get());
    }
    for (const auto &in : op->Inputs()) in->Disconnect();
    op->OnRemoveFromFlow();
    op->OnDelete();
    const std::string place = "Tools." + name;
    for (auto c = comments_.lower_bound(place); c != comments_.end() && c->first.rfind(place, 0) == 0;)
        c = c->first.size() == place.size() || c->first[place.size()] == '.' ? comments_.erase(c) : std::next(c);
    tools_.erase(it);
    return true;
}

Operator *OrvaneDoc::FindTool(const std::string &name) const {
    auto it = tools_.find(name);
    return it == tools_.end() ? nullptr : it->second.Get();
}

std::vector<Operator *> OrvaneDoc::Tools() const {
    std::vector<Operator *> list;
    for (const auto &[name, op] : tools_) list.push_back(op.Get());
    return list;
}

std::string OrvaneDoc::UniqueName(const std::string &base) const {
    std::string stem;
    for (char c : base)
        if (std::isalnum(static_cast<unsigned char>(c)) || c == '_') stem += c;
    if (stem.empty() || std::isdigit(static_cast<unsigned char>(stem[0]))) stem = "Tool" + stem;
    for (int n = 1;; ++n) {
        std::string candidate = stem + std::to_string(n);
        if (!tools_.count(candidate) && !keptTools_.Find(candidate)) return candidate;
    }
}

std::string OrvaneDoc::MapPath(const std::string &name) const {
    if (name.empty() || filePath_.empty()) return name;
    const std::filesystem::path p(name);
    if (p.is_absolute()) return name;
    return (std::filesystem::path(filePath_).parent_path() / p).lexically_normal().string();
}

} // namespace Orvane
