// Rectangles and domains: sizes, containment, intersection and union against pixel sets counted one by one,
// scaling that rounds outward, moving, endless sides that stay endless.
#include "host/image/Rect.h"

#include <set>
#include <tuple>

#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::recttest {
namespace {
using Test::RectText;

// The pixels of a rectangle, counted one by one.
std::set<std::pair<int, int>> PixelsOf(const ImgRectI &r) {
    std::set<std::pair<int, int>> s;
    for (int y = r.y0; y < r.y1; ++y)
        for (int x = r.x0; x < r.x1; ++x) s.insert({x, y});
    return s;
}

// A small deterministic generator for rectangles in [-6, 6], null ones included.
struct Lcg {
    uint32_t state;
    int Next(int lo, int hi) {
        state = state * 1664525u + 1013904223u;
        return lo + static_cast<int>((state >> 8) % static_cast<uint32_t>(hi - lo + 1));
    }
    ImgRectI Rect() { return ImgRectI(Next(-6, 6), Next(-6, 6), Next(-6, 6), Next(-6, 6)); }
};

constexpr int E = DomainEndless;

TEST(RectBasics, SizeNullNormaliseContainsIntersectionAndUnion) {
    const std::tuple<ImgRectI, int, int, ImgRectI> cases[] = {
        {{0, 0, 4, 3}, 4, 3, {0, 0, 4, 3}},        {{-2, -5, 1, -1}, 3, 4, {-2, -5, 1, -1}},
        {{2, 2, 2, 5}, 0, 3, {2, 2, 2, 5}},        {{2, 2, 5, 2}, 3, 0, {2, 2, 5, 2}},
        {{5, 0, 2, 3}, -3, 3, {2, 0, 5, 3}},       {{}, 0, 0, {}},
        {{5, 7, 1, 2}, -4, -5, {1, 2, 5, 7}},      {{1, 7, 5, 2}, 4, -5, {1, 2, 5, 7}},
        {{-3, 4, -3, -4}, 0, -8, {-3, -4, -3, 4}},
    };
    for (const auto &[in, w, h, normalised] : cases) {
        ImgRectI r = in;
        r.Normalise();
        EXPECT_TRUE(r == normalised && in.Width() == w && in.Height() == h) << RectText(in);
        EXPECT_EQ(in.IsNull(), PixelsOf(in).empty()) << RectText(in);
    }
    ImgRectI r(1, 2, 3, 4);
    r.SetNull();
    EXPECT_EQ(r, ImgRectI());
    // Half open: the far sides are outside; a null rectangle lies in everything and holds nothing.
    const ImgRectI box(-2, -1, 3, 2);
    for (int y = -2; y <= 2; ++y)
        for (int x = -3; x <= 3; ++x)
            EXPECT_EQ(box.Contains(x, y), x >= -2 && x < 3 && y >= -1 && y < 2) << x << "," << y;
    EXPECT_TRUE(box.Contains(box) && box.Contains(ImgRectI(-1, 0, 3, 2)) && box.Contains(ImgRectI(50, 50, 40, 60)));
    EXPECT_FALSE(box.Contains(ImgRectI(-1, 0, 4, 2)) || box.Contains(ImgRectI(-3, -1, 0, 0)));
    EXPECT_TRUE(ImgRectI().Contains(ImgRectI()) && !ImgRectI().Contains(ImgRectI(0, 0, 1, 1)));
    EXPECT_FALSE(ImgRectI().Contains(0, 0));
    Lcg rng{7};
    for (int i = 0; i < 4000; ++i) {
        const ImgRectI a = rng.Rect(), b = rng.Rect();
        SCOPED_TRACE(RectText(a) + " and " + RectText(b));
        const auto pa = PixelsOf(a), pb = PixelsOf(b);

        // Intersection: exactly the shared pixels; a null result is the zero rectangle.
        const ImgRectI i1 = a & b;
        std::set<std::pair<int, int>> shared;
        for (const auto &p : pa)
            if (pb.count(p)) shared.insert(p);
        ImgRectI i2 = a, u2 = a;
        i2 &= b, u2 |= b;
        ASSERT_EQ(PixelsOf(i1), shared);
        ASSERT_TRUE(!shared.empty() || i1 == ImgRectI());
        ASSERT_TRUE((b & a) == i1 && i2 == i1);

        // Union: the smallest rectangle holding both.
        const ImgRectI u = a | b;
        ASSERT_EQ(u2, u);
        if (pa.empty() && pb.empty()) {
            ASSERT_TRUE(u.IsNull());
            continue;
        }
        ASSERT_TRUE(u.Contains(a) && u.Contains(b));
        int minX = 1000, minY = 1000, maxX = -1000, maxY = -1000;
        for (const auto *s : {&pa, &pb})
            for (const auto &[x, y] : *s) {
                minX = std::min(minX, x), minY = std::min(minY, y);
                maxX = std::max(maxX, x), maxY = std::max(maxY, y);
            }
        ASSERT_EQ(u, ImgRectI(minX, minY, maxX + 1, maxY + 1));
    }
}

TEST(RectMove, ScaleOffsetGrowAndDomainOperationsKeepEndlessSides) {
    const std::tuple<ImgRectI, double, double, ImgRectI> cases[] = {
        {{-3, -3, 3, 3}, 0.5, 0.5, {-2, -2, 2, 2}},
        {{3, -5, 7, 9}, 2.0, 3.0, {6, -15, 14, 27}},
        {{0, 0, 1921, 1081}, 0.5, 0.5, {0, 0, 961, 541}},
        {{-E, 3, E, 9}, 0.5, 0.5, {-E, 1, E, 5}},
        {{5, -E, 11, E}, 2.0, 0.1, {10, -E, 22, E}},
        {{-2 * E, 0, 3, 2 * E}, 0.5, 0.5, {-2 * E, 0, 2, 2 * E}},
        {{1, 1, 999999, 999999}, 0.5, 0.5, {0, 0, 500000, 500000}},
    };
    for (const auto &[in, sx, sy, out] : cases) {
        ImgRectI r = in;
        r.Scale(sx, sy);
        ImageDomain d(in);
        d.Scale(sx, sy);
        EXPECT_TRUE(r == out && d.rect == out) << RectText(in) << " x " << sx << ", " << sy;
    }
    // Any finite rectangle: the scaled one holds the exact scaled edges, and no
    // side lies a whole pixel beyond them.
    Lcg rng{11};
    for (int i = 0; i < 3000; ++i) {
        ImgRectI in = rng.Rect();
        in.Normalise();
        const double sx = rng.Next(1, 40) / 8.0, sy = rng.Next(1, 40) / 7.0;
        ImgRectI r = in;
        r.Scale(sx, sy);
        ASSERT_TRUE(r.x0 <= in.x0 * sx && r.x0 > in.x0 * sx - 1 && r.y0 <= in.y0 * sy && r.y0 > in.y0 * sy - 1 &&
                    r.x1 >= in.x1 * sx && r.x1 < in.x1 * sx + 1 && r.y1 >= in.y1 * sy && r.y1 < in.y1 * sy + 1)
            << RectText(in) << " x " << sx << ", " << sy << " gave " << RectText(r);
    }
    const std::tuple<ImgRectI, int, int, ImgRectI> moves[] = {
        {{0, 0, 4, 3}, 5, -2, {5, -2, 9, 1}},
        {{-E, 2, 7, E}, 10, 10, {-E, 12, 17, E}},
        {{-E, -E, E, E}, 123, -456, {-E, -E, E, E}},
        {{1, -2 * E, 2 * E, 4}, -1, 1, {0, -2 * E, 2 * E, 5}},
    };
    for (const auto &[in, dx, dy, out] : moves) {
        ImgRectI moved = in;
        moved.Offset(dx, dy);
        ImageDomain movedDomain(in);
        movedDomain.Offset(dx, dy);
        EXPECT_TRUE(moved == out && movedDomain.rect == out) << RectText(in);
    }
    EXPECT_EQ(ImgRectI(0, 0, 4, 3).Grown(2, 1), ImgRectI(-2, -1, 6, 4));
    EXPECT_TRUE(ImgRectI(0, 0, 4, 3).Grown(-2, 0).IsNull());
    // Domains.
    const ImageDomain endless = ImageDomain::Endless(), frame(ImgRectI(0, 0, 640, 480));
    EXPECT_EQ(endless.rect, ImgRectI(-E, -E, E, E));
    for (int v : {E, -E, E + 5}) EXPECT_TRUE(IsEndlessSide(v)) << v;
    for (int v : {E - 1, -E + 1}) EXPECT_FALSE(IsEndlessSide(v)) << v;
    EXPECT_TRUE((endless & frame) == frame && (endless | frame) == endless && (frame | ImageDomain()) == frame);
    EXPECT_TRUE((frame & ImageDomain(ImgRectI(700, 0, 800, 10))).IsNull());
    ImageDomain movedDomain = endless;
    movedDomain &= ImageDomain(ImgRectI(-10, -E, 10, E));
    movedDomain.Scale(2.0, 2.0); // the endless sides stay, the finite ones scale
    movedDomain.Offset(5, 5);
    EXPECT_EQ(movedDomain.rect, ImgRectI(-15, -E, 25, E));
    movedDomain.ClipTo(ImgRectI(0, 0, 100, 50));
    EXPECT_EQ(movedDomain.rect, ImgRectI(0, 0, 25, 50));
    movedDomain.ClipTo(ImgRectI(30, 0, 40, 10));
    EXPECT_EQ(movedDomain, ImageDomain());
}

} // namespace
} // namespace Orvane::recttest
