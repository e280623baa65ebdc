#pragma once
// AnimCurve: an input's value over time, as a list of keyframes.
//
// Between two keys the value follows the first key's interpolation:
//   Linear  straight line from key to key
//   Smooth  cubic Hermite through the keys, tangents from the neighbouring
//           keys (Catmull-Rom), flat at the ends
//   Hold    the first key's value until the next key
// Before the first key and after the last the curve holds the end values.
// Values that cannot blend (text, IDs) hold; so do polylines whose point
// counts differ: the earlier key's shape stays until the next key. Keys are
// kept sorted by time; a key at the time of an existing one replaces it.
//
// Thread safety: a curve is edited on the main thread and read by renders
// after; do not edit a curve while a render reads it.
#include <cmath>
#include <vector>

#include "host/flow/Parameter.h"

namespace Orvane {

enum class KeyInterp : uint8_t { Linear, Smooth, Hold };

struct Keyframe {
    double time;
    Ref<Parameter> value;
    KeyInterp interp = KeyInterp::Linear;
};

class ORVANE_API AnimCurve {
public:
    void SetKey(double time, Ref<Parameter> value, KeyInterp interp = KeyInterp::Linear);
    bool RemoveKey(double time);
    const std::vector<Keyframe> &Keys() const { return keys_; }
    bool Empty() const { return keys_.empty(); }

    /// The value at `time`; null when the curve has no key.
    Ref<Parameter> ValueAt(double time) const;

    /// Document form: Curve { { time, value }, { time, value, Interp = "Smooth" }, ... }.
    ScriptVal ToScript() const;
    /// Reads the document form; `makeValue` turns a key's value into a
    /// parameter of the input's type (null when it does not fit).
    template <class MakeValue> static bool FromScript(const ScriptVal &v, MakeValue &&makeValue, AnimCurve &out);

private:
    std::vector<Keyframe> keys_;
};

/// Interpolation names in documents.
ORVANE_API const char *KeyInterpName(KeyInterp interp);
ORVANE_API bool KeyInterpFromName(const std::string &name, KeyInterp &out);

template <class MakeValue> bool AnimCurve::FromScript(const ScriptVal &v, MakeValue &&makeValue, AnimCurve &out) {
    if (!v.IsTable() || v.ClassName() != "Curve") return false;
    AnimCurve curve;
    for (size_t i = 1; i <= v.ArrayLength(); ++i) {
        const ScriptVal *key = v.At(i);
        if (!key || !key->IsTable() || key->ArrayLength() < 2 || !key->At(1)->IsNumber() ||
            !std::isfinite(key->At(1)->AsNumber()))
            return false;
        Ref<Parameter> value = makeValue(*key->At(2));
        if (!value) return false;
        KeyInterp interp = KeyInterp::Linear;
        if (const ScriptVal *name = key->Find("Interp")) {
            if (!name->IsText() || !KeyInterpFromName(name->AsText(), interp)) return false;
        }
        curve.SetKey(key->At(1)->AsNumber(), std::move(value), interp);
    }
    if (curve.Empty()) return false;
    out = std::move(curve);
    return true;
}

} // namespace Orvane
