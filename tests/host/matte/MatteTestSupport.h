#pragma once
// Checks the matte step tests share.
#include <functional>

#include "host/image/Image.h"
#include "host/image/PixelMemory.h"

namespace Orvane::MatteTest {

/// How far a stored value may be from the exact one: float32 a few units of
/// rounding, float16 and integers half a step of their depth (and a little).
double Tolerance(int depth, float want);

/// Expects every pixel of `got` over its frame and two pixels around it
/// (canvas included) near want(x, y), held to 0..1 for integer depths.
/// Stops at the first pixel that differs.
void ExpectEveryPixel(const Image &got, const std::function<FltPixel(int x, int y)> &want);

/// Pixel memory held to what is in use now (plus 1 KiB) while it lives.
struct TightMemory {
    TightMemory();
    ~TightMemory();
    size_t poolLimit = PixelPoolLimit();
};

/// Same windows, canvas and bytes in every row.
bool SamePixels(const Image &a, const Image &b);

} // namespace Orvane::MatteTest
