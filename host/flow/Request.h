#pragma once
// Request: one ask of one tool for a result at one time. The engine fills it
// with the inputs' values by priority level, the tool reads them with
// GetInputData, may shape what is fetched next in CheckRequest, and hands its
// results over with SetOutputData.
//
// Regions: the request's region of interest is what the asker needs (absent:
// the whole frame). Each input slot holds the region to ask of that input and
// the input's domain of definition, known from the pre-calculation pass.
//
// Thread safety: a request belongs to one render thread; chunks read it.
#include <atomic>
#include <optional>
#include <vector>

#include "host/core/Object.h"
#include "host/flow/Parameter.h"
#include "host/image/Rect.h"

namespace Orvane {

class Input;
class Output;
class Operator;
class RenderTask;

// Request flags.
constexpr uint32_t ReqFlagQuick = 1u << 0;        ///< interactive: speed over quality
constexpr uint32_t ReqFlagProxy = 1u << 1;        ///< render at the task's proxy scale
constexpr uint32_t ReqFlagPreCalc = 1u << 3;      ///< windows and domains only, no pixels
constexpr uint32_t ReqFlagNoGPU = 1u << 5;        ///< the device must not be used
constexpr uint32_t ReqFlagInteractive = 1u << 17; ///< an interactive view asks: Savers write only when armed
constexpr uint32_t ReqFlagPreview = 1u << 18;     ///< a preview render: Savers never write
constexpr uint32_t ReqFlagTrackStep = 1u << 19;   ///< a frame of a tracking run: trackers step on it
constexpr uint32_t ReqFlagSkipRoI = 1u << 31;     ///< CheckRequest must leave regions alone
/// Per-input flag: fetch this input for pre-calculation only.
constexpr uint32_t InputFlagPreCalc = 8;

/// No time set.
constexpr double TimeUndefined = -2e9;

class ORVANE_API Request {
public:
    Request(Operator *op, Output *asked, double time, uint32_t flags, RenderTask *task);
    ~Request();

    double Time() const { return time_; }
    uint32_t GetFlags() const { return flags_; }
    bool IsPreCalc() const { return (flags_ & ReqFlagPreCalc) != 0; }
    void SetReqFlags(uint32_t set, uint32_t clear = 0) { flags_ = (flags_ | set) & ~clear; }
    int GetPri() const { return priority_; }
    void SetPri(int level) { priority_ = level; }
    Operator *GetOperator() const { return op_; }
    Output *AskedOutput() const { return asked_; }
    RenderTask *GetTask() const { return task_; }
    /// Proxy divisor for this request (1 = full resolution).
    int ProxyScale() const;
    /// The field this request renders (0 or 1, its dominance), or -1 for a whole frame.
    int Field() const { return field_; }
    void SetField(int field) { field_ = field; }

    // ---- the asker's region ----
    const std::optional<ImageDomain> &RoI() const { return roi_; }
    void SetRoI(std::optional<ImageDomain> roi) { roi_ = std::move(roi); }
    /// Domain of definition of the output in preparation (from pre-calculation).
    const std::optional<ImageDomain> &OutputDoD() const { return outputDoD_; }
    void SetOutputDoD(std::optional<ImageDomain> dod) { outputDoD_ = std::move(dod); }

    // ---- inputs ----
    /// The value fetched for `in`; null when absent (optional input, skipped,
    /// or not fetched yet). The request keeps the reference.
    Parameter *GetInputData(const Input *in, int index = 0) const;
    /// The number an input holds for this request: its fetched value, else
    /// its default, else `fallback` (also for a null input).
    double GetInputNumber(const Input *in, double fallback = 0.0) const;
    /// The same for an ID-valued input.
    OvID GetInputID(const Input *in, OvID fallback = OvID()) const;
    /// Gives an input a value instead of fetching it; null: do not fetch it.
    void SetInputData(Input *in, Parameter *value, int index = 0);
    /// Forgets a value set with SetInputData, so the input is fetched again.
    void ClearInputData(Input *in, int index = 0);
    void SetInputRoI(Input *in, const ImageDomain *roi, int index = 0);
    /// The region that will be asked of `in`; absent for the whole frame.
    const std::optional<ImageDomain> &GetInputRoI(const Input *in, int index = 0) const;
    /// The domain of definition of `in`'s image, when known.
    const std::optional<ImageDomain> &GetInputDoD(const Input *in, int index = 0) const;
    void SetInputTime(Input *in, double time, int index = 0);
    double GetInputTime(const Input *in, int index = 0) const;
    double GetInputBaseTime(const Input *in, int index = 0) const { return GetInputTime(in, index); }
    void SetInputFlags(Input *in, uint32_t flags, int index = 0);
    void ClearInputFlags(Input *in, uint32_t flags, int index = 0);
    uint32_t GetInputFlags(const Input *in, int index = 0) const;

    // ---- outputs ----
    /// Hands a result over; the request keeps a reference. Null means failure.
    void SetOutputData(Output *out, Parameter *value);
    void SetOutputData(Output *out, const Ref<Parameter> &value) { SetOutputData(out, value.Get()); }
    Parameter *GetOutputData(const Output *out) const;
    bool HasOutputData(const Output *out) const;

    // Engine side.
    struct Slot {
        Ref<Parameter> data;
        bool fetched = false, skip = false, given = false;
        std::optional<ImageDomain> roi, dod;
        double time = TimeUndefined;
        uint32_t flags = 0;
    };
    Slot &SlotOf(const Input *in);
    const Slot &SlotOf(const Input *in) const;

private:
    Operator *op_;
    Output *asked_;
    double time_;
    uint32_t flags_;
    int priority_ = 0;
    int field_ = -1;
    RenderTask *task_;
    std::optional<ImageDomain> roi_, outputDoD_;
    std::vector<Slot> slots_;
    std::vector<Ref<Parameter>> outputs_;
    std::vector<bool> outputSet_;
};

/// The region of interest of a request (or of one input of it), held for a
/// scope. Absent when the whole frame is wanted.
class ORVANE_API AutoImageRoI {
public:
    explicit AutoImageRoI(const Request *req);
    AutoImageRoI(const Request *req, const Input *in, int index = 0);
    bool IsSet() const { return roi_.has_value(); }
    explicit operator bool() const { return IsSet(); }
    const ImageDomain *Get() const { return roi_ ? &*roi_ : nullptr; }
    const ImageDomain *operator->() const { return Get(); }

private:
    std::optional<ImageDomain> roi_;
};

/// The domain of definition of the output in preparation (or of one input),
/// held for a scope. Absent when unknown.
class ORVANE_API AutoImageDoD {
public:
    explicit AutoImageDoD(const Request *req);
    AutoImageDoD(const Request *req, const Input *in, int index = 0);
    bool IsSet() const { return dod_.has_value(); }
    explicit operator bool() const { return IsSet(); }
    const ImageDomain *Get() const { return dod_ ? &*dod_ : nullptr; }
    const ImageDomain *operator->() const { return Get(); }

private:
    std::optional<ImageDomain> dod_;
};

} // namespace Orvane
