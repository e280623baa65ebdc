#include "operators/warp/BetterResize.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/ResizeFilters.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_BetterResize("BetterResize");
static ClassRegistration<BetterResize, ThreadedOperator>
    s_Registration(CLSID_BetterResize, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "BetterResize"},
                    {RegPath, "Tools/Transform/Resize"},
                    {RegName, "Resize"},
                    {RegCategory, "Transform"},
                    {RegAbbreviation, "Rsz"},
                    {RegHelp, "Resizes the frame to a new resolution"},
                    {RegIcon, "Icons.Tools.Icons.Resize"},
                    {RegAlias, "Reformat"},
                    {RegAlias, "Format"},
                    {RegNoBlendControls, 1},
                    {RegNoEffectMask, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

bool On(const Parameter *param) {
    const auto *n = dynamic_cast<const Number *>(param);
    return n && n->value >= 0.5;
}

double NumberOf(const Parameter *param, double def = 0.0) {
    const auto *n = dynamic_cast<const Number *>(param);
    return n ? n->value : def;
}

} // namespace

BetterResize::BetterResize(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    AddControlPageTagList("Controls", {});
    width_ = AddSizeInput(this, "Width", "Width", ff.width, {{InputNotify, 1}});
    height_ = AddSizeInput(this, "Height", "Height", ff.height, {{InputNotify, 1}});
    useFrameFormat_ = AddCheckbox(this, "Use Frame Format Settings", "UseFrameFormatSettings", 0.0,
                                  {{InputExternal, 0}, {InputNotify, 1}});
    resetSize_ = AddButton(this, "Reset Size", "ResetSize");
    keepAspect_ = AddCheckbox(this, "Keep Frame Aspect", "KeepAspect", 0.0, {{InputNotify, 1}});
    hiQOnly_ = AddHiQOnlyInput(this);
    aspect_ = AddAspectInputs(this);
    filter_ = AddFilterInputs(this);
    input_ = AddSourceImageInput(this);
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

BetterResize::~BetterResize() = default;

void BetterResize::OnDelete() { tables_.Free(); }

SourceFormat BetterResize::Source() const {
    std::lock_guard<std::mutex> guard(stateLock_);
    return source_;
}

std::pair<double, double> BetterResize::TargetAspect(const SourceFormat &src, double time) const {
    if (ControlNumber(aspect_.change, time) >= 0.5) return ControlPoint(aspect_.aspect, time);
    return {src.aspectX, src.aspectY};
}

void BetterResize::KeepHeightFor(double width, double time) {
    const SourceFormat src = Source();
    if (!src.Known()) return;
    const auto [tax, tay] = TargetAspect(src, time);
    const int h = HeightKeepingAspect(src, width, tax, tay);
    {
        std::lock_guard<std::mutex> guard(stateLock_);
        knownWidth_ = width;
        if (knownHeight_ == h) return;
        knownHeight_ = h;
    }
    WriteControl(this, height_, h, time);
}

void BetterResize::KeepWidthFor(double height, double time) {
    const SourceFormat src = Source();
    if (!src.Known()) return;
    const auto [tax, tay] = TargetAspect(src, time);
    const int w = WidthKeepingAspect(src, height, tax, tay);
    {
        std::lock_guard<std::mutex> guard(stateLock_);
        knownHeight_ = height;
        if (knownWidth_ == w) return;
        knownWidth_ = w;
    }
    WriteControl(this, width_, w, time);
}

void BetterResize::FollowFrameFormat() {
    if (!GetDoc()) return;
    const FrameFormat ff = GetDoc()->GetFrameFormat();
    {
        std::lock_guard<std::mutex> guard(stateLock_);
        knownWidth_ = ff.width;
        knownHeight_ = ff.height;
    }
    if (ControlNumber(width_, TimeUndefined) != ff.width) WriteControl(this, width_, ff.width, TimeUndefined);
    if (ControlNumber(height_, TimeUndefined) != ff.height) WriteControl(this, height_, ff.height, TimeUndefined);
    if (ControlPoint(aspect_.aspect, TimeUndefined) != std::pair{ff.aspectX, ff.aspectY})
        WriteControlPoint(this, aspect_.aspect, ff.aspectX, ff.aspectY, TimeUndefined);
}

void BetterResize::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        const bool frameFormat = ControlNumber(useFrameFormat_, time) >= 0.5;
        const bool keep = ControlNumber(keepAspect_, time) >= 0.5;
        if (in == filter_.filter) {
            ShowWindowFor(filter_, NumberOf(param));
        } else if (in == useFrameFormat_) {
            ShowInput(keepAspect_, !On(param));
            if (On(param)) FollowFrameFormat();
        } else if (in == aspect_.change) {
            ShowInput(aspect_.aspect, On(param));
        }
        if (in == width_ || in == height_ || in == resetSize_ || in == aspect_.change || in == aspect_.aspect ||
            in == keepAspect_) {
            if (frameFormat) {
                FollowFrameFormat();
            } else if (in == resetSize_) {
                const SourceFormat src = Source();
                if (src.Known()) {
                    {
                        std::lock_guard<std::mutex> guard(stateLock_);
                        knownWidth_ = src.fullWidth;
                        knownHeight_ = src.fullHeight;
                    }
                    WriteControl(this, width_, src.fullWidth, time);
                    WriteControl(this, height_, src.fullHeight, time);
                }
            } else if (in == width_ || in == height_) {
                const double v = NumberOf(param);
                bool echo;
                {
                    std::lock_guard<std::mutex> guard(stateLock_);
                    double &known = in == width_ ? knownWidth_ : knownHeight_;
                    echo = known == v;
                    known = v;
                }
                if (keep && !echo) {
                    if (in == width_)
                        KeepHeightFor(v, time);
                    else
                        KeepWidthFor(v, time);
                }
            } else if (keep && (in != keepAspect_ || On(param))) {
                KeepHeightFor(ControlNumber(width_, time), time);
            }
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void BetterResize::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const std::optional<ImageDomain> &in = req->GetInputDoD(input_);
    const std::optional<ImageDomain> &out = req->OutputDoD();
    const AutoImageRoI roi(req);
    if (!in || !out || !roi || !in->HasFrame() || !out->HasFrame()) {
        req->SetInputRoI(input_, nullptr);
        return;
    }
    // Source pixels per output pixel: the two frames' ratio, which is what
    // Process resamples by (proxy and field included).
    const double rx = static_cast<double>(in->FrameWidth()) / out->FrameWidth();
    const double ry = static_cast<double>(in->FrameHeight()) / out->FrameHeight();
    const double s = Image::GetResizeFilterSupport(FilterOf(req, filter_));
    const double reachX = std::max(s * rx, s), reachY = std::max(s * ry, s);
    ImageDomain region = in->WithRect(SourceRegion(out->rect & roi->rect, rx, ry, reachX, reachY) & in->rect);
    req->SetInputRoI(input_, &region);
}

void BetterResize::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const bool precalc = req->IsPreCalc();
    const double time = req->Time();
    const SourceFormat sf = ReadSourceFormat(*src);
    {
        std::lock_guard<std::mutex> guard(stateLock_);
        source_ = sf;
    }

    // 1-2. The size, kept in aspect when asked.
    const bool changeAspect = req->GetInputNumber(aspect_.change) >= 0.5;
    std::pair<double, double> aspect{1.0, 1.0};
    if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(aspect_.aspect))) aspect = {p->x, p->y};
    int w = static_cast<int>(std::lround(req->GetInputNumber(width_, 1.0)));
    int h = static_cast<int>(std::lround(req->GetInputNumber(height_, 1.0)));
    if (req->GetInputNumber(useFrameFormat_) >= 0.5) {
        if (GetDoc()) {
            const FrameFormat ff = GetDoc()->GetFrameFormat();
            w = ff.width, h = ff.height, aspect = {ff.aspectX, ff.aspectY};
        }
    } else if (req->GetInputNumber(keepAspect_) >= 0.5) {
        const double tax = changeAspect ? aspect.first : sf.aspectX;
        const double tay = changeAspect ? aspect.second : sf.aspectY;
        const int kept = HeightKeepingAspect(sf, w, tax, tay);
        if (kept != h) {
            h = kept;
            {
                std::lock_guard<std::mutex> guard(stateLock_);
                knownWidth_ = w;
                knownHeight_ = h;
            }
            WriteControl(this, height_, h, time);
        }
    }
    const int fullWidth = w, fullHeight = h;

    // 3-4. Proxy and field.
    const int proxy = req->ProxyScale();
    w /= proxy;
    h /= proxy;
    if (sf.IsField()) h /= 2;
    w = std::max(w, 1);
    h = std::max(h, 1);

    // 5-7. The windows and the new image.
    const AutoImageDoD dod(req, input_);
    const OvID clipping = GetClippingMode(req);
    ImgRectI window;
    if (clipping == ClippingMode_Frame) {
        window = ImgRectI(0, 0, w, h);
    } else {
        window = (precalc || clipping == ClippingMode_Domain) && dod ? dod->rect : src->DataWindow();
        window = ScaleWindow(window, static_cast<float>(w) / static_cast<float>(src->Width()),
                             static_cast<float>(h) / static_cast<float>(src->Height()));
    }
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    Ref<Image> dst = NewSizedImage(*src, w, h, window, req);
    if (!dst) return FailSizing(this, req, output_, "cannot make an image of that size");
    WriteFormatAttrs(*dst, sf, fullWidth, fullHeight,
                     changeAspect ? std::optional<std::pair<double, double>>(aspect) : std::nullopt);

    // 8-10. The pixels.
    if (!precalc && !window.IsNull()) {
        int filter = FilterOf(req, filter_);
        if (DraftDropsFilter(req, req->GetInputNumber(hiQOnly_) >= 0.5)) filter = RszNearest;
        const int windowMethod = WindowOf(req, filter_);
        ResizeKey key;
        key.srcFrame = src->Frame();
        key.srcWindow = src->DataWindow();
        key.dstFrame = dst->Frame();
        key.dstWindow = dst->DataWindow();
        key.filter = filter;
        key.window = windowMethod;
        TagList tags = WorkTags(this, req);
        tags.Set({ResizeFilter, filter});
        tags.Set({ResizeWindow, windowMethod});
        if (!ResizeInto(*src, dst.Get(), tables_, key, tags)) return FailSizing(this, req, output_, "out of memory");
    }
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
