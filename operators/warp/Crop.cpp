#include "operators/warp/Crop.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Crop("Crop");
static ClassRegistration<Crop, ThreadedOperator>
    s_Registration(CLSID_Crop, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "Crop"},
                    {RegPath, "Tools/Transform/Crop"},
                    {RegName, "Crop"},
                    {RegCategory, "Transform"},
                    {RegAbbreviation, "Crp"},
                    {RegHelp, "Changes size and offset, and allows trimming of a frame"},
                    {RegIcon, "Icons.Tools.Icons.Crop"},
                    {RegNoBlendControls, 1},
                    {RegNoEffectMask, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegHasOperatorControl, 1},
                    {RegNoAutoProxy, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

constexpr IdChoice kClipping[] = {{"None", "ClippingMode_None"}, {"Frame", "ClippingMode_Frame"}};
/// Checkboxes count as on from the largest float below 1.
constexpr double kOn = 0.9999998807907104;
/// Float pixels closer than this are the same colour.
constexpr float kSame = 1e-6f;

struct Channels {
    bool on[4];
    /// Whether a chosen channel of `p` differs from `ref`. Integer pixels
    /// arrive as floats one code apart by 1/65535 at least, so equal codes
    /// are equal and any other difference exceeds kSame.
    bool Differ(const FltPixel &p, const FltPixel &ref) const {
        return (on[0] && std::fabs(p.R - ref.R) > kSame) || (on[1] && std::fabs(p.G - ref.G) > kSame) ||
               (on[2] && std::fabs(p.B - ref.B) > kSame) || (on[3] && std::fabs(p.A - ref.A) > kSame);
    }
};

} // namespace

Crop::Crop(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    // PageIcon is a pointer-typed tag: the icon name travels as a plain pointer to static text.
    AddControlPageTagList("Crop", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Crop")}});
    for (int axis = 0; axis < 2; ++axis)
        (axis ? yOffset_ : xOffset_) = AddInputTagList(axis ? "Y Offset" : "X Offset", axis ? "YOffset" : "XOffset",
                                                       {{LinkDataType, CLSID_DataType_Number},
                                                        {InputControl, CLSID_InputControl_Slider},
                                                        {InputInteger, 1},
                                                        {InputSliderLow, -1000.0},
                                                        {InputSliderHigh, 1000.0},
                                                        {SliderSteps, 2001},
                                                        {InputDefault, 0.0},
                                                        {InputNotify, 1}});
    xSize_ = AddSizeInput(this, "X Size", "XSize", ff.width);
    ySize_ = AddSizeInput(this, "Y Size", "YSize", ff.height);
    resetSize_ = AddButton(this, "Reset Size", "ResetSize", {{ControlWidth, 0.5}});
    resetOffset_ = AddButton(this, "Reset Offset", "ResetOffset", {{ControlWidth, 0.5}});
    keepAspect_ = AddCheckbox(this, "Keep Aspect", "KeepAspect", 0.0);
    keepCentered_ = AddCheckbox(this, "Keep Centered", "KeepCentered", 0.0);
    aspect_ = AddAspectInputs(this);
    input_ = AddSourceImageInput(this, {{InputNotify, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    clipping_ = AddInputTagList("Clipping Mode", "ClippingMode",
                                WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                               {InputControl, CLSID_InputControl_MultiButtonID},
                                               {InputDefaultId, ClippingMode_Frame},
                                               {ButtonsFillRow, 1}},
                                              kClipping));

    AddControlPageTagList("Auto Crop", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.AutoCrop")}});
    static const char *const names[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int c = 0; c < 4; ++c)
        channels_[c] = AddCheckbox(this, names[c], names[c], 1.0,
                                   {{InputExternal, 0},
                                    {ControlGroup, 12},
                                    {ControlMember, c},
                                    {ColorChannel, ColorChannelRed + c},
                                    {ControlWidth, 0.25}});
    autoCrop_ = AddButton(this, "Auto Crop", "AutoCrop");
}

Crop::~Crop() = default;

Crop::Geometry Crop::Place(const SourceFormat &src, const Controls &c) {
    Geometry g;
    const double rx = static_cast<double>(src.fullWidth) / src.width;
    const double ry = static_cast<double>(src.fullHeight) / src.height;
    auto pixels = [](double v, double r) { return std::max(1, static_cast<int>(std::lround(v / r))); };
    g.x = static_cast<int>(c.x);
    g.y = static_cast<int>(c.y);
    g.w = static_cast<int>(c.w);
    g.h = static_cast<int>(c.h);
    if (c.keepAspect) {
        const int h = static_cast<int>(g.w / (static_cast<double>(src.fullWidth) / src.fullHeight) + 0.5);
        g.heightKept = h != g.h;
        g.h = h;
    }
    g.iw = pixels(g.w, rx);
    g.ih = pixels(g.h, ry);
    if (c.keepCentered) {
        const int x = static_cast<int>(std::floor((src.fullWidth - g.w) * 0.5 + 0.5));
        const int y = static_cast<int>(std::floor((src.fullHeight - g.h) * 0.5 + 0.5));
        g.centred = x != g.x || y != g.y;
        g.x = x;
        g.y = y;
    }
    g.ox = static_cast<int>(std::floor(g.x / rx + 0.5));
    g.oy = static_cast<int>(std::floor(g.y / ry + 0.5));
    return g;
}

bool Crop::FindContentBox(const Image &img, const bool channels[4], ImgRectI &box) {
    const ImgRectI dw = img.DataWindow();
    if (dw.IsNull() || !img.HasScanLineData()) return false;
    const Channels chans{{channels[0], channels[1], channels[2], channels[3]}};

    // The border colour: the sample most of the eight match.
    const int xs[3] = {dw.x0, dw.x0 + (dw.Width() - 1) / 2, dw.x1 - 1};
    const int ys[3] = {dw.y0, dw.y0 + (dw.Height() - 1) / 2, dw.y1 - 1};
    FltPixel samples[8];
    int n = 0;
    for (int j = 0; j < 3; ++j)
        for (int i = 0; i < 3; ++i)
            if (i != 1 || j != 1) samples[n++] = img.GetFlt(xs[i], ys[j]);
    int best = 0, bestCount = -1;
    for (int i = 0; i < 8; ++i) {
        int count = 0;
        for (int k = 0; k < 8; ++k) count += !chans.Differ(samples[k], samples[i]);
        if (count > bestCount) best = i, bestCount = count;
    }
    const FltPixel ref = samples[best];

    // Per row, the first and last differing pixel (-1: none).
    const int width = dw.Width();
    std::vector<int> first(dw.Height(), -1), last(dw.Height(), -1);
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> row(width);
            for (int y = y0; y < y1; ++y) {
                if (img.CheckAbort()) return;
                LoadFlt(img.Depth(), img.ScanLine(y), width, row.data());
                int a = 0;
                while (a < width && !chans.Differ(row[a], ref)) ++a;
                if (a == width) continue;
                int b = width - 1;
                while (!chans.Differ(row[b], ref)) --b;
                first[y - dw.y0] = a;
                last[y - dw.y0] = b;
            }
        },
        8);
    if (img.CheckAbort()) return false;
    int bottom = -1, top = -1, left = width, right = -1;
    for (int r = 0; r < dw.Height(); ++r) {
        if (first[r] < 0) continue;
        if (bottom < 0) bottom = r;
        top = r;
        left = std::min(left, first[r]);
        right = std::max(right, last[r]);
    }
    if (bottom < 0) return false;
    box = ImgRectI(dw.x0 + left, dw.y0 + bottom, dw.x0 + right + 1, dw.y0 + top + 1);
    return true;
}

Crop::Controls Crop::ReadControls(const Request *req) const {
    Controls c;
    c.x = req->GetInputNumber(xOffset_);
    c.y = req->GetInputNumber(yOffset_);
    c.w = req->GetInputNumber(xSize_, 1.0);
    c.h = req->GetInputNumber(ySize_, 1.0);
    c.keepAspect = req->GetInputNumber(keepAspect_) > kOn;
    c.keepCentered = req->GetInputNumber(keepCentered_) > kOn;
    return c;
}

SourceFormat Crop::SourceFor(const ImageDomain &domain, const Request *req) const {
    {
        // What the last render read from the image's attributes, when it was
        // this frame (the pre-calculation just before this request read it).
        std::lock_guard<std::mutex> guard(stateLock_);
        if (source_.Known() && source_.width == domain.FrameWidth() && source_.height == domain.FrameHeight())
            return source_;
    }
    return SourceFormatOfDomain(domain, req->Field(), req->ProxyScale());
}

void Crop::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (const auto *n = dynamic_cast<const Number *>(param)) {
        if (in == autoCrop_) {
            autoCropPending_ = true;
        } else if (in == resetOffset_) {
            WriteControl(this, xOffset_, 0.0, time);
            WriteControl(this, yOffset_, 0.0, time);
        } else if (in == resetSize_) {
            SourceFormat src;
            {
                std::lock_guard<std::mutex> guard(stateLock_);
                src = source_;
            }
            if (src.Known()) {
                WriteControl(this, xSize_, src.fullWidth, time);
                WriteControl(this, ySize_, src.fullHeight, time);
            }
        } else if (in == aspect_.change) {
            ShowInput(aspect_.aspect, n->value >= 0.5);
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void Crop::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const std::optional<ImageDomain> &in = req->GetInputDoD(input_);
    const AutoImageRoI roi(req);
    const RenderTask *task = req->GetTask();
    // The scan of a pending auto crop looks at the whole image.
    const bool scan = autoCropPending_ && !req->IsPreCalc();
    if (!in || !roi || !in->HasFrame() || scan || (task && task->passThrough)) {
        req->SetInputRoI(input_, nullptr);
        return;
    }
    const Geometry g = Place(SourceFor(*in, req), ReadControls(req));
    ImgRectI need = roi->rect;
    if (GetClippingMode(req) == ClippingMode_Frame) need &= ImgRectI(0, 0, g.iw, g.ih);
    need.Offset(g.ox, g.oy);
    ImageDomain region = in->WithRect(need & in->rect);
    req->SetInputRoI(input_, &region);
}

void Crop::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    // 1. A pass-through look hands the input on.
    if (const RenderTask *task = req->GetTask(); task && task->passThrough) {
        req->SetOutputData(output_, src);
        return;
    }
    const bool precalc = req->IsPreCalc();
    const double time = req->Time();
    const SourceFormat sf = ReadSourceFormat(*src);
    {
        std::lock_guard<std::mutex> guard(stateLock_);
        source_ = sf;
    }
    const double rx = static_cast<double>(sf.fullWidth) / sf.width;
    const double ry = static_cast<double>(sf.fullHeight) / sf.height;
    Controls c = ReadControls(req);

    // 2. A pending auto crop: the box becomes the offsets and size.
    if (autoCropPending_ && !precalc && !src->DataWindow().IsNull()) {
        autoCropPending_ = false;
        if (!src->DownloadGPUMem()) return FailSizing(this, req, output_, "the image could not be read back");
        bool chans[4];
        for (int i = 0; i < 4; ++i) chans[i] = req->GetInputNumber(channels_[i], 1.0) >= 0.5;
        ImgRectI box;
        if (FindContentBox(*src, chans, box)) {
            c.x = box.x0 * rx;
            c.y = box.y0 * ry;
            c.w = box.Width() * rx;
            c.h = box.Height() * ry;
            WriteControl(this, xOffset_, c.x, time);
            WriteControl(this, yOffset_, c.y, time);
            WriteControl(this, xSize_, c.w, time);
            WriteControl(this, ySize_, c.h, time);
        }
    }

    // 3-6. The cut; kept aspect and centring go back into the controls.
    const Geometry g = Place(sf, c);
    if (g.heightKept) WriteControl(this, ySize_, g.h, time);
    if (g.centred) {
        WriteControl(this, xOffset_, g.x, time);
        WriteControl(this, yOffset_, g.y, time);
    }

    // 7-8. The windows, the new image and its pixels.
    const AutoImageDoD dod(req, input_);
    ImgRectI window = precalc && dod ? dod->rect : src->DataWindow();
    window.Offset(-g.ox, -g.oy);
    if (GetClippingMode(req) == ClippingMode_Frame) window &= ImgRectI(0, 0, g.iw, g.ih);
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    Ref<Image> dst = NewSizedImage(*src, g.iw, g.ih, window, req);
    if (!dst) return FailSizing(this, req, output_, "cannot make an image of that size");
    if (!precalc && !window.IsNull() &&
        !(dst->AllocScanLineData() && src->ImageCrop(dst.Get(), g.ox, g.oy, WorkTags(this, req), 1, 1)))
        return FailSizing(this, req, output_, "out of memory");

    // 9. Attributes and pixel aspect.
    std::optional<std::pair<double, double>> aspect;
    if (req->GetInputNumber(aspect_.change) >= 0.5)
        if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(aspect_.aspect))) aspect = {p->x, p->y};
    WriteFormatAttrs(*dst, sf, g.w, g.h, aspect);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
