// Our resize against oiiotool and vips on one smooth picture. All three sample pixel centres alike and stretch
// the filter by the shrink factor, so on the same filter they differ by float rounding: at most 1e-6 over the
// interior (border rules differ); the limit is 5e-6, and another filter differs by more than 1e-4.
#include "tests/host/image/ImageTestSupport.h"

namespace Orvane::resizepeertest {
namespace {
using namespace ::Orvane::Test;

constexpr int kW = 240, kH = 160;
constexpr double kTolerance = 5e-6;

/// Largest difference over the interior (4 output pixels from each edge).
double InteriorDiff(const Image &a, const Image &b) {
    return MaxDiff(a, b, ImgRectI(4, 4, a.Width() - 4, a.Height() - 4));
}

class ResizePeers : public testing::Test {
protected:
    void SetUp() override {
        if (!HaveProgram("oiiotool") || !HaveProgram("vips")) GTEST_SKIP() << "oiiotool or vips is not installed";
        src_ = Filled(kW, kH, DepthRGBAFlt32, [](int x, int y) {
            const double r =
                0.5 + 0.3 * std::sin(2 * std::numbers::pi * x / 53.0) * std::cos(2 * std::numbers::pi * y / 41.0);
            return FltPixel{float(r), float(0.4 + 0.002 * x), float(0.2 + 0.003 * y), 1.f};
        });
        std::ofstream out(folder_ / "in.raw", std::ios::binary);
        for (int y = kH - 1; y >= 0; --y)
            out.write(reinterpret_cast<const char *>(src_->ScanLine(y)), src_->RowBytes());
        out.close();
        ASSERT_TRUE(
            RunQuiet("vips rawload " + folder_ / "in.raw" + " " + folder_ / "in.v" + " 240 160 4 --format float") &&
            RunQuiet("vips tiffsave " + folder_ / "in.v" + " " + folder_ / "in.tif"));
    }

    /// oiiotool's resize of the picture to w x h with `filter`.
    Ref<Image> Oiio(const char *filter, int w, int h) {
        const std::string size = std::to_string(w) + "x" + std::to_string(h);
        if (!RunQuiet("oiiotool " + folder_ / "in.tif" + " --resize:filter=" + filter + " " + size + " -o " +
                      folder_ / "o.tif"))
            return nullptr;
        return ReadOiioDump(folder_ / "o.tif", w, h);
    }

    /// vips's halving of the picture with `kernel`, saved as a float TIFF.
    Ref<Image> Vips(const char *kernel) {
        if (!RunQuiet("vips resize " + folder_ / "in.v" + " " + folder_ / "v.tif" + " 0.5 --kernel " + kernel))
            return nullptr;
        return ReadOiioDump(folder_ / "v.tif", kW / 2, kH / 2);
    }

    Ref<Image> Ours(int filter, int w = kW / 2, int h = kH / 2) {
        Ref<Image> out = Blank(w, h, DepthRGBAFlt32);
        EXPECT_TRUE(src_->ResizeTagList(out.Get(), {{ResizeFilter, filter}}));
        return out;
    }

    TempFolder folder_;
    Ref<Image> src_;
};

TEST_F(ResizePeers, LanczosAndLinearShrinkAndStretchAsOiiotoolAndVipsDo) {
    const std::tuple<int, const char *, const char *> cases[] = {{RszLanczos, "lanczos3", "lanczos3"},
                                                                 {RszLinear, "triangle", "linear"}};
    for (const auto &[filter, oiioName, vipsName] : cases) {
        Ref<Image> ours = Ours(filter), oiio = Oiio(oiioName, kW / 2, kH / 2), vips = Vips(vipsName);
        ASSERT_TRUE(oiio && vips);
        EXPECT_LT(InteriorDiff(*ours, *oiio), kTolerance) << oiioName;
        EXPECT_LT(InteriorDiff(*ours, *vips), kTolerance) << vipsName;
        EXPECT_GT(InteriorDiff(*Ours(filter == RszLinear ? RszLanczos : RszLinear), *vips), 1e-4);
    }
    Ref<Image> stretched = Oiio("lanczos3", 336, 224);
    ASSERT_TRUE(stretched);
    EXPECT_LT(InteriorDiff(*Ours(RszLanczos, 336, 224), *stretched), kTolerance);
}

} // namespace
} // namespace Orvane::resizepeertest
