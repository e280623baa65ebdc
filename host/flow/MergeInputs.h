#pragma once
// MergeInputs: the group of inputs a tool adds to itself to lay a foreground
// onto a background, and the compositing operation behind them. Merge has
// one; MultiMerge one per layer (made while the tool's current group is
// "Layer%d", so the layer's inputs are "Layer%d.Center" and so on). The
// controls and every formula are in docs/MERGE.md.
//
// Use: make the group in the tool's constructor (or when a layer is added),
// forward the tool's NotifyChanged to it, and in Process build a
// TransformMatrix on the background's value and call Merge.
//
// Inputs (IDs in the current group; pages: the tool's "Merge" page, else its
// current one; the channel switches on its "Channels" page when it has one;
// the depth controls on a page "Depth Merge"):
//   Foreground        image input (unless the tool gives its own), taking
//                     pending transforms (LinkSecondDataType TransformMatrix)
//   Center            point (0.5, 0.5): where the foreground's centre lands,
//                     0..1 across the background's output frame, y up
//   Size, XSize, YSize  scale (1, 1, 1; the foreground keeps its pixel size)
//   Angle             degrees, anticlockwise
//   FlipHoriz, FlipVert
//   Edges             Canvas, Wrap, Duplicate, Mirror: beyond the foreground
//   FilterMethod      the resampling filter (RszTypes, Linear by default)
//   WindowMethod      the window of Sinc and Bessel
//   ApplyMode         Normal, Screen, Dissolve, ... (MergeApplyMode order)
//   Operator          Over, In, Held Out, Atop, XOr (Normal only)
//   SubtractiveAdditive, AlphaGain, BurnIn, MergeBlend
//   MergeRed, MergeGreen, MergeBlue, MergeAlpha   the channels merged
//   PerformDepthMerge, ZLargerIsNearer
//   UseReferenceSize  scale the foreground by the background's frame over the
//                     tool's reference size (shown when the tool has one)
//
// Thread safety: construction and NotifyChanged on the main thread; Merge on
// the tool's render thread (its rows on the workers).
#include <string>
#include <vector>

#include "host/core/TagList.h"
#include "host/image/Matrix3.h"

namespace Orvane {

class Input;
class Operator;
class Parameter;
class Request;
class TransformMatrix;

class ORVANE_API MergeInputs {
public:
    /// Adds the group's inputs to `tool`. `foreground`: the tool's own
    /// foreground input, or null to add one ("Foreground" in the current
    /// group) with connector number `mainIndex` (0: none).
    MergeInputs(Operator *tool, Input *foreground = nullptr, int mainIndex = 0);

    /// Keeps dependent inputs shown or hidden (Operator for Normal, the
    /// window for Sinc and Bessel). Call from the tool's NotifyChanged.
    void NotifyChanged(Input *in, Parameter *param, double time);
    /// The reference frame size inputs of the tool (Merge's Width and
    /// Height); UseReferenceSize is shown once they are given.
    void SetReferenceSize(Input *width, Input *height);

    /// Lays the foreground the request holds onto `bg`: reads the controls
    /// for `req`'s time, places the foreground, resamples it once and
    /// composites it onto bg's source (TransformMatrix::
    /// MergeConcatenateTagList), which bg keeps with its pending matrix.
    /// Without a foreground bg stays as it is. `tags` may add to or override
    /// what the controls give (Mrg* and Xf* tags). False when a step failed
    /// (no background image, out of memory, an abort): the tool's console
    /// line is written here (none for an abort).
    bool Merge(Request *req, TransformMatrix *bg, const TagList &tags);

    /// The placement for `req`: foreground output pixels (a frame of
    /// fgW x fgH, pixel aspect fgAspect = XScale / YScale) to background
    /// output pixels (bgW x bgH, bgAspect) by the Center, Size, Angle and
    /// flip controls.
    Matrix3 PlacementOf(const Request *req, int fgW, int fgH, double fgAspect, int bgW, int bgH, double bgAspect) const;

    Input *ForegroundInput() const { return foreground_; }
    /// Every input of the group, in the order added (the foreground first
    /// when the group made it).
    const std::vector<Input *> &AllInputs() const { return all_; }

private:
    void ShowFor(int mode, int filter);
    void Report(Request *req, const char *what) const;

    Operator *tool_;
    Input *foreground_ = nullptr;
    Input *center_ = nullptr, *size_ = nullptr, *xSize_ = nullptr, *ySize_ = nullptr, *angle_ = nullptr;
    Input *flipH_ = nullptr, *flipV_ = nullptr, *edges_ = nullptr, *filter_ = nullptr, *window_ = nullptr;
    Input *mode_ = nullptr, *operator_ = nullptr, *additive_ = nullptr, *alphaGain_ = nullptr;
    Input *burnIn_ = nullptr, *blend_ = nullptr;
    Input *channels_[4] = {nullptr, nullptr, nullptr, nullptr};
    Input *zMerge_ = nullptr, *zLarger_ = nullptr, *useReference_ = nullptr;
    Input *refWidth_ = nullptr, *refHeight_ = nullptr;
    std::vector<Input *> all_;
};

} // namespace Orvane
