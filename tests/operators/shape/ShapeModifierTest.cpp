// The shape modifiers: outlines and offsets against their closed-form areas, copies where k offsets put them with
// their copy numbers and seeds, jitter reproducible by seed and bounded by its amounts, and nodes a tool leaves
// alone kept as the very same objects.
#include <cmath>
#include <numbers>
#include <set>
#include <vector>

#include "tests/operators/shape/ShapeToolRig.h"

namespace Orvane::shapetest {
namespace {

using std::numbers::pi;
using Modifiers = Rig;

TEST_F(Modifiers, OutlineAndExpandAreasAndUnchangedNodesKept) {
    // A w x h rectangle stroked by d, an s x s square grown by d; a tool that changes nothing keeps the very node.
    const double w = 0.4, h = 0.2, s = 0.3, d = 0.04;
    struct Case {
        const char *tool;
        std::vector<std::pair<const char *, double>> numbers;
        double area;
        bool kept = false;
    };
    const Case cases[] = {
        // Miter joins: the band between the rectangle grown and shrunk by d / 2.
        {"sOutline", {{"Width", d}, {"JoinStyle", 1}}, (w + d) * (h + d) - (w - d) * (h - d)},
        // Bevel joins cut each outer corner's triangle of legs d / 2.
        {"sOutline", {{"Width", d}, {"JoinStyle", 0}}, (w + d) * (h + d) - (w - d) * (h - d) - 4 * d * d / 8},
        {"sExpand", {{"Amount", d}, {"JoinStyle", 2}}, (s + 2 * d) * (s + 2 * d) - (4 - pi) * d * d},
        {"sExpand", {{"Amount", d}, {"JoinStyle", 1}}, (s + 2 * d) * (s + 2 * d)},
        {"sExpand", {{"Amount", -d}, {"JoinStyle", 2}}, (s - 2 * d) * (s - 2 * d)},
        {"sExpand", {{"Amount", -s}}, 0.0}, // shrunk past itself
        {"sExpand", {{"Amount", 0}}, s * s, true},
        {"sJitter", {{"XAmount", 0}, {"YAmount", 0}}, w * h, true},
    };
    for (const Case &c : cases) {
        const bool square = std::string(c.tool) == "sExpand";
        Operator *rect = Add("sRectangle", {{"Width", square ? s : w}, {"Height", square ? s : h}, {"FillRed", 0.3}});
        Operator *op = Chain(c.tool, rect, c.numbers);
        // Through the cache, the tool reads the very nodes `in` holds.
        const Ref<ShapeTree> in = Tree(rect, 0, 0, true), tree = Tree(op, 0, 0, true);
        ASSERT_EQ(tree->NodeCount(), 1) << c.tool;
        const ShapeNode &node = Top(*tree);
        // Round joins are flattened at the default tolerance (chords of 2 / 4096): within 1e-6 of the arcs.
        EXPECT_NEAR(node.GetShape() ? AreaOf(*node.GetShape()) : 0.0, c.area, 1e-6) << c.tool << c.numbers[0].second;
        EXPECT_FLOAT_EQ(node.Style().fillColor[0], 0.3f) << c.tool; // the style stays
        EXPECT_EQ(node.AxisX(), 0.5);
        EXPECT_EQ(&node == &Top(*in), c.kept) << c.tool;
    }
}

TEST_F(Modifiers, DuplicatePlacesCopyKAtKOffsets) {
    // A 0.1 square at (0.2, 0.5); copy k moved by k (0.1, 0.05), its width halved k times, turned k x 90 degrees
    // about its own centre (so the halved width lies along y for odd k).
    const int copies = 4;
    Operator *square = Add("sRectangle", {{"Width", 0.1}, {"Height", 0.1}});
    T::SetPoint(square, "Center", 0.2, 0.5);
    Operator *dup = Chain("sDuplicate", square,
                          {{"Copies", copies},
                           {"XOffset", 0.1},
                           {"YOffset", 0.05},
                           {"XSize", 0.5},
                           {"ZRotation", 90},
                           {"RandomSeed", 7}});
    const Ref<ShapeTree> in = Tree(square, 0, 0, true), tree = Tree(dup, 0, 0, true);
    ASSERT_EQ(tree->NodeCount(), copies);
    std::set<uint32_t> seeds;
    for (int k = 0; k < copies; ++k) {
        const ShapeNode &node = Top(*tree, size_t(k));
        EXPECT_EQ(node.CopyIndex(), k);
        seeds.insert(node.Seed());
        const ShapePoint mid = MiddleOf(node);
        EXPECT_NEAR(mid.x, 0.2 + 0.1 * k, 1e-15) << k;
        EXPECT_NEAR(mid.y, 0.5 + 0.05 * k, 1e-15) << k;
        EXPECT_NEAR(node.AxisX(), mid.x, 1e-15);
        EXPECT_NEAR(node.AxisY(), mid.y, 1e-15);
        const ShapeBox b = node.GetShape()->Bounds();
        const double along = 0.1 * std::pow(0.5, k);
        EXPECT_NEAR(b.x1 - b.x0, k % 2 ? 0.1 : along, 1e-15) << k;
        EXPECT_NEAR(b.y1 - b.y0, k % 2 ? along : 0.1, 1e-15) << k;
    }
    EXPECT_EQ(seeds.size(), size_t(copies));               // each copy its own seed
    EXPECT_EQ(Top(*tree).GetShape(), Top(*in).GetShape()); // copy 0 keeps the shape itself

    // A later tool's Step moves copy k by k steps: the copy numbers reach it.
    Operator *move = Chain("sTransform", dup, {{"YOffsetStep", 0.01}});
    const Ref<ShapeTree> moved = Tree(move);
    for (int k = 0; k < copies; ++k) EXPECT_NEAR(MiddleOf(Top(*moved, size_t(k))).y, 0.5 + 0.06 * k, 1e-15) << k;
}

TEST_F(Modifiers, JitterIsReproducibleBySeedAndBoundedByItsAmounts) {
    Operator *star = Add("sStar", {{"Points", 7}});
    Operator *dup = Chain("sDuplicate", star, {{"Copies", 2}, {"XOffset", 0}});
    const double ax = 0.02, ay = 0.005;
    const auto points = [&](double seed) {
        Operator *jitter = Chain("sJitter", dup, {{"XAmount", ax}, {"YAmount", ay}, {"RandomSeed", seed}});
        std::vector<std::vector<ShapePoint>> out;
        const Ref<ShapeTree> tree = Tree(jitter);
        for (const Ref<ShapeNode> &node : tree->Root().Children())
            out.push_back(OnCurve(node->GetShape()->SubPaths()[0]));
        return out;
    };
    const std::vector<ShapePoint> original = OnCurve(Top(*Tree(star)).GetShape()->SubPaths().at(0));
    const auto first = points(3), again = points(3), other = points(4);
    ASSERT_EQ(first.size(), 2u);
    EXPECT_EQ(first, again);
    EXPECT_NE(first, other);
    EXPECT_NE(first[0], first[1]); // copies draw their own moves
    double widest = 0;
    for (const auto &copy : first) {
        ASSERT_EQ(copy.size(), original.size());
        for (size_t i = 0; i < copy.size(); ++i) {
            EXPECT_LE(std::fabs(copy[i].x - original[i].x), ax);
            EXPECT_LE(std::fabs(copy[i].y - original[i].y), ay);
            widest = std::max(widest, std::fabs(copy[i].x - original[i].x));
        }
    }
    EXPECT_GT(widest, ax / 2); // 28 draws: all under half the amount would be a 1 in 2^28 chance
}

} // namespace
} // namespace Orvane::shapetest
