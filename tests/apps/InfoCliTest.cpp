// orvane info as a separate process: a file is itself, a sequence only when asked or named so; OpenEXR headers
// as exrheader reads them, other formats' channels and depths as ImageMagick reads them.
#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <regex>
#include <vector>

#include "tests/apps/CliRun.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane::clitest {
namespace {

std::string Samples() {
    for (const char *root : {ORVANE_SOURCE_DIR "/../shared/testdata", "/work/shared/testdata"})
        if (std::filesystem::is_directory(std::string(root) + "/openexr-images"))
            return std::string(root) + "/openexr-images";
    return {};
}

using FmtTest::HaveProgram;
const auto Capture = FmtTest::CaptureText;

TEST(CliInfo, AFileIsItselfAndASequenceIsAskedForOrNamed) {
    if (Samples().empty()) GTEST_SKIP() << "the OpenEXR sample images are absent";
    TempDir dir;
    for (const char *name : {"shot.0001.exr", "shot.0002.exr", "shot.0004.exr", "plate.exr"})
        std::filesystem::copy_file(Samples() + "/DisplayWindow/t08.exr", dir.Path() / name);
    const std::string d = dir.Path().string() + "/", yc = Samples() + "/Chromaticities/Rec709_YC.exr";
    struct Row {
        std::string args, firstLine, frameFile; ///< frameFile "": no sequence lines
        const char *size = "501 x 401";
    };
    const Row rows[] = {
        {d + "shot.0002.exr", d + "shot.0002.exr", ""},
        {yc, yc, "", "610 x 406"}, // a number in a name is not a frame number by itself
        {"--sequence " + d + "shot.0002.exr", d + "shot.####.exr", d + "shot.0002.exr"},
        {d + "shot.####.exr", d + "shot.####.exr", d + "shot.0001.exr"},
        {d + "shot.%04d.exr --sequence", d + "shot.####.exr", d + "shot.0001.exr"},
        {"--sequence " + d + "plate.exr", d + "plate.exr", ""},
    };
    for (const Row &row : rows) {
        SCOPED_TRACE(row.args);
        const CliRun r = Orvane("info " + row.args);
        ASSERT_EQ(r.exitCode, 0) << r.err;
        EXPECT_EQ(r.out.substr(0, r.out.find('\n')), row.firstLine);
        EXPECT_TRUE(Contains(r.out, std::string("size                             ") + row.size + ",")) << r.out;
        EXPECT_EQ(Contains(r.out, "frame file                       " + row.frameFile + "\n"), !row.frameFile.empty());
        EXPECT_EQ(
            Contains(r.out, "frames                           1 - 4 (3 files)\n  missing                          3\n"),
            !row.frameFile.empty())
            << r.out;
    }

    const auto broken = dir.File("broken.png", "\x89PNG\r\n\x1a\n but then nothing sensible");
    struct Bad {
        std::string args, message;
        int exitCode;
    };
    const Bad bad[] = {{Quote(broken.string()), "broken.png", 3},
                       {d + "none.####.exr", "no file of the sequence exists", 3},
                       {d + "none.exr", "none.exr", 3},
                       {"--frames " + d + "plate.exr", "unexpected option '--frames'", 2},
                       {"--json", "expected one or more files", 2}};
    for (const Bad &b : bad) {
        const CliRun r = Orvane("info " + b.args);
        EXPECT_EQ(r.exitCode, b.exitCode) << b.args;
        EXPECT_TRUE(Contains(r.err, "ERROR: ") && Contains(r.err, b.message)) << b.args << ": " << r.err;
    }
}

/// Per part: the windows, compression, tiles and channels, in one notation.
using Parts = std::vector<std::vector<std::string>>;
using Rule = std::pair<std::regex, std::function<std::string(const std::smatch &)>>;

/// The facts `rules` make of the lines of `text`, per part: a part starts at a line matching `part`, or at the
/// first line starting with `single` in a file of one part.
Parts Facts(const std::string &text, const std::regex &part, const std::vector<Rule> &rules, const char *single) {
    Parts parts;
    std::istringstream in(text);
    std::smatch m;
    for (std::string line; std::getline(in, line);) {
        if (std::regex_match(line, part) || (parts.empty() && *single && line.rfind(single, 0) == 0))
            parts.emplace_back();
        for (const auto &[re, fact] : rules)
            if (!parts.empty() && std::regex_match(line, m, re)) parts.back().push_back(fact(m));
    }
    for (auto &p : parts) std::sort(p.begin(), p.end());
    return parts;
}

Parts FromExrheader(const std::string &text) {
    static const std::map<std::string, std::string> renamed = {{"run-length encoding", "rle"},
                                                               {"zip, individual scanlines", "zips"},
                                                               {"zip, multi-scanline blocks", "zip"},
                                                               {"dwa, small scanline blocks", "dwaa"},
                                                               {"dwa, medium scanline blocks", "dwab"}};
    static const std::map<std::string, std::string> types = {
        {"16-bit floating-point", "half"}, {"32-bit floating-point", "float"}, {"32-bit unsigned integer", "uint32"}};
    static const std::vector<Rule> rules = {
        {std::regex(R"(^(data|display)Window \(type box2i\): \((-?\d+) (-?\d+)\) - \((-?\d+) (-?\d+)\)$)"),
         [](const std::smatch &m) {
             return m[1].str() + " " + m[2].str() + "," + m[3].str() + " - " + m[4].str() + "," + m[5].str();
         }},
        {std::regex(R"(^compression \(type compression\): (.*)$)"),
         [](const std::smatch &m) { return "compression " + (renamed.count(m[1]) ? renamed.at(m[1]) : m[1].str()); }},
        {std::regex(R"(^    (.+), (\d+-bit [a-z -]+), sampling (\d+ \d+(, plinear)?)$)"),
         [](const std::smatch &m) { return "channel " + m[1].str() + " " + types.at(m[2]) + " " + m[3].str(); }},
        {std::regex(R"(^    tile size (\d+) by (\d+) pixels$)"),
         [](const std::smatch &m) { return "tiles " + m[1].str() + " x " + m[2].str(); }}};
    return Facts(text, std::regex(R"(^ part \d+:$)"), rules, "channels (type");
}

Parts FromInfo(const std::string &text) {
    static const std::vector<Rule> rules = {
        {std::regex(R"(^    (data|display) window \(file, y down\) +(.*)$)"),
         [](const std::smatch &m) { return m[1].str() + " " + m[2].str(); }},
        {std::regex(R"(^    compression +(\S+)$)"), [](const std::smatch &m) { return "compression " + m[1].str(); }},
        {std::regex(R"(^    channel +(.+) (\S+), sampling (\d+ \d+(, plinear)?)$)"),
         [](const std::smatch &m) { return "channel " + m[1].str() + " " + m[2].str() + " " + m[3].str(); }},
        {std::regex(R"(^    tiles +(\d+ x \d+),.*$)"), [](const std::smatch &m) { return "tiles " + m[1].str(); }}};
    return Facts(text, std::regex(R"(^  part \d+ .*$)"), rules, "");
}

TEST(CliInfo, OpenEXRPartsAgreeWithExrheader) {
    if (Samples().empty() || !HaveProgram("exrheader") || !HaveProgram("exrmaketiled"))
        GTEST_SKIP() << "the OpenEXR sample images or tools are absent";
    TempDir dir;
    const std::string tiled = (dir.Path() / "tiled.exr").string();
    ASSERT_TRUE(FmtTest::RunShell("exrmaketiled -t 16 32 -m -z zip " + Quote(Samples() + "/DisplayWindow/t08.exr") +
                                  " " + Quote(tiled) + " >/dev/null"));
    // Multi-part views, single-part views, a luminance / chroma file with sub-sampled channels, pxr24, piz, zip
    // and tiled mip-maps.
    std::vector<std::string> files{tiled};
    for (const char *name :
         {"Beachball/multipart.0001.exr", "Beachball/singlepart.0001.exr", "Chromaticities/Rec709_YC.exr",
          "TestImages/GrayRampsHorizontal.exr", "DisplayWindow/t08.exr", "TestImages/WideColorGamut.exr"})
        files.push_back(Samples() + "/" + name);
    const bool python = HaveProgram("python3");
    for (const std::string &file : files) {
        SCOPED_TRACE(file);
        const Parts want = FromExrheader(Capture("exrheader " + Quote(file)));
        ASSERT_FALSE(want.empty());
        const CliRun r = Orvane("info " + Quote(file));
        ASSERT_EQ(r.exitCode, 0) << r.err;
        EXPECT_EQ(FromInfo(r.out), want) << r.out;
        if (!python) continue;
        // The JSON document parses and holds the same parts and windows.
        const std::string json = Capture(
            Quote(std::string(ORVANE_BINARY_DIR) + "/orvane") + " info --json " + Quote(file) +
            " | python3 -c 'import json,sys; d=json.load(sys.stdin)[0]; "
            "print(\" \".join(\"%d,%d-%d,%d\" % tuple(p[\"dataWindow\"]) for p in d[\"openexr\"][\"parts\"]))'");
        std::string windows;
        for (const auto &p : want)
            for (const std::string &f : p)
                if (f.rfind("data ", 0) == 0)
                    windows += (windows.empty() ? "" : " ") + std::regex_replace(f.substr(5), std::regex(" - "), "-");
        EXPECT_EQ(json, windows + "\n");
    }
}

TEST(CliInfo, OtherFormatsGiveTheChannelsAndDepthTheFileHas) {
    if (!HaveProgram("convert") || !HaveProgram("identify")) GTEST_SKIP() << "ImageMagick is not installed";
    TempDir dir;
    const std::pair<const char *, const char *> made[] = {
        {"g16.png", "-size 5x3 gradient: -colorspace Gray -depth 16"},
        {"ga8.png", "-size 5x3 gradient: -colorspace Gray -alpha set -channel A -evaluate set 50% +channel "
                    "-define png:color-type=4 -depth 8"},
        {"rgb16.png", "-size 4x3 gradient:red-blue -depth 16"},
        {"rgb.jpg", "-size 5x3 gradient:red-blue"},
        {"grey.jpg", "-size 5x3 gradient: -colorspace Gray"},
        {"rgba.tga", "-size 4x3 xc:red -alpha set -channel A -evaluate set 50% +channel"},
        {"rgb.bmp", "-size 4x3 gradient:red-blue"}};
    const std::map<std::string, std::vector<std::string>> names = {
        {"gray", {"Y"}}, {"graya", {"Y", "A"}}, {"srgb", {"R", "G", "B"}}, {"srgba", {"R", "G", "B", "A"}}};
    for (const auto &[name, how] : made) {
        SCOPED_TRACE(name);
        const std::string path = (dir.Path() / name).string();
        ASSERT_TRUE(FmtTest::RunShell("convert " + std::string(how) + " " + Quote(path)));
        std::istringstream id(Capture("identify -format '%[channels] %z' " + Quote(path)));
        std::string channels;
        int bits = 0;
        id >> channels >> bits;
        ASSERT_TRUE(names.count(channels)) << channels;
        std::string want;
        for (const std::string &n : names.at(channels))
            want += (want.empty() ? "" : ", ") + n + " uint" + std::to_string(bits);
        const CliRun r = Orvane("info " + Quote(path));
        ASSERT_EQ(r.exitCode, 0) << r.err;
        std::smatch m;
        ASSERT_TRUE(std::regex_search(r.out, m, std::regex(R"(\n  channels +(.*)\n)"))) << r.out;
        EXPECT_EQ(m[1].str(), want);
        EXPECT_EQ(Contains(r.out, "image                            RGBA int16"), bits == 16) << r.out;
    }
}

} // namespace
} // namespace Orvane::clitest
