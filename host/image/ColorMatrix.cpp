#include "host/image/ColorMatrix.h"

#include <cmath>
#include <cstddef>
#include <cstring>
#include <memory>
#include <vector>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/PointKernel.h"
#include "host/krom/kernels/ColorKernelParams.h"

namespace Orvane {

void ColorMatrixFull::SetIdentity() {
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) m[i][j] = i == j ? 1.0 : 0.0;
}

bool ColorMatrixFull::IsIdentity() const {
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j)
            if (m[i][j] != (i == j ? 1.0 : 0.0)) return false;
    return true;
}

ColorMatrixFull &ColorMatrixFull::Then(const ColorMatrixFull &b) {
    double r[5][5];
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) {
            double s = 0.0;
            for (int k = 0; k < 5; ++k) s += b.m[i][k] * m[k][j];
            r[i][j] = s;
        }
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) m[i][j] = r[i][j];
    return *this;
}

ColorMatrixFull &ColorMatrixFull::Scale(int c, double s) {
    for (int j = 0; j < 5; ++j) m[c][j] *= s;
    return *this;
}

ColorMatrixFull &ColorMatrixFull::Offset(int c, double o) {
    m[c][4] += o;
    return *this;
}

double ColorMatrixFull::Determinant() const {
    double a[5][5];
    std::memcpy(a, m, sizeof a);
    double det = 1.0;
    for (int c = 0; c < 5; ++c) {
        int pivot = c;
        for (int r = c + 1; r < 5; ++r)
            if (std::fabs(a[r][c]) > std::fabs(a[pivot][c])) pivot = r;
        if (a[pivot][c] == 0.0) return 0.0;
        if (pivot != c) {
            for (int j = 0; j < 5; ++j) std::swap(a[c][j], a[pivot][j]);
            det = -det;
        }
        det *= a[c][c];
        for (int r = c + 1; r < 5; ++r) {
            const double f = a[r][c] / a[c][c];
            for (int j = c; j < 5; ++j) a[r][j] -= f * a[c][j];
        }
    }
    return det;
}

bool ColorMatrixFull::Invert(double eps) {
    if (std::fabs(Determinant()) < eps) return false;
    double a[5][10];
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) {
            a[i][j] = m[i][j];
            a[i][j + 5] = i == j ? 1.0 : 0.0;
        }
    for (int c = 0; c < 5; ++c) {
        int pivot = c;
        for (int r = c + 1; r < 5; ++r)
            if (std::fabs(a[r][c]) > std::fabs(a[pivot][c])) pivot = r;
        if (pivot != c)
            for (int j = 0; j < 10; ++j) std::swap(a[c][j], a[pivot][j]);
        const double inv = 1.0 / a[c][c];
        for (int j = 0; j < 10; ++j) a[c][j] *= inv;
        for (int r = 0; r < 5; ++r) {
            if (r == c || a[r][c] == 0.0) continue;
            const double f = a[r][c];
            for (int j = 0; j < 10; ++j) a[r][j] -= f * a[c][j];
        }
    }
    for (int i = 0; i < 5; ++i)
        for (int j = 0; j < 5; ++j) m[i][j] = a[i][j + 5];
    return true;
}

FltPixel ColorMatrixFull::Apply(const FltPixel &p) const {
    const double in[5] = {p.R, p.G, p.B, p.A, 1.0};
    double out[4];
    for (int i = 0; i < 4; ++i) {
        double s = 0.0;
        for (int j = 0; j < 5; ++j) s += m[i][j] * in[j];
        out[i] = s;
    }
    return {static_cast<float>(out[0]), static_cast<float>(out[1]), static_cast<float>(out[2]),
            static_cast<float>(out[3])};
}

ColorMatrix::ColorMatrix(const ColorMatrixFull &full) {
    static constexpr int pick[4] = {0, 1, 2, 4};
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 4; ++j) m[i][j] = full.m[pick[i]][pick[j]];
}

void ColorMatrix::SetIdentity() {
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 4; ++j) m[i][j] = i == j ? 1.0 : 0.0;
}

FltPixel ColorMatrix::Apply(const FltPixel &p) const {
    const double in[4] = {p.R, p.G, p.B, 1.0};
    double out[3];
    for (int i = 0; i < 3; ++i) out[i] = m[i][0] * in[0] + m[i][1] * in[1] + m[i][2] * in[2] + m[i][3] * in[3];
    return {static_cast<float>(out[0]), static_cast<float>(out[1]), static_cast<float>(out[2]), p.A};
}

namespace {

/// The matrix in float, as the row loop uses it: 4 rows of (r, g, b, a, 1).
struct RowMatrix {
    alignas(16) float k[4][5];
};

RowMatrix ToRowMatrix(const ColorMatrixFull &full) {
    RowMatrix r;
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) r.k[i][j] = static_cast<float>(full.m[i][j]);
    return r;
}

/// The four-channel multiply over a run of RGBA float pixels; in and out may alias.
void MatrixRun(const RowMatrix &mx, const float *in, float *out, int count) {
    const auto &k = mx.k;
    for (int i = 0; i < count; ++i) {
        const float r = in[4 * i], g = in[4 * i + 1], b = in[4 * i + 2], a = in[4 * i + 3];
        out[4 * i + 0] = k[0][0] * r + k[0][1] * g + k[0][2] * b + k[0][3] * a + k[0][4];
        out[4 * i + 1] = k[1][0] * r + k[1][1] * g + k[1][2] * b + k[1][3] * a + k[1][4];
        out[4 * i + 2] = k[2][0] * r + k[2][1] * g + k[2][2] * b + k[2][3] * a + k[2][4];
        out[4 * i + 3] = k[3][0] * r + k[3][1] * g + k[3][2] * b + k[3][3] * a + k[3][4];
    }
}

/// The matrix as the "ColorMatrix" kernel of the common library: the same
/// float arithmetic as MatrixRun, so the device gives the rows' results.
bool MatrixOnDevice(Request *req, const Image *src, Image *dst, const RowMatrix &mx) {
    if (!req || dst->DataWindow().IsNull()) return false;
    auto block = std::make_shared<ColorMatrixParams>();
    ColorMatrixParams &p = *block;
    std::memcpy(p.m, mx.k, sizeof p.m);
    const FltPixel c = src->GetCanvasColor();
    float canvas[4] = {c.R, c.G, c.B, c.A};
    MatrixRun(mx, canvas, p.dp, 1);
    SetPointKernelWindows(p, *src, *dst);
    return KROMComputeNode::ExecKernelI(
        req, "ColorMatrix", nullptr, ColorMatrixParamsText, sizeof p, offsetof(ColorMatrixParams, srcCompOrder),
        offsetof(ColorMatrixParams, dstCompOrder), block, {{"input", const_cast<Image *>(src)}, {"output", dst}});
}

} // namespace

bool ApplyMatrixTagList(const Image *src, Image *dst, const TagList &tags) {
    if (!src || !dst) return false;
    ColorMatrixFull full;
    if (const auto *m4 = tags.GetPtrAs<const ColorMatrix>(MtxColorMatrix)) {
        static constexpr int pick[4] = {0, 1, 2, 4};
        for (int i = 0; i < 4; ++i)
            for (int j = 0; j < 4; ++j) full.m[pick[i]][pick[j]] = m4->m[i][j];
    } else if (const auto *m5 = tags.GetPtrAs<const ColorMatrixFull>(MtxColorMatrixFull)) {
        full = *m5;
    } else {
        return false;
    }
    const FltPixel canvas = full.Apply(src->GetCanvasColor());
    if (dst->IsNoData()) {
        dst->SetCanvasColor(canvas);
        return true;
    }
    const RowMatrix mx = ToRowMatrix(full);
    if (tags.GetBool(WorkUseGPU, false) && MatrixOnDevice(tags.GetPtrAs<Request>(WorkRequest), src, dst, mx)) {
        dst->SetCanvasColor(canvas);
        return true;
    }
    if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return false;

    const ImgRectI dw = dst->DataWindow();
    const ImgRectI sw = src->DataWindow();
    const bool direct = src->Depth() == DepthRGBAFlt32 && dst->Depth() == DepthRGBAFlt32 && src->HasScanLineData();
    auto rows = [&](int y0, int y1) {
        std::vector<FltPixel> span;
        for (int y = y0; y < y1; ++y) {
            if (src->CheckAbort()) return;
            auto *out = dst->Row<float>(y);
            if (direct && y >= sw.y0 && y < sw.y1 && dw.x0 >= sw.x0 && dw.x1 <= sw.x1) {
                MatrixRun(mx, reinterpret_cast<const float *>(src->PixelAddress(dw.x0, y)), out, dw.Width());
                continue;
            }
            span.resize(dw.Width());
            ReadSpanFlt(*src, y, dw.x0, dw.x1, span.data());
            auto *f = reinterpret_cast<float *>(span.data());
            MatrixRun(mx, f, f, dw.Width());
            StoreFlt(dst->Depth(), span.data(), dw.Width(), dst->ScanLine(y));
        }
    };
    if (tags.GetBool(WorkThreaded, true))
        ParallelRange(dw.y0, dw.y1, rows, 4);
    else
        rows(dw.y0, dw.y1);
    dst->SetCanvasColor(canvas);
    return true;
}

} // namespace Orvane
