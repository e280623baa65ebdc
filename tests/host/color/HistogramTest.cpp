#include "host/color/Histogram.h"

#include <atomic>

#include <gtest/gtest.h>

#include "host/core/Parallel.h"
#include "host/image/PixPtr.h"
#include "tests/support/TestSupport.h"

using namespace Orvane;

namespace {

constexpr int kW = 512, kH = 256, kN = kW * kH;
constexpr HistogramChannel kL = HistogramChannel::L, kR = HistogramChannel::R, kG = HistogramChannel::G,
                           kB = HistogramChannel::B;
const ImgRectI kAll(0, 0, kW, kH);

// A grey, opaque RGBA int16 image of kN pixels whose pixel k (along the rows) has the value value(k).
Ref<Image> GreyImage(uint16_t (*value)(int)) {
    Ref<Image> img = MakeRef<Image>(kW, kH, DepthRGBAInt16);
    EXPECT_TRUE(img->AllocScanLineData());
    for (int k = 0; k < kN; ++k) PixPtr(img.Get(), k % kW, k / kW).PutPixel({value(k), value(k), value(k), 65535});
    return img;
}

// Ramp (two pixels per 16-bit value), cubic (crowded near black), clustered.
std::vector<Ref<Image>> Distributions() {
    return {GreyImage([](int k) { return uint16_t(k / 2); }),
            GreyImage([](int k) { return uint16_t(65535 * std::pow(double(k) / kN, 3)); }),
            GreyImage([](int k) { return uint16_t(k % 7 == 0 ? 60000 + k % 1000 : k % 5000); })};
}

// How far the counts of `channels` added, each pixel through `curve` and binned again, stray from the flat (`ref` null)
// or reference cumulative distribution beyond what the bins allow (half the largest source bin, plus a count): <= 0.
double CdfExcess(const Histogram &h, std::initializer_list<HistogramChannel> channels, HistogramChannel curve,
                 const uint64_t *ref = nullptr) {
    std::vector<uint64_t> got(h.Size());
    double allowance = 0, n = 0, nRef = 0, c = 0, cRef = 0, gap = 0;
    for (int i = 0; i < h.Size(); ++i) {
        uint64_t bin = 0;
        for (HistogramChannel ch : channels) bin += h.BinCount(ch, i);
        got[h.Curve(curve)[i] >> h.Shift()] += bin;
        allowance = std::max(allowance, bin / 2.0 + 1), n += bin, nRef += ref ? ref[i] : 1;
    }
    for (int i = 0; i < h.Size(); ++i) {
        c += got[i], cRef += ref ? ref[i] : 1;
        gap = std::max(gap, std::fabs(c / n - cRef / nRef));
    }
    return gap - allowance / n;
}

} // namespace

TEST(Histogram, EqualiseAndMatchReachTheirDistributionsAsTheBinsAllow) {
    std::vector<Ref<Image>> images = Distributions();
    images.push_back(Orvane::Test::PatternImage(301, 203, DepthRGBAFlt32, 5));
    for (int size : {256, 1024, 65536}) {
        for (size_t s = 0; s < images.size(); ++s) {
            Histogram h(size);
            ASSERT_TRUE(h.CountImage(*images[s], images[s]->DataWindow()));
            Histogram flat = h;
            flat.Equalize({.luminance = true, .red = true, .green = true, .blue = true});
            // Locked: R, G and B take one curve that flattens their counts added together.
            EXPECT_TRUE(CdfExcess(flat, {kL}, kL) <= 0 && CdfExcess(flat, {kR, kG, kB}, kR) <= 0) << s << ", " << size;
            EXPECT_TRUE(std::equal(flat.Curve(kR), flat.Curve(kR) + size, flat.Curve(kB)));
            Histogram smooth = flat;
            smooth.Equalize({.luminance = true, .smooth = 0.3});
            for (const Histogram *c : {&flat, &smooth}) EXPECT_TRUE(std::is_sorted(c->Curve(kL), c->Curve(kL) + size));
            for (size_t f = 0; f < 3 && s < 3; ++f) { // onto each grey distribution
                Histogram m = h, reference(size);
                ASSERT_TRUE(reference.CountImage(*images[f], kAll) &&
                            m.Match(reference, {.red = true, .lockRGB = false}));
                EXPECT_LE(CdfExcess(m, {kR}, kR, reference.Counts(kR)), 0) << s << " onto " << f;
                EXPECT_TRUE(std::is_sorted(m.Curve(kR), m.Curve(kR) + size));
                EXPECT_EQ(m.GetValueG(size / 2), Histogram(size).GetValueG(size / 2));
                for (int i = 0; i < size && s == f; ++i) // matched onto itself: pixels keep their bins
                    ASSERT_TRUE(m.BinCount(kR, i) == 0 || m.BinOf(m.GetValueR(i)) == i) << s << ", bin " << i;
            }
        }
        Histogram h(size);
        ASSERT_TRUE(h.CountImage(*images[0], kAll));
        h.Equalize({.red = true, .lockRGB = false});
        EXPECT_TRUE(h.GetValueG(0) == 0 && h.GetValueG(size - 1) == 65535);
        for (int i = 0; i < size; ++i)
            ASSERT_TRUE(h.BinOf(h.GetValueR(i)) == i && h.BinOf(h.GetValueG(i)) == i) << "flat ramp, identity " << i;
        // Smoothing a straight curve moves only the ends, where the held end values enter the filter.
        Histogram smooth = h;
        smooth.Equalize({.red = true, .lockRGB = false, .smooth = 0.5});
        const int reach = 3 * (size / 32);
        for (int i = reach; i < size - reach; ++i) ASSERT_NEAR(smooth.GetValueR(i), h.GetValueR(i), 1) << i;
    }
}

TEST(Histogram, CountsMatchPerPixelCountAcrossDepthsRectanglesProxyTransparencyAndThreads) {
    // A mask over part of the frame, its canvas outside: kept where its alpha is at least one half.
    const Ref<Image> maskOut = Orvane::Test::WindowedImage(701, 389, ImgRectI(100, 50, 500, 300), {}, 3, DepthAInt8);
    const Ref<Image> maskIn =
        Orvane::Test::WindowedImage(701, 389, ImgRectI(-50, 20, 300, 200), {0, 0, 0, 1}, 4, DepthRGBAFlt32);
    // depth, histogram size, rectangle, proxy step, ignore transparent, divide by alpha, mask
    const std::tuple<int, int, ImgRectI, int, bool, bool, const Image *> cases[] = {
        {DepthRGBAFlt32, 65536, ImgRectI(0, 0, 701, 389), 1, false, false, nullptr},
        {DepthRGBAFlt32, 1024, ImgRectI(5, 3, 400, 300), 3, true, true, nullptr},
        {DepthRGBAInt8, 256, ImgRectI(-10, -10, 900, 900), 2, true, false, nullptr},
        {DepthRGBAInt16, 65536, ImgRectI(7, 9, 8, 10), 1, false, false, nullptr},
        {DepthRGBAFlt16, 65536, ImgRectI(0, 0, 701, 389), 4, false, true, nullptr},
        {DepthAInt16, 256, ImgRectI(1, 1, 600, 386), 1, true, false, nullptr},
        {DepthRGBAFlt32, 65536, ImgRectI(0, 0, 701, 389), 1, false, false, maskOut.Get()},
        {DepthRGBAInt16, 1024, ImgRectI(5, 3, 400, 300), 3, true, false, maskIn.Get()},
    };
    const int workersBefore = WorkerCount();
    for (const auto &[depth, size, rect, step, ignoreTransparent, divide, mask] : cases) {
        const Ref<Image> img = Orvane::Test::WindowedImage(701, 389, ImgRectI(-3, 2, 690, 389), {}, 7, depth);
        const int shift = 16 - static_cast<int>(std::log2(size));
        std::vector<std::vector<uint64_t>> want(kHistogramChannels, std::vector<uint64_t>(size));
        uint64_t samples = 0;
        const ImgRectI area = rect & img->DataWindow();
        auto to16 = [](float v) { return static_cast<int>(std::lround(std::clamp<double>(v, 0, 1) * 65535)); };
        for (int y = area.y0; y < area.y1; y += step)
            for (int x = area.x0; x < area.x1; x += step) {
                const FltPixel p = img->GetFlt(x, y);
                const long a = to16(p.A);
                if ((ignoreTransparent && a == 0) || (mask && mask->GetFlt(x, y).A < 0.5f)) continue;
                auto value = [&, divide = divide](float v) {
                    return !divide ? to16(v) : a == 0 ? 0 : int(std::min(65535L, std::lround(65535.0 * to16(v) / a)));
                };
                const int r = value(p.R), g = value(p.G), b = value(p.B);
                ++samples, ++want[0][std::lround(0.299 * r + 0.587 * g + 0.114 * b) >> shift];
                ++want[1][r >> shift], ++want[2][g >> shift], ++want[3][b >> shift];
            }
        for (int workers : {1, 3}) {
            SetWorkerCount(workers);
            Histogram h(size);
            ASSERT_TRUE(h.CountImage(*img, rect, {step, ignoreTransparent, divide, mask}));
            SCOPED_TRACE("depth " + std::to_string(depth) + ", workers " + std::to_string(workers));
            EXPECT_EQ(h.Samples(), samples);
            for (int ch = 0; ch < kHistogramChannels; ++ch)
                EXPECT_TRUE(std::equal(want[ch].begin(), want[ch].end(), h.Counts(HistogramChannel(ch)))) << ch;
        }
    }
    SetWorkerCount(workersBefore);
}

TEST(Histogram, FailsWithoutPixelsOrOnAbortAndTheMatchRectangleRounds) {
    const Ref<Image> img = Orvane::Test::PatternImage(64, 64);
    std::atomic<bool> stop{true};
    img->SetAbortFlag(&stop);
    Histogram h(256);
    EXPECT_TRUE(!h.CountImage(*img, img->DataWindow()) && h.Samples() == 0);
    EXPECT_FALSE(h.CountImage(*MakeRef<Image>(8, 8, DepthRGBAInt8), ImgRectI(0, 0, 8, 8))); // no rows
    EXPECT_TRUE(h.CountImage(*img, ImgRectI(100, 100, 120, 120)) && h.Samples() == 0);      // nothing to count
    // No match against another size or an empty reference: every curve stays the identity.
    ASSERT_TRUE(h.CountImage(*Distributions()[1], kAll));
    for (const Histogram &bad : {Histogram(1024), Histogram(256)})
        EXPECT_TRUE(!h.Match(bad, {.luminance = true, .red = true}) &&
                    std::equal(h.Curve(kL), h.Curve(kL) + 256, Histogram(256).Curve(kL)));
    // The match rectangle floors left and bottom and rounds up right and top.
    const ImgRectI frame(0, 0, 100, 50), window(10, 10, 60, 40);
    const std::tuple<ImgRectI, double, double, double, double, ImgRectI> cases[] = {
        {frame, 0.5, 0.5, 1.0, 1.0, frame},
        {frame, 0.5, 0.5, 0.333, 0.333, ImgRectI(33, 16, 67, 34)}, // 33.35..66.65, 16.675..33.325
        {frame, 0.5, 0.5, -0.333, -0.333, ImgRectI(33, 16, 67, 34)},
        {frame, 0.5, 0.125, 0.5, 0.5, ImgRectI(25, 0, 75, 19)}, // whole edges stay; -6.25 clipped, 18.75 up
        {window, 0.5, 0.5, 1.0, 1.0, window},
        {window, 0.0, 0.0, 1e300, 1e300, window},
        {frame, 0.505, 0.5, 0.0, 0.0, ImgRectI(50, 25, 51, 25)}, // no height: nothing
        {frame, std::nan(""), 0.5, 1.0, 1.0, ImgRectI()},
    };
    for (const auto &[dw, cx, cy, w, h, want] : cases)
        EXPECT_EQ(HistogramMatchRect(100, 50, dw, cx, cy, w, h), want & dw)
            << cx << ", " << cy << " size " << w << " x " << h;
}
