#include "host/flow/FilmGates.h"

#include <gtest/gtest.h>

#include <set>
#include <string>

namespace Orvane::filmgatestest {
namespace {

constexpr double kMmPerInch = 25.4;

TEST(FilmGates, DefaultGateAndApertureEntryNameTheSameGate) {
    // The lens tool defaults to FilmGateID entry 17 and ApertureTable entry 35.
    const OvID gate = FilmGateID[17];
    EXPECT_EQ(gate, FilmGateID[kDefaultFilmGate]);
    EXPECT_EQ(FindFilmGate(gate), 17);
    EXPECT_EQ(std::string(FilmGateName[17]), "35mm Full Aperture (Super 35)");
    // Entry 35 is the height of the same gate, entry 34 its width.
    auto size = ApertureOf(gate);
    ASSERT_TRUE(size);
    EXPECT_EQ(ApertureTable[34], size->width);
    EXPECT_EQ(ApertureTable[35], size->height);
    // 35 mm full aperture: 24.89 x 18.67 mm.
    EXPECT_NEAR(size->width * kMmPerInch, 24.89, 0.05);
    EXPECT_NEAR(size->height * kMmPerInch, 18.67, 0.05);
}

TEST(FilmGates, TablesAreWellFormed) {
    EXPECT_EQ(FilmGateID[0], FilmGate_User);
    EXPECT_EQ(FilmGateCount(), FilmGateID.size());
    std::set<OvID> ids;
    std::set<std::string> names;
    for (size_t i = 0; i < FilmGateCount(); ++i) {
        SCOPED_TRACE(i);
        ASSERT_TRUE(FilmGateID[i]);
        ASSERT_NE(FilmGateName[i], nullptr);
        EXPECT_NE(std::string(FilmGateName[i]), "");
        ids.insert(FilmGateID[i]);
        names.insert(FilmGateName[i]);
        EXPECT_EQ(FindFilmGate(FilmGateID[i]), static_cast<int>(i));
        for (double side : {ApertureTable[2 * i], ApertureTable[2 * i + 1]}) {
            EXPECT_GE(side, 0.1);
            EXPECT_LE(side, 3.0);
        }
    }
    EXPECT_EQ(ids.size(), FilmGateCount());
    EXPECT_EQ(names.size(), FilmGateCount());
    EXPECT_EQ(FindFilmGate(OvID("FilmGate_NoSuchGate")), -1);
    EXPECT_EQ(FindFilmGate(OvID()), -1);
    EXPECT_FALSE(ApertureOf(OvID("FilmGate_NoSuchGate")));
}

TEST(FilmGates, KnownFormatsMatchTheirPublishedSizes) {
    struct Case {
        const char *id;
        double widthMm, heightMm;
    };
    const Case cases[] = {
        {"FilmGate_16mm", 10.26, 7.49},
        {"FilmGate_Super16mm", 12.52, 7.41},
        {"FilmGate_35mmAcademy", 21.95, 16.00},
        {"FilmGate_Super35_3Perf", 24.89, 13.87},
        {"FilmGate_FullFrame", 36.0, 24.0},
        {"FilmGate_APSC", 23.6, 15.6},
        {"FilmGate_FourThirds", 17.3, 13.0},
        {"FilmGate_65mm5Perf", 52.48, 23.01},
        {"FilmGate_35mm8PerfHorizontal", 37.72, 25.17},
        {"FilmGate_LargeFormat15Perf", 70.41, 52.63},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.id);
        auto size = ApertureOf(OvID(c.id));
        ASSERT_TRUE(size);
        EXPECT_NEAR(size->width * kMmPerInch, c.widthMm, 0.05);
        EXPECT_NEAR(size->height * kMmPerInch, c.heightMm, 0.05);
    }
}

TEST(FilmGates, FitMethodsInOrder) {
    const OvID order[] = {FMID_Inside, FMID_Width, FMID_Height, FMID_Outside, FMID_Stretch};
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(FitMethodID[i], order[i]);
        EXPECT_EQ(FindFitMethod(order[i]), i);
    }
    EXPECT_EQ(FindFitMethod(FilmGate_User), -1);
}

TEST(FilmGates, FilmbackFit) {
    // A 1920 x 1080 (16:9) image over a 4:3-ish gate (0.980 x 0.735, aspect
    // 1.33) and a wide gate (2.066 x 0.906, aspect 2.28). With square pixels
    // the image (1.78) is wider than the 4:3 gate and narrower than the wide
    // one; with pixel aspect 2 (3.56) it is wider than both.
    const double narrowW = 0.980 / 1920, narrowH = 0.735 / 1080; // width fits, height fits
    const double wideW = 2.066 / 1920, wideH = 0.906 / 1080;
    struct Case {
        double width, height, pixelAspect, wFb, hFb;
        int fit;
        double kx, ky;
    };
    const Case cases[] = {
        // Inside: the gate inside the image.
        {1920, 1080, 1, 0.980, 0.735, 0, narrowH, narrowH},
        {1920, 1080, 1, 2.066, 0.906, 0, wideW, wideW},
        {1920, 1080, 2, 2.066, 0.906, 0, wideH, wideH},
        // Outside: the image inside the gate.
        {1920, 1080, 1, 0.980, 0.735, 3, narrowW, narrowW},
        {1920, 1080, 1, 2.066, 0.906, 3, wideH, wideH},
        {1920, 1080, 2, 2.066, 0.906, 3, wideW, wideW},
        // A 900 x 1000 image of pixel aspect 2 is exactly as wide (1.8) as a
        // 1.8 x 1 gate: Inside then fits the width, Outside the height.
        {900, 1000, 2, 1.8, 1.0, 0, 0.002, 0.002},
        {900, 1000, 2, 1.8, 1.0, 3, 0.001, 0.001},
        // Width, Height and Stretch ignore the aspects.
        {1920, 1080, 1, 0.980, 0.735, 1, narrowW, narrowW},
        {1920, 1080, 2, 2.066, 0.906, 1, wideW, wideW},
        {1920, 1080, 1, 0.980, 0.735, 2, narrowH, narrowH},
        {1920, 1080, 2, 2.066, 0.906, 2, wideH, wideH},
        {1920, 1080, 1, 0.980, 0.735, 4, narrowW, narrowH},
        {1920, 1080, 2, 2.066, 0.906, 4, wideW, wideH},
        // Unknown methods leave pixels unscaled.
        {1920, 1080, 1, 0.980, 0.735, 5, 1, 1},
        {1920, 1080, 1, 0.980, 0.735, -1, 1, 1},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << "fit " << c.fit << " image " << c.width << " aspect " << c.pixelAspect
                                        << " gate " << c.wFb);
        FilmbackScale k = FitFilmback(c.width, c.height, c.pixelAspect, c.wFb, c.hFb, c.fit);
        EXPECT_DOUBLE_EQ(k.x, c.kx);
        EXPECT_DOUBLE_EQ(k.y, c.ky);
    }
}

} // namespace
} // namespace Orvane::filmgatestest
