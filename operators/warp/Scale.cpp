#include "operators/warp/Scale.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/ResizeFilters.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Scale("Scale");
static ClassRegistration<Scale, ThreadedOperator> s_Registration(CLSID_Scale, &CLSID_ThreadedOperator,
                                                                 {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                  {RegClassName, "Scale"},
                                                                  {RegPath, "Tools/Transform/Scale"},
                                                                  {RegName, "Scale"},
                                                                  {RegCategory, "Transform"},
                                                                  {RegAbbreviation, "Scl"},
                                                                  {RegHelp, "Scales the frame to a new resolution"},
                                                                  {RegIcon, "Icons.Tools.Icons.Scale"},
                                                                  {RegNoBlendControls, 1},
                                                                  {RegNoEffectMask, 1},
                                                                  {RegNoObjectMaterialControls, 1},
                                                                  {RegNoMotionBlurControls, 1},
                                                                  {RegSupportsRoI, 1},
                                                                  {RegSupportsDoD, 1},
                                                                  {RegSupportsGPUImages, 1}});

namespace {

/// The Edges buttons are Canvas and Duplicate; the host numbers Duplicate 2.
int EdgesOfButton(double value) {
    const long v = std::lround(value);
    return v == 1 ? EdgeDuplicate : v == 2 ? EdgeWrap : static_cast<int>(v);
}

/// Reach of the filter in source pixels at factor s: the filter stretches
/// by 1 / s when shrinking.
double ReachOf(double support, double s) { return s > 0.0 ? std::max(support / s, support) : 0.0; }

} // namespace

Scale::Scale(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    lockXY_ = AddCheckbox(this, "Lock X/Y", "LockXY", 1.0, {{InputExternal, 0}, {InputNotify, 1}});
    for (int axis = 0; axis < 2; ++axis)
        (axis ? ySize_ : xSize_) = AddInputTagList(axis ? "Y Size" : "X Size", axis ? "YSize" : "XSize",
                                                   {{LinkDataType, CLSID_DataType_Number},
                                                    {InputControl, CLSID_InputControl_Slider},
                                                    {InputDefault, 1.0},
                                                    {InputSliderLow, 0.0},
                                                    {InputSliderHigh, 5.0},
                                                    {SliderRest, 1.0},
                                                    {InputNotify, 1},
                                                    {ControlVisible, axis ? 0 : 1}});
    edges_ = AddInputTagList("Edges", "Edges",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_MultiButton},
                              {InputInteger, 1},
                              {InputMinAllowed, 0.0},
                              {InputMaxAllowed, 1.0},
                              {InputDefault, 0.0},
                              {ButtonsFillRow, 1},
                              {ListAddItem, "Canvas"},
                              {ListAddItem, "Duplicate"}});
    hiQOnly_ = AddHiQOnlyInput(this);
    aspect_ = AddAspectInputs(this);
    filter_ = AddFilterInputs(this);
    input_ = AddSourceImageInput(this);
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Scale::~Scale() = default;

void Scale::OnDelete() { tables_.Free(); }

int Scale::ScaledSide(int full, double s) {
    double x = full * 0.5 * s;
    x = (full % 2 != 0) ? std::ceil(x - 0.5) + 0.5 : std::ceil(x);
    const double side = 2.0 * x + 0.5;
    // Truncated; never below one pixel, nor beyond what a frame may hold.
    if (!(side >= 1.0)) return 1;
    return static_cast<int>(std::min(side, MaxFrameSize()));
}

Scale::Settings Scale::ReadSettings(const Request *req) const {
    Settings s;
    s.xSize = req->GetInputNumber(xSize_, 1.0);
    s.ySize = req->GetInputNumber(lockXY_, 1.0) >= 0.5 ? s.xSize : req->GetInputNumber(ySize_, 1.0);
    s.edges = EdgesOfButton(req->GetInputNumber(edges_));
    s.filter = FilterOf(req, filter_);
    s.window = WindowOf(req, filter_);
    s.draftNearest = DraftDropsFilter(req, req->GetInputNumber(hiQOnly_) >= 0.5);
    if (!s.draftNearest && s.filter >= RszLinear) {
        const double support = Image::GetResizeFilterSupport(s.filter);
        s.reachX = ReachOf(support, s.xSize);
        s.reachY = ReachOf(support, s.ySize);
    }
    if (s.draftNearest) s.filter = RszNearest;
    return s;
}

void Scale::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (const auto *n = dynamic_cast<const Number *>(param)) {
        if (in == lockXY_)
            ShowInput(ySize_, n->value < 0.5);
        else if (in == filter_.filter)
            ShowWindowFor(filter_, n->value);
        else if (in == aspect_.change)
            ShowInput(aspect_.aspect, n->value >= 0.5);
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void Scale::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const std::optional<ImageDomain> &in = req->GetInputDoD(input_);
    const std::optional<ImageDomain> &out = req->OutputDoD();
    const AutoImageRoI roi(req);
    if (!in || !out || !roi) {
        req->SetInputRoI(input_, nullptr);
        return;
    }
    const Settings s = ReadSettings(req);
    const ImgRectI r = out->rect & roi->rect;
    ImgRectI need =
        SourceRegion(r, s.xSize > 0.0 ? 1.0 / s.xSize : 1.0, s.ySize > 0.0 ? 1.0 / s.ySize : 1.0, s.reachX, s.reachY);
    // Nothing is read at a size of zero: the region collapses on its middle.
    if (!(s.xSize > 0.0)) need.x0 = need.x1 = (r.x0 + r.x1) / 2;
    if (!(s.ySize > 0.0)) need.y0 = need.y1 = (r.y0 + r.y1) / 2;
    if (!need.IsNull()) need &= in->rect;
    ImageDomain region = in->WithRect(need);
    req->SetInputRoI(input_, &region);
}

void Scale::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const bool precalc = req->IsPreCalc();
    const SourceFormat sf = ReadSourceFormat(*src);
    const Settings s = ReadSettings(req);
    const bool zero = !(s.xSize > 0.0) || !(s.ySize > 0.0);

    // The size: parity kept at full resolution, then proxy and field.
    const int fullWidth = ScaledSide(sf.fullWidth, s.xSize), fullHeight = ScaledSide(sf.fullHeight, s.ySize);
    const int proxy = req->ProxyScale();
    int w = fullWidth / proxy, h = fullHeight / proxy;
    if (sf.IsField()) h /= 2;
    w = std::max(w, 1);
    h = std::max(h, 1);

    const AutoImageDoD dod(req, input_);
    const OvID clipping = GetClippingMode(req);
    ImgRectI window = (precalc || clipping == ClippingMode_Domain) && dod ? dod->rect : src->DataWindow();
    if (zero)
        window.SetNull();
    else if (clipping == ClippingMode_Frame)
        window = ImgRectI(0, 0, w, h);
    else {
        // Duplicate edges repeat the border instead of spreading past it.
        const bool spreads = s.edges != EdgeDuplicate;
        window =
            ScaleWindow(window, static_cast<float>(s.xSize), static_cast<float>(s.ySize),
                        spreads ? static_cast<float>(s.reachX) : 0.f, spreads ? static_cast<float>(s.reachY) : 0.f);
    }
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    Ref<Image> dst = NewSizedImage(*src, w, h, window, req);
    if (!dst) return FailSizing(this, req, output_, "cannot make an image of that size");
    std::optional<std::pair<double, double>> aspect;
    if (req->GetInputNumber(aspect_.change) >= 0.5)
        if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(aspect_.aspect))) aspect = {p->x, p->y};
    WriteFormatAttrs(*dst, sf, fullWidth, fullHeight, aspect);

    if (zero) {
        dst->SetCanvasColor(FltPixel{});
        if (!precalc) dst->Fill(FltPixel{});
    } else if (!precalc && !window.IsNull()) {
        ResizeKey key;
        key.srcFrame = src->Frame();
        key.srcWindow = src->DataWindow();
        key.dstFrame = dst->Frame();
        key.dstWindow = dst->DataWindow();
        key.filter = s.filter;
        key.window = s.window;
        key.xEdges = key.yEdges = s.edges;
        key.xScale = s.xSize;
        key.yScale = s.ySize;
        TagList tags = WorkTags(this, req);
        tags.Set({ResizeXScale, s.xSize});
        tags.Set({ResizeYScale, s.ySize});
        tags.Set({ResizeXOffset, 0.0});
        tags.Set({ResizeYOffset, 0.0});
        tags.Set({ResizeXEdges, s.edges});
        tags.Set({ResizeYEdges, s.edges});
        tags.Set({ResizeFilter, s.filter});
        tags.Set({ResizeWindow, s.window});
        if (!ResizeInto(*src, dst.Get(), tables_, key, tags)) return FailSizing(this, req, output_, "out of memory");
    }
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
