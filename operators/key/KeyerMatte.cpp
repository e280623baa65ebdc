#include "operators/key/KeyerMatte.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/matte/MaskInputs.h"
#include "host/matte/MatteSteps.h"
#include "operators/filter/BlurControls.h"

namespace Orvane {
namespace {

/// Control values are lengths on a 720-wide frame.
constexpr double kSizeUnit = 720.0;
/// The fringe's work matte is blurred with this many passes.
constexpr int kFringePasses = 2;
/// The Gaussian kinds blur the matte with this many passes.
constexpr int kGaussianPasses = 4;

TagList Slider(double def, int steps) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Slider},
            {InputDefault, def},
            {SliderSteps, steps}};
}

TagList Checkbox() {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Checkbox},
            {InputDefault, 0.0},
            {InputMinAllowed, 0.0},
            {InputMaxAllowed, 1.0}};
}

/// The single-channel depth holding what one channel of `depth` holds.
int MatteDepthOf(int depth) { return depth >= DepthRGBAInt8 ? depth - (DepthRGBAInt8 - DepthAInt8) : depth; }

bool Neutral(double v, double neutral) { return std::fabs(v - neutral) <= kKeyerNoChange; }

} // namespace

KeyerMatte::KeyerMatte(Operator &op, Flavour flavour) : op_(op), flavour_(flavour) {}
KeyerMatte::~KeyerMatte() = default;

void KeyerMatte::AddImageInputs(bool spillColor) {
    if (spillColor)
        spillColor_ = op_.AddInputTagList("Spill Color", "SpillColor",
                                          {{LinkDataType, CLSID_DataType_Number},
                                           {InputControl, CLSID_InputControl_MultiButton},
                                           {InputDefault, 1.0},
                                           {ButtonsFillRow, 1},
                                           {ListAddItem, "Red"},
                                           {ListAddItem, "Green"},
                                           {ListAddItem, "Blue"}});
    TagList spill = Slider(1.0, 101);
    spill.Add({InputMinAllowed, 0.0}), spill.Add({InputMaxAllowed, 1.0});
    spill_ = op_.AddInputTagList("Spill Suppression", "SpillSuppression", spill);
    spillMethod_ = op_.AddInputTagList("Spill Method", "SpillMethod",
                                       {{LinkDataType, CLSID_DataType_Number},
                                        {InputControl, CLSID_InputControl_MultiButton},
                                        {InputDefault, 2.0},
                                        {ButtonsFillRow, 1},
                                        {ListAddItem, "None"},
                                        {ListAddItem, "Rare"},
                                        {ListAddItem, "Medium"},
                                        {ListAddItem, "Well Done"},
                                        {ListAddItem, "Burnt"}});
    TagList gamma = Slider(1.0, 101);
    gamma.Add({InputMinAllowed, 0.01}), gamma.Add({InputSliderLow, 0.01}), gamma.Add({InputSliderHigh, 9.0});
    gamma.Add({SliderRest, 1.0});
    fringeGamma_ = op_.AddInputTagList("Fringe Gamma", "FringeGamma", gamma);
    TagList size = Slider(0.0, 51);
    size.Add({InputMinAllowed, 0.0}), size.Add({InputMaxAllowed, 50.0}), size.Add({InputSliderLow, 0.0});
    size.Add({InputSliderHigh, 10.0});
    fringeSize_ = op_.AddInputTagList("Fringe Size", "FringeSize", size);
    TagList shape = Slider(1.0, 101);
    shape.Add({InputMinAllowed, 0.5}), shape.Add({InputSliderLow, 0.5}), shape.Add({InputSliderHigh, 1.5});
    shape.Add({SliderRest, 1.0});
    fringeShape_ = op_.AddInputTagList("Fringe Shape", "FringeShape", shape);
    static const char *const labels[3] = {"Red/Cyan", "Green/Magenta", "Blue/Yellow"};
    static const char *const ids[3] = {"RedCyan", "GreenMagenta", "BlueYellow"};
    for (int c = 0; c < 3; ++c) {
        TagList shift = Slider(0.0, 101);
        shift.Add({InputMinAllowed, -1.0}), shift.Add({InputMaxAllowed, 1.0}), shift.Add({InputSliderLow, -0.5});
        shift.Add({InputSliderHigh, 0.5}), shift.Add({SliderRest, 0.0});
        shift_[c] = op_.AddInputTagList(labels[c], ids[c], shift);
    }
}

void KeyerMatte::AddMatteInputs() {
    const bool screen = flavour_ == Flavour::Screen;
    filter_ = op_.AddInputTagList("Filter", "Filter", BlurFilterTags());
    TagList blur = Slider(0.0, 51);
    blur.Add({InputMinAllowed, 0.0}), blur.Add({InputSliderLow, 0.0}), blur.Add({InputSliderHigh, 10.0});
    blur_ = op_.AddInputTagList("Blur", "MatteBlur", blur);
    passes_ = op_.AddInputTagList("Num Passes", "Passes", BlurPassesTags());
    clipping_ = op_.AddInputTagList("Clipping Mode", "ClippingMode", ClippingModeTags(ClippingMode_Frame));
    TagList contrast = Slider(0.0, 101);
    contrast.Add({InputSliderLow, -1.0}), contrast.Add({InputSliderHigh, 1.0}), contrast.Add({SliderRest, 0.0});
    if (!screen) contrast.Add({InputMinAllowed, -1.0}), contrast.Add({InputMaxAllowed, 1.0});
    contrast_ = screen ? op_.AddInputTagList("Contract / Expand", "MatteContractExpand", contrast)
                       : op_.AddInputTagList("Contrast", "MatteContrast", contrast);
    TagList gamma = Slider(1.0, 101);
    gamma.Add({InputSliderLow, 0.0}), gamma.Add({InputSliderHigh, 3.0}), gamma.Add({SliderRest, 1.0});
    if (!screen) gamma.Add({InputMinAllowed, 1e-6});
    gamma_ = op_.AddInputTagList("Gamma", "MatteGamma", gamma);
    if (screen) {
        auto threshold = [](double def, int member) {
            TagList t{{LinkDataType, CLSID_DataType_Number},
                      {InputControl, CLSID_InputControl_Range},
                      {ControlGroup, 5},
                      {ControlMember, member},
                      {InputDefault, def},
                      {InputMinAllowed, 0.0},
                      {InputMaxAllowed, 1.0}};
            if (member == 0) t.Add({ControlRowLabel, "Threshold"});
            return t;
        };
        low_ = op_.AddInputTagList("Low", "LowMatteThreshold", threshold(0.0, 0));
        high_ = op_.AddInputTagList("High", "High", threshold(1.0, 1));
        TagList restore = Slider(0.0, 101);
        restore.Add({InputMinAllowed, 0.0}), restore.Add({InputMaxAllowed, 1.0}), restore.Add({InputSliderLow, 0.0});
        restore.Add({InputSliderHigh, 0.02});
        restoreFringe_ = op_.AddInputTagList("Restore Fringe", "RestoreFringe", restore);
    }
    invert_ = screen ? op_.AddInputTagList("Invert Matte", "InvertMatte", Checkbox())
                     : op_.AddInputTagList("Invert", "Invert", Checkbox());
    solid_ = std::make_unique<MaskInputs>(op_, "Solid", "Solid Matte");
    garbage_ = std::make_unique<MaskInputs>(op_, "Garbage", "Garbage Matte");
    postMultiply_ = op_.AddInputTagList("Post Multiply Image", "PostMultiplyImage", Checkbox());
}

void KeyerMatte::NotifyChanged(Input *in, Parameter *param) {
    if (in != filter_ || !param) return;
    if (const auto *id = dynamic_cast<const IDValue *>(param))
        passes_->SetAttrsTagList({{ControlVisible, id->value == OvID("Multi-box")}});
}

KeyerMatte::Values KeyerMatte::Read(Request *req) const {
    Values v;
    auto num = [req](Input *in, double def) { return in ? req->GetInputNumber(in, def) : def; };
    if (filter_) v.filter = BlurTypeOfFilter(req->GetInputID(filter_, OvID("Fast Gaussian")));
    v.blur = num(blur_, 0.0);
    v.passes = static_cast<int>(std::floor(num(passes_, 4.0) + 0.5));
    v.contrast = num(contrast_, 0.0);
    v.gamma = num(gamma_, 1.0);
    v.low = num(low_, 0.0);
    v.high = num(high_, 1.0);
    v.invert = num(invert_, 0.0) >= 0.5;
    v.postMultiply = num(postMultiply_, 0.0) >= 0.5;
    if (spillColor_) v.keyChannel = 2 - std::clamp(static_cast<int>(num(spillColor_, 1.0) + 0.5), 0, 2);
    v.spill = num(spill_, 0.0);
    v.spillMethod = std::clamp(static_cast<int>(num(spillMethod_, 0.0) + 0.5) - 1, 0, static_cast<int>(SpillBurnt));
    v.fringeGamma = num(fringeGamma_, 1.0);
    v.fringeSize = num(fringeSize_, 0.0);
    v.fringeShape = num(fringeShape_, 1.0);
    v.redCyan = num(shift_[0], 0.0), v.greenMagenta = num(shift_[1], 0.0), v.blueYellow = num(shift_[2], 0.0);
    return v;
}

Image *KeyerMatte::SolidMask(Request *req, bool *inverted) const {
    return solid_ ? solid_->GetMask(req, inverted) : nullptr;
}

Image *KeyerMatte::GarbageMask(Request *req, bool *inverted) const {
    return garbage_ ? garbage_->GetMask(req, inverted) : nullptr;
}

void KeyerMatte::Reach(const Values &v, const ImageDomain *domain, double extraSize, int &rx, int &ry) {
    double totalX = 0.0, totalY = 0.0;
    auto add = [&](double size, int type, int passes) {
        if (size <= kKeyerNoChange) return;
        double x = size / kSizeUnit, y = x;
        if (!Image::GetBlurSupport(type, domain, x, y, passes)) return;
        totalX += x, totalY += y;
    };
    const bool gaussian = v.filter == BlurGaussian || v.filter == BlurFastGaussian;
    add(v.blur, gaussian ? v.filter : BlurMultiBox, gaussian ? kGaussianPasses : MultiBoxPasses(v));
    add(v.fringeSize, BlurGaussian, kFringePasses);
    add(extraSize, BlurGaussian, kGaussianPasses);
    rx = static_cast<int>(std::ceil(totalX));
    ry = static_cast<int>(std::ceil(totalY));
}

int KeyerMatte::MultiBoxPasses(const Values &v) {
    if (v.filter == BlurBox) return 1;
    if (v.filter == BlurBartlett) return 2;
    return v.passes;
}

void KeyerMatte::CheckRequest(Request *req, Input *image, double extraSize) const {
    if (req->GetPri() != image->Priority() || (req->GetFlags() & ReqFlagSkipRoI)) return;
    const AutoImageDoD inDoD(req, image), outDoD(req);
    if (!inDoD || !outDoD) return;
    Values v;
    auto num = [req](Input *in, double def) { return in ? AskInputNumber(req, in, def) : def; };
    auto id = [req](Input *in, OvID def) { return in ? AskInputID(req, in, def) : def; };
    v.filter = BlurTypeOfFilter(id(filter_, OvID("Fast Gaussian")));
    v.blur = num(blur_, 0.0);
    v.passes = static_cast<int>(std::floor(num(passes_, 4.0) + 0.5));
    v.fringeSize = num(fringeSize_, 0.0);
    int rx = 0, ry = 0;
    Reach(v, inDoD.Get(), extraSize, rx, ry);
    if (rx == 0 && ry == 0) return;
    const AutoImageRoI roi(req);
    ImageDomain region = (roi ? *roi.Get() : *outDoD.Get())
                             .WithRect(GrownKeepingEndless((roi ? *roi.Get() : *outDoD.Get()).rect, rx, ry));
    const OvID mode = id(clipping_, ClippingMode_Frame);
    if (mode == ClippingMode_Domain)
        region.ClipTo(inDoD->rect);
    else if (mode == ClippingMode_Frame && inDoD->HasFrame())
        region.ClipTo(inDoD->frame);
    req->SetInputRoI(image, &region);
}

Ref<Image> KeyerMatte::NewMatteImage(Request *req, const Input *in, const Image *src, const Values &v,
                                     double extraSize) const {
    const OvID mode = op_.GetClippingMode(req);
    const AutoImageRoI roi(req);
    const AutoImageDoD dod(req, in);
    const ImgRectI domain = dod ? dod->rect : src->DataWindow();
    int rx = 0, ry = 0;
    const ImageDomain frameOf = DomainOfImage(*src, src->DataWindow());
    Reach(v, &frameOf, extraSize, rx, ry);
    ImgRectI window;
    if (mode == ClippingMode_Frame)
        window = src->Frame();
    else if (mode == ClippingMode_Domain)
        window = domain;
    else
        window = (domain & src->DataWindow()).Grown(rx, ry);
    if (roi) window &= roi->rect.Grown(rx, ry);
    const ImgRectI valid = roi ? roi->rect & window : window;
    return NewImageTagList({{ImgLikeImage, src},
                            {ImgDataWindow, &window},
                            {ImgValidWindow, &valid},
                            {ImgNoData, req->IsPreCalc()},
                            {ImgForRequest, 1},
                            {ImgTakeWindows, 1}});
}

bool KeyerMatte::BlurMatte(Request *req, Image *img, const Values &v) {
    if (v.blur <= kKeyerNoChange) return true;
    if (v.filter == BlurGaussian || v.filter == BlurFastGaussian)
        return MatteCore_DoSoftenChannel(req, img, MatteAlpha, v.blur, kGaussianPasses, v.filter);
    return MatteCore_DoMultiBox(req, img, MatteAlpha, v.blur, MultiBoxPasses(v));
}

bool KeyerMatte::LevelsOn(Request *req, Image *img, int channel, double low, double high, double contrast,
                          double gamma) {
    if (Neutral(contrast, 0.0) && Neutral(gamma, 1.0) && low <= kKeyerNoChange && high >= 1.0 - kKeyerNoChange)
        return true;
    const TagList tags{{MatteLevelsChannel, channel},
                       {MatteLevelsLow, low},
                       {MatteLevelsHigh, high},
                       {MatteLevelsContrast, contrast},
                       {MatteLevelsGamma, std::max(gamma, 1e-5)}};
    return img->IsFloat() ? DoLevelsFlt(req, img, tags) : DoLevels(req, img, tags);
}

bool KeyerMatte::Levels(Request *req, Image *img, const Values &v) {
    return LevelsOn(req, img, MatteAlpha, v.low, v.high, v.contrast, v.gamma);
}

bool KeyerMatte::Spill(Request *req, Image *img, const Values &v) {
    if (v.spill <= kKeyerNoChange) return true;
    ChromaValues chroma;
    chroma.keyChannel = v.keyChannel;
    chroma.amount = v.spill;
    chroma.method = v.spillMethod;
    return MatteCore_DoSpill(req, img, chroma);
}

bool KeyerMatte::Fringe(Request *req, Image *img, const Values &v) {
    const double rc = v.redCyan * 0.5, gm = v.greenMagenta * 0.5, by = v.blueYellow * 0.5;
    if (Neutral(v.fringeShape, 1.0) && Neutral(rc, 0.0) && Neutral(gm, 0.0) && Neutral(by, 0.0)) return true;
    const ImgRectI window = img->DataWindow();
    Ref<Image> edge = NewImageTagList({{ImgLikeImage, img},
                                       {ImgDepth, MatteDepthOf(img->Depth())},
                                       {ImgDataWindow, &window},
                                       {ImgAbortFlag, img->AbortFlag()}});
    if (!edge || !MatteCore_DoCopyChannel(req, img, edge.Get(), MatteAlpha, MatteAlpha)) return false;
    if (v.fringeSize > kKeyerNoChange &&
        !MatteCore_DoSoftenChannel(req, edge.Get(), MatteAlpha, v.fringeSize, kFringePasses, BlurGaussian))
        return false;
    if (!LevelsOn(req, edge.Get(), MatteAlpha, 0.0, 1.0, 0.0, v.fringeGamma)) return false;
    const double shape = std::max(v.fringeShape, 1e-5);
    return img->IsFloat() ? MatteCore_DoFringeFlt(req, img, edge.Get(), shape, rc, gm, by)
                          : MatteCore_DoFringe(req, img, edge.Get(), shape, rc, gm, by);
}

bool KeyerMatte::Invert(Request *req, Image *img, const Values &v) {
    return !v.invert || MatteCore_DoInvert(req, img, MatteAlpha);
}

Ref<Image> KeyerMatte::ApplyMasks(Request *req, Image *img) const {
    Ref<Image> out(img);
    bool inverted = false;
    if (const Image *solid = SolidMask(req, &inverted)) {
        out = DoGarbageMatte(req, out.Get(), solid, GarbageMatteSolid, false, inverted);
        if (!out) return out;
    }
    if (const Image *garbage = GarbageMask(req, &inverted))
        out = DoGarbageMatte(req, out.Get(), garbage, GarbageMatteGarbage, false, inverted);
    return out;
}

bool KeyerMatte::PostMultiply(Request *req, Image *img, const Values &v) {
    return !v.postMultiply || MatteCore_DoPostMultiply(req, img);
}

Ref<Image> KeyerMatte::Refine(Request *req, Image *img, const Image *src, const Values &v) const {
    Ref<Image> out(img);
    if (!img->IsNoData() && !img->DataWindow().IsNull()) {
        if (!BlurMatte(req, img, v) || !Levels(req, img, v) || !Spill(req, img, v) || !Fringe(req, img, v) ||
            !Invert(req, img, v))
            return {};
        out = ApplyMasks(req, img);
        if (!out || !PostMultiply(req, out.Get(), v)) return {};
    }
    out->CopyCanvasColor(src);
    return out;
}

} // namespace Orvane
