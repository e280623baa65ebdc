// BrightnessContrast and Background on a UHD RGBA float32 frame, on the CPU
// rows and on each device back end, through the public Evaluate with the
// cache off. The argument picks where the tool runs:
//   device:0  the CPU rows (a render task without a device)
//   device:1  the OpenCL device (Application::Device(DeviceChoice::OpenCL))
//   device:2  the CUDA device
// A back end that has no device skips its rows with the reason.
//
// What one iteration includes:
//   BrightnessContrast_Rows    Gamma 1.3: the row function, or the
//                              "BrightnessContrast" kernel on a device.
//   BrightnessContrast_Matrix  Gain 1.2, Brightness 0.1: one colour matrix,
//                              the host's rows or its "ColorMatrix" kernel.
//     Both read the frame of AddFrameSource, which hands the same prepared
//     image each time (no pixels are made in the loop). On a device the
//     iteration pays: dropping the frame's earlier upload, allocating device
//     memory and uploading the 133 MB frame, the kernel, allocating the
//     output's rows and downloading it, and freeing both device images.
//   BrightnessContrast_*Resident  The same with the frame's upload kept on
//     the image (as the engine keeps it for the next device tool), so the
//     input already lives on the device: kernel, download and the output's
//     memory only. Device arguments only.
//   LensDistort_Distort        Distort with the anamorphic degree 4 model
//                              (squeezed and rotated), 1 x 1 bilinear: the
//                              rows, or the "LensDistort" kernel; the frame
//                              uploaded each time as above.
//   Background_FourCorner      Four Corner mode, four different corners.
//   Background_Gradient3x3     Linear gradient with the 3x3 sub-pixel grid.
//     A generator has no input to upload: on a device the iteration pays the
//     kernel, the download of the frame into fresh rows and the device memory.
// One untimed render before the loop opens the device and compiles the
// kernel, so compile time is not counted; a device run that failed (the rows
// then made the frame) skips the benchmark with the device log's reason.
//
// On a machine without a GPU the OpenCL rows run on an OpenCL driver for the
// host's own CPU (PoCL): they measure that driver, not a GPU. The label of
// each device row names the device.
#include <string>
#include <utility>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/Engine.h"
#include "host/flow/RenderTask.h"
#include "host/krom/DeviceContext.h"
#include "host/krom/GPUMemory.h"

namespace Orvane::Bench {
namespace {

/// Gives `task` the device of the benchmark's argument (0: none). False, the
/// benchmark skipped, when that back end has no device.
bool ChooseDevice(benchmark::State &state, RenderTask &task) {
    const long long arg = state.range(0);
    if (arg == 0) {
        state.SetLabel("CPU rows");
        return true;
    }
    const DeviceChoice choice = arg == 1 ? DeviceChoice::OpenCL : DeviceChoice::CUDA;
    std::string error;
    IDeviceContext *device = GetApp()->Device(choice, &error);
    if (!device) {
        state.SkipWithError(("no " + std::string(arg == 1 ? "OpenCL" : "CUDA") + " device: " + error).c_str());
        return false;
    }
    task.SetDevice(device);
    state.SetLabel(device->Description());
    return true;
}

/// Why the device did not make `out`, or empty when it did (or the task has
/// no device).
std::string DeviceFailure(const RenderTask &task, const Parameter *out) {
    if (!task.Device()) return {};
    const auto *img = dynamic_cast<const Image *>(out);
    if (img && img->GetGPUMem() && task.DeviceLog().empty()) return {};
    std::string why = "the device did not make the frame";
    for (const std::string &line : task.DeviceLog()) why += "; " + line;
    return why;
}

/// Renders `tool`'s main output once per iteration with `task`, the cache
/// off. `dropUpload`: the source frame loses its device copy before each
/// render, so a device render uploads it again.
void DeviceLoop(benchmark::State &state, Operator *tool, RenderTask &task, bool dropUpload) {
    EvalOptions options;
    options.useCache = false;
    options.task = &task;
    Image *frame = UhdFrame().Get();
    Output *out = tool->FindMainOutput();

    {
        // Opens the device and compiles the kernel outside the timing.
        Ref<Parameter> first = Evaluate(out, 0.0, options);
        const std::string failure = first ? DeviceFailure(task, first.Get()) : "the tool gave no image";
        if (!failure.empty()) {
            frame->SetGPUMem(nullptr, false);
            state.SkipWithError(failure.c_str());
            return;
        }
    }

    for (auto _ : state) {
        if (dropUpload) frame->SetGPUMem(nullptr, false);
        Ref<Parameter> result = Evaluate(out, 0.0, options);
        if (!result || result.Get() == frame) {
            state.SkipWithError("the tool gave no new image");
            break;
        }
        benchmark::DoNotOptimize(result.Get());
    }
    if (!task.DeviceLog().empty()) state.SkipWithError(DeviceFailure(task, nullptr).c_str());
    frame->SetGPUMem(nullptr, false); // the other benchmarks read the frame's rows only
    ReportPixels(state);
}

void RunBrightnessContrast(benchmark::State &state, const std::vector<std::pair<const char *, double>> &settings,
                           bool resident) {
    if (!LoadLibrary(state)) return;
    RenderTask task;
    if (!ChooseDevice(state, task)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *bc = doc.AddTool(OvID("BrightnessContrast"));
    if (!source || !bc) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    bc->FindInput("Input")->ConnectTo(source);
    for (const auto &[id, value] : settings) bc->FindInput(id)->SetValue(MakeRef<Number>(value));
    DeviceLoop(state, bc, task, !resident);
}

/// The rows as BM_BrightnessContrast_Rows runs them: fast powers, vector rows.
void RunRows(benchmark::State &state, bool resident) {
    const bool fastPower = GetApp()->GetAttrB(AppFastPower), vectorRows = GetApp()->GetAttrB(AppVectorRows);
    GetApp()->SetAttrsTagList({{AppFastPower, 1}, {AppVectorRows, 1}});
    RunBrightnessContrast(state, {{"Gamma", 1.3}}, resident);
    GetApp()->SetAttrsTagList({{AppFastPower, fastPower}, {AppVectorRows, vectorRows}});
}

void BM_DeviceBrightnessContrast_Rows(benchmark::State &state) { RunRows(state, false); }
BENCHMARK(BM_DeviceBrightnessContrast_Rows)
    ->ArgName("device")
    ->DenseRange(0, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_DeviceBrightnessContrast_RowsResident(benchmark::State &state) { RunRows(state, true); }
BENCHMARK(BM_DeviceBrightnessContrast_RowsResident)
    ->ArgName("device")
    ->DenseRange(1, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_DeviceBrightnessContrast_Matrix(benchmark::State &state) {
    RunBrightnessContrast(state, {{"Gain", 1.2}, {"Brightness", 0.1}}, false);
}
BENCHMARK(BM_DeviceBrightnessContrast_Matrix)
    ->ArgName("device")
    ->DenseRange(0, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_DeviceBrightnessContrast_MatrixResident(benchmark::State &state) {
    RunBrightnessContrast(state, {{"Gain", 1.2}, {"Brightness", 0.1}}, true);
}
BENCHMARK(BM_DeviceBrightnessContrast_MatrixResident)
    ->ArgName("device")
    ->DenseRange(1, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void SetInput(Operator *op, const char *id, Ref<Parameter> value) {
    if (Input *in = op->FindInput(id)) in->SetValue(std::move(value));
}

void BM_DeviceLensDistort_Distort(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    RenderTask task;
    if (!ChooseDevice(state, task)) return;
    OrvaneDoc doc;
    Output *source = AddFrameSource(doc);
    Operator *lens = doc.AddTool(OvID("LensDistort"));
    if (!source || !lens) {
        state.SkipWithError("cannot make the tools");
        return;
    }
    lens->FindInput("Input")->ConnectTo(source);
    SetInput(lens, "Mode", MakeRef<Number>(0));
    SetInput(lens, "Model", MakeRef<IDValue>(OvID("DE4AnamorphicStandardDegree4")));
    const std::pair<const char *, double> values[] = {
        {"Cx02Degree2", -0.05}, {"Cy02Degree2", -0.03}, {"Cx22Degree2", 0.01}, {"Cx04Degree4", 0.006},
        {"Cy04Degree4", 0.004}, {"LensRotation", 0.5},  {"SqueezeX", 1.02}};
    for (const auto &[id, v] : values)
        SetInput(lens, ("DE4AnamorphicStandardDegree4." + std::string(id)).c_str(), MakeRef<Number>(v));
    DeviceLoop(state, lens, task, true);
}
BENCHMARK(BM_DeviceLensDistort_Distort)
    ->ArgName("device")
    ->DenseRange(0, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

/// A UHD float32 Background set up by `setUp`, rendered per iteration.
template <class SetUp> void RunBackground(benchmark::State &state, SetUp setUp) {
    if (!LoadLibrary(state)) return;
    RenderTask task;
    if (!ChooseDevice(state, task)) return;
    OrvaneDoc doc;
    Operator *bg = doc.AddTool(OvID("Background"));
    if (!bg) {
        state.SkipWithError("no Background tool");
        return;
    }
    SetInput(bg, "Width", MakeRef<Number>(kWidth));
    SetInput(bg, "Height", MakeRef<Number>(kHeight));
    SetInput(bg, "Depth", MakeRef<Number>(4)); // float32
    setUp(bg);
    DeviceLoop(state, bg, task, false);
}

void BM_DeviceBackground_FourCorner(benchmark::State &state) {
    RunBackground(state, [](Operator *bg) {
        SetInput(bg, "Type", MakeRef<IDValue>(OvID("FourCorner")));
        // Four different corners, so no row or column is constant.
        const char *corners[4] = {"TopLeft", "TopRight", "BottomLeft", "BottomRight"};
        const double colors[4][4] = {
            {1.0, 0.2, 0.1, 1.0}, {0.1, 0.9, 0.3, 1.0}, {0.2, 0.3, 1.0, 0.8}, {0.9, 0.8, 0.2, 0.6}};
        const char *channels[4] = {"Red", "Green", "Blue", "Alpha"};
        for (int c = 0; c < 4; ++c)
            for (int ch = 0; ch < 4; ++ch)
                SetInput(bg, (std::string(corners[c]) + channels[ch]).c_str(), MakeRef<Number>(colors[c][ch]));
    });
}
BENCHMARK(BM_DeviceBackground_FourCorner)
    ->ArgName("device")
    ->DenseRange(0, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

void BM_DeviceBackground_Gradient3x3(benchmark::State &state) {
    RunBackground(state, [](Operator *bg) {
        SetInput(bg, "Type", MakeRef<IDValue>(OvID("Gradient")));
        SetInput(bg, "GradientType", MakeRef<IDValue>(OvID("Linear")));
        SetInput(bg, "Start", MakeRef<Point>(0.1, 0.2));
        SetInput(bg, "End", MakeRef<Point>(0.9, 0.7));
        SetInput(bg, "SubPixel", MakeRef<IDValue>(OvID("3x3")));
    });
}
BENCHMARK(BM_DeviceBackground_Gradient3x3)
    ->ArgName("device")
    ->DenseRange(0, 2)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

} // namespace
} // namespace Orvane::Bench
