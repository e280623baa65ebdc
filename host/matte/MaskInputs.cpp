#include "host/matte/MaskInputs.h"

#include <algorithm>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"

namespace Orvane {

MaskInputs::MaskInputs(Operator &op, const char *name, const char *label, const char *page) {
    TagList where;
    if (page) {
        // The named page, added when the tool has none of that name yet.
        const auto &pages = op.Pages();
        const auto found =
            std::find_if(pages.begin(), pages.end(), [page](const PanelPage &p) { return p.name == page; });
        const int index =
            found != pages.end() ? static_cast<int>(found - pages.begin()) : op.AddControlPageTagList(page, {});
        where.Set({ControlPage, index});
    }
    auto with = [&where](TagList tags) {
        tags.Merge(where);
        return tags;
    };
    const std::string prefix = name;
    op.BeginControlNestTagList(label, (prefix + ".MaskNest").c_str(), true, where);
    mask_ = op.AddInputTagList(
        label, (prefix + ".Mask").c_str(),
        with({{LinkDataType, CLSID_DataType_Mask}, {InputPriority, PriorityMask}, {InputRequired, 0}}));
    inverted_ = op.AddInputTagList("Invert", (prefix + ".MaskInverted").c_str(),
                                   with({{LinkDataType, CLSID_DataType_Number},
                                         {InputControl, CLSID_InputControl_Checkbox},
                                         {InputDefault, 0.0},
                                         {InputMinAllowed, 0.0},
                                         {InputMaxAllowed, 1.0}}));
    op.EndControlNest();
}

Image *MaskInputs::GetMask(Request *req, bool *inverted) const {
    if (inverted) *inverted = req && inverted_ && req->GetInputNumber(inverted_, 0.0) != 0.0;
    return req && mask_ ? dynamic_cast<Image *>(req->GetInputData(mask_)) : nullptr;
}

} // namespace Orvane
