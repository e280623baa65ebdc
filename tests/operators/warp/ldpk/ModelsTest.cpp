// The six lens models: the round trip distort(undistort(p)) over whole frames at realistic coefficients on
// 4:3, 16:9 and 2:1 anamorphic filmbacks with the lens centre off the middle, each model's Jacobian against
// differences of undistort, zero parameters, the fisheye radius cut, the start table, the parameter lists,
// the error texts and the model IDs.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <thread>
#include <vector>

#include "operators/warp/ldpk/Models.h"

namespace Orvane::ldpk {
namespace {

struct Filmback {
    const char *name;
    double focal_cm, width_cm, height_cm, offset_x_cm, offset_y_cm, pixel_aspect;
};

constexpr Filmback filmbacks[] = {{"4:3", 3.5, 3.6, 2.7, 0.03, -0.02, 1.0},
                                  {"16:9", 2.4, 2.4892, 1.4002, -0.05, 0.04, 1.0},
                                  {"2:1 anamorphic", 5.0, 2.2, 1.86, 0.02, 0.01, 2.0}};

void set_camera(ldp_builtin &m, const Filmback &fb) {
    const double v[7] = {fb.focal_cm,    fb.width_cm,     fb.height_cm, fb.offset_x_cm,
                         fb.offset_y_cm, fb.pixel_aspect, 120.0};
    for (int i = 0; i < ldp_builtin::n_builtin; ++i)
        ASSERT_TRUE(m.setParameterValue(ldp_builtin::builtin_names[i], v[i]));
}

struct Setting {
    const char *name;
    double value;
};

// Realistic coefficients for each model, in factory order.
const std::vector<std::vector<Setting>> model_settings = {
    {{"Cx02 - Degree 2", -0.05},
     {"Cy02 - Degree 2", -0.04},
     {"Cx22 - Degree 2", 0.01},
     {"Cy22 - Degree 2", 0.008},
     {"Cx04 - Degree 4", 0.01},
     {"Cy04 - Degree 4", 0.012},
     {"Cx24 - Degree 4", -0.003},
     {"Cy44 - Degree 4", 0.002},
     {"Lens Rotation", 0.7},
     {"Squeeze-X", 1.02},
     {"Squeeze-Y", 0.98}},
    {{"Cx02 - Degree 2", -0.05},
     {"Cy02 - Degree 2", -0.045},
     {"Cx22 - Degree 2", 0.012},
     {"Cy04 - Degree 4", 0.01},
     {"Cx04 - Degree 4", 0.011},
     {"Cx06 - Degree 6", -0.002},
     {"Cy26 - Degree 6", 0.001},
     {"Cx66 - Degree 6", 0.0005}},
    {{"Distortion", -0.05},
     {"Anamorphic Squeeze", 1.1},
     {"Curvature X", 0.01},
     {"Curvature Y", -0.01},
     {"Quartic Distortion", 0.01}},
    {{"Distortion - Degree 2", -0.05},
     {"U - Degree 2", 0.002},
     {"V - Degree 2", -0.003},
     {"Quartic Distortion - Degree 4", 0.01},
     {"U - Degree 4", 0.001},
     {"V - Degree 4", -0.001},
     {"Phi - Cylindric Direction", 30.0},
     {"B - Cylindric Bending", 0.02}},
    {{"Distortion - Degree 2", -0.05},
     {"Quartic Distortion - Degree 4", 0.01},
     {"Degree 6", -0.002},
     {"Degree 8", 0.0005}},
    {{"Distortion - Degree 2", -0.05},
     {"Quartic Distortion - Degree 4", 0.01},
     {"Degree 6", -0.002},
     {"Degree 8", 0.0005}},
};

std::vector<std::unique_ptr<ldp_builtin>> configured(const Filmback &fb, bool with_coefficients) {
    auto models = make_models();
    for (size_t m = 0; m < models.size(); ++m) {
        set_camera(*models[m], fb);
        if (with_coefficients) {
            for (const Setting &s : model_settings[m]) EXPECT_TRUE(models[m]->setParameterValue(s.name, s.value));
        }
        models[m]->initializeParameters();
    }
    return models;
}

TEST(LdpkModels, RoundTripOverWholeFramesWithNewtonFromTheStartTable) {
    constexpr int n = 41;
    for (const Filmback &fb : filmbacks)
        for (auto &model : configured(fb, true)) {
            SCOPED_TRACE(std::string(fb.name) + ", " + model->getModelName());
            model->distortion().reset_counters();
            double worst = 0, worst_residual = 0, worst_jacobian = 0;
            for (int j = 0; j < n; ++j)
                for (int i = 0; i < n; ++i) {
                    const double x = i / double(n - 1), y = j / double(n - 1);
                    double ux, uy, bx, by, rx, ry;
                    ASSERT_TRUE(model->undistort(x, y, ux, uy));
                    EXPECT_TRUE(model->distort(ux, uy, bx, by)) << x << " " << y;
                    worst = std::max(worst, std::hypot(bx - x, by - y));
                    // The other way round: distort's answer undistorts to the point asked.
                    ASSERT_TRUE(model->distort(x, y, rx, ry));
                    model->undistort(rx, ry, ux, uy);
                    worst_residual = std::max(worst_residual, std::hypot(ux - x, uy - y));
                    if (i % 8 == 0 && j % 8 == 0) {
                        double m[4], h = 1e-6, xp, yp, xm, ym, xq, yq, xn, yn;
                        EXPECT_TRUE(model->getJacobianMatrix(x, y, m[0], m[1], m[2], m[3]));
                        model->undistort(x + h, y, xp, yp);
                        model->undistort(x - h, y, xm, ym);
                        model->undistort(x, y + h, xq, yq);
                        model->undistort(x, y - h, xn, yn);
                        const double fd[4] = {(xp - xm) / (2 * h), (xq - xn) / (2 * h), (yp - ym) / (2 * h),
                                              (yq - yn) / (2 * h)};
                        for (int k = 0; k < 4; ++k) worst_jacobian = std::max(worst_jacobian, std::abs(m[k] - fd[k]));
                    }
                }
            // A row at once (undistort_span, each model's own chain) gives what one point at a time gives.
            std::vector<vec2d> row(n), mapped(n);
            for (int i = 0; i < n; ++i) row[i] = {i / double(n - 1), 0.3};
            model->undistort_span(row.data(), mapped.data(), n);
            for (int i = 0; i < n; ++i) {
                double ux, uy;
                model->undistort(row[i].x, row[i].y, ux, uy);
                ASSERT_EQ(mapped[i].x, ux) << i;
                ASSERT_EQ(mapped[i].y, uy) << i;
            }
            const int rounds = model->distortion().largest_iterations();
            std::printf("[ldpk] %-44s %-15s round trip %.1e, residual %.1e, Newton rounds at most %d\n",
                        model->getModelName(), fb.name, worst, worst_residual, rounds);
            EXPECT_LT(worst, 1e-6);
            EXPECT_LT(worst_residual, 1e-6);
            EXPECT_LT(worst_jacobian, 1e-7);
            EXPECT_LE(rounds, 6); // the table's start is close: a handful of rounds, far from the limit of 20
        }
}

TEST(LdpkModels, ZeroParametersAreTheIdentityAndFisheyeModelsRunTheirPair) {
    for (const Filmback &fb : filmbacks)
        for (auto &model : configured(fb, false)) {
            SCOPED_TRACE(std::string(fb.name) + ", " + model->getModelName());
            const bool fisheye = std::string(model->getModelName()).find("Fisheye") != std::string::npos;
            for (double y : {0.0, 0.3, 0.5, 0.77, 1.0})
                for (double x : {0.0, 0.12, 0.5, 0.9, 1.0}) {
                    double ux, uy, bx, by;
                    model->undistort(x, y, ux, uy);
                    if (fisheye) {
                        // The equisolid radius 2 f sin(theta / 2) becomes the perspective f tan(theta).
                        const double f = fb.focal_cm / model->r_fb();
                        const vec2d u = model->to_unit({x, y}), v = model->to_unit({ux, uy});
                        const double theta = 2 * std::asin(u.norm() / (2 * f));
                        EXPECT_NEAR(v.norm(), f * std::tan(theta), 1e-12);
                    } else {
                        EXPECT_NEAR(ux, x, 1e-15);
                        EXPECT_NEAR(uy, y, 1e-15);
                    }
                    model->distort(ux, uy, bx, by);
                    EXPECT_NEAR(bx, x, 1e-12);
                    EXPECT_NEAR(by, y, 1e-12);
                }
        }
}

TEST(LdpkModels, FisheyeResultRadiusIsCutAtFiftyKeepingItsDirection) {
    tde4_ldp_radial_deg_8 cut;
    tde4_ldp_radial_deg_8_release_1 uncut;
    for (ldp_builtin *m : std::initializer_list<ldp_builtin *>{&cut, &uncut}) {
        set_camera(*m, filmbacks[0]);
        m->setParameterValue("Distortion - Degree 2", 0.5);
        m->initializeParameters();
    }
    // Far outside the fisheye's reach the perspective radius holds at 5: 5 x (1 + 0.5 x 25) = 67.5.
    const struct { double x, y; } far[] = {{3.0, 2.0}, {-4.0, 0.5}, {0.5, -6.0}};
    for (const auto &p : far) {
        double cx, cy, ux, uy;
        cut.undistort(p.x, p.y, cx, cy);
        uncut.undistort(p.x, p.y, ux, uy);
        const vec2d c = cut.to_unit({cx, cy}), u = uncut.to_unit({ux, uy});
        EXPECT_NEAR(u.norm(), 67.5, 1e-9);
        EXPECT_NEAR(c.norm(), tde4_ldp_radial_deg_8::result_radius_limit, 1e-9);
        EXPECT_NEAR(c.x * u.y - c.y * u.x, 0.0, 1e-9);
        EXPECT_GT(c.x * u.x + c.y * u.y, 0.0);
    }
}

TEST(LdpkModels, StartTableHoldsTheInverseOfEachCellAndFollowsChanges) {
    tde4_ldp_radial_decentered_deg_4_cylindric model;
    set_camera(model, filmbacks[1]);
    const auto check_table = [&](const char *when) {
        const auto &table = model.start_table();
        for (int r = 0; r < ldp_builtin::table_rows; ++r)
            for (int c = 0; c < ldp_builtin::table_columns; ++c) {
                double x, y;
                const vec2d v = table[c + r * ldp_builtin::table_columns];
                model.undistort(v.x, v.y, x, y);
                ASSERT_NEAR(x, c / 20.0, 1e-9) << when << " " << c << " " << r;
                ASSERT_NEAR(y, r / 14.0, 1e-9) << when << " " << c << " " << r;
            }
    };
    for (const Setting &s : model_settings[3]) model.setParameterValue(s.name, s.value);
    model.initializeParameters();
    check_table("first");
    model.setParameterValue("Distortion - Degree 2", 0.08);
    model.initializeParameters();
    check_table("after a coefficient changed");
    model.setParameterValue("tde4_filmback_width_cm", 3.0);
    model.initializeParameters();
    check_table("after the filmback changed");

    // Threads racing for the first table agree with one thread alone, to the bit.
    tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy shared, alone;
    for (ldp_builtin *m : std::initializer_list<ldp_builtin *>{&shared, &alone}) {
        set_camera(*m, filmbacks[2]);
        for (const Setting &s : model_settings[0]) m->setParameterValue(s.name, s.value);
        m->initializeParameters();
    }
    constexpr int n_threads = 6, n = 30;
    std::vector<double> results(n_threads * n * 2);
    std::vector<std::thread> threads;
    for (int t = 0; t < n_threads; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < n; ++i)
                shared.distort(i / double(n), 0.1 * t, results[(t * n + i) * 2], results[(t * n + i) * 2 + 1]);
        });
    for (auto &th : threads) th.join();
    for (int t = 0; t < n_threads; ++t)
        for (int i = 0; i < n; ++i) {
            double x, y;
            alone.distort(i / double(n), 0.1 * t, x, y);
            EXPECT_EQ(results[(t * n + i) * 2], x);
            EXPECT_EQ(results[(t * n + i) * 2 + 1], y);
        }
}

TEST(LdpkModels, BoundingBoxesHoldTheMappedOutline) {
    for (auto &model : configured(filmbacks[0], true)) {
        SCOPED_TRACE(model->getModelName());
        double box[4], fine[4] = {HUGE_VAL, HUGE_VAL, -HUGE_VAL, -HUGE_VAL};
        ASSERT_TRUE(model->getBoundingBoxUndistorted(0.1, 0.0, 0.9, 1.0, box[0], box[1], box[2], box[3]));
        for (int k = 0; k <= 1000; ++k) {
            const double t = k / 1000.0;
            const double pts[4][2] = {{0.1 + 0.8 * t, 0.0}, {0.1 + 0.8 * t, 1.0}, {0.1, t}, {0.9, t}};
            for (const auto &p : pts) {
                double x, y;
                model->undistort(p[0], p[1], x, y);
                fine[0] = std::min(fine[0], x), fine[1] = std::min(fine[1], y);
                fine[2] = std::max(fine[2], x), fine[3] = std::max(fine[3], y);
            }
        }
        // The sampled outline lies within the fine one and misses it by at most a sliver.
        for (int k = 0; k < 4; ++k) EXPECT_NEAR(box[k], fine[k], 1e-4) << k;
        EXPECT_GE(box[0], fine[0]);
        EXPECT_LE(box[2], fine[2]);
        double dbox[4];
        ASSERT_TRUE(model->getBoundingBoxDistorted(box[0], box[1], box[2], box[3], dbox[0], dbox[1], dbox[2], dbox[3]));
        // Distorting the undistorted box encloses the original one again (up to the same sliver).
        EXPECT_LT(dbox[0], 0.1 + 1e-4);
        EXPECT_GT(dbox[2], 0.9 - 1e-4);
    }
}

TEST(LdpkModels, FactoryOrderParameterListsAndIds) {
    const struct {
        const char *name, *id;
        int n_parameters;
        const char *last;
        double lo, hi, def;
    } expected[] = {
        {"3DE4 Anamorphic - Standard, Degree 4", "DE4AnamorphicStandardDegree4", 13, "Squeeze-Y", 0.9, 1.1, 1.0},
        {"3DE4 Anamorphic, Degree 6", "DE4AnamorphicDegree6", 18, "Cy66 - Degree 6", -0.5, 0.5, 0.0},
        {"3DE Classic LD Model", "DEClassicLDModel", 5, "Quartic Distortion", -0.5, 0.5, 0.0},
        {"3DE4 Radial - Standard, Degree 4", "DE4RadialStandardDegree4", 8, "B - Cylindric Bending", -0.1, 0.1, 0.0},
        {"3DE4 Radial - Fisheye, Degree 8", "DE4RadialFisheyeDegree8Release2", 4, "Degree 8", -0.5, 0.5, 0.0},
        {"3DE4 Radial - Fisheye, Degree 8, Release 1", "DE4RadialFisheyeDegree8", 4, "Degree 8", -0.5, 0.5, 0.0},
    };
    const auto models = make_models();
    ASSERT_EQ(models.size(), std::size(expected));
    for (size_t i = 0; i < models.size(); ++i) {
        const auto &m = *models[i];
        const auto &e = expected[i];
        SCOPED_TRACE(e.name);
        EXPECT_STREQ(m.getModelName(), e.name);
        EXPECT_EQ(model_id(m.getModelName()), e.id);
        ASSERT_EQ(m.getNumParameters(), e.n_parameters);
        EXPECT_STREQ(m.getParameterName(e.n_parameters - 1), e.last);
        EXPECT_EQ(m.getParameterName(e.n_parameters), nullptr);
        double lo, hi, def;
        ASSERT_TRUE(m.getParameterRange(e.last, lo, hi));
        ASSERT_TRUE(m.getParameterDefaultValue(e.last, def));
        EXPECT_EQ(lo, e.lo);
        EXPECT_EQ(hi, e.hi);
        EXPECT_EQ(def, e.def);
        parameter_type type;
        EXPECT_TRUE(m.getParameterType("tde4_pixel_aspect", type) && type == parameter_type::real);
        EXPECT_FALSE(m.getParameterType("tde4_unknown", type));
        int i_def;
        EXPECT_FALSE(m.getParameterDefaultValue(e.last, i_def)); // the parameters are doubles only
    }
    EXPECT_EQ(model_id("3DE4 Radial - Fisheye, Degree 8, Release 1"), "DE4RadialFisheyeDegree8");
    EXPECT_EQ(model_id("PFTrack"), "PFTrack");
    // Spot checks of ranges and defaults across the lists.
    double lo, hi, def;
    EXPECT_TRUE(models[0]->getParameterRange("Lens Rotation", lo, hi) && lo == -2 && hi == 2);
    EXPECT_TRUE(models[2]->getParameterRange("Anamorphic Squeeze", lo, hi) && lo == 0.25 && hi == 4);
    EXPECT_TRUE(models[2]->getParameterDefaultValue("Anamorphic Squeeze", def) && def == 1.0);
    EXPECT_TRUE(models[3]->getParameterRange("Phi - Cylindric Direction", lo, hi) && lo == -90 && hi == 90);
    EXPECT_FALSE(models[3]->setParameterValue("Phi - Cylindric Direction", true));
    EXPECT_FALSE(models[3]->setParameterValue("Cx02 - Degree 2", 0.1));
}

TEST(LdpkModels, ErrorTextsAndReadingValues) {
    tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy anamorphic;
    for (const char *name : {"tde4_focal_length_cm", "tde4_filmback_width_cm", "tde4_filmback_height_cm",
                             "tde4_pixel_aspect", "Squeeze-X", "Squeeze-Y"})
        anamorphic.setParameterValue(name, 0.0);
    testing::internal::CaptureStderr();
    anamorphic.initializeParameters();
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              "ldp_builtin: filmback width is 0.\n"
              "ldp_builtin: filmback height is 0.\n"
              "ldp_builtin: focal length is 0.\n"
              "ldp_builtin: pixel aspect is 0.\n"
              "tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters, error: Squeeze-X is 0.\n"
              "tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters, error: Squeeze-Y is 0.\n");
    // A zero squeeze alone leaves a singular chain; the maths goes on and stays finite.
    set_camera(anamorphic, filmbacks[0]);
    anamorphic.setParameterValue("Squeeze-Y", 1.0);
    testing::internal::CaptureStderr();
    anamorphic.initializeParameters();
    EXPECT_EQ(testing::internal::GetCapturedStderr(),
              "tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy::initializeParameters, error: Squeeze-X is 0.\n");
    double x, y;
    anamorphic.distort(0.3, 0.6, x, y);
    EXPECT_TRUE(std::isfinite(x) && std::isfinite(y));

    const struct {
        int index;
        const char *text;
    } out_of_range[] = {{13, "ldpk::error: index 13 out of range, range [0..12]"},
                        {-1, "ldpk::error: index -1 out of range, range [0..12]"}};
    for (const auto &c : out_of_range) {
        try {
            anamorphic.parameter(c.index);
            ADD_FAILURE() << "no error for " << c.index;
        } catch (const error_index_out_of_range &e) {
            EXPECT_STREQ(e.what(), c.text);
        }
    }
    EXPECT_STREQ(anamorphic.parameter(12).name, "Squeeze-Y");

    tde4_ldp_classic_3de_mixed from_text, direct;
    const struct {
        const char *name, *text, *error;
    } reads[] = {
        {"Lens Warp", "0.1", "ldpk::error: undefined parameter"},
        {"Distortion", "abc", "ldpk::error: could not read value for parameter 'Distortion'"},
        {"Distortion", "0.1 0.2", "ldpk::error: could not read value for parameter 'Distortion'"},
        {"Distortion", "nan", "ldpk::error: could not read value for parameter 'Distortion'"},
        {"tde4_focal_length_cm", "", "ldpk::error: could not read value for parameter 'tde4_focal_length_cm'"},
        {"Distortion", " 0.1\r\n", nullptr},
        {"tde4_focal_length_cm", "5.0", nullptr},
    };
    for (const auto &r : reads) {
        try {
            from_text.set_parameter_from_text(r.name, r.text);
            EXPECT_EQ(r.error, nullptr) << r.name << " " << r.text;
        } catch (const error_base &e) {
            ASSERT_NE(r.error, nullptr) << e.what();
            EXPECT_STREQ(e.what(), r.error);
            const std::exception &base = e;
            EXPECT_STREQ(base.what(), r.error);
        }
    }
    direct.setParameterValue("Distortion", 0.1);
    from_text.initializeParameters();
    direct.initializeParameters();
    double tx, ty, dx, dy;
    from_text.undistort(0.8, 0.1, tx, ty);
    direct.undistort(0.8, 0.1, dx, dy);
    EXPECT_EQ(tx, dx);
    EXPECT_EQ(ty, dy);
    EXPECT_NE(tx, 0.8);
}

TEST(LdpkModels, AnamorphicChainSqueezesAndRotationLeavesRoundLensesAlone) {
    // No polynomial terms: the chain is the squeeze alone, about the lens centre.
    tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy squeeze, round, turned;
    const Filmback &fb = filmbacks[0];
    for (ldp_builtin *m : std::initializer_list<ldp_builtin *>{&squeeze, &round, &turned}) set_camera(*m, fb);
    squeeze.setParameterValue("Squeeze-X", 1.05);
    squeeze.setParameterValue("Squeeze-Y", 0.97);
    // A rotationally symmetric polynomial (equal Cx02, Cy02 and Cx04, Cy04) is the same turned or not.
    for (ldp_builtin *m : std::initializer_list<ldp_builtin *>{&round, &turned}) {
        m->setParameterValue("Cx02 - Degree 2", -0.05);
        m->setParameterValue("Cy02 - Degree 2", -0.05);
        m->setParameterValue("Cx04 - Degree 4", 0.01);
        m->setParameterValue("Cy04 - Degree 4", 0.01);
    }
    turned.setParameterValue("Lens Rotation", 1.7);
    for (ldp_builtin *m : std::initializer_list<ldp_builtin *>{&squeeze, &round, &turned}) m->initializeParameters();
    const double cx = 0.5 + fb.offset_x_cm / fb.width_cm, cy = 0.5 + fb.offset_y_cm / fb.height_cm;
    for (double x : {0.0, 0.25, 0.6, 1.0})
        for (double y : {0.0, 0.4, 1.0}) {
            double sx, sy, rx, ry, tx, ty;
            squeeze.undistort(x, y, sx, sy);
            EXPECT_NEAR(sx, cx + 1.05 * (x - cx), 1e-14);
            EXPECT_NEAR(sy, cy + 0.97 * (y - cy), 1e-14);
            round.undistort(x, y, rx, ry);
            turned.undistort(x, y, tx, ty);
            EXPECT_NEAR(tx, rx, 1e-14);
            EXPECT_NEAR(ty, ry, 1e-14);
        }
}

} // namespace
} // namespace Orvane::ldpk
