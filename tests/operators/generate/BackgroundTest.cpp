// Background: registration, panel, ramps on every depth, and its frame.
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

std::vector<std::string> InputIds(const Operator *op) {
    std::vector<std::string> ids;
    for (const auto &in : op->Inputs()) ids.push_back(in->ID().Text());
    return ids;
}

std::vector<std::string> Texts(const TagList &tags, Tag tag) {
    std::vector<std::string> out;
    for (const TagItem *item : tags.FindAll(tag))
        out.push_back(KindOfTag(tag) == TagKind::ID ? item->AsID().Text() : item->AsText());
    return out;
}

// ---- identity and panel ---------------------------------------------------

TEST_F(BackgroundControls, RegistryRowCarriesTheClassIdentity) {
    const Registry *row = ClassRegistry->Find(OvID("Background"));
    ASSERT_NE(row, nullptr);
    const TagList &t = row->Tags();
    EXPECT_EQ(row->TypeFlags(), RegKindOperator | RegKindTool | RegKindSource);
    EXPECT_EQ(row->BaseID(), CLSID_SourceOperator);
    EXPECT_STREQ(row->ClassName(), "Background");
    EXPECT_STREQ(t.GetText(RegPath, ""), "Tools/Creator/Background");
    EXPECT_STREQ(t.GetText(RegAbbreviation, ""), "BG");
    EXPECT_EQ(Texts(t, RegAlias), (std::vector<std::string>{"Constant", "Solid", "Gradient", "Ramp"}));
    for (Tag on : {RegSupportsRoI, RegSupportsDoD, RegSupportsGPUImages, RegSourceRangeControls, RegSourceSizeControls,
                   RegSourceAspectControls, RegSourceDepthControls})
        EXPECT_TRUE(t.GetBool(on)) << std::hex << on;
    EXPECT_FALSE(t.Has(RegNoMotionBlurControls));
}

TEST_F(BackgroundControls, InputsComeInPanelOrderBeforeTheImagePage) {
    std::vector<std::string> expected = {"Type"};
    for (int c = 0; c < 4; ++c) {
        if (c > 0) expected.push_back(std::string(kCornerIds[c]) + "Sep");
        for (const char *ch : {"Red", "Green", "Blue", "Alpha"}) expected.push_back(std::string(kCornerIds[c]) + ch);
    }
    for (const char *id :
         {"GradientType", "Start", "End", "Gradient", "GradientInterpolationMethod", "Offset", "Repeat", "SubPixel"})
        expected.push_back(id);
    std::vector<std::string> ids = InputIds(bg);
    ASSERT_GT(ids.size(), expected.size());
    EXPECT_EQ(std::vector<std::string>(ids.begin(), ids.begin() + expected.size()), expected);
    // The image-format controls the class attributes ask for follow on their own page.
    for (const char *host : {"GlobalIn", "GlobalOut", "Width", "Height", "PixelAspect", "Depth"})
        EXPECT_NE(std::find(ids.begin() + expected.size(), ids.end(), host), ids.end()) << host;

    ASSERT_GE(bg->Pages().size(), 1u);
    for (size_t i = 0; i < expected.size(); ++i) EXPECT_EQ(bg->Inputs()[i]->Page(), 0) << expected[i];

    ASSERT_EQ(bg->Nests().size(), 1u);
    const ControlNest &nest = bg->Nests()[0];
    EXPECT_EQ(nest.id, OvID("BackgroundNest"));
    EXPECT_EQ(nest.name, "Background");
    EXPECT_TRUE(nest.open);
    EXPECT_EQ(nest.firstInput, 1); // everything after Type
    EXPECT_EQ(nest.endInput, static_cast<int>(expected.size()));

    Output *out = bg->FindMainOutput();
    ASSERT_NE(out, nullptr);
    EXPECT_EQ(out->ID(), OvID("Output"));
    EXPECT_EQ(out->DataType(), CLSID_DataType_Image);
}

TEST_F(BackgroundControls, ColourInputsFormFourColourControls) {
    const char *const labels[4] = {"Top Left", "Top Right", "Bottom Left", "Bottom Right"};
    const char *const channels[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int c = 0; c < 4; ++c)
        for (int ch = 0; ch < 4; ++ch) {
            const std::string id = std::string(kCornerIds[c]) + channels[ch];
            SCOPED_TRACE(id);
            const Input *in = bg->FindInput(id.c_str());
            ASSERT_NE(in, nullptr);
            const TagList &t = in->Tags();
            EXPECT_EQ(in->Name(), std::string(labels[c]) + " " + channels[ch]);
            EXPECT_EQ(t.GetLong(ControlGroup), c + 1);
            EXPECT_EQ(t.GetLong(ControlMember), ch);
            EXPECT_EQ(t.GetLong(ColorChannel), ColorChannelRed + ch);
            EXPECT_FALSE(t.Has(InputMinAllowed) || t.Has(InputMaxAllowed)); // typed values may leave 0..1
            const auto *def = dynamic_cast<const Number *>(in->Default().Get());
            ASSERT_NE(def, nullptr);
            EXPECT_EQ(def->value, ch == 3 ? 1.0 : 0.0);
        }
    for (int c = 1; c < 4; ++c) {
        const Input *sep = bg->FindInput((std::string(kCornerIds[c]) + "Sep").c_str());
        ASSERT_NE(sep, nullptr);
        EXPECT_EQ(sep->Tags().GetID(InputControl), CLSID_InputControl_Label);
        EXPECT_FALSE(sep->IsExternal());
    }
}

TEST_F(BackgroundControls, ChoiceRowsAndGradientControlsHaveTheirDefaults) {
    const std::pair<const char *, std::vector<std::string>> rows[] = {
        {"Type", {"SolidColor", "Horizontal", "Vertical", "FourCorner", "Gradient"}},
        {"GradientType", {"Linear", "Reflect", "Square", "Cross", "Radial", "Angle"}},
        {"GradientInterpolationMethod", {"RGB", "HLS", "HSV", "LAB"}},
        {"Repeat", {"Once", "Repeat", "PingPong"}},
        {"SubPixel", {"1x1", "2x2", "3x3", "4x4", "5x5"}},
    };
    for (const auto &[id, ids] : rows) {
        SCOPED_TRACE(id);
        const Input *in = bg->FindInput(id);
        ASSERT_NE(in, nullptr);
        EXPECT_EQ(Texts(in->Tags(), ListItemId), ids);
        EXPECT_EQ(Texts(in->Tags(), ListAddItem).size(), ids.size());
        const auto *def = dynamic_cast<const IDValue *>(in->Default().Get());
        ASSERT_NE(def, nullptr);
        EXPECT_EQ(def->value, OvID(ids[0].c_str()));
    }
    EXPECT_EQ(Texts(bg->FindInput("Type")->Tags(), ButtonIcon).size(), 5u);
    EXPECT_TRUE(bg->FindInput("Type")->Notifies());
    EXPECT_TRUE(bg->FindInput("GradientInterpolationMethod")->Notifies());

    for (const auto &[id, x, y] : {std::tuple{"Start", 0.0, 0.5}, std::tuple{"End", 1.0, 0.5}}) {
        const auto *p = dynamic_cast<const Point *>(bg->FindInput(id)->Default().Get());
        ASSERT_NE(p, nullptr) << id;
        EXPECT_EQ(p->x, x) << id;
        EXPECT_EQ(p->y, y) << id;
    }
    EXPECT_EQ(bg->FindInput("End")->Tags().GetPtr(PreviewInputFirst), bg->FindInput("GradientType"));
    EXPECT_EQ(bg->FindInput("Gradient")->DataType(), CLSID_DataType_Gradient);
    EXPECT_EQ(dynamic_cast<const Number *>(bg->FindInput("Offset")->Default().Get())->value, 0.0);
}

// ---- NotifyChanged ----------------------------------------------------------

struct Visibility {
    bool corner[4], gradient;
    const char *labels[3]; ///< top left, top right and bottom left colour labels
};

void ExpectPanel(const Operator *op, const Visibility &v) {
    for (int c = 0; c < 4; ++c) {
        for (const char *ch : {"Red", "Green", "Blue", "Alpha"})
            EXPECT_EQ(op->FindInput((std::string(kCornerIds[c]) + ch).c_str())->IsVisible(), v.corner[c])
                << kCornerIds[c] << ch;
        if (c > 0) {
            EXPECT_EQ(op->FindInput((std::string(kCornerIds[c]) + "Sep").c_str())->IsVisible(), v.corner[c])
                << kCornerIds[c];
        }
    }
    for (const char *id :
         {"GradientType", "Start", "End", "Gradient", "GradientInterpolationMethod", "Offset", "Repeat", "SubPixel"})
        EXPECT_EQ(op->FindInput(id)->IsVisible(), v.gradient) << id;
    for (int c = 0; c < 3; ++c)
        if (v.labels[c]) {
            EXPECT_STREQ(op->FindInput((std::string(kCornerIds[c]) + "Red").c_str())->Label(), v.labels[c]);
        }
}

const Visibility kPanels[5] = {
    {{true, false, false, false}, false, {"Color", nullptr, nullptr}},
    {{true, true, false, false}, false, {"Left", "Right", nullptr}},
    {{true, false, true, false}, false, {"Top", nullptr, "Bottom"}},
    {{true, true, true, true}, false, {"Top Left", "Top Right", "Bottom Left"}},
    {{false, false, false, false}, true, {nullptr, nullptr, nullptr}},
};

TEST_F(BackgroundControls, TypeShowsTheControlsAndLabelsOfItsMode) {
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

TEST_F(BackgroundRamp, TopLeftIsTheTopRowOfAVerticalAndTheLeftColumnOfAHorizontalRamp) {
    const int W = 9, H = 6;
    SetCorners(bg, kCorners);
    Frame(W, H, "Vertical");
    Ref<Image> vertical = EvalImage(bg);
    Frame(W, H, "Horizontal");
    Ref<Image> horizontal = EvalImage(bg);
    ASSERT_TRUE(vertical && horizontal);
    for (int i = 0; i < 9; ++i) {
        const FltPixel top = vertical->GetFlt(i % W, H - 1), left = horizontal->GetFlt(0, i % H);
        const FltPixel bottom = vertical->GetFlt(i % W, 0), right = horizontal->GetFlt(W - 1, i % H);
        for (int ch = 0; ch < 4; ++ch) {
            EXPECT_FLOAT_EQ(Channel(top, ch), float(kCorners[0][ch]));
            EXPECT_FLOAT_EQ(Channel(left, ch), float(kCorners[0][ch]));
            EXPECT_FLOAT_EQ(Channel(bottom, ch), float(kCorners[2][ch]));
            EXPECT_FLOAT_EQ(Channel(right, ch), float(kCorners[1][ch]));
        }
    }
}

TEST_F(BackgroundRamp, EqualEndsGiveExactlyThatColourAcrossTheRow) {
    // 0.3 is not a sum of halves: a blend of two 0.3s may miss it by a unit in the last place.
    const double c[4] = {0.3, 0.7, 0.1, 0.9}, other[4] = {0.55, 0.25, 0.35, 0.45};
    SetColor(bg, "TopLeft", c);
    SetColor(bg, "TopRight", c);
    SetColor(bg, "BottomLeft", other);
    SetColor(bg, "BottomRight", other);
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
        double tl[4], tr[4], bl[4], br[4];
    };
    // The last case has its out-of-range colour only on the top right corner.
    const Case cases[] = {
        {"Horizontal", {-0.5, 0.2, 1.0, 1.0}, {1.5, 0.8, 3.0, 1.0}, {0, 0, 0, 0}, {0, 0, 0, 0}},
        {"Vertical", {2.0, 0.5, 0.5, 1.0}, {0, 0, 0, 0}, {-1.0, 0.5, 0.2, 1.0}, {0, 0, 0, 0}},
        {"FourCorner", {0.2, 0.4, 0.6, 1.0}, {4.0, 0.4, -2.0, 1.0}, {0.1, 0.9, 0.5, 1.0}, {0.3, 0.3, 0.3, 1.0}},
    };
    const int W = 41, H = 7;
    for (const Case &c : cases)
        for (int depthChoice : {2, 1}) {
            SCOPED_TRACE(std::string(c.mode) + (depthChoice == 2 ? " int16" : " int8"));
            const double colors[4][4] = {{c.tl[0], c.tl[1], c.tl[2], c.tl[3]},
                                         {c.tr[0], c.tr[1], c.tr[2], c.tr[3]},
                                         {c.bl[0], c.bl[1], c.bl[2], c.bl[3]},
                                         {c.br[0], c.br[1], c.br[2], c.br[3]}};
            SetCorners(bg, colors);
            Frame(W, H, c.mode);
            SetNumber(bg, "Depth", depthChoice);
            const int m = std::string(c.mode) == "Horizontal" ? 1 : std::string(c.mode) == "Vertical" ? 2 : 3;
            const double top = depthChoice == 2 ? 65535.0 : 255.0;
            Ref<Image> img = EvalImage(bg);
            ASSERT_TRUE(img);
            for (int y = 0; y < H; ++y)
                for (int x = 0; x < W; ++x)
                    for (int ch = 0; ch < 4; ++ch) {
                        const double f = RampValue(m, colors, ch, x / double(W - 1), y / double(H - 1));
                        const double want = std::clamp(f, 0.0, 1.0) * top;
                        ASSERT_NEAR(StoredInt(*img, x, y, ch), want, 1.0) << x << "," << y << " ch " << ch;
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

TEST_F(BackgroundFrame, PreCalculationGivesTheWindowsWithoutPixels) {
    Frame(40, 30, "FourCorner");
    EvalOptions opt;
    opt.flags = ReqFlagPreCalc;
    opt.roi = ImageDomain(ImgRectI(5, 5, 10, 10)); // no region in pre-calculation
    Ref<Image> img = Render(bg, opt);
    ASSERT_TRUE(img);
    EXPECT_TRUE(img->IsNoData());
    EXPECT_FALSE(img->HasScanLineData());
    EXPECT_EQ(img->Frame(), ImgRectI(0, 0, 40, 30));
    EXPECT_EQ(img->DataWindow(), img->Frame());
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

TEST_F(BackgroundFrame, RegionOutsideTheFrameGivesAnEmptyImage) {
    Frame(16, 16, "Horizontal");
    EvalOptions opt;
    opt.roi = ImageDomain(ImgRectI(20, 20, 30, 30));
    Ref<Image> img = Render(bg, opt);
    ASSERT_TRUE(img);
    EXPECT_TRUE(img->DataWindow().IsNull());
    EXPECT_FALSE(img->HasScanLineData());
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
