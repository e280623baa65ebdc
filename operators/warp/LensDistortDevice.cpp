#include "operators/warp/LensDistortDevice.h"

#include <algorithm>
#include <cstring>
#include <memory>

#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/ResizeFilters.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/LensDistortKernelParams.h"
#include "operators/warp/ldpk/Models.h"

namespace Orvane::lensdistort {
namespace {

constexpr int kClipFrame = 2; // LensDistort::Setup::clipping

void SetMatrix(float out[4], const ldpk::mat2d &m) {
    out[0] = static_cast<float>(m.m00), out[1] = static_cast<float>(m.m01);
    out[2] = static_cast<float>(m.m10), out[3] = static_cast<float>(m.m11);
}

template <int Degree>
void SetAnamorphic(LensDistortParams &p, const ldpk::generic_anamorphic_distortion<Degree> &poly) {
    constexpr int n = ldpk::generic_anamorphic_distortion<Degree>::per_axis;
    p.polynomial = 1;
    p.terms = n;
    for (int k = 0; k < n; ++k) {
        p.coeffX[k] = static_cast<float>(poly.get_coeff(k));
        p.coeffY[k] = static_cast<float>(poly.get_coeff(n + k));
    }
}

/// The chain's matrices: undistort is outer (polynomial (inner p)); mix = outer inner - 1, taken in double.
void SetMatrices(LensDistortParams &p, const ldpk::mat2d &inner, const ldpk::mat2d &outer) {
    SetMatrix(p.inner, inner);
    SetMatrix(p.outer, outer);
    ldpk::mat2d mix = outer * inner;
    mix.m00 -= 1.0, mix.m11 -= 1.0;
    SetMatrix(p.mix, mix);
}

/// The chain of `plugin` into the block; false for a model the kernel does not have.
bool SetChain(LensDistortParams &p, const ldpk::ldp_builtin &plugin) {
    if (const auto *radial = dynamic_cast<const tde4_ldp_radial_decentered_deg_4_cylindric *>(&plugin)) {
        p.polynomial = 0;
        for (int k = 0; k < 6; ++k) p.coeffX[k] = static_cast<float>(radial->polynomial().get_coeff(k));
        SetMatrices(p, ldpk::mat2d{}, radial->cylindric().matrix());
        return true;
    }
    if (const auto *a4 = dynamic_cast<const tde4_ldp_anamorphic_deg_4_rotate_squeeze_xy *>(&plugin)) {
        SetAnamorphic(p, a4->polynomial());
        SetMatrices(p, a4->e2().inverse(), a4->e1().matrix());
        return true;
    }
    if (const auto *a6 = dynamic_cast<const tde4_ldp_anamorphic_deg_6 *>(&plugin)) {
        SetAnamorphic(p, a6->polynomial());
        SetMatrices(p, ldpk::mat2d{}, ldpk::mat2d{});
        return true;
    }
    return false;
}

void SetWindow(int out[4], const ImgRectI &r) {
    const int w[4] = {r.x0, r.x1, r.y0, r.y1};
    std::memcpy(out, w, sizeof w);
}

} // namespace

bool DeviceTakes(const Model &model) {
    const auto *eq = dynamic_cast<const ModelEq *>(&model);
    LensDistortParams unused{};
    return eq && SetChain(unused, eq->Plugin());
}

bool DistortOnDevice(Request *req, const LensDistort::Setup &s, const Image &src, Image &dst) {
    const auto *eq = dynamic_cast<const ModelEq *>(s.model);
    if (s.mode != 0 || !eq || dst.DataWindow().IsNull()) return false;
    auto block = std::make_shared<LensDistortParams>();
    LensDistortParams &p = *block;
    if (!SetChain(p, eq->Plugin())) return false;

    // Pixel to unit coordinates, per axis: u = (x - centre) scale + shift, with
    // scale = filmback units per pixel / r_fb and shift = -lens centre offset / r_fb.
    const ldpk::ldp_builtin &kit = eq->Plugin();
    const double scaleX = eq->ToNormX() * kit.filmback_width() / kit.r_fb();
    const double scaleY = eq->ToNormY() * kit.filmback_height() / kit.r_fb();
    p.centre[0] = static_cast<float>(eq->CentreX()), p.centre[1] = static_cast<float>(eq->CentreY());
    p.scale[0] = static_cast<float>(scaleX), p.scale[1] = static_cast<float>(scaleY);
    p.shift[0] = static_cast<float>(-kit.lens_centre_offset_x() / kit.r_fb());
    p.shift[1] = static_cast<float>(-kit.lens_centre_offset_y() / kit.r_fb());
    p.invScale[0] = static_cast<float>(1.0 / scaleX), p.invScale[1] = static_cast<float>(1.0 / scaleY);

    const FltPixel c = src.GetCanvasColor();
    const float canvas[4] = {c.R, c.G, c.B, c.A};
    std::memcpy(p.canvas, canvas, sizeof canvas);
    const bool hasPixels = src.HasScanLineData() || src.IsGPUMemDirty();
    const ImgRectI sw = hasPixels ? src.DataWindow() : ImgRectI();
    SetWindow(p.srcWindow, sw);
    // Clipping to the frame reads the frame as the source: canvas inside it beyond the data, its border repeating.
    SetWindow(p.readWindow, s.clipping == kClipFrame ? ImgRectI(0, 0, s.width, s.height) : sw);
    SetWindow(p.outDataWindow, dst.DataWindow());
    p.workSize[0] = dst.DataWindow().Width(), p.workSize[1] = dst.DataWindow().Height();
    p.samples = s.samples;
    p.bilinear = s.bilinear;
    p.duplicate = s.edge == EdgeDuplicate;
    p.distortionMap = s.distortionMap;

    return KROMComputeNode::ExecKernelI(
        req, "LensDistort", nullptr, LensDistortParamsText, sizeof p, offsetof(LensDistortParams, srcCompOrder),
        offsetof(LensDistortParams, dstCompOrder), block, {{"input", const_cast<Image *>(&src)}, {"output", &dst}});
}

} // namespace Orvane::lensdistort
