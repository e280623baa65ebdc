#include "host/script/ScriptImageApi.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>

#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/image/ResizeFilters.h"

using Orvane::FltPixel;
using Orvane::Image;

static_assert(sizeof(OrvanePixPtr) == 6 * sizeof(uint64_t), "scripts see a cursor as 6 opaque words");
static_assert(sizeof(OrvaneScriptPixel) == 24 * sizeof(float) && offsetof(OrvaneScriptPixel, A) == 3 * sizeof(float),
              "a script pixel starts with the host's FltPixel");
static_assert(static_cast<int>(OrvaneEdgeWrap) == Orvane::EdgeWrap &&
                  static_cast<int>(OrvaneEdgeDuplicate) == Orvane::EdgeDuplicate &&
                  static_cast<int>(OrvaneEdgeMirror) == Orvane::EdgeMirror,
              "sample edge rules share the resampler's numbers");

namespace {

/// The image's auxiliary channel behind each auxiliary field of a script pixel.
constexpr Orvane::AuxChannelKind kAuxKinds[kScriptAuxFields] = {
    Orvane::AuxChannelKind::Z,           Orvane::AuxChannelKind::Coverage,    Orvane::AuxChannelKind::U,
    Orvane::AuxChannelKind::V,           Orvane::AuxChannelKind::NormalX,     Orvane::AuxChannelKind::NormalY,
    Orvane::AuxChannelKind::NormalZ,     Orvane::AuxChannelKind::VectorX,     Orvane::AuxChannelKind::VectorY,
    Orvane::AuxChannelKind::BackVectorX, Orvane::AuxChannelKind::BackVectorY, Orvane::AuxChannelKind::PositionX,
    Orvane::AuxChannelKind::PositionY,   Orvane::AuxChannelKind::PositionZ,   Orvane::AuxChannelKind::DisparityX,
    Orvane::AuxChannelKind::DisparityY};

float *AuxFields(OrvaneScriptPixel *px) { return &px->Z; }
const float *AuxFields(const OrvaneScriptPixel *px) { return &px->Z; }

uint32_t AuxFieldsOf(const Image *img) {
    uint32_t mask = 0;
    if (img && img->HasAuxChannels())
        for (int k = 0; k < kScriptAuxFields; ++k)
            if (img->HasAuxChannel(kAuxKinds[k])) mask |= 1u << k;
    return mask;
}

void SetColour(OrvaneScriptPixel *out, const FltPixel &c) { out->R = c.R, out->G = c.G, out->B = c.B, out->A = c.A; }

void PointCursorAtRow(OrvanePixPtr *p) {
    p->row = p->img && p->img->HasScanLineData() ? p->img->ScanLine(p->y) : nullptr;
}

bool CursorInWindow(const OrvanePixPtr *p) { return p->row && p->x >= p->x0 && p->x < p->x1; }

uint8_t *CursorAddress(const OrvanePixPtr *p) {
    return p->row + static_cast<ptrdiff_t>(p->x - p->x0) * p->bytesPerPixel;
}

/// Pixel (x, y) of the frame under the edge rule, into `mx`, `my`; false when the rule gives a clear pixel.
bool FramePixel(const Image *img, int64_t x, int64_t y, int32_t edges, int &mx, int &my) {
    const int w = img->Width(), h = img->Height();
    mx = Orvane::MapEdge(static_cast<int>(x), 0, w, edges);
    my = Orvane::MapEdge(static_cast<int>(y), 0, h, edges);
    return mx >= 0 && mx < w && my >= 0 && my < h;
}

} // namespace

extern "C" {

void ovs_PixPtrInit(OrvanePixPtr *p, Image *img) {
    if (!p) return;
    *p = OrvanePixPtr{};
    p->img = img;
    if (!img) return;
    p->x0 = img->DataWindow().x0;
    p->x1 = img->DataWindow().x1;
    p->bytesPerPixel = img->BytesPerPixel();
    p->depth = img->Depth();
    p->writable = !img->IsReadOnly();
    p->auxFields = AuxFieldsOf(img);
    PointCursorAtRow(p);
}

void ovs_PixPtrGotoXY(OrvanePixPtr *p, int32_t x, int32_t y) {
    if (!p) return;
    p->x = x;
    if (y != p->y || !p->row) {
        p->y = y;
        PointCursorAtRow(p);
    }
}

void ovs_PixPtrNextPixel(OrvanePixPtr *p) {
    if (p) ++p->x;
}

void ovs_PixPtrGetPixel(const OrvanePixPtr *p, OrvaneScriptPixel *out) {
    if (!p || !out) return;
    const bool inside = CursorInWindow(p);
    if (inside) {
        FltPixel c;
        Orvane::LoadFlt(p->depth, CursorAddress(p), 1, &c);
        SetColour(out, c);
    } else {
        SetColour(out, p->img ? p->img->GetCanvasColor() : FltPixel{});
    }
    for (uint32_t mask = p->auxFields; mask; mask &= mask - 1) {
        const int k = __builtin_ctz(mask);
        AuxFields(out)[k] = inside ? p->img->AuxRow(kAuxKinds[k], p->y)[p->x - p->x0] : 0.f;
    }
}

void ovs_PixPtrSetPixel(const OrvanePixPtr *p, const OrvaneScriptPixel *in) {
    if (!p || !in || !p->writable || !CursorInWindow(p)) return;
    const FltPixel c{in->R, in->G, in->B, in->A};
    Orvane::StoreFlt(p->depth, &c, 1, CursorAddress(p));
    for (uint32_t mask = p->auxFields; mask; mask &= mask - 1) {
        const int k = __builtin_ctz(mask);
        p->img->AuxRow(kAuxKinds[k], p->y)[p->x - p->x0] = AuxFields(in)[k];
    }
}

void ovs_PixPtrGetNextPixel(OrvanePixPtr *p, OrvaneScriptPixel *out) {
    ovs_PixPtrGetPixel(p, out);
    ovs_PixPtrNextPixel(p);
}

void ovs_PixPtrSetNextPixel(OrvanePixPtr *p, const OrvaneScriptPixel *in) {
    ovs_PixPtrSetPixel(p, in);
    ovs_PixPtrNextPixel(p);
}

int32_t ovs_ImageWidth(const Image *img) { return img ? img->Width() : 0; }
int32_t ovs_ImageHeight(const Image *img) { return img ? img->Height() : 0; }
double ovs_ImageXScale(const Image *img) { return img ? img->XScale() : 1.0; }
double ovs_ImageYScale(const Image *img) { return img ? img->YScale() : 1.0; }

void ovs_ImageSample(const Image *img, double x, double y, int32_t edges, OrvaneScriptPixel *out) {
    if (!out) return;
    const uint32_t auxFields = AuxFieldsOf(img);
    SetColour(out, FltPixel{});
    for (uint32_t mask = auxFields; mask; mask &= mask - 1) AuxFields(out)[__builtin_ctz(mask)] = 0.f;
    if (!img || std::isnan(x) || std::isnan(y)) return;
    // Far positions all map alike under every rule once clamped well past any frame.
    constexpr double kFar = 1 << 30;
    x = std::clamp(x, -kFar, kFar);
    y = std::clamp(y, -kFar, kFar);
    const double fx = std::floor(x), fy = std::floor(y);
    const double wx[2] = {1 - (x - fx), x - fx}, wy[2] = {1 - (y - fy), y - fy};
    const Orvane::ImgRectI &dw = img->DataWindow();
    double sum[4 + kScriptAuxFields] = {};
    const int64_t x0 = static_cast<int64_t>(fx), y0 = static_cast<int64_t>(fy);
    // Float rows, all four taps inside the frame and the data window: read the rows directly.
    if (!auxFields && img->Depth() == Orvane::DepthRGBAFlt32 && img->HasScanLineData() &&
        (img->Frame() & dw)
            .Contains(Orvane::ImgRectI(static_cast<int>(x0), static_cast<int>(y0), static_cast<int>(x0) + 2,
                                       static_cast<int>(y0) + 2))) {
        for (int j = 0; j < 2; ++j) {
            const auto *row =
                reinterpret_cast<const float *>(img->ScanLine(static_cast<int>(y0) + j)) + (x0 - dw.x0) * 4;
            for (int i = 0; i < 2; ++i) {
                const double w = wx[i] * wy[j];
                if (w == 0) continue;
                for (int c = 0; c < 4; ++c) sum[c] += w * row[i * 4 + c];
            }
        }
        SetColour(out, FltPixel{float(sum[0]), float(sum[1]), float(sum[2]), float(sum[3])});
        return;
    }
    for (int j = 0; j < 2; ++j)
        for (int i = 0; i < 2; ++i) {
            const double w = wx[i] * wy[j];
            int mx, my;
            // Taps of weight 0 are skipped, so a whole position reads its pixel exactly.
            if (w == 0 || !FramePixel(img, x0 + i, y0 + j, edges, mx, my)) continue;
            const FltPixel px = img->GetFlt(mx, my);
            sum[0] += w * px.R;
            sum[1] += w * px.G;
            sum[2] += w * px.B;
            sum[3] += w * px.A;
            if (!dw.Contains(mx, my)) continue; // auxiliary channels are 0 outside the data window
            for (uint32_t mask = auxFields; mask; mask &= mask - 1) {
                const int k = __builtin_ctz(mask);
                sum[4 + k] += w * img->AuxRow(kAuxKinds[k], my)[mx - dw.x0];
            }
        }
    SetColour(out, FltPixel{float(sum[0]), float(sum[1]), float(sum[2]), float(sum[3])});
    for (uint32_t mask = auxFields; mask; mask &= mask - 1) {
        const int k = __builtin_ctz(mask);
        AuxFields(out)[k] = float(sum[4 + k]);
    }
}

void ovs_ImageGetCanvasColorFlt(const Image *img, OrvaneScriptPixel *out) {
    if (!out) return;
    *out = OrvaneScriptPixel{};
    if (img) SetColour(out, img->GetCanvasColor());
}
int32_t ovs_NextLine(int32_t *counter) {
    if (!counter) return INT32_MAX;
    return std::atomic_ref<int32_t>(*counter).fetch_add(1, std::memory_order_relaxed);
}

int32_t ovs_Aborted(const int32_t *abort) {
    return abort && std::atomic_ref<const int32_t>(*abort).load(std::memory_order_relaxed) != 0;
}

Orvane::Image *ovs_ImageNew(int32_t width, int32_t height, int32_t depth) {
    using namespace Orvane;
    if (width < 1 || height < 1 || width > MaxImageSide || height > MaxImageSide) return nullptr;
    Ref<Image> img = NewImageTagList({{ImgWidth, width}, {ImgHeight, height}, {ImgDepth, depth}});
    if (!img || !img->AllocScanLineData()) return nullptr;
    return img.Release();
}

void ovs_ImageFree(Orvane::Image *img) {
    if (img) img->Recycle();
}

} // extern "C"

namespace Orvane {

AuxChannelKind ScriptAuxChannel(int k) { return kAuxKinds[k]; }

const OrvaneScriptApi &ScriptImageApi() {
    static const OrvaneScriptApi api{ovs_PixPtrInit,
                                     ovs_PixPtrGotoXY,
                                     ovs_PixPtrNextPixel,
                                     ovs_PixPtrGetPixel,
                                     ovs_PixPtrSetPixel,
                                     ovs_PixPtrGetNextPixel,
                                     ovs_PixPtrSetNextPixel,
                                     ovs_ImageWidth,
                                     ovs_ImageHeight,
                                     ovs_ImageXScale,
                                     ovs_ImageYScale,
                                     ovs_ImageSample,
                                     ovs_ImageGetCanvasColorFlt,
                                     ovs_NextLine,
                                     ovs_Aborted,
                                     ovs_ImageNew,
                                     ovs_ImageFree};
    return api;
}

const char *ScriptImageDeclarations() {
    return R"(
typedef struct FltPixel {
    float R, G, B, A, BgR, BgG, BgB, BgA, Z, Coverage, U, V, NX, NY, NZ, VectX, VectY, BackVectX, BackVectY,
        PositionX, PositionY, PositionZ, DisparityX, DisparityY;
} FltPixel;
typedef struct Image Image;
typedef struct PixPtr { const uint64_t opaque_[6]; } PixPtr;
typedef struct OrvaneScriptApi {
    void (*PixPtrInit)(PixPtr *p, Image *img);
    void (*PixPtrGotoXY)(PixPtr *p, int32_t x, int32_t y);
    void (*PixPtrNextPixel)(PixPtr *p);
    void (*PixPtrGetPixel)(const PixPtr *p, FltPixel *out);
    void (*PixPtrSetPixel)(const PixPtr *p, const FltPixel *in);
    void (*PixPtrGetNextPixel)(PixPtr *p, FltPixel *out);
    void (*PixPtrSetNextPixel)(PixPtr *p, const FltPixel *in);
    int32_t (*ImageWidth)(const Image *img);
    int32_t (*ImageHeight)(const Image *img);
    double (*ImageXScale)(const Image *img);
    double (*ImageYScale)(const Image *img);
    void (*ImageSample)(const Image *img, double x, double y, int32_t edges, FltPixel *out);
    void (*ImageGetCanvasColorFlt)(const Image *img, FltPixel *out);
    int32_t (*NextLine)(int32_t *counter);
    int32_t (*Aborted)(const int32_t *abort);
    Image *(*ImageNew)(int32_t width, int32_t height, int32_t depth);
    void (*ImageFree)(Image *img);
} OrvaneScriptApi;
typedef struct ImgRectI { int32_t x0, y0, x1, y1; } ImgRectI;
typedef double float64;
typedef struct Request Request;
typedef struct ScriptObject ScriptObject;
)";
}

} // namespace Orvane
