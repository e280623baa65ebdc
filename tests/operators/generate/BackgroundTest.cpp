// Background: ramps on every depth against the formula and the fixed point steps worked out here; Gradient mode
// against positions worked out here in double; the frame (opacity, regions, proxies, fields); the device.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <tuple>
#include <vector>

#include "host/color/ColorSpace.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/Gradient.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/krom/GPUMemory.h"
#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::BgTest {
namespace {
// Inside a test body `Test` names the framework's class.
using Orvane::Test::LoadOperators;
using Orvane::Test::SetID;
using Orvane::Test::SetNumber;
using Orvane::Test::SetNumbers;
using Orvane::Test::SetPoint;

const char *const kCornerIds[4] = {"TopLeft", "TopRight", "BottomLeft", "BottomRight"};
const char *const kModeIds[5] = {"SolidColor", "Horizontal", "Vertical", "FourCorner", "Gradient"};

/// Sets the four inputs of one corner colour ("TopLeft", "BottomRight", ...).
void SetColor(Operator *op, const std::string &corner, const double rgba[4]) {
    static const char *const channels[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int ch = 0; ch < 4; ++ch) SetNumber(op, (corner + channels[ch]).c_str(), rgba[ch]);
}

void SetCorners(Operator *op, const double colors[4][4]) {
    for (int c = 0; c < 4; ++c) SetColor(op, kCornerIds[c], colors[c]);
}

void SetGradient(Operator *op, std::vector<GradientStop> stops) {
    ASSERT_TRUE(op->FindInput("Gradient")->SetValue(MakeRef<Gradient>(std::move(stops))));
}

/// The main output, never from the cache (the document's depth is not part of its key), or null.
Ref<Image> Render(Operator *op, uint32_t flags = 0, RenderTask *task = nullptr, std::optional<ImgRectI> roi = {}) {
    EvalOptions opt;
    opt.flags = flags, opt.task = task, opt.useCache = false;
    if (roi) opt.roi = ImageDomain(*roi);
    return Ref<Image>(dynamic_cast<Image *>(Evaluate(op->FindMainOutput(), 0.0, opt).Get()));
}

/// Runs one field request straight through Process, the way the engine would
/// for an interlaced render: the inputs' own values, no region, no domain.
Ref<Image> RenderField(Operator *op, int field, RenderTask *task = nullptr) {
    Output *out = op->FindMainOutput();
    Request req(op, out, 0.0, 0, task);
    req.SetField(field);
    for (const auto &in : op->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    op->Process(&req);
    return Ref<Image>(dynamic_cast<Image *>(req.GetOutputData(out)));
}

/// A render at proxy scale `proxy`.
Ref<Image> RenderProxy(Operator *op, int proxy) {
    RenderTask task;
    task.proxyScale = proxy;
    return Render(op, ReqFlagProxy, &task);
}

float Channel(const FltPixel &p, int ch) { return ch == 0 ? p.R : ch == 1 ? p.G : ch == 2 ? p.B : p.A; }

/// The stored integer of channel `ch` at (x, y) of an 8- or 16-bit image;
/// single-channel images hold one value per pixel whatever `ch` is.
int StoredInt(const Image &img, int x, int y, int ch) {
    const int channels = img.IsMask() ? 1 : 4;
    const int i = (x - img.DataWindow().x0) * channels + (channels == 4 ? ch : 0);
    if (img.Format().bytesPerComponent == 1) return img.Row<uint8_t>(y)[i];
    return img.Row<uint16_t>(y)[i];
}

/// Expects every channel of every pixel of `img` (a mask's one; the stored integer on integer depths) within
/// `tol` of want(x, y, ch).
template <class Want> void ExpectPixels(const Image &img, Want want, double tol) {
    const ImgRectI dw = img.DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            for (int ch = img.IsMask() ? 3 : 0; ch < 4; ++ch) {
                const double got = img.IsFloat() ? Channel(img.GetFlt(x, y), ch) : StoredInt(img, x, y, ch);
                ASSERT_NEAR(got, want(x, y, ch), tol) << x << "," << y << " ch " << ch;
            }
}

/// The fixed point ramp of one row between two end values: each end scaled
/// by 65535 x 32768 with 0.5 added and truncated, a per-column step of their
/// difference over (W - 1) truncated towards zero, 16384 added once, and the
/// 16-bit value in bits 15 and up.
std::vector<int> FixedRow(float left, float right, int width) {
    const double one = 65535.0 * 32768.0;
    const int64_t a = static_cast<int64_t>(static_cast<double>(left) * one + 0.5);
    const int64_t b = static_cast<int64_t>(static_cast<double>(right) * one + 0.5);
    const int64_t step = width > 1 ? (b - a) / (width - 1) : 0;
    std::vector<int> row(width);
    for (int x = 0; x < width; ++x) row[x] = static_cast<int>((a + 16384 + x * step) >> 15);
    return row;
}

/// A 16-bit value as stored in 8 bits (nearest).
int To8(int v16) { return static_cast<int>(std::floor(v16 * 255.0 / 65535.0 + 0.5)); }

/// Distinct colours for the corners, so that a corner read where it should
/// be copied shows.
const double kCorners[4][4] = {
    {0.9, 0.1, 0.3, 1.0}, {0.2, 0.8, 0.6, 0.7}, {0.05, 0.45, 0.95, 0.4}, {0.6, 0.3, 0.15, 0.9}};

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

class BackgroundSuite : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    void SetUp() override { ASSERT_NE(bg = doc.AddTool(OvID("Background")), nullptr); }
    /// Frame size, Type and (unless 0) the Depth choice: 1 int8, 2 int16, 3 float16, 4 float32.
    void Frame(int w, int h, const char *type, int depthChoice = 0) {
        SetNumbers(bg, {{"Width", w}, {"Height", h}});
        SetID(bg, "Type", type);
        if (depthChoice) SetNumber(bg, "Depth", depthChoice);
    }
    OrvaneDoc doc;
    Operator *bg = nullptr;
};
using BackgroundRamp = BackgroundSuite;
using BackgroundFrame = BackgroundSuite;
using BackgroundGradient = BackgroundSuite;
using BackgroundDevice = BackgroundSuite;

// ---- ramps ------------------------------------------------------------------

TEST_F(BackgroundRamp, FloatPixelsFollowTheFormulaOfEachMode) {
    const int W = 23, H = 11;
    SetCorners(bg, kCorners);
    for (const auto &[depthChoice, tolerance] : {std::pair{4, 2e-6}, {3, 2e-3}})
        for (int mode = 0; mode < 4; ++mode) {
            SCOPED_TRACE(std::to_string(depthChoice) + " " + kModeIds[mode]);
            Frame(W, H, kModeIds[mode], depthChoice);
            Ref<Image> img = Render(bg);
            ASSERT_TRUE(img && img->Depth() == 4 + depthChoice);
            EXPECT_EQ(img->Frame(), ImgRectI(0, 0, W, H));
            EXPECT_EQ(img->DataWindow(), img->Frame());
            ExpectPixels(
                *img,
                [&](int x, int y, int ch) {
                    return RampValue(mode, kCorners, ch, x / double(W - 1), y / double(H - 1));
                },
                tolerance);
        }
}

TEST_F(BackgroundRamp, EqualEndsGiveExactlyThatColourAcrossTheRow) {
    // 0.3 is not a sum of halves: a blend of two 0.3s may miss it by a unit in the last place.
    const double top[4] = {0.3, 0.7, 0.1, 0.9}, bottom[4] = {0.55, 0.25, 0.35, 0.45};
    for (int k = 0; k < 4; ++k) SetColor(bg, kCornerIds[k], k < 2 ? top : bottom);
    for (const char *mode : {"Horizontal", "FourCorner"}) {
        Frame(37, 5, mode);
        Ref<Image> img = Render(bg);
        ASSERT_TRUE(img);
        for (int x = 0; x < 37; ++x)
            for (int ch = 0; ch < 4; ++ch) ASSERT_EQ(Channel(img->GetFlt(x, 4), ch), float(top[ch])) << mode << x;
    }
}

TEST_F(BackgroundRamp, IntegerImagesTakeTheFixedPointIncrementsAndOneColumnIsTheLeftColour) {
    struct Case {
        int width;
        double left[4], right[4];
    };
    // Rising, wide and steep, falling, one column, flat.
    const Case cases[] = {{53, {0.0, 0.1, 0.25, 1.0}, {1.0, 0.9, 0.75, 0.5}},
                          {1999, {0.0, 1.0, 0.0, 1.0}, {1.0, 0.0, 0.3333, 1.0}},
                          {7, {0.9, 0.6, 0.123, 0.77}, {0.1, 0.2, 0.456, 0.33}},
                          {1, {0.4, 0.5, 0.6, 0.7}, {1.0, 0.0, 1.0, 0.0}},
                          {17, {0.51, 0.49, 0.02, 1.0}, {0.51, 0.49, 0.02, 1.0}}};
    for (const Case &c : cases)
        for (int depthChoice : {4, 3, 2, 1}) {
            if (depthChoice > 2 && c.width > 1) continue; // one float column: the left colour, no 0 / 0
            SCOPED_TRACE(std::to_string(c.width) + " depth " + std::to_string(depthChoice));
            Frame(c.width, 3, "Horizontal", depthChoice);
            SetColor(bg, "TopLeft", c.left);
            SetColor(bg, "TopRight", c.right);
            Ref<Image> img = Render(bg);
            ASSERT_TRUE(img && img->Depth() == 4 + depthChoice);
            std::vector<int> rows[4];
            for (int ch = 0; ch < 4; ++ch) rows[ch] = FixedRow(float(c.left[ch]), float(c.right[ch]), c.width);
            ExpectPixels(
                *img,
                [&](int x, int, int ch) -> double {
                    if (depthChoice > 2) return float(c.left[ch]);
                    return depthChoice == 2 ? rows[ch][x] : To8(rows[ch][x]);
                },
                depthChoice == 3 ? 1e-3 : 0.0);
        }
}

TEST_F(BackgroundRamp, IntegerRampsFollowTheFormulaClampedThroughFloatsAndStartFromTheirEnds) {
    const double horizontal[4][4] = {{-0.5, 0.2, 1.0, 1.0}, {1.5, 0.8, 3.0, 1.0}, {}, {}};
    const double vertical[4][4] = {{2.0, 0.5, 0.5, 1.0}, {}, {-1.0, 0.5, 0.2, 1.0}, {}};
    // Out of range only on the top right corner.
    const double fourCorner[4][4] = {
        {0.2, 0.4, 0.6, 1.0}, {4.0, 0.4, -2.0, 1.0}, {0.1, 0.9, 0.5, 1.0}, {0.3, 0.3, 0.3, 1.0}};
    // The mode (the ramp of RampValue) and its corners, top left, top right, bottom left, bottom right.
    const std::pair<int, const double(*)[4]> cases[] = {
        {1, horizontal}, {2, vertical}, {3, fourCorner}, {2, kCorners}, {3, kCorners}};
    const int W = 41, H = 7;
    for (const auto &[m, colors] : cases)
        for (int depthChoice : {2, 1}) {
            SCOPED_TRACE(std::string(kModeIds[m]) + " depth " + std::to_string(depthChoice));
            SetCorners(bg, colors);
            Frame(W, H, kModeIds[m], depthChoice);
            const double top = depthChoice == 2 ? 65535.0 : 255.0;
            Ref<Image> img = Render(bg);
            ASSERT_TRUE(img);
            ExpectPixels(
                *img,
                [&, m = m, colors = colors](int x, int y, int ch) {
                    return std::clamp(RampValue(m, colors, ch, x / double(W - 1), y / double(H - 1)), 0.0, 1.0) * top;
                },
                1.0);
            if (colors != kCorners || depthChoice != 2) continue;
            // In range, the bottom and top rows are the fixed point rows between their corner colours exactly.
            for (int ch = 0; ch < 4; ++ch) {
                const std::vector<int> bottom = FixedRow(float(colors[2][ch]), float(colors[m == 2 ? 2 : 3][ch]), W);
                const std::vector<int> topRow = FixedRow(float(colors[0][ch]), float(colors[m == 2 ? 0 : 1][ch]), W);
                for (int x = 0; x < W; ++x) {
                    ASSERT_EQ(StoredInt(*img, x, 0, ch), bottom[x]) << x;
                    ASSERT_EQ(StoredInt(*img, x, H - 1, ch), topRow[x]) << x;
                }
            }
        }
}

// ---- the frame --------------------------------------------------------------

TEST_F(BackgroundFrame, ANewToolIsOpaqueBlackAndOpacityFollowsTheAlphasInUse) {
    SetNumbers(bg, {{"Width", 4}, {"Height", 3}});
    Ref<Image> fresh = Render(bg);
    ASSERT_TRUE(fresh);
    EXPECT_EQ(fresh->GetFlt(3, 2), (FltPixel{0, 0, 0, 1}));
    // Mode, the corner given alpha `alpha` (the others keep 1), whether the frame is opaque.
    const std::tuple<const char *, int, double, bool> cases[] = {
        {"SolidColor", 0, 0.5, false},  {"SolidColor", 1, 0.0, true},  {"SolidColor", 3, 0.0, true},
        {"Horizontal", 1, 0.99, false}, {"Horizontal", 2, 0.0, true},  {"Vertical", 2, 0.5, false},
        {"Vertical", 1, 0.0, true},     {"FourCorner", 3, 0.9, false}, {"FourCorner", 0, 1.0, true},
        {"Gradient", 0, 0.0, true},
    };
    for (const auto &[mode, corner, alpha, opaque] : cases) {
        const double solid[4] = {0.5, 0.5, 0.5, 1.0}, partial[4] = {0.5, 0.5, 0.5, alpha};
        for (int k = 0; k < 4; ++k) SetColor(bg, kCornerIds[k], k == corner ? partial : solid);
        Frame(8, 4, mode);
        Ref<Image> img = Render(bg);
        ASSERT_TRUE(img);
        EXPECT_EQ(img->IsOpaque(), opaque) << mode << " corner " << corner;
    }
    // In Gradient mode the gradient's stops decide.
    SetGradient(bg, {{0.0, 1, 1, 1, 1.0f}, {1.0, 1, 1, 1, 0.5f}});
    Ref<Image> img = Render(bg);
    ASSERT_TRUE(img);
    EXPECT_FALSE(img->IsOpaque());
}

TEST_F(BackgroundFrame, RegionRenderIsTheCropOfTheFullRenderAndPreCalculationMakesNoPixels) {
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
        Frame(48, 32, c.mode, c.depthChoice);
        Ref<Image> whole = Render(bg), crop = Render(bg, 0, nullptr, c.roi);
        ASSERT_TRUE(whole && crop);
        ASSERT_EQ(crop->DataWindow(), c.expected);
        EXPECT_EQ(crop->ValidWindow(), c.expected);
        for (int y = c.expected.y0; y < c.expected.y1; ++y)
            ASSERT_EQ(0, std::memcmp(crop->ScanLine(y), whole->PixelAddress(c.expected.x0, y), crop->RowBytes()))
                << "row " << y;
        // Pre-calculation makes no pixels and takes no region; a region beyond the frame gives none.
        Ref<Image> shape = Render(bg, ReqFlagPreCalc, nullptr, c.roi),
                   none = Render(bg, 0, nullptr, ImgRectI(50, 20, 60, 40));
        ASSERT_TRUE(shape && shape->IsNoData() && !shape->HasScanLineData());
        EXPECT_EQ(shape->DataWindow(), ImgRectI(0, 0, 48, 32));
        ASSERT_TRUE(none && none->DataWindow().IsNull() && !none->HasScanLineData());
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
    Ref<Image> img = RenderProxy(bg, 2);
    ASSERT_TRUE(img && img->Width() == 32 && img->Height() == 16);
    EXPECT_EQ(img->Attrs().GetLong(ImgFullWidth), W);
    EXPECT_EQ(img->Attrs().GetLong(ImgFullHeight), H);
    EXPECT_EQ(img->Attrs().GetLong(ImgProxyScale), 2);
    const double aspect = double(H) / W;
    ExpectPixels(
        *img,
        [&](int x, int y, int ch) {
            return ch == 3 ? 1.0 : std::min(1.0, std::hypot(x / 32.0 - 0.5, aspect * (y / 16.0 - 0.5)) / 0.25);
        },
        2e-5);
}

TEST_F(BackgroundFrame, HeightIsNeverBelowTwoAndWidthNeverBelowOne) {
    // Width, height, proxy, field (-1: a whole frame), expected width and height: height 1, a proxy of height 3, a
    // proxy of width 1, fields of heights 3 and 9.
    const int cases[][6] = {
        {5, 1, 1, -1, 5, 2}, {6, 3, 2, -1, 3, 2}, {1, 8, 2, -1, 1, 4}, {4, 3, 1, 0, 4, 2}, {4, 9, 1, 1, 4, 4}};
    for (const auto &[width, height, proxy, field, expectW, expectH] : cases) {
        SCOPED_TRACE(testing::Message() << width << " x " << height << " proxy " << proxy << " field " << field);
        Frame(width, height, "Vertical");
        Ref<Image> img = field >= 0 ? RenderField(bg, field) : RenderProxy(bg, proxy);
        ASSERT_TRUE(img && img->Width() == expectW && img->Height() == expectH);
        ExpectPixels(
            *img, [](int, int, int ch) { return ch == 3 ? 1.0 : 0.0; }, 0.0); // black, opaque
    }
}

TEST_F(BackgroundFrame, FieldRowsSitOnEveryOtherLineOfTheFrameAndNeverUseTheDevice) {
    const int W = 5, H = 9, fieldH = 4;
    const double bottom[4] = {0.0, 1.0, 0.2, 1.0}, top[4] = {1.0, 0.0, 0.6, 1.0};
    SetColor(bg, "BottomLeft", bottom);
    SetColor(bg, "TopLeft", top);
    Frame(W, H, "Vertical");
    SetPoint(bg, "PixelAspect", 1.0, 1.5);
    IDeviceContext *ctx = Orvane::Test::OpenCLDevice();
    for (int dominance : {0, 1}) {
        SCOPED_TRACE(dominance);
        Ref<Image> img = RenderField(bg, dominance);
        ASSERT_TRUE(img && img->Height() == fieldH);
        EXPECT_DOUBLE_EQ(img->YScale(), 3.0);
        EXPECT_DOUBLE_EQ(img->XScale(), 1.0);
        EXPECT_EQ(img->Attrs().GetLong(ImgField, -1), dominance);
        EXPECT_EQ(img->Attrs().GetDouble(ImgFieldOffset, -1), dominance ? 0.5 / fieldH : -1);
        ExpectPixels(
            *img,
            [&](int, int y, int ch) {
                const double v = (2.0 * y + dominance) / (2.0 * fieldH - 1);
                return bottom[ch] * (1 - v) + top[ch] * v;
            },
            1e-6);
        if (!ctx) continue;
        // The same field request from a render that has a device: the kernel has no field form.
        RenderTask task;
        task.SetDevice(ctx);
        const int launches = ctx->LaunchCount();
        const Ref<Image> field = RenderField(bg, dominance, &task);
        ASSERT_TRUE(field && field->DataWindow() == img->DataWindow());
        EXPECT_EQ(ctx->LaunchCount(), launches);
        EXPECT_FALSE(field->GetGPUMem());
        EXPECT_EQ(std::memcmp(field->ScanLine(0), img->ScanLine(0), img->RowBytes() * fieldH), 0);
    }
}

// ---- Gradient mode ----

enum Shape { Linear, Reflect, Square, Cross, Radial, Angle };
const char *const kShapeIds[] = {"Linear", "Reflect", "Square", "Cross", "Radial", "Angle"};
enum Fold { Once, Repeat, PingPong };
const char *const kFoldIds[] = {"Once", "Repeat", "PingPong"};
const char *const kSubPixelIds[] = {"", "1x1", "2x2", "3x3", "4x4", "5x5"};

struct GradientCase {
    const char *name;
    Shape shape;
    double sx, sy, ex, ey; ///< Start and End as the controls hold them
    double offset;
    Fold fold;
    int subpixel;
};

/// One sample's gradient position, from the geometry in double.
struct Sample {
    double position; ///< after offset and folding
    bool nearJump;   ///< within rounding of a jump of the position
};

Sample SampleAt(const GradientCase &c, double aspect, double px, double py) {
    const double sx = c.sx, sy = c.sy * aspect, ex = c.ex, ey = c.ey * aspect;
    const double dx = ex - sx, dy = ey - sy, L2 = dx * dx + dy * dy, L = std::sqrt(L2);
    const double ox = px - sx, oy = py - sy;
    const double a = (dx * ox + dy * oy) / L2, b = (-dy * ox + dx * oy) / L2;
    const double radial = std::sqrt(std::pow(px / L - sx / L, 2) + oy * oy / L2);
    bool nearJump = false;
    double p = 0;
    switch (c.shape) {
    case Linear: p = a; break;
    case Reflect: p = std::fabs(a); break;
    case Square: p = std::max(std::fabs(a), std::fabs(b)); break;
    case Cross: p = std::min(std::fabs(a), std::fabs(b)); break;
    case Radial: p = radial; break;
    case Angle: {
        const double cosine = radial > 0 ? a / radial : 0.0;
        const double turn = std::acos(std::clamp(cosine, -1.0, 1.0)) / (2 * M_PI);
        p = b >= 0 ? turn : 1 - turn;
        // The angle jumps from 1 to 0 across the ray from Start towards End,
        // and near that line and its extension acos magnifies float rounding.
        nearJump = radial < 1e-4 || 1 - std::fabs(cosine) < 1e-4;
        break;
    }
    }
    p -= c.offset;
    if (c.fold == Repeat) {
        nearJump |= std::fabs(p - std::round(p)) < 1e-4;
        p -= std::floor(p);
    } else if (c.fold == PingPong) {
        p -= 2 * std::floor(p / 2);
        if (p > 1) p = 2 - p;
    }
    return {p, nearJump};
}

/// The pixel's value under the default black-to-white gradient: the mean of
/// the clamped positions of its n x n samples at (x + j/n, y + i/n) / (W, H),
/// the sample row's step added after the aspect scaling. False when a sample
/// lies on a jump, where float and double may fall on different sides.
/// With `device`, the device's form: positions against W - 1 and H - 1, the
/// row step added before the aspect scaling, and the colour read from the
/// 256-entry table (entry k at k/255) through a linear sampler over texel
/// centres, which for this ramp gives (256 t - 0.5) / 255, clamped.
bool ExpectedGrey(const GradientCase &c, int W, int H, int x, int y, double &value, bool device = false) {
    const int n = c.subpixel;
    const double aspect = double(H) / W;
    double sum = 0;
    for (int i = 0; i < n; ++i)
        for (int j = 0; j < n; ++j) {
            double px = (x + double(j) / n) / W, py = aspect * (double(y) / H) + double(i) / (n * H);
            if (device) px = (x + double(j) / n) / (W - 1), py = aspect * ((y + double(i) / n) / (H - 1));
            const Sample s = SampleAt(c, aspect, px, py);
            if (s.nearJump) return false;
            sum += device ? std::clamp((256.0 * s.position - 0.5) / 255.0, 0.0, 1.0) : std::clamp(s.position, 0.0, 1.0);
        }
    value = sum / (n * n);
    return true;
}

void SetUpGradient(Operator *op, const GradientCase &c) {
    SetID(op, "GradientType", kShapeIds[c.shape]);
    SetPoint(op, "Start", c.sx, c.sy);
    SetPoint(op, "End", c.ex, c.ey);
    SetNumber(op, "Offset", c.offset);
    SetID(op, "Repeat", kFoldIds[c.fold]);
    SetID(op, "SubPixel", kSubPixelIds[c.subpixel]);
}

/// Expects every pixel of `img` off the jumps (nine in ten at least) to be opaque with the grey of case `c`
/// in every colour channel.
void ExpectGreys(const Image &img, const GradientCase &c, double tol, bool device = false) {
    const int W = img.Width(), H = img.Height();
    int checked = 0;
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            double want;
            if (!ExpectedGrey(c, W, H, x, y, want, device)) continue;
            ++checked;
            for (int ch = 0; ch < 4; ++ch) {
                ASSERT_NEAR(Channel(img.GetFlt(x, y), ch), ch == 3 ? 1.0 : want,
                            ch < 3   ? tol
                            : device ? 1e-6
                                     : 0.0)
                    << x << "," << y << " ch " << ch;
            }
        }
    EXPECT_GT(checked, W * H * 9 / 10);
}

// The first case is the tool's defaults, rendered without setting a control.
const GradientCase kCases[] = {
    {"linear, the defaults", Linear, 0.0, 0.5, 1.0, 0.5, 0.0, Once, 1},
    {"linear, diagonal, offset", Linear, 0.2, 0.1, 0.8, 0.9, 0.25, Once, 1},
    {"reflect", Reflect, 0.5, 0.5, 0.9, 0.6, 0.0, Once, 1},
    {"square", Square, 0.5, 0.4, 0.8, 0.5, 0.0, Once, 1},
    {"cross, negative offset", Cross, 0.5, 0.4, 0.8, 0.5, -0.1, Once, 1},
    {"radial: raw X, aspect-scaled Y offset", Radial, 0.4, 0.6, 0.7, 0.8, 0.0, Once, 1},
    {"angle", Angle, 0.5, 0.5, 0.9, 0.7, 0.0, Once, 1},
    {"angle pointing down-left", Angle, 0.6, 0.7, 0.2, 0.1, 0.0, Once, 1},
    {"linear repeat", Linear, 0.1, 0.5, 0.35, 0.5, 0.33, Repeat, 1},
    {"linear ping-pong", Linear, 0.1, 0.5, 0.35, 0.5, 0.3, PingPong, 1},
    {"linear once, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -1.5, Once, 1},
    {"linear ping-pong, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -1.5, PingPong, 1},
    {"linear repeat, far offset", Linear, 0.0, 0.5, 1.0, 0.5, -2.25, Repeat, 1},
    {"radial repeat", Radial, 0.5, 0.5, 0.6, 0.5, -0.2, Repeat, 1},
    {"angle ping-pong", Angle, 0.3, 0.2, 0.6, 0.9, 0.6, PingPong, 1},
    {"square 2x2", Square, 0.5, 0.5, 0.7, 0.6, 0.0, Once, 2},
    {"steep linear 3x3", Linear, 0.5, 0.5, 0.52, 0.5, 0.0, Once, 3},
    {"angle repeat 4x4", Angle, 0.5, 0.5, 0.8, 0.5, 0.1, Repeat, 4},
    {"small radial 5x5", Radial, 0.5, 0.5, 0.55, 0.5, 0.0, Once, 5},
    {"reflect ping-pong 3x3", Reflect, 0.45, 0.3, 0.5, 0.45, 1.2, PingPong, 3},
};

TEST_F(BackgroundGradient, EachShapeFoldAndSubPixelGridMatchesTheGeometryOnTheRowsAndOnTheDevice) {
    Frame(40, 24, "Gradient"); // aspect 0.6, so that Y scaling matters
    IDeviceContext *ctx = Orvane::Test::OpenCLDevice();
    for (const GradientCase &c : kCases) {
        SCOPED_TRACE(c.name);
        if (&c != kCases) SetUpGradient(bg, c);
        Ref<Image> img = Render(bg);
        ASSERT_TRUE(img);
        ExpectGreys(*img, c, 2e-5);
        if (!ctx) continue;
        RenderTask task;
        task.SetDevice(ctx);
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(img = Render(bg, 0, &task));
        EXPECT_EQ(ctx->LaunchCount(), launches + 1);
        ExpectGreys(*img, c, 5e-5, true);
    }
}

TEST_F(BackgroundGradient, CoincidentStartAndEndGiveTheColourAtZeroEverywhere) {
    // Red at -1, blue at 1: position 0 is their midpoint. Offset and folding
    // would move it anywhere else.
    SetGradient(bg, {{-1.0, 1, 0, 0, 1}, {1.0, 0, 0, 1, 1}});
    Frame(12, 7, "Gradient");
    SetPoint(bg, "Start", 0.3, 0.3);
    SetPoint(bg, "End", 0.3, 0.3);
    SetNumber(bg, "Offset", 0.25);
    SetID(bg, "Repeat", "PingPong");
    SetID(bg, "SubPixel", "3x3");
    const double want[4] = {0.5, 0, 0.5, 1}, want16[4] = {32767, 0, 32767, 65535}; // 32767.5, truncated
    for (const char *shape : {"Linear", "Radial", "Angle"})
        for (int depthChoice : {4, 2}) {
            SCOPED_TRACE(std::string(shape) + " depth " + std::to_string(depthChoice));
            SetID(bg, "GradientType", shape);
            SetNumber(bg, "Depth", depthChoice);
            Ref<Image> img = Render(bg);
            ASSERT_TRUE(img);
            ExpectPixels(
                *img, [&](int, int, int ch) { return depthChoice == 4 ? want[ch] : want16[ch]; }, 0.0);
        }
}

TEST_F(BackgroundGradient, ColoursFollowTheGradientInEachInterpolationSpaceAndArePremultiplied) {
    // Red to blue with straight alphas: RGB passes through a dark purple, HSV and HLS through magenta, LAB through
    // its own blend.
    const Ref<Gradient> reference =
        MakeRef<Gradient>(std::vector<GradientStop>{{0.0, 1, 0, 0, 0.5f}, {1.0, 0, 0, 1, 0.25f}});
    SetGradient(bg, reference->Stops());
    Frame(64, 4, "Gradient");
    SetPoint(bg, "Start", 0.0, 0.5);
    SetPoint(bg, "End", 1.0, 0.5);
    const char *const ids[] = {"RGB", "HLS", "HSV", "LAB"};
    const ColorSpaceType spaces[] = {ColorSpaceType::RGB, ColorSpaceType::HLS, ColorSpaceType::HSV,
                                     ColorSpaceType::LAB};
    FltPixel middles[4];
    for (int i = 0; i < 4; ++i) {
        SCOPED_TRACE(ids[i]);
        SetID(bg, "GradientInterpolationMethod", ids[i]);
        Ref<Image> img = Render(bg);
        ASSERT_TRUE(img && !img->IsOpaque());
        auto want = [&](int x, int, int ch) {
            float rgba[4];
            reference->QuickEvaluate(x / 64.0, rgba[0], rgba[1], rgba[2], rgba[3], static_cast<int>(spaces[i]));
            return double(ch == 3 ? rgba[3] : rgba[ch] * rgba[3]);
        };
        ExpectPixels(*img, want, 1e-6);
        middles[i] = img->GetFlt(32, 1);
    }
    // RGB's middle is (0.5, 0, 0.5) at alpha 0.375, premultiplied; the other spaces' differ from it.
    EXPECT_NEAR(middles[0].R, 0.1875f, 1e-6);
    EXPECT_NEAR(middles[0].B, 0.1875f, 1e-6);
    for (int i = 1; i < 4; ++i)
        EXPECT_GT(std::fabs(middles[i].R - middles[0].R) + std::fabs(middles[i].B - middles[0].B), 0.02) << ids[i];
}

TEST_F(BackgroundGradient, IntegerImagesClampAndTruncateFloatImagesDoNot) {
    // One stop: the same colour at every position, beyond 0..1 in two channels.
    SetGradient(bg, {{0.0, 2.0f, -1.0f, 0.5f, 1.0f}});
    Frame(9, 5, "Gradient");
    SetID(bg, "GradientType", "Radial");
    const double floats[4] = {2.0, -1.0, 0.5, 1.0}, int16[4] = {65535, 0, 32767, 65535};
    const double int8[4] = {255, 0, double(To8(32767)), 255};
    const double *const wanted[] = {int8, int16, floats, floats};
    for (int depthChoice = 1; depthChoice <= 4; ++depthChoice) {
        SetNumber(bg, "Depth", depthChoice);
        Ref<Image> img = Render(bg);
        ASSERT_TRUE(img);
        ExpectPixels(
            *img, [&](int, int, int ch) { return wanted[depthChoice - 1][ch]; }, 0.0);
    }
}

TEST_F(BackgroundGradient, FastInteractivePreviewsSkipTheSubPixelGrid) {
    Frame(24, 12, "Gradient");
    SetUpGradient(bg, {"", Radial, 0.5, 0.5, 0.6, 0.5, 0.0, Repeat, 3});
    RenderTask interactive, batch;
    interactive.interactive = true;
    Ref<Image> fine = Render(bg), preview = Render(bg, ReqFlagQuick, &interactive),
               batchQuick = Render(bg, ReqFlagQuick, &batch);
    SetID(bg, "SubPixel", "1x1");
    Ref<Image> coarse = Render(bg);
    ASSERT_TRUE(fine && preview && batchQuick && coarse);
    const size_t bytes = fine->RowBytes() * 12;
    EXPECT_EQ(0, std::memcmp(preview->ScanLine(0), coarse->ScanLine(0), bytes));
    EXPECT_EQ(0, std::memcmp(batchQuick->ScanLine(0), fine->ScanLine(0), bytes));
    EXPECT_NE(0, std::memcmp(fine->ScanLine(0), coarse->ScanLine(0), bytes));
    EXPECT_EQ(preview->Attrs().GetLong(ImgQuickMode), 1);
}

TEST_F(BackgroundRamp, MaskDepthsHoldTheAlphaOfARampAndOfAGradient) {
    const double tl[4] = {0.3, 0.6, 0.9, 0.1}, tr[4] = {0.9, 0.2, 0.4, 0.85};
    SetColor(bg, "TopLeft", tl);
    SetColor(bg, "TopRight", tr);
    SetGradient(bg, {{0.0, 1, 1, 1, 0}, {1.0, 1, 1, 1, 1}});
    const GradientCase c{"", Linear, 0.1, 0.5, 0.9, 0.5, 0.0, Once, 1};
    SetUpGradient(bg, c);
    const int W = 29, H = 4;
    const std::vector<int> fixed = FixedRow(float(tl[3]), float(tr[3]), W);
    for (int depth = 1; depth <= 4; ++depth)
        for (const bool ramp : {true, false}) {
            SCOPED_TRACE(std::string(ramp ? "ramp" : "gradient") + " depth " + std::to_string(depth));
            doc.SetPref(PREF_FFDepth, depth);
            Frame(W, H, ramp ? "Horizontal" : "Gradient");
            Ref<Image> img = Render(bg);
            ASSERT_TRUE(img && img->IsMask() && img->Depth() == depth);
            EXPECT_FALSE(img->IsOpaque());
            auto want = [&](int x, int y, int) {
                double v = tl[3] * (1 - x / double(W - 1)) + tr[3] * x / double(W - 1);
                EXPECT_TRUE(ramp || ExpectedGrey(c, W, H, x, y, v));
                if (depth <= 2 && ramp) return double(depth == 2 ? fixed[x] : To8(fixed[x]));
                return depth == 2 ? std::floor(v * 65535.0) : depth == 1 ? v * 255 : v;
            };
            ExpectPixels(*img, want, depth <= 2 ? (ramp ? 0.0 : 1.0) : depth == 3 ? 1e-3 : ramp ? 1e-6 : 2e-5);
        }
}

// ---- on the device ----

TEST_F(BackgroundDevice, RampsMatchTheRowsInEveryModeAndDepth) {
    ORVANE_NEED_OPENCL(ctx);
    const double colors[4][4] = {{0.9, 0.2, 0.1, 1}, {0.1, 0.8, 0.3, 0.7}, {0.0, 0.3, 0.9, 1}, {0.5, 0.5, 0.05, 0.4}};
    SetCorners(bg, colors);
    const ImgRectI roi(7, 3, 97, 55); // lines up with nothing
    for (const char *type : {"SolidColor", "Horizontal", "Vertical", "FourCorner"})
        for (int choice : {4, 3, 2, 1}) { // float32, float16, int16, int8
            SCOPED_TRACE(std::string(type) + " depth " + std::to_string(choice));
            Frame(101, 57, type, choice);
            RenderTask task;
            task.SetDevice(ctx);
            Ref<Image> cpu = Render(bg, 0, nullptr, roi);
            const int launches = ctx->LaunchCount();
            Ref<Image> dev = Render(bg, 0, &task, roi);
            ASSERT_TRUE(cpu && dev && cpu->Depth() == choice + 4);
            EXPECT_EQ(ctx->LaunchCount(), launches + 1);
            EXPECT_EQ(dev->IsOpaque(), cpu->IsOpaque());
            ASSERT_EQ(dev->DataWindow(), cpu->DataWindow());
            // Floats bit for bit, integers within one stored step.
            const ImgRectI dw = cpu->DataWindow();
            if (cpu->IsFloat())
                EXPECT_EQ(std::memcmp(dev->ScanLine(dw.y0), cpu->ScanLine(dw.y0), cpu->RowBytes() * dw.Height()), 0);
            else
                ExpectPixels(
                    *dev, [&](int x, int y, int ch) { return double(StoredInt(*cpu, x, y, ch)); }, 1.0);
        }
}

} // namespace
} // namespace Orvane::BgTest
