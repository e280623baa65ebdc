// Crop: hand-cut pixels, windows by clipping mode, proxies, kept aspect and centring written back (not in a
// write-protected document), pass-through, regions of interest, and the auto crop's box on every kind of image.
#include <array>

#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::CropT {
namespace {

class CropTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    Operator *Make(Ref<Image> src, int x, int y, int w, int h, OrvaneDoc *in = nullptr) {
        OrvaneDoc &d = in ? *in : doc;
        probe = AddProbe(d, std::move(src));
        return AddTool(d, "Crop", probe, {{"XOffset", x}, {"YOffset", y}, {"XSize", w}, {"YSize", h}});
    }
    OrvaneDoc doc;
    ProbeSource *probe = nullptr;
};

/// `out` is w x h and every pixel of it over `r` (default: the frame) is the source's at (x + ox, y + oy),
/// its canvas outside its window.
void ExpectCut(const Ref<Image> &out, const Image &src, int ox, int oy, int w, int h,
               std::optional<ImgRectI> r = std::nullopt) {
    ASSERT_TRUE(Sized(out, w, h));
    const ImgRectI area = r.value_or(ImgRectI(0, 0, w, h));
    for (int y = area.y0; y < area.y1; ++y)
        for (int x = area.x0; x < area.x1; ++x)
            ASSERT_EQ(out->GetFlt(x, y), src.GetFlt(x + ox, y + oy)) << x << "," << y;
}

/// The four box controls: x and y offset, x and y size.
std::array<double, 4> Box(Operator *crp) {
    return {Control(crp, "XOffset"), Control(crp, "YOffset"), Control(crp, "XSize"), Control(crp, "YSize")};
}
using B = std::array<double, 4>;

TEST_F(CropTool, TheCutIsTheSourcesPixelsMovedAndKeptAspectAndCentringWriteTheControls) {
    Ref<Image> src = PatternImage(40, 30, 8, 2);
    Operator *crp = Make(src, 7, 5, 16, 10);
    Ref<Image> out = Render(crp);
    ExpectCut(out, *src, 7, 5, 16, 10);
    EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 16, 10)); // Frame clipping by default
    // Regions of interest give the whole frame's pixels; the input is asked for the region moved by the offset.
    ExpectRegionsMatchWhole(crp, {ImgRectI(0, 0, 5, 5), ImgRectI(10, 3, 25, 20), ImgRectI(12, 7, 15, 9)});
    ASSERT_TRUE(probe->asked.back());
    EXPECT_EQ(probe->asked.back()->rect, ImgRectI(19, 12, 22, 14));
    // Without clipping the whole source moves along: (-7, -5) .. (33, 25).
    SetID(crp, "ClippingMode", "ClippingMode_None");
    ExpectCut(out = Render(crp), *src, 7, 5, 16, 10, ImgRectI(-9, -7, 35, 27));
    EXPECT_EQ(out->DataWindow(), ImgRectI(-7, -5, 33, 25));
    // A cut reaching beyond the source: canvas there.
    SetID(crp, "ClippingMode", "ClippingMode_Frame");
    SetNumbers(crp, {{"XOffset", -4}, {"YOffset", 26}});
    ExpectCut(out = Render(crp), *src, -4, 26, 16, 10);
    EXPECT_EQ(out->DataWindow(), ImgRectI(4, 0, 16, 4));
    // A pass-through render hands on the input itself.
    EXPECT_EQ(Render(crp, {.passThrough = true}).Get(), src.Get());
    // Kept centred: floor((40 - 16) / 2 + 0.5) = 12, floor((30 - 10) / 2 + 0.5) = 10, written to the controls.
    SetNumber(crp, "KeepCentered", 1);
    ExpectCut(Render(crp), *src, 12, 10, 16, 10);
    EXPECT_EQ(Box(crp), (B{12, 10, 16, 10}));
    // Keep Aspect: 16 / (40 / 30) + 0.5 = 12.5, cut to 12; centred again: y = 9.
    SetNumber(crp, "KeepAspect", 1);
    ExpectCut(Render(crp), *src, 12, 9, 16, 12);
    EXPECT_EQ(Box(crp), (B{12, 9, 16, 12}));
    // Write-protected: the same frame, the controls as they were.
    OrvaneDoc d;
    d.SetWriteProtected(true);
    Operator *locked = Make(src, 0, 0, 16, 10, &d);
    SetNumbers(locked, {{"KeepCentered", 1}, {"KeepAspect", 1}});
    ExpectCut(Render(locked), *src, 12, 9, 16, 12);
    EXPECT_EQ(Box(locked), (B{0, 0, 16, 10}));
    // The reset buttons: no offset, the source's size.
    SetNumbers(crp, {{"ResetOffset", 1}, {"ResetSize", 1}});
    EXPECT_EQ(Box(crp), (B{0, 0, 40, 30}));
}

TEST_F(CropTool, EveryDepthCutsTheSameAndControlsAreFullResolutionPixelsOfAProxy) {
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        OrvaneDoc d;
        Ref<Image> src = PatternImage(21, 13, depth, 4), out = Render(Make(src, 3, 2, 11, 9, &d));
        ExpectCut(out, *src, 3, 2, 11, 9);
        EXPECT_EQ(out->Depth(), depth);
    }
    // A half-size proxy of a 40 x 30 frame: offsets 7, 5 -> floor(3.5 + 0.5) = 4,
    // floor(2.5 + 0.5) = 3; size 16 x 10 -> 8 x 5.
    Ref<Image> src = PatternImage(20, 15, 8, 9);
    src->SetAttrsTagList({{ImgFullWidth, 40}, {ImgFullHeight, 30}});
    Ref<Image> out = Render(Make(src, 7, 5, 16, 10), {.proxy = 2});
    ExpectCut(out, *src, 4, 3, 8, 5);
    EXPECT_TRUE(out->GetAttrL(ImgFullWidth) == 16 && out->GetAttrL(ImgFullHeight) == 10);
}

/// Presses Auto Crop and renders (the press is passive: no cache).
Ref<Image> AutoCrop(Operator *crp) {
    SetNumber(crp, "AutoCrop", 1);
    return Render(crp);
}

TEST_F(CropTool, AutoCropFindsTheBoxOfWhatDiffersFromTheBorder) {
    const FltPixel bg{0.2f, 0.3f, 0.4f, 1.f}, mark{0.9f, 0.1f, 0.1f, 1.f};
    Ref<Image> src = FlatImage(40, 30, DepthRGBAFlt32, bg);
    src->FillWithin(mark, ImgRectI(10, 5, 20, 25));
    src->PutFlt(33, 7, mark);
    src->PutFlt(0, 0, mark); // one corner differs: the other samples outvote it
    Operator *crp = Make(src, 0, 0, 40, 30);
    // Columns 0 .. 33 and rows 0 .. 24: the corner pixel counts as content.
    EXPECT_TRUE(Sized(AutoCrop(crp), 34, 25));
    EXPECT_EQ(Box(crp), (B{0, 0, 34, 25}));
    src->PutFlt(0, 0, bg);
    ExpectCut(AutoCrop(crp), *src, 10, 5, 24, 20);
    EXPECT_EQ(Box(crp), (B{10, 5, 24, 20}));
    // Once done, a render without a press leaves the controls alone.
    SetNumber(crp, "XSize", 30);
    ASSERT_NE(Render(crp), nullptr);
    EXPECT_EQ(Control(crp, "XSize"), 30.0);
    // On a proxy the box comes back in full-resolution pixels.
    Ref<Image> proxy = FlatImage(20, 15, DepthRGBAFlt32, {});
    proxy->FillWithin({1.f, 1.f, 1.f, 1.f}, ImgRectI(3, 4, 8, 6));
    proxy->SetAttrsTagList({{ImgFullWidth, 40}, {ImgFullHeight, 30}});
    OrvaneDoc d;
    Operator *half = Make(proxy, 0, 0, 40, 30, &d);
    ASSERT_NE(AutoCrop(half), nullptr);
    EXPECT_EQ(Box(half), (B{6, 8, 10, 4}));
}

TEST_F(CropTool, AutoCropComparesTheChosenChannelsExactlyOrWithinAMillionth) {
    struct Case {
        int depth;
        FltPixel mark;
        bool alphaOn, found;
        FltPixel bg{0.5f, 0.5f, 0.5f, 0.5f};
    };
    // Background and marks on exact codes of the integer depths where they matter. A flat image of any
    // depth (the mark equal to the background) changes nothing.
    const float b8 = 128.f / 255.f, b16 = 32768.f / 65535.f, h = 0.5f;
    const FltPixel bg8{b8, b8, b8, b8}, bg16{b16, b16, b16, b16}, flat{h, h, h, h};
    const Case cases[] = {
        {DepthRGBAInt8, {b8, b8, b8, 129.f / 255.f}, true, true, bg8},   // one code in alpha
        {DepthRGBAInt8, {b8, b8, b8, 129.f / 255.f}, false, false, bg8}, // alpha not looked at
        {DepthRGBAInt16, {32769.f / 65535.f, b16, b16, b16}, false, true, bg16},
        {DepthRGBAFlt32, {h, h + 2e-6f, h, h}, true, true},
        {DepthRGBAFlt32, {h, h + 5e-7f, h, h}, true, false},  // within a millionth
        {DepthRGBAFlt16, {h, h, 0.50048828f, h}, true, true}, // one half-float step
        {DepthAFlt32, {0.7f, 0.7f, 0.7f, 0.7f}, true, true},
        {DepthAInt16, {0.7f, 0.7f, 0.7f, 0.7f}, false, true}, // a mask's value shows in every channel
    };
    std::vector<Case> all(std::begin(cases), std::end(cases));
    for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32, DepthAInt8, DepthAFlt32})
        all.push_back({depth, flat, true, false});
    for (const Case &c : all) {
        SCOPED_TRACE(testing::Message() << "depth " << c.depth << " alpha " << c.alphaOn);
        OrvaneDoc d;
        Ref<Image> src = FlatImage(30, 20, c.depth, c.bg);
        src->FillWithin(c.mark, ImgRectI(4, 6, 9, 8));
        Operator *crp = Make(src, 3, 0, 17, 12, &d);
        SetNumber(crp, "Alpha", c.alphaOn ? 1 : 0);
        ASSERT_NE(AutoCrop(crp), nullptr);
        EXPECT_EQ(Box(crp), (c.found ? B{4, 6, 5, 2} : B{3, 0, 17, 12}));
    }
}

} // namespace
} // namespace Orvane::WarpTest::CropT
