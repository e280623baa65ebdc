// The classical provider of "GetObjectMask": a stroke-seeded GrabCut on the
// reference frame, carried to later frames by dense optical flow and
// re-segmented in a band around the carried edge, with a soft edge at full
// size from the local object and background colours. docs/MAGIC_MASK_PROVIDERS.md describes the steps.
//
// All matrices keep Orvane's row order (row 0 is the data window's bottom
// row): segmentation and flow do not care which way up a picture is, and
// stroke points then map to matrix cells by subtracting the window's origin.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <map>
#include <mutex>
#include <optional>
#include <utility>
#include <vector>

#include <opencv2/imgproc.hpp>
#include <opencv2/video/tracking.hpp>

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KernelProvider.h"
#include "host/segment/BuiltinProviders.h"

namespace Orvane {
namespace {

/// Longest side the segmentation runs at. GrabCut's graph cut and colour
/// models cost time in proportion to the pixels; 640 keeps a 1920x1080 frame
/// at a third of its size (about 0.2 megapixels), where a stroke-sized object
/// still spans hundreds of pixels, and the full-size refinement recovers the
/// edge the downscale blurred. Better mode segments at 960 (half size).
constexpr int kFasterWorkSide = 640;
constexpr int kBetterWorkSide = 960;
/// GrabCut iterations: from strokes, and when refining a carried mask.
constexpr int kReferenceIterations[2] = {3, 5};
constexpr int kTrackIterations[2] = {2, 4};
/// Smallest working side the flow runs on (its patches are 8 pixels, its pyramid halves the frame).
constexpr int kMinFlowSide = 16;
/// Fewest labelled pixels of a class GrabCut's five-component colour model can learn from.
constexpr int kMinClassSamples = 16;
/// Guided filter regularisation on a 0..1 grey guide: edges of a contrast
/// below about sqrt(eps) = 0.03 are smoothed over rather than followed.
constexpr float kGuidedEps = 1e-3f;

using Stroke = std::vector<cv::Point2f>;

/// The block's fields this provider uses.
struct Settings {
    uint64_t compId = 0;
    uint32_t operatorId = 0;
    int time = 0;
    int refineRange = 30;
    bool hasCarriedMask = false, better = false, reference = false, keyframe = false, srcPremultiplied = true;
};

/// Splits a flat x, y list into strokes (NaN pairs end strokes), moved into the window's matrix cells.
bool ParseStrokes(const std::vector<float> &flat, const ImgRectI &window, std::vector<Stroke> &strokes,
                  std::string &why) {
    if (flat.size() % 2 != 0) return why = "a stroke list has an odd number of values", false;
    Stroke current;
    for (size_t i = 0; i < flat.size(); i += 2) {
        const float x = flat[i], y = flat[i + 1];
        if (std::isnan(x) && std::isnan(y)) {
            if (!current.empty()) strokes.push_back(std::move(current));
            current.clear();
            continue;
        }
        if (!std::isfinite(x) || !std::isfinite(y)) return why = "a stroke point is not a finite number", false;
        current.emplace_back(x - window.x0, y - window.y0);
    }
    if (!current.empty()) strokes.push_back(std::move(current));
    return true;
}

/// A stroke point (pixel units from the window's corner) as a matrix position at `scale`: OpenCV puts pixel
/// centres on whole numbers, Orvane on halves.
cv::Point2f ToCell(const cv::Point2f &p, double scale) {
    return cv::Point2f(static_cast<float>(p.x * scale - 0.5), static_cast<float>(p.y * scale - 0.5));
}

/// Draws strokes scaled by `scale` with `value`, `thickness` pixels wide (a lone point as a dot).
void DrawStrokes(cv::Mat &target, const std::vector<Stroke> &strokes, double scale, int value, int thickness) {
    constexpr int shift = 4; // sub-pixel positions, 1/16 pixel
    auto fixed = [&](const cv::Point2f &p) {
        const cv::Point2f c = ToCell(p, scale);
        return cv::Point(cvRound(c.x * (1 << shift)), cvRound(c.y * (1 << shift)));
    };
    for (const Stroke &s : strokes) {
        if (s.size() == 1) cv::line(target, fixed(s[0]), fixed(s[0]), value, thickness, cv::LINE_8, shift);
        for (size_t i = 1; i < s.size(); ++i)
            cv::line(target, fixed(s[i - 1]), fixed(s[i]), value, thickness, cv::LINE_8, shift);
    }
}

/// Lookup from linear 0..1 to 8-bit with a 1/2.2 power: GrabCut's colour
/// models separate dark colours better on a roughly perceptual scale.
const std::vector<uint8_t> &EncodeTable() {
    static const std::vector<uint8_t> table = [] {
        std::vector<uint8_t> t(4097);
        for (int i = 0; i <= 4096; ++i) t[i] = static_cast<uint8_t>(std::lround(255.0 * std::pow(i / 4096.0, 1 / 2.2)));
        return t;
    }();
    return table;
}

/// The frame as 8-bit BGR over its data window, un-premultiplied where alpha > 0.
cv::Mat ToBgr8(const Image &src, bool premultiplied) {
    const ImgRectI &w = src.DataWindow();
    cv::Mat bgr(w.Height(), w.Width(), CV_8UC3);
    const std::vector<uint8_t> &encode = EncodeTable();
    ParallelRange(
        0, w.Height(),
        [&](int r0, int r1) {
            std::vector<FltPixel> row(w.Width());
            // NaN reads as 0 (a comparison with NaN is false), infinity as 1.
            auto code = [&](float v) {
                return v > 0.f ? encode[static_cast<int>(std::min(v, 1.f) * 4096.f + 0.5f)] : 0;
            };
            for (int r = r0; r < r1; ++r) {
                LoadFlt(src.Depth(), src.ScanLine(w.y0 + r), w.Width(), row.data());
                uint8_t *out = bgr.ptr<uint8_t>(r);
                for (const FltPixel &p : row) {
                    const float k = (premultiplied && p.A > 0.f) ? 1.f / p.A : 1.f;
                    *out++ = code(p.B * k);
                    *out++ = code(p.G * k);
                    *out++ = code(p.R * k);
                }
            }
        },
        16);
    return bgr;
}

/// A mask image's values (its alpha; a one-channel image reads into all channels) as float.
cv::Mat ReadMask(const Image &mask) {
    const ImgRectI &w = mask.DataWindow();
    cv::Mat out(w.Height(), w.Width(), CV_32F);
    ParallelRange(0, w.Height(), [&](int r0, int r1) {
        std::vector<FltPixel> row(w.Width());
        for (int r = r0; r < r1; ++r) {
            LoadFlt(mask.Depth(), mask.ScanLine(w.y0 + r), w.Width(), row.data());
            float *o = out.ptr<float>(r);
            for (int x = 0; x < w.Width(); ++x) o[x] = row[x].A;
        }
    });
    return out;
}

/// Writes a float matte into all four channels of an image over its data window.
void WriteMatte(const cv::Mat &matte, Image &out) {
    const ImgRectI &w = out.DataWindow();
    ParallelRange(0, w.Height(), [&](int r0, int r1) {
        std::vector<FltPixel> row(w.Width());
        for (int r = r0; r < r1; ++r) {
            const float *m = matte.ptr<float>(r);
            for (int x = 0; x < w.Width(); ++x) row[x] = FltPixel{m[x], m[x], m[x], m[x]};
            StoreFlt(out.Depth(), row.data(), w.Width(), out.ScanLine(w.y0 + r));
        }
    });
}

/// Keeps the foreground regions (8-connected) that hold at least one sure-foreground pixel of the trimap:
/// a region of the object's colours that no stroke or carried interior reaches is not the object.
cv::Mat KeepSeededRegions(const cv::Mat &foreground, const cv::Mat &trimap) {
    cv::Mat labels;
    const int count = cv::connectedComponents(foreground, labels, 8, CV_32S);
    std::vector<uint8_t> keep(count, 0);
    for (int r = 0; r < labels.rows; ++r) {
        const int *l = labels.ptr<int>(r);
        const uint8_t *t = trimap.ptr<uint8_t>(r);
        for (int c = 0; c < labels.cols; ++c)
            if (l[c] > 0 && t[c] == cv::GC_FGD) keep[l[c]] = 1;
    }
    cv::Mat kept(foreground.size(), CV_8U);
    for (int r = 0; r < labels.rows; ++r) {
        const int *l = labels.ptr<int>(r);
        uint8_t *k = kept.ptr<uint8_t>(r);
        for (int c = 0; c < labels.cols; ++c) k[c] = keep[l[c]];
    }
    return kept;
}

/// GrabCut over `roi` of the working image from a trimap (labels GC_*); the 0/1 foreground of the whole image.
cv::Mat Segment(const cv::Mat &bgr, cv::Mat trimap, cv::Rect roi, int iterations) {
    cv::Mat sub = trimap(roi);
    const int foreground = cv::countNonZero((sub & 1) != 0);
    const int background = static_cast<int>(sub.total()) - foreground;
    if (foreground >= kMinClassSamples && background >= kMinClassSamples) {
        cv::theRNG().state = 0x5eed; // the colour models start from k-means: the same result for the same frame
        cv::Mat bgdModel, fgdModel;
        cv::grabCut(bgr(roi), sub, cv::Rect(), bgdModel, fgdModel, iterations, cv::GC_INIT_WITH_MASK);
    }
    // Too few pixels of a class to model: the trimap's own labels stand.
    cv::Mat foregroundMask = (trimap & 1) != 0; // GC_FGD and GC_PR_FGD are the odd labels
    return KeepSeededRegions(foregroundMask / 255, trimap);
}

/// He, Sun and Tang's guided filter of `p` by the grey guide `guide` (both float), radius `r`.
cv::Mat GuidedFilter(const cv::Mat &guide, const cv::Mat &p, int r) {
    const cv::Size box(2 * r + 1, 2 * r + 1);
    auto mean = [&](const cv::Mat &m) {
        cv::Mat out;
        cv::boxFilter(m, out, CV_32F, box, cv::Point(-1, -1), true, cv::BORDER_REFLECT);
        return out;
    };
    const cv::Mat meanI = mean(guide), meanP = mean(p);
    const cv::Mat varI = mean(guide.mul(guide)) - meanI.mul(meanI);
    const cv::Mat covIP = mean(guide.mul(p)) - meanI.mul(meanP);
    const cv::Mat a = covIP / (varI + kGuidedEps);
    const cv::Mat b = meanP - a.mul(meanI);
    return mean(a).mul(guide) + mean(b);
}

/// The frame's 8-bit colours back in linear light (the scale edges mix colours on), as float BGR.
cv::Mat DecodeLinear(const cv::Mat &bgr) {
    static const cv::Mat table = [] {
        cv::Mat t(1, 256, CV_32F);
        for (int i = 0; i < 256; ++i) t.at<float>(i) = static_cast<float>(std::pow(i / 255.0, 2.2));
        return t;
    }();
    cv::Mat linear;
    cv::LUT(bgr, table, linear);
    return linear;
}

/// The soft matte at full size. The working-size foreground is scaled up and cut at one half; in a band of
/// `radius` pixels either side of that edge each pixel's colour C is taken as a mix of the nearby object colour F
/// (the mean over the band's inner side within a few radii) and background colour B (the same outside):
/// alpha = (C - B).(F - B) / |F - B|^2, which puts a soft edge, motion blur or a ramp where the picture has it.
/// Where F and B are too alike to tell apart the scaled-up foreground stands. A guided filter by the frame's grey
/// levels then smooths the texture's noise out of the band. Work is limited to the object's box and a margin;
/// elsewhere the matte is 0.
cv::Mat RefineEdge(const cv::Mat &foreground, const cv::Mat &bgr, double scale) {
    cv::Mat matte = cv::Mat::zeros(bgr.size(), CV_32F);
    if (cv::countNonZero(foreground) == 0) return matte;
    // The band covers the segmentation's uncertainty at working size (a few of its pixels) and at least 0.5% of
    // the frame's long side, about as wide as a defocused or motion-blurred edge gets before it is a blur.
    const int longSide = std::max(bgr.cols, bgr.rows);
    const int radius = std::max({3, static_cast<int>(std::lround(3 / scale)), longSide / 200});
    const int smoothRadius = std::max(1, static_cast<int>(std::lround(1 / scale)));
    cv::Rect box = cv::boundingRect(foreground);
    box = cv::Rect(
        cv::Point(static_cast<int>(box.x / scale), static_cast<int>(box.y / scale)),
        cv::Point(static_cast<int>(std::ceil(box.br().x / scale)), static_cast<int>(std::ceil(box.br().y / scale))));
    const int margin = 4 * radius + 2;
    box = cv::Rect(box.x - margin, box.y - margin, box.width + 2 * margin, box.height + 2 * margin) &
          cv::Rect(0, 0, bgr.cols, bgr.rows);

    cv::Mat soft;
    foreground.convertTo(soft, CV_32F);
    if (foreground.size() != bgr.size()) cv::resize(soft, soft, bgr.size(), 0, 0, cv::INTER_LINEAR);
    soft = soft(box).clone();
    const cv::Mat hard = soft >= 0.5f;
    const cv::Mat kernel = cv::getStructuringElement(cv::MORPH_ELLIPSE, cv::Size(2 * radius + 1, 2 * radius + 1));
    cv::Mat inner, outer;
    cv::erode(hard, inner, kernel);
    cv::dilate(hard, outer, kernel);
    cv::Mat innerF, outsideF;
    inner.convertTo(innerF, CV_32F, 1 / 255.0);
    outer.convertTo(outsideF, CV_32F, -1 / 255.0, 1.0);

    // Local means of the object's and the background's colours, from the sure sides of the band.
    const cv::Mat colour = DecodeLinear(bgr(box));
    const cv::Size window(6 * radius + 1, 6 * radius + 1);
    auto localMean = [&](const cv::Mat &weight, cv::Mat &mean, cv::Mat &count) {
        cv::Mat weighted, w3;
        cv::merge(std::vector<cv::Mat>{weight, weight, weight}, w3);
        cv::multiply(colour, w3, weighted);
        cv::boxFilter(weighted, mean, CV_32F, window, cv::Point(-1, -1), false);
        cv::boxFilter(weight, count, CV_32F, window, cv::Point(-1, -1), false);
    };
    cv::Mat fSum, fCount, bSum, bCount;
    localMean(innerF, fSum, fCount);
    localMean(outsideF, bSum, bCount);
    constexpr float minSeparation = 0.02f * 0.02f; // squared linear distance below which F and B are "alike"
    cv::Mat alpha = soft.clone();
    for (int r = 0; r < alpha.rows; ++r) {
        const uint8_t *in = inner.ptr<uint8_t>(r), *out = outer.ptr<uint8_t>(r);
        const cv::Vec3f *c = colour.ptr<cv::Vec3f>(r), *fs = fSum.ptr<cv::Vec3f>(r), *bs = bSum.ptr<cv::Vec3f>(r);
        const float *fn = fCount.ptr<float>(r), *bn = bCount.ptr<float>(r);
        float *a = alpha.ptr<float>(r);
        for (int x = 0; x < alpha.cols; ++x) {
            if (in[x] || !out[x] || fn[x] < 1 || bn[x] < 1) continue;
            const cv::Vec3f f = fs[x] / fn[x], b = bs[x] / bn[x], fb = f - b;
            const float separation = fb.dot(fb);
            if (separation >= minSeparation) a[x] = std::clamp((c[x] - b).dot(fb) / separation, 0.f, 1.f);
        }
    }
    cv::Mat grey;
    cv::cvtColor(bgr(box), grey, cv::COLOR_BGR2GRAY);
    grey.convertTo(grey, CV_32F, 1 / 255.0);
    cv::Mat refined = GuidedFilter(grey, alpha, smoothRadius);
    cv::min(cv::max(refined, 0.f), 1.f, matte(box));
    return matte;
}

/// A trimap around a carried 0/1 mask: its interior eroded by `band` pixels is sure foreground, what lies beyond
/// `band` pixels outside it sure background, the band between probable (by which side of the edge it is on).
cv::Mat TrimapAround(const cv::Mat &carried, int band) {
    const cv::Mat kernel = cv::getStructuringElement(cv::MORPH_ELLIPSE, cv::Size(2 * band + 1, 2 * band + 1));
    cv::Mat inner, outer;
    cv::erode(carried, inner, kernel);
    cv::dilate(carried, outer, kernel);
    cv::Mat trimap(carried.size(), CV_8U, cv::Scalar(cv::GC_BGD));
    trimap.setTo(cv::GC_PR_BGD, outer);
    trimap.setTo(cv::GC_PR_FGD, carried);
    trimap.setTo(cv::GC_FGD, inner);
    return trimap;
}

/// Frames since the strokes, as a trust in the carried mask: the uncertain band grows from its narrowest next to
/// a frame with strokes to its widest `refineRange` frames away, and stays there.
int BandWidth(int framesSinceStrokes, int refineRange, int workSide) {
    const double narrow = std::max(3.0, workSide / 200.0), wide = std::max(8.0, workSide / 60.0);
    const double t = std::min(1.0, std::abs(framesSinceStrokes) / static_cast<double>(std::max(1, refineRange)));
    return static_cast<int>(std::lround(narrow + (wide - narrow) * t));
}

/// `mask` moved from the previous frame to this one: the flow from `grey` back to `previousGrey` says where each
/// pixel was (bilinear, 0 outside).
cv::Mat WarpBackward(const cv::Mat &mask, const cv::Mat &grey, const cv::Mat &previousGrey, bool better) {
    auto dis = cv::DISOpticalFlow::create(better ? cv::DISOpticalFlow::PRESET_MEDIUM : cv::DISOpticalFlow::PRESET_FAST);
    cv::Mat flow;
    dis->calc(grey, previousGrey, flow);
    cv::Mat map(flow.size(), CV_32FC2);
    for (int r = 0; r < flow.rows; ++r) {
        const cv::Point2f *f = flow.ptr<cv::Point2f>(r);
        cv::Point2f *m = map.ptr<cv::Point2f>(r);
        for (int c = 0; c < flow.cols; ++c) m[c] = cv::Point2f(c + f[c].x, r + f[c].y);
    }
    cv::Mat warped;
    cv::remap(mask, warped, map, cv::noArray(), cv::INTER_LINEAR, cv::BORDER_CONSTANT, 0);
    return warped;
}

/// The reference frame: the positive strokes' convex hull, widened, is probably the object (a user strokes along
/// the object's inside, so the hull holds mostly its colours and seeds a good foreground model); the rest probably
/// background; the strokes themselves sure.
cv::Mat SegmentFromStrokes(const cv::Mat &work, const std::vector<Stroke> &positive,
                           const std::vector<Stroke> &negative, double scale, int strokeWidth, int iterations) {
    cv::Mat trimap(work.size(), CV_8U, cv::Scalar(cv::GC_PR_BGD));
    std::vector<cv::Point2f> points;
    for (const Stroke &st : positive)
        for (const cv::Point2f &p : st) points.push_back(ToCell(p, scale));
    std::vector<cv::Point> hull;
    cv::Mat pointsInt;
    cv::Mat(points).convertTo(pointsInt, CV_32S);
    cv::convexHull(pointsInt, hull);
    cv::fillConvexPoly(trimap, hull, cv::GC_PR_FGD);
    cv::polylines(trimap, hull, true, cv::GC_PR_FGD, 2 * strokeWidth);
    DrawStrokes(trimap, positive, scale, cv::GC_FGD, strokeWidth);
    DrawStrokes(trimap, negative, scale, cv::GC_BGD, strokeWidth);
    return Segment(work, trimap, cv::Rect(0, 0, work.cols, work.rows), iterations);
}

/// A tracked frame: re-segments a band of `band` pixels around the carried 0/1 mask, with a keyframe's strokes on
/// top (sure on the strokes, probable a band around them, so the segmentation may grow or cut the mask there).
cv::Mat SegmentAround(const cv::Mat &carried, const cv::Mat &work, const std::vector<Stroke> &positive,
                      const std::vector<Stroke> &negative, double scale, int band, int strokeWidth, int iterations) {
    cv::Mat trimap = TrimapAround(carried, band);
    DrawStrokes(trimap, positive, scale, cv::GC_PR_FGD, 2 * band + strokeWidth);
    DrawStrokes(trimap, negative, scale, cv::GC_PR_BGD, 2 * band + strokeWidth);
    DrawStrokes(trimap, positive, scale, cv::GC_FGD, strokeWidth);
    DrawStrokes(trimap, negative, scale, cv::GC_BGD, strokeWidth);
    // Only the region around what is not sure background needs segmenting; the colour models then describe the
    // object's surroundings rather than the whole frame.
    const cv::Mat notSureBackground = trimap != cv::GC_BGD;
    if (cv::countNonZero(notSureBackground) == 0) return cv::Mat::zeros(work.size(), CV_8U);
    const int margin = 4 * band + 8;
    cv::Rect roi = cv::boundingRect(notSureBackground);
    roi = cv::Rect(roi.x - margin, roi.y - margin, roi.width + 2 * margin, roi.height + 2 * margin) &
          cv::Rect(0, 0, work.cols, work.rows);
    return Segment(work, trimap, roi, iterations);
}

class ClassicalObjectMaskProvider final : public KernelProvider {
public:
    const char *Name() const override { return "classical"; }
    bool Run(const ProviderCall &call, std::string &error) override;
    void Purge() override {
        std::lock_guard<std::mutex> guard(lock_);
        tracks_.clear();
    }

private:
    /// What a tool's run keeps between frames: the last frame at working size and the last frame with strokes.
    struct Track {
        cv::Mat grey;
        int strokeTime = 0;
    };
    using TrackKey = std::pair<uint64_t, uint32_t>;
    bool Compute(const ProviderCall &call, const Settings &s, std::string &error);

    std::mutex lock_;
    std::map<TrackKey, Track> tracks_;
};

bool ClassicalObjectMaskProvider::Run(const ProviderCall &call, std::string &error) {
    error.clear();
    try {
        if (!call.block || call.blockSize != sizeof(OrvaneSemanticSegmentationParams)) {
            error = "GetObjectMask: the parameter block is missing or not " +
                    std::to_string(sizeof(OrvaneSemanticSegmentationParams)) + " bytes";
            return false;
        }
        OrvaneSemanticSegmentationParams block;
        std::memcpy(&block, call.block, sizeof block);
        Settings s;
        s.compId = block.compId;
        s.operatorId = block.operatorId;
        s.time = block.timeStamp;
        s.refineRange = std::max(1, block.refineRange);
        s.hasCarriedMask = block.hasCachePropMask != 0;
        s.better = block.isBetterMode != 0;
        s.reference = block.isRefframe != 0;
        s.keyframe = block.isKeyframe != 0;
        s.srcPremultiplied = block.isSrcPreMult != 0;
        if (Compute(call, s, error)) return true;
    } catch (const cv::Exception &e) {
        error = std::string("GetObjectMask: OpenCV failed: ") + e.what();
    } catch (const std::bad_alloc &) {
        error = "GetObjectMask: out of memory";
    }
    if (error.empty()) error = "GetObjectMask: failed";
    return false;
}

bool ClassicalObjectMaskProvider::Compute(const ProviderCall &call, const Settings &s, std::string &error) {
    auto fail = [&error](const std::string &why) { return error = "GetObjectMask: " + why, false; };
    auto aborted = [&call] { return call.abort && call.abort->load(); };
    auto input = [&call](const char *name) -> const Image * {
        auto it = call.inputs.find(name);
        return it == call.inputs.end() ? nullptr : it->second;
    };
    auto output = [&call](const char *name) -> Image * {
        auto it = call.outputs.find(name);
        return it == call.outputs.end() ? nullptr : it->second;
    };

    const Image *src = input("src");
    if (!src || !src->HasScanLineData() || src->DataWindow().IsNull()) return fail("no frame \"src\" with pixels");
    const ImgRectI window = src->DataWindow();
    Image *dst = output("dst"), *carryOut = output("cachePropMaskOut");
    for (auto [name, image] : {std::pair<const char *, Image *>{"dst", dst}, {"cachePropMaskOut", carryOut}}) {
        if (!image) return fail(std::string("no output \"") + name + "\"");
        if (image->DataWindow() != window)
            return fail(std::string("output \"") + name + "\" does not cover the frame's data window");
        if (!image->AllocScanLineData()) return fail("out of memory for the outputs");
    }
    std::vector<Stroke> positive, negative;
    for (auto [name, strokes] :
         {std::pair<const char *, std::vector<Stroke> *>{"posStroke", &positive}, {"negStroke", &negative}}) {
        std::string why;
        auto it = call.floatLists.find(name);
        if (it != call.floatLists.end() && !ParseStrokes(it->second, window, *strokes, why))
            return fail(std::string("\"") + name + "\": " + why);
    }
    const bool carry = s.hasCarriedMask && !s.reference;
    const Image *carryIn = input("cachePropMaskIn");
    if (carry && (!carryIn || !carryIn->HasScanLineData() || carryIn->DataWindow() != window))
        return fail("the propagated mask \"cachePropMaskIn\" does not cover the frame's data window");

    // The frame at full size and at working size.
    const cv::Mat bgr = ToBgr8(*src, s.srcPremultiplied);
    const int workSide = s.better ? kBetterWorkSide : kFasterWorkSide;
    const double scale = std::min(1.0, workSide / static_cast<double>(std::max(bgr.cols, bgr.rows)));
    cv::Mat work = bgr, grey;
    if (scale < 1.0) cv::resize(bgr, work, cv::Size(), scale, scale, cv::INTER_AREA);
    cv::cvtColor(work, grey, cv::COLOR_BGR2GRAY);
    const int workLong = std::max(work.cols, work.rows);
    const int strokeWidth = std::max(3, workLong / 160);
    if (aborted()) return fail("aborted");

    const TrackKey key{s.compId, s.operatorId};
    std::optional<Track> previous;
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (auto it = tracks_.find(key); it != tracks_.end()) previous = it->second;
    }
    int strokeTime = s.time;
    cv::Mat foreground;
    if (carry) {
        cv::Mat carried = ReadMask(*carryIn);
        if (scale < 1.0) cv::resize(carried, carried, work.size(), 0, 0, cv::INTER_AREA);
        // Move the mask with the picture: the flow from this frame back to the kept one says where each pixel was.
        // Without a kept frame of this size nothing says how far the mask is off: it is trusted least.
        const bool kept = previous && previous->grey.size() == grey.size();
        strokeTime = kept ? previous->strokeTime : s.time - s.refineRange;
        if (kept && std::min(grey.cols, grey.rows) >= kMinFlowSide) {
            carried = WarpBackward(carried, grey, previous->grey, s.better);
        }
        if (s.keyframe) strokeTime = s.time;
        if (aborted()) return fail("aborted");
        const int band = BandWidth(s.time - strokeTime, s.refineRange, workLong);
        foreground = SegmentAround((carried >= 0.5f) / 255, work, positive, negative, scale, band, strokeWidth,
                                   kTrackIterations[s.better]);
    } else if (positive.empty()) {
        foreground = cv::Mat::zeros(work.size(), CV_8U); // nothing marked and nothing carried: an empty matte
    } else {
        foreground = SegmentFromStrokes(work, positive, negative, scale, strokeWidth, kReferenceIterations[s.better]);
    }
    if (aborted()) return fail("aborted");

    const cv::Mat matte = RefineEdge(foreground, bgr, scale);
    const cv::Mat hard = matte >= 0.5f;
    cv::Mat carryMatte;
    hard.convertTo(carryMatte, CV_32F, 1 / 255.0);
    WriteMatte(matte, *dst);
    WriteMatte(carryMatte, *carryOut);
    {
        std::lock_guard<std::mutex> guard(lock_);
        tracks_[key] = Track{grey, strokeTime};
    }
    return true;
}

} // namespace

std::shared_ptr<KernelProvider> MakeClassicalObjectMaskProvider() {
    return std::make_shared<ClassicalObjectMaskProvider>();
}

} // namespace Orvane
