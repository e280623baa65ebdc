// The lens file readers: ".data" entries in both layouts and every error kind with its text, ".pfb" files of
// both versions and orders written to disk, each parse error, and truncated or garbage input.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <map>
#include <random>
#include <sstream>
#include <tuple>

#include "operators/warp/LensFiles.h"
#include "tests/support/TestSupport.h"

namespace Orvane::lensfiles {
namespace {

using T = ParameterType;
const std::vector<ParameterSpec> Params{{"tde4_focal_length_cm", T::Double},
                                        {"Distortion - Degree 2", T::Double},
                                        {"U - Degree 2", T::Double},
                                        {"Phi - Cylindric Direction", T::Double},
                                        {"Degree 6", T::Double},
                                        {"Samples", T::Int},
                                        {"Mirror", T::Bool},
                                        {"Note", T::Text}};
using Values = std::map<std::string, ParameterValue>;

Values ReadText(const std::string &text, int *calls = nullptr) {
    Values got;
    std::istringstream in(text);
    ReadData(in, Params, [&](std::size_t i, const ParameterValue &v) {
        got[Params[i].name] = v;
        if (calls) ++*calls;
    });
    return got;
}

/// The text of the error `read` throws, or "" with a failure when it throws none or another kind.
template <typename Kind, typename Read> std::string ErrorOf(Read read, const std::string &where) {
    try {
        read();
    } catch (const Kind &e) {
        return e.what();
    } catch (const std::exception &e) {
        ADD_FAILURE() << where << ": other error " << e.what();
        return "";
    }
    ADD_FAILURE() << where << ": no error";
    return "";
}

TEST(LensData, BothLayoutsWithLineEndsCommentsAndRepeats) {
    const struct {
        std::string text;
        Values want;
    } cases[] = {
        {"\xEF\xBB\xBFtde4_focal_length_cm\r\n3.5\r\n\r\n# lens\r\nDistortion  -\tDegree 2\r\n-0.0421\r\n"
         "Phi - Cylindric Direction\r\n+12.5\r\n",
         {{"tde4_focal_length_cm", 3.5}, {"Distortion - Degree 2", -0.0421}, {"Phi - Cylindric Direction", 12.5}}},
        {"Distortion - Degree 2 0.015\nDegree 6 -1e-3\nSamples 8\nMirror TRUE\nNote hello",
         {{"Distortion - Degree 2", 0.015},
          {"Degree 6", -1e-3},
          {"Samples", 8},
          {"Mirror", true},
          {"Note", std::string("hello")}}},
        {"Note\n  a b  c \nU - Degree 2\n1\nU - Degree 2 0.25\nMirror\n0\n",
         {{"Note", std::string("a b  c")}, {"U - Degree 2", 0.25}, {"Mirror", false}}},
        {"", {}},
    };
    for (const auto &c : cases) EXPECT_EQ(ReadText(c.text), c.want) << c.text;

    PfBarrelSettings pf;
    std::istringstream in("Low Order Distortion\n-0.08\nAnamorphic Squeeze 2\nLens Center X 0.45\n");
    ReadData(in, PfBarrelParameters(), PfBarrelSetter(pf));
    EXPECT_TRUE(pf.lowOrder == -0.08 && pf.squeeze == 2 && pf.centerX == 0.45 && pf.centerY == 0.5);
}

TEST(LensData, ErrorsNameTheirParameterAndSetNothing) {
    const std::string undefined = "ldpk::error: undefined parameter";
    const auto value = [](const std::string &name) {
        return "ldpk::error: could not read value for parameter '" + name + "'";
    };
    const struct {
        std::string text, want;
    } cases[] = {
        {"Cx02 - Degree 2\n0.1\n", undefined},
        {"Degree 6 0.1\nDistortion - Degree 2 0.1 0.2\n", undefined},
        {"\x01\x02\xff\xfe zz\n", undefined},
        {"Degree 6 0.1\nDistortion - Degree 2\nabc\n", value("Distortion - Degree 2")},
        {"Distortion - Degree 2\nU - Degree 2\n0.1\n", value("Distortion - Degree 2")},
        {"Degree 6 0.1\nPhi - Cylindric Direction\n", value("Phi - Cylindric Direction")},
        {"Degree 6 nan", value("Degree 6")},
        {"Degree 6 -inf", value("Degree 6")},
        {"Degree 6 1e999", value("Degree 6")},
        {"Degree 6 1.5.2", value("Degree 6")},
        {"Degree 6 0x10", value("Degree 6")},
        {"Degree 6 +-1", value("Degree 6")},
        {"Samples 2.5", value("Samples")},
        {"Samples 99999999999", value("Samples")},
        {"Mirror maybe", value("Mirror")},
        {"Degree 6 0.1\n" + std::string(5000, 'x'), "parse error - line 2 is too long"},
    };
    for (const auto &c : cases) {
        int calls = 0;
        EXPECT_EQ(ErrorOf<Error>([&] { ReadText(c.text, &calls); }, c.text), c.want);
        EXPECT_EQ(calls, 0) << c.text;
    }
    try {
        ReadText("Degree 6 0.1\n\n# note\nbogus  entry 1\n");
        ADD_FAILURE() << "no error";
    } catch (const UndefinedParameter &e) {
        EXPECT_TRUE(e.name() == "bogus entry 1" && e.line() == 4) << e.name() << " " << e.line();
    }

    // Entries built by a caller are checked against the list before anything is set.
    const std::vector<DataEntry> beyond{{0, 1.0}, {8, 1.0}}, mistyped{{5, 1.0}};
    const ParameterSetter never = [](std::size_t, const ParameterValue &) { ADD_FAILURE() << "set"; };
    EXPECT_EQ(ErrorOf<IndexOutOfRange>([&] { ApplyDataEntries(beyond, Params, never); }, "beyond"),
              "ldpk::error: index 8 out of range, range [0, 7]");
    EXPECT_EQ(ErrorOf<CouldNotReadValue>([&] { ApplyDataEntries(mistyped, Params, never); }, "type"), value("Samples"));
    PfBarrelSettings pf;
    EXPECT_EQ(ErrorOf<IndexOutOfRange>([&] { PfBarrelSetter(pf)(5, 1.0); }, "pf"),
              "ldpk::error: index 5 out of range, range [0, 4]");
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadDataFile("/nonexistent/lens.data", Params, never); }, "open"),
              "failed to open file");
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadDataFile("/tmp", Params, never); }, "folder"), "failed to open file");
}

const std::string V1Low = "#PFBarrel 2011 v1\n1920 1080\n1001 1003\nLow Order\n1.0\n"
                          "-0.052 0.01 0.5 0.5 1.0\n-0.051 0.01 0.501 0.499 1.0\n-0.05 0.01 0.502 0.498 1\n";
const std::string V2High = "#PFBarrel 2011 v2\r\n2048\t858\r\n2.0\r\n-1 0\r\n\r\nHigh Order\r\n2\r\n"
                           "-0.1, 0.02, 0.48, 0.52, 2\r\n-0.11, 0.021, 0.47, 0.53, 2.0\r\n";

bool Same(const PfbFile &a, const PfbFile &b) {
    const auto row = [](const PfbRow &r) {
        return std::tuple(r.lowOrder, r.highOrder, r.centerX, r.centerY, r.squeeze);
    };
    return a.version == b.version && a.width == b.width && a.height == b.height && a.pixelAspect == b.pixelAspect &&
           a.firstFrame == b.firstFrame && a.lastFrame == b.lastFrame && a.order == b.order && a.squeeze == b.squeeze &&
           std::equal(a.rows.begin(), a.rows.end(), b.rows.begin(), b.rows.end(),
                      [&](auto &x, auto &y) { return row(x) == row(y); });
}

TEST(LensPfb, VersionsAndOrdersFromDisk) {
    Orvane::Test::TempDir dir;
    for (const auto &[name, text] : {std::pair{"v1.pfb", V1Low}, std::pair{"v2.pfb", V2High}})
        std::ofstream(dir / name, std::ios::binary) << text;
    const PfbFile v1 = ReadPfbFile(dir / "v1.pfb"), v2 = ReadPfbFile(dir / "v2.pfb");
    EXPECT_TRUE(v1.version == 1 && v1.width == 1920 && v1.height == 1080 && v1.pixelAspect == 1.0 &&
                v1.firstFrame == 1001 && v1.lastFrame == 1003 && v1.order == PfbOrder::Low && v1.rows.size() == 3);
    EXPECT_TRUE(v2.version == 2 && v2.width == 2048 && v2.height == 858 && v2.pixelAspect == 2.0 &&
                v2.firstFrame == -1 && v2.lastFrame == 0 && v2.order == PfbOrder::High && v2.squeeze == 2 &&
                v2.rows.size() == 2);

    const struct {
        const PfbFile &file;
        int frame;
        PfBarrelSettings want; // a low-order file drops c5; frames outside the table take its nearest row
    } cases[] = {
        {v1, 1002, {-0.051, 0, 0.501, 0.499, 1, 960, 540}}, {v1, 900, {-0.052, 0, 0.5, 0.5, 1, 960, 540}},
        {v1, 2000, {-0.05, 0, 0.502, 0.498, 1, 960, 540}},  {v2, -1, {-0.1, 0.02, 0.48, 0.52, 2, 1024, 429}},
        {v2, 0, {-0.11, 0.021, 0.47, 0.53, 2, 1024, 429}},
    };
    for (const auto &c : cases) {
        const PfBarrelSettings s = PfBarrelSettingsAt(c.file, c.frame, c.want.width, c.want.height);
        EXPECT_TRUE(s.lowOrder == c.want.lowOrder && s.highOrder == c.want.highOrder && s.centerX == c.want.centerX &&
                    s.centerY == c.want.centerY && s.squeeze == c.want.squeeze && s.width == c.want.width &&
                    s.height == c.want.height)
            << c.frame;
    }
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadPfbFile(dir / "missing.pfb"); }, "missing"), "failed to open file");
}

TEST(LensPfb, ParseErrorsTruncationAndGarbage) {
    const std::string head = "#PFBarrel 2011 v1\n1920 1080\n1 2\nLow Order\n1.5\n";
    const struct {
        std::string text, want;
    } cases[] = {
        {"", "unrecognized file version - \"\""},
        {"#PFBarrel 2011 v3\n1920 1080\n", "unrecognized file version - \"#PFBarrel 2011 v3\""},
        {"\x01PF\n", "unrecognized file version - \"?PF\""},
        {"#PFBarrel 2011 v1\n1920 1080\n1 1\nMedium Order\n1\n0 0 .5 .5 1\n",
         "unrecognized lens model - \"Medium Order\""},
        {"#PFBarrel 2011 v1\n1920\n", "expected a width and height in pixels - \"1920\""},
        {"#PFBarrel 2011 v1\n0 1080\n", "expected a width and height in pixels - \"0 1080\""},
        {"#PFBarrel 2011 v2\n1920 1080\nnan\n", "expected a pixel aspect - \"nan\""},
        {"#PFBarrel 2011 v1\n1920 1080\n5 4\n", "expected a first and last frame - \"5 4\""},
        {"#PFBarrel 2011 v1\n1920 1080\n0 2000000\n", "expected a first and last frame - \"0 2000000\""},
        {"#PFBarrel 2011 v1\n1920 1080\n1 1\nLow Order\n-1\n", "expected an anamorphic squeeze - \"-1\""},
        {head + "0 0 0.5 0.5\n", "bad table row - \"0 0 0.5 0.5\""},
        {head + "0 0 0.5 0.5 1.25\n", "bad table row - \"0 0 0.5 0.5 1.25\""},
        {head + "inf 0 0.5 0.5 1.5\n", "bad table row - \"inf 0 0.5 0.5 1.5\""},
        {head + "0 0 0.5 0.5 1.5\n", "unexpected end of file"},
        {head + "0 0 0.5 0.5 1.5\n0 0 0.5 0.5 1.5\n0 0 0 0 1.5\n", "text after the table - \"0 0 0 0 1.5\""},
        {"#PFBarrel 2011 v1\n" + std::string(5000, '7'), "line 2 is too long"},
    };
    for (const auto &c : cases) {
        std::istringstream in(c.text);
        EXPECT_EQ(ErrorOf<ParseError>([&] { ReadPfb(in); }, c.text), "parse error - " + c.want);
    }

    // Every cut of a file fails with a file error, or reads the same when it falls within the last number.
    for (const std::string &full : {V1Low, V2High}) {
        std::istringstream whole(full);
        const PfbFile want = ReadPfb(whole);
        for (std::size_t n = 0; n < full.size(); ++n) {
            std::istringstream in(full.substr(0, n));
            try {
                EXPECT_TRUE(Same(ReadPfb(in), want) && n > full.rfind(' ') + 1) << n;
            } catch (const Error &) {
            }
        }
    }
    // Random bytes after a good header, and on their own as lens data: errors, never anything worse.
    std::mt19937 random(7);
    for (int i = 0; i < 200; ++i) {
        std::string junk(random() % 400, ' ');
        for (char &c : junk) c = static_cast<char>(random());
        std::istringstream pfb("#PFBarrel 2011 v2\n" + junk), data(junk);
        EXPECT_THROW(ReadPfb(pfb), Error) << i;
        try {
            EXPECT_TRUE(ReadDataEntries(data, Params).empty()) << i;
        } catch (const Error &) {
        }
    }
}

} // namespace
} // namespace Orvane::lensfiles
