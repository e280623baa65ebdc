// Numbered file sequences: parsing and writing names, matching, scanning a folder with gaps.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "host/media/Sequence.h"
#include "tests/support/TestSupport.h"

namespace Orvane::sequencetest {
namespace {

TEST(SequenceName, ParsesTheLastNumberBeforeTheExtension) {
    // Path, folder, prefix, suffix, number, padding and whether there is one.
    const std::tuple<const char *, const char *, const char *, const char *, int64_t, int, bool> cases[] = {
        {"/a/b/shot_v2.0042.exr", "/a/b/", "shot_v2.", ".exr", 42, 4, true},
        {"shot.1.png", "", "shot.", ".png", 1, 1, true},
        {"plate.00000001.dpx", "", "plate.", ".dpx", 1, 8, true},
        {"shot.-0005.exr", "", "shot.", ".exr", -5, 4, true},
        {"shot_-12.tga", "", "shot_", ".tga", -12, 2, true},
        {"-7.png", "", "", ".png", -7, 1, true},
        {"shot-0005.exr", "", "shot-", ".exr", 5, 4, true}, // '-' after a letter is part of the name
        {"name0012_final.tif", "", "name", "_final.tif", 12, 4, true},
        {"still.exr", "", "still.exr", "", 0, 0, false},
        {"dir.0001/still.exr", "dir.0001/", "still.exr", "", 0, 0, false},
        {".hidden12", "", ".hidden", "", 12, 2, true}, // a leading dot is no extension
    };
    for (const auto &[path, folder, prefix, suffix, number, padding, hasNumber] : cases) {
        SCOPED_TRACE(path);
        const SequenceName s = ParseSequenceName(path);
        EXPECT_EQ(std::tuple(s.folder, s.prefix, s.suffix, s.hasNumber), std::tuple(folder, prefix, suffix, hasNumber));
        if (!hasNumber) continue;
        EXPECT_EQ(std::pair(s.number, s.padding), std::pair(number, padding));
        EXPECT_EQ(SequencePath(s, s.number), path) << "a parsed name writes back as it was";
    }
}

// Frame names keep the padding and grow when needed; markers give the place and padding of the number.
TEST(SequenceName, FrameNamesFromNumbersAndMarkers) {
    const struct { // the display name only where it differs from the path
        const char *path, *frame7, *frame12345, *display;
    } cases[] = {
        {"out/render.0100.exr", "out/render.0007.exr", "out/render.12345.exr", "out/render.####.exr"},
        {"f9.png", "f7.png", "f12345.png", "f#.png"},
        {"o/shot.####.exr", "o/shot.0007.exr", "o/shot.12345.exr", "o/shot.####.exr"},
        // The last run of signs counts.
        {"out/v#2/render_######.exr", "out/v#2/render_000007.exr", "out/v#2/render_012345.exr",
         "out/v#2/render_######.exr"},
        {"shot.%04d.exr", "shot.0007.exr", "shot.12345.exr", nullptr},
        {"shot.%d.exr", "shot.7.exr", "shot.12345.exr", nullptr},
        {"shot.%4d.exr", "shot.0007.exr", "shot.12345.exr", nullptr}, // zeros, not spaces, in a file name
        {"shot_$F4.exr", "shot_0007.exr", "shot_12345.exr", nullptr},
        {"v2_%03d_final.tif", "v2_007_final.tif", "v2_12345_final.tif", nullptr},   // the marker wins over digits
        {"take.%05d.$F2.png", "take.%05d.07.png", "take.%05d.12345.png", nullptr},  // the last marker counts
        {"v#1/plate.%02d.dpx", "v#1/plate.07.dpx", "v#1/plate.12345.dpx", nullptr}, // markers in folders are text
        {"odd.%123d.exr", "odd.%007d.exr", "odd.%12345d.exr", nullptr},             // no marker: the digits rule
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.path);
        const SequenceName s = ParseSequenceName(c.path);
        ASSERT_TRUE(s.hasNumber);
        EXPECT_EQ(SequencePath(s, 7), c.frame7);
        EXPECT_EQ(SequencePath(s, 12345), c.frame12345);
        if (c.display) {
            EXPECT_EQ(SequenceDisplayName(s), c.display);
        }
        // The display form names the same files, and the files belong to it.
        EXPECT_EQ(SequencePath(ParseSequenceName(SequenceDisplayName(s)), 7), c.frame7);
        int64_t n = 0;
        const std::string file = c.frame12345;
        EXPECT_TRUE(MatchesSequence(s, file.substr(file.rfind('/') + 1), n));
        EXPECT_EQ(n, 12345);
    }
    EXPECT_EQ(SequencePath(ParseSequenceName("out/render.0100.exr"), -23), "out/render.-0023.exr");
    for (int padding = 1; padding <= 8; ++padding) {
        SequenceName p = ParseSequenceName("x." + std::string(padding, '0') + ".raw");
        ASSERT_EQ(p.padding, padding);
        int64_t number = 0;
        EXPECT_TRUE(MatchesSequence(p, SequencePath(p, 1001), number)) << padding;
        EXPECT_EQ(number, 1001);
    }
}

TEST(SequenceName, OutputNamesNumberAPlainNameOnlyForSeveralFrames) {
    // The name, frame 12 of several frames, and of one frame (a number in the name gives the padding).
    for (auto [path, several, one] : {std::tuple{"o/out.exr", "o/out.0012.exr", "o/out.exr"},
                                      {"o/out_.exr", "o/out_0012.exr", "o/out_.exr"},
                                      {"o/out.", "o/out.0012.", "o/out."},
                                      {"o/out", "o/out.0012", "o/out"},
                                      {"o/.hidden", "o/.hidden.0012", "o/.hidden"},
                                      {"o/shot.0100.exr", "o/shot.0012.exr", "o/shot.0012.exr"},
                                      {"o/shot.$F.exr", "o/shot.12.exr", "o/shot.12.exr"}}) {
        EXPECT_EQ(SequencePath(OutputSequenceName(path, true), 12), several) << path;
        EXPECT_EQ(SequencePath(OutputSequenceName(path, false), 12), one) << path;
    }
}

TEST(SequenceName, MatchingRespectsPaddingPrefixAndSuffix) {
    const SequenceName four = ParseSequenceName("shot.0001.exr");
    const SequenceName one = ParseSequenceName("shot.1.exr");
    for (auto [file, inFour, inOne] : {std::tuple{"shot.0002.exr", true, false},
                                       {"shot.12345.exr", true, true},
                                       {"shot.012345.exr", false, false},
                                       {"shot.002.exr", false, false},
                                       {"shot.7.exr", false, true},
                                       {"shot.0002.png", false, false},
                                       {"shots.0002.exr", false, false},
                                       {"shot.-0003.exr", true, false},
                                       {"shot.exr", false, false}}) {
        int64_t n;
        EXPECT_EQ(std::pair(MatchesSequence(four, file, n), MatchesSequence(one, file, n)), std::pair(inFour, inOne))
            << file;
    }
}

TEST(SequenceScan, FindsTheFramesAndTheGapsInAFolder) {
    const Orvane::Test::TempDir dir;
    for (const char *name : {"a.0003.exr", "a.0004.exr", "a.0007.exr", "a.0010.exr", "a.-0001.exr", "a.004.exr",
                             "b.0005.exr", "a.0005.png"})
        std::ofstream(dir / name) << "x";
    std::filesystem::create_directories(dir / "a.0006.exr"); // a folder is no frame
    const SequenceScan scan = ScanSequence(ParseSequenceName(dir / "a.0003.exr"));
    EXPECT_EQ(scan.frames, (std::vector<int64_t>{-1, 3, 4, 7, 10}));
    const std::vector<std::pair<int64_t, int64_t>> gaps{{0, 2}, {5, 6}, {8, 9}};
    EXPECT_EQ(scan.gaps, gaps);
    EXPECT_TRUE(ScanSequence(ParseSequenceName(dir / "nothing.0001.exr")).frames.empty());
}

} // namespace
} // namespace Orvane::sequencetest
