#pragma once
// ShapeOperator: the base of the shape tools, which take and give ShapeTrees
// (ShapeTree.h) rather than images. It owns what they share:
//
// - shape inputs (AddShapeInput) and the ShapeTree output;
// - the style controls of tools that style what they make (fill, line, their
//   colours, opacity, line width, join, cap, miter limit; page "Style"), read
//   per shape by GetStyle;
// - numbers that may differ from shape to shape (AddVarianceInputTagList):
//   each such input comes with a Step (added per copy number) and a Random
//   amount (a seeded draw per shape), read by VarianceInput::GetValue for the
//   shape a VarianceState points at;
// - ProcessTree, the walk that rebuilds a tree node by node and keeps by
//   reference what the tool does not change;
// - the polygon paths of the boolean adaptor (ShapeClip.h).
//
// docs/SHAPES.md describes the style fields and how variance works.
//
// Thread safety: construction and NotifyChanged on the main thread; Process
// on the tool's render thread. GetStyle, GetValue and ProcessTree only read
// the tool and may run on worker threads.
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

#include "host/core/MtRand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/shape/ShapeClip.h"
#include "host/shape/ShapeTree.h"

namespace Orvane {

/// Which shape of a sequence is current, for the variance inputs: made at the start of a tool's Process, then
/// pointed at each node in turn.
struct ORVANE_API VarianceState {
    explicit VarianceState(Request *request) : req(request) {}
    /// Takes the node's copy number and seed.
    void SetShape(const ShapeNode &node) { index = node.CopyIndex(), seed = node.Seed(); }

    Request *req;
    int index = 0;     ///< the shape's place in its sequence of copies (0: the original)
    uint32_t seed = 0; ///< the shape's own random seed
};

/// A number that may differ from shape to shape.
struct VarianceValue {
    double value = 0.0;
    operator double() const { return value; }
};

/// A number input with its per-shape parts: value + Step x copy number + Random x a draw in -1..1 that depends
/// on the shape's seed and this input alone.
class ORVANE_API VarianceInput {
public:
    VarianceInput(Input *value, Input *step, Input *random);
    VarianceValue GetValue(const VarianceState &state) const;
    Input *ValueInput() const { return value_; }

private:
    Input *value_, *step_, *random_;
    uint32_t salt_; ///< from the input's ID: inputs of one shape draw independently
};

class ORVANE_API ShapeOperator : public ThreadedOperator {
public:
    /// `withStyle`: the tool has the style controls (on page "Style", added after the tool's own inputs, which go
    /// on page "Controls"). `outputType`: what "Output" carries (an image for the renderer).
    ShapeOperator(const Registry *reg, const ScriptVal &args, const TagList &tags, bool withStyle,
                  OvID outputType = CLSID_DataType_ShapeTree);
    ~ShapeOperator() override;
    /// Adds the style controls after the tool's own inputs.
    void FinishConstruction() override;

    /// Passes the request's region (which carries the reference frame the trees are flattened for) to the shape
    /// inputs.
    void CheckRequest(Request *req) override;

    /// A ShapeTree input: "Input" for index 0, else "Input<index>" ("Input <index>"), main link `index` (or 1).
    /// Optional unless the tags say InputRequired.
    Input *AddShapeInput(int index, const TagList &tags = TagList());
    /// A number input (tags as AddInputTagList, LinkDataType Number implied) with "<id>Step" ("<name> Step")
    /// and "<id>Random" ("<name> Random") beside it, both 0 by default; owned by the tool.
    VarianceInput *AddVarianceInputTagList(const char *name, const char *id, const TagList &tags);
    /// The "Output" ShapeTree output (main); made by the constructor.
    Output *ShapeOutput() const { return output_; }

    /// The style the controls give for the current shape (the tool's default style without style controls).
    ShapeStyle GetStyle(const VarianceState &state) const;
    /// A random generator seeded with `seed` (MT19937).
    static MtRand CreateRNG(uint32_t seed) { return MtRand(seed); }

    /// Walks `in` depth first, children in order; for each node calls fn(node, parent in `out`), which returns
    /// the node to place (appended to that parent): the node itself keeps it and its subtree by reference (no
    /// descent); a new node is appended and the walk goes on into the original's children under it; null drops
    /// the node and its subtree. `out`'s root stands for `in`'s.
    static void ProcessTree(const ShapeTree &in, ShapeTree &out,
                            const std::function<Ref<ShapeNode>(const ShapeNode &, ShapeNode &)> &fn);

    /// The shape's sub-paths, closed and flattened to `tolerance`, into `paths`. `normalise`: first as the region
    /// the shape fills under the non-zero rule (outer contours anticlockwise, holes clockwise), so that paths of
    /// several shapes add up to their union whichever way each was drawn.
    static void AddShapeToPaths(const Shape &shape, ClipPaths &paths, double tolerance, bool normalise);
    /// The union of every shape of the tree into `paths`; `normalise` as AddShapeToPaths for each shape.
    static void AddShapeUnionToPaths(const ShapeTree &tree, ClipPaths &paths, double tolerance, bool normalise);
    /// A shape of the paths (closed straight contours).
    static Ref<Shape> AddPathsToShape(const ClipPaths &paths);

    /// The flattening tolerance for `req`: 2 / the reference image's width, else 2 / (4 x s_TessBase).
    static double TessellationTolerance(Request *req);

    /// Hands a finished tree to the output.
    void SetOutputTree(Request *req, Ref<ShapeTree> tree) const;
    /// The tree on `in` for `req`, or null.
    static const ShapeTree *GetInputTree(Request *req, const Input *in);

protected:
    Output *output_ = nullptr;

private:
    void AddStyleControls();

    struct StyleInputs;
    bool withStyle_;
    std::unique_ptr<StyleInputs> style_;
    std::vector<std::unique_ptr<VarianceInput>> variance_;
};

} // namespace Orvane
