// The barrel model against its formula rewritten in pixels about the centre, the squeeze as a scaling of the
// vertical radius, and the finite-difference inverse: round trips over frames and its stop rules.
#include <gtest/gtest.h>

#include <cmath>
#include <tuple>

#include "operators/warp/ModelPf.h"

namespace Orvane {
namespace {

struct Lens {
    const char *name;
    PfBarrelSettings s;
    int maxRounds; // the most rounds a round trip over the frame takes
} const Lenses[] = {{"barrel", {-0.1, 0, 0.5, 0.5, 1, 1920, 1080}, 4},
                    {"pincushion", {0.08, 0.02, 0.5, 0.5, 1, 1920, 1080}, 4},
                    {"strong", {-0.25, 0.05, 0.5, 0.5, 1, 1920, 1080}, 6},
                    {"off centre", {-0.12, 0.03, 0.45, 0.55, 1, 2048, 858}, 4},
                    {"squeeze 2", {-0.1, 0.01, 0.5, 0.5, 2, 1828, 1556}, 4},
                    {"squeeze 0.5", {0.05, -0.01, 0.52, 0.48, 0.5, 1000, 1000}, 4}};

// In pixels about the centre: the radius is taken with the vertical offset unsqueezed, in units of half the
// diagonal, and both offsets grow by the same factor t.
PfPoint Expected(const PfBarrelSettings &s, PfPoint p) {
    const double dx = p.x - s.centerX * s.width, dy = p.y - s.centerY * s.height;
    const double r2 = (dx * dx + dy * dy / (s.squeeze * s.squeeze)) / ((s.width * s.width + s.height * s.height) / 2.);
    const double t = s.lowOrder * r2 + s.highOrder * r2 * r2;
    return {p.x + t * dx, p.y + t * dy};
}

TEST(PfBarrel, DirectMapFollowsTheCentredFormulaAndInverseRoundTrips) {
    // By hand: 3 x 4 pixels, half diagonal 5 / sqrt(2); a point that far right of the centre (1.5, 2) has
    // r2 = 1, t = 0.1 + 0.05, and moves to 1.5 + 1.15 x 3.5355339 = 5.5658640.
    const PfPoint moved = PfBarrel({0.1, 0.05, 0.5, 0.5, 1, 3, 4}).Direct({1.5 + 5 / std::sqrt(2.0), 2});
    EXPECT_TRUE(std::abs(moved.x - 5.5658640) < 1e-7 && std::abs(moved.y - 2) < 1e-12) << moved.x << " " << moved.y;
    for (const Lens &lens : Lenses) {
        PfBarrelSettings flat = lens.s;
        flat.lowOrder = flat.highOrder = 0;
        const PfBarrel model(lens.s), identity(flat);
        const double tol = 1e-9 * lens.s.width;
        for (double fx : {-0.3, 0.0, 0.25, 0.5, 0.9, 1.4})
            for (double fy : {-0.2, 0.0, 0.33, 0.5, 1.0, 1.2}) {
                const PfPoint p{fx * lens.s.width, fy * lens.s.height};
                const PfPoint got = model.Direct(p), want = Expected(lens.s, p), same = identity.Direct(p);
                EXPECT_TRUE(std::hypot(got.x - want.x, got.y - want.y) < tol &&
                            std::hypot(same.x - p.x, same.y - p.y) < tol)
                    << lens.name << " " << fx << " " << fy;
            }
        // A point sq x d below the centre sees the radius of a point d beside it, so it moves sq times as far.
        const double sq = lens.s.squeeze, cx = lens.s.centerX * lens.s.width, cy = lens.s.centerY * lens.s.height;
        const PfPoint side = model.Direct({cx + 100, cy}), below = model.Direct({cx, cy + sq * 100});
        EXPECT_NEAR(below.y - cy - sq * 100, sq * (side.x - cx - 100), 1e-9) << lens.name;
        EXPECT_TRUE(std::abs(side.y - cy) < 1e-9 && std::abs(below.x - cx) < 1e-9) << lens.name;
        // The inverse, started at the target as a caller without a better guess would, round-trips the frame.
        int rounds = 0;
        for (int j = 0; j <= 10; ++j)
            for (int i = 0; i <= 10; ++i) {
                const PfPoint p{lens.s.width * i / 10.0, lens.s.height * j / 10.0}, q = model.Direct(p);
                const PfInverse inv = model.Inverse(q, q);
                EXPECT_LT(std::hypot(inv.p.x - p.x, inv.p.y - p.y), 0.002) << lens.name << " " << i << " " << j;
                rounds = std::max(rounds, inv.rounds);
            }
        EXPECT_LE(rounds, lens.maxRounds) << lens.name;
    }
}

TEST(PfBarrel, InverseStopRules) {
    const PfBarrel identity({0, 0, 0.5, 0.5, 1, 1920, 1080});
    const PfPoint q{700.25, 300.5};
    // At the identity each step lands on q; the walk stops after the first step shorter than 0.01 pixels.
    for (const auto &[dx, dy, rounds] : {std::tuple(0.0, 0.0, 1),
                                         {0.0099, 0.0, 1},
                                         {0.0101, 0.0, 2},
                                         {0.0, -0.0101, 2},
                                         {0.007, 0.007, 1},
                                         {0.0071, 0.0071, 2},
                                         {300.0, -200.0, 2}}) {
        const PfInverse inv = identity.Inverse(q, {q.x + dx, q.y + dy});
        EXPECT_TRUE(inv.rounds == rounds && std::hypot(inv.p.x - q.x, inv.p.y - q.y) < 1e-6) << dx << " " << dy;
    }
    // One short step near a corner of a strong lens: its gains are the lengths of the Jacobian's columns,
    // differentiated here from the centred formula.
    const PfBarrelSettings &s = Lenses[2].s;
    const PfPoint p{1900, 1070}, f = PfBarrel(s).Direct(p);
    const double d2 = (s.width * s.width + s.height * s.height) / 2.0, dx = p.x - 960, dy = p.y - 540;
    const double r2 = (dx * dx + dy * dy) / d2, t = s.lowOrder * r2 + s.highOrder * r2 * r2;
    const double tx = (s.lowOrder + 2 * s.highOrder * r2) * 2 * dx / d2, ty = tx * dy / dx;
    const PfInverse one = PfBarrel(s).Inverse({f.x + 0.004, f.y - 0.003}, p);
    EXPECT_EQ(one.rounds, 1);
    EXPECT_NEAR(one.p.x, p.x + 0.004 / std::hypot(1 + t + dx * tx, dy * tx), 1e-7);
    EXPECT_NEAR(one.p.y, p.y - 0.003 / std::hypot(dx * ty, 1 + t + dy * ty), 1e-7);
    // So far out that a step of 0.001 doesn't change the position: the gain is 0 and the start comes back.
    const PfInverse flat = identity.Inverse(q, {1e17, 5});
    EXPECT_TRUE(flat.rounds == 0 && flat.p.x == 1e17);
    // A zero squeeze gives no finite value; the walk still ends at its round limit.
    const PfInverse lost = PfBarrel({-0.1, 0, 0.5, 0.5, 0, 1920, 1080}).Inverse(q, q);
    EXPECT_TRUE(lost.rounds == PfBarrel::MaxRounds && !std::isfinite(lost.p.y));
}

} // namespace
} // namespace Orvane
