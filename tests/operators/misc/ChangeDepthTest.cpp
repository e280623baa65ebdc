// Change Depth: every conversion against the value it stands for (the nearest step of an integer depth, the nearest
// half), dither that keeps the mean and the steps and repeats bit for bit, single-channel images, the frame.
#include <gtest/gtest.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "operators/misc/ChangeDepth.h"
#include "tests/operators/color/ColorToolTestSupport.h"

namespace Orvane::colortest {
namespace {

class ChangeDepth : public ::testing::Test {
protected:
    static void SetUpTestSuite() { Orvane::Test::LoadOperators(); }
};

const PixelModel kSame = [](const Px &p) { return p; };
/// The Depth choice that makes each RGBA depth.
int ChoiceOf(int depth) { return depth - DepthRGBAInt8 + 1; }

TEST_F(ChangeDepth, EveryConversionGivesTheNearestValueOfTheNewDepth) {
    for (int from : {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16, DepthRGBAInt8, DepthAFlt32, DepthAInt16})
        for (int choice = 0; choice <= 4; ++choice)
            for (bool dither : {false, true}) {
                const std::string what = "from " + std::to_string(from) + " choice " + std::to_string(choice);
                Ref<Image> src = Orvane::Test::PatternImage(41, 7, from, 9);
                Rig rig("ChangeDepth", src);
                Orvane::Test::SetNumbers(rig.tool, {{"Depth", choice}, {"Dither", dither}});
                Ref<Image> out = Render(rig.tool);
                ASSERT_TRUE(out) << what;
                const int to = choice == 0 ? from : (src->IsMask() ? DepthAInt8 : DepthRGBAInt8) + choice - 1;
                EXPECT_EQ(out->Depth(), to) << what;
                EXPECT_EQ(out.Get() == src.Get(), to == from) << what;
                // Dither changes only narrowings to integers; widenings and float results are exact either way.
                const bool narrows = !FormatOfDepth(to).isFloat &&
                                     (FormatOfDepth(from).isFloat || FormatOfDepth(from).bytesPerComponent == 2) &&
                                     to != from;
                if (!dither || !narrows) ExpectModel(kSame, *src, *out, what);
            }
}

TEST_F(ChangeDepth, DitherKeepsTheMeanAndTheStepsAndRepeats) {
    // A flat colour between two 8-bit steps: plain rounding gives one step everywhere; dither mixes the two
    // neighbours so that the mean over an area is the value itself.
    const FltPixel flat{0.3013f, 0.7f + 0.25f / 255, 0.1f, 0.6f};
    Ref<Image> src = NewImageTagList({{ImgWidth, 64}, {ImgHeight, 64}, {ImgDepth, DepthRGBAFlt32}});
    src->Fill(flat);
    Rig rig("ChangeDepth", src);
    Orvane::Test::SetNumbers(rig.tool, {{"Depth", ChoiceOf(DepthRGBAInt8)}, {"Dither", 1}});
    Ref<Image> out = Render(rig.tool);
    ASSERT_TRUE(out);
    const Px want = ToPx(flat);
    for (int c = 0; c < 4; ++c) {
        double sum = 0;
        for (int y = 0; y < 64; ++y)
            for (int x = 0; x < 64; ++x) {
                const double got = out->Row<uint8_t>(y)[4 * x + c];
                ASSERT_TRUE(got == std::floor(want[c] * 255) || got == std::ceil(want[c] * 255)) << c;
                if (c == 3) ASSERT_EQ(got, std::round(want[c] * 255)) << "alpha is rounded, not dithered";
                sum += got;
            }
        if (c < 3) EXPECT_NEAR(sum / 4096, want[c] * 255, 0.03) << "channel " << c;
    }
    // Bit for bit again, and over a region the bits of the whole.
    ExpectSameBits(*Render(rig.tool), *out, out->DataWindow());
    const ImgRectI roi(13, 20, 50, 41);
    Ref<Image> part = Render(rig.tool, &roi);
    ASSERT_TRUE(part && part->DataWindow() == roi);
    ExpectSameBits(*part, *out, roi);
}

TEST_F(ChangeDepth, StepsSurviveADitheredTripThroughFloat) {
    // Integer codes widened to float and dithered back are the same codes: dither only moves values between steps.
    for (const auto &[from, via] : {std::pair{DepthRGBAInt8, DepthRGBAFlt32},
                                    {DepthRGBAInt16, DepthRGBAFlt32},
                                    {DepthRGBAInt8, DepthRGBAFlt16},
                                    {DepthAInt16, DepthAFlt32}}) {
        Ref<Image> src = Orvane::Test::PatternImage(53, 9, from, 2);
        Rig rig("ChangeDepth", src);
        const int wide = ChoiceOf(via < DepthRGBAInt8 ? via + 4 : via), back = ChoiceOf(from < 5 ? from + 4 : from);
        Orvane::Test::SetNumber(rig.tool, "Depth", wide);
        Operator *narrow = rig.doc.AddTool(OvID("ChangeDepth"));
        ASSERT_TRUE(narrow->FindInput("Input")->ConnectTo(rig.tool->FindMainOutput()));
        Orvane::Test::SetNumbers(narrow, {{"Depth", back}, {"Dither", 1}});
        Ref<Image> out = Render(narrow);
        ASSERT_TRUE(out && out->Depth() == from) << from;
        ExpectSameBits(*out, *src, src->DataWindow());
    }
}

TEST_F(ChangeDepth, TheFrameHoldsAndTheDitherNumbersSpreadEvenly) {
    ExpectFrame("ChangeDepth", [](Operator *op) { Orvane::Test::SetNumber(op, "Depth", 1); }, kSame, 0, true,
                {DepthRGBAFlt32, DepthRGBAFlt16, DepthRGBAInt16});
    ExpectFrame("ChangeDepth", [](Operator *op) { Orvane::Test::SetNumber(op, "Depth", 4); }, kSame, 0, true,
                {DepthRGBAInt8});
    // Over a block of places, each tenth of [0, 1) gets its share of the numbers, and neighbours differ.
    int bins[10] = {};
    int same = 0;
    for (int y = -50; y < 50; ++y)
        for (int x = -50; x < 50; ++x) {
            const double d = DitherAt(x, y, 0);
            ASSERT_TRUE(d >= 0 && d < 1);
            ++bins[static_cast<int>(d * 10)];
            same += d == DitherAt(x + 1, y, 0) || d == DitherAt(x, y, 1);
        }
    for (int b : bins) EXPECT_NEAR(b, 1000, 120);
    EXPECT_LT(same, 3);
    // The tool search finds the tool by its alias.
    const auto aliases = ClassRegistry->Find(OvID("ChangeDepth"))->Tags().FindAll(RegAlias);
    ASSERT_EQ(aliases.size(), 1u);
    EXPECT_STREQ(aliases[0]->AsText(), "dither");
}

} // namespace
} // namespace Orvane::colortest
