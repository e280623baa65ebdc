#include "host/image/ColorMatrix.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "tests/support/CompilerHalf.h"

namespace Orvane::mtxtest {
namespace {

using Mat5 = double[5][5];

// Deterministic values in [lo, hi).
struct Rng {
    uint64_t state;
    double Next(double lo, double hi) {
        state = state * 6364136223846793005ull + 1442695040888963407ull;
        return lo + (hi - lo) * static_cast<double>(state >> 11) * (1.0 / 9007199254740992.0);
    }
};

// A random matrix with the constant row (0 0 0 0 1), as the colour steps make them.
ColorMatrixFull RandomMatrix(Rng &rng, double spread = 1.0) {
    ColorMatrixFull m;
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) m.m[i][j] = (i == j ? 1.0 : 0.0) + rng.Next(-spread, spread);
    return m;
}

// The matrix applied in double, written out here: out_i = sum_j m[i][j] * in_j, in_4 = 1.
void ApplyD(const ColorMatrixFull &m, const double in[4], double out[4]) {
    const double v[5] = {in[0], in[1], in[2], in[3], 1.0};
    for (int i = 0; i < 4; ++i) {
        out[i] = 0.0;
        for (int j = 0; j < 5; ++j) out[i] += m.m[i][j] * v[j];
    }
}

void Multiply(const ColorMatrixFull &a, const ColorMatrixFull &b, Mat5 out) {
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) {
            out[i][j] = 0.0;
            for (int k = 0; k < 5; ++k) out[i][j] += a.m[i][k] * b.m[k][j];
        }
}

double MaxOffIdentity(const Mat5 m) {
    double worst = 0.0;
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) worst = std::max(worst, std::fabs(m[i][j] - (i == j ? 1.0 : 0.0)));
    return worst;
}

// ---------------------------------------------------------------------------------------------------------------
// Matrices

TEST(ColorMatrixCompose, ThenScaleOffsetApplyInStepOrder) {
    Rng rng{1};
    for (int trial = 0; trial < 200; ++trial) {
        const ColorMatrixFull a = RandomMatrix(rng), b = RandomMatrix(rng), c = RandomMatrix(rng);
        const int ch = trial % 4;
        const double s = rng.Next(-3, 3), o = rng.Next(-2, 2);
        ColorMatrixFull composed = a;
        composed.Then(b).Scale(ch, s).Offset((ch + 1) % 4, o).Then(c);

        const double p[4] = {rng.Next(-0.5, 1.5), rng.Next(-0.5, 1.5), rng.Next(-0.5, 1.5), rng.Next(0, 1)};
        // Step by step: a, then b, then the scale, then the offset, then c.
        double s1[4], s2[4], want[4];
        ApplyD(a, p, s1);
        ApplyD(b, s1, s2);
        s2[ch] *= s;
        s2[(ch + 1) % 4] += o;
        ApplyD(c, s2, want);
        double got[4];
        ApplyD(composed, p, got);
        for (int i = 0; i < 4; ++i) ASSERT_NEAR(got[i], want[i], 1e-9 * (1 + std::fabs(want[i]))) << trial;
        for (int j = 0; j < 5; ++j) ASSERT_EQ(composed.m[4][j], j == 4 ? 1.0 : 0.0); // still affine

        const FltPixel fp{static_cast<float>(p[0]), static_cast<float>(p[1]), static_cast<float>(p[2]),
                          static_cast<float>(p[3])};
        const double pf[4] = {fp.R, fp.G, fp.B, fp.A};
        ApplyD(composed, pf, want);
        const FltPixel out = composed.Apply(fp);
        EXPECT_NEAR(out.R, want[0], 1e-6 * (1 + std::fabs(want[0])));
        EXPECT_NEAR(out.G, want[1], 1e-6 * (1 + std::fabs(want[1])));
        EXPECT_NEAR(out.B, want[2], 1e-6 * (1 + std::fabs(want[2])));
        EXPECT_NEAR(out.A, want[3], 1e-6 * (1 + std::fabs(want[3])));
    }

    // The order shows in the entries: scale then offset versus offset then scale.
    ColorMatrixFull so, os;
    so.Scale(0, 2.0).Offset(0, 0.5);
    os.Offset(0, 0.5).Scale(0, 2.0);
    EXPECT_EQ(so.m[0][0], 2.0);
    EXPECT_EQ(so.m[0][4], 0.5);
    EXPECT_EQ(os.m[0][0], 2.0);
    EXPECT_EQ(os.m[0][4], 1.0);
    EXPECT_FALSE(so.IsIdentity());

    ColorMatrixFull id;
    EXPECT_TRUE(id.IsIdentity());
    id.Then(ColorMatrixFull());
    EXPECT_TRUE(id.IsIdentity());
    ColorMatrixFull m = RandomMatrix(rng);
    m.SetIdentity();
    EXPECT_TRUE(m.IsIdentity());
    EXPECT_EQ(ColorMatrixFull().Apply({0.25f, -1.0f, 3.0f, 0.5f}), (FltPixel{0.25f, -1.0f, 3.0f, 0.5f}));
}

TEST(ColorMatrixDeterminant, ClosedForms) {
    struct Case {
        const char *what;
        double m[5][5];
        double det;
    };
    const Case cases[] = {
        {"identity", {{1, 0, 0, 0, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 1.0},
        {"diagonal", {{2, 0, 0, 0, 0}, {0, 3, 0, 0, 0}, {0, 0, 0.5, 0, 0}, {0, 0, 0, -1, 0}, {0, 0, 0, 0, 1}}, -3.0},
        {"upper triangular",
         {{2, 7, -3, 1, 0.5}, {0, -4, 2, 9, 1}, {0, 0, 0.25, 5, -2}, {0, 0, 0, 3, 4}, {0, 0, 0, 0, 1}},
         2 * -4 * 0.25 * 3},
        {"lower triangular",
         {{1.5, 0, 0, 0, 0}, {8, 2, 0, 0, 0}, {-1, 3, -2, 0, 0}, {4, 4, 4, 0.5, 0}, {0, 0, 0, 0, 1}},
         1.5 * 2 * -2 * 0.5},
        {"swap red and green",
         {{0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}},
         -1},
        {"three-cycle", {{0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 1},
        {"scaled swap", {{0, 0, 0, 2, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {3, 0, 0, 0, 0}, {0, 0, 0, 0, 1}}, -6},
        {"equal rows", {{1, 2, 3, 4, 5}, {1, 2, 3, 4, 5}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 0},
        {"zero column", {{0, 2, 3, 4, 5}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 0},
        {"2x2 block", {{1, 2, 0, 0, 0}, {3, 4, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, -2},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        ColorMatrixFull m;
        std::memcpy(m.m, c.m, sizeof m.m);
        EXPECT_NEAR(m.Determinant(), c.det, 1e-12);
    }

    // det(A B) = det(A) det(B); det of Then is the product as well.
    Rng rng{5};
    for (int i = 0; i < 100; ++i) {
        const ColorMatrixFull a = RandomMatrix(rng), b = RandomMatrix(rng);
        ColorMatrixFull ab = a;
        ab.Then(b);
        const double want = a.Determinant() * b.Determinant();
        EXPECT_NEAR(ab.Determinant(), want, 1e-10 * (1 + std::fabs(want)));
        ColorMatrixFull scaled = a;
        scaled.Scale(2, -3.0);
        EXPECT_NEAR(scaled.Determinant(), -3.0 * a.Determinant(), 1e-10 * (1 + std::fabs(a.Determinant())));
    }
}

TEST(ColorMatrixInvert, InverseAndSingular) {
    Rng rng{9};
    for (int trial = 0; trial < 200; ++trial) {
        const ColorMatrixFull a = RandomMatrix(rng, 0.4);
        ColorMatrixFull inv = a;
        ASSERT_TRUE(inv.Invert()) << trial;
        Mat5 p;
        Multiply(a, inv, p);
        EXPECT_LT(MaxOffIdentity(p), 1e-10) << trial;
        Multiply(inv, a, p);
        EXPECT_LT(MaxOffIdentity(p), 1e-10) << trial;
        EXPECT_NEAR(inv.Determinant() * a.Determinant(), 1.0, 1e-10);
        ColorMatrixFull back = inv;
        ASSERT_TRUE(back.Invert());
        for (int i = 0; i < 5; ++i)
            for (int j = 0; j < 5; ++j) EXPECT_NEAR(back.m[i][j], a.m[i][j], 1e-10);
    }

    // A matrix that needs row swaps (zero on the diagonal).
    ColorMatrixFull perm;
    const double swapped[5][5] = {{0, 0, 2, 0, 1}, {1, 0, 0, 0, 0}, {0, 4, 0, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}};
    std::memcpy(perm.m, swapped, sizeof perm.m);
    ColorMatrixFull permInv = perm;
    ASSERT_TRUE(permInv.Invert());
    Mat5 p;
    Multiply(perm, permInv, p);
    EXPECT_LT(MaxOffIdentity(p), 1e-14);

    ColorMatrixFull id;
    ASSERT_TRUE(id.Invert());
    EXPECT_TRUE(id.IsIdentity());

    // Singular matrices are refused and left as they were.
    ColorMatrixFull flat;
    flat.Scale(1, 0.0); // green to nothing
    ColorMatrixFull dependent = RandomMatrix(rng);
    for (int j = 0; j < 5; ++j) dependent.m[2][j] = 2 * dependent.m[0][j] - dependent.m[1][j];
    ColorMatrixFull tiny;
    for (int c = 0; c < 4; ++c) tiny.Scale(c, 1e-4); // determinant 1e-16
    for (const ColorMatrixFull *s : {&flat, &dependent, &tiny}) {
        ColorMatrixFull m = *s;
        EXPECT_FALSE(m.Invert());
        EXPECT_EQ(std::memcmp(m.m, s->m, sizeof m.m), 0);
    }
    ColorMatrixFull tinyLoose = tiny;
    EXPECT_TRUE(tinyLoose.Invert(1e-20)); // a looser threshold accepts it
    EXPECT_NEAR(tinyLoose.m[0][0], 1e4, 1e-6);
}

TEST(ColorMatrixCut, KeepsAlpha) {
    ColorMatrixFull full;
    double n = 1.0;
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) full.m[i][j] = (n += 0.5) * (j % 2 ? -0.1 : 0.1);
    const ColorMatrix cut(full);
    const int pick[4] = {0, 1, 2, 4};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 4; ++j) EXPECT_EQ(cut.m[i][j], full.m[pick[i]][pick[j]]) << i << ", " << j;

    const FltPixel p{0.3f, -0.2f, 1.25f, 0.6f};
    const FltPixel out = cut.Apply(p);
    EXPECT_EQ(out.A, p.A); // alpha passes unchanged
    const double in[4] = {p.R, p.G, p.B, 1.0};
    const float got[3] = {out.R, out.G, out.B};
    for (int i = 0; i < 3; ++i) {
        double want = 0.0;
        for (int j = 0; j < 4; ++j) want += full.m[i][pick[j]] * in[j];
        EXPECT_NEAR(got[i], want, 1e-6) << i;
    }

    // With no alpha in the colour rows, the cut and the full matrix agree on colour.
    ColorMatrixFull noAlpha = full;
    for (int i = 0; i < 3; ++i) noAlpha.m[i][3] = 0.0;
    const FltPixel a = noAlpha.Apply(p), b = ColorMatrix(noAlpha).Apply(p);
    EXPECT_EQ(a.R, b.R);
    EXPECT_EQ(a.G, b.G);
    EXPECT_EQ(a.B, b.B);

    ColorMatrix id;
    EXPECT_EQ(id.Apply(p), p);
    ColorMatrix reset(full);
    reset.SetIdentity();
    EXPECT_EQ(reset.Apply(p), p);
}

// ---------------------------------------------------------------------------------------------------------------
// ApplyMatrixTagList

int Kind(int depth) { return (depth - 1) % 4; } // 0 int8, 1 int16, 2 half, 3 float

double Quantise(int depth, double v) {
    const double max = Kind(depth) == 0 ? 255.0 : 65535.0;
    switch (Kind(depth)) {
    case 0:
    case 1:
        if (!(v > 0)) return 0;
        if (v >= 1) return 1;
        return std::round(v * max) / max;
    case 2: {
        volatile float f = static_cast<float>(v);
        return static_cast<float>(static_cast<Test::CompilerHalf>(f));
    }
    default: return static_cast<float>(v);
    }
}

// The value read back after storing: each channel, or alpha in all four for masks.
void StoredPixel(int depth, const double in[4], double out[4]) {
    for (int c = 0; c < 4; ++c) out[c] = Quantise(depth, depth <= 4 ? in[3] : in[c]);
}

// Whether `got` is what storing the exact value `want` at `depth` may give: the
// host works in float, so a value within float error of a rounding boundary
// may land on either side.
bool StoredNear(int depth, double got, double want) {
    const double err = 1e-6 * (1 + std::fabs(want)); // float evaluation of the matrix
    switch (Kind(depth)) {
    case 0:
    case 1: {
        const double max = Kind(depth) == 0 ? 255.0 : 65535.0;
        const double lo = std::clamp(want - err, 0.0, 1.0), hi = std::clamp(want + err, 0.0, 1.0);
        const double code = std::round(got * max);
        return std::fabs(got * max - code) < 0.01 && code >= std::round(lo * max) && code <= std::round(hi * max);
    }
    case 2:
        return got == Quantise(depth, want - err) || got == Quantise(depth, want + err) || got == Quantise(depth, want);
    default: return std::fabs(got - want) <= err;
    }
}

// Writes pseudo-random pixels and returns what the depth holds of them (read
// back), the values the matrix is then applied to.
std::vector<FltPixel> FillSource(Image &img, unsigned seed) {
    Rng rng{seed};
    EXPECT_TRUE(img.AllocScanLineData());
    const ImgRectI dw = img.DataWindow();
    std::vector<FltPixel> read;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            img.PutFlt(x, y,
                       {static_cast<float>(rng.Next(-0.2, 1.3)), static_cast<float>(rng.Next(-0.2, 1.3)),
                        static_cast<float>(rng.Next(-0.2, 1.3)), static_cast<float>(rng.Next(0, 1))});
            read.push_back(img.GetFlt(x, y)); // what the depth holds
        }
    return read;
}

// Checks dst against the matrix applied in double to src's pixels (or its canvas).
void CheckApplied(const ColorMatrixFull &m, const ImgRectI &sw, const std::vector<FltPixel> &srcRead,
                  const FltPixel &srcCanvas, const Image &dst) {
    const ImgRectI dw = dst.DataWindow();
    int bad = 0;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const FltPixel s =
                sw.Contains(x, y) ? srcRead[static_cast<size_t>(y - sw.y0) * sw.Width() + (x - sw.x0)] : srcCanvas;
            const double in[4] = {s.R, s.G, s.B, s.A};
            double exact[4], want[4];
            ApplyD(m, in, exact);
            StoredPixel(dst.Depth(), exact, want);
            const FltPixel g = dst.GetFlt(x, y);
            const double got[4] = {g.R, g.G, g.B, g.A};
            for (int c = 0; c < 4; ++c) {
                const double e = dst.Depth() <= 4 ? exact[3] : exact[c];
                if (!StoredNear(dst.Depth(), got[c], e) && ++bad <= 5)
                    ADD_FAILURE() << "pixel " << x << ", " << y << " channel "
                                  << "RGBA"[c] << ": got " << got[c] << ", matrix gives " << e << " (stored " << want[c]
                                  << ")";
            }
        }
    EXPECT_EQ(bad, 0);
}

ColorMatrixFull TestMatrix() {
    ColorMatrixFull m;
    const double rows[4][5] = {{0.8, 0.3, -0.1, 0.05, 0.02},
                               {-0.2, 0.9, 0.25, 0.0, -0.03},
                               {0.1, -0.15, 1.1, 0.1, 0.05},
                               {0.05, 0.02, -0.04, 0.9, 0.01}};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) m.m[i][j] = rows[i][j];
    return m;
}

TEST(ApplyMatrix, EveryPairOfDepths) {
    const ColorMatrixFull m = TestMatrix();
    const ImgRectI sw(0, 0, 9, 7);
    const FltPixel canvas{0.3f, 0.1f, 0.7f, 0.5f};
    const ImgRectI dstWindows[] = {
        {0, 0, 9, 7},    // the source's window
        {-2, -1, 12, 9}, // larger than the source's data window: canvas through the matrix outside
        {3, 2, 6, 5},    // inside
        {5, -3, 14, 4},  // overlapping one corner
    };
    for (int sd = 1; sd <= 8; ++sd) {
        auto src = MakeRef<Image>(9, 7, sd);
        src->SetCanvasColor(canvas);
        const std::vector<FltPixel> read = FillSource(*src, 100 + sd);
        for (int dd = 1; dd <= 8; ++dd)
            for (const ImgRectI &dw : dstWindows) {
                SCOPED_TRACE(testing::Message() << "depth " << sd << " to " << dd << ", window " << dw.x0 << ", "
                                                << dw.y0 << ", " << dw.x1 << ", " << dw.y1);
                auto dst = MakeRef<Image>(9, 7, dd);
                dst->SetDataWindow(dw);
                ASSERT_TRUE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrixFull, &m}}));
                ASSERT_TRUE(dst->HasScanLineData());
                CheckApplied(m, sw, read, canvas, *dst);
                // The destination's canvas is the matrix of the source's canvas.
                const double in[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
                double want[4];
                ApplyD(m, in, want);
                const FltPixel dc = dst->GetCanvasColor();
                EXPECT_NEAR(dc.R, want[0], 1e-6);
                EXPECT_NEAR(dc.G, want[1], 1e-6);
                EXPECT_NEAR(dc.B, want[2], 1e-6);
                EXPECT_NEAR(dc.A, want[3], 1e-6);
                EXPECT_EQ(src->GetCanvasColor(), canvas); // the source is not touched
            }
    }
}

TEST(ApplyMatrix, InPlace) {
    Rng rng{77};
    const ColorMatrixFull m = RandomMatrix(rng, 0.3);
    const FltPixel canvas{0.2f, 0.2f, 0.9f, 1.0f};
    for (int depth = 1; depth <= 8; ++depth) {
        SCOPED_TRACE(depth);
        const ImgRectI dw(-1, -1, 10, 6);
        auto img = MakeRef<Image>(8, 5, depth);
        img->SetDataWindow(dw);
        img->SetCanvasColor(canvas);
        const std::vector<FltPixel> read = FillSource(*img, 200 + depth);
        ASSERT_TRUE(ApplyMatrixTagList(img.Get(), img.Get(), {{MtxColorMatrixFull, &m}}));
        CheckApplied(m, dw, read, canvas, *img);
        const FltPixel c = img->GetCanvasColor();
        const double in[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
        double want[4];
        ApplyD(m, in, want);
        EXPECT_NEAR(c.R, want[0], 1e-6);
        EXPECT_NEAR(c.A, want[3], 1e-6);
    }
}

TEST(ApplyMatrix, ThreadedAndUnthreadedAgreeBitForBit) {
    const int saved = WorkerCount();
    SetWorkerCount(4);
    Rng rng{3};
    const ColorMatrixFull m = RandomMatrix(rng, 0.5);
    for (int sd : {5, 7, 8})
        for (int dd : {1, 6, 7, 8}) {
            SCOPED_TRACE(testing::Message() << sd << " to " << dd);
            auto src = MakeRef<Image>(97, 131, sd);
            FillSource(*src, 300 + sd);
            const ImgRectI dw(-3, -5, 100, 135);
            auto one = MakeRef<Image>(97, 131, dd), many = MakeRef<Image>(97, 131, dd);
            one->SetDataWindow(dw);
            many->SetDataWindow(dw);
            ASSERT_TRUE(ApplyMatrixTagList(src.Get(), one.Get(), {{MtxColorMatrixFull, &m}, {WorkThreaded, 0}}));
            ASSERT_TRUE(ApplyMatrixTagList(src.Get(), many.Get(), {{MtxColorMatrixFull, &m}, {WorkThreaded, 1}}));
            for (int y = dw.y0; y < dw.y1; ++y)
                ASSERT_EQ(std::memcmp(one->ScanLine(y), many->ScanLine(y), one->RowBytes()), 0) << "row " << y;
            EXPECT_EQ(one->GetCanvasColor(), many->GetCanvasColor());
        }
    SetWorkerCount(saved);
}

TEST(ApplyMatrix, FourByFourLeavesAlpha) {
    ColorMatrix m4;
    const double rows[4][4] = {{0.5, 0.2, 0.1, 0.05}, {0.1, 0.7, -0.2, 0.1}, {-0.1, 0.3, 0.9, 0.0}, {0, 0, 0, 1}};
    std::memcpy(m4.m, rows, sizeof m4.m);
    // The full matrix the cut stands for: alpha row and column of the identity.
    ColorMatrixFull asFull;
    const int pick[4] = {0, 1, 2, 4};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 4; ++j) asFull.m[pick[i]][pick[j]] = rows[i][j];
    const FltPixel canvas{0.4f, 0.5f, 0.6f, 0.25f};
    for (int depth : {5, 6, 7, 8}) {
        SCOPED_TRACE(depth);
        auto src = MakeRef<Image>(6, 4, depth);
        src->SetCanvasColor(canvas);
        const std::vector<FltPixel> read = FillSource(*src, 400 + depth);
        auto dst = MakeRef<Image>(6, 4, depth);
        dst->SetDataWindow(ImgRectI(-1, 0, 7, 5));
        ASSERT_TRUE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrix, &m4}}));
        CheckApplied(asFull, src->DataWindow(), read, canvas, *dst);
        for (int y = 0; y < 4; ++y)
            for (int x = 0; x < 6; ++x) ASSERT_EQ(dst->GetFlt(x, y).A, src->GetFlt(x, y).A) << x << ", " << y;
        EXPECT_EQ(dst->GetCanvasColor().A, canvas.A);
        EXPECT_NEAR(dst->GetFlt(-1, 0).A, Quantise(depth, canvas.A), 2e-7);
    }
}

TEST(ApplyMatrix, RefusalsAndNoData) {
    auto src = MakeRef<Image>(4, 4, 8);
    FillSource(*src, 1);
    auto dst = MakeRef<Image>(4, 4, 8);
    const ColorMatrixFull m = TestMatrix();
    EXPECT_FALSE(ApplyMatrixTagList(src.Get(), dst.Get(), {}));
    EXPECT_FALSE(ApplyMatrixTagList(src.Get(), dst.Get(), {{WorkThreaded, 1}}));
    EXPECT_FALSE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrixFull, nullptr}}));
    EXPECT_FALSE(dst->HasScanLineData()); // nothing done
    EXPECT_TRUE(dst->IsCanvasColorClear());
    EXPECT_FALSE(ApplyMatrixTagList(nullptr, dst.Get(), {{MtxColorMatrixFull, &m}}));
    EXPECT_FALSE(ApplyMatrixTagList(src.Get(), nullptr, {{MtxColorMatrixFull, &m}}));

    // A destination without pixels gets only the canvas.
    src->SetCanvasColor(FltPixel{1, 1, 1, 1});
    auto noData = MakeRef<Image>(4, 4, 8);
    noData->SetNoData(true);
    ASSERT_TRUE(ApplyMatrixTagList(src.Get(), noData.Get(), {{MtxColorMatrixFull, &m}}));
    EXPECT_FALSE(noData->HasScanLineData());
    const double in[4] = {1, 1, 1, 1};
    double want[4];
    ApplyD(m, in, want);
    EXPECT_NEAR(noData->GetCanvasColor().R, want[0], 1e-6);
    EXPECT_NEAR(noData->GetCanvasColor().A, want[3], 1e-6);

    // An aborted render stops early but the call still succeeds.
    std::atomic<bool> abort{true};
    src->SetAbortFlag(&abort);
    auto late = MakeRef<Image>(4, 4, 8);
    EXPECT_TRUE(ApplyMatrixTagList(src.Get(), late.Get(), {{MtxColorMatrixFull, &m}}));
    src->SetAbortFlag(nullptr);
}

} // namespace
} // namespace Orvane::mtxtest
