#pragma once
// A document of shape tools, their trees evaluated through the engine, and measures of the shapes taken
// independently of the tools: filled areas of finely flattened paths and the on-curve points.
#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "host/flow/Engine.h"
#include "host/shape/ShapeClip.h"
#include "host/shape/ShapeOperator.h"
#include "host/shape/ShapeTree.h"
#include "tests/support/TestSupport.h"

namespace Orvane::shapetest {

namespace T = Orvane::Test;

/// Steps of the flattening used to measure areas: a chord of 1e-4 lies within 1e-7 of a curve of radius >= 0.01.
constexpr double kMeasureStep = 1e-4;
/// What measuring an area may lose or gain: points rounded to the clipping grid (2^-24), curves cut into chords.
constexpr double kSlack = 2e-7;

struct Rig : ::testing::Test {
    static void SetUpTestSuite() { T::LoadOperators(); }

    Operator *Add(const char *cls, std::vector<std::pair<const char *, double>> numbers = {}) {
        Operator *op = doc.AddTool(OvID(cls), cls + std::to_string(++made));
        EXPECT_TRUE(op) << cls;
        if (op) T::SetNumbers(op, numbers);
        return op;
    }
    /// `tool` reading `from` on its shape input.
    Operator *Chain(const char *tool, Operator *from, std::vector<std::pair<const char *, double>> numbers = {}) {
        Operator *op = Add(tool, std::move(numbers));
        EXPECT_TRUE(op->FindInput("Input")->ConnectTo(from->FindMainOutput()));
        return op;
    }
    /// The tree `op` gives, for a reference frame of w x h pixels (none when w is 0); `cached`: through the
    /// document's cache, so that tools downstream read the very tree an earlier call gave.
    static Ref<ShapeTree> Tree(Operator *op, int w = 0, int h = 0, bool cached = false) {
        EvalOptions options;
        options.useCache = cached;
        if (w > 0) {
            ImageDomain roi(ImgRectI(0, 0, w, h));
            roi.frame = ImgRectI(0, 0, w, h);
            options.roi = roi;
        }
        Ref<Parameter> v = Evaluate(op->FindMainOutput(), 0.0, options);
        auto *tree = dynamic_cast<ShapeTree *>(v.Get());
        EXPECT_TRUE(tree) << op->Name();
        return Ref<ShapeTree>(tree);
    }
    static const ShapeNode &Top(const ShapeTree &tree, size_t i = 0) {
        EXPECT_LT(i, tree.Root().Children().size());
        return *tree.Root().Children().at(i);
    }

    OrvaneDoc doc;
    int made = 0;
};

/// The area a shape fills (non-zero rule).
inline double AreaOf(const Shape &shape) {
    ClipPaths paths;
    ShapeOperator::AddShapeToPaths(shape, paths, kMeasureStep, true);
    return FilledArea(paths);
}

/// The on-curve points of a sub-path.
inline std::vector<ShapePoint> OnCurve(const Shape::SubPath &sp) {
    std::vector<ShapePoint> out;
    for (const Shape::Vertex &v : sp.points)
        if (!v.control) out.push_back({v.x, v.y});
    return out;
}

/// The middle of a node's bounds.
inline ShapePoint MiddleOf(const ShapeNode &node) {
    const ShapeBox b = node.GetShape()->Bounds();
    return {(b.x0 + b.x1) / 2, (b.y0 + b.y1) / 2};
}

} // namespace Orvane::shapetest
