// The pattern matcher: zero-mean normalised cross-correlation over every
// integer offset of the search area (coarse to fine on a pyramid when the
// area is large), then a sub-pixel fit of the correlation peak refined by
// Gauss-Newton steps on the cubic-interpolated image: a translation, a 2 x 2
// linear part that follows mild turns and scale changes, and a gain and an
// offset, so brightness and contrast changes do not move the answer.
//
// Pixel coordinates here are "sample" coordinates: sample (i, j) is the
// centre of pixel (i, j), at normalised ((i + 0.5) / W, (j + 0.5) / H).
// The pattern is always held on whole pixels of the image it was taken from;
// `offset` keeps the point's distance from the pattern's grid centre, so
// taking a pattern at a sub-pixel position needs no resampling (no blur).
#include "host/track/TrackPoint.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <vector>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/track/TrackMath.h"

namespace Orvane {

namespace {

constexpr int kMinPatternSide = 3;
/// Pixels read beyond the search area: the cubic taps and gradients of the sub-pixel refinement.
constexpr int kMargin = 3;
/// Coarse peaks followed down the pyramid, so a wrong coarse winner does not decide alone.
constexpr int kCoarsePeaks = 3;
/// A level is added while the coarse search would span more offsets than this per axis.
constexpr int kCoarseSpan = 24;
/// Coarse levels keep at least this many pattern pixels per side.
constexpr int kMinCoarsePattern = 6;
constexpr int kRefineIterations = 6;
/// Patterns from this size on a side fit turns and scale changes.
constexpr int kMinTurningSide = 9;
/// How many noise variances the turn and scale must take off the residual to be kept (two unknowns on pure
/// noise take off more than 16 about once in 3000 steps).
constexpr double kTurnEvidence = 16.0;
/// BestMatch: the pattern is taken again once a step matches this much worse than the best since it was taken,
/// or once its fitted turn or scale has left the pattern's by kBestMatchShape (about 6 degrees or 10 %), before
/// the whole-pixel search, which does not turn the pattern, loses it.
constexpr double kBestMatchFactor = 2.0, kBestMatchSlack = 0.002, kBestMatchShape = 0.1;

constexpr double kLumR = 0.2126, kLumG = 0.7152, kLumB = 0.0722;

int PixelSide(double fraction, int side) {
    const double px = fraction * side;
    if (!std::isfinite(px)) return kMinPatternSide;
    return std::max(kMinPatternSide, static_cast<int>(std::lround(std::min(px, 1e8))));
}

/// Reads `rect` of one channel (or luminance) as floats; values that are not finite read as 0.
void ReadChannel(const Image &img, const ImgRectI &rect, int channel, Plane &out) {
    out.Resize(rect.Width(), rect.Height());
    ParallelRange(
        0, out.h,
        [&](int begin, int end) {
            std::vector<FltPixel> row(out.w);
            for (int j = begin; j < end; ++j) {
                ReadSpanFlt(img, rect.y0 + j, rect.x0, rect.x1, row.data());
                float *dst = out.Row(j);
                for (int i = 0; i < out.w; ++i) {
                    const FltPixel &p = row[i];
                    float v;
                    switch (channel) {
                    case 0: v = p.R; break;
                    case 1: v = p.G; break;
                    case 2: v = p.B; break;
                    case 3: v = p.A; break;
                    default: v = static_cast<float>(kLumR * p.R + kLumG * p.G + kLumB * p.B); break;
                    }
                    dst[i] = std::isfinite(v) ? v : 0.f;
                }
            }
        },
        16);
}

struct Candidate {
    int x = 0, y = 0;
    double score = -2.0;
};

/// The offsets a pattern's origin may take at one level, inclusive.
struct Range {
    int x0 = 0, y0 = 0, x1 = -1, y1 = -1;
    bool Empty() const { return x1 < x0 || y1 < y0; }
};

/// Full search of `range`: scores every offset (rows on the workers) and keeps the best local maxima.
std::vector<Candidate> FullSearch(const PlaneStats &img, const Pattern &pat, const Range &range,
                                  std::vector<double> &scores) {
    const int cw = range.x1 - range.x0 + 1, ch = range.y1 - range.y0 + 1;
    scores.assign(static_cast<size_t>(cw) * ch, -2.0);
    ParallelRange(
        0, ch,
        [&](int begin, int end) {
            for (int j = begin; j < end; ++j)
                for (int i = 0; i < cw; ++i)
                    scores[static_cast<size_t>(j) * cw + i] = Ncc(img, pat, range.x0 + i, range.y0 + j);
        },
        1);
    std::vector<Candidate> peaks;
    auto at = [&](int i, int j) {
        return (i < 0 || j < 0 || i >= cw || j >= ch) ? -3.0 : scores[static_cast<size_t>(j) * cw + i];
    };
    for (int j = 0; j < ch; ++j)
        for (int i = 0; i < cw; ++i) {
            const double s = at(i, j);
            bool peak = true;
            for (int dj = -1; dj <= 1 && peak; ++dj)
                for (int di = -1; di <= 1; ++di)
                    if ((di || dj) && at(i + di, j + dj) > s) {
                        peak = false;
                        break;
                    }
            if (peak) peaks.push_back({range.x0 + i, range.y0 + j, s});
        }
    std::sort(peaks.begin(), peaks.end(), [](const Candidate &a, const Candidate &b) { return a.score > b.score; });
    if (peaks.size() > kCoarsePeaks) peaks.resize(kCoarsePeaks);
    return peaks;
}

/// The best offset within `radius` of `c` (inside `range`).
Candidate LocalSearch(const PlaneStats &img, const Pattern &pat, const Range &range, int cx, int cy, int radius) {
    Candidate best;
    for (int y = std::max(range.y0, cy - radius); y <= std::min(range.y1, cy + radius); ++y)
        for (int x = std::max(range.x0, cx - radius); x <= std::min(range.x1, cx + radius); ++x) {
            const double s = Ncc(img, pat, x, y);
            if (s > best.score) best = {x, y, s};
        }
    return best;
}

/// The vertex of the parabola through three samples of a peak, as an offset from the middle one.
double ParabolaPeak(double before, double mid, double after) {
    const double curvature = before - 2.0 * mid + after;
    if (!(curvature < 0.0)) return 0.0;
    return std::clamp(0.5 * (before - after) / curvature, -0.5, 0.5);
}

} // namespace

struct TrackPoint::State {
    int channel = -1;
    bool hasPattern = false;
    bool invalid = false;
    double centreX = 0.0, centreY = 0.0; ///< normalised, as last set
    double width = 0.0, height = 0.0;    ///< normalised pattern size
    double searchW = 0.0, searchH = 0.0; ///< normalised; 0: twice the pattern
    Pattern pattern;                     ///< whole pixels of the image it came from
    int sourceW = 0, sourceH = 0;        ///< that image's size
    double offsetX = 0.0, offsetY = 0.0; ///< the point minus the pattern's grid centre, in pixels
    double bestSinceTaken = std::numeric_limits<double>::infinity();
    Placement shape; ///< the pattern's turn and scale at the last good step (its translation unused)
    // Work space kept between steps.
    std::vector<PlaneStats> levels;
    std::vector<Pattern> patterns;
    std::vector<double> scores;

    double SearchW() const { return searchW > 0.0 ? searchW : 2.0 * width; }
    double SearchH() const { return searchH > 0.0 ? searchH : 2.0 * height; }

    /// The pattern's grid origin for a point at sample position (sx, sy).
    void GridOrigin(double sx, double sy, int &gx, int &gy) const {
        gx = static_cast<int>(std::lround(sx - 0.5 * (pattern.w - 1)));
        gy = static_cast<int>(std::lround(sy - 0.5 * (pattern.h - 1)));
    }

    /// Takes the pattern around the sample position (sx, sy) from `plane`, whose origin lies at (px, py);
    /// false when the plane does not hold it.
    bool Take(const Plane &plane, int px, int py, double sx, double sy) {
        int gx, gy;
        GridOrigin(sx, sy, gx, gy);
        if (gx < px || gy < py || gx + pattern.w > px + plane.w || gy + pattern.h > py + plane.h) return false;
        pattern.SetFrom(plane, gx - px, gy - py);
        offsetX = sx - (gx + 0.5 * (pattern.w - 1));
        offsetY = sy - (gy + 0.5 * (pattern.h - 1));
        bestSinceTaken = std::numeric_limits<double>::infinity();
        shape = Placement();
        return true;
    }

    bool TakeFromImage(const Image &img, double x, double y) {
        const int W = img.Width(), H = img.Height();
        pattern.w = PixelSide(width, W);
        pattern.h = PixelSide(height, H);
        const double sx = x * W - 0.5, sy = y * H - 0.5;
        if (!(std::abs(sx) < 1e8 && std::abs(sy) < 1e8) || img.IsNoData()) return false;
        int gx, gy;
        GridOrigin(sx, sy, gx, gy);
        const ImgRectI rect(gx, gy, gx + pattern.w, gy + pattern.h);
        if (!img.Frame().Contains(rect)) return false;
        Plane plane;
        ReadChannel(img, rect, channel, plane);
        sourceW = W, sourceH = H;
        return Take(plane, gx, gy, sx, sy);
    }
};

TrackPoint::TrackPoint() : state_(new State) {}
TrackPoint::~TrackPoint() { delete state_; }

void TrackPoint::Reset() {
    State &s = *state_;
    s.hasPattern = false;
    s.invalid = false;
    s.pattern = Pattern();
    s.offsetX = s.offsetY = 0.0;
    s.bestSinceTaken = std::numeric_limits<double>::infinity();
    s.shape = Placement();
}

void TrackPoint::Invalidate() { state_->invalid = true; }

void TrackPoint::SetChannel(int channel) { state_->channel = (channel >= 0 && channel <= 3) ? channel : -1; }

bool TrackPoint::SetPattern(const Image *img, double x, double y, double width, double height, double time) {
    State &s = *state_;
    s.centreX = x;
    s.centreY = y;
    s.width = width;
    s.height = height;
    (void)time; // a pattern is pixels: when it was taken does not change how it is found
    s.invalid = false;
    s.hasPattern = img && s.TakeFromImage(*img, x, y);
    return s.hasPattern;
}

void TrackPoint::SetSearchArea(double width, double height) {
    state_->searchW = width;
    state_->searchH = height;
}

ImgRectI TrackPoint::GetPatternRect(int width, int height) const {
    const State &s = *state_;
    const int pw = PixelSide(s.width, width), ph = PixelSide(s.height, height);
    const int gx = static_cast<int>(std::lround(s.centreX * width - 0.5 - 0.5 * (pw - 1)));
    const int gy = static_cast<int>(std::lround(s.centreY * height - 0.5 - 0.5 * (ph - 1)));
    return ImgRectI(gx, gy, gx + pw, gy + ph);
}

namespace {
/// Half the travel of the pattern's origin within a search area, at least one pixel.
int Travel(int searchSide, int patternSide) { return std::max(1, (searchSide - patternSide) / 2); }
} // namespace

ImgRectI TrackPoint::GetSearchRect(int width, int height, double x, double y) const {
    const State &s = *state_;
    const int pw = s.hasPattern ? s.pattern.w : PixelSide(s.width, width);
    const int ph = s.hasPattern ? s.pattern.h : PixelSide(s.height, height);
    // Travel beyond the image's size finds nothing more, and would only make the area huge.
    const int rx = std::min(Travel(PixelSide(s.SearchW(), width), pw), width);
    const int ry = std::min(Travel(PixelSide(s.SearchH(), height), ph), height);
    const double sx = x * width - 0.5 - s.offsetX, sy = y * height - 0.5 - s.offsetY;
    if (!(std::abs(sx) < 1e8 && std::abs(sy) < 1e8)) return ImgRectI();
    const int gx = static_cast<int>(std::lround(sx - 0.5 * (pw - 1)));
    const int gy = static_cast<int>(std::lround(sy - 0.5 * (ph - 1)));
    return ImgRectI(gx - rx - kMargin, gy - ry - kMargin, gx + pw + rx + kMargin, gy + ph + ry + kMargin);
}

TrackResult TrackPoint::Track(const Image *img, double time, double x, double y, TrackSettings &settings) {
    (void)time;
    State &s = *state_;
    TrackResult result;
    result.x = x;
    result.y = y;
    if (!img || img->IsNoData()) return result;
    // A frame at another size (another proxy scale) cannot be matched against the pattern's pixels: the pattern is
    // taken again from it at the expected position, as after Invalidate.
    if (s.invalid || (s.hasPattern && (img->Width() != s.sourceW || img->Height() != s.sourceH))) {
        // The pattern is taken here, at the expected position: that is this step's answer.
        s.invalid = false;
        s.hasPattern = s.TakeFromImage(*img, x, y);
        result.found = s.hasPattern && !s.pattern.Flat();
        return result;
    }
    if (!s.hasPattern || s.pattern.Flat()) return result;

    const int W = img->Width(), H = img->Height();
    const Pattern &pat = s.pattern;
    const ImgRectI search = GetSearchRect(W, H, x, y);
    if (search.IsNull()) return result;
    // Offsets of the pattern's origin, in image pixels: inside the search area and the image. What is read is
    // those and the margin around them.
    const int ox0 = std::max(search.x0 + kMargin, 0), ox1 = std::min(search.x1 - kMargin - pat.w, W - pat.w);
    const int oy0 = std::max(search.y0 + kMargin, 0), oy1 = std::min(search.y1 - kMargin - pat.h, H - pat.h);
    if (ox1 < ox0 || oy1 < oy0) return result;
    const ImgRectI area(ox0 - kMargin, oy0 - kMargin, ox1 + pat.w + kMargin, oy1 + pat.h + kMargin);

    // Level 0 is the search area read from the image; each further level halves it.
    s.levels.resize(1);
    s.patterns.resize(1);
    ReadChannel(*img, area, s.channel, s.levels[0].plane);
    s.levels[0].Update();
    s.patterns[0] = pat;
    Range range{ox0 - area.x0, oy0 - area.y0, ox1 - area.x0, oy1 - area.y0};
    std::vector<Range> ranges{range};
    while (static_cast<int>(s.levels.size()) < 8) {
        const Range &r = ranges.back();
        const Pattern &p = s.patterns.back();
        if (std::max(r.x1 - r.x0, r.y1 - r.y0) <= kCoarseSpan || std::min(p.w, p.h) / 2 < kMinCoarsePattern) break;
        PlaneStats next;
        Halve(s.levels.back().plane, next.plane);
        next.Update();
        Pattern half;
        half.Halve(p);
        Range nr{r.x0 / 2, r.y0 / 2, std::min(r.x1 / 2, next.plane.w - half.w),
                 std::min(r.y1 / 2, next.plane.h - half.h)};
        if (nr.Empty() || half.Flat()) break;
        s.levels.push_back(std::move(next));
        s.patterns.push_back(std::move(half));
        ranges.push_back(nr);
    }

    // Search the coarsest level fully, then follow its best peaks down, each within two pixels of where the
    // level above put it.
    int level = static_cast<int>(s.levels.size()) - 1;
    std::vector<Candidate> candidates = FullSearch(s.levels[level], s.patterns[level], ranges[level], s.scores);
    for (--level; level >= 0; --level)
        for (Candidate &c : candidates)
            c = LocalSearch(s.levels[level], s.patterns[level], ranges[level], 2 * c.x, 2 * c.y, 2);
    Candidate best;
    for (const Candidate &c : candidates)
        if (c.score > best.score) best = c;
    if (best.score <= -2.0) return result;

    // Sub-pixel: the parabola through the peak's neighbours, then Gauss-Newton refinement from there.
    const PlaneStats &base = s.levels[0];
    auto score = [&](int dx, int dy) {
        const int qx = best.x + dx, qy = best.y + dy;
        if (qx < 0 || qy < 0 || qx + pat.w > base.plane.w || qy + pat.h > base.plane.h) return best.score;
        return Ncc(base, pat, qx, qy);
    };
    Placement fit = s.shape;
    fit.tx = ParabolaPeak(score(-1, 0), best.score, score(1, 0));
    fit.ty = ParabolaPeak(score(0, -1), best.score, score(0, 1));
    fit.ncc = SampledNcc(base.plane, pat, best.x, best.y, fit);
    Placement refined = Refine(base.plane, pat, best.x, best.y, fit, kRefineIterations, false);
    if (pat.w >= kMinTurningSide && pat.h >= kMinTurningSide) {
        // A turn and a scale are kept only where they explain clearly more of the window than noise would: two
        // more unknowns fitted to noise alone lower the residual by about two noise variances.
        const Placement turned =
            Refine(base.plane, pat, best.x, best.y, refined.ncc > -2.0 ? refined : fit, kRefineIterations, true);
        const double noise = turned.residual / std::max(1, pat.w * pat.h - 6);
        if (turned.ncc > -2.0 && (refined.ncc <= -2.0 || refined.residual - turned.residual > kTurnEvidence * noise))
            refined = turned;
    }
    if (refined.ncc >= fit.ncc) fit = refined;

    // The point keeps its place relative to the pattern as the pattern turns and scales.
    const double sx = area.x0 + best.x + 0.5 * (pat.w - 1) + fit.tx + fit.m00 * s.offsetX + fit.m01 * s.offsetY;
    const double sy = area.y0 + best.y + 0.5 * (pat.h - 1) + fit.ty + fit.m10 * s.offsetX + fit.m11 * s.offsetY;
    result.x = (sx + 0.5) / W;
    result.y = (sy + 0.5) / H;
    result.match = std::clamp(1.0 - fit.ncc, 0.0, 2.0);
    result.found = true;

    // The pattern follows the shot only from steps that matched within the tolerance, so an occluder or a
    // wrong place never becomes the pattern.
    const bool weak = !(result.match <= settings.matchTolerance);
    bool retake = false;
    switch (settings.adaptive) {
    case TrackSettings::Adaptive::None: break;
    case TrackSettings::Adaptive::EveryFrame: retake = !weak; break;
    case TrackSettings::Adaptive::BestMatch:
        retake = !weak && (result.match > kBestMatchFactor * s.bestSinceTaken + kBestMatchSlack ||
                           std::max({std::abs(fit.m00 - 1.0), std::abs(fit.m01), std::abs(fit.m10),
                                     std::abs(fit.m11 - 1.0)}) > kBestMatchShape);
        s.bestSinceTaken = std::min(s.bestSinceTaken, result.match);
        break;
    }
    if (!weak) s.shape = fit; // the next step starts from this step's turn and scale
    if (retake) s.Take(base.plane, area.x0, area.y0, sx, sy);
    return result;
}

} // namespace Orvane
