// The pattern matcher on HD sequences of known motion, beside OpenCV's
// pyramidal Lucas-Kanade tracker on the same frames in the same run.
//
// Each sequence is 100 frames of 1920 x 1080 of a texture of random plane
// waves, moved exactly (every pixel is the wave sum at its inverse-moved
// position, so the truth of a point is the motion applied to it) and stored
// at 8 bits, the depth the peer takes. Four points are tracked frame by frame
// from frame 0. Counters: ms_per_frame (the four Track calls of a frame),
// mean_err and worst_err (pixels, against the truth), and the same with the
// prefix peer_ for the peer (its time is that of its tracking calls alone).
#include <benchmark/benchmark.h>

#include <chrono>
#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include "bench/PeerSupport.h"
#include "host/core/Parallel.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"
#include "host/track/TrackPoint.h"

namespace Orvane::Bench {
namespace {

constexpr int kW = 1920, kH = 1080, kFrames = 100, kPoints = 4;
constexpr int kPattern = 31, kSearch = 95; // pixels: the pattern may travel 32 pixels a frame
constexpr double kPi = 3.14159265358979323846;
const double kStart[kPoints][2] = {{480.3, 270.6}, {1440.7, 300.2}, {500.5, 810.1}, {1400.2, 790.8}};

struct Motion {
    double dx = 0, dy = 0, angle = 0, scale = 1;
};

enum class Sequence { Translation, TurnScale, Noise };

Motion MotionAt(Sequence seq, int k) {
    Motion m;
    m.dx = 1.37 * k + 4.0 * std::sin(0.21 * k);
    m.dy = -0.83 * k + 3.0 * std::cos(0.17 * k) - 3.0;
    if (seq == Sequence::TurnScale) {
        m.angle = 0.1 * kPi / 180 * k; // 10 degrees and 8 % over the sequence, about the frame's centre
        m.scale = 1.0 + 0.0008 * k;
    }
    return m;
}

/// Where a point of frame 0 lies under `m` (pixel coordinates, rows from the bottom).
void Apply(const Motion &m, double x, double y, double &tx, double &ty) {
    const double cx = kW / 2.0, cy = kH / 2.0, c = std::cos(m.angle), s = std::sin(m.angle);
    tx = cx + m.scale * (c * (x - cx) - s * (y - cy)) + m.dx;
    ty = cy + m.scale * (s * (x - cx) + c * (y - cy)) + m.dy;
}

struct Waves {
    std::vector<double> kx, ky, phase, amp;
    Waves() {
        std::mt19937 rng(2024);
        std::uniform_real_distribution<double> u(0.0, 1.0);
        for (int i = 0; i < 12; ++i) {
            const double period = 8.0 + 72.0 * u(rng), dir = 2 * kPi * u(rng);
            kx.push_back(2 * kPi / period * std::cos(dir));
            ky.push_back(2 * kPi / period * std::sin(dir));
            phase.push_back(2 * kPi * u(rng));
            amp.push_back(0.02 + 0.03 * u(rng));
        }
    }
};

/// Frame k, top row first (the file order), 8 bits. Along a row the inverse-moved position advances linearly,
/// so each wave's phase turns by a fixed step per pixel: one complex product per wave and pixel.
std::vector<uint8_t> MakeFrame(const Waves &w, Sequence seq, int k) {
    const Motion m = MotionAt(seq, k);
    const double cx = kW / 2.0, cy = kH / 2.0, c = std::cos(m.angle) / m.scale, s = std::sin(m.angle) / m.scale;
    std::vector<uint8_t> out(static_cast<size_t>(kW) * kH);
    ParallelRange(0, kH, [&](int begin, int end) {
        std::mt19937 rng(1000003u * k + begin);
        std::normal_distribution<double> noise(0.0, 0.03);
        const size_t n = w.kx.size();
        std::vector<std::complex<double>> z(n), step(n);
        for (int row = begin; row < end; ++row) {
            const double py = (kH - 1 - row) + 0.5 - m.dy - cy, px = 0.5 - m.dx - cx;
            // Frame-0 position of this row's first pixel centre, and its advance per pixel.
            const double sx = cx + c * px + s * py, sy = cy - s * px + c * py;
            for (size_t i = 0; i < n; ++i) {
                z[i] = std::polar(1.0, w.kx[i] * sx + w.ky[i] * sy + w.phase[i]);
                step[i] = std::polar(1.0, w.kx[i] * c - w.ky[i] * s);
            }
            uint8_t *dst = out.data() + static_cast<size_t>(row) * kW;
            for (int x = 0; x < kW; ++x) {
                double v = 0.5;
                for (size_t i = 0; i < n; ++i) {
                    v += w.amp[i] * z[i].imag();
                    z[i] *= step[i];
                }
                if (seq == Sequence::Noise) v += noise(rng);
                dst[x] = static_cast<uint8_t>(std::clamp(v * 255.0 + 0.5, 0.0, 255.0));
            }
        }
    });
    return out;
}

Ref<Image> ToImage(const std::vector<uint8_t> &frame) {
    Ref<Image> img = NewImageTagList({{ImgWidth, kW}, {ImgHeight, kH}, {ImgDepth, DepthAInt8}});
    img->AllocScanLineData();
    for (int y = 0; y < kH; ++y)
        std::copy_n(frame.data() + static_cast<size_t>(kH - 1 - y) * kW, kW, img->Row<uint8_t>(y));
    return img;
}

void WritePgm(const std::string &path, const std::vector<uint8_t> &frame) {
    std::ofstream f(path, std::ios::binary);
    f << "P5\n" << kW << " " << kH << "\n255\n";
    f.write(reinterpret_cast<const char *>(frame.data()), static_cast<std::streamsize>(frame.size()));
}

struct Errors {
    double sum = 0, worst = 0;
    int count = 0;
    void Add(const Motion &m, int point, double x, double y) {
        double tx, ty;
        Apply(m, kStart[point][0], kStart[point][1], tx, ty);
        const double e = std::hypot(x - tx, y - ty);
        sum += e;
        worst = std::max(worst, std::isfinite(e) ? e : 1e9);
        ++count;
    }
};

/// Runs the peer on the written frames; false (with the reason in `why`) when it cannot.
bool RunPeer(const std::string &folder, Sequence seq, Errors &errors, double &secondsPerFrame, std::string &why) {
    const char *python = "/usr/bin/python3";
    std::string out;
    if (CapturePeer(std::string(python) + " -c 'import cv2'", out) != 0) {
        why = "peer skipped: OpenCV's Python module is missing (scripts/setup-bench-peers.sh installs it)";
        return false;
    }
    std::ostringstream cmd;
    cmd.precision(10);
    cmd << python << " " << ORVANE_SOURCE_DIR << "/bench/peers/opencv_lk_track.py " << folder << " " << kFrames << " "
        << kPattern << " 3";
    // OpenCV's pixel centres lie on whole numbers, rows from the top.
    for (const auto &p : kStart) cmd << " " << p[0] - 0.5 << "," << kH - 0.5 - p[1];
    if (CapturePeer(cmd.str(), out) != 0) {
        why = "peer failed: " + out.substr(0, 200);
        return false;
    }
    std::istringstream lines(out);
    std::string word;
    secondsPerFrame = -1;
    while (lines >> word) {
        if (word == "seconds_per_frame") {
            lines >> secondsPerFrame;
        } else if (word == "pos") {
            int k;
            lines >> k;
            for (int p = 0; p < kPoints; ++p) {
                double x, y;
                lines >> x >> y;
                if (k > 0) errors.Add(MotionAt(seq, k), p, x + 0.5, kH - 0.5 - y);
            }
        }
    }
    if (secondsPerFrame < 0 || errors.count != (kFrames - 1) * kPoints) {
        why = "peer gave no usable output";
        return false;
    }
    return true;
}

void BM_Track(benchmark::State &state, Sequence seq) {
    const Waves waves;
    const std::string folder = PeerOutput("-track");
    std::filesystem::create_directories(folder);
    for (auto _ : state) {
        TrackPoint points[kPoints];
        TrackResult last[kPoints];
        TrackSettings settings;
        settings.tracking = true;
        Errors ours;
        double spent = 0;
        for (int k = 0; k < kFrames; ++k) {
            const std::vector<uint8_t> frame = MakeFrame(waves, seq, k);
            char name[32];
            std::snprintf(name, sizeof name, "/frame_%04d.pgm", k);
            WritePgm(folder + name, frame);
            const Ref<Image> img = ToImage(frame);
            const auto start = std::chrono::steady_clock::now();
            for (int p = 0; p < kPoints; ++p) {
                const double x = kStart[p][0] / kW, y = kStart[p][1] / kH;
                if (k == 0) {
                    points[p].SetSearchArea(double(kSearch) / kW, double(kSearch) / kH);
                    points[p].SetPattern(img.Get(), x, y, double(kPattern) / kW, double(kPattern) / kH, 0);
                    last[p] = {x, y, 0, true};
                } else {
                    last[p] = points[p].Track(img.Get(), k, last[p].x, last[p].y, settings);
                }
            }
            spent += std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
            if (k > 0)
                for (int p = 0; p < kPoints; ++p)
                    ours.Add(MotionAt(seq, k), p, last[p].found ? last[p].x * kW : NAN, last[p].y * kH);
        }
        state.SetIterationTime(spent);
        state.counters["ms_per_frame"] = 1e3 * spent / kFrames;
        state.counters["mean_err"] = ours.sum / ours.count;
        state.counters["worst_err"] = ours.worst;

        Errors peer;
        double peerSeconds = 0;
        std::string why;
        if (RunPeer(folder, seq, peer, peerSeconds, why)) {
            state.counters["peer_ms_per_frame"] = 1e3 * peerSeconds;
            state.counters["peer_mean_err"] = peer.sum / peer.count;
            state.counters["peer_worst_err"] = peer.worst;
        } else {
            state.SetLabel(why);
        }
    }
    std::filesystem::remove_all(folder);
}

BENCHMARK_CAPTURE(BM_Track, translation, Sequence::Translation)
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond)
    ->Iterations(1);
BENCHMARK_CAPTURE(BM_Track, turn_scale, Sequence::TurnScale)
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond)
    ->Iterations(1);
BENCHMARK_CAPTURE(BM_Track, noise, Sequence::Noise)->UseManualTime()->Unit(benchmark::kMillisecond)->Iterations(1);

} // namespace
} // namespace Orvane::Bench
