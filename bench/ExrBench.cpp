// OpenEXR reading and writing of the UHD frame, in memory (no disk): RGBA
// float16 with Zip (16 lines) and Piz, RGBA float32 with Zip (16 lines).
// Writing includes the header; reading includes header, decode and the
// image's allocation, as a clip pays them.
#include <map>
#include <vector>

#include "bench/BenchSupport.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"

namespace Orvane::Bench {
namespace {

constexpr int kZip16 = 3, kPiz = 4;

Ref<ImageFormat> NewExrFormat() {
    return NewImageFormat(ClassRegistry->Find(OvID("OpenEXRFormat"), RegFamilyImageFormat));
}

const Image *Frame(int depth) {
    static std::map<int, Ref<Image>> frames;
    Ref<Image> &f = frames[depth];
    if (!f) {
        f = NewImageTagList({{ImgLikeImage, UhdFrame().Get()}, {ImgDepth, depth}});
        f->ImageCopy(UhdFrame().Get());
    }
    return f.Get();
}

/// Writes `image` with `compression` into memory; empty on failure.
std::vector<uint8_t> Write(const Image *image, int compression, benchmark::State &state) {
    OrvaneDoc doc;
    Operator *tool = AddFrameSource(doc)->Owner();
    Ref<ImageFormat> f = NewExrFormat();
    if (!f) {
        state.SkipWithError("no OpenEXR format");
        return {};
    }
    f->AddSaveInputs(tool);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    req.SetInputData(tool->FindInput("Compression"), MakeRef<Number>(compression).Get());
    f->SetupSave(tool, &req);
    MemoryIO io;
    if (!f->SaveHeader(&io, const_cast<Image *>(image)) || !f->SaveFrame(0, const_cast<Image *>(image))) {
        state.SkipWithError(f->Error().c_str());
        return {};
    }
    return io.Data();
}

void BM_ExrWrite(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const Image *image = Frame(static_cast<int>(state.range(0)));
    size_t bytes = 0;
    for (auto _ : state) {
        bytes = Write(image, static_cast<int>(state.range(1)), state).size();
        if (!bytes) return;
    }
    state.counters["MB"] = static_cast<double>(bytes) / 1e6;
    ReportPixels(state);
}

void BM_ExrRead(benchmark::State &state) {
    if (!LoadLibrary(state)) return;
    const std::vector<uint8_t> file =
        Write(Frame(static_cast<int>(state.range(0))), static_cast<int>(state.range(1)), state);
    if (file.empty()) return;
    MemoryIO io(file);
    for (auto _ : state) {
        Ref<ImageFormat> f = NewExrFormat();
        f->SetupLoad(nullptr, nullptr);
        io.Seek(0, IOClass::SeekStart);
        Ref<Image> image;
        if (!f->LoadHeader(&io) || !f->LoadFrameTagList(0, image, {})) {
            state.SkipWithError(f->Error().c_str());
            return;
        }
        benchmark::DoNotOptimize(image.Get());
    }
    state.counters["MB"] = static_cast<double>(file.size()) / 1e6;
    ReportPixels(state);
}

void Cases(benchmark::internal::Benchmark *b) {
    b->ArgNames({"depth", "compression"});
    b->Args({DepthRGBAFlt16, kZip16})->Args({DepthRGBAFlt16, kPiz})->Args({DepthRGBAFlt32, kZip16});
    b->UseRealTime()->Unit(benchmark::kMillisecond);
}
BENCHMARK(BM_ExrWrite)->Apply(Cases);
BENCHMARK(BM_ExrRead)->Apply(Cases);

} // namespace
} // namespace Orvane::Bench
