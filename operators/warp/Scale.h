#pragma once
// Scale: the frame resampled by a size factor.
//
// The new size keeps the parity of the old one, so that the frame's centre
// stays on the same pixel grid: with full width w and factor s, x = w x s / 2;
// for an odd w, x = ceil(x - 1/2) + 1/2, else x = ceil(x); the width is
// truncate(2x + 1/2) (5 at 1.0 stays 5; 5 at 0.5 gives 3). The height is
// found the same way from the full frame height (a field counts its frame's
// height, which is even). Proxy and field divide the result as in Resize.
//
// The image is scaled by exactly (X Size, Y Size) about the frame's origin
// (Lock X/Y takes X Size for both). The output's data window is the
// source's grown by the filter's reach (for the filters from Linear up, when
// the edges are not Duplicate and no draft drops the filter) and scaled; the
// common Clipping Mode takes the domain (Domain) or the new frame (Frame).
// A size that is not above 0 gives an output of zeros.
//
// Edges: Canvas reads the canvas colour beyond the source's data window,
// Duplicate repeats its border pixels, on both axes.
//
// CheckRequest asks the input for the output region divided by the sizes
// and widened by the reach (at every edge mode: Duplicate reads the border
// pixels the filter reaches); a size that is not above 0 asks for an empty
// region in the middle of it.
//
// Thread safety: as every tool: Process and CheckRequest on the render
// thread, one request at a time; NotifyChanged on the main thread.
#include "host/flow/Operator.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

class Scale : public ThreadedOperator {
public:
    Scale(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Scale() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void OnDelete() override;

    /// The side a full-resolution side of `full` pixels gets at factor `s`.
    static int ScaledSide(int full, double s);

private:
    /// What one request scales by.
    struct Settings {
        double xSize = 1.0, ySize = 1.0;
        int edges = 0; ///< EdgeMode
        int filter = 0, window = 0;
        bool draftNearest = false;
        double reachX = 0.0, reachY = 0.0; ///< of the filter, in source pixels; 0 when no filter reads around
    };
    Settings ReadSettings(const Request *req) const;

    Input *lockXY_, *xSize_, *ySize_, *edges_, *hiQOnly_;
    AspectInputs aspect_;
    FilterInputs filter_;
    Input *input_;
    Output *output_;
    ResizeTables tables_;
};

} // namespace Orvane
