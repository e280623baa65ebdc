#include "tests/host/matte/MatteTestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>

#include "host/image/PixelMemory.h"

namespace Orvane::MatteTest {

double Tolerance(int depth, float want) {
    switch (FormatOfDepth(depth).type) {
    case ComponentType::Int8: return 0.51 / 255;
    case ComponentType::Int16: return 0.51 / 65535;
    case ComponentType::Flt16: return 5e-4 * std::max(1.f, std::abs(want));
    default: return 2e-6 * std::max(1.f, std::abs(want));
    }
}

void ExpectEveryPixel(const Image &got, const std::function<FltPixel(int x, int y)> &want) {
    const bool integer = !got.IsFloat();
    for (int y = -2; y < got.Height() + 2; ++y)
        for (int x = -2; x < got.Width() + 2; ++x) {
            const FltPixel g = got.GetFlt(x, y), w = want(x, y);
            const float gv[] = {g.R, g.G, g.B, g.A}, wv[] = {w.R, w.G, w.B, w.A};
            for (int c = got.IsMask() ? 3 : 0; c < 4; ++c) { // a mask's value is its alpha
                const float expected = integer && got.DataWindow().Contains(x, y) ? std::clamp(wv[c], 0.f, 1.f) : wv[c];
                ASSERT_NEAR(gv[c], expected, Tolerance(got.Depth(), expected))
                    << "pixel " << x << "," << y << " channel " << c;
            }
        }
}

TightMemory::TightMemory() {
    SetPixelPoolLimit(0); // pooled blocks would make room
    SetPixelMemoryLimit(PixelMemoryInUse() + 1024);
}

TightMemory::~TightMemory() {
    SetPixelMemoryLimit(0);
    SetPixelPoolLimit(poolLimit);
}

bool SamePixels(const Image &a, const Image &b) {
    if (a.DataWindow() != b.DataWindow() || a.Depth() != b.Depth() || !(a.GetCanvasColor() == b.GetCanvasColor()))
        return false;
    for (int y = a.DataWindow().y0; y < a.DataWindow().y1; ++y)
        if (std::memcmp(a.ScanLine(y), b.ScanLine(y), a.RowBytes()) != 0) return false;
    return true;
}

} // namespace Orvane::MatteTest
