#include "host/image/PaintModes.h"

#include <algorithm>
#include <cstring>

namespace Orvane {

const char *const PaintModeName[PaintModeCount] = {"Merge",    "Add",     "Subtract", "Minimum", "Maximum", "Average",
                                                   "Multiply", "Replace", "Invert",   "Copy",    "None"};
const char *const PaintModeID[PaintModeCount] = {"Merge",    "Add",     "Subtract", "Minimum", "Maximum", "Average",
                                                 "Multiply", "Replace", "Invert",   "Copy",    "None"};

int PaintModeIndex(const char *id) {
    if (!id) return PaintMerge;
    for (int i = 0; i < PaintModeCount; ++i)
        if (std::strcmp(id, PaintModeID[i]) == 0 || std::strcmp(id, PaintModeName[i]) == 0) return i;
    return PaintMerge;
}

namespace paintmodes {

inline float Clamp01(float v) { return std::min(std::max(v, 0.f), 1.f); }

/// f(I, M): the mode at full level.
template <int Mode> inline float Full(float i, float m) {
    if constexpr (Mode == PaintAdd) return i + m;
    if constexpr (Mode == PaintSubtract) return i - m;
    if constexpr (Mode == PaintMinimum) return std::min(i, m);
    if constexpr (Mode == PaintMaximum) return std::max(i, m);
    if constexpr (Mode == PaintAverage) return 0.5f * (i + m);
    if constexpr (Mode == PaintMultiply) return i * m;
    if constexpr (Mode == PaintReplace) return m;
    if constexpr (Mode == PaintInvert) return i + m - 2.f * i * m;
    return i + m - i * m; // Merge
}

template <int Mode> inline float ModePixel(float l, float i, float m) {
    if constexpr (Mode == PaintNone) return i;
    if constexpr (Mode == PaintCopy) return Clamp01(l * m);
    return Clamp01(i + l * (Full<Mode>(i, m) - i));
}

template <int Mode> void ModeSpan(float l, const float *incoming, float *mask, int n) {
    for (int x = 0; x < n; ++x) mask[x] = ModePixel<Mode>(l, incoming[x], mask[x]);
}

using SpanFn = void (*)(float, const float *, float *, int);
using PixelFn = float (*)(float, float, float);

template <int... Modes> constexpr SpanFn SpanTable[] = {&ModeSpan<Modes>...};
template <int... Modes> constexpr PixelFn PixelTable[] = {&ModePixel<Modes>...};

constexpr const SpanFn *kSpans = SpanTable<0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10>;
constexpr const PixelFn *kPixels = PixelTable<0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10>;

inline int ValidMode(int mode) { return mode >= 0 && mode < PaintModeCount ? mode : PaintMerge; }

} // namespace paintmodes

using namespace paintmodes;

float Merge_Flt32_Flt32_Pixel(int mode, float level, float incoming, float mask) {
    return kPixels[ValidMode(mode)](level, incoming, mask);
}

void MergeSpanFlt32(int mode, float level, const float *incoming, float *mask, int n) {
    kSpans[ValidMode(mode)](level, incoming, mask, n);
}

} // namespace Orvane
