#include "operators/color/HueCurves.h"

#include <algorithm>
#include <array>

#include "host/color/ColorSpace.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_HueCurves("HueCurves");
static ClassRegistration<HueCurves, ThreadedOperator>
    s_Registration(CLSID_HueCurves, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/HueCurves"},
                    {RegName, "Hue Curves"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "HCv"},
                    {RegHelp, "Adjusts colors by hue with spline curves"},
                    {RegIcon, "Icons.Tools.Icons.HueCurves"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// Neutral value of each curve: no shift, unit gains.
constexpr double kNeutral[3] = {0.0, 1.0, 1.0};

struct HueFunction {
    const std::array<CurveTable, 3> *tables;
    template <class T> void operator()(T *p) const {
        const double rgb[3] = {p[0], p[1], p[2]};
        double hls[3], out[3];
        RGBToSpaceDouble(ColorSpaceType::HLS, rgb, hls);
        const double hue = hls[0];
        const double shift = (*tables)[0](hue), saturation = (*tables)[1](hue), luminance = (*tables)[2](hue);
        hls[0] = hue + shift;
        hls[1] *= 1.0 + (luminance - 1.0) * std::clamp(hls[2], 0.0, 1.0);
        hls[2] *= std::max(saturation, 0.0);
        SpaceToRGBDouble(ColorSpaceType::HLS, hls, out);
        for (int c = 0; c < 3; ++c) p[c] = static_cast<T>(out[c]);
    }
};

} // namespace

HueCurves::HueCurves(const Registry *reg, const ScriptVal &args, const TagList &tags) : CurveTool(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    const char *ids[] = {"Hue", "Saturation", "Luminance"};
    for (int i = 0; i < 3; ++i) AddCurveInput(ids[i], {{InputDefault, kNeutral[i]}});
    AddImageLinks();
}

void HueCurves::Process(Request *req) {
    std::vector<Ref<SplineCurve>> curves;
    Image *src = Begin(req, true, curves);
    if (!src) return;
    bool neutral = true;
    for (int i = 0; i < 3; ++i) neutral = neutral && curves[static_cast<size_t>(i)]->IsFlatAt(kNeutral[i]);
    if (neutral) {
        req->SetOutputData(output_, src);
        return;
    }
    std::array<CurveTable, 3> tables{CurveTable(true), CurveTable(true), CurveTable(true)};
    for (size_t i = 0; i < 3; ++i) {
        const Spline curve = curves[i]->ToSpline(true);
        CurveTable &table = tables[i];
        ForEachSample([&](int k) { table[k] = curve(static_cast<double>(k) / CurveTable::kSteps); });
    }
    Finish(req, RunPointColor(*this, req, input_, src, HueFunction{&tables}));
}

} // namespace Orvane
