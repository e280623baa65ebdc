// The image object: windows, rows, canvas, pixel access and runs against values worked out here (nearest codes
// in double, halves by the compiler's binary16), whole-image services, auxiliary planes, NewImageTagList.
#include "host/image/Image.h"

#include <bit>

#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::imagetest {
namespace {
using namespace ::Orvane::Test;

constexpr float NaNf = std::numeric_limits<float>::quiet_NaN(), Inff = std::numeric_limits<float>::infinity();

double HalfStep(double v) { return 2 * HalfCode(DepthRGBAFlt16, v); }

bool AllZero(const uint8_t *p, size_t n) {
    return p && std::all_of(p, p + n, [](uint8_t b) { return b == 0; });
}

// What GetFlt gives after PutFlt(p) at `depth`: masks hold alpha in all four channels.
FltPixel ExpectedRead(int depth, const FltPixel &p) {
    auto s = [depth](float v) { return static_cast<float>(StoredValue(depth, v)); };
    if (depth <= DepthAFlt32) return {s(p.A), s(p.A), s(p.A), s(p.A)};
    return {s(p.R), s(p.G), s(p.B), s(p.A)};
}

// Integers: well under a code. Half and float: exact when the input was exact, else a half step or float ulps.
::testing::AssertionResult PixelNear(int depth, const FltPixel &got, const FltPixel &want, bool inputExact) {
    for (int c = 0; c < 4; ++c) {
        const double g = Channel(got, c), w = Channel(want, c);
        const double tol = Kind(depth) == 0   ? 0.25 / 255
                           : Kind(depth) == 1 ? 0.25 / 65535
                           : inputExact       ? 0.0
                           : Kind(depth) == 2 ? HalfStep(w)
                                              : 4e-7 * std::max(1.0, std::fabs(w));
        if (!(std::isnan(w) ? std::isnan(g) : (g == w || std::fabs(g - w) <= tol)))
            return ::testing::AssertionFailure()
                   << "channel " << c << ": got " << g << ", want " << w << " (depth " << depth << ")";
    }
    return ::testing::AssertionSuccess();
}

TEST(ImageWindows, DataWindowOnlyBeforeRowsValidWindowInsideRowsAndCanvasOutside) {
    auto img = Blank(10, 6, 7);
    EXPECT_EQ(img->ValidWindow(), ImgRectI(0, 0, 10, 6));
    img->SetDataWindow(ImgRectI(-4, -2, 7, 5));
    EXPECT_EQ(img->ValidWindow(), ImgRectI(0, 0, 7, 5)); // clipped to the new data window
    img->SetValidWindow(ImgRectI(-10, 1, 3, 20));
    EXPECT_EQ(img->ValidWindow(), ImgRectI(-4, 1, 3, 5));
    img->SetDataWindow(ImgRectI(1, 1, 5, 4)); // still without rows: allowed
    ASSERT_TRUE(img->AllocScanLineData());
    img->SetDataWindow(ImgRectI(0, 0, 10, 6)); // rows exist: ignored
    EXPECT_EQ(img->DataWindow(), ImgRectI(1, 1, 5, 4));
    auto empty = Blank(4, 4, 8);
    empty->SetDataWindow(ImgRectI(3, 3, 3, 9)); // a null window: rows of nothing
    EXPECT_TRUE(empty->ValidWindow().IsNull() && empty->AllocScanLineData());
    EXPECT_EQ(empty->ScanLine(3), nullptr);
    // Rows come late, zeroed, and only in the data window.
    const size_t bytesPerPixel[] = {1, 2, 2, 4, 4, 8, 8, 16};
    const ImgRectI dw(-3, -2, 5, 4);
    for (int depth = 1; depth <= 8; ++depth) {
        const size_t bpp = bytesPerPixel[depth - 1];
        auto img = Blank(6, 4, depth, &dw);
        img->PutFlt(0, 0, {1, 1, 1, 1}); // nowhere to go yet
        EXPECT_TRUE(!img->HasScanLineData() && !img->ScanLine(0) && !img->PixelAddress(0, 0) && !img->DataBytes());
        ASSERT_TRUE(img->AllocScanLineData());
        EXPECT_TRUE(img->RowBytes() == 8 * bpp && img->DataBytes() == 8 * 6 * bpp && !img->ScanLine(100)) << depth;
        for (int y = dw.y0 - 1; y <= dw.y1; ++y) {
            const uint8_t *row = img->ScanLine(y);
            EXPECT_TRUE(y >= dw.y0 && y < dw.y1 ? AllZero(row, img->RowBytes()) : !row) << depth << " row " << y;
            for (int x = dw.x0 - 1; x <= dw.x1; ++x)
                EXPECT_EQ(img->PixelAddress(x, y), dw.Contains(x, y) ? row + (x - dw.x0) * bpp : nullptr)
                    << x << "," << y;
        }
    }
    auto none = Blank(8, 8, 8); // an image for pre-calculation never gets rows
    none->SetNoData(true);
    none->Fill({1, 1, 1, 1});
    EXPECT_FALSE(none->AllocScanLineData() || none->HasScanLineData());
    // The canvas: outside the data window and without rows.
    const ImgRectI cw(1, 1, 4, 3);
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f}, white{1, 1, 1, 1};
    auto painted = Blank(5, 4, 6, &cw);
    painted->SetCanvasColor(canvas);
    EXPECT_EQ(painted->GetFlt(2, 2), canvas); // no rows yet: all canvas
    ASSERT_TRUE(painted->AllocScanLineData());
    painted->PutFlt(2, 2, white);
    painted->PutFlt(0, 0, white); // outside: ignored
    EXPECT_TRUE(AllNear(*painted, ImgRectI(-1, -1, 6, 5), 0.0, [&](int x, int y) {
        return !cw.Contains(x, y) ? canvas : x == 2 && y == 2 ? white : FltPixel{};
    }));
    // The canvas as 16-bit components.
    const Pixel wide{65535, 0, 32768, 257};
    painted->SetCanvasColor(wide);
    for (int c = 0; c < 4; ++c) EXPECT_NEAR(Channel(painted->GetCanvasColor(), c), (&wide.R)[c] / 65535.0, 1e-7) << c;
    Pixel p;
    painted->GetCanvasColor(p);
    EXPECT_EQ(p, wide);
}

TEST(ImagePixels, PutGetRoundTripPerDepthFloatsStoreAsTheNearestCode) {
    const float values[] = {0.0f, 1.0f,  0.5f,  1.0f / 255, 0.25f, 0.73f,        1e-3f, 0.999f, 1e-6f, -0.2f,
                            1.7f, -0.0f, 65504, 1e-7f,      0.1f,  100.4f / 255, NaNf,  Inff,   -Inff, 3.0f / 65535};
    const int n = std::size(values);
    for (int depth = 1; depth <= 8; ++depth) {
        auto img = Blank(4, 4, depth);
        ASSERT_TRUE(img->AllocScanLineData());
        for (int i = 0; i < n; ++i) { // each value in each channel, the others different
            const FltPixel p{values[i], values[(i + 3) % n], values[(i + 7) % n], values[(i + 11) % n]};
            img->PutFlt(1, 2, p);
            EXPECT_TRUE(PixelNear(depth, img->GetFlt(1, 2), ExpectedRead(depth, p), true)) << "value index " << i;
        }
        EXPECT_TRUE(img->GetFlt(0, 0) == FltPixel{} && img->GetFlt(2, 2) == FltPixel{}) << "neighbours, " << depth;
    }
    // Floats store as the exactly nearest code: values near every code, floats in 0..1, out of range.
    // Values near every code, floats in 0..1, values out of range: the code nearest to the clamped v x max.
    std::vector<FltPixel> in;
    for (long max : {255L, 65535L})
        for (long k = 0; k <= max; ++k)
            for (double d : {-0.49, -0.3, 0.0, 0.3, 0.49}) {
                const float v = static_cast<float>((k + d) / max);
                in.push_back({v, 1 - v, v * 0.5f, v});
            }
    for (uint32_t i = 0, state = 99; i < 400000; ++i) {
        state = state * 1664525u + 1013904223u;
        const float f = (state >> 8) * (1.0f / 16777216.0f);
        in.push_back({f, 1.0f - f, f * 0.5f, f});
    }
    for (float v : {-1.0f, -0.0f, NaNf, -NaNf, Inff, -Inff, 1.0000001f, 7.5f, 1e-9f, 0.49f / 255, 254.6f / 255})
        in.push_back({v, v, v, v});
    for (int depth : {DepthAInt8, DepthAInt16, DepthRGBAInt8, DepthRGBAInt16}) {
        const PixelFormat fmt = FormatOfDepth(depth);
        const long max = fmt.bytesPerComponent == 1 ? 255 : 65535;
        std::vector<uint8_t> raw(in.size() * fmt.BytesPerPixel());
        StoreFlt(depth, in.data(), static_cast<int>(in.size()), raw.data());
        int wrong = 0;
        for (size_t i = 0; i < in.size(); ++i)
            for (int c = 4 - fmt.channels; c < 4; ++c) { // a mask stores alpha
                const size_t at = i * fmt.channels + c - (4 - fmt.channels);
                uint16_t got = raw[at];
                if (max == 65535) std::memcpy(&got, &raw[at * 2], 2);
                const float v = Channel(in[i], c);
                const long want = NearestCode(v, max), single = max == 255 ? FloatToU8(v) : FloatToU16(v);
                if ((got != want || single != want) && ++wrong <= 5)
                    ADD_FAILURE() << "depth " << depth << ": float " << v << " stored as " << got << " and " << single
                                  << ", nearest code " << want;
            }
        EXPECT_EQ(wrong, 0);
    }
}

TEST(PixelRuns, LoadStoreAndReadSpansAsWorkedOutHere) {
    for (int depth : {DepthAInt8, DepthAInt16, DepthAFlt16, DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16}) {
        const PixelFormat fmt = FormatOfDepth(depth);
        const bool half = Kind(depth) == 2, wide = fmt.bytesPerComponent == 2;
        // Every code (every half but the NaNs), as a run of components.
        std::vector<uint16_t> codes;
        for (uint32_t k = 0; k < (wide ? 65536u : 256u); ++k)
            if (!half || ((k >> 10) & 0x1f) != 0x1f || (k & 0x3ff) == 0) codes.push_back(static_cast<uint16_t>(k));
        while (codes.size() % 4) codes.push_back(0);
        std::vector<uint8_t> raw(codes.size() * fmt.bytesPerComponent);
        for (size_t i = 0; i < codes.size(); ++i)
            wide ? void(std::memcpy(&raw[2 * i], &codes[i], 2)) : void(raw[i] = static_cast<uint8_t>(codes[i]));
        auto value = [&](uint16_t code) -> double {
            return half ? CompilerHalfToFloat(code) : code / (wide ? 65535.0 : 255.0);
        };
        const int n = static_cast<int>(codes.size()) / fmt.channels;
        std::vector<FltPixel> f(n);
        std::vector<Pixel> p(n);
        LoadFlt(depth, raw.data(), n, f.data());
        LoadPixel(depth, raw.data(), n, p.data());
        for (int i = 0; i < n; ++i)
            for (int c = 0; c < 4; ++c) { // a mask reads into all four channels; halves widen exactly
                const double want = value(codes[fmt.channels == 1 ? i : i * 4 + c]), got = Channel(f[i], c);
                ASSERT_TRUE(got == want || (!half && std::fabs(got - want) <= 2e-7)) << got << ", want " << want;
                ASSERT_EQ((&p[i].R)[c], NearestCode(want, 65535)) << i << " channel " << c; // 8 bits widen by 257
            }
        if (fmt.channels == 1) // a mask stores alpha only
            for (int i = 0; i < n; ++i) f[i].R = f[i].G = f[i].B = 0.9f, p[i].R = p[i].G = p[i].B = 1234;
        std::vector<uint8_t> back(raw.size());
        StoreFlt(depth, f.data(), n, back.data());
        for (size_t i = 0; i < codes.size(); ++i) {
            uint16_t got = back[i];
            if (wide) std::memcpy(&got, &back[2 * i], 2);
            ASSERT_TRUE(got == codes[i] || (half && (got & 0x7fff) == 0 && (codes[i] & 0x7fff) == 0)) << i;
        }
        if (half) continue; // a 16-bit Pixel does not hold every half
        std::fill(back.begin(), back.end(), 0);
        StorePixel(depth, p.data(), n, back.data());
        EXPECT_EQ(back, raw);
    }
    // Every 16-bit value narrows and widens to the nearest.
    for (uint32_t v = 0; v < 65536; ++v) {
        const Pixel px{static_cast<uint16_t>(v), 0, static_cast<uint16_t>(65535 - v), 65535};
        uint8_t b8[4];
        CompilerHalf h[4];
        float f[4];
        StorePixel(DepthRGBAInt8, &px, 1, b8);
        StorePixel(DepthRGBAFlt16, &px, 1, reinterpret_cast<uint8_t *>(h));
        StorePixel(DepthRGBAFlt32, &px, 1, reinterpret_cast<uint8_t *>(f));
        const FltPixel fp = PixelToFlt(px);
        ASSERT_TRUE(b8[0] == std::lround(v / 257.0) && U16ToU8(static_cast<uint16_t>(v)) == std::lround(v / 257.0))
            << v;
        ASSERT_LE(std::fabs(static_cast<double>(h[0]) - v / 65535.0), 0.5 * HalfStep(v / 65535.0) * 1.001) << v;
        ASSERT_TRUE(std::fabs(f[0] - v / 65535.0) <= 2e-7 && f[3] == 1.0f && std::fabs(fp.R - v / 65535.0) <= 2e-7)
            << v;
        ASSERT_EQ(FltToPixel(fp), px) << v;
    }
    // Floats keep their bits and clamp into integers.
    const std::vector<float> data = {0.0f, 1.0f, 0.5f, -0.25f, 1.5f, NaNf, Inff, -Inff, 1e-9f, 0.7f, 65504.f, -0.0f};
    const auto *raw = reinterpret_cast<const uint8_t *>(data.data());
    const int n = static_cast<int>(data.size());
    std::vector<FltPixel> f(n / 4), m(n);
    std::vector<float> back(n);
    std::vector<Pixel> p(n);
    LoadFlt(DepthRGBAFlt32, raw, n / 4, f.data());
    StoreFlt(DepthRGBAFlt32, f.data(), n / 4, reinterpret_cast<uint8_t *>(back.data()));
    EXPECT_EQ(std::memcmp(f.data(), data.data(), n * sizeof(float)), 0); // bits, NaN included
    EXPECT_EQ(std::memcmp(back.data(), data.data(), n * sizeof(float)), 0);
    LoadFlt(DepthAFlt32, raw, n, m.data());
    LoadPixel(DepthAFlt32, raw, n, p.data());
    for (int i = 0; i < n; ++i) {
        for (int c = 0; c < 4; ++c) EXPECT_EQ(std::memcmp(&m[i].R + c, &data[i], sizeof(float)), 0) << i;
        EXPECT_TRUE(p[i].A == NearestCode(data[i], 65535) && p[i].R == p[i].A) << data[i]; // clamped, NaN to 0
    }
    EXPECT_EQ(FltToPixel({-0.5f, 0.25f, 2.0f, NaNf}), (Pixel{0, 16384, 65535, 0}));
    // Spans read canvas left and right of the data window.
    const ImgRectI dw(2, 1, 6, 4);
    const FltPixel canvas{0.125f, 0.25f, 0.375f, 0.5f}, unset{-9, -9, -9, -9};
    // Rows {y, x0, x1} through, below and above the window, runs over, inside and either side of it; two empty.
    const int spans[][3] = {{2, -1, 9}, {2, 2, 6},  {2, 3, 5},  {2, -3, 1},  {2, 6, 10}, {2, 0, 4},
                            {2, 4, 8},  {0, -1, 9}, {4, -1, 9}, {1, 5, 6},   {3, 1, 2},  {3, 2, 3},
                            {1, -5, 2}, {3, 6, 7},  {-7, 0, 3}, {100, 3, 4}, {2, 5, 5},  {2, 5, 3}};
    for (int depth = 1; depth <= 9; ++depth) { // 9: a float image without rows, all canvas
        Ref<Image> img = depth < 9 ? WindowedImage(8, 5, dw, canvas, 5 + depth, depth) : Blank(8, 5, 8, &dw);
        img->SetCanvasColor(canvas);
        for (const auto &[y, x0, x1] : spans) {
            std::vector<FltPixel> out(std::max(0, x1 - x0) + 2, unset);
            ReadSpanFlt(*img, y, x0, x1, out.data() + 1);
            EXPECT_TRUE(out.front() == unset && out.back() == unset) << "written outside the run";
            for (int x = x0; x < x1; ++x)
                EXPECT_EQ(out[x - x0 + 1], depth < 9 ? img->GetFlt(x, y) : canvas) << depth << ": " << x << "," << y;
        }
    }
}

TEST(ImageServices, FillFillWithinClearAndCopyBetweenEveryPairOfDepths) {
    const ImgRectI dw(-1, -1, 5, 4), within(2, 0, 9, 2); // within: partly outside the data window
    const FltPixel first{0.2f, 1.3f, -0.2f, 0.6f}, second{0.9f, 0.1f, 0.45f, 1.0f};
    for (int depth = 1; depth <= 8; ++depth) {
        const double tol = Kind(depth) == 0 ? 0.25 / 255 : Kind(depth) == 1 ? 0.25 / 65535 : 0.0;
        auto img = Blank(6, 5, depth, &dw);
        img->FillWithin(first, within);
        ASSERT_TRUE(img->HasScanLineData()); // rows made on demand
        EXPECT_TRUE(AllNear(*img, dw, tol, [&](int x, int y) {
            return within.Contains(x, y) ? ExpectedRead(depth, first) : FltPixel{};
        })) << depth;
        img->Fill(second);
        EXPECT_TRUE(AllNear(*img, dw, tol, [&](int, int) { return ExpectedRead(depth, second); })) << depth;
        img->SetCanvasColor(second);
        img->Clear();
        EXPECT_TRUE(img->IsCanvasColorClear());
        for (int y = dw.y0; y < dw.y1; ++y) ASSERT_TRUE(AllZero(img->ScanLine(y), img->RowBytes())) << y;
    }
    // A large image, filled by the worker pool, every row.
    auto big = Blank(300, 257, 5);
    big->FillWithin({1, 0, 0, 1}, ImgRectI(10, 3, 290, 250));
    for (int y = 0; y < 257; ++y) {
        const bool in = y >= 3 && y < 250;
        ASSERT_TRUE(big->GetFlt(9, y).A == 0 && (big->GetFlt(10, y).A > 0.5f) == in &&
                    (big->GetFlt(289, y).R > 0.5f) == in && big->GetFlt(290, y).A == 0)
            << y;
    }
    const ImgRectI sw(-2, -1, 5, 4);
    const FltPixel canvas{0.2f, 0.4f, 0.6f, 0.8f};
    // Destinations partly outside the source on two sides, inside, around it, its columns and more rows, far away.
    const ImgRectI dstWindows[] = {{0, 0, 8, 6}, {-1, 0, 4, 3}, {-4, -3, 9, 7}, {-2, -3, 5, 7}, {20, 20, 23, 22}};
    for (int sd = 1; sd <= 8; ++sd) {
        Ref<Image> src = WindowedImage(6, 5, sw, canvas, 40 + sd, sd); // read back as the round trip above holds
        for (int dd = 1; dd <= 8; ++dd)
            for (const ImgRectI &dw : dstWindows) {
                auto dst = Blank(6, 5, dd, &dw);
                dst->ImageCopy(src.Get());
                ASSERT_TRUE(dst->HasScanLineData());
                for (int y = dw.y0; y < dw.y1; ++y)
                    for (int x = dw.x0; x < dw.x1; ++x)
                        ASSERT_TRUE(PixelNear(dd, dst->GetFlt(x, y), ExpectedRead(dd, src->GetFlt(x, y)),
                                              sd == dd || Kind(sd) == 3))
                            << sd << " to " << dd << " window " << RectText(dw) << " at " << x << ", " << y;
            }
    }
    auto bare = Blank(4, 4, 6), dst = Blank(4, 4, 8); // a source without rows gives canvas everywhere
    bare->SetNoData(true);
    bare->SetCanvasColor(canvas);
    dst->ImageCopy(bare.Get());
    EXPECT_TRUE(AllNear(*dst, dst->DataWindow(), 0.0, Constant(canvas)));
}

TEST(ImageServices, CopyOfImageIsDeepAndAuxiliaryPlanesLieBesideTheColourRows) {
    const ImgRectI dw(-1, -2, 8, 6);
    auto src = WindowedImage(9, 7, dw, {0.1f, 0.2f, 0.3f, 0.4f}, 3, 6);
    src->SetScale(2.0, 0.5);
    src->SetValidWindow(ImgRectI(0, 0, 5, 5));
    std::string note = "copied note";
    src->SetAttrsTagList({{ImgFullWidth, 100}, {0x30020f00, note.c_str()}});
    note.assign(note.size(), '#');
    ASSERT_TRUE(src->AddAuxChannel(AuxChannelKind::Z));
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int i = 0; i < dw.Width(); ++i) src->AuxRow(AuxChannelKind::Z, y)[i] = y * 100.0f + i;
    auto bare = Blank(4, 3, 3); // without rows: a copy without rows, with the same channels listed
    bare->AddAuxChannel(AuxChannelKind::VectorX);
    Ref<Image> copy = CopyOfImage(src.Get()), bareCopy = CopyOfImage(bare.Get());
    ASSERT_TRUE(copy && bareCopy);
    EXPECT_TRUE(copy->XScale() == 2.0 && copy->YScale() == 0.5 && copy->ValidWindow() == ImgRectI(0, 0, 5, 5) &&
                copy->GetCanvasColor() == src->GetCanvasColor() && copy->GetAttrL(ImgFullWidth) == 100);
    EXPECT_TRUE(SameBits(*copy, *src) && !copy->HasAuxChannel(AuxChannelKind::U));
    for (int y = dw.y0; y < dw.y1; ++y)
        ASSERT_EQ(std::memcmp(copy->AuxRow(AuxChannelKind::Z, y), src->AuxRow(AuxChannelKind::Z, y), 9 * 4), 0);
    EXPECT_TRUE(!bareCopy->HasScanLineData() && bareCopy->HasAuxChannel(AuxChannelKind::VectorX));
    EXPECT_FALSE(CopyOfImage(nullptr));
    // Writing to the copy leaves the source alone; the attributes' text belongs to the copy.
    const FltPixel before = src->GetFlt(3, 3);
    copy->PutFlt(3, 3, {0, 0, 0, 0});
    copy->AuxRow(AuxChannelKind::Z, 1)[2] = -1.0f;
    EXPECT_TRUE(src->GetFlt(3, 3) == before && src->AuxRow(AuxChannelKind::Z, 1)[2] == 102.0f);
    src.Reset();
    EXPECT_STREQ(copy->Attrs().GetText(0x30020f00), "copied note");
    // Copy() of the parameter is the same deep copy.
    Ref<Parameter> asParam = copy->Copy();
    auto *paramImage = dynamic_cast<Image *>(asParam.Get());
    EXPECT_TRUE(paramImage && paramImage != copy.Get() && SameBits(*paramImage, *copy));
    // Auxiliary planes beside the colour rows.
    const ImgRectI aw(1, 1, 6, 4);
    auto planes = Blank(5, 4, 8, &aw);
    ASSERT_TRUE(planes->AddAuxChannel(AuxChannelKind::Z)); // before rows: no storage yet
    EXPECT_TRUE(planes->HasAuxChannel(AuxChannelKind::Z) && !planes->HasAuxChannel(AuxChannelKind::U));
    EXPECT_EQ(planes->AuxRow(AuxChannelKind::Z, 1), nullptr);
    planes->ImageCopy(PatternImage(5, 4, 8, 17).Get());
    const Ref<Image> colour = CopyOfImage(planes.Get());
    for (int y : {0, 4, -5}) EXPECT_EQ(planes->AuxRow(AuxChannelKind::Z, y), nullptr) << y;
    for (int y = aw.y0; y < aw.y1; ++y) std::fill_n(planes->AuxRow(AuxChannelKind::Z, y), aw.Width(), -7.0f);
    EXPECT_EQ(planes->AuxRow(AuxChannelKind::U, 1), nullptr);
    // Every kind has a plane of its own (Z again: the same plane, the others
    // zeroed, added after the rows); the colour rows stay as they were.
    const int kinds = static_cast<int>(AuxChannelKind::Count);
    for (int k = 0; k < kinds; ++k) {
        const auto kind = static_cast<AuxChannelKind>(k);
        ASSERT_TRUE(planes->AddAuxChannel(kind));
        for (int y = aw.y0; y < aw.y1; ++y)
            for (int i = 0; i < aw.Width(); ++i) {
                ASSERT_EQ(planes->AuxRow(kind, y)[i], k == 0 ? -7.0f : 0.0f) << k;
                planes->AuxRow(kind, y)[i] = k * 1000.0f + y;
            }
    }
    for (int k = 0; k < kinds; ++k)
        for (int y = aw.y0; y < aw.y1; ++y)
            for (int i = 0; i < aw.Width(); ++i)
                ASSERT_EQ(planes->AuxRow(static_cast<AuxChannelKind>(k), y)[i], k * 1000.0f + y) << k;
    EXPECT_TRUE(SameBits(*planes, *colour));
}

TEST(NewImage, ImpossibleFormatsGiveNullLikeImagesExplicitTagsWindowsAndNoData) {
    // Sizes: none, no height, zero, negative, too large, beyond 32 bits.
    EXPECT_TRUE(!NewImageTagList({}) && !NewImageTagList({{ImgWidth, 4}}));
    const long long sizes[][2] = {
        {0, 4}, {4, -1}, {MaxImageSide + 1, 4}, {4, MaxImageSide + 1}, {(1LL << 32) + 16, 4}, {4, -(1LL << 32) + 8}};
    for (auto [w, h] : sizes) EXPECT_FALSE(NewImageTagList({{ImgWidth, w}, {ImgHeight, h}})) << w << " x " << h;
    // Depths beyond 1..8 and aspects not above 0, given outright or over a like-image.
    auto like = Blank(30, 20, 6);
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const TagItem bad[] = {{ImgDepth, 0},    {ImgDepth, 9},     {ImgDepth, -1},  {ImgDepth, (1LL << 32) + 5},
                           {ImgXScale, 0.0}, {ImgYScale, -1.0}, {ImgXScale, nan}};
    for (const TagItem &t : bad) {
        EXPECT_FALSE(NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}, t})) << &t - bad;
        EXPECT_FALSE(NewImageTagList({{ImgLikeImage, like.Get()}, t})) << &t - bad;
    }
    EXPECT_FALSE(NewImageTagList({{ImgLikeImage, like.Get()}, {ImgHeight, 0}}));
    Ref<Image> largest = NewImageTagList({{ImgWidth, MaxImageSide}, {ImgHeight, MaxImageSide}, {ImgNoData, 1}});
    EXPECT_TRUE(largest && largest->Width() == MaxImageSide);
    like->SetScale(2.0, 0.5);
    like->SetDataWindow(ImgRectI(-5, -5, 40, 25));
    like->SetCanvasColor(FltPixel{1, 0, 0, 1});
    like->SetAttrsTagList({{ImgFullWidth, 60}, {ImgField, 1}, {ImgFieldOffset, 0.5}});
    Ref<Image> same = NewImageTagList({{ImgLikeImage, like.Get()}});
    ASSERT_TRUE(same);
    EXPECT_TRUE(same->Depth() == 6 && same->YScale() == 0.5 && same->GetAttrD(ImgFieldOffset) == 0.5);
    // The image rectangle, not the like-image's window, and a clear canvas.
    EXPECT_TRUE(same->DataWindow() == ImgRectI(0, 0, 30, 20) && same->IsCanvasColorClear());
    // Explicit tags win over the like-image, which keeps its own.
    TagList tags{{ImgLikeImage, like.Get()}, {ImgWidth, 7}, {ImgDepth, 1}};
    tags.Add({ImgXScale, 3.0}), tags.Add({ImgField, 2}), tags.Add({ImgFullHeight, 99});
    Ref<Image> changed = NewImageTagList(tags);
    ASSERT_TRUE(changed && changed->Width() == 7 && changed->Height() == 20 && changed->Depth() == 1 &&
                changed->XScale() == 3.0);
    EXPECT_TRUE(changed->GetAttrL(ImgField) == 2 && changed->GetAttrL(ImgFullHeight) == 99 &&
                changed->GetAttrL(ImgFullWidth) == 60);
    EXPECT_TRUE(like->GetAttrL(ImgField) == 1 && !like->Attrs().Has(ImgFullHeight));
    // Every attribute tag is recorded; tags that are not attributes are not.
    const std::pair<Tag, long long> longs[] = {
        {ImgFullWidth, 1920}, {ImgFullHeight, 1080}, {ImgField, 1}, {ImgProxyScale, 2}, {ImgQuickMode, 1}};
    const std::pair<Tag, double> doubles[] = {{ImgFullXScale, 1.5}, {ImgFullYScale, 0.75}, {ImgFieldOffset, 0.25}};
    TagList all{{ImgWidth, 960}, {ImgHeight, 270}};
    for (auto [tag, value] : longs) all.Add({tag, value});
    for (auto [tag, value] : doubles) all.Add({tag, value});
    Ref<Image> img = NewImageTagList(all);
    ASSERT_TRUE(img);
    for (auto [tag, value] : longs) EXPECT_EQ(img->GetAttrL(tag, -1), value) << std::hex << tag;
    for (auto [tag, value] : doubles) EXPECT_EQ(img->GetAttrD(tag, -1), value) << std::hex << tag;
    EXPECT_FALSE(img->Attrs().Has(ImgWidth) || img->Attrs().Has(ImgDepth));
    EXPECT_TRUE(NewImageTagList({{ImgWidth, 4}, {ImgHeight, 4}})->Attrs().Empty());
    // Data and valid windows given or not.
    const ImgRectI dw(-5, -5, 15, 8), vw(2, 2, 30, 30), frame(0, 0, 10, 6);
    const std::tuple<const ImgRectI *, const ImgRectI *, bool, ImgRectI, ImgRectI> cases[] = {
        {&dw, nullptr, false, dw, dw},
        {&dw, &vw, true, dw, ImgRectI(2, 2, 15, 8)},
        {nullptr, &vw, true, frame, ImgRectI(2, 2, 10, 6)},
        {&dw, nullptr, true, dw, dw}}; // a null valid window: the data window
    for (const auto &[data, valid, validTag, wantData, wantValid] : cases) {
        TagList t{{ImgWidth, 10}, {ImgHeight, 6}};
        if (data) t.Add({ImgDataWindow, data});
        if (validTag) t.Add({ImgValidWindow, valid});
        Ref<Image> got = NewImageTagList(t);
        EXPECT_TRUE(got && got->DataWindow() == wantData && got->ValidWindow() == wantValid);
    }
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.0f};
    std::atomic<bool> abort{false};
    Ref<Image> e = NewImageTagList(
        {{ImgWidth, 10}, {ImgHeight, 6}, {ImgNoData, true}, {ImgCanvasColor, &canvas}, {ImgAbortFlag, &abort}});
    ASSERT_TRUE(e && !e->AllocScanLineData() && e->GetCanvasColor() == canvas && !e->CheckAbort());
    abort = true;
    EXPECT_TRUE(e->CheckAbort());
    Ref<Image> f = NewImageTagList({{ImgWidth, 10}, {ImgHeight, 6}, {ImgNoData, false}, {ImgCanvasColor, nullptr}});
    ASSERT_TRUE(f && f->IsCanvasColorClear() && f->AllocScanLineData());
}

} // namespace
} // namespace Orvane::imagetest
