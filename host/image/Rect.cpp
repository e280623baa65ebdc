#include "host/image/Rect.h"

#include <cmath>

namespace Orvane {
namespace {

int ScaleDown(int v, double s) { return IsEndlessSide(v) ? v : static_cast<int>(std::floor(v * s)); }
int ScaleUp(int v, double s) { return IsEndlessSide(v) ? v : static_cast<int>(std::ceil(v * s)); }
int Move(int v, int d) { return IsEndlessSide(v) ? v : v + d; }

} // namespace

void ImgRectI::Scale(double sx, double sy) {
    x0 = ScaleDown(x0, sx);
    y0 = ScaleDown(y0, sy);
    x1 = ScaleUp(x1, sx);
    y1 = ScaleUp(y1, sy);
    Normalise();
}

void ImgRectI::Offset(int dx, int dy) {
    x0 = Move(x0, dx);
    x1 = Move(x1, dx);
    y0 = Move(y0, dy);
    y1 = Move(y1, dy);
}

} // namespace Orvane
