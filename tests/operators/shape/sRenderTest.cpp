// sRender: summed coverage against areas worked out apart from the renderer (analytic, or the polygon adaptor's),
// premultiplied colours and opacity, strokes against their bands, drawing order, no tree, proxy scale, and the
// frame the tree is asked for.
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
#include "host/shape/ShapeClip.h"
#include "host/shape/ShapeOperator.h"
#include "host/shape/ShapeTree.h"
#include "tests/host/shape/ShapeTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::shapetest::srender {
namespace {

namespace T = Orvane::Test;

constexpr int kW = 200, kH = 150;

/// Hands on a fixed tree and notes the flattening tolerance its requests carry.
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

class SRender : public testing::Test {
protected:
    void SetUp() override {
        T::LoadOperators();
        static const OvID id = T::RegisterTestTool("TestShapeTreeSource", &T::MakeTool<TreeSource>);
        source = dynamic_cast<TreeSource *>(doc.AddTool(id));
        render = doc.AddTool(OvID("sRender"));
        ASSERT_TRUE(source && render);
        ASSERT_TRUE(render->FindInput("Input")->ConnectTo(source->FindMainOutput()));
        T::SetNumbers(render, {{"Width", kW}, {"Height", kH}, {"Depth", 4}});
    }
    /// Adds a node of `shape` (given in pixels) under the root.
    void Add(const std::vector<ShapePoint> &px, const ShapeStyle &style) {
        std::vector<ShapePoint> units;
        for (const ShapePoint &p : px) units.push_back({p.x / kW, p.y / kW});
        Ref<ShapeNode> n = MakeRef<ShapeNode>();
        n->SetShape(Polygon(units));
        n->SetStyle(style);
        source->tree->Root().AppendChild(std::move(n));
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

double SumAlpha(const Image &img) {
    double sum = 0;
    for (int y = 0; y < img.Height(); ++y)
        for (int x = 0; x < img.Width(); ++x) sum += img.GetFlt(x, y).A;
    return sum;
}

ShapeStyle Style(float r, float g, float b, float a, double opacity = 1.0) {
    ShapeStyle s;
    s.fillColor[0] = r, s.fillColor[1] = g, s.fillColor[2] = b, s.fillColor[3] = a, s.opacity = opacity;
    return s;
}

std::vector<ShapePoint> Box(double x0, double y0, double x1, double y1) {
    return {{x0, y0}, {x1, y0}, {x1, y1}, {x0, y1}};
}

/// The area (pixels) of a polygon in pixels within the frame, by the polygon adaptor rather than the renderer.
double AreaInFrame(const std::vector<ShapePoint> &px) {
    ShapeClipper clipper;
    clipper.AddPaths({px}, true);
    clipper.AddPaths({Box(0, 0, kW, kH)}, false);
    ClipPaths in;
    EXPECT_TRUE(clipper.Execute(ClipOperation::Intersection, in));
    return FilledArea(in);
}

TEST_F(SRender, CoverageIsTheAreaAndColoursArePremultiplied) {
    const double r = 41.3;
    struct Case {
        const char *name;
        std::vector<ShapePoint> points;
        double area; ///< pixels
        ShapeStyle style;
    } cases[] = {
        {"disc", EllipsePoints(97.2, 70.6, r, r, 8192), M_PI * r * r, Style(0.8f, 0.4f, 0.2f, 1.0f)},
        {"triangle",
         {{10.2, 12.7}, {150.9, 30.1}, {60.4, 140.3}},
         std::abs((150.9 - 10.2) * (140.3 - 12.7) - (60.4 - 10.2) * (30.1 - 12.7)) / 2,
         Style(0.2f, 1.0f, 0.5f, 0.6f)},
        {"rectangle turned 30 degrees", {}, 0.0, Style(1.0f, 1.0f, 1.0f, 1.0f, 0.35)},
        {"square half off the frame", Box(170.25, -20.5, 260.0, 60.75), 0.0, Style(0.3f, 0.3f, 0.9f, 0.8f, 0.5)},
    };
    {
        const Ref<Shape> turned = Polygon(Box(40, 40, 160, 100), 30, 100, 70);
        for (const Shape::Vertex &v : turned->SubPaths()[0].points) cases[2].points.push_back({v.x, v.y});
        cases[2].area = 120.0 * 60.0;
    }
    cases[3].area = AreaInFrame(cases[3].points);
    EXPECT_NEAR(cases[3].area, 29.75 * 60.75, 1e-6); // the adaptor itself, against the hand-worked clip
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        source->tree = MakeRef<ShapeTree>();
        Add(c.points, c.style);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        ASSERT_EQ(img->Width(), kW);
        const double alpha = c.style.fillColor[3] * c.style.opacity;
        // A polygon of 8192 sides falls short of its circle by 2 pi^3 r^2 / (3 n^2), far below the tolerance;
        // vertices on the 1/256 pixel grid move the area by well under 1e-4 of it here (measured: below 1e-5).
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
    struct Case {
        const char *name;
        std::vector<ShapePoint> points;
        bool closed;
        double width; ///< pixels
        int join, cap;
        double area;
    } cases[] = {
        {"rectangle, thin miter", Box(50, 40, 150, 110), true, 2.0, ShapeJoinMiter, ShapeCapFlat, 102.0 * 72 - 98 * 68},
        {"rectangle, wide miter", Box(50, 40, 150, 110), true, 13.5, ShapeJoinMiter, ShapeCapFlat,
         113.5 * 83.5 - 86.5 * 56.5},
        {"rectangle, bevel", Box(50, 40, 150, 110), true, 10.0, ShapeJoinBevel, ShapeCapFlat,
         110.0 * 80 - 90 * 60 - 4 * 12.5},
        {"segment, flat caps", {{30.5, 75.25}, {170.5, 75.25}}, false, 9.0, ShapeJoinMiter, ShapeCapFlat, 140.0 * 9},
        {"segment, square caps",
         {{30.5, 75.25}, {170.5, 75.25}},
         false,
         9.0,
         ShapeJoinMiter,
         ShapeCapSquare,
         149.0 * 9},
        {"segment, round caps",
         {{30.5, 75.25}, {170.5, 75.25}},
         false,
         9.0,
         ShapeJoinMiter,
         ShapeCapRound,
         140.0 * 9 + M_PI * 4.5 * 4.5},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        Ref<Shape> shape = MakeRef<Shape>();
        for (size_t i = 0; i < c.points.size(); ++i)
            i ? shape->LineTo(c.points[i].x / kW, c.points[i].y / kW)
              : shape->MoveTo(c.points[0].x / kW, c.points[0].y / kW);
        if (c.closed) shape->Close();
        ShapeStyle style = Style(0, 0, 0, 0);
        style.fill = false, style.line = true, style.lineWidth = c.width / kW, style.join = c.join, style.cap = c.cap;
        source->tree = MakeRef<ShapeTree>();
        Ref<ShapeNode> n = MakeRef<ShapeNode>();
        n->SetShape(shape);
        n->SetStyle(style);
        source->tree->Root().AppendChild(n);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        // Round caps are flattened to chords of at most one pixel: the two half discs lose at most what a
        // polygon of such chords loses from its circle.
        const double r = c.width / 2, sides = std::ceil(M_PI / std::asin(0.5 / r));
        const double chordLoss = M_PI * r * r - sides / 2 * r * r * std::sin(2 * M_PI / sides);
        const double sum = SumAlpha(*img);
        EXPECT_NEAR(sum, c.area, c.cap == ShapeCapRound ? chordLoss : 1e-3 * c.area);
        EXPECT_LE(sum, c.area + 1e-3 * c.area);
    }
}

TEST_F(SRender, LaterNodesDrawOverEarlierOnes) {
    const ShapeStyle red = Style(1, 0, 0, 1), blue = Style(0, 0, 1, 0.5f);
    struct Case {
        const char *name;
        const ShapeStyle *first, *second;
        bool nested;
        FltPixel overlap;
    } cases[] = {
        {"translucent blue over red", &red, &blue, false, {0.5f, 0, 0.5f, 1}},
        {"red over translucent blue", &blue, &red, false, {1, 0, 0, 1}},
        {"a child over its parent", &blue, &red, true, {1, 0, 0, 1}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        source->tree = MakeRef<ShapeTree>();
        Add(Box(20, 20, 120, 100), *c.first);
        Ref<ShapeNode> second = MakeRef<ShapeNode>();
        second->SetShape(Polygon(Box(80.0 / kW, 60.0 / kW, 180.0 / kW, 140.0 / kW)));
        second->SetStyle(*c.second);
        ShapeNode &parent = c.nested ? *source->tree->Root().Children()[0] : source->tree->Root();
        parent.AppendChild(second);
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        T::ExpectPixelNear(img->GetFlt(100, 80), c.overlap, 1e-6);
    }
}

TEST_F(SRender, NoTreeOrAnEmptyOneGivesATransparentFrame) {
    for (bool linked : {true, false}) {
        if (!linked) render->FindInput("Input")->Disconnect();
        const Ref<Image> img = Render();
        ASSERT_TRUE(img);
        EXPECT_EQ(img->Width(), kW);
        EXPECT_EQ(img->Height(), kH);
        EXPECT_EQ(SumAlpha(*img), 0.0);
        T::ExpectPixelNear(img->GetFlt(kW / 2, kH / 2), FltPixel{}, 0.0);
    }
}

TEST_F(SRender, ProxyScalePixelAspectAndTheFrameAskedOfTheTree) {
    Add(Box(20, 20, 120, 100), Style(1, 1, 1, 1));
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

TEST_F(SRender, AFieldHoldsItsRowsOfTheFrame) {
    Add({{10.2, 12.7}, {150.9, 30.1}, {60.4, 140.3}}, Style(0.2f, 1.0f, 0.5f, 0.6f));
    const Ref<Image> full = Render();
    ASSERT_TRUE(full);
    for (int field : {0, 1}) {
        SCOPED_TRACE(field);
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
