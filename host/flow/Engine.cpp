#include "host/flow/Engine.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <unordered_map>
#include <vector>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputAt.h"
#include "host/flow/MotionBlur.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/flow/ResultCache.h"
#include "host/image/NewImage.h"
#include "host/image/PixelMemory.h"
#include "host/image/TransformMatrix.h"

namespace Orvane {
namespace {

bool Volatile(const Operator *op) { return op->RegAttrB(RegNoCache) || op->RegAttrB(RegUnpredictable); }

/// The request flags that change a result, with the proxy scale.
uint32_t Traits(uint32_t flags, const RenderTask *task) {
    uint32_t t = flags & (ReqFlagPreCalc | ReqFlagProxy | ReqFlagQuick | ReqFlagNoGPU | ReqFlagMotionSample);
    // Device results may differ from the rows in the last bits: kept apart.
    if (task && task->Device()) t |= 1u << 30;
    // A pass-through look hands inputs on where tools allow it: kept apart too.
    if (task && task->passThrough) t |= 1u << 29;
    if ((flags & ReqFlagProxy) && task) t |= static_cast<uint32_t>(std::min(task->proxyScale, 255)) << 16;
    return t;
}

/// Hashes already worked out during one StateHash call, so that a tool feeding several others is hashed once.
using HashMemo = std::unordered_map<const Output *, std::optional<uint64_t>>;

std::optional<uint64_t> StateHashOf(const Output *out, double time, int depth, HashMemo &memo, RenderTask *task) {
    if (const auto known = memo.find(out); known != memo.end()) return known->second;
    if (task)
        if (const auto kept = task->FindStateHash(out, time)) return *kept;
    const Operator *op = out->Owner();
    if (!op || Volatile(op) || depth > MaxFlowDepth) return std::nullopt;
    const char *cls = op->ClassID().Text();
    std::optional<uint64_t> h = HashMix(HashBytes(cls, std::strlen(cls)), static_cast<uint64_t>(out->Index()));
    for (const auto &in : op->Inputs()) {
        if (in->IsPassive()) continue;
        if (in->Link()) {
            std::optional<uint64_t> up = StateHashOf(in->Link(), time, depth + 1, memo, task);
            if (!up) {
                h.reset();
                break;
            }
            h = HashMix(*h, *up);
        } else {
            h = HashMix(*h, in->ValueHash(time));
        }
    }
    memo[out] = h;
    if (task) task->KeepStateHash(out, time, h);
    return h;
}

/// An image input of a tool that needs whole frames: the canvas made real
/// over the frame, or the image itself when it already covers it.
Ref<Parameter> CoverFrame(const Ref<Parameter> &value, bool precalc) {
    auto *img = dynamic_cast<Image *>(value.Get());
    if (!img || img->DataWindow().Contains(img->Frame())) return value;
    const ImgRectI frame = img->Frame();
    const ImgRectI dw = img->DataWindow() | frame;
    const FltPixel canvas = img->GetCanvasColor();
    Ref<Image> full =
        NewImageTagList({{ImgLikeImage, img}, {ImgDataWindow, &dw}, {ImgNoData, precalc}, {ImgCanvasColor, &canvas}});
    if (!full) return nullptr;
    if (!precalc) full->ImageCopy(img);
    return full;
}

/// The domain of definition a pre-calculated value gives: an image's data
/// window (with its frame for tools that need whole frames), or the output
/// window of a pending transform, with the frame it renders into.
std::optional<ImageDomain> DomainOfShape(const Parameter *shape, bool wholeFrames) {
    if (const auto *img = dynamic_cast<const Image *>(shape))
        return DomainOfImage(*img, wholeFrames ? img->DataWindow() | img->Frame() : img->DataWindow());
    if (const auto *tm = dynamic_cast<const TransformMatrix *>(shape)) {
        ImageDomain d(tm->OutputDataWindow());
        d.frame = ImgRectI(0, 0, tm->Width(), tm->Height());
        d.xScale = tm->XScale(), d.yScale = tm->YScale();
        if (wholeFrames) d.rect |= d.frame;
        return d;
    }
    return std::nullopt;
}

/// Whether an input takes a pending transform as it is (it declares
/// LinkSecondDataType TransformMatrix); every other input receives pixels.
bool TakesTransforms(const Input *in) {
    for (const TagItem *item : in->Tags().FindAll(LinkSecondDataType))
        if (item->AsID() == CLSID_DataType_TransformMatrix) return true;
    return false;
}

/// The pixels of a pending transform, over `roi` when given (the whole
/// output domain, endless sides cut to the frame, otherwise); other values
/// unchanged. Null when the resampling was aborted or ran out of memory.
Ref<Parameter> PixelsOf(Ref<Parameter> value, const std::optional<ImageDomain> &roi, const Request *req) {
    auto *tm = dynamic_cast<TransformMatrix *>(value.Get());
    if (!tm) return value;
    TagList tags{{WorkRequest, static_cast<const void *>(req)}};
    if (roi) tags.Set({ImgDataWindow, &roi->rect});
    return tm->ApplyTransformTagList(tags);
}

/// The console line of a tool that ran out of memory: what it needed and the
/// limit when pixel memory refused it.
void ReportOutOfMemory(const Operator *op, double time) {
    OrvaneDoc *doc = op->GetDoc();
    const std::string why = TakePixelRefusal();
    if (!doc) return;
    if (why.empty())
        doc->PrintF(ConsoleError, "%s: out of memory (time = %f)\n", op->Name().c_str(), time);
    else
        doc->PrintF(ConsoleError, "%s: %s\n", op->Name().c_str(), why.c_str());
}

/// A value that should carry pixels has them: an image without rows after a
/// refused allocation is a tool that did not notice its failure.
bool HasPixels(const Parameter *value) {
    const auto *img = dynamic_cast<const Image *>(value);
    return value &&
           (!img || img->IsNoData() || img->HasScanLineData() || img->DataWindow().IsNull() || img->GPUBytes());
}

} // namespace

std::optional<uint64_t> StateHash(const Output *out, double time, RenderTask *task) {
    if (!out) return std::nullopt;
    HashMemo memo;
    std::optional<uint64_t> h = StateHashOf(out, time, 0, memo, task);
    if (h) h = HashMix(*h, GetApp()->AttrHash());
    return h;
}

namespace {

/// Brings an image value's pixels back from the device for a consumer that
/// reads rows; false (with the tool's console line) when that fails.
bool InMainMemory(const Parameter *value, const Operator *consumer, double time) {
    const auto *img = dynamic_cast<const Image *>(value);
    if (!img || img->DownloadGPUMem()) return true;
    if (consumer && consumer->GetDoc())
        consumer->GetDoc()->PrintF(ConsoleError,
                                   "%s: an input image could not be brought back from the device (time = %f)\n",
                                   consumer->Name().c_str(), time);
    return false;
}

} // namespace

namespace {

/// The walk of one request. A pending transform comes back as it is: inputs
/// that do not take transforms get its pixels here, outside callers in
/// EvaluateOnDevice.
Ref<Parameter> EvaluateValue(Output *out, double time, const EvalOptions &options) {
    if (!out || !out->Owner()) return nullptr;
    Operator *op = out->Owner();
    RenderTask *task = options.task;
    auto aborted = [task] { return task && task->IsAborted(); };
    if (aborted()) return nullptr;

    EvalOptions opt = options;
    if (++opt.depth > MaxFlowDepth) {
        if (op->GetDoc())
            op->GetDoc()->PrintF(ConsoleError, "%s: the flow is more than %d tools deep here\n", op->Name().c_str(),
                                 MaxFlowDepth);
        return nullptr;
    }
    const bool precalc = (opt.flags & ReqFlagPreCalc) != 0;
    if (precalc || !op->RegAttrB(RegSupportsRoI)) opt.roi.reset();

    ResultCache *cache = op->GetDoc() && opt.useCache ? &op->GetDoc()->Cache() : nullptr;
    std::optional<uint64_t> state = cache ? StateHash(out, time, task) : std::nullopt;
    if (state) state = HashMix(*state, op->GetDoc()->PrefsHash());
    const CacheKey key{out, time, Traits(opt.flags, task), state.value_or(0)};
    if (state)
        if (Ref<Parameter> hit = cache->Find(key, opt.roi)) return hit;

    // Motion blur: the output averaged over the shutter's sample times.
    if (std::optional<Ref<Parameter>> blurred = MotionBlurOf(out, time, opt)) {
        if (*blurred && state) cache->Store(key, opt.roi, *blurred);
        return *blurred;
    }

    // The output's domain of definition comes from the pre-calculation pass.
    std::optional<ImageDomain> ownDoD;
    if (!precalc && IsImageDataType(out->DataType())) {
        EvalOptions pre = opt;
        pre.flags |= ReqFlagPreCalc;
        pre.roi.reset();
        Ref<Parameter> shape = EvaluateValue(out, time, pre);
        if (!shape) return nullptr;
        ownDoD = DomainOfShape(shape.Get(), false);
    }

    std::lock_guard<std::recursive_mutex> lock(op->RequestLock());
    Request req(op, out, time, opt.flags, task);
    req.SetRoI(opt.roi);
    req.SetOutputDoD(ownDoD);

    std::vector<int> levels;
    for (const auto &in : op->Inputs()) levels.push_back(in->Priority());
    std::sort(levels.begin(), levels.end());
    levels.erase(std::unique(levels.begin(), levels.end()), levels.end());

    const bool wholeFrames = !op->RegAttrB(RegSupportsDoD);
    // Tools that read images on the device take them as they are; the others get rows.
    const bool keepsDeviceImages = op->RegAttrB(RegSupportsGPUImages);
    bool timeShifted = false;
    // Pre-calculated shapes of linked image inputs, reused when the fetch
    // itself is a pre-calculation at the same time.
    std::vector<Ref<Parameter>> shapes(op->Inputs().size());
    std::vector<double> shapeTimes(op->Inputs().size(), TimeUndefined);
    for (int level : levels) {
        // Domains and default regions of this level's image inputs.
        for (const auto &inPtr : op->Inputs()) {
            Input *in = inPtr.get();
            if (in->Priority() != level) continue;
            Request::Slot &slot = req.SlotOf(in);
            if (slot.given || !in->Link() || !IsImageDataType(in->DataType())) continue;
            slot.roi = opt.roi;
            // A mask is drawn in the frame of the image it limits: its request carries this tool's frame.
            if (in->DataType() == CLSID_DataType_Mask && ownDoD && ownDoD->HasFrame()) {
                ImageDomain framed = slot.roi ? *slot.roi : ImageDomain::Endless();
                framed.frame = ownDoD->frame, framed.xScale = ownDoD->xScale, framed.yScale = ownDoD->yScale;
                slot.roi = framed;
            }
            EvalOptions pre = opt;
            pre.flags |= ReqFlagPreCalc;
            pre.roi.reset();
            Ref<Parameter> shape = EvaluateValue(in->Link(), slot.time, pre);
            if (!shape) return nullptr; // the upstream tool failed (its line is written) or the render was aborted
            if (std::optional<ImageDomain> dod = DomainOfShape(shape.Get(), wholeFrames)) slot.dod = dod;
            shapes[in->Index()] = std::move(shape);
            shapeTimes[in->Index()] = slot.time;
        }
        req.SetPri(level);
        op->CheckRequest(&req);
        if (aborted()) return nullptr;

        for (const auto &inPtr : op->Inputs()) {
            Input *in = inPtr.get();
            if (in->Priority() != level) continue;
            Request::Slot &slot = req.SlotOf(in);
            if (slot.given || slot.skip || !in->SendsRequest()) continue;
            if (slot.time != time) timeShifted = true;
            if (in->Link()) {
                EvalOptions up = opt;
                up.roi = slot.roi;
                if (slot.flags & InputFlagPreCalc) up.flags |= ReqFlagPreCalc;
                up.flags |= slot.flags & ReqFlagTimeShifted;
                const bool reuse =
                    (up.flags & ReqFlagPreCalc) && shapes[in->Index()] && shapeTimes[in->Index()] == slot.time;
                slot.data = reuse ? shapes[in->Index()] : EvaluateValue(in->Link(), slot.time, up);
                if (slot.data && !TakesTransforms(in)) {
                    // A pending transform becomes pixels here, over the region asked of the input.
                    slot.data = PixelsOf(std::move(slot.data), up.roi, &req);
                    if (!slot.data && !aborted()) {
                        ReportOutOfMemory(op, time);
                        return nullptr;
                    }
                }
                if (!slot.data) {
                    return nullptr; // a linked tool failed or the render was aborted: stop here, optional or not
                } else if (!keepsDeviceImages && !InMainMemory(slot.data.Get(), op, time)) {
                    return nullptr;
                } else if (wholeFrames && IsImageDataType(in->DataType())) {
                    slot.data = CoverFrame(slot.data, req.IsPreCalc() || (up.flags & ReqFlagPreCalc));
                }
            } else {
                slot.data = in->ValueAt(slot.time);
                if (!slot.data && in->IsRequired()) {
                    if (OrvaneDoc *doc = op->GetDoc()) {
                        if (!in->UnresolvedLink().empty())
                            doc->PrintF(ConsoleError,
                                        "%s: input \"%s\" is linked to %s, a tool this program does not have\n",
                                        op->Name().c_str(), in->ID().Text(), in->UnresolvedLink().c_str());
                        else
                            doc->PrintF(ConsoleError, "%s: input \"%s\" is not connected\n", op->Name().c_str(),
                                        in->ID().Text());
                    }
                    return nullptr;
                }
            }
            slot.fetched = true;
        }
    }

    ClearPixelRefusal();
    try {
        if (precalc) {
            op->PreCalcPreProcess(&req);
            op->PreCalcProcess(&req);
            if (req.GetOutputData(out)) op->PreCalcPostProcess(&req);
        } else {
            op->PreProcess(&req);
            op->Process(&req);
            if (req.GetOutputData(out)) op->PostProcess(&req);
        }
    } catch (const std::bad_alloc &) {
        ReportOutOfMemory(op, time);
        return nullptr;
    }
    if (aborted()) return nullptr;

    Ref<Parameter> result(req.GetOutputData(out));
    if (!HasPixels(result.Get()) && PixelMemoryRefused()) {
        ReportOutOfMemory(op, time);
        return nullptr;
    }
    ClearPixelRefusal();
    if (!result) {
        if (!req.HasOutputData(out))
            if (OrvaneDoc *doc = op->GetDoc())
                doc->PrintF(ConsoleError, "%s: produced no result at time %g\n", op->Name().c_str(), time);
        return nullptr;
    }
    if (state && !timeShifted) cache->Store(key, opt.roi, result);
    return result;
}

} // namespace

Ref<Parameter> EvaluateOnDevice(Output *out, double time, const EvalOptions &options) {
    Ref<Parameter> result = EvaluateValue(out, time, options);
    // Whoever asked from outside the flow gets pixels.
    if (!result || !dynamic_cast<TransformMatrix *>(result.Get())) return result;
    const bool wholeFrame = (options.flags & ReqFlagPreCalc) || !out->Owner()->RegAttrB(RegSupportsRoI);
    result = PixelsOf(std::move(result), wholeFrame ? std::nullopt : options.roi, nullptr);
    if (!result && !(options.task && options.task->IsAborted())) ReportOutOfMemory(out->Owner(), time);
    return result;
}

Ref<Parameter> Evaluate(Output *out, double time, const EvalOptions &options) {
    Ref<Parameter> result = EvaluateOnDevice(out, time, options);
    // Whoever asked from outside the flow reads rows.
    if (result && !InMainMemory(result.Get(), out->Owner(), time)) return nullptr;
    return result;
}

} // namespace Orvane
