#include "host/shape/ShapeClip.h"

#include "host/core/Tags.h"
#include "host/shape/ClipperUnits.h"

namespace Orvane {

namespace CL = ClipperLib;
using clipperunits::kScale;

struct ShapeClipper::Impl {
    CL::Clipper clipper;
};

namespace {

CL::Path ToClipper(const ClipPath &path) {
    CL::Path out;
    out.reserve(path.size());
    for (const ShapePoint &p : path) {
        const CL::IntPoint ip = clipperunits::ToInt(p.x, p.y);
        if (out.empty() || ip.X != out.back().X || ip.Y != out.back().Y) out.push_back(ip);
    }
    while (out.size() > 1 && out.back().X == out.front().X && out.back().Y == out.front().Y) out.pop_back();
    return out;
}

ClipPaths FromClipper(const CL::Paths &paths) {
    ClipPaths out;
    out.reserve(paths.size());
    for (const CL::Path &path : paths) {
        if (path.size() < 3) continue;
        ClipPath &p = out.emplace_back();
        p.reserve(path.size());
        for (const CL::IntPoint &ip : path) p.push_back({ip.X / kScale, ip.Y / kScale});
    }
    return out;
}

} // namespace

ShapeClipper::ShapeClipper() : impl_(std::make_unique<Impl>()) {}
ShapeClipper::~ShapeClipper() = default;

void ShapeClipper::AddPaths(const ClipPaths &paths, bool subject) {
    for (const ClipPath &path : paths) {
        const CL::Path p = ToClipper(path);
        if (p.size() >= 3) impl_->clipper.AddPath(p, subject ? CL::ptSubject : CL::ptClip, true);
    }
}

bool ShapeClipper::Execute(ClipOperation op, ClipPaths &result) {
    const CL::ClipType type = op == ClipOperation::Intersection ? CL::ctIntersection
                              : op == ClipOperation::Union      ? CL::ctUnion
                              : op == ClipOperation::Difference ? CL::ctDifference
                                                                : CL::ctXor;
    CL::Paths out;
    bool ok = false;
    try {
        ok = impl_->clipper.Execute(type, out, CL::pftNonZero, CL::pftNonZero);
    } catch (const CL::clipperException &) {
        ok = false;
    }
    result = ok ? FromClipper(out) : ClipPaths();
    return ok;
}

void ShapeClipper::Clear() { impl_->clipper.Clear(); }

void AppendShapePaths(const Shape &shape, ClipPaths &paths, double tolerance) {
    Ref<Shape> flat;
    const Shape *source = &shape;
    if (!shape.IsFlat()) {
        flat = shape.FlattenOfShapeTagList({{ShapeTolerance, tolerance}});
        source = flat.Get();
    }
    for (const Shape::SubPath &sp : source->SubPaths()) {
        if (sp.points.size() < 3) continue;
        ClipPath &p = paths.emplace_back();
        p.reserve(sp.points.size());
        for (const Shape::Vertex &v : sp.points) p.push_back({v.x, v.y});
    }
}

Ref<Shape> ShapeOfClipPaths(const ClipPaths &paths) {
    Ref<Shape> shape = MakeRef<Shape>();
    for (const ClipPath &path : paths) {
        if (path.size() < 3) continue;
        shape->MoveTo(path[0].x, path[0].y);
        for (size_t i = 1; i < path.size(); ++i) shape->LineTo(path[i].x, path[i].y);
        shape->Close();
    }
    return shape;
}

double FilledArea(const ClipPaths &paths) {
    // The union under the non-zero rule leaves outer contours anticlockwise and holes clockwise: their signed
    // areas add up to what is filled.
    ShapeClipper clipper;
    clipper.AddPaths(paths, true);
    ClipPaths clean;
    if (!clipper.Execute(ClipOperation::Union, clean)) return 0.0;
    double area = 0.0;
    for (const ClipPath &p : clean)
        for (size_t i = 0, j = p.size() - 1; i < p.size(); j = i++) area += p[j].x * p[i].y - p[i].x * p[j].y;
    return 0.5 * area;
}

} // namespace Orvane
