// The transform chain's matrix arithmetic, the Transform tool's matrix, and
// the general sampler. Expected pixels are hand-written (moves, flips,
// quarter turns, borders) or computed here from the filters' formulas with
// an inverse mapping written out from the geometry (never from the
// sampler's tables or the object's own matrix); windows, depths, identities,
// inverses and singular matrices are checked as invariants, and a rotation
// is compared with oiiotool's.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <functional>
#include <map>
#include <numbers>
#include <string>
#include <unistd.h>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/TransformMatrix.h"
#include "host/image/TransformSampler.h"
#include "tests/support/TestSupport.h"

namespace Orvane::xformtest {
namespace {
namespace ts = ::Orvane::Test;

constexpr double kPi = std::numbers::pi;

// ---- filters, written out from their definitions ----

double Sinc(double x) { return x == 0 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

double FilterAt(int filter, double x) {
    const double a = std::fabs(x);
    switch (filter) {
    case RszLinear: return a < 1 ? 1 - a : 0;
    case RszCubic: return a < 1 ? (4 - 6 * a * a + 3 * a * a * a) / 6 : a < 2 ? (2 - a) * (2 - a) * (2 - a) / 6 : 0;
    case RszCatmullRom:
        return a < 1 ? 1.5 * a * a * a - 2.5 * a * a + 1 : a < 2 ? -0.5 * a * a * a + 2.5 * a * a - 4 * a + 2 : 0;
    case RszLanczos: return a < 3 ? Sinc(a) * Sinc(a / 3) : 0;
    default: ADD_FAILURE() << "no reference for filter " << filter; return 0;
    }
}

double RadiusOf(int filter) { return filter == RszLinear ? 1 : filter == RszLanczos ? 3 : 2; }

// ---- images ----

Ref<Image> MakeImage(int w, int h, int depth, const std::function<FltPixel(int, int)> &f,
                     const ImgRectI *window = nullptr, FltPixel canvas = {}) {
    const ImgRectI dw = window ? *window : ImgRectI(0, 0, w, h);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    EXPECT_TRUE(img && img->AllocScanLineData());
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, f(x, y));
    return img;
}

/// The geometry tags of a transform about the frame's middle.
TagList Geometry(double angle, double sx, double sy, double dx = 0.5, double dy = 0.5) {
    return {{XfCenterX, dx}, {XfCenterY, dy}, {XfXSize, sx}, {XfYSize, sy}, {XfAngle, angle}};
}

TagList With(TagList tags, std::initializer_list<TagItem> more) {
    for (const TagItem &t : more) tags.Set(t);
    return tags;
}

/// A transform of `src` by `tags`, made into pixels (cut to `cut` when given).
Ref<Image> Transformed(Image *src, const TagList &tags, const ImgRectI *cut = nullptr,
                       Ref<TransformMatrix> *keep = nullptr) {
    auto tm = MakeRef<TransformMatrix>(src);
    EXPECT_TRUE(tm->ImageConcatenateTagList(tags));
    TagList apply;
    if (cut) apply.Set({ImgDataWindow, cut});
    Ref<Image> out = tm->ApplyTransformTagList(apply);
    if (keep) *keep = tm;
    return out;
}

void ExpectPixelsR(const Image &img, const std::vector<std::vector<float>> &rowsTopDown, int x0, int yTop) {
    for (size_t r = 0; r < rowsTopDown.size(); ++r)
        for (size_t c = 0; c < rowsTopDown[r].size(); ++c) {
            const int x = x0 + static_cast<int>(c), y = yTop - static_cast<int>(r);
            EXPECT_EQ(img.GetFlt(x, y).R, rowsTopDown[r][c]) << "at " << x << "," << y;
        }
}

// ---- Matrix3 ----

TEST(Matrix3, ComposesInvertsAndMapsPointsAsWrittenByHand) {
    double x, y;
    (Matrix3::Translate(3, 4) * Matrix3::Scale(2, 5)).Apply(1, 1, x, y);
    EXPECT_EQ(x, 5.0);
    EXPECT_EQ(y, 9.0);
    (Matrix3::Scale(2, 5) * Matrix3::Translate(3, 4)).Apply(1, 1, x, y);
    EXPECT_EQ(x, 8.0);
    EXPECT_EQ(y, 25.0);

    // Quarter turns are exact, in either direction and after whole turns.
    const Matrix3 q = Matrix3::Rotate(90);
    EXPECT_EQ(q.m, (std::array<double, 9>{0, -1, 0, 1, 0, 0, 0, 0, 1}));
    EXPECT_EQ(Matrix3::Rotate(-270), q);
    EXPECT_EQ(Matrix3::Rotate(450), q);
    EXPECT_EQ(Matrix3::Rotate(180).m, (std::array<double, 9>{-1, 0, 0, 0, -1, 0, 0, 0, 1}));
    Matrix3::Rotate(30).Apply(1, 0, x, y); // anticlockwise, y up
    EXPECT_NEAR(x, std::sqrt(3.0) / 2, 1e-15);
    EXPECT_NEAR(y, 0.5, 1e-15);

    const Matrix3 m = Matrix3::Translate(-7, 2.5) * Matrix3::Rotate(33) * Matrix3::Scale(2, 5);
    EXPECT_NEAR(m.Determinant(), 10.0, 1e-12);
    Matrix3 inv;
    ASSERT_TRUE(m.Invert(inv));
    EXPECT_TRUE((m * inv).IsIdentity(1e-12));
    EXPECT_TRUE((inv * m).IsIdentity(1e-12));
    EXPECT_FALSE(m.IsIdentity());

    // Singular: no inverse, and the identity handed back.
    EXPECT_FALSE((Matrix3::Rotate(10) * Matrix3::Scale(0, 1)).Invert(inv));
    EXPECT_TRUE(inv.IsIdentity(0));

    // A projective row divides by w; its inverse maps back.
    Matrix3 p;
    p(2, 0) = 0.5;
    EXPECT_FALSE(p.IsAffine());
    p.Apply(2, 2, x, y);
    EXPECT_EQ(x, 1.0);
    EXPECT_EQ(y, 1.0);
    ASSERT_TRUE(p.Invert(inv));
    inv.Apply(1, 1, x, y);
    EXPECT_NEAR(x, 2.0, 1e-15);
    EXPECT_NEAR(y, 2.0, 1e-15);
}

// ---- the Transform tool's matrix ----

/// (x, y) in pixels of a W x H frame through the tags' matrix.
std::pair<double, double> MapPixel(const TagList &tags, double W, double H, double ax, double ay, double x, double y) {
    double ox, oy;
    NormalisedToPixelMatrix(TransformTagsMatrix(tags, W, H, ax, ay), W, H).Apply(x, y, ox, oy);
    return {ox, oy};
}

TEST(TransformTagsMatrix, FollowsTheControlsStepByStep) {
    // A quarter turn about the middle of 200 x 100 square pixels: 50 pixels
    // right of the middle go to 50 pixels above it, 25 above to 25 left.
    const TagList quarter = Geometry(90, 1, 1);
    auto [x, y] = MapPixel(quarter, 200, 100, 1, 1, 150, 50);
    EXPECT_NEAR(x, 100, 1e-12);
    EXPECT_NEAR(y, 100, 1e-12);
    std::tie(x, y) = MapPixel(quarter, 200, 100, 1, 1, 100, 75);
    EXPECT_NEAR(x, 75, 1e-12);
    EXPECT_NEAR(y, 50, 1e-12);

    // Pixels twice as wide as high: 10 pixels right (20 units) turn into 20
    // units = 20 pixels up.
    std::tie(x, y) = MapPixel(quarter, 100, 100, 2, 1, 60, 50);
    EXPECT_NEAR(x, 50, 1e-12);
    EXPECT_NEAR(y, 70, 1e-12);

    // Sizes about a pivot, then the centre's offset: (0.5, 0.5) minus pivot
    // (0.25, 0.5) is (0.25, 0), scaled by 2 to (0.5, 0), plus the pivot and
    // the centre's 0.1: (0.85, 0.5).
    const Matrix3 n = TransformTagsMatrix(
        {{XfXSize, 2.0}, {XfYSize, 3.0}, {XfPivotX, 0.25}, {XfPivotY, 0.5}, {XfCenterX, 0.6}, {XfCenterY, 0.5}}, 640,
        480, 1, 1);
    n.Apply(0.5, 0.5, x, y);
    EXPECT_NEAR(x, 0.85, 1e-15);
    EXPECT_NEAR(y, 0.5, 1e-15);
    n.Apply(0.25, 0.6, x, y); // 0.1 above the pivot: three times as far
    EXPECT_NEAR(x, 0.35, 1e-15);
    EXPECT_NEAR(y, 0.8, 1e-15);

    // Flips mirror about the frame's middle before anything else.
    TransformTagsMatrix({{XfFlipX, 1}}, 10, 10, 1, 1).Apply(0.2, 0.3, x, y);
    EXPECT_NEAR(x, 0.8, 1e-15);
    EXPECT_NEAR(y, 0.3, 1e-15);
    TransformTagsMatrix({{XfFlipY, 1}, {XfCenterX, 0.6}}, 10, 10, 1, 1).Apply(0.2, 0.3, x, y);
    EXPECT_NEAR(x, 0.3, 1e-15);
    EXPECT_NEAR(y, 0.7, 1e-15);

    // Invert gives the inverse; a singular matrix (Size 0) stays as it is.
    const TagList t = With(Geometry(37, 1.3, 0.7, 0.52, 0.46), {{XfPivotX, 0.3}, {XfFlipX, 1}});
    const Matrix3 fwd = TransformTagsMatrix(t, 320, 200, 1.2, 0.9);
    const Matrix3 back = TransformTagsMatrix(With(t, {{XfInvert, 1}}), 320, 200, 1.2, 0.9);
    EXPECT_TRUE((back * fwd).IsIdentity(1e-12));
    const TagList zero = Geometry(20, 0, 0, 0.6, 0.4);
    const Matrix3 singular = TransformTagsMatrix(zero, 320, 200, 1, 1);
    EXPECT_EQ(singular.Determinant(), 0.0);
    EXPECT_EQ(TransformTagsMatrix(With(zero, {{XfInvert, 1}}), 320, 200, 1, 1), singular);

    // No frame, no transform.
    EXPECT_TRUE(TransformTagsMatrix(t, 0, 100, 1, 1).IsIdentity(0));
    EXPECT_TRUE(TransformTagsMatrix(t, 100, 100, 1, 0).IsIdentity(0));
}

// ---- pixels ----

TEST(TransformMatrix, AnIdentityHandsOnTheSourceItself) {
    Ref<Image> src = ts::PatternImage(9, 7);
    const long before = TransformMatrix::ResampleCount();
    auto tm = MakeRef<TransformMatrix>(src.Get());
    EXPECT_TRUE(tm->ImageConcatenateTagList({{XfFilter, RszLanczos}, {XfEdges, EdgeMirror}}));
    EXPECT_EQ(tm->ApplyTransformTagList({}).Get(), src.Get());
    EXPECT_EQ(tm->OutputDataWindow(), src->DataWindow());
    // A transform followed by its inverse composes to the identity: no pixels move.
    const TagList t = Geometry(23, 1.7, 0.8, 0.55, 0.41);
    ASSERT_TRUE(tm->ImageConcatenateTagList(t));
    ASSERT_TRUE(tm->ImageConcatenateTagList(With(t, {{XfInvert, 1}})));
    EXPECT_TRUE(tm->SourceToOutput().IsIdentity(1e-12));
    EXPECT_EQ(tm->ApplyTransformTagList({}).Get(), src.Get());
    EXPECT_EQ(ImageOfValue(src.Get()).Get(), src.Get());
    EXPECT_EQ(TransformMatrix::ResampleCount(), before);
}

TEST(TransformMatrix, WholePixelMovesCopyPixelsOnEveryDepth) {
    const ImgRectI dw(1, 0, 6, 5);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.f};
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        Ref<Image> src = MakeImage(
            7, 5, depth,
            [](int x, int y) {
                return FltPixel{0.1f * x, 0.07f * y + 0.01f, 0.3f, 0.05f * (x + y)};
            },
            &dw, canvas);
        const long before = TransformMatrix::ResampleCount();
        // Three right and two down, with a filter that would soften anything between pixels.
        const TagList move = {{XfCenterX, 0.5 + 3.0 / 7}, {XfCenterY, 0.5 - 2.0 / 5}, {XfFilter, RszCubic}};
        Ref<TransformMatrix> tm;
        Ref<Image> out = Transformed(src.Get(), move, nullptr, &tm);
        ASSERT_TRUE(out);
        EXPECT_EQ(TransformMatrix::ResampleCount(), before + 1);
        EXPECT_EQ(out->DataWindow(), ImgRectI(4, -2, 9, 3));
        EXPECT_EQ(tm->OutputDataWindow(), out->DataWindow());
        EXPECT_EQ(out->Depth(), depth);
        EXPECT_EQ(out->GetCanvasColor(), canvas);
        for (int y = -2; y < 3; ++y)
            for (int x = 4; x < 9; ++x)
                EXPECT_EQ(std::memcmp(out->PixelAddress(x, y), src->PixelAddress(x - 3, y + 2), src->BytesPerPixel()),
                          0)
                    << x << "," << y;
    }
}

TEST(TransformMatrix, FlipsAndQuarterTurnsMovePixelsExactly) {
    // 3 x 2, rows top down: 4 5 6 / 1 2 3.
    Ref<Image> small = MakeImage(3, 2, 8, [](int x, int y) { return FltPixel{1.f + x + 3.f * y, 0, 0, 1}; });
    const TagList lanczos{{XfFilter, RszLanczos}};
    ExpectPixelsR(*Transformed(small.Get(), With(lanczos, {{XfFlipX, 1}})), {{6, 5, 4}, {3, 2, 1}}, 0, 1);
    ExpectPixelsR(*Transformed(small.Get(), With(lanczos, {{XfFlipY, 1}})), {{1, 2, 3}, {4, 5, 6}}, 0, 1);
    ExpectPixelsR(*Transformed(small.Get(), With(lanczos, {{XfFlipX, 1}, {XfFlipY, 1}})), {{3, 2, 1}, {6, 5, 4}}, 0, 1);

    // 3 x 3, rows top down 7 8 9 / 4 5 6 / 1 2 3, a quarter turn anticlockwise
    // about the middle: the right column becomes the top row.
    Ref<Image> square = MakeImage(3, 3, 8, [](int x, int y) { return FltPixel{1.f + x + 3.f * y, 0, 0, 1}; });
    for (int filter : {RszNearest, RszLinear}) {
        Ref<Image> out = Transformed(square.Get(), With(Geometry(90, 1, 1), {{XfFilter, filter}}));
        EXPECT_EQ(out->DataWindow(), ImgRectI(0, 0, 3, 3));
        ExpectPixelsR(*out, {{9, 6, 3}, {8, 5, 2}, {7, 4, 1}}, 0, 2);
        // The other way round, and half a turn.
        ExpectPixelsR(*Transformed(square.Get(), With(Geometry(-90, 1, 1), {{XfFilter, filter}})),
                      {{1, 4, 7}, {2, 5, 8}, {3, 6, 9}}, 0, 2);
        ExpectPixelsR(*Transformed(square.Get(), With(Geometry(180, 1, 1), {{XfFilter, filter}})),
                      {{3, 2, 1}, {6, 5, 4}, {9, 8, 7}}, 0, 2);
    }

    // 4 x 2 about its middle (2, 1), a pixel corner: rows top down 5 6 7 8 /
    // 1 2 3 4 turn into two columns standing out of the frame.
    Ref<Image> wide = MakeImage(4, 2, 5, [](int x, int y) { return FltPixel{(1.f + x + 4.f * y) / 255.f, 0, 0, 1}; });
    Ref<Image> turned = Transformed(wide.Get(), With(Geometry(90, 1, 1), {{XfFilter, RszLinear}}));
    EXPECT_EQ(turned->DataWindow(), ImgRectI(1, -1, 3, 3));
    const int expect[4][2] = {{8, 4}, {7, 3}, {6, 2}, {5, 1}}; // top down, x = 1, 2
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 2; ++c) EXPECT_EQ(*turned->PixelAddress(1 + c, 2 - r), expect[r][c]) << r << "," << c;
}

/// The value of a filtered transform at output pixel (i, j), computed from
/// the geometry: output = R(angle) S(sx, sy) (p - c) + c + d in square pixels
/// of a W x W frame, so p = S^-1 R^-1 (o - c - d) + c.
double Reference(const Image &src, int filter, double angle, double sx, double sy, double dx, double dy, int i, int j) {
    const double c = src.Width() / 2.0, a = angle * kPi / 180;
    const double ox = i + 0.5 - c - dx, oy = j + 0.5 - c - dy;
    const double u = (std::cos(a) * ox + std::sin(a) * oy) / sx + c;
    const double v = (-std::sin(a) * ox + std::cos(a) * oy) / sy + c;
    // The footprint widens along a source axis where an output step moves
    // more than one source pixel along it.
    const double stx = std::max(1.0, std::hypot(std::cos(a) / sx, std::sin(a) / sx));
    const double sty = std::max(1.0, std::hypot(std::sin(a) / sy, std::cos(a) / sy));
    const double rx = RadiusOf(filter) * stx, ry = RadiusOf(filter) * sty;
    double sum = 0, wsum = 0;
    for (int l = static_cast<int>(std::floor(v - ry)) - 1; l <= v + ry + 1; ++l)
        for (int k = static_cast<int>(std::floor(u - rx)) - 1; k <= u + rx + 1; ++k) {
            const double w = FilterAt(filter, (k + 0.5 - u) / stx) * FilterAt(filter, (l + 0.5 - v) / sty);
            wsum += w;
            sum += w * src.GetFlt(k, l).R; // canvas outside the data window
        }
    return sum / wsum;
}

TEST(TransformMatrix, FilteredSamplesFollowTheFilterFormula) {
    // An impulse turned and enlarged, and a noisy image turned and shrunk.
    Ref<Image> impulse = MakeImage(24, 24, 8, [](int x, int y) {
        return x == 11 && y == 13 ? FltPixel{1, 0.5f, 0.25f, 1} : FltPixel{};
    });
    Ref<Image> noise = ts::PatternImage(40, 40);
    struct Case {
        Image *src;
        int filter;
        double angle, sx, sy, dx, dy;
    };
    const Case cases[] = {{impulse.Get(), RszCatmullRom, 30, 1.4, 1.4, 0.7, -0.3},
                          {impulse.Get(), RszCubic, -12, 1.1, 2.0, 0, 0},
                          {impulse.Get(), RszLanczos, 75, 1.25, 1.25, 1.5, 0.25},
                          {impulse.Get(), RszLinear, 200, 1, 1, 0.3, 0.3},
                          {noise.Get(), RszLinear, 17, 0.4, 0.4, 0, 0},
                          {noise.Get(), RszCatmullRom, 0, 0.5, 0.3, 0.25, 0},
                          {noise.Get(), RszLanczos, 41, 0.7, 0.45, -2, 1}};
    for (const Case &c : cases) {
        SCOPED_TRACE(::testing::Message()
                     << "filter " << c.filter << " angle " << c.angle << " size " << c.sx << "x" << c.sy);
        const double W = c.src->Width();
        const TagList tags =
            With(Geometry(c.angle, c.sx, c.sy, 0.5 + c.dx / W, 0.5 + c.dy / W), {{XfFilter, c.filter}});
        Ref<Image> out = Transformed(c.src, tags);
        ASSERT_TRUE(out);
        const ImgRectI dw = out->DataWindow();
        int checked = 0;
        for (int j = dw.y0; j < dw.y1; ++j)
            for (int i = dw.x0; i < dw.x1; ++i, ++checked)
                ASSERT_NEAR(out->GetFlt(i, j).R, Reference(*c.src, c.filter, c.angle, c.sx, c.sy, c.dx, c.dy, i, j),
                            5e-6)
                    << i << "," << j;
        EXPECT_GT(checked, 16);
    }
}

TEST(TransformMatrix, ShrinkingAveragesWhereNearestAliases) {
    // A one-pixel checkerboard: its area average is 0.5 everywhere.
    Ref<Image> board = MakeImage(96, 96, 8, [](int x, int y) {
        const float v = (x + y) % 2 ? 1.f : 0.f;
        return FltPixel{v, v, v, 1};
    });
    const TagList shrink = With(Geometry(10, 0.25, 0.25), {{XfFilter, RszLinear}});
    Ref<Image> smooth = Transformed(board.Get(), shrink);
    Ref<Image> nearest = Transformed(board.Get(), With(shrink, {{XfFilter, RszNearest}}));
    int inside = 0;
    for (int y = 40; y < 56; ++y)
        for (int x = 40; x < 56; ++x, ++inside) {
            EXPECT_NEAR(smooth->GetFlt(x, y).R, 0.5, 0.03) << x << "," << y;
            const float n = nearest->GetFlt(x, y).R;
            EXPECT_TRUE(n == 0.f || n == 1.f) << n;
        }
    EXPECT_EQ(inside, 256);
}

TEST(TransformMatrix, AnInverseUndoesATransform) {
    // Smooth enough (periods of 12 pixels and more) for two Catmull-Rom passes.
    Ref<Image> src = MakeImage(64, 64, 8, [](int x, int y) {
        const float v = 0.5f + 0.25f * std::sin(x * 0.45f) * std::cos(y * 0.3f) + 0.1f * std::sin((x + y) * 0.2f);
        return FltPixel{v, 1 - v, 0.5f * v, 1};
    });
    const TagList t = With(Geometry(25, 1.2, 1.1, 0.53, 0.47), {{XfFilter, RszCatmullRom}});
    auto first = MakeRef<TransformMatrix>(src.Get());
    ASSERT_TRUE(first->ImageConcatenateTagList(With(t, {{XfFlatten, 1}})));
    EXPECT_TRUE(first->SourceToOutput().IsIdentity(0));
    Image *moved = first->Source();
    EXPECT_NE(moved, src.Get());
    Ref<Image> back = Transformed(moved, With(t, {{XfInvert, 1}}));
    double worst = 0;
    for (int y = 12; y < 52; ++y)
        for (int x = 12; x < 52; ++x)
            worst = std::max(worst, std::fabs(double(back->GetFlt(x, y).R) - src->GetFlt(x, y).R));
    // Two interpolations of a signal sampled at 4.7 pixels per radian and
    // more lose a little at its peaks (measured: 1.7e-3).
    EXPECT_LT(worst, 4e-3);
    EXPECT_GT(worst, 0.0); // two real resamplings took place
}

TEST(TransformMatrix, ASingularSizeShowsOnlyCanvas) {
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    const ImgRectI frame(0, 0, 8, 8);
    Ref<Image> src = MakeImage(
        8, 8, 7,
        [](int, int) {
            return FltPixel{1, 1, 1, 1};
        },
        &frame, canvas);
    for (int edges : {EdgeCanvas, EdgeWrap}) {
        Ref<TransformMatrix> tm;
        Ref<Image> out =
            Transformed(src.Get(), With(Geometry(30, 0, 1), {{XfInvert, 1}, {XfEdges, edges}}), nullptr, &tm);
        EXPECT_EQ(tm->SourceToOutput().Determinant(), 0.0);
        EXPECT_TRUE(tm->OutputDataWindow().IsNull());
        ASSERT_TRUE(out);
        EXPECT_TRUE(out->DataWindow().IsNull());
        EXPECT_EQ(out->GetFlt(3, 3), out->GetCanvasColor());
        EXPECT_NEAR(out->GetCanvasColor().B, 0.3f, 1e-3);
    }
}

TEST(TransformMatrix, EdgeModesFoldAtTheFrameBorder) {
    // One row 1 2 3 4, canvas 10, moved right by half a pixel with the tent:
    // each output pixel averages two source pixels, folded at the border.
    const FltPixel canvas{10, 10, 10, 10};
    Ref<Image> row = MakeImage(
        4, 1, 8,
        [](int x, int) {
            return FltPixel{1.f + x, 0, 0, 1};
        },
        nullptr, canvas);
    const ImgRectI cut(-1, 0, 6, 1);
    const std::map<int, std::vector<float>> expected = {
        // output x = -1 .. 5
        {EdgeCanvas, {10, 5.5f, 1.5f, 2.5f, 3.5f, 7, 10}},
        {EdgeWrap, {3.5f, 2.5f, 1.5f, 2.5f, 3.5f, 2.5f, 1.5f}},
        {EdgeDuplicate, {1, 1, 1.5f, 2.5f, 3.5f, 4, 4}},
        {EdgeMirror, {1.5f, 1, 1.5f, 2.5f, 3.5f, 4, 3.5f}},
    };
    for (const auto &[edges, values] : expected) {
        SCOPED_TRACE(edges);
        Ref<TransformMatrix> tm;
        Ref<Image> out =
            Transformed(row.Get(), {{XfCenterX, 0.5 + 0.5 / 4}, {XfFilter, RszLinear}, {XfEdges, edges}}, &cut, &tm);
        ASSERT_TRUE(out);
        for (int x = -1; x < 6; ++x) EXPECT_FLOAT_EQ(out->GetFlt(x, 0).R, values[x + 1]) << x;
        if (edges == EdgeCanvas) {
            EXPECT_EQ(tm->OutputDataWindow(), ImgRectI(0, 0, 5, 1));
        } else {
            // Every position has a colour: the domain has no end, and pixels
            // without a cut stop at the frame.
            EXPECT_EQ(tm->OutputDataWindow(), ImgRectI(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless));
            EXPECT_EQ(tm->ApplyTransformTagList({})->DataWindow(), ImgRectI(0, 0, 4, 1));
        }
    }
}

TEST(TransformMatrix, DomainsCoverEveryPixelTheSourceReaches) {
    const ImgRectI dw(3, 2, 17, 12);
    Ref<Image> src = MakeImage(
        20, 16, 8,
        [](int, int) {
            return FltPixel{1, 1, 1, 1};
        },
        &dw);
    // Half a pixel right with the tent reaches exactly one more column; rows stay.
    auto tm = MakeRef<TransformMatrix>(src.Get());
    tm->ImageConcatenateTagList({{XfCenterX, 0.5 + 0.5 / 20}, {XfFilter, RszLinear}});
    EXPECT_EQ(tm->OutputDataWindow(), ImgRectI(3, 2, 18, 12));
    // Turned and shrunk with a wide filter: outside the domain only canvas,
    // and the domain's border rows and columns are not all canvas.
    for (int filter : {RszNearest, RszBox, RszCatmullRom, RszLanczos, RszBessel}) {
        SCOPED_TRACE(filter);
        Ref<TransformMatrix> t;
        const ImgRectI big(-30, -30, 50, 50);
        Ref<Image> out =
            Transformed(src.Get(), With(Geometry(33, 0.6, 1.3, 0.46, 0.55), {{XfFilter, filter}}), &big, &t);
        const ImgRectI d = t->OutputDataWindow();
        ASSERT_FALSE(d.IsNull());
        bool left = false, right = false, bottom = false, top = false;
        for (int y = big.y0; y < big.y1; ++y)
            for (int x = big.x0; x < big.x1; ++x) {
                const bool nonzero = out->GetFlt(x, y).A != 0.f;
                if (!d.Contains(x, y)) {
                    EXPECT_FALSE(nonzero) << x << "," << y;
                    continue;
                }
                // Tight to a pixel: something shows within one pixel of each side.
                left |= nonzero && x <= d.x0 + 1, right |= nonzero && x >= d.x1 - 2;
                bottom |= nonzero && y <= d.y0 + 1, top |= nonzero && y >= d.y1 - 2;
            }
        EXPECT_TRUE(left && right && bottom && top);
    }
    // Endless sides stay endless through moves and scales, and flip sides with a flip.
    const ImgRectI endless(-DomainEndless, 0, 10, DomainEndless);
    const ImgRectI moved = TransformedWindow(endless, Matrix3::Translate(-4, 0) * Matrix3::Scale(-1, 2), {RszNearest});
    EXPECT_EQ(moved, ImgRectI(-14, 0, DomainEndless, DomainEndless));
    EXPECT_EQ(TransformedWindow(endless, Matrix3::Rotate(10), {RszLinear}),
              ImgRectI(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless));
}

TEST(TransformMatrix, IntegerDepthsAgreeWithFloatWithinOneCode) {
    const auto f = [](int x, int y) {
        const float v = 0.5f + 0.4f * std::sin(x * 0.5f + y * 0.3f);
        return FltPixel{v, v * 0.5f, 1 - v, 1};
    };
    Ref<Image> ref =
        Transformed(MakeImage(32, 32, 8, f).Get(), With(Geometry(21, 0.8, 1.3), {{XfFilter, RszMitchell}}));
    for (int depth : {1, 2, 3, 5, 6, 7}) {
        SCOPED_TRACE(depth);
        Ref<Image> out =
            Transformed(MakeImage(32, 32, depth, f).Get(), With(Geometry(21, 0.8, 1.3), {{XfFilter, RszMitchell}}));
        ASSERT_EQ(out->DataWindow(), ref->DataWindow());
        EXPECT_EQ(out->Depth(), depth);
        const double tol = depth % 4 == 1 ? 1.5 / 255 : depth % 4 == 2 ? 1.5 / 65535 + 1e-5 : 2e-3;
        for (int y = 8; y < 24; ++y)
            for (int x = 8; x < 24; ++x) {
                const FltPixel a = out->GetFlt(x, y), b = ref->GetFlt(x, y);
                EXPECT_NEAR(a.A, b.A, tol);
                if (depth >= 5) {
                    EXPECT_NEAR(a.R, b.R, tol) << x << "," << y;
                }
            }
    }
}

TEST(TransformMatrix, PreCalculationGivesWindowsWithoutPixels) {
    Ref<Image> shape = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 32}, {ImgNoData, 1}});
    const long before = TransformMatrix::ResampleCount();
    auto tm = MakeRef<TransformMatrix>(shape.Get());
    ASSERT_TRUE(tm->ImageConcatenateTagList(With(Geometry(45, 0.5, 0.5), {{XfFlatten, 1}})));
    Image *flat = tm->Source();
    EXPECT_TRUE(flat->IsNoData());
    EXPECT_FALSE(flat->HasScanLineData());
    EXPECT_EQ(flat->DataWindow(),
              TransformedWindow(
                  ImgRectI(0, 0, 64, 32),
                  NormalisedToPixelMatrix(TransformTagsMatrix(Geometry(45, 0.5, 0.5), 64, 32, 1, 1), 64, 32), {}));
    EXPECT_EQ(TransformMatrix::ResampleCount(), before);
}

TEST(TransformMatrix, EqualityAndHashFollowSourceMatrixAndSampling) {
    Ref<Image> a = ts::PatternImage(8, 8), b = ts::PatternImage(8, 8);
    auto make = [](Image *src, const TagList &tags) {
        auto tm = MakeRef<TransformMatrix>(src);
        tm->ImageConcatenateTagList(tags);
        return tm;
    };
    const TagList t = Geometry(10, 1.1, 1.1);
    auto x = make(a.Get(), t), same = make(a.Get(), t);
    EXPECT_TRUE(x->Equals(*same));
    EXPECT_EQ(x->Hash(), same->Hash());
    EXPECT_TRUE(x->Equals(*x->Copy()));
    for (const auto &other :
         {make(b.Get(), t), make(a.Get(), Geometry(11, 1.1, 1.1)), make(a.Get(), With(t, {{XfFilter, RszNearest}})),
          make(a.Get(), With(t, {{XfEdges, EdgeWrap}}))}) {
        EXPECT_FALSE(x->Equals(*other));
        EXPECT_NE(x->Hash(), other->Hash());
    }
    EXPECT_FALSE(x->Equals(*a));
    EXPECT_EQ(x->DataType(), CLSID_DataType_TransformMatrix);
}

TEST(TransformMatrix, AnAbortedRenderGivesNoPixels) {
    Ref<Image> src = ts::PatternImage(64, 64);
    std::atomic<bool> abort{true};
    src->SetAbortFlag(&abort);
    auto tm = MakeRef<TransformMatrix>(src.Get());
    tm->ImageConcatenateTagList(Geometry(10, 1.5, 1.5));
    EXPECT_EQ(tm->ApplyTransformTagList({}), nullptr);
    EXPECT_FALSE(tm->ImageConcatenateTagList({{XfFlatten, 1}}));
}

// ---- against oiiotool ----

bool HaveOiiotool() { return access("/usr/bin/oiiotool", X_OK) == 0; }

TEST(TransformMatrix, ARotationAgreesWithOiiotool) {
    if (!HaveOiiotool()) GTEST_SKIP() << "oiiotool is not installed";
    // A smooth picture (periods of 16 pixels and more), written as a PFM:
    // rows bottom up, as ours.
    const int W = 64, H = 48;
    Ref<Image> src = MakeImage(W, H, 8, [](int x, int y) {
        const float v = 0.5f + 0.3f * std::sin(x * 0.35f) * std::cos(y * 0.25f);
        return FltPixel{v, 0.5f + 0.2f * std::cos(x * 0.2f + y * 0.3f), 0.25f, 1};
    });
    char dir[] = "/tmp/orvane-xform-XXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    const std::string in = std::string(dir) + "/in.pfm", out = std::string(dir) + "/out.exr";
    {
        std::ofstream f(in, std::ios::binary);
        f << "PF\n" << W << " " << H << "\n-1.0\n";
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                const FltPixel p = src->GetFlt(x, y);
                const float rgb[3] = {p.R, p.G, p.B};
                f.write(reinterpret_cast<const char *>(rgb), sizeof rgb);
            }
    }
    // oiiotool turns clockwise on screen: -30 is our anticlockwise 30, about the middle.
    const std::string cmd = "oiiotool " + in + " --rotate:filter=lanczos3:recompute_roi=0 -30 -d float -o " + out +
                            " 2>&1 && oiiotool --dumpdata " + out + " 2>&1";
    FILE *p = popen(cmd.c_str(), "r");
    ASSERT_NE(p, nullptr);
    std::map<std::pair<int, int>, float> theirs;
    char line[512];
    while (fgets(line, sizeof line, p)) {
        int x, y;
        float r, g, b;
        if (std::sscanf(line, " Pixel (%d, %d): %f %f %f", &x, &y, &r, &g, &b) == 5) theirs[{x, H - 1 - y}] = r;
    }
    pclose(p);
    std::remove(in.c_str()), std::remove(out.c_str()), rmdir(dir);
    ASSERT_EQ(theirs.size(), static_cast<size_t>(W * H));

    const ImgRectI frame(0, 0, W, H);
    Ref<Image> ours = Transformed(src.Get(), With(Geometry(30, 1, 1), {{XfFilter, RszLanczos}}), &frame);
    // Both sample with the separable 3-lobe Lanczos at unit scale, weights
    // normalised per axis and black beyond the picture, so they agree over
    // the whole frame, corners included, up to the order of float sums
    // (measured: 3.3e-6 of a 0.6 range).
    double worst = 0;
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) worst = std::max(worst, std::fabs(double(ours->GetFlt(x, y).R) - theirs[{x, y}]));
    EXPECT_LT(worst, 1e-5);
}

} // namespace
} // namespace Orvane::xformtest
