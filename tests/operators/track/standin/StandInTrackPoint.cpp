// A stand-in for the host's matcher while it is not in the tree: an exhaustive
// search of whole-pixel positions by the mean squared difference of one
// channel. It gives the tracking tools' tests a matcher whose answers are
// exact on shifted test images; it is built only into the tracking tests, and
// only when the host's own matcher is missing.
#include <cmath>
#include <limits>
#include <vector>

#include "host/image/Image.h"
#include "host/track/TrackPoint.h"

namespace Orvane {

struct TrackPoint::State {
    std::vector<float> pattern; // (2 * half + 1)^2 samples, rows from the bottom
    int halfW = 0, halfH = 0;
    double x = 0.5, y = 0.5, searchW = 0.1, searchH = 0.1;
    int channel = -1;
    bool set = false;
};

namespace {

float Sample(const Image &img, int x, int y, int channel) {
    const FltPixel p = img.GetFlt(x, y);
    switch (channel) {
    case 0: return p.R;
    case 1: return p.G;
    case 2: return p.B;
    case 3: return p.A;
    default: return 0.299f * p.R + 0.587f * p.G + 0.114f * p.B;
    }
}

int PixelOf(double v, int size) { return static_cast<int>(std::floor(v * size)); }

} // namespace

TrackPoint::TrackPoint() : state_(new State) {}
TrackPoint::~TrackPoint() { delete state_; }

void TrackPoint::Reset() { *state_ = State{}; }
void TrackPoint::Invalidate() { state_->set = false; }
void TrackPoint::SetChannel(int channel) { state_->channel = channel; }
void TrackPoint::SetSearchArea(double width, double height) { state_->searchW = width, state_->searchH = height; }

bool TrackPoint::SetPattern(const Image *img, double x, double y, double width, double height, double) {
    State &s = *state_;
    s.set = false;
    if (!img) return false;
    const int W = img->Width(), H = img->Height();
    s.halfW = std::max(1, static_cast<int>(std::lround(width * W / 2))),
    s.halfH = std::max(1, static_cast<int>(std::lround(height * H / 2)));
    const int cx = PixelOf(x, W), cy = PixelOf(y, H);
    if (cx - s.halfW < 0 || cy - s.halfH < 0 || cx + s.halfW >= W || cy + s.halfH >= H) return false;
    s.pattern.clear();
    for (int j = -s.halfH; j <= s.halfH; ++j)
        for (int i = -s.halfW; i <= s.halfW; ++i) s.pattern.push_back(Sample(*img, cx + i, cy + j, s.channel));
    s.x = x, s.y = y, s.set = true;
    return true;
}

ImgRectI TrackPoint::GetPatternRect(int width, int height) const {
    const State &s = *state_;
    const int cx = PixelOf(s.x, width), cy = PixelOf(s.y, height);
    return ImgRectI(cx - s.halfW, cy - s.halfH, cx + s.halfW + 1, cy + s.halfH + 1);
}

ImgRectI TrackPoint::GetSearchRect(int width, int height, double x, double y) const {
    const State &s = *state_;
    const int cx = PixelOf(x, width), cy = PixelOf(y, height);
    const int rx = static_cast<int>(std::lround(s.searchW * width / 2)) + s.halfW + 1;
    const int ry = static_cast<int>(std::lround(s.searchH * height / 2)) + s.halfH + 1;
    return ImgRectI(cx - rx, cy - ry, cx + rx + 1, cy + ry + 1);
}

TrackResult TrackPoint::Track(const Image *img, double, double x, double y, TrackSettings &) {
    const State &s = *state_;
    TrackResult best;
    if (!img || !s.set) return best;
    const int W = img->Width(), H = img->Height();
    const int cx = PixelOf(x, W), cy = PixelOf(y, H);
    const int rx = static_cast<int>(std::lround(s.searchW * W / 2)),
              ry = static_cast<int>(std::lround(s.searchH * H / 2));
    double bestSsd = std::numeric_limits<double>::infinity();
    for (int dy = -ry; dy <= ry; ++dy)
        for (int dx = -rx; dx <= rx; ++dx) {
            const int px = cx + dx, py = cy + dy;
            if (px - s.halfW < 0 || py - s.halfH < 0 || px + s.halfW >= W || py + s.halfH >= H) continue;
            double ssd = 0.0;
            size_t k = 0;
            for (int j = -s.halfH; j <= s.halfH; ++j)
                for (int i = -s.halfW; i <= s.halfW; ++i) {
                    const double d = Sample(*img, px + i, py + j, s.channel) - s.pattern[k++];
                    ssd += d * d;
                }
            ssd /= static_cast<double>(s.pattern.size());
            if (ssd < bestSsd) {
                bestSsd = ssd;
                best = {(px + 0.5) / W, (py + 0.5) / H, ssd, true};
            }
        }
    return best;
}

} // namespace Orvane
