#include "host/flow/RenderTask.h"

#include <algorithm>
#include <map>

#include "host/krom/DeviceContext.h"

namespace Orvane {
namespace {

// The live tasks by ID.
std::mutex s_tasksLock;
std::map<uint64_t, RenderTask *> s_tasks;
uint64_t s_nextId = 1;

} // namespace

void RenderTask::Abort() {
    abort_.store(true, std::memory_order_relaxed);
    std::lock_guard<std::mutex> hold(abortLock_);
    for (int32_t *word : abortWords_) std::atomic_ref<int32_t>(*word).store(1, std::memory_order_relaxed);
}

void RenderTask::LinkAbortWord(int32_t *word) {
    std::lock_guard<std::mutex> hold(abortLock_);
    abortWords_.push_back(word);
    if (IsAborted()) std::atomic_ref<int32_t>(*word).store(1, std::memory_order_relaxed);
}

void RenderTask::UnlinkAbortWord(int32_t *word) {
    std::lock_guard<std::mutex> hold(abortLock_);
    std::erase(abortWords_, word);
}

RenderTask::RenderTask() {
    std::lock_guard<std::mutex> lock(s_tasksLock);
    id_ = s_nextId++;
    s_tasks[id_] = this;
}

RenderTask::~RenderTask() {
    if (device_) device_->Finish(); // queued runs may still use this task
    std::lock_guard<std::mutex> lock(s_tasksLock);
    s_tasks.erase(id_);
}

RenderTask *RenderTask::Find(uint64_t id) {
    std::lock_guard<std::mutex> lock(s_tasksLock);
    auto it = s_tasks.find(id);
    return it == s_tasks.end() ? nullptr : it->second;
}

bool RenderTask::Execute(const char *, const std::function<bool(IDeviceContext *)> &fn) {
    IDeviceContext *device = device_;
    if (!device) return false;
    return device->Execute([&] { return fn(device); });
}

bool RenderTask::QueueExecute(const char *, std::function<void(IDeviceContext *)> fn) {
    IDeviceContext *device = device_;
    if (!device) return false;
    device->QueueExecute([device, fn = std::move(fn)] { fn(device); });
    return true;
}

void RenderTask::NoteDeviceFailure(const std::string &name, const std::string &reason) {
    const std::string line = name + ": " + reason;
    std::lock_guard<std::mutex> lock(logLock_);
    if (std::find(log_.begin(), log_.end(), line) == log_.end()) log_.push_back(line);
}

std::vector<std::string> RenderTask::DeviceLog() const {
    std::lock_guard<std::mutex> lock(logLock_);
    return log_;
}

std::optional<std::optional<uint64_t>> RenderTask::FindStateHash(const Output *out, double time) const {
    std::lock_guard<std::mutex> lock(hashLock_);
    const auto it = stateHashes_.find({out, time});
    if (it == stateHashes_.end()) return std::nullopt;
    return it->second;
}

void RenderTask::KeepStateHash(const Output *out, double time, std::optional<uint64_t> hash) {
    // A long render asks at many times; the memo is only a shortcut, so it starts afresh past a bound.
    constexpr size_t kMostKept = 1 << 20;
    std::lock_guard<std::mutex> lock(hashLock_);
    if (stateHashes_.size() >= kMostKept) stateHashes_.clear();
    stateHashes_[{out, time}] = hash;
}

void RenderTask::NoteFileWritten(const std::string &tool, const std::string &path) {
    std::lock_guard<std::mutex> lock(logLock_);
    written_.push_back({tool, path});
}

std::vector<RenderTask::WrittenFile> RenderTask::FilesWritten(size_t from) const {
    std::lock_guard<std::mutex> lock(logLock_);
    return {written_.begin() + static_cast<ptrdiff_t>(std::min(from, written_.size())), written_.end()};
}

} // namespace Orvane
