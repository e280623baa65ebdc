// Transform matrices and the sampler: hand-written moves, flips, turns and borders, filtered samples from the
// filters' formulas and the inverse geometry, invariants, and oiiotool's rotation.
#include <map>

#include "host/flow/DataTypes.h"
#include "host/image/TransformMatrix.h"
#include "host/image/TransformSampler.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::xformtest {
namespace {
using namespace ::Orvane::Test;

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
    if (keep) *keep = tm;
    return tm->ApplyTransformTagList(apply);
}

/// Red of the rows of `img` from row `yTop` down, columns from x0.
std::vector<std::vector<float>> RowsR(const Image &img, int x0, int yTop, int w, int h) {
    std::vector<std::vector<float>> rows(h);
    for (int r = 0; r < h; ++r)
        for (int c = 0; c < w; ++c) rows[r].push_back(img.GetFlt(x0 + c, yTop - r).R);
    return rows;
}

::testing::AssertionResult Maps(const Matrix3 &m, double x, double y, double wantX, double wantY, double tol) {
    double gx, gy;
    m.Apply(x, y, gx, gy);
    if (std::fabs(gx - wantX) <= tol && std::fabs(gy - wantY) <= tol) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << "got (" << gx << ", " << gy << "), want (" << wantX << ", " << wantY << ")";
}

TEST(Matrix3, ComposesInvertsMapsByHandAndFollowsTheTransformControls) {
    EXPECT_TRUE(Maps(Matrix3::Translate(3, 4) * Matrix3::Scale(2, 5), 1, 1, 5, 9, 0));
    EXPECT_TRUE(Maps(Matrix3::Scale(2, 5) * Matrix3::Translate(3, 4), 1, 1, 8, 25, 0));
    // Quarter turns are exact, in either direction and after whole turns; anticlockwise, y up.
    const Matrix3 q = Matrix3::Rotate(90);
    EXPECT_TRUE(q.m == (std::array<double, 9>{0, -1, 0, 1, 0, 0, 0, 0, 1}) && Matrix3::Rotate(-270) == q &&
                Matrix3::Rotate(450) == q);
    EXPECT_EQ(Matrix3::Rotate(180).m, (std::array<double, 9>{-1, 0, 0, 0, -1, 0, 0, 0, 1}));
    EXPECT_TRUE(Maps(Matrix3::Rotate(30), 1, 0, std::sqrt(3.0) / 2, 0.5, 1e-15));

    const Matrix3 m = Matrix3::Translate(-7, 2.5) * Matrix3::Rotate(33) * Matrix3::Scale(2, 5);
    EXPECT_NEAR(m.Determinant(), 10.0, 1e-12);
    Matrix3 inv;
    ASSERT_TRUE(m.Invert(inv));
    EXPECT_TRUE((m * inv).IsIdentity(1e-12) && (inv * m).IsIdentity(1e-12) && !m.IsIdentity());
    // Singular: no inverse, and the identity handed back.
    EXPECT_TRUE(!(Matrix3::Rotate(10) * Matrix3::Scale(0, 1)).Invert(inv) && inv.IsIdentity(0));
    // A projective row divides by w; its inverse maps back.
    Matrix3 p;
    p(2, 0) = 0.5;
    EXPECT_TRUE(!p.IsAffine() && Maps(p, 2, 2, 1, 1, 0));
    ASSERT_TRUE(p.Invert(inv));
    EXPECT_TRUE(Maps(inv, 1, 1, 2, 2, 1e-15));
    // Sizes about a pivot, then the centre's offset: (0.5, 0.5) - (0.25, 0.5) scaled by 2, plus the pivot and
    // the centre's 0.1: (0.85, 0.5); 0.1 above the pivot goes three times as far.
    const TagList pivot{{XfXSize, 2.0},  {XfYSize, 3.0},   {XfPivotX, 0.25},
                        {XfPivotY, 0.5}, {XfCenterX, 0.6}, {XfCenterY, 0.5}};
    const std::tuple<const char *, TagList, double, double, double, double, bool, double, double, double, double>
        cases[] = {
            // A quarter turn about the middle of 200 x 100 square pixels: 50 pixels right of the middle go to 50 above
            // it.
            {"quarter turn", Geometry(90, 1, 1), 200, 100, 1, 1, true, 150, 50, 100, 100},
            // Pixels twice as wide as high: 10 pixels right (20 units) turn into 20 units = 20 pixels up.
            {"wide pixels", Geometry(90, 1, 1), 100, 100, 2, 1, true, 60, 50, 50, 70},
            {"pivot", pivot, 640, 480, 1, 1, false, 0.5, 0.5, 0.85, 0.5},
            {"pivot", pivot, 640, 480, 1, 1, false, 0.25, 0.6, 0.35, 0.8},
            // Flips mirror about the frame's middle before anything else.
            {"flip x", {{XfFlipX, 1}}, 10, 10, 1, 1, false, 0.2, 0.3, 0.8, 0.3},
            {"flip y, moved", {{XfFlipY, 1}, {XfCenterX, 0.6}}, 10, 10, 1, 1, false, 0.2, 0.3, 0.3, 0.7},
        };
    for (const auto &[what, tags, W, H, ax, ay, pixels, x, y, wantX, wantY] : cases) {
        const Matrix3 n = TransformTagsMatrix(tags, W, H, ax, ay);
        EXPECT_TRUE(Maps(pixels ? NormalisedToPixelMatrix(n, W, H) : n, x, y, wantX, wantY, 1e-12)) << what;
    }
    // Invert gives the inverse; a singular matrix (Size 0) stays as it is.
    const TagList t = With(Geometry(37, 1.3, 0.7, 0.52, 0.46), {{XfPivotX, 0.3}, {XfFlipX, 1}});
    const Matrix3 fwd = TransformTagsMatrix(t, 320, 200, 1.2, 0.9);
    EXPECT_TRUE((TransformTagsMatrix(With(t, {{XfInvert, 1}}), 320, 200, 1.2, 0.9) * fwd).IsIdentity(1e-12));
    const TagList zero = Geometry(20, 0, 0, 0.6, 0.4);
    const Matrix3 singular = TransformTagsMatrix(zero, 320, 200, 1, 1);
    EXPECT_TRUE(singular.Determinant() == 0.0 &&
                TransformTagsMatrix(With(zero, {{XfInvert, 1}}), 320, 200, 1, 1) == singular);
    // No frame, no transform.
    EXPECT_TRUE(TransformTagsMatrix(t, 0, 100, 1, 1).IsIdentity(0) &&
                TransformTagsMatrix(t, 100, 100, 1, 0).IsIdentity(0));
}

TEST(TransformMatrix, AnIdentityHandsOnTheSourceWholePixelMovesCopyPixels) {
    Ref<Image> src = PatternImage(9, 7);
    const long before = TransformMatrix::ResampleCount();
    auto tm = MakeRef<TransformMatrix>(src.Get());
    EXPECT_TRUE(tm->ImageConcatenateTagList({{XfFilter, RszLanczos}, {XfEdges, EdgeMirror}}));
    EXPECT_TRUE(tm->ApplyTransformTagList({}).Get() == src.Get() && tm->OutputDataWindow() == src->DataWindow());
    // A transform followed by its inverse composes to the identity: no pixels move.
    const TagList t = Geometry(23, 1.7, 0.8, 0.55, 0.41);
    ASSERT_TRUE(tm->ImageConcatenateTagList(t) && tm->ImageConcatenateTagList(With(t, {{XfInvert, 1}})));
    EXPECT_TRUE(tm->SourceToOutput().IsIdentity(1e-12) && tm->ApplyTransformTagList({}).Get() == src.Get());
    EXPECT_TRUE(ImageOfValue(src.Get()).Get() == src.Get() && TransformMatrix::ResampleCount() == before);
    const ImgRectI dw(1, 0, 6, 5);
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.f};
    auto ramps = [](int x, int y) { return FltPixel{0.1f * x, 0.07f * y + 0.01f, 0.3f, 0.05f * (x + y)}; };
    // Three right and two down, with a filter that would soften anything between pixels.
    const TagList move = {{XfCenterX, 0.5 + 3.0 / 7}, {XfCenterY, 0.5 - 2.0 / 5}, {XfFilter, RszCubic}};
    for (int depth = 1; depth <= 8; ++depth) {
        Ref<Image> src = Filled(7, 5, depth, ramps, &dw, canvas);
        const long before = TransformMatrix::ResampleCount();
        Ref<TransformMatrix> tm;
        Ref<Image> out = Transformed(src.Get(), move, nullptr, &tm);
        ASSERT_TRUE(out && TransformMatrix::ResampleCount() == before + 1);
        EXPECT_TRUE(out->DataWindow() == ImgRectI(4, -2, 9, 3) && tm->OutputDataWindow() == out->DataWindow() &&
                    out->Depth() == depth && out->GetCanvasColor() == canvas);
        for (int y = -2; y < 3; ++y)
            for (int x = 4; x < 9; ++x)
                EXPECT_EQ(std::memcmp(out->PixelAddress(x, y), src->PixelAddress(x - 3, y + 2), src->BytesPerPixel()),
                          0)
                    << depth << ": " << x << "," << y;
    }
}

/// A filtered transform at output pixel (i, j) from the geometry: o = R S (p - c) + c + d in square pixels of a
/// W x W frame, so p = S^-1 R^-1 (o - c - d) + c.
double Reference(const Image &src, int filter, double angle, double sx, double sy, double dx, double dy, int i, int j) {
    const double c = src.Width() / 2.0, a = angle * std::numbers::pi / 180;
    const double ox = i + 0.5 - c - dx, oy = j + 0.5 - c - dy;
    const double u = (std::cos(a) * ox + std::sin(a) * oy) / sx + c;
    const double v = (-std::sin(a) * ox + std::cos(a) * oy) / sy + c;
    // The footprint widens along a source axis where an output step moves more than a source pixel.
    const double stx = std::max(1.0, std::hypot(std::cos(a) / sx, std::sin(a) / sx));
    const double sty = std::max(1.0, std::hypot(std::sin(a) / sy, std::cos(a) / sy));
    const double rx = RefRadius(filter) * stx, ry = RefRadius(filter) * sty;
    double sum = 0, wsum = 0;
    for (int l = static_cast<int>(std::floor(v - ry)) - 1; l <= v + ry + 1; ++l)
        for (int k = static_cast<int>(std::floor(u - rx)) - 1; k <= u + rx + 1; ++k) {
            const double w = RefFilter(filter, RszWindowHanning, (k + 0.5 - u) / stx) *
                             RefFilter(filter, RszWindowHanning, (l + 0.5 - v) / sty);
            wsum += w;
            sum += w * src.GetFlt(k, l).R; // canvas outside the data window; a mask reads alpha
        }
    return sum / wsum;
}

TEST(TransformMatrix, FlipsAndQuarterTurnsMovePixelsExactlyFilteredSamplesFollowTheFormula) {
    // 3 x 2 and 3 x 3 images numbered 1, 2, 3 along the bottom row, rows top down in the table.
    auto numbered = [](int x, int y) { return FltPixel{1.f + x + 3.f * y, 0, 0, 1}; };
    Ref<Image> small = Filled(3, 2, 8, numbered), square = Filled(3, 3, 8, numbered);
    const std::tuple<Image *, TagList, std::vector<std::vector<float>>> cases[] = {
        {small.Get(), {{XfFlipX, 1}}, {{6, 5, 4}, {3, 2, 1}}},
        {small.Get(), {{XfFlipY, 1}}, {{1, 2, 3}, {4, 5, 6}}},
        {small.Get(), {{XfFlipX, 1}, {XfFlipY, 1}}, {{3, 2, 1}, {6, 5, 4}}},
        // A quarter turn anticlockwise about the middle: the right column becomes the top row.
        {square.Get(), Geometry(90, 1, 1), {{9, 6, 3}, {8, 5, 2}, {7, 4, 1}}},
        {square.Get(), Geometry(-90, 1, 1), {{1, 4, 7}, {2, 5, 8}, {3, 6, 9}}},
        {square.Get(), Geometry(180, 1, 1), {{3, 2, 1}, {6, 5, 4}, {9, 8, 7}}},
    };
    for (const auto &[src, tags, want] : cases)
        for (int filter : {RszNearest, RszLinear, RszLanczos}) {
            Ref<Image> out = Transformed(src, With(tags, {{XfFilter, filter}}));
            const int h = static_cast<int>(want.size());
            EXPECT_EQ(out->DataWindow(), src->DataWindow());
            EXPECT_EQ(RowsR(*out, 0, h - 1, 3, h), want) << "filter " << filter;
        }
    // 4 x 2 about its middle (2, 1), a pixel corner: rows top down 5 6 7 8 /
    // 1 2 3 4 turn into two columns standing out of the frame.
    Ref<Image> wide = Filled(4, 2, 5, [](int x, int y) { return FltPixel{(1.f + x + 4.f * y) / 255.f, 0, 0, 1}; });
    Ref<Image> turned = Transformed(wide.Get(), With(Geometry(90, 1, 1), {{XfFilter, RszLinear}}));
    EXPECT_EQ(turned->DataWindow(), ImgRectI(1, -1, 3, 3));
    const int expect[4][2] = {{8, 4}, {7, 3}, {6, 2}, {5, 1}}; // top down, x = 1, 2
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 2; ++c) EXPECT_EQ(*turned->PixelAddress(1 + c, 2 - r), expect[r][c]) << r << "," << c;
    // An impulse turned and enlarged, a noisy image turned and shrunk, also at other depths (the reference reads
    // what the source holds, the output is within half a step of its grid).
    Ref<Image> impulse = Filled(24, 24, 8, [](int x, int y) {
        return x == 11 && y == 13 ? FltPixel{1, 0.5f, 0.25f, 1} : FltPixel{};
    });
    Ref<Image> noise = PatternImage(40, 40);
    auto at = [&](int depth) { return noise->CopyOfImageTagList({{ImgDepth, depth}}); };
    Ref<Image> noise8 = at(DepthRGBAInt8), mask = at(DepthAInt16), half = at(DepthAFlt16);
    const std::tuple<Image *, int, double, double, double, double, double> samples[] = {
        {impulse.Get(), RszCatmullRom, 30, 1.4, 1.4, 0.7, -0.3},
        {impulse.Get(), RszCubic, -12, 1.1, 2.0, 0, 0},
        {impulse.Get(), RszLanczos, 75, 1.25, 1.25, 1.5, 0.25},
        {noise.Get(), RszLinear, 17, 0.4, 0.4, 0, 0},
        {noise.Get(), RszCatmullRom, 0, 0.5, 0.3, 0.25, 0},
        {noise.Get(), RszLanczos, 41, 0.7, 0.45, -2, 1},
        {noise8.Get(), RszMitchell, 21, 0.8, 1.3, 0, 0},
        {mask.Get(), RszLanczos, -33, 1.2, 0.9, 0, 0.5},
        {half.Get(), RszMitchell, 21, 0.8, 1.3, 0, 0}};
    for (const auto &[src, filter, angle, sx, sy, dx, dy] : samples) {
        const double W = src->Width();
        const TagList tags = With(Geometry(angle, sx, sy, 0.5 + dx / W, 0.5 + dy / W), {{XfFilter, filter}});
        Ref<Image> out = Transformed(src, tags);
        ASSERT_TRUE(out && out->Depth() == src->Depth());
        const ImgRectI dw = out->DataWindow();
        ASSERT_GT(dw.Width() * dw.Height(), 16);
        for (int j = dw.y0; j < dw.y1; ++j)
            for (int i = dw.x0; i < dw.x1; ++i) {
                double want = Reference(*src, filter, angle, sx, sy, dx, dy, i, j);
                if (Kind(src->Depth()) < 2) want = std::clamp(want, 0.0, 1.0); // integers hold 0..1
                ASSERT_NEAR(out->GetFlt(i, j).R, want, HalfCode(src->Depth(), want) + 5e-6)
                    << "depth " << src->Depth() << " filter " << filter << " angle " << angle << " at " << i << ","
                    << j;
            }
    }
}

TEST(TransformMatrix, AnInverseUndoesATransformAndEdgeModesFoldAtTheBorder) {
    // Smooth enough (periods of 12 pixels and more) for two Catmull-Rom passes.
    Ref<Image> src = Filled(64, 64, 8, [](int x, int y) {
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
    // Two interpolations lose a little at the peaks (measured: 1.7e-3); two real resamplings took place.
    const double worst = MaxDiff(*back, *src, ImgRectI(12, 12, 52, 52));
    EXPECT_TRUE(worst < 4e-3 && worst > 0.0) << worst;
    // One row 1 2 3 4, canvas 10, moved half a pixel right with the tent: two source pixels per output pixel.
    Ref<Image> row = Filled(4, 1, 8, [](int x, int) { return FltPixel{1.f + x, 0, 0, 1}; }, nullptr, {10, 10, 10, 10});
    const ImgRectI cut(-1, 0, 6, 1);
    const std::map<int, std::vector<float>> expected = {
        // output x = -1 .. 5
        {EdgeCanvas, {10, 5.5f, 1.5f, 2.5f, 3.5f, 7, 10}},
        {EdgeWrap, {3.5f, 2.5f, 1.5f, 2.5f, 3.5f, 2.5f, 1.5f}},
        {EdgeDuplicate, {1, 1, 1.5f, 2.5f, 3.5f, 4, 4}},
        {EdgeMirror, {1.5f, 1, 1.5f, 2.5f, 3.5f, 4, 3.5f}},
    };
    for (const auto &[edges, values] : expected) {
        Ref<TransformMatrix> tm;
        Ref<Image> out =
            Transformed(row.Get(), {{XfCenterX, 0.5 + 0.5 / 4}, {XfFilter, RszLinear}, {XfEdges, edges}}, &cut, &tm);
        ASSERT_TRUE(out);
        for (int x = -1; x < 6; ++x) EXPECT_FLOAT_EQ(out->GetFlt(x, 0).R, values[x + 1]) << edges << ": " << x;
        // Other than the canvas, the domain has no end; pixels without a cut stop at the frame.
        const int E = DomainEndless;
        EXPECT_EQ(tm->OutputDataWindow(), edges == EdgeCanvas ? ImgRectI(0, 0, 5, 1) : ImgRectI(-E, -E, E, E));
        if (edges != EdgeCanvas) {
            EXPECT_EQ(tm->ApplyTransformTagList({})->DataWindow(), ImgRectI(0, 0, 4, 1));
        }
    }
}

TEST(TransformMatrix, DomainsCoverEveryPixelTheSourceReaches) {
    const ImgRectI dw(3, 2, 17, 12);
    Ref<Image> src = Filled(20, 16, 8, Constant({1, 1, 1, 1}), &dw);
    // Half a pixel right with the tent reaches exactly one more column; rows stay.
    auto tm = MakeRef<TransformMatrix>(src.Get());
    tm->ImageConcatenateTagList({{XfCenterX, 0.5 + 0.5 / 20}, {XfFilter, RszLinear}});
    EXPECT_EQ(tm->OutputDataWindow(), ImgRectI(3, 2, 18, 12));
    // Turned and shrunk: outside the domain only canvas, and something shows within a pixel of each side.
    for (int filter : {RszNearest, RszBox, RszCatmullRom, RszLanczos, RszBessel}) {
        Ref<TransformMatrix> t;
        const ImgRectI big(-30, -30, 50, 50);
        Ref<Image> out =
            Transformed(src.Get(), With(Geometry(33, 0.6, 1.3, 0.46, 0.55), {{XfFilter, filter}}), &big, &t);
        const ImgRectI d = t->OutputDataWindow();
        ASSERT_FALSE(d.IsNull());
        bool left = false, right = false, bottom = false, top = false;
        for (int y = big.y0; y < big.y1; ++y)
            for (int x = big.x0; x < big.x1; ++x) {
                const bool shows = out->GetFlt(x, y).A != 0.f;
                EXPECT_FALSE(shows && !d.Contains(x, y)) << filter << ": " << x << "," << y;
                left |= shows && x <= d.x0 + 1, right |= shows && x >= d.x1 - 2;
                bottom |= shows && y <= d.y0 + 1, top |= shows && y >= d.y1 - 2;
            }
        EXPECT_TRUE(left && right && bottom && top) << filter;
    }
    // Endless sides stay endless through moves and scales, and flip sides with a flip.
    const int E = DomainEndless;
    const ImgRectI endless(-E, 0, 10, E);
    EXPECT_EQ(TransformedWindow(endless, Matrix3::Translate(-4, 0) * Matrix3::Scale(-1, 2), {RszNearest}),
              ImgRectI(-14, 0, E, E));
    EXPECT_EQ(TransformedWindow(endless, Matrix3::Rotate(10), {RszLinear}), ImgRectI(-E, -E, E, E));
}

TEST(TransformMatrix, PreCalculationAbortsAndSingularSizesGiveNoPixelsEqualityAndHashFollowTheSampling) {
    Ref<Image> shape = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 32}, {ImgNoData, 1}});
    const long before = TransformMatrix::ResampleCount();
    auto tm = MakeRef<TransformMatrix>(shape.Get());
    ASSERT_TRUE(tm->ImageConcatenateTagList(With(Geometry(45, 0.5, 0.5), {{XfFlatten, 1}})));
    Image *flat = tm->Source();
    const Matrix3 m = TransformTagsMatrix(Geometry(45, 0.5, 0.5), 64, 32, 1, 1);
    EXPECT_TRUE(flat->IsNoData() && !flat->HasScanLineData() && TransformMatrix::ResampleCount() == before);
    EXPECT_EQ(flat->DataWindow(), TransformedWindow(ImgRectI(0, 0, 64, 32), NormalisedToPixelMatrix(m, 64, 32), {}));

    Ref<Image> src = PatternImage(64, 64);
    std::atomic<bool> abort{true};
    src->SetAbortFlag(&abort);
    auto aborted = MakeRef<TransformMatrix>(src.Get());
    aborted->ImageConcatenateTagList(Geometry(10, 1.5, 1.5));
    EXPECT_FALSE(aborted->ApplyTransformTagList({}) || aborted->ImageConcatenateTagList({{XfFlatten, 1}}));
    // A singular size shows only canvas.
    const FltPixel canvas{0.1f, 0.2f, 0.3f, 0.4f};
    Ref<Image> white = Filled(8, 8, 7, Constant({1, 1, 1, 1}), nullptr, canvas);
    for (int edges : {EdgeCanvas, EdgeWrap}) {
        Ref<TransformMatrix> singular;
        Ref<Image> out =
            Transformed(white.Get(), With(Geometry(30, 0, 1), {{XfInvert, 1}, {XfEdges, edges}}), nullptr, &singular);
        EXPECT_TRUE(singular->SourceToOutput().Determinant() == 0.0 && singular->OutputDataWindow().IsNull());
        ASSERT_TRUE(out && out->DataWindow().IsNull() && out->GetFlt(3, 3) == out->GetCanvasColor());
        EXPECT_NEAR(out->GetCanvasColor().B, 0.3f, 1e-3);
    }
    // Equality and hash follow the source, matrix and sampling.
    Ref<Image> a = PatternImage(8, 8), b = PatternImage(8, 8);
    auto make = [](Image *src, const TagList &tags) {
        auto tm = MakeRef<TransformMatrix>(src);
        tm->ImageConcatenateTagList(tags);
        return tm;
    };
    const TagList t = Geometry(10, 1.1, 1.1);
    auto x = make(a.Get(), t), same = make(a.Get(), t);
    EXPECT_TRUE(x->Equals(*same) && x->Hash() == same->Hash() && x->Equals(*x->Copy()));
    for (const auto &other :
         {make(b.Get(), t), make(a.Get(), Geometry(11, 1.1, 1.1)), make(a.Get(), With(t, {{XfFilter, RszNearest}})),
          make(a.Get(), With(t, {{XfEdges, EdgeWrap}}))})
        EXPECT_TRUE(!x->Equals(*other) && x->Hash() != other->Hash());
    EXPECT_TRUE(!x->Equals(*a) && x->DataType() == CLSID_DataType_TransformMatrix);
}

TEST(TransformMatrix, ARotationAgreesWithOiiotool) {
    if (!HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    const int W = 64, H = 48;
    Ref<Image> src = Filled(W, H, 8, [](int x, int y) {
        const float v = 0.5f + 0.3f * std::sin(x * 0.35f) * std::cos(y * 0.25f);
        return FltPixel{v, 0.5f + 0.2f * std::cos(x * 0.2f + y * 0.3f), 0.25f, 1};
    });
    TempFolder dir;
    WritePfm(*src, dir / "in.pfm");
    // oiiotool turns clockwise on screen: -30 is our anticlockwise 30, about the middle.
    ASSERT_TRUE(RunQuiet("oiiotool " + dir / "in.pfm" + " --rotate:filter=lanczos3:recompute_roi=0 -30 -d float -o " +
                         dir / "out.exr"));
    Ref<Image> theirs = ReadOiioDump(dir / "out.exr", W, H);
    ASSERT_TRUE(theirs);
    const ImgRectI frame(0, 0, W, H);
    Ref<Image> ours = Transformed(src.Get(), With(Geometry(30, 1, 1), {{XfFilter, RszLanczos}}), &frame);
    // Both use the separable Lanczos3 with weights normalised per axis and black beyond the picture: they
    // agree over the whole frame up to the order of float sums (measured: 3.3e-6 of a 0.6 range).
    EXPECT_TRUE(AllNear(
        *ours, frame, 1e-5, [&](int x, int y) { return theirs->GetFlt(x, y); }, 0, 1));
}

} // namespace
} // namespace Orvane::xformtest
