// The polygon masks: covered areas against shoelace areas worked out here (squares, triangles, a star under both
// fill rules, strokes of open lines, grown and hollow borders, sizes and turns in three axes), a B-spline against its
// own line's samples, the soft band between two lines against the linear fall-off it must have, the kept edit-state
// keys of documents, and a mask limiting another tool.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/shape/PolyLine.h"
#include "tests/operators/mask/MaskRig.h"
#include "tests/support/TestSupport.h"

namespace Orvane::PolyMaskTest {
namespace {
namespace ts = ::Orvane::Test;
using std::numbers::pi;

constexpr int W = ts::MaskRig::W, H = ts::MaskRig::H;

struct Px {
    double x, y;
};

/// A line through pixel positions of the W x H frame (the tool's Center at the frame's middle).
template <class Line = PolyLine> Ref<Line> LineThrough(const std::vector<Px> &px, bool closed) {
    auto line = MakeRef<Line>();
    line->closed = closed;
    for (const Px &p : px) {
        PolyPoint q;
        q.x = p.x / W - 0.5, q.y = p.y / H - 0.5;
        q.straight = true;
        line->points.push_back(q);
    }
    return line;
}

double Shoelace(const std::vector<Px> &p) {
    double twice = 0;
    for (size_t i = 0; i < p.size(); ++i) {
        const Px &a = p[i], &b = p[(i + 1) % p.size()];
        twice += a.x * b.y - b.x * a.y;
    }
    return std::fabs(twice) / 2;
}

std::vector<Px> Square(double cx, double cy, double half) {
    return {{cx - half, cy - half}, {cx + half, cy - half}, {cx + half, cy + half}, {cx - half, cy + half}};
}

struct Rig : ts::MaskRig {
    explicit Rig(const char *cls = "PolylineMask") : MaskRig(cls) {}
    void Set(const char *id, Ref<PolyLine> line) const { ASSERT_TRUE(mask->FindInput(id)->SetValue(line)); }
};

double Area(const Image &m) { return ts::MaskRig::Area(m); }

double Perimeter(const std::vector<Px> &p, bool closed) {
    double sum = 0;
    for (size_t i = 0; i + (closed ? 0 : 1) < p.size(); ++i)
        sum += std::hypot(p[(i + 1) % p.size()].x - p[i].x, p[(i + 1) % p.size()].y - p[i].y);
    return sum;
}

/// The area a round end of radius r loses at most to its chords, each no further than min(1/8, r / 4) pixels (a
/// sixteenth of the stroke's steps of 2 / W, no coarser than a quarter of the radius) from the arc: a circle of
/// such chords.
double RoundLoss(double r) {
    const double s = std::min(0.125, r / 4);
    const int n = static_cast<int>(std::ceil(pi / std::acos(1 - s / r)));
    return pi * r * r - n / 2.0 * r * r * std::sin(2 * pi / n);
}

TEST(PolyMask, CoversTheAreasOfItsLines) {
    // Vertices are placed on a grid of 1/256 pixel, so an edge may move by 1/512 pixel: areas hold to the outline's
    // length over 512.
    const std::vector<Px> square = Square(128, 96, 50), triangle = {{70, 50}, {190, 70}, {110, 150}};
    // A five-pointed star drawn point to point: its 10-gon of outer radius R and inner radius r, less the pentagon
    // in its middle under the even-odd rule.
    const double R = 80, r = R * std::cos(2 * pi / 5) / std::cos(pi / 5);
    std::vector<Px> star;
    for (int k = 0; k < 5; ++k) {
        const double a = pi / 2 + k * 4 * pi / 5;
        star.push_back({128 + R * std::cos(a), 96 + R * std::sin(a)});
    }
    const double tenGon = 10 * 0.5 * R * r * std::sin(pi / 5), pentagon = 2.5 * r * r * std::sin(2 * pi / 5);
    const double b = 0.02 * W, w = 0.04 * W; // borders in pixels
    const std::vector<Px> open = {{60, 90}, {180, 90}};
    const double sq = Perimeter(square, true), tri = Perimeter(triangle, true), st = 20 * R * std::sin(pi / 5) * 2;
    struct Case {
        const char *what;
        const std::vector<Px> *line;
        bool closed;
        std::vector<std::pair<const char *, double>> settings;
        double area, outline; // the outline's length in pixels bounds the error
    } cases[] = {
        {"square", &square, true, {}, 100.0 * 100, 0},
        {"triangle", &triangle, true, {}, Shoelace(triangle), tri},
        {"size 1.5", &square, true, {{"Size", 1.5}}, 150.0 * 150, 0},
        {"size 0", &square, true, {{"Size", 0}}, 0, 0},
        {"turned about Z", &triangle, true, {{"ZRotation", 37}}, Shoelace(triangle), tri},
        {"tilted 60 about X", &square, true, {{"XRotation", 60}}, 100.0 * 100 * 0.5, sq},
        {"tilted 60 about Y", &triangle, true, {{"YRotation", 60}}, Shoelace(triangle) * 0.5, tri},
        {"inverted", &square, true, {{"Invert", 1}}, double(W) * H - 100.0 * 100, 0},
        // A solid border grows each side by half of it (mitred corners); a hollow one is the ring of its width.
        {"grown", &square, true, {{"BorderWidth", 0.02}, {"JoinStyle", 2}}, std::pow(100 + b, 2), sq},
        {"shrunk", &square, true, {{"BorderWidth", -0.02}, {"JoinStyle", 2}}, std::pow(100 - b, 2), sq},
        {"hollow",
         &square,
         true,
         {{"BorderWidth", 0.02}, {"JoinStyle", 2}, {"Solid", 0}},
         std::pow(100 + b, 2) - std::pow(100 - b, 2),
         2 * sq},
        // An open line is a stroke whatever Solid says: length x width, plus the caps.
        {"open, flat caps", &open, false, {{"BorderWidth", 0.04}}, 120 * w, 2 * 120 + 2 * w},
        {"open, square caps", &open, false, {{"BorderWidth", 0.04}, {"CapStyle", 2}}, (120 + w) * w, 2 * 120 + 4 * w},
        {"open, half written", &open, false, {{"BorderWidth", 0.04}, {"WriteLength", 0.5}}, 60 * w, 2 * 60 + 2 * w},
        {"star, alternate", &star, true, {}, tenGon - pentagon, st},
        {"star, non-zero", &star, true, {{"FillMethod", 1}}, tenGon, st},
    };
    auto render = [](const std::vector<Px> &line, bool closed, const std::vector<std::pair<const char *, double>> &s) {
        Rig rig;
        rig.Set("Polyline", LineThrough(line, closed));
        ts::SetNumbers(rig.mask, s);
        const Ref<Image> m = rig.Render();
        EXPECT_TRUE(m) << ts::ConsoleText(*rig.doc);
        return m ? Area(*m) : -1.0;
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        EXPECT_NEAR(render(*c.line, c.closed, c.settings), c.area, c.outline / 512 + 1e-3);
    }
    // Round caps: two half discs of radius w / 2, made of chords.
    const double round = render(open, false, {{"BorderWidth", 0.04}, {"CapStyle", 1}});
    EXPECT_LE(round, 120 * w + pi * w * w / 4 + 1);
    EXPECT_GE(round, 120 * w + pi * w * w / 4 - RoundLoss(w / 2) - 1);
}

TEST(PolyMask, DataWindowHoldsTheShapeAndItsOuterLine) {
    Rig rig;
    rig.Set("Polyline", LineThrough(Square(100, 80, 30), true));
    Ref<Image> m = rig.Render();
    ASSERT_TRUE(m);
    EXPECT_EQ(m->DataWindow(), ImgRectI(69, 49, 131, 111)) << ts::RectText(m->DataWindow());
    // The outer line is not asked for until it holds a point; then the window reaches it.
    Input *outer = rig.mask->FindInput("Polyline2");
    EXPECT_FALSE(outer->IsVisible());
    EXPECT_FALSE(outer->SendsRequest());
    rig.Set("Polyline2", LineThrough(Square(100, 80, 50), true));
    EXPECT_TRUE(outer->IsVisible());
    EXPECT_TRUE(outer->SendsRequest());
    m = rig.Render();
    EXPECT_EQ(m->DataWindow(), ImgRectI(49, 29, 151, 131)) << ts::RectText(m->DataWindow());
}

TEST(PolyMask, BSplineCoversTheAreaOfItsLinesSamples) {
    // The mask of a B-spline line against the shoelace of the line's own evenly spaced samples (open lines stroked,
    // so their ends, where the two ways of ending a spline differ, count). Chords of at most 2 pixels stay within
    // 1/8 pixel of the curve, so the area may differ by the outline's length times 2/3 of that, and by the outline
    // over 512 for the vertex grid.
    const std::vector<Px> ring = {{60, 40}, {200, 50}, {220, 150}, {128, 120}, {40, 160}};
    for (const bool weighted : {false, true}) {
        SCOPED_TRACE(weighted ? "weighted" : "plain");
        Ref<BSplinePolyLine> line = LineThrough<BSplinePolyLine>(ring, true);
        if (weighted) line->points[2].weight = 3, line->points[4].weight = 0.5;
        Rig rig("BSplineMask");
        rig.Set("Polyline", line);
        const Ref<Image> m = rig.Render();
        ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
        std::vector<PolySample> s(4001);
        ASSERT_EQ(line->GetSamplePoints(4001, double(W) / H, s.data(), nullptr, 0), 4001);
        std::vector<Px> px;
        double perimeter = 0;
        for (const PolySample &q : s) {
            px.push_back({(q.x + 0.5) * W, (q.y + 0.5) * H});
            if (px.size() > 1)
                perimeter += std::hypot(px.back().x - px[px.size() - 2].x, px.back().y - px[px.size() - 2].y);
        }
        EXPECT_NEAR(Area(*m), Shoelace(px), perimeter * (0.125 * 2 / 3 + 1.0 / 512));
    }
    // Open: a stroke 0.02 wide along a curve through its two end points.
    Ref<BSplinePolyLine> open = LineThrough<BSplinePolyLine>({{40, 40}, {90, 160}, {160, 30}, {220, 150}}, false);
    Rig rig("BSplineMask");
    rig.Set("Polyline", open);
    ts::SetNumber(rig.mask, "BorderWidth", 0.02);
    const Ref<Image> m = rig.Render();
    ASSERT_TRUE(m);
    const double length = open->CalcLength(double(W) / H) * W; // Y measured in widths
    EXPECT_NEAR(Area(*m), length * 0.02 * W, length * 0.02 * W * 0.02);
    EXPECT_GT(m->GetFlt(40, 40).A, 0.2f) << "the stroke starts on the first point";
    EXPECT_GT(m->GetFlt(219, 149).A, 0.2f) << "and ends on the last";
}

/// A tool that hands out a fixed line of the cardinal kind.
class CardinalSource : public ThreadedOperator {
public:
    CardinalSource(const Registry *reg, const ScriptVal &args, const TagList &tags)
        : ThreadedOperator(reg, args, tags) {
        out_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_CardinalSplinePolyline}});
    }
    void Process(Request *req) override { req->SetOutputData(out_, line); }
    Ref<CardinalSplinePolyLine> line;

private:
    Output *out_;
};

TEST(PolyMask, ACardinalLineIsDrawnAsItsBezierCopy) {
    const OvID cls = ts::RegisterTool("PolyMaskTestCardinal", &ts::MakeTool<CardinalSource>);
    Rig rig;
    auto *source = dynamic_cast<CardinalSource *>(rig.doc->AddTool(cls, "Cardinal1"));
    ASSERT_TRUE(source);
    source->line = LineThrough<CardinalSplinePolyLine>({{60, 40}, {200, 60}, {150, 160}, {50, 140}}, true);
    for (PolyPoint &p : source->line->points) p.straight = false;
    ASSERT_TRUE(rig.mask->FindInput("Polyline")
                    ->ConnectTo(source->FindMainOutput() ? source->FindMainOutput() : source->Outputs()[0].get()));
    const Ref<Image> linked = rig.Render();
    ASSERT_TRUE(linked) << ts::ConsoleText(*rig.doc);
    Rig plain;
    plain.Set("Polyline", source->line->ToBezier());
    const Ref<Image> bezier = plain.Render();
    ASSERT_TRUE(bezier);
    ASSERT_EQ(linked->DataWindow(), bezier->DataWindow());
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) ASSERT_EQ(linked->GetFlt(x, y).A, bezier->GetFlt(x, y).A) << x << "," << y;
    EXPECT_GT(Area(*linked), Shoelace({{60, 40}, {200, 60}, {150, 160}, {50, 140}}) * 0.9);
}

TEST(PolyMask, BandFallsLinearlyFromTheInnerLineToTheOuter) {
    // Concentric squares of half-sizes a (inner) and b (outer): 1 inside the inner one, (b - d) / (b - a) between
    // them at distance d = max(|dx|, |dy|) from the centre, 0 beyond. A single-point inner line gives a cone,
    // 1 - d / b.
    const double cx = 128, cy = 96;
    struct Case {
        const char *what;
        std::vector<Px> inner;
        bool innerClosed;
        double a, b;
        std::vector<std::pair<const char *, double>> settings;
        double tolerance;
    } cases[] = {
        {"closed solid squares", Square(cx, cy, 30), true, 30, 70, {}, 2e-5},
        {"hollow squares", Square(cx, cy, 30), true, 30, 70, {{"Solid", 0}, {"BorderWidth", 0.0}}, 1e-4},
        {"cone", {{cx, cy}}, false, 0, 70, {}, 1e-4},
        {"inverted", Square(cx, cy, 30), true, 30, 70, {{"Invert", 1}}, 2e-5},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        Rig rig;
        ts::SetNumbers(rig.mask, c.settings);
        rig.Set("Polyline", LineThrough(c.inner, c.innerClosed));
        rig.Set("Polyline2", LineThrough(Square(cx, cy, c.b), true));
        const Ref<Image> m = rig.Render();
        ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
        const bool hollow = !c.settings.empty() && c.settings[0].first == std::string("Solid");
        const bool inverted = !c.settings.empty() && c.settings[0].first == std::string("Invert");
        int checked = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) {
                // Square rings: the distance is the larger of the two; skip the pixels the curves and the corners'
                // diagonals (where the fall-off bends) pass through.
                const double dx = std::fabs(x + 0.5 - cx), dy = std::fabs(y + 0.5 - cy), d = std::max(dx, dy);
                if (std::fabs(d - c.a) < 1 || std::fabs(d - c.b) < 1 || std::fabs(dx - dy) < 1) continue;
                double want = d < c.a ? (hollow ? 0.0 : 1.0) : d < c.b ? (c.b - d) / (c.b - c.a) : 0.0;
                if (inverted) want = 1 - want;
                ASSERT_NEAR(m->GetFlt(x, y).A, want, c.tolerance) << x << "," << y;
                ++checked;
            }
        EXPECT_GT(checked, W * H * 3 / 4);
    }
}

TEST(PolyMask, IdenticalLinesDrawThePlainMask) {
    const Ref<PolyLine> line = LineThrough({{50, 40}, {200, 70}, {120, 170}}, true);
    Rig plain, twice;
    plain.Set("Polyline", line);
    twice.Set("Polyline", line);
    twice.Set("Polyline2", LineThrough({{50, 40}, {200, 70}, {120, 170}}, true));
    const Ref<Image> a = plain.Render(), b = twice.Render();
    ASSERT_TRUE(a && b);
    EXPECT_EQ(a->DataWindow(), b->DataWindow());
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) ASSERT_EQ(a->GetFlt(x, y).A, b->GetFlt(x, y).A) << x << "," << y;
}

TEST(PolyMask, DocumentsKeepTheEditStateKeys) {
    const std::string doc = R"(Orvane.Document {
	Tools = {
		Mask1 = PolylineMask {
			Inputs = {
				Polyline = Polyline { "0.1 0.2 S", "0.4 0.2 S", "0.3 0.5", Closed = true },
			},
			DrawMode = "InsertAndModify",
			DrawMode2 = "ClickAppend",
			DrawStyle2 = "dash",
			Color = { Red = 1, Green = 0.5, Blue = 0 },
			KeyPointColor2 = { Red = 0, Green = 1, Blue = 0 },
			ShowHandles = false,
			StopRendering = 1,
			FollowExtMatchPoints = true,
			PolyLine2Disabled = true,
			OnionSkinning = { Show = true, PrevRange = 3, NextRange = 2, Anchor = 0, Step = 1, PrevColor = { Red = 1 }, ShowKeySkin = false, EnableHover = true, PointPlot = false, ShowHull = true },
			RotoAssist2 = { Enabled = true, MultiplePointRoto = false, Distance = 12, TrackFrameSkip = 2 },
		},
	},
})";
    ts::LoadOperators();
    Ref<OrvaneDoc> first = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = LoadDocument(doc, *first);
    ASSERT_TRUE(r.ok) << r.error;
    const std::string saved = SaveDocument(*first);
    for (const char *key : {"DrawMode = \"InsertAndModify\"", "DrawMode2 = \"ClickAppend\"", "DrawStyle2 = \"dash\"",
                            "KeyPointColor2", "ShowHandles = false", "StopRendering = 1", "FollowExtMatchPoints = true",
                            "PolyLine2Disabled = true", "PrevRange = 3", "TrackFrameSkip = 2", "Polyline = Polyline"})
        EXPECT_NE(saved.find(key), std::string::npos) << key << " in\n" << saved;
    Ref<OrvaneDoc> second = MakeRef<OrvaneDoc>();
    ASSERT_TRUE(LoadDocument(saved, *second).ok);
    EXPECT_EQ(SaveDocument(*second), saved);
    // The keys change nothing: the loaded tool draws its triangle.
    Operator *mask = second->FindTool("Mask1");
    ASSERT_TRUE(mask);
    EvalOptions opt;
    opt.useCache = false;
    const Ref<Image> m = ts::EvalImage(mask, 0.0, opt);
    ASSERT_TRUE(m) << ts::ConsoleText(*second);
    EXPECT_GT(m->DataWindow().Width(), 0);
}

TEST(PolyMask, LimitsAnotherToolToItsInside) {
    Rig rig;
    const std::vector<Px> tri = {{60, 30}, {220, 70}, {90, 170}};
    rig.Set("Polyline", LineThrough(tri, true));
    const Ref<Image> out = rig.GainThroughMask(W, H);
    ASSERT_TRUE(out) << ts::ConsoleText(*rig.doc);
    // Pixels wholly inside the triangle doubled, wholly outside untouched; which is which by the edge functions.
    int inside = 0, outside = 0;
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            double nearest = 1e9;
            bool in = true;
            for (size_t i = 0; i < 3; ++i) {
                const Px &a = tri[i], &b = tri[(i + 1) % 3];
                const double ex = b.x - a.x, ey = b.y - a.y;
                const double side = (ex * (y + 0.5 - a.y) - ey * (x + 0.5 - a.x)) / std::hypot(ex, ey);
                in = in && side > 0;
                nearest = std::min(nearest, std::fabs(side));
            }
            if (nearest < 0.75) continue;
            EXPECT_FLOAT_EQ(out->GetFlt(x, y).R, in ? 0.5f : 0.25f) << x << "," << y;
            (in ? inside : outside)++;
        }
    EXPECT_GT(inside, 5000);
    EXPECT_GT(outside, 20000);
}

} // namespace
} // namespace Orvane::PolyMaskTest
