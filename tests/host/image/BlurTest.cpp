// The host blur: finite kernels against a 2D convolution written here in double, the Gaussian kinds against
// the normal CDF at a step edge and their variance, invariants, and oiiotool's blur.
#include "host/image/BlurFilters.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::blurtest {
namespace {
using namespace ::Orvane::Test;

constexpr int kAllKinds[] = {BlurBox,          BlurSoften,       BlurBartlett,    BlurSharpen,
                             BlurGaussian,     BlurFastGaussian, BlurMultiBox,    BlurYvVGaussian,
                             BlurVYV3Gaussian, BlurVYV5Gaussian, BlurVYV6Gaussian};

/// The normalised kernel of a finite kind for a length of p pixels: the box of width 2p + 1 (pixels weigh by
/// the part covered), the raised cosine and the tent reaching p + 1, the Gaussian of sigma p / 2 cut at 4 sigma.
std::vector<double> KernelOf(int kind, double p) {
    if (p <= 0) return {1.0};
    const double s = p / 2;
    const int r = kind == BlurGaussian ? int(std::ceil(4 * s)) : kind == BlurBox ? int(std::ceil(p)) : int(p + 1);
    std::vector<double> w;
    double sum = 0;
    for (int k = -r; k <= r; ++k) {
        const double a = std::abs(k);
        w.push_back(kind == BlurBox        ? std::max(0.0, std::min(k + 0.5, p + 0.5) - std::max(k - 0.5, -p - 0.5))
                    : kind == BlurSoften   ? 0.5 + 0.5 * std::cos(M_PI * a / (p + 1))
                    : kind == BlurBartlett ? 1 - a / (p + 1)
                                           : std::exp(-a * a / (2 * s * s)));
        sum += w.back();
    }
    for (double &v : w) v /= sum;
    return w;
}

/// A w x h frame holding 1 at (x, y) in every channel, zero canvas.
Ref<Image> Impulse(int w, int h, int x, int y) {
    const ImgRectI one(x, y, x + 1, y + 1);
    return Filled(w, h, DepthRGBAFlt32, Constant({1, 1, 1, 1}), &one);
}

/// A new image like `src` with data window `window` and depth `depth` (0: src's).
Ref<Image> Like(const Image *src, const ImgRectI &window, int depth = 0) {
    return NewImageTagList({{ImgLikeImage, src}, {ImgDataWindow, &window}, {ImgDepth, depth ? depth : src->Depth()}});
}

/// Blurs `src` into a new image of `window` by `kind` at p pixels along X and q along Y, plus `more` tags.
Ref<Image> Blurred(Image *src, const ImgRectI &window, int kind, double p, double q, TagList more = {}) {
    Ref<Image> dst = Like(src, window);
    TagList tags{{BlurFilterType, kind}, {BlurXSize, p / src->Width()}, {BlurYSize, q / src->Width()}};
    for (const TagItem &t : more.Items()) tags.Set(t);
    EXPECT_TRUE(src->BlurTagList(dst.Get(), tags));
    return dst;
}

/// Sum over i, j of kx[i] ky[j] S(x + i - rx, y + j - ry); S: the pixel inside `have`, else the canvas.
struct Reference {
    const Image &img;
    ImgRectI have;
    std::vector<double> kx, ky;

    double At(int x, int y, int c) const {
        const int rx = static_cast<int>(kx.size() / 2), ry = static_cast<int>(ky.size() / 2);
        double sum = 0;
        for (size_t j = 0; j < ky.size(); ++j)
            for (size_t i = 0; i < kx.size(); ++i) {
                const int sx = x + static_cast<int>(i) - rx, sy = y + static_cast<int>(j) - ry;
                sum += kx[i] * ky[j] * Channel(have.Contains(sx, sy) ? img.GetFlt(sx, sy) : img.GetCanvasColor(), c);
            }
        return sum;
    }
};

/// The response of `kind` at p pixels to an impulse, along the row through it.
std::vector<double> RowResponse(int kind, double p, int half, TagList more = {}) {
    const int w = 2 * half + 1;
    Ref<Image> out = Blurred(Impulse(w, 3, half, 1).Get(), ImgRectI(0, 1, w, 2), kind, p, 0, more);
    std::vector<double> r(w);
    for (int x = 0; x < w; ++x) r[x] = out->GetFlt(x, 1).R;
    return r;
}

double Variance(const std::vector<double> &r) {
    const int half = static_cast<int>(r.size() / 2);
    double s = 0, v = 0;
    for (int k = -half; k <= half; ++k) s += r[k + half], v += k * k * r[k + half];
    return v / s;
}

TEST(BlurKernels, FiniteKindsAreTheirConvolutionsImpulseResponsesKeepEnergyAndReach) {
    // A partial source window, a canvas, an output grown past the data window: borders, corners, pure canvas.
    const ImgRectI dw(2, 1, 33, 20), source(0, 3, 28, 30);
    Ref<Image> img = PatternAt(40, 24, DepthRGBAFlt32, 3, &dw, {0.1f, 0.2f, 0.3f, 0.4f});
    for (int kind : {BlurBox, BlurSoften, BlurBartlett, BlurGaussian})
        for (double p : {0.0, 0.4, 1.0, 2.5, 3.25, 5.0})
            for (double q : {p, 1.75}) {
                const Reference ref{*img, dw & source, KernelOf(kind, p), KernelOf(kind, q)};
                const ImgRectI out = dw.Grown(int(ref.kx.size() / 2) + 2, int(ref.ky.size() / 2) + 2);
                Ref<Image> got = Blurred(img.Get(), out, kind, p, q, {{BlurSourceWindow, &source}});
                EXPECT_TRUE(AllNear(*got, out, 3e-6, [&](int x, int y, int c) { return ref.At(x, y, c); }))
                    << "kind " << kind << " p " << p << " q " << q;
            }
    // Impulse responses keep energy, are symmetric and reach what they say.
    for (int kind : kAllKinds)
        for (double p : {0.6, 3.0, 9.5, 24.0}) {
            SCOPED_TRACE(testing::Message() << "kind " << kind << " p " << p);
            const int half = 8 * static_cast<int>(p) + 40;
            const std::vector<double> r = RowResponse(kind, p, half);
            EXPECT_NEAR(std::accumulate(r.begin(), r.end(), 0.0), 1.0, 2e-5);
            EXPECT_EQ(*std::max_element(r.begin(), r.end()), r[half]);
            for (int k = 1; k <= half; ++k) ASSERT_NEAR(r[half + k], r[half - k], 2e-7) << k;
            // Without a frame GetBlurSupport counts sizes against 720 pixels.
            double reach = p / 720.0, none = 0;
            if (!Image::GetBlurSupport(kind, nullptr, reach, none, 0)) continue;
            const int R = static_cast<int>(reach);
            EXPECT_TRUE(reach == R && r[half + R] > 0.0) << "the reach is whole and used: " << reach;
            for (int k = R + 1; k <= half; ++k) ASSERT_EQ(r[half + k], 0.0) << k;
        }
}

TEST(BlurKernels, GaussianKindsMeetTheNormalCdfAndHaveItsVariance) {
    // A step from 0 to 1 at x = 0: pixel x sums the kernel over k <= x, the normal CDF at z = (x + 1/2) / sigma
    // plus the first Euler-Maclaurin term z phi(z) / (24 sigma^2). Tolerances: the fast kind's five boxes err
    // by 0.6% (docs/BLUR.md); the recursive ones are as good as their pole sets.
    const std::pair<int, double> cases[] = {{BlurFastGaussian, 6.5e-3}, {BlurMultiBox, 8e-3},
                                            {BlurYvVGaussian, 2e-2},    {BlurVYV3Gaussian, 6e-3},
                                            {BlurVYV5Gaussian, 1.2e-3}, {BlurVYV6Gaussian, 1e-3}};
    for (auto [kind, tolerance] : cases)
        for (double sigma : {2.0, 4.0, 12.0, 40.0}) {
            // The step's far end (x = 3 half) lies 20 sigma beyond the pixels looked at.
            const int half = static_cast<int>(10 * sigma) + 20;
            const ImgRectI right(0, 0, 3 * half, 1), out(-half, 0, half, 1);
            Ref<Image> step = Filled(4 * half, 1, DepthRGBAFlt32, Constant({1, 1, 1, 1}), &right);
            Ref<Image> got = Blurred(step.Get(), out, kind, 2 * sigma, 0);
            EXPECT_TRUE(AllNear(*got, out, tolerance,
                                [&](int x, int, int) {
                                    const double z = (x + 0.5) / sigma;
                                    return 0.5 * std::erfc(-z / std::sqrt(2.0)) +
                                           z * std::exp(-z * z / 2) / std::sqrt(2 * M_PI) / (24 * sigma * sigma);
                                }))
                << "kind " << kind << " sigma " << sigma;
        }
    // Extended boxes and the moved poles give sigma^2 exactly (the YvV fit matches the peak, not the variance).
    for (double p : {7.0, 13.0, 40.0}) { // sigma above 3: the fast kind runs its boxes
        const double sigma2 = p * p / 4;
        const int half = 10 * static_cast<int>(p) + 20;
        EXPECT_NEAR(Variance(RowResponse(BlurFastGaussian, p, half)), sigma2, 1e-4 * sigma2) << p;
        for (int passes : {1, 2, 3, 7}) {
            EXPECT_NEAR(Variance(RowResponse(BlurMultiBox, p, half, {{BlurPasses, passes}})), sigma2, 1e-4 * sigma2)
                << p << " " << passes;
            EXPECT_NEAR(Variance(RowResponse(BlurSharpen, p, half, {{BlurPasses, passes}})), sigma2, 1e-3 * sigma2)
                << p << " " << passes;
        }
        for (int kind : {BlurVYV3Gaussian, BlurVYV5Gaussian, BlurVYV6Gaussian})
            EXPECT_NEAR(Variance(RowResponse(kind, p, half)), sigma2, 2e-3 * sigma2) << p << " " << kind;
    }
}

TEST(BlurKernels, KindsThatAreAnotherGiveItsBitsConstantsStayAndTheCanvasIsEndless) {
    // The fast Gaussian is the sampled one while that is short (sigma up to 3); unknown kinds are the Soften kernel.
    const ImgRectI dw(0, 0, 30, 20);
    Ref<Image> img = PatternAt(30, 20, DepthRGBAFlt32, 3, nullptr, {0.5f, 0.5f, 0.5f, 0.5f});
    auto same = [&](int kind, int as, double p) {
        return MaxDiff(*Blurred(img.Get(), dw, kind, p, 2), *Blurred(img.Get(), dw, as, p, 2), dw) == 0.0;
    };
    for (double p : {0.5, 2.0, 6.0}) EXPECT_TRUE(same(BlurFastGaussian, BlurGaussian, p)) << p;
    for (int kind : {-1, 6, 8, 14, 99}) EXPECT_TRUE(same(kind, BlurSoften, 3)) << kind;
    // A constant with the same canvas blurs to itself; with another canvas, the result is that of the image
    // padded with canvas far beyond any reach: an endless canvas, recursions included.
    const FltPixel c{0.37f, -0.2f, 1.25f, 0.5f};
    const ImgRectI whole(0, 0, 24, 16), out = whole.Grown(20, 20);
    Ref<Image> flat = Filled(24, 16, DepthRGBAFlt32, Constant(c), &whole, c);
    Ref<Image> pattern = PatternAt(24, 16, DepthRGBAFlt32, 3, &whole, {0.9f, 0.1f, 0.4f, 1.0f});
    const ImgRectI padded = whole.Grown(160, 160);
    Ref<Image> big = pattern->CopyOfImageTagList({{ImgDataWindow, &padded}});
    for (int kind : kAllKinds)
        for (double p : {3.0, 11.0}) {
            EXPECT_TRUE(AllNear(*Blurred(flat.Get(), out, kind, p, p), out, 2e-6, Constant(c)))
                << "kind " << kind << " p " << p;
            EXPECT_LT(MaxDiff(*Blurred(pattern.Get(), out, kind, p, p), *Blurred(big.Get(), out, kind, p, p), out),
                      2e-5)
                << "kind " << kind << " p " << p;
        }
}

TEST(BlurEdges, SupportFollowsTheFrameAndAspectChannelsBlendScalesAndSourceWindows) {
    // Lengths of p pixels on a 1000-pixel frame: sizes round up; passes count for Sharpen and Multi-box.
    ImageDomain domain(ImgRectI(0, 0, 1000, 500));
    domain.frame = ImgRectI(0, 0, 1000, 500);
    auto reach = [&](int kind, double p, int passes) {
        double x = p / 1000, y = p / 1000;
        const bool finite = Image::GetBlurSupport(kind, &domain, x, y, passes);
        EXPECT_EQ(x, y);
        return finite ? x : -1.0; // -1: no finite reach
    };
    EXPECT_EQ(reach(BlurBox, 10.25, 0), 11);
    EXPECT_EQ(reach(BlurGaussian, 10.2, 0), 21); // ceil(4 sigma): ceil(20.4)
    EXPECT_EQ(reach(BlurGaussian, 20, 8), 40);   // passes count for Sharpen and Multi-box only
    EXPECT_EQ(reach(BlurMultiBox, 20, 1), 17);   // one box of variance 100: r = 16 (16 x 17 / 3 <= 100), plus end taps
    EXPECT_TRUE(reach(BlurVYV3Gaussian, 10, 0) == -1 && reach(BlurVYV6Gaussian, 10, 0) == -1);
    // The reach grows with the passes; 4 by default.
    EXPECT_GT(reach(BlurMultiBox, 20, 8), reach(BlurMultiBox, 20, 2));
    EXPECT_EQ(reach(BlurMultiBox, 20, 0), reach(BlurMultiBox, 20, 4));
    EXPECT_EQ(reach(BlurSharpen, 20, 0), reach(BlurSharpen, 20, 4));

    // A box reaches size x frame width across, x XScale / YScale down: round on wide pixels.
    Ref<Image> imp = Impulse(720, 400, 300, 200);
    imp->SetScale(2.0, 1.0); // pixels twice as wide as tall
    Ref<Image> got = Blurred(imp.Get(), ImgRectI(280, 170, 321, 231), BlurBox, 5, 5);
    auto lit = [&](int dx, int dy) { return got->GetFlt(300 + dx, 200 + dy).R > 0.f; };
    EXPECT_TRUE(lit(5, 0) && !lit(6, 0) && lit(-5, 0) && !lit(-6, 0));
    EXPECT_TRUE(lit(0, 10) && !lit(0, 11) && lit(0, -10) && !lit(0, -11));
    double x = 5 / 720.0, y = 5 / 720.0, dx = x, dy = y;
    ASSERT_TRUE(imp->GetBlurSupport(BlurBox, x, y, 0));
    EXPECT_TRUE(x == 5.0 && y == 10.0) << x << ", " << y;
    // The static form reads the same from a domain that carries the frame.
    const ImageDomain frame = DomainOfImage(*imp, imp->DataWindow());
    ASSERT_TRUE(Image::GetBlurSupport(BlurBox, &frame, dx, dy, 0));
    EXPECT_TRUE(dx == x && dy == y);
    // Channels, blend, scales and the source window.
    const ImgRectI dw(0, 0, 26, 18), out = dw.Grown(4, 4);
    Ref<Image> img = PatternAt(26, 18, DepthRGBAFlt32, 3, &dw, {0.05f, 0.1f, 0.15f, 0.2f});
    Ref<Image> plain = Blurred(img.Get(), out, BlurGaussian, 4, 3);
    const float blend = 0.3f, scale = 1.5f, scales[4] = {2.0f, 0.5f, 1.0f, -1.0f};
    const TagList mixed{{BlurDoGreen, 0},          {BlurBlend, blend},          {BlurScale, scale},
                        {BlurRedScale, scales[0]}, {BlurGreenScale, scales[1]}, {BlurAlphaScale, scales[3]}};
    Ref<Image> blended = Blurred(img.Get(), out, BlurGaussian, 4, 3, mixed);
    // The mix, and the canvas through it (its blur is itself).
    auto mix = [&](const FltPixel &s, const FltPixel &b, int c) {
        return c == 1 ? Channel(s, c) : Channel(s, c) + (Channel(b, c) * scale * scales[c] - Channel(s, c)) * blend;
    };
    EXPECT_TRUE(AllNear(*blended, out, 2e-6,
                        [&](int x, int y, int c) { return mix(img->GetFlt(x, y), plain->GetFlt(x, y), c); }));
    for (int c = 0; c < 4; ++c)
        EXPECT_FLOAT_EQ(Channel(blended->GetCanvasColor(), c), mix(img->GetCanvasColor(), img->GetCanvasColor(), c));
    // Blend 0 is the source itself, and every channel off likewise.
    Ref<Image> none = Blurred(img.Get(), out, BlurGaussian, 4, 3, {{BlurBlend, 0.0}});
    Ref<Image> off = Blurred(img.Get(), out, BlurGaussian, 4, 3,
                             {{BlurDoRed, 0}, {BlurDoGreen, 0}, {BlurDoBlue, 0}, {BlurDoAlpha, 0}});
    EXPECT_TRUE(MaxDiff(*none, *img, out) == 0.0 && MaxDiff(*off, *img, out) == 0.0);
    // A source window is a copy with canvas outside it; one missing the data window leaves only canvas.
    const ImgRectI window(6, -5, 21, 12), inside = window & dw, away(100, 100, 120, 120);
    Ref<Image> cut = img->CopyOfImageTagList({{ImgDataWindow, &inside}});
    for (int kind : {BlurBox, BlurGaussian, BlurFastGaussian, BlurVYV5Gaussian})
        EXPECT_LT(MaxDiff(*Blurred(img.Get(), out, kind, 9, 7, {{BlurSourceWindow, &window}}),
                          *Blurred(cut.Get(), out, kind, 9, 7), out),
                  1e-6)
            << kind;
    Ref<Image> empty = Blurred(img.Get(), out, BlurGaussian, 9, 7, {{BlurSourceWindow, &away}});
    EXPECT_TRUE(AllNear(*empty, ImgRectI(15, 10, 16, 11), 1e-7, [&](int, int) { return img->GetCanvasColor(); }));
}

TEST(BlurRequest, EveryDepthInPlaceAnyThreadsAbortsEmptyRequestsAndOiiotoolsBlur) {
    // At each depth: the float blur of the source as the depth stores it; in place and on one thread alike.
    const ImgRectI dw(0, 0, 53, 37), out = dw.Grown(2, 2);
    Ref<Image> pattern = PatternAt(53, 37, DepthRGBAFlt32, 3, &dw, {0.25f, 0.5f, 0.75f, 1.0f});
    for (int depth = 1; depth <= 8; ++depth)
        for (int kind : {BlurBox, BlurGaussian, BlurFastGaussian, BlurVYV3Gaussian}) {
            SCOPED_TRACE(testing::Message() << "depth " << depth << " kind " << kind);
            Ref<Image> src = pattern->CopyOfImageTagList({{ImgDepth, depth}});
            Ref<Image> asFloat = src->CopyOfImageTagList({{ImgDepth, src->IsMask() ? DepthAFlt32 : DepthRGBAFlt32}});
            const TagList tags{{BlurFilterType, kind}, {BlurXSize, 6.0 / 53}, {BlurYSize, 4.0 / 53},
                               {BlurScale, 1.2},       {BlurBlend, 0.8},      {BlurDoBlue, 0}};
            TagList one = tags;
            one.Set({WorkThreaded, 0});
            Ref<Image> got = Like(src.Get(), out), want = Like(asFloat.Get(), out);
            Ref<Image> serial = Like(src.Get(), dw), threaded = Like(src.Get(), dw);
            ASSERT_TRUE(src->BlurTagList(got.Get(), tags) && asFloat->BlurTagList(want.Get(), tags) &&
                        src->BlurTagList(serial.Get(), one) && src->BlurTagList(threaded.Get(), tags));
            for (int y = out.y0; y < out.y1; ++y)
                for (int x = out.x0; x < out.x1; ++x) {
                    const FltPixel w = want->GetFlt(x, y);
                    FltPixel stored;
                    uint8_t bytes[16];
                    StoreFlt(depth, &w, 1, bytes);
                    LoadFlt(depth, bytes, 1, &stored);
                    ASSERT_EQ(got->GetFlt(x, y), stored) << x << "," << y;
                }
            ASSERT_TRUE(src->BlurTagList(src.Get(), tags));
            EXPECT_TRUE(got->Depth() == depth && SameBits(*serial, *threaded) && SameBits(*src, *threaded));
            EXPECT_EQ(src->GetCanvasColor(), threaded->GetCanvasColor());
        }
    // Aborts say no; empty requests only set the canvas.
    const ImgRectI square(0, 0, 64, 64);
    Ref<Image> source = PatternAt(64, 64, DepthRGBAFlt32, 3, &square, {0.5f, 0.5f, 0.5f, 0.5f}),
               blurOut = Like(source.Get(), square);
    AbortedRequest aborted;
    EXPECT_FALSE(source->BlurTagList(blurOut.Get(),
                                     {{BlurFilterType, BlurGaussian}, {BlurXSize, 0.1}, {WorkRequest, &aborted.req}}));
    std::atomic<bool> stop{true};
    source->SetAbortFlag(&stop);
    EXPECT_FALSE(source->BlurTagList(blurOut.Get(), {{BlurFilterType, BlurVYV5Gaussian}, {BlurXSize, 0.1}}));
    source->SetAbortFlag(nullptr);
    EXPECT_FALSE(source->BlurTagList(nullptr, {}));
    // No pixels wanted: only the canvas, mixed like any pixel.
    Ref<Image> shape = NewImageTagList({{ImgLikeImage, source.Get()}, {ImgDataWindow, &square}, {ImgNoData, 1}});
    EXPECT_TRUE(source->BlurTagList(shape.Get(), {{BlurXSize, 0.1}, {BlurScale, 2.0}}));
    EXPECT_FALSE(shape->HasScanLineData());
    EXPECT_EQ(shape->GetCanvasColor(), (FltPixel{1, 1, 1, 1}));
    // BlurOfImageTagList: a new image with this one's windows and depth.
    Ref<Image> copy = source->BlurOfImageTagList({{BlurFilterType, BlurBox}, {BlurXSize, 2.0 / 64}});
    EXPECT_TRUE(copy && SameBits(*copy, *Blurred(source.Get(), square, BlurBox, 2, 0)));
    // `oiiotool --blur WxW` is the sampled Gaussian of sigma W / 4 over |k| < W / 2, normalised; ours (cut at
    // 4 sigma) has the same shape there, so on a line the two differ by the ratio of the kernels' sums.
    if (!HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    TempFolder dir;
    const int w = 121, h = 41, mid = 60; // rows 1..39 of the middle one's kernel lie inside
    // A vertical line: its blur is the kernel across, whatever the row order.
    Ref<Image> line = Blank(w, h, DepthRGBAFlt32);
    line->FillWithin({1, 1, 1, 1}, ImgRectI(mid, 0, mid + 1, h));
    WritePfm(*line, dir / "line.pfm");
    for (int width : {8, 10, 20, 40}) {
        const std::string size = std::to_string(width) + "x" + std::to_string(width);
        ASSERT_TRUE(
            RunQuiet("oiiotool " + dir / "line.pfm" + " --blur " + size + " -d float -o " + dir / "blurOut.exr"));
        Ref<Image> theirs = ReadOiioDump(dir / "blurOut.exr", w, h);
        ASSERT_TRUE(theirs);
        const double sigma = width / 4.0;
        const std::vector<double> ours = RowResponse(BlurGaussian, 2 * sigma, mid);
        double cut = 0, all = 0; // sums of exp(-k^2 / 2 sigma^2) over |k| < W / 2 and over |k| <= 4 sigma
        for (int k = -mid; k <= mid; ++k) {
            const double g = std::exp(-k * k / (2 * sigma * sigma));
            cut += std::abs(k) < width / 2.0 ? g : 0, all += std::abs(k) <= std::ceil(4 * sigma) ? g : 0;
        }
        for (int k = -mid; k <= mid; ++k) {
            const double v = theirs->GetFlt(mid + k, h / 2).R;
            ASSERT_TRUE(std::abs(k) < width / 2.0 ? std::fabs(ours[mid + k] - v * cut / all) <= 2e-6 : v == 0.0)
                << width << ": " << k << ", " << ours[mid + k] << " against " << v * cut / all;
        }
    }
}

TEST(BlurRequest, MasksGiveTheBitsOfTheirFourChannelTwinAtEveryDepthKindWindowAndMix) {
    // A mask blurs one channel, 32 lines to a strip; an RGBA float image holding the mask's values in all four
    // channels blurs by eight pixels of four. Each value is the same arithmetic, so the mask's stored values are
    // its twin's alpha as the mask's depth stores it, bit for bit. The data window overhangs the 140 x 70 frame
    // and is 153 x 79: strips of 32 with a partial one, rows read in chunks of 128 columns with a tail.
    const ImgRectI dw(-6, -4, 147, 75), source(-20, 10, 100, 90);
    struct Window {
        const ImgRectI *source; // BlurSourceWindow, or none
        ImgRectI out;           // the output's data window
        bool inPlace;
    };
    const Window windows[] = {
        {nullptr, dw.Grown(9, 7), false}, {&source, ImgRectI(-30, 20, 130, 110), false}, {nullptr, dw, true}};
    const TagList mixes[] = {{},
                             {{BlurBlend, 0.6}, {BlurScale, 1.3}, {BlurAlphaScale, 0.8}, {BlurDoRed, 0}},
                             {{BlurDoAlpha, 0}, {BlurRedScale, 3.0}},
                             {{BlurBlend, 0.0}}};
    for (int depth = DepthAInt8; depth <= DepthAFlt32; ++depth)
        for (float canvasValue : {0.f, 1.f}) {
            const FltPixel canvas{0.3f, 0.7f, 0.2f, canvasValue}; // the colour channels must not count
            Ref<Image> mask = PatternAt(140, 70, depth, 5, &dw, canvas);
            Ref<Image> twin = Filled(
                140, 70, DepthRGBAFlt32,
                [&](int x, int y) {
                    const float v = mask->GetFlt(x, y).A;
                    return FltPixel{v, v, v, v};
                },
                &dw, canvas);
            for (int kind : kAllKinds)
                for (auto [p, q] : {std::pair{0.6, 1.5}, std::pair{3.0, 2.2}, std::pair{9.5, 13.0}})
                    for (const Window &w : windows)
                        for (const TagList &mix : mixes) {
                            SCOPED_TRACE(testing::Message()
                                         << "depth " << depth << " canvas " << canvasValue << " kind " << kind << " p "
                                         << p << " window " << (&w - windows) << " mix " << (&mix - mixes));
                            TagList tags = mix;
                            tags.Set({BlurFilterType, kind});
                            tags.Set({BlurXSize, p / 140});
                            tags.Set({BlurYSize, q / 140});
                            if (w.source) tags.Set({BlurSourceWindow, w.source});
                            Ref<Image> got = w.inPlace ? mask->CopyOfImageTagList({}) : Like(mask.Get(), w.out);
                            Ref<Image> want = Like(twin.Get(), w.out);
                            ASSERT_TRUE((w.inPlace ? got.Get() : mask.Get())->BlurTagList(got.Get(), tags) &&
                                        twin->BlurTagList(want.Get(), tags));
                            for (int y = w.out.y0; y < w.out.y1; ++y)
                                for (int x = w.out.x0; x < w.out.x1; ++x) {
                                    const FltPixel a = want->GetFlt(x, y);
                                    FltPixel stored;
                                    uint8_t bytes[16];
                                    StoreFlt(depth, &a, 1, bytes);
                                    LoadFlt(depth, bytes, 1, &stored);
                                    ASSERT_EQ(got->GetFlt(x, y).A, stored.A) << x << "," << y;
                                }
                        }
        }
}

} // namespace
} // namespace Orvane::blurtest
