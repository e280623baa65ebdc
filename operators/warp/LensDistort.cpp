#include "operators/warp/LensDistort.h"

#include <algorithm>
#include <cmath>
#include <exception>

#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/FilmGates.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/EdgeSampler.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"
#include "operators/warp/LensDistortDevice.h"
#include "operators/warp/LensFiles.h"
#include "operators/warp/SizingCommon.h"
#include "operators/warp/ldpk/LdpkTypes.h"

namespace Orvane {

static const OvID CLSID_LensDistort("LensDistort");
static ClassRegistration<LensDistort, ThreadedOperator> s_Registration(CLSID_LensDistort, &CLSID_ThreadedOperator,
                                                                       {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                        {RegClassName, "LensDistort"},
                                                                        {RegPath, "Tools/Warp/LensDistort"},
                                                                        {RegName, "Lens Distort"},
                                                                        {RegCategory, "Warp"},
                                                                        {RegAbbreviation, "Lens"},
                                                                        {RegHelp, "Applies or remove lens distortion"},
                                                                        {RegIcon, "Icons.Tools.Icons.LensDistort"},
                                                                        {RegNoEffectMask, 1},
                                                                        {RegNoObjectMaterialControls, 1},
                                                                        {RegNoMotionBlurControls, 1},
                                                                        {RegSupportsRoI, 1},
                                                                        {RegSupportsDoD, 1},
                                                                        {RegSupportsGPUImages, 1}});

namespace {

constexpr IdChoice kClipping[] = {
    {"None", "ClippingMode_None"}, {"Domain", "ClippingMode_Domain"}, {"Frame", "ClippingMode_Frame"}};
constexpr int kSamplesPerAxis[] = {1, 2, 4, 8};
constexpr int kClipNone = 0, kClipDomain = 1, kClipFrame = 2;
/// Pixels the bilinear read reaches beyond a position's pixel.
constexpr int kBilinearReach = 1;
/// The longest walk between two boundary points (a bound against endless windows).
constexpr int kMostWalkSteps = 1 << 16;

Input *AddSlider(Operator *op, const char *name, const char *id, double low, double high, double def,
                 const TagList &extra = {}) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_Slider},
                 {InputSliderLow, low},
                 {InputSliderHigh, high},
                 {InputDefault, def}};
    tags.Merge(extra);
    return op->AddInputTagList(name, id, tags);
}

Input *AddMultiButton(Operator *op, const char *name, const char *id, std::initializer_list<const char *> labels,
                      double def, const TagList &extra = {}) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_MultiButton},
                 {InputInteger, 1},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, static_cast<double>(labels.size() - 1)},
                 {InputDefault, def}};
    for (const char *label : labels) tags.Add({ListAddItem, label});
    tags.Merge(extra);
    return op->AddInputTagList(name, id, tags);
}

struct Pos {
    double x, y;
};

OvID ModelAt(const Input *in, double time) {
    Ref<Parameter> v = in->ValueAt(time == TimeUndefined ? 0.0 : time);
    const auto *id = dynamic_cast<const IDValue *>(v.Get());
    return id ? id->value : OvID();
}

} // namespace

LensDistort::LensDistort(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), models_(lensdistort::MakeModels()) {
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    mode_ = AddMultiButton(this, "Mode", "Mode", {"Distort", "Undistort"}, 1.0, {{ButtonsFillRow, 1}});
    edgeMode_ = AddMultiButton(this, "Edges", "EdgeMode", {"Canvas", "Duplicate"}, 0.0, {{ButtonsFillRow, 1}});
    clipping_ = AddInputTagList("Clipping Mode", "ClippingMode",
                                WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                               {InputControl, CLSID_InputControl_MultiButtonID},
                                               {InputDefaultId, ClippingMode_Domain}},
                                              kClipping));
    distortionMap_ = AddCheckbox(this, "Output Distortion Map", "OutputDistortionMap", 0.0, {{InputNotify, 1}});

    BeginControlNestTagList("Lens Distortion Model", "LensDistortionModel", true, {});
    TagList modelTags{{LinkDataType, CLSID_DataType_OvID},
                      {InputControl, CLSID_InputControl_ComboID},
                      {InputDefaultId, models_.front()->ID()},
                      {InputNotify, 1}};
    for (const auto &m : models_) {
        modelTags.Add({ListAddItem, m->Name().c_str()});
        modelTags.Add({ListItemId, m->ID()});
    }
    model_ = AddInputTagList("Model", "Model", modelTags);
    for (const auto &m : models_) {
        SetCurrentGroup(m->ID().Text());
        std::vector<Input *> inputs;
        for (const lensdistort::ModelParameter &p : m->Parameters()) {
            switch (p.type) {
            case ldpk::parameter_type::integer:
                inputs.push_back(AddSlider(this, p.name.c_str(), p.id.c_str(), 0.0, 10.0, p.def, {{InputInteger, 1}}));
                break;
            case ldpk::parameter_type::boolean:
                inputs.push_back(AddCheckbox(this, p.name.c_str(), p.id.c_str(), p.def));
                break;
            default: inputs.push_back(AddSlider(this, p.name.c_str(), p.id.c_str(), p.low, p.high, p.def)); break;
            }
            inputs.back()->SetAttrsTagList({{ControlVisible, m == models_.front()}});
        }
        modelInputs_.push_back(std::move(inputs));
    }
    SetCurrentGroup("");
    EndControlNest();

    BeginControlNestTagList("Camera Settings", "CameraSettings", false, {});
    useSourceAspect_ = AddCheckbox(this, "Use Source Pixel Aspect", "UseSourcePixelAspect", 1.0, {{InputNotify, 1}});
    pixelAspect_ = AddInputTagList("Pixel Aspect", "PixelAspect",
                                   {{LinkDataType, CLSID_DataType_Point},
                                    {InputControl, CLSID_InputControl_Offset},
                                    {InputDefaultX, ff.aspectX},
                                    {InputDefaultY, ff.aspectY},
                                    {ControlDecimals, 6},
                                    {InputDelayDefault, 1},
                                    {ControlVisible, 0}});
    focalLength_ = AddSlider(this, "Focal Length (mm)", "FocalLength", 2.5, 3500.0, 35.0,
                             {{InputMinAllowed, 0.01}, {SliderRest, 45.0}});
    TagList gateTags{{LinkDataType, CLSID_DataType_OvID},
                     {InputControl, CLSID_InputControl_ComboID},
                     {InputDefaultId, FilmGateID[kDefaultFilmGate]},
                     {InputNotify, 1}};
    for (size_t i = 0; i < kFilmGateCount; ++i) {
        gateTags.Add({ListAddItem, FilmGateName[i]});
        gateTags.Add({ListItemId, FilmGateID[i]});
    }
    filmGate_ = AddInputTagList("Film Gate", "FilmGate", gateTags);
    const double gateW = ApertureTable[2 * kDefaultFilmGate], gateH = ApertureTable[2 * kDefaultFilmGate + 1];
    // Typed for the user gate only (shown then); the default gate is a standard one.
    apertureW_ = AddSlider(this, "Aperture Width (in)", "ApertureWidth", 0.1, 3.0, gateW,
                           {{InputMinAllowed, 0.1}, {InputMaxAllowed, 3.0}, {ControlVisible, 0}});
    apertureH_ = AddSlider(this, "Aperture Height (in)", "ApertureHeight", 0.1, 3.0, gateH,
                           {{InputMinAllowed, 0.1}, {InputMaxAllowed, 3.0}, {ControlVisible, 0}});
    TagList fitTags{{LinkDataType, CLSID_DataType_OvID},
                    {InputControl, CLSID_InputControl_MultiButtonID},
                    {InputDefaultId, FMID_Inside}};
    static const char *const fitLabels[kFitMethodCount] = {"Inside", "Width", "Height", "Outside", "Stretch"};
    for (size_t i = 0; i < kFitMethodCount; ++i) {
        fitTags.Add({ListAddItem, fitLabels[i]});
        fitTags.Add({ListItemId, FitMethodID[i]});
    }
    fit_ = AddInputTagList("Resolution Gate Fit", "ResolutionGateFit", fitTags);
    shiftX_ = AddSlider(this, "Lens Shift X (apertures)", "LensShiftX", -0.2, 0.2, 0.0);
    shiftY_ = AddSlider(this, "Lens Shift Y (apertures)", "LensShiftY", -0.2, 0.2, 0.0);
    focusDistance_ = AddSlider(this, "Focus Distance (cm)", "FocalDist", 2.5, 3500.0, 100.0,
                               {{InputMinAllowed, 0.01}, {SliderRest, 100.0}});
    EndControlNest();

    BeginControlNestTagList("Sampling Options", "SamplingOptions", false, {});
    supersampling_ = AddMultiButton(this, "Supersampling [HiQ]", "Supersampling", {"1x1", "2x2", "4x4", "8x8"}, 0.0);
    subsampleMode_ = AddMultiButton(this, "Subsample Mode [HiQ]", "SubsampleMode", {"Nearest", "Bilinear"}, 1.0);
    EndControlNest();

    load_ = AddButton(this, "Load Distortion Data", "Load");
    input_ = AddSourceImageInput(this);
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

LensDistort::~LensDistort() = default;

lensdistort::Model *LensDistort::ChosenModel(OvID id) const {
    for (const auto &m : models_)
        if (m->ID() == id) return m.get();
    return models_.front().get();
}

void LensDistort::ShowModelInputs(OvID chosen) {
    const lensdistort::Model *model = ChosenModel(chosen);
    for (size_t i = 0; i < models_.size(); ++i)
        for (Input *in : modelInputs_[i]) ShowInput(in, models_[i].get() == model);
    const bool camera = model->HasCameraParameters();
    for (Input *in : {useSourceAspect_, focalLength_, filmGate_, fit_, shiftX_, shiftY_, focusDistance_})
        ShowInput(in, camera);
    // The aperture is typed only for the user gate; a standard gate brings its own.
    const Ref<Parameter> gate = filmGate_->ValueAt(0.0);
    const auto *gateId = dynamic_cast<const IDValue *>(gate.Get());
    for (Input *in : {apertureW_, apertureH_}) ShowInput(in, camera && gateId && gateId->value == FilmGate_User);
    ShowInput(pixelAspect_, camera && ControlNumber(useSourceAspect_, TimeUndefined, 1.0) < 0.5);
}

void LensDistort::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == model_) {
        if (const auto *id = dynamic_cast<const IDValue *>(param)) ShowModelInputs(id->value);
    } else if (const auto *n = dynamic_cast<const Number *>(param)) {
        if (in == useSourceAspect_) {
            ShowModelInputs(ModelAt(model_, time));
        } else if (in == distortionMap_) {
            // The map is of positions: the edges and the sampler do not enter it.
            ShowInput(edgeMode_, n->value < 0.5);
            ShowInput(subsampleMode_, n->value < 0.5);
        } else if (in == load_ && GetDoc()) {
            GetDoc()->PrintF(
                ConsoleError,
                "%s: this program has no file dialog; load a lens file with orvane set FLOW %s.Load=FILE\n",
                Name().c_str(), Name().c_str());
        }
    } else if (in == filmGate_) {
        ShowModelInputs(ModelAt(model_, time));
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

// ---- lens files ------------------------------------------------------------------------------------------

bool LensDistort::ControlCommand(int command, const TagList &tags) {
    if (command != CCMD_LoadFile) return false;
    const auto *in = tags.GetPtrAs<const Input>(CCMD_FileInput);
    if (in && in != load_) return false;
    const char *path = tags.GetPtrAs<const char>(CCMD_FileName);
    auto *error = tags.GetPtrAs<std::string>(CCMD_FileError);
    std::string message;
    const bool ok = path && LoadLensFile(path, tags.GetDouble(CCMD_FileTime, TimeUndefined), message);
    if (!ok) {
        if (!path) message = "no file named";
        // The caller that asks for the text reports it; otherwise the console has it.
        if (error)
            *error = message;
        else if (GetDoc())
            GetDoc()->PrintF(ConsoleError, "%s: %s\n", Name().c_str(), message.c_str());
    }
    return true;
}

bool LensDistort::LoadLensFile(const std::string &path, double time, std::string &error) {
    lensdistort::Model *model = ChosenModel(ModelAt(model_, time));
    const size_t index = static_cast<size_t>(
        std::find_if(models_.begin(), models_.end(), [&](const auto &m) { return m.get() == model; }) -
        models_.begin());
    lensdistort::LoadedLens lens;
    try {
        lens = model->Load(path);
    } catch (const lensfiles::UndefinedParameter &e) {
        error = "cannot load lens data \"" + path + "\": " + e.what() + " '" + e.name() + "' at line " +
                std::to_string(e.line());
        return false;
    } catch (const std::exception &e) {
        error = "cannot load lens data \"" + path + "\": " + e.what();
        return false;
    }
    const std::vector<Input *> &inputs = modelInputs_[index];
    if (lens.frames.size() > 1) {
        // A table per frame: keys at its frames, on every parameter.
        for (size_t p = 0; p < inputs.size(); ++p) {
            AnimCurve curve;
            for (size_t f = 0; f < lens.frames.size(); ++f)
                if (p < lens.frames[f].size())
                    curve.SetKey(lens.firstFrame + static_cast<double>(f), MakeRef<Number>(lens.frames[f][p]));
            inputs[p]->SetCurve(std::move(curve));
        }
    } else {
        for (const auto &[p, v] : lens.values)
            if (p >= 0 && static_cast<size_t>(p) < inputs.size()) WriteControl(this, inputs[p], v, time);
    }
    if (lens.focalLengthMm) WriteControl(this, focalLength_, *lens.focalLengthMm, time);
    const double apertureW = lens.apertureWidthIn.value_or(ControlNumber(apertureW_, time, 1.0));
    const double apertureH = lens.apertureHeightIn.value_or(ControlNumber(apertureH_, time, 1.0));
    if (lens.apertureWidthIn || lens.apertureHeightIn) {
        filmGate_->SetValue(MakeRef<IDValue>(FilmGate_User));
        WriteControl(this, apertureW_, apertureW, time);
        WriteControl(this, apertureH_, apertureH, time);
    }
    // The inverse of the offset the update makes: shift x aperture (inches).
    if (lens.lensOffsetXCm) WriteControl(this, shiftX_, *lens.lensOffsetXCm / apertureW, time);
    if (lens.lensOffsetYCm) WriteControl(this, shiftY_, *lens.lensOffsetYCm / apertureH, time);
    if (lens.pixelAspect) {
        WriteControl(this, useSourceAspect_, 0.0, time);
        WriteControlPoint(this, pixelAspect_, *lens.pixelAspect, 1.0, time);
    }
    if (lens.focusDistanceCm) WriteControl(this, focusDistance_, *lens.focusDistanceCm, time);
    ShowModelInputs(model->ID());
    return true;
}

// ---- setup and windows -----------------------------------------------------------------------------------

bool LensDistort::ReadSetup(Request *req, const Image *img, const ImageDomain *domain, Setup &s) {
    s.model = ChosenModel(req->GetInputID(model_));
    s.mode = req->GetInputNumber(mode_, 1.0) >= 0.5 ? 1 : 0;
    s.samples = kSamplesPerAxis[std::clamp(static_cast<int>(req->GetInputNumber(supersampling_, 0.0)), 0, 3)];
    s.bilinear = req->GetInputNumber(subsampleMode_, 1.0) >= 0.5;
    s.edge = req->GetInputNumber(edgeMode_, 0.0) >= 0.5 ? EdgeDuplicate : EdgeCanvas;
    if (DraftDropsFilter(req, true)) s.samples = 1, s.bilinear = true;
    const OvID clip = GetClippingMode(req);
    s.clipping = clip == ClippingMode_Frame ? kClipFrame : clip == ClippingMode_None ? kClipNone : kClipDomain;
    s.distortionMap = req->GetInputNumber(distortionMap_, 0.0) >= 0.5;
    double aspect = 1.0;
    if (img) {
        s.width = img->Width(), s.height = img->Height();
        aspect = img->XScale() / img->YScale();
    } else if (domain && domain->HasFrame()) {
        s.width = domain->FrameWidth(), s.height = domain->FrameHeight();
        aspect = domain->xScale / domain->yScale;
    } else {
        return false;
    }
    s.maxStep = std::max(s.width, s.height) * 0.1;
    lensdistort::ModelSettings m;
    m.width = s.width, m.height = s.height, m.pixelAspect = aspect;
    if (s.model->HasCameraParameters()) {
        m.focalLengthMm = req->GetInputNumber(focalLength_, 35.0);
        // A standard gate gives its aperture; the user gate takes the typed one.
        const OvID gate = req->GetInputID(filmGate_, FilmGateID[kDefaultFilmGate]);
        const std::optional<FilmAperture> standard = gate == FilmGate_User ? std::nullopt : ApertureOf(gate);
        m.apertureWidthIn = standard ? standard->width : req->GetInputNumber(apertureW_, m.apertureWidthIn);
        m.apertureHeightIn = standard ? standard->height : req->GetInputNumber(apertureH_, m.apertureHeightIn);
        m.shiftX = req->GetInputNumber(shiftX_, 0.0);
        m.shiftY = req->GetInputNumber(shiftY_, 0.0);
        m.focusDistanceCm = req->GetInputNumber(focusDistance_, 100.0);
        m.fit = std::max(0, FindFitMethod(req->GetInputID(fit_, FMID_Inside)));
        if (req->GetInputNumber(useSourceAspect_, 1.0) < 0.5)
            if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(pixelAspect_)); p && p->y != 0.0)
                m.pixelAspect = p->x / p->y;
    }
    const size_t index = static_cast<size_t>(
        std::find_if(models_.begin(), models_.end(), [&](const auto &x) { return x.get() == s.model; }) -
        models_.begin());
    std::vector<double> values;
    for (size_t i = 0; i < modelInputs_[index].size(); ++i)
        values.push_back(req->GetInputNumber(modelInputs_[index][i], s.model->Parameters()[i].def));
    s.model->Update(m, values);
    return true;
}

ImgRectI LensDistort::MappedBounds(const Setup &s, const ImgRectI &r, bool direct) {
    if (r.IsNull()) return r;
    // The boundary, counter-clockwise from the lower left corner, in unit steps.
    const double x0 = r.x0, y0 = r.y0, x1 = r.x1, y1 = r.y1;
    const Pos corners[5] = {{x0, y0}, {x1, y0}, {x1, y1}, {x0, y1}, {x0, y0}};
    double minX = HUGE_VAL, minY = HUGE_VAL, maxX = -HUGE_VAL, maxY = -HUGE_VAL;
    auto note = [&](double x, double y) {
        minX = std::min(minX, x), maxX = std::max(maxX, x);
        minY = std::min(minY, y), maxY = std::max(maxY, y);
    };
    const lensdistort::Model &m = *s.model;
    // The inverse walk starts at the centre and reaches the first corner in unit steps.
    Pos last{0.5 * s.width, 0.5 * s.height};
    if (!direct) {
        m.MapInverse(last.x, last.y, last.x, last.y, last.x, last.y);
        const Pos c{0.5 * s.width, 0.5 * s.height};
        const int n =
            std::min(kMostWalkSteps, static_cast<int>(std::ceil(std::max(std::fabs(x0 - c.x), std::fabs(y0 - c.y)))));
        for (int k = 1; k <= n; ++k) {
            const double t = static_cast<double>(k) / n;
            Pos q;
            if (m.MapInverse(c.x + t * (x0 - c.x), c.y + t * (y0 - c.y), last.x, last.y, q.x, q.y) &&
                std::fabs(q.x - last.x) + std::fabs(q.y - last.y) <= s.maxStep)
                last = q;
        }
    }
    int missed = 0; // steps since the last believable inverse
    for (int side = 0; side < 4; ++side) {
        const Pos a = corners[side], b = corners[side + 1];
        const int n =
            std::max(1, std::min(kMostWalkSteps,
                                 static_cast<int>(std::ceil(std::max(std::fabs(b.x - a.x), std::fabs(b.y - a.y))))));
        for (int k = 0; k < n; ++k) {
            const double t = static_cast<double>(k) / n;
            const double px = a.x + t * (b.x - a.x), py = a.y + t * (b.y - a.y);
            Pos q;
            if (direct) {
                if (m.MapDirect(px, py, q.x, q.y)) note(q.x, q.y);
                continue;
            }
            if (m.MapInverse(px, py, last.x, last.y, q.x, q.y) &&
                std::fabs(q.x - last.x) + std::fabs(q.y - last.y) <= s.maxStep * (1 + missed)) {
                last = q;
                missed = 0;
                note(q.x, q.y);
            } else {
                ++missed;
            }
        }
    }
    if (!(minX <= maxX && minY <= maxY)) return ImgRectI();
    auto toInt = [](double v) {
        return static_cast<int>(std::clamp(v, -double(DomainEndless), double(DomainEndless)));
    };
    return ImgRectI(toInt(std::floor(minX)) - 1, toInt(std::floor(minY)) - 1, toInt(std::ceil(maxX)) + 1,
                    toInt(std::ceil(maxY)) + 1);
}

void LensDistort::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI) || req->IsPreCalc()) return;
    const AutoImageDoD dod(req, input_);
    const AutoImageRoI roi(req);
    if (!dod || !dod->HasFrame()) return;
    Setup s;
    if (!ReadSetup(req, nullptr, dod.Get(), s)) return;
    if (s.edge == EdgeDuplicate) {
        req->SetInputRoI(input_, nullptr); // the border pixels repeat: the whole input
        return;
    }
    const ImgRectI asked = roi ? roi->rect : ImgRectI(0, 0, s.width, s.height);
    ImgRectI need = MappedBounds(s, asked & ImgRectI(0, 0, s.width, s.height).Grown(s.width, s.height), s.mode == 0);
    need = need.Grown(kBilinearReach, kBilinearReach);
    if (s.clipping == kClipDomain) need &= dod->rect;
    if (s.clipping == kClipFrame) need &= dod->frame;
    const ImageDomain region = dod->WithRect(need);
    req->SetInputRoI(input_, &region);
}

// ---- processing ------------------------------------------------------------------------------------------

void LensDistort::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    auto outOfMemory = [&] {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
    };
    Setup s;
    ReadSetup(req, src, nullptr, s);
    const bool precalc = req->IsPreCalc();
    const ImgRectI frame(0, 0, s.width, s.height);
    const AutoImageDoD dod(req, input_);
    // The input's domain and data window, bounded so that the walk stays finite.
    ImgRectI from = src->DataWindow() & frame.Grown(s.width, s.height);
    if (dod) from &= dod->rect;
    // A distortion map covers every position of the frame, whatever the source holds.
    ImgRectI window = s.distortionMap ? frame : MappedBounds(s, from, s.mode == 1);
    window &= src->DataWindow().Grown(s.width, s.height);
    if (s.distortionMap) window = frame;
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    if (s.clipping == kClipFrame) window &= frame;

    Ref<Image> dst = NewSizedImage(*src, s.width, s.height, window, req);
    if (dst && s.distortionMap && dst->Depth() != DepthRGBAFlt32)
        dst = NewImageTagList(
            {{ImgLikeImage, dst.Get()}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &window}, {ImgNoData, precalc}});
    if (!dst) {
        return outOfMemory();
    }
    if (!precalc && !window.IsNull()) {
        if (s.width >= 3 && s.mode == 0 && lensdistort::DeviceTakes(*s.model) && IsGPUEnabled(req, true) &&
            lensdistort::DistortOnDevice(req, s, *src, *dst)) {
            req->SetOutputData(output_, dst.Get());
            return;
        }
        if (!dst->AllocScanLineData() || !src->DownloadGPUMem()) {
            return outOfMemory();
        }
        // Reads beyond the data window give canvas (or the border, Duplicate) by the sampler's rules; a copy is
        // made when the source is not float, or the frame is the window to read.
        const ImgRectI read = s.clipping == kClipFrame ? frame : src->DataWindow();
        Ref<Image> source(src);
        if (!s.distortionMap && (src->Depth() != DepthRGBAFlt32 || read != src->DataWindow()))
            source = src->CopyOfImageTagList({{ImgDataWindow, &read}, {ImgDepth, DepthRGBAFlt32}});
        if (!source) {
            return outOfMemory();
        }
        setup_ = s;
        source_ = source.Get();
        dest_ = dst.Get();
        if (s.width >= 3) DoMultiProcess(req, window.Height());
        source_ = nullptr;
        dest_ = nullptr;
        if (req->GetTask() && req->GetTask()->IsAborted()) {
            req->SetOutputData(output_, nullptr);
            return;
        }
    }
    req->SetOutputData(output_, dst.Get());
}

void LensDistort::ProcessChunk(Request *req, int chunk) {
    if (req->GetTask() && req->GetTask()->IsAborted()) return;
    const ImgRectI dw = dest_->DataWindow();
    std::vector<FltPixel> row(static_cast<size_t>(dw.Width()));
    ProcessRow(dw.y0 + chunk, row);
    StoreFlt(dest_->Depth(), row.data(), dw.Width(), dest_->ScanLine(dw.y0 + chunk));
}

void LensDistort::ProcessRow(int y, std::vector<FltPixel> &row) const {
    const Setup &s = setup_;
    const lensdistort::Model &m = *s.model;
    const ImgRectI dw = dest_->DataWindow();
    const int n = s.samples;
    const double step = 1.0 / n;
    const float weight = 1.0f / static_cast<float>(n * n);
    const EdgeSampler sampler(*source_, s.edge);

    // One pixel of Undistort: its samples mapped by the inverse from `start` (the predicted result at the pixel's
    // centre) moved to each sample by `slope` (the result's change per pixel along x) and, for the change along y,
    // that slope turned a quarter (a lens map is close to a similarity locally). Gives the number of samples
    // kept, and `result` the mean result when none dropped.
    auto pixel = [&](int x, Pos start, Pos slope, Pos &result) {
        float sum[4] = {0, 0, 0, 0};
        double sumX = 0, sumY = 0;
        int kept = 0;
        for (int j = 0; j < n; ++j)
            for (int i = 0; i < n; ++i) {
                const double dx = (i + 0.5) * step - 0.5, dy = (j + 0.5) * step - 0.5;
                const double px = x + 0.5 + dx, py = y + 0.5 + dy;
                Pos q;
                const Pos from{start.x + dx * slope.x - dy * slope.y, start.y + dx * slope.y + dy * slope.x};
                if (!m.MapInverse(px, py, from.x, from.y, q.x, q.y) ||
                    std::fabs(q.x - from.x) + std::fabs(q.y - from.y) > s.maxStep)
                    continue;
                ++kept;
                sumX += q.x, sumY += q.y;
                if (s.distortionMap) {
                    sum[0] += static_cast<float>(q.x - px), sum[1] += static_cast<float>(q.y - py);
                } else if (s.bilinear) {
                    sampler.AddBilinear(q.x, q.y, 1.0f, sum);
                } else {
                    sampler.AddNearest(q.x, q.y, 1.0f, sum);
                }
            }
        FltPixel &out = row[static_cast<size_t>(x - dw.x0)];
        if (kept == 0) {
            out = FltPixel{};
            return 0;
        }
        const float scale = kept == n * n ? weight : 1.0f / static_cast<float>(kept);
        out = s.distortionMap ? FltPixel{sum[0] * scale, sum[1] * scale, 0.f, 1.f}
                              : FltPixel{sum[0] * scale, sum[1] * scale, sum[2] * scale, sum[3] * scale};
        if (kept == n * n) result = {sumX / kept, sumY / kept};
        return kept;
    };

    if (s.mode == 0) {
        // Distort: the direct map of a whole row of samples per call, then the reads.
        const int width = dw.Width(), count = width * n;
        std::vector<double> xs(static_cast<size_t>(count)), ox(xs.size()), oy(xs.size());
        const std::unique_ptr<bool[]> ok(new bool[xs.size()]);
        std::vector<int> kept(static_cast<size_t>(width), 0);
        for (int k = 0; k < count; ++k) xs[k] = dw.x0 + (k + 0.5) * step;
        for (int j = 0; j < n; ++j) {
            const double py = y + (j + 0.5) * step;
            m.MapDirectRow(xs.data(), py, count, ox.data(), oy.data(), ok.get());
            for (int k = 0; k < count; ++k) {
                if (!ok[k]) continue;
                float *sum = &row[static_cast<size_t>(k / n)].R;
                ++kept[static_cast<size_t>(k / n)];
                if (s.distortionMap) {
                    sum[0] += static_cast<float>(ox[k] - xs[k]), sum[1] += static_cast<float>(oy[k] - py);
                } else if (s.bilinear) {
                    sampler.AddBilinear(ox[k], oy[k], 1.0f, sum);
                } else {
                    sampler.AddNearest(ox[k], oy[k], 1.0f, sum);
                }
            }
        }
        for (int p = 0; p < width; ++p) {
            FltPixel &out = row[static_cast<size_t>(p)];
            const int got = kept[static_cast<size_t>(p)];
            const float scale = got == n * n ? weight : got ? 1.0f / static_cast<float>(got) : 0.f;
            out = s.distortionMap && got ? FltPixel{out.R * scale, out.G * scale, 0.f, 1.f}
                                         : FltPixel{out.R * scale, out.G * scale, out.B * scale, out.A * scale};
        }
        return;
    }
    // Undistort: two runs from the row's middle. Each pixel starts from its neighbours' results: the last one,
    // extended along the run by the last two or three (a line or a parabola through them), which puts the start
    // within a small fraction of a pixel of the answer so that Newton's method ends after a round or two. Only
    // pixels whose samples were all kept feed the prediction; a pixel with every sample dropped ends the run.
    const int mid = dw.x0 + (dw.Width() - 1) / 2;
    Pos seed{0.5 * s.width, 0.5 * s.height};
    m.MapInverse(mid + 0.5, y + 0.5, seed.x, seed.y, seed.x, seed.y);
    Pos middle = seed; // the middle pixel's result, where the right run starts
    bool middleFull = false;
    for (const int dir : {-1, 1}) {
        Pos h[3] = {dir < 0 ? seed : middle, {}, {}}; // the latest full results, newest first
        int known = dir > 0 && middleFull ? 1 : 0;    // how many of them are results of pixels
        for (int x = dir < 0 ? mid : mid + 1; x >= dw.x0 && x < dw.x1; x += dir) {
            Pos start = h[0], slope{0, 0};
            if (known >= 2) {
                slope = {(h[0].x - h[1].x) * dir, (h[0].y - h[1].y) * dir};
                start = known == 2 ? Pos{2 * h[0].x - h[1].x, 2 * h[0].y - h[1].y}
                                   : Pos{3 * (h[0].x - h[1].x) + h[2].x, 3 * (h[0].y - h[1].y) + h[2].y};
            }
            Pos result = start;
            const int kept = pixel(x, start, slope, result);
            if (kept == n * n) {
                h[2] = h[1], h[1] = h[0], h[0] = result;
                known = std::min(known + 1, 3);
                if (x == mid) middle = result, middleFull = true;
            } else if (kept == 0) {
                // Every sample dropped: the inverse ran away, and the rest of this run is cleared.
                if (dir < 0)
                    std::fill(row.begin(), row.begin() + (x - dw.x0), FltPixel{});
                else
                    std::fill(row.begin() + (x - dw.x0), row.end(), FltPixel{});
                break;
            }
        }
    }
}

} // namespace Orvane
