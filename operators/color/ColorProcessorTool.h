#pragma once
// ColorProcessorTool: the frame shared by the colour-managed tools (File LUT,
// Color Space Transform, Gamut). A tool derived from it says which transform
// its settings make (a ColorProcessor, host/color/ColorConfig.h); this class
// runs it over the image:
//  * a transform that cannot be made (a file or colour space not found): the
//    tool's one console line with the reason, and a null output;
//  * a transform that changes nothing, or a mask image (one channel, which
//    colour transforms leave alone): the input is handed on;
//  * otherwise rows (PointRows.h) on the workers, any depth: integer and half
//    pixels are widened to float for the transform and stored back rounded;
//    the canvas colour goes through the same transform once.
// The processor made for a set of settings is kept and reused while the
// settings stay the same, so a render optimises it once.
//
// Thread safety: Process runs on the tool's render thread; the kept
// processor is guarded by a lock, and the rows share the processor read-only.
#include <functional>
#include <string>

#include "host/color/ColorConfig.h"
#include "host/flow/Operator.h"

namespace Orvane {

class ColorProcessorTool : public ThreadedOperator {
public:
    using ThreadedOperator::ThreadedOperator;
    void Process(Request *req) override;

protected:
    /// Adds the main image input and output; call after the tool's own inputs.
    void AddImageLinks();
    /// The transform of this request's settings; null with `error` set when
    /// it cannot be made. `passThrough` set (and null returned) when the
    /// settings ask for nothing.
    virtual ColorProcessorPtr ProcessorFor(Request *req, bool *passThrough, std::string *error) = 0;
    /// The processor kept under `key`, made by `make` when the key changed.
    ColorProcessorPtr Kept(const std::string &key, const std::function<ColorProcessorPtr(std::string *)> &make,
                           std::string *error) {
        return kept_.Get(key, make, error);
    }

private:
    Input *input_ = nullptr;
    Output *output_ = nullptr;
    KeptColorProcessor kept_;
};

} // namespace Orvane
