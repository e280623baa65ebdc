#include "host/krom/KROMComputeNode.h"

#include <algorithm>

#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/krom/CommonKernels.h"
#include "host/krom/GPUMemory.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KernelProvider.h"

namespace Orvane {

std::unique_ptr<KROMComputeNode> KROMComputeNode::Create(IDeviceContext *ctx, const char *name, const char *source,
                                                         const char *paramStructText, bool compileNow) {
    std::unique_ptr<KROMComputeNode> node(new KROMComputeNode);
    node->context_ = ctx;
    node->name_ = name ? name : "";
    node->paramText_ = paramStructText ? paramStructText : "";
    node->common_ = source == nullptr;
    if (source) node->source_ = source;
    node->provider_ = FindKernelProvider(node->name_);
    if (node->provider_) return node; // served by code: no context or text needed
    if (!ctx)
        node->error_ = "no device";
    else if (node->name_.empty())
        node->error_ = "a kernel needs a name";
    else if (node->ResolveSource() && compileNow) {
        if (!ctx->GetKernel(node->name_, node->paramText_ + node->source_, &node->error_) && node->error_.empty())
            node->error_ = "kernel " + node->name_ + " does not compile";
    }
    return node;
}

bool KROMComputeNode::ResolveSource() {
    if (!common_) return true;
    const CommonKernel *kernel = FindCommonKernel(name_);
    if (!kernel) {
        error_ = "the common kernel library has no kernel \"" + name_ + "\"";
        return false;
    }
    source_ = kernel->source;
    return true;
}

void KROMComputeNode::AddInput(const char *name, const KROMBuffer *buf) { images_[name] = buf; }

void KROMComputeNode::AddOutput(const char *name, const KROMBuffer *buf) {
    images_[name] = buf;
    outputs_.push_back(name);
}

void KROMComputeNode::AddSampler(const char *name, TextureFilterMode filter, TextureAddressMode address,
                                 TextureNormalizedCoords coords) {
    samplers_[name] = DeviceSampler{filter, address, coords};
}

void KROMComputeNode::SetParamStruct(std::shared_ptr<const void> block, size_t size) {
    block_ = std::move(block);
    blockSize_ = size;
}

void KROMComputeNode::AddKernelOption(const char *name, const ScriptVal &value) {
    if (std::string(name) == KROMCommonKernelOption && value.IsNumber() && value.AsNumber() >= 0.5 && !common_) {
        common_ = true;
        ResolveSource();
    }
}

bool KROMComputeNode::RunProvider() {
    ProviderCall call;
    call.kernel = name_;
    call.block = block_.get();
    call.blockSize = blockSize_;
    call.floatLists = floatLists_;
    call.abort = abort_;
    for (const auto &[name, buf] : images_) {
        if (!buf || !buf->HostImage()) {
            error_ = "kernel " + name_ + ": \"" + name + "\" is not an image in main memory";
            return false;
        }
        if (std::find(outputs_.begin(), outputs_.end(), name) != outputs_.end())
            call.outputs[name] = const_cast<Image *>(buf->HostImage());
        else
            call.inputs[name] = buf->HostImage();
    }
    return provider_->Run(call, error_);
}

bool KROMComputeNode::RunSession() {
    if (provider_) return RunProvider();
    if (!IsValid()) return false;
    auto fail = [this](std::string why) {
        error_ = std::move(why);
        return false;
    };
    std::shared_ptr<IDeviceKernel> kernel = context_->GetKernel(name_, paramText_ + source_, &error_);
    if (!kernel) return fail(error_.empty() ? "kernel " + name_ + " does not compile" : error_);

    // Bind the arguments in the kernel's parameter order.
    std::vector<KernelArgument> args;
    std::shared_ptr<IDeviceMemory> blockMemory;
    for (const KernelParamDecl &p : kernel->Params()) {
        KernelArgument arg;
        switch (p.kind) {
        case KernelParamDecl::Kind::Block: {
            if (!block_ || blockSize_ == 0) return fail("kernel " + name_ + ": no parameter block");
            blockMemory = context_->Allocate(blockSize_, &error_);
            if (!blockMemory || !context_->Write(*blockMemory, 0, block_.get(), blockSize_, &error_)) return false;
            arg.memory = blockMemory.get();
            break;
        }
        case KernelParamDecl::Kind::Image:
        case KernelParamDecl::Kind::WriteImage: {
            auto it = images_.find(p.name);
            if (it == images_.end() || !it->second || !it->second->IsValid())
                return fail("kernel " + name_ + ": no image for \"" + p.name + "\"");
            if (!it->second->IsImage() || it->second->GetIDeviceContext() != context_)
                return fail("kernel " + name_ + ": \"" + p.name + "\" is not a device image of this device");
            arg.memory = it->second->GetIDeviceMemory();
            break;
        }
        case KernelParamDecl::Kind::Sampler: {
            auto it = samplers_.find(p.name);
            if (it == samplers_.end()) return fail("kernel " + name_ + ": no sampler \"" + p.name + "\"");
            arg.value.resize(sizeof(DeviceSampler));
            std::memcpy(arg.value.data(), &it->second, sizeof(DeviceSampler));
            break;
        }
        case KernelParamDecl::Kind::Scalar: {
            auto it = scalars_.find(p.name);
            if (it == scalars_.end()) return fail("kernel " + name_ + ": no value for \"" + p.name + "\"");
            arg.value = it->second;
            break;
        }
        }
        args.push_back(std::move(arg));
    }
    if (outputs_.empty()) return fail("kernel " + name_ + ": no output");
    const KROMBuffer *out = images_[outputs_.front()];
    if (!out || !out->IsValid()) return fail("kernel " + name_ + ": the output is not valid");
    return context_->Launch(*kernel, args, out->Width(), out->Height(), &error_);
}

bool KROMComputeNode::ExecKernelI(Request *req, const char *name, const char *source, const char *paramStructText,
                                  size_t blockSize, int srcCompOrderOffset, int dstCompOrderOffset,
                                  std::shared_ptr<void> block,
                                  const std::vector<std::pair<const char *, Image *>> &images) {
    RenderTask *task = req ? req->GetTask() : nullptr;
    if (!task || !task->Device() || !block) return false;
    std::string failure;
    const bool ok = task->Execute(name, [&](IDeviceContext *ctx) {
        std::unique_ptr<KROMComputeNode> node = Create(ctx, name, source, paramStructText, false);
        std::vector<std::unique_ptr<KROMBuffer>> buffers;
        std::vector<std::pair<Image *, const KROMBuffer *>> outputs;
        const KROMBuffer *firstIn = nullptr;
        for (const auto &[argName, img] : images) {
            if (!argName) break;
            const bool isOutput = std::strncmp(argName, "output", 6) == 0;
            buffers.push_back(KROMBuffer::CreateImage(ctx, img, isOutput ? KROMBufferWrite : KROMBufferRead));
            if (!buffers.back()->IsValid()) {
                failure = "\"" + std::string(argName) + "\": " + buffers.back()->Error();
                return false;
            }
            if (isOutput) {
                outputs.emplace_back(img, buffers.back().get());
                node->AddOutput(argName, buffers.back().get());
            } else {
                if (!firstIn) firstIn = buffers.back().get();
                node->AddInput(argName, buffers.back().get());
            }
        }
        if (!node->IsValid() || outputs.empty()) {
            failure = node->IsValid() ? "no output image" : node->Error();
            return false;
        }
        auto *bytes = static_cast<uint8_t *>(block.get());
        auto fillOrder = [&](int offset, const KROMBuffer *buf) {
            if (offset < 0 || !buf || static_cast<size_t>(offset) + sizeof(int) > blockSize) return;
            const int order = buf->GetCompOrder();
            std::memcpy(bytes + offset, &order, sizeof order);
        };
        fillOrder(srcCompOrderOffset, firstIn);
        fillOrder(dstCompOrderOffset, outputs.front().second);
        node->SetParamStruct(block, blockSize);
        if (!source) node->AddKernelOption(KROMCommonKernelOption, ScriptVal(1.0));
        if (!node->RunSession()) {
            failure = node->Error();
            return false;
        }
        for (const auto &[img, buf] : outputs) img->SetGPUMem(buf->GetGPUMemory(), true);
        return true;
    });
    if (!ok) task->NoteDeviceFailure(name, failure.empty() ? "failed" : failure);
    return ok;
}

} // namespace Orvane
