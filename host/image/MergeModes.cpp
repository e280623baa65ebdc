#include "host/image/MergeModes.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <cstring>
#include <limits>
#include <memory>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/MergeKernelParams.h"

namespace Orvane {
namespace mergemodes {

/// Pixels worked on at a time: four float blocks of this size stay in the
/// first-level cache.
constexpr int kBlock = 256;

/// The constants of one call (MergeSettings::Hc and friends), in float.
struct Consts {
    float hc, kk, fa, blend;
    bool doBlend, allChannels;
    float on[4]; ///< 1 where the merge's channel is taken, 0 where the background's is kept
};

Consts ConstsOf(const MergeSettings &s) {
    Consts k;
    k.hc = s.Hc();
    k.kk = s.Kk();
    k.fa = s.Fa();
    k.blend = s.blend;
    k.doBlend = s.blend != 1.f;
    k.allChannels = s.AllChannels();
    for (int c = 0; c < 4; ++c) k.on[c] = s.channels[c] ? 1.f : 0.f;
    return k;
}

// ---- the Normal mode's operators ----

template <int Op> inline void NormalPx(const Consts &k, const float *f, const float *b, float *o) {
    const float as = f[3], ab = b[3];
    const float yc = 1.f - k.hc * as, ya = 1.f - k.kk * as;
    if constexpr (Op == MrgOver) {
        for (int c = 0; c < 3; ++c) o[c] = f[c] + yc * b[c];
        o[3] = k.fa * as + ya * ab;
    } else if constexpr (Op == MrgIn) {
        for (int c = 0; c < 3; ++c) o[c] = ab * f[c];
        o[3] = k.fa * ab * as;
    } else if constexpr (Op == MrgHeldOut) {
        const float x = 1.f - ab;
        for (int c = 0; c < 3; ++c) o[c] = x * f[c];
        o[3] = k.fa * x * as;
    } else if constexpr (Op == MrgReplace) {
        for (int c = 0; c < 3; ++c) o[c] = f[c];
        o[3] = k.fa * as;
        (void)yc, (void)ya, (void)ab;
    } else if constexpr (Op == MrgAtop) {
        for (int c = 0; c < 3; ++c) o[c] = ab * f[c] + yc * b[c];
        o[3] = k.fa * ab * as + ya * ab;
    } else {
        const float x = 1.f - ab;
        for (int c = 0; c < 3; ++c) o[c] = x * f[c] + yc * b[c];
        o[3] = k.fa * x * as + ya * ab;
    }
}

// ---- the other modes: cs (1 - ab) + cb (1 - hc as) + P ----

inline float ScreenOf(float x, float y) { return x + y - x * y; }
inline float HardLightOf(float cb, float cs) { return cs <= 0.5f ? cb * (2.f * cs) : ScreenOf(cb, 2.f * cs - 1.f); }
inline float SoftLightOf(float cb, float cs) {
    if (cs <= 0.5f) return cb - (1.f - 2.f * cs) * cb * (1.f - cb);
    const float d = cb <= 0.25f ? ((16.f * cb - 12.f) * cb + 4.f) * cb : std::sqrt(cb);
    return cb + (2.f * cs - 1.f) * (d - cb);
}
inline float ColorDodgeOf(float cb, float cs) {
    if (cb == 0.f) return 0.f;
    if (cs >= 1.f) return 1.f;
    return std::min(1.f, cb / (1.f - cs));
}
inline float ColorBurnOf(float cb, float cs) {
    if (cb >= 1.f) return 1.f;
    if (cs <= 0.f) return 0.f;
    return 1.f - std::min(1.f, (1.f - cb) / cs);
}

// Luminance weights of the non-separable modes (Rec. 709).
constexpr float kLumR = 0.2126f, kLumG = 0.7152f, kLumB = 0.0722f;
inline float LumOf(const float *c) { return kLumR * c[0] + kLumG * c[1] + kLumB * c[2]; }
/// Brings a colour with a negative channel back to the gamut along the line
/// to its luminance; values above 1 stay (float images are not clipped).
inline void ClipColor(float *c) {
    const float l = LumOf(c);
    const float n = std::min(std::min(c[0], c[1]), c[2]);
    if (!(n < 0.f)) return;
    if (l <= 0.f) {
        c[0] = c[1] = c[2] = 0.f;
        return;
    }
    const float t = l / (l - n);
    for (int i = 0; i < 3; ++i) c[i] = l + (c[i] - l) * t;
}
inline void SetLum(float *c, float l) {
    const float d = l - LumOf(c);
    for (int i = 0; i < 3; ++i) c[i] += d;
    ClipColor(c);
}
inline float SatOf(const float *c) {
    return std::max(std::max(c[0], c[1]), c[2]) - std::min(std::min(c[0], c[1]), c[2]);
}
inline void SetSat(float *c, float s) {
    const float mx = std::max(std::max(c[0], c[1]), c[2]), mn = std::min(std::min(c[0], c[1]), c[2]);
    for (int i = 0; i < 3; ++i) {
        if (!(mx > mn))
            c[i] = 0.f;
        else if (c[i] >= mx)
            c[i] = s;
        else if (c[i] <= mn)
            c[i] = 0.f;
        else
            c[i] = (c[i] - mn) * s / (mx - mn);
    }
}

/// The mode's own term P (three channels) from premultiplied cs, cb.
template <int Mode> inline void TermOf(const float *f, const float *b, float as, float ab, float *p) {
    if constexpr (Mode == MrgScreen) {
        for (int c = 0; c < 3; ++c) p[c] = as * b[c] + ab * f[c] - f[c] * b[c];
    } else if constexpr (Mode == MrgMultiply) {
        for (int c = 0; c < 3; ++c) p[c] = f[c] * b[c];
    } else if constexpr (Mode == MrgDarken) {
        for (int c = 0; c < 3; ++c) p[c] = std::min(as * b[c], ab * f[c]);
    } else if constexpr (Mode == MrgLighten) {
        for (int c = 0; c < 3; ++c) p[c] = std::max(as * b[c], ab * f[c]);
    } else if constexpr (Mode == MrgDifference) {
        for (int c = 0; c < 3; ++c) p[c] = std::fabs(as * b[c] - ab * f[c]);
    } else if constexpr (Mode == MrgExclusion) {
        for (int c = 0; c < 3; ++c) p[c] = as * b[c] + ab * f[c] - 2.f * f[c] * b[c];
    } else if constexpr (Mode == MrgAdd) {
        for (int c = 0; c < 3; ++c) p[c] = as * b[c] + ab * f[c];
    } else if constexpr (Mode == MrgSubtract) {
        for (int c = 0; c < 3; ++c) p[c] = as * b[c] - ab * f[c];
    } else {
        // The rest work on straight colour: Cs = cs / as, Cb = cb / ab (0
        // where the alpha is 0), P = as ab B(Cb, Cs).
        const float w = as * ab;
        float cs[3], cb[3];
        for (int c = 0; c < 3; ++c) {
            cs[c] = as != 0.f ? f[c] / as : 0.f;
            cb[c] = ab != 0.f ? b[c] / ab : 0.f;
        }
        float r[3];
        if constexpr (Mode == MrgOverlay) {
            for (int c = 0; c < 3; ++c) r[c] = HardLightOf(cs[c], cb[c]);
        } else if constexpr (Mode == MrgHardLight) {
            for (int c = 0; c < 3; ++c) r[c] = HardLightOf(cb[c], cs[c]);
        } else if constexpr (Mode == MrgSoftLight) {
            for (int c = 0; c < 3; ++c) r[c] = SoftLightOf(cb[c], cs[c]);
        } else if constexpr (Mode == MrgColorDodge) {
            for (int c = 0; c < 3; ++c) r[c] = ColorDodgeOf(cb[c], cs[c]);
        } else if constexpr (Mode == MrgColorBurn) {
            for (int c = 0; c < 3; ++c) r[c] = ColorBurnOf(cb[c], cs[c]);
        } else if constexpr (Mode == MrgHue) {
            std::copy(cs, cs + 3, r);
            SetSat(r, SatOf(cb));
            SetLum(r, LumOf(cb));
        } else if constexpr (Mode == MrgSaturation) {
            std::copy(cb, cb + 3, r);
            SetSat(r, SatOf(cs));
            SetLum(r, LumOf(cb));
        } else if constexpr (Mode == MrgColor) {
            std::copy(cs, cs + 3, r);
            SetLum(r, LumOf(cb));
        } else if constexpr (Mode == MrgLuminosity) {
            std::copy(cb, cb + 3, r);
            SetLum(r, LumOf(cs));
        } else {
            std::copy(cs, cs + 3, r); // Normal's B(Cb, Cs) = Cs
        }
        for (int c = 0; c < 3; ++c) p[c] = w * r[c];
    }
}

template <int Mode> inline void ModePx(const Consts &k, const float *f, const float *b, float *o) {
    const float as = f[3], ab = b[3];
    const float yc = 1.f - k.hc * as, ya = 1.f - k.kk * as;
    const float xs = 1.f - ab;
    float p[3];
    TermOf<Mode>(f, b, as, ab, p);
    for (int c = 0; c < 3; ++c) o[c] = f[c] * xs + b[c] * yc + p[c];
    o[3] = k.fa * as + ya * ab;
}

/// Dissolve: the foreground's straight colour, fully opaque, where the noise
/// falls below blend x alpha; nothing elsewhere; then Over.
inline void DissolvePx(const Consts &k, const float *f, const float *b, float *o, int x, int y) {
    const float as = f[3];
    const float p = k.blend * as;
    float g[4] = {0.f, 0.f, 0.f, 0.f};
    if (DissolveNoise(x, y) < p) {
        for (int c = 0; c < 3; ++c) g[c] = f[c] / as; // p > 0, so as != 0
        g[3] = 1.f;
    }
    NormalPx<MrgOver>(k, g, b, o);
}

/// The background laid over the foreground (the depth merge where the
/// background is nearer).
inline void UnderPx(const float *f, const float *b, float *o) {
    const float x = 1.f - b[3];
    for (int c = 0; c < 4; ++c) o[c] = b[c] + x * f[c];
}

/// Blend towards the background, then the channels the merge does not take.
inline void FinishPx(const Consts &k, const float *b, float *o, bool blend) {
    if (blend && k.doBlend)
        for (int c = 0; c < 4; ++c) o[c] = b[c] + k.blend * (o[c] - b[c]);
    if (!k.allChannels)
        for (int c = 0; c < 4; ++c) o[c] = k.on[c] != 0.f ? o[c] : b[c];
}

/// The mode's pixel function, before blend and channels.
using PixelFn = void (*)(const Consts &k, const float *f, const float *b, float *o);

template <int Mode> void ModeFn(const Consts &k, const float *f, const float *b, float *o) { ModePx<Mode>(k, f, b, o); }
template <int Op> void NormalFn(const Consts &k, const float *f, const float *b, float *o) { NormalPx<Op>(k, f, b, o); }

PixelFn PixelFnOf(const MergeSettings &s) {
    if (s.mode == MrgNormal || s.mode == MrgDissolve) {
        switch (s.op) {
        case MrgIn: return &NormalFn<MrgIn>;
        case MrgHeldOut: return &NormalFn<MrgHeldOut>;
        case MrgAtop: return &NormalFn<MrgAtop>;
        case MrgXOr: return &NormalFn<MrgXOr>;
        case MrgReplace: return &NormalFn<MrgReplace>;
        default: return &NormalFn<MrgOver>;
        }
    }
    switch (s.mode) {
    case MrgScreen: return &ModeFn<MrgScreen>;
    case MrgMultiply: return &ModeFn<MrgMultiply>;
    case MrgOverlay: return &ModeFn<MrgOverlay>;
    case MrgSoftLight: return &ModeFn<MrgSoftLight>;
    case MrgHardLight: return &ModeFn<MrgHardLight>;
    case MrgColorDodge: return &ModeFn<MrgColorDodge>;
    case MrgColorBurn: return &ModeFn<MrgColorBurn>;
    case MrgDarken: return &ModeFn<MrgDarken>;
    case MrgLighten: return &ModeFn<MrgLighten>;
    case MrgDifference: return &ModeFn<MrgDifference>;
    case MrgExclusion: return &ModeFn<MrgExclusion>;
    case MrgHue: return &ModeFn<MrgHue>;
    case MrgSaturation: return &ModeFn<MrgSaturation>;
    case MrgColor: return &ModeFn<MrgColor>;
    case MrgLuminosity: return &ModeFn<MrgLuminosity>;
    case MrgAdd: return &ModeFn<MrgAdd>;
    case MrgSubtract: return &ModeFn<MrgSubtract>;
    default: return &NormalFn<MrgOver>;
    }
}

// ---- spans: n pixels of RGBA float, blend and channels included ----

/// A run of n pixels; x, y is the first pixel's position (for Dissolve).
using SpanFn = void (*)(const Consts &k, const float *f, const float *b, float *o, int n, int x, int y);

/// One mode over a run, its pixel function inlined; blend and channels in
/// a second pass only when they do something.
template <class Px> inline void RunSpan(const Consts &k, const float *__restrict f, const float *__restrict b,
                                        float *__restrict o, int n, Px px) {
    for (int i = 0; i < n; ++i) px(f + 4 * i, b + 4 * i, o + 4 * i);
    if (k.doBlend)
        for (int i = 0; i < 4 * n; ++i) o[i] = b[i] + k.blend * (o[i] - b[i]);
    if (!k.allChannels)
        for (int i = 0; i < n; ++i)
            for (int c = 0; c < 4; ++c) o[4 * i + c] = k.on[c] != 0.f ? o[4 * i + c] : b[4 * i + c];
}

template <int Mode> void ModeSpan(const Consts &k, const float *f, const float *b, float *o, int n, int, int) {
    RunSpan(k, f, b, o, n, [&k](const float *pf, const float *pb, float *po) { ModePx<Mode>(k, pf, pb, po); });
}
template <int Op> void NormalSpan(const Consts &k, const float *f, const float *b, float *o, int n, int, int) {
    RunSpan(k, f, b, o, n, [&k](const float *pf, const float *pb, float *po) { NormalPx<Op>(k, pf, pb, po); });
}
void DissolveSpan(const Consts &k, const float *f, const float *b, float *o, int n, int x, int y) {
    for (int i = 0; i < n; ++i) {
        DissolvePx(k, f + 4 * i, b + 4 * i, o + 4 * i, x + i, y);
        FinishPx(k, b + 4 * i, o + 4 * i, false);
    }
}

SpanFn SpanFnOf(const MergeSettings &s) {
    if (s.mode == MrgDissolve) return &DissolveSpan;
    if (s.mode == MrgNormal) {
        switch (s.op) {
        case MrgIn: return &NormalSpan<MrgIn>;
        case MrgHeldOut: return &NormalSpan<MrgHeldOut>;
        case MrgAtop: return &NormalSpan<MrgAtop>;
        case MrgXOr: return &NormalSpan<MrgXOr>;
        case MrgReplace: return &NormalSpan<MrgReplace>;
        default: return &NormalSpan<MrgOver>;
        }
    }
    switch (s.mode) {
    case MrgScreen: return &ModeSpan<MrgScreen>;
    case MrgMultiply: return &ModeSpan<MrgMultiply>;
    case MrgOverlay: return &ModeSpan<MrgOverlay>;
    case MrgSoftLight: return &ModeSpan<MrgSoftLight>;
    case MrgHardLight: return &ModeSpan<MrgHardLight>;
    case MrgColorDodge: return &ModeSpan<MrgColorDodge>;
    case MrgColorBurn: return &ModeSpan<MrgColorBurn>;
    case MrgDarken: return &ModeSpan<MrgDarken>;
    case MrgLighten: return &ModeSpan<MrgLighten>;
    case MrgDifference: return &ModeSpan<MrgDifference>;
    case MrgExclusion: return &ModeSpan<MrgExclusion>;
    case MrgHue: return &ModeSpan<MrgHue>;
    case MrgSaturation: return &ModeSpan<MrgSaturation>;
    case MrgColor: return &ModeSpan<MrgColor>;
    case MrgLuminosity: return &ModeSpan<MrgLuminosity>;
    case MrgAdd: return &ModeSpan<MrgAdd>;
    case MrgSubtract: return &ModeSpan<MrgSubtract>;
    default: return &NormalSpan<MrgOver>;
    }
}

/// One pixel with the depth merge: the nearer one lies on top; a pixel
/// without alpha never wins over one with alpha; a tie goes to the
/// foreground. zOut is the winner's Z.
void DepthPx(const MergeSettings &s, const Consts &k, PixelFn fn, const float *f, const float *b, float *o, float zf,
             float zb, int x, int y, float &zOut) {
    bool fgWins;
    if (b[3] == 0.f)
        fgWins = true;
    else if (f[3] == 0.f)
        fgWins = false;
    else
        fgWins = zf == zb || (s.zLargerIsNearer ? zf > zb : zf < zb);
    if (!fgWins) {
        UnderPx(f, b, o);
        FinishPx(k, b, o, true);
        zOut = zb;
        return;
    }
    if (s.mode == MrgDissolve) {
        DissolvePx(k, f, b, o, x, y);
        FinishPx(k, b, o, false);
    } else {
        fn(k, f, b, o);
        FinishPx(k, b, o, true);
    }
    zOut = zf;
}

FltPixel ToPixel(const float *o) { return {o[0], o[1], o[2], o[3]}; }

} // namespace mergemodes

MergeSettings MergeSettings::FromTags(const TagList &tags) {
    MergeSettings s;
    s.mode = static_cast<int>(tags.GetLong(MrgApplyMode, MrgNormal));
    if (s.mode < 0 || s.mode >= MrgModeCount) s.mode = MrgNormal;
    s.op = static_cast<int>(tags.GetLong(MrgOperator, MrgOver));
    if (s.op < 0 || s.op > MrgReplace) s.op = MrgOver;
    s.blend = static_cast<float>(tags.GetDouble(MrgBlend, 1.0));
    s.additive = static_cast<float>(tags.GetDouble(MrgAdditive, 0.0));
    s.alphaGain = static_cast<float>(tags.GetDouble(MrgAlphaGain, 1.0));
    s.burnIn = static_cast<float>(tags.GetDouble(MrgBurnIn, 0.0));
    const Tag chans[4] = {MrgDoRed, MrgDoGreen, MrgDoBlue, MrgDoAlpha};
    for (int c = 0; c < 4; ++c) s.channels[c] = tags.GetBool(chans[c], true);
    s.zMerge = tags.GetBool(MrgZMerge, false);
    s.zLargerIsNearer = tags.GetBool(MrgZLargerIsNearer, false);
    return s;
}

bool MergeSettings::ClearForegroundKeepsBackground() const {
    return !(mode == MrgNormal && (op == MrgIn || op == MrgHeldOut || op == MrgReplace));
}

float DissolveNoise(int x, int y) {
    uint32_t u = static_cast<uint32_t>(x) * 0x9E3779B1u + static_cast<uint32_t>(y) * 0x85EBCA77u;
    u ^= u >> 16;
    u *= 0x7FEB352Du;
    u ^= u >> 15;
    u *= 0x846CA68Bu;
    u ^= u >> 16;
    return static_cast<float>(u >> 8) * (1.f / 16777216.f);
}

float MergeFarZ(const MergeSettings &s) {
    return s.zLargerIsNearer ? -std::numeric_limits<float>::infinity() : std::numeric_limits<float>::infinity();
}

FltPixel MergePixel(const MergeSettings &s, const FltPixel &fg, const FltPixel &bg, int x, int y) {
    const mergemodes::Consts k = mergemodes::ConstsOf(s);
    const float f[4] = {fg.R, fg.G, fg.B, fg.A}, b[4] = {bg.R, bg.G, bg.B, bg.A};
    float o[4];
    if (s.mode == MrgDissolve) {
        mergemodes::DissolvePx(k, f, b, o, x, y);
        mergemodes::FinishPx(k, b, o, false);
    } else {
        mergemodes::PixelFnOf(s)(k, f, b, o);
        mergemodes::FinishPx(k, b, o, true);
    }
    return mergemodes::ToPixel(o);
}

FltPixel MergePixelZ(const MergeSettings &s, const FltPixel &fg, const FltPixel &bg, float zf, float zb, int x, int y,
                     float &zOut) {
    if (!s.zMerge) {
        zOut = zb;
        return MergePixel(s, fg, bg, x, y);
    }
    const mergemodes::Consts k = mergemodes::ConstsOf(s);
    const float f[4] = {fg.R, fg.G, fg.B, fg.A}, b[4] = {bg.R, bg.G, bg.B, bg.A};
    float o[4];
    mergemodes::DepthPx(s, k, mergemodes::PixelFnOf(s), f, b, o, zf, zb, x, y, zOut);
    return mergemodes::ToPixel(o);
}

FltPixel MergeCanvasColor(const MergeSettings &s, const FltPixel &fgCanvas, const FltPixel &bgCanvas) {
    if (s.mode != MrgDissolve) return MergePixel(s, fgCanvas, bgCanvas, 0, 0);
    // Dissolve's canvas is its mean: the opaque straight colour over the
    // background, weighted by the chance blend x alpha.
    const mergemodes::Consts k = mergemodes::ConstsOf(s);
    const float f[4] = {fgCanvas.R, fgCanvas.G, fgCanvas.B, fgCanvas.A};
    const float b[4] = {bgCanvas.R, bgCanvas.G, bgCanvas.B, bgCanvas.A};
    const float p = std::clamp(k.blend * f[3], 0.f, 1.f);
    float o[4];
    if (p > 0.f) {
        const float g[4] = {f[0] / f[3], f[1] / f[3], f[2] / f[3], 1.f};
        mergemodes::NormalPx<MrgOver>(k, g, b, o);
        for (int c = 0; c < 4; ++c) o[c] = b[c] + p * (o[c] - b[c]);
    } else {
        std::copy(b, b + 4, o);
    }
    mergemodes::FinishPx(k, b, o, false);
    return mergemodes::ToPixel(o);
}

ImgRectI MergeDataWindow(const MergeSettings &s, const ImgRectI &fgWindow, const FltPixel &fgCanvas,
                         const ImgRectI &bgWindow, const FltPixel &bgCanvas) {
    const bool normal = s.mode == MrgNormal;
    // Beyond the background's window over a clear canvas, In and Atop give
    // nothing, whatever the foreground holds.
    const bool fgOnlyConstant = normal && (s.op == MrgIn || s.op == MrgAtop) && bgCanvas == FltPixel{};
    // Beyond the foreground's window under a clear canvas, In, Held Out and
    // Replace give nothing, unless part of the background stays (blend, channels,
    // or a nearer background under the depth merge).
    const bool bgOnlyConstant = normal && (s.op == MrgIn || s.op == MrgHeldOut || s.op == MrgReplace) &&
                                fgCanvas == FltPixel{} && s.blend == 1.f && s.AllChannels() && !s.zMerge;
    ImgRectI w = fgWindow & bgWindow;
    if (!fgOnlyConstant) w |= fgWindow;
    if (!bgOnlyConstant) w |= bgWindow;
    return w;
}

bool MergeKernelSupports(const MergeSettings &s) {
    if (s.zMerge) return false;
    switch (s.mode) {
    case MrgNormal:
    case MrgScreen:
    case MrgMultiply:
    case MrgDarken:
    case MrgLighten:
    case MrgDifference:
    case MrgExclusion:
    case MrgAdd:
    case MrgSubtract: return true;
    default: return false;
    }
}

namespace mergemodes {

/// The foreground read at an offset, and everything one call needs.
struct Job {
    MergeSettings s;
    Consts k;
    SpanFn span;
    PixelFn pixel;
    const Image *fg, *bg;
    Image *dst;
    int dx, dy;        ///< foreground pixel (i, j) lies at (i + dx, j + dy)
    ImgRectI fgw;      ///< the foreground's data window, placed
    bool copyBeyondFg; ///< beyond fgw the result is the background itself
    bool depth;        ///< the depth merge runs (both carry Z)
    float farZ;
    std::vector<AuxChannelKind> carried; ///< background planes copied into dst
};

/// n pixels of row y from x on, as RGBA float: straight from the image's
/// row when it is RGBA float and holds them all, else converted into
/// `scratch` with the canvas colour beyond the data window.
const float *Fetch(const Image &img, int x, int y, int n, FltPixel *scratch) {
    const ImgRectI &w = img.DataWindow();
    if (img.Depth() == DepthRGBAFlt32 && x >= w.x0 && x + n <= w.x1)
        if (const uint8_t *p = img.PixelAddress(x, y)) return reinterpret_cast<const float *>(p);
    ReadSpanFlt(img, y, x, x + n, scratch);
    return reinterpret_cast<const float *>(scratch);
}

/// n values of an auxiliary plane of row y from x on; `outside` beyond the
/// data window (or where the image has no such plane).
const float *FetchAux(const Image &img, AuxChannelKind kind, int x, int y, int n, float outside, float *scratch) {
    const ImgRectI &w = img.DataWindow();
    const float *row = img.AuxRow(kind, y);
    if (row && x >= w.x0 && x + n <= w.x1) return row + (x - w.x0);
    for (int i = 0; i < n; ++i) {
        const int xi = x + i;
        scratch[i] = row && xi >= w.x0 && xi < w.x1 ? row[xi - w.x0] : outside;
    }
    return scratch;
}

/// Copies the background into dst over [x0, x1) of row y (its canvas colour
/// beyond its window); bytes as they are when the depths agree.
void CopyBackground(const Job &j, int y, int x0, int x1, FltPixel *scratch) {
    const Image &bg = *j.bg;
    Image &dst = *j.dst;
    uint8_t *out = dst.PixelAddress(x0, y);
    if (x1 <= x0 || !out) return;
    const ImgRectI &bw = bg.DataWindow();
    const uint8_t *row = bg.ScanLine(y);
    const int bpp = dst.BytesPerPixel();
    if (bg.Depth() == dst.Depth() && row && x0 >= bw.x0 && x1 <= bw.x1) {
        std::memcpy(out, row + static_cast<size_t>(x0 - bw.x0) * bpp, static_cast<size_t>(x1 - x0) * bpp);
        return;
    }
    for (int x = x0; x < x1; x += kBlock) {
        const int n = std::min(kBlock, x1 - x);
        ReadSpanFlt(bg, y, x, x + n, scratch);
        StoreFlt(dst.Depth(), scratch, n, out + static_cast<size_t>(x - x0) * bpp);
    }
}

/// Row y of dst over [x0, x1) through the merge.
void MergeRun(const Job &j, int y, int x0, int x1, FltPixel *fs, FltPixel *bs, FltPixel *os, float *zs) {
    Image &dst = *j.dst;
    const bool direct = dst.Depth() == DepthRGBAFlt32;
    uint8_t *row = dst.PixelAddress(x0, y);
    if (!row) return;
    const int bpp = dst.BytesPerPixel();
    float *zOutRow = j.depth ? dst.AuxRow(AuxChannelKind::Z, y) : nullptr;
    for (int x = x0; x < x1; x += kBlock) {
        const int n = std::min(kBlock, x1 - x);
        const float *f = Fetch(*j.fg, x - j.dx, y - j.dy, n, fs);
        const float *b = Fetch(*j.bg, x, y, n, bs);
        uint8_t *at = row + static_cast<size_t>(x - x0) * bpp;
        float *o = direct ? reinterpret_cast<float *>(at) : reinterpret_cast<float *>(os);
        if (j.depth) {
            const float *zf = FetchAux(*j.fg, AuxChannelKind::Z, x - j.dx, y - j.dy, n, j.farZ, zs);
            const float *zb = FetchAux(*j.bg, AuxChannelKind::Z, x, y, n, j.farZ, zs + kBlock);
            float *zo = zOutRow ? zOutRow + (x - dst.DataWindow().x0) : nullptr;
            for (int i = 0; i < n; ++i) {
                float z;
                DepthPx(j.s, j.k, j.pixel, f + 4 * i, b + 4 * i, o + 4 * i, zf[i], zb[i], x + i, y, z);
                if (zo) zo[i] = z;
            }
        } else {
            j.span(j.k, f, b, o, n, x, y);
        }
        if (!direct) StoreFlt(dst.Depth(), os, n, at);
    }
}

/// The background's auxiliary planes over row y of dst (beyond its window
/// zero, and the far Z for Z); the depth merge then writes its Z where it
/// merges.
void CarryAux(const Job &j, int y) {
    const ImgRectI &dw = j.dst->DataWindow();
    const ImgRectI &bw = j.bg->DataWindow();
    for (AuxChannelKind kind : j.carried) {
        float *out = j.dst->AuxRow(kind, y);
        if (!out) continue;
        const float *in = j.bg->AuxRow(kind, y);
        const float outside = kind == AuxChannelKind::Z ? j.farZ : 0.f;
        for (int x = dw.x0; x < dw.x1; ++x) out[x - dw.x0] = in && x >= bw.x0 && x < bw.x1 ? in[x - bw.x0] : outside;
    }
}

void MergeRow(const Job &j, int y, FltPixel *fs, FltPixel *bs, FltPixel *os, float *zs) {
    const ImgRectI &dw = j.dst->DataWindow();
    CarryAux(j, y);
    if (!j.copyBeyondFg) {
        MergeRun(j, y, dw.x0, dw.x1, fs, bs, os, zs);
        return;
    }
    // Left of the foreground, the foreground's span, right of it.
    const bool rowHasFg = y >= j.fgw.y0 && y < j.fgw.y1;
    const int a = rowHasFg ? std::clamp(j.fgw.x0, dw.x0, dw.x1) : dw.x1;
    const int b = rowHasFg ? std::clamp(j.fgw.x1, a, dw.x1) : dw.x1;
    CopyBackground(j, y, dw.x0, a, os);
    MergeRun(j, y, a, b, fs, bs, os, zs);
    CopyBackground(j, y, b, dw.x1, os);
}

/// The device kernel "Merge" for the modes it has.
bool MergeOnDevice(Request *req, const Job &j) {
    if (!req || j.dst->DataWindow().IsNull()) return false;
    auto block = std::make_shared<MergeParams>();
    MergeParams &p = *block;
    p.mode = j.s.mode;
    p.op = j.s.op;
    p.hc = j.k.hc;
    p.kk = j.k.kk;
    p.fa = j.k.fa;
    p.blend = j.k.blend;
    p.doBlend = j.k.doBlend;
    for (int c = 0; c < 4; ++c) p.chans[c] = j.s.channels[c];
    const FltPixel fc = j.fg->GetCanvasColor(), bc = j.bg->GetCanvasColor();
    const float fgCanvas[4] = {fc.R, fc.G, fc.B, fc.A}, bgCanvas[4] = {bc.R, bc.G, bc.B, bc.A};
    std::memcpy(p.fgCanvas, fgCanvas, sizeof fgCanvas);
    std::memcpy(p.bgCanvas, bgCanvas, sizeof bgCanvas);
    auto windowOf = [](const Image &img) {
        return img.HasScanLineData() || img.IsGPUMemDirty() ? img.DataWindow() : ImgRectI();
    };
    const ImgRectI fw = windowOf(*j.fg), bw = windowOf(*j.bg), ow = j.dst->DataWindow();
    const int fgWindow[4] = {fw.x0, fw.x1, fw.y0, fw.y1}, bgWindow[4] = {bw.x0, bw.x1, bw.y0, bw.y1};
    const int outWindow[4] = {ow.x0, ow.x1, ow.y0, ow.y1};
    std::memcpy(p.fgWindow, fgWindow, sizeof fgWindow);
    std::memcpy(p.bgWindow, bgWindow, sizeof bgWindow);
    std::memcpy(p.outWindow, outWindow, sizeof outWindow);
    p.fgOffset[0] = j.dx;
    p.fgOffset[1] = j.dy;
    p.workSize[0] = ow.Width();
    p.workSize[1] = ow.Height();
    return KROMComputeNode::ExecKernelI(
        req, "Merge", nullptr, MergeParamsText, sizeof p, offsetof(MergeParams, srcCompOrder),
        offsetof(MergeParams, dstCompOrder), block,
        {{"fg", const_cast<Image *>(j.fg)}, {"bg", const_cast<Image *>(j.bg)}, {"output", j.dst}});
}

} // namespace mergemodes

bool MergeImagesTagList(const Image *fg, const Image *bg, Image *dst, const TagList &tags) {
    if (!fg || !bg || !dst) return false;
    mergemodes::Job j;
    j.s = MergeSettings::FromTags(tags);
    j.k = mergemodes::ConstsOf(j.s);
    j.span = mergemodes::SpanFnOf(j.s);
    j.pixel = mergemodes::PixelFnOf(j.s);
    j.fg = fg;
    j.bg = bg;
    j.dst = dst;
    j.dx = static_cast<int>(tags.GetLong(MrgFgOffsetX, 0));
    j.dy = static_cast<int>(tags.GetLong(MrgFgOffsetY, 0));
    j.fgw = fg->DataWindow();
    j.fgw.Offset(j.dx, j.dy);
    j.depth = j.s.zMerge && fg->HasAuxChannel(AuxChannelKind::Z) && bg->HasAuxChannel(AuxChannelKind::Z);
    if (!j.depth) j.s.zMerge = false;
    j.farZ = MergeFarZ(j.s);
    j.copyBeyondFg = fg->GetCanvasColor() == FltPixel{} && j.s.ClearForegroundKeepsBackground();
    dst->SetCanvasColor(MergeCanvasColor(j.s, fg->GetCanvasColor(), bg->GetCanvasColor()));
    for (int k = 0; k < static_cast<int>(AuxChannelKind::Count); ++k) {
        const auto kind = static_cast<AuxChannelKind>(k);
        if (bg->HasAuxChannel(kind)) j.carried.push_back(kind);
    }
    for (AuxChannelKind kind : j.carried)
        if (!dst->AddAuxChannel(kind)) return false;
    if (dst->IsNoData() || dst->DataWindow().IsNull()) return true;

    auto *req = tags.GetPtrAs<Request>(WorkRequest);
    const RenderTask *task = req ? req->GetTask() : nullptr;
    if (tags.GetBool(WorkUseGPU, false) && j.carried.empty() && MergeKernelSupports(j.s) &&
        mergemodes::MergeOnDevice(req, j))
        return true;
    if (!fg->DownloadGPUMem() || !bg->DownloadGPUMem() || !dst->AllocScanLineData()) return false;

    std::atomic<bool> stopped{false};
    const ImgRectI dw = dst->DataWindow();
    auto rows = [&](int y0, int y1) {
        // Scratch blocks: foreground, background, output, two Z runs.
        std::unique_ptr<FltPixel[]> scratch(new FltPixel[3 * mergemodes::kBlock]);
        std::unique_ptr<float[]> zs(new float[2 * mergemodes::kBlock]);
        for (int y = y0; y < y1; ++y) {
            if (dst->CheckAbort() || bg->CheckAbort() || (task && task->IsAborted())) {
                stopped.store(true, std::memory_order_relaxed);
                return;
            }
            mergemodes::MergeRow(j, y, scratch.get(), scratch.get() + mergemodes::kBlock,
                                 scratch.get() + 2 * mergemodes::kBlock, zs.get());
        }
    };
    if (tags.GetBool(WorkThreaded, true))
        ParallelRange(dw.y0, dw.y1, rows, 4);
    else
        rows(dw.y0, dw.y1);
    return !stopped.load();
}

} // namespace Orvane
