// The network provider of the object mask on a network this test writes itself: a 1 x 1 convolution of the six
// input planes and a sigmoid, so the matte is sigmoid(8 pos - 8 neg + 4 carried - 2) at every pixel and can be
// worked out here. Files that are no network leave it unavailable with a reason; an available one serves.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/segment/OnnxObjectMask.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

// ---- a protocol-buffer writer, just enough for an ONNX model ----
using Bytes = std::string;
Bytes Varint(uint64_t v) {
    Bytes b;
    do {
        b += static_cast<char>((v & 0x7f) | (v > 0x7f ? 0x80 : 0));
        v >>= 7;
    } while (v);
    return b;
}
Bytes Int(int field, uint64_t v) { return Varint(uint64_t(field) << 3) + Varint(v); }
Bytes Len(int field, const Bytes &payload) {
    return Varint((uint64_t(field) << 3) | 2) + Varint(payload.size()) + payload;
}
Bytes Floats(int field, const std::vector<float> &v) {
    Bytes raw(v.size() * 4, '\0');
    std::memcpy(raw.data(), v.data(), raw.size());
    return Len(field, raw);
}
/// TensorProto: dims (1), data type float (2 = 1), raw data (9), name (8).
Bytes Tensor(const char *name, const std::vector<int64_t> &dims, const std::vector<float> &values) {
    Bytes t;
    for (int64_t d : dims) t += Int(1, static_cast<uint64_t>(d));
    return t + Int(2, 1) + Len(8, name) + Floats(9, values);
}
/// ValueInfoProto of a float tensor 1 x channels x h x w with named height and width.
Bytes FloatInfo(const char *name, int channels) {
    const Bytes shape =
        Len(1, Int(1, 1)) + Len(1, Int(1, uint64_t(channels))) + Len(1, Len(2, "h")) + Len(1, Len(2, "w"));
    return Len(1, name) + Len(2, Len(1, Int(1, 1) + Len(2, shape)));
}
/// The model: input (1 x 6 x h x w) -> Conv 1 x 1 (weights w, bias b, `planes` output planes) -> Sigmoid -> output
/// (1 x planes x h x w).
Bytes Model(const std::vector<float> &w, float b, int planes = 1) {
    const Bytes kernelShape = Len(1, "kernel_shape") + Int(20, 7) + Int(8, 1) + Int(8, 1);
    const Bytes conv =
        Len(1, "input") + Len(1, "W") + Len(1, "B") + Len(2, "conv") + Len(4, "Conv") + Len(5, kernelShape);
    const Bytes sigmoid = Len(1, "conv") + Len(2, "output") + Len(4, "Sigmoid");
    const Bytes graph = Len(1, conv) + Len(1, sigmoid) + Len(2, "mask") + Len(5, Tensor("W", {planes, 6, 1, 1}, w)) +
                        Len(5, Tensor("B", {planes}, std::vector<float>(planes, b))) + Len(11, FloatInfo("input", 6)) +
                        Len(12, FloatInfo("output", planes));
    return Int(1, 7) + Len(7, graph) + Len(8, Int(2, 11));
}

double Sigmoid(double x) { return 1.0 / (1.0 + std::exp(-x)); }

Ref<Image> Frame(int w, int h, float value) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    EXPECT_TRUE(img->AllocScanLineData());
    img->Fill(FltPixel{value, value, value, 1.f});
    return img;
}

TEST(OnnxObjectMask, AWrittenNetworkGivesTheMatteItsWeightsMakeAndBadFilesAreUnavailable) {
    Orvane::Test::TempDir dir;
    const std::string path = dir / "mask.onnx";
    std::ofstream(path, std::ios::binary) << Model({0, 0, 0, 8, -8, 4}, -2);
    OnnxObjectMaskProvider provider(path);
    ASSERT_TRUE(provider.Available()) << provider.LoadError();

    // A 40 x 30 frame (the network's own size): a positive stroke along row 10 from x 5 to 20, a negative dot at
    // (30, 20), a carried mask of 0.5 everywhere.
    const int W = 40, H = 30;
    Ref<Image> src = Frame(W, H, 0.3f), carried = Frame(W, H, 0.f), dst = Frame(W, H, 0.f), out = Frame(W, H, 0.f);
    carried->Fill(FltPixel{0.5f, 0.5f, 0.5f, 0.5f}); // a carried mask holds the mask in every channel
    OrvaneSemanticSegmentationParams block;
    block.hasCachePropMask = 1;
    ProviderCall call;
    call.block = &block;
    call.blockSize = sizeof block;
    call.inputs = {{"src", src.Get()}, {"cachePropMaskIn", carried.Get()}};
    call.outputs = {{"dst", dst.Get()}, {"cachePropMaskOut", out.Get()}};
    const float nan = std::nanf("");
    call.floatLists = {{"posStroke", {5.5f, 10.5f, 20.5f, 10.5f, nan, nan}}, {"negStroke", {30.5f, 20.5f, nan, nan}}};
    std::string error;
    ASSERT_TRUE(provider.Run(call, error)) << error;
    const struct {
        int x, y;
        double logit;
    } cases[] = {{12, 10, 8 + 2 - 2}, {30, 20, -8 + 2 - 2}, {2, 2, 2 - 2}, {12, 25, 0}};
    for (const auto &c : cases) {
        SCOPED_TRACE(std::to_string(c.x) + "," + std::to_string(c.y));
        EXPECT_NEAR(dst->GetFlt(c.x, c.y).A, Sigmoid(c.logit), 1e-5);
        EXPECT_NEAR(out->GetFlt(c.x, c.y).R, Sigmoid(c.logit), 1e-5);
    }
    // Without a carried mask the plane is 0: sigmoid(-2) away from the strokes.
    block.hasCachePropMask = 0;
    ASSERT_TRUE(provider.Run(call, error)) << error;
    EXPECT_NEAR(dst->GetFlt(2, 2).A, Sigmoid(-2), 1e-5);

    // Through the compute node, as the tool calls it, once the provider is registered (it serves while it can).
    auto shared = std::make_shared<OnnxObjectMaskProvider>(path);
    RegisterKernelProvider("GetObjectMask", shared);
    EXPECT_EQ(FindKernelProvider("GetObjectMask"), shared);
    auto node = KROMComputeNode::Create(nullptr, "GetObjectMask", nullptr, OrvaneSemanticSegmentationParamsText, false);
    auto bSrc = KROMBuffer::CreateImage(nullptr, src.Get(), KROMBufferRead);
    auto bDst = KROMBuffer::CreateImage(nullptr, dst.Get(), KROMBufferWrite);
    node->SetParamStruct(std::make_shared<OrvaneSemanticSegmentationParams>(block), sizeof block);
    node->AddInput("src", bSrc.get());
    node->AddOutput("dst", bDst.get());
    node->SetParam("posStroke", std::vector<float>{5.5f, 10.5f, 20.5f, 10.5f, nan, nan});
    ASSERT_TRUE(node->RunSession()) << node->Error();
    EXPECT_NEAR(dst->GetFlt(12, 10).A, Sigmoid(6), 1e-5);
    UnregisterKernelProvider("GetObjectMask", shared.get());

    // A file that is no network: unavailable, the file named in the reason. A network giving two planes where
    // the matte is one loads, but its run fails with a reason rather than a matte.
    std::ofstream(dir / "bad.onnx", std::ios::binary) << "not a network";
    OnnxObjectMaskProvider broken(dir / "bad.onnx");
    EXPECT_FALSE(broken.Available());
    EXPECT_NE(broken.LoadError().find("bad.onnx"), std::string::npos) << broken.LoadError();
    std::ofstream(dir / "two.onnx", std::ios::binary) << Model(std::vector<float>(12, 0.5f), 0, 2);
    OnnxObjectMaskProvider two(dir / "two.onnx");
    ASSERT_TRUE(two.Available()) << two.LoadError();
    error.clear();
    EXPECT_FALSE(two.Run(call, error));
    EXPECT_EQ(error, "the network's output is not one plane of the input's size");
}

} // namespace
} // namespace Orvane
