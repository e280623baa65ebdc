#include "operators/color/ColorCurves.h"

#include <array>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ColorCurves("ColorCurves");
static ClassRegistration<ColorCurves, ThreadedOperator>
    s_Registration(CLSID_ColorCurves, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "ColorCorrect"},
                    {RegPath, "Tools/Color/ColorCurves"},
                    {RegName, "Color Curves"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "CCv"},
                    {RegHelp, "Adjusts color channels with spline curves"},
                    {RegIcon, "Icons.Tools.Icons.ColorCorrect"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

void CurveTool::AddCurveInput(const char *id, std::initializer_list<TagItem> extra) {
    TagList tags{{LinkDataType, CLSID_DataType_LookUpTable},
                 {InputControl, CLSID_InputControl_Spline},
                 {InputSplineClass, CLSID_LUT_Cubic}};
    for (const TagItem &item : extra) tags.Add(item);
    curves_.push_back(AddInputTagList(id, id, tags));
}

void CurveTool::AddImageLinks() {
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Image *CurveTool::Begin(Request *req, bool periodic, std::vector<Ref<SplineCurve>> &curves) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    curves.clear();
    for (Input *in : src ? curves_ : std::vector<Input *>()) {
        Ref<SplineCurve> curve(dynamic_cast<SplineCurve *>(req->GetInputData(in)));
        const std::string problem = curve ? curve->Problem(periodic) : std::string("is not a curve");
        if (!problem.empty()) {
            Fail(req, "%s: the %s curve %s\n", Name().c_str(), in->Label(), problem.c_str());
            src = nullptr;
            break;
        }
        curves.push_back(std::move(curve));
    }
    if (!src) req->SetOutputData(output_, nullptr);
    return src;
}

void CurveTool::Finish(Request *req, const Ref<Image> &dst) {
    if (!dst) FailOutOfMemory(req);
    req->SetOutputData(output_, dst.Get());
}

void CurveTool::ForEachSample(const std::function<void(int)> &sample) {
    constexpr int kBlock = 1024, kSamples = CurveTable::kSteps + 1;
    DoMultiProcess(
        [&](int chunk) {
            for (int i = chunk * kBlock; i < std::min(kSamples, (chunk + 1) * kBlock); ++i) sample(i);
        },
        (kSamples + kBlock - 1) / kBlock);
}

namespace {

/// The four channels through their tables; null tables leave a channel as it is.
struct ChannelCurves {
    std::array<const CurveTable *, 4> table{};
    template <class T> void operator()(T *p) const {
        for (int c = 0; c < 4; ++c)
            if (table[c]) p[c] = static_cast<T>((*table[c])(p[c]));
    }
};

} // namespace

ColorCurves::ColorCurves(const Registry *reg, const ScriptVal &args, const TagList &tags) : CurveTool(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    AddCurveInput("Red", {{ColorChannel, ColorChannelRed}});
    AddCurveInput("Green", {{ColorChannel, ColorChannelGreen}});
    AddCurveInput("Blue", {{ColorChannel, ColorChannelBlue}});
    AddCurveInput("Alpha", {{ColorChannel, ColorChannelAlpha}});
    AddCurveInput("Luminance");
    AddImageLinks();
}

void ColorCurves::Process(Request *req) {
    std::vector<Ref<SplineCurve>> curves;
    Image *src = Begin(req, false, curves);
    if (!src) return;
    const SplineCurve &luminance = *curves[4];
    const bool lumaIdentity = luminance.IsIdentity();
    std::vector<int> changed; // channels whose composed curve is not the identity
    for (int c = 0; c < 4; ++c)
        if (!curves[c]->IsIdentity() || (c < 3 && !lumaIdentity)) changed.push_back(c);
    if (changed.empty()) {
        req->SetOutputData(output_, src);
        return;
    }
    // Each changed channel's curve, after the luminance curve for colour.
    std::vector<Spline> splines;
    for (int c = 0; c < 4; ++c) splines.push_back(curves[c]->ToSpline(false));
    const Spline luma = luminance.ToSpline(false);
    std::array<CurveTable, 4> tables;
    ChannelCurves fn;
    for (int c : changed) {
        const Spline &curve = splines[static_cast<size_t>(c)];
        const bool throughLuma = c < 3 && !lumaIdentity;
        auto composed = [&](double x) { return curve(throughLuma ? luma(x) : x); };
        auto slope = [&](double x) { return throughLuma ? curve.Slope(luma(x)) * luma.Slope(x) : curve.Slope(x); };
        CurveTable &table = tables[static_cast<size_t>(c)];
        ForEachSample([&](int i) { table[i] = composed(static_cast<double>(i) / CurveTable::kSteps); });
        table.SetEndSlopes(slope(0.0), slope(1.0));
        fn.table[static_cast<size_t>(c)] = &table;
    }
    Finish(req, RunPointColor(*this, req, input_, src, fn));
}

} // namespace Orvane
