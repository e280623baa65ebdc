// Image::LegalOfImage and Image::ImageLegal: keeping colours inside what a
// composite video signal may carry.
//
// The pixel values are taken as gamma-encoded video, 0 at black and 1 at
// white (the encoder adds NTSC's 7.5 IRE setup itself). Per pixel:
//   Y = 0.299 R + 0.587 G + 0.114 B                 (Rec.601 luma)
//   U = 0.492111 (B - Y),  V = 0.877283 (R - Y)     (the subcarrier's axes)
//   C = sqrt(U^2 + V^2)                             (subcarrier amplitude)
// so the composite signal swings between Y - C and Y + C. 100% colour bars
// reach -1/3 (blue, red) and 4/3 (yellow, cyan). A pixel is legal when
//   0 <= Y <= 1   and   lo <= Y - C,  Y + C <= hi
// with, in the same video units (signal limits less setup, over 1 - setup):
//   NTSC  (setup 0.075, -20 .. 120 IRE)     lo = -0.2973, hi = 1.2162
//   NHK   (no setup,    -20 .. 120 IRE)     lo = -0.20,   hi = 1.20
//   PAL / SECAM (no setup, 100% bars pass)  lo = -1/3,    hi = 4/3
// "75% amplitude" narrows the composite range further to what 100/75 colour
// bars reach: lo = -0.25, hi = 1.0 (no chroma peak above white). The tests
// allow 1e-4 (a hundredth of an IRE) past each limit, so colours that sit
// exactly on one, such as 100% yellow under PAL, stay legal.
//
// Actions: 1 paints illegal pixels white, 2 black; 3 adjusts: luma is brought
// into 0..1, then chroma is scaled down about it (hue and luma kept) until
// the composite swing fits. softClip is the width of a soft knee as a
// fraction of each range (luma: of 0..1; chroma: of the amplitude allowed at
// that luma): values approach the limit along an exponential instead of
// being cut, so values within the knee of a limit move a little too. With
// softClip 0, legal pixels are left exactly as they are.
//
// Alpha is never touched, and masks have no colour to check. Rows run in
// parallel; integer images go through float rows (rounded and clamped back).
#include <algorithm>
#include <cmath>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace imglegal {

constexpr double kTolerance = 1e-4;
constexpr int kBlock = 256;

struct Rule {
    int action;
    double lo, hi; ///< composite limits in video units
    double soft;   ///< knee width as a fraction of the range
};

Rule RuleOf(int videoType, int action, int adjust, double softClip) {
    Rule r{action, -1.0 / 3.0, 4.0 / 3.0, std::isfinite(softClip) ? std::clamp(softClip, 0.0, 1.0) : 0.0};
    if (videoType == 0) { // NTSC: signal limits -0.20 .. 1.20 over the 7.5 IRE setup
        r.lo = (-0.20 - 0.075) / (1.0 - 0.075);
        r.hi = (1.20 - 0.075) / (1.0 - 0.075);
    } else if (videoType == 1) {
        r.lo = -0.20, r.hi = 1.20;
    }
    if (adjust == 1) r.lo = std::max(r.lo, -0.25), r.hi = std::min(r.hi, 1.0);
    return r;
}

/// x held at or below `limit`, approaching it along an exponential knee of width w.
double SoftMax(double x, double limit, double w) {
    if (w <= 0.0) return std::min(x, limit);
    const double t = limit - w;
    return x <= t ? x : t + w * (1.0 - std::exp(-(x - t) / w));
}
/// x held in 0..1 with knees of width w at both ends.
double SoftUnit(double x, double w) {
    w = std::min(w, 0.5);
    if (w <= 0.0) return std::clamp(x, 0.0, 1.0);
    if (x < w) return w * std::exp((x - w) / w);
    return SoftMax(x, 1.0, w);
}

void Apply(const Rule &rule, FltPixel &p) {
    const double r = p.R, g = p.G, b = p.B;
    const double y = 0.299 * r + 0.587 * g + 0.114 * b;
    const double u = 0.492111 * (b - y), v = 0.877283 * (r - y);
    const double c = std::sqrt(u * u + v * v);
    const bool legal =
        y >= -kTolerance && y <= 1.0 + kTolerance && y - c >= rule.lo - kTolerance && y + c <= rule.hi + kTolerance;
    if (rule.action == 1 || rule.action == 2) {
        if (!legal) p.R = p.G = p.B = rule.action == 1 ? 1.f : 0.f;
        return;
    }
    if (rule.action != 3 || (legal && rule.soft == 0.0)) return;
    const double y2 = SoftUnit(y, rule.soft);
    const double cmax = std::max(0.0, std::min(rule.hi - y2, y2 - rule.lo));
    const double c2 = SoftMax(c, cmax, rule.soft * cmax);
    const double k = c > 0.0 ? std::max(0.0, c2) / c : 0.0;
    p.R = static_cast<float>(y2 + k * (r - y));
    p.G = static_cast<float>(y2 + k * (g - y));
    p.B = static_cast<float>(y2 + k * (b - y));
}

/// The pass over an image's data window, in place: float32 rows directly,
/// other depths through blocks of float pixels.
void Run(const Rule &rule, Image &img) {
    const ImgRectI dw = img.DataWindow();
    const int depth = img.Depth(), bpp = img.BytesPerPixel();
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            FltPixel block[kBlock];
            for (int y = y0; y < y1; ++y) {
                if (img.CheckAbort()) return;
                uint8_t *row = img.ScanLine(y);
                if (depth == DepthRGBAFlt32) {
                    auto *px = reinterpret_cast<FltPixel *>(row);
                    for (int x = 0; x < dw.Width(); ++x) Apply(rule, px[x]);
                    continue;
                }
                for (int x = 0; x < dw.Width(); x += kBlock) {
                    const int n = std::min(kBlock, dw.Width() - x);
                    uint8_t *at = row + static_cast<size_t>(x) * bpp;
                    LoadFlt(depth, at, n, block);
                    for (int i = 0; i < n; ++i) Apply(rule, block[i]);
                    StoreFlt(depth, block, n, at);
                }
            }
        },
        4);
}

} // namespace imglegal

void Image::ImageLegal(int videoType, int action, int adjust, double softClip) {
    if (IsMask() || action < 1 || action > 3 || readOnly_) return;
    const imglegal::Rule rule = imglegal::RuleOf(videoType, action, adjust, softClip);
    imglegal::Apply(rule, canvas_);
    if (HasScanLineData() && !dataWindow_.IsNull()) imglegal::Run(rule, *this);
}

Ref<Image> Image::LegalOfImage(int videoType, int action, int adjust, double softClip) const {
    Ref<Image> out = CopyOfImage(this);
    if (!out) return nullptr;
    out->SetReadOnly(false);
    out->ImageLegal(videoType, action, adjust, softClip);
    return out;
}

} // namespace Orvane
