// Colour matrices against arithmetic written out here in double; ApplyMatrixTagList over every pair of depths,
// windows and canvases, in place, on threads or not.
#include "host/image/ColorMatrix.h"

#include "host/core/Parallel.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::mtxtest {
namespace {
using namespace ::Orvane::Test;

using Mat5 = double[5][5];
using D4 = std::array<double, 4>;

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
D4 ApplyD(const ColorMatrixFull &m, const D4 &in) {
    D4 out{};
    for (int i = 0; i < 4; ++i)
        out[i] = m.m[i][4] + m.m[i][0] * in[0] + m.m[i][1] * in[1] + m.m[i][2] * in[2] + m.m[i][3] * in[3];
    return out;
}
D4 ApplyD(const ColorMatrixFull &m, const FltPixel &p) { return ApplyD(m, D4{p.R, p.G, p.B, p.A}); }

double MaxOffIdentity(const ColorMatrixFull &a, const ColorMatrixFull &b) { // of a x b
    double worst = 0.0;
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) {
            double v = 0.0;
            for (int k = 0; k < 5; ++k) v += a.m[i][k] * b.m[k][j];
            worst = std::max(worst, std::fabs(v - (i == j ? 1.0 : 0.0)));
        }
    return worst;
}

ColorMatrixFull FromRows(const Mat5 rows) {
    ColorMatrixFull m;
    std::memcpy(m.m, rows, sizeof m.m);
    return m;
}

TEST(ColorMatrixFull, ComposesInStepOrderDeterminantsInversesAndTheCut) {
    Rng rng{1};
    for (int trial = 0; trial < 200; ++trial) {
        const ColorMatrixFull a = RandomMatrix(rng), b = RandomMatrix(rng), c = RandomMatrix(rng);
        const int ch = trial % 4;
        const double s = rng.Next(-3, 3), o = rng.Next(-2, 2);
        ColorMatrixFull composed = a;
        composed.Then(b).Scale(ch, s).Offset((ch + 1) % 4, o).Then(c);
        const FltPixel p{float(rng.Next(-0.5, 1.5)), float(rng.Next(-0.5, 1.5)), float(rng.Next(-0.5, 1.5)),
                         float(rng.Next(0, 1))};
        // Step by step: a, then b, then the scale, then the offset, then c.
        D4 step = ApplyD(b, ApplyD(a, p));
        step[ch] *= s;
        step[(ch + 1) % 4] += o;
        const D4 want = ApplyD(c, step), got = ApplyD(composed, p);
        const FltPixel out = composed.Apply(p);
        for (int i = 0; i < 4; ++i) {
            ASSERT_NEAR(got[i], want[i], 1e-9 * (1 + std::fabs(want[i]))) << trial;
            ASSERT_NEAR(Channel(out, i), want[i], 1e-6 * (1 + std::fabs(want[i]))) << trial;
        }
        for (int j = 0; j < 5; ++j) ASSERT_EQ(composed.m[4][j], j == 4 ? 1.0 : 0.0); // still affine
    }
    ColorMatrixFull id;
    EXPECT_TRUE(id.IsIdentity() && !id.Scale(0, 2.0).IsIdentity());
    id.SetIdentity();
    EXPECT_EQ(id.Apply({0.25f, -1.0f, 3.0f, 0.5f}), (FltPixel{0.25f, -1.0f, 3.0f, 0.5f}));
    // Diagonal, triangular, a swap, a three-cycle, a scaled swap, equal rows, a zero column, a 2 x 2 block.
    const struct {
        Mat5 m;
        double det;
    } cases[] = {
        {{{2, 0, 0, 0, 0}, {0, 3, 0, 0, 0}, {0, 0, 0.5, 0, 0}, {0, 0, 0, -1, 0}, {0, 0, 0, 0, 1}}, -3.0},
        {{{2, 7, -3, 1, 0.5}, {0, -4, 2, 9, 1}, {0, 0, 0.25, 5, -2}, {0, 0, 0, 3, 4}, {0, 0, 0, 0, 1}},
         2 * -4 * 0.25 * 3},
        {{{0, 1, 0, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, -1},
        {{{0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {1, 0, 0, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 1},
        {{{0, 0, 0, 2, 0}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {3, 0, 0, 0, 0}, {0, 0, 0, 0, 1}}, -6},
        {{{1, 2, 3, 4, 5}, {1, 2, 3, 4, 5}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 0},
        {{{0, 2, 3, 4, 5}, {0, 1, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, 0},
        {{{1, 2, 0, 0, 0}, {3, 4, 0, 0, 0}, {0, 0, 1, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}}, -2},
    };
    for (const auto &c : cases) EXPECT_NEAR(FromRows(c.m).Determinant(), c.det, 1e-12) << &c - cases;
    // det(A B) = det(A) det(B), through Then and Scale.
    rng = Rng{5};
    for (int i = 0; i < 100; ++i) {
        const ColorMatrixFull a = RandomMatrix(rng), b = RandomMatrix(rng);
        ColorMatrixFull ab = a, scaled = a;
        ab.Then(b);
        scaled.Scale(2, -3.0);
        EXPECT_NEAR(ab.Determinant(), a.Determinant() * b.Determinant(), 1e-10 * (1 + std::fabs(ab.Determinant())));
        EXPECT_NEAR(scaled.Determinant(), -3.0 * a.Determinant(), 1e-10 * (1 + std::fabs(a.Determinant())));
    }
    // Inverses, and singular matrices refused.
    rng = Rng{9};
    for (int trial = 0; trial < 200; ++trial) {
        const ColorMatrixFull a = RandomMatrix(rng, 0.4);
        ColorMatrixFull inv = a;
        ASSERT_TRUE(inv.Invert()) << trial;
        EXPECT_TRUE(MaxOffIdentity(a, inv) < 1e-10 && MaxOffIdentity(inv, a) < 1e-10) << trial;
    }
    // A matrix that needs row swaps (zero on the diagonal).
    const Mat5 swapped = {{0, 0, 2, 0, 1}, {1, 0, 0, 0, 0}, {0, 4, 0, 0, 0}, {0, 0, 0, 1, 0}, {0, 0, 0, 0, 1}};
    ColorMatrixFull perm = FromRows(swapped), permInv = perm;
    ASSERT_TRUE(permInv.Invert());
    EXPECT_LT(MaxOffIdentity(perm, permInv), 1e-14);
    // Singular matrices are refused and left as they were.
    ColorMatrixFull flat, dependent = RandomMatrix(rng), tiny;
    flat.Scale(1, 0.0); // green to nothing
    for (int j = 0; j < 5; ++j) dependent.m[2][j] = 2 * dependent.m[0][j] - dependent.m[1][j];
    for (int c = 0; c < 4; ++c) tiny.Scale(c, 1e-4); // determinant 1e-16
    for (const ColorMatrixFull *s : {&flat, &dependent, &tiny}) {
        ColorMatrixFull m = *s;
        EXPECT_FALSE(m.Invert());
        EXPECT_EQ(std::memcmp(m.m, s->m, sizeof m.m), 0);
    }
    EXPECT_TRUE(tiny.Invert(1e-20)); // a looser threshold accepts it
    EXPECT_NEAR(tiny.m[0][0], 1e4, 1e-6);
    // The 4 x 4 cut: colour as the full matrix without its alpha column, alpha unchanged.
    rng = Rng{4};
    const ColorMatrixFull full = RandomMatrix(rng);
    const ColorMatrix cut(full);
    ColorMatrixFull noAlpha = full;
    for (int i = 0; i < 4; ++i) noAlpha.m[i][3] = 0.0;
    const FltPixel p{0.3f, -0.2f, 1.25f, 0.6f}, out = cut.Apply(p);
    const D4 want = ApplyD(noAlpha, p);
    for (int i = 0; i < 3; ++i) EXPECT_NEAR(Channel(out, i), want[i], 1e-6) << i;
    EXPECT_TRUE(out.A == p.A && ColorMatrix().Apply(p) == p);
}

// Checks dst and its canvas against the matrix applied in double to what src holds. The host works in float:
// a value within float error of a rounding boundary of dst's depth may land on either side.
void CheckApplied(const ColorMatrixFull &m, const Image &src, const Image &dst) {
    const ImgRectI dw = dst.DataWindow();
    int bad = 0;
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) {
            const D4 exact = ApplyD(m, src.GetFlt(x, y));
            for (int c = 0; c < 4; ++c) {
                const double want = exact[dst.IsMask() ? 3 : c], got = Channel(dst.GetFlt(x, y), c);
                const double err = 1e-6 * (1 + std::fabs(want)); // float evaluation of the matrix
                bool near = Kind(dst.Depth()) == 3 && std::fabs(got - want) <= err;
                for (double v : {want - err, want, want + err})
                    near |= Kind(dst.Depth()) < 3 && std::fabs(got - StoredValue(dst.Depth(), v)) <= 1e-7;
                if (!near && ++bad <= 5)
                    ADD_FAILURE() << "pixel " << x << ", " << y << " channel " << c << ": got " << got
                                  << ", matrix gives " << want;
            }
        }
    EXPECT_EQ(bad, 0);
    const D4 canvas = ApplyD(m, src.GetCanvasColor());
    for (int c = 0; c < 4; ++c) EXPECT_NEAR(Channel(dst.GetCanvasColor(), c), canvas[c], 1e-6) << c;
}

ColorMatrixFull TestMatrix() {
    const Mat5 rows = {{0.8, 0.3, -0.1, 0.05, 0.02},
                       {-0.2, 0.9, 0.25, 0.0, -0.03},
                       {0.1, -0.15, 1.1, 0.1, 0.05},
                       {0.05, 0.02, -0.04, 0.9, 0.01},
                       {0, 0, 0, 0, 1}};
    return FromRows(rows);
}

TEST(ApplyMatrix, EveryPairOfDepthsAndInPlace) {
    const ColorMatrixFull m = TestMatrix();
    const ImgRectI sw(0, 0, 9, 7), wide(-1, -1, 10, 6);
    const FltPixel canvas{0.3f, 0.1f, 0.7f, 0.5f};
    // The source's window, one larger (canvas through the matrix outside), one inside, one over a corner.
    const ImgRectI dstWindows[] = {{0, 0, 9, 7}, {-2, -1, 12, 9}, {3, 2, 6, 5}, {5, -3, 14, 4}};
    for (int sd = 1; sd <= 8; ++sd) {
        Ref<Image> src = PatternAt(9, 7, sd, 100 + sd, &sw, canvas);
        for (int dd = 1; dd <= 8; ++dd)
            for (const ImgRectI &dw : dstWindows) {
                SCOPED_TRACE(testing::Message() << "depth " << sd << " to " << dd << ", window " << RectText(dw));
                Ref<Image> dst = Blank(9, 7, dd, &dw);
                ASSERT_TRUE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrixFull, &m}}));
                CheckApplied(m, *src, *dst);
            }
        EXPECT_EQ(src->GetCanvasColor(), canvas); // the source is not touched
        // In place, over a window reaching past the frame.
        Ref<Image> img = PatternAt(8, 5, sd, 200 + sd, &wide, {0.2f, 0.2f, 0.9f, 1.0f}),
                   before = CopyOfImage(img.Get());
        ASSERT_TRUE(ApplyMatrixTagList(img.Get(), img.Get(), {{MtxColorMatrixFull, &m}}));
        CheckApplied(m, *before, *img);
    }
    // The 4 x 4 cut stands for the full matrix with the identity's alpha row and column.
    ColorMatrixFull asFull = m;
    for (int i = 0; i < 5; ++i) asFull.m[3][i] = asFull.m[i][3] = i == 3 ? 1.0 : 0.0;
    const ColorMatrix m4(asFull);
    for (int depth : {5, 6, 7, 8}) {
        Ref<Image> src = PatternAt(6, 4, depth, 400 + depth, nullptr, {0.4f, 0.5f, 0.6f, 0.25f});
        const ImgRectI dw(-1, 0, 7, 5);
        Ref<Image> dst = Blank(6, 4, depth, &dw);
        ASSERT_TRUE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrix, &m4}}));
        CheckApplied(asFull, *src, *dst);
    }
}

TEST(ApplyMatrix, ThreadedAndUnthreadedAgreeBitForBitRefusalsNoDataAndAbort) {
    const int saved = WorkerCount();
    SetWorkerCount(4);
    Rng rng{3};
    const ColorMatrixFull m = RandomMatrix(rng, 0.5);
    const ImgRectI dw(-3, -5, 100, 135);
    for (int sd : {5, 7, 8})
        for (int dd : {1, 6, 7, 8}) {
            Ref<Image> src = PatternAt(97, 131, sd, 300 + sd), one = Blank(97, 131, dd, &dw),
                       many = Blank(97, 131, dd, &dw);
            ASSERT_TRUE(ApplyMatrixTagList(src.Get(), one.Get(), {{MtxColorMatrixFull, &m}, {WorkThreaded, 0}}));
            ASSERT_TRUE(ApplyMatrixTagList(src.Get(), many.Get(), {{MtxColorMatrixFull, &m}, {WorkThreaded, 1}}));
            EXPECT_TRUE(SameBits(*one, *many) && one->GetCanvasColor() == many->GetCanvasColor()) << sd << " to " << dd;
        }
    SetWorkerCount(saved);
    // Refusals leave the destination alone; no data: the canvas only; an abort stops early.
    Ref<Image> src = PatternAt(4, 4, 8), dst = Blank(4, 4, 8);
    for (const TagList &t : {TagList{}, TagList{{WorkThreaded, 1}}, TagList{{MtxColorMatrixFull, nullptr}}})
        EXPECT_FALSE(ApplyMatrixTagList(src.Get(), dst.Get(), t));
    EXPECT_TRUE(!dst->HasScanLineData() && dst->IsCanvasColorClear()); // nothing done
    EXPECT_FALSE(ApplyMatrixTagList(nullptr, dst.Get(), {{MtxColorMatrixFull, &m}}) ||
                 ApplyMatrixTagList(src.Get(), nullptr, {{MtxColorMatrixFull, &m}}));
    // A destination without pixels gets only the canvas.
    src->SetCanvasColor(FltPixel{1, 1, 1, 1});
    Ref<Image> noData = Blank(4, 4, 8);
    noData->SetNoData(true);
    ASSERT_TRUE(ApplyMatrixTagList(src.Get(), noData.Get(), {{MtxColorMatrixFull, &m}}) && !noData->HasScanLineData());
    EXPECT_NEAR(noData->GetCanvasColor().R, ApplyD(m, FltPixel{1, 1, 1, 1})[0], 1e-6);
    // An aborted render stops early but the call still succeeds.
    std::atomic<bool> abort{true};
    src->SetAbortFlag(&abort);
    EXPECT_TRUE(ApplyMatrixTagList(src.Get(), dst.Get(), {{MtxColorMatrixFull, &m}}));
    src->SetAbortFlag(nullptr);
}

} // namespace
} // namespace Orvane::mtxtest
