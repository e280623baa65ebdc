#include "host/flow/Link.h"

#include <unordered_set>

#include <algorithm>
#include <cmath>

#include "host/color/ColorCurvesTable.h"
#include "host/color/SplineCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Gradient.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/media/Clip.h"
#include "host/shape/PolyLine.h"

namespace Orvane {
namespace {

/// True when `op` is `target` or takes anything from it, directly or not:
/// linking target's input to op's output would close a loop.
bool DependsOn(const Operator *op, const Operator *target) {
    if (op == target) return true;
    std::vector<const Operator *> todo{op};
    std::unordered_set<const Operator *> seen;
    while (!todo.empty()) {
        const Operator *at = todo.back();
        todo.pop_back();
        if (!seen.insert(at).second) continue;
        for (const auto &in : at->Inputs()) {
            if (!in->Link()) continue;
            const Operator *up = in->Link()->Owner();
            if (up == target) return true;
            todo.push_back(up);
        }
    }
    return false;
}

} // namespace

Ref<Parameter> DefaultValueFor(OvID dataType, const TagList &tags) {
    if (dataType == CLSID_DataType_Number) return MakeRef<Number>(tags.GetDouble(InputDefault, 0.0));
    if (dataType == CLSID_DataType_Point)
        return MakeRef<Point>(tags.GetDouble(InputDefaultX, 0.0), tags.GetDouble(InputDefaultY, 0.0));
    if (dataType == CLSID_DataType_Text) return MakeRef<Text>(tags.GetText(InputDefaultText, ""));
    if (dataType == CLSID_DataType_OvID) {
        OvID def = tags.GetID(InputDefaultId);
        if (def.IsNull()) def = tags.GetID(ListItemId); // the first entry of the list
        return MakeRef<IDValue>(def);
    }
    if (dataType == CLSID_DataType_Gradient) return MakeRef<Gradient>();
    if (dataType == CLSID_DataType_ColorCurves) return MakeRef<ColorCurvesTable>();
    // A curve input is the identity unless its default names a flat curve.
    if (dataType == CLSID_DataType_LookUpTable)
        return tags.Has(InputDefault) ? SplineCurve::Flat(tags.GetDouble(InputDefault)) : MakeRef<SplineCurve>();
    if (dataType == CLSID_DataType_Clip) return MakeRef<Clip>(tags.GetText(InputDefaultText, ""));
    if (dataType == CLSID_DataType_ScriptVal) return MakeRef<ScriptValue>();
    if (PolyLine::IsPolyLineType(dataType)) return PolyLine::MakeOfType(dataType);
    return nullptr;
}

Ref<Parameter> ParameterFromScript(OvID dataType, const ScriptVal &v) {
    if (dataType == CLSID_DataType_Number) {
        if (v.IsNumber()) return MakeRef<Number>(v.AsNumber());
        if (v.IsBool()) return MakeRef<Number>(v.AsBool() ? 1.0 : 0.0);
        return nullptr;
    }
    if (dataType == CLSID_DataType_Point) {
        if (v.IsTable() && v.ArrayLength() == 2 && v.At(1)->IsNumber() && v.At(2)->IsNumber())
            return MakeRef<Point>(v.At(1)->AsNumber(), v.At(2)->AsNumber());
        return nullptr;
    }
    if (dataType == CLSID_DataType_Text) return v.IsText() ? MakeRef<Text>(v.AsText()) : nullptr;
    if (dataType == CLSID_DataType_OvID) return v.IsText() ? MakeRef<IDValue>(OvID(v.AsText())) : nullptr;
    if (dataType == CLSID_DataType_Gradient) return Gradient::FromScript(v);
    if (dataType == CLSID_DataType_ColorCurves) return ColorCurvesTable::FromScript(v);
    if (dataType == CLSID_DataType_LookUpTable) return SplineCurve::FromScript(v);
    if (dataType == CLSID_DataType_Clip) return v.IsText() ? MakeRef<Clip>(v.AsText()) : nullptr;
    if (dataType == CLSID_DataType_ScriptVal) return MakeRef<ScriptValue>(v);
    if (PolyLine::IsPolyLineType(dataType)) {
        std::string problem;
        return PolyLine::FromScript(dataType, v, problem);
    }
    // A data type a tool library registers as a parameter class reads its document form in its constructor.
    if (const Registry *row = ClassRegistry ? ClassRegistry->Find(dataType, RegFamilyDataType) : nullptr)
        return Ref<Parameter>::Adopt(dynamic_cast<Parameter *>(row->New(v, {})));
    return nullptr;
}

Input::Input(Operator *owner, std::string name, OvID id, const TagList &tags, int index, int page)
    : owner_(owner), name_(std::move(name)), id_(id), tags_(tags), index_(index), page_(page) {
    tags_.Persist();
    dataType_ = tags_.GetID(LinkDataType, CLSID_DataType_Number);
    defaultPriority_ = dataType_ == CLSID_DataType_Mask ? PriorityMask
                       : IsImageDataType(dataType_)     ? PriorityImage
                                                        : PriorityDefault;
    default_ = Conform(DefaultValueFor(dataType_, tags_));
    value_ = default_;
}

const char *Input::Label() const { return tags_.GetText(ControlLabel, name_.c_str()); }

bool Input::IsRequired() const {
    if (!IsImageDataType(dataType_)) return false;
    if (dataType_ == CLSID_DataType_Mask && Priority() <= PriorityMask && !tags_.Has(InputRequired)) return false;
    return tags_.GetLong(InputRequired, 1) != 0;
}

void Input::SetAttrsTagList(const TagList &tags) {
    tags_.Merge(tags);
    tags_.Persist();
}

void Input::SetChoices(const std::vector<std::string> &labels) {
    tags_.Remove(ListAddItem);
    tags_.Remove(ListItemId);
    for (const std::string &label : labels) tags_.Add({ListAddItem, label.c_str()});
    tags_.Persist();
}

Ref<Parameter> Input::Conform(Ref<Parameter> value) const {
    if (!value) return nullptr;
    if (IsImageDataType(dataType_)) return nullptr;
    if (value->DataType() != dataType_) return nullptr;
    const bool hasMin = tags_.Has(InputMinAllowed), hasMax = tags_.Has(InputMaxAllowed);
    const double lo = tags_.GetDouble(InputMinAllowed), hi = tags_.GetDouble(InputMaxAllowed);
    auto limit = [&](double v) {
        if (IsInteger()) v = std::round(v);
        if (hasMin && v < lo) v = lo;
        if (hasMax && v > hi) v = hi;
        return v;
    };
    if (auto *n = dynamic_cast<Number *>(value.Get())) {
        const double v = limit(n->value);
        if (v != n->value) return MakeRef<Number>(v);
    } else if (auto *p = dynamic_cast<Point *>(value.Get())) {
        const double x = limit(p->x), y = limit(p->y);
        if (x != p->x || y != p->y) return MakeRef<Point>(x, y);
    }
    return value;
}

bool Input::SetValue(Ref<Parameter> value) {
    Ref<Parameter> v = Conform(std::move(value));
    if (!v) return false;
    Disconnect();
    curve_.reset();
    value_ = std::move(v);
    Changed();
    return true;
}

void Input::Changed() {
    if (!Notifies() || !owner_) return;
    const double time = owner_->GetDoc() ? owner_->GetDoc()->RenderStart() : 0.0;
    Ref<Parameter> value = ValueAt(time);
    owner_->NotifyChanged(this, value.Get(), time, nullptr);
}

bool Input::SetCurve(AnimCurve curve) {
    if (curve.Empty() || IsImageDataType(dataType_) || !IsExternal()) return false;
    AnimCurve limited;
    for (const Keyframe &k : curve.Keys()) {
        Ref<Parameter> v = Conform(k.value);
        if (!v) return false;
        limited.SetKey(k.time, std::move(v), k.interp);
    }
    Disconnect();
    curve_ = std::make_unique<AnimCurve>(std::move(limited));
    Changed();
    return true;
}

bool Input::ConnectTo(Output *output, bool checkLoop) {
    if (!output || !IsExternal()) return false;
    const OvID from = output->DataType();
    const bool fits = from == dataType_ || (IsImageDataType(from) && IsImageDataType(dataType_)) ||
                      from == tags_.GetID(LinkSecondDataType);
    if (!fits || (checkLoop && DependsOn(output->Owner(), owner_))) return false;
    Disconnect();
    curve_.reset();
    link_ = output;
    output->consumers_.push_back(this);
    Changed();
    return true;
}

void Input::Disconnect() {
    unresolvedLink_.clear(); // a link to a tool this program lacks goes the same way
    if (!link_) return;
    auto &c = link_->consumers_;
    c.erase(std::remove(c.begin(), c.end(), this), c.end());
    link_ = nullptr;
}

void Input::ResetValue() {
    Disconnect();
    curve_.reset();
    value_ = default_;
    Changed();
}

bool Input::IsDefault() const {
    if (link_ || curve_) return false;
    if (!value_ || !default_) return value_.Get() == default_.Get();
    return value_->Equals(*default_);
}

Ref<Parameter> Input::ValueAt(double time) const {
    if (link_) return nullptr;
    if (curve_) return curve_->ValueAt(time);
    return value_;
}

uint64_t Input::ValueHash(double time) const {
    // A curve counts whole: a tool below may fetch this input at other times
    // than the one asked (SetInputTime), and its cached result must not
    // outlive an edit there.
    if (curve_ && !link_) {
        uint64_t h = 0xc0c0ull;
        for (const Keyframe &k : curve_->Keys())
            h = HashMix(HashMix(HashMix(h, HashDouble(k.time)), k.value->Hash()), static_cast<uint64_t>(k.interp));
        return h;
    }
    Ref<Parameter> v = ValueAt(time);
    return v ? v->Hash() : 0x51ab1e5ull;
}

Output::Output(Operator *owner, std::string name, OvID id, const TagList &tags, int index)
    : owner_(owner), name_(std::move(name)), id_(id), tags_(tags), index_(index) {
    tags_.Persist();
    dataType_ = tags_.GetID(LinkDataType, CLSID_DataType_Image);
}

} // namespace Orvane
