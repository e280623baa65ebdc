#include "operators/mask/PrimitiveGeometry.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace Orvane::maskgeo {

int JoinOfButton(double stored) {
    switch (static_cast<int>(std::floor(stored + 0.5))) {
    case 0: return 0;  // Bevel
    case 2: return 1;  // Miter
    case 3: return 3;  // Miter Clip
    default: return 2; // Round, and anything else
    }
}

int CapOfButton(double stored) {
    switch (static_cast<int>(std::floor(stored + 0.5))) {
    case 0: return 0;  // Flat
    case 2: return 1;  // Square
    default: return 2; // Rounded, and anything else
    }
}

WriteOn WriteOnRange(double position, double length) {
    const double start = position + std::min(0.0, length);
    return {start, start + std::fabs(length)};
}

bool InvertOn(double value, bool ellipse) { return value >= (ellipse ? 0.9999998807907104 : 0.5); }

Placement::Placement(double sx, double sy, double degrees, double x, double y) : tx(x), ty(y) {
    const double a = degrees * std::numbers::pi / 180.0, c = std::cos(a), s = std::sin(a);
    m[0][0] = c * sx, m[0][1] = -s * sy;
    m[1][0] = s * sx, m[1][1] = c * sy;
}

double EllipseBorder(double border, double hw, double hh) { return std::max(border, -std::max(2.0 * hw, 2.0 * hh)); }

std::vector<Pt> EllipsePoints(double hw, double hh, double b, const Placement &place, int width) {
    if (!(hw > 0.0 && hh > 0.0)) return {};
    const double rx = (b / 2 + hw) * width, ry = (b / 2 + hh) * width;
    const int n = static_cast<int>(std::max(4.0 * std::sqrt(rx * rx + ry * ry), 4.0));
    std::vector<Pt> points(n);
    for (int i = 0; i < n; ++i) {
        const double a = 2.0 * std::numbers::pi * i / n;
        points[i] = place({std::cos(a), std::sin(a)});
    }
    return points;
}

std::vector<Pt> RectanglePoints(double hw, double hh, double corner, double o, const Placement &place, int width) {
    const double r0 = corner * std::min(hw, hh);
    const double r = std::max(r0, 0.0) + (std::fabs(r0) > kTiny ? o : 0.0);
    const double R = std::max(hw + o, 0.0), T = std::max(hh + o, 0.0), L = std::min(-hw - o, 0.0),
                 B = std::min(-hh - o, 0.0);
    std::vector<Pt> p{{R, 0.0}};
    if (r <= 0.0) {
        p.insert(p.end(), {{R, T}, {L, T}, {L, B}, {R, B}});
    } else {
        const int n = std::max(static_cast<int>(width * r + 0.5), 8);
        // Each corner is a quarter circle of n chords about its centre, from the side before it to the side after
        // it; where a side has no length (a radius as large as the half-size) its ends are one point, kept once.
        const Pt centres[4] = {{std::max(R - r, 0.0), std::max(T - r, 0.0)},
                               {std::min(L + r, 0.0), std::max(T - r, 0.0)},
                               {std::min(L + r, 0.0), std::min(B + r, 0.0)},
                               {std::max(R - r, 0.0), std::min(B + r, 0.0)}};
        auto add = [&p](Pt q) {
            if (q.x != p.back().x || q.y != p.back().y) p.push_back(q);
        };
        const Pt axis[5] = {{1, 0}, {0, 1}, {-1, 0}, {0, -1}, {1, 0}}; // the arcs' ends, exactly
        for (int c = 0; c < 4; ++c)
            for (int k = 0; k <= n; ++k) {
                const double a = (90.0 * c + 90.0 * k / n) * std::numbers::pi / 180.0;
                const Pt u = k == 0 ? axis[c] : k == n ? axis[c + 1] : Pt{std::cos(a), std::sin(a)};
                add({centres[c].x + r * u.x, centres[c].y + r * u.y});
            }
        if (p.size() > 1 && p.back().x == p.front().x && p.back().y == p.front().y) p.pop_back();
    }
    for (Pt &q : p) q = place(q);
    return p;
}

ImgRectI PixelBox(Pt lo, Pt hi, int width, double aspectX, double aspectY) {
    const double yScale = width * aspectX / aspectY;
    auto clampInt = [](double v) { return static_cast<int>(std::clamp(v, -2.0 * DomainEndless, 2.0 * DomainEndless)); };
    ImgRectI box(clampInt(std::floor(lo.x * width)), clampInt(std::floor(lo.y * yScale)),
                 clampInt(std::ceil(hi.x * width)), clampInt(std::ceil(hi.y * yScale)));
    if (hi.x - lo.x > kTiny) box.x0 -= 1, box.x1 += 1;
    if (hi.y - lo.y > kTiny) box.y0 -= 1, box.y1 += 1;
    return box;
}

const float kTeapotOuter[102][2] = {
    {-0.001024f, 0.000000f}, {0.008030f, 0.000022f},  {0.017084f, 0.000095f},  {0.026137f, 0.000233f},
    {0.035188f, 0.000457f},  {0.044236f, 0.000801f},  {0.053274f, 0.001334f},  {0.062284f, 0.002208f},
    {0.071133f, 0.004029f},  {0.076893f, 0.010347f},  {0.083839f, 0.016104f},  {0.090308f, 0.022373f},
    {0.095622f, 0.029620f},  {0.103252f, 0.034112f},  {0.111073f, 0.038629f},  {0.118539f, 0.043702f},
    {0.125586f, 0.049334f},  {0.132130f, 0.055532f},  {0.138063f, 0.062307f},  {0.143238f, 0.069665f},
    {0.147397f, 0.077627f},  {0.150000f, 0.086202f},  {0.149157f, 0.094969f},  {0.142219f, 0.100461f},
    {0.133499f, 0.102810f},  {0.124520f, 0.103943f},  {0.115485f, 0.104525f},  {0.106436f, 0.104820f},
    {0.097383f, 0.104958f},  {0.088329f, 0.105011f},  {0.080732f, 0.107284f},  {0.076875f, 0.115404f},
    {0.072551f, 0.123252f},  {0.069582f, 0.120090f},  {0.061793f, 0.122934f},  {0.053122f, 0.125443f},
    {0.044203f, 0.126985f},  {0.035250f, 0.128323f},  {0.026312f, 0.129755f},  {0.017459f, 0.131628f},
    {0.009118f, 0.134995f},  {0.009702f, 0.142756f},  {0.015683f, 0.149490f},  {0.013810f, 0.156168f},
    {0.004864f, 0.157403f},  {-0.004188f, 0.157500f}, {-0.013205f, 0.156780f}, {-0.019115f, 0.151809f},
    {-0.013533f, 0.144802f}, {-0.009557f, 0.137112f}, {-0.016890f, 0.132382f}, {-0.025680f, 0.130251f},
    {-0.034603f, 0.128732f}, {-0.043556f, 0.127394f}, {-0.052492f, 0.125954f}, {-0.061303f, 0.123914f},
    {-0.069008f, 0.120208f}, {-0.072427f, 0.124841f}, {-0.077753f, 0.117846f}, {-0.081626f, 0.109733f},
    {-0.085425f, 0.101586f}, {-0.089082f, 0.093377f}, {-0.092524f, 0.085076f}, {-0.095653f, 0.076655f},
    {-0.098347f, 0.068088f}, {-0.104672f, 0.066263f}, {-0.112643f, 0.070434f}, {-0.118661f, 0.077075f},
    {-0.122540f, 0.085167f}, {-0.125444f, 0.093667f}, {-0.128770f, 0.102007f}, {-0.133793f, 0.109435f},
    {-0.141041f, 0.114704f}, {-0.144966f, 0.112678f}, {-0.154020f, 0.112599f}, {-0.163022f, 0.112767f},
    {-0.171480f, 0.115951f}, {-0.169078f, 0.113186f}, {-0.160975f, 0.109207f}, {-0.153865f, 0.103684f},
    {-0.148238f, 0.096676f}, {-0.144123f, 0.088694f}, {-0.141100f, 0.080238f}, {-0.138605f, 0.071611f},
    {-0.136091f, 0.062989f}, {-0.133031f, 0.054546f}, {-0.128941f, 0.046549f}, {-0.123495f, 0.039399f},
    {-0.116712f, 0.033478f}, {-0.108910f, 0.028947f}, {-0.100487f, 0.025676f}, {-0.092357f, 0.022373f},
    {-0.085888f, 0.016104f}, {-0.078942f, 0.010347f}, {-0.073182f, 0.004029f}, {-0.064333f, 0.002208f},
    {-0.055323f, 0.001334f}, {-0.046285f, 0.000801f}, {-0.037237f, 0.000457f}, {-0.028186f, 0.000233f},
    {-0.019133f, 0.000095f}, {-0.010079f, 0.000022f},
};

const float kTeapotHole[18][2] = {
    {0.099355f, 0.045000f}, {0.099072f, 0.054505f}, {0.097395f, 0.063892f}, {0.094778f, 0.073091f},
    {0.091503f, 0.082104f}, {0.087771f, 0.090960f}, {0.083730f, 0.099697f}, {0.091309f, 0.101241f},
    {0.101465f, 0.101124f}, {0.111614f, 0.100748f}, {0.121709f, 0.099732f}, {0.131296f, 0.096773f},
    {0.135000f, 0.088549f}, {0.132551f, 0.079336f}, {0.128038f, 0.070820f}, {0.122026f, 0.063158f},
    {0.114770f, 0.056509f}, {0.106488f, 0.051011f},
};

} // namespace Orvane::maskgeo
