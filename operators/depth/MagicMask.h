#pragma once
// MagicMask: a matte for an object the user marks with strokes
// (MagicMaskStrokes.h). The segmentation is the kernel "GetObjectMask",
// served by whichever provider is registered (host/krom/KernelProvider.h);
// the tool owns the strokes, the tracking run and the matte's refinement.
//
// Process: the core step (DoMagicMask) runs the kernel on the input frame
// and puts the matte in the alpha of a copy of the input; the "Matte" page
// then works on that alpha in this order: blur (Filter, Blur, Num Passes),
// erode/dilate (a square minimum or maximum of |ErodeDilate| x the frame's
// width pixels), threshold and gamma, invert, the solid and garbage mattes;
// last, the colour is multiplied by the new alpha when Post Multiply Image is
// on. RestoreFringe is kept with the document but has no effect yet.
//
// The run: CCMD_Track (ControlCommand.h) or a track button steps frame by
// frame from its first frame; each frame's propagated mask ("cachePropMaskOut")
// is kept in memory and handed to the next frame as "cachePropMaskIn". The
// first frame of a run is its reference frame: ReferenceTime takes it, and
// ProcessedFramesLow/High take the span the run covered. The kept frames
// (propagated mask and raw matte, keyed by the strokes, mode, refine range
// and algorithm version) let a later render of a tracked frame reuse the
// run's matte. Each frame of a run, and each frame a render carries through
// the tracked span, is also written to the disk cache (MagicMaskCache.h,
// keyed besides by the source frame's pixels), which a later process reads
// before carrying the masks again from the reference frame (CatchUp). A frame
// outside the span is computed on its own (no propagated mask). Clear Cache
// deletes the tool's files and the kept frames; Regenerate All tracks the
// span again from the reference frame out to its ends.
//
// Stroke buttons: Delete Strokes removes the last stroke of the list Stroke
// Mode draws into (there is no selection); Clear Current removes the strokes
// keyed on the current frame, Clear Range those keyed within the render
// range, Clear All every stroke; with constant strokes the first two clear
// them all too (a constant holds on every frame).
//
// Run kinds: -1 no run, 4 a forward leg, 0 a reverse leg (or a forward leg
// that reached the render end, left open for a reverse leg to follow).
//
// Thread safety: the run's state and the mask cache are under the tool's
// state lock; Process may run on a render thread while ControlCommand waits
// for it on the main thread. NotifyChanged and ControlCommand run on the
// main thread between renders.
#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>

#include "host/core/Tags.h"
#include "host/flow/Operator.h"

namespace Orvane {

class Image;
class MaskInputs;
class RenderTask;

/// The tool's attribute (construction tags) giving the kernel's algorithm version (default 1).
constexpr Tag MagicMaskAlgorithmVersion = 0x1000012c;

class MagicMask : public ThreadedOperator {
public:
    MagicMask(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~MagicMask() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void Process(Request *req) override;
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    bool ControlCommand(int command, const TagList &tags) override;
    void OnEndRender() override;

    enum class Step { Done, Skipped, Failed };
    /// The core step: `out`'s alpha := the kernel's matte of `in` at `time`.
    /// Skipped (nothing done) for a no-data image, an output window empty in
    /// width or height, or windows that differ; Failed with the tool's
    /// console line when no provider serves the kernel or it fails.
    Step DoMagicMask(double time, Request *req, Image *in, Image *out);

    static constexpr int RunNone = -1, RunReverse = 0, RunForward = 4;
    /// Steps from `from` to `to` (either way); false with the tool's line when nothing was done.
    bool RunTracking(double from, double to, RenderTask *task);

private:
    struct Kept {
        Ref<Image> propMask, matte;
        uint64_t key = 0;
    };
    struct Settings; // what one request renders with

    Settings ReadSettings(Request *req) const;
    bool RunKernel(double time, Request *req, const Settings &s, const Image *in, const Image *propIn,
                   Ref<Image> &propOut, Ref<Image> &matte);
    /// For a render of a frame inside the tracked span: carries the masks from the reference frame (or the last
    /// frame the render did) up to the frame before `time`, giving `propIn` for this frame. False with the tool's
    /// line when a source frame is missing or of another size.
    bool CatchUp(double time, Request *req, const Settings &s, const Image *in, Ref<Image> &propIn);
    /// The frame lies in the span the runs covered (Processed Frames).
    bool InTrackedSpan(Request *req, double time) const;
    /// The disk cache's matte (and propagated mask) of `frame` under `key`, in images like `like`; null on a miss.
    Ref<Image> LoadCached(int frame, uint64_t key, const Image *like, Ref<Image> *propMask = nullptr) const;
    void ClearStrokes(const std::function<bool(double keyTime)> &pick);
    void DeleteLastStroke(double time);
    void RegenerateAll();
    bool RefineMatte(Request *req, Ref<Image> &out);
    bool ErodeDilate(Request *req, Image *img, double amount) const;
    /// A frame of a run needs a source image of the run's frame size; false with the tool's line.
    bool CheckRunSource(Request *req, const Image *src);
    void EndRun(RenderTask *task);

    Input *mode_, *refineRange_, *strokeMode_, *deleteStrokes_, *trackReverse_, *trackBidirectional_, *trackForward_,
        *trackReverseOne_, *stopTracking_, *trackForwardOne_, *clearCurrent_, *clearRange_, *clearAll_, *goToStart_,
        *goToRefTime_, *goToEnd_, *cacheRegen_, *cacheClear_, *referenceTimeIn_, *processedLow_, *processedHigh_,
        *postMultiply_;
    Input *filter_, *matteBlur_, *passes_, *erodeDilate_, *matteGamma_, *lowThreshold_, *highThreshold_,
        *restoreFringe_, *invertMatte_;
    std::unique_ptr<MaskInputs> solid_, garbage_;
    Input *strokes_, *input_;
    Output *output_;

    uint32_t operatorId_;
    int algoVer_;
    std::atomic<bool> stop_{false};
    std::atomic<bool> sourceSeen_{false}; ///< the run's frame reached Process with an image

    mutable std::mutex state_;
    bool isTracking_ = false;
    int runKind_ = RunNone;
    double referenceTime_ = 0.0;
    std::optional<std::pair<double, double>> processed_; ///< frames the runs covered
    double presentTime_ = 0.0;                           ///< the frame the run is at
    double legStart_ = 0.0, runEnd_ = 0.0;
    int step_ = 1;
    std::optional<std::pair<int, int>> runSize_; ///< the frame size of the run's first frame
    RenderTask *runTask_ = nullptr;              ///< the task of the leg under way
    std::map<int, Kept> kept_;
    struct Chain {
        int frame;
        Ref<Image> propMask;
        uint64_t key;
    };
    std::optional<Chain> chain_;  ///< where a render's carrying of the masks stands
    std::optional<int> lastCall_; ///< the frame of the provider's last call by this tool
};

} // namespace Orvane
