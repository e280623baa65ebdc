#include "host/krom/KROMDialect.h"

namespace Orvane {
namespace {

// OpenCL C 1.2: images are __global memory, helpers are static inline.
const char kOpenCLHead[] = R"KROM(
#pragma OPENCL FP_CONTRACT OFF
#define __KERNEL__ __kernel
#define __CONSTANTREF__ __global const
#define __TEXTURE2D__ __global const KromImage *
#define __TEXTURE2D_WRITE__ __global KromImage *
#define __SAMPLER__ KromSampler
#define KROM_FN static inline
#define KROM_GLOBAL __global
#define DEFINE_KERNEL_ITERATORS_XY(x, y) const int x = (int)get_global_id(0); const int y = (int)get_global_id(1)
#define make_float4(a, b, c, d) ((float4)((a), (b), (c), (d)))
#define make_int2(a, b) ((int2)((a), (b)))
#define make_int4(a, b, c, d) ((int4)((a), (b), (c), (d)))
#define krom_as_float(u) as_float(u)
#define krom_as_uint(f) as_uint(f)
#define _fmaxf fmax
#define _fminf fmin
#define _fabs fabs
#define _powf pow
#define _sqrtf sqrt
#define _floorf floor
#define _ceilf ceil
#define _fmodf fmod
#define _expf exp
#define _logf log
#define _acosf acos
#define _atan2f atan2
#define _sinf sin
#define _cosf cos
#define _copysignf copysign
)KROM";

// CUDA C++ through NVRTC: images are plain device pointers; float4 gets the
// arithmetic OpenCL has built in.
const char kCUDAHead[] = R"KROM(
typedef unsigned char uchar;
typedef unsigned short ushort;
typedef unsigned int uint;
typedef unsigned long long ulong;
#define __KERNEL__ extern "C" __global__
#define __CONSTANTREF__ const
#define __TEXTURE2D__ const KromImage *
#define __TEXTURE2D_WRITE__ KromImage *
#define __SAMPLER__ KromSampler
#define KROM_FN static __device__ __forceinline__
#define KROM_GLOBAL
#define DEFINE_KERNEL_ITERATORS_XY(x, y) const int x = (int)(blockIdx.x * blockDim.x + threadIdx.x); const int y = (int)(blockIdx.y * blockDim.y + threadIdx.y)
#define krom_as_float(u) __uint_as_float(u)
#define krom_as_uint(f) __float_as_uint(f)
#define _fmaxf fmaxf
#define _fminf fminf
#define _fabs fabsf
#define _powf powf
#define _sqrtf sqrtf
#define _floorf floorf
#define _ceilf ceilf
#define _fmodf fmodf
#define _expf expf
#define _logf logf
#define _acosf acosf
#define _atan2f atan2f
#define _sinf sinf
#define _cosf cosf
#define _copysignf copysignf
KROM_FN float4 operator+(float4 a, float4 b) { return make_float4(a.x + b.x, a.y + b.y, a.z + b.z, a.w + b.w); }
KROM_FN float4 operator-(float4 a, float4 b) { return make_float4(a.x - b.x, a.y - b.y, a.z - b.z, a.w - b.w); }
KROM_FN float4 operator*(float4 a, float4 b) { return make_float4(a.x * b.x, a.y * b.y, a.z * b.z, a.w * b.w); }
KROM_FN float4 operator/(float4 a, float4 b) { return make_float4(a.x / b.x, a.y / b.y, a.z / b.z, a.w / b.w); }
KROM_FN float4 operator*(float4 a, float s) { return make_float4(a.x * s, a.y * s, a.z * s, a.w * s); }
KROM_FN float4 operator*(float s, float4 a) { return make_float4(a.x * s, a.y * s, a.z * s, a.w * s); }
KROM_FN float4 operator/(float4 a, float s) { return make_float4(a.x / s, a.y / s, a.z / s, a.w / s); }
KROM_FN float4 operator+(float4 a, float s) { return make_float4(a.x + s, a.y + s, a.z + s, a.w + s); }
KROM_FN float4 operator-(float4 a, float s) { return make_float4(a.x - s, a.y - s, a.z - s, a.w - s); }
)KROM";

// Shared by both: the image and sampler records, pixel conversion exactly as
// the host converts (PixelConvert.h, Half.h), reads, writes and sampling.
const char kCommon[] = R"KROM(
typedef struct { int width, height, rowBytes, type, channels, reserved[11]; } KromImage;
typedef struct { int filter, address, normalized; } KromSampler;
#define _clampf(v, lo, hi) _fminf(_fmaxf((v), (lo)), (hi))
#define to_float4_v(a) make_float4((a)[0], (a)[1], (a)[2], (a)[3])
#define to_int2(a) make_int2((a)[0], (a)[1])
#define to_int4_v(a) make_int4((a)[0], (a)[1], (a)[2], (a)[3])
#define IsInsideROI(pos, w) ((pos).x >= (w)[0] && (pos).x < (w)[1] && (pos).y >= (w)[2] && (pos).y < (w)[3])
#define get_comp_order(order, i) (((order) >> (4 * (i))) & 15)
#define _tex2DVecN(img, x, y, order) krom_read((img), (x), (y))
#define _tex2DVec4Write(img, x, y, v) krom_write((img), (x), (y), (v))
#define _tex2DSample(img, s, u, v) krom_sample((img), (s), (u), (v))

KROM_FN float4 make_intensity(float4 v, int order) {
    return (order & 15) == 8 ? make_float4(v.w, v.w, v.w, v.w) : v;
}

KROM_FN float krom_half_to_float(uint h) {
    uint sign = (h & 0x8000u) << 16, e = (h >> 10) & 0x1fu, m = h & 0x3ffu, bits;
    if (e == 0u) {
        if (m == 0u) {
            bits = sign;
        } else {
            e = 113u;
            while ((m & 0x400u) == 0u) { m <<= 1; --e; }
            bits = sign | (e << 23) | ((m & 0x3ffu) << 13);
        }
    } else if (e == 0x1fu) {
        bits = sign | 0x7f800000u | (m << 13);
    } else {
        bits = sign | ((e + 112u) << 23) | (m << 13);
    }
    return krom_as_float(bits);
}

KROM_FN ushort krom_float_to_half(float f) {
    uint bits = krom_as_uint(f), sign = (bits >> 16) & 0x8000u, a = bits & 0x7fffffffu;
    if (a >= 0x7f800000u) return (ushort)(sign | 0x7c00u | (a > 0x7f800000u ? 0x200u | ((a >> 13) & 0x3ffu) : 0u));
    if (a >= 0x477ff000u) return (ushort)(sign | 0x7c00u);
    if (a < 0x38800000u) {
        if (a < 0x33000000u) return (ushort)sign;
        uint shift = 126u - (a >> 23), m = (a & 0x7fffffu) | 0x800000u, r = m >> shift;
        uint rest = m & ((1u << shift) - 1u), halfway = 1u << (shift - 1u);
        if (rest > halfway || (rest == halfway && (r & 1u))) ++r;
        return (ushort)(sign | r);
    }
    uint r = (a - 0x38000000u) >> 13, rest = a & 0x1fffu;
    if (rest > 0x1000u || (rest == 0x1000u && (r & 1u))) ++r;
    return (ushort)(sign | r);
}

KROM_FN int krom_type_bytes(int type) { return type == 0 ? 1 : (type == 3 ? 4 : 2); }

KROM_FN float krom_load(KROM_GLOBAL const uchar *p, int type) {
    if (type == 0) return (float)p[0] * (1.f / 255.f);
    if (type == 1) return (float)(*(KROM_GLOBAL const ushort *)p) * (1.f / 65535.f);
    if (type == 2) return krom_half_to_float(*(KROM_GLOBAL const ushort *)p);
    return *(KROM_GLOBAL const float *)p;
}

KROM_FN void krom_store(KROM_GLOBAL uchar *p, int type, float v) {
    if (type == 0) {
        *p = !(v > 0.f) ? (uchar)0 : (v >= 1.f ? (uchar)255 : (uchar)(v * 255.f + 0.5f));
    } else if (type == 1) {
        *(KROM_GLOBAL ushort *)p = !(v > 0.f) ? (ushort)0 : (v >= 1.f ? (ushort)65535 : (ushort)(v * 65535.f + 0.5f));
    } else if (type == 2) {
        *(KROM_GLOBAL ushort *)p = krom_float_to_half(v);
    } else {
        *(KROM_GLOBAL float *)p = v;
    }
}

KROM_FN float4 krom_read(KROM_GLOBAL const KromImage *img, int x, int y) {
    if (x < 0 || y < 0 || x >= img->width || y >= img->height) return make_float4(0.f, 0.f, 0.f, 0.f);
    const int cb = krom_type_bytes(img->type);
    KROM_GLOBAL const uchar *p = (KROM_GLOBAL const uchar *)img + 64 + (ulong)y * (ulong)img->rowBytes +
                                 (ulong)x * (ulong)(cb * img->channels);
    if (img->channels == 1) {
        const float v = krom_load(p, img->type);
        return make_float4(v, v, v, v);
    }
    return make_float4(krom_load(p, img->type), krom_load(p + cb, img->type), krom_load(p + 2 * cb, img->type),
                       krom_load(p + 3 * cb, img->type));
}

KROM_FN void krom_write(KROM_GLOBAL KromImage *img, int x, int y, float4 v) {
    if (x < 0 || y < 0 || x >= img->width || y >= img->height) return;
    const int cb = krom_type_bytes(img->type);
    KROM_GLOBAL uchar *p = (KROM_GLOBAL uchar *)img + 64 + (ulong)y * (ulong)img->rowBytes +
                           (ulong)x * (ulong)(cb * img->channels);
    if (img->channels == 1) {
        krom_store(p, img->type, v.w);
        return;
    }
    krom_store(p, img->type, v.x);
    krom_store(p + cb, img->type, v.y);
    krom_store(p + 2 * cb, img->type, v.z);
    krom_store(p + 3 * cb, img->type, v.w);
}

/// A texel index under an address mode; -1 for the border.
KROM_FN int krom_address(int i, int n, int mode) {
    if (mode == 1) return (i < 0 || i >= n) ? -1 : i;
    if (mode == 2) return ((i % n) + n) % n;
    if (mode == 3) {
        int p = ((i % (2 * n)) + 2 * n) % (2 * n);
        return p < n ? p : 2 * n - 1 - p;
    }
    return i < 0 ? 0 : (i >= n ? n - 1 : i);
}

KROM_FN float4 krom_texel(KROM_GLOBAL const KromImage *img, KromSampler s, int x, int y) {
    const int ax = krom_address(x, img->width, s.address), ay = krom_address(y, img->height, s.address);
    if (ax < 0 || ay < 0) return make_float4(0.f, 0.f, 0.f, 0.f);
    return krom_read(img, ax, ay);
}

KROM_FN float4 krom_sample(KROM_GLOBAL const KromImage *img, KromSampler s, float u, float v) {
    float fx = s.normalized ? u * (float)img->width : u;
    float fy = s.normalized ? v * (float)img->height : v;
    if (s.filter == 0) return krom_texel(img, s, (int)_floorf(fx), (int)_floorf(fy));
    fx -= 0.5f;
    fy -= 0.5f;
    const float x0 = _floorf(fx), y0 = _floorf(fy), ax = fx - x0, ay = fy - y0;
    const int ix = (int)x0, iy = (int)y0;
    const float4 bottom = krom_texel(img, s, ix, iy) * (1.f - ax) + krom_texel(img, s, ix + 1, iy) * ax;
    const float4 top = krom_texel(img, s, ix, iy + 1) * (1.f - ax) + krom_texel(img, s, ix + 1, iy + 1) * ax;
    return bottom * (1.f - ay) + top * ay;
}
)KROM";

} // namespace

const std::string &DialectHeader(DeviceBackend backend) {
    static const std::string openCL = std::string(kOpenCLHead) + kCommon;
    static const std::string cuda = std::string(kCUDAHead) + kCommon;
    return backend == DeviceBackend::CUDA ? cuda : openCL;
}

} // namespace Orvane
