#include "operators/modifier/VariableFields.h"

#include <random>

#include <fmt/format.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"

namespace Orvane {

void VariableFields::Add(Operator *op, const char *kind, std::vector<Input *> inputs, int page) {
    kind_ = kind;
    inputs_ = std::move(inputs);
    TagList onPage;
    if (page >= 0) onPage.Set({ControlPage, page});
    op->BeginControlNestTagList(fmt::format("{} Controls", kind).c_str(), fmt::format("{}Controls", kind).c_str(),
                                false, onPage);
    for (size_t k = 1; k <= inputs_.size(); ++k) {
        TagList name{{LinkDataType, CLSID_DataType_Text},
                     {InputControl, CLSID_InputControl_TextEdit},
                     {InputDefaultText, ""},
                     {InputExternal, 0},
                     {InputNotify, 1}};
        TagList show{{LinkDataType, CLSID_DataType_Number},
                     {InputControl, CLSID_InputControl_Checkbox},
                     {InputMinAllowed, 0.0},
                     {InputMaxAllowed, 1.0},
                     {InputDefault, 1.0},
                     {InputExternal, 0},
                     {InputNotify, 1},
                     {InputPassive, 1}};
        name.Merge(onPage);
        show.Merge(onPage);
        names_.push_back(op->AddInputTagList(fmt::format("Name for {} {}", kind, k).c_str(),
                                             fmt::format("Namefor{}{}", kind, k).c_str(), name));
        shows_.push_back(op->AddInputTagList(fmt::format("Show {} {}", kind, k).c_str(),
                                             fmt::format("Show{}{}", kind, k).c_str(), show));
    }
    op->EndControlNest();
}

bool VariableFields::Notify(const Input *in, const Parameter *param) const {
    for (size_t k = 0; k < inputs_.size(); ++k) {
        if (in == shows_[k]) {
            if (const auto *n = dynamic_cast<const Number *>(param))
                inputs_[k]->SetAttrsTagList({{ControlVisible, n->value >= 0.5 ? 1 : 0}});
            return true;
        }
        if (in == names_[k]) {
            if (const auto *text = dynamic_cast<const Text *>(param)) {
                std::string label = fmt::format("{} In {}", kind_, k + 1);
                if (!text->value.empty()) label += ": " + text->value;
                inputs_[k]->SetAttrsTagList({{ControlLabel, label.c_str()}});
            }
            return true;
        }
    }
    return false;
}

std::vector<std::string> VariableFields::Names(const Request *req) const {
    std::vector<std::string> names;
    for (const Input *in : names_) names.push_back(TextOf(req, in));
    return names;
}

std::string TextOf(const Request *req, const Input *in) {
    const auto *text = dynamic_cast<const Text *>(req->GetInputData(in));
    return text ? text->value : std::string();
}

double NewRandomSeed(double current) {
    constexpr int kSeeds = 32768;
    std::random_device device;
    int seed = static_cast<int>(device() % kSeeds);
    if (seed == static_cast<int>(current)) seed = (seed + 1) % kSeeds;
    return seed;
}

} // namespace Orvane
