// Lens Distort: the distortion map against the radial model written out here, the undistort-distort round trip on
// a coordinate image, windows against a dense walk of the boundary, regions of interest, supersampling on a
// checkerboard, divergent rows, narrow images, and lens files through the load command.
#include <cmath>
#include <fstream>
#include <functional>

#include "host/flow/ControlCommand.h"
#include "host/flow/OrvaneDoc.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::LensT {
namespace {

constexpr const char *kRadial = "DE4RadialStandardDegree4";
constexpr const char *kC2 = "DE4RadialStandardDegree4.DistortionDegree2";
constexpr const char *kC4 = "DE4RadialStandardDegree4.QuarticDistortionDegree4";
// The default aperture, 0.980 x 0.735 in: a 4:3 filmback, so on a 4:3 image the width fits, x / W normalised.
constexpr double kFbW = 0.980 * 2.54, kFbH = 0.735 * 2.54;

/// The radial model's direct function (distorted to undistorted) in pixels of a W x H image, from its formula:
/// unit coordinates over half the filmback diagonal, K = 1 + c2 r^2 + c4 r^4.
struct Radial {
    double c2, c4;
    int w, h;
    void Direct(double x, double y, double &ox, double &oy) const {
        const double r = 0.5 * std::hypot(kFbW, kFbH);
        const double u = (x / w - 0.5) * kFbW / r, v = (y / h - 0.5) * kFbH / r;
        const double r2 = u * u + v * v, k = 1 + c2 * r2 + c4 * r2 * r2;
        ox = (k * u * r / kFbW + 0.5) * w;
        oy = (k * v * r / kFbH + 0.5) * h;
    }
};

Ref<Image> ImageOf(int w, int h, const std::function<FltPixel(int, int)> &f) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) *reinterpret_cast<FltPixel *>(img->PixelAddress(x, y)) = f(x, y);
    return img;
}

/// Red and green hold the pixel centre's position: bilinear reads give back the position they read at.
Ref<Image> CoordinateImage(int w, int h) {
    return ImageOf(w, h, [](int x, int y) { return FltPixel{x + 0.5f, y + 0.5f, 0.f, 1.f}; });
}

class LensTool : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    Operator *Make(Operator *src, double c2, double c4, int mode) {
        Operator *lens = AddTool(doc, "LensDistort", src, {{"Mode", mode}});
        SetID(lens, "Model", kRadial);
        SetNumbers(lens, {{kC2, c2}, {kC4, c4}});
        return lens;
    }
    OrvaneDoc doc;
};

// The map of Distort holds the direct function's offsets, of Undistort the inverse's (checked by sending the
// result back through the direct function); both within float precision. Edges and the sampler do not enter it.
TEST_F(LensTool, DistortionMapsHoldTheModelsOffsets) {
    const int W = 160, H = 120;
    const Radial model{-0.06, 0.015, W, H};
    Operator *src = AddProbe(doc, CoordinateImage(W, H));
    for (int mode : {0, 1}) {
        SCOPED_TRACE(mode);
        Operator *lens = Make(src, model.c2, model.c4, mode);
        SetNumbers(lens, {{"OutputDistortionMap", 1}, {"EdgeMode", 1}, {"SubsampleMode", 0}});
        Ref<Image> map = Render(lens);
        ASSERT_TRUE(Sized(map, W, H));
        EXPECT_EQ(map->DataWindow(), ImgRectI(0, 0, W, H));
        double worst = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                const FltPixel m = map->GetFlt(x, y);
                const double px = x + 0.5, py = y + 0.5;
                double fx, fy;
                if (mode == 0) {
                    model.Direct(px, py, fx, fy);
                    worst = std::max({worst, std::fabs(m.R - (fx - px)), std::fabs(m.G - (fy - py))});
                } else {
                    model.Direct(px + m.R, py + m.G, fx, fy); // the source position goes back to the sample
                    worst = std::max({worst, std::fabs(fx - px), std::fabs(fy - py)});
                }
                ASSERT_EQ(m.B, 0.f);
                ASSERT_EQ(m.A, 1.f);
            }
        EXPECT_LT(worst, 1e-3) << "pixels";
    }
}

// Undistort then Distort with the same lens, on the coordinate image: every pixel well inside the frame reads
// back its own position within a hundredth of a pixel, at 1 x 1 and 2 x 2.
TEST_F(LensTool, UndistortThenDistortReturnsEveryPosition) {
    const int W = 200, H = 150;
    Operator *src = AddProbe(doc, CoordinateImage(W, H));
    for (int ss : {0, 1}) {
        SCOPED_TRACE(ss);
        Operator *undo = Make(src, -0.05, 0.01, 1);
        Operator *redo = Make(undo, -0.05, 0.01, 0);
        SetNumber(undo, "Supersampling", ss);
        SetNumber(redo, "Supersampling", ss);
        Ref<Image> out = Render(redo);
        ASSERT_TRUE(Sized(out, W, H));
        double worst = 0;
        for (int y = 10; y < H - 10; ++y)
            for (int x = 10; x < W - 10; ++x) {
                const FltPixel p = out->GetFlt(x, y);
                worst = std::max({worst, std::fabs(p.R - (x + 0.5)), std::fabs(p.G - (y + 0.5))});
            }
        EXPECT_LT(worst, 0.01) << "pixels";
    }
}

// The output window is the box of the mapped input window: it holds the box of a boundary walked every quarter
// pixel by the model written here, within two pixels. With c2 < 0 the undistorted frame shrinks and the distorted
// one spreads beyond the frame. Regions of interest give the whole render's pixels.
TEST_F(LensTool, WindowsHoldTheMappedBoundaryAndRegionsMatch) {
    const int W = 120, H = 90;
    const Radial model{-0.08, 0.0, W, H};
    Operator *src = AddProbe(doc, PatternImage(W, H, DepthRGBAFlt32));
    // Distort reads the source at the direct map: its window is where the direct map lands inside the frame, and
    // Undistort's window is the direct map's image of the frame.
    double minX = 1e9, minY = 1e9, maxX = -1e9, maxY = -1e9;
    for (int k = 0; k <= 4 * (W + H); ++k) {
        const double t = k / 4.0;
        const double pts[4][2] = {{std::min(t, double(W)), 0},
                                  {std::min(t, double(W)), H},
                                  {0, std::min(t, double(H))},
                                  {W, std::min(t, double(H))}};
        for (const auto &p : pts) {
            double fx, fy;
            model.Direct(p[0], p[1], fx, fy);
            minX = std::min(minX, fx), maxX = std::max(maxX, fx), minY = std::min(minY, fy), maxY = std::max(maxY, fy);
        }
    }
    Operator *undo = Make(src, model.c2, 0.0, 1);
    SetID(undo, "ClippingMode", "ClippingMode_None");
    const ImgRectI dw = Render(undo)->DataWindow();
    EXPECT_LE(dw.x0, std::floor(minX)) << RectText(dw);
    EXPECT_LE(dw.y0, std::floor(minY));
    EXPECT_GE(dw.x1, std::ceil(maxX));
    EXPECT_GE(dw.y1, std::ceil(maxY));
    EXPECT_GE(dw.x0, std::floor(minX) - 2);
    EXPECT_LE(dw.x1, std::ceil(maxX) + 2);
    EXPECT_GT(dw.x0, 0); // c2 < 0 pulls undistorted positions in: the frame's image lies inside it
    EXPECT_EQ(Shape(undo)->DataWindow(), dw);
    SetID(undo, "ClippingMode", "ClippingMode_Frame");
    EXPECT_EQ(Render(undo)->DataWindow(), dw & ImgRectI(0, 0, W, H));
    ExpectRegionsMatchWhole(undo, {ImgRectI(0, 0, 20, 15), ImgRectI(50, 40, 70, 60), ImgRectI(100, 70, 120, 90)});

    Operator *distort = Make(src, model.c2, 0.0, 0);
    const ImgRectI inner = Render(distort)->DataWindow();
    EXPECT_LT(inner.x0, 0) << RectText(inner); // and the distorted frame spreads beyond it
    EXPECT_GT(inner.x1, W);
    ExpectRegionsMatchWhole(distort, {ImgRectI(0, 0, 20, 15), ImgRectI(50, 40, 70, 60), ImgRectI(60, 0, 120, 10)});
}

// A checkerboard of 1-pixel squares squeezed towards the edges (c2 > 0 reads further out) aliases at one sample
// per pixel (mean error against the 8 x 8 result 0.32); 2 x 2 cuts it to under half (0.09), 4 x 4 that again
// to under 0.6 of it (0.05).
TEST_F(LensTool, SupersamplingRemovesAliasing) {
    const int W = 128, H = 96;
    Operator *src = AddProbe(doc, ImageOf(W, H, [](int x, int y) {
                                 const float v = ((x + y) % 2) ? 1.f : 0.f;
                                 return FltPixel{v, v, v, 1.f};
                             }));
    Operator *lens = Make(src, 0.3, 0.0, 0);
    SetNumbers(lens, {{"SubsampleMode", 0}, {"Supersampling", 3}, {"EdgeMode", 1}});
    Ref<Image> truth = Render(lens);
    std::vector<double> errors;
    for (int ss : {0, 1, 2}) {
        SetNumber(lens, "Supersampling", ss);
        Ref<Image> out = Render(lens);
        double err = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) err += std::fabs(out->GetFlt(x, y).R - truth->GetFlt(x, y).R);
        errors.push_back(err / (W * H));
    }
    EXPECT_GT(errors[0], 0.2) << "one sample per pixel aliases";
    EXPECT_LT(errors[1], 0.5 * errors[0]);
    EXPECT_LT(errors[2], 0.6 * errors[1]);
}

// Strong barrel distortion has no inverse beyond the fold of r (1 - 0.5 r^2): undistorted rows keep their middle
// and are cleared from the first diverged pixel outward; images narrower than three pixels stay cleared.
TEST_F(LensTool, DivergedRowsAndNarrowImagesAreCleared) {
    const int W = 160, H = 120;
    Operator *src = AddProbe(doc, FlatImage(W, H, DepthRGBAFlt32, {0.5f, 0.5f, 0.5f, 1.f}));
    Operator *lens = Make(src, -0.5, 0.0, 1);
    SetID(lens, "ClippingMode", "ClippingMode_Frame");
    Ref<Image> out = Render(lens);
    ASSERT_TRUE(Sized(out, W, H));
    const int y = H / 2;
    EXPECT_EQ(out->GetFlt(W / 2, y).A, 1.f);
    int firstCleared = -1;
    for (int x = W / 2; x < W; ++x)
        if (out->GetFlt(x, y).A == 0.f) {
            firstCleared = x;
            break;
        }
    ASSERT_GT(firstCleared, W / 2);
    for (int x = firstCleared; x < W; ++x) ASSERT_EQ(out->GetFlt(x, y).A, 0.f) << x;

    Operator *narrow =
        Make(AddProbe(doc, FlatImage(2, 10, DepthRGBAFlt32, {1.f, 1.f, 1.f, 1.f}), "Narrow"), -0.1, 0, 0);
    Ref<Image> thin = Render(narrow);
    ASSERT_TRUE(Sized(thin, 2, 10));
    for (int j = 0; j < 10; ++j)
        for (int i = 0; i < 2; ++i) EXPECT_EQ(thin->GetFlt(i, j).A, 0.f);
}

// Lens files through the load command: a ".data" file sets the chosen model's parameters and the camera (focal
// length in mm, aperture in inches, lens shift from the centre offset), and renders as the same values typed in;
// a ".pfb" table of three frames becomes keys; bad files change nothing and say why.
TEST_F(LensTool, LensFilesLoadIntoTheInputs) {
    TempDir dir;
    const int W = 120, H = 90;
    Operator *src = AddProbe(doc, CoordinateImage(W, H));
    Operator *lens = Make(src, 0.0, 0.0, 0);
    auto load = [&](const std::string &name, const std::string &text) {
        std::ofstream(dir / name) << text;
        std::string error;
        const std::string path = dir / name;
        EXPECT_TRUE(lens->ControlCommand(CCMD_LoadFile, {{CCMD_FileName, static_cast<const void *>(path.c_str())},
                                                         {CCMD_FileError, static_cast<void *>(&error)}}));
        return error;
    };
    EXPECT_EQ(load("a.data", "tde4_focal_length_cm 5\ntde4_filmback_width_cm 2.54\ntde4_filmback_height_cm 1.905\n"
                             "tde4_lens_center_offset_x_cm 0.1\nDistortion - Degree 2\n-0.04\n"
                             "Quartic Distortion - Degree 4 0.01\n"),
              "");
    EXPECT_DOUBLE_EQ(Control(lens, kC2), -0.04);
    EXPECT_DOUBLE_EQ(Control(lens, kC4), 0.01);
    EXPECT_DOUBLE_EQ(Control(lens, "FocalLength"), 50.0);
    EXPECT_DOUBLE_EQ(Control(lens, "ApertureWidth"), 1.0);
    EXPECT_DOUBLE_EQ(Control(lens, "ApertureHeight"), 0.75);
    EXPECT_DOUBLE_EQ(Control(lens, "LensShiftX"), 0.1);
    Ref<Image> loaded = Render(lens);
    // The file's aperture holds with the user gate only: a standard gate brings its own (0.980 x 0.735 in), as
    // typing that aperture for the user gate does.
    SetID(lens, "FilmGate", "FilmGate_35mmFullAperture");
    Ref<Image> standard = Render(lens);
    SetID(lens, "FilmGate", "FilmGate_User");
    SetNumbers(lens, {{"ApertureWidth", 0.98}, {"ApertureHeight", 0.735}});
    ExpectSamePixels(*Render(lens), *standard, ImgRectI(0, 0, W, H), "standard gate");
    // (An aperture of another aspect fits the frame otherwise, and bends it otherwise.)
    SetNumbers(lens, {{"ApertureWidth", 1.0}, {"ApertureHeight", 0.5}});
    EXPECT_GT(std::fabs(Render(lens)->GetFlt(100, 70).R - standard->GetFlt(100, 70).R), 1e-3);
    SetNumbers(lens, {{"ApertureWidth", 1.0}, {"ApertureHeight", 0.75}});

    // A bad file: nothing changes, and the reason names the file.
    for (const auto &[name, text] : std::vector<std::pair<std::string, std::string>>{
             {"b.data", "Distortion - Degree 2 -0.3\nno such parameter 1\n"},
             {"c.data", "Distortion - Degree 2\nx\n"}}) {
        const std::string error = load(name, text);
        EXPECT_NE(error.find("cannot load lens data \"" + (dir / name) + "\""), std::string::npos) << error;
        EXPECT_DOUBLE_EQ(Control(lens, kC2), -0.04);
    }
    EXPECT_NE(load("b.data", "bogus 1\n").find("undefined parameter 'bogus 1' at line 1"), std::string::npos);
    ExpectSamePixels(*Render(lens), *loaded, ImgRectI(0, 0, W, H), "after bad files");

    SetID(lens, "Model", "PFTrack");
    EXPECT_EQ(load("a.pfb", "#PFBarrel 2011 v2\n120 90\n1.0\n3 5\nHigh Order\n1.0\n"
                            "0.01 0.001 0.5 0.5 1.0\n0.02 0.002 0.5 0.5 1.0\n0.03 0.003 0.5 0.5 1.0\n"),
              "");
    const Input *low = lens->FindInput("PFTrack.LowOrderDistortion");
    ASSERT_TRUE(low && low->IsAnimated());
    for (int f = 3; f <= 5; ++f)
        EXPECT_DOUBLE_EQ(dynamic_cast<const Number *>(low->ValueAt(f).Get())->value, 0.01 * (f - 2)) << f;
    EXPECT_NE(load("b.pfb", "#PFBarrel 2012 v1\n").find("unrecognized file version"), std::string::npos);
}

} // namespace
} // namespace Orvane::WarpTest::LensT
