// The point steps of MatteSteps.h: spill, fringe, invert, post-multiply,
// in-fill and levels. Each formula is written once, on the pixel kinds of
// MatteRows.h, and runs on the rows and on the canvas colour alike.
#include "host/matte/MatteSteps.h"

#include <algorithm>
#include <cmath>

#include "host/color/FastPow.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/matte/MatteRows.h"

namespace Orvane {
namespace matterows {

bool Aborted(const Request *req, const Image &img) {
    return img.CheckAbort() || (req && req->GetTask() && req->GetTask()->IsAborted());
}

bool PrepareRows(Image &img) {
    if (!img.DownloadGPUMem()) return false;
    if (img.IsNoData() || img.DataWindow().IsNull()) return true;
    if (!img.HasScanLineData() && !img.AllocScanLineData()) return false;
    img.SetGPUMem(nullptr, false);
    return true;
}

void SetCanvasResult(Image &img, const FltPixel &result) {
    if (img.IsMask())
        img.SetCanvasColorFltChan(3, result.A);
    else
        img.SetCanvasColor(result);
}

} // namespace matterows

namespace mattesteps {

using namespace matterows;

bool IsChannel(int c) { return c >= MatteRed && c <= MatteAlpha; }

// ---- spill ----

/// The most the key channel may hold, made of the two other channels.
float SpillLimit(int method, float a, float b) {
    const float lo = std::min(a, b), hi = std::max(a, b);
    switch (method) {
    case SpillRare: return hi;
    case SpillMedium: return 0.5f * (a + b);
    case SpillWellDone: return lo;
    default: return std::max(0.f, 0.5f * (3.f * lo - hi));
    }
}

/// The spill formula on a span. The limit is linear in the channels, so it
/// holds the same in 16-bit units as in float.
template <class P> void SpillSpan(P *px, int n, int key, int method, float amount) {
    const auto k = ChannelOf<P>(key), a = ChannelOf<P>(key == 0 ? 1 : 0), b = ChannelOf<P>(key == 2 ? 1 : 2);
    for (int i = 0; i < n; ++i) {
        const float v = Val(px[i].*k);
        const float over = std::max(0.f, v - SpillLimit(method, Val(px[i].*a), Val(px[i].*b)));
        Put(px[i].*k, std::max(0.f, v - amount * over));
    }
}

// ---- fringe ----

struct Fringe {
    float shape;
    float shift[3];
    /// Colours one pixel where the edge matte is e.
    template <class P> void Apply(P &p, float e) const {
        e = std::clamp(e, 0.f, 1.f);
        const float w = 4.f * e * (1.f - e), gain = 1.f + w * (shape - 1.f);
        for (int c = 0; c < 3; ++c) {
            const auto ch = ChannelOf<P>(c);
            Put(p.*ch, Val(p.*ch) * gain + w * shift[c] * kOne<P>);
        }
    }
};

bool DoFringeOf(Request *req, Image *img, const Image *edge, bool floatForm, double shape, double redCyan,
                double greenMagenta, double blueYellow) {
    if (!img || img->IsFloat() != floatForm) return false;
    const Fringe f{static_cast<float>(shape),
                   {static_cast<float>(redCyan), static_cast<float>(greenMagenta), static_cast<float>(blueYellow)}};
    if (!edge || !edge->DownloadGPUMem()) return false;
    if (img->IsMask()) return true; // no colour to change
    return StepBy(req, *img, *edge, [&f](auto &p, float e) { f.Apply(p, e); });
}

// ---- curves on one channel ----

/// Contract (c < 0) or expand (c > 0) a value, c in [-1, 1]: at c = 1 every
/// value above 0 becomes 1, at c = -1 every value below 1 becomes 0.
float ContractExpand(float a, float c) {
    if (c > 0.f) return c >= 1.f ? (a > 0.f ? 1.f : a) : std::min(1.f, a / (1.f - c));
    if (c < 0.f) return c <= -1.f ? (a < 1.f ? 0.f : a) : std::max(0.f, (a + c) / (1.f + c));
    return a;
}

/// Runs curve(values, n), a map of one channel over arrays of values in 0..1
/// units, on that channel of every pixel and of the canvas.
template <class Curve> bool ApplyChannelCurve(Request *req, Image *img, int channel, const Curve &curve) {
    if (!img || !IsChannel(channel)) return false;
    const int c = StoredChannel(*img, channel);
    const bool ok = Walk(req, *img, [&](auto *px, int n, int, int, RowScratch &s) {
        using P = std::remove_pointer_t<decltype(px)>;
        const auto ch = ChannelOf<P>(c);
        constexpr float one = kOne<P>, toUnit = 1.f / kOne<P>;
        s.values.resize(n);
        for (int i = 0; i < n; ++i) s.values[i] = Val(px[i].*ch) * toUnit;
        curve(s.values.data(), n);
        for (int i = 0; i < n; ++i) Put(px[i].*ch, s.values[i] * one);
    });
    if (!ok) return false;
    float v = img->GetCanvasColorFltChan(c);
    curve(&v, 1);
    img->SetCanvasColorFltChan(c, v);
    return true;
}

/// Levels (thresholds, contrast, gamma) on values in 0..1 units.
struct LevelsCurve {
    float low = 0.f, high = 1.f, contrast = 0.f, invGamma = 1.f;

    explicit LevelsCurve(const TagList &tags)
        : low(static_cast<float>(tags.GetDouble(MatteLevelsLow, 0.0))),
          high(static_cast<float>(tags.GetDouble(MatteLevelsHigh, 1.0))) {
        const double c = tags.GetDouble(MatteLevelsContrast, 0.0), g = tags.GetDouble(MatteLevelsGamma, 1.0);
        contrast = std::isnan(c) ? 0.f : static_cast<float>(std::clamp(c, -1.0, 1.0));
        // Gammas at or below 0 (and not-a-number) would not be a curve: held to a small positive value.
        invGamma = static_cast<float>(1.0 / (g > 1e-5 ? g : std::isnan(g) ? 1.0 : 1e-5));
    }

    void operator()(float *v, int n) const {
        const float scale = high > low ? 1.f / (high - low) : 0.f;
        for (int i = 0; i < n; ++i) {
            const float a1 = high > low ? std::clamp((v[i] - low) * scale, 0.f, 1.f) : (v[i] >= high ? 1.f : 0.f);
            v[i] = ContractExpand(a1, contrast);
        }
        if (invGamma != 1.f) PowAbsSigned(v, invGamma, v, n);
    }
};

bool DoLevelsOf(Request *req, Image *img, const TagList &tags, bool floatForm) {
    if (!img || img->IsFloat() != floatForm) return false;
    return ApplyChannelCurve(req, img, static_cast<int>(tags.GetLong(MatteLevelsChannel, MatteAlpha)),
                             LevelsCurve(tags));
}

} // namespace mattesteps

bool MatteCore_DoSpill(Request *req, Image *img, const ChromaValues &chroma) {
    using namespace mattesteps;
    if (!img) return false;
    if (img->IsMask()) return true; // no colour to change
    // The key channel counts from blue: 0 blue, 1 green, 2 red.
    const int key = 2 - std::clamp(chroma.keyChannel, 0, 2), method = std::clamp(chroma.method, 0, 3);
    const float amount = chroma.amount > 0.0 ? static_cast<float>(chroma.amount) : 0.f; // also NaN
    return PointStep(req, *img, [&](auto *px, int n) { SpillSpan(px, n, key, method, amount); });
}

bool MatteCore_DoFringe(Request *req, Image *img, const Image *edge, double shape, double redCyan, double greenMagenta,
                        double blueYellow) {
    using namespace mattesteps;
    return DoFringeOf(req, img, edge, false, shape, redCyan, greenMagenta, blueYellow);
}

bool MatteCore_DoFringeFlt(Request *req, Image *img, const Image *edge, double shape, double redCyan,
                           double greenMagenta, double blueYellow) {
    using namespace mattesteps;
    return DoFringeOf(req, img, edge, true, shape, redCyan, greenMagenta, blueYellow);
}

bool MatteCore_DoInvert(Request *req, Image *img, int channel) {
    using namespace mattesteps;
    return ApplyChannelCurve(req, img, channel, [](float *v, int n) {
        for (int i = 0; i < n; ++i) v[i] = 1.f - v[i];
    });
}

bool MatteCore_DoPostMultiply(Request *req, Image *img) {
    using namespace mattesteps;
    if (!img) return false;
    if (img->IsMask()) return true; // no colour to multiply
    return PointStep(req, *img, [](auto *px, int n) {
        using P = std::remove_pointer_t<decltype(px)>;
        constexpr float toUnit = 1.f / kOne<P>;
        for (int i = 0; i < n; ++i) {
            const float a = Val(px[i].A) * toUnit;
            Put(px[i].R, Val(px[i].R) * a);
            Put(px[i].G, Val(px[i].G) * a);
            Put(px[i].B, Val(px[i].B) * a);
        }
    });
}

bool MatteCore_DoInFill(Request *req, Image *img, double amount, int channel) {
    using namespace mattesteps;
    if (!img || !IsChannel(channel)) return false;
    if (!(amount > 0.0 || amount < 0.0)) return true; // 0 (or not a number): nothing to do
    const float c = static_cast<float>(std::clamp(amount, -1.0, 1.0));
    return ApplyChannelCurve(req, img, channel, [c](float *v, int n) {
        for (int i = 0; i < n; ++i) v[i] = ContractExpand(v[i], c);
    });
}

bool DoLevels(Request *req, Image *img, const TagList &tags) {
    using namespace mattesteps;
    return DoLevelsOf(req, img, tags, false);
}

bool DoLevelsFlt(Request *req, Image *img, const TagList &tags) {
    using namespace mattesteps;
    return DoLevelsOf(req, img, tags, true);
}

} // namespace Orvane
