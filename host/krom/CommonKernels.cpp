#include "host/krom/CommonKernels.h"

#include "host/krom/kernels/BlurKernelParams.h"
#include "host/krom/kernels/ColorKernelParams.h"
#include "host/krom/kernels/DeltaKeyerKernelParams.h"
#include "host/krom/kernels/GeneratorKernelParams.h"
#include "host/krom/kernels/KernelTexts.h"
#include "host/krom/kernels/KeyKernelParams.h"
#include "host/krom/kernels/LensDistortKernelParams.h"
#include "host/krom/kernels/MaskKernelParams.h"
#include "host/krom/kernels/MergeKernelParams.h"
#include "host/krom/kernels/ResizeKernelParams.h"
#include "host/krom/kernels/UltraKeyerKernelParams.h"

namespace Orvane {

const std::vector<CommonKernel> &CommonKernels() {
    static const std::vector<CommonKernel> kernels = {
        {"BrightnessContrast", BrightnessContrastParamsText, kBrightnessContrastKernels},
        {"BrightnessContrastReverse", BrightnessContrastParamsText, kBrightnessContrastKernels},
        {"ColorMatrix", ColorMatrixParamsText, kColorMatrixKernel},
        {"CCProcessPixel", CCProcessPixelParamsText, kColorCorrectorKernels},
        {"CCProcessPixelSimple", CCProcessPixelParamsText, kColorCorrectorKernels},
        {"CCProcessRange", CCProcessRangeParamsText, kColorCorrectorRangeKernel},
        {"CCProcessEqualize", CCProcessEqualizeParamsText, kColorCorrectorEqualizeKernel},
        {"Background", BackgroundParamsText, kBackgroundKernel},
        {"BackgroundGrad", BackgroundGradParamsText, kBackgroundGradKernel},
        {"BlurRows", BlurRowsParamsText, kBlurRowsKernel},
        {"BlurColumns", BlurColumnsParamsText, kBlurColumnsKernel},
        {"Merge", MergeParamsText, kMergeKernel},
        {"MaskMerge", MaskMergeParamsText, kMaskMergeKernel},
        {"DeltaKeyerScreen", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerPreMatte", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerPreMatteCombine", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerThreshold", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerRestoreFringe", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerReplace", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerMaskMerge", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerColorMax", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerReplaceMask", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerStatusDiff", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerStatus", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerStatusSolid", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerStatusGarbage", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerRangesToColor", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerAlphaToColor", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerCopyColor", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"DeltaKeyerSourceAlpha", DeltaKeyerParamsText, kDeltaKeyerKernels},
        {"ChromaKeyer", ChromaKeyerParamsText, kChromaKeyerKernel},
        {"LumaKey", LumaKeyParamsText, kLumaKeyKernel},
        {"DifferenceKeyer", DifferenceKeyerParamsText, kDifferenceKeyerKernel},
        {"LensDistort", LensDistortParamsText, kLensDistortKernel},
        {"ResizeAcross", ResizeParamsText, kResizeKernels},
        {"ResizeDown", ResizeParamsText, kResizeKernels},
        {"UltraKeyer", UltraKeyerParamsText, kUltraKeyerKernel},
        {"UltraKeyerSoft", UltraKeyerSoftParamsText, kUltraKeyerSoftKernel},
        {"UltraKeyerCombine", UltraKeyerCombineParamsText, kUltraKeyerCombineKernel},
        {"UltraKeyerSubtract", UltraKeyerSubtractParamsText, kUltraKeyerSubtractKernel},
    };
    return kernels;
}

const CommonKernel *FindCommonKernel(const std::string &name) {
    for (const CommonKernel &k : CommonKernels())
        if (name == k.name) return &k;
    return nullptr;
}

} // namespace Orvane
