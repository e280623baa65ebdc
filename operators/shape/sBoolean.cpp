#include "operators/shape/sBoolean.h"

#include <vector>

#include "host/core/Tags.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<sBoolean, ShapeOperator>
    s_Registration(OvID("sBoolean"), &CLSID_ShapeOperator,
                   {{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool},
                    {RegClassName, "sBoolean"},
                    {RegPath, "Tools/Shape/sBoolean"},
                    {RegName, "sBoolean"},
                    {RegCategory, "Shape"},
                    {RegAbbreviation, "sBol"},
                    {RegHelp, "Combines shapes by union, intersection or difference"},
                    {RegIcon, "Icons.Tools.Icons.sBoolean"},
                    {RegNoBlendControls, 1},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1}});

namespace {

constexpr const char *kOperations[] = {"Intersection", "Union", "Subtract", "Xor"};
constexpr ClipOperation kClipOf[] = {ClipOperation::Intersection, ClipOperation::Union, ClipOperation::Difference,
                                     ClipOperation::Xor};
enum Operation { OpIntersection, OpUnion, OpSubtract, OpXor };
constexpr const char *kStyleModes[] = {"Replace", "Keep"};

TagList ComboID(std::initializer_list<const char *> items, const char *def) {
    TagList t{
        {LinkDataType, CLSID_DataType_OvID}, {InputControl, CLSID_InputControl_ComboID}, {InputDefaultId, OvID(def)}};
    for (const char *item : items) {
        t.Add({ListAddItem, item});
        t.Add({ListItemId, OvID(item)});
    }
    return t;
}

/// The drawn nodes of a tree (those with a shape), in drawing order.
void Gather(const ShapeNode &node, std::vector<const ShapeNode *> &out) {
    if (node.GetShape()) out.push_back(&node);
    for (const Ref<ShapeNode> &c : node.Children()) Gather(*c, out);
}

} // namespace

sBoolean::sBoolean(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ShapeOperator(reg, args, tags, true) {
    operation_ =
        AddInputTagList("Operation", "Operation",
                        ComboID({kOperations[0], kOperations[1], kOperations[2], kOperations[3]}, "Intersection"));
    styleMode_ = AddInputTagList("Style Mode", "StyleMode", ComboID({kStyleModes[0], kStyleModes[1]}, "Replace"));
    input1_ = AddShapeInput(1, {{InputRequired, 1}});
    input2_ = AddShapeInput(2);
}

void sBoolean::Process(Request *req) {
    const double tolerance = TessellationTolerance(req);
    VarianceState state(req);
    const OvID opId = req->GetInputID(operation_, OvID(kOperations[0]));
    int op = OpIntersection;
    for (int i = 0; i < 4; ++i)
        if (opId == OvID(kOperations[i])) op = i;
    const bool keep = req->GetInputID(styleMode_, OvID(kStyleModes[0])) == OvID(kStyleModes[1]);
    const ShapeTree *a = GetInputTree(req, input1_), *b = GetInputTree(req, input2_);
    Ref<ShapeTree> out = MakeRef<ShapeTree>(req);
    const auto restyled = [&](const ShapeNode &node) {
        Ref<ShapeNode> copy =
            MakeRef<ShapeNode>(&node, ShapeNode::CopyShape | ShapeNode::CopyStyle | ShapeNode::CopyState);
        if (!keep) {
            state.SetShape(node);
            copy->SetStyle(GetStyle(state));
        }
        return copy;
    };

    if (!a || !b) {
        // One tree: handed on node by node, restyled under "Replace".
        if (const ShapeTree *one = a ? a : b)
            ProcessTree(*one, *out, [&](const ShapeNode &node, ShapeNode &) { return restyled(node); });
        return SetOutputTree(req, out);
    }

    if (keep && op != OpUnion) {
        const bool same = a == b || a->Equals(*b);
        if (same && (op == OpSubtract || op == OpXor)) return SetOutputTree(req, out);
        std::vector<const ShapeNode *> nodesA, nodesB;
        Gather(a->Root(), nodesA);
        Gather(b->Root(), nodesB);
        // Each job: one node clipped by the overlapping nodes of the other tree.
        struct Job {
            const ShapeNode *node;
            const std::vector<const ShapeNode *> *others;
            ClipOperation clip;
            Ref<ShapeNode> result;
        };
        std::vector<Job> jobs;
        const ClipOperation clip = op == OpIntersection ? ClipOperation::Intersection : ClipOperation::Difference;
        for (const ShapeNode *n : nodesA) jobs.push_back({n, &nodesB, clip, nullptr});
        if (op == OpXor)
            for (const ShapeNode *n : nodesB) jobs.push_back({n, &nodesA, clip, nullptr});
        DoMultiProcess(
            [&](int i) {
                Job &job = jobs[static_cast<size_t>(i)];
                ClipPaths subject, clipPaths;
                for (const ShapeNode *other : *job.others)
                    if (other->Bounds().Overlaps(job.node->Bounds()))
                        AddShapeToPaths(*other->GetShape(), clipPaths, tolerance, true);
                if (clipPaths.empty() && job.clip == ClipOperation::Difference) {
                    job.result = Ref<ShapeNode>(const_cast<ShapeNode *>(job.node)); // untouched: kept, not copied
                    return;
                }
                if (clipPaths.empty()) return; // an intersection with nothing
                AddShapeToPaths(*job.node->GetShape(), subject, tolerance, true);
                ShapeClipper clipper;
                clipper.AddPaths(subject, true);
                clipper.AddPaths(clipPaths, false);
                ClipPaths result;
                if (!clipper.Execute(job.clip, result) || result.empty()) return;
                job.result = MakeRef<ShapeNode>(job.node, ShapeNode::CopyStyle | ShapeNode::CopyState);
                job.result->SetShape(AddPathsToShape(result));
            },
            static_cast<int>(jobs.size()));
        for (Job &job : jobs)
            if (job.result) out->Root().AppendChild(std::move(job.result));
        return SetOutputTree(req, out);
    }

    // "Replace", or "Union": the union of each tree, clipped once into one node.
    ClipPaths subject, clipPaths, result;
    AddShapeUnionToPaths(*a, subject, tolerance, true);
    AddShapeUnionToPaths(*b, clipPaths, tolerance, true);
    ShapeClipper clipper;
    clipper.AddPaths(subject, true);
    clipper.AddPaths(clipPaths, false);
    if (clipper.Execute(kClipOf[op], result) && !result.empty()) {
        Ref<ShapeNode> node = MakeRef<ShapeNode>();
        node->SetShape(AddPathsToShape(result));
        const ImgRectF box = node->Bounds();
        node->SetAxis(0.5 * (box.x0 + box.x1), 0.5 * (box.y0 + box.y1));
        if (keep) {
            // "Keep" with "Union": the style of the first drawn node of Input1.
            std::vector<const ShapeNode *> first;
            Gather(a->Root(), first);
            if (!first.empty()) node->SetStyle(first.front()->Style());
        } else {
            node->SetStyle(GetStyle(state));
        }
        out->Root().AppendChild(std::move(node));
    }
    SetOutputTree(req, out);
}

} // namespace Orvane
