// Lens Distort on the device: Distort with the radial and the two anamorphic models against the rows, over
// supersampling, subsample mode, edges, clipping, depth and the distortion map; the models and the mode the kernel
// does not take render through the rows.
#include <cfloat>
#include <cmath>
#include <sstream>
#include <string>

#include "tests/host/krom/DeviceTestSupport.h"
#include "tests/operators/warp/WarpTestSupport.h"

namespace Orvane::WarpTest::LensDeviceT {
namespace {

constexpr int W = 96, H = 60; // 16:10 on the 4:3 default filmback: the fit is not a plain x / W
constexpr FltPixel kCanvas{0.2f, 0.3f, 0.4f, 0.5f};
/// How far a device position may lie from the rows': the device maps in float, the rows in double. The unit
/// coordinates carry a few float roundings relative to the image's size, which the lens's displacement (whose slope
/// is well below one) passes on scaled down; the offset itself is rounded relative to its own size. Both stay below a
/// float step of the image's size (measured: about a tenth of it, here and at 3840 x 2160).
const double kPositionTol = FLT_EPSILON * std::max(W, H);

/// The largest difference of any channel.
double ChannelDifference(const FltPixel &a, const FltPixel &b) {
    return std::max({std::fabs(double(a.R) - b.R), std::fabs(double(a.G) - b.G), std::fabs(double(a.B) - b.B),
                     std::fabs(double(a.A) - b.A)});
}

/// A smooth source over a data window inside the frame, with a canvas colour unlike its pixels, in `depth`.
Ref<Image> SmoothSource(int depth) {
    const ImgRectI dw(4, 3, W - 5, H - 2);
    Ref<Image> img = NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &dw}});
    EXPECT_TRUE(img->AllocScanLineData());
    img->SetCanvasColor(kCanvas);
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x)
            *reinterpret_cast<FltPixel *>(img->PixelAddress(x, y)) =
                FltPixel{0.5f + 0.4f * std::sin(0.21f * x + 0.13f * y), 0.5f + 0.4f * std::cos(0.17f * x - 0.11f * y),
                         float(x) / W, 0.8f + 0.2f * std::sin(0.05f * x * y / W)};
    return depth == DepthRGBAFlt32 ? img : img->CopyOfImageTagList({{ImgDataWindow, &dw}, {ImgDepth, depth}});
}

struct Lens {
    const char *name, *model, *clipping;
    int depth;
    const char *values; ///< "ID=value ...": the model's parameters (IDs after the model's), then ".Tool" inputs
};

// Coefficients of the size matchmove solves give for real lenses; lens shift, rotation, squeeze and bending on.
const Lens kLenses[] = {
    {"radial, decentered, cylindric", "DE4RadialStandardDegree4", "ClippingMode_Domain", DepthRGBAFlt32,
     "DistortionDegree2=-0.045 UDegree2=0.003 VDegree2=-0.002 QuarticDistortionDegree4=0.012 UDegree4=0.001 "
     "VDegree4=-0.0015 PhiCylindricDirection=30 BCylindricBending=0.02 .LensShiftX=0.01 .LensShiftY=-0.02"},
    {"anamorphic degree 4, rotated and squeezed", "DE4AnamorphicStandardDegree4", "ClippingMode_Frame", DepthRGBAFlt32,
     "Cx02Degree2=-0.05 Cy02Degree2=-0.03 Cx22Degree2=0.01 Cy22Degree2=0.008 Cx04Degree4=0.006 Cy04Degree4=0.004 "
     "Cx24Degree4=-0.002 Cy24Degree4=0.001 Cx44Degree4=0.001 Cy44Degree4=-0.001 LensRotation=0.5 SqueezeX=1.02 "
     "SqueezeY=0.98 .FocalLength=50"},
    {"anamorphic degree 6, 16-bit", "DE4AnamorphicDegree6", "ClippingMode_None", DepthRGBAInt16,
     "Cx02Degree2=-0.04 Cy02Degree2=-0.02 Cx22Degree2=0.01 Cy22Degree2=0.005 Cx04Degree4=0.004 Cy04Degree4=0.003 "
     "Cx24Degree4=-0.001 Cx06Degree6=0.001 Cy06Degree6=-0.0005 Cx26Degree6=0.0004 Cy46Degree6=-0.0003 "
     "Cx66Degree6=0.0002"},
};

class LensDevice : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    Operator *Make(Operator *src, const Lens &lens, int mode = 0) {
        Operator *tool = AddTool(doc, "LensDistort", src, {{"Mode", mode}});
        SetID(tool, "Model", lens.model);
        SetID(tool, "ClippingMode", lens.clipping);
        std::istringstream values(lens.values);
        for (std::string id; std::getline(values >> std::ws, id, '=');) {
            double v = 0;
            values >> v;
            SetNumber(tool, (id[0] == '.' ? id.substr(1) : std::string(lens.model) + "." + id).c_str(), v);
        }
        return tool;
    }
    /// The tool's output on `ctx` (the rows when null), without the result cache; notes whether the device ran.
    Ref<Image> RenderOn(Operator *op, IDeviceContext *ctx, bool *ran = nullptr) {
        const int launches = ctx ? ctx->LaunchCount() : 0;
        RenderTask task;
        task.SetDevice(ctx);
        EvalOptions opt;
        opt.task = &task, opt.useCache = false;
        Ref<Image> img = Orvane::Test::EvalImage(op, 0.0, opt);
        if (ran) *ran = ctx && ctx->LaunchCount() > launches;
        EXPECT_TRUE(task.DeviceLog().empty()) << task.DeviceLog().front();
        return img;
    }
    OrvaneDoc doc;
};

// Per model, at 1 x 1 and 2 x 2: the distortion map's offsets lie within the position tolerance of the rows'. Source
// values and canvas lie in [0, 1], so a read moved by d pixels along each axis changes by at most 2 d: bilinear
// colours agree to that plus float rounding of the sums (and one 16-bit step where a stored rounding flips). Nearest
// reads agree wherever no sample lies within d of a pixel edge; elsewhere a pixel changes by at most one step, and
// such pixels are rare.
TEST_F(LensDevice, DistortMatchesTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    struct Variant {
        const char *name;
        int map, edges, bilinear;
    };
    const Variant variants[] = {{"map", 1, 0, 1},
                                {"canvas bilinear", 0, 0, 1},
                                {"duplicate bilinear", 0, 1, 1},
                                {"canvas nearest", 0, 0, 0},
                                {"duplicate nearest", 0, 1, 0}};
    for (const Lens &lens : kLenses) {
        const double quantum = lens.depth == DepthRGBAInt16 ? 1.0 / 65535 : 0.0;
        Operator *tool = Make(AddProbe(doc, SmoothSource(lens.depth), std::string("Src") + lens.model), lens);
        for (int ss : {0, 1})
            for (const Variant &v : variants) {
                SCOPED_TRACE(std::string(lens.name) + (ss ? " 2x2 " : " 1x1 ") + v.name);
                SetNumbers(tool, {{"Supersampling", ss},
                                  {"OutputDistortionMap", v.map},
                                  {"EdgeMode", v.edges},
                                  {"SubsampleMode", v.bilinear}});
                bool ran = false;
                Ref<Image> rows = RenderOn(tool, nullptr), dev = RenderOn(tool, ctx, &ran);
                ASSERT_TRUE(rows && dev);
                EXPECT_TRUE(ran) << "the device ran";
                ASSERT_EQ(dev->DataWindow(), rows->DataWindow());
                ASSERT_EQ(dev->Depth(), rows->Depth());
                const ImgRectI dw = rows->DataWindow();
                const double tol = v.map ? kPositionTol : 2 * kPositionTol + 4e-6 + quantum;
                double worst = 0, moved = 0;
                int changed = 0;
                for (int y = dw.y0; y < dw.y1; ++y)
                    for (int x = dw.x0; x < dw.x1; ++x) {
                        const FltPixel r = rows->GetFlt(x, y);
                        const double d = ChannelDifference(dev->GetFlt(x, y), r);
                        worst = std::max(worst, d);
                        changed += d > 1e-5 + quantum;
                        moved = std::max({moved, std::fabs(double(r.R)), std::fabs(double(r.G))});
                    }
                if (v.bilinear) {
                    EXPECT_LE(worst, tol);
                } else {
                    EXPECT_LE(changed, dw.Width() * dw.Height() / 100) << "pixels off by a step";
                }
                if (v.map) {
                    EXPECT_GT(moved, 1.0) << "the lens moves pixels";
                }
            }
    }
}

// The fisheye, classic and barrel models, and Undistort (which iterates), have no kernel: with a device they give
// the rows' pixels exactly and launch nothing.
TEST_F(LensDevice, OtherModelsAndUndistortRenderThroughTheRows) {
    ORVANE_NEED_OPENCL(ctx);
    Operator *src = AddProbe(doc, SmoothSource(DepthRGBAFlt32));
    const std::pair<Lens, int> cases[] = {
        {{"fisheye", "DE4RadialFisheyeDegree8Release2", "ClippingMode_Domain", 0, "DistortionDegree2=0.05"}, 0},
        {{"fisheye release 1", "DE4RadialFisheyeDegree8", "ClippingMode_Domain", 0, "Degree6=0.01"}, 0},
        {{"classic", "DEClassicLDModel", "ClippingMode_Domain", 0, "Distortion=-0.04"}, 0},
        {{"barrel", "PFTrack", "ClippingMode_Domain", 0, "LowOrderDistortion=-0.05"}, 0},
        {kLenses[0], 1},
        {kLenses[1], 1},
    };
    for (const auto &[lens, mode] : cases) {
        SCOPED_TRACE(std::string(lens.name) + (mode ? " undistort" : " distort"));
        Operator *tool = Make(src, lens, mode);
        bool ran = true;
        Ref<Image> rows = RenderOn(tool, nullptr), dev = RenderOn(tool, ctx, &ran);
        ASSERT_TRUE(rows && dev);
        EXPECT_FALSE(ran) << "a launch";
        ASSERT_EQ(dev->DataWindow(), rows->DataWindow());
        ExpectSamePixels(*dev, *rows, rows->DataWindow(), lens.name);
    }
}

} // namespace
} // namespace Orvane::WarpTest::LensDeviceT
