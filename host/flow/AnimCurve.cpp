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
    // Smooth: cubic Hermite with Catmull-Rom tangents scaled to this span, written as weights of the (up to) four
    // keys involved, so that every kind that sums (numbers, points, polylines) takes this one path. A neighbour
    // that does not blend with the span's keys counts as absent: a flat end.
    if (!k0.value->BlendsWith(*k1.value)) return Blend(k0, k1, u);
    const Keyframe *kPrev = i0 > 0 && keys_[i0 - 1].value->BlendsWith(*k0.value) ? &keys_[i0 - 1] : nullptr;
    const Keyframe *kNext =
        i1 + 1 < keys_.size() && keys_[i1 + 1].value->BlendsWith(*k0.value) ? &keys_[i1 + 1] : nullptr;
    const double u2 = u * u, u3 = u2 * u;
    const double h00 = 2 * u3 - 3 * u2 + 1, h10 = u3 - 2 * u2 + u, h01 = -2 * u3 + 3 * u2, h11 = u3 - u2;
    // Tangents m0 = (v1 - vPrev) * a0 and m1 = (vNext - v0) * a1.
    const double a0 = kPrev ? span / (k1.time - kPrev->time) : 0.0;
    const double a1 = kNext ? span / (kNext->time - k0.time) : 0.0;
    const Parameter *values[4] = {k0.value.Get(), k1.value.Get(), nullptr, nullptr};
    double weights[4] = {h00 - h11 * a1, h01 + h10 * a0, 0.0, 0.0};
    size_t n = 2;
    if (kPrev) {
        values[n] = kPrev->value.Get();
        weights[n++] = -h10 * a0;
    }
    if (kNext) {
        values[n] = kNext->value.Get();
        weights[n++] = h11 * a1;
    }
    Ref<Parameter> v = k0.value->WeightedSum(values, weights, n);
    return v ? v : Blend(k0, k1, u);
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
