// Background: its panel by mode, ramps on every depth against the formula
// and the fixed point steps worked out here, and its frame.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>
#include <tuple>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "tests/operators/generate/BackgroundTestSupport.h"

namespace Orvane::BgTest {
namespace {

using BackgroundControls = BackgroundSuite;
using BackgroundRamp = BackgroundSuite;
using BackgroundFrame = BackgroundSuite;

const char *const kCornerIds[4] = {"TopLeft", "TopRight", "BottomLeft", "BottomRight"};
const char *const kModeIds[5] = {"SolidColor", "Horizontal", "Vertical", "FourCorner", "Gradient"};

/// Distinct colours for the corners, so that a corner read where it should
/// be copied shows.
const double kCorners[4][4] = {
    {0.9, 0.1, 0.3, 1.0}, {0.2, 0.8, 0.6, 0.7}, {0.05, 0.45, 0.95, 0.4}, {0.6, 0.3, 0.15, 0.9}};

void SetCorners(Operator *op, const double colors[4][4]) {
    for (int c = 0; c < 4; ++c) SetColor(op, kCornerIds[c], colors[c]);
}

/// The colour of a ramp mode at (u, v), v up from the bottom, in double.
double RampValue(int mode, const double c[4][4], int ch, double u, double v) {
    const double tl = c[0][ch], tr = c[1][ch], bl = c[2][ch], br = c[3][ch];
    switch (mode) {
    case 0: return tl;
    case 1: return tl * (1 - u) + tr * u;
    case 2: return bl * (1 - v) + tl * v;
    default: return (bl * (1 - u) + br * u) * (1 - v) + (tl * (1 - u) + tr * u) * v;
    }
}

// ---- NotifyChanged ----------------------------------------------------------

struct Visibility {
    bool corner[4], gradient;
    const char *labels[3]; ///< top left, top right and bottom left colour labels
};

void ExpectPanel(const Operator *op, const Visibility &v) {
    for (int c = 0; c < 4; ++c)
        for (const char *ch : {"Red", "Green", "Blue", "Alpha", "Sep"})
            if (c > 0 || std::string(ch) != "Sep") {
                EXPECT_EQ(op->FindInput((std::string(kCornerIds[c]) + ch).c_str())->IsVisible(), v.corner[c])
                    << kCornerIds[c] << ch;
            }
    for (const char *id :
         {"GradientType", "Start", "End", "Gradient", "GradientInterpolationMethod", "Offset", "Repeat", "SubPixel"})
        EXPECT_EQ(op->FindInput(id)->IsVisible(), v.gradient) << id;
    for (int c = 0; c < 3; ++c)
        if (v.labels[c])
            EXPECT_STREQ(op->FindInput((std::string(kCornerIds[c]) + "Red").c_str())->Label(), v.labels[c]);
}

const Visibility kPanels[5] = {
    {{true, false, false, false}, false, {"Color", nullptr, nullptr}},
    {{true, true, false, false}, false, {"Left", "Right", nullptr}},
    {{true, false, true, false}, false, {"Top", nullptr, "Bottom"}},
    {{true, true, true, true}, false, {"Top Left", "Top Right", "Bottom Left"}},
    {{false, false, false, false}, true, {nullptr, nullptr, nullptr}},
};

TEST_F(BackgroundControls, TypeShowsTheControlsAndLabelsOfItsMode) {
    // As constructed: a solid, opaque black frame.
    SetNumbers(bg, {{"Width", 4}, {"Height", 3}});
    Ref<Image> img = EvalImage(bg);
    ASSERT_TRUE(img);
    EXPECT_EQ(img->GetFlt(3, 2), (FltPixel{0, 0, 0, 1}));
    Input *type = bg->FindInput("Type");
    // A new tool shows what the default Solid Color needs.
    ExpectPanel(bg, kPanels[0]);
    for (int mode : {3, 1, 4, 2, 0, 3}) {
        SCOPED_TRACE(kModeIds[mode]);
        Ref<IDValue> v = MakeRef<IDValue>(OvID(kModeIds[mode]));
        bg->NotifyChanged(type, v.Get(), 0.0, nullptr);
        ExpectPanel(bg, kPanels[mode]);
        EXPECT_STREQ(bg->FindInput("BottomRightRed")->Label(), "Bottom Right");
    }
    // No value: nothing changes.
    bg->NotifyChanged(type, nullptr, 0.0, nullptr);
    ExpectPanel(bg, kPanels[3]);
}

TEST_F(BackgroundControls, InterpolationSpaceReachesTheGradientControl) {
    Input *space = bg->FindInput("GradientInterpolationMethod");
    const Input *gradient = bg->FindInput("Gradient");
    const std::pair<const char *, int> spaces[] = {{"LAB", 7}, {"HLS", 1}, {"RGB", 0}, {"HSV", 5}};
    for (const auto &[id, expected] : spaces) {
        Ref<IDValue> v = MakeRef<IDValue>(OvID(id));
        bg->NotifyChanged(space, v.Get(), 0.0, nullptr);
        EXPECT_EQ(gradient->Tags().GetLong(ControlKindValue, -1), expected) << id;
    }
    bg->NotifyChanged(space, nullptr, 0.0, nullptr);
    EXPECT_EQ(gradient->Tags().GetLong(ControlKindValue, -1), 5);
}

// ---- ramps ------------------------------------------------------------------

struct DepthCase {
    const char *name;
    int depthChoice;  ///< the Depth control: 1 int8 .. 4 float32
    double tolerance; ///< float depths only
};
const DepthCase kFloatDepths[] = {{"float32", 4, 2e-6}, {"float16", 3, 2e-3}};

TEST_F(BackgroundRamp, FloatPixelsFollowTheFormulaOfEachMode) {
    const int W = 23, H = 11;
    SetCorners(bg, kCorners);
    for (const DepthCase &d : kFloatDepths)
        for (int mode = 0; mode < 4; ++mode) {
            SCOPED_TRACE(std::string(d.name) + " " + kModeIds[mode]);
            Frame(W, H, kModeIds[mode]);
            SetNumber(bg, "Depth", d.depthChoice);
            Ref<Image> img = EvalImage(bg);
            ASSERT_TRUE(img);
            ASSERT_EQ(img->Width(), W);
            ASSERT_EQ(img->Height(), H);
            EXPECT_EQ(img->Depth(), 4 + d.depthChoice);
            EXPECT_EQ(img->DataWindow(), img->Frame());
            for (int y = 0; y < H; ++y)
                for (int x = 0; x < W; ++x) {
                    const FltPixel p = img->GetFlt(x, y);
                    for (int ch = 0; ch < 4; ++ch) {
                        const double want = RampValue(mode, kCorners, ch, x / double(W - 1), y / double(H - 1));
                        ASSERT_NEAR(Channel(p, ch), want, d.tolerance) << x << "," << y << " ch " << ch;
                    }
                }
        }
}

TEST_F(BackgroundRamp, EqualEndsGiveExactlyThatColourAcrossTheRow) {
    // 0.3 is not a sum of halves: a blend of two 0.3s may miss it by a unit in the last place.
    const double c[4] = {0.3, 0.7, 0.1, 0.9};
    const double colors[4][4] = {
        {c[0], c[1], c[2], c[3]}, {c[0], c[1], c[2], c[3]}, {0.55, 0.25, 0.35, 0.45}, {0.55, 0.25, 0.35, 0.45}};
    SetCorners(bg, colors);
    for (const char *mode : {"Horizontal", "FourCorner"}) {
        Frame(37, 5, mode);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        for (int x = 0; x < 37; ++x)
            for (int ch = 0; ch < 4; ++ch) ASSERT_EQ(Channel(img->GetFlt(x, 4), ch), float(c[ch])) << mode << " " << x;
    }
}

TEST_F(BackgroundRamp, IntegerImagesTakeTheFixedPointIncrements) {
    struct Case {
        const char *name;
        int width;
        double left[4], right[4];
    };
    const Case cases[] = {
        {"rising", 53, {0.0, 0.1, 0.25, 1.0}, {1.0, 0.9, 0.75, 0.5}},
        {"wide and steep", 1999, {0.0, 1.0, 0.0, 1.0}, {1.0, 0.0, 0.3333, 1.0}},
        {"falling", 7, {0.9, 0.6, 0.123, 0.77}, {0.1, 0.2, 0.456, 0.33}},
        {"one column", 1, {0.4, 0.5, 0.6, 0.7}, {1.0, 0.0, 1.0, 0.0}},
        {"flat", 17, {0.51, 0.49, 0.02, 1.0}, {0.51, 0.49, 0.02, 1.0}},
    };
    for (const Case &c : cases)
        for (int depthChoice : {2, 1}) {
            SCOPED_TRACE(std::string(c.name) + (depthChoice == 2 ? " int16" : " int8"));
            Frame(c.width, 3, "Horizontal");
            SetNumber(bg, "Depth", depthChoice);
            SetColor(bg, "TopLeft", c.left);
            SetColor(bg, "TopRight", c.right);
            Ref<Image> img = EvalImage(bg);
            ASSERT_TRUE(img);
            ASSERT_EQ(img->Depth(), 4 + depthChoice);
            for (int ch = 0; ch < 4; ++ch) {
                const std::vector<int> want = FixedRow(float(c.left[ch]), float(c.right[ch]), c.width);
                for (int y = 0; y < 3; ++y)
                    for (int x = 0; x < c.width; ++x) {
                        const int expected = depthChoice == 2 ? want[x] : To8(want[x]);
                        ASSERT_EQ(StoredInt(*img, x, y, ch), expected) << "x " << x << " y " << y << " ch " << ch;
                    }
            }
        }
}

TEST_F(BackgroundRamp, IntegerVerticalAndFourCornerRowsStartFromTheirEnds) {
    const int W = 31, H = 9;
    SetCorners(bg, kCorners);
    SetNumber(bg, "Depth", 2);
    for (const char *mode : {"Vertical", "FourCorner"}) {
        SCOPED_TRACE(mode);
        const int m = std::string(mode) == "Vertical" ? 2 : 3;
        Frame(W, H, mode);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        for (int ch = 0; ch < 4; ++ch) {
            // The bottom and top rows' ends are corner colours exactly.
            const int rightBottom = m == 2 ? 2 : 3, rightTop = m == 2 ? 0 : 1;
            const std::vector<int> bottom = FixedRow(float(kCorners[2][ch]), float(kCorners[rightBottom][ch]), W);
            const std::vector<int> top = FixedRow(float(kCorners[0][ch]), float(kCorners[rightTop][ch]), W);
            for (int x = 0; x < W; ++x) {
                ASSERT_EQ(StoredInt(*img, x, 0, ch), bottom[x]) << x;
                ASSERT_EQ(StoredInt(*img, x, H - 1, ch), top[x]) << x;
            }
            // Rows between: the formula, to the unit.
            for (int y = 1; y < H - 1; ++y)
                for (int x = 0; x < W; ++x) {
                    const double want = RampValue(m, kCorners, ch, x / double(W - 1), y / double(H - 1)) * 65535.0;
                    ASSERT_NEAR(StoredInt(*img, x, y, ch), want, 1.0) << x << "," << y;
                }
        }
    }
}

TEST_F(BackgroundRamp, IntegerImagesWithColoursBeyondOneRenderClampedThroughFloats) {
    struct Case {
        const char *mode;
        int m;               ///< the ramp of RampValue
        double colors[4][4]; ///< top left, top right, bottom left, bottom right
    };
    // The last case has its out-of-range colour only on the top right corner.
    const Case cases[] = {
        {"Horizontal", 1, {{-0.5, 0.2, 1.0, 1.0}, {1.5, 0.8, 3.0, 1.0}, {}, {}}},
        {"Vertical", 2, {{2.0, 0.5, 0.5, 1.0}, {}, {-1.0, 0.5, 0.2, 1.0}, {}}},
        {"FourCorner", 3, {{0.2, 0.4, 0.6, 1.0}, {4.0, 0.4, -2.0, 1.0}, {0.1, 0.9, 0.5, 1.0}, {0.3, 0.3, 0.3, 1.0}}},
    };
    const int W = 41, H = 7;
    for (const Case &c : cases)
        for (int depthChoice : {2, 1}) {
            SCOPED_TRACE(std::string(c.mode) + (depthChoice == 2 ? " int16" : " int8"));
            SetCorners(bg, c.colors);
            Frame(W, H, c.mode);
            SetNumber(bg, "Depth", depthChoice);
            const double top = depthChoice == 2 ? 65535.0 : 255.0;
            Ref<Image> img = EvalImage(bg);
            ASSERT_TRUE(img);
            for (int y = 0; y < H; ++y)
                for (int x = 0; x < W; ++x)
                    for (int ch = 0; ch < 4; ++ch) {
                        const double f = RampValue(c.m, c.colors, ch, x / double(W - 1), y / double(H - 1));
                        ASSERT_NEAR(StoredInt(*img, x, y, ch), std::clamp(f, 0.0, 1.0) * top, 1.0)
                            << x << "," << y << " ch " << ch;
                    }
        }
}

TEST_F(BackgroundRamp, MaskDepthsHoldTheAlphaRamp) {
    const double tl[4] = {0.3, 0.6, 0.9, 0.1}, tr[4] = {0.9, 0.2, 0.4, 0.85};
    const int W = 29, H = 4;
    for (int depth = 1; depth <= 4; ++depth) {
        SCOPED_TRACE(depth);
        doc.SetPref(PREF_FFDepth, depth);
        Frame(W, H, "Horizontal");
        SetColor(bg, "TopLeft", tl);
        SetColor(bg, "TopRight", tr);
        EvalOptions opt;
        opt.useCache = false; // the document's depth is not part of the cache key
        Ref<Image> img = Render(bg, opt);
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Depth(), depth);
        ASSERT_TRUE(img->IsMask());
        const std::vector<int> fixed = FixedRow(float(tl[3]), float(tr[3]), W);
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                if (depth <= 2) {
                    ASSERT_EQ(StoredInt(*img, x, y, 3), depth == 2 ? fixed[x] : To8(fixed[x])) << x;
                } else {
                    const double want = tl[3] * (1 - x / double(W - 1)) + tr[3] * x / double(W - 1);
                    ASSERT_NEAR(img->GetFlt(x, y).A, want, depth == 3 ? 1e-3 : 1e-6) << x;
                }
            }
    }
}

TEST_F(BackgroundRamp, OnePixelWideHorizontalRampIsTheLeftColour) {
    const double tl[4] = {0.25, 0.5, 0.75, 1.0}, tr[4] = {1.0, 0.0, 0.0, 0.5};
    SetColor(bg, "TopLeft", tl);
    SetColor(bg, "TopRight", tr);
    for (int depthChoice : {4, 3, 2, 1}) {
        Frame(1, 6, "Horizontal");
        SetNumber(bg, "Depth", depthChoice);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Width(), 1);
        const double tol = depthChoice == 4 ? 0.0 : depthChoice == 3 ? 1e-3 : 1.0 / 255;
        for (int y = 0; y < 6; ++y)
            for (int ch = 0; ch < 4; ++ch) EXPECT_NEAR(Channel(img->GetFlt(0, y), ch), tl[ch], tol) << depthChoice;
    }
}

// ---- the frame --------------------------------------------------------------

TEST_F(BackgroundFrame, OpacityFollowsTheAlphasInUse) {
    struct Case {
        const char *mode;
        int corner; ///< the corner given alpha `alpha`; the others keep 1
        double alpha;
        bool opaque;
    };
    const Case cases[] = {
        {"SolidColor", 0, 0.5, false},  {"SolidColor", 1, 0.0, true},  {"SolidColor", 3, 0.0, true},
        {"Horizontal", 1, 0.99, false}, {"Horizontal", 2, 0.0, true},  {"Vertical", 2, 0.5, false},
        {"Vertical", 1, 0.0, true},     {"FourCorner", 3, 0.9, false}, {"FourCorner", 0, 1.0, true},
        {"Gradient", 0, 0.0, true},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.mode) + " corner " + std::to_string(c.corner));
        const double opaque[4] = {0.5, 0.5, 0.5, 1.0}, partial[4] = {0.5, 0.5, 0.5, c.alpha};
        for (int k = 0; k < 4; ++k) SetColor(bg, kCornerIds[k], k == c.corner ? partial : opaque);
        Frame(8, 4, c.mode);
        Ref<Image> img = EvalImage(bg);
        ASSERT_TRUE(img);
        EXPECT_EQ(img->IsOpaque(), c.opaque);
    }
    // In Gradient mode the gradient's stops decide.
    SetGradient(bg, {{0.0, 1, 1, 1, 1.0f}, {1.0, 1, 1, 1, 0.5f}});
    Ref<Image> img = EvalImage(bg);
    ASSERT_TRUE(img);
    EXPECT_FALSE(img->IsOpaque());
}

TEST_F(BackgroundFrame, PreCalculationAndARegionOutsideTheFrameMakeNoPixels) {
    Frame(40, 30, "FourCorner");
    EvalOptions opt;
    opt.flags = ReqFlagPreCalc;
    opt.roi = ImageDomain(ImgRectI(5, 5, 10, 10)); // no region in pre-calculation
    Ref<Image> img = Render(bg, opt);
    ASSERT_TRUE(img);
    EXPECT_TRUE(img->IsNoData() && !img->HasScanLineData());
    EXPECT_EQ(img->Frame(), ImgRectI(0, 0, 40, 30));
    EXPECT_EQ(img->DataWindow(), img->Frame());
    opt.flags = 0;
    opt.roi = ImageDomain(ImgRectI(50, 20, 60, 40));
    ASSERT_TRUE(img = Render(bg, opt));
    EXPECT_TRUE(img->DataWindow().IsNull() && !img->HasScanLineData());
}

TEST_F(BackgroundFrame, RegionRenderEqualsTheCropOfTheFullRender) {
    struct Case {
        const char *mode;
        int depthChoice;
        ImgRectI roi, expected;
    };
    const Case cases[] = {
        {"Horizontal", 2, {7, 3, 41, 29}, {7, 3, 41, 29}}, // fixed point rows starting mid-frame
        {"FourCorner", 4, {7, 3, 41, 29}, {7, 3, 41, 29}},
        {"Vertical", 1, {-5, 10, 20, 50}, {0, 10, 20, 32}}, // clipped to the frame
        {"Gradient", 4, {30, 0, 48, 7}, {30, 0, 48, 7}},
        {"Gradient", 2, {1, 1, 47, 31}, {1, 1, 47, 31}},
    };
    SetCorners(bg, kCorners);
    SetID(bg, "SubPixel", "2x2");
    SetID(bg, "GradientType", "Angle");
    SetPoint(bg, "Start", 0.4, 0.6);
    SetPoint(bg, "End", 0.8, 0.3);
    for (const Case &c : cases) {
        SCOPED_TRACE(c.mode);
        Frame(48, 32, c.mode);
        SetNumber(bg, "Depth", c.depthChoice);
        EvalOptions full, part;
        full.useCache = part.useCache = false;
        part.roi = ImageDomain(c.roi);
        Ref<Image> whole = Render(bg, full), crop = Render(bg, part);
        ASSERT_TRUE(whole && crop);
        ASSERT_EQ(crop->DataWindow(), c.expected);
        EXPECT_EQ(crop->ValidWindow(), c.expected);
        for (int y = c.expected.y0; y < c.expected.y1; ++y)
            ASSERT_EQ(0, std::memcmp(crop->ScanLine(y), whole->PixelAddress(c.expected.x0, y), crop->RowBytes()))
                << "row " << y;
    }
}

TEST_F(BackgroundFrame, ProxyHalvesTheSizeAndKeepsTheFullFrameAspect) {
    // A radial gradient is round in the full frame's units, so its values
    // tell which aspect the proxy used.
    const int W = 65, H = 33;
    Frame(W, H, "Gradient");
    SetID(bg, "GradientType", "Radial");
    SetPoint(bg, "Start", 0.5, 0.5);
    SetPoint(bg, "End", 0.75, 0.5);
    RenderTask task;
    task.proxyScale = 2;
    EvalOptions opt;
    opt.task = &task;
    opt.flags = ReqFlagProxy;
    Ref<Image> img = Render(bg, opt);
    ASSERT_TRUE(img);
    ASSERT_EQ(img->Width(), 32);
    ASSERT_EQ(img->Height(), 16);
    EXPECT_EQ(img->Attrs().GetLong(ImgFullWidth), W);
    EXPECT_EQ(img->Attrs().GetLong(ImgFullHeight), H);
    EXPECT_EQ(img->Attrs().GetLong(ImgProxyScale), 2);
    const double aspect = double(H) / W, L = 0.25;
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 32; ++x) {
            const double ox = x / 32.0 - 0.5, oy = aspect * (y / 16.0) - aspect * 0.5;
            const double want = std::min(1.0, std::sqrt(ox * ox + oy * oy) / L);
            ASSERT_NEAR(img->GetFlt(x, y).R, want, 2e-5) << x << "," << y;
        }
}

TEST_F(BackgroundFrame, HeightIsNeverBelowTwoAndWidthNeverBelowOne) {
    struct Case {
        const char *name;
        int width, height, proxy, field; ///< field -1: a whole frame
        int expectW, expectH;
    };
    const Case cases[] = {
        {"height 1", 5, 1, 1, -1, 5, 2},         {"proxy of height 3", 6, 3, 2, -1, 3, 2},
        {"proxy of width 1", 1, 8, 2, -1, 1, 4}, {"field of height 3", 4, 3, 1, 0, 4, 2},
        {"field of height 9", 4, 9, 1, 1, 4, 4},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Frame(c.width, c.height, "Vertical");
        Ref<Image> img;
        if (c.field >= 0) {
            img = RenderField(bg, c.field);
        } else {
            RenderTask task;
            task.proxyScale = c.proxy;
            EvalOptions opt;
            opt.task = &task;
            opt.flags = ReqFlagProxy;
            opt.useCache = false;
            img = Render(bg, opt);
        }
        ASSERT_TRUE(img);
        EXPECT_EQ(img->Width(), c.expectW);
        EXPECT_EQ(img->Height(), c.expectH);
        for (int y = 0; y < img->Height(); ++y)
            for (int x = 0; x < img->Width(); ++x) ASSERT_TRUE(std::isfinite(img->GetFlt(x, y).R));
    }
}

TEST_F(BackgroundFrame, FieldRowsSitOnEveryOtherLineOfTheFrame) {
    const int W = 5, H = 9, fieldH = 4;
    const double bottom[4] = {0.0, 1.0, 0.2, 1.0}, top[4] = {1.0, 0.0, 0.6, 1.0};
    SetColor(bg, "BottomLeft", bottom);
    SetColor(bg, "TopLeft", top);
    Frame(W, H, "Vertical");
    SetPoint(bg, "PixelAspect", 1.0, 1.5);
    for (int dominance : {0, 1}) {
        SCOPED_TRACE(dominance);
        Ref<Image> img = RenderField(bg, dominance);
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Height(), fieldH);
        EXPECT_DOUBLE_EQ(img->YScale(), 3.0);
        EXPECT_DOUBLE_EQ(img->XScale(), 1.0);
        EXPECT_EQ(img->Attrs().GetLong(ImgField, -1), dominance);
        if (dominance)
            EXPECT_DOUBLE_EQ(img->Attrs().GetDouble(ImgFieldOffset), 0.5 / fieldH);
        else
            EXPECT_FALSE(img->Attrs().Has(ImgFieldOffset));
        for (int y = 0; y < fieldH; ++y) {
            const double v = (2.0 * y + dominance) / (2.0 * fieldH - 1);
            for (int ch = 0; ch < 4; ++ch)
                EXPECT_NEAR(Channel(img->GetFlt(2, y), ch), bottom[ch] * (1 - v) + top[ch] * v, 1e-6) << y;
        }
    }
}

} // namespace
} // namespace Orvane::BgTest
