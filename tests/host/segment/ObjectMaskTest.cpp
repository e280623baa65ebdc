// The classical object-mask provider, called as the tool calls it: through a KROMComputeNode of "GetObjectMask"
// on host buffers, scored against the true mask of a synthetic moving object (tests/support/BlobSequence.h).
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <map>
#include <string>
#include <vector>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/krom/KernelProvider.h"
#include "tests/support/BlobSequence.h"

namespace Orvane {
namespace {

namespace blob = Orvane::Test;
using blob::kBlobFrames;
constexpr int W = 160, H = 120;

/// The block's fields, written at their wire offsets (not through the struct), so a layout change shows here.
struct BlockFields {
    uint64_t compId = 7;
    uint32_t operatorId = 1;
    int32_t time = 0, refineRange = 30, hasMask = 0, better = 0, tracking = 0, ref = 0, key = 0, srcPremult = 1;
};

std::shared_ptr<const void> WireBlock(const BlockFields &f, size_t size = 56) {
    std::shared_ptr<uint8_t[]> bytes(new uint8_t[size]());
    auto put = [&](size_t offset, const auto &v) {
        if (offset + sizeof v <= size) std::memcpy(bytes.get() + offset, &v, sizeof v);
    };
    put(0, f.compId);
    put(8, f.operatorId);
    put(12, f.time);
    put(16, f.refineRange);
    put(20, f.hasMask);
    put(24, f.better);
    put(28, f.tracking);
    put(32, f.ref);
    put(36, f.key);
    put(40, f.srcPremult);
    put(48, int32_t{1}); // algoVer
    return std::shared_ptr<const void>(bytes, bytes.get());
}

using Result = blob::ObjectMaskRun;

Result Call(const Image &frame, const Image *carried, const BlockFields &f, const std::vector<float> &pos,
            const std::vector<float> &neg, size_t blockSize = 56, const ImgRectI *outWindow = nullptr) {
    return blob::RunObjectMask(frame, carried, WireBlock(f, blockSize), blockSize, pos, neg, outWindow);
}

/// The matte's four channels agree and lie in 0..1; the carried mask is the matte cut at one half.
void ExpectMatteForm(const Result &r, const std::string &label) {
    const ImgRectI &w = r.matte->DataWindow();
    int bad = 0;
    for (int y = w.y0; y < w.y1; ++y)
        for (int x = w.x0; x < w.x1; ++x) {
            const FltPixel m = r.matte->GetFlt(x, y);
            const float c = r.carry->GetFlt(x, y).A;
            bad += !(m.R == m.A && m.G == m.A && m.B == m.A && m.A >= 0 && m.A <= 1 && c == (m.A >= 0.5f ? 1 : 0));
        }
    EXPECT_EQ(bad, 0) << label;
}

class ObjectMask : public ::testing::Test {
protected:
    void SetUp() override {
        GetApp(); // start-up registers the host's providers
        auto provider = FindKernelProvider("GetObjectMask");
        ASSERT_TRUE(provider);
        ASSERT_STREQ(provider->Name(), "classical");
        PurgeKROMMagicMaskTrackerCache();
    }
};

TEST_F(ObjectMask, ReferenceFrameFromStrokesMatchesTheObject) {
    // On two colour families the segmentation should miss little more than the soft edge: the ellipse (30 x 18
    // pixels across its semi-axes, ~1700 pixels) has a rim of ~150, so half a pixel wrong all round costs ~0.04 of
    // IoU. 0.95 allows a third of a pixel all round (this build gives 0.983); strokes read upside down give 0.02.
    const ImgRectI offset(-6, 4, W - 10, H + 3); // cut on the right, grown above, not at the origin
    struct Case {
        const char *name;
        int depth;
        const ImgRectI *window;
        float alpha;
        int better;
    } cases[] = {
        {"float", DepthRGBAFlt32, nullptr, 1.f, 0},         {"better", DepthRGBAFlt32, nullptr, 1.f, 1},
        {"8-bit", DepthRGBAInt8, nullptr, 1.f, 0},          {"half", DepthRGBAFlt16, nullptr, 1.f, 0},
        {"offset window", DepthRGBAFlt32, &offset, 1.f, 0}, {"premultiplied 0.4", DepthRGBAFlt32, nullptr, 0.4f, 0},
    };
    for (const Case &c : cases) {
        Ref<Image> frame = blob::MakeBlobFrame(W, H, 0, c.depth, c.window, c.alpha);
        BlockFields f;
        f.ref = f.key = 1;
        f.better = c.better;
        const Result r =
            Call(*frame, nullptr, f, blob::BlobPositiveStrokes(W, H, 0), blob::BlobNegativeStrokes(W, H, 0));
        ASSERT_TRUE(r.ok) << c.name << ": " << r.error;
        EXPECT_EQ(r.matte->DataWindow(), frame->DataWindow());
        EXPECT_GT(blob::BlobIoU(*r.matte, W, H, 0), 0.95) << c.name;
        ExpectMatteForm(r, c.name);
    }
}

TEST_F(ObjectMask, TracksTheObjectThroughTheSequenceBothWays) {
    // Each frame re-segments a band around the carried edge, so errors do not pile up: the worst frame of the run
    // should do as well as the reference frame, IoU above 0.95 (this build's worst is the reference frame, 0.983).
    // The object moves up to 8 pixels a frame, more than the band: carrying the mask without the flow gives 0.88,
    // a flow used the wrong way round 0.
    struct Case {
        const char *name;
        bool reverse;
        int better;
    } cases[] = {{"forward faster", false, 0}, {"forward better", false, 1}, {"reverse faster", true, 0}};
    for (const Case &c : cases) {
        PurgeKROMMagicMaskTrackerCache();
        Ref<Image> carried;
        double worst = 1;
        int worstFrame = -1;
        for (int i = 0; i < kBlobFrames; ++i) {
            const int frame = c.reverse ? kBlobFrames - 1 - i : i;
            BlockFields f;
            f.time = frame;
            f.better = c.better;
            f.tracking = 1;
            f.ref = f.key = i == 0;
            f.hasMask = i > 0;
            const auto pos = i == 0 ? blob::BlobPositiveStrokes(W, H, frame) : std::vector<float>{};
            const auto neg = i == 0 ? blob::BlobNegativeStrokes(W, H, frame) : std::vector<float>{};
            const Result r = Call(*blob::MakeBlobFrame(W, H, frame), carried.Get(), f, pos, neg);
            ASSERT_TRUE(r.ok) << c.name << " frame " << frame << ": " << r.error;
            const double iou = blob::BlobIoU(*r.matte, W, H, frame);
            if (iou < worst) worst = iou, worstFrame = frame;
            carried = r.carry;
        }
        EXPECT_GT(worst, 0.95) << c.name << ", worst at frame " << worstFrame;
    }
}

TEST_F(ObjectMask, ToolsTrackingAtOnceKeepTheirOwnFrames) {
    // Two tools (operator ids 1 and 2) track the sequence in opposite directions, calls interleaved: each must get
    // bit for bit what it gets alone, so neither flows from the other's kept frame.
    constexpr int steps = 6;
    auto track = [](std::vector<uint32_t> tools) {
        std::map<uint32_t, Ref<Image>> carried;
        std::map<uint32_t, std::vector<Ref<Image>>> mattes;
        for (int i = 0; i < steps; ++i)
            for (uint32_t tool : tools) {
                const int frame = tool == 1 ? i : kBlobFrames - 1 - i;
                BlockFields f;
                f.operatorId = tool;
                f.time = frame;
                f.ref = f.key = i == 0;
                f.hasMask = f.tracking = i > 0;
                const Result r = Call(*blob::MakeBlobFrame(W, H, frame), carried[tool].Get(), f,
                                      i == 0 ? blob::BlobPositiveStrokes(W, H, frame) : std::vector<float>{}, {});
                EXPECT_TRUE(r.ok) << r.error;
                carried[tool] = r.carry;
                mattes[tool].push_back(r.matte);
            }
        PurgeKROMMagicMaskTrackerCache();
        return mattes;
    };
    auto together = track({1, 2}), first = track({1}), second = track({2});
    for (auto [tool, alone] : {std::pair{1u, &first}, {2u, &second}})
        for (int i = 0; i < steps; ++i)
            for (int y = 0; y < H; ++y)
                ASSERT_EQ(std::memcmp(together[tool][i]->ScanLine(y), (*alone)[tool][i]->ScanLine(y),
                                      together[tool][i]->RowBytes()),
                          0)
                    << "tool " << tool << " step " << i << " row " << y;
}

TEST_F(ObjectMask, NothingMarkedGivesAnEmptyMatteAndTinyFramesWork) {
    // Nothing marked: an empty matte, and success. A frame too small to model or to flow, or with pixels that are
    // not numbers: a matte all the same, and a carried mask taken on to the next frame (the flow refuses frames
    // under 12 pixels).
    const ImgRectI tiny(0, 0, 5, 4);
    Ref<Image> frame = blob::MakeBlobFrame(W, H, 3), small = blob::MakeBlobFrame(W, H, 0, DepthRGBAFlt32, &tiny);
    Ref<Image> broken = blob::MakeBlobFrame(W, H, 0);
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    for (int i = 0; i < W * H; i += 7) broken->PutFlt(i % W, i / W, FltPixel{nan, inf, -inf, i % 2 ? nan : inf});
    struct Case {
        const char *name;
        const Image *frame;
        std::vector<float> pos, neg;
        bool expectEmpty;
    } cases[] = {
        {"no strokes", frame.Get(), {}, {}, true},
        {"negative strokes only", frame.Get(), {}, blob::BlobNegativeStrokes(W, H, 3), true},
        {"5 x 4 frame", small.Get(), {0.5f, 1.5f, 4.5f, 1.5f, nan, nan}, {}, false},
        {"NaN and infinite pixels", broken.Get(), blob::BlobPositiveStrokes(W, H, 0), {}, false},
    };
    for (const Case &c : cases) {
        BlockFields f;
        f.ref = 1;
        Result r = Call(*c.frame, nullptr, f, c.pos, c.neg);
        ASSERT_TRUE(r.ok) << c.name << ": " << r.error;
        ExpectMatteForm(r, c.name);
        int marked = 0;
        const ImgRectI &w = r.matte->DataWindow();
        for (int y = w.y0; y < w.y1; ++y)
            for (int x = w.x0; x < w.x1; ++x) marked += r.matte->GetFlt(x, y).A != 0;
        EXPECT_EQ(marked == 0, c.expectEmpty) << c.name;
        f.ref = 0;
        f.hasMask = f.tracking = f.time = 1;
        r = Call(*c.frame, r.carry.Get(), f, {}, {});
        ASSERT_TRUE(r.ok) << c.name << ", tracked: " << r.error;
        ExpectMatteForm(r, c.name);
    }
}

TEST_F(ObjectMask, BadInputsFailWithAReason) {
    Ref<Image> frame = blob::MakeBlobFrame(W, H, 0);
    Ref<Image> noRows = NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, DepthRGBAFlt32}});
    const ImgRectI half(0, 0, W / 2, H);
    Ref<Image> smallMask =
        NewImageTagList({{ImgWidth, W}, {ImgHeight, H}, {ImgDepth, DepthAFlt32}, {ImgDataWindow, &half}});
    ASSERT_TRUE(smallMask->AllocScanLineData());
    const ImgRectI smaller(0, 0, W - 1, H);
    const float nan = std::numeric_limits<float>::quiet_NaN(), inf = std::numeric_limits<float>::infinity();
    BlockFields ref, carry;
    ref.ref = 1;
    carry.hasMask = carry.tracking = 1;
    carry.time = 1;
    const std::vector<float> pos = blob::BlobPositiveStrokes(W, H, 0);
    struct Case {
        const char *name;
        const Image *src, *carried;
        BlockFields block;
        std::vector<float> pos;
        size_t blockSize;
        const ImgRectI *outWindow;
        const char *reason;
    } cases[] = {
        {"short block", frame.Get(), nullptr, ref, pos, 48, nullptr, "parameter block"},
        {"frame without rows", noRows.Get(), nullptr, ref, pos, 56, nullptr, "\"src\""},
        {"outputs not over the frame", frame.Get(), nullptr, ref, pos, 56, &smaller, "\"dst\""},
        {"odd stroke list", frame.Get(), nullptr, ref, {10, 20, 30}, 56, nullptr, "odd number"},
        {"infinite point", frame.Get(), nullptr, ref, {10, 20, inf, 5, nan, nan}, 56, nullptr, "finite"},
        {"carried mask is the dummy", frame.Get(), nullptr, carry, {}, 56, nullptr, "cachePropMaskIn"},
        {"carried mask too small", frame.Get(), smallMask.Get(), carry, {}, 56, nullptr, "cachePropMaskIn"},
    };
    for (const Case &c : cases) {
        const Result r = Call(*c.src, c.carried, c.block, c.pos, {}, c.blockSize, c.outWindow);
        EXPECT_FALSE(r.ok) << c.name;
        EXPECT_NE(r.error.find("GetObjectMask"), std::string::npos) << c.name << ": " << r.error;
        EXPECT_NE(r.error.find(c.reason), std::string::npos) << c.name << ": " << r.error;
    }
}

} // namespace
} // namespace Orvane
