#include "operators/depth/MagicMask.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <vector>

#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/KernelProvider.h"
#include "host/matte/MaskInputs.h"
#include "host/matte/MatteSteps.h"
#include "operators/depth/MagicMaskCache.h"
#include "operators/depth/MagicMaskStrokes.h"
#include "operators/filter/BlurControls.h"
#include "operators/frame/Registration.h"
#include "operators/key/KeyerMatte.h"

namespace Orvane {

static const OvID CLSID_MagicMask("MagicMask");
static ClassRegistration<MagicMask, ThreadedOperator> s_Registration(CLSID_MagicMask, &CLSID_ThreadedOperator,
                                                                     {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                      {RegClassName, "MagicMask"},
                                                                      {RegPath, "Tools/Matte/MagicMask"},
                                                                      {RegName, "Magic Mask"},
                                                                      {RegCategory, "Matte"},
                                                                      {RegAbbreviation, "MagM"},
                                                                      {RegHelp, "Creates a mask for a selected object"},
                                                                      {RegIcon, "Icons.Tools.Icons.MagicMask"},
                                                                      {RegNoMotionBlurControls, 1},
                                                                      {RegHasOperatorControl, 1},
                                                                      {RegNoAutoProxy, 1},
                                                                      {RegUnpredictable, 1},
                                                                      {RegSupportsGPUImages, 1}});

namespace {

constexpr const char *kKernel = "GetObjectMask";
/// A control's tips (one or more) and a button's caption, for a panel to show.
constexpr Tag ControlTipText = 0x68040010; // may repeat
constexpr Tag ButtonCaption = 0x30050010;
/// Run kind 4 ends its leg at the render end within this.
constexpr double kEndSlack = 5e-5;

std::atomic<uint32_t> g_nextOperatorId{1};

TagList NumberTags(double def) { return {{LinkDataType, CLSID_DataType_Number}, {InputDefault, def}}; }

TagList Slider(double def, double low, double high) {
    TagList t = NumberTags(def);
    t.Add({InputControl, CLSID_InputControl_Slider}), t.Add({InputSliderLow, low}), t.Add({InputSliderHigh, high});
    return t;
}

TagList Buttons(std::initializer_list<const char *> items, double def) {
    TagList t = NumberTags(def);
    t.Add({InputControl, CLSID_InputControl_MultiButton}), t.Add({ButtonsFillRow, 1}), t.Add({InputInteger, 1});
    t.Add({InputMinAllowed, 0.0}), t.Add({InputMaxAllowed, static_cast<double>(items.size() - 1)});
    for (const char *item : items) t.Add({ListAddItem, item});
    return t;
}

/// A push button: no value of its own, tells the tool when pressed.
TagList Button(const char *icon, const char *caption = nullptr, const char *tip = nullptr) {
    TagList t{{LinkDataType, CLSID_DataType_Number},
              {InputControl, CLSID_InputControl_Button},
              {InputExternal, 0},
              {InputNotify, 1},
              {InputInitialNotify, 0},
              {InputPassive, 1}};
    if (icon) t.Add({ButtonIcon, icon});
    if (caption) t.Add({ButtonCaption, caption});
    if (tip) t.Add({ControlTipText, tip});
    return t;
}

TagList Checkbox(double def) {
    TagList t = NumberTags(def);
    t.Add({InputControl, CLSID_InputControl_Checkbox}), t.Add({InputMinAllowed, 0.0}), t.Add({InputMaxAllowed, 1.0});
    return t;
}

TagList RangeHalf(int member, double def, double high, const char *rowLabel) {
    TagList t = NumberTags(def);
    t.Add({InputControl, CLSID_InputControl_Range}), t.Add({ControlGroup, member < 2 ? 1 : 2});
    t.Add({ControlMember, member % 2}), t.Add({InputSliderLow, 0.0}), t.Add({InputSliderHigh, high});
    if (rowLabel) t.Add({ControlRowLabel, rowLabel});
    return t;
}

TagList Passive(TagList t) {
    t.Add({InputPassive, 1}), t.Add({InputExternal, 0}); // one value, neither animated nor linked
    return t;
}

int Frame(double time) { return static_cast<int>(std::floor(time)); }

/// An image of `depth` over `window` of `like`'s frame, with rows.
Ref<Image> WorkImage(const Image *like, int depth, const ImgRectI &window) {
    Ref<Image> img = NewImageTagList(
        {{ImgLikeImage, like}, {ImgDepth, depth}, {ImgDataWindow, &window}, {ImgAbortFlag, like->AbortFlag()}});
    if (img && !img->AllocScanLineData()) return {};
    if (img) img->Fill(FltPixel{0.f, 0.f, 0.f, 0.f});
    return img;
}

/// One pass of a running minimum (erode) or maximum (dilate) of `radius` along rows or columns of a float alpha.
void ExtremePass(Image &img, int radius, bool dilate, bool alongRows) {
    const ImgRectI dw = img.DataWindow();
    const int w = dw.x1 - dw.x0, h = dw.y1 - dw.y0, lines = alongRows ? h : w, len = alongRows ? w : h;
    std::vector<float> line(len), out(len);
    auto at = [&](int l, int i) -> float & {
        return alongRows ? img.Row<float>(dw.y0 + l)[i] : img.Row<float>(dw.y0 + i)[l];
    };
    for (int l = 0; l < lines; ++l) {
        for (int i = 0; i < len; ++i) line[i] = at(l, i);
        for (int i = 0; i < len; ++i) {
            float v = line[i];
            for (int k = std::max(0, i - radius); k <= std::min(len - 1, i + radius); ++k)
                v = dilate ? std::max(v, line[k]) : std::min(v, line[k]);
            out[i] = v;
        }
        for (int i = 0; i < len; ++i) at(l, i) = out[i];
    }
}

} // namespace

struct MagicMask::Settings {
    Ref<MagicMaskStrokes> strokes;
    bool better = false;
    int refineRange = 30;
    uint64_t key = 0; ///< what a kept matte must match
};

MagicMask::MagicMask(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), operatorId_(g_nextOperatorId.fetch_add(1)),
      algoVer_(static_cast<int>(tags.GetLong(MagicMaskAlgorithmVersion, 1))) {
    AddControlPageTagList("Tracking", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Tracker")}});
    mode_ = AddInputTagList("Mode", "Mode", Buttons({"Faster", "Better"}, 0.0));
    TagList refine = Slider(30.0, 1.0, 100.0);
    refine.Add({InputInteger, 1}), refine.Add({InputMinAllowed, 1.0});
    refineRange_ = AddInputTagList("Refine Range", "RefineRange", refine);
    TagList strokeMode = Buttons({"Add", "Sub", "Select"}, 0.0);
    strokeMode.Add({ControlTipText, "Alt - Stroke subtracts"}),
        strokeMode.Add({ControlTipText, "Shift - Select strokes"});
    strokeMode_ = AddInputTagList("Stroke Mode", "StrokeMode", strokeMode);
    deleteStrokes_ = AddInputTagList("Delete Strokes", "DeleteStrokes",
                                     Button(nullptr, "Delete strokes", "Del - Delete selected strokes"));
    trackReverse_ = AddInputTagList("Track Reverse", "TrackReverse", Button("Icons.Tracker.ReverseTime"));
    trackBidirectional_ =
        AddInputTagList("Track Fwd Then Reverse", "TrackBidirectional", Button("Icons.Tracker.TrackBidirectional"));
    trackForward_ = AddInputTagList("Track Forward", "TrackForward", Button("Icons.Tracker.ForwardTime"));
    trackReverseOne_ =
        AddInputTagList("Track Reverse One Frame", "TrackReverseFromCurrentTime", Button("Icons.Tracker.ReverseFrame"));
    stopTracking_ = AddInputTagList("Stop Tracking", "StopTracking", Button("Icons.Tracker.Stop"));
    trackForwardOne_ =
        AddInputTagList("Track Forward One Frame", "TrackForwardFromCurrentTime", Button("Icons.Tracker.ForwardFrame"));
    TagList current = Button(nullptr, "Current", "Clear strokes from current frame");
    current.Add({ControlRowLabel, "Clear Strokes"});
    clearCurrent_ = AddInputTagList("Clear Current", "ClearCurrent", current);
    clearRange_ =
        AddInputTagList("Clear Range", "ClearRange", Button(nullptr, "Range", "Clear strokes from render range"));
    clearAll_ = AddInputTagList("Clear All", "ClearAll", Button(nullptr, "All", "Clear strokes from all frames"));
    goToStart_ = AddInputTagList("Go To Start", "GoToStart",
                                 Button("Icons.MagicMask.GoStart", nullptr, "Go to the first frame of tracked area"));
    goToRefTime_ = AddInputTagList("Go To Ref Time", "GoToRefTime", Button("Icons.MagicMask.GoRefTime"));
    goToEnd_ = AddInputTagList("Go To End", "GoToEnd", Button("Icons.MagicMask.GoEnd"));
    TagList regen = Button(nullptr, "Regenerate All");
    regen.Add({ControlWidth, 2.0 / 3.0});
    cacheRegen_ = AddInputTagList("Disk Cache", "CacheRegen", regen);
    TagList clear = Button(nullptr, "Clear Cache", "Clear all disk cache frames");
    clear.Add({ControlWidth, 1.0 / 3.0});
    cacheClear_ = AddInputTagList("Clear Cache", "CacheClear", clear);
    referenceTimeIn_ = AddInputTagList("Reference Time", "ReferenceTime", Passive(Slider(0.0, 0.0, 100.0)));
    processedLow_ =
        AddInputTagList("Processed Frames", "ProcessedFramesLow", Passive(RangeHalf(2, 0.0, 100.0, nullptr)));
    processedHigh_ =
        AddInputTagList("Processed Frames", "ProcessedFramesHigh", Passive(RangeHalf(3, 0.0, 100.0, nullptr)));
    postMultiply_ = AddInputTagList("Post Multiply Image", "PostMultiplyImage", Checkbox(1.0));

    AddControlPageTagList("Matte", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Matte")}});
    filter_ = AddInputTagList("Filter", "Filter", BlurFilterTags());
    TagList blur = Slider(0.0, 0.0, 10.0);
    blur.Add({InputMinAllowed, 0.0}), blur.Add({SliderSteps, 51});
    matteBlur_ = AddInputTagList("Blur", "MatteBlur", blur);
    passes_ = AddInputTagList("Num Passes", "Passes", BlurPassesTags());
    TagList erode = Slider(0.0, -0.02, 0.02);
    erode.Add({InputMinAllowed, -1.0}), erode.Add({InputMaxAllowed, 1.0}), erode.Add({SliderRest, 0.0});
    erodeDilate_ = AddInputTagList("Erode/Dilate", "ErodeDilate", erode);
    TagList gamma = Slider(1.0, 0.01, 3.0);
    gamma.Add({InputMinAllowed, 0.01}), gamma.Add({SliderSteps, 101}), gamma.Add({SliderRest, 1.0});
    matteGamma_ = AddInputTagList("Gamma", "MatteGamma", gamma);
    TagList low = RangeHalf(0, 0.0, 1.0, "Threshold"), high = RangeHalf(1, 1.0, 1.0, nullptr);
    for (TagList *t : {&low, &high}) t->Add({InputMinAllowed, 0.0}), t->Add({InputMaxAllowed, 1.0});
    lowThreshold_ = AddInputTagList("Low", "LowMatteThreshold", low);
    highThreshold_ = AddInputTagList("High", "High", high);
    TagList restore = Slider(0.0, 0.0, 0.02);
    restore.Add({InputMinAllowed, 0.0}), restore.Add({InputMaxAllowed, 1.0});
    restoreFringe_ = AddInputTagList("Restore Fringe", "RestoreFringe", restore);
    invertMatte_ = AddInputTagList("Invert Matte", "InvertMatte", Checkbox(0.0));
    solid_ = std::make_unique<MaskInputs>(*this, "Solid", "Solid Matte");
    garbage_ = std::make_unique<MaskInputs>(*this, "Garbage", "Garbage Matte");

    strokes_ = AddInputTagList("Strokes", "Strokes", {{LinkDataType, CLSID_DataType_MagicMaskStrokes}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image},
                              {LinkMain, 1},
                              {InputPriority, PriorityImage},
                              {InputRequired, 1},
                              {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

MagicMask::~MagicMask() = default;

MagicMask::Settings MagicMask::ReadSettings(Request *req) const {
    Settings s;
    if (auto *strokes = dynamic_cast<MagicMaskStrokes *>(req->GetInputData(strokes_)))
        s.strokes = Ref<MagicMaskStrokes>(strokes);
    s.better = req->GetInputNumber(mode_, 0.0) >= 0.5;
    s.refineRange = std::max(1, static_cast<int>(std::lround(req->GetInputNumber(refineRange_, 30.0))));
    uint64_t h = HashMix(HashMix(s.strokes ? s.strokes->Hash() : 0, s.better), static_cast<uint64_t>(s.refineRange));
    s.key = HashMix(h, static_cast<uint64_t>(algoVer_));
    return s;
}

MagicMask::Step MagicMask::DoMagicMask(double time, Request *req, Image *in, Image *out) {
    if (!in || !out || in->IsNoData() || out->IsNoData()) return Step::Skipped;
    const ImgRectI window = out->DataWindow();
    if (window.x1 <= window.x0 || window.y1 <= window.y0 || !(in->DataWindow() == window)) return Step::Skipped;
    const Settings s = ReadSettings(req);
    const int frame = Frame(time);

    Ref<Image> propIn, matte;
    std::optional<uint64_t> diskKey; // set for a frame whose matte belongs in the disk cache
    bool tracking = false;
    {
        std::lock_guard lock(state_);
        tracking = isTracking_;
        if (tracking) {
            // The previous frame of this leg hands its propagated mask on; a leg's first frame starts afresh.
            presentTime_ = time;
            auto prev = kept_.find(frame - step_);
            if (Frame(legStart_) != frame && prev != kept_.end() && prev->second.key == s.key)
                propIn = prev->second.propMask;
        } else if (auto it = kept_.find(frame); it != kept_.end() && it->second.key == s.key &&
                                                it->second.matte->Width() == in->Width() &&
                                                it->second.matte->Height() == in->Height()) {
            matte = it->second.matte; // a tracked frame, rendered again with the run's settings and frame size
        }
    }
    if (!matte && (tracking || InTrackedSpan(req, time))) {
        // A run's frame is written to the disk cache; a frame of the tracked span not in memory may be read from it.
        if (!in->DownloadGPUMem()) return Step::Failed;
        diskKey = MagicMaskCache::FrameKey(s.key, frame, *in);
        if (!tracking && (matte = LoadCached(frame, *diskKey, in))) {
            std::lock_guard lock(state_);
            kept_[frame] = Kept{Ref<Image>(), matte, s.key};
        }
    }
    if (!matte && !tracking && !CatchUp(time, req, s, in, propIn)) return Step::Failed;
    if (!matte) {
        Ref<Image> propOut;
        if (!RunKernel(time, req, s, in, propIn.Get(), propOut, matte)) return Step::Failed;
        // The reference frame and the carried frames are the run's mattes; a lone frame in the span is not.
        if (diskKey && (tracking || propIn || frame == Frame(req->GetInputNumber(referenceTimeIn_, 0.0))))
            MagicMaskCache::Store(Name(), *diskKey, frame, *matte, *propOut);
        std::lock_guard lock(state_);
        if (tracking) kept_[frame] = Kept{propOut, matte, s.key};
        lastCall_ = frame;
        if (!tracking && propIn) {
            // Rendered inside the tracked span: the mask carried on, kept for the next frame of a render.
            kept_[frame] = Kept{Ref<Image>(), matte, s.key};
            chain_ = Chain{frame, propOut, s.key};
        }
    }
    return MatteCore_DoCopyChannel(req, matte.Get(), out, MatteAlpha, MatteAlpha) ? Step::Done : Step::Failed;
}

bool MagicMask::CatchUp(double time, Request *req, const Settings &s, const Image *in, Ref<Image> &propIn) {
    // A frame of the tracked span rendered without its run's matte in memory (another process, or a change): the
    // masks are carried again from the reference frame, frame by frame as the run did, so that the render gives
    // the tracked matte rather than one from the reference frame's strokes alone. A render going on frame by frame
    // carries on from the last frame it did.
    const int frame = Frame(time), ref = Frame(req->GetInputNumber(referenceTimeIn_, 0.0));
    if (frame == ref || !InTrackedSpan(req, time)) return true;
    const Output *source = input_->Link();
    if (!source) return true;
    const int step = frame > ref ? 1 : -1;
    int from = ref;
    {
        std::lock_guard lock(state_);
        // Carry on from the chain's last frame when it lies on the way and the provider last saw that frame.
        if (chain_ && chain_->key == s.key && lastCall_ == chain_->frame && (frame - chain_->frame) * step > 0 &&
            (chain_->frame - ref) * step >= 0) {
            from = chain_->frame + step;
            propIn = chain_->propMask;
        }
    }
    if (from == ref) PurgeKROMMagicMaskTrackerCache();
    EvalOptions options;
    options.task = req->GetTask();
    for (int f = from; f != frame; f += step) {
        const Ref<Parameter> value = Evaluate(const_cast<Output *>(source), f, options);
        auto *src = dynamic_cast<Image *>(value.Get());
        if (!src || src->Width() != in->Width() || src->Height() != in->Height()) {
            Fail(req,
                 src ? "%s: Non-uniform size for tracking source at time %g\n"
                     : "%s: Cannot get tracking source for time %g\n",
                 Name().c_str(), static_cast<double>(f));
            return false;
        }
        if (!src->DownloadGPUMem()) return false;
        const uint64_t key = MagicMaskCache::FrameKey(s.key, f, *src);
        Ref<Image> propOut, matte = LoadCached(f, key, src, &propOut);
        const bool computed = !matte;
        if (computed) {
            if (!RunKernel(f, req, s, src, propIn.Get(), propOut, matte)) return false;
            MagicMaskCache::Store(Name(), key, f, *matte, *propOut);
        }
        propIn = propOut;
        std::lock_guard lock(state_);
        kept_[f] = Kept{Ref<Image>(), matte, s.key};
        chain_ = Chain{f, propOut, s.key};
        if (computed) lastCall_ = f;
    }
    return true;
}

bool MagicMask::InTrackedSpan(Request *req, double time) const {
    const double low = req->GetInputNumber(processedLow_, 0.0), high = req->GetInputNumber(processedHigh_, 0.0);
    return high > low && time >= low - kEndSlack && time <= high + kEndSlack;
}

Ref<Image> MagicMask::LoadCached(int frame, uint64_t key, const Image *like, Ref<Image> *propMask) const {
    const ImgRectI window = like->DataWindow();
    Ref<Image> matte = WorkImage(like, DepthRGBAFlt32, window), prop = WorkImage(like, DepthAFlt32, window);
    if (!matte || !prop || !MagicMaskCache::Load(Name(), key, frame, *matte, *prop)) return {};
    if (propMask) *propMask = prop;
    return matte;
}

bool MagicMask::RunKernel(double time, Request *req, const Settings &s, const Image *in, const Image *propIn,
                          Ref<Image> &propOut, Ref<Image> &matte) {
    if (!FindKernelProvider(kKernel)) {
        Fail(req, "%s: no provider of the kernel \"%s\" is registered\n", Name().c_str(), kKernel);
        return false;
    }
    auto node = KROMComputeNode::Create(nullptr, kKernel, nullptr, OrvaneSemanticSegmentationParamsText, false);
    if (!node || !node->IsValid()) {
        Fail(req, "%s: the kernel \"%s\" cannot run: %s\n", Name().c_str(), kKernel,
             node ? node->Error().c_str() : "no node");
        return false;
    }
    if (!in->DownloadGPUMem()) return false;
    const ImgRectI window = in->DataWindow(), unit(0, 0, 1, 1);
    propOut = WorkImage(in, DepthAFlt32, window);
    matte = WorkImage(in, DepthRGBAFlt32, window);
    Ref<Image> dummy = propIn ? Ref<Image>() : WorkImage(in, DepthAFlt32, unit);
    if (!propOut || !matte || (!propIn && !dummy)) {
        FailOutOfMemory(req);
        return false;
    }

    auto block = std::make_shared<OrvaneSemanticSegmentationParams>();
    OrvaneSemanticSegmentationParams &p = *block;
    const int frame = Frame(time);
    {
        std::lock_guard lock(state_);
        p.isTracking = isTracking_;
        p.isRefframe = Frame(isTracking_ ? referenceTime_ : req->GetInputNumber(referenceTimeIn_, 0.0)) == frame;
    }
    p.compId = reinterpret_cast<uintptr_t>(GetDoc());
    p.operatorId = operatorId_;
    p.timeStamp = frame;
    p.refineRange = s.refineRange;
    p.hasCachePropMask = propIn != nullptr;
    p.isBetterMode = s.better;
    p.isKeyframe =
        s.strokes && !s.strokes->Empty() &&
        (!strokes_->IsAnimated() || std::any_of(strokes_->Curve()->Keys().begin(), strokes_->Curve()->Keys().end(),
                                                [frame](const Keyframe &k) { return Frame(k.time) == frame; }));
    p.isSrcPreMult = 1;
    p.algoVer = algoVer_;

    auto src = KROMBuffer::CreateImage(nullptr, in, KROMBufferRead);
    auto prop = KROMBuffer::CreateImage(nullptr, propIn ? propIn : dummy.Get(), KROMBufferRead);
    auto propBuf = KROMBuffer::CreateImage(nullptr, propOut.Get(), KROMBufferWrite);
    auto dst = KROMBuffer::CreateImage(nullptr, matte.Get(), KROMBufferWrite);
    node->SetParamStruct(block, sizeof p);
    node->AddInput("src", src.get());
    node->AddInput("cachePropMaskIn", prop.get());
    static const std::vector<MagicMaskStrokes::Stroke> none;
    node->SetParam("posStroke",
                   MagicMaskStrokes::PixelList(s.strokes ? s.strokes->pos : none, in->Width(), in->Height()));
    node->SetParam("negStroke",
                   MagicMaskStrokes::PixelList(s.strokes ? s.strokes->neg : none, in->Width(), in->Height()));
    node->AddOutput("cachePropMaskOut", propBuf.get());
    node->AddOutput("dst", dst.get());
    node->SetAbortFlag(in->AbortFlag());
    if (!node->RunSession()) {
        if (!in->CheckAbort())
            Fail(req, "%s: the kernel \"%s\" failed: %s\n", Name().c_str(), kKernel, node->Error().c_str());
        return false;
    }
    return true;
}

bool MagicMask::ErodeDilate(Request *req, Image *img, double amount) const {
    const int radius = static_cast<int>(std::lround(std::fabs(amount) * img->Width()));
    if (radius == 0) return true;
    Ref<Image> work = WorkImage(img, DepthAFlt32, img->DataWindow());
    if (!work || !MatteCore_DoCopyChannel(req, img, work.Get(), MatteAlpha, MatteAlpha)) return false;
    ExtremePass(*work, radius, amount > 0, true);
    ExtremePass(*work, radius, amount > 0, false);
    return MatteCore_DoCopyChannel(req, work.Get(), img, MatteAlpha, MatteAlpha);
}

bool MagicMask::RefineMatte(Request *req, Ref<Image> &out) {
    KeyerMatte::Values v;
    v.filter = BlurTypeOfFilter(req->GetInputID(filter_, OvID("Fast Gaussian")));
    v.blur = req->GetInputNumber(matteBlur_, 0.0);
    v.passes = static_cast<int>(std::lround(req->GetInputNumber(passes_, 4.0)));
    v.gamma = req->GetInputNumber(matteGamma_, 1.0);
    v.low = req->GetInputNumber(lowThreshold_, 0.0);
    v.high = req->GetInputNumber(highThreshold_, 1.0);
    v.invert = req->GetInputNumber(invertMatte_, 0.0) >= 0.5;
    v.postMultiply = req->GetInputNumber(postMultiply_, 1.0) >= 0.5;
    if (req->GetInputNumber(restoreFringe_, 0.0) > 0.0 && GetDoc())
        GetDoc()->PrintF(req, ConsoleWarning, "%s: Restore Fringe is not built yet and has no effect (time = %g)\n",
                         Name().c_str(), req->Time());
    Image *img = out.Get();
    if (!KeyerMatte::BlurMatte(req, img, v) || !ErodeDilate(req, img, req->GetInputNumber(erodeDilate_, 0.0)) ||
        !KeyerMatte::Levels(req, img, v) || !KeyerMatte::Invert(req, img, v))
        return false;
    bool inverted = false;
    if (const Image *solid = solid_->GetMask(req, &inverted))
        if (!(out = DoGarbageMatte(req, out.Get(), solid, GarbageMatteSolid, false, inverted))) return false;
    if (const Image *garbage = garbage_->GetMask(req, &inverted))
        if (!(out = DoGarbageMatte(req, out.Get(), garbage, GarbageMatteGarbage, false, inverted))) return false;
    return KeyerMatte::PostMultiply(req, out.Get(), v);
}

bool MagicMask::CheckRunSource(Request *req, const Image *src) {
    if (!src) return false;
    sourceSeen_ = true;
    std::lock_guard lock(state_);
    // The propagated masks are images of one frame size: a run keeps to its first frame's.
    const std::pair size{src->Width(), src->Height()};
    if (!runSize_) runSize_ = size;
    if (*runSize_ == size) return true;
    Fail(req, "%s: Non-uniform size for tracking source at time %g\n", Name().c_str(), req->Time());
    return false;
}

void MagicMask::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if ((req->GetFlags() & ReqFlagTrackStep) ? !CheckRunSource(req, src) : !src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const ImgRectI window = src->DataWindow();
    Ref<Image> out = NewImageTagList({{ImgLikeImage, src},
                                      {ImgDataWindow, &window},
                                      {ImgNoData, req->IsPreCalc() || src->IsNoData()},
                                      {ImgAbortFlag, src->AbortFlag()}});
    if (!out) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    out->CopyCanvasColor(src);
    if (!out->IsNoData()) {
        if (!src->DownloadGPUMem() || !out->AllocScanLineData()) {
            FailOutOfMemory(req);
            req->SetOutputData(output_, nullptr);
            return;
        }
        out->ImageCopy(src);
    }
    const Step step = DoMagicMask(req->Time(), req, src, out.Get());
    if (step == Step::Failed || (step == Step::Done && !RefineMatte(req, out))) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, out.Get());
}

void MagicMask::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == filter_)
        if (const auto *id = dynamic_cast<const IDValue *>(param))
            passes_->SetAttrsTagList({{ControlVisible, id->value == OvID("Multi-box")}});
    if (param && GetDoc()) {
        const double start = GetDoc()->RenderStart(), end = GetDoc()->RenderEnd();
        auto run = [this](double from, double to) {
            RenderTask task;
            const bool ok = RunTracking(from, to, &task);
            OnEndRender(); // the run of a button ends with it
            return ok;
        };
        if (in == trackForward_) run(time, end);
        if (in == trackReverse_) run(time, start);
        if (in == trackForwardOne_) run(time, time + 1.0);
        if (in == trackReverseOne_) run(time, time - 1.0);
        if (in == trackBidirectional_) {
            RenderTask task;
            if (RunTracking(time, end, &task) && !task.IsAborted()) RunTracking(time, start, &task);
            OnEndRender();
        }
        if (in == stopTracking_) stop_ = true;
        const bool editable = !GetDoc()->IsWriteProtected();
        if (in == deleteStrokes_ && editable) DeleteLastStroke(time);
        if (in == clearCurrent_ && editable) ClearStrokes([time](double key) { return Frame(key) == Frame(time); });
        if (in == clearRange_ && editable)
            ClearStrokes([start, end](double key) { return key >= start - kEndSlack && key <= end + kEndSlack; });
        if (in == clearAll_ && editable) strokes_->ResetValue();
        if (in == cacheClear_) {
            MagicMaskCache::Clear(Name());
            std::lock_guard lock(state_);
            kept_.clear();
            chain_.reset();
        }
        if (in == cacheRegen_) RegenerateAll();
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void MagicMask::ClearStrokes(const std::function<bool(double keyTime)> &pick) {
    if (!strokes_->IsAnimated()) {
        strokes_->ResetValue(); // constant strokes hold on every frame, the current one and the range's among them
        return;
    }
    AnimCurve left;
    for (const Keyframe &k : strokes_->Curve()->Keys())
        if (!pick(k.time)) left.SetKey(k.time, k.value, k.interp);
    if (left.Empty())
        strokes_->ResetValue();
    else
        strokes_->SetCurve(std::move(left));
}

void MagicMask::DeleteLastStroke(double time) {
    // Without a selection on the picture, the stroke to delete is the last one added to the list Stroke Mode
    // draws into (Sub: the negative strokes, else the positive ones), in the value in effect at `time`.
    const Ref<Parameter> mode = strokeMode_->ValueAt(time);
    const auto *number = dynamic_cast<const Number *>(mode.Get());
    const bool negative = number && std::lround(number->value) == 1;
    auto withoutLast = [negative](const Ref<Parameter> &value) -> Ref<Parameter> {
        const auto *strokes = dynamic_cast<const MagicMaskStrokes *>(value.Get());
        if (!strokes || (negative ? strokes->neg : strokes->pos).empty()) return {};
        Ref<Parameter> copy = strokes->Copy();
        auto &list = negative ? static_cast<MagicMaskStrokes *>(copy.Get())->neg
                              : static_cast<MagicMaskStrokes *>(copy.Get())->pos;
        list.pop_back();
        return copy;
    };
    if (!strokes_->IsAnimated()) {
        if (Ref<Parameter> value = withoutLast(strokes_->Constant())) strokes_->SetValue(value);
        return;
    }
    // The key in effect: the last at or before `time`, else the first.
    const std::vector<Keyframe> &keys = strokes_->Curve()->Keys();
    auto it =
        std::find_if(keys.rbegin(), keys.rend(), [time](const Keyframe &k) { return k.time <= time + kEndSlack; });
    const Keyframe &key = it != keys.rend() ? *it : keys.front();
    if (Ref<Parameter> value = withoutLast(key.value)) {
        AnimCurve curve = *strokes_->Curve();
        curve.SetKey(key.time, value, key.interp);
        strokes_->SetCurve(std::move(curve));
    }
}

void MagicMask::RegenerateAll() {
    // The tracked span is tracked again from the reference frame out to both of its ends, rewriting the mattes in
    // memory and on disk.
    auto number = [](const Input *in) {
        const auto *n = dynamic_cast<const Number *>(in->Constant().Get());
        return n ? n->value : 0.0;
    };
    const double ref = number(referenceTimeIn_), low = number(processedLow_), high = number(processedHigh_);
    if (!(high > low) || ref < low - kEndSlack || ref > high + kEndSlack) {
        Fail(nullptr, "%s: nothing tracked to regenerate\n", Name().c_str());
        return;
    }
    RenderTask task;
    bool ok = ref >= high || RunTracking(ref, high, &task);
    if (ok && ref > low && !task.IsAborted()) RunTracking(ref, low, &task);
    OnEndRender();
}

bool MagicMask::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_Track) return ThreadedOperator::ControlCommand(command, tags);
    return RunTracking(tags.GetDouble(CCMD_TrackFrom, 0.0), tags.GetDouble(CCMD_TrackTo, 0.0),
                       tags.GetPtrAs<RenderTask>(CCMD_TrackTask));
}

bool MagicMask::RunTracking(double from, double to, RenderTask *task) {
    if (!std::isfinite(from) || !std::isfinite(to)) {
        Fail(nullptr, "%s: a run needs finite frames\n", Name().c_str());
        return false;
    }
    RenderTask own;
    if (!task) task = &own;
    const int step = to >= from ? 1 : -1;
    {
        std::lock_guard lock(state_);
        if (!isTracking_) {
            // A new run: its first frame is the reference frame, the strokes' frame.
            isTracking_ = true;
            referenceTime_ = from;
            if (GetDoc() && !GetDoc()->IsWriteProtected()) referenceTimeIn_->SetValue(MakeRef<Number>(from));
        }
        runKind_ = step > 0 ? RunForward : RunReverse;
        step_ = step;
        legStart_ = from;
        runEnd_ = task->endTime > -2e9 ? task->endTime : GetDoc() ? GetDoc()->RenderEnd() : to;
        runTask_ = task;
    }
    stop_ = false;
    EvalOptions options;
    options.flags = ReqFlagTrackStep;
    options.task = task;
    options.useCache = false;
    const long frames = std::lround(std::fabs(to - from)) + 1;
    long done = 0;
    for (; done < frames && !task->IsAborted() && !stop_; ++done) {
        const double time = from + step * static_cast<double>(done);
        sourceSeen_ = false;
        if (Evaluate(output_, time, options)) continue;
        // A source that failed upstream never reaches Process: say why the run stops here.
        if (!sourceSeen_ && !task->IsAborted())
            Fail(nullptr, "%s: Cannot get tracking source for time %g\n", Name().c_str(), time);
        break;
    }
    {
        std::lock_guard lock(state_);
        if (done > 0) {
            const double last = from + step * static_cast<double>(done - 1);
            std::pair<double, double> span{std::min(from, last), std::max(from, last)};
            if (processed_) span = {std::min(span.first, processed_->first), std::max(span.second, processed_->second)};
            processed_ = span;
            if (GetDoc() && !GetDoc()->IsWriteProtected()) {
                processedLow_->SetValue(MakeRef<Number>(span.first));
                processedHigh_->SetValue(MakeRef<Number>(span.second));
            }
        }
    }
    OnEndRender(); // the leg's render is over
    {
        std::lock_guard lock(state_);
        runTask_ = nullptr;
    }
    if (done == 0) Fail(nullptr, "%s: nothing was tracked from frame %g\n", Name().c_str(), from);
    return done > 0;
}

void MagicMask::EndRun(RenderTask *task) {
    auto purge = [](IDeviceContext *) { PurgeKROMMagicMaskTrackerCache(); };
    if (!task || !task->QueueExecute("MagicMask", purge)) PurgeKROMMagicMaskTrackerCache();
}

void MagicMask::OnEndRender() {
    RenderTask *task = nullptr;
    bool ended = false;
    {
        std::lock_guard lock(state_);
        if (isTracking_ && runKind_ == RunForward && presentTime_ > runEnd_ - kEndSlack) {
            runKind_ = RunReverse; // the forward leg reached the end: a reverse leg may follow in this run
        } else if (isTracking_) {
            isTracking_ = false;
            runKind_ = RunNone;
            task = runTask_;
            ended = true;
            // The run's own state goes: where it stood, and the propagated masks (the mattes stay for renders).
            step_ = 1, legStart_ = presentTime_ = 0.0;
            runSize_.reset();
            lastCall_.reset(); // the providers forget the run's frames
            for (auto &[frame, kept] : kept_) kept.propMask = Ref<Image>();
        }
    }
    if (ended) EndRun(task);
    ThreadedOperator::OnEndRender();
}

} // namespace Orvane
