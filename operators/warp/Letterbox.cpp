#include "operators/warp/Letterbox.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/ResizeFilters.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Letterbox("Letterbox");
static ClassRegistration<Letterbox, ThreadedOperator>
    s_Registration(CLSID_Letterbox, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "Letterbox"},
                    {RegPath, "Tools/Transform/Letterbox"},
                    {RegName, "Letterbox"},
                    {RegCategory, "Transform"},
                    {RegAbbreviation, "Lbx"},
                    {RegHelp, "Tranforms a widescreen/film image to a video image with the correct aspect"},
                    {RegIcon, "Icons.Tools.Icons.LetterBox"},
                    {RegNoBlendControls, 1},
                    {RegNoEffectMask, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegNoAutoProxy, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

constexpr IdChoice kClipping[] = {{"None", "ClippingMode_None"}, {"Frame", "ClippingMode_Frame"}};
enum Mode { ModeLetterbox, ModePanAndScan };

/// Everything a resampler may read: no narrowing.
constexpr ImgRectI kReadAll(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless);

} // namespace

Letterbox::Letterbox(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    AddControlPageTagList("Controls", {});
    width_ = AddSizeInput(this, "Width", "Width", ff.width, {{InputNotify, 1}});
    height_ = AddSizeInput(this, "Height", "Height", ff.height, {{InputNotify, 1}});
    useFrameFormat_ = AddCheckbox(this, "Use Frame Format Settings", "UseFrameFormatSettings", 0.0,
                                  {{InputExternal, 0}, {InputNotify, 1}});
    aspect_ = AddInputTagList("Pixel Aspect", "PixelAspect",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {InputDefaultX, ff.aspectX},
                               {InputDefaultY, ff.aspectY},
                               {ControlDecimals, 6},
                               {LinkForceSave, 1},
                               {InputDelayDefault, 1},
                               {InputNotify, 1}});
    // The pixel aspect as documents of old kept it; read by nothing now.
    for (int axis = 0; axis < 2; ++axis)
        (axis ? legacyAspectY_ : legacyAspectX_) =
            AddInputTagList(axis ? "Aspect Y" : "Aspect X", axis ? "AspectY" : "AspectX",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_Slider},
                             {InputDefault, axis ? ff.aspectY : ff.aspectX},
                             {InputMinAllowed, 0.1},
                             {ControlDecimals, 6},
                             {InputExternal, 0},
                             {LinkForceSave, 1},
                             {ControlVisible, 0}});
    center_ = AddInputTagList("Center", "Center",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {PreviewControl, CLSID_PreviewControl_Crosshair},
                               {InputDefaultX, 0.5},
                               {InputDefaultY, 0.5}});
    mode_ = AddInputTagList("Mode", "Mode",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_MultiButton},
                             {InputInteger, 1},
                             {InputMinAllowed, 0.0},
                             {InputMaxAllowed, 1.0},
                             {InputDefault, 0.0},
                             {InputExternal, 0},
                             {ButtonsFillRow, 1},
                             {ListAddItem, "Letterbox / Envelope"},
                             {ListAddItem, "Pan-and-Scan"}});
    hiQOnly_ = AddHiQOnlyInput(this);
    filter_ = AddFilterInputs(this);
    clipping_ = AddInputTagList("Clipping Mode", "ClippingMode",
                                WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                               {InputControl, CLSID_InputControl_MultiButtonID},
                                               {InputDefaultId, ClippingMode_Frame},
                                               {ButtonsFillRow, 1}},
                                              kClipping));
    input_ = AddSourceImageInput(this);
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Letterbox::~Letterbox() = default;

void Letterbox::OnDelete() { tables_.Free(); }

void Letterbox::FollowFrameFormat() {
    if (!GetDoc()) return;
    const FrameFormat ff = GetDoc()->GetFrameFormat();
    if (ControlNumber(width_, TimeUndefined) != ff.width) WriteControl(this, width_, ff.width, TimeUndefined);
    if (ControlNumber(height_, TimeUndefined) != ff.height) WriteControl(this, height_, ff.height, TimeUndefined);
    if (ControlPoint(aspect_, TimeUndefined) != std::pair{ff.aspectX, ff.aspectY})
        WriteControlPoint(this, aspect_, ff.aspectX, ff.aspectY, TimeUndefined);
}

void Letterbox::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param) {
        if (in == filter_.filter) {
            if (const auto *n = dynamic_cast<const Number *>(param)) ShowWindowFor(filter_, n->value);
        } else if ((in == useFrameFormat_ || in == width_ || in == height_ || in == aspect_) &&
                   ControlNumber(useFrameFormat_, time) >= 0.5) {
            FollowFrameFormat();
        }
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

Letterbox::Geometry Letterbox::Place(const Request *req, int sw, int sh, double sax, double say, bool field) const {
    Geometry g;
    int w = static_cast<int>(std::lround(req->GetInputNumber(width_, 1.0)));
    int h = static_cast<int>(std::lround(req->GetInputNumber(height_, 1.0)));
    double ax = 1.0, ay = 1.0;
    if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(aspect_)))
        ax = p->x, ay = p->y;
    else if (!aspect_)
        ax = req->GetInputNumber(legacyAspectX_, 1.0), ay = req->GetInputNumber(legacyAspectY_, 1.0);
    if (req->GetInputNumber(useFrameFormat_) >= 0.5 && GetDoc()) {
        const FrameFormat ff = GetDoc()->GetFrameFormat();
        w = ff.width, h = ff.height, ax = ff.aspectX, ay = ff.aspectY;
    }
    g.fullWidth = w;
    g.fullHeight = h;
    g.aspectX = ax;
    g.aspectY = ay;
    const int proxy = req->ProxyScale();
    w /= proxy;
    h /= proxy;
    if (field) {
        h /= 2;
        ay *= 2.0;
    }
    g.width = w = std::max(w, 1);
    g.height = h = std::max(h, 1);

    double cx = 0.5, cy = 0.5;
    if (const auto *c = dynamic_cast<const Point *>(req->GetInputData(center_))) cx = c->x, cy = c->y;
    const int mode = static_cast<int>(std::lround(req->GetInputNumber(mode_)));
    g.sw = w;
    g.sh = h;
    if (mode <= ModeLetterbox) {
        g.sh = (sh * say) * (w * ax / ay) / (sw * sax);
        if (g.sh > h) {
            const double e = (g.sh - h) * 0.5;
            g.oy = std::clamp((0.5 - cy) * g.sh, -e, e);
        }
        g.xEdges = EdgeDuplicate, g.yEdges = EdgeCanvas;
    } else {
        g.sw = (sw * sax) * (h * ay / ax) / (sh * say);
        if (g.sw > w) {
            const double e = (g.sw - w) * 0.5;
            g.ox = std::clamp((0.5 - cx) * g.sw, -e, e);
        }
        g.xEdges = EdgeCanvas, g.yEdges = EdgeDuplicate;
    }
    g.xScale = g.sw / sw;
    g.yScale = g.sh / sh;
    if (!std::isfinite(g.xScale) || !std::isfinite(g.yScale)) g.xScale = g.yScale = 0.0;
    g.xOffset = (w - g.sw) * 0.5 + g.ox;
    g.yOffset = (h - g.sh) * 0.5 + g.oy;
    return g;
}

void Letterbox::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const std::optional<ImageDomain> &in = req->GetInputDoD(input_);
    const std::optional<ImageDomain> &out = req->OutputDoD();
    const AutoImageRoI roi(req);
    if (!in || !out || !roi || !in->HasFrame()) {
        req->SetInputRoI(input_, nullptr);
        return;
    }
    const Geometry g = Place(req, in->FrameWidth(), in->FrameHeight(), in->xScale, in->yScale, req->Field() >= 0);
    ImgRectI need;
    if (g.Valid()) {
        const double s = Image::GetResizeFilterSupport(FilterOf(req, filter_));
        const double rx = 1.0 / g.xScale, ry = 1.0 / g.yScale;
        need = SourceRegion(out->rect & roi->rect, rx, ry, std::max(s * rx, s), std::max(s * ry, s), g.xOffset,
                            g.yOffset) &
               in->rect;
        if (GetClippingMode(req) == ClippingMode_Frame) need &= in->frame;
    }
    ImageDomain region = in->WithRect(need);
    req->SetInputRoI(input_, &region);
}

void Letterbox::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    const bool precalc = req->IsPreCalc();
    const SourceFormat sf = ReadSourceFormat(*src);
    const Geometry g = Place(req, src->Width(), src->Height(), src->XScale(), src->YScale(), sf.IsField());
    const bool frameMode = GetClippingMode(req) == ClippingMode_Frame;

    const AutoImageDoD dod(req, input_);
    ImgRectI window = precalc && dod ? dod->rect : src->DataWindow();
    if (frameMode) window = src->IsCanvasColorClear() ? window & src->Frame() : src->Frame();
    if (g.Valid())
        window = PlaceWindow(window, g.xScale, g.yScale, g.xOffset, g.yOffset);
    else
        window.SetNull();
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    Ref<Image> dst = NewSizedImage(*src, g.width, g.height, window, req);
    if (!dst) return FailSizing(this, req, output_, "cannot make an image of that size");
    if (frameMode || !g.Valid()) dst->SetCanvasColor(FltPixel{});
    WriteFormatAttrs(*dst, sf, g.fullWidth, g.fullHeight, std::pair{g.aspectX, g.aspectY});

    if (!g.Valid()) {
        if (!precalc) dst->Clear();
    } else if (!precalc && !window.IsNull()) {
        // Framed with a canvas that is not clear: the canvas is made real
        // over the frame, and what lies beyond is clear.
        Ref<Image> from(src);
        if (frameMode && !src->IsCanvasColorClear()) {
            const ImgRectI frame = src->Frame();
            const FltPixel clear{};
            from = src->CopyOfImageTagList({{ImgDataWindow, &frame}, {ImgValidWindow, &frame}});
            if (!from) return FailSizing(this, req, output_, "out of memory");
            from->SetCanvasColor(clear);
        }
        const ImgRectI read = frameMode ? src->Frame() : kReadAll;
        ResizeKey key;
        key.srcFrame = from->Frame();
        key.srcWindow = from->DataWindow();
        key.dstFrame = dst->Frame();
        key.dstWindow = dst->DataWindow();
        key.readWindow = read;
        key.filter = DraftDropsFilter(req, req->GetInputNumber(hiQOnly_) >= 0.5) ? RszNearest : FilterOf(req, filter_);
        key.window = WindowOf(req, filter_);
        key.xEdges = g.xEdges;
        key.yEdges = g.yEdges;
        key.xScale = g.xScale;
        key.yScale = g.yScale;
        key.xOffset = g.xOffset;
        key.yOffset = g.yOffset;
        TagList tags = WorkTags(this, req);
        tags.Set({ResizeFilter, key.filter});
        tags.Set({ResizeWindow, key.window});
        tags.Set({ResizeXScale, g.xScale});
        tags.Set({ResizeYScale, g.yScale});
        tags.Set({ResizeXOffset, g.xOffset});
        tags.Set({ResizeYOffset, g.yOffset});
        tags.Set({ResizeXEdges, g.xEdges});
        tags.Set({ResizeYEdges, g.yEdges});
        tags.Set({ResizeSourceWindow, &read});
        if (!ResizeInto(*from, dst.Get(), tables_, key, tags)) return FailSizing(this, req, output_, "out of memory");
        if (frameMode) dst->SetCanvasColor(FltPixel{});
    }
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
