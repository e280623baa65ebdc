#include "operators/warp/ModelPf.h"

#include <cmath>

namespace Orvane {

PfBarrel::PfBarrel(const PfBarrelSettings &s)
    : c3_(s.lowOrder), c5_(s.highOrder), squeeze_(s.squeeze),
      scale_(std::sqrt(2.0) / std::sqrt(double(s.width) * s.width + double(s.height) * s.height)),
      unscale_(1.0 / scale_), centerA_(scale_ * s.centerX * s.width),
      centerB_(scale_ * s.centerY * s.height / s.squeeze) {}

PfPoint PfBarrel::Direct(PfPoint p) const {
    const double a = scale_ * p.x;
    const double b = scale_ * p.y / squeeze_;
    const double da = a - centerA_;
    const double db = b - centerB_;
    const double r2 = da * da + db * db;
    const double t = (c3_ + c5_ * r2) * r2;
    return {(t * da + a) * unscale_, (t * db + b) * squeeze_ * unscale_};
}

PfInverse PfBarrel::Inverse(PfPoint q, PfPoint start) const {
    PfInverse out{start, 0};
    PfPoint &p = out.p;
    while (out.rounds < MaxRounds) {
        const PfPoint f = Direct(p);
        const PfPoint fx = Direct({p.x + Step, p.y});
        const PfPoint fy = Direct({p.x, p.y + Step});
        const double lx = std::hypot(fx.x - f.x, fx.y - f.y) / Step;
        const double ly = std::hypot(fy.x - f.x, fy.y - f.y) / Step;
        if (lx == 0.0 || ly == 0.0) break;
        const double dx = (f.x - q.x) / lx;
        const double dy = (f.y - q.y) / ly;
        p.x -= dx;
        p.y -= dy;
        ++out.rounds;
        if (dx * dx + dy * dy < StopStep2) break;
    }
    return out;
}

} // namespace Orvane
