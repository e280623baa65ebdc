#include "operators/mask/PolyMask.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

namespace {

TagList PolyMaskRow(const char *path, const char *name, const char *abbreviation, const char *help) {
    return {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindMask},
            {RegClassName, "PolyMask"},
            {RegPath, path},
            {RegName, name},
            {RegCategory, "Mask"},
            {RegAbbreviation, abbreviation},
            {RegHelp, help},
            {RegIcon, "Icons.Tools.Icons.PolyMask"},
            {RegAlias, "Rotoscope"},
            {RegAlias, "Roto"},
            {RegAlias, "Mask"},
            {RegMaskHasPolygon, 1},
            {RegOutputType, "Mask"},
            {RegSupportsRoI, 1},
            {RegSupportsDoD, 1},
            {RegSupportsGPUImages, 1}};
}

const ClassRegistration<PolyMask, MaskOperator> s_Bezier(CLSID_Mask_Polyline, &CLSID_MaskOperator,
                                                         PolyMaskRow("Tools/Masks/Polygon", "Polygon", "Ply",
                                                                     "Draw a Polyline"));
const ClassRegistration<PolyMask, MaskOperator> s_BSpline(CLSID_Mask_BSpline, &CLSID_Mask_Polyline,
                                                          PolyMaskRow("Tools/Masks/BSpline", "BSpline", "BSp",
                                                                      "Draw a BSpline Polyline"));

} // namespace

PolyMask::PolyMask(const Registry *reg, const ScriptVal &args, const TagList &tags) : MaskOperator(reg, args, tags) {
    SetControlPageTags(0, {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.PolyLine")}});
    PolyMaskInputs::Options options;
    options.bspline = reg && reg->ID() == CLSID_Mask_BSpline;
    options.threeRotations = true;
    options.controls = &Controls();
    poly_ = std::make_unique<PolyMaskInputs>(this, "", options);
}

void PolyMask::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    poly_->NotifyChanged(in, param);
    MaskOperator::NotifyChanged(in, param, time, tags);
}

void PolyMask::PreProcess(Request *req) {
    const std::optional<ImgRectI> dod = GetMaskDoD(req);
    SetMaskRegion(req, dod ? poly_->PixelBox(req, GetMaskFormat(req)) & *dod : ImgRectI());
    MaskOperator::PreProcess(req);
}

void PolyMask::Process(Request *req) {
    Image *mask = GetMaskImage(req);
    if (!mask || poly_->Render(req, mask, GetMaskFormat(req))) return;
    SetMaskImage(req, nullptr);
    if (!(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
    req->SetOutputData(OutMask(), nullptr);
}

} // namespace Orvane
