#pragma once
// Custom: per-pixel expressions typed by the user, one per output channel,
// over up to three images, eight numbers, four points and four LUT curves.
//
// The expressions are translated by the host's Parser and placed in the Lua
// template of CustomScript.h; LuaJIT compiles the text once per worker state
// (ScriptPool) and runs it with the JIT on, lines handed out from a shared
// counter. Expressions cannot loop, so the only loop is the template's, and it
// polls the tool's abort word once per line; the render's abort sets that word.
// The text is made again only when an expression, the images present or the
// output's channels change.
//
// The output has the first present image's frame, depth and auxiliary
// channels (the document's frame format when no image is linked), and covers
// the region asked of it within the frame. Noise (rand) is seeded per line
// from the time, the line and the Random Seed, so it does not depend on which
// worker took a line.
//
// Thread safety: Process runs on the render thread; the exported ffi_Custom*
// functions are called from the workers' scripts and only read what Process
// prepared, except a number asked at another time, which is evaluated under
// the tool's lock.
#include <array>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "host/color/SplineCurve.h"
#include "host/flow/Operator.h"
#include "operators/modifier/CustomScript.h"
#include "operators/modifier/VariableFields.h"

namespace Orvane {

class Image;
class ScriptPool;
class ScriptState;

class Custom : public ThreadedOperator {
public:
    Custom(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Custom() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;

    // What the exported functions return; `inp` counts from 1.
    double LUTValue(int inp, double v) const;
    double NumberAt(int inp, double time);
    double PointAxisAt(int inp, double time, int axis);

private:
    void AddVariableInputs(int page);
    void AddExpressionInputs();
    /// Makes the script text for this frame's images and output, reusing the last while nothing changed.
    const CustomScript &ScriptFor(Request *req, const std::array<bool, 4> &images, const Image &out);
    void SetFrameGlobals(ScriptState &state, Request *req, const std::array<Image *, 4> &images, Image *out);

    std::array<Input *, 8> numbers_{};
    std::array<Input *, 4> points_{};
    VariableFields numberFields_, pointFields_;
    std::array<Input *, 4> luts_{}, editLuts_{};
    std::array<Input *, 8> setup_{}, intermediate_{};
    std::array<Input *, kCustomChannels> channels_{};
    std::array<Input *, 3> images_{};
    Input *randomSeed_ = nullptr, *reseed_ = nullptr;
    Output *output_ = nullptr;

    // Prepared by Process for the workers.
    const Request *req_ = nullptr;
    std::array<double, 8> numberValues_{};
    std::array<std::array<double, 2>, 4> pointValues_{};
    std::array<std::optional<Spline>, 4> lutSplines_;
    std::array<std::pair<double, double>, 4> lutRanges_{};
    std::mutex evaluateLock_;

    std::string scriptKey_;
    CustomScript script_;
    std::unique_ptr<ScriptPool> pool_;
    int32_t abortWord_ = 0;
};

} // namespace Orvane

// The tool's functions for scripts (LuaJIT FFI), with the C declarations scripts use:
//   float64 ffi_CustomGetLUT(Custom * self, int inp, float64 v)   LUT input inp at v, v clamped to the curve's ends
//   float64 ffi_CustomGetNum(Custom * self, int inp, float64 time) number input inp at time; 0 for no such input
//   float64 ffi_CustomGetPtX(Custom * self, int inp, float64 time), ffi_CustomGetPtY  point input inp's axis
//   Custom * ffi_Custom_cast(void * obj), ScriptObject * ffi_Custom_uncast(Custom * self)
extern "C" {
ORVANE_API double ffi_CustomGetLUT(Orvane::Custom *self, int inp, double v);
ORVANE_API double ffi_CustomGetNum(Orvane::Custom *self, int inp, double time);
ORVANE_API double ffi_CustomGetPtX(Orvane::Custom *self, int inp, double time);
ORVANE_API double ffi_CustomGetPtY(Orvane::Custom *self, int inp, double time);
ORVANE_API Orvane::Custom *ffi_Custom_cast(void *obj);
ORVANE_API Orvane::Object *ffi_Custom_uncast(Orvane::Custom *self);
}
