// The tools that act on whole shape trees (sBoolean, sMerge, sTransform,
// sChangeStyle) and the tree's sharing rules: boolean areas against closed
// forms, node styles in "Keep", drawing order, transforms worked out here,
// per-shape variance, and nodes that pass untouched being the same objects.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/shape/ShapeOperator.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace {

namespace T = Orvane::Test;
constexpr double kPi = std::numbers::pi;

/// A tool that hands on a fixed tree.
class TreeSource : public ThreadedOperator {
public:
    TreeSource(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
        out_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_ShapeTree}, {LinkMain, 1}});
    }
    void Process(Request *req) override { req->SetOutputData(out_, tree.Get()); }
    Ref<ShapeTree> tree = MakeRef<ShapeTree>();

private:
    Output *out_;
};

struct TreeSourceClass {
    OvID id =
        T::RegisterTestTool("ShapeTreeSource", &T::MakeTool<TreeSource>,
                            {{RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)}});
};

Ref<Shape> Circle(double cx, double cy, double r, int n = 4096) {
    Ref<Shape> s = MakeRef<Shape>();
    for (int i = 0; i < n; ++i) {
        const double a = 2 * kPi * i / n;
        i ? s->LineTo(cx + r * std::cos(a), cy + r * std::sin(a)) : s->MoveTo(cx + r, cy);
    }
    s->Close();
    return s;
}

Ref<Shape> Box(double x0, double y0, double x1, double y1) {
    Ref<Shape> s = MakeRef<Shape>();
    s->MoveTo(x0, y0), s->LineTo(x1, y0), s->LineTo(x1, y1), s->LineTo(x0, y1), s->Close();
    return s;
}

Ref<ShapeNode> Node(Ref<Shape> shape, float red = 1.f) {
    Ref<ShapeNode> n = MakeRef<ShapeNode>();
    n->SetShape(std::move(shape));
    ShapeStyle st;
    st.fillColor[0] = red;
    n->SetStyle(st);
    const ImgRectF b = n->Bounds();
    n->SetAxis(0.5 * (b.x0 + b.x1), 0.5 * (b.y0 + b.y1));
    return n;
}

/// The area a tree fills (every node's shape, non-zero rule).
double Area(const ShapeTree &tree) {
    ClipPaths paths;
    ShapeOperator::AddShapeUnionToPaths(tree, paths, 1e-4, true);
    return FilledArea(paths);
}

class ShapeTools : public ::testing::Test {
protected:
    static void SetUpTestSuite() { T::LoadOperators(); }
    TreeSource *Source(const char *name, std::initializer_list<Ref<ShapeNode>> nodes) {
        auto *s = dynamic_cast<TreeSource *>(doc.AddTool(T::Once<TreeSourceClass>().id, name));
        for (const Ref<ShapeNode> &n : nodes) s->tree->Root().AppendChild(n);
        return s;
    }
    Operator *Tool(const char *cls, const char *name, std::initializer_list<Operator *> inputs) {
        Operator *op = doc.AddTool(OvID(cls), name);
        int i = 1;
        for (Operator *in : inputs) {
            Input *link = op->FindInput(("Input" + std::to_string(i++)).c_str());
            if (!link) link = op->FindInput("Input");
            EXPECT_TRUE(link && link->ConnectTo(in->FindMainOutput())) << cls;
        }
        return op;
    }
    Ref<ShapeTree> Eval(Operator *op) {
        EvalOptions o;
        o.useCache = false;
        Ref<Parameter> v = Evaluate(op->FindMainOutput(), 0.0, o);
        return Ref<ShapeTree>(dynamic_cast<ShapeTree *>(v.Get()));
    }
    OrvaneDoc doc;
};

TEST_F(ShapeTools, BooleanAreasMatchClosedForms) {
    // Circles of radius 0.2 whose centres are 0.2 apart: the lens between them is 2 r^2 acos(d / 2r) - d/2
    // sqrt(4 r^2 - d^2). Rectangles of 0.12 and 0.16 overlapping in 0.04.
    const double r = 0.2, d = 0.2, disc = kPi * r * r;
    const double lens = 2 * r * r * std::acos(d / (2 * r)) - 0.5 * d * std::sqrt(4 * r * r - d * d);
    struct Pair {
        Ref<Shape> a, b;
        double areaA, areaB, common;
    } pairs[] = {{Circle(0.4, 0.5, r), Circle(0.6, 0.5, r), disc, disc, lens},
                 {Box(0.1, 0.1, 0.5, 0.4), Box(0.3, 0.2, 0.7, 0.6), 0.12, 0.16, 0.04}};
    for (const Pair &p : pairs) {
        TreeSource *a = Source("A", {Node(p.a)}), *b = Source("B", {Node(p.b)});
        Operator *op = Tool("sBoolean", "Bool", {a, b});
        const struct {
            const char *operation;
            double expected;
        } cases[] = {{"Intersection", p.common},
                     {"Union", p.areaA + p.areaB - p.common},
                     {"Subtract", p.areaA - p.common},
                     {"Xor", p.areaA + p.areaB - 2 * p.common}};
        for (const char *mode : {"Replace", "Keep"})
            for (const auto &c : cases) {
                T::SetID(op, "Operation", c.operation);
                T::SetID(op, "StyleMode", mode);
                const Ref<ShapeTree> out = Eval(op);
                ASSERT_TRUE(out) << c.operation << T::ConsoleText(doc);
                // A 4096-gon holds 1 - 4e-7 of its circle; the clipper's grid is 2^-24.
                EXPECT_NEAR(Area(*out), c.expected, 2e-6) << c.operation << " " << mode << " " << p.areaA;
            }
        for (const char *t : {"A", "B", "Bool"}) doc.RemoveTool(t);
    }
}

TEST_F(ShapeTools, KeepModeClipsNodeByNodeAndKeepsStyles) {
    // Input1: a red square left and a green square right; Input2: a disc over the left square only.
    Ref<ShapeNode> left = Node(Box(0.1, 0.1, 0.3, 0.3), 1.f), right = Node(Box(0.6, 0.1, 0.8, 0.3), 0.f);
    TreeSource *a = Source("A", {left, right}), *b = Source("B", {Node(Circle(0.3, 0.3, 0.1))});
    Operator *op = Tool("sBoolean", "Bool", {a, b});
    T::SetID(op, "StyleMode", "Keep");
    T::SetID(op, "Operation", "Subtract");
    Ref<ShapeTree> out = Eval(op);
    ASSERT_TRUE(out && out->NodeCount() == 2);
    EXPECT_EQ(out->Root().Children()[0]->Style().fillColor[0], 1.f);
    EXPECT_NEAR(Area(*out), 0.08 - kPi * 0.01 / 4, 1e-6);    // a quarter disc out of the left square
    EXPECT_EQ(out->Root().Children()[1].Get(), right.Get()); // met nothing: the same node
    T::SetID(op, "Operation", "Intersection");
    out = Eval(op);
    ASSERT_TRUE(out && out->NodeCount() == 1);
    EXPECT_NEAR(Area(*out), kPi * 0.01 / 4, 1e-6);

    // Xor without overlap gives both sides; a tree less itself is empty.
    TreeSource *far = Source("Far", {Node(Box(0.1, 0.6, 0.2, 0.7))});
    ASSERT_TRUE(op->FindInput("Input2")->ConnectTo(far->FindMainOutput()));
    T::SetID(op, "Operation", "Xor");
    out = Eval(op);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->NodeCount(), 3);
    EXPECT_NEAR(Area(*out), 0.08 + 0.01, 1e-7); // corners rounded onto the 2^-24 grid
    ASSERT_TRUE(op->FindInput("Input2")->ConnectTo(a->FindMainOutput()));
    T::SetID(op, "Operation", "Subtract");
    out = Eval(op);
    ASSERT_TRUE(out);
    EXPECT_EQ(out->NodeCount(), 0);

    // Without Input2, "Replace" hands Input1 on restyled, its shapes shared.
    op->FindInput("Input2")->ResetValue();
    T::SetID(op, "StyleMode", "Replace");
    T::SetNumber(op, "FillRed", 0.25);
    out = Eval(op);
    ASSERT_TRUE(out && out->NodeCount() == 2);
    for (int i = 0; i < 2; ++i) {
        EXPECT_EQ(out->Root().Children()[i]->Style().fillColor[0], 0.25f);
        EXPECT_EQ(out->Root().Children()[i]->GetShape(), a->tree->Root().Children()[i]->GetShape());
    }
}

TEST_F(ShapeTools, MergeDrawsInInputOrderWithoutCopies) {
    Ref<ShapeNode> n1 = Node(Box(0, 0, 0.1, 0.1)), n2 = Node(Box(0.2, 0, 0.3, 0.1)), n3 = Node(Box(0.8, 0.4, 0.9, 0.5));
    TreeSource *a = Source("A", {n1, n2}), *b = Source("B", {n3});
    Operator *merge = doc.AddTool(OvID("sMerge"), "Merge");
    EXPECT_EQ(Eval(merge)->NodeCount(), 0); // no inputs: an empty tree
    ASSERT_TRUE(merge->FindInput("Input1")->ConnectTo(a->FindMainOutput()));
    ASSERT_TRUE(merge->FindInput("Input2") && merge->FindInput("Input2")->ConnectTo(b->FindMainOutput()));
    ASSERT_TRUE(merge->FindInput("Input3")); // always one free input
    // Through a second merge too: the same node objects, in order.
    Operator *again = doc.AddTool(OvID("sMerge"), "Again");
    ASSERT_TRUE(again->FindInput("Input1")->ConnectTo(merge->FindMainOutput()));
    Ref<ShapeTree> out = Eval(again);
    ASSERT_TRUE(out);
    const std::vector<ShapeNode *> want{n1.Get(), n2.Get(), n3.Get()};
    ASSERT_EQ(out->Root().Children().size(), want.size());
    for (size_t i = 0; i < want.size(); ++i) EXPECT_EQ(out->Root().Children()[i].Get(), want[i]) << i;
    // A document keeps the links, the free input opening again as they are read back.
    Operator *c = Source("C", {});
    ASSERT_TRUE(merge->FindInput("Input3")->ConnectTo(c->FindMainOutput()));
    OrvaneDoc loaded;
    ASSERT_TRUE(LoadDocument(SaveDocument(doc), loaded).ok);
    Operator *back = loaded.FindTool("Merge");
    ASSERT_TRUE(back && back->FindInput("Input4"));
    for (const char *id : {"Input1", "Input2", "Input3"}) EXPECT_TRUE(back->FindInput(id)->Link()) << id;
    // Override Axis: every node turns about the centre of the whole (0.45, 0.25); shapes still shared.
    T::SetNumber(merge, "OverrideAxis", 1);
    out = Eval(merge);
    ASSERT_TRUE(out);
    for (size_t i = 0; i < want.size(); ++i) {
        EXPECT_EQ(std::pair(out->Root().Children()[i]->AxisX(), out->Root().Children()[i]->AxisY()),
                  std::pair(0.45, 0.25));
        EXPECT_EQ(out->Root().Children()[i]->GetShape(), want[i]->GetShape());
    }
}

TEST_F(ShapeTools, TransformTurnsAboutThePivotAndVariesPerCopy) {
    Ref<ShapeNode> first = Node(Box(0.2, 0.2, 0.4, 0.3)), second = Node(Box(0.2, 0.2, 0.4, 0.3));
    second->SetCopy(1, 77);
    TreeSource *src = Source("A", {first, second});
    Operator *xf = Tool("sTransform", "Xf", {src});
    T::SetNumbers(xf, {{"XOffset", 0.05}, {"XSize", 2}, {"ZRotation", 90}, {"XPivot", 0.1}, {"XOffsetStep", 0.1}});
    Ref<ShapeTree> out = Eval(xf);
    ASSERT_TRUE(out && out->NodeCount() == 2);
    // Worked here: pivot P = axis (0.3, 0.25) + (0.1, 0); p' = P + offset + R90 (2 (px - Px), py - Py).
    for (int copy = 0; copy < 2; ++copy) {
        const Shape &moved = *out->Root().Children()[copy]->GetShape();
        const Shape &orig = *src->tree->Root().Children()[copy]->GetShape();
        const double px = 0.4, py = 0.25, ox = 0.05 + 0.1 * copy;
        for (size_t i = 0; i < orig.SubPaths()[0].points.size(); ++i) {
            const auto &p = orig.SubPaths()[0].points[i], &q = moved.SubPaths()[0].points[i];
            EXPECT_NEAR(q.x, px + ox - (p.y - py), 1e-12) << copy;
            EXPECT_NEAR(q.y, py + 2 * (p.x - px), 1e-12) << copy;
        }
        // Transform Axis (on by default): the axis went with the shape.
        EXPECT_NEAR(out->Root().Children()[copy]->AxisX(), px + ox, 1e-12);
        EXPECT_NEAR(out->Root().Children()[copy]->AxisY(), py - 0.2, 1e-12);
    }
    T::SetNumber(xf, "TransformAxis", 0);
    EXPECT_DOUBLE_EQ(Eval(xf)->Root().Children()[0]->AxisX(), 0.3);

    // Random: within the amount, the same for the same seed, another for another seed.
    T::SetNumbers(xf, {{"XOffsetStep", 0}, {"XOffset", 0}, {"XSize", 1}, {"ZRotation", 0}, {"XOffsetRandom", 0.1}});
    const auto shiftOf = [&](uint32_t seed) {
        second->SetCopy(1, seed);
        return Eval(xf)->Root().Children()[1]->GetShape()->Bounds().x0 - 0.2;
    };
    const double s1 = shiftOf(5), s2 = shiftOf(5), s3 = shiftOf(6);
    EXPECT_EQ(s1, s2);
    EXPECT_NE(s1, s3);
    EXPECT_LE(std::max(std::abs(s1), std::abs(s3)), 0.1);

    // A size of 0 flattens the shape, without an error.
    T::SetNumbers(xf, {{"XOffsetRandom", 0}, {"XSize", 0}});
    out = Eval(xf);
    ASSERT_TRUE(out && out->NodeCount() == 2) << T::ConsoleText(doc);
    EXPECT_NEAR(Area(*out), 0.0, 1e-12);
}

TEST_F(ShapeTools, ChangeStyleRestylesAndTreesCompareByContent) {
    TreeSource *src = Source("A", {Node(Box(0, 0, 1, 1)), Node(Box(0.2, 0.2, 0.4, 0.4))});
    Operator *cs = Tool("sChangeStyle", "Style", {src});
    T::SetNumbers(cs, {{"Line", 1}, {"LineWidth", 0.02}, {"OpacityStep", -0.25}});
    const Ref<ShapeTree> out = Eval(cs);
    ASSERT_TRUE(out);
    EXPECT_TRUE(out->Root().Children()[0]->Style().line);
    EXPECT_EQ(out->Root().Children()[0]->Style().lineWidth, 0.02);
    EXPECT_EQ(out->Root().Children()[0]->GetShape(), src->tree->Root().Children()[0]->GetShape());
    // Both nodes are copy 0: the step changes nothing; the style's reach is half the miter-limited width.
    EXPECT_EQ(out->Root().Children()[1]->Style().opacity, 1.0);
    EXPECT_NEAR(out->Root().Children()[0]->Style().Reach(), 0.01 * 4, 1e-15);
    // Equal content compares equal and hashes alike; other geometry does not.
    ShapeTree same, other;
    same.Root().AppendChild(Node(Box(0, 0, 1, 1)));
    same.Root().AppendChild(Node(Box(0.2, 0.2, 0.4, 0.4)));
    other.Root().AppendChild(Node(Box(0, 0, 1, 1)));
    EXPECT_TRUE(same.Equals(*src->tree));
    EXPECT_EQ(same.Hash(), src->tree->Hash());
    EXPECT_FALSE(other.Equals(*src->tree));
    EXPECT_EQ(src->tree->ToScript().Find("Nodes")->AsNumber(), 2);
}

} // namespace
} // namespace Orvane
