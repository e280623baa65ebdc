#include <tuple>

#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {

using ChangeDepth = ColorTool;
TEST_F(ChangeDepth, TheNearestValueOfTheNewDepthTheFrameAndDitherKeepingTheMeanAndTheSteps) {
    for (int from : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt16})
        for (int choice = 0; choice <= 4; ++choice) {
            Ref<Image> src = PatternImage(41, 7, from, 9);
            const int to = choice == 0 ? from : (src->IsMask() ? DepthAInt8 : DepthRGBAInt8) + choice - 1;
            Ref<Image> out = Through(src, {{"ChangeDepth", Numbers({{"Depth", choice}})}});
            ASSERT_TRUE(out && out->Depth() == to && (out.Get() == src.Get()) == (to == from)) << from << " " << choice;
            ExpectModel(kIdentity, *src, *out, "from " + std::to_string(from) + " choice " + std::to_string(choice));
        }
    // Half float and 8-bit from float and from integers: host conversions and the exact way, no depth handed on.
    ExpectFrame("ChangeDepth", {{Numbers({{"Depth", 3}}), kIdentity}, {Numbers({{"Depth", 1}}), kIdentity}}, 0,
                {DepthRGBAFlt32, DepthRGBAInt16});
    // Between two 8-bit steps dither mixes both so that the mean is the value (rounding: 77 for red); alpha is rounded.
    const FltPixel flat{0.3013f, 0.7f + 0.25f / 255, 0.1f, 0.6f + 0.3f / 255};
    Ref<Image> src = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 64}, {ImgDepth, DepthRGBAFlt32}});
    src->Fill(flat);
    const Setter dither = Numbers({{"Depth", 1}, {"Dither", 1}});
    const ImgRectI roi(13, 20, 50, 41);
    Ref<Image> out = Through(src, {{"ChangeDepth", dither}}), part = Through(src, {{"ChangeDepth", dither}}, &roi);
    ASSERT_TRUE(out && part && part->DataWindow() == roi);
    ExpectSameBits(*part, *out, roi); // the same noise wherever a region starts
    for (int c = 0; c < 4; ++c) {
        const double v = ToPx(flat)[c] * 255;
        double sum = 0;
        for (int i = 0; i < 64 * 64; ++i) {
            const double got = out->Row<uint8_t>(i / 64)[4 * (i % 64) + c];
            ASSERT_TRUE(c < 3 ? got == std::floor(v) || got == std::ceil(v) : got == std::round(v)) << c;
            sum += got;
        }
        EXPECT_NEAR(sum / 4096, v, c < 3 ? 0.03 : 0.5) << "channel " << c;
    }
    // Integer codes widened to float and dithered back are the same codes: dither only moves values between steps.
    for (const auto &[from, wide, back] :
         {std::tuple{DepthRGBAInt8, 4, 1}, {DepthRGBAInt16, 4, 2}, {DepthRGBAInt8, 3, 1}, {DepthAInt16, 4, 2}}) {
        Ref<Image> codes = PatternImage(53, 9, from, 2);
        Ref<Image> narrowed = Through(codes, {{"ChangeDepth", Numbers({{"Depth", wide}})},
                                              {"ChangeDepth", Numbers({{"Depth", back}, {"Dither", 1}})}});
        ASSERT_TRUE(narrowed && narrowed->Depth() == from) << from;
        ExpectSameBits(*narrowed, *codes, codes->DataWindow());
    }
}

} // namespace Orvane::colortest
