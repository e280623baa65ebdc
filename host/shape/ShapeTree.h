#pragma once
// The vector data that flows between shape tools: a tree of ShapeNodes, each
// holding a Shape, a ShapeStyle and its bounds, carried on links as a
// ShapeTree (a Parameter of data type ShapeTree).
//
// Coordinates are shape units: X from 0 to 1 across the frame, Y from 0 to
// the frame's aspect (height x pixel aspect Y over width x pixel aspect X),
// so one unit is the same length on both axes.
//
// Sharing. Nodes are reference counted and never changed once they are in a
// tree a tool has handed on: a tool that alters a node makes a new one
// (ShapeNode(from, flags)) and keeps the children it does not touch by
// reference, so a chain of tools that leaves a node alone costs no copy.
// A tree is built by the one tool that makes it, then published.
//
// The style fields, the axis and the copy number are in docs/SHAPES.md.
//
// Thread safety: a node or tree is built by one thread; once published it is
// read-only and may be read from any number of threads.
#include <cstdint>
#include <vector>

#include "host/flow/Parameter.h"
#include "host/image/Rect.h"
#include "host/shape/Shape.h"

namespace Orvane {

class Request;

/// How a node is drawn.
struct ORVANE_API ShapeStyle {
    bool fill = true;                           ///< fill the shape (non-zero rule)
    bool line = false;                          ///< stroke its outline
    float fillColor[4] = {1.f, 1.f, 1.f, 1.f};  ///< RGBA, not premultiplied
    float lineColor[4] = {0.f, 0.f, 0.f, 1.f};  ///< RGBA, not premultiplied
    double opacity = 1.0;                       ///< multiplies both alphas
    double lineWidth = 0.005;                   ///< shape units (fractions of the frame width)
    int join = ShapeJoinMiter;                  ///< ShapeJoinKind
    int cap = ShapeCapFlat;                     ///< ShapeCapKind
    double miterLimit = ShapeDefaultMiterLimit; ///< miter length over line width

    /// Whether nodes with this style and `other` can be drawn in one pass, their shapes merged: the same fill and
    /// line choices, colours, opacity and (with a line) width, join, cap and limit. ShapeCombineFillOnly (Tags.h)
    /// true compares only what the fill needs.
    bool CanCombine(const ShapeStyle &other, const TagList &tags = TagList()) const;
    /// How far the drawing reaches beyond the shape: half the line width with a line (times the miter limit
    /// for miter joins), else 0.
    double Reach() const;
    bool operator==(const ShapeStyle &) const = default;
};

class ORVANE_API ShapeNode : public RefObject {
public:
    /// What ShapeNode(from, flags) takes over.
    enum CopyFlags : unsigned {
        CopyShape = 1u << 0,    ///< the shape (by reference) and the bounds
        CopyStyle = 1u << 1,    ///< the style
        CopyChildren = 1u << 2, ///< the children (by reference)
        CopyState = 1u << 3,    ///< the axis, the copy number and the seed
        CopyAll = CopyShape | CopyStyle | CopyChildren | CopyState,
    };

    ShapeNode() = default;
    /// A new node with what `flags` names taken from `from` (may be null: an empty node).
    ShapeNode(const ShapeNode *from, unsigned flags);

    // ---- building (before the node is published) ----
    void AppendChild(Ref<ShapeNode> child);
    /// Sets the shape (may be null) and recomputes the bounds.
    void SetShape(Ref<const Shape> shape);
    void SetStyle(const ShapeStyle &style);
    /// The point the node turns and scales about by default (its centre, for generated shapes).
    void SetAxis(double x, double y) { axisX_ = x, axisY_ = y; }
    /// The node's place in a sequence of copies and its own random seed (what variance reads).
    void SetCopy(int index, uint32_t seed) { copyIndex_ = index, seed_ = seed; }

    // ---- reading ----
    const std::vector<Ref<ShapeNode>> &Children() const { return children_; }
    /// The shape; null for a group node.
    const Shape *GetShape() const { return shape_.Get(); }
    Ref<const Shape> ShapeRef() const { return shape_; }
    const ShapeStyle &Style() const { return style_; }
    /// The box of the shape's points (control points included), without the style's reach; empty without a shape.
    const ImgRectF &Bounds() const { return bounds_; }
    /// The bounds of this node and everything below it.
    ImgRectF TreeBounds() const;
    double AxisX() const { return axisX_; }
    double AxisY() const { return axisY_; }
    int CopyIndex() const { return copyIndex_; }
    uint32_t Seed() const { return seed_; }
    /// This node and its descendants.
    int CountNodes() const;

    size_t SizeOf() const override;

private:
    std::vector<Ref<ShapeNode>> children_;
    Ref<const Shape> shape_;
    ShapeStyle style_;
    ImgRectF bounds_;
    double axisX_ = 0.5, axisY_ = 0.5;
    int copyIndex_ = 0;
    uint32_t seed_ = 0;
};

class ORVANE_API ShapeTree : public Parameter {
public:
    /// The tessellation base when no reference image is known: tools flatten curves as for a frame
    /// 4 x s_TessBase pixels wide.
    static constexpr double s_TessBase = 1024.0;

    /// An empty tree (its root has no shape and no children). `req`: the request it is made for (may be null).
    explicit ShapeTree(Request *req = nullptr);

    /// The root: a group node. Build under it before publishing the tree.
    ShapeNode &Root() { return *root_; }
    const ShapeNode &Root() const { return *root_; }
    /// Adds `other`'s top nodes to this root, by reference.
    void Append(const ShapeTree &other);
    /// Nodes below the root.
    int NodeCount() const { return root_->CountNodes() - 1; }
    ImgRectF Bounds() const { return root_->TreeBounds(); }
    /// The distinct styles of the nodes that draw (have a shape), in drawing order.
    std::vector<ShapeStyle> Styles() const;

    OvID DataType() const override;
    /// A summary (nodes, bounds, the styles in drawing order); trees are not saved in documents.
    ScriptVal ToScript() const override;
    /// The same nodes (identity of the shared nodes, not their geometry).
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    /// A tree sharing this one's nodes.
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override;

private:
    Ref<ShapeNode> root_;
};

} // namespace Orvane
