#include "host/color/Histogram.h"

#include <algorithm>
#include <cmath>
#include <mutex>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace {

// Products of two cumulative counts (each up to three times the pixels of the largest image) need more than 64 bits.
__extension__ typedef unsigned __int128 Wide;

// Sampled pixels a counting piece should hold at least, so that clearing and adding its own bins stays a small part.
constexpr int64_t kMinPiecePixels = 1 << 16;

int Log2(int size) { return size == 256 ? 8 : size == 1024 ? 10 : 16; }

/// Fills `curve` (size values) with the identity: bin i to round(i * 65535 / (size - 1)).
void IdentityCurve(int size, uint16_t *curve) {
    for (int i = 0; i < size; ++i)
        curve[i] = static_cast<uint16_t>((static_cast<int64_t>(i) * 65535 * 2 + (size - 1)) / (2 * (size - 1)));
}

/// The curve that moves the distribution `src` onto `ref` (null: a flat reference, one count per bin). Source bin i,
/// the part [C(i-1), C(i)) of the source's cumulative count, goes where the reference's cumulative count reaches
/// (C(i-1) + C(i)) / 2 scaled to the reference's total, each reference bin's count spread evenly over its width.
void MatchCurve(const uint64_t *src, const uint64_t *ref, int size, uint16_t *curve) {
    auto refCount = [&](int j) -> uint64_t { return ref ? ref[j] : 1; };
    uint64_t srcTotal = 0, refTotal = 0;
    for (int i = 0; i < size; ++i) srcTotal += src[i], refTotal += refCount(i);
    if (srcTotal == 0 || refTotal == 0) {
        IdentityCurve(size, curve);
        return;
    }
    const int binWidth = 65536 / size;
    const Wide twiceSrc = static_cast<Wide>(srcTotal) * 2;
    uint64_t srcBefore = 0, refBefore = 0;
    int j = 0; // the reference bin where the target falls; moves up only, as the targets rise
    for (int i = 0; i < size; ++i) {
        const uint64_t srcAfter = srcBefore + src[i];
        // The target in the reference's counts is target2 / twiceSrc; compare without rounding.
        const Wide target2 = static_cast<Wide>(srcBefore + srcAfter) * refTotal;
        while (j < size && static_cast<Wide>(refBefore + refCount(j)) * twiceSrc <= target2) refBefore += refCount(j++);
        int value = 65535;
        if (j < size) {
            const double target = static_cast<double>(target2) / static_cast<double>(twiceSrc);
            double frac = (target - static_cast<double>(refBefore)) / static_cast<double>(refCount(j));
            frac = std::clamp(frac, 0.0, std::nextafter(1.0, 0.0));
            value = std::min(65535, j * binWidth + static_cast<int>(frac * binWidth));
        }
        curve[i] = static_cast<uint16_t>(value);
        srcBefore = srcAfter;
    }
}

/// Three box filters of radius `radius` over the curve, ends held; a rising curve stays rising.
void SmoothCurve(int size, int radius, uint16_t *curve) {
    std::vector<double> v(curve, curve + size), sum(size + 1);
    for (int pass = 0; pass < 3; ++pass) {
        for (int i = 0; i < size; ++i) sum[i + 1] = sum[i] + v[i];
        const double low = v[0], high = v[size - 1];
        for (int i = 0; i < size; ++i) {
            const int lo = i - radius, hi = i + radius;
            // Samples beyond the ends repeat the end values.
            double total = sum[std::min(hi, size - 1) + 1] - sum[std::max(lo, 0)];
            if (lo < 0) total += -lo * low;
            if (hi > size - 1) total += (hi - (size - 1)) * high;
            v[i] = total / (2 * radius + 1); // the sums and ends were taken before this pass wrote v
        }
    }
    for (int i = 0; i < size; ++i) curve[i] = static_cast<uint16_t>(std::clamp(std::lround(v[i]), 0L, 65535L));
}

/// Reads `count` pixels of row y as 16-bit values, from x0 every `step` pixels (FloatToU16 for floats).
void ReadSamples(const Image &img, int x0, int y, int step, int count, Pixel *out) {
    const uint8_t *p = img.PixelAddress(x0, y);
    if (img.Depth() == DepthRGBAFlt32) {
        // The common float frame, converted without branches (NaN reads as 0) so that the loop vectorises.
        const float *f = reinterpret_cast<const float *>(p);
        uint16_t *o = &out[0].R;
        static_assert(sizeof(Pixel) == 4 * sizeof(uint16_t));
        for (int c = 0; c < count; ++c, f += 4 * step)
            for (int k = 0; k < 4; ++k) {
                const float low = f[k] > 0.f ? f[k] : 0.f, v = low < 1.f ? low : 1.f;
                o[4 * c + k] = static_cast<uint16_t>(static_cast<int>(static_cast<double>(v) * 65535.0 + 0.5));
            }
    } else if (step == 1) {
        LoadPixel(img.Depth(), p, count, out);
    } else {
        for (int c = 0; c < count; ++c)
            LoadPixel(img.Depth(), p + static_cast<size_t>(c) * step * img.BytesPerPixel(), 1, &out[c]);
    }
}

/// keep[c] = whether the mask's alpha at (x0 + c * step, y) is at least one half.
void MaskSamples(const Image &mask, int x0, int y, int step, int count, uint8_t *keep) {
    const ImgRectI w = mask.DataWindow();
    const bool canvasKeeps = mask.GetCanvasColor().A >= 0.5f, rowIn = y >= w.y0 && y < w.y1;
    FltPixel f;
    for (int c = 0; c < count; ++c) {
        const int x = x0 + c * step;
        if (!rowIn || x < w.x0 || x >= w.x1) {
            keep[c] = canvasKeeps;
            continue;
        }
        LoadFlt(mask.Depth(), mask.PixelAddress(x, y), 1, &f);
        keep[c] = f.A >= 0.5f;
    }
}

/// Colour divided by alpha on the 16-bit values, rounded and held at 65535; 0 where alpha is 0.
Pixel DividedByAlpha(const Pixel &p) {
    auto divide = [a = uint64_t(p.A)](uint16_t v) {
        return static_cast<uint16_t>(a == 0 ? 0 : std::min<uint64_t>(65535, (v * uint64_t(2 * 65535) + a) / (2 * a)));
    };
    return {divide(p.R), divide(p.G), divide(p.B), p.A};
}

int ClampToInt(double v) { return static_cast<int>(std::clamp(v, -2.0 * DomainEndless, 2.0 * DomainEndless)); }

} // namespace

Histogram::Histogram(int size)
    : size_(size == 256 || size == 1024 ? size : 65536), shift_(16 - Log2(size_)),
      counts_(static_cast<size_t>(kHistogramChannels) * size_), curves_(counts_.size()) {
    ResetCurves();
}

int Histogram::SizeForPrecision(int precision) { return precision <= 0 ? 256 : precision == 1 ? 1024 : 65536; }

bool Histogram::CountImage(const Image &img, const ImgRectI &rect, const HistogramSampling &sampling) {
    std::fill(counts_.begin(), counts_.end(), 0);
    samples_ = 0;
    const ImgRectI area = rect & img.DataWindow();
    if (area.IsNull()) return true;
    if (img.IsGPUMemDirty() && !img.DownloadGPUMem()) return false;
    if (!img.HasScanLineData()) return false;
    const Image *mask = sampling.mask;
    if (mask && ((mask->IsGPUMemDirty() && !mask->DownloadGPUMem()) || !mask->HasScanLineData())) return false;

    const int step = std::max(1, sampling.proxyStep);
    const int cols = (area.Width() + step - 1) / step, rows = (area.Height() + step - 1) / step;
    const int grain = static_cast<int>(
        std::max<int64_t>((rows + 2 * WorkerCount() - 1) / (2 * WorkerCount()), (kMinPiecePixels + cols - 1) / cols));
    std::mutex merge;
    ParallelRange(
        0, rows,
        [&](int first, int last) {
            // 32-bit bins halve the memory a piece touches; a block of rows stays below 2^32 samples.
            const int blockRows = static_cast<int>(std::min<int64_t>(last - first, UINT32_MAX / cols));
            std::vector<uint32_t> bins(counts_.size());
            std::vector<Pixel> line(cols);
            std::vector<uint8_t> keep(mask ? cols : 0);
            uint32_t *l = bins.data(), *r = l + size_, *g = r + size_, *b = g + size_;
            for (int block = first; block < last; block += blockRows) {
                if (block != first) std::fill(bins.begin(), bins.end(), 0);
                uint64_t samples = 0;
                for (int k = block; k < std::min(last, block + blockRows); ++k) {
                    if (img.CheckAbort()) return;
                    const int y = area.y0 + k * step;
                    ReadSamples(img, area.x0, y, step, cols, line.data());
                    if (mask) MaskSamples(*mask, area.x0, y, step, cols, keep.data());
                    for (int c = 0; c < cols; ++c) {
                        Pixel px = line[c];
                        if ((sampling.ignoreTransparent && px.A == 0) || (mask && !keep[c])) continue;
                        if (sampling.divideByAlpha) px = DividedByAlpha(px);
                        ++l[Luma16(px.R, px.G, px.B) >> shift_];
                        ++r[px.R >> shift_];
                        ++g[px.G >> shift_];
                        ++b[px.B >> shift_];
                        ++samples;
                    }
                }
                std::lock_guard<std::mutex> guard(merge);
                for (size_t i = 0; i < bins.size(); ++i) counts_[i] += bins[i];
                samples_ += samples;
            }
        },
        grain);
    if (!img.CheckAbort()) return true;
    std::fill(counts_.begin(), counts_.end(), 0);
    samples_ = 0;
    return false;
}

void Histogram::ResetCurves() {
    for (int c = 0; c < kHistogramChannels; ++c) IdentityCurve(size_, curves_.data() + static_cast<size_t>(c) * size_);
}

void Histogram::BlendCurve(HistogramChannel c, double amount) {
    const double a = std::isnan(amount) ? 0.0 : std::clamp(amount, 0.0, 1.0);
    std::vector<uint16_t> identity(size_);
    IdentityCurve(size_, identity.data());
    uint16_t *curve = curves_.data() + Index(c);
    for (int i = 0; i < size_; ++i)
        curve[i] = static_cast<uint16_t>(std::lround(identity[i] + a * (double(curve[i]) - identity[i])));
}

Histogram Histogram::Reduced(int size) const {
    Histogram out(std::min(size, size_));
    const int merge = size_ / out.size_;
    for (size_t i = 0; i < counts_.size(); ++i) out.counts_[i / merge] += counts_[i]; // channels stay apart
    out.samples_ = samples_;
    return out;
}

bool Histogram::SetCounts(const std::vector<uint64_t> &counts, uint64_t samples) {
    if (counts.size() != counts_.size()) return false;
    for (int c = 0; c < kHistogramChannels; ++c) {
        uint64_t total = 0;
        for (int i = 0; i < size_; ++i) {
            const uint64_t v = counts[static_cast<size_t>(c) * size_ + i];
            if (v > samples - total) return false; // also catches an overflowing sum
            total += v;
        }
        if (total != samples) return false;
    }
    counts_ = counts;
    samples_ = samples;
    return true;
}

void Histogram::Equalize(const HistogramCorrection &choice) { BuildCurves(nullptr, choice); }

bool Histogram::Match(const Histogram &reference, const HistogramCorrection &choice) {
    if (reference.size_ != size_ || reference.samples_ == 0) {
        ResetCurves();
        return false;
    }
    BuildCurves(&reference, choice);
    return true;
}

void Histogram::BuildCurves(const Histogram *reference, const HistogramCorrection &choice) {
    ResetCurves();
    const double smooth = std::isnan(choice.smooth) ? 0.0 : std::clamp(choice.smooth, 0.0, 1.0);
    const int radius = static_cast<int>(std::lround(smooth * size_ / 16));
    auto build = [&](const uint64_t *src, const uint64_t *ref, HistogramChannel into) {
        uint16_t *curve = curves_.data() + Index(into);
        MatchCurve(src, ref, size_, curve);
        if (radius > 0) SmoothCurve(size_, radius, curve);
    };
    auto refCounts = [&](HistogramChannel c) { return reference ? reference->Counts(c) : nullptr; };

    if (choice.luminance) build(Counts(HistogramChannel::L), refCounts(HistogramChannel::L), HistogramChannel::L);
    const HistogramChannel rgb[3] = {HistogramChannel::R, HistogramChannel::G, HistogramChannel::B};
    const bool chosen[3] = {choice.red, choice.green, choice.blue};
    if (!choice.lockRGB) {
        for (int k = 0; k < 3; ++k)
            if (chosen[k]) build(Counts(rgb[k]), refCounts(rgb[k]), rgb[k]);
        return;
    }
    // Locked: one curve from the chosen channels' counts added together, copied to each of them.
    std::vector<uint64_t> src(size_), ref(reference ? size_ : 0);
    int first = -1;
    for (int k = 0; k < 3; ++k) {
        if (!chosen[k]) continue;
        if (first < 0) first = k;
        for (int i = 0; i < size_; ++i) {
            src[i] += Counts(rgb[k])[i];
            if (reference) ref[i] += reference->Counts(rgb[k])[i];
        }
    }
    if (first < 0) return;
    build(src.data(), reference ? ref.data() : nullptr, rgb[first]);
    for (int k = first + 1; k < 3; ++k)
        if (chosen[k]) std::copy_n(Curve(rgb[first]), size_, curves_.data() + Index(rgb[k]));
}

ImgRectI HistogramMatchRect(int frameWidth, int frameHeight, const ImgRectI &dataWindow, double centerX, double centerY,
                            double width, double height) {
    if (std::isnan(centerX) || std::isnan(centerY) || std::isnan(width) || std::isnan(height)) return ImgRectI();
    const double halfW = std::fabs(width) / 2, halfH = std::fabs(height) / 2;
    const ImgRectI r(
        ClampToInt(std::floor((centerX - halfW) * frameWidth)), ClampToInt(std::floor((centerY - halfH) * frameHeight)),
        ClampToInt(std::ceil((centerX + halfW) * frameWidth)), ClampToInt(std::ceil((centerY + halfH) * frameHeight)));
    return r & dataWindow;
}

} // namespace Orvane
