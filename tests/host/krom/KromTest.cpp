// The device service: kernel signatures, the dialect's pixel conversions and sampling against the host's own,
// device images on Image, the kernel caches, the device thread, the common library on every back end.
#include <memory>
#include <thread>

#include "host/image/ColorMatrix.h"
#include "host/krom/CommonKernels.h"
#include "host/krom/GPUMemory.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/KernelDiskCache.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/host/krom/DeviceTestSupport.h"

namespace Orvane {
namespace {
using namespace ::Orvane::Test;

// A copy through the dialect: reads any image as float4, writes any image.
const char kCopyParams[] = "typedef struct { int workSize[2]; } CopyParams;\n";
const char kCopyKernel[] = R"(
__KERNEL__ void CopyImage(__CONSTANTREF__ CopyParams *p_pParams, __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    _tex2DVec4Write(output, x, y, _tex2DVecN(input, x, y, 15));
}
)";

/// Runs CopyImage from `src` into a new image of `depth` (same windows) on the device and brings it back.
Ref<Image> CopyOnDevice(IDeviceContext *ctx, const Image *src, int depth) {
    const ImgRectI dw = src->DataWindow();
    Ref<Image> dst = NewImageTagList({{ImgLikeImage, src}, {ImgDepth, depth}, {ImgDataWindow, &dw}});
    auto block = std::make_shared<int[]>(2);
    block[0] = dw.Width(), block[1] = dw.Height();
    auto node = KROMComputeNode::Create(ctx, "CopyImage", kCopyKernel, kCopyParams, true);
    auto in = KROMBuffer::CreateImage(ctx, src, KROMBufferRead);
    auto out = KROMBuffer::CreateImage(ctx, dst.Get(), KROMBufferWrite);
    EXPECT_TRUE(node->IsValid()) << node->Error();
    EXPECT_TRUE(in->IsValid() && out->IsValid());
    node->SetParamStruct(block, 2 * sizeof(int));
    node->AddInput("input", in.get());
    node->AddOutput("output", out.get());
    EXPECT_TRUE(node->RunSession()) << node->Error();
    dst->SetGPUMem(out->GetGPUMemory(), true);
    EXPECT_TRUE(dst->DownloadGPUMem());
    return dst;
}

TEST(KernelSignature, ReadsKindsAndNamesCommonKernelsCompileAndTheDialectConvertsAndSamplesAsTheHost) {
    std::vector<KernelParamDecl> params;
    std::string error;
    const std::string text =
        "KROM_FN float helper(float x) { return x; }\n"
        "__KERNEL__   void  Grad ( __CONSTANTREF__ GradParams *p_pParams,\n"
        "  __TEXTURE2D__ p_Grad, __TEXTURE2D_WRITE__ output, __SAMPLER__ RowSampler, int count) {}";
    ASSERT_TRUE(ParseKernelSignature(text, "Grad", params, &error)) << error;
    ASSERT_EQ(params.size(), 5u);
    using K = KernelParamDecl::Kind;
    const K kinds[] = {K::Block, K::Image, K::WriteImage, K::Sampler, K::Scalar};
    const char *names[] = {"p_pParams", "p_Grad", "output", "RowSampler", "count"};
    for (size_t i = 0; i < params.size(); ++i) EXPECT_TRUE(params[i].kind == kinds[i] && params[i].name == names[i]);
    EXPECT_EQ(params[4].type, "int");
    // A kernel whose name only starts like the one asked for is not it.
    EXPECT_FALSE(ParseKernelSignature(text, "Gra", params, &error));
    EXPECT_NE(error.find("not found"), std::string::npos);
    // Every common kernel compiles on every back end; a broken one is reported.
    const char bad[] = "__KERNEL__ void Bad(int x) { undefined_thing(x); }";
    ASSERT_GE(CommonKernels().size(), 5u);
    for (const char *name :
         {"BrightnessContrast", "BrightnessContrastReverse", "ColorMatrix", "Background", "BackgroundGrad"})
        EXPECT_NE(FindCommonKernel(name), nullptr) << name;
    if (BackendBuilt(DeviceBackend::CUDA)) { // compile only: this catches dialect errors without a GPU
        std::string log;
        for (const CommonKernel &k : CommonKernels())
            EXPECT_TRUE(CompileKernelForCUDA(k.name, std::string(k.paramStructText) + k.source, &log)) << k.name << log;
        EXPECT_FALSE(CompileKernelForCUDA("Bad", bad, &log));
        EXPECT_NE(log.find("Bad"), std::string::npos);
    }
    ORVANE_NEED_OPENCL(ctx);
    for (const CommonKernel &k : CommonKernels()) {
        auto node = KROMComputeNode::Create(ctx, k.name, nullptr, k.paramStructText, true);
        EXPECT_TRUE(node->IsValid()) << k.name << ": " << node->Error();
    }
    auto node = KROMComputeNode::Create(ctx, "Bad", bad, "", true);
    EXPECT_FALSE(node->IsValid() || node->RunSession());
    auto missing = KROMComputeNode::Create(ctx, "NoSuchCommonKernel", nullptr, "", false);
    EXPECT_TRUE(!missing->IsValid() && missing->Error().find("NoSuchCommonKernel") != std::string::npos);
    // The dialect reads and writes every depth as the host converts it.
    Ref<Image> src = PatternImage(37, 11, DepthRGBAFlt32);
    for (int depth = 1; depth <= 8; ++depth) {
        // Read: any depth into float, as LoadFlt reads it.
        Ref<Image> at = PatternImage(19, 7, depth, 3), read = CopyOnDevice(ctx, at.Get(), DepthRGBAFlt32);
        for (int y = 0; y < 7; ++y)
            for (int x = 0; x < 19; ++x) {
                FltPixel expect;
                LoadFlt(depth, at->PixelAddress(x, y), 1, &expect);
                ASSERT_EQ(std::memcmp(read->PixelAddress(x, y), &expect, sizeof expect), 0) << depth << " " << x;
            }
        // Write: float into any depth, as StoreFlt stores it. Integers are rounded in float on the device, in
        // double on the host: a value within a float step of a half code may land on its neighbour.
        Ref<Image> written = CopyOnDevice(ctx, src.Get(), depth);
        const PixelFormat f = FormatOfDepth(depth);
        int offByOne = 0, wrong = 0;
        for (int y = 0; y < 11; ++y)
            for (int x = 0; x < 37; ++x) {
                uint8_t expect[16];
                StoreFlt(depth, reinterpret_cast<const FltPixel *>(src->PixelAddress(x, y)), 1, expect);
                const uint8_t *got = written->PixelAddress(x, y);
                if (std::memcmp(expect, got, f.BytesPerPixel()) == 0) continue;
                bool near = !f.isFloat;
                for (int c = 0; near && c < f.channels; ++c) {
                    uint32_t a = 0, b = 0;
                    std::memcpy(&a, expect + c * f.bytesPerComponent, f.bytesPerComponent);
                    std::memcpy(&b, got + c * f.bytesPerComponent, f.bytesPerComponent);
                    near = std::abs(static_cast<int>(a) - static_cast<int>(b)) <= 1;
                }
                ++(near ? offByOne : wrong);
            }
        EXPECT_EQ(wrong, 0) << "depth " << depth;
        EXPECT_LE(offByOne, 2) << "depth " << depth;
    }
    // The linear sampler interpolates between texel centres and clamps.
    const char sampleParams[] = "typedef struct { float u[6]; int workSize[2]; } SampleParams;\n";
    const char kernel[] = R"(
__KERNEL__ void SampleRow(__CONSTANTREF__ SampleParams *p_pParams, __TEXTURE2D__ table, __TEXTURE2D_WRITE__ output,
                          __SAMPLER__ s) {
    DEFINE_KERNEL_ITERATORS_XY(x, y);
    if (x >= p_pParams->workSize[0] || y >= p_pParams->workSize[1]) return;
    _tex2DVec4Write(output, x, y, _tex2DSample(table, s, p_pParams->u[x], 0.5f));
}
)";
    // Four texels 0, 10, 20, 30 (in red); their centres sit at u = (k + 0.5) / 4.
    float texels[4][4] = {{0, 0, 0, 1}, {10, 0, 0, 1}, {20, 0, 0, 1}, {30, 0, 0, 1}};
    struct Block {
        float u[6];
        int workSize[2];
    };
    auto block = std::make_shared<Block>(Block{{-1.f, 0.125f, 0.25f, 0.5f, 0.8125f, 2.f}, {6, 1}});
    const ImgRectI dw(0, 0, 6, 1);
    Ref<Image> out = NewImageTagList({{ImgWidth, 6}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &dw}});
    auto sampleNode = KROMComputeNode::Create(ctx, "SampleRow", kernel, sampleParams, true);
    auto table = KROMBuffer::CreateImage(ctx, 4, 1, DepthRGBAFlt32, texels);
    auto dst = KROMBuffer::CreateImage(ctx, out.Get(), KROMBufferWrite);
    ASSERT_TRUE(sampleNode->IsValid() && table->IsValid() && dst->IsValid()) << sampleNode->Error();
    sampleNode->SetParamStruct(block, sizeof(Block));
    sampleNode->AddInput("table", table.get());
    sampleNode->AddOutput("output", dst.get());
    sampleNode->AddSampler("s", TextureFilterLinear, TextureAddressClamp, TextureCoordsNormalized);
    ASSERT_TRUE(sampleNode->RunSession()) << sampleNode->Error();
    out->SetGPUMem(dst->GetGPUMemory(), true);
    ASSERT_TRUE(out->DownloadGPUMem());
    // Clamped below, a texel centre, halfway between texels, 3/4 of the way, clamped above.
    const float expect[6] = {0.f, 0.f, 5.f, 15.f, 27.5f, 30.f};
    for (int x = 0; x < 6; ++x) EXPECT_FLOAT_EQ(out->GetFlt(x, 0).R, expect[x]) << x;
}

TEST(DeviceImages, UploadIsKeptResultsAreStaleUntilDownloadedAndLocksKeepAWriterApart) {
    ORVANE_NEED_OPENCL(ctx);
    Ref<Image> src = PatternImage(16, 9, DepthRGBAFlt32), dst = Blank(16, 9, DepthRGBAFlt32);
    EXPECT_FALSE(src->GetGPUMem());
    {
        // The upload stays with the image, current with main memory; a second device image reuses it.
        auto in = KROMBuffer::CreateImage(ctx, src.Get(), KROMBufferRead);
        auto again = KROMBuffer::CreateImage(ctx, src.Get(), KROMBufferRead);
        ASSERT_TRUE(in->IsValid() && src->GetGPUMem());
        EXPECT_TRUE(src->GetGPUMem().Get() == in->GetGPUMemory() && again->GetGPUMemory() == in->GetGPUMemory());
        EXPECT_TRUE(!src->IsGPUMemDirty() && in->GetCompOrder() == (CompOrderRGBA | (3 << 4)));
    }
    EXPECT_TRUE(SameBits(*CopyOnDevice(ctx, src.Get(), DepthRGBAFlt32), *src)); // downloads

    auto out = KROMBuffer::CreateImage(ctx, dst.Get(), KROMBufferWrite);
    dst->SetGPUMem(out->GetGPUMemory(), true);
    // Nothing in main memory yet.
    EXPECT_TRUE(dst->IsGPUMemDirty() && !dst->HasScanLineData() && dst->SizeOf() > dst->DataBytes());
    out.reset();
    ASSERT_TRUE(dst->DownloadGPUMem());
    EXPECT_TRUE(!dst->IsGPUMemDirty() && dst->HasScanLineData());
    // Share locks keep a writer apart.
    Ref<Image> img = PatternImage(4, 4);
    auto reader = KROMBuffer::CreateImage(ctx, img.Get(), KROMBufferRead);
    GPUMemory *mem = reader->GetGPUMemory();
    ASSERT_NE(mem, nullptr);
    EXPECT_TRUE(mem->ObtainShareLock(GPUShareRead, false)); // readers share
    mem->ReleaseShareLock();
    EXPECT_FALSE(mem->ObtainShareLock(GPUShareWrite, false)); // not while a reader holds it
    reader.reset();
    EXPECT_TRUE(mem->ObtainShareLock(GPUShareWrite, false) && !mem->ObtainShareLock(GPUShareRead, false));
    mem->ReleaseShareLock();
}

TEST(KernelCaches, CompileOnceReuseBinariesTheDeviceThreadQueuesInOrderAndTheMatrixKernelGivesTheRowsBits) {
    ORVANE_NEED_OPENCL(ctx);
    const int before = ctx->CompileCount();
    std::string log;
    const std::string text = std::string(kCopyParams) + kCopyKernel;
    ASSERT_TRUE(ctx->GetKernel("CopyImage", text, &log) && ctx->GetKernel("CopyImage", text, &log)) << log;
    EXPECT_LE(ctx->CompileCount() - before, 1);

    const std::filesystem::path folder = std::filesystem::temp_directory_path() / "orvane-kernel-cache-test";
    std::filesystem::remove_all(folder);
    setenv("ORVANE_KERNEL_CACHE", folder.c_str(), 1);
    auto files = [&] {
        size_t n = 0;
        if (std::filesystem::exists(folder))
            for (const auto &e : std::filesystem::directory_iterator(folder)) n += e.path().extension() == ".bin";
        return n;
    };
    for (int round = 0; round < 2; ++round) {
        // A fresh context has no kernels: the first compiles and stores, the second loads.
        std::unique_ptr<IDeviceContext> fresh = OpenDeviceContext(DeviceBackend::OpenCL, &log);
        ASSERT_TRUE(fresh) << log;
        Ref<Image> src = PatternImage(8, 3);
        EXPECT_TRUE(SameBits(*CopyOnDevice(fresh.get(), src.Get(), DepthRGBAFlt32), *src) && files() == 1) << round;
    }
    unsetenv("ORVANE_KERNEL_CACHE");
    std::filesystem::remove_all(folder);
    // The device thread: Execute waits, nests and queues in order.
    RenderTask task;
    EXPECT_EQ(RenderTask::Find(task.ID()), &task);
    EXPECT_FALSE(task.Execute("no device", [](IDeviceContext *) { return true; }));
    task.SetDevice(ctx);
    const auto caller = std::this_thread::get_id();
    std::thread::id ran;
    bool nestedRan = false;
    EXPECT_TRUE(task.Execute("outer", [&](IDeviceContext *c) {
        ran = std::this_thread::get_id();
        // Execute from the device thread runs in place instead of waiting on itself.
        nestedRan = task.Execute("inner", [&](IDeviceContext *) { return std::this_thread::get_id() == ran; });
        return c == ctx;
    }));
    EXPECT_TRUE(ran != caller && nestedRan);
    std::vector<int> order;
    for (int i = 0; i < 5; ++i) task.QueueExecute("queued", [&order, i](IDeviceContext *) { order.push_back(i); });
    ctx->Finish();
    EXPECT_EQ(order, (std::vector<int>{0, 1, 2, 3, 4}));
    EXPECT_NE(std::make_unique<RenderTask>()->ID(), task.ID());
    EXPECT_EQ(RenderTask::Find(task.ID()), &task); // after the other is gone
    // The matrix kernel gives the rows' bits.
    Ref<Image> pattern = PatternImage(41, 23, DepthRGBAFlt32, 7);
    pattern->SetCanvasColor(FltPixel{0.1f, 0.2f, 0.3f, 0.5f});
    ColorMatrixFull m;
    m.Scale(0, 1.3).Offset(1, -0.07).Scale(2, 0.6).Offset(3, 0.02);
    m.m[0][1] = 0.25, m.m[2][0] = -0.125, m.m[3][2] = 0.3;
    const ImgRectI wider(-5, -3, 47, 30); // beyond the source on every side: canvas there
    for (int depth : {DepthRGBAFlt32, DepthRGBAInt16, DepthAFlt32}) {
        Ref<Image> cpu = Blank(41, 23, depth, &wider), dev = Blank(41, 23, depth, &wider);
        ASSERT_TRUE(ApplyMatrixTagList(pattern.Get(), cpu.Get(), {{MtxColorMatrixFull, &m}}));
        DeviceRender render(ctx);
        const int launches = ctx->LaunchCount();
        ASSERT_TRUE(ApplyMatrixTagList(pattern.Get(), dev.Get(), render.On({{MtxColorMatrixFull, &m}})));
        EXPECT_EQ(ctx->LaunchCount(), launches + 1) << "the device ran it";
        ASSERT_TRUE(dev->IsGPUMemDirty() && dev->DownloadGPUMem());
        EXPECT_EQ(dev->GetCanvasColor(), cpu->GetCanvasColor());
        if (FormatOfDepth(depth).isFloat) {
            EXPECT_TRUE(SameBits(*dev, *cpu)) << "depth " << depth;
        }
        EXPECT_LE(MaxDiff(*dev, *cpu, wider), 1.6e-5) << "depth " << depth;
    }
}

} // namespace
} // namespace Orvane
