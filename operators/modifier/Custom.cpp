#include "operators/modifier/Custom.h"

#include <algorithm>
#include <cmath>

#include <fmt/format.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputAt.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/script/ScriptImageApi.h"
#include "host/script/ScriptPool.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Custom("Custom");
static ClassRegistration<Custom, ThreadedOperator> s_Registration(CLSID_Custom, &CLSID_ThreadedOperator,
                                                                  {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                   {RegClassName, "Custom"},
                                                                   {RegPath, "Tools/Miscellaneous/Custom"},
                                                                   {RegName, "Custom Tool"},
                                                                   {RegCategory, "Miscellaneous"},
                                                                   {RegAbbreviation, "CT"},
                                                                   {RegHelp, "Applies per-pixel expressions to images"},
                                                                   {RegIcon, "Icons.Tools.Icons.Custom"},
                                                                   {RegTemplateName, "Orvane::Custom"},
                                                                   {RegNoMotionBlurControls, 1},
                                                                   {RegSupportsRoI, 1}});

namespace {

struct ExpressionRow {
    const char *id, *label, *def;
};
constexpr ExpressionRow kExpressions[kCustomChannels] = {
    {"RedExpression", "Red", "r1"},
    {"GreenExpression", "Green", "g1"},
    {"BlueExpression", "Blue", "b1"},
    {"AlphaExpression", "Alpha", "a1"},
    {"ZExpression", "Z", "z1"},
    {"CovExpression", "Z Coverage", "cv1"},
    {"UExpression", "U", "u1"},
    {"VExpression", "V", "v1"},
    {"XNormalExpression", "X Normal", "nx1"},
    {"YNormalExpression", "Y Normal", "ny1"},
    {"ZNormalExpression", "Z Normal", "nz1"},
    {"XVectorExpression", "X Vector", "vx1"},
    {"YVectorExpression", "Y Vector", "vy1"},
    {"XBackVectorExpression", "X Back Vector", "bx1"},
    {"YBackVectorExpression", "Y Back Vector", "by1"},
    {"XPositionExpression", "X Position", "px1"},
    {"YPositionExpression", "Y Position", "py1"},
    {"ZPositionExpression", "Z Position", "pz1"},
    {"XDisparityExpression", "X Disparity", "dx1"},
    {"YDisparityExpression", "Y Disparity", "dy1"},
};

/// The image's auxiliary channel behind output channel `c` (Z and after): the script pixel's fields in order.
AuxChannelKind AuxOfChannel(int c) { return ScriptAuxChannel(c - kFirstAuxChannel); }

TagList TextTags(int page, const char *def) {
    return {{LinkDataType, CLSID_DataType_Text},
            {InputControl, CLSID_InputControl_TextEdit},
            {ControlPage, page},
            {InputDefaultText, def},
            {InputExternal, 0}};
}

TagList CheckboxTags(int page, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Checkbox},
            {ControlPage, page},
            {InputDefault, def},
            {InputExternal, 0},
            {InputNotify, 1}};
}

/// The seed of the script's noise: (seed * 572662306) xor 0xe7a891f3, as an unsigned 32-bit number.
double ScriptSeed(double randomSeed) {
    const auto seed = static_cast<uint32_t>(static_cast<int64_t>(randomSeed) * int64_t{572662306});
    return static_cast<double>(seed ^ 0xe7a891f3u);
}

} // namespace

Custom::Custom(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    AddVariableInputs(AddControlPageTagList("Controls", {}));

    const int setupPage = AddControlPageTagList("Setup", {});
    for (int k = 1; k <= 8; ++k)
        setup_[k - 1] = AddInputTagList(fmt::format("Setup {}", k).c_str(), fmt::format("Setup{}", k).c_str(),
                                        TextTags(setupPage, ""));
    const int interPage = AddControlPageTagList("Inter", {});
    for (int k = 1; k <= 8; ++k)
        intermediate_[k - 1] = AddInputTagList(fmt::format("Intermediate {}", k).c_str(),
                                               fmt::format("Intermediate{}", k).c_str(), TextTags(interPage, ""));
    AddExpressionInputs();

    const int config = AddControlPageTagList("Config", {});
    randomSeed_ = AddInputTagList("Random Seed", "RandomSeed",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {ControlPage, config},
                                   {InputInteger, 1},
                                   {InputMinAllowed, 0.0},
                                   {InputMaxAllowed, 32767.0},
                                   {InputSliderHigh, 32767.0},
                                   {InputDefault, 0.0}});
    reseed_ = AddInputTagList("Reseed", "Reseed",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_Button},
                               {ControlPage, config},
                               {InputExternal, 0},
                               {InputNotify, 1},
                               {InputInitialNotify, 0},
                               {InputPassive, 1}});

    for (int k = 1; k <= 3; ++k)
        images_[k - 1] = AddInputTagList(
            fmt::format("Image {}", k).c_str(), fmt::format("Image{}", k).c_str(),
            {{LinkDataType, CLSID_DataType_Image}, {LinkMain, k}, {InputRequired, 0}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Custom::~Custom() = default;

void Custom::AddVariableInputs(int page) {
    for (int k = 1; k <= 8; ++k)
        numbers_[k - 1] = AddInputTagList(fmt::format("Number In {}", k).c_str(), fmt::format("NumberIn{}", k).c_str(),
                                          {{LinkDataType, CLSID_DataType_Number},
                                           {InputControl, CLSID_InputControl_Screw},
                                           {ControlPage, page},
                                           {InputSliderLow, 0.0},
                                           {InputSliderHigh, 1.0},
                                           {InputDefault, 0.0}});
    for (int k = 1; k <= 4; ++k)
        points_[k - 1] = AddInputTagList(fmt::format("Point In {}", k).c_str(), fmt::format("PointIn{}", k).c_str(),
                                         {{LinkDataType, CLSID_DataType_Point},
                                          {InputControl, CLSID_InputControl_Offset},
                                          {ControlPage, page},
                                          {InputDefaultX, 0.5},
                                          {InputDefaultY, 0.5}});
    numberFields_.Add(this, "Number", {numbers_.begin(), numbers_.end()}, page);
    pointFields_.Add(this, "Point", {points_.begin(), points_.end()}, page);
    BeginControlNestTagList("LUT Controls", "LUTControlsNest", false, {{ControlPage, page}});
    for (int k = 1; k <= 4; ++k) {
        editLuts_[k - 1] = AddInputTagList(fmt::format("Edit LUT In {}", k).c_str(),
                                           fmt::format("EditLUTIn{}", k).c_str(), CheckboxTags(page, 0.0));
        luts_[k - 1] = AddInputTagList(fmt::format("LUT In {}", k).c_str(), fmt::format("LUTIn{}", k).c_str(),
                                       {{LinkDataType, CLSID_DataType_LookUpTable},
                                        {InputControl, CLSID_InputControl_Spline},
                                        {InputSplineClass, CLSID_LUT_Cubic},
                                        {ControlPage, page}});
    }
    EndControlNest();
}

void Custom::AddExpressionInputs() {
    const int page =
        AddControlPageTagList("Channels", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.ColorChannels")}});
    for (int c = 0; c < kCustomChannels; ++c) {
        if (c == kFirstAuxChannel)
            BeginControlNestTagList("Aux Channel Expressions", "AuxChannelNest", false, {{ControlPage, page}});
        const ExpressionRow &row = kExpressions[c];
        channels_[c] = AddInputTagList(row.label, row.id, TextTags(page, row.def));
    }
    EndControlNest();
}

void Custom::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    const auto *number = dynamic_cast<const Number *>(param);
    numberFields_.Notify(in, param) || pointFields_.Notify(in, param);
    for (int k = 0; k < 4; ++k)
        if (in == editLuts_[k] && number)
            editLuts_[k]->SetAttrsTagList({{ControlLabel, fmt::format("Edit {}", luts_[k]->Name()).c_str()}});
    if (in == reseed_ && number && number->value != 0) {
        const auto *current = dynamic_cast<const Number *>(randomSeed_->Constant().Get());
        randomSeed_->SetValue(MakeRef<Number>(NewRandomSeed(current ? current->value : -1)));
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

const CustomScript &Custom::ScriptFor(Request *req, const std::array<bool, 4> &images, const Image &out) {
    uint32_t channels = 0xf;
    for (int c = kFirstAuxChannel; c < kCustomChannels; ++c)
        if (out.HasAuxChannel(AuxOfChannel(c))) channels |= 1u << c;
    CustomScriptInput in;
    in.images = images;
    in.outputChannels = channels;
    in.integerOutput = !out.IsFloat();
    std::string key =
        fmt::format("{:x}/{}/{}{}{}{}", channels, in.integerOutput, images[0], images[1], images[2], images[3]);
    auto take = [&](const Input *input, std::string &into) {
        into = TextOf(req, input);
        key += '\x1f';
        key += into;
    };
    for (int k = 0; k < 8; ++k) take(setup_[k], in.setup[k]), take(intermediate_[k], in.intermediate[k]);
    for (int c = 0; c < kCustomChannels; ++c) take(channels_[c], in.channel[c]);
    const std::vector<std::string> numberNames = numberFields_.Names(req), pointNames = pointFields_.Names(req);
    for (const std::string &name : numberNames) key += '\x1f' + name;
    for (const std::string &name : pointNames) key += '\x1f' + name;
    in.aliases = InputNameAliases(numberNames, pointNames, false, true);
    if (key == scriptKey_) return script_;
    script_ = GenerateCustomScript(in);
    scriptKey_ = std::move(key);
    // Each faulty expression is told once per change; it writes 0.
    if (OrvaneDoc *doc = GetDoc())
        for (const std::string &error : script_.errors)
            doc->PrintF(ConsoleWarning, "%s: %s\n", Name().c_str(), error.c_str());
    return script_;
}

void Custom::SetFrameGlobals(ScriptState &state, Request *req, const std::array<Image *, 4> &images, Image *out) {
    constexpr ScriptEnv env = ScriptEnv::Sandbox;
    if (state.GetNumber(ScriptEnv::Trusted, "_customTypes") == 0) {
        state.Run(ScriptEnv::Trusted,
                  "require('ffi').cdef('typedef struct Custom Custom; typedef struct Request Request;') "
                  "_customTypes = 1");
        state.SetPointer(env, "_lutfn", "double (*)(Custom *, int, double)",
                         reinterpret_cast<void *>(&ffi_CustomGetLUT));
    }
    state.SetPointer(env, "self", "Custom *", this);
    state.SetPointer(env, "req", "Request *", req);
    state.SetImage(env, "out", out);
    for (int k = 1; k <= 4; ++k) state.SetImage(env, fmt::format("img{}", k).c_str(), images[k - 1]);
    state.SetNumber(env, "time", req->Time());
    state.SetNumber(env, "_seed", ScriptSeed(req->GetInputNumber(randomSeed_)));
    auto setWindow = [&](int k, const ImgRectI &r) {
        state.SetNumber(env, fmt::format("dw{}_left", k).c_str(), r.x0);
        state.SetNumber(env, fmt::format("dw{}_right", k).c_str(), r.x1);
        state.SetNumber(env, fmt::format("dw{}_bottom", k).c_str(), r.y0);
        state.SetNumber(env, fmt::format("dw{}_top", k).c_str(), r.y1);
    };
    const ImgRectI &dw = out->DataWindow();
    setWindow(0, dw);
    for (int k = 1; k <= 4; ++k) setWindow(k, images[k - 1] ? dw & images[k - 1]->DataWindow() : ImgRectI());
    const double proxyX = out->Width() / static_cast<double>(out->GetAttrL(ImgFullWidth, out->Width()));
    const double proxyY = out->Height() / static_cast<double>(out->GetAttrL(ImgFullHeight, out->Height()));
    state.SetNumber(env, "proxy_x", proxyX);
    state.SetNumber(env, "proxy_y", proxyY);
    state.SetNumber(env, "unproxy_x", 1.0 / proxyX);
    state.SetNumber(env, "unproxy_y", 1.0 / proxyY);
    for (int k = 1; k <= 8; ++k) state.SetNumber(env, fmt::format("n{}", k).c_str(), numberValues_[k - 1]);
    for (int k = 1; k <= 4; ++k) {
        state.SetNumber(env, fmt::format("p{}x", k).c_str(), pointValues_[k - 1][0]);
        state.SetNumber(env, fmt::format("p{}y", k).c_str(), pointValues_[k - 1][1]);
        state.SetNumber(env, fmt::format("p{}z", k).c_str(), 0.0); // points are two-dimensional
    }
}

void Custom::Process(Request *req) {
    std::array<Image *, 4> images{};
    for (int k = 0; k < 3; ++k) images[k] = dynamic_cast<Image *>(req->GetInputData(images_[k]));
    if (Common().effectMask) images[3] = dynamic_cast<Image *>(req->GetInputData(Common().effectMask));
    const Image *like = images[0] ? images[0] : images[1] ? images[1] : images[2];

    TagList outTags{{ImgForRequest, 1}};
    if (like)
        outTags.Set({ImgLikeImage, like});
    else
        outTags.Set({ImgDocument, static_cast<const void *>(GetDoc())});
    Ref<Image> probe = NewImageTagList(outTags);
    if (!probe) {
        Fail(req, "%s: no image to work on and no frame format\n", Name().c_str());
        req->SetOutputData(output_, nullptr);
        return;
    }
    ImgRectI dw = probe->Frame();
    if (AutoImageRoI roi(req); roi) dw = dw & roi->rect;
    outTags.Set({ImgDataWindow, &dw});
    outTags.Set({ImgNoData, req->IsPreCalc()});
    const FltPixel clear{};
    outTags.Set({ImgCanvasColor, &clear});
    Ref<Image> out = NewImageTagList(outTags);
    if (!out) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (req->IsPreCalc()) {
        req->SetOutputData(output_, out);
        return;
    }
    bool ok = out->AllocScanLineData();
    for (int c = kFirstAuxChannel; ok && like && c < kCustomChannels; ++c)
        if (like->HasAuxChannel(AuxOfChannel(c))) ok = out->AddAuxChannel(AuxOfChannel(c));
    if (!ok) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }

    const CustomScript &script =
        ScriptFor(req, {images[0] != nullptr, images[1] != nullptr, images[2] != nullptr, images[3] != nullptr}, *out);
    for (int k = 0; k < 8; ++k) numberValues_[k] = req->GetInputNumber(numbers_[k]);
    for (int k = 0; k < 4; ++k) {
        const auto *point = dynamic_cast<const Point *>(req->GetInputData(points_[k]));
        pointValues_[k] = {point ? point->x : 0.5, point ? point->y : 0.5};
        const auto *curve = dynamic_cast<const SplineCurve *>(req->GetInputData(luts_[k]));
        lutSplines_[k].reset();
        if (curve && curve->Problem(false).empty()) {
            lutSplines_[k].emplace(curve->ToSpline(false));
            lutRanges_[k] = {curve->Points().front().x, curve->Points().back().x};
        }
    }

    if (!pool_) {
        ScriptLimits limits = PixelScriptLimits();
        limits.jit = true; // translated expressions cannot loop: the line loop polls the abort word
        pool_ = std::make_unique<ScriptPool>(limits, ScriptEnv::Sandbox);
    }
    std::vector<std::string> alerts;
    std::mutex alertLock;
    pool_->SetAlert([&](const std::string &text) {
        std::lock_guard<std::mutex> hold(alertLock);
        if (alerts.size() < 8) alerts.push_back(text);
    });
    req_ = req;
    abortWord_ = 0;
    RenderTask *task = req->GetTask();
    if (task) task->LinkAbortWord(&abortWord_);
    const std::string error = pool_->Dispatch(script.text, dw.y0, dw.y1, &abortWord_, [&](ScriptState &state, int) {
        SetFrameGlobals(state, req, images, out.Get());
    });
    if (task) task->UnlinkAbortWord(&abortWord_);
    pool_->SetAlert({});
    req_ = nullptr;
    if (task && task->IsAborted()) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (!error.empty() || !alerts.empty()) {
        std::string message = error;
        for (const std::string &a : alerts) message += (message.empty() ? "" : "; ") + a;
        std::replace(message.begin(), message.end(), '\n', ' ');
        Fail(req, "%s: %s\n", Name().c_str(), message.c_str());
        req->SetOutputData(output_, nullptr);
        return;
    }
    req->SetOutputData(output_, out);
}

double Custom::LUTValue(int inp, double v) const {
    if (inp < 1 || inp > 4 || !lutSplines_[inp - 1]) return 0.0;
    const auto [lo, hi] = lutRanges_[inp - 1];
    return (*lutSplines_[inp - 1])(std::clamp(v, lo, hi));
}

double Custom::NumberAt(int inp, double time) {
    if (inp < 1 || inp > 8) return 0.0;
    if (req_ && time == req_->Time()) return numberValues_[inp - 1];
    std::lock_guard<std::mutex> hold(evaluateLock_);
    return InputNumberAt(req_, numbers_[inp - 1], time);
}

double Custom::PointAxisAt(int inp, double time, int axis) {
    if (inp < 1 || inp > 4) return 0.0;
    if (req_ && time == req_->Time()) return pointValues_[inp - 1][axis];
    std::lock_guard<std::mutex> hold(evaluateLock_);
    double x, y;
    InputPointAt(req_, points_[inp - 1], time, x, y, 0.5, 0.5);
    return axis == 0 ? x : y;
}

} // namespace Orvane

// The functions scripts call through the FFI, under the names and C types they are declared with.
extern "C" {
ORVANE_API double ffi_CustomGetLUT(Orvane::Custom *self, int inp, double v) {
    return self ? self->LUTValue(inp, v) : 0.0;
}
ORVANE_API double ffi_CustomGetNum(Orvane::Custom *self, int inp, double time) {
    return self ? self->NumberAt(inp, time) : 0.0;
}
ORVANE_API double ffi_CustomGetPtX(Orvane::Custom *self, int inp, double time) {
    return self ? self->PointAxisAt(inp, time, 0) : 0.0;
}
ORVANE_API double ffi_CustomGetPtY(Orvane::Custom *self, int inp, double time) {
    return self ? self->PointAxisAt(inp, time, 1) : 0.0;
}
ORVANE_API Orvane::Custom *ffi_Custom_cast(void *obj) {
    return dynamic_cast<Orvane::Custom *>(static_cast<Orvane::Object *>(obj));
}
ORVANE_API Orvane::Object *ffi_Custom_uncast(Orvane::Custom *self) { return self; }
}
