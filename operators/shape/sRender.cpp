#include "operators/shape/sRender.h"

#include <algorithm>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/shape/ShapeTree.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static ClassRegistration<sRender, SourceOperator>
    s_Registration(OvID("sRender"), &CLSID_SourceOperator,
                   {{RegTypeFlags, RegFamilyShape | RegKindOperator | RegKindTool},
                    {RegClassName, "sRender"},
                    {RegPath, "Tools/Shape/sRender"},
                    {RegName, "sRender"},
                    {RegCategory, "Shape"},
                    {RegAbbreviation, "sRdr"},
                    {RegHelp, "Renders shapes into an image"},
                    {RegIcon, "Icons.Tools.Icons.sRender"},
                    {RegNoObjectMaterialControls, 1},
                    {RegNoMotionBlurControls, 1},
                    {RegSourceRangeControls, 1},
                    {RegSourceSizeControls, 1},
                    {RegSourceAspectControls, 1},
                    {RegSourceDepthControls, 1},
                    {RegSupportsRoI, 1},
                    {RegOutputType2, "ShapeTree"}});

sRender::sRender(const Registry *reg, const ScriptVal &args, const TagList &tags) : SourceOperator(reg, args, tags) {
    // Like every shape tool, the tree input sits on page "Controls". Its priority comes after the frame
    // controls': CheckRequest knows the frame before the tree is asked for.
    AddControlPageTagList("Controls", {});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_ShapeTree},
                              {LinkMain, 1},
                              {InputRequired, 0},
                              {InputPriority, PriorityDefault + 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

ImgRectI sRender::FrameOf(Request *req) const {
    const SourceFrame f = GetSourceFrame(req);
    const int scale = std::max(f.proxyScale, 1);
    return ImgRectI(0, 0, std::max(f.width / scale, 1), std::max(f.height / scale, 1));
}

void sRender::CheckRequest(Request *req) {
    const SourceFrame f = GetSourceFrame(req);
    ImageDomain domain(FrameOf(req));
    domain.frame = domain.rect;
    domain.xScale = f.aspectX, domain.yScale = f.aspectY;
    req->SetInputRoI(input_, &domain);
    SourceOperator::CheckRequest(req);
}

Ref<Image> sRender::NewOutput(Request *req, const SourceFrame &f, const ImgRectI &size, const ImgRectI &window) const {
    TagList tags{{ImgDocument, static_cast<const void *>(GetDoc())},
                 {ImgWidth, size.Width()},
                 {ImgHeight, size.Height()},
                 {ImgXScale, f.aspectX},
                 {ImgYScale, f.aspectY},
                 {ImgProxyScale, f.proxyScale},
                 {ImgDataWindow, &window},
                 {ImgValidWindow, &window},
                 {ImgNoData, req->IsPreCalc()},
                 {ImgForRequest, 1},
                 {ImgTakeWindows, 1}};
    if (f.depth != 0) tags.Add({ImgDepth, f.depth});
    if (f.proxyScale > 1) {
        tags.Add({ImgFullWidth, std::max(f.width, 1)});
        tags.Add({ImgFullHeight, std::max(f.height, 1)});
    }
    if (const RenderTask *task = req->GetTask()) tags.Add({ImgAbortFlag, static_cast<const void *>(task->AbortFlag())});
    return NewImageTagList(tags);
}

void sRender::Process(Request *req) {
    const SourceFrame f = GetSourceFrame(req);
    const ImgRectI frame = FrameOf(req);
    // A field holds the frame's rows 2y + dominance.
    const int dominance = f.field ? f.fieldDominance : 0;
    const int height = f.field ? std::max(frame.Height() / 2, 1) : frame.Height();
    ImgRectI window(0, 0, frame.Width(), height);
    if (const AutoImageRoI roi(req); roi) window &= roi->rect;
    Ref<Image> img = NewOutput(req, f, ImgRectI(0, 0, frame.Width(), height), window);
    // A field is drawn in the frame's rows it takes, then copied row by row.
    const ImgRectI frameRows(window.x0, 2 * window.y0 + dominance, window.x1,
                             std::min(2 * window.y1 + dominance, frame.Height()));
    Ref<Image> drawn = !f.field || window.IsNull() ? img : NewOutput(req, f, frame, frameRows);
    if (!img || !drawn) {
        FailOutOfMemory(req);
        return req->SetOutputData(output_, nullptr);
    }
    if (!req->IsPreCalc()) {
        static const ShapeTree empty;
        const auto *tree = dynamic_cast<const ShapeTree *>(req->GetInputData(input_));
        bool ok = renderer_.Render(req, tree ? *tree : empty, drawn.Get());
        if (ok && drawn != img && (ok = img->AllocScanLineData()))
            for (int y = window.y0; y < window.y1; ++y)
                if (const uint8_t *row = drawn->ScanLine(2 * y + dominance))
                    std::memcpy(img->ScanLine(y), row, img->RowBytes());
        if (!ok) {
            const RenderTask *task = req->GetTask();
            if (!(task && task->IsAborted()) && !img->CheckAbort()) FailOutOfMemory(req);
            return req->SetOutputData(output_, nullptr);
        }
    }
    if (f.field) {
        img->SetScale(img->XScale(), img->YScale() * 2.0);
        TagList fieldTags{{ImgField, dominance}};
        if (dominance != 0) fieldTags.Add({ImgFieldOffset, 0.5 / height});
        img->SetAttrsTagList(fieldTags);
    }
    req->SetOutputData(output_, img.Get());
}

} // namespace Orvane
