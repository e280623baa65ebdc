#include "host/shape/ShapeTree.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"

namespace Orvane {

// ---- ShapeStyle ----

bool ShapeStyle::CanCombine(const ShapeStyle &o, const TagList &tags) const {
    auto sameColour = [](const float *a, const float *b) { return std::equal(a, a + 4, b); };
    if (fill != o.fill || opacity != o.opacity || (fill && !sameColour(fillColor, o.fillColor))) return false;
    if (tags.GetLong(ShapeCombineFillOnly, 0)) return true;
    return line == o.line && (!line || (sameColour(lineColor, o.lineColor) && lineWidth == o.lineWidth &&
                                        join == o.join && cap == o.cap && miterLimit == o.miterLimit));
}

double ShapeStyle::Reach() const {
    if (!line) return 0.0;
    const double half = 0.5 * std::abs(lineWidth);
    if (join == ShapeJoinMiter || join == ShapeJoinMiterClip) return half * std::max(1.0, miterLimit);
    // A square cap reaches half a width out along the path and half across: the diagonal.
    return cap == ShapeCapSquare ? half * std::sqrt(2.0) : half;
}

// ---- ShapeNode ----

ShapeNode::ShapeNode(const ShapeNode *from, unsigned flags) {
    if (!from) return;
    if (flags & CopyShape) shape_ = from->shape_, bounds_ = from->bounds_;
    if (flags & CopyStyle) style_ = from->style_;
    if (flags & CopyChildren) children_ = from->children_;
    if (flags & CopyState)
        axisX_ = from->axisX_, axisY_ = from->axisY_, copyIndex_ = from->copyIndex_, seed_ = from->seed_;
}

void ShapeNode::AppendChild(Ref<ShapeNode> child) {
    if (child) children_.push_back(std::move(child));
}

void ShapeNode::SetShape(Ref<const Shape> shape) {
    shape_ = std::move(shape);
    bounds_ = ImgRectF();
    if (!shape_) return;
    const ShapeBox b = shape_->Bounds();
    if (!b.IsEmpty()) bounds_ = ImgRectF(b.x0, b.y0, b.x1, b.y1);
}

void ShapeNode::SetStyle(const ShapeStyle &style) { style_ = style; }

ImgRectF ShapeNode::TreeBounds() const {
    ImgRectF r = bounds_;
    for (const Ref<ShapeNode> &c : children_) r |= c->TreeBounds();
    return r;
}

int ShapeNode::CountNodes() const {
    int n = 1;
    for (const Ref<ShapeNode> &c : children_) n += c->CountNodes();
    return n;
}

size_t ShapeNode::SizeOf() const {
    // Shared shapes and nodes count in every tree that holds them: an upper bound, as a cache wants.
    size_t n = sizeof(*this) + children_.capacity() * sizeof(Ref<ShapeNode>);
    if (shape_) n += shape_->SizeOf();
    for (const Ref<ShapeNode> &c : children_) n += c->SizeOf();
    return n;
}

// ---- ShapeTree ----

ShapeTree::ShapeTree(Request *) : root_(MakeRef<ShapeNode>()) {}

void ShapeTree::Append(const ShapeTree &other) {
    for (const Ref<ShapeNode> &c : other.root_->Children()) root_->AppendChild(c);
}

OvID ShapeTree::DataType() const { return CLSID_DataType_ShapeTree; }

namespace {

ScriptVal Colour(const float *c) {
    ScriptVal t = ScriptVal::Table();
    for (int i = 0; i < 4; ++i) t.Append(static_cast<double>(c[i]));
    return t;
}

ScriptVal StyleSummary(const ShapeStyle &s) {
    ScriptVal t = ScriptVal::Table();
    if (s.fill) t.Set("Fill", Colour(s.fillColor));
    if (s.line) {
        t.Set("Line", Colour(s.lineColor));
        t.Set("LineWidth", s.lineWidth);
    }
    if (s.opacity != 1.0) t.Set("Opacity", s.opacity);
    return t;
}

/// The distinct styles of the drawn nodes, in drawing order.
void CollectStyles(const ShapeNode &node, std::vector<ShapeStyle> &styles) {
    if (node.GetShape() && std::find(styles.begin(), styles.end(), node.Style()) == styles.end())
        styles.push_back(node.Style());
    for (const Ref<ShapeNode> &c : node.Children()) CollectStyles(*c, styles);
}

uint64_t HashStyle(const ShapeStyle &st, uint64_t h) {
    h = HashMix(h, (uint64_t(st.fill) << 1) | uint64_t(st.line));
    for (int i = 0; i < 4; ++i) h = HashMix(HashMix(h, HashDouble(st.fillColor[i])), HashDouble(st.lineColor[i]));
    for (double v : {st.opacity, st.lineWidth, st.miterLimit}) h = HashMix(h, HashDouble(v));
    return HashMix(h, (uint64_t(st.join) << 8) | uint64_t(st.cap));
}

uint64_t HashNode(const ShapeNode &node, uint64_t h) {
    if (const Shape *shape = node.GetShape())
        for (const Shape::SubPath &sp : shape->SubPaths()) {
            h = HashMix(h, sp.closed);
            for (const Shape::Vertex &v : sp.points)
                h = HashMix(HashMix(HashMix(h, HashDouble(v.x)), HashDouble(v.y)), v.control);
        }
    h = HashStyle(node.Style(), h);
    h = HashMix(HashMix(h, HashDouble(node.AxisX())), HashDouble(node.AxisY()));
    h = HashMix(HashMix(h, uint64_t(uint32_t(node.CopyIndex()))), node.Seed());
    h = HashMix(h, node.Children().size());
    for (const Ref<ShapeNode> &c : node.Children()) h = HashNode(*c, h);
    return h;
}

bool SameShape(const Shape *a, const Shape *b) {
    if (a == b) return true;
    if (!a || !b || a->SubPaths().size() != b->SubPaths().size()) return false;
    for (size_t k = 0; k < a->SubPaths().size(); ++k) {
        const Shape::SubPath &p = a->SubPaths()[k], &q = b->SubPaths()[k];
        if (p.closed != q.closed || p.points.size() != q.points.size()) return false;
        for (size_t i = 0; i < p.points.size(); ++i)
            if (p.points[i].x != q.points[i].x || p.points[i].y != q.points[i].y ||
                p.points[i].control != q.points[i].control)
                return false;
    }
    return true;
}

bool SameNodes(const ShapeNode &a, const ShapeNode &b) {
    if (&a == &b) return true;
    if (a.Children().size() != b.Children().size() || !(a.Style() == b.Style()) || a.AxisX() != b.AxisX() ||
        a.AxisY() != b.AxisY() || a.CopyIndex() != b.CopyIndex() || a.Seed() != b.Seed() ||
        !SameShape(a.GetShape(), b.GetShape()))
        return false;
    for (size_t i = 0; i < a.Children().size(); ++i)
        if (!SameNodes(*a.Children()[i], *b.Children()[i])) return false;
    return true;
}

} // namespace

ScriptVal ShapeTree::ToScript() const {
    ScriptVal t = ScriptVal::Table("ShapeTree");
    t.Set("Nodes", NodeCount());
    const ImgRectF b = Bounds();
    if (!b.IsEmpty()) {
        ScriptVal box = ScriptVal::Table();
        for (double v : {b.x0, b.y0, b.x1, b.y1}) box.Append(v);
        t.Set("Bounds", std::move(box));
    }
    ScriptVal list = ScriptVal::Table();
    for (const ShapeStyle &s : Styles()) list.Append(StyleSummary(s));
    t.Set("Styles", std::move(list));
    return t;
}

std::vector<ShapeStyle> ShapeTree::Styles() const {
    std::vector<ShapeStyle> styles;
    CollectStyles(*root_, styles);
    return styles;
}

bool ShapeTree::Equals(const Parameter &other) const {
    const auto *o = dynamic_cast<const ShapeTree *>(&other);
    return o && (o == this || SameNodes(*root_, *o->root_));
}

uint64_t ShapeTree::Hash() const { return HashNode(*root_, 0x5ea9e7ee); }

Ref<Parameter> ShapeTree::Copy() const {
    Ref<ShapeTree> t = MakeRef<ShapeTree>();
    t->Append(*this);
    return t;
}

size_t ShapeTree::SizeOf() const { return sizeof(*this) + root_->SizeOf(); }

} // namespace Orvane
