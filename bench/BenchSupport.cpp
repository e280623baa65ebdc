#include "bench/BenchSupport.h"

#include <string>

#include "host/app/Application.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"

namespace Orvane::Bench {
namespace {

class FrameSource : public ThreadedOperator {
public:
    FrameSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        const Image *frame = image_ ? image_.Get() : UhdFrame().Get();
        if (!req->IsPreCalc()) {
            req->SetOutputData(output_, const_cast<Image *>(frame));
            return;
        }
        const ImgRectI dw = frame->DataWindow();
        Ref<Image> shape = NewImageTagList({{ImgLikeImage, frame}, {ImgDataWindow, &dw}, {ImgNoData, 1}});
        req->SetOutputData(output_, shape.Get());
    }
    Output *Out() const { return output_; }
    void SetImage(Ref<Image> image) { image_ = std::move(image); }

private:
    Output *output_;
    Ref<Image> image_; ///< null: the UHD frame
};

const OvID FrameSourceClass("BenchFrameSource");

Object *MakeFrameSource(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new FrameSource(reg, args, tags);
}

} // namespace

const Ref<Image> &UhdFrame() {
    static const Ref<Image> frame = [] {
        Ref<Image> img = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, kHeight}, {ImgDepth, DepthRGBAFlt32}});
        img->AllocScanLineData();
        for (int y = 0; y < kHeight; ++y) {
            float *row = img->Row<float>(y);
            for (int x = 0; x < kWidth; ++x) {
                row[4 * x + 0] = static_cast<float>(x) / kWidth;
                row[4 * x + 1] = static_cast<float>(y) / kHeight;
                row[4 * x + 2] = static_cast<float>((x * 7 + y * 13) % 1024) / 1023.f;
                row[4 * x + 3] = 1.f;
            }
        }
        return img;
    }();
    return frame;
}

bool LoadLibrary(benchmark::State &state) {
    std::string error;
    if (GetApp()->LoadOperators(error)) return true;
    state.SkipWithError(("cannot load the tool library: " + error).c_str());
    return false;
}

Output *AddFrameSource(OrvaneDoc &doc) { return AddImageSource(doc, nullptr, "Frame"); }

Output *AddImageSource(OrvaneDoc &doc, Ref<Image> image, const char *name) {
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeFrameSource},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Benchmark Frame"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, FrameSourceClass, tags);
    }();
    if (!image) UhdFrame(); // made before any timing starts
    auto *source = row ? dynamic_cast<FrameSource *>(doc.AddTool(FrameSourceClass, name)) : nullptr;
    if (source) source->SetImage(std::move(image));
    return source ? source->Out() : nullptr;
}

Operator *AddToolOnFrame(benchmark::State &state, OrvaneDoc &doc, const char *classId,
                         const std::vector<std::pair<const char *, double>> &numbers) {
    Output *source = AddFrameSource(doc);
    Operator *tool = doc.AddTool(OvID(classId));
    if (!source || !tool || !tool->FindMainInput()->ConnectTo(source)) {
        state.SkipWithError("cannot make the tools");
        return nullptr;
    }
    for (const auto &[id, value] : numbers) tool->FindInput(id)->SetValue(MakeRef<Number>(value));
    return tool;
}

void ReportPixels(benchmark::State &state) {
    state.counters["pixels/s"] =
        benchmark::Counter(static_cast<double>(kWidth) * kHeight, benchmark::Counter::kIsIterationInvariantRate);
}

void RenderLoop(benchmark::State &state, Operator *tool) {
    EvalOptions options;
    options.useCache = false;
    for (auto _ : state) {
        Ref<Parameter> out = Evaluate(tool->FindMainOutput(), 0.0, options);
        if (!out || out.Get() == UhdFrame().Get()) {
            state.SkipWithError("the tool gave no new image");
            break;
        }
        benchmark::DoNotOptimize(out.Get());
    }
    ReportPixels(state);
}

} // namespace Orvane::Bench
