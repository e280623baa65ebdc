// MultiPoly: layers of hard pixel-aligned squares against the mask worked out pixel by pixel here (paint modes,
// order, levels, disabled layers, the incoming mask merged once), its data window, a B-spline layer against the
// BSpline tool, documents saved, loaded and saved again, deleting and resetting layers, and a layer whose image is
// refused.
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "host/image/PaintModes.h"
#include "host/image/PixelMemory.h"
#include "host/shape/PolyLine.h"
#include "tests/operators/mask/MaskRig.h"
#include "tests/support/TestSupport.h"

namespace Orvane::MultiPolyTest {
namespace {
namespace ts = ::Orvane::Test;

constexpr int W = ts::MaskRig::W, H = ts::MaskRig::H;

/// A square of pixels [x0, x0 + side) x [y0, y0 + side).
struct Square {
    int x0, y0, side;
    bool Holds(int x, int y) const { return x >= x0 && x < x0 + side && y >= y0 && y < y0 + side; }
    /// The mask's window for it alone: its box and a pixel each way.
    ImgRectI Window() const { return ImgRectI(x0 - 1, y0 - 1, x0 + side + 1, y0 + side + 1); }
};

/// The square as a closed line of the layer's kind (points in fractions about the middle of the frame).
template <class Line = PolyLine> Ref<Line> LineOf(const Square &s) {
    auto line = MakeRef<Line>();
    line->closed = true;
    const int xs[4] = {s.x0, s.x0 + s.side, s.x0 + s.side, s.x0}, ys[4] = {s.y0, s.y0, s.y0 + s.side, s.y0 + s.side};
    for (int i = 0; i < 4; ++i) {
        PolyPoint p;
        p.x = double(xs[i]) / W - 0.5, p.y = double(ys[i]) / H - 0.5;
        p.straight = true;
        line->points.push_back(p);
    }
    return line;
}

struct Rig : ts::MaskRig {
    Rig() : MaskRig("MultiPolyMask") {}
    /// Presses Add Polygon (or Add BSpline); the new layer's ID.
    int Add(bool bspline = false) const {
        const size_t before = Layers();
        EXPECT_TRUE(mask->FindInput(bspline ? "AddBSpline" : "AddPolygon")->SetValue(MakeRef<Number>(1)));
        EXPECT_EQ(Layers(), before + 1);
        return Order().empty() ? 0 : Order().back();
    }
    size_t Layers() const {
        return std::count_if(mask->Nests().begin(), mask->Nests().end(),
                             [](const ControlNest &n) { return std::string(n.id.Text()).rfind("PolyMask", 0) == 0; });
    }
    std::vector<int> Order() const {
        std::vector<int> ids;
        const auto *v = dynamic_cast<const ScriptValue *>(mask->FindInput("PolyOrder")->Constant().Get());
        for (const auto &e : v->value.Entries()) ids.push_back(int(e.second.AsNumber()));
        return ids;
    }
    void SetOrder(const std::vector<int> &ids) const {
        ScriptVal t = ScriptVal::Table();
        for (int id : ids) t.Append(id);
        ASSERT_TRUE(mask->FindInput("PolyOrder")->SetValue(MakeRef<ScriptValue>(t)));
    }
    Input *In(int layer, const char *id) const {
        return mask->FindInput(("PolyMask" + std::to_string(layer) + "." + id).c_str());
    }
    Input *Own(const char *id, int layer) const { return mask->FindInput((id + std::to_string(layer)).c_str()); }
};

/// One layer of a case: its square, paint mode, level and switch.
struct LayerSpec {
    Square sq;
    int mode = PaintMerge;
    double level = 1.0;
    bool enabled = true;
};

/// The mask a stack of hard layers must give at a pixel, mode by mode, over the incoming value `in`.
double Expected(const std::vector<LayerSpec> &layers, int x, int y, double in) {
    double acc = in;
    for (const LayerSpec &l : layers) {
        if (!l.enabled || l.mode == PaintNone) continue;
        const double m = l.sq.Holds(x, y) ? 1.0 : 0.0;
        double full = acc;
        if (l.mode == PaintMerge) full = acc + m - acc * m;
        if (l.mode == PaintSubtract) full = acc - m;
        if (l.mode == PaintMinimum) full = std::min(acc, m);
        acc = std::clamp(acc + l.level * (full - acc), 0.0, 1.0);
    }
    return acc;
}

void SetLayers(const Rig &rig, const std::vector<LayerSpec> &layers) {
    for (const LayerSpec &l : layers) {
        const int n = rig.Add();
        ASSERT_TRUE(rig.In(n, "Polyline")->SetValue(LineOf(l.sq)));
        ASSERT_TRUE(rig.In(n, "PaintMode")->SetValue(MakeRef<IDValue>(OvID(PaintModeID[l.mode]))));
        ASSERT_TRUE(rig.In(n, "Level")->SetValue(MakeRef<Number>(l.level)));
        ASSERT_TRUE(rig.Own("PolyMaskEnabled", n)->SetValue(MakeRef<Number>(l.enabled ? 1.0 : 0.4)));
    }
}

void ExpectMask(const Image &m, const std::function<double(int, int)> &want) {
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) ASSERT_NEAR(m.GetFlt(x, y).A, want(x, y), 1e-5) << x << "," << y;
}

TEST(MultiPoly, LayersMergeInPaintOrder) {
    const Square a{60, 50, 80}, b{100, 90, 70}, far{200, 20, 30};
    struct Case {
        const char *what;
        std::vector<LayerSpec> layers;
        std::vector<int> order; ///< empty: the order added
    } cases[] = {
        {"two squares merged: their union", {{a}, {b}}, {}},
        {"A, then B subtracted", {{a}, {b, PaintSubtract}}, {}},
        {"B, then A subtracted", {{b}, {a, PaintSubtract}}, {}},
        {"the same layers painted in the other order", {{a, PaintSubtract}, {b}}, {2, 1}},
        {"a disabled layer drops out", {{a}, {far, PaintMerge, 1.0, false}}, {}},
        {"paint mode None leaves the stack", {{a}, {far, PaintNone}}, {}},
        {"B at level 0.5", {{a}, {b, PaintMerge, 0.5}}, {}},
        {"intersection", {{a}, {b, PaintMinimum}}, {}},
        {"a layer left out of the order", {{a}, {b}}, {1}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        Rig rig;
        SetLayers(rig, c.layers);
        std::vector<LayerSpec> painted;
        if (!c.order.empty()) {
            rig.SetOrder(c.order);
            for (int n : c.order) painted.push_back(c.layers[size_t(n - 1)]);
        } else {
            painted = c.layers;
        }
        const Ref<Image> m = rig.Render();
        ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
        ExpectMask(*m, [&](int x, int y) { return Expected(painted, x, y, 0.0); });
        // The window: the enabled layers that paint, each its box and a pixel.
        ImgRectI window;
        for (const LayerSpec &l : painted)
            if (l.enabled && l.mode != PaintNone) window |= l.sq.Window();
        EXPECT_EQ(m->DataWindow(), window) << ts::RectText(m->DataWindow());
    }
}

TEST(MultiPoly, TakesTheIncomingMaskOnce) {
    // The incoming mask: a rectangle at level 0.5, so a second merge of it would show (0.5 over 0.5 gives 0.75).
    const Square a{60, 50, 80};
    for (const bool withLayer : {false, true}) {
        SCOPED_TRACE(withLayer ? "one layer over it" : "no layers: handed on unchanged");
        Rig rig;
        Operator *rect = rig.doc->AddTool(OvID("RectangleMask"), "Rect1");
        ASSERT_TRUE(rect);
        ts::SetNumbers(rect, {{"Level", 0.5}, {"Width", 0.25}, {"Height", 0.25}});
        ts::SetPoint(rect, "Center", 0.75, 0.5);
        ASSERT_TRUE(rig.mask->FindInput("EffectMask")->ConnectTo(rect->FindMainOutput()));
        if (withLayer) SetLayers(rig, {{a}});
        const Ref<Image> below = ts::EvalImage(rect), m = rig.Render();
        ASSERT_TRUE(below && m) << ts::ConsoleText(*rig.doc);
        if (!withLayer) {
            EXPECT_EQ(m->DataWindow(), below->DataWindow());
        }
        ExpectMask(*m, [&](int x, int y) {
            return withLayer ? Expected({{a}}, x, y, below->GetFlt(x, y).A) : below->GetFlt(x, y).A;
        });
    }
}

TEST(MultiPoly, BSplineLayerDrawsAsTheBSplineTool) {
    const Square a{30, 30, 40};
    Ref<BSplinePolyLine> ring = MakeRef<BSplinePolyLine>();
    ring->closed = true;
    for (const auto &[x, y] : std::vector<std::pair<int, int>>{{120, 40}, {220, 60}, {200, 160}, {130, 140}}) {
        PolyPoint p;
        p.x = double(x) / W - 0.5, p.y = double(y) / H - 0.5;
        ring->points.push_back(p);
    }
    ts::MaskRig single("BSplineMask");
    ASSERT_TRUE(single.mask->FindInput("Polyline")->SetValue(ring));
    const Ref<Image> alone = single.Render();
    ASSERT_TRUE(alone);
    Rig rig;
    SetLayers(rig, {{a}});
    const int n = rig.Add(true);
    EXPECT_EQ(rig.Own("PolyMaskName", n)->Constant()->ToScript().AsText(), "BSpline 2");
    ASSERT_TRUE(rig.In(n, "Polyline")->SetValue(ring));
    EXPECT_FALSE(rig.In(1, "Polyline")->SetValue(ring)) << "a Bezier layer takes no B-spline line";
    const Ref<Image> m = rig.Render();
    ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
    // The square and the curve do not meet: each pixel is the one or the other.
    ExpectMask(*m, [&](int x, int y) { return a.Holds(x, y) ? 1.0 : alone->GetFlt(x, y).A; });
    EXPECT_GT(ts::MaskRig::Area(*alone), 5000);
}

TEST(MultiPoly, DocumentsKeepLayersNamesOrderAndAnimation) {
    Rig rig;
    SetLayers(rig, {{{40, 40, 50}}});
    const int spline = rig.Add(true), third = rig.Add();
    ASSERT_TRUE(rig.Own("PolyMaskName", 1)->SetValue(MakeRef<Text>("Face")));
    AnimCurve moving;
    moving.SetKey(0, LineOf({40, 40, 50}));
    moving.SetKey(10, LineOf({140, 90, 60}));
    ASSERT_TRUE(rig.In(1, "Polyline")->SetCurve(moving));
    ASSERT_TRUE(rig.In(spline, "Polyline")->SetValue(LineOf<BSplinePolyLine>({150, 30, 60})));
    ASSERT_TRUE(rig.In(third, "Polyline")->SetValue(LineOf({20, 120, 40})));
    ASSERT_TRUE(rig.In(third, "SoftEdge")->SetValue(MakeRef<Number>(0.02)));
    rig.SetOrder({third, 1, spline});
    const std::string saved = SaveDocument(*rig.doc);
    for (const char *text : {"BSplineLayers = { 2 }", "PolyOrder = { 3, 1, 2 }", "PolyMaskName1 = \"Face\"",
                             "[\"PolyMask1.Polyline\"] = Curve", "BSplinePolyline"})
        EXPECT_NE(saved.find(text), std::string::npos) << text << " in\n" << saved;

    Ref<OrvaneDoc> loaded = MakeRef<OrvaneDoc>();
    const DocumentLoadResult r = LoadDocument(saved, *loaded);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_EQ(SaveDocument(*loaded), saved);
    Operator *again = loaded->FindTool(rig.mask->Name());
    ASSERT_TRUE(again);
    EXPECT_TRUE(again->FindInput("PolyMask1.Polyline")->IsAnimated());
    EXPECT_EQ(again->FindInput("PolyMaskName2")->Constant()->ToScript().AsText(), "BSpline 2");
    EvalOptions opt;
    opt.useCache = false;
    for (const double time : {0.0, 4.5, 10.0}) {
        const Ref<Image> before = ts::EvalImage(rig.mask, time, opt), after = ts::EvalImage(again, time, opt);
        ASSERT_TRUE(before && after) << ts::ConsoleText(*loaded);
        EXPECT_EQ(before->DataWindow(), after->DataWindow()) << time;
        ExpectMask(*after, [&](int x, int y) { return before->GetFlt(x, y).A; });
    }
}

TEST(MultiPoly, DeleteTakesALayerOutAndResetRestoresIt) {
    const Square a{60, 50, 80}, b{100, 90, 70};
    Rig rig;
    SetLayers(rig, {{a}, {b, PaintSubtract, 0.5}});
    ASSERT_TRUE(rig.Own("PolyMaskName", 2)->SetValue(MakeRef<Text>("Cut")));
    ASSERT_TRUE(rig.Own("PolyMaskReset", 2)->SetValue(MakeRef<Number>(1)));
    for (Input *in : {rig.In(2, "Polyline"), rig.In(2, "PaintMode"), rig.In(2, "Level"), rig.Own("PolyMaskEnabled", 2)})
        EXPECT_TRUE(in->IsDefault()) << in->ID().Text();
    EXPECT_EQ(rig.Own("PolyMaskName", 2)->Constant()->ToScript().AsText(), "Cut") << "the name stays";

    ASSERT_TRUE(rig.In(2, "Polyline")->SetValue(LineOf(b)));
    ASSERT_TRUE(rig.Own("PolyMaskDelete", 1)->SetValue(MakeRef<Number>(1)));
    EXPECT_EQ(rig.Order(), std::vector<int>{2});
    EXPECT_EQ(rig.Layers(), 1u);
    for (const char *id : {"PolyMask1.Polyline", "PolyMask1.Level", "PolyMaskName1", "PolyMaskEnabled1",
                           "PolyMaskDelete1", "PolyMaskReset1"})
        EXPECT_FALSE(rig.mask->FindInput(id)) << id;
    for (size_t i = 0; i < rig.mask->Inputs().size(); ++i) ASSERT_EQ(rig.mask->Inputs()[i]->Index(), int(i));
    for (const ControlNest &n : rig.mask->Nests()) EXPECT_LE(n.endInput, int(rig.mask->Inputs().size())) << n.id.Text();
    EXPECT_EQ(SaveDocument(*rig.doc).find("PolyMask1"), std::string::npos);
    const Ref<Image> m = rig.Render();
    ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
    ExpectMask(*m, [&](int x, int y) { return Expected({{b}}, x, y, 0.0); });
    EXPECT_EQ(rig.Add(), 3) << "IDs are not used twice";
}

TEST(MultiPoly, ALayerWithoutItsImageSaysSoAndDropsOut) {
    // Over a small incoming mask (the stack's start, so the tool makes no image of its own), a small layer fits
    // under the memory limit and a big one (182 x 182 floats) does not.
    const Square small{20, 20, 10}, big{10, 10, 180};
    Rig rig;
    Operator *rect = rig.doc->AddTool(OvID("RectangleMask"), "Rect1");
    ASSERT_TRUE(rect);
    ts::SetNumbers(rect, {{"Width", 0.05}, {"Height", 0.05}});
    ASSERT_TRUE(rig.mask->FindInput("EffectMask")->ConnectTo(rect->FindMainOutput()));
    const Ref<Image> below = ts::EvalImage(rect);
    ASSERT_TRUE(below);
    SetLayers(rig, {{small}, {big}});
    struct Restore {
        size_t pool = PixelPoolLimit();
        ~Restore() {
            SetPixelMemoryLimit(0);
            SetPixelPoolLimit(pool);
        }
    } restore;
    SetPixelPoolLimit(0);
    SetPixelMemoryLimit(PixelMemoryInUse() + (size_t(64) << 10));
    const Ref<Image> m = rig.Render();
    SetPixelMemoryLimit(0);
    ASSERT_TRUE(m) << ts::ConsoleText(*rig.doc);
    const std::string line = rig.mask->Name() + " cannot get mask image at time 0\n";
    EXPECT_NE(ts::ConsoleText(*rig.doc).find(line), std::string::npos) << ts::ConsoleText(*rig.doc);
    ExpectMask(*m, [&](int x, int y) { return Expected({{small}}, x, y, below->GetFlt(x, y).A); });
}

} // namespace
} // namespace Orvane::MultiPolyTest
