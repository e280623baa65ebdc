// A pixel script over a UHD float frame through the script pool: every pixel read through a cursor, a few
// operations, written through another. With the JIT compiler off (the default: limits and abort hold inside
// the script) and on (ScriptLimits::jit), to show what the bound costs.
#include "bench/BenchSupport.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/script/ScriptPool.h"

namespace Orvane::Bench {
namespace {

const char *kPixelScript = R"(
local width, pin, pout, pix = 0, nil, nil, nil
function initfunc()
    width, pix = out.Width, FltPixel()
    pin, pout = PixPtr(src, pix), PixPtr(out, pix)
end
function chunkfunc(y)
    pin:GotoXY(0, y)
    pout:GotoXY(0, y)
    for _ = 1, width do
        pin:GetNextPixel(pix)
        pix.R, pix.G, pix.B = pix.G * 0.5 + pix.B, math.min(1, pix.R * 2), pix.B * pix.A
        pout:SetNextPixel(pix)
    end
end)";

void RunPixelScript(benchmark::State &state, bool jit) {
    const Image *frame = UhdFrame().Get();
    Ref<Image> out = NewImageTagList({{ImgLikeImage, frame}});
    out->AllocScanLineData();
    ScriptLimits limits = PixelScriptLimits();
    limits.jit = jit;
    ScriptPool pool(limits);
    auto setup = [&](ScriptState &s, int) {
        s.SetImage(ScriptEnv::Sandbox, "src", const_cast<Image *>(frame));
        s.SetImage(ScriptEnv::Sandbox, "out", out.Get());
    };
    for (auto _ : state) {
        const std::string error = pool.Dispatch(kPixelScript, 0, frame->Height(), nullptr, setup);
        if (!error.empty()) state.SkipWithError(error.c_str());
    }
    ReportPixels(state);
}

void BM_PixelScriptInterpreted(benchmark::State &state) { RunPixelScript(state, false); }
void BM_PixelScriptJit(benchmark::State &state) { RunPixelScript(state, true); }
BENCHMARK(BM_PixelScriptInterpreted)->UseRealTime()->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK(BM_PixelScriptJit)->UseRealTime()->Unit(benchmark::kMillisecond)->Iterations(3);

} // namespace
} // namespace Orvane::Bench
