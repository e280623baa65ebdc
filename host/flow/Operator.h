#pragma once
// Operator: the base of every tool. A tool's own text is a constructor that
// declares control pages, inputs and outputs with tag lists, an optional
// NotifyChanged and CheckRequest, and Process. Everything else is the host's:
// fetching inputs, caching, the common controls (PostProcess), threads.
//
// ThreadedOperator adds row-parallel work: DoMultiProcess calls ProcessChunk
// (or a given function) once per chunk on the worker pool and returns when
// all chunks are done. A ThreadedOperator handles one request at a time.
//
// Ownership: a document owns its tools (reference counted); a tool owns its
// inputs and outputs.
//
// Thread safety: constructors, NotifyChanged and value changes run on the
// main thread; CheckRequest and Process run on a render thread, one request
// at a time per tool; chunks run on workers and only read the tool's members.
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "host/core/Object.h"
#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
#include "host/flow/Link.h"

namespace Orvane {

class OrvaneDoc;
class RenderTask;
class Request;

/// A page of a tool's panel.
struct PanelPage {
    std::string name;
    TagList tags;
};

/// A fold of controls under a caption (BeginControlNestTagList).
struct ControlNest {
    std::string name;
    OvID id;
    bool open;
    int firstInput, endInput; ///< inputs [firstInput, endInput) fold under it
    TagList tags;
};

class ORVANE_API Operator : public RefObject {
public:
    Operator(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Operator() override;

    // ---- identity ----
    /// The node's name in its document ("Blur1").
    const std::string &Name() const { return name_; }
    void SetName(std::string name) { name_ = std::move(name); }
    OvID ClassID() const;
    OrvaneDoc *GetDoc() const { return doc_; }
    void SetDoc(OrvaneDoc *doc) { doc_ = doc; }
    /// A registry attribute of the tool's class.
    bool RegAttrB(Tag tag, bool def = false) const;

    // ---- declaring (constructors) ----
    int AddControlPageTagList(const char *name, const TagList &tags);
    /// Merges `tags` into page `page`'s (a tool changing the icon of a page its base made).
    void SetControlPageTags(int page, const TagList &tags);
    Input *AddInputTagList(const char *name, const char *id, const TagList &tags);
    Output *AddOutputTagList(const char *name, const char *id, const TagList &tags);
    void BeginControlNestTagList(const char *name, const char *id, bool open, const TagList &tags);
    void EndControlNest();
    /// While a group is current, added inputs get the ID "group.id", so that
    /// the options two file formats add to one tool never collide.
    void SetCurrentGroup(std::string group) { group_ = std::move(group); }
    const std::string &CurrentGroup() const { return group_; }
    /// The page inputs go on when their tags name none (-1: the last page
    /// added), for inputs a tool adds after construction.
    void SetCurrentPage(int page) { page_ = page; }
    /// Takes inputs out of the tool (a layer deleted): they are disconnected,
    /// the others renumbered, and nests left empty dropped. The objects live
    /// on, detached, until the tool goes, so a caller in the middle of one's
    /// notification is safe. Main thread, between renders.
    void RemoveInputs(const std::vector<Input *> &inputs);

    // ---- links ----
    Input *FindInput(OvID id) const;
    Input *FindInput(const char *id) const { return FindInput(OvID(id)); }
    /// The input `id` of the current group, else the input `id` itself.
    Input *FindGroupInput(const char *id) const;
    Output *FindOutput(OvID id) const;
    Output *FindOutput(const char *id) const { return FindOutput(OvID(id)); }
    Input *FindMainInput(int n = 1) const;
    Output *FindMainOutput(int n = 1) const;
    const std::vector<std::unique_ptr<Input>> &Inputs() const { return inputs_; }
    const std::vector<std::unique_ptr<Output>> &Outputs() const { return outputs_; }
    const std::vector<PanelPage> &Pages() const { return pages_; }
    const std::vector<ControlNest> &Nests() const { return nests_; }

    // ---- life ----
    /// Called by the registry after the constructor: adds the common controls
    /// the class's attributes ask for.
    virtual void FinishConstruction();
    virtual void OnAddToFlow() {}
    virtual void OnRemoveFromFlow() {}
    virtual void OnStartRender() {}
    virtual void OnEndRender() {}
    virtual void OnDelete() {}

    // ---- the tool's own operations ----
    /// An input with InputNotify changed. A null `param` is ignored. Tools end
    /// by calling their base's NotifyChanged.
    virtual void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags);
    /// Called after each priority level of inputs; narrows or widens what is
    /// asked of the inputs still to come.
    virtual void CheckRequest(Request *req);
    virtual void PreProcess(Request *req);
    virtual void Process(Request *req);
    /// The host's common controls (blend, channels, effect mask).
    virtual void PostProcess(Request *req);
    /// A command from a viewer or the command line (ControlCommand.h: CCMD_*),
    /// on the main thread between renders. True when the tool took it; a tool
    /// whose next result changes by it has its cached results dropped by the
    /// caller.
    virtual bool ControlCommand(int command, const TagList &tags) {
        (void)command, (void)tags;
        return false;
    }
    virtual void PreCalcPreProcess(Request *req) { PreProcess(req); }
    virtual void PreCalcProcess(Request *req) { Process(req); }
    virtual void PreCalcPostProcess(Request *req) { PostProcess(req); }
    /// Whether a device path may run for this request: the render has a
    /// device, the request does not forbid it (ReqFlagNoGPU), it is no
    /// pre-calculation, and the class reads device images
    /// (RegSupportsGPUImages). `forKernel`: the tool asks for its own kernel
    /// (rather than a host service's).
    virtual bool IsGPUEnabled(Request *req, bool forKernel);
    virtual std::string GetTitle() const { return name_; }
    /// For a tool that writes files: the file the frame at `time` of
    /// `task`'s render goes to; "" for other tools.
    virtual std::string FrameFileName(double time, const RenderTask *task) const;
    /// The files FrameFileName chooses from at `time`, in display form
    /// ("out.####.exr", or the one file's name); "" for other tools.
    virtual std::string FrameFilePattern(double time, const RenderTask *task) const;

    /// True for a class whose processing is not built yet: documents keep
    /// its saved values as they are.
    virtual bool IsPlaceholder() const { return false; }
    /// Document entries this program does not understand, kept to be written
    /// back unchanged: unknown inputs, and other keys of the tool's table.
    ScriptVal &KeptInputs() { return keptInputs_; }
    ScriptVal &KeptFields() { return keptFields_; }

    /// Serialises the walk of one request through this tool.
    std::recursive_mutex &RequestLock() { return requestLock_; }

    /// Class-level start-up and shut-down hooks of operator rows.
    static bool RegInit(Registry *reg);
    static void RegCleanup(Registry *reg);

    // Inputs the host adds to every tool (FinishConstruction); null when the
    // class's attributes leave them out.
    struct CommonInputs {
        Input *clippingMode = nullptr; ///< tools with a main image input that accept domains
        Input *blend = nullptr;
        Input *process[4] = {nullptr, nullptr, nullptr, nullptr};
        Input *effectMask = nullptr, *maskChannel = nullptr, *maskInvert = nullptr, *multiplyByMask = nullptr;
        /// Motion blur (MotionBlur.h): tools with an image output.
        Input *motionBlur = nullptr, *motionQuality = nullptr, *shutterAngle = nullptr, *centerBias = nullptr,
              *sampleSpread = nullptr;
    };
    const CommonInputs &Common() const { return common_; }
    /// The clipping mode of this request: the tool's own ClippingMode input,
    /// the host's common one, or ClippingMode_None.
    OvID GetClippingMode(const Request *req) const;

protected:
    /// Writes one console line under the error code, starting with the tool's
    /// name; after a refused pixel allocation the line says what was needed
    /// and the memory limit instead (PixelMemory.h).
    void Fail(Request *req, const char *fmt, ...) __attribute__((format(printf, 3, 4)));
    /// Fail with the line every tool gives when memory for its result was not
    /// to be had: "NAME: out of memory (time = T)", or the refusal above.
    void FailOutOfMemory(Request *req);

private:
    std::string name_, group_;
    int page_ = -1;
    OrvaneDoc *doc_ = nullptr;
    std::vector<PanelPage> pages_;
    std::vector<ControlNest> nests_;
    std::vector<int> openNests_;
    std::vector<std::unique_ptr<Input>> inputs_, removed_;
    std::vector<std::unique_ptr<Output>> outputs_;
    CommonInputs common_;
    std::recursive_mutex requestLock_;
    ScriptVal keptInputs_ = ScriptVal::Table(), keptFields_ = ScriptVal::Table();
};

/// Whether device kernels are wanted at all for this request: its render has
/// a device and the request does not forbid it.
ORVANE_API bool UseKROMKernel(const Request *req);

class ORVANE_API ThreadedOperator : public Operator {
public:
    using Operator::Operator;

    /// Calls ProcessChunk(req, i) for i in [0, count) on the workers.
    void DoMultiProcess(Request *req, int count);
    /// The same with a function of the tool in place of ProcessChunk.
    template <class T> void DoMultiProcess(void (T::*fn)(Request *, int), Request *req, int count) {
        T *self = static_cast<T *>(this);
        RunChunks(count, [self, fn, req](int i) { (self->*fn)(req, i); });
    }
    void DoMultiProcess(const std::function<void(int)> &fn, int count) { RunChunks(count, fn); }
    /// Hands contiguous ranges [begin, end) of [first, last) to the workers.
    void DoMultiProcessRange(const std::function<void(int, int)> &fn, int first, int last);

    /// One chunk of DoMultiProcess; chunks share the tool's members read-only.
    virtual void ProcessChunk(Request *req, int chunk);

private:
    void RunChunks(int count, const std::function<void(int)> &fn);
};

} // namespace Orvane
