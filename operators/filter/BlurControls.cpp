#include "operators/filter/BlurControls.h"

#include <algorithm>
#include <cstring>
#include <iterator>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/Request.h"
#include "host/image/BlurFilters.h"
#include "operators/frame/IdChoices.h"

namespace Orvane {
namespace {

/// The filter buttons, in order.
constexpr IdChoice kFilterButtons[] = {{"Box", "Box"},
                                       {"Bartlett", "Bartlett"},
                                       {"Multi-box", "Multi-box"},
                                       {"Gaussian", "Gaussian"},
                                       {"Fast Gaussian", "Fast Gaussian"}};

/// Every filter ID known, with its kernel: the buttons' and four that files
/// and scripts may set. The entry just ahead of the table is the fallback for
/// any other ID.
struct FilterEntry {
    const char *id;
    int type;
};
constexpr FilterEntry kFilters[] = {
    {nullptr, BlurSoften}, // fallback
    {"Box", BlurBox},
    {"Bartlett", BlurBartlett},
    {"Multi-box", BlurMultiBox},
    {"Gaussian", BlurGaussian},
    {"Fast Gaussian", BlurFastGaussian},
    {"YV Gaussian", BlurYvVGaussian},
    {"VYV N=3 Gau", BlurVYV3Gaussian},
    {"VYV N=5 Gau", BlurVYV5Gaussian},
    {"VYV N=6 Gau", BlurVYV6Gaussian},
    {nullptr, 0}, // end
};

} // namespace

TagList BlurFilterTags() {
    TagList tags = WithIdChoices({{LinkDataType, CLSID_DataType_OvID},
                                  {InputControl, CLSID_InputControl_MultiButtonID},
                                  {ButtonsFillRow, 1},
                                  {InputDefaultId, OvID("Fast Gaussian")},
                                  {LinkForceSave, 1},
                                  {InputNotify, 1}},
                                 kFilterButtons);
    // Filters without a button that documents and scripts may still name, "Soften" of old documents among them.
    tags.Add({ListAcceptedId, OvID("Soften")});
    for (const FilterEntry *f = kFilters + 1; f->id; ++f)
        if (std::none_of(std::begin(kFilterButtons), std::end(kFilterButtons),
                         [f](const IdChoice &button) { return std::strcmp(button.id, f->id) == 0; }))
            tags.Add({ListAcceptedId, OvID(f->id)});
    return tags;
}

int BlurTypeOfFilter(OvID id) {
    const FilterEntry *e = kFilters + 1;
    while (e->id && !(id == OvID(e->id))) ++e;
    return e->id ? e->type : kFilters[0].type;
}

TagList BlurPassesTags() {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Slider},
            {InputInteger, 1},
            {InputDefault, 4.0},
            {InputMinAllowed, 1.0},
            {InputMaxAllowed, 64.0},
            {InputSliderLow, 1.0},
            {InputSliderHigh, 16.0},
            {ControlVisible, 0}};
}

TagList ClippingModeTags(OvID def) {
    return {{LinkDataType, CLSID_DataType_OvID},
            {InputControl, CLSID_InputControl_MultiButtonID},
            {ButtonsFillRow, 1},
            {InputDefaultId, def},
            {ListAddItem, "None"},
            {ListItemId, ClippingMode_None},
            {ListAddItem, "Domain"},
            {ListItemId, ClippingMode_Domain},
            {ListAddItem, "Frame"},
            {ListItemId, ClippingMode_Frame}};
}

Ref<Parameter> AskInputValue(Request *req, Input *in) {
    if (Parameter *fetched = req->GetInputData(in)) return Ref<Parameter>(fetched);
    if (!in->Link()) return in->ValueAt(req->GetInputTime(in));
    EvalOptions opt;
    opt.task = req->GetTask();
    return Evaluate(in->Link(), req->GetInputTime(in), opt);
}

double AskInputNumber(Request *req, Input *in, double fallback) {
    const Ref<Parameter> value = AskInputValue(req, in);
    const auto *n = dynamic_cast<const Number *>(value.Get());
    return n ? n->value : fallback;
}

OvID AskInputID(Request *req, Input *in, OvID fallback) {
    const Ref<Parameter> value = AskInputValue(req, in);
    const auto *id = dynamic_cast<const IDValue *>(value.Get());
    return id ? id->value : fallback;
}

ImgRectI GrownKeepingEndless(ImgRectI r, int dx, int dy) {
    auto move = [](int &side, int by) {
        if (!IsEndlessSide(side)) side += by;
    };
    move(r.x0, -dx), move(r.x1, dx), move(r.y0, -dy), move(r.y1, dy);
    return r;
}

} // namespace Orvane
