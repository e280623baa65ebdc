#pragma once
// Helpers the image, colour and device tests share: test images, what a depth stores of a value (worked out
// here, not by the host's converters), the resize filters from their definitions, comparisons, other programs.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <limits>
#include <numbers>
#include <numeric>
#include <string>
#include <type_traits>
#include <vector>

#include <unistd.h>

#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/image/ResizeFilters.h"
#include "tests/support/CompilerHalf.h"
#include "tests/support/TestSupport.h"

namespace Orvane::Test {

/// A w x h image of `depth` without rows, over `dw` when given.
inline Ref<Image> Blank(int w, int h, int depth, const ImgRectI *dw = nullptr) {
    TagList tags{{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}};
    if (dw) tags.Set({ImgDataWindow, dw});
    return NewImageTagList(tags);
}

/// The test pattern stored at `depth`, so that reads give what the depth holds; `canvas` beyond `dw`.
inline Ref<Image> PatternAt(int w, int h, int depth, unsigned seed = 3, const ImgRectI *dw = nullptr,
                            FltPixel canvas = {}) {
    Ref<Image> img = Blank(w, h, depth, dw);
    EXPECT_TRUE(img->AllocScanLineData());
    img->ImageCopy(PatternImage(w, h, DepthRGBAFlt32, seed).Get());
    img->SetCanvasColor(canvas);
    return img;
}

/// A w x h image of `depth` whose data window (`dw`, else the frame) holds f(x, y), with `canvas` beyond.
inline Ref<Image> Filled(int w, int h, int depth, const std::function<FltPixel(int, int)> &f,
                         const ImgRectI *dw = nullptr, FltPixel canvas = {}) {
    Ref<Image> img = Blank(w, h, depth, dw);
    EXPECT_TRUE(img->AllocScanLineData());
    img->SetCanvasColor(canvas);
    const ImgRectI r = img->DataWindow();
    for (int y = r.y0; y < r.y1; ++y)
        for (int x = r.x0; x < r.x1; ++x) img->PutFlt(x, y, f(x, y));
    return img;
}

/// A picture of one colour everywhere, for Filled.
inline std::function<FltPixel(int, int)> Constant(FltPixel p) {
    return [p](int, int) { return p; };
}

/// The kind of component a depth stores: 0 8-bit, 1 16-bit, 2 half, 3 float.
inline int Kind(int depth) { return (depth - 1) % 4; }

/// Half a step of the grid `depth` stores values on, at v: how far a stored value may lie from v.
inline double HalfCode(int depth, double v) {
    switch (Kind(depth)) {
    case 0: return 0.5 / 255;
    case 1: return 0.5 / 65535;
    case 2: return std::ldexp(1.0, std::ilogb(std::max(std::fabs(v), 0x1p-14)) - 11);
    default: return 0;
    }
}

/// A request of a render that has been aborted.
struct AbortedRequest {
    RenderTask task;
    Request req{nullptr, nullptr, 0.0, 0, &task};
    AbortedRequest() { task.Abort(); }
};

inline float Channel(const FltPixel &p, int c) { return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A; }
template <size_t N> double Channel(const std::array<double, N> &p, int c) { return p[c]; }

/// Whether channels c0 to c1 - 1 of `img` over `window` lie within `tol` of
/// want(x, y, c), or of channel c of want(x, y); says where not.
template <class F>::testing::AssertionResult AllNear(const Image &img, const ImgRectI &window, double tol, F want,
                                                     int c0 = 0, int c1 = 4) {
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x) {
            double w[4];
            if constexpr (std::is_invocable_v<F, int, int, int>)
                for (int c = c0; c < c1; ++c) w[c] = want(x, y, c);
            else {
                const auto p = want(x, y);
                for (int c = 0; c < 4; ++c) w[c] = Channel(p, c);
            }
            for (int c = c0; c < c1; ++c) {
                const double got = Channel(img.GetFlt(x, y), c);
                if (!(std::fabs(got - w[c]) <= tol))
                    return ::testing::AssertionFailure()
                           << "at " << x << "," << y << " channel " << c << ": " << got << ", want " << w[c];
            }
        }
    return ::testing::AssertionSuccess();
}

/// The largest difference between two images over `window`, all channels.
inline double MaxDiff(const Image &a, const Image &b, const ImgRectI &window) {
    double m = 0;
    for (int y = window.y0; y < window.y1; ++y)
        for (int x = window.x0; x < window.x1; ++x)
            for (int c = 0; c < 4; ++c)
                m = std::max(m, std::fabs(double(Channel(a.GetFlt(x, y), c)) - Channel(b.GetFlt(x, y), c)));
    return m;
}

/// The same windows, depth and stored bytes.
inline bool SameBits(const Image &a, const Image &b) {
    if (a.DataWindow() != b.DataWindow() || a.Depth() != b.Depth()) return false;
    for (int y = a.DataWindow().y0; y < a.DataWindow().y1; ++y)
        if (std::memcmp(a.ScanLine(y), b.ScanLine(y), a.RowBytes()) != 0) return false;
    return true;
}

/// The nearest code of v on 0..max, clamped; NaN gives 0 (in double, where v * max is exact for a float v).
inline long NearestCode(double v, long max) {
    if (!(v > 0)) return 0;
    if (v >= 1) return max;
    return std::lround(v * static_cast<double>(max));
}

/// What a component reads back as after v is stored at `depth`.
inline double StoredValue(int depth, double v) {
    switch (Kind(depth)) {
    case 0: return NearestCode(v, 255) / 255.0;
    case 1: return NearestCode(v, 65535) / 65535.0;
    case 2: {
        volatile float in = static_cast<float>(v);
        return static_cast<float>(static_cast<Test::CompilerHalf>(in));
    }
    default: return static_cast<float>(v);
    }
}

// ---- the resize filters, written out from their definitions ----

inline double Sinc(double x) { return x == 0 ? 1.0 : std::sin(std::numbers::pi * x) / (std::numbers::pi * x); }

inline double RefWindow(int window, double t) {
    const double c = std::cos(std::numbers::pi * t);
    switch (window) {
    case RszWindowHamming: return 0.54 + 0.46 * c;
    case RszWindowBlackman: return 0.42 + 0.5 * c + 0.08 * std::cos(2 * std::numbers::pi * t);
    case RszWindowKaiser: return std::cyl_bessel_i(0.0, 6.5 * std::sqrt(1 - t * t)) / std::cyl_bessel_i(0.0, 6.5);
    default: return 0.5 + 0.5 * c;
    }
}

/// The filter at distance x (source pixels at scale 1); 0 beyond its radius.
inline double RefFilter(int filter, int window, double x) {
    const double a = std::fabs(x);
    switch (filter) {
    case RszLinear: return a < 1 ? 1 - a : 0;
    case RszQuadratic: return a < 0.5 ? 0.75 - a * a : a < 1.5 ? 0.5 * (a - 1.5) * (a - 1.5) : 0;
    case RszCubic: return a < 1 ? (4 - 6 * a * a + 3 * a * a * a) / 6 : a < 2 ? (2 - a) * (2 - a) * (2 - a) / 6 : 0;
    case RszCatmullRom:
        return a < 1 ? 1.5 * a * a * a - 2.5 * a * a + 1 : a < 2 ? -0.5 * a * a * a + 2.5 * a * a - 4 * a + 2 : 0;
    case RszGaussian: return a < 1.5 ? std::exp(-2 * a * a) : 0;
    case RszMitchell:
        return a < 1   ? (7 * a * a * a - 12 * a * a + 16.0 / 3) / 6
               : a < 2 ? (-7.0 / 3 * a * a * a + 12 * a * a - 20 * a + 32.0 / 3) / 6
                       : 0;
    case RszLanczos: return a < 3 ? Sinc(a) * Sinc(a / 3) : 0;
    case RszSinc: return a < 4 ? Sinc(a) * RefWindow(window, a / 4) : 0;
    case RszBessel: {
        if (a >= 4) return 0;
        const double jinc = a == 0 ? 1.0 : 2 * std::cyl_bessel_j(1.0, std::numbers::pi * a) / (std::numbers::pi * a);
        return jinc * RefWindow(window, a / 4);
    }
    default: return a <= 0.5 ? 1 : 0; // nearest, box
    }
}

inline double RefRadius(int filter) {
    switch (filter) {
    case RszLinear: return 1;
    case RszQuadratic:
    case RszGaussian: return 1.5;
    case RszCubic:
    case RszCatmullRom:
    case RszMitchell: return 2;
    case RszLanczos: return 3;
    case RszSinc:
    case RszBessel: return 4;
    default: return 0.5;
    }
}

// ---- other programs ----

/// Runs a shell command with its output discarded; true when it exits with 0.
inline bool RunQuiet(const std::string &command) { return std::system((command + " > /dev/null 2>&1").c_str()) == 0; }

inline bool HaveProgram(const char *name) { return RunQuiet(std::string("command -v ") + name); }

/// A folder for one test's files, removed at the end.
struct TempFolder {
    std::filesystem::path path =
        std::filesystem::temp_directory_path() / ("orvane-image-test-" + std::to_string(::getpid()));
    TempFolder() { std::filesystem::create_directories(path); }
    ~TempFolder() {
        std::error_code ec;
        std::filesystem::remove_all(path, ec);
    }
    std::string operator/(const char *name) const { return (path / name).string(); }
};

/// Writes the colour of an image's frame as a PFM (rows bottom up, as ours).
inline void WritePfm(const Image &img, const std::string &file) {
    std::ofstream f(file, std::ios::binary);
    f << "PF\n" << img.Width() << " " << img.Height() << "\n-1.0\n";
    for (int y = 0; y < img.Height(); ++y)
        for (int x = 0; x < img.Width(); ++x) {
            const FltPixel p = img.GetFlt(x, y);
            const float rgb[3] = {p.R, p.G, p.B};
            f.write(reinterpret_cast<const char *>(rgb), sizeof rgb);
        }
}

/// An image file as `oiiotool --dumpdata` prints it (rows from the top), as
/// a w x h float image with rows bottom up (alpha 1 for RGB files); null when
/// unreadable or incomplete.
inline Ref<Image> ReadOiioDump(const std::string &file, int w, int h) {
    FILE *pipe = ::popen(("oiiotool --dumpdata " + file + " 2>/dev/null").c_str(), "r");
    if (!pipe) return nullptr;
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    char line[512];
    int count = 0;
    while (std::fgets(line, sizeof line, pipe)) {
        int x = 0, y = 0;
        FltPixel p{0, 0, 0, 1};
        if (std::sscanf(line, " Pixel (%d, %d): %f %f %f %f", &x, &y, &p.R, &p.G, &p.B, &p.A) >= 5 && x >= 0 && x < w &&
            y >= 0 && y < h) {
            img->PutFlt(x, h - 1 - y, p);
            ++count;
        }
    }
    ::pclose(pipe);
    return count == w * h ? img : nullptr;
}

} // namespace Orvane::Test
