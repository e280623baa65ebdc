// Motion blur: sample times recorded by the tool against the formula worked out here, and pixels against means.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <tuple>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "tests/support/TestSupport.h"

namespace Orvane::motionblurtest {
namespace ts = ::Orvane::Test;
namespace {

/// A 16 x 4 float frame with a bar two pixels wide and two high whose left edge is at x = floor(4 t): pixels (t, 1,
/// 0.5, 1) inside, canvas colour (0, 0, 0, t / 10) outside. With an input it passes that on instead. It records the
/// times of its pixel requests, and fails after `failAfter`.
class MovingBar : public ThreadedOperator {
public:
    MovingBar(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withInput = false)
        : ThreadedOperator(reg, args, tags), input(withInput ? ts::AddImageIn(this) : nullptr),
          output(ts::AddImageOut(this)) {}
    static ImgRectI Window(double t) {
        const int x = static_cast<int>(std::floor(4 * t));
        return ImgRectI(x, 1, x + 2, 3);
    }
    static FltPixel Inside(double t) { return {static_cast<float>(t), 1.f, 0.5f, 1.f}; }
    static FltPixel Canvas(double t) { return {0.f, 0.f, 0.f, static_cast<float>(t / 10)}; }
    static FltPixel At(double t, int x, int y) { return Window(t).Contains(x, y) ? Inside(t) : Canvas(t); }
    void Process(Request *req) override {
        const double t = req->Time();
        if (!req->IsPreCalc()) times.push_back(t), flags.push_back(req->GetFlags());
        if (t > failAfter) {
            Fail(req, "%s: no bar after time %g\n", Name().c_str(), failAfter);
            return req->SetOutputData(output, nullptr);
        }
        if (input) return req->SetOutputData(output, req->GetInputData(input));
        ImgRectI dw = Window(t);
        if (const AutoImageRoI roi(req); roi) dw &= roi->rect;
        const FltPixel canvas = Canvas(t);
        static const Ref<Image> frame = NewImageTagList({{ImgWidth, 16}, {ImgHeight, 4}, {ImgDepth, DepthRGBAFlt32}});
        Ref<Image> img = NewImageTagList({{ImgLikeImage, frame.Get()},
                                          {ImgDataWindow, &dw},
                                          {ImgNoData, req->IsPreCalc()},
                                          {ImgCanvasColor, &canvas}});
        if (!req->IsPreCalc()) img->AllocScanLineData(), img->Fill(Inside(t));
        req->SetOutputData(output, img);
    }
    Input *input;
    Output *output;
    std::vector<double> times;
    std::vector<uint32_t> flags;
    double failAfter = 1e9;
};

struct PassingBar : MovingBar {
    PassingBar(const Registry *reg, const ScriptVal &args, const TagList &tags) : MovingBar(reg, args, tags, true) {}
};

/// A modifier-like tool whose output is a number.
struct NumberTool : ThreadedOperator {
    NumberTool(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        AddOutputTagList("Value", "Value", {{LinkDataType, CLSID_DataType_Number}});
    }
};

struct Classes {
    OvID bar = ts::RegisterTestTool("TestMotionBar", &ts::MakeTool<MovingBar>);
    OvID pass = ts::RegisterTestTool("TestMotionPass", &ts::MakeTool<PassingBar>);
    OvID still = ts::RegisterTestTool("TestMotionStill", &ts::MakeTool<MovingBar>, {{RegNoMotionBlurControls, 1}});
    OvID number = ts::RegisterTool("TestMotionNumber", &ts::MakeTool<NumberTool>);
};
const Classes &C() { return ts::Once<Classes>(); }

/// The sample times as the controls document them.
std::vector<double> SampleTimes(double t, int n, double angle, double bias, double spread) {
    const double open = angle / 360.0;
    std::vector<double> times;
    for (int i = 0; i < n; ++i) times.push_back(t + open * bias / 2 + open * (((i + 0.5) / n) - 0.5) * spread);
    return times;
}

void ExpectTimes(const std::vector<double> &got, const std::vector<double> &want) {
    ASSERT_EQ(got.size(), want.size());
    for (size_t i = 0; i < want.size(); ++i) EXPECT_NEAR(got[i], want[i], 1e-12) << i;
}

void SetBlur(Operator *op, int quality, double angle, double bias, double spread) {
    ts::SetNumbers(op, {{"MotionBlur", 1}, {"MotionBlurQuality", quality}, {"MotionBlurShutterAngle", angle}});
    ts::SetNumbers(op, {{"MotionBlurCenterBias", bias}, {"MotionBlurSampleSpread", spread}});
}

Ref<Image> Eval(Operator *op, double time, bool cache = false, const ImgRectI *roi = nullptr, uint32_t flags = 0) {
    return ts::EvalImage(
        op, time, {.flags = flags, .roi = roi ? std::optional(ImageDomain(*roi)) : std::nullopt, .useCache = cache});
}

double Channel(const FltPixel &p, int c) { return c == 0 ? p.R : c == 1 ? p.G : c == 2 ? p.B : p.A; }

/// Expects `img` at (x, y) to hold the mean of the frames' values there.
template <class Frames, class ValueOf>
void ExpectMean(const Image &img, int x, int y, const Frames &frames, ValueOf valueOf, double tol) {
    for (int ch = 0; ch < 4; ++ch) {
        double sum = 0;
        for (const auto &f : frames) sum += Channel(valueOf(f, x, y), ch);
        const FltPixel got = img.DataWindow().Contains(x, y) ? img.GetFlt(x, y) : img.GetCanvasColor();
        ASSERT_NEAR(Channel(got, ch), sum / frames.size(), tol) << x << "," << y << " channel " << ch;
    }
}

class MotionBlur : public ::testing::Test {
protected:
    void SetUp() override { ts::LoadOperators(); }
    MovingBar *AddBar(OvID cls, const char *name) {
        auto *bar = dynamic_cast<MovingBar *>(doc->AddTool(cls, name));
        EXPECT_NE(bar, nullptr);
        return bar;
    }
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
};

TEST_F(MotionBlur, ControlsComeWithImageToolsThatDoNotRefuseThem) {
    MovingBar *bar = AddBar(C().bar, "Bar");
    MovingBar *still = AddBar(C().still, "Still");
    Operator *number = doc->AddTool(C().number, "Number");
    ASSERT_TRUE(bar && still && number);
    for (const char *id : {"MotionBlur", "MotionBlurQuality", "MotionBlurShutterAngle", "MotionBlurCenterBias",
                           "MotionBlurSampleSpread"}) {
        SCOPED_TRACE(id);
        Input *in = bar->FindInput(id);
        ASSERT_NE(in, nullptr);
        EXPECT_EQ(bar->Pages().at(in->Page()).name, "Common Controls");
        // The class refuses motion blur; a number is not blurred.
        EXPECT_TRUE(!still->FindInput(id) && !number->FindInput(id));
    }
}

TEST_F(MotionBlur, SamplesAreRenderedAtTheShutterTimesAndAveraged) {
    // Samples, shutter angle, centre bias, sample spread, time.
    const std::tuple<int, double, double, double, double> cases[] = {
        {2, 180, 0, 1, 1.0}, {4, 360, 0, 1, 1.0},        {5, 270, 0.5, 1, 1.25}, {3, 90, -1, 0.5, 2.0},
        {6, 360, 1, 1, 0.5}, {8, 180, -0.25, 0.75, 1.5}, {16, 360, 0, 1, 2.0},
    };
    for (const auto &[quality, angle, bias, spread, time] : cases) {
        SCOPED_TRACE(testing::Message() << quality << " samples, " << angle << " deg, bias " << bias << ", spread "
                                        << spread << " at " << time);
        MovingBar *bar = AddBar(C().bar, "Bar");
        SetBlur(bar, quality, angle, bias, spread);
        const std::vector<double> want = SampleTimes(time, quality, angle, bias, spread);
        Ref<Image> img = Eval(bar, time);
        ASSERT_TRUE(img);
        ExpectTimes(bar->times, want);
        // The union of the samples' windows, and per pixel the mean of what each sample holds there (its bar or its
        // canvas).
        ImgRectI dw;
        for (double t : want) dw |= MovingBar::Window(t);
        EXPECT_EQ(std::pair(img->DataWindow(), img->Depth()), std::pair(dw, int(DepthRGBAFlt32)));
        for (int y = 0; y < 4; ++y)
            for (int x = -1; x <= 16; ++x) ExpectMean(*img, x, y, want, &MovingBar::At, 1e-6);
        ExpectMean(*img, 100, 100, want, &MovingBar::At, 1e-6); // the canvas
        // The pre-calculation gives the same windows without pixels; a region cuts the blurred window.
        Ref<Image> shape = Eval(bar, time, false, nullptr, ReqFlagPreCalc);
        EXPECT_TRUE(shape && shape->IsNoData() && shape->DataWindow() == dw);
        const ImgRectI roi(dw.x0 + 1, 0, dw.x1, 2);
        Ref<Image> part = Eval(bar, time, false, &roi);
        ASSERT_TRUE(part && part->DataWindow() == (dw & roi));
        for (int x = roi.x0; x < roi.x1; ++x) EXPECT_EQ(part->GetFlt(x, 1), img->GetFlt(x, 1)) << x;
        doc->RemoveTool("Bar");
    }
}

TEST_F(MotionBlur, OffOneSampleOrAClosedShutterIsTheFrameItself) {
    // On, samples, shutter angle, centre bias, sample spread, and the one time rendered.
    const std::tuple<const char *, bool, int, double, double, double, double> cases[] = {
        {"Off", false, 8, 360, 0, 1, 1.1},
        {"OneSample", true, 1, 360, 0, 1, 1.1},
        {"ClosedShutter", true, 8, 0, 0, 1, 1.1},
        {"NoSpreadRendersOnceAtTheMiddle", true, 6, 180, 1, 0, 1.35}};
    for (const auto &[name, on, quality, angle, bias, spread, renderedAt] : cases) {
        SCOPED_TRACE(name);
        MovingBar *bar = AddBar(C().bar, name);
        SetBlur(bar, quality, angle, bias, spread);
        ts::SetNumber(bar, "MotionBlur", on);
        Ref<Image> out = Eval(bar, 1.1);
        ASSERT_TRUE(out);
        ExpectTimes(bar->times, {renderedAt});
        EXPECT_EQ(out->DataWindow(), MovingBar::Window(renderedAt));
        EXPECT_EQ(out->GetFlt(out->DataWindow().x0, 1), MovingBar::Inside(renderedAt));
        EXPECT_EQ(bar->flags, std::vector<uint32_t>{renderedAt == 1.1 ? 0u : 1u << 20}) << "a sample only when moved";
    }
}

TEST_F(MotionBlur, EveryDepthAveragesAnAnimatedBackground) {
    // Red rises to 1 at frame 10 and falls to 0.25 at 20 (a kink at the frame asked); green falls steadily; alpha rises
    // from 0.5 to 1.
    Operator *bg = doc->AddTool(OvID("Background"), "BG");
    ASSERT_NE(bg, nullptr);
    ts::SetNumbers(bg, {{"Width", 5}, {"Height", 3}});
    const std::vector<std::pair<double, double>> keys[4] = {
        {{0, 0.0}, {10, 1.0}, {20, 0.25}}, {{0, 1.0}, {20, 0.0}}, {{0, 0.3}}, {{0, 0.5}, {20, 1.0}}};
    Input *channels[4] = {bg->FindInput("TopLeftRed"), bg->FindInput("TopLeftGreen"), bg->FindInput("TopLeftBlue"),
                          bg->FindInput("TopLeftAlpha")};
    for (int ch = 0; ch < 4; ++ch) ASSERT_TRUE(channels[ch]->SetCurve(ts::NumberCurve(keys[ch])));
    // The background's colour at a sample time, from its inputs' curves.
    auto colourAt = [&](double t, int, int) {
        float v[4];
        for (int ch = 0; ch < 4; ++ch)
            v[ch] = static_cast<float>(dynamic_cast<Number &>(*channels[ch]->ValueAt(t)).value);
        return FltPixel{v[0], v[1], v[2], v[3]};
    };
    SetBlur(bg, 5, 360, 0.4, 0.9);
    const std::vector<double> times = SampleTimes(10.0, 5, 360, 0.4, 0.9);
    // The Depth choice, the depth it makes and the tolerance of its values.
    for (const auto &[choice, depth, tolerance] : {std::tuple{4, DepthRGBAFlt32, 1e-6},
                                                   {3, DepthRGBAFlt16, 1e-3},
                                                   {2, DepthRGBAInt16, 1.0 / 65535 + 1e-7},
                                                   {1, DepthRGBAInt8, 1.0 / 255 + 1e-7}}) {
        SCOPED_TRACE(depth);
        ts::SetNumbers(bg, {{"Depth", choice}, {"MotionBlur", 1}});
        Ref<Image> img = Eval(bg, 10.0);
        ASSERT_TRUE(img);
        EXPECT_EQ(std::pair(img->Depth(), img->DataWindow()), std::pair(int(depth), img->Frame()));
        for (int y = 0; y < 3; ++y)
            for (int x = 0; x < 5; ++x) ExpectMean(*img, x, y, times, colourAt, tolerance);
        // Off: the frame at 10 itself, whose red is 1.
        ts::SetNumber(bg, "MotionBlur", 0);
        Ref<Image> sharp = Eval(bg, 10.0);
        ASSERT_TRUE(sharp);
        EXPECT_NEAR(sharp->GetFlt(2, 1).R, 1.0, tolerance);
    }
}

TEST_F(MotionBlur, APendingTransformIsMadeIntoPixelsBeforeAveraging) {
    // A Transform whose centre moves hands on a pending transform; blurred, it gives the mean of its own sharp frames
    // at the sample times.
    ts::ImageSourceTool *src = ts::AddImageSource(*doc, "Src", ts::PatternImage(24, 10, DepthRGBAFlt32, 7));
    Operator *xf = doc->AddTool(OvID("Transform"), "Xf");
    ASSERT_TRUE(xf && !xf->IsPlaceholder() && xf->FindMainInput(1)->ConnectTo(src->Out()));
    AnimCurve center;
    center.SetKey(0, MakeRef<Point>(0.3, 0.5));
    center.SetKey(4, MakeRef<Point>(0.7, 0.6));
    ASSERT_TRUE(xf->FindInput("Center")->SetCurve(center));
    std::vector<Ref<Image>> sharp;
    ImgRectI dw;
    for (double t : SampleTimes(2.0, 3, 360, 0, 1)) {
        sharp.push_back(Eval(xf, t));
        ASSERT_TRUE(sharp.back());
        dw |= sharp.back()->DataWindow();
    }
    SetBlur(xf, 3, 360, 0, 1);
    Ref<Image> img = Eval(xf, 2.0);
    ASSERT_TRUE(img && img->DataWindow() == dw);
    auto valueOf = [](const Ref<Image> &f, int x, int y) {
        return f->DataWindow().Contains(x, y) ? f->GetFlt(x, y) : f->GetCanvasColor();
    };
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) ExpectMean(*img, x, y, sharp, valueOf, 1e-6);
}

TEST_F(MotionBlur, TheOutermostShutterDecidesAndTheCostStaysLinear) {
    MovingBar *bar = AddBar(C().bar, "Bar");
    MovingBar *pass = AddBar(C().pass, "Pass");
    ASSERT_TRUE(pass->input->ConnectTo(bar->output));
    SetBlur(bar, 4, 360, 0, 1);
    SetBlur(pass, 3, 180, 0, 1);
    ASSERT_TRUE(Eval(pass, 1.0));
    const std::vector<double> outer = SampleTimes(1.0, 3, 180, 0, 1);
    ExpectTimes(pass->times, outer);
    // The tool above renders sharp at the outer sample times, once each.
    ExpectTimes(bar->times, outer);
    for (uint32_t f : bar->flags) EXPECT_NE(f & (1u << 20), 0u);
    // With the downstream tool's blur off, the upstream blurs by itself.
    ts::SetNumber(pass, "MotionBlur", 0);
    bar->times.clear();
    ASSERT_TRUE(Eval(pass, 1.0));
    ExpectTimes(bar->times, SampleTimes(1.0, 4, 360, 0, 1));
}

TEST_F(MotionBlur, CachedResultsOfSamplesAndFramesStayApartAndAFailingSampleFailsTheFrame) {
    MovingBar *bar = AddBar(C().bar, "Bar");
    SetBlur(bar, 2, 360, 0, 1); // samples at t - 0.25 and t + 0.25
    // Frame 0.75 renders a sharp sample at 1.0, frame 1.0 a blurred frame at the same time: neither may stand in for
    // the other, in either order. At x = 4: the bar of 0.5 ends at 4, the bars of 0.75, 1.0 and 1.25 start at 3, 4 and
    // 5.
    for (int pass = 0; pass < 2; ++pass) {
        for (const auto &[t, red, dw] : {std::tuple{0.75, (0.0 + 1.0) / 2, ImgRectI(2, 1, 6, 3)},
                                         std::tuple{1.0, (0.75 + 0.0) / 2, ImgRectI(3, 1, 7, 3)}}) {
            SCOPED_TRACE(testing::Message() << "pass " << pass << " at " << t);
            Ref<Image> out = Eval(bar, t, true);
            ASSERT_TRUE(out && out->DataWindow() == dw);
            EXPECT_FLOAT_EQ(out->GetFlt(4, 1).R, red);
        }
        EXPECT_EQ(bar->times.size(), 4u) << "the second pass came from the cache";
    }
    SetBlur(bar, 4, 180, 0, 1);
    bar->failAfter = 2.0;
    EXPECT_TRUE(Eval(bar, 1.5) && !Eval(bar, 2.0));
    EXPECT_EQ(ts::ConsoleText(*doc), "error: Bar: no bar after time 2\n");
}

} // namespace
} // namespace Orvane::motionblurtest
