#pragma once
// What the shape modifiers share: the walk that replaces each shape of a
// tree, the join, cap and miter limit controls of the tools that stroke or
// offset, and the random seed control with its mixing.
//
// Thread safety: as ShapeOperator.
#include <cstdint>
#include <functional>

#include "host/shape/ShapeOperator.h"

namespace Orvane {

class ShapeModifier : public ShapeOperator {
public:
    ShapeModifier(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withStyle = false);

    /// The function that gives a node's new shape (the state points at the node); returning the node's own shape
    /// object means no change.
    using ShapeFunction = std::function<Ref<const Shape>(const ShapeNode &, const VarianceState &)>;
    /// `in` rebuilt into `out`: each node with a shape gets fn's shape and keeps its style, axis and copy number.
    /// A node without children whose shape comes back unchanged is kept by reference; a node with children is
    /// always new, since what lies below it may change.
    static void ReplaceShapes(Request *req, const ShapeTree &in, ShapeTree &out, const ShapeFunction &fn);

    /// Hands on the tree on `input` with ReplaceShapes' changes (an empty tree without one).
    void OutputReplaced(Request *req, const Input *input, const ShapeFunction &fn) const;

    /// A well-spread 32-bit mix of two numbers, for seeds derived from a seed control and a place in a tree.
    static uint32_t MixSeed(uint32_t a, uint32_t b);

protected:
    /// "Join" (Bevel, Miter, Round; default `def`), "Miter Limit", and with `withCap` "Cap" (Flat, Square, Round).
    void AddJoinInputs(int def, bool withCap);
    /// ShapeJoin, ShapeCap, ShapeMiterLimit and ShapeTolerance tags from those controls.
    TagList JoinTags(Request *req) const;
    /// "Random Seed" (an integer).
    void AddSeedInput();
    uint32_t SeedOf(Request *req) const;

private:
    Input *join_ = nullptr, *cap_ = nullptr, *miterLimit_ = nullptr, *seed_ = nullptr;
};

} // namespace Orvane
