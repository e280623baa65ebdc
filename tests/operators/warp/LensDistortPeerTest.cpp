// Lens Distort beside OpenCV. The radial degree 4 model with only its two radial terms set is OpenCV's radial
// model (k1, k2) under a camera matrix worked out below, so OpenCV's own map and bilinear remap, run on the same
// image by bench/peers/opencv_lens_remap.py, must give the tool's pixels: Distort against the map of
// initUndistortRectifyMap, Undistort against the inverse that undistortPointsIter iterates, at 1 x 1 and 2 x 2.
#include <cmath>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "host/flow/OrvaneDoc.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::LensPeerT {
namespace {

// The mapping, derived. The tool's filmback (w_fb x h_fb) lies over the W x H image at s filmback units per pixel
// (the fit: s = w_fb / W when the width fits, h_fb / H when the height does; one and the same when the aspects
// agree) and centred on it. The model works in unit coordinates over half the filmback diagonal r_fb, so pixel p
// (rows from the bottom, centres at + 0.5) has u = (p.x - W / 2) / f, v = (p.y - H / 2) / f with f = r_fb / s
// pixels: half the image diagonal when the aspects agree. Its direct function, which Distort reads the source at,
// is D(p) = (W / 2, H / 2) + f (u, v) (1 + c2 r^2 + c4 r^4), r^2 = u^2 + v^2.
//
// OpenCV's pixel (a, b) has its centre on whole numbers, rows from the top: it is our p = (a + 0.5, H - 0.5 - b).
// Its map reads the source at (cx + fx x K, cy + fy y K), x = (a - cx) / fx, y = (b - cy) / fy, with
// K = 1 + k1 r^2 + k2 r^4. With fx = fy = f, cx = W / 2 - 0.5 and cy = H / 2 - 0.5, x = u and y = -v: the same
// radius, so with k1 = c2 and k2 = c4 the same K, and the read position (W / 2 - 0.5 + f u K, H / 2 - 0.5 - f v K)
// is D(p) in OpenCV's pixels. The y flip changes nothing radial. Undistort reads at D's inverse: OpenCV's
// undistortPointsIter solves x K(x) = given for x, which is that inverse.
//
// Both read bilinearly between the same four pixels. OpenCV's remap rounds the read position to 1/32 of a pixel
// (its fixed-point interpolation table), an error of at most 1/64 on each axis; along an axis the bilinear value
// moves by at most the range of the four pixels per pixel, so the two results may differ by up to that range / 32
// (averaged over the samples of a pixel at 2 x 2). OpenCV's float maps (a relative 6e-8) and our float weights add
// far less; 1e-5 covers them.
struct Case {
    const char *what;
    int w, h;
    double apertureW, apertureH; // inches
    const char *fit;
    bool widthFits;
    double c2, c4;
    int mode, edge, samples; // Distort 0 / Undistort 1; Canvas 0 / Duplicate 1; per axis
};

const Case kCases[] = {
    {"4:3 barrel, canvas", 160, 120, 0.980, 0.735, "FMID_Inside", true, -0.08, 0.01, 0, 0, 1},
    {"16:9 pincushion reads past the edges, duplicate", 192, 108, 1.6, 0.9, "FMID_Inside", true, 0.06, -0.01, 0, 1, 1},
    {"16:9 pincushion, canvas, 2x2", 192, 108, 1.6, 0.9, "FMID_Inside", true, 0.06, 0.02, 0, 0, 2},
    {"portrait barrel, duplicate", 90, 160, 0.9, 1.6, "FMID_Inside", true, -0.05, 0.0, 0, 1, 1},
    {"4:3 filmback, height fits a 16:9 image", 192, 108, 0.980, 0.735, "FMID_Height", false, -0.06, 0.008, 0, 0, 1},
    {"4:3 filmback, width fits a 16:9 image", 192, 108, 0.980, 0.735, "FMID_Width", true, 0.04, 0.0, 0, 1, 1},
    {"undistort 4:3 barrel, canvas", 160, 120, 0.980, 0.735, "FMID_Inside", true, -0.08, 0.01, 1, 0, 1},
    {"undistort 16:9 pincushion, duplicate, 2x2", 192, 108, 1.6, 0.9, "FMID_Inside", true, 0.05, 0.0, 1, 1, 2},
};

/// An interpreter with OpenCV's module: Debian's python3-opencv installs it for the system interpreter, which
/// another python3 earlier on PATH may not see. Empty when none has it.
std::string PythonWithOpenCv() {
    for (const char *python : {"/usr/bin/python3", "python3"})
        if (std::system((std::string(python) + " -c 'import cv2' > /dev/null 2>&1").c_str()) == 0) return python;
    return "";
}

/// Smooth waves of periods 10 to 40 pixels in every channel, alpha included, so that a read half a pixel off
/// shows (about 0.05) far above the tolerance (about 0.003).
Ref<Image> Waves(int w, int h) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_TRUE(img->AllocScanLineData());
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x)
            img->PutFlt(x, y,
                        {static_cast<float>(0.5 + 0.4 * std::sin(0.31 * x + 0.05 * y)),
                         static_cast<float>(0.5 + 0.4 * std::cos(0.17 * y - 0.11 * x)),
                         static_cast<float>(0.3 + 0.2 * std::sin(0.23 * (x + y))),
                         static_cast<float>(0.75 + 0.25 * std::cos(0.16 * x + 0.2 * y))});
    return img;
}

float Channel(const FltPixel &p, int c) { return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A; }

/// The frame's pixels as OpenCV holds them: RGBA float32, the top row first.
void WriteRaw(const Image &img, const std::string &path) {
    std::ofstream f(path, std::ios::binary);
    for (int y = img.Height() - 1; y >= 0; --y)
        for (int x = 0; x < img.Width(); ++x) {
            const FltPixel p = img.GetFlt(x, y);
            f.write(reinterpret_cast<const char *>(&p), sizeof p);
        }
}

std::vector<FltPixel> ReadRaw(const std::string &path, int w, int h) {
    std::vector<FltPixel> top(static_cast<size_t>(w) * h);
    std::ifstream f(path, std::ios::binary);
    f.read(reinterpret_cast<char *>(top.data()), static_cast<std::streamsize>(top.size() * sizeof(FltPixel)));
    if (!f) top.clear();
    return top;
}

/// Where a sample at p reads, in our pixels: D(p), or for Undistort the root of D(q) = p (Newton on the radius).
void ReadPosition(const Case &c, double f, double px, double py, double &qx, double &qy) {
    const double u = (px - 0.5 * c.w) / f, v = (py - 0.5 * c.h) / f, rho = std::hypot(u, v);
    double scale = 1.0 + c.c2 * rho * rho + c.c4 * rho * rho * rho * rho;
    if (c.mode == 1) {
        double r = rho;
        for (int i = 0; i < 50; ++i)
            r -= (r * (1 + c.c2 * r * r + c.c4 * r * r * r * r) - rho) /
                 (1 + 3 * c.c2 * r * r + 5 * c.c4 * r * r * r * r);
        scale = rho > 0 ? r / rho : 1.0;
    }
    qx = 0.5 * c.w + f * u * scale;
    qy = 0.5 * c.h + f * v * scale;
}

/// The spread of one channel over the four pixels a bilinear read at (qx, qy) takes, under the edge rule.
float TapRange(const Image &src, int edge, double qx, double qy, int channel) {
    const int i = static_cast<int>(std::floor(qx - 0.5)), j = static_cast<int>(std::floor(qy - 0.5));
    float lo = 1e30f, hi = -1e30f;
    for (int b = 0; b < 2; ++b)
        for (int a = 0; a < 2; ++a) {
            int x = i + a, y = j + b;
            if (edge == 1) x = std::clamp(x, 0, src.Width() - 1), y = std::clamp(y, 0, src.Height() - 1);
            const bool inside = x >= 0 && x < src.Width() && y >= 0 && y < src.Height();
            const float v = inside ? Channel(src.GetFlt(x, y), channel) : 0.f;
            lo = std::min(lo, v), hi = std::max(hi, v);
        }
    return hi - lo;
}

class LensPeer : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
};

TEST_F(LensPeer, RadialModelMatchesOpenCvsRemap) {
    const std::string python = PythonWithOpenCv();
    if (python.empty())
        GTEST_SKIP() << "OpenCV's Python module is missing (python3-opencv; scripts/setup-deps.sh installs it)";
    TempDir dir;
    for (const Case &c : kCases) {
        SCOPED_TRACE(c.what);
        const Ref<Image> src = Waves(c.w, c.h);
        OrvaneDoc doc;
        Operator *lens = AddTool(doc, "LensDistort", AddProbe(doc, src), {{"Mode", c.mode}, {"EdgeMode", c.edge}});
        SetID(lens, "Model", "DE4RadialStandardDegree4");
        SetID(lens, "ResolutionGateFit", c.fit);
        SetNumbers(lens, {{"DE4RadialStandardDegree4.DistortionDegree2", c.c2},
                          {"DE4RadialStandardDegree4.QuarticDistortionDegree4", c.c4},
                          {"ApertureWidth", c.apertureW},
                          {"ApertureHeight", c.apertureH},
                          {"Supersampling", c.samples == 2 ? 1 : 0}});
        const Ref<Image> ours = Render(lens);
        ASSERT_TRUE(Sized(ours, c.w, c.h));

        const double f =
            0.5 * std::hypot(c.apertureW, c.apertureH) / (c.widthFits ? c.apertureW / c.w : c.apertureH / c.h);
        std::ostringstream cmd;
        cmd.precision(17);
        const std::string in = dir / "in.raw", out = dir / "out.raw";
        WriteRaw(*src, in);
        cmd << python << " " << ORVANE_SOURCE_DIR << "/bench/peers/opencv_lens_remap.py remap " << in << " " << out
            << " " << c.w << " " << c.h << " " << f << " " << f << " " << 0.5 * c.w - 0.5 << " " << 0.5 * c.h - 0.5
            << " " << c.c2 << " " << c.c4 << " " << (c.edge ? "replicate" : "constant") << " "
            << (c.mode ? "inverse" : "forward") << " " << c.samples;
        ASSERT_EQ(std::system(cmd.str().c_str()), 0) << cmd.str();
        const std::vector<FltPixel> peer = ReadRaw(out, c.w, c.h);
        ASSERT_FALSE(peer.empty()) << "the peer wrote no image";

        // With Canvas edges, pixels beyond the output's data window are canvas on both sides; with Duplicate,
        // OpenCV repeats the border where the tool's window ends, so the comparison keeps to that window.
        const ImgRectI region = c.edge == 0 ? ImgRectI(0, 0, c.w, c.h) : ours->DataWindow() & ImgRectI(0, 0, c.w, c.h);
        ASSERT_GE(region.Width() * region.Height(), c.w * c.h * 9 / 10) << RectText(region);
        double worstRatio = 0, moved = 0;
        int bad = 0;
        for (int y = region.y0; y < region.y1; ++y)
            for (int x = region.x0; x < region.x1; ++x) {
                const FltPixel p = ours->GetFlt(x, y), s = src->GetFlt(x, y);
                const FltPixel q = peer[static_cast<size_t>(c.h - 1 - y) * c.w + x];
                for (int ch = 0; ch < 4; ++ch) {
                    double range = 0;
                    for (int sy = 0; sy < c.samples; ++sy)
                        for (int sx = 0; sx < c.samples; ++sx) {
                            double qx, qy;
                            ReadPosition(c, f, x + (sx + 0.5) / c.samples, y + (sy + 0.5) / c.samples, qx, qy);
                            range += TapRange(*src, c.edge, qx, qy, ch);
                        }
                    const double tol = range / (c.samples * c.samples) / 32 + 1e-5;
                    const double err = std::fabs(Channel(p, ch) - Channel(q, ch));
                    worstRatio = std::max(worstRatio, err / tol);
                    moved = std::max(moved, double(std::fabs(Channel(p, ch) - Channel(s, ch))));
                    if (err > tol && ++bad <= 5)
                        ADD_FAILURE() << "pixel (" << x << ", " << y << ") channel " << ch << ": " << Channel(p, ch)
                                      << " against OpenCV's " << Channel(q, ch) << ", allowed " << tol;
                }
            }
        EXPECT_EQ(bad, 0) << "worst error / allowed: " << worstRatio;
        EXPECT_GT(moved, 0.3) << "the lens moved nothing: the comparison would show no fault";
    }
}

} // namespace
} // namespace Orvane::WarpTest::LensPeerT
