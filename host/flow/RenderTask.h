#pragma once
// RenderTask: one render (a command-line frame range, an interactive view):
// its abort flag, its proxy scale, whether it is interactive, whether it only
// wants bounds, and the compute device its tools may use. Requests carry
// their task.
//
// The device: a render that may use one holds its IDeviceContext (chosen by
// the command line or the document's UseGPU preference). Execute runs a
// function on the device's thread and waits for its result; QueueExecute
// queues one. Device runs that fail are noted in the task's device log (one
// line per distinct reason), which the command line prints as warnings: the
// tool's rows have made the frame instead.
//
// Tools that write files note each file they completed (NoteFileWritten),
// so the command line can list them even for a frame it abandoned.
//
// Tasks are found by their ID (Find) while they exist.
//
// State hashes: the flow does not change while a task renders, so the hash
// of everything an output depends on at a time (the cache key) is worked out
// once per task and kept, instead of once per request, which would cost a
// chain its length at every tool.
//
// Thread safety: Abort, Execute, QueueExecute, NoteDeviceFailure, DeviceLog,
// NoteFileWritten, FilesWritten and the state hashes may be used from any
// thread; the rest is set before the render starts.
#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class IDeviceContext;
class Output;

class ORVANE_API RenderTask {
public:
    RenderTask();
    ~RenderTask();
    RenderTask(const RenderTask &) = delete;
    RenderTask &operator=(const RenderTask &) = delete;

    /// Stops the render: sets the abort flag and every abort word linked to the task.
    void Abort();
    bool IsAborted() const { return abort_.load(std::memory_order_relaxed); }
    const std::atomic<bool> *AbortFlag() const { return &abort_; }
    /// Links a 32-bit abort word (read atomically by scripts and other code that polls a
    /// word rather than the task) so that Abort sets it to 1; set at once when the task is
    /// already aborted. Unlink before the word goes away.
    void LinkAbortWord(int32_t *word);
    void UnlinkAbortWord(int32_t *word);

    uint64_t ID() const { return id_; }
    /// The live task with this ID, or null.
    static RenderTask *Find(uint64_t id);

    /// The device the task's tools may use (null: rows only).
    IDeviceContext *Device() const { return device_; }
    void SetDevice(IDeviceContext *device) { device_ = device; }
    /// Runs `fn` on the device's thread and gives back its result; false at
    /// once without a device. `name` names the caller in the device log.
    bool Execute(const char *name, const std::function<bool(IDeviceContext *)> &fn);
    /// Queues `fn` on the device's thread; false without a device.
    bool QueueExecute(const char *name, std::function<void(IDeviceContext *)> fn);
    /// Notes that a device run of `name` failed and why.
    void NoteDeviceFailure(const std::string &name, const std::string &reason);
    /// The distinct failures noted so far ("name: reason").
    std::vector<std::string> DeviceLog() const;

    /// The state hash kept for `out` at `time`: absent when none is kept yet;
    /// a kept absent hash means "not cacheable".
    std::optional<std::optional<uint64_t>> FindStateHash(const Output *out, double time) const;
    void KeepStateHash(const Output *out, double time, std::optional<uint64_t> hash);
    struct WrittenFile {
        std::string tool, path;
    };
    /// Notes that `tool` wrote `path` completely.
    void NoteFileWritten(const std::string &tool, const std::string &path);
    /// The files noted, in order, from the `from`-th on.
    std::vector<WrittenFile> FilesWritten(size_t from = 0) const;

    int proxyScale = 1;
    bool interactive = false;
    bool boundsOnly = false;
    /// A look at the unprocessed picture: tools that can hand their main
    /// input on unchanged (Crop) do so.
    bool passThrough = false;
    /// First frame of the render's range (-2e9: not a range render). Savers
    /// number their files from it when asked to.
    double startTime = -2e9;
    /// Last frame of the range (-2e9: not a range render). A render of one
    /// frame (endTime == startTime) may write a file name without a number.
    double endTime = -2e9;

private:
    std::atomic<bool> abort_{false};
    std::mutex abortLock_;
    std::vector<int32_t *> abortWords_;
    uint64_t id_;
    IDeviceContext *device_ = nullptr;
    mutable std::mutex logLock_;
    std::vector<std::string> log_;
    struct HashKey {
        const Output *out;
        double time;
        bool operator==(const HashKey &) const = default;
    };
    struct HashOfKey {
        size_t operator()(const HashKey &k) const {
            return std::hash<const void *>()(k.out) ^ (std::hash<double>()(k.time) * 0x9e3779b97f4a7c15ull);
        }
    };
    mutable std::mutex hashLock_;
    std::unordered_map<HashKey, std::optional<uint64_t>, HashOfKey> stateHashes_;
    std::vector<WrittenFile> written_;
};

} // namespace Orvane
