#include "host/color/ColorConfig.h"
#include "tests/operators/color/ColorTestSupport.h"

namespace Orvane::colortest::filelut {

using Function = std::function<Rgb(const Rgb &)>;

double Clamp01(double v) { return std::clamp(v, 0.0, 1.0); }
// Tables clamp their input to the domain 0..1 they are written over.
Rgb Invert(const Rgb &c) { return {1 - Clamp01(c[0]), 1 - Clamp01(c[1]), 1 - Clamp01(c[2])}; }
Rgb Rotate(const Rgb &c) { return {Clamp01(c[2]), Clamp01(c[0]), Clamp01(c[1])}; }
Rgb Products(const Rgb &c) { return {c[0] * c[1], c[1] * c[2], c[2] * c[0]}; }

/// A .cube 3D table of `n` points a side (red fastest), or an .spi3d table (`spi`, each line with its indices).
std::string Table3D(const Function &f, int n, bool spi = false) {
    std::string t = spi ? "SPILUT 1.0\n3 3\n2 2 2\n" : "LUT_3D_SIZE " + std::to_string(n) + "\n";
    for (int i = 0; i < n * n * n; ++i) {
        const int r = spi ? i / (n * n) : i % n, g = i / n % n, b = spi ? i % n : i / (n * n);
        const Rgb o = f({r / (n - 1.0), g / (n - 1.0), b / (n - 1.0)});
        if (spi) t += std::to_string(r) + " " + std::to_string(g) + " " + std::to_string(b) + " ";
        t += std::to_string(o[0]) + " " + std::to_string(o[1]) + " " + std::to_string(o[2]) + "\n";
    }
    return t;
}

const char *const kInvertSpi1D = "Version 1\nFrom 0.0 1.0\nLength 2\nComponents 1\n{\n 1.0\n 0.0\n}\n";

class FileLUTTest : public ToolTest {};

TEST_F(FileLUTTest, ExactFunctionsAtEveryDepth) {
    const std::tuple<const char *, std::string, Function> cases[] = {
        {"invert.cube", Table3D(Invert, 2), Invert},
        {"rotate.cube", Table3D(Rotate, 5), Rotate},
        {"invert1d.cube", "LUT_1D_SIZE 2\n1 1 1\n0 0 0\n", Invert},
        {"invert.spi1d", kInvertSpi1D, Invert},
        {"rotate.spi3d", Table3D(Rotate, 2, true), Rotate},
    };
    for (const auto &[name, text, f] : cases) {
        const std::string file = Write(name, text);
        for (int depth : {DepthRGBAInt8, DepthRGBAInt16, DepthRGBAFlt16, DepthRGBAFlt32}) {
            SCOPED_TRACE(std::string(name) + " depth " + std::to_string(depth));
            Ref<Image> src = T::PatternImage(23, 7, depth, 3);
            Chain chain(src);
            chain.Add("FileLUT", {{"LUTFile", file}});
            Ref<Image> out = chain.Run();
            ASSERT_TRUE(out && out->Depth() == depth);
            // The function's value stored at the depth (integers and halves round once); alpha passes.
            Ref<Image> want = T::PatternImage(23, 7, depth, 3);
            for (int y = 0; y < 7; ++y)
                for (int x = 0; x < 23; ++x) {
                    const FltPixel in = src->GetFlt(x, y);
                    const Rgb w = f({in.R, in.G, in.B});
                    want->PutFlt(x, y, {float(w[0]), float(w[1]), float(w[2]), in.A});
                }
            EXPECT_LE(WorstDifference(*out, *want, want->DataWindow(), 4), depth == DepthRGBAFlt32 ? 1e-6 : 0.0);
        }
    }
}

TEST_F(FileLUTTest, InterpolationAndDirection) {
    const std::string spi1d = Write("invert.spi1d", kInvertSpi1D), rotate = Write("rotate.cube", Table3D(Rotate, 9)),
                      products = Write("products.cube", Table3D(Products, 2));
    const std::tuple<std::string, int, bool, std::vector<Rgb>, double> cases[] = {
        // Products of channels from their values at the cube's corners: trilinear reading gives the products
        // themselves; tetrahedral weighs the four corners along the path of the sorted coordinates (for 0.3,
        // 0.7, 0: 000, 010, 110, 111 with weights 0.3, 0.4, 0.3, 0).
        {products, 1, false, {{0.21, 0, 0}, {0.055, 0.495, 0.09}}, 1e-6},
        {products, 2, false, {{0.3, 0, 0}, {0.1, 0.55, 0.1}}, 1e-6},
        // Inverting 1 - x gives 1 - x again; the inverse of the rotation is found by search.
        {spi1d, 1, true, {{0.7, 0.3, 1}, {0.9, 0.45, 0.1}}, 1e-5},
        {rotate, 1, true, {{0.7, 0.0, 0.3}, {0.55, 0.9, 0.1}}, 1e-3},
    };
    for (const auto &[file, interpolation, inverse, want, tol] : cases) {
        SCOPED_TRACE(file + " " + std::to_string(interpolation) + (inverse ? " inverse" : ""));
        Chain chain(ColourRow({{0.3, 0.7, 0.0}, {0.1, 0.55, 0.9}}));
        chain.Add("FileLUT", {{"LUTFile", file}}, {{"Interpolation", interpolation}, {"Direction", inverse}});
        ExpectColoursNear(chain.Run(), want, tol);
    }
}

TEST_F(FileLUTTest, RelativeNamesAndFilesThatCannotBeRead) {
    Write("invert.cube", Table3D(Invert, 2));
    Write("broken.cube", "LUT_3D_SIZE 2\n0 0 0\n1 1\n");
    Write("unknown.xyz", "0 1\n");
    for (const char *name : {"missing.cube", "broken.cube", "unknown.xyz"}) {
        Chain chain(T::PatternImage(4, 4, DepthRGBAFlt32));
        Operator *lut = chain.Add("FileLUT", {{"LUTFile", dir / name}});
        ExpectFailure(chain.Run(), chain.doc, lut->Name() + ": cannot read LUT file '" + dir / name + "'");
    }
    // No file named yet: nothing to do, the input is handed on. A relative name is found in the document's folder.
    Ref<Image> src = ColourRow({{0.25, 0.5, 1}});
    Chain chain(src, "FileLUT");
    EXPECT_EQ(chain.Run().Get(), src.Get());
    chain.doc.SetFilePath(dir / "flow.orvane");
    T::SetText(chain.last, "LUTFile", "invert.cube");
    ExpectColoursNear(chain.Run(), {{0.75, 0.5, 0}}, 1e-6);
}

TEST_F(FileLUTTest, SameAsOiiotool) {
    if (!T::HaveProgram("oiiotool")) GTEST_SKIP() << "oiiotool is not installed";
    // A smooth table with cross-talk between the channels, 17 points a side. oiiotool reads a table only with a
    // configuration at hand; ours serves.
    const std::string cube = Write(
        "look.cube",
        Table3D(
            [](const Rgb &c) {
                return Rgb{std::pow(c[0], 0.8) * 0.9 + 0.1 * c[1], 0.2 * c[0] + 0.8 * std::sqrt(c[1]), c[2] * c[2]};
            },
            17));
    const std::string config = Write("builtin.ocio", ColorConfig::BuiltInText());
    Ref<Image> src = T::PatternImage(32, 16, DepthRGBAFlt32, 9);
    Ref<Image> theirs = ThroughOiiotool(*src, dir.path, "--colorconfig " + config + " --ociofiletransform " + cube);
    ASSERT_TRUE(theirs);
    Chain chain(src);
    chain.Add("FileLUT", {{"LUTFile", cube}});
    Ref<Image> ours = chain.Run();
    ASSERT_TRUE(ours);
    EXPECT_LT(WorstDifference(*ours, *theirs, ours->DataWindow()), 1e-5);
}

} // namespace Orvane::colortest::filelut
