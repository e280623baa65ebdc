// Shrinking by whole factors and resizing through the separable filters:
// block averages computed here from the source pixels, constants and ramps
// that filters must keep, identity resizes, weight tables, windows, aborts.
#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/Resample.h"
#include "tests/support/TestSupport.h"

namespace Orvane::imgresizetest {
namespace {
namespace ts = ::Orvane::Test;

constexpr int kFilters[] = {ResampleNearest, ResampleBox, ResampleBilinear, ResampleBicubic};

/// What one stored component may differ by from an exact value: half a code for integers.
double Slack(int depth) {
    switch ((depth - 1) % 4) {
    case 0: return 0.5 / 255 + 1e-6;
    case 1: return 0.5 / 65535 + 1e-6;
    case 2: return 2e-3;
    default: return 1e-5;
    }
}

/// The pattern image at `depth` (values stored there, so that reads are exact).
Ref<Image> Pattern(int w, int h, int depth, unsigned seed = 3) {
    Ref<Image> f = ts::PatternImage(w, h, DepthRGBAFlt32, seed);
    if (depth == DepthRGBAFlt32) return f;
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    img->ImageCopy(f.Get());
    return img;
}

Ref<Image> Blank(int w, int h, int depth, const ImgRectI *dw = nullptr) {
    TagList tags{{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}};
    if (dw) tags.Set({ImgDataWindow, dw});
    return NewImageTagList(tags);
}

void ExpectNear(const FltPixel &got, const double want[4], double tol, const char *what) {
    EXPECT_NEAR(got.R, want[0], tol) << what;
    EXPECT_NEAR(got.G, want[1], tol) << what;
    EXPECT_NEAR(got.B, want[2], tol) << what;
    EXPECT_NEAR(got.A, want[3], tol) << what;
}

TEST(ScaleOfImage, AveragesBlocksAndScalesWindows) {
    for (int depth : {DepthAInt8, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
        SCOPED_TRACE(depth);
        const int w = 11, h = 7, fx = 3, fy = 2;
        Ref<Image> src = Pattern(w, h, depth);
        src->SetScale(1.0, 2.0);
        Ref<Image> out = src->ScaleOfImage(nullptr, fx, fy);
        ASSERT_TRUE(out);
        EXPECT_EQ(out->Width(), 4); // 11 / 3 rounded up
        EXPECT_EQ(out->Height(), 4);
        EXPECT_EQ(out->Depth(), depth);
        // Pixels three wide and two tall: the aspect 1:2 becomes 3:4.
        EXPECT_DOUBLE_EQ(out->XScale() / out->YScale(), 3.0 / 4.0);
        for (int y = 0; y < out->Height(); ++y)
            for (int x = 0; x < out->Width(); ++x) {
                // The block, cut to the frame: the last column and row of blocks are partial.
                double sum[4] = {0, 0, 0, 0};
                int n = 0;
                for (int sy = y * fy; sy < std::min(h, (y + 1) * fy); ++sy)
                    for (int sx = x * fx; sx < std::min(w, (x + 1) * fx); ++sx, ++n) {
                        const FltPixel p = src->GetFlt(sx, sy);
                        sum[0] += p.R, sum[1] += p.G, sum[2] += p.B, sum[3] += p.A;
                    }
                for (double &s : sum) s /= n;
                if (depth <= DepthAFlt32) sum[0] = sum[1] = sum[2] = sum[3];
                ExpectNear(out->GetFlt(x, y), sum, Slack(depth), "block average");
            }
    }
}

TEST(ScaleOfImage, WindowsCanvasAndRefusals) {
    const ImgRectI dw(1, 1, 6, 4);
    Ref<Image> src = Blank(8, 6, DepthRGBAFlt32, &dw);
    src->AllocScanLineData();
    src->Fill({1, 1, 1, 1});
    const FltPixel canvas{0, 0, 0.5f, 0.5f};
    src->SetCanvasColor(canvas);
    src->SetValidWindow(ImgRectI(2, 1, 5, 3));
    Ref<Image> out = src->ScaleOfImage(nullptr, 2, 2);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 3, 2)); // rounded outward
    EXPECT_EQ(out->ValidWindow(), ImgRectI(1, 0, 3, 2));
    EXPECT_EQ(out->GetCanvasColor(), canvas);
    // Block (0, 0) holds one window pixel and three canvas pixels; block (1, 0) two and two.
    EXPECT_FLOAT_EQ(out->GetFlt(0, 0).R, 0.25f);
    EXPECT_FLOAT_EQ(out->GetFlt(0, 0).B, (1 + 3 * 0.5f) / 4);
    EXPECT_FLOAT_EQ(out->GetFlt(1, 0).R, 0.5f);
    EXPECT_FLOAT_EQ(out->GetFlt(1, 1).R, 1.f); // rows 2 and 3, columns 2 and 3: all inside
    EXPECT_EQ(out->GetFlt(3, 0), canvas);

    Ref<Image> same = src->ScaleOfImage(nullptr, 1, 1);
    ASSERT_TRUE(same);
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 8; ++x) EXPECT_EQ(same->GetFlt(x, y), src->GetFlt(x, y));

    EXPECT_FALSE(src->ScaleOfImage(nullptr, 0.5, 1));
    EXPECT_FALSE(src->ScaleOfImage(nullptr, 2, NAN));
    RenderTask task;
    Request req(nullptr, nullptr, 0.0, 0, &task);
    EXPECT_TRUE(src->ScaleOfImage(&req, 2, 2));
    task.Abort();
    EXPECT_FALSE(src->ScaleOfImage(&req, 2, 2));
}

TEST(ResizeTagList, ConstantStaysConstantAndIdentityIsExact) {
    for (int depth = 1; depth <= 8; ++depth)
        for (int filter : kFilters) {
            SCOPED_TRACE(testing::Message() << "depth " << depth << " filter " << filter);
            Ref<Image> flat = Blank(13, 9, depth);
            flat->AllocScanLineData();
            flat->Fill({0.25f, 0.5f, 0.75f, 0.625f});
            const FltPixel c = flat->GetFlt(0, 0);
            for (auto [w, h] : {std::pair{29, 20}, std::pair{5, 4}, std::pair{13, 30}}) {
                Ref<Image> dst = Blank(w, h, depth);
                ASSERT_TRUE(flat->ResizeTagList(dst.Get(), {{ResizeFilter, filter}}));
                for (int y = 0; y < h; ++y)
                    for (int x = 0; x < w; ++x) {
                        const FltPixel p = dst->GetFlt(x, y);
                        ASSERT_NEAR(p.R, c.R, 1e-6) << x << "," << y;
                        ASSERT_NEAR(p.A, c.A, 1e-6) << x << "," << y;
                    }
            }
            Ref<Image> src = Pattern(13, 9, depth, 7);
            Ref<Image> dst = Blank(13, 9, depth);
            ASSERT_TRUE(src->ResizeTagList(dst.Get(), {{ResizeFilter, filter}}));
            for (int y = 0; y < 9; ++y)
                for (int x = 0; x < 13; ++x) ASSERT_EQ(dst->GetFlt(x, y), src->GetFlt(x, y)) << x << "," << y;
        }
}

TEST(ResizeTagList, RampsStayStraightAwayFromEdges) {
    // Pixel i holds the ramp at its centre, i + 0.5; output pixel o sits at (o + 0.5) / scale.
    auto ramp = [](double x, double y) { return 0.1 + 0.02 * x + 0.03 * y; };
    struct Case {
        int sw, sh, dw, dh;
    };
    for (const Case c : {Case{10, 8, 25, 19}, Case{24, 16, 12, 8}, Case{30, 20, 10, 5}})
        for (int filter : {ResampleBilinear, ResampleBicubic}) {
            SCOPED_TRACE(testing::Message() << c.sw << "->" << c.dw << " filter " << filter);
            Ref<Image> src = Blank(c.sw, c.sh, DepthRGBAFlt32);
            src->AllocScanLineData();
            for (int y = 0; y < c.sh; ++y)
                for (int x = 0; x < c.sw; ++x) {
                    const float v = static_cast<float>(ramp(x + 0.5, y + 0.5));
                    src->PutFlt(x, y, {v, 1 - v, v * 0.5f, 1});
                }
            Ref<Image> dst = Blank(c.dw, c.dh, DepthRGBAFlt32);
            ASSERT_TRUE(src->ResizeTagList(dst.Get(), {{ResizeFilter, filter}}));
            const double sx = double(c.dw) / c.sw, sy = double(c.dh) / c.sh;
            const double reach = 2.0 * std::max(1.0, 1.0 / std::min(sx, sy)) + 1; // source pixels a tap may reach
            int checked = 0;
            for (int y = 0; y < c.dh; ++y)
                for (int x = 0; x < c.dw; ++x) {
                    const double u = (x + 0.5) / sx, v = (y + 0.5) / sy;
                    if (u < reach || u > c.sw - reach || v < reach || v > c.sh - reach) continue;
                    const FltPixel p = dst->GetFlt(x, y);
                    EXPECT_NEAR(p.R, ramp(u, v), 1e-5) << x << "," << y;
                    EXPECT_NEAR(p.G, 1 - ramp(u, v), 1e-5) << x << "," << y;
                    ++checked;
                }
            EXPECT_GT(checked, 0);
        }
}

TEST(ResampleAxis, WeightsSumToOneAndShrinkingSpreadsEvenly) {
    for (int filter : kFilters)
        for (double scale : {0.25, 1.0 / 3, 0.5, 1.0, 1.7, 4.0}) {
            SCOPED_TRACE(testing::Message() << "filter " << filter << " scale " << scale);
            const int src = 48, out = static_cast<int>(src * scale);
            ResampleAxis axis;
            ASSERT_TRUE(axis.Build(filter, scale, 0.0, 0, out, 0, src));
            ASSERT_EQ(axis.Count(), out);
            std::vector<double> received(src, 0.0);
            for (int i = 0; i < out; ++i) {
                double sum = 0.0;
                ASSERT_GE(axis.First(i), 0);
                ASSERT_LE(axis.First(i) + axis.Taps(i), src);
                ASSERT_NE(axis.Weights(i)[0], 0.f);
                ASSERT_NE(axis.Weights(i)[axis.Taps(i) - 1], 0.f);
                for (int k = 0; k < axis.Taps(i); ++k) {
                    sum += axis.Weights(i)[k];
                    received[axis.First(i) + k] += axis.Weights(i)[k];
                }
                EXPECT_NEAR(sum, 1.0, 1e-6) << i;
            }
            // Whole shrink factors with an area filter: every source pixel away from
            // the ends counts the same, 1 / factor, so averages are kept.
            const double factor = 1.0 / scale;
            if (filter != ResampleNearest && scale < 1 && std::fabs(factor - std::round(factor)) < 1e-9) {
                for (int j = 8; j < src - 8; ++j) EXPECT_NEAR(received[j], scale, 1e-6) << j;
            }
        }
    ResampleAxis bad;
    EXPECT_FALSE(bad.Build(ResampleBilinear, 0.0, 0.0, 0, 4, 0, 4));
    EXPECT_FALSE(bad.Build(ResampleBilinear, 1.0, 0.0, 0, 4, 4, 4));
}

TEST(ResizeTagList, NearestPicksTheCoveringPixelAndBoxAverages) {
    Ref<Image> src = Pattern(6, 4, DepthRGBAFlt32);
    Ref<Image> up = Blank(12, 8, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(up.Get(), {{ResizeFilter, ResampleNearest}}));
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 12; ++x) EXPECT_EQ(up->GetFlt(x, y), src->GetFlt(x / 2, y / 2));
    Ref<Image> down = Blank(3, 2, DepthRGBAFlt32);
    ASSERT_TRUE(src->ResizeTagList(down.Get(), {{ResizeFilter, ResampleBox}}));
    Ref<Image> blocks = src->ScaleOfImage(nullptr, 2, 2);
    for (int y = 0; y < 2; ++y)
        for (int x = 0; x < 3; ++x) {
            const FltPixel a = down->GetFlt(x, y), b = blocks->GetFlt(x, y);
            EXPECT_NEAR(a.R, b.R, 1e-6);
            EXPECT_NEAR(a.A, b.A, 1e-6);
        }
}

TEST(ResizeTagList, WindowsAbortAndNoData) {
    Ref<Image> src = Pattern(16, 12, DepthRGBAInt16);
    const FltPixel canvas{0.5f, 0, 0, 0.5f};
    src->SetCanvasColor(canvas);
    Ref<Image> whole = Blank(40, 30, DepthRGBAFlt32);
    const ImgRectI part(7, 5, 23, 19);
    Ref<Image> window = Blank(40, 30, DepthRGBAFlt32, &part);
    for (Image *d : {whole.Get(), window.Get()}) ASSERT_TRUE(src->ResizeTagList(d, {{ResizeFilter, ResampleBicubic}}));
    // A window gets the same pixels as the whole frame has there.
    for (int y = part.y0; y < part.y1; ++y)
        for (int x = part.x0; x < part.x1; ++x) ASSERT_EQ(window->GetFlt(x, y), whole->GetFlt(x, y));
    EXPECT_EQ(window->GetCanvasColor(), canvas);

    Ref<Image> pre = Blank(40, 30, DepthRGBAFlt32);
    pre->SetNoData(true);
    EXPECT_TRUE(src->ResizeTagList(pre.Get(), {}));
    EXPECT_FALSE(pre->HasScanLineData());
    EXPECT_EQ(pre->GetCanvasColor(), canvas);

    RenderTask task;
    task.Abort();
    Request req(nullptr, nullptr, 0.0, 0, &task);
    Ref<Image> dst = Blank(20, 20, DepthRGBAFlt32);
    EXPECT_FALSE(src->ResizeTagList(dst.Get(), {{WorkRequest, &req}}));
    std::atomic<bool> stop{true};
    src->SetAbortFlag(&stop);
    EXPECT_FALSE(src->ResizeTagList(dst.Get(), {}));
    EXPECT_FALSE(src->ResizeTagList(nullptr, {}));
}

} // namespace
} // namespace Orvane::imgresizetest
