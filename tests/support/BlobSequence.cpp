#include "tests/support/BlobSequence.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>

#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/KernelProvider.h"

namespace Orvane::Test {
namespace {

struct Pose {
    double cx, cy, a, b, angle, unit; ///< centre, semi-axes, turn, and pixels per reference pixel
};

Pose PoseAt(int width, int height, int frame) {
    const double phase = 2 * M_PI * frame / kBlobFrames;
    return {width * (0.5 + 0.2 * std::sin(phase)),
            height * (0.4 + 0.1 * std::sin(2 * phase)),
            0.19 * width,
            0.15 * height,
            0.3 + 0.03 * frame,
            width / 160.0};
}

/// (x, y) in the object's own axes.
void ToObject(const Pose &p, double x, double y, double &u, double &v) {
    const double dx = x - p.cx, dy = y - p.cy, c = std::cos(p.angle), s = std::sin(p.angle);
    u = c * dx + s * dy;
    v = -s * dx + c * dy;
}

double Hash(int64_t i, int64_t j, uint32_t seed) {
    uint32_t h = static_cast<uint32_t>(i) * 0x8da6b343u ^ static_cast<uint32_t>(j) * 0xd8163841u ^ seed * 0xcb1ab31fu;
    h ^= h >> 13;
    h *= 0x5bd1e995u;
    h ^= h >> 15;
    return (h & 0xffffff) / double(0xffffff) * 2 - 1;
}

/// Value noise in -1..1: lattice values every `cell` units, blended bilinearly.
double Noise(double x, double y, double cell, uint32_t seed) {
    const double fx = x / cell, fy = y / cell;
    const double ix = std::floor(fx), iy = std::floor(fy), tx = fx - ix, ty = fy - iy;
    const int64_t i = static_cast<int64_t>(ix), j = static_cast<int64_t>(iy);
    const double top = Hash(i, j, seed) * (1 - tx) + Hash(i + 1, j, seed) * tx;
    const double bottom = Hash(i, j + 1, seed) * (1 - tx) + Hash(i + 1, j + 1, seed) * tx;
    return top * (1 - ty) + bottom * ty;
}

/// Texture in -1..1 at a scale of a few reference pixels, plus finer detail.
double Texture(double x, double y, double unit, uint32_t seed) {
    return 0.65 * Noise(x, y, 4 * unit, seed) + 0.35 * Noise(x, y, 1.5 * unit, seed + 1);
}

void AddStroke(std::vector<float> &list, const Pose &p, const std::vector<std::pair<double, double>> &points) {
    const double c = std::cos(p.angle), s = std::sin(p.angle);
    for (auto [u, v] : points) {
        list.push_back(static_cast<float>(p.cx + c * u - s * v));
        list.push_back(static_cast<float>(p.cy + s * u + c * v));
    }
    list.push_back(std::numeric_limits<float>::quiet_NaN());
    list.push_back(std::numeric_limits<float>::quiet_NaN());
}

} // namespace

Ref<Image> MakeBlobFrame(int width, int height, int frame, int depth, const ImgRectI *window, float alpha) {
    const ImgRectI w = window ? *window : ImgRectI(0, 0, width, height);
    Ref<Image> img = NewImageTagList({{ImgWidth, width}, {ImgHeight, height}, {ImgDepth, depth}, {ImgDataWindow, &w}});
    if (!img->AllocScanLineData()) return img;
    const Pose p = PoseAt(width, height, frame);
    const double soft = 1.5 * p.unit;
    ParallelRange(w.y0, w.y1, [&](int y0, int y1) {
        std::vector<FltPixel> row(w.Width());
        for (int y = y0; y < y1; ++y) {
            for (int x = w.x0; x < w.x1; ++x) {
                const double px = x + 0.5, py = y + 0.5;
                double u, v;
                ToObject(p, px, py, u, v);
                // Distance to the edge, to first order: (rho - 1) over rho's gradient.
                const double rho = std::hypot(u / p.a, v / p.b);
                const double grad = std::max(1e-9, std::hypot(u / (p.a * p.a), v / (p.b * p.b)) / std::max(rho, 1e-9));
                const double cover = std::clamp(0.5 - (rho - 1) / grad / soft, 0.0, 1.0);
                const double to = Texture(u, v, p.unit, 7), tb = Texture(px, py, p.unit, 19);
                const double obj[3] = {0.75 * (1 + 0.3 * to), 0.28 * (1 + 0.35 * to), 0.08 * (1 + 0.4 * to)};
                const double bg[3] = {0.09 * (1 + 0.4 * tb), 0.3 * (1 + 0.3 * tb), 0.42 * (1 + 0.3 * tb)};
                auto mix = [&](int c) { return static_cast<float>(alpha * (cover * obj[c] + (1 - cover) * bg[c])); };
                row[x - w.x0] = FltPixel{mix(0), mix(1), mix(2), alpha};
            }
            StoreFlt(depth, row.data(), w.Width(), img->ScanLine(y));
        }
    });
    return img;
}

bool InsideBlob(int width, int height, int frame, double x, double y) {
    const Pose p = PoseAt(width, height, frame);
    double u, v;
    ToObject(p, x, y, u, v);
    return (u / p.a) * (u / p.a) + (v / p.b) * (v / p.b) <= 1;
}

std::vector<float> BlobPositiveStrokes(int width, int height, int frame) {
    const Pose p = PoseAt(width, height, frame);
    std::vector<float> list;
    AddStroke(list, p, {{-0.6 * p.a, 0.05 * p.b}, {0, -0.1 * p.b}, {0.6 * p.a, 0.05 * p.b}});
    AddStroke(list, p, {{0.1 * p.a, -0.55 * p.b}, {0.1 * p.a, 0.55 * p.b}});
    return list;
}

std::vector<float> BlobNegativeStrokes(int width, int height, int frame) {
    const Pose p = PoseAt(width, height, frame);
    std::vector<std::pair<double, double>> loop;
    for (int i = 0; i <= 24; ++i) {
        const double t = i * 2 * M_PI / 24;
        loop.emplace_back(1.45 * p.a * std::cos(t), 1.6 * p.b * std::sin(t));
    }
    std::vector<float> list;
    AddStroke(list, p, loop);
    return list;
}

double BlobIoU(const Image &matte, int width, int height, int frame) {
    int64_t both = 0, either = 0;
    for (int y = 0; y < height; ++y)
        for (int x = 0; x < width; ++x) {
            const bool truth = InsideBlob(width, height, frame, x + 0.5, y + 0.5);
            const bool found = matte.GetFlt(x, y).A >= 0.5f;
            both += truth && found;
            either += truth || found;
        }
    return either == 0 ? 1.0 : static_cast<double>(both) / either;
}

ObjectMaskRun RunObjectMask(const Image &frame, const Image *carried, std::shared_ptr<const void> block,
                            size_t blockSize, const std::vector<float> &pos, const std::vector<float> &neg,
                            const ImgRectI *outWindow) {
    ObjectMaskRun r;
    auto make = [&frame](const ImgRectI &window, int depth) {
        Ref<Image> img = NewImageTagList(
            {{ImgWidth, frame.Width()}, {ImgHeight, frame.Height()}, {ImgDepth, depth}, {ImgDataWindow, &window}});
        img->AllocScanLineData();
        return img;
    };
    const ImgRectI window = outWindow ? *outWindow : frame.DataWindow();
    r.matte = make(window, DepthRGBAFlt32);
    r.carry = make(window, DepthAFlt32);
    Ref<Image> dummy = make(ImgRectI(0, 0, 1, 1), DepthAFlt32);
    auto node = KROMComputeNode::Create(nullptr, "GetObjectMask", nullptr, OrvaneSemanticSegmentationParamsText, false);
    if (!node->IsValid()) {
        r.error = node->Error();
        return r;
    }
    auto src = KROMBuffer::CreateImage(nullptr, const_cast<Image *>(&frame), KROMBufferRead);
    auto in = KROMBuffer::CreateImage(nullptr, const_cast<Image *>(carried ? carried : dummy.Get()), KROMBufferRead);
    auto dst = KROMBuffer::CreateImage(nullptr, r.matte.Get(), KROMBufferWrite);
    auto out = KROMBuffer::CreateImage(nullptr, r.carry.Get(), KROMBufferWrite);
    node->SetParamStruct(std::move(block), blockSize);
    node->AddInput("src", src.get());
    node->AddInput("cachePropMaskIn", in.get());
    node->SetParam("posStroke", pos);
    node->SetParam("negStroke", neg);
    node->AddOutput("cachePropMaskOut", out.get());
    node->AddOutput("dst", dst.get());
    r.ok = node->RunSession();
    r.error = node->Error();
    return r;
}

} // namespace Orvane::Test
