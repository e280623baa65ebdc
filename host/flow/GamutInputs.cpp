#include "host/flow/GamutInputs.h"

#include <algorithm>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Parameter.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"

namespace Orvane {
namespace gamutinputs {

struct Choice {
    GamutSpace space;
    const char *id, *label;
};
constexpr Choice kChoices[] = {{GamutSpace::NoChange, "NoChange", "No Change"},
                               {GamutSpace::Linear, "Linear", "Linear"},
                               {GamutSpace::SRGB, "sRGB", "sRGB"},
                               {GamutSpace::Rec709, "Rec709", "Rec.709"},
                               {GamutSpace::Gamma, "Gamma", "Gamma"},
                               {GamutSpace::CineonLog, "CineonLog", "Cineon Log"},
                               {GamutSpace::ConfigSpace, "ColorSpace", "Color Space"}};

/// Pixels converted at a time in the rows.
constexpr int kBlock = 256;

/// The curve over a run of float pixels, with the optional divide by alpha.
struct Converter {
    GamutCurve curve;
    bool toLinear, preDivide;
    const ColorProcessor *proc; ///< a configuration's transform, in place of the curve

    void Run(FltPixel *px, int n) const {
        auto *f = reinterpret_cast<float *>(px);
        if (!preDivide) {
            Convert(f, n);
            return;
        }
        // Colour over alpha, the curve, times alpha; pixels without alpha keep their values.
        for (int i = 0; i < n; ++i) {
            FltPixel &p = px[i];
            if (!(p.A > 0.f)) continue;
            FltPixel straight{p.R / p.A, p.G / p.A, p.B / p.A, p.A};
            Convert(reinterpret_cast<float *>(&straight), 1);
            p.R = straight.R * p.A, p.G = straight.G * p.A, p.B = straight.B * p.A;
        }
    }
    void Convert(float *rgba, int n) const {
        if (proc)
            proc->Apply(rgba, n);
        else if (toLinear)
            GamutRowToLinear(curve, rgba, n);
        else
            GamutRowFromLinear(curve, rgba, n);
    }
};

} // namespace gamutinputs

OvID GamutInputs::SpaceID(GamutSpace space) {
    for (const auto &c : gamutinputs::kChoices)
        if (c.space == space) return OvID(c.id);
    return OvID(gamutinputs::kChoices[0].id);
}

GamutSpace GamutInputs::SpaceOf(OvID id) {
    for (const auto &c : gamutinputs::kChoices)
        if (id == OvID(c.id)) return c.space;
    return GamutSpace::NoChange;
}

GamutInputs::GamutInputs(Operator *tool, Direction direction) : tool_(tool), direction_(direction) {
    if (!tool_) return;
    const int page = tool_->Pages().empty() ? tool_->AddControlPageTagList("Gamut", {})
                                            : static_cast<int>(tool_->Pages().size()) - 1;
    const bool toLinear = direction_ == ToLinear;
    TagList spaceTags{{LinkDataType, CLSID_DataType_OvID},
                      {InputControl, CLSID_InputControl_ComboID},
                      {ControlPage, page},
                      {InputDefaultId, SpaceID(GamutSpace::NoChange)},
                      {InputNotify, 1}};
    for (const auto &c : gamutinputs::kChoices) {
        spaceTags.Add({ListAddItem, c.label});
        spaceTags.Add({ListItemId, OvID(c.id)});
    }
    space_ = tool_->AddInputTagList(toLinear ? "Source Space" : "Output Space", "GamutSpace", spaceTags);
    auto number = [&](const char *name, const char *id, double def, double lo, double hi, double sliderLo,
                      double sliderHi) {
        return tool_->AddInputTagList(name, id,
                                      {{LinkDataType, CLSID_DataType_Number},
                                       {InputControl, CLSID_InputControl_Slider},
                                       {ControlPage, page},
                                       {InputDefault, def},
                                       {InputMinAllowed, lo},
                                       {InputMaxAllowed, hi},
                                       {InputSliderLow, sliderLo},
                                       {InputSliderHigh, sliderHi}});
    };
    gamma_ = number("Gamma", "GamutGamma", 2.2, 0.01, 10.0, 0.2, 4.0);
    logBlack_ = number("Black Level", "GamutLogBlack", 95.0, 0.0, 1023.0, 0.0, 1023.0);
    logWhite_ = number("White Level", "GamutLogWhite", 685.0, 0.0, 1023.0, 0.0, 1023.0);
    logFilmGamma_ = number("Film Gamma", "GamutLogFilmGamma", 0.6, 0.01, 4.0, 0.1, 2.0);
    logSoftClip_ = number("Soft Clip", "GamutLogSoftClip", 0.0, 0.0, 1023.0, 0.0, 100.0);
    auto checkbox = [&](const char *name, const char *id, double def) {
        return tool_->AddInputTagList(name, id,
                                      {{LinkDataType, CLSID_DataType_Number},
                                       {InputControl, CLSID_InputControl_Checkbox},
                                       {ControlPage, page},
                                       {InputDefault, def}});
    };
    enable_ =
        toLinear ? checkbox("Remove Gamma", "GamutRemoveGamma", 1.0) : checkbox("Add Gamma", "GamutAddGamma", 1.0);
    preDivide_ = checkbox("Pre-Divide/Post-Multiply", "GamutPreDivide", 0.0);
    colorSpace_ = tool_->AddInputTagList("Color Space", "GamutColorSpace",
                                         {{LinkDataType, CLSID_DataType_Text},
                                          {InputControl, CLSID_InputControl_TextEdit},
                                          {ControlPage, page},
                                          {InputDefaultText, "sRGB"}});
    ShowFor(GamutSpace::NoChange);
}

void GamutInputs::ShowFor(GamutSpace space) {
    auto show = [](Input *in, bool on) {
        if (in) in->SetAttrsTagList({{ControlVisible, on ? 1 : 0}});
    };
    const bool log = space == GamutSpace::CineonLog;
    const bool curve = space != GamutSpace::NoChange && space != GamutSpace::Linear;
    show(gamma_, space == GamutSpace::Gamma);
    show(colorSpace_, space == GamutSpace::ConfigSpace);
    for (Input *in : {logBlack_, logWhite_, logFilmGamma_, logSoftClip_}) show(in, log);
    show(enable_, curve);
    show(preDivide_, curve);
}

void GamutInputs::NotifyChanged(Input *in, Parameter *param, double) {
    if (!in || in != space_) return;
    const auto *id = dynamic_cast<const IDValue *>(param);
    if (!id) return;
    ShowFor(SpaceOf(id->value));
}

GamutCurve GamutInputs::CurveOf(const Request *req) const {
    GamutCurve c;
    auto number = [req](const Input *in, double def) { return req ? req->GetInputNumber(in, def) : def; };
    c.space = SpaceOf(req ? req->GetInputID(space_, SpaceID(GamutSpace::NoChange)) : SpaceID(GamutSpace::NoChange));
    c.gamma = number(gamma_, 2.2);
    c.log.black = number(logBlack_, 95.0);
    c.log.white = number(logWhite_, 685.0);
    c.log.filmGamma = number(logFilmGamma_, 0.6);
    c.log.softClip = number(logSoftClip_, 0.0);
    return c;
}

ColorProcessorPtr GamutInputs::ConfigProcessor(const Request *req, std::string *error) {
    const auto *text = req ? dynamic_cast<const Text *>(req->GetInputData(colorSpace_)) : nullptr;
    const std::string space = text ? text->value : "sRGB";
    const std::string from = direction_ == ToLinear ? space : "scene_linear";
    const std::string to = direction_ == ToLinear ? "scene_linear" : space;
    const std::string configPath = ColorConfig::PathFor(tool_->GetDoc());
    return kept_.Get(
        configPath + '\n' + from + '\n' + to,
        [&](std::string *err) -> ColorProcessorPtr {
            const auto config = ColorConfig::Load(configPath, err);
            return config ? config->SpaceProcessor(from, to, err) : nullptr;
        },
        error);
}

Ref<Image> GamutInputs::ProcessOf(Request *req, Image *in, Image *out, OvID clippingMode, bool convert,
                                  std::string *error) {
    if (!in) return nullptr;
    const GamutCurve curve = CurveOf(req);
    const bool enabled = !req || req->GetInputNumber(enable_, 1.0) >= 0.5;
    if (!convert || !enabled || curve.IsIdentity() || in->IsMask()) return Ref<Image>(in);
    ColorProcessorPtr proc;
    if (curve.space == GamutSpace::ConfigSpace) {
        std::string why;
        proc = ConfigProcessor(req, &why);
        if (!proc) {
            if (error) *error = why;
            return nullptr;
        }
        if (proc->IsNoOp()) return Ref<Image>(in);
    }
    const gamutinputs::Converter conv{curve, direction_ == ToLinear, req && req->GetInputNumber(preDivide_) >= 0.5,
                                      proc.get()};
    const bool frameOnly = clippingMode == ClippingMode_Frame;

    // The canvas: converted when nothing clips, the input's otherwise.
    FltPixel canvas = in->GetCanvasColor();
    if (clippingMode == ClippingMode_None || clippingMode.IsNull()) conv.Run(&canvas, 1);

    Ref<Image> dst;
    if (out == in && !in->IsReadOnly())
        dst = Ref<Image>(in);
    else if (out && out != in)
        dst = Ref<Image>(out);
    else {
        const ImgRectI dw = frameOnly ? in->DataWindow() & in->Frame() : in->DataWindow();
        const ImgRectI vw = in->ValidWindow() & dw;
        const bool noData = (req && req->IsPreCalc()) || in->IsNoData();
        dst = NewImageTagList({{ImgLikeImage, in},
                               {ImgDataWindow, &dw},
                               {ImgValidWindow, &vw},
                               {ImgNoData, noData},
                               {ImgCanvasColor, &canvas}});
        if (!dst) return nullptr;
        dst->Metadata() = in->Metadata();
        dst->SetIsOpaque(in->IsOpaque());
    }
    dst->SetCanvasColor(canvas);
    if (dst->IsNoData() || dst->DataWindow().IsNull()) return dst;
    if (!dst->AllocScanLineData()) return nullptr;

    const ImgRectI dw = dst->DataWindow();
    const ImgRectI area = frameOnly ? dw & in->Frame() : dw;
    const bool inPlace = dst.Get() == in;
    const RenderTask *task = req ? req->GetTask() : nullptr;
    std::atomic<bool> stopped{false};
    Image *target = dst.Get();
    ParallelRange(
        dw.y0, dw.y1,
        [&](int y0, int y1) {
            std::vector<FltPixel> span(dw.Width());
            for (int y = y0; y < y1; ++y) {
                if (in->CheckAbort() || target->CheckAbort() || (task && task->IsAborted())) {
                    stopped.store(true, std::memory_order_relaxed);
                    return;
                }
                const bool rowInArea = y >= area.y0 && y < area.y1;
                if (inPlace) {
                    if (!rowInArea) continue;
                    uint8_t *row = target->PixelAddress(area.x0, y);
                    const int bpp = target->BytesPerPixel();
                    for (int x = 0; x < area.Width(); x += gamutinputs::kBlock) {
                        const int n = std::min(gamutinputs::kBlock, area.Width() - x);
                        uint8_t *at = row + static_cast<size_t>(x) * bpp;
                        LoadFlt(target->Depth(), at, n, span.data());
                        conv.Run(span.data(), n);
                        StoreFlt(target->Depth(), span.data(), n, at);
                    }
                    continue;
                }
                ReadSpanFlt(*in, y, dw.x0, dw.x1, span.data());
                if (rowInArea) conv.Run(span.data() + (area.x0 - dw.x0), area.Width());
                StoreFlt(target->Depth(), span.data(), dw.Width(), target->ScanLine(y));
            }
        },
        4);
    if (stopped.load()) return nullptr;
    return dst;
}

} // namespace Orvane
