#include "host/image/Image.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string>
#include <tuple>
#include <vector>

#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "tests/support/CompilerHalf.h"

namespace Orvane::imagetest {
namespace {

constexpr int AllDepths[] = {1, 2, 3, 4, 5, 6, 7, 8};
constexpr float NaNf = std::numeric_limits<float>::quiet_NaN();
constexpr float Inff = std::numeric_limits<float>::infinity();

bool MaskDepth(int depth) { return depth <= 4; }
int ComponentKind(int depth) { return (depth - 1) % 4; } // 0 int8, 1 int16, 2 half, 3 float

// The nearest integer code of v on 0..max, clamped; NaN gives 0. Computed in
// double, where v * max is exact.
long NearestCode(float v, long max) {
    if (!(v > 0.f)) return 0;
    if (v >= 1.f) return max;
    return std::lround(static_cast<double>(v) * static_cast<double>(max));
}

float HalfRound(float v) {
    volatile float in = v;
    const Orvane::Test::CompilerHalf h = static_cast<Orvane::Test::CompilerHalf>(in);
    return static_cast<float>(h);
}

// What a component reads back as after v is stored at `depth`.
double StoredValue(int depth, float v) {
    switch (ComponentKind(depth)) {
    case 0: return NearestCode(v, 255) / 255.0;
    case 1: return NearestCode(v, 65535) / 65535.0;
    case 2: return HalfRound(v);
    default: return v;
    }
}

// The spacing of halves around v (subnormal spacing at and near zero).
double HalfStep(double v) {
    if (std::fabs(v) < std::ldexp(1.0, -14)) return std::ldexp(1.0, -24);
    return std::ldexp(1.0, std::ilogb(v) - 10);
}

struct Expect4 {
    double c[4];
};

// What GetFlt gives after PutFlt(p) at `depth`.
Expect4 ExpectedRead(int depth, const FltPixel &p) {
    if (MaskDepth(depth)) {
        const double a = StoredValue(depth, p.A);
        return {{a, a, a, a}};
    }
    return {{StoredValue(depth, p.R), StoredValue(depth, p.G), StoredValue(depth, p.B), StoredValue(depth, p.A)}};
}

Expect4 AsExpect(const FltPixel &p) { return {{p.R, p.G, p.B, p.A}}; }
FltPixel AsPixel(const Expect4 &e) {
    return {static_cast<float>(e.c[0]), static_cast<float>(e.c[1]), static_cast<float>(e.c[2]),
            static_cast<float>(e.c[3])};
}

// How far a stored component may be from the value computed here. Integer
// depths: well under one code (so a wrong code fails). Half: exact when the
// input was exact, else within one step of the half grid. Float: a few ulps.
::testing::AssertionResult ComponentNear(int depth, float got, double want, bool inputExact) {
    if (std::isnan(want)) {
        if (std::isnan(got)) return ::testing::AssertionSuccess();
        return ::testing::AssertionFailure() << "got " << got << ", want NaN";
    }
    double tol = 0.0;
    switch (ComponentKind(depth)) {
    case 0: tol = 0.25 / 255.0; break;
    case 1: tol = 0.25 / 65535.0; break;
    case 2:
        if (inputExact)
            tol = 0.0;
        else
            tol = HalfStep(want);
        break;
    default: tol = inputExact ? 0.0 : 4e-7 * std::max(1.0, std::fabs(want)); break;
    }
    if (got == want || std::fabs(got - want) <= tol) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "got " << got << ", want " << want << " (depth " << depth << ", off by "
                                         << got - want << ")";
}

::testing::AssertionResult PixelNear(int depth, const FltPixel &got, const Expect4 &want, bool inputExact) {
    const float g[4] = {got.R, got.G, got.B, got.A};
    for (int c = 0; c < 4; ++c) {
        auto r = ComponentNear(depth, g[c], want.c[c], inputExact);
        if (!r)
            return r << " in channel "
                     << "RGBA"[c];
    }
    return ::testing::AssertionSuccess();
}

// Deterministic values over -0.25 .. 1.5.
struct Values {
    uint32_t state;
    float Next() {
        state = state * 1664525u + 1013904223u;
        return -0.25f + 1.75f * ((state >> 8) * (1.0f / 16777216.0f));
    }
    FltPixel NextPixel() {
        const float r = Next(), g = Next(), b = Next(), a = Next();
        return {r, g, b, a};
    }
};

Ref<Image> MakeImage(int w, int h, int depth, const ImgRectI *dw = nullptr) {
    auto img = MakeRef<Image>(w, h, depth);
    if (dw) img->SetDataWindow(*dw);
    return img;
}

// Fills the data window with pseudo-random pixels and returns what was put, row by row.
std::vector<FltPixel> PutPattern(Image &img, unsigned seed) {
    Values v{seed};
    std::vector<FltPixel> put;
    const ImgRectI dw = img.DataWindow();
    EXPECT_TRUE(img.AllocScanLineData());
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            put.push_back(v.NextPixel());
            img.PutFlt(x, y, put.back());
        }
    return put;
}

// Size, depth and scales as one comparable value.
std::tuple<int, int, int, double, double> Shape(const Image &img) {
    return {img.Width(), img.Height(), img.Depth(), img.XScale(), img.YScale()};
}

// The integer code of component `index` in a run stored with `bpc` bytes per component.
long CodeAt(const std::vector<uint8_t> &raw, int bpc, size_t index) {
    if (bpc == 1) return raw[index];
    uint16_t u;
    std::memcpy(&u, &raw[index * 2], 2);
    return u;
}

const FltPixel &PutAt(const std::vector<FltPixel> &put, const ImgRectI &dw, int x, int y) {
    return put[static_cast<size_t>(y - dw.y0) * dw.Width() + (x - dw.x0)];
}

// ---------------------------------------------------------------------------------------------------------------
// Formats

TEST(ImageFormat, FormatOfEveryDepth) {
    struct Case {
        int depth, channels, bytes;
        ComponentType type;
        bool isFloat;
    };
    const Case cases[] = {
        {1, 1, 1, ComponentType::Int8, false}, {2, 1, 2, ComponentType::Int16, false},
        {3, 1, 2, ComponentType::Flt16, true}, {4, 1, 4, ComponentType::Flt32, true},
        {5, 4, 1, ComponentType::Int8, false}, {6, 4, 2, ComponentType::Int16, false},
        {7, 4, 2, ComponentType::Flt16, true}, {8, 4, 4, ComponentType::Flt32, true},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.depth);
        const PixelFormat f = FormatOfDepth(c.depth);
        EXPECT_EQ(f.depth, c.depth);
        EXPECT_EQ(f.channels, c.channels);
        EXPECT_EQ(f.bytesPerComponent, c.bytes);
        EXPECT_EQ(f.type, c.type);
        EXPECT_EQ(f.isFloat, c.isFloat);
        EXPECT_EQ(f.BytesPerPixel(), c.channels * c.bytes);
        EXPECT_TRUE(IsValidDepth(c.depth));

        Image img(3, 2, c.depth);
        EXPECT_EQ(img.Depth(), c.depth);
        EXPECT_EQ(img.BytesPerPixel(), c.channels * c.bytes);
        EXPECT_EQ(img.IsMask(), c.channels == 1);
        EXPECT_EQ(img.IsFloat(), c.isFloat);
        const bool flags[] = {img.IsAInt8(),     img.IsAInt16(),    img.IsAFlt16(),    img.IsAFlt32(),
                              img.IsRGBAInt32(), img.IsRGBAInt64(), img.IsRGBAFlt64(), img.IsRGBAFlt128()};
        for (int d = 1; d <= 8; ++d) EXPECT_EQ(flags[d - 1], d == c.depth) << "flag of depth " << d;
    }
    for (int bad : {0, 9, -1, 100}) {
        SCOPED_TRACE(bad);
        const PixelFormat f = FormatOfDepth(bad);
        EXPECT_EQ(f.depth, 0);
        EXPECT_EQ(f.channels, 0);
        EXPECT_EQ(f.bytesPerComponent, 0);
        EXPECT_EQ(f.BytesPerPixel(), 0);
        EXPECT_FALSE(IsValidDepth(bad));
    }
}

// ---------------------------------------------------------------------------------------------------------------
// Windows and rows

TEST(ImageWindows, DataWindowOnlyBeforeRows) {
    auto img = MakeImage(10, 6, 7);
    EXPECT_EQ(img->Frame(), ImgRectI(0, 0, 10, 6));
    EXPECT_EQ(img->DataWindow(), img->Frame());
    EXPECT_EQ(img->ValidWindow(), img->Frame());
    img->SetScale(2.0, 0.5);
    EXPECT_EQ(Shape(*img), std::make_tuple(10, 6, 7, 2.0, 0.5));

    img->SetDataWindow(ImgRectI(-4, -2, 7, 5));
    EXPECT_EQ(img->DataWindow(), ImgRectI(-4, -2, 7, 5));
    EXPECT_EQ(img->ValidWindow(), ImgRectI(0, 0, 7, 5)); // clipped to the new data window
    img->SetValidWindow(ImgRectI(-10, 1, 3, 20));
    EXPECT_EQ(img->ValidWindow(), ImgRectI(-4, 1, 3, 5));
    img->SetValidWindow(ImgRectI(50, 50, 60, 60));
    EXPECT_TRUE(img->ValidWindow().IsNull());

    img->SetDataWindow(ImgRectI(1, 1, 5, 4)); // still without rows: allowed
    EXPECT_EQ(img->DataWindow(), ImgRectI(1, 1, 5, 4));
    ASSERT_TRUE(img->AllocScanLineData());
    img->SetDataWindow(ImgRectI(0, 0, 10, 6)); // rows exist: ignored
    EXPECT_EQ(img->DataWindow(), ImgRectI(1, 1, 5, 4));
    EXPECT_EQ(img->RowBytes(), 4u * 8u);

    auto empty = MakeImage(4, 4, 8);
    empty->SetDataWindow(ImgRectI(3, 3, 3, 9)); // a null window
    EXPECT_TRUE(empty->DataWindow().IsNull());
    EXPECT_TRUE(empty->ValidWindow().IsNull());
    EXPECT_TRUE(empty->AllocScanLineData());
    EXPECT_EQ(empty->ScanLine(3), nullptr);
    EXPECT_EQ(empty->GetFlt(3, 3), FltPixel{});
}

TEST(ImageRows, AllocatedLateAndZeroed) {
    for (int depth : AllDepths) {
        SCOPED_TRACE(depth);
        const ImgRectI dw(-3, -2, 5, 4);
        auto img = MakeImage(6, 4, depth, &dw);
        EXPECT_FALSE(img->HasScanLineData());
        EXPECT_EQ(img->ScanLine(0), nullptr);
        EXPECT_EQ(img->PixelAddress(0, 0), nullptr);
        EXPECT_EQ(img->DataBytes(), 0u);
        img->PutFlt(0, 0, {1, 1, 1, 1}); // nowhere to go yet
        EXPECT_FALSE(img->HasScanLineData());

        ASSERT_TRUE(img->AllocScanLineData());
        ASSERT_TRUE(img->HasScanLineData());
        const size_t bpp = FormatOfDepth(depth).BytesPerPixel();
        EXPECT_EQ(img->RowBytes(), 8 * bpp);
        EXPECT_EQ(img->DataBytes(), 8 * 6 * bpp);
        std::vector<uint8_t *> rows;
        for (int y = dw.y0; y < dw.y1; ++y) {
            uint8_t *row = img->ScanLine(y);
            ASSERT_NE(row, nullptr) << y;
            EXPECT_EQ(img->Row<uint8_t>(y), row);
            for (size_t i = 0; i < img->RowBytes(); ++i) ASSERT_EQ(row[i], 0) << "byte " << i << " of row " << y;
            for (int x = dw.x0; x < dw.x1; ++x) EXPECT_EQ(img->PixelAddress(x, y), row + (x - dw.x0) * bpp);
            rows.push_back(row);
        }
        // Rows do not overlap: mark each fully and read the marks back.
        for (int i = 0; i < static_cast<int>(rows.size()); ++i) std::memset(rows[i], i + 1, img->RowBytes());
        for (int i = 0; i < static_cast<int>(rows.size()); ++i)
            for (size_t b = 0; b < img->RowBytes(); ++b) ASSERT_EQ(rows[i][b], i + 1);

        // Outside the data window there is no address.
        for (int y : {dw.y0 - 1, dw.y1, -100, 100}) EXPECT_EQ(img->ScanLine(y), nullptr) << y;
        struct At {
            int x, y;
        };
        for (const At &a : {At{dw.x0 - 1, 0}, At{dw.x1, 0}, At{0, dw.y0 - 1}, At{0, dw.y1}, At{dw.x1, dw.y1}})
            EXPECT_EQ(img->PixelAddress(a.x, a.y), nullptr) << a.x << ", " << a.y;

        // A second call keeps the rows and their contents.
        ASSERT_TRUE(img->AllocScanLineData());
        EXPECT_EQ(img->ScanLine(dw.y0), rows[0]);
        EXPECT_EQ(rows[0][0], 1);
    }

    auto none = MakeImage(8, 8, 8);
    none->SetNoData(true);
    EXPECT_TRUE(none->IsNoData());
    EXPECT_FALSE(none->AllocScanLineData());
    EXPECT_FALSE(none->HasScanLineData());
    EXPECT_EQ(none->ScanLine(0), nullptr);
    none->Fill({1, 1, 1, 1});
    EXPECT_FALSE(none->HasScanLineData());
    none->SetCanvasColor(FltPixel{0.5f, 0.25f, 0, 1});
    EXPECT_EQ(none->GetFlt(2, 2), (FltPixel{0.5f, 0.25f, 0, 1}));
}

TEST(ImageCanvas, OutsideTheDataWindow) {
    const ImgRectI dw(1, 1, 4, 3);
    auto img = MakeImage(5, 4, 6, &dw);
    EXPECT_TRUE(img->IsCanvasColorClear());
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    img->SetCanvasColor(canvas);
    EXPECT_FALSE(img->IsCanvasColorClear());
    EXPECT_EQ(img->GetCanvasColor(), canvas);
    EXPECT_EQ(img->GetFlt(2, 2), canvas); // no rows yet: all canvas
    ASSERT_TRUE(img->AllocScanLineData());
    img->PutFlt(2, 2, {1, 1, 1, 1});
    EXPECT_EQ(img->GetFlt(2, 2), (FltPixel{1, 1, 1, 1}));
    EXPECT_EQ(img->GetFlt(1, 1), FltPixel{});
    for (int y = -1; y <= 4; ++y)
        for (int x = -1; x <= 5; ++x)
            if (!dw.Contains(x, y)) {
                EXPECT_EQ(img->GetFlt(x, y), canvas) << x << ", " << y;
            }
    img->PutFlt(0, 0, {1, 1, 1, 1}); // outside: ignored
    EXPECT_EQ(img->GetFlt(0, 0), canvas);

    // The canvas as 16-bit components.
    img->SetCanvasColor(Pixel{65535, 0, 32768, 257});
    const FltPixel f = img->GetCanvasColor();
    EXPECT_NEAR(f.R, 1.0, 1e-7);
    EXPECT_EQ(f.G, 0.0f);
    EXPECT_NEAR(f.B, 32768 / 65535.0, 1e-7);
    EXPECT_NEAR(f.A, 257 / 65535.0, 1e-9);
    Pixel p;
    img->GetCanvasColor(p);
    EXPECT_EQ(p, (Pixel{65535, 0, 32768, 257}));

    auto other = MakeImage(2, 2, 1);
    other->CopyCanvasColor(img.Get());
    EXPECT_EQ(other->GetCanvasColor(), img->GetCanvasColor());
}

// ---------------------------------------------------------------------------------------------------------------
// Pixel access

TEST(ImagePixels, PutGetRoundTripPerDepth) {
    const float values[] = {0.0f, 1.0f,  0.5f,  1.0f / 255, 0.25f, 0.73f,        1e-3f, 0.999f, 1e-6f, -0.2f,
                            1.7f, -0.0f, 65504, 1e-7f,      0.1f,  100.4f / 255, NaNf,  Inff,   -Inff, 3.0f / 65535};
    for (int depth : AllDepths) {
        SCOPED_TRACE(depth);
        auto img = MakeImage(4, 4, depth);
        ASSERT_TRUE(img->AllocScanLineData());
        const int n = sizeof values / sizeof values[0];
        for (int i = 0; i < n; ++i) {
            // Each value in each channel, the others different.
            const FltPixel p{values[i], values[(i + 3) % n], values[(i + 7) % n], values[(i + 11) % n]};
            img->PutFlt(1, 2, p);
            const FltPixel got = img->GetFlt(1, 2);
            EXPECT_TRUE(PixelNear(depth, got, ExpectedRead(depth, p), true)) << "value index " << i;
        }
        EXPECT_EQ(img->GetFlt(0, 0), FltPixel{}); // neighbours untouched
        EXPECT_EQ(img->GetFlt(2, 2), FltPixel{});
    }
}

TEST(ImagePixels, IntegerDepthsRoundToTheNearestCode) {
    const double offsets[] = {-0.49, -0.3, 0.0, 0.3, 0.49};
    for (int depth : {1, 2, 5, 6}) {
        SCOPED_TRACE(depth);
        const long max = ComponentKind(depth) == 0 ? 255 : 65535;
        std::vector<FltPixel> in;
        std::vector<long> codes;
        for (long k = 0; k <= max; ++k)
            for (double d : offsets) {
                if ((k == 0 && d < 0) || (k == max && d > 0)) continue;
                const float v = static_cast<float>((k + d) / max);
                in.push_back({v, v, v, v});
                codes.push_back(k);
            }
        const int bpc = FormatOfDepth(depth).bytesPerComponent, ch = FormatOfDepth(depth).channels;
        std::vector<uint8_t> raw(in.size() * bpc * ch);
        StoreFlt(depth, in.data(), static_cast<int>(in.size()), raw.data());
        int wrong = 0;
        for (size_t i = 0; i < in.size(); ++i) {
            const long got = CodeAt(raw, bpc, i * ch + ch - 1); // the alpha component
            if (got != codes[i] && ++wrong <= 5)
                ADD_FAILURE() << "value " << in[i].A << " stored as " << got << ", nearest code " << codes[i];
        }
        EXPECT_EQ(wrong, 0);
    }
}

TEST(ImagePixels, FloatsStoreAsTheExactlyNearestCode) {
    // Any float in 0..1: the code nearest to v * max, computed exactly.
    Values v{99};
    std::vector<FltPixel> in;
    for (int i = 0; i < 400000; ++i) {
        float f = v.Next();
        f = f < 0 ? -f : (f > 1 ? f - 0.5f : f);
        in.push_back({f, 1.0f - f, f * 0.5f, f});
    }
    for (int depth : {5, 6}) {
        SCOPED_TRACE(depth);
        const long max = depth == 5 ? 255 : 65535;
        const int bpc = depth == 5 ? 1 : 2;
        std::vector<uint8_t> raw(in.size() * 4 * bpc);
        StoreFlt(depth, in.data(), static_cast<int>(in.size()), raw.data());
        int wrong = 0;
        for (size_t i = 0; i < in.size(); ++i) {
            const float src[4] = {in[i].R, in[i].G, in[i].B, in[i].A};
            for (int c = 0; c < 4; ++c) {
                const long got = CodeAt(raw, bpc, i * 4 + c), want = NearestCode(src[c], max);
                if (got != want && ++wrong <= 5)
                    ADD_FAILURE() << "float " << src[c] << " (x max = " << static_cast<double>(src[c]) * max
                                  << ") stored as " << got << ", nearest code " << want;
            }
        }
        EXPECT_EQ(wrong, 0);
    }
}

// ---------------------------------------------------------------------------------------------------------------
// Runs of pixels

TEST(PixelRuns, EightBitLoadsAndStores) {
    std::vector<uint8_t> rgba(256 * 4), mask(256);
    for (int k = 0; k < 256; ++k) {
        rgba[k * 4 + 0] = static_cast<uint8_t>(k);
        rgba[k * 4 + 1] = static_cast<uint8_t>(255 - k);
        rgba[k * 4 + 2] = static_cast<uint8_t>(k * 7);
        rgba[k * 4 + 3] = static_cast<uint8_t>(k * 13);
        mask[k] = static_cast<uint8_t>(k);
    }
    std::vector<FltPixel> f(256);
    LoadFlt(DepthRGBAInt8, rgba.data(), 256, f.data());
    std::vector<Pixel> p(256);
    LoadPixel(DepthRGBAInt8, rgba.data(), 256, p.data());
    for (int k = 0; k < 256; ++k) {
        const float got[4] = {f[k].R, f[k].G, f[k].B, f[k].A};
        const uint16_t wide[4] = {p[k].R, p[k].G, p[k].B, p[k].A};
        for (int c = 0; c < 4; ++c) {
            const int code = rgba[k * 4 + c];
            ASSERT_NEAR(got[c], code / 255.0, 2e-7) << k << " channel " << c;
            ASSERT_EQ(wide[c], code * 257) << k << " channel " << c; // 255 widens to 65535
        }
    }
    std::vector<uint8_t> back(rgba.size());
    StoreFlt(DepthRGBAInt8, f.data(), 256, back.data());
    EXPECT_EQ(back, rgba);
    std::fill(back.begin(), back.end(), 0);
    StorePixel(DepthRGBAInt8, p.data(), 256, back.data());
    EXPECT_EQ(back, rgba);

    // A mask reads into all four channels and stores alpha.
    LoadFlt(DepthAInt8, mask.data(), 256, f.data());
    LoadPixel(DepthAInt8, mask.data(), 256, p.data());
    for (int k = 0; k < 256; ++k) {
        ASSERT_NEAR(f[k].R, k / 255.0, 2e-7);
        ASSERT_TRUE(f[k].R == f[k].G && f[k].G == f[k].B && f[k].B == f[k].A) << k;
        ASSERT_EQ(p[k], (Pixel{static_cast<uint16_t>(k * 257), static_cast<uint16_t>(k * 257),
                               static_cast<uint16_t>(k * 257), static_cast<uint16_t>(k * 257)}));
        f[k].R = f[k].G = f[k].B = 0.9f; // not stored
        p[k].R = p[k].G = p[k].B = 1234;
    }
    std::vector<uint8_t> maskBack(256);
    StoreFlt(DepthAInt8, f.data(), 256, maskBack.data());
    EXPECT_EQ(maskBack, mask);
    std::fill(maskBack.begin(), maskBack.end(), 0);
    StorePixel(DepthAInt8, p.data(), 256, maskBack.data());
    EXPECT_EQ(maskBack, mask);

    // Every 16-bit value narrows to the nearest 8-bit code.
    for (uint32_t v = 0; v < 65536; ++v) {
        const Pixel in{0, 0, 0, static_cast<uint16_t>(v)};
        uint8_t out = 0;
        StorePixel(DepthAInt8, &in, 1, &out);
        ASSERT_EQ(out, std::lround(v / 257.0)) << v;
        ASSERT_EQ(U16ToU8(static_cast<uint16_t>(v)), std::lround(v / 257.0)) << v;
    }
}

TEST(PixelRuns, SixteenBitLoadsAndStores) {
    std::vector<uint16_t> codes(65536);
    for (uint32_t k = 0; k < 65536; ++k) codes[k] = static_cast<uint16_t>(k);
    const auto *raw = reinterpret_cast<const uint8_t *>(codes.data());
    for (int depth : {DepthAInt16, DepthRGBAInt16}) {
        SCOPED_TRACE(depth);
        const int count = depth == DepthAInt16 ? 65536 : 16384;
        std::vector<FltPixel> f(count);
        std::vector<Pixel> p(count);
        LoadFlt(depth, raw, count, f.data());
        LoadPixel(depth, raw, count, p.data());
        for (int i = 0; i < count; ++i) {
            const float got[4] = {f[i].R, f[i].G, f[i].B, f[i].A};
            const uint16_t wide[4] = {p[i].R, p[i].G, p[i].B, p[i].A};
            for (int c = 0; c < 4; ++c) {
                const uint16_t code = depth == DepthAInt16 ? codes[i] : codes[i * 4 + c];
                ASSERT_NEAR(got[c], code / 65535.0, 2e-7) << code;
                ASSERT_EQ(wide[c], code);
            }
        }
        std::vector<uint16_t> back(65536);
        StoreFlt(depth, f.data(), count, reinterpret_cast<uint8_t *>(back.data()));
        EXPECT_EQ(back, codes);
        std::fill(back.begin(), back.end(), 0);
        StorePixel(depth, p.data(), count, reinterpret_cast<uint8_t *>(back.data()));
        EXPECT_EQ(back, codes);
    }
}

TEST(PixelRuns, HalfLoadsAndStores) {
    std::vector<uint16_t> halves;
    for (uint32_t h = 0; h < 65536; ++h)
        if (((h >> 10) & 0x1f) != 0x1f || (h & 0x3ff) == 0) halves.push_back(static_cast<uint16_t>(h)); // no NaN
    while (halves.size() % 4) halves.push_back(0);
    const auto *raw = reinterpret_cast<const uint8_t *>(halves.data());
    const int n = static_cast<int>(halves.size());
    std::vector<float> exact(n);
    for (int i = 0; i < n; ++i) {
        Orvane::Test::CompilerHalf h;
        std::memcpy(&h, &halves[i], 2);
        exact[i] = static_cast<float>(h);
    }
    for (int depth : {DepthAFlt16, DepthRGBAFlt16}) {
        SCOPED_TRACE(depth);
        const int count = depth == DepthAFlt16 ? n : n / 4;
        std::vector<FltPixel> f(count);
        std::vector<Pixel> p(count);
        LoadFlt(depth, raw, count, f.data());
        LoadPixel(depth, raw, count, p.data());
        for (int i = 0; i < count; ++i) {
            const float got[4] = {f[i].R, f[i].G, f[i].B, f[i].A};
            const uint16_t wide[4] = {p[i].R, p[i].G, p[i].B, p[i].A};
            for (int c = 0; c < 4; ++c) {
                const float want = depth == DepthAFlt16 ? exact[i] : exact[i * 4 + c];
                ASSERT_EQ(got[c], want) << i;
                ASSERT_EQ(wide[c], NearestCode(want, 65535)) << "half value " << want;
            }
        }
        std::vector<uint16_t> back(n);
        StoreFlt(depth, f.data(), count, reinterpret_cast<uint8_t *>(back.data()));
        for (int i = 0; i < n; ++i) // -0 and +0 both fine; everything else exact
            ASSERT_TRUE(back[i] == halves[i] || (exact[i] == 0 && (back[i] & 0x7fff) == 0)) << i;
    }
    // 16-bit values stored as halves land on the half nearest v / 65535.
    std::vector<Pixel> in(65536);
    for (uint32_t v = 0; v < 65536; ++v) in[v].A = static_cast<uint16_t>(v);
    std::vector<uint16_t> out(65536);
    StorePixel(DepthAFlt16, in.data(), 65536, reinterpret_cast<uint8_t *>(out.data()));
    for (uint32_t v = 0; v < 65536; ++v) {
        Orvane::Test::CompilerHalf h;
        std::memcpy(&h, &out[v], 2);
        const double want = v / 65535.0;
        ASSERT_LE(std::fabs(static_cast<double>(h) - want), 0.5 * HalfStep(want) * 1.001) << v;
    }
}

TEST(PixelRuns, FloatLoadsStoresAndClamping) {
    const std::vector<float> values = {0.0f, 1.0f, 0.5f, -0.25f, 1.5f, NaNf, Inff, -Inff, 1e-9f, 0.7f, 65504.f, -0.0f};
    std::vector<float> data = values;
    while (data.size() % 4) data.push_back(0.3f);
    const auto *raw = reinterpret_cast<const uint8_t *>(data.data());
    const int n = static_cast<int>(data.size());

    std::vector<FltPixel> f(n / 4);
    LoadFlt(DepthRGBAFlt32, raw, n / 4, f.data());
    EXPECT_EQ(std::memcmp(f.data(), data.data(), n * sizeof(float)), 0); // bits, NaN included
    std::vector<float> back(n);
    StoreFlt(DepthRGBAFlt32, f.data(), n / 4, reinterpret_cast<uint8_t *>(back.data()));
    EXPECT_EQ(std::memcmp(back.data(), data.data(), n * sizeof(float)), 0);

    std::vector<FltPixel> m(n);
    LoadFlt(DepthAFlt32, raw, n, m.data());
    std::vector<Pixel> p(n);
    LoadPixel(DepthAFlt32, raw, n, p.data());
    for (int i = 0; i < n; ++i) {
        const float v = data[i];
        for (float c : {m[i].R, m[i].G, m[i].B, m[i].A}) EXPECT_TRUE(std::memcmp(&c, &v, sizeof v) == 0) << i;
        EXPECT_EQ(p[i].A, NearestCode(v, 65535)) << v; // clamped, NaN to 0
        EXPECT_EQ(p[i].R, p[i].A);
    }

    // Out-of-range floats into the integer depths.
    struct Clamp {
        float in;
        long c8, c16;
    };
    const Clamp clamps[] = {{-1.0f, 0, 0},
                            {-0.0f, 0, 0},
                            {NaNf, 0, 0},
                            {-NaNf, 0, 0},
                            {Inff, 255, 65535},
                            {-Inff, 0, 0},
                            {1.0f, 255, 65535},
                            {1.0000001f, 255, 65535},
                            {7.5f, 255, 65535},
                            {0.5f, 128, 32768},
                            {1e-9f, 0, 0},
                            {0.49f / 255, 0, 126},
                            {0.51f / 255, 1, 131},
                            {254.4f / 255, 254, 65381},
                            {254.6f / 255, 255, 65432}};
    for (const Clamp &c : clamps) {
        SCOPED_TRACE(c.in);
        const FltPixel px{c.in, c.in, c.in, c.in};
        uint8_t b8[4];
        StoreFlt(DepthRGBAInt8, &px, 1, b8);
        for (uint8_t b : b8) EXPECT_EQ(b, c.c8);
        uint16_t b16[4];
        StoreFlt(DepthRGBAInt16, &px, 1, reinterpret_cast<uint8_t *>(b16));
        for (uint16_t b : b16) EXPECT_EQ(b, c.c16);
        EXPECT_EQ(FltToPixel(px), (Pixel{static_cast<uint16_t>(c.c16), static_cast<uint16_t>(c.c16),
                                         static_cast<uint16_t>(c.c16), static_cast<uint16_t>(c.c16)}));
        EXPECT_EQ(FloatToU8(c.in), c.c8);
        EXPECT_EQ(FloatToU16(c.in), c.c16);
    }

    // 16-bit to float and back, every value.
    for (uint32_t v = 0; v < 65536; ++v) {
        const Pixel px{static_cast<uint16_t>(v), 0, static_cast<uint16_t>(65535 - v), 65535};
        const FltPixel fp = PixelToFlt(px);
        ASSERT_NEAR(fp.R, v / 65535.0, 2e-7);
        ASSERT_EQ(FltToPixel(fp), px) << v;
        float stored[4];
        StorePixel(DepthRGBAFlt32, &px, 1, reinterpret_cast<uint8_t *>(stored));
        ASSERT_NEAR(stored[0], v / 65535.0, 2e-7);
        ASSERT_EQ(stored[3], 1.0f);
    }
}

TEST(PixelRuns, ReadSpanGivesCanvasLeftAndRight) {
    const ImgRectI dw(2, 1, 6, 4);
    const FltPixel canvas{0.125f, 0.25f, 0.375f, 0.5f};
    struct Span {
        int y, x0, x1;
    };
    const Span spans[] = {{2, -1, 9}, {2, 2, 6}, {2, 3, 5}, {2, -3, 1}, {2, 6, 10}, {2, 0, 4}, {2, 4, 8},  {0, -1, 9},
                          {4, -1, 9}, {1, 5, 6}, {3, 1, 2}, {3, 2, 3},  {1, -5, 2}, {3, 6, 7}, {-7, 0, 3}, {100, 3, 4}};
    for (int depth : AllDepths) {
        SCOPED_TRACE(depth);
        auto img = MakeImage(8, 5, depth, &dw);
        img->SetCanvasColor(canvas);
        const std::vector<FltPixel> put = PutPattern(*img, 5 + depth);
        for (const Span &s : spans) {
            SCOPED_TRACE(testing::Message() << "row " << s.y << " x " << s.x0 << ".." << s.x1);
            std::vector<FltPixel> out(s.x1 - s.x0 + 2, FltPixel{-9, -9, -9, -9});
            ReadSpanFlt(*img, s.y, s.x0, s.x1, out.data() + 1);
            EXPECT_EQ(out.front(), (FltPixel{-9, -9, -9, -9})); // nothing written outside the run
            EXPECT_EQ(out.back(), (FltPixel{-9, -9, -9, -9}));
            for (int x = s.x0; x < s.x1; ++x) {
                const Expect4 want =
                    dw.Contains(x, s.y) ? ExpectedRead(depth, PutAt(put, dw, x, s.y)) : AsExpect(canvas);
                EXPECT_TRUE(PixelNear(depth, out[x - s.x0 + 1], want, true)) << "x " << x;
            }
        }
        FltPixel untouched{-9, -9, -9, -9};
        ReadSpanFlt(*img, 2, 5, 5, &untouched);
        ReadSpanFlt(*img, 2, 5, 3, &untouched);
        EXPECT_EQ(untouched, (FltPixel{-9, -9, -9, -9}));
    }
    // Without rows the whole run is canvas.
    auto bare = MakeImage(8, 5, 8, &dw);
    bare->SetCanvasColor(canvas);
    std::vector<FltPixel> out(6);
    ReadSpanFlt(*bare, 2, 1, 7, out.data());
    for (const FltPixel &p : out) EXPECT_EQ(p, canvas);
}

// ---------------------------------------------------------------------------------------------------------------
// Whole-image services

TEST(ImageServices, FillFillWithinAndClear) {
    const ImgRectI dw(-1, -1, 5, 4);
    const FltPixel first{0.2f, 1.3f, -0.2f, 0.6f}, second{0.9f, 0.1f, 0.45f, 1.0f};
    const ImgRectI within(2, 0, 9, 2); // partly outside the data window
    for (int depth : AllDepths) {
        SCOPED_TRACE(depth);
        auto img = MakeImage(6, 5, depth, &dw);
        img->FillWithin(first, within);
        ASSERT_TRUE(img->HasScanLineData()); // rows made on demand
        const ImgRectI filled = within & dw;
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int x = dw.x0; x < dw.x1; ++x) {
                const Expect4 want = filled.Contains(x, y) ? ExpectedRead(depth, first) : Expect4{{0, 0, 0, 0}};
                ASSERT_TRUE(PixelNear(depth, img->GetFlt(x, y), want, true)) << x << ", " << y;
            }
        img->Fill(second);
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int x = dw.x0; x < dw.x1; ++x)
                ASSERT_TRUE(PixelNear(depth, img->GetFlt(x, y), ExpectedRead(depth, second), true)) << x << ", " << y;

        img->SetCanvasColor(second);
        img->Clear();
        EXPECT_TRUE(img->IsCanvasColorClear());
        for (int y = dw.y0; y < dw.y1; ++y) {
            const uint8_t *row = img->ScanLine(y);
            for (size_t i = 0; i < img->RowBytes(); ++i) ASSERT_EQ(row[i], 0) << "row " << y << " byte " << i;
        }
    }

    // A large image, filled by the worker pool, every row.
    auto big = MakeImage(300, 257, 5);
    big->FillWithin({1, 0, 0, 1}, ImgRectI(10, 3, 290, 250));
    for (int y = 0; y < 257; ++y) {
        const bool rowIn = y >= 3 && y < 250;
        ASSERT_EQ(big->GetFlt(9, y).A, 0.0f) << y;
        ASSERT_EQ(big->GetFlt(10, y).A > 0.5f, rowIn) << y;
        ASSERT_EQ(big->GetFlt(289, y).R > 0.5f, rowIn) << y;
        ASSERT_EQ(big->GetFlt(289, y).G, 0.0f) << y;
        ASSERT_EQ(big->GetFlt(290, y).A, 0.0f) << y;
    }
}

TEST(ImageServices, CopyBetweenEveryPairOfDepths) {
    const ImgRectI srcWindow(-2, -1, 5, 4);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    const ImgRectI dstWindows[] = {
        {0, 0, 8, 6},    // partly outside the source on two sides
        {-1, 0, 4, 3},   // inside the source
        {-4, -3, 9, 7},  // around the source
        {-2, -3, 5, 7},  // the source's columns, more rows
        {20, 20, 23, 22} // nowhere near: all canvas
    };
    for (int sd : AllDepths) {
        auto src = MakeImage(6, 5, sd, &srcWindow);
        src->SetCanvasColor(canvas);
        const std::vector<FltPixel> put = PutPattern(*src, 40 + sd);
        for (int dd : AllDepths)
            for (const ImgRectI &dw : dstWindows) {
                SCOPED_TRACE(testing::Message() << "depth " << sd << " to " << dd << ", destination window " << dw.x0
                                                << ", " << dw.y0 << ", " << dw.x1 << ", " << dw.y1);
                auto dst = MakeImage(6, 5, dd, &dw);
                dst->ImageCopy(src.Get());
                ASSERT_TRUE(dst->HasScanLineData());
                for (int y = dw.y0; y < dw.y1; ++y)
                    for (int x = dw.x0; x < dw.x1; ++x) {
                        const Expect4 from =
                            srcWindow.Contains(x, y) ? ExpectedRead(sd, PutAt(put, srcWindow, x, y)) : AsExpect(canvas);
                        const Expect4 want = ExpectedRead(dd, AsPixel(from));
                        ASSERT_TRUE(PixelNear(dd, dst->GetFlt(x, y), want, sd == dd || sd == 4 || sd == 8))
                            << x << ", " << y;
                    }
            }
    }
    // A source without rows gives canvas everywhere.
    auto bare = MakeImage(4, 4, 6);
    bare->SetNoData(true);
    bare->SetCanvasColor(canvas);
    auto dst = MakeImage(4, 4, 8);
    dst->ImageCopy(bare.Get());
    for (int y = 0; y < 4; ++y)
        for (int x = 0; x < 4; ++x) EXPECT_EQ(dst->GetFlt(x, y), canvas);
}

TEST(ImageServices, CopyOfImageIsDeep) {
    const ImgRectI dw(-1, -2, 8, 6);
    auto src = MakeImage(9, 7, 6, &dw);
    src->SetScale(2.0, 0.5);
    src->SetValidWindow(ImgRectI(0, 0, 5, 5));
    src->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.4f});
    src->SetIsOpaque(true);
    std::string note = "copied note";
    src->SetAttrsTagList({{ImgFullWidth, 100}, {ImgFieldOffset, 0.5}, {0x30020f00, note.c_str()}});
    note.assign(note.size(), '#');
    const std::vector<FltPixel> put = PutPattern(*src, 3);
    ASSERT_TRUE(src->AddAuxChannel(AuxChannelKind::Z));
    ASSERT_TRUE(src->AddAuxChannel(AuxChannelKind::Coverage));
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int i = 0; i < dw.Width(); ++i) {
            src->AuxRow(AuxChannelKind::Z, y)[i] = y * 100.0f + i;
            src->AuxRow(AuxChannelKind::Coverage, y)[i] = -i * 0.5f;
        }

    Ref<Image> copy = CopyOfImage(src.Get());
    ASSERT_TRUE(copy);
    EXPECT_NE(copy.Get(), src.Get());
    EXPECT_EQ(copy->RefCount(), 1);
    EXPECT_EQ(Shape(*copy), std::make_tuple(9, 7, 6, 2.0, 0.5));
    EXPECT_EQ(copy->DataWindow(), dw);
    EXPECT_EQ(copy->ValidWindow(), ImgRectI(0, 0, 5, 5));
    EXPECT_EQ(copy->GetCanvasColor(), src->GetCanvasColor());
    EXPECT_TRUE(copy->IsOpaque());
    EXPECT_EQ(copy->GetAttrL(ImgFullWidth), 100);
    EXPECT_EQ(copy->GetAttrD(ImgFieldOffset), 0.5);
    ASSERT_TRUE(copy->HasScanLineData());
    for (int y = dw.y0; y < dw.y1; ++y) {
        EXPECT_NE(copy->ScanLine(y), src->ScanLine(y));
        EXPECT_EQ(std::memcmp(copy->ScanLine(y), src->ScanLine(y), src->RowBytes()), 0) << y;
        for (AuxChannelKind k : {AuxChannelKind::Z, AuxChannelKind::Coverage}) {
            ASSERT_NE(copy->AuxRow(k, y), nullptr);
            EXPECT_NE(copy->AuxRow(k, y), src->AuxRow(k, y));
            EXPECT_EQ(std::memcmp(copy->AuxRow(k, y), src->AuxRow(k, y), dw.Width() * sizeof(float)), 0) << y;
        }
    }
    EXPECT_FALSE(copy->HasAuxChannel(AuxChannelKind::U));

    // Writing to the copy leaves the source alone.
    const FltPixel before = src->GetFlt(3, 3);
    copy->PutFlt(3, 3, {0, 0, 0, 0});
    copy->AuxRow(AuxChannelKind::Z, 1)[2] = -1.0f;
    EXPECT_EQ(src->GetFlt(3, 3), before);
    EXPECT_EQ(src->AuxRow(AuxChannelKind::Z, 1)[2], 102.0f);

    // The attributes' text belongs to the copy too.
    src.Reset();
    EXPECT_STREQ(copy->Attrs().GetText(0x30020f00), "copied note");

    // Without rows: a copy without rows, with the same channels listed.
    auto bare = MakeImage(4, 3, 3);
    bare->AddAuxChannel(AuxChannelKind::VectorX);
    Ref<Image> bareCopy = CopyOfImage(bare.Get());
    ASSERT_TRUE(bareCopy);
    EXPECT_FALSE(bareCopy->HasScanLineData());
    EXPECT_TRUE(bareCopy->HasAuxChannel(AuxChannelKind::VectorX));
    EXPECT_EQ(bareCopy->Depth(), 3);
    EXPECT_FALSE(CopyOfImage(nullptr));

    // Copy() of the parameter is the same deep copy.
    Ref<Parameter> asParam = copy->Copy();
    auto *paramImage = dynamic_cast<Image *>(asParam.Get());
    ASSERT_NE(paramImage, nullptr);
    EXPECT_NE(paramImage, copy.Get());
    EXPECT_EQ(paramImage->GetFlt(3, 3), copy->GetFlt(3, 3));
}

TEST(ImageAux, PlanesBesideTheColourRows) {
    const ImgRectI dw(1, 1, 6, 4);
    auto img = MakeImage(5, 4, 8, &dw);
    EXPECT_FALSE(img->HasAuxChannel(AuxChannelKind::Z));
    ASSERT_TRUE(img->AddAuxChannel(AuxChannelKind::Z)); // before rows
    EXPECT_TRUE(img->HasAuxChannel(AuxChannelKind::Z));
    EXPECT_FALSE(img->HasAuxChannel(AuxChannelKind::U));
    EXPECT_EQ(img->AuxRow(AuxChannelKind::Z, 1), nullptr); // no storage yet

    const std::vector<FltPixel> put = PutPattern(*img, 17);
    std::vector<uint8_t *> colourRows;
    for (int y = dw.y0; y < dw.y1; ++y) {
        colourRows.push_back(img->ScanLine(y));
        float *z = img->AuxRow(AuxChannelKind::Z, y);
        ASSERT_NE(z, nullptr) << y;
        for (int i = 0; i < dw.Width(); ++i) EXPECT_EQ(z[i], 0.0f);
        for (int i = 0; i < dw.Width(); ++i) z[i] = y + i * 0.125f;
    }
    for (int y : {0, 4, -5}) EXPECT_EQ(img->AuxRow(AuxChannelKind::Z, y), nullptr) << y;
    EXPECT_EQ(img->AuxRow(AuxChannelKind::U, 1), nullptr);

    // Added after the rows: storage at once, zeroed; the colour rows stay where they were.
    ASSERT_TRUE(img->AddAuxChannel(AuxChannelKind::Coverage));
    for (int y = dw.y0; y < dw.y1; ++y) {
        EXPECT_EQ(img->ScanLine(y), colourRows[y - dw.y0]);
        const float *c = img->AuxRow(AuxChannelKind::Coverage, y);
        ASSERT_NE(c, nullptr);
        for (int i = 0; i < dw.Width(); ++i) EXPECT_EQ(c[i], 0.0f);
        for (int x = dw.x0; x < dw.x1; ++x) EXPECT_EQ(img->GetFlt(x, y), PutAt(put, dw, x, y)) << x << ", " << y;
    }
    float *z1 = img->AuxRow(AuxChannelKind::Z, 1);
    ASSERT_TRUE(img->AddAuxChannel(AuxChannelKind::Z)); // again: the same plane
    EXPECT_EQ(img->AuxRow(AuxChannelKind::Z, 1), z1);
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int i = 0; i < dw.Width(); ++i) EXPECT_EQ(img->AuxRow(AuxChannelKind::Z, y)[i], y + i * 0.125f);

    // Every kind can be added, each its own plane.
    for (int k = 0; k < static_cast<int>(AuxChannelKind::Count); ++k)
        ASSERT_TRUE(img->AddAuxChannel(static_cast<AuxChannelKind>(k)));
    for (int k = 0; k < static_cast<int>(AuxChannelKind::Count); ++k)
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int i = 0; i < dw.Width(); ++i) img->AuxRow(static_cast<AuxChannelKind>(k), y)[i] = k * 1000.0f + y;
    for (int k = 0; k < static_cast<int>(AuxChannelKind::Count); ++k)
        for (int y = dw.y0; y < dw.y1; ++y)
            for (int i = 0; i < dw.Width(); ++i)
                ASSERT_EQ(img->AuxRow(static_cast<AuxChannelKind>(k), y)[i], k * 1000.0f + y) << k;
}

// ---------------------------------------------------------------------------------------------------------------
// NewImageTagList

TEST(NewImage, SizeDepthAndAspect) {
    Ref<Image> img = NewImageTagList({{ImgWidth, 20}, {ImgHeight, 10}, {ImgDepth, 5}, {ImgXScale, 2.0}});
    ASSERT_TRUE(img);
    EXPECT_EQ(img->RefCount(), 1);
    EXPECT_EQ(Shape(*img), std::make_tuple(20, 10, 5, 2.0, 1.0));
    EXPECT_EQ(img->DataWindow(), ImgRectI(0, 0, 20, 10));
    EXPECT_EQ(img->ValidWindow(), ImgRectI(0, 0, 20, 10));
    EXPECT_FALSE(img->IsNoData());
    EXPECT_FALSE(img->HasScanLineData());
    EXPECT_TRUE(img->IsCanvasColorClear());
    EXPECT_EQ(img->AbortFlag(), nullptr);

    for (int depth : AllDepths) {
        Ref<Image> d = NewImageTagList({{ImgWidth, 1}, {ImgHeight, 1}, {ImgDepth, depth}});
        ASSERT_TRUE(d) << depth;
        EXPECT_EQ(d->Depth(), depth);
    }
    Ref<Image> largest = NewImageTagList({{ImgWidth, MaxImageSide}, {ImgHeight, MaxImageSide}, {ImgNoData, 1}});
    ASSERT_TRUE(largest);
    EXPECT_EQ(largest->Width(), MaxImageSide);
}

TEST(NewImage, ImpossibleFormatsGiveNull) {
    struct Case {
        const char *what;
        TagList tags;
    };
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const Case cases[] = {
        {"no size at all", {}},
        {"no height", {{ImgWidth, 4}}},
        {"zero width", {{ImgWidth, 0}, {ImgHeight, 4}}},
        {"negative height", {{ImgWidth, 4}, {ImgHeight, -1}}},
        {"too wide", {{ImgWidth, MaxImageSide + 1}, {ImgHeight, 4}}},
        {"too tall", {{ImgWidth, 4}, {ImgHeight, MaxImageSide + 1}}},
        {"width beyond 32 bits", {{ImgWidth, (1LL << 32) + 16}, {ImgHeight, 4}}},
        {"height beyond 32 bits", {{ImgWidth, 4}, {ImgHeight, -(1LL << 32) + 8}}},
        {"depth 0", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, 0}}},
        {"depth 9", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, 9}}},
        {"depth -1", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, -1}}},
        {"depth beyond 32 bits", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgDepth, (1LL << 32) + 5}}},
        {"zero x aspect", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgXScale, 0.0}}},
        {"negative y aspect", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgYScale, -1.0}}},
        {"NaN aspect", {{ImgWidth, 4}, {ImgHeight, 4}, {ImgXScale, nan}}},
    };
    for (const Case &c : cases) EXPECT_FALSE(NewImageTagList(c.tags)) << c.what;
}

TEST(NewImage, LikeImageAndExplicitTags) {
    auto like = MakeImage(30, 20, 6);
    like->SetScale(2.0, 0.5);
    like->SetDataWindow(ImgRectI(-5, -5, 40, 25));
    like->SetCanvasColor(FltPixel{1, 0, 0, 1});
    like->SetAttrsTagList({{ImgFullWidth, 60}, {ImgField, 1}, {ImgFieldOffset, 0.5}});

    Ref<Image> same = NewImageTagList({{ImgLikeImage, like.Get()}});
    ASSERT_TRUE(same);
    EXPECT_EQ(Shape(*same), std::make_tuple(30, 20, 6, 2.0, 0.5));
    EXPECT_EQ(same->GetAttrL(ImgFullWidth), 60);
    EXPECT_EQ(same->GetAttrL(ImgField), 1);
    EXPECT_EQ(same->GetAttrD(ImgFieldOffset), 0.5);
    EXPECT_EQ(same->DataWindow(), ImgRectI(0, 0, 30, 20)); // the image rectangle, not the like-image's window
    EXPECT_EQ(same->ValidWindow(), ImgRectI(0, 0, 30, 20));
    EXPECT_TRUE(same->IsCanvasColorClear());
    EXPECT_FALSE(same->HasScanLineData());

    // Explicit tags win over the like-image.
    Ref<Image> changed = NewImageTagList({{ImgLikeImage, like.Get()},
                                          {ImgWidth, 7},
                                          {ImgDepth, 1},
                                          {ImgXScale, 3.0},
                                          {ImgField, 2},
                                          {ImgFullHeight, 99}});
    ASSERT_TRUE(changed);
    EXPECT_EQ(Shape(*changed), std::make_tuple(7, 20, 1, 3.0, 0.5));
    EXPECT_EQ(changed->GetAttrL(ImgField), 2);
    EXPECT_EQ(changed->GetAttrL(ImgFullHeight), 99);
    EXPECT_EQ(changed->GetAttrL(ImgFullWidth), 60);
    EXPECT_EQ(like->GetAttrL(ImgField), 1); // the like-image keeps its own
    EXPECT_FALSE(like->Attrs().Has(ImgFullHeight));

    // An impossible result from a like-image is still refused.
    EXPECT_FALSE(NewImageTagList({{ImgLikeImage, like.Get()}, {ImgDepth, 12}}));
    EXPECT_FALSE(NewImageTagList({{ImgLikeImage, like.Get()}, {ImgHeight, 0}}));
}

TEST(NewImage, WindowsNoDataCanvasAndAbort) {
    const ImgRectI dw(-5, -5, 15, 8);
    const ImgRectI vw(2, 2, 30, 30);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.0f};
    std::atomic<bool> abort{false};

    struct Case {
        const ImgRectI *data, *valid;
        bool validTag;
        ImgRectI wantData, wantValid;
    };
    const ImgRectI frame(0, 0, 10, 6);
    for (const Case &w : {Case{&dw, nullptr, false, dw, dw}, Case{&dw, &vw, true, dw, ImgRectI(2, 2, 15, 8)},
                          Case{nullptr, &vw, true, frame, ImgRectI(2, 2, 10, 6)},
                          Case{&dw, nullptr, true, dw, dw}}) { // a null valid window: the data window
        TagList tags{{ImgWidth, 10}, {ImgHeight, 6}};
        if (w.data) tags.Add({ImgDataWindow, w.data});
        if (w.validTag) tags.Add({ImgValidWindow, w.valid});
        Ref<Image> img = NewImageTagList(tags);
        ASSERT_TRUE(img);
        EXPECT_EQ(img->DataWindow(), w.wantData);
        EXPECT_EQ(img->ValidWindow(), w.wantValid);
    }

    Ref<Image> e = NewImageTagList(
        {{ImgWidth, 10}, {ImgHeight, 6}, {ImgNoData, true}, {ImgCanvasColor, &canvas}, {ImgAbortFlag, &abort}});
    ASSERT_TRUE(e);
    EXPECT_TRUE(e->IsNoData());
    EXPECT_FALSE(e->AllocScanLineData());
    EXPECT_EQ(e->GetCanvasColor(), canvas);
    EXPECT_EQ(e->AbortFlag(), &abort);
    EXPECT_FALSE(e->CheckAbort());
    abort = true;
    EXPECT_TRUE(e->CheckAbort());

    Ref<Image> f = NewImageTagList({{ImgWidth, 10}, {ImgHeight, 6}, {ImgNoData, false}, {ImgCanvasColor, nullptr}});
    ASSERT_TRUE(f);
    EXPECT_FALSE(f->IsNoData());
    EXPECT_TRUE(f->IsCanvasColorClear());
    EXPECT_TRUE(f->AllocScanLineData());
}

TEST(NewImage, AttributeTagsAreRecorded) {
    Ref<Image> img = NewImageTagList({{ImgWidth, 960},
                                      {ImgHeight, 270},
                                      {ImgFullWidth, 1920},
                                      {ImgFullHeight, 1080},
                                      {ImgField, 1},
                                      {ImgProxyScale, 2},
                                      {ImgQuickMode, true},
                                      {ImgFullXScale, 1.5},
                                      {ImgFullYScale, 0.75},
                                      {ImgFieldOffset, 0.25}});
    ASSERT_TRUE(img);
    struct Long {
        Tag tag;
        long long value;
    };
    for (const Long &l : {Long{ImgFullWidth, 1920}, Long{ImgFullHeight, 1080}, Long{ImgField, 1},
                          Long{ImgProxyScale, 2}, Long{ImgQuickMode, 1}})
        EXPECT_EQ(img->GetAttrL(l.tag, -1), l.value) << std::hex << l.tag;
    struct Double {
        Tag tag;
        double value;
    };
    for (const Double &d : {Double{ImgFullXScale, 1.5}, Double{ImgFullYScale, 0.75}, Double{ImgFieldOffset, 0.25}})
        EXPECT_EQ(img->GetAttrD(d.tag, -1), d.value) << std::hex << d.tag;

    // Tags that are not attributes are not recorded.
    EXPECT_FALSE(img->Attrs().Has(ImgWidth));
    EXPECT_FALSE(img->Attrs().Has(ImgDepth));
    Ref<Image> plain = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}});
    ASSERT_TRUE(plain);
    EXPECT_TRUE(plain->Attrs().Empty());
}

} // namespace
} // namespace Orvane::imagetest
