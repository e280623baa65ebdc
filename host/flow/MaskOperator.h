#pragma once
// MaskOperator: the base of mask tools. A mask tool makes a single-channel
// image (the value in the alpha place) that other tools take on their Effect
// Mask input; this base owns what all masks share (docs/MASKS.md):
//
// - the common controls, in this order: Level, Filter, SoftEdge, Passes,
//   BorderWidth, PaintMode, Invert, Solid, JoinStyle, MiterLimit, CapStyle,
//   WritePosition, WriteLength; the tool adds its own inputs after them;
// - the Image page (Width, Height, PixelAspect, Depth of the mask, following
//   the document's frame format), ClippingMode and the EffectMask input (the
//   mask below this one), added after the tool's inputs;
// - the mask image of a request: PreProcess makes it for the rectangle the
//   tool gave with SetMaskRegion, the tool's Process fills it (GetMaskImage)
//   and sets its canvas value, and PostProcess finishes it: soft edge, level,
//   paint mode against the incoming mask, windows.
//
// A tool's PreProcess: compute the pixel rectangle its shape can touch (in
// the mask's pixels), SetMaskRegion(req, rect), then MaskOperator::PreProcess.
// Without a region the mask covers everywhere it may be needed.
//
// Thread safety: as ThreadedOperator. The mask image and region are per
// request scratch: a tool handles one request at a time.
#include <optional>

#include "host/flow/ImageFormatInputs.h"
#include "host/flow/Operator.h"
#include "host/image/Image.h"

namespace Orvane {

/// The soft-edge filters, as the Filter buttons list them.
enum MaskFilter : int {
    MaskFilterBox,
    MaskFilterBartlett,
    MaskFilterMultiBox,
    MaskFilterGaussian,
    MaskFilterFastGaussian,
    MaskFilterCount
};
/// The Filter button IDs, by MaskFilter.
ORVANE_API extern const char *const MaskFilterID[MaskFilterCount];
/// The filter of an ID; "Soften" of older documents is Multi-box; unknown IDs
/// give Fast Gaussian.
ORVANE_API int MaskFilterOf(OvID id);
/// The blur kind (BlurTypes) and pass count a filter runs with: Box is one
/// pass of the multi-box kernel whatever `passes` says.
ORVANE_API void MaskFilterBlur(int filter, int passes, int &blurType, int &blurPasses);

/// The settings of the finishing merge of one mask (a tool's own controls, or
/// one layer's).
struct MaskMergeSettings {
    int paintMode = 0; ///< PaintMode
    double level = 1.0;
    int filter = MaskFilterFastGaussian;
    double softEdge = 0.0; ///< blur size as a fraction of the mask's width
    int passes = 4;
    bool clipToFrame = false; ///< ClippingMode is Frame: the soft edge stays inside the frame
};

/// The mask image's format for a request: size at the request's proxy scale.
struct MaskFormat {
    int width = 0, height = 0;
    double aspectX = 1.0, aspectY = 1.0;
    int depth = DepthAFlt32; ///< 1..4
    ImgRectI Frame() const { return ImgRectI(0, 0, width, height); }
};

/// The common controls of a mask, Level to WriteLength in this order. A mask
/// tool has one set; each layer of a multi-layer mask adds its own (under the
/// layer's group, so its IDs read "Layer.Level").
struct ORVANE_API MaskControls {
    Input *level = nullptr, *filter = nullptr, *softEdge = nullptr, *passes = nullptr, *borderWidth = nullptr,
          *paintMode = nullptr, *invert = nullptr, *solid = nullptr, *joinStyle = nullptr, *miterLimit = nullptr,
          *capStyle = nullptr, *writePosition = nullptr, *writeLength = nullptr;

    /// Adds the controls to `op` on its current page (and in its current group).
    void Add(Operator *op);
    /// Passes shows for Multi-box only; an older document's "Soften" becomes
    /// Multi-box. Call from the owner's NotifyChanged.
    void NotifyChanged(Input *in, Parameter *param);
    /// The merge settings of a request (clipToFrame left false: the tool's).
    MaskMergeSettings MergeSettings(Request *req) const;
};

class ORVANE_API MaskOperator : public ThreadedOperator {
public:
    MaskOperator(const Registry *reg, const ScriptVal &args, const TagList &tags);

    void FinishConstruction() override;
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    /// Makes the mask image for the region the tool gave and hands it over as
    /// the output, so that PostProcess runs.
    void PreProcess(Request *req) override;
    /// The finishing merge (MergeMasks), the mask-domain flag and the valid window.
    void PostProcess(Request *req) override;

    /// Samples per pixel of curve length along the soft band between an inner
    /// and an outer polyline: the longer line's length in pixels times this
    /// gives the facing sample pairs, so 0.5 is a pair every 2 pixels. The
    /// band is linear between samples; at that spacing a curve of radius r
    /// pixels strays at most 0.5 / r pixels from its chords.
    static constexpr double kBandTessellation = 0.5;

    // ---- the mask of a request ----
    /// The pixels the mask may be needed over: the consumer's region (the
    /// frame when it asks for everything), widened by the soft edge's reach.
    /// Nothing when the region is empty: the tool then does no work.
    std::optional<ImgRectI> GetMaskDoD(Request *req) const;
    /// The rectangle the tool's shape can touch, for the next PreProcess.
    void SetMaskRegion(Request *req, const ImgRectI &rect);
    /// Makes a mask image (zeroed, rows allocated unless pre-calculating or
    /// empty) and makes it the request's mask. Tags: MaskRegion (the
    /// rectangle; it grows by the soft edge's reach and is cut to
    /// GetMaskDoD; absent: all of GetMaskDoD), MaskDepth, MaskReach (the
    /// reach to allow for, in place of the tool's). Null when memory ran out.
    Ref<Image> CreateMaskImage(Request *req, const TagList &tags);
    Image *GetMaskImage(Request *req) const;
    void SetMaskImage(Request *req, Ref<Image> mask);
    MaskFormat GetMaskFormat(Request *req) const;
    /// The tool's merge settings; neutral (level 1, no soft edge) for a tool
    /// whose mask already holds the incoming one.
    MaskMergeSettings GetMergeSettings(Request *req) const;
    /// Pixels the soft edge of `s` reaches from a shape's edge (0 without one).
    int SoftEdgeReach(const MaskMergeSettings &s, const MaskFormat &f) const;

    // ---- the finishing merge ----
    /// Joins `mask` (M, this tool's; consumed) with `incoming` (I, may be
    /// null) under `s`, keeping the result inside `valid`: paint mode None
    /// hands I on; soft edge; window union; an empty clear Merge hands I on;
    /// re-lay; merge; canvas. Null on abort or when memory ran out.
    Ref<Image> MergeMasks(Request *req, Ref<Image> mask, Image *incoming, const MaskMergeSettings &s,
                          const ImgRectI &valid);
    /// A copy of `mask` at `depth` (0: the larger of the two masks' depths)
    /// over `window` (null: the union of both data windows); the canvas
    /// beyond the old window. Null on abort or when memory ran out.
    static Ref<Image> ChangeDataWindowAndDepth(Request *req, Image *mask, const Image *incoming, int depth,
                                               const ImgRectI *window);
    /// mask := mode(level, incoming, mask) over mask's data window, in place;
    /// the incoming mask's canvas (0 without one) beyond its window. Rows in
    /// parallel. False on abort or a failed download.
    static bool MergeCPU(Request *req, Image *mask, const Image *incoming, int mode, double level);
    /// The same with the device kernel "MaskMerge"; false when it could not run.
    static bool MergeGPU(Request *req, Image *mask, const Image *incoming, int mode, double level);

    // ---- inputs ----
    Input *InLevel() const { return controls_.level; }
    Input *InFilter() const { return controls_.filter; }
    Input *InSoftEdge() const { return controls_.softEdge; }
    Input *InPasses() const { return controls_.passes; }
    Input *InBorderWidth() const { return controls_.borderWidth; }
    Input *InPaintMode() const { return controls_.paintMode; }
    Input *InInvert() const { return controls_.invert; }
    Input *InSolid() const { return controls_.solid; }
    Input *InJoinStyle() const { return controls_.joinStyle; }
    Input *InMiterLimit() const { return controls_.miterLimit; }
    Input *InCapStyle() const { return controls_.capStyle; }
    Input *InWritePosition() const { return controls_.writePosition; }
    Input *InWriteLength() const { return controls_.writeLength; }
    Output *OutMask() const { return output_; }
    const MaskControls &Controls() const { return controls_; }

protected:
    /// True for a tool that merges the incoming mask into its own as it goes
    /// (layer by layer): PostProcess then hands the mask on without merging
    /// the incoming one again, and the tool's own merge settings are neutral.
    virtual bool HoldsIncomingMask() const { return false; }

private:
    /// The consumer's region with endless sides cut to the frame, or the frame.
    ImgRectI NeededRect(Request *req, const ImgRectI &frame) const;
    Ref<Image> SoftEdgeOf(Request *req, Image *mask, int depth, const MaskMergeSettings &s);

    MaskControls controls_;
    Output *output_;
    ImageFormatInputs formatInputs_;
    std::optional<ImgRectI> region_;
    Ref<Image> mask_;
};

} // namespace Orvane
