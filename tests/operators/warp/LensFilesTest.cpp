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
const std::vector<ParameterInfo> Params{{"tde4_focal_length_cm", T::Double},
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

/// The text of the error of kind `Kind` that `read` throws (another kind fails the test as uncaught).
template <typename Kind, typename Read> std::string ErrorOf(
    Read read, std::string (*describe)(const Kind &) = [](const Kind &e) { return std::string(e.what()); }) {
    try {
        read();
    } catch (const Kind &e) {
        return describe(e);
    }
    return "no error";
}

TEST(LensData, BothLayoutsWithLineEndsCommentsAndRepeats) {
    const std::pair<std::string, Values> cases[] = {
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
        {"", {}}};
    for (const auto &[text, want] : cases) EXPECT_EQ(ReadText(text), want) << text;

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
    const std::pair<std::string, std::string> cases[] = {
        {"Cx02 - Degree 2\n0.1\n", undefined},
        {"Degree 6 0.1\nDistortion - Degree 2 0.1 0.2\n", undefined},
        {"Degree 6 0.1\nDistortion - Degree 2\nabc\n", value("Distortion - Degree 2")},
        {"Distortion - Degree 2\nU - Degree 2\n0.1\n", value("Distortion - Degree 2")},
        {"Degree 6 0.1\nPhi - Cylindric Direction\n", value("Phi - Cylindric Direction")},
        {"Degree 6 nan", value("Degree 6")},
        {"Degree 6 1e999", value("Degree 6")},
        {"Degree 6 0x10", value("Degree 6")},
        {"Degree 6 +-1", value("Degree 6")},
        {"Samples 2.5", value("Samples")},
        {"Mirror maybe", value("Mirror")},
        {"Degree 6 0.1\n" + std::string(5000, 'x'), "parse error - line 2 is too long"}};
    for (const auto &c : cases) {
        int calls = 0;
        EXPECT_EQ(ErrorOf<Error>([&] { ReadText(c.first, &calls); }), c.second);
        EXPECT_EQ(calls, 0) << c.first;
    }
    const auto where = [](const UndefinedParameter &e) { return e.name() + " @" + std::to_string(e.line()); };
    EXPECT_EQ(ErrorOf<UndefinedParameter>([&] { ReadText("Degree 6 0.1\n\n# note\nbogus  entry 1\n"); }, where),
              "bogus entry 1 @4");

    // Entries built by a caller are checked against the list before anything is set.
    const std::vector<DataEntry> beyond{{0, 1.0}, {8, 1.0}}, mistyped{{5, 1.0}};
    const ParameterSetter never = [](std::size_t, const ParameterValue &) { ADD_FAILURE() << "set"; };
    EXPECT_EQ(ErrorOf<IndexOutOfRange>([&] { ApplyDataEntries(beyond, Params, never); }),
              "ldpk::error: index 8 out of range, range [0, 7]");
    EXPECT_EQ(ErrorOf<CouldNotReadValue>([&] { ApplyDataEntries(mistyped, Params, never); }), value("Samples"));
    PfBarrelSettings pf;
    EXPECT_EQ(ErrorOf<IndexOutOfRange>([&] { PfBarrelSetter(pf)(5, 1.0); }),
              "ldpk::error: index 5 out of range, range [0, 4]");
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadDataFile("/nonexistent/lens.data", Params, never); }),
              "failed to open file");
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadDataFile("/tmp", Params, never); }), "failed to open file");
}

const std::string V1Low = "#PFBarrel 2011 v1\n1920 1080\n1001 1003\nLow Order\n1.0\n"
                          "-0.052 0.01 0.5 0.5 1.0\n-0.051 0.01 0.501 0.499 1.0\n-0.05 0.01 0.502 0.498 1\n";
const std::string V2High = "#PFBarrel 2011 v2\r\n2048\t858\r\n2.0\r\n-1 0\r\n\r\nHigh Order\r\n2\r\n"
                           "-0.1, 0.02, 0.48, 0.52, 2\r\n-0.11, 0.021, 0.47, 0.53, 2.0\r\n";

TEST(LensPfb, VersionsAndOrdersFromDisk) {
    Orvane::Test::TempDir dir;
    for (const auto &[name, text] : {std::pair{"v1.pfb", V1Low}, std::pair{"v2.pfb", V2High}})
        std::ofstream(dir / name, std::ios::binary) << text;
    const PfbFile v1 = ReadPfbFile(dir / "v1.pfb"), v2 = ReadPfbFile(dir / "v2.pfb");
    const auto fields = [](const PfbFile &f) {
        return std::tuple(f.version, f.width, f.height, f.pixelAspect, f.firstFrame, f.lastFrame, f.order, f.squeeze);
    };
    EXPECT_EQ(fields(v1), std::tuple(1, 1920, 1080, 1.0, 1001, 1003, PfbOrder::Low, 1.0));
    EXPECT_EQ(fields(v2), std::tuple(2, 2048, 858, 2.0, -1, 0, PfbOrder::High, 2.0));
    // A low-order file drops c5; frames outside the table take its nearest row.
    const auto key = [](const PfBarrelSettings &s) {
        return std::tuple(s.lowOrder, s.highOrder, s.centerX, s.centerY, s.squeeze, s.width, s.height);
    };
    for (const auto &[file, frame, want] :
         {std::tuple(&v1, 1002, PfBarrelSettings{-0.051, 0, 0.501, 0.499, 1, 960, 540}),
          std::tuple(&v1, 900, PfBarrelSettings{-0.052, 0, 0.5, 0.5, 1, 960, 540}),
          std::tuple(&v1, 2000, PfBarrelSettings{-0.05, 0, 0.502, 0.498, 1, 960, 540}),
          std::tuple(&v2, -1, PfBarrelSettings{-0.1, 0.02, 0.48, 0.52, 2, 1024, 429}),
          std::tuple(&v2, 0, PfBarrelSettings{-0.11, 0.021, 0.47, 0.53, 2, 1024, 429})})
        EXPECT_EQ(key(PfBarrelSettingsAt(*file, frame, want.width, want.height)), key(want)) << frame;
    EXPECT_EQ(ErrorOf<ParseError>([&] { ReadPfbFile(dir / "missing.pfb"); }), "failed to open file");
}

TEST(LensPfb, ParseErrorsTruncationAndGarbage) {
    const std::string head = "#PFBarrel 2011 v1\n1920 1080\n1 2\nLow Order\n1.5\n";
    const std::pair<std::string, std::string> cases[] = {
        {"", "unrecognized file version - \"\""},
        {"#PFBarrel 2011 v3\n1920 1080\n", "unrecognized file version - \"#PFBarrel 2011 v3\""},
        {"\x01PF\n", "unrecognized file version - \"?PF\""},
        {"#PFBarrel 2011 v1\n1920 1080\n1 1\nMedium Order\n1\n0 0 .5 .5 1\n",
         "unrecognized lens model - \"Medium Order\""},
        {"#PFBarrel 2011 v1\n1920\n", "expected a width and height in pixels - \"1920\""},
        {"#PFBarrel 2011 v2\n1920 1080\nnan\n", "expected a pixel aspect - \"nan\""},
        {"#PFBarrel 2011 v1\n1920 1080\n5 4\n", "expected a first and last frame - \"5 4\""},
        {"#PFBarrel 2011 v1\n1920 1080\n1 1\nLow Order\n-1\n", "expected an anamorphic squeeze - \"-1\""},
        {head + "0 0 0.5 0.5\n", "bad table row - \"0 0 0.5 0.5\""},
        {head + "0 0 0.5 0.5 1.25\n", "bad table row - \"0 0 0.5 0.5 1.25\""},
        {head + "0 0 0.5 0.5 1.5\n", "unexpected end of file"},
        {head + "0 0 0.5 0.5 1.5\n0 0 0.5 0.5 1.5\n0 0 0 0 1.5\n", "text after the table - \"0 0 0 0 1.5\""},
        {"#PFBarrel 2011 v1\n" + std::string(5000, '7'), "line 2 is too long"}};
    for (const auto &[text, want] : cases) {
        std::istringstream in(text);
        EXPECT_EQ(ErrorOf<ParseError>([&] { ReadPfb(in); }), "parse error - " + want) << text;
    }

    // Every cut of a file fails with a file error, or reads the same when it falls within the last number.
    for (const std::string &full : {V1Low, V2High})
        for (std::size_t n = 0; n < full.size(); ++n) {
            std::istringstream in(full.substr(0, n));
            if (n <= full.rfind(' ') + 1)
                EXPECT_THROW(ReadPfb(in), Error) << n;
            else
                EXPECT_EQ(ReadPfb(in).rows.size(), 2u + (full == V1Low)) << n;
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
