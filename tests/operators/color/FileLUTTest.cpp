// FileLUT: tables written here for exact known functions, at every depth; interpolation and direction; the canvas
// colour; files that cannot be read; and oiiotool applying the same file.
#include <algorithm>
#include <array>
#include <cmath>
#include <fstream>
#include <functional>
#include <string>

#include <gtest/gtest.h>

#include "host/color/ColorConfig.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::lut_test {
namespace {
namespace T = Orvane::Test;

using Rgb = std::array<double, 3>;
using Function = std::function<Rgb(const Rgb &)>;

double Clamp01(double v) { return std::clamp(v, 0.0, 1.0); }
// Tables clamp their input to the domain 0..1 they are written over.
Rgb Invert(const Rgb &c) { return {1 - Clamp01(c[0]), 1 - Clamp01(c[1]), 1 - Clamp01(c[2])}; }
Rgb Rotate(const Rgb &c) { return {Clamp01(c[2]), Clamp01(c[0]), Clamp01(c[1])}; }
Rgb Products(const Rgb &c) { return {c[0] * c[1], c[1] * c[2], c[2] * c[0]}; }

void Write(const std::string &path, const std::string &text) { std::ofstream(path) << text; }

/// A .cube 3D table of `n` points a side, red fastest.
std::string Cube3D(const Function &f, int n) {
    std::string t = "TITLE \"test\"\nLUT_3D_SIZE " + std::to_string(n) + "\n";
    for (int b = 0; b < n; ++b)
        for (int g = 0; g < n; ++g)
            for (int r = 0; r < n; ++r) {
                const Rgb o = f({r / (n - 1.0), g / (n - 1.0), b / (n - 1.0)});
                t += std::to_string(o[0]) + " " + std::to_string(o[1]) + " " + std::to_string(o[2]) + "\n";
            }
    return t;
}

/// An .spi3d table of 2 points a side, each line with its indices.
std::string Spi3D(const Function &f) {
    std::string t = "SPILUT 1.0\n3 3\n2 2 2\n";
    for (int r = 0; r < 2; ++r)
        for (int g = 0; g < 2; ++g)
            for (int b = 0; b < 2; ++b) {
                const Rgb o = f({1.0 * r, 1.0 * g, 1.0 * b});
                t += std::to_string(r) + " " + std::to_string(g) + " " + std::to_string(b) + " " +
                     std::to_string(o[0]) + " " + std::to_string(o[1]) + " " + std::to_string(o[2]) + "\n";
            }
    return t;
}

const char *const kInvert1DCube = "LUT_1D_SIZE 2\n1 1 1\n0 0 0\n";
const char *const kInvertSpi1D = "Version 1\nFrom 0.0 1.0\nLength 2\nComponents 1\n{\n 1.0\n 0.0\n}\n";

/// A document: an image source feeding a FileLUT.
struct Rig {
    OrvaneDoc doc;
    T::ImageSourceTool *source;
    Operator *lut;
    explicit Rig(Ref<Image> img) : source(T::AddImageSource(doc, "Src", std::move(img))) {
        lut = doc.AddTool(OvID("FileLUT"));
        EXPECT_TRUE(lut && lut->FindInput("Input")->ConnectTo(source->FindMainOutput()));
    }
    Ref<Image> Run(const std::string &file, int interpolation = 0, bool inverse = false) {
        T::SetText(lut, "LUTFile", file);
        T::SetNumbers(lut, {{"Interpolation", interpolation}, {"Direction", inverse ? 1.0 : 0.0}});
        EvalOptions opt;
        opt.useCache = false;
        return T::EvalImage(lut, 0.0, opt);
    }
};

/// A one-row float image of the given colours (alpha 0.5).
Ref<Image> Row(const std::vector<Rgb> &colours) {
    Ref<Image> img =
        NewImageTagList({{ImgWidth, static_cast<int>(colours.size())}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (size_t x = 0; x < colours.size(); ++x)
        img->PutFlt(static_cast<int>(x), 0,
                    {static_cast<float>(colours[x][0]), static_cast<float>(colours[x][1]),
                     static_cast<float>(colours[x][2]), 0.5f});
    return img;
}

class FileLUTTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    T::TempDir dir;
};

TEST_F(FileLUTTest, ExactFunctionsAtEveryDepth) {
    struct Case {
        const char *file;
        std::string text;
        Function f;
    };
    const Case cases[] = {
        {"invert.cube", Cube3D(Invert, 2), Invert}, {"rotate.cube", Cube3D(Rotate, 5), Rotate},
        {"invert1d.cube", kInvert1DCube, Invert},   {"invert.spi1d", kInvertSpi1D, Invert},
        {"rotate.spi3d", Spi3D(Rotate), Rotate},
    };
    for (const Case &c : cases) {
        Write(dir / c.file, c.text);
        for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
            SCOPED_TRACE(std::string(c.file) + " depth " + std::to_string(depth));
            Ref<Image> src = T::PatternImage(23, 7, depth, 3);
            Rig rig(src);
            Ref<Image> out = rig.Run(dir / c.file);
            ASSERT_TRUE(out);
            ASSERT_EQ(out->Depth(), depth);
            int wrong = 0;
            for (int y = 0; y < 7; ++y)
                for (int x = 0; x < 23; ++x) {
                    const FltPixel in = src->GetFlt(x, y), got = out->GetFlt(x, y);
                    const Rgb want = c.f({in.R, in.G, in.B});
                    // The model's value stored at the depth: integer and half results round once.
                    FltPixel stored{static_cast<float>(want[0]), static_cast<float>(want[1]),
                                    static_cast<float>(want[2]), in.A};
                    uint8_t bytes[16];
                    StoreFlt(depth, &stored, 1, bytes);
                    LoadFlt(depth, bytes, 1, &stored);
                    const double tol = depth == DepthRGBAFlt32 ? 1e-6 : 0.0;
                    const float g[4] = {got.R, got.G, got.B, got.A}, w[4] = {stored.R, stored.G, stored.B, stored.A};
                    for (int k = 0; k < 4; ++k) wrong += std::fabs(g[k] - w[k]) > tol;
                }
            EXPECT_EQ(wrong, 0);
        }
    }
}

TEST_F(FileLUTTest, InterpolationAndDirection) {
    Write(dir / "invert.spi1d", kInvertSpi1D);
    Write(dir / "rotate.cube", Cube3D(Rotate, 9));
    Write(dir / "products.cube", Cube3D(Products, 2));
    const std::vector<Rgb> colours = {{0.3, 0.7, 0.0}, {0.1, 0.55, 0.9}};
    struct Case {
        const char *file;
        int interpolation;
        bool inverse;
        std::vector<Rgb> want;
        double tol;
    };
    const Case cases[] = {
        // Products of channels from their values at the cube's corners: trilinear reading gives the products
        // themselves; tetrahedral weighs the four corners along the path of the sorted coordinates (for 0.3,
        // 0.7, 0: 000, 010, 110, 111 with weights 0.3, 0.4, 0.3, 0).
        {"products.cube", 1, false, {{0.21, 0, 0}, {0.055, 0.495, 0.09}}, 1e-6},
        {"products.cube", 2, false, {{0.3, 0, 0}, {0.1, 0.55, 0.1}}, 1e-6},
        {"invert.spi1d", 1, false, {{0.7, 0.3, 1}, {0.9, 0.45, 0.1}}, 1e-6},
        // Inverting 1 - x gives 1 - x again; the inverse of the rotation is found by search.
        {"invert.spi1d", 1, true, {{0.7, 0.3, 1}, {0.9, 0.45, 0.1}}, 1e-5},
        {"rotate.cube", 1, true, {{0.7, 0.0, 0.3}, {0.55, 0.9, 0.1}}, 1e-3},
        {"rotate.cube", 2, false, {{0.0, 0.3, 0.7}, {0.9, 0.1, 0.55}}, 1e-6},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.file) + " interpolation " + std::to_string(c.interpolation) +
                     (c.inverse ? " inverse" : ""));
        Rig rig(Row(colours));
        Ref<Image> out = rig.Run(dir / c.file, c.interpolation, c.inverse);
        ASSERT_TRUE(out);
        for (size_t x = 0; x < colours.size(); ++x)
            T::ExpectPixelNear(out->GetFlt(static_cast<int>(x), 0),
                               {static_cast<float>(c.want[x][0]), static_cast<float>(c.want[x][1]),
                                static_cast<float>(c.want[x][2]), 0.5f},
                               c.tol);
    }
}

TEST_F(FileLUTTest, CanvasColourRegionsAndRelativeNames) {
    Write(dir / "invert.cube", Cube3D(Invert, 2));
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1.f};
    Rig rig(T::WindowedImage(16, 8, ImgRectI(4, 2, 10, 6), canvas, 5, DepthRGBAFlt32));
    rig.doc.SetFilePath(dir / "flow.orvane"); // relative names are taken from the document's folder
    Ref<Image> out = rig.Run("invert.cube");
    ASSERT_TRUE(out) << T::ConsoleText(rig.doc);
    // A region of interest gives the same values as the same part of the whole frame.
    const ImgRectI roi(3, 1, 9, 5);
    EvalOptions opt;
    opt.useCache = false;
    opt.roi = ImageDomain(roi);
    Ref<Image> part = T::EvalImage(rig.lut, 0.0, opt);
    ASSERT_TRUE(part);
    for (int y = roi.y0; y < roi.y1; ++y)
        for (int x = roi.x0; x < roi.x1; ++x) EXPECT_EQ(part->GetFlt(x, y), out->GetFlt(x, y)) << x << "," << y;
    const FltPixel want{0.75f, 0.5f, 0.25f, 1.f};
    T::ExpectPixelNear(out->GetCanvasColor(), want, 1e-6, "canvas");
    T::ExpectPixelNear(out->GetFlt(1, 1), want, 1e-6, "beyond the window");
}

TEST_F(FileLUTTest, UnreadableFilesFailNamingThem) {
    Write(dir / "broken.cube", "LUT_3D_SIZE 2\n0 0 0\n1 1\n");
    Write(dir / "unknown.xyz", "0 1\n");
    for (const char *name : {"missing.cube", "broken.cube", "unknown.xyz"}) {
        SCOPED_TRACE(name);
        Rig rig(T::PatternImage(4, 4, DepthRGBAFlt32));
        EXPECT_FALSE(rig.Run(dir / name));
        const std::string console = T::ConsoleText(rig.doc);
        EXPECT_NE(console.find(rig.lut->Name() + ": cannot read LUT file '" + dir / name + "'"), std::string::npos)
            << console;
    }
    // No file named yet: nothing to do, the input is handed on.
    Ref<Image> src = T::PatternImage(4, 4, DepthRGBAFlt32);
    Rig rig(src);
    EXPECT_EQ(rig.Run("").Get(), src.Get());
}

TEST_F(FileLUTTest, SameAsOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // A smooth table with cross-talk between the channels, 17 points a side.
    const Function look = [](const Rgb &c) {
        return Rgb{std::pow(c[0], 0.8) * 0.9 + 0.1 * c[1], 0.2 * c[0] + 0.8 * std::sqrt(c[1]), c[2] * c[2]};
    };
    Write(dir / "look.cube", Cube3D(look, 17));
    Ref<Image> src = T::PatternImage(32, 16, DepthRGBAFlt32, 9);
    T::WritePfm(*src, dir / "in.pfm");
    // oiiotool reads a table only with a configuration at hand; ours serves.
    Write(dir / "builtin.ocio", ColorConfig::BuiltInText());
    ASSERT_TRUE(T::RunQuiet("oiiotool --colorconfig " + dir / "builtin.ocio" + " " + dir / "in.pfm" +
                            " --ociofiletransform " + dir / "look.cube" + " -o " + dir / "out.exr"));
    Ref<Image> theirs = T::ReadOiioDump(dir / "out.exr", 32, 16);
    ASSERT_TRUE(theirs);
    Rig rig(src);
    Ref<Image> ours = rig.Run(dir / "look.cube");
    ASSERT_TRUE(ours);
    double worst = 0;
    for (int y = 0; y < 16; ++y)
        for (int x = 0; x < 32; ++x) {
            const FltPixel a = ours->GetFlt(x, y), b = theirs->GetFlt(x, y);
            worst = std::max<double>({worst, std::fabs(a.R - b.R), std::fabs(a.G - b.G), std::fabs(a.B - b.B)});
        }
    EXPECT_LT(worst, 1e-5);
}

} // namespace
} // namespace Orvane::lut_test
