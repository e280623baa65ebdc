// Transforming a UHD RGBA float32 frame through the general sampler
// (TransformMatrix::ApplyTransformTagList), output the same frame.
//
//   Transform/UHDRotate/<filter>     15 degrees about the middle: taps per
//                                    pixel (the general path).
//   Transform/UHDShrink/<filter>     scaled by 0.5 about the middle, no turn:
//                                    taps per column and per row (the
//                                    diagonal path), the filter stretched by 2.
//   Transform/UHDMove                moved by whole pixels (the copy path).
//   Transform/UHDRotateInt8/Linear   the rotation of an 8-bit frame.
//   Transform/UHDKeystone/<filter>   a projective matrix (the top edge
//                                    narrowed to 80 %): taps per pixel with
//                                    the divide by w and the stretch from the
//                                    local Jacobian (the mapped path).
//   Transform/ToolChain              two Transform tools in a flow (15 and 10
//                                    degrees, linear) rendered from outside,
//                                    cache off: one resampling for the chain.
//   Peer/oiiotool_rotate_*           oiiotool --rotate (lanczos3, triangle),
//                                    the frame kept; counter op_s is the
//                                    rotation alone (--runstats).
//   Peer/vips_rotate_*               vips rotate (bicubic = Catmull-Rom,
//                                    bilinear); op_s is the whole minus a
//                                    plain copy.
#include <string>

#include "bench/BenchSupport.h"
#include "bench/PeerSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/QuadMap.h"
#include "host/image/TransformMatrix.h"

namespace Orvane::Bench {
namespace {

const char *FilterName(int filter) {
    switch (filter) {
    case RszLanczos: return "Lanczos";
    case RszCatmullRom: return "CatmullRom";
    default: return "Linear";
    }
}

/// Makes the pixels of `tm` over its frame in each round.
void Render(benchmark::State &state, const TransformMatrix *tm) {
    const ImgRectI frame(0, 0, tm->Width(), tm->Height());
    for (auto _ : state) {
        Ref<Image> out = tm->ApplyTransformTagList({{ImgDataWindow, &frame}});
        if (!out) {
            state.SkipWithError("the transform failed");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

void Apply(benchmark::State &state, Image *src, const TagList &geometry) {
    const int filter = static_cast<int>(state.range(0));
    state.SetLabel(FilterName(filter));
    TagList tags = geometry;
    tags.Set({XfFilter, filter});
    auto tm = MakeRef<TransformMatrix>(src);
    tm->ImageConcatenateTagList(tags);
    Render(state, tm.Get());
}

void BM_Keystone(benchmark::State &state) {
    const int filter = static_cast<int>(state.range(0));
    state.SetLabel(FilterName(filter));
    Image *src = UhdFrame().Get();
    const double W = src->Width(), H = src->Height();
    const QuadPoint frame[4] = {{0, 0}, {W, 0}, {W, H}, {0, H}};
    const QuadPoint keystone[4] = {{0, 0}, {W, 0}, {0.9 * W, H}, {0.1 * W, H}};
    Matrix3 m;
    if (!HomographyFromPoints(frame, keystone, m)) {
        state.SkipWithError("no homography");
        return;
    }
    auto tm = MakeRef<TransformMatrix>(src);
    tm->ImageConcatenateTagList({{XfFilter, filter}});
    tm->SetSourceToOutput(m);
    Render(state, tm.Get());
}

void BM_Rotate(benchmark::State &state) { Apply(state, UhdFrame().Get(), {{XfAngle, 15.0}}); }
void BM_Shrink(benchmark::State &state) { Apply(state, UhdFrame().Get(), {{XfXSize, 0.5}, {XfYSize, 0.5}}); }
void BM_Move(benchmark::State &state) {
    Apply(state, UhdFrame().Get(), {{XfCenterX, 0.5 + 17.0 / kWidth}, {XfCenterY, 0.5 - 9.0 / kHeight}});
}
void BM_RotateInt8(benchmark::State &state) {
    static const Ref<Image> frame8 = [] {
        Ref<Image> img = NewImageTagList({{ImgLikeImage, UhdFrame().Get()}, {ImgDepth, DepthRGBAInt8}});
        img->ImageCopy(UhdFrame().Get());
        return img;
    }();
    Apply(state, frame8.Get(), {{XfAngle, 15.0}});
}

void BM_ToolChain(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    OrvaneDoc doc;
    Output *src = AddFrameSource(doc);
    Operator *first = doc.AddTool(OvID("Transform"));
    Operator *second = doc.AddTool(OvID("Transform"));
    if (!first || !second || !first->FindInput("Input")->ConnectTo(src) ||
        !second->FindInput("Input")->ConnectTo(first->FindMainOutput())) {
        state.SkipWithError("no Transform tool");
        return;
    }
    first->FindInput("Angle")->SetValue(MakeRef<Number>(15.0));
    second->FindInput("Angle")->SetValue(MakeRef<Number>(10.0));
    RenderLoop(state, second);
}

#define XF_ROW(fn, name) BENCHMARK(fn)->Name(name)->UseRealTime()->Unit(benchmark::kMillisecond)
XF_ROW(BM_Rotate, "Transform/UHDRotate")->Arg(RszLinear)->Arg(RszCatmullRom)->Arg(RszLanczos);
XF_ROW(BM_Shrink, "Transform/UHDShrink")->Arg(RszLinear)->Arg(RszLanczos);
XF_ROW(BM_Move, "Transform/UHDMove")->Arg(RszLinear);
XF_ROW(BM_RotateInt8, "Transform/UHDRotateInt8")->Arg(RszLinear);
XF_ROW(BM_Keystone, "Transform/UHDKeystone")->Arg(RszLinear)->Arg(RszLanczos);
BENCHMARK(BM_ToolChain)->Name("Transform/ToolChain")->UseRealTime()->Unit(benchmark::kMillisecond);

const bool kPeersRegistered = [] {
    auto oiio = [](const char *filter) {
        return [filter] {
            const std::string &in = PeerUHDFrame(".exr");
            if (in.empty()) return std::string();
            return in + " --rotate:filter=" + filter + ":recompute_roi=0 -15 -d float --compression none -o " +
                   PeerOutput(".exr");
        };
    };
    auto vips = [](const char *interpolator) {
        return [interpolator] {
            const std::string &in = PeerUHDFrame(".v");
            if (in.empty()) return std::string();
            return "rotate " + in + " " + PeerOutput(".v") + " 15 --interpolate " + interpolator;
        };
    };
    RegisterPeerBenchmark("oiiotool_rotate_lanczos3", "oiiotool", oiio("lanczos3"), "rotate");
    RegisterPeerBenchmark("oiiotool_rotate_triangle", "oiiotool", oiio("triangle"), "rotate");
    RegisterPeerBenchmark("vips_rotate_bicubic", "vips", vips("bicubic"));
    RegisterPeerBenchmark("vips_rotate_bilinear", "vips", vips("bilinear"));
    return true;
}();

} // namespace
} // namespace Orvane::Bench
