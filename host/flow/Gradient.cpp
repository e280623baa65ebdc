#include "host/flow/Gradient.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <string_view>

#include "host/color/ColorSpace.h"
#include "host/flow/DataTypes.h"

namespace Orvane {

namespace gradient_impl {
namespace {

// A string_view, as a bare literal would also match the ScriptVal key overloads.
constexpr std::string_view kColorsKey = "Colors";

// Hue blend the shorter way round; a hue difference of exactly half a turn
// goes towards increasing hue. The result may leave [0, 1); SpaceToRGB wraps.
inline float BlendHue(float h0, float h1, float t) {
    float d = h1 - h0;
    if (d > 0.5f)
        d -= 1.0f;
    else if (d <= -0.5f)
        d += 1.0f;
    return h0 + d * t;
}

// Blends two (hue, x, y) triples whose saturation sits at `satIndex`.
inline void BlendHueSpace(const float c0[3], const float c1[3], int satIndex, float t, float out[3]) {
    float h0 = c0[0], h1 = c1[0];
    // A grey's hue means nothing; borrow the other end's.
    if (c0[satIndex] == 0.0f) h0 = h1;
    if (c1[satIndex] == 0.0f) h1 = h0;
    out[0] = BlendHue(h0, h1, t);
    for (int i = 1; i < 3; ++i) out[i] = c0[i] + (c1[i] - c0[i]) * t;
}

// A float colour component as a document number: the shortest decimal that
// reads back to the same float (0.1f is written 0.1, not 0.100000001490116).
double DocNumber(float f) {
    char buf[32];
    auto res = std::to_chars(buf, buf + sizeof buf, f);
    double d = f;
    if (res.ec == std::errc()) {
        double parsed;
        auto back = std::from_chars(buf, res.ptr, parsed);
        if (back.ec == std::errc() && static_cast<float>(parsed) == f) d = parsed;
    }
    return d;
}

ScriptVal ColorToScript(const GradientStop &s) {
    ScriptVal c = ScriptVal::Table();
    c.Append(DocNumber(s.r));
    c.Append(DocNumber(s.g));
    c.Append(DocNumber(s.b));
    c.Append(DocNumber(s.a));
    return c;
}

// Reads { r, g, b [, a] } into `stop`; false when malformed.
bool ColorFromScript(const ScriptVal &v, GradientStop &stop) {
    if (!v.IsTable() || !v.ClassName().empty()) return false;
    size_t n = v.Size();
    if ((n != 3 && n != 4) || v.ArrayLength() != n) return false;
    float c[4] = {0.0f, 0.0f, 0.0f, 1.0f};
    for (size_t i = 0; i < n; ++i) {
        const ScriptVal *x = v.At(i + 1);
        if (!x || !x->IsNumber()) return false;
        c[i] = static_cast<float>(x->AsNumber());
    }
    stop.r = c[0], stop.g = c[1], stop.b = c[2], stop.a = c[3];
    return true;
}

bool SameStop(const GradientStop &x, const GradientStop &y) {
    return x.position == y.position && x.r == y.r && x.g == y.g && x.b == y.b && x.a == y.a;
}

} // namespace
} // namespace gradient_impl

Gradient::Gradient() : Gradient({{0.0, 0.0f, 0.0f, 0.0f, 1.0f}, {1.0, 1.0f, 1.0f, 1.0f, 1.0f}}) {}

Gradient::Gradient(std::vector<GradientStop> stops) { SetStops(std::move(stops)); }

void Gradient::SetStops(std::vector<GradientStop> stops) {
    std::erase_if(stops, [](const GradientStop &s) { return !std::isfinite(s.position); });
    std::stable_sort(stops.begin(), stops.end(),
                     [](const GradientStop &x, const GradientStop &y) { return x.position < y.position; });
    stops_ = std::move(stops);
    forms_.resize(stops_.size());
    for (size_t i = 0; i < stops_.size(); ++i) {
        const float rgb[3] = {stops_[i].r, stops_[i].g, stops_[i].b};
        RGBToSpace(ColorSpaceType::HLS, rgb, forms_[i].hls);
        RGBToSpace(ColorSpaceType::HSV, rgb, forms_[i].hsv);
        RGBToSpace(ColorSpaceType::LAB, rgb, forms_[i].lab);
    }
}

void Gradient::QuickEvaluate(double position, float &r, float &g, float &b, float &a, int colorSpace) const {
    const size_t n = stops_.size();
    if (n == 0) {
        r = g = b = a = 0.0f;
        return;
    }
    const GradientStop *s = stops_.data();
    // Before the first stop, or NaN.
    if (!(position >= s[0].position)) {
        r = s[0].r, g = s[0].g, b = s[0].b, a = s[0].a;
        return;
    }
    // Find lo = the last stop at or before `position`; hi = lo + 1 is past it.
    size_t lo = 0, hi = n;
    while (hi - lo > 1) {
        size_t mid = lo + (hi - lo) / 2;
        if (s[mid].position <= position)
            lo = mid;
        else
            hi = mid;
    }
    const GradientStop &s0 = s[lo];
    if (hi == n || position == s0.position) {
        r = s0.r, g = s0.g, b = s0.b, a = s0.a;
        return;
    }
    const GradientStop &s1 = s[hi];
    // s0.position <= position < s1.position, so the span is positive.
    const float t = static_cast<float>((position - s0.position) / (s1.position - s0.position));
    a = s0.a + (s1.a - s0.a) * t;

    float blended[3], rgb[3];
    ColorSpaceType space;
    switch (static_cast<ColorSpaceType>(colorSpace)) {
    case ColorSpaceType::HLS:
        space = ColorSpaceType::HLS;
        gradient_impl::BlendHueSpace(forms_[lo].hls, forms_[hi].hls, 2, t, blended);
        break;
    case ColorSpaceType::HSV:
        space = ColorSpaceType::HSV;
        gradient_impl::BlendHueSpace(forms_[lo].hsv, forms_[hi].hsv, 1, t, blended);
        break;
    case ColorSpaceType::LAB:
        space = ColorSpaceType::LAB;
        for (int i = 0; i < 3; ++i) blended[i] = forms_[lo].lab[i] + (forms_[hi].lab[i] - forms_[lo].lab[i]) * t;
        break;
    default:
        r = s0.r + (s1.r - s0.r) * t;
        g = s0.g + (s1.g - s0.g) * t;
        b = s0.b + (s1.b - s0.b) * t;
        return;
    }
    SpaceToRGB(space, blended, rgb);
    r = rgb[0], g = rgb[1], b = rgb[2];
}

bool Gradient::IsOpaque() const {
    return !stops_.empty() &&
           std::all_of(stops_.begin(), stops_.end(), [](const GradientStop &s) { return s.a >= 1.0f; });
}

OvID Gradient::DataType() const { return CLSID_DataType_Gradient; }

ScriptVal Gradient::ToScript() const {
    ScriptVal colors = ScriptVal::Table();
    for (size_t i = 0; i < stops_.size();) {
        size_t end = i + 1;
        while (end < stops_.size() && stops_[end].position == stops_[i].position) ++end;
        if (end - i == 1) {
            colors.Set(ScriptVal(stops_[i].position), gradient_impl::ColorToScript(stops_[i]));
        } else {
            ScriptVal list = ScriptVal::Table();
            for (size_t k = i; k < end; ++k) list.Append(gradient_impl::ColorToScript(stops_[k]));
            colors.Set(ScriptVal(stops_[i].position), std::move(list));
        }
        i = end;
    }
    ScriptVal v = ScriptVal::Table("Gradient");
    v.Set(gradient_impl::kColorsKey, std::move(colors));
    return v;
}

Ref<Gradient> Gradient::FromScript(const ScriptVal &value) {
    if (!value.IsTable()) return nullptr;
    if (!value.ClassName().empty() && value.ClassName() != "Gradient") return nullptr;
    const ScriptVal *colors = value.Find(gradient_impl::kColorsKey);
    if (!colors || !colors->IsTable() || !colors->ClassName().empty()) return nullptr;

    std::vector<GradientStop> stops;
    stops.reserve(colors->Size());
    for (const auto &[key, val] : colors->Entries()) {
        if (!key.IsNumber() || !std::isfinite(key.AsNumber())) return nullptr;
        GradientStop stop;
        stop.position = key.AsNumber();
        const ScriptVal *first = val.IsTable() ? val.At(1) : nullptr;
        if (first && first->IsTable()) {
            // Several stops at one position, in order.
            if (!val.ClassName().empty() || val.ArrayLength() != val.Size()) return nullptr;
            for (const auto &entry : val.Entries()) {
                if (!gradient_impl::ColorFromScript(entry.second, stop)) return nullptr;
                stops.push_back(stop);
            }
        } else {
            if (!gradient_impl::ColorFromScript(val, stop)) return nullptr;
            stops.push_back(stop);
        }
    }
    return MakeRef<Gradient>(std::move(stops));
}

bool Gradient::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Gradient *>(&other);
    return o && std::equal(stops_.begin(), stops_.end(), o->stops_.begin(), o->stops_.end(), gradient_impl::SameStop);
}

uint64_t Gradient::Hash() const {
    uint64_t h = HashMix(0x67726164ull, stops_.size());
    for (const GradientStop &s : stops_) {
        h = HashMix(h, HashDouble(s.position));
        h = HashMix(h, HashDouble(s.r));
        h = HashMix(h, HashDouble(s.g));
        h = HashMix(h, HashDouble(s.b));
        h = HashMix(h, HashDouble(s.a));
    }
    return h;
}

Ref<Parameter> Gradient::Copy() const { return MakeRef<Gradient>(stops_); }

Ref<Parameter> Gradient::Interpolate(const Parameter &other, double t) const {
    auto *o = dynamic_cast<const Gradient *>(&other);
    if (!o || o->stops_.size() != stops_.size()) return Parameter::Interpolate(other, t);
    std::vector<GradientStop> blended(stops_);
    for (size_t i = 0; i < blended.size(); ++i) {
        const GradientStop &x = stops_[i], &y = o->stops_[i];
        if (x.position != y.position) return Parameter::Interpolate(other, t);
        blended[i].r = static_cast<float>(x.r + (y.r - x.r) * t);
        blended[i].g = static_cast<float>(x.g + (y.g - x.g) * t);
        blended[i].b = static_cast<float>(x.b + (y.b - x.b) * t);
        blended[i].a = static_cast<float>(x.a + (y.a - x.a) * t);
    }
    return MakeRef<Gradient>(std::move(blended));
}

size_t Gradient::SizeOf() const {
    return sizeof(*this) + stops_.capacity() * sizeof(GradientStop) + forms_.capacity() * sizeof(SpaceForms);
}

} // namespace Orvane
