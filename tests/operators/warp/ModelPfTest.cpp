// The barrel model against its formula rewritten in pixels about the centre, the squeeze as a scaling of the
// vertical radius, and the finite-difference inverse: round trips over the frame and its stop rules.
#include <gtest/gtest.h>

#include <cmath>

#include "operators/warp/ModelPf.h"

namespace Orvane {
namespace {

struct Lens {
    const char *name;
    PfBarrelSettings s;
    int maxRounds; // the most rounds a round trip over the frame takes
};

const Lens Lenses[] = {
    {"barrel", {-0.1, 0, 0.5, 0.5, 1, 1920, 1080}, 4},
    {"pincushion", {0.08, 0.02, 0.5, 0.5, 1, 1920, 1080}, 4},
    {"strong", {-0.25, 0.05, 0.5, 0.5, 1, 1920, 1080}, 6},
    {"off centre", {-0.12, 0.03, 0.45, 0.55, 1, 2048, 858}, 4},
    {"squeeze 2", {-0.1, 0.01, 0.5, 0.5, 2, 1828, 1556}, 4},
    {"squeeze 0.5", {0.05, -0.01, 0.52, 0.48, 0.5, 1000, 1000}, 4},
};

// In pixels about the centre (x0, y0): the radius is measured with the vertical offset unsqueezed, in units of
// half the diagonal, and both offsets grow by the same factor t.
PfPoint Expected(const PfBarrelSettings &s, PfPoint p) {
    const double halfDiagonal = std::hypot(s.width, s.height) / std::sqrt(2.0);
    const double dx = p.x - s.centerX * s.width, dy = p.y - s.centerY * s.height;
    const double r2 = (dx * dx + dy * dy / (s.squeeze * s.squeeze)) / (halfDiagonal * halfDiagonal);
    const double t = s.lowOrder * r2 + s.highOrder * r2 * r2;
    return {p.x + t * dx, p.y + t * dy};
}

TEST(PfBarrel, DirectMapFollowsTheCentredFormulaAndZeroCoefficientsAreTheIdentity) {
    // By hand: 3 x 4 pixels, half diagonal 5 / sqrt(2); a point that far right of the centre (1.5, 2) has
    // r2 = 1, t = 0.1 + 0.05, and moves to 1.5 + 1.15 x 3.5355339 = 5.5658640.
    const PfBarrel small({0.1, 0.05, 0.5, 0.5, 1, 3, 4});
    const PfPoint moved = small.Direct({1.5 + 5 / std::sqrt(2.0), 2});
    EXPECT_NEAR(moved.x, 5.5658640, 1e-7);
    EXPECT_NEAR(moved.y, 2.0, 1e-12);

    for (const Lens &lens : Lenses) {
        PfBarrelSettings flat = lens.s;
        flat.lowOrder = flat.highOrder = 0;
        const PfBarrel model(lens.s), identity(flat);
        for (double fx : {-0.3, 0.0, 0.25, 0.5, 0.9, 1.4})
            for (double fy : {-0.2, 0.0, 0.33, 0.5, 1.0, 1.2}) {
                const PfPoint p{fx * lens.s.width, fy * lens.s.height};
                const PfPoint got = model.Direct(p), want = Expected(lens.s, p), same = identity.Direct(p);
                EXPECT_NEAR(got.x, want.x, 1e-9 * lens.s.width) << lens.name << " " << fx << " " << fy;
                EXPECT_NEAR(got.y, want.y, 1e-9 * lens.s.height) << lens.name << " " << fx << " " << fy;
                EXPECT_NEAR(same.x, p.x, 1e-9 * lens.s.width) << lens.name;
                EXPECT_NEAR(same.y, p.y, 1e-9 * lens.s.height) << lens.name;
            }
    }
}

TEST(PfBarrel, SqueezeStretchesTheVerticalRadius) {
    // A point sq x d below the centre sees the radius of a point d beside it, so it moves sq times as far.
    for (double sq : {0.5, 1.0, 1.33, 2.0}) {
        const PfBarrel model({-0.15, 0.04, 0.4, 0.6, sq, 1600, 900});
        const double cx = 640, cy = 540, d = 300;
        const PfPoint side = model.Direct({cx + d, cy}), below = model.Direct({cx, cy + sq * d});
        EXPECT_NEAR(side.y, cy, 1e-9) << sq;
        EXPECT_NEAR(below.x, cx, 1e-9) << sq;
        EXPECT_NEAR(below.y - (cy + sq * d), sq * (side.x - (cx + d)), 1e-9) << sq;
        EXPECT_LT(side.x, cx + d) << sq; // a negative low order pulls points in
    }
}

TEST(PfBarrel, InverseRoundTripsOverTheFrame) {
    for (const Lens &lens : Lenses) {
        const PfBarrel model(lens.s);
        int rounds = 0;
        for (int j = 0; j <= 10; ++j)
            for (int i = 0; i <= 10; ++i) {
                const PfPoint p{lens.s.width * i / 10.0, lens.s.height * j / 10.0};
                const PfPoint q = model.Direct(p);
                const PfInverse inv = model.Inverse(q, q);
                EXPECT_NEAR(inv.p.x, p.x, 0.002) << lens.name << " " << i << " " << j;
                EXPECT_NEAR(inv.p.y, p.y, 0.002) << lens.name << " " << i << " " << j;
                rounds = std::max(rounds, inv.rounds);
            }
        EXPECT_LE(rounds, lens.maxRounds) << lens.name;
    }
}

TEST(PfBarrel, InverseStopRules) {
    const PfBarrel identity({0, 0, 0.5, 0.5, 1, 1920, 1080});
    const PfPoint q{700.25, 300.5};
    // At the identity each step lands on q; the walk stops after the first step shorter than 0.01 pixels.
    const struct {
        double dx, dy;
        int rounds;
    } starts[] = {{0, 0, 1},         {0.0099, 0, 1},      {0.0101, 0, 2}, {0, -0.0101, 2},
                  {0.007, 0.007, 1}, {0.0071, 0.0071, 2}, {300, -200, 2}};
    for (const auto &c : starts) {
        const PfInverse inv = identity.Inverse(q, {q.x + c.dx, q.y + c.dy});
        EXPECT_EQ(inv.rounds, c.rounds) << c.dx << " " << c.dy;
        EXPECT_NEAR(inv.p.x, q.x, 1e-6);
        EXPECT_NEAR(inv.p.y, q.y, 1e-6);
    }
    // So far out that a step of 0.001 doesn't change the position: the gain is 0 and the start comes back.
    const PfInverse flat = identity.Inverse(q, {1e17, 5});
    EXPECT_EQ(flat.rounds, 0);
    EXPECT_EQ(flat.p.x, 1e17);
    // A zero squeeze gives no finite value; the walk still ends at its round limit.
    const PfBarrel broken({-0.1, 0, 0.5, 0.5, 0, 1920, 1080});
    const PfInverse lost = broken.Inverse(q, q);
    EXPECT_EQ(lost.rounds, PfBarrel::MaxRounds);
    EXPECT_FALSE(std::isfinite(lost.p.y));
}

} // namespace
} // namespace Orvane
