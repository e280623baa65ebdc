// GamutConvert: published conversion matrices, white kept between every pair of gamuts, curves by their formulas,
// and round trips.
#include <array>
#include <cmath>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::gamut_test {
namespace {
namespace T = Orvane::Test;

using Rgb = std::array<double, 3>;
enum Gamut { Rec709, Rec2020, DCIP3, DisplayP3, AP0, AP1 };
enum Curve { Linear, SRGB, Rec709Curve, Gamma, Cineon };

const std::vector<Rgb> kColours = {{1, 1, 1}, {0.18, 0.18, 0.18}, {1, 0, 0}, {0, 1, 0}, {0, 0, 1}, {0.3, 0.6, 0.1}};

Ref<Image> Row(const std::vector<Rgb> &colours) {
    Ref<Image> img =
        NewImageTagList({{ImgWidth, static_cast<int>(colours.size())}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (size_t x = 0; x < colours.size(); ++x)
        img->PutFlt(static_cast<int>(x), 0,
                    {static_cast<float>(colours[x][0]), static_cast<float>(colours[x][1]),
                     static_cast<float>(colours[x][2]), 1.f});
    return img;
}

struct Rig {
    OrvaneDoc doc;
    Operator *last;
    explicit Rig(const std::vector<Rgb> &colours) : last(T::AddImageSource(doc, "Src", Row(colours))) {}
    void Add(Gamut from, Curve fromCurve, Gamut to, Curve toCurve) {
        Operator *g = doc.AddTool(OvID("GamutConvert"));
        ASSERT_TRUE(g && g->FindInput("Input")->ConnectTo(last->FindMainOutput()));
        T::SetNumbers(
            g, {{"SourceGamut", from}, {"SourceCurve", fromCurve}, {"OutputGamut", to}, {"OutputCurve", toCurve}});
        last = g;
    }
    std::vector<Rgb> Run() {
        EvalOptions opt;
        opt.useCache = false;
        Ref<Image> out = T::EvalImage(last, 0.0, opt);
        std::vector<Rgb> got;
        EXPECT_TRUE(out) << T::ConsoleText(doc);
        if (!out) return got;
        for (int x = 0; x < out->Width(); ++x) {
            const FltPixel p = out->GetFlt(x, 0);
            got.push_back({p.R, p.G, p.B});
        }
        return got;
    }
};

void ExpectNear(const std::vector<Rgb> &got, const std::vector<Rgb> &want, double tol) {
    ASSERT_EQ(got.size(), want.size());
    for (size_t i = 0; i < got.size(); ++i)
        for (int c = 0; c < 3; ++c) EXPECT_NEAR(got[i][c], want[i][c], tol) << "colour " << i << " channel " << c;
}

std::vector<Rgb> Times(const double m[3][3], const std::vector<Rgb> &colours) {
    std::vector<Rgb> out;
    for (const Rgb &c : colours)
        out.push_back({m[0][0] * c[0] + m[0][1] * c[1] + m[0][2] * c[2],
                       m[1][0] * c[0] + m[1][1] * c[1] + m[1][2] * c[2],
                       m[2][0] * c[0] + m[2][1] * c[1] + m[2][2] * c[2]});
    return out;
}

class GamutConvertTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
};

TEST_F(GamutConvertTest, PublishedMatrices) {
    // BT.2087 (Rec.709 to Rec.2020, four places) and the ACES AP0 to AP1 matrix (ten places).
    const double bt2087[3][3] = {{0.6274, 0.3293, 0.0433}, {0.0691, 0.9195, 0.0114}, {0.0164, 0.0880, 0.8956}};
    const double ap0ToAp1[3][3] = {{1.4514393161, -0.2365107469, -0.2149285693},
                                   {-0.0765537734, 1.1762296998, -0.0996759264},
                                   {0.0083161484, -0.0060324498, 0.9977163014}};
    struct Case {
        Gamut from, to;
        const double (*m)[3];
        double tol;
    };
    for (const Case &c : {Case{Rec709, Rec2020, bt2087, 1e-4}, Case{AP0, AP1, ap0ToAp1, 2e-6}}) {
        Rig rig(kColours);
        rig.Add(c.from, Linear, c.to, Linear);
        ExpectNear(rig.Run(), Times(c.m, kColours), c.tol);
    }
}

TEST_F(GamutConvertTest, WhiteStaysWhiteBetweenEveryPair) {
    // The whites are adapted, so equal RGB (white and greys) stays equal RGB from any gamut to any other.
    for (int from = Rec709; from <= AP1; ++from)
        for (int to = Rec709; to <= AP1; ++to) {
            SCOPED_TRACE(std::to_string(from) + " -> " + std::to_string(to));
            Rig rig({{1, 1, 1}, {0.18, 0.18, 0.18}});
            rig.Add(static_cast<Gamut>(from), Linear, static_cast<Gamut>(to), Linear);
            ExpectNear(rig.Run(), {{1, 1, 1}, {0.18, 0.18, 0.18}}, 2e-6);
        }
}

TEST_F(GamutConvertTest, CurvesAndRoundTrips) {
    const auto srgb = [](double v) { return v <= 0.04045 ? v / 12.92 : std::pow((v + 0.055) / 1.055, 2.4); };
    Rig decode(kColours);
    decode.Add(Rec709, SRGB, Rec709, Linear);
    std::vector<Rgb> want;
    for (const Rgb &c : kColours) want.push_back({srgb(c[0]), srgb(c[1]), srgb(c[2])});
    ExpectNear(decode.Run(), want, 2e-5);

    Rig gamma({{0.5, 0.25, 1}});
    gamma.Add(Rec709, Gamma, Rec709, Linear); // the default gamma, 2.2
    ExpectNear(gamma.Run(), {{std::pow(0.5, 2.2), std::pow(0.25, 2.2), 1}}, 2e-5);

    struct Case {
        Gamut a;
        Curve ac;
        Gamut b;
        Curve bc;
    };
    const Case trips[] = {{Rec709, SRGB, AP1, Cineon},
                          {DisplayP3, Rec709Curve, Rec2020, Gamma},
                          {DCIP3, Gamma, AP0, Linear},
                          {Rec2020, Cineon, Rec709, SRGB}};
    for (const Case &c : trips) {
        SCOPED_TRACE(std::to_string(c.a) + "/" + std::to_string(c.ac) + " <-> " + std::to_string(c.b) + "/" +
                     std::to_string(c.bc));
        // Colours well inside every gamut, so that no step clamps.
        const std::vector<Rgb> colours = {{0.5, 0.5, 0.5}, {0.4, 0.5, 0.45}, {0.2, 0.3, 0.25}};
        Rig rig(colours);
        rig.Add(c.a, c.ac, c.b, c.bc);
        rig.Add(c.b, c.bc, c.a, c.ac);
        ExpectNear(rig.Run(), colours, 1e-4);
    }
}

} // namespace
} // namespace Orvane::gamut_test
