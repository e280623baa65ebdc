#include "operators/warp/SizingCommon.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <strings.h>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"

namespace Orvane {
namespace {

constexpr const char *kFilterNames[] = {"Nearest Neighbor", "Box",      "Linear",  "Quadratic", "Cubic", "Catmull-Rom",
                                        "Gaussian",         "Mitchell", "Lanczos", "Sinc",      "Bessel"};
constexpr const char *kWindowNames[] = {"Hanning", "Hamming", "Blackman", "Kaiser"};
constexpr int kFilterSinc = 9, kFilterBessel = 10;

bool EnvSwitchOn(const char *name) {
    const char *v = std::getenv(name);
    if (!v || !*v) return false;
    for (const char *yes : {"1", "true", "yes", "on"})
        if (strcasecmp(v, yes) == 0) return true;
    return false;
}

FrameFormat DocFormat(const Operator *op) { return op->GetDoc() ? op->GetDoc()->GetFrameFormat() : FrameFormat(); }

/// A side in double, rounded down or up, within the endless sentinels.
int RoundSide(double x, bool up) {
    const double r = up ? std::ceil(x) : std::floor(x);
    return static_cast<int>(std::clamp(r, -static_cast<double>(DomainEndless), static_cast<double>(DomainEndless)));
}

/// Scales one corner in single precision; endless sides stay.
int ScaleSide(int v, float reach, float s, bool up) {
    if (IsEndlessSide(v)) return v;
    const float x = (static_cast<float>(v) + reach) * s;
    return RoundSide(x, up);
}

/// One side of a source region: (v - o) x r + reach in double, rounded through float.
int SourceSide(int v, double o, double r, double reach, bool up) {
    if (IsEndlessSide(v)) return v;
    return RoundSide(static_cast<float>((v - o) * r + reach), up);
}

bool DocProtected(const Operator *op) { return op->GetDoc() && op->GetDoc()->IsWriteProtected(); }

} // namespace

// ---- inputs ----------------------------------------------------------------

FilterInputs AddFilterInputs(Operator *op) {
    FilterInputs in;
    TagList filter{{LinkDataType, CLSID_DataType_Number},
                   {InputControl, CLSID_InputControl_Combo},
                   {InputInteger, 1},
                   {InputMinAllowed, 0.0},
                   {InputMaxAllowed, 10.0},
                   {InputDefault, 2.0},
                   {InputNotify, 1}};
    for (const char *name : kFilterNames) filter.Add({ListAddItem, name});
    in.filter = op->AddInputTagList("Filter Method", "FilterMethod", filter);
    TagList window{{LinkDataType, CLSID_DataType_Number},
                   {InputControl, CLSID_InputControl_Combo},
                   {InputInteger, 1},
                   {InputMinAllowed, 0.0},
                   {InputMaxAllowed, 4.0},
                   {InputDefault, 0.0}};
    for (const char *name : kWindowNames) window.Add({ListAddItem, name});
    in.window = op->AddInputTagList("Window Method", "WindowMethod", window);
    // The list's visibility follows the filter's value before any is set.
    ShowWindowFor(in, ControlNumber(in.filter, TimeUndefined, 2.0));
    return in;
}

void ShowWindowFor(const FilterInputs &in, double filterMethod) {
    const long m = std::lround(filterMethod);
    ShowInput(in.window, m == kFilterSinc || m == kFilterBessel);
}

int FilterValue(double filterMethod) { return static_cast<int>(std::clamp(std::lround(filterMethod), 0L, 10L)) + 1; }

int WindowValue(double windowMethod) { return static_cast<int>(std::clamp(std::lround(windowMethod), 0L, 4L)) + 100; }

int FilterOf(const Request *req, const FilterInputs &in) { return FilterValue(req->GetInputNumber(in.filter, 2.0)); }

int WindowOf(const Request *req, const FilterInputs &in) { return WindowValue(req->GetInputNumber(in.window, 0.0)); }

double MaxFrameSize() {
    static const bool huge = EnvSwitchOn("ORVANE_HUGE_FRAMES");
    return huge ? 1000000.0 : 32767.0;
}

Input *AddSizeInput(Operator *op, const char *name, const char *id, double def, const TagList &extra) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Slider},
                 {InputInteger, 1},
                 {InputMinAllowed, 1.0},
                 {InputMaxAllowed, MaxFrameSize()},
                 {InputSliderLow, 1.0},
                 {InputSliderHigh, 4096.0},
                 {InputDefault, def},
                 {LinkForceSave, 1},
                 {InputDelayDefault, 1}};
    tags.Merge(extra);
    return op->AddInputTagList(name, id, tags);
}

Input *AddHiQOnlyInput(Operator *op) { return AddCheckbox(op, "Only Use Filter in HiQ", "HiQOnly", 0.0); }

Input *AddSourceImageInput(Operator *op, const TagList &extra) {
    TagList tags{{LinkDataType, CLSID_DataType_Image},
                 {LinkMain, 1},
                 {ImageFromRequestOK, 1},
                 {InputPriority, PriorityDefault + 1}};
    for (const TagItem &item : extra.Items()) tags.Add(item);
    return op->AddInputTagList("Input", "Input", tags);
}

AspectInputs AddAspectInputs(Operator *op) {
    const FrameFormat ff = DocFormat(op);
    AspectInputs in;
    in.change = AddCheckbox(op, "Change Pixel Aspect", "ChangePixelAspect", 0.0, {{InputNotify, 1}});
    in.aspect = op->AddInputTagList("Pixel Aspect", "PixelAspect",
                                    {{LinkDataType, CLSID_DataType_Point},
                                     {InputControl, CLSID_InputControl_Offset},
                                     {InputDefaultX, ff.aspectX},
                                     {InputDefaultY, ff.aspectY},
                                     {ControlDecimals, 6},
                                     {LinkForceSave, 1},
                                     {InputDelayDefault, 1},
                                     {InputNotify, 1},
                                     {ControlVisible, 0}});
    return in;
}

Input *AddCheckbox(Operator *op, const char *name, const char *id, double def, const TagList &extra) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Checkbox},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, 1.0},
                 {InputDefault, def}};
    tags.Merge(extra);
    return op->AddInputTagList(name, id, tags);
}

Input *AddButton(Operator *op, const char *name, const char *id, const TagList &extra) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Button},
                 {InputExternal, 0},
                 {InputPassive, 1},
                 {InputNotify, 1},
                 {InputInitialNotify, 0},
                 {LinkNotSaved, 1}};
    tags.Merge(extra);
    return op->AddInputTagList(name, id, tags);
}

void ShowInput(Input *in, bool visible) {
    if (in) in->SetAttrsTagList({{ControlVisible, visible ? 1 : 0}});
}

bool DraftDropsFilter(const Request *req, bool hiQOnly) {
    return hiQOnly && (req->GetFlags() & ReqFlagQuick) && GetApp()->GetAttrB(AppFastScale);
}

// ---- the source's format -----------------------------------------------------

double SourceFormat::FrameAspect() const { return (fullWidth * aspectX) / (fullHeight * aspectY); }

SourceFormat ReadSourceFormat(const Image &img) {
    SourceFormat f;
    f.width = img.Width();
    f.height = img.Height();
    f.xScale = img.XScale();
    f.yScale = img.YScale();
    const TagList &attrs = img.Attrs();
    auto attr = [&attrs](Tag t) -> std::optional<double> {
        if (!attrs.Has(t)) return std::nullopt;
        return attrs.GetDouble(t);
    };
    f.fullWidthAttr = attr(ImgFullWidth);
    f.fullHeightAttr = attr(ImgFullHeight);
    f.fullXScaleAttr = attr(ImgFullXScale);
    f.fullYScaleAttr = attr(ImgFullYScale);
    f.fullWidth = static_cast<int>(f.fullWidthAttr.value_or(f.width));
    f.fullHeight = static_cast<int>(f.fullHeightAttr.value_or(f.height));
    f.aspectX = f.fullXScaleAttr.value_or(f.xScale);
    f.aspectY = f.fullYScaleAttr.value_or(f.yScale);
    f.field = static_cast<int>(attrs.GetLong(ImgField, -1));
    f.fieldOffset = attrs.GetDouble(ImgFieldOffset, 0.0);
    if (f.IsField()) {
        f.fullHeight *= 2;
        f.aspectY *= 0.5;
    }
    return f;
}

SourceFormat SourceFormatOfDomain(const ImageDomain &domain, int field, int proxy) {
    SourceFormat f;
    proxy = std::max(proxy, 1);
    f.width = domain.FrameWidth();
    f.height = domain.FrameHeight();
    f.xScale = domain.xScale;
    f.yScale = domain.yScale;
    f.fullWidth = f.width * proxy;
    f.fullHeight = f.height * proxy;
    f.aspectX = f.xScale;
    f.aspectY = f.yScale;
    f.field = field;
    if (f.IsField()) {
        f.fullHeight *= 2;
        f.aspectY *= 0.5;
    }
    return f;
}

namespace {

/// A size worked out in double, truncated; kept within 1..MaxFrameSize()
/// (also for aspects of zero, which give no finite size).
int SizeOf(double v) {
    if (!(v >= 1.0)) return 1;
    return static_cast<int>(std::min(v, MaxFrameSize()));
}

} // namespace

int HeightKeepingAspect(const SourceFormat &src, double w, double tax, double tay) {
    return SizeOf(w * tax / (src.FrameAspect() * tay) + 0.5);
}

int WidthKeepingAspect(const SourceFormat &src, double h, double tax, double tay) {
    return SizeOf(h * (src.FrameAspect() * tay) / tax + 0.5);
}

// ---- windows -------------------------------------------------------------------

ImgRectI ScaleWindow(const ImgRectI &r, float sx, float sy, float reachX, float reachY) {
    ImgRectI s(ScaleSide(r.x0, -reachX, sx, false), ScaleSide(r.y0, -reachY, sy, false),
               ScaleSide(r.x1, reachX, sx, true), ScaleSide(r.y1, reachY, sy, true));
    return s;
}

ImgRectI PlaceWindow(const ImgRectI &r, double sx, double sy, double ox, double oy) {
    auto side = [](int v, double s, double o, bool up) { return IsEndlessSide(v) ? v : RoundSide(v * s + o, up); };
    return ImgRectI(side(r.x0, sx, ox, false), side(r.y0, sy, oy, false), side(r.x1, sx, ox, true),
                    side(r.y1, sy, oy, true));
}

ImgRectI SourceRegion(const ImgRectI &r, double rx, double ry, double reachX, double reachY, double ox, double oy) {
    return ImgRectI(SourceSide(r.x0, ox, rx, -reachX, false), SourceSide(r.y0, oy, ry, -reachY, false),
                    SourceSide(r.x1, ox, rx, reachX, true), SourceSide(r.y1, oy, ry, reachY, true));
}

// ---- coefficient tables --------------------------------------------------------

bool ResizeTables::Prepare(const Image &src, Image *dst, const ResizeKey &key, const TagList &tags) {
    if (key_ && *key_ == key && x_ && y_) return true;
    Free();
    if (!src.ResizePreCalcTagList(dst, x_, y_, tags)) {
        Free();
        return false;
    }
    ++builds_;
    key_ = key;
    return true;
}

void ResizeTables::Free() {
    if (x_ || y_) Image::ResizePostCalc(x_, y_);
    x_ = y_ = nullptr;
    key_.reset();
}

TagList WorkTags(Operator *op, Request *req) {
    return {{WorkOperator, op},
            {WorkThreaded, 1},
            {WorkUseGPU, !req->IsPreCalc() && op->IsGPUEnabled(req, false)},
            {WorkRequest, req}};
}

Ref<Image> NewSizedImage(const Image &src, int w, int h, const ImgRectI &window, const Request *req) {
    const AutoImageRoI roi(req);
    const ImgRectI valid = roi ? window & roi->rect : window;
    const FltPixel canvas = src.GetCanvasColor();
    return NewImageTagList({{ImgLikeImage, &src},
                            {ImgWidth, w},
                            {ImgHeight, h},
                            {ImgDataWindow, &window},
                            {ImgValidWindow, &valid},
                            {ImgNoData, req->IsPreCalc()},
                            {ImgCanvasColor, &canvas},
                            {ImgTakeWindows, 1}});
}

bool ResizeInto(const Image &src, Image *dst, ResizeTables &tables, const ResizeKey &key, const TagList &tags) {
    return tables.Prepare(src, dst, key, tags) && dst->AllocScanLineData() &&
           src.ResizeTagList(dst, tables.XTable(), tables.YTable(), tags);
}

void FailSizing(Operator *op, Request *req, Output *out, const char *what) {
    const RenderTask *task = req->GetTask();
    if (task && task->IsAborted()) {
        // An abandoned render ends without a message.
    } else if (op->GetDoc()) {
        op->GetDoc()->PrintF(req, ConsoleError, "%s: %s (time = %f)\n", op->Name().c_str(), what, req->Time());
    } else {
        std::fprintf(stderr, "%s: %s (time = %f)\n", op->Name().c_str(), what, req->Time());
    }
    req->SetOutputData(out, nullptr);
}

// ---- results -------------------------------------------------------------------

void WriteFormatAttrs(Image &out, const SourceFormat &src, int fullWidth, int fullHeight,
                      const std::optional<std::pair<double, double>> &aspect) {
    TagList attrs;
    if (src.fullWidthAttr) attrs.Set({ImgFullWidth, fullWidth});
    if (src.fullHeightAttr) attrs.Set({ImgFullHeight, src.IsField() ? fullHeight / 2 : fullHeight});
    if (src.fieldOffset > 0.0) attrs.Set({ImgFieldOffset, 0.5 / out.Height()});
    if (aspect) {
        const double ax = std::max(1e-5, aspect->first);
        const double ay = std::max(1e-5, aspect->second) * (src.IsField() ? 2.0 : 1.0);
        double sx = ax, sy = ay;
        if (src.fullXScaleAttr && *src.fullXScaleAttr > 0.0) {
            attrs.Set({ImgFullXScale, ax});
            sx = src.xScale * ax / *src.fullXScaleAttr;
        }
        if (src.fullYScaleAttr && *src.fullYScaleAttr > 0.0) {
            attrs.Set({ImgFullYScale, ay});
            sy = src.yScale * ay / *src.fullYScaleAttr;
        }
        out.SetScale(sx, sy);
    }
    if (!attrs.Empty()) out.SetAttrsTagList(attrs);
}

// ---- controls -------------------------------------------------------------------

namespace {

bool WriteValue(Operator *op, Input *in, Ref<Parameter> value, double time) {
    if (!in || DocProtected(op) || in->Link()) return false;
    if (in->IsAnimated() && time != TimeUndefined) {
        AnimCurve curve = *in->Curve();
        curve.SetKey(time, std::move(value));
        return in->SetCurve(std::move(curve));
    }
    return in->SetValue(std::move(value));
}

} // namespace

bool WriteControl(Operator *op, Input *in, double value, double time) {
    return WriteValue(op, in, MakeRef<Number>(value), time);
}

bool WriteControlPoint(Operator *op, Input *in, double x, double y, double time) {
    return WriteValue(op, in, MakeRef<Point>(x, y), time);
}

double ControlNumber(const Input *in, double time, double def) {
    if (!in) return def;
    Ref<Parameter> v = in->ValueAt(time == TimeUndefined ? 0.0 : time);
    const auto *n = dynamic_cast<const Number *>(v.Get());
    return n ? n->value : def;
}

std::pair<double, double> ControlPoint(const Input *in, double time, std::pair<double, double> def) {
    if (!in) return def;
    Ref<Parameter> v = in->ValueAt(time == TimeUndefined ? 0.0 : time);
    const auto *p = dynamic_cast<const Point *>(v.Get());
    return p ? std::pair{p->x, p->y} : def;
}

} // namespace Orvane
