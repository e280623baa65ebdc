#pragma once
// Histogram: an image's values counted in 256, 1024 or 65536 bins, and the
// correction curves built from the counts (equalise, match) that a colour tool
// applies per pixel. docs/HISTOGRAM.md tells the whole model.
//
// Values. Every depth is counted as 16-bit values: 8-bit data widened by 257,
// float data clamped to 0..1 and scaled to 0..65535 (rounded). A value's bin is
// value >> Shift(), Shift() = 16 - log2(Size()). Luminance is
// 0.299 R + 0.587 G + 0.114 B of the three 16-bit values, rounded. A mask image
// counts its one channel as R, G, B and L alike.
//
// Counting. CountImage counts the pixels of a rectangle clipped to the data
// window, every proxyStep-th column and row from the clipped rectangle's lower
// left pixel; it may skip pixels whose 16-bit alpha is 0 and may divide the
// colour by alpha first. Rows run in parallel on the worker pool, each piece
// into bins of its own that are then added up: the counts are the same at any
// thread count.
//
// Curves. For each of L, R, G and B a table of Size() 16-bit values;
// GetValueX(bin) is the corrected value of a pixel in that bin. Until a curve
// is built it is the identity, bin i giving round(i * 65535 / (Size() - 1)):
// a value in bin i again, 0 and 65535 at the ends, and 8-bit data unchanged at
// 256 bins. Matching sends the pixels of a source bin, which hold the part
// [C(i-1), C(i)) of the cumulative count, to the value where the reference's
// cumulative distribution (each reference bin's count spread evenly over its
// width) reaches the source's at the middle of that part. Equalising matches a
// flat reference. So the corrected histogram follows the reference's
// cumulative distribution to within half a source bin's share; curves never
// fall. Smoothing (0..1) runs a box filter three times over a built curve,
// radius up to Size() / 16 bins; it keeps the curve rising.
//
// Snapshot. A Histogram is a plain value: a copy keeps the counts, to serve
// later as the reference of Match.
//
// Thread safety: CountImage, Equalize, Match, ResetCurves and assignment
// change the object and must not overlap any other call on it; the const
// members (counts, GetValue*) are safe from many threads at once.
#include <algorithm>
#include <cstdint>
#include <vector>

#include "host/core/Export.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;

enum class HistogramChannel : int { L = 0, R = 1, G = 2, B = 3 };
constexpr int kHistogramChannels = 4;

/// How CountImage samples the rectangle.
struct HistogramSampling {
    int proxyStep = 1;              ///< every n-th column and row; below 1 reads as 1
    bool ignoreTransparent = false; ///< skip pixels whose 16-bit alpha is 0
    /// Count R, G and B divided by alpha (the 16-bit values, rounded, held at 65535; 0 where alpha is 0), as a tool
    /// that works on unpremultiplied colour sees them.
    bool divideByAlpha = false;
    /// When set, only pixels where this image's alpha is at least one half count (its canvas colour's alpha
    /// outside its data window; a single-channel mask's value is its alpha). It is read at the same coordinates.
    const Image *mask = nullptr;
};

/// Which curves Equalize and Match build; the others stay the identity.
struct HistogramCorrection {
    bool luminance = false;
    bool red = false, green = false, blue = false;
    /// The chosen ones of R, G and B share one curve, built from their counts added together.
    bool lockRGB = true;
    double smooth = 0.0; ///< 0 (none) to 1
};

class ORVANE_API Histogram {
public:
    static constexpr double kLumaR = 0.299, kLumaG = 0.587, kLumaB = 0.114;

    /// `size` 256, 1024 or 65536; any other size reads as 65536.
    explicit Histogram(int size = 65536);
    /// The size chosen by a precision choice: 0 "8-bit" 256, 1 "10-bit" 1024, 2 "16-bit" 65536 (clamped).
    static int SizeForPrecision(int precision);
    /// The luminance of three 16-bit values, as counted.
    static uint16_t Luma16(uint16_t r, uint16_t g, uint16_t b) {
        return static_cast<uint16_t>(std::min(65535.0, kLumaR * r + kLumaG * g + kLumaB * b + 0.5));
    }

    int Size() const { return size_; }
    int Shift() const { return shift_; }
    int BinOf(uint16_t value) const { return value >> shift_; }

    /// Counts the pixels of `rect` & the image's data window (the old counts go; curves stay).
    /// False, with nothing counted, on abort or when the image's pixels cannot be read.
    bool CountImage(const Image &img, const ImgRectI &rect, const HistogramSampling &sampling = {});
    /// Pixels counted.
    uint64_t Samples() const { return samples_; }
    uint64_t BinCount(HistogramChannel c, int bin) const { return counts_[Index(c) + bin]; }
    const uint64_t *Counts(HistogramChannel c) const { return counts_.data() + Index(c); }

    /// Builds the chosen curves so that the counted pixels spread evenly over the full range.
    void Equalize(const HistogramCorrection &choice);
    /// Builds the chosen curves so that the counted pixels take the distribution of `reference`.
    /// False, all curves left the identity, when the reference has another size or no samples.
    bool Match(const Histogram &reference, const HistogramCorrection &choice);
    /// Every curve back to the identity.
    void ResetCurves();
    /// Moves a curve towards the identity: each value becomes identity + amount x (value - identity), rounded;
    /// amount 1 keeps the curve, 0 gives the identity (clamped to 0..1).
    void BlendCurve(HistogramChannel c, double amount);

    /// The same counts in `size` bins (each the sum of the bins it covers), curves the identity; `size` no more
    /// than Size() (a larger size reads as Size()).
    Histogram Reduced(int size) const;
    /// Replaces the counts: Size() values for each of L, R, G and B in that order, each channel adding up to
    /// `samples`. False, nothing changed, when they do not (a damaged saved histogram).
    bool SetCounts(const std::vector<uint64_t> &counts, uint64_t samples);

    /// The corrected value of a pixel in `bin` (0 <= bin < Size()).
    uint16_t GetValueL(int bin) const { return curves_[bin]; }
    uint16_t GetValueR(int bin) const { return curves_[size_ + bin]; }
    uint16_t GetValueG(int bin) const { return curves_[2 * size_ + bin]; }
    uint16_t GetValueB(int bin) const { return curves_[3 * size_ + bin]; }
    /// A whole curve (Size() values), for a device table.
    const uint16_t *Curve(HistogramChannel c) const { return curves_.data() + Index(c); }

private:
    size_t Index(HistogramChannel c) const { return static_cast<size_t>(c) * size_; }
    void BuildCurves(const Histogram *reference, const HistogramCorrection &choice);

    int size_ = 65536, shift_ = 0;
    uint64_t samples_ = 0;
    std::vector<uint64_t> counts_; // L, R, G, B, Size() each
    std::vector<uint16_t> curves_; // L, R, G, B, Size() each
};

/// The pixel rectangle of a match rectangle given in frame-relative units (x in frame widths, y in frame heights,
/// the centre and the full width and height): left and bottom floored, right and top rounded up, intersected with
/// `dataWindow`. A negative width or height counts as its size; NaN gives a null rectangle.
ORVANE_API ImgRectI HistogramMatchRect(int frameWidth, int frameHeight, const ImgRectI &dataWindow, double centerX,
                                       double centerY, double width, double height);

} // namespace Orvane
