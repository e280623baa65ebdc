// Field copies, dominance reversal and window cuts. Rows carry their row number in red (column in green), so
// every written line tells where it came from; the expected layouts are worked out by hand.
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::imgfieldstest {
namespace {
using namespace ::Orvane::Test;

constexpr float kMarker = -7.f;

/// A w x h image whose pixel (x, y) is (y, x, 100 + y, 1), over `dw` when given.
Ref<Image> RowImage(int w, int h, int depth = DepthRGBAFlt32, const ImgRectI *dw = nullptr, FltPixel canvas = {}) {
    auto rows = [](int x, int y) { return FltPixel{float(y), float(x), 100.f + y, 1.f}; };
    return Filled(w, h, depth, rows, dw, canvas);
}

/// The source row each row of `img` shows (red), -1 for a zero row, -2 for the marker.
std::vector<int> RowsOf(const Image &img) {
    std::vector<int> rows;
    for (int y = 0; y < img.Height(); ++y) {
        const FltPixel p = img.GetFlt(1, y);
        EXPECT_TRUE(p.R == kMarker || p.A == 0.f || (p.B == 100.f + p.R && p.G == 1.f)) << "row " << y << " is mixed";
        rows.push_back(p.R == kMarker ? -2 : p.A == 0.f ? -1 : static_cast<int>(p.R));
    }
    return rows;
}

TEST(CopyField, FullAndHalfHeightLinesLandWhereExpectedDepthsConvertAndRefusals) {
    // Rows listed bottom (y = 0) to top; field 0 holds the top line.
    enum Into { New, Marked, Self };
    const std::tuple<int, int, int, int, Into, std::vector<int>> cases[] = {
        {5, 0, 2, 1, New, {0, -1, 2, -1, 4}},        // field 0 in place
        {5, 1, 2, 1, New, {-1, 1, -1, 3, -1}},       // field 1 in place
        {5, 1, 0, 1, New, {-1, -1, 1, -1, 3}},       // field 1 moved up one line; the bottom line has no source
        {5, 0, 1, 1, New, {-1, 2, -1, 4, -1}},       // field 0 moved down; its last line drops
        {6, 0, 1, 1, New, {1, -1, 3, -1, 5, -1}},    //
        {5, 0, 0, 3, New, {0, 2, 2, 4, 4}},          // doubling: each line also below itself
        {5, 1, 1, 3, New, {1, 1, 3, 3, 3}},          // doubling of field 1: the top line repeats its first line
        {6, 1, 0, 3, New, {0, 0, 2, 2, 4, 4}},       //
        {6, 0, 0, 3, New, {1, 1, 3, 3, 5, 5}},       //
        {6, 1, 0, 1, Marked, {-2, 0, -2, 2, -2, 4}}, // into a frame: its other lines stay
        {6, 0, 1, 1, Self, {1, 1, 3, 3, 5, 5}},      // into the same image: read before written
    };
    for (const auto &[h, field, dest, mode, into, rows] : cases) {
        Ref<Image> src = RowImage(4, h), marked = Filled(4, h, DepthRGBAFlt32, [](int, int) {
                                             return FltPixel{kMarker, 0, 0, 1};
                                         });
        Ref<Image> out =
            src->CopyField(field, into == New ? nullptr : (into == Marked ? marked : src).Get(), dest, mode);
        ASSERT_TRUE(out && (out.Get() == src.Get()) == (into == Self));
        EXPECT_EQ(RowsOf(*out), rows) << "h " << h << " field " << field << " dest " << dest << " mode " << mode
                                      << " into " << into;
    }
    // Into an integer frame: the float rows stored at its depth; lines not written stay zero.
    Ref<Image> into = Blank(4, 6, DepthRGBAInt16);
    Ref<Image> small = Filled(4, 6, DepthRGBAFlt32, [](int, int y) { return FltPixel{y / 8.f, 0.5f, 0.25f, 1.f}; });
    ASSERT_TRUE(into->AllocScanLineData());
    ASSERT_TRUE(small->CopyField(0, into.Get(), 2, 1));
    for (int y = 0; y < 6; ++y) EXPECT_NEAR(into->GetFlt(2, y).R, (5 - y) % 2 == 0 ? y / 8.f : 0.f, 1e-4) << y;

    // Refusals: a frame of another height, a read-only frame, bad numbers.
    Ref<Image> src = RowImage(4, 6), other = RowImage(4, 5), locked = RowImage(4, 6);
    locked->SetReadOnly();
    EXPECT_FALSE(src->CopyField(0, other.Get(), 0, 1));
    EXPECT_FALSE(src->CopyField(0, locked.Get(), 0, 1));
    EXPECT_FALSE(src->CopyField(2, nullptr, 0, 1));
    EXPECT_FALSE(src->CopyField(0, nullptr, 3, 1));
    EXPECT_FALSE(src->CopyField(0, nullptr, 0, 2));
    EXPECT_FALSE(RowImage(4, 1)->CopyField(1, nullptr, -1, 1)); // a one-line frame has no field 1
    // Half-height images are tagged and keep the windows.
    const std::tuple<int, int, std::vector<int>> halves[] = {
        {5, 0, {0, 2, 4}}, {5, 1, {1, 3}}, {6, 0, {1, 3, 5}}, {6, 1, {0, 2, 4}}, {1, 0, {0}}};
    for (const auto &[h, field, rows] : halves) {
        Ref<Image> framed = PatternAt(3, h, DepthRGBAInt16);
        framed->SetScale(1.5, 0.75);
        Ref<Image> out = framed->CopyField(field, nullptr, -1, 1);
        const int n = static_cast<int>(rows.size());
        ASSERT_TRUE(out && out->Height() == n && out->Depth() == DepthRGBAInt16) << "h " << h << " field " << field;
        EXPECT_TRUE(out->GetAttrL(ImgField, -1) == field && out->GetAttrL(ImgFullHeight) == h);
        EXPECT_DOUBLE_EQ(out->GetAttrD(ImgFieldOffset, -1.0), rows[0] * 0.5 / n);
        EXPECT_DOUBLE_EQ(out->YScale(), 1.5);
        for (int yh = 0; yh < n; ++yh) EXPECT_EQ(out->GetFlt(1, yh), framed->GetFlt(1, rows[yh])) << h << " " << yh;
    }
    // Rows 1..5 of a 6-line frame: field 0 is rows 1, 3, 5 (all inside), field 1 rows 0, 2, 4 (row 0 outside).
    const ImgRectI dw(1, 1, 4, 6);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.f};
    Ref<Image> framed = RowImage(6, 6, DepthRGBAFlt32, &dw, canvas);
    Ref<Image> f0 = framed->CopyField(0, nullptr, -1, 1), f1 = framed->CopyField(1, nullptr, -1, 1);
    ASSERT_TRUE(f0 && f1);
    EXPECT_TRUE(f0->DataWindow() == ImgRectI(1, 0, 4, 3) && f1->DataWindow() == ImgRectI(1, 1, 4, 3));
    EXPECT_TRUE(f0->GetFlt(2, 2).R == 5.f && f1->GetFlt(2, 1).R == 2.f && f1->GetFlt(2, 0) == canvas);
    // A full-height copy keeps the windows; lines of the other field are zero inside them.
    Ref<Image> full = framed->CopyField(1, nullptr, 2, 1);
    ASSERT_TRUE(full && full->DataWindow() == dw);
    EXPECT_TRUE(full->GetFlt(2, 2).R == 2.f && full->GetFlt(2, 3) == FltPixel{} && full->GetFlt(0, 3) == canvas);
}

TEST(ReverseFieldDominance, MovesThePictureDownOneLineAndCopiesCutAndGrowWithCanvasOutside) {
    for (int depth : {DepthRGBAInt8, DepthRGBAFlt32}) {
        Ref<Image> img = PatternAt(3, 5, depth), before = PatternAt(3, 5, depth);
        img->ReverseFieldDominance();
        const int want[5] = {1, 2, 3, 4, 4}; // the top line repeats
        EXPECT_TRUE(AllNear(*img, img->DataWindow(), 0, [&](int x, int y) { return before->GetFlt(x, want[y]); }));
    }
    // A window below the frame's top: the row above the window is canvas; auxiliary planes move too.
    const ImgRectI dw(0, 0, 3, 3);
    const FltPixel canvas{0.5f, 0.5f, 0.5f, 0.5f};
    Ref<Image> low = RowImage(3, 5, DepthRGBAFlt32, &dw, canvas);
    low->AddAuxChannel(AuxChannelKind::Z);
    for (int y = 0; y < 3; ++y) low->AuxRow(AuxChannelKind::Z, y)[1] = 10.f + y;
    low->ReverseFieldDominance();
    EXPECT_TRUE(low->GetFlt(1, 1).R == 2.f && low->GetFlt(1, 2) == canvas);
    EXPECT_TRUE(low->AuxRow(AuxChannelKind::Z, 0)[1] == 11.f && low->AuxRow(AuxChannelKind::Z, 2)[1] == 0.f);
    // Images the caller does not own stay as they are.
    Ref<Image> shared = RowImage(3, 5);
    shared->SetReadOnly();
    shared->ReverseFieldDominance();
    EXPECT_EQ(shared->GetFlt(0, 0).R, 0.f);
    // CopyOfImageTagList cuts and grows with canvas outside.
    const ImgRectI window(2, 1, 6, 5), grown(0, 0, 8, 6), cut(3, 2, 5, 4);
    const FltPixel outside{0.1f, 0.2f, 0.3f, 0.4f}, black{0, 0, 0, 1};
    Ref<Image> source = RowImage(8, 6, DepthRGBAFlt32, &window, outside);
    source->SetValidWindow(ImgRectI(2, 1, 5, 4));
    source->AddAuxChannel(AuxChannelKind::Z);
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = 0; x < window.Width(); ++x) source->AuxRow(AuxChannelKind::Z, y)[x] = 10.f * y + x;

    Ref<Image> same = source->CopyOfImageTagList({});
    Ref<Image> big = source->CopyOfImageTagList({{ImgDataWindow, &grown}, {ImgValidWindow, &grown}});
    Ref<Image> small = source->CopyOfImageTagList({{ImgDataWindow, &cut}});
    Ref<Image> eight = source->CopyOfImageTagList({{ImgDepth, DepthRGBAInt8}, {ImgCanvasColor, &black}});
    ASSERT_TRUE(same && big && small && eight);
    EXPECT_TRUE(same->DataWindow() == window && same->ValidWindow() == source->ValidWindow() &&
                same->GetCanvasColor() == outside);
    EXPECT_TRUE(big->ValidWindow() == grown && small->DataWindow() == cut && small->ValidWindow() == cut);
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 8; ++x) {
            EXPECT_EQ(big->GetFlt(x, y), window.Contains(x, y) ? source->GetFlt(x, y) : outside) << x << "," << y;
            if (cut.Contains(x, y)) {
                EXPECT_EQ(small->GetFlt(x, y), source->GetFlt(x, y));
                EXPECT_EQ(small->AuxRow(AuxChannelKind::Z, y)[x - cut.x0], 10.f * y + (x - window.x0));
            }
        }
    EXPECT_TRUE(big->AuxRow(AuxChannelKind::Z, 0)[0] == 0.f && big->AuxRow(AuxChannelKind::Z, 3)[4] == 10.f * 3 + 2);
    // Another depth and outside through the usual tags; 3 clamps to white.
    EXPECT_TRUE(eight->Depth() == DepthRGBAInt8 && eight->GetCanvasColor() == black && eight->GetFlt(3, 2).G == 1.f);
}

} // namespace
} // namespace Orvane::imgfieldstest
