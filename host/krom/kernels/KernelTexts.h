#pragma once
// Kernel texts of the common library (the *Params.h headers have their blocks).
namespace Orvane {
/// "BrightnessContrast" and "BrightnessContrastReverse".
extern const char kBrightnessContrastKernels[];
/// "CCProcessPixel" and "CCProcessPixelSimple".
extern const char kColorCorrectorKernels[];
/// "CCProcessRange".
extern const char kColorCorrectorRangeKernel[];
/// "CCProcessEqualize".
extern const char kColorCorrectorEqualizeKernel[];
/// "ColorMatrix".
extern const char kColorMatrixKernel[];
/// "Background".
extern const char kBackgroundKernel[];
/// "BackgroundGrad".
extern const char kBackgroundGradKernel[];
/// "BlurRows".
extern const char kBlurRowsKernel[];
/// "BlurColumns".
extern const char kBlurColumnsKernel[];
/// "Merge".
extern const char kMergeKernel[];
/// "MaskMerge".
extern const char kMaskMergeKernel[];
/// The Delta Keyer's: "DeltaKeyer" followed by Screen, PreMatte, PreMatteCombine, Threshold, RestoreFringe,
/// Replace, ReplaceMask, MaskMerge, ColorMax, Status, StatusDiff, StatusSolid, StatusGarbage, RangesToColor,
/// AlphaToColor, CopyColor, SourceAlpha.
extern const char kDeltaKeyerKernels[];
/// "ChromaKeyer".
extern const char kChromaKeyerKernel[];
/// "LumaKey".
extern const char kLumaKeyKernel[];
/// "DifferenceKeyer".
extern const char kDifferenceKeyerKernel[];
/// "LensDistort".
extern const char kLensDistortKernel[];
/// "ResizeAcross" and "ResizeDown".
extern const char kResizeKernels[];
/// "UltraKeyer", "UltraKeyerSoft", "UltraKeyerCombine", "UltraKeyerSubtract".
extern const char kUltraKeyerKernel[];
extern const char kUltraKeyerSoftKernel[];
extern const char kUltraKeyerCombineKernel[];
extern const char kUltraKeyerSubtractKernel[];
} // namespace Orvane
