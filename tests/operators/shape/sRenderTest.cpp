// sRender: summed coverage against areas worked out by hand, premultiplied colours and opacity, strokes against
// their bands, drawing order, no tree, proxy scale and pixel aspect, the frame the tree is asked for, a generator's
// ellipse, fields.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/shape/ShapeOperator.h"
#include "host/shape/ShapeTree.h"
#include "tests/host/shape/ShapeTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::shapetest::srender {
namespace {

namespace T = Orvane::Test;

constexpr int kW = 200, kH = 150;

/// Hands on a fixed tree and notes the flattening tolerance its request carries.
class TreeSource : public ThreadedOperator {
public:
    TreeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_ShapeTree}, {LinkMain, 1}});
    }
    void Process(Request *req) override {
        tolerance = ShapeOperator::TessellationTolerance(req);
        req->SetOutputData(output_, tree.Get());
    }
    Ref<ShapeTree> tree = MakeRef<ShapeTree>();
    double tolerance = 0.0;

private:
    Output *output_;
};

/// Points given in pixels, in shape units.
std::vector<ShapePoint> Units(std::vector<ShapePoint> px) {
    for (ShapePoint &p : px) p = {p.x / kW, p.y / kW};
    return px;
}

double SumAlpha(const Image &img) {
    double sum = 0;
    for (int y = 0; y < img.Height(); ++y)
        for (int x = 0; x < img.Width(); ++x) sum += img.GetFlt(x, y).A;
    return sum;
}

class SRender : public testing::Test {
protected:
    void SetUp() override {
        T::LoadOperators();
        static const OvID id = T::RegisterTestTool("TestShapeTreeSource", &T::MakeTool<TreeSource>);
        source = dynamic_cast<TreeSource *>(doc.AddTool(id));
        render = doc.AddTool(OvID("sRender"));
        ASSERT_TRUE(source && render && render->FindInput("Input")->ConnectTo(source->FindMainOutput()));
        T::SetNumbers(render, {{"Width", kW}, {"Height", kH}, {"Depth", 4}});
    }
    ShapeNode &Add(Ref<Shape> shape, const ShapeStyle &style, ShapeNode *parent = nullptr) {
        return AddNode(parent ? *parent : source->tree->Root(), std::move(shape), style);
    }
    Ref<Image> Render(int proxy = 1) {
        RenderTask task;
        task.proxyScale = proxy;
        EvalOptions opt;
        opt.flags = proxy > 1 ? ReqFlagProxy : 0u, opt.task = &task, opt.useCache = false;
        return T::EvalImage(render, 0.0, opt);
    }

    OrvaneDoc doc;
    TreeSource *source = nullptr;
    Operator *render = nullptr;
};

TEST_F(SRender, CoverageIsTheAreaAndColoursArePremultiplied) {
    const double r = 41.3;
    const std::vector<ShapePoint> triangle{{10.2, 12.7}, {150.9, 30.1}, {60.4, 140.3}};
    struct Case {
        const char *name;
        Ref<Shape> shape;
        double area; ///< pixels
        ShapeStyle style;
    } cases[] = {
        {"disc", Polygon(Units(EllipsePoints(97.2, 70.6, r, r, 8192))), M_PI * r * r, FillStyle(0.8f, 0.4f, 0.2f, 1)},
        {"triangle", Polygon(Units(triangle)), (140.7 * 127.6 - 50.2 * 17.4) / 2, FillStyle(0.2f, 1, 0.5f, 0.6f)},
        {"rectangle turned 30 degrees", Polygon(Units(Box(40, 40, 160, 100)), 30, 0.5, 0.35), 120.0 * 60,
         FillStyle(1, 1, 1, 1, 0.35)},
        {"square half off the frame", Polygon(Units(Box(170.25, -20.5, 260, 60.75))), 29.75 * 60.75,
         FillStyle(0.3f, 0.3f, 0.9f, 0.8f, 0.5)},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        source->tree = MakeRef<ShapeTree>();
        Add(c.shape, c.style);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        const double alpha = c.style.fillColor[3] * c.style.opacity;
        // The 8192-gon falls short of its circle by 2 pi^3 r^2 / (3 n^2), far below the tolerance; vertices on the
        // 1/256 pixel grid move the areas by well under 1e-4 of them (measured: below 1e-5).
        EXPECT_NEAR(SumAlpha(*img), c.area * alpha, 1e-4 * c.area);
        for (int y = 0; y < kH; ++y)
            for (int x = 0; x < kW; ++x) {
                const FltPixel p = img->GetFlt(x, y);
                ASSERT_NEAR(p.R, c.style.fillColor[0] * p.A, 1e-6);
                ASSERT_NEAR(p.B, c.style.fillColor[2] * p.A, 1e-6);
                ASSERT_LE(p.A, alpha + 1e-6);
            }
    }
}

TEST_F(SRender, AStrokeCoversItsBand) {
    const std::vector<ShapePoint> rect = Box(50, 40, 150, 110), segment{{30.5, 75.25}, {170.5, 75.25}};
    struct Case {
        const std::vector<ShapePoint> *points;
        double width; ///< pixels
        int join, cap;
        double area;
    } cases[] = {
        {&rect, 2.0, ShapeJoinMiter, ShapeCapFlat, 102.0 * 72 - 98 * 68},
        {&rect, 13.5, ShapeJoinMiter, ShapeCapFlat, 113.5 * 83.5 - 86.5 * 56.5},
        {&rect, 10.0, ShapeJoinBevel, ShapeCapFlat, 110.0 * 80 - 90 * 60 - 4 * 12.5},
        {&segment, 9.0, ShapeJoinMiter, ShapeCapFlat, 140.0 * 9},
        {&segment, 9.0, ShapeJoinMiter, ShapeCapSquare, 149.0 * 9},
        {&segment, 9.0, ShapeJoinMiter, ShapeCapRound, 140.0 * 9 + M_PI * 4.5 * 4.5},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.width << " join " << c.join << " cap " << c.cap);
        Ref<Shape> shape = MakeRef<Shape>();
        for (const ShapePoint &p : Units(*c.points)) shape->LineTo(p.x, p.y);
        if (c.points == &rect) shape->Close();
        ShapeStyle style;
        style.fill = false, style.line = true, style.lineWidth = c.width / kW, style.join = c.join, style.cap = c.cap;
        source->tree = MakeRef<ShapeTree>();
        Add(shape, style);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        // Round caps are chords of at most a pixel: the two half discs lose at most what a polygon of such chords
        // loses from its circle.
        const double half = c.width / 2, sides = std::ceil(M_PI / std::asin(0.5 / half));
        const double chordLoss = M_PI * half * half - sides / 2 * half * half * std::sin(2 * M_PI / sides);
        const double sum = SumAlpha(*img);
        EXPECT_NEAR(sum, c.area, c.cap == ShapeCapRound ? chordLoss : 1e-3 * c.area);
        EXPECT_LE(sum, c.area * (1 + 1e-3));
    }
}

TEST_F(SRender, LaterNodesDrawOverEarlierOnesAndNoTreeIsTransparent) {
    const ShapeStyle red = FillStyle(1, 0, 0, 1), blue = FillStyle(0, 0, 1, 0.5f);
    struct Case {
        const ShapeStyle *first, *second;
        bool nested;
        FltPixel overlap;
    } cases[] = {{&red, &blue, false, {0.5f, 0, 0.5f, 1}},
                 {&blue, &red, false, {1, 0, 0, 1}},
                 {&blue, &red, true, {1, 0, 0, 1}}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << (c.first == &red) << c.nested);
        source->tree = MakeRef<ShapeTree>();
        ShapeNode &first = Add(Polygon(Units(Box(20, 20, 120, 100))), *c.first);
        Add(Polygon(Units(Box(80, 60, 180, 140))), *c.second, c.nested ? &first : nullptr);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        T::ExpectPixelNear(img->GetFlt(100, 80), c.overlap, 1e-6);
    }
    source->tree = MakeRef<ShapeTree>();
    for (bool linked : {true, false}) {
        if (!linked) render->FindInput("Input")->Disconnect();
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        EXPECT_EQ(img->Width(), kW);
        EXPECT_EQ(img->Height(), kH);
        EXPECT_EQ(SumAlpha(*img), 0.0);
    }
}

TEST_F(SRender, ProxyScalePixelAspectAndTheFrameAskedOfTheTree) {
    Add(Polygon(Units(Box(20, 20, 120, 100))), FillStyle(1, 1, 1, 1));
    struct Case {
        int width, proxy;
        double aspectX; ///< pixel aspect X (Y is 1)
    } cases[] = {{kW, 1, 1.0}, {kW, 2, 1.0}, {4 * kW, 1, 1.0}, {4 * kW, 4, 1.0}, {kW, 1, 2.0}, {kW, 2, 0.5}};
    for (const Case &c : cases) {
        SCOPED_TRACE(testing::Message() << c.width << " / " << c.proxy << ", aspect " << c.aspectX);
        T::SetNumbers(render, {{"Width", c.width}, {"Height", c.width * 3 / 2}}); // tall enough for every aspect
        T::SetPoint(render, "PixelAspect", c.aspectX, 1.0);
        const Ref<Image> img = Render(c.proxy);
        ASSERT_TRUE(img);
        const double pixels = double(c.width) / c.proxy;
        EXPECT_EQ(img->Width(), c.width / c.proxy);
        // The box is 0.5 x 0.4 of the frame width; a unit spans the width across and width x aspect X / aspect Y
        // rows up, so the area goes with the square of the width rendered, times the pixel aspect.
        const double area = 0.5 * 0.4 * pixels * pixels * c.aspectX;
        EXPECT_NEAR(SumAlpha(*img), area, 1e-6 * area);
        EXPECT_DOUBLE_EQ(source->tolerance, 2.0 / pixels);
    }
}

TEST_F(SRender, DrawsAGeneratorsEllipseAtItsArea) {
    Operator *ellipse = doc.AddTool(OvID("sEllipse"));
    ASSERT_TRUE(ellipse && render->FindInput("Input")->ConnectTo(ellipse->FindMainOutput()));
    T::SetNumbers(render, {{"Height", 2 * kW}}); // room for the whole ellipse
    const Ref<Image> img = Render();
    ASSERT_TRUE(img);
    // The default ellipse is half the frame width across: a disc of radius kW / 4. Flattened in steps of at most
    // a pixel, its chords cut off under 1e-3 of the area (measured: 2e-5), never add to it.
    const double area = M_PI * kW * kW / 16;
    const double sum = SumAlpha(*img);
    EXPECT_NEAR(sum, area, 1e-3 * area);
    EXPECT_LE(sum, area);
}

TEST_F(SRender, AFieldHoldsItsRowsOfTheFrame) {
    Add(Polygon(Units({{10.2, 12.7}, {150.9, 30.1}, {60.4, 140.3}})), FillStyle(0.2f, 1.0f, 0.5f, 0.6f));
    const Ref<Image> full = Render();
    ASSERT_TRUE(full);
    for (int field : {0, 1}) {
        Request req(render, render->FindMainOutput(), 0.0, 0, nullptr);
        req.SetField(field);
        for (const auto &in : render->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
        req.SetInputData(render->FindInput("Input"), source->tree.Get());
        render->Process(&req);
        const auto *img = dynamic_cast<const Image *>(req.GetOutputData(render->FindMainOutput()));
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Height(), kH / 2);
        EXPECT_DOUBLE_EQ(img->YScale(), 2 * full->YScale());
        EXPECT_EQ(img->Attrs().GetLong(ImgField, -1), field);
        for (int y = 0; y < kH / 2; ++y)
            ASSERT_EQ(std::memcmp(img->ScanLine(y), full->ScanLine(2 * y + field), full->RowBytes()), 0) << y;
    }
}

} // namespace
} // namespace Orvane::shapetest::srender
