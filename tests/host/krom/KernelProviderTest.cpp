// Kernels served by providers: a node of a provided kernel runs without a device on host buffers, hands over the
// block, images and float lists by name, and the registry serves the last available provider.
#include <gtest/gtest.h>

#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/KernelProvider.h"

namespace Orvane {
namespace {

/// Writes "dst" = the block's first int plus the sum of the list "add", everywhere; notes what it was given.
struct FillProvider : KernelProvider {
    bool available = true;
    ProviderCall seen;
    const char *Name() const override { return "fill"; }
    bool Available() const override { return available; }
    bool Run(const ProviderCall &call, std::string &error) override {
        seen = call;
        auto out = call.outputs.find("dst");
        if (out == call.outputs.end() || call.blockSize != sizeof(int)) return error = "bad call", false;
        float v = static_cast<float>(*static_cast<const int *>(call.block));
        for (float f : call.floatLists.at("add")) v += f;
        out->second->Fill(FltPixel{v, v, v, 1.f});
        return true;
    }
};

TEST(KernelProvider, NodesOfProvidedKernelsRunOnHostImagesAndTheLastAvailableProviderServes) {
    auto first = std::make_shared<FillProvider>(), second = std::make_shared<FillProvider>();
    RegisterKernelProvider("TestFill", first);
    RegisterKernelProvider("TestFill", second);
    EXPECT_EQ(FindKernelProvider("TestFill"), second);
    second->available = false;
    EXPECT_EQ(FindKernelProvider("TestFill"), first);

    Ref<Image> src = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt32}});
    Ref<Image> dst = NewImageTagList({{ImgWidth, 4}, {ImgHeight, 3}, {ImgDepth, DepthRGBAFlt32}});
    ASSERT_TRUE(src->AllocScanLineData() && dst->AllocScanLineData());
    auto node = KROMComputeNode::Create(nullptr, "TestFill", nullptr, nullptr, false);
    ASSERT_TRUE(node->IsValid()) << node->Error();
    auto in = KROMBuffer::CreateImage(nullptr, src.Get(), KROMBufferRead);
    auto out = KROMBuffer::CreateImage(nullptr, dst.Get(), KROMBufferWrite);
    ASSERT_TRUE(in->IsValid() && out->IsValid());
    EXPECT_EQ(out->HostImage(), dst.Get());
    node->SetParamStruct(std::make_shared<int>(5), sizeof(int));
    node->AddInput("src", in.get());
    node->AddOutput("dst", out.get());
    node->SetParam("add", std::vector<float>{0.25f, 0.5f});
    ASSERT_TRUE(node->RunSession()) << node->Error();
    EXPECT_EQ(dst->GetFlt(3, 2).R, 5.75f);
    EXPECT_EQ(first->seen.inputs.at("src"), src.Get());
    EXPECT_EQ(first->seen.outputs.count("src"), 0u);

    // Without an available provider, a kernel with no text and no device is no kernel at all.
    UnregisterKernelProvider("TestFill", first.get());
    EXPECT_EQ(FindKernelProvider("TestFill"), nullptr);
    EXPECT_FALSE(KROMComputeNode::Create(nullptr, "TestFill", nullptr, nullptr, false)->IsValid());
    UnregisterKernelProvider("TestFill", second.get());
}

} // namespace
} // namespace Orvane
