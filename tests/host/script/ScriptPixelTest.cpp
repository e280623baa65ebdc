// The pixel API from C++ and from Lua: sampling against Image::GetFlt and the edge rules worked out here,
// cursors, and the pool's row dispatch (same bits for any worker count, abort, errors, the compile cache).
#include <gtest/gtest.h>

#include <chrono>
#include <cmath>
#include <thread>

#include <fmt/format.h>

#include "host/script/ScriptImageApi.h"
#include "host/script/ScriptPool.h"
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::scriptpixeltest {
namespace {
using namespace ::Orvane::Test;

FltPixel Mix(FltPixel a, double wa, FltPixel b, double wb) {
    return {float(wa * a.R + wb * b.R), float(wa * a.G + wb * b.G), float(wa * a.B + wb * b.B),
            float(wa * a.A + wb * b.A)};
}

TEST(ScriptImageApi, SamplingFollowsGetFltAndTheEdgeRules) {
    const FltPixel canvas{0.25f, 0.5f, 0.75f, 1};
    const ImgRectI dw(0, 0, 4, 3); // the top row of the 5 x 4 frame is canvas
    const Ref<Image> img = PatternAt(5, 4, DepthRGBAFlt32, 7, &dw, canvas);
    auto px = [&](int x, int y) { return img->GetFlt(x, y); };
    const FltPixel clear{};
    struct Case {
        double x, y;
        int edges;
        FltPixel want;
    };
    const Case cases[] = {
        {2, 1, OrvaneEdgeBlack, px(2, 1)},
        {4, 3, OrvaneEdgeBlack, canvas}, // inside the frame, outside the data window
        {-1, 1, OrvaneEdgeBlack, clear},
        {-1, 1, OrvaneEdgeWrap, px(4, 1)},
        {-1, 1, OrvaneEdgeDuplicate, px(0, 1)},
        {-1, 1, OrvaneEdgeMirror, px(0, 1)},
        {-2, 1, OrvaneEdgeWrap, px(3, 1)},
        {-2, 1, OrvaneEdgeMirror, px(1, 1)},
        {6, 0, OrvaneEdgeWrap, px(1, 0)},
        {6, 0, OrvaneEdgeDuplicate, px(4, 0)},
        {6, 0, OrvaneEdgeMirror, px(3, 0)},
        {1, -1, OrvaneEdgeMirror, px(1, 0)},
        {1, 5, OrvaneEdgeWrap, px(1, 1)},
        {-0.5, 1, OrvaneEdgeBlack, Mix(px(0, 1), 0.5, clear, 0.5)},
        {-0.5, 1, OrvaneEdgeWrap, Mix(px(0, 1), 0.5, px(4, 1), 0.5)},
        {1.25, 0.5, OrvaneEdgeDuplicate,
         Mix(Mix(px(1, 0), 0.75, px(2, 0), 0.25), 0.5, Mix(px(1, 1), 0.75, px(2, 1), 0.25), 0.5)},
        {NAN, 1, OrvaneEdgeWrap, clear},
    };
    ScriptState state;
    state.SetImage(ScriptEnv::Trusted, "img", img.Get());
    const char *letters = "BWDM";
    for (const Case &c : cases) {
        OrvaneScriptPixel sampled;
        ovs_ImageSample(img.Get(), c.x, c.y, c.edges, &sampled);
        const FltPixel got{sampled.R, sampled.G, sampled.B, sampled.A};
        for (int ch = 0; ch < 4; ++ch)
            EXPECT_NEAR(Channel(got, ch), Channel(c.want, ch), 1e-6) << c.x << "," << c.y << " edges " << c.edges;
        // The same through the FFI binding.
        state.SetNumber(ScriptEnv::Trusted, "sx", c.x);
        state.SetNumber(ScriptEnv::Trusted, "sy", c.y);
        const std::string code =
            fmt::format("local p = ffi.new('FltPixel') img:SamplePixel{}(sx, sy, p) r, g, b, a = p.R, p.G, p.B, p.A",
                        letters[c.edges]);
        ASSERT_EQ(state.Run(ScriptEnv::Trusted, code), "");
        EXPECT_EQ(state.GetNumber(ScriptEnv::Trusted, "r"), got.R);
        EXPECT_EQ(state.GetNumber(ScriptEnv::Trusted, "a"), got.A);
    }
    ASSERT_EQ(state.Run(ScriptEnv::Trusted, "local p = FltPixel() img:GetCanvasColorFlt(p) "
                                            "w, h, g = img.Width, img.Height, p.G"),
              "");
    EXPECT_EQ(state.GetNumber(ScriptEnv::Trusted, "w") * 10 + state.GetNumber(ScriptEnv::Trusted, "h"), 54);
    EXPECT_EQ(state.GetNumber(ScriptEnv::Trusted, "g"), 0.5);
    state.SetImage(ScriptEnv::Trusted, "img", nullptr);
}

// Per line: reads the source through a cursor, writes a function of it and of x, y.
const char *kRowScript = R"(
local pin, pout, pix
function initfunc() pin, pout, pix = PixPtr(src, nil), PixPtr(out, nil), FltPixel() end
function chunkfunc(y)
    pin:GotoXY(0, y) pout:GotoXY(0, y)
    for x = 0, out.Width - 1 do
        pin:GetNextPixel(pix)
        pix.R, pix.G, pix.B, pix.A = math.sin(pix.R * 3 + x), pix.G * y / 7, math.sqrt(pix.B), 1 - pix.A
        pout:SetNextPixel(pix)
    end
end)";

TEST(ScriptPool, RowsComeOutTheSameForAnyWorkerCount) {
    const int w = 37, h = 29;
    const Ref<Image> src = PatternAt(w, h, DepthRGBAFlt32, 11);
    src->SetReadOnly();
    const Ref<Image> want = Filled(w, h, DepthRGBAFlt32, [&](int x, int y) {
        const FltPixel s = src->GetFlt(x, y);
        return FltPixel{float(std::sin(double(s.R) * 3 + x)), float(double(s.G) * y / 7), float(std::sqrt(double(s.B))),
                        float(1 - double(s.A))};
    });
    ScriptPool pool;
    for (int workers : {1, 2, 4}) {
        const Ref<Image> out = Blank(w, h, DepthRGBAFlt32);
        ASSERT_TRUE(out->AllocScanLineData());
        auto setup = [&](ScriptState &s, int) {
            s.SetImage(ScriptEnv::Sandbox, "src", src.Get());
            s.SetImage(ScriptEnv::Sandbox, "out", out.Get());
        };
        EXPECT_EQ(pool.Dispatch(kRowScript, 0, h, nullptr, setup, workers), "");
        EXPECT_LE(MaxDiff(*out, *want, out->DataWindow()), 1e-6) << workers;
        EXPECT_TRUE(SameBits(*out, *want)) << workers;
        EXPECT_EQ(src->GetFlt(3, 3), PatternAt(w, h, DepthRGBAFlt32, 11)->GetFlt(3, 3)); // read-only stays
    }
    // Four states made, each compiled the text once; a new text compiles again.
    EXPECT_EQ(pool.StateCount(), 4);
    EXPECT_EQ(pool.Compilations(), 4);
    EXPECT_EQ(pool.Dispatch("function chunkfunc(y) end", 0, 4, nullptr, {}, 2), "");
    EXPECT_EQ(pool.Compilations(), 6);
}

TEST(ScriptPool, AbortAndErrorsStopTheWorkers) {
    ScriptPool pool;
    int32_t abort = 0;
    std::thread stopper([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        std::atomic_ref<int32_t>(abort).store(1);
    });
    const std::string stuck = pool.Dispatch("function chunkfunc(y) while true do end end", 0, 100, &abort, {}, 2);
    stopper.join();
    EXPECT_NE(stuck.find(kScriptAbortedMessage), std::string::npos) << stuck;

    // Every worker that meets the bad line says so once; the others stop at the abort word.
    abort = 0;
    const std::string failed = pool.Dispatch("function chunkfunc(y)\n"
                                             "if y >= 5 then error('bad line') end end",
                                             0, 1000, &abort, {}, 4);
    EXPECT_EQ(failed, "pixel script:2: bad line");
    EXPECT_EQ(abort, 1);
    EXPECT_NE(pool.Dispatch("function chunkfunc(y) end x = = 1", 0, 1, nullptr, {}, 1).find("pixel script:1:"),
              std::string::npos);
}

} // namespace
} // namespace Orvane::scriptpixeltest
