#include "host/flow/Operator.h"

#include <algorithm>
#include <cstdio>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/PixelMemory.h"

namespace Orvane {

Operator::Operator(const Registry *reg, const ScriptVal &, const TagList &tags) {
    SetRegistry(reg);
    doc_ = static_cast<OrvaneDoc *>(tags.GetPtr(ImgDocument));
}

Operator::~Operator() = default;

OvID Operator::ClassID() const { return GetRegistry() ? GetRegistry()->ID() : OvID(); }

bool Operator::RegAttrB(Tag tag, bool def) const {
    return GetRegistry() ? GetRegistry()->Tags().GetBool(tag, def) : def;
}

int Operator::AddControlPageTagList(const char *name, const TagList &tags) {
    pages_.push_back(PanelPage{name ? name : "", tags});
    pages_.back().tags.Persist();
    return static_cast<int>(pages_.size()) - 1;
}

void Operator::SetControlPageTags(int page, const TagList &tags) {
    if (page < 0 || page >= static_cast<int>(pages_.size())) return;
    pages_[static_cast<size_t>(page)].tags.Merge(tags);
    pages_[static_cast<size_t>(page)].tags.Persist();
}

Input *Operator::AddInputTagList(const char *name, const char *id, const TagList &tags) {
    const std::string fullId = group_.empty() ? std::string(id) : group_ + "." + id;
    if (FindInput(OvID(fullId))) return nullptr;
    const long long last = page_ >= 0 ? page_ : pages_.empty() ? 0 : static_cast<long long>(pages_.size()) - 1;
    const int page = static_cast<int>(tags.GetLong(ControlPage, last));
    inputs_.push_back(
        std::make_unique<Input>(this, name ? name : id, OvID(fullId), tags, static_cast<int>(inputs_.size()), page));
    return inputs_.back().get();
}

void Operator::RemoveInputs(const std::vector<Input *> &inputs) {
    std::vector<int> keptBefore(inputs_.size() + 1, 0); // kept inputs ahead of each old index
    std::vector<std::unique_ptr<Input>> kept;
    for (size_t i = 0; i < inputs_.size(); ++i) {
        keptBefore[i] = static_cast<int>(kept.size());
        std::unique_ptr<Input> &in = inputs_[i];
        if (std::find(inputs.begin(), inputs.end(), in.get()) == inputs.end()) {
            in->index_ = static_cast<int>(kept.size());
            kept.push_back(std::move(in));
            continue;
        }
        in->Disconnect();
        removed_.push_back(std::move(in));
    }
    keptBefore[inputs_.size()] = static_cast<int>(kept.size());
    inputs_ = std::move(kept);
    std::vector<ControlNest> nests;
    for (ControlNest n : nests_) {
        const bool wasEmpty = n.firstInput == n.endInput;
        n.firstInput = keptBefore[static_cast<size_t>(n.firstInput)];
        n.endInput = keptBefore[static_cast<size_t>(n.endInput)];
        if (wasEmpty || n.firstInput != n.endInput) nests.push_back(std::move(n));
    }
    nests_ = std::move(nests);
}

Input *Operator::FindGroupInput(const char *id) const {
    if (!group_.empty())
        if (Input *in = FindInput(OvID(group_ + "." + id))) return in;
    return FindInput(OvID(id));
}

Output *Operator::AddOutputTagList(const char *name, const char *id, const TagList &tags) {
    if (FindOutput(OvID(id))) return nullptr;
    outputs_.push_back(
        std::make_unique<Output>(this, name ? name : id, OvID(id), tags, static_cast<int>(outputs_.size())));
    return outputs_.back().get();
}

void Operator::BeginControlNestTagList(const char *name, const char *id, bool open, const TagList &tags) {
    const int at = static_cast<int>(inputs_.size());
    nests_.push_back(ControlNest{name ? name : "", OvID(id), open, at, at, tags});
    nests_.back().tags.Persist();
    openNests_.push_back(static_cast<int>(nests_.size()) - 1);
}

void Operator::EndControlNest() {
    if (openNests_.empty()) return;
    nests_[openNests_.back()].endInput = static_cast<int>(inputs_.size());
    openNests_.pop_back();
}

Input *Operator::FindInput(OvID id) const {
    for (const auto &in : inputs_)
        if (in->ID() == id) return in.get();
    return nullptr;
}

Output *Operator::FindOutput(OvID id) const {
    for (const auto &out : outputs_)
        if (out->ID() == id) return out.get();
    return nullptr;
}

Input *Operator::FindMainInput(int n) const {
    for (const auto &in : inputs_)
        if (in->MainIndex() == n) return in.get();
    return nullptr;
}

Output *Operator::FindMainOutput(int n) const {
    for (const auto &out : outputs_)
        if (out->MainIndex() == n) return out.get();
    return n == 1 && !outputs_.empty() ? outputs_.front().get() : nullptr;
}

void Operator::NotifyChanged(Input *, Parameter *, double, TagList *) {}
void Operator::CheckRequest(Request *) {}
void Operator::PreProcess(Request *) {}

void Operator::Process(Request *req) {
    Fail(req, "%s: this tool has no processing of its own\n", Name().c_str());
    if (Output *out = FindMainOutput()) req->SetOutputData(out, nullptr);
}

bool UseKROMKernel(const Request *req) {
    const RenderTask *task = req ? req->GetTask() : nullptr;
    return task && task->Device() && !(req->GetFlags() & ReqFlagNoGPU);
}

bool Operator::IsGPUEnabled(Request *req, bool) {
    return UseKROMKernel(req) && !req->IsPreCalc() && RegAttrB(RegSupportsGPUImages);
}

bool Operator::RegInit(Registry *) { return true; }
void Operator::RegCleanup(Registry *) {}

void Operator::FailOutOfMemory(Request *req) {
    Fail(req, "%s: out of memory (time = %f)\n", name_.c_str(), req->Time());
}

void Operator::Fail(Request *req, const char *fmt, ...) {
    // A failure after refused pixel memory says what was needed and the limit.
    if (const std::string why = TakePixelRefusal(); !why.empty()) {
        if (doc_)
            doc_->PrintF(ConsoleError, "%s: %s\n", name_.c_str(), why.c_str());
        else
            std::fprintf(stderr, "%s: %s\n", name_.c_str(), why.c_str());
        return;
    }
    va_list args;
    va_start(args, fmt);
    if (doc_) {
        doc_->VPrintF(ConsoleError, fmt, args);
    } else {
        std::vfprintf(stderr, fmt, args);
    }
    va_end(args);
    (void)req;
}

std::string Operator::FrameFileName(double, const RenderTask *) const { return {}; }

std::string Operator::FrameFilePattern(double, const RenderTask *) const { return {}; }

void ThreadedOperator::ProcessChunk(Request *, int) {}

void ThreadedOperator::DoMultiProcess(Request *req, int count) {
    RunChunks(count, [this, req](int i) { ProcessChunk(req, i); });
}

void ThreadedOperator::RunChunks(int count, const std::function<void(int)> &fn) {
    if (count <= 0) return;
    // Chunks of a few rows amortise scheduling; each chunk still runs whole.
    const int grain = count >= 256 ? 4 : 1;
    ParallelFor(count, fn, grain);
}

void ThreadedOperator::DoMultiProcessRange(const std::function<void(int, int)> &fn, int first, int last) {
    ParallelRange(first, last, fn, 1);
}

} // namespace Orvane
