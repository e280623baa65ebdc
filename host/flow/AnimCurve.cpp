#include "host/flow/AnimCurve.h"

#include <algorithm>

namespace Orvane {

const char *KeyInterpName(KeyInterp interp) {
    switch (interp) {
    case KeyInterp::Smooth: return "Smooth";
    case KeyInterp::Hold: return "Hold";
    default: return "Linear";
    }
}

bool KeyInterpFromName(const std::string &name, KeyInterp &out) {
    for (KeyInterp k : {KeyInterp::Linear, KeyInterp::Smooth, KeyInterp::Hold})
        if (name == KeyInterpName(k)) {
            out = k;
            return true;
        }
    return false;
}

void AnimCurve::SetKey(double time, Ref<Parameter> value, KeyInterp interp) {
    auto it =
        std::lower_bound(keys_.begin(), keys_.end(), time, [](const Keyframe &k, double t) { return k.time < t; });
    if (it != keys_.end() && it->time == time) {
        it->value = std::move(value);
        it->interp = interp;
        return;
    }
    keys_.insert(it, Keyframe{time, std::move(value), interp});
}

bool AnimCurve::RemoveKey(double time) {
    auto it = std::find_if(keys_.begin(), keys_.end(), [time](const Keyframe &k) { return k.time == time; });
    if (it == keys_.end()) return false;
    keys_.erase(it);
    return true;
}

namespace {

/// k0's value blended toward k1's at u in [0, 1). Kinds that cannot blend
/// hand back one of the two values: the curve then holds k0's.
Ref<Parameter> Blend(const Keyframe &k0, const Keyframe &k1, double u) {
    Ref<Parameter> v = k0.value->Interpolate(*k1.value, u);
    return v.Get() == k1.value.Get() ? k0.value : v;
}

/// Hermite basis blend of four numbers at u in [0, 1] between p1 and p2.
double Hermite(double p1, double p2, double m1, double m2, double u) {
    const double u2 = u * u, u3 = u2 * u;
    return (2 * u3 - 3 * u2 + 1) * p1 + (u3 - 2 * u2 + u) * m1 + (-2 * u3 + 3 * u2) * p2 + (u3 - u2) * m2;
}

} // namespace

Ref<Parameter> AnimCurve::ValueAt(double time) const {
    if (keys_.empty()) return nullptr;
    if (time <= keys_.front().time) return keys_.front().value;
    if (time >= keys_.back().time) return keys_.back().value;
    auto next =
        std::upper_bound(keys_.begin(), keys_.end(), time, [](double t, const Keyframe &k) { return t < k.time; });
    const size_t i1 = static_cast<size_t>(next - keys_.begin()), i0 = i1 - 1;
    const Keyframe &k0 = keys_[i0], &k1 = keys_[i1];
    const double span = k1.time - k0.time;
    const double u = (time - k0.time) / span;
    switch (k0.interp) {
    case KeyInterp::Hold: return k0.value;
    case KeyInterp::Linear: return Blend(k0, k1, u);
    case KeyInterp::Smooth: break;
    }
    // Smooth: cubic Hermite per component, Catmull-Rom tangents scaled to this
    // span. Numbers and points are smooth; other kinds fall back to Interpolate.
    auto *n0 = dynamic_cast<const Number *>(k0.value.Get());
    auto *n1 = dynamic_cast<const Number *>(k1.value.Get());
    auto *p0 = dynamic_cast<const Point *>(k0.value.Get());
    auto *p1 = dynamic_cast<const Point *>(k1.value.Get());
    const Keyframe *kPrev = i0 > 0 ? &keys_[i0 - 1] : nullptr;
    const Keyframe *kNext = i1 + 1 < keys_.size() ? &keys_[i1 + 1] : nullptr;
    auto tangent = [&](double vPrev, double tPrev, double vNext, double tNext) {
        return (vNext - vPrev) / (tNext - tPrev) * span;
    };
    auto smooth1 = [&](auto get) {
        const double v0 = get(*k0.value), v1 = get(*k1.value);
        const double m0 = kPrev ? tangent(get(*kPrev->value), kPrev->time, v1, k1.time) : 0.0;
        const double m1 = kNext ? tangent(v0, k0.time, get(*kNext->value), kNext->time) : 0.0;
        return Hermite(v0, v1, m0, m1, u);
    };
    if (n0 && n1) {
        return MakeRef<Number>(smooth1([](const Parameter &p) { return static_cast<const Number &>(p).value; }));
    }
    if (p0 && p1) {
        const double x = smooth1([](const Parameter &p) { return static_cast<const Point &>(p).x; });
        const double y = smooth1([](const Parameter &p) { return static_cast<const Point &>(p).y; });
        return MakeRef<Point>(x, y);
    }
    return Blend(k0, k1, u);
}

ScriptVal AnimCurve::ToScript() const {
    ScriptVal curve = ScriptVal::Table("Curve");
    for (const Keyframe &k : keys_) {
        ScriptVal key = ScriptVal::Table();
        key.Append(k.time);
        key.Append(k.value->ToScript());
        if (k.interp != KeyInterp::Linear) key.Set("Interp", KeyInterpName(k.interp));
        curve.Append(std::move(key));
    }
    return curve;
}

} // namespace Orvane
