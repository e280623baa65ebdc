#pragma once
// Parameter: a value that travels on a link (number, point, text, ID, image,
// gradient, ...). Parameters are reference counted; a value handed on
// unchanged is Use()d, never copied.
//
// Every kind converts to and from its document form (ScriptVal), compares for
// equality (defaults, cache validity) and reports a content hash (cache keys).
//
// Thread safety: a parameter is immutable once published on a link or in a
// request; build it fully before handing it over.
#include <cstdint>
#include <string>

#include "host/core/Object.h"
#include "host/core/OvID.h"
#include "host/core/ScriptVal.h"

namespace Orvane {

class ORVANE_API Parameter : public RefObject {
public:
    /// The data type class of this value (CLSID_DataType_*).
    virtual OvID DataType() const = 0;
    /// Document form of the value.
    virtual ScriptVal ToScript() const = 0;
    virtual bool Equals(const Parameter &other) const = 0;
    virtual uint64_t Hash() const = 0;
    /// A new parameter with the same value.
    virtual Ref<Parameter> Copy() const = 0;
    /// The value blended with `other` (same type) at weight t in [0, 1], for
    /// animation; kinds that cannot blend return the nearer of the two.
    virtual Ref<Parameter> Interpolate(const Parameter &other, double t) const;
    /// True when WeightedSum can take this value together with `other`.
    virtual bool BlendsWith(const Parameter &) const { return false; }
    /// weights[0] x values[0] + ... for values that BlendsWith this one, for
    /// smooth animation; what does not blend (flags, marks) comes from this
    /// value. Null for kinds that do not sum.
    virtual Ref<Parameter> WeightedSum(const Parameter *const *, const double *, size_t) const { return nullptr; }
};

class ORVANE_API Number : public Parameter {
public:
    explicit Number(double v = 0.0) : value(v) {}
    double value;

    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(value); }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    Ref<Parameter> Interpolate(const Parameter &other, double t) const override;
    bool BlendsWith(const Parameter &other) const override;
    Ref<Parameter> WeightedSum(const Parameter *const *values, const double *weights, size_t count) const override;
    size_t SizeOf() const override { return sizeof(*this); }
    operator double() const { return value; }
};

class ORVANE_API Point : public Parameter {
public:
    Point(double px = 0.0, double py = 0.0) : x(px), y(py) {}
    double x, y;

    OvID DataType() const override;
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    Ref<Parameter> Interpolate(const Parameter &other, double t) const override;
    bool BlendsWith(const Parameter &other) const override;
    Ref<Parameter> WeightedSum(const Parameter *const *values, const double *weights, size_t count) const override;
    size_t SizeOf() const override { return sizeof(*this); }
};

class ORVANE_API Text : public Parameter {
public:
    explicit Text(std::string v = {}) : value(std::move(v)) {}
    std::string value;

    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(value); }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override { return sizeof(*this) + value.capacity(); }
};

/// A value that is an ID: list choices by ID, clipping modes, gradient types.
class ORVANE_API IDValue : public Parameter {
public:
    explicit IDValue(OvID v = OvID()) : value(v) {}
    OvID value;

    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(value.Text()); }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override { return sizeof(*this); }
};

/// A value that is a script value, usually a table: list controls whose
/// value is a table of entries (a layer order), saved as it stands.
class ORVANE_API ScriptValue : public Parameter {
public:
    explicit ScriptValue(ScriptVal v = ScriptVal::Table()) : value(std::move(v)) {}
    ScriptVal value;

    OvID DataType() const override;
    ScriptVal ToScript() const override { return value; }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override { return sizeof(*this); }
};

/// Mixes a value into a running 64-bit hash.
inline uint64_t HashMix(uint64_t h, uint64_t v) {
    h ^= v + 0x9e3779b97f4a7c15ull + (h << 6) + (h >> 2);
    return h;
}
ORVANE_API uint64_t HashDouble(double v);
ORVANE_API uint64_t HashBytes(const void *data, size_t size);

} // namespace Orvane
