#include "host/flow/Parameter.h"

#include <cstring>

#include "host/flow/DataTypes.h"

namespace Orvane {

uint64_t HashDouble(double v) {
    if (v == 0.0) v = 0.0; // -0 and +0 hash alike, as they compare equal
    uint64_t bits;
    std::memcpy(&bits, &v, sizeof bits);
    return HashMix(0xcbf29ce484222325ull, bits);
}

uint64_t HashBytes(const void *data, size_t size) {
    uint64_t h = 0xcbf29ce484222325ull;
    const auto *p = static_cast<const unsigned char *>(data);
    for (size_t i = 0; i < size; ++i) h = (h ^ p[i]) * 0x100000001b3ull;
    return h;
}

Ref<Parameter> Parameter::Interpolate(const Parameter &other, double t) const {
    return t < 0.5 ? Ref<Parameter>(const_cast<Parameter *>(this)) : Ref<Parameter>(const_cast<Parameter *>(&other));
}

OvID Number::DataType() const { return CLSID_DataType_Number; }
bool Number::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Number *>(&other);
    return o && o->value == value;
}
uint64_t Number::Hash() const { return HashDouble(value); }
Ref<Parameter> Number::Copy() const { return MakeRef<Number>(value); }
Ref<Parameter> Number::Interpolate(const Parameter &other, double t) const {
    auto *o = dynamic_cast<const Number *>(&other);
    if (!o) return Parameter::Interpolate(other, t);
    return MakeRef<Number>(value + (o->value - value) * t);
}
bool Number::BlendsWith(const Parameter &other) const { return dynamic_cast<const Number *>(&other) != nullptr; }
Ref<Parameter> Number::WeightedSum(const Parameter *const *values, const double *weights, size_t count) const {
    double sum = 0.0;
    for (size_t i = 0; i < count; ++i) sum += weights[i] * static_cast<const Number *>(values[i])->value;
    return MakeRef<Number>(sum);
}

OvID Point::DataType() const { return CLSID_DataType_Point; }
ScriptVal Point::ToScript() const {
    ScriptVal t = ScriptVal::Table();
    t.Append(x);
    t.Append(y);
    return t;
}
bool Point::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Point *>(&other);
    return o && o->x == x && o->y == y;
}
uint64_t Point::Hash() const { return HashMix(HashDouble(x), HashDouble(y)); }
Ref<Parameter> Point::Copy() const { return MakeRef<Point>(x, y); }
Ref<Parameter> Point::Interpolate(const Parameter &other, double t) const {
    auto *o = dynamic_cast<const Point *>(&other);
    if (!o) return Parameter::Interpolate(other, t);
    return MakeRef<Point>(x + (o->x - x) * t, y + (o->y - y) * t);
}
bool Point::BlendsWith(const Parameter &other) const { return dynamic_cast<const Point *>(&other) != nullptr; }
Ref<Parameter> Point::WeightedSum(const Parameter *const *values, const double *weights, size_t count) const {
    double sx = 0.0, sy = 0.0;
    for (size_t i = 0; i < count; ++i) {
        const auto *p = static_cast<const Point *>(values[i]);
        sx += weights[i] * p->x;
        sy += weights[i] * p->y;
    }
    return MakeRef<Point>(sx, sy);
}

OvID Text::DataType() const { return CLSID_DataType_Text; }
bool Text::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Text *>(&other);
    return o && o->value == value;
}
uint64_t Text::Hash() const { return HashBytes(value.data(), value.size()); }
Ref<Parameter> Text::Copy() const { return MakeRef<Text>(value); }

OvID IDValue::DataType() const { return CLSID_DataType_OvID; }
bool IDValue::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const IDValue *>(&other);
    return o && o->value == value;
}
uint64_t IDValue::Hash() const { return HashBytes(value.Text(), std::strlen(value.Text())); }
Ref<Parameter> IDValue::Copy() const { return MakeRef<IDValue>(value); }

OvID ScriptValue::DataType() const { return CLSID_DataType_ScriptVal; }
bool ScriptValue::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const ScriptValue *>(&other);
    return o && o->value == value;
}
uint64_t ScriptValue::Hash() const {
    const std::string text = value.ToText();
    return HashBytes(text.data(), text.size());
}
Ref<Parameter> ScriptValue::Copy() const { return MakeRef<ScriptValue>(value); }

} // namespace Orvane
