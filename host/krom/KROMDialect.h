#pragma once
// The KROM kernel dialect: one kernel text for every back end.
//
// A kernel is written once, as text, with these words, and compiled at run
// time behind a header that maps them onto OpenCL C or CUDA C++:
//
//   __KERNEL__ void Name(__CONSTANTREF__ NameParams *p_pParams,
//                        __TEXTURE2D__ input, __TEXTURE2D_WRITE__ output)
//       a kernel: its parameter block first, then images, samplers (__SAMPLER__)
//       and scalars, bound by name (KROMComputeNode::AddInput and friends).
//   DEFINE_KERNEL_ITERATORS_XY(x, y)   the work item's position; test it
//       against p_pParams->workSize, since the grid may be larger.
//   _tex2DVecN(img, x, y, order)       a pixel as float4 (red, green, blue,
//       alpha) whatever the image stores; single-channel images give their
//       value in all four places; (0,0,0,0) outside the image.
//   _tex2DVec4Write(img, x, y, v)      stores a pixel (single-channel images
//       store alpha), converting to the image's component type exactly as the
//       host's rows do (round to nearest, clamped, for integers; round to
//       nearest even for half floats).
//   _tex2DSample(img, sampler, u, v)   a filtered read through a sampler.
//   get_comp_order(order, i)           the order of the i-th image packed four
//       bits each into one integer.
//   make_intensity(v, order)           fits v to a one-channel output (all
//       four places hold alpha) and leaves it alone otherwise.
//   to_float4_v(a), to_int2(a), to_int4_v(a)   vectors from arrays.
//   IsInsideROI(pos, w)                pos within w = {x0, x1, y0, y1}.
//   make_float4, make_int2, make_int4, float4 arithmetic, and the maths
//   functions _fmaxf, _fminf, _fabs, _powf, _sqrtf, _floorf, _ceilf, _fmodf,
//   _expf, _logf, _acosf, _atan2f, _sinf, _cosf, _copysignf, _clampf.
//   KROM_FN marks a helper function; KROM_GLOBAL qualifies pointers into
//   device memory.
//
// Component orders. The low four bits are the channels a buffer holds
// (15 RGBA, 8 alpha only), bits 4 and 5 its component type (0 int8, 1 int16,
// 2 float16, 3 float32).
//
// Device images are device memory that starts with a 64-byte header (width,
// height, row bytes, component type, channel count) followed by the rows,
// bottom row first, as the host stores them; pixel (0, 0) is the corner of the
// image's data window.
//
// Floating point: the headers switch off contraction into fused
// multiply-adds and ask for correctly rounded division and square roots, so
// a kernel that does the host's arithmetic in the host's order gets the
// host's bits.
//
// Thread safety: the texts are constants.
#include <string>

#include "host/core/Export.h"
#include "host/krom/DeviceContext.h"

namespace Orvane {

/// Channel masks of component orders.
constexpr int CompOrderRGBA = 15;
constexpr int CompOrderAlpha = 8;
/// Bytes before the first row of a device image.
constexpr size_t DeviceImageHeaderBytes = 64;

/// The device image header, as both sides see it.
struct DeviceImageHeader {
    int width = 0, height = 0, rowBytes = 0, componentType = 0, channels = 0;
    int reserved[11] = {};
};
static_assert(sizeof(DeviceImageHeader) == DeviceImageHeaderBytes);

/// The header text that puts a kernel into the back end's language.
ORVANE_API const std::string &DialectHeader(DeviceBackend backend);

/// Texture sampling choices (KROMComputeNode::AddSampler).
enum TextureFilterMode { TextureFilterPoint = 0, TextureFilterLinear = 1 };
enum TextureAddressMode {
    TextureAddressClamp = 0,
    TextureAddressBorder = 1,
    TextureAddressWrap = 2,
    TextureAddressMirror = 3
};
enum TextureNormalizedCoords { TextureCoordsPixels = 0, TextureCoordsNormalized = 1 };

/// A sampler as kernels receive it (by value).
struct DeviceSampler {
    int filter, address, normalized;
};

} // namespace Orvane
