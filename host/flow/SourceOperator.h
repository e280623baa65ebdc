#pragma once
// SourceOperator: the base of generators, tools that make images from their
// controls alone. The host adds the image-format controls the class's
// attributes ask for (RegSourceRangeControls: GlobalIn/GlobalOut;
// RegSourceSizeControls: Width/Height; RegSourceAspectControls: PixelAspect;
// RegSourceDepthControls: Depth) on a page "Image", with the document's frame
// format as defaults, and works out the frame a request asks for.
//
// Thread safety: as Operator.
#include "host/flow/ImageFormatInputs.h"
#include "host/flow/Operator.h"

namespace Orvane {

/// The frame a generator renders for one request.
struct SourceFrame {
    int width = 0, height = 0;           ///< full-resolution size from the controls
    double aspectX = 1.0, aspectY = 1.0; ///< pixel aspect
    int depth = 0;                       ///< 0: the image-creation default
    int proxyScale = 1;                  ///< divisor of width and height
    bool field = false;                  ///< the request renders one field
    int fieldDominance = 0;              ///< which field, when `field`
    bool quick = false;                  ///< interactive request on a host that prefers speed
};

class ORVANE_API SourceOperator : public ThreadedOperator {
public:
    SourceOperator(const Registry *reg, const ScriptVal &args, const TagList &tags);

    void FinishConstruction() override;
    /// Reads the image-format controls and the request's proxy and field state.
    SourceFrame GetSourceFrame(Request *req) const;

    Input *InWidth() const { return formatInputs_.width; }
    Input *InHeight() const { return formatInputs_.height; }
    Input *InPixelAspect() const { return formatInputs_.aspect; }
    Input *InDepth() const { return formatInputs_.depth; }
    Input *InGlobalIn() const { return inGlobalIn_; }
    Input *InGlobalOut() const { return inGlobalOut_; }

private:
    ImageFormatInputs formatInputs_;
    Input *inGlobalIn_ = nullptr, *inGlobalOut_ = nullptr;
};

} // namespace Orvane
