#include "operators/warp/Transform.h"

#include <cmath>
#include <tuple>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/TransformMatrix.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Transform("Transform");
static ClassRegistration<Transform, ThreadedOperator>
    s_Registration(CLSID_Transform, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "Transform"},
                    {RegPath, "Tools/Transform/Transform"},
                    {RegName, "Transform"},
                    {RegCategory, "Transform"},
                    {RegAbbreviation, "Xf"},
                    {RegHelp, "Applies rotation, scaling and mirroring effects"},
                    {RegIcon, "Icons.Tools.Icons.Transform"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// Differences below this count as none (a float's step at 1).
constexpr double kEps = 1.1920928955078125e-07;

Input *AddSlider(Operator *op, const char *name, const char *id, double minAllowed) {
    return op->AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Slider},
                                {InputMinAllowed, minAllowed},
                                {InputSliderLow, 0.0},
                                {InputSliderHigh, 5.0},
                                {InputDefault, 1.0},
                                {SliderRest, 1.0},
                                {InputNotify, 1}});
}

Input *AddFlip(Operator *op, const char *name, const char *id, const char *label, const char *iconOff,
               const char *iconOn, bool first) {
    TagList tags{{LinkDataType, CLSID_DataType_Number},
                 {InputControl, CLSID_InputControl_MultiButton},
                 {InputMinAllowed, 0.0},
                 {InputMaxAllowed, 1.0},
                 {InputDefault, 0.0},
                 {ListAddItem, label},
                 {ButtonIconOff, iconOff},
                 {ButtonIconOn, iconOn},
                 {ControlGroup, 1},
                 {ControlMember, first ? 0 : 1},
                 {InputNotify, 1}};
    if (first) tags.Add({ControlRowLabel, "Flip"});
    return op->AddInputTagList(name, id, tags);
}

std::pair<double, double> PointOf(const Request *req, const Input *in, double dx, double dy) {
    if (const auto *p = dynamic_cast<const Point *>(req->GetInputData(in))) return {p->x, p->y};
    if (const auto *p = dynamic_cast<const Point *>(in->Default().Get())) return {p->x, p->y};
    return {dx, dy};
}

bool UsesSizeAndAspect(double v) { return std::floor(v + 0.5) == 1.0; }

} // namespace

TagList Transform::Controls::GeometryTags() const {
    const bool sa = UsesSizeAndAspect(useSizeAndAspect);
    return {{XfCenterX, centerX},    {XfCenterY, centerY},         {XfPivotX, pivotX},
            {XfPivotY, pivotY},      {XfXSize, sa ? size : xSize}, {XfYSize, sa ? size * aspect : ySize},
            {XfAngle, angle},        {XfFlipX, flipH > 0.5},       {XfFlipY, flipV > 0.5},
            {XfInvert, invert > 0.5}};
}

Transform::Transform(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Transform")}});
    BeginControlNestTagList("Transform", "TransformNest", true, {});
    center_ = AddInputTagList("Center", "Center",
                              {{LinkDataType, CLSID_DataType_Point},
                               {InputControl, CLSID_InputControl_Offset},
                               {PreviewControl, CLSID_PreviewControl_Crosshair},
                               {InputDefaultX, 0.5},
                               {InputDefaultY, 0.5},
                               {InputNotify, 1}});
    pivot_ = AddInputTagList("Pivot", "Pivot",
                             {{LinkDataType, CLSID_DataType_Point},
                              {InputControl, CLSID_InputControl_Offset},
                              {PreviewControl, CLSID_PreviewControl_Crosshair},
                              {InputDefaultX, 0.5},
                              {InputDefaultY, 0.5},
                              {InputNotify, 1}});
    useSizeAndAspect_ =
        AddCheckbox(this, "Use Size and Aspect", "UseSizeAndAspect", 1.0, {{InputExternal, 0}, {InputNotify, 1}});
    size_ = AddSlider(this, "Size", "Size", 0.0);
    aspect_ = AddSlider(this, "Aspect", "Aspect", 0.01);
    xSize_ = AddSlider(this, "X Size", "XSize", 0.0);
    ySize_ = AddSlider(this, "Y Size", "YSize", 0.0);
    angle_ = AddInputTagList("Angle", "Angle",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_Screw},
                              {PreviewControl, CLSID_PreviewControl_Angle},
                              {PreviewInputFirst, static_cast<const void *>(pivot_)},
                              {InputSliderLow, 0.0},
                              {InputSliderHigh, 360.0},
                              {SliderSteps, 3601},
                              {InputDefault, 0.0},
                              {InputNotify, 1}});
    flipH_ = AddFlip(this, "Flip Horizontal", "FlipHoriz", "Horiz", "Icons.FlipHorizontal.1", "Icons.FlipHorizontal.2",
                     true);
    flipV_ = AddFlip(this, "Flip Vertical", "FlipVert", "Vert", "Icons.FlipVertical.1", "Icons.FlipVertical.2", false);
    edges_ = AddInputTagList("Edges", "Edges",
                             {{LinkDataType, CLSID_DataType_Number},
                              {InputControl, CLSID_InputControl_MultiButton},
                              {InputInteger, 1},
                              {InputMinAllowed, 0.0},
                              {InputMaxAllowed, 3.0},
                              {InputDefault, 0.0},
                              {ButtonsFillRow, 1},
                              {ListAddItem, "Canvas"},
                              {ListAddItem, "Wrap"},
                              {ListAddItem, "Duplicate"},
                              {ListAddItem, "Mirror"}});
    filter_ = AddFilterInputs(this);
    invert_ = AddCheckbox(this, "Invert Transform", "InvertTransform", 0.0, {{InputNotify, 1}});
    flatten_ = AddCheckbox(this, "Flatten Transform", "FlattenTransform", 0.0);
    EndControlNest();

    // The reference size: the frame the on-screen controls show pixels of.
    const FrameFormat ff = GetDoc() ? GetDoc()->GetFrameFormat() : FrameFormat();
    BeginControlNestTagList("Reference Size", "ReferenceSize", false, {});
    const TagList sizeTags{{InputSliderHigh, 2048.0}, {InputMaxAllowed, 32767.0}, {SliderSteps, 2047},
                           {InputExternal, 0},        {InputPassive, 1},          {InputNotify, 1},
                           {LinkForceSave, 0}};
    width_ = AddSizeInput(this, "Width", "Width", ff.width, sizeTags);
    height_ = AddSizeInput(this, "Height", "Height", ff.height, sizeTags);
    useFrameFormat_ = AddCheckbox(this, "Use Frame Format Settings", "UseFrameFormatSettings", 0.0,
                                  {{InputExternal, 0}, {InputPassive, 1}, {InputNotify, 1}});
    EndControlNest();

    // Fetched after the controls, so that CheckRequest can read them. A
    // pending transform arrives as it is.
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image},
                              {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                              {LinkMain, 1},
                              {InputPriority, PriorityDefault + 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});

    // The rectangle previews of the sizes follow the centre, angle, pivot
    // and flips; Size's shows while Use Size and Aspect is on.
    for (Input *in : {size_, xSize_, ySize_}) {
        TagList t{{PreviewControl, CLSID_PreviewControl_Rectangle},
                  {PreviewGroup, in == size_ ? 2 : 1},
                  {PreviewMember, in == ySize_ ? 1 : 0},
                  {PreviewShown, in == size_}};
        int n = 0;
        for (Input *companion : {center_, angle_, pivot_, flipH_, flipV_})
            t.Add({PreviewInputFirst + static_cast<Tag>(n++), static_cast<const void *>(companion)});
        in->SetAttrsTagList(t);
    }
    pivot_->SetAttrsTagList({{PreviewInputFirst, static_cast<const void *>(angle_)}});
    ShowInput(xSize_, false);
    ShowInput(ySize_, false);
}

Transform::~Transform() = default;

Transform::Controls Transform::ReadControls(const Request *req) const {
    Controls c;
    std::tie(c.centerX, c.centerY) = PointOf(req, center_, 0.5, 0.5);
    std::tie(c.pivotX, c.pivotY) = PointOf(req, pivot_, 0.5, 0.5);
    c.useSizeAndAspect = req->GetInputNumber(useSizeAndAspect_, 1.0);
    c.size = req->GetInputNumber(size_, 1.0);
    c.aspect = req->GetInputNumber(aspect_, 1.0);
    c.xSize = req->GetInputNumber(xSize_, 1.0);
    c.ySize = req->GetInputNumber(ySize_, 1.0);
    c.angle = req->GetInputNumber(angle_, 0.0);
    c.flipH = req->GetInputNumber(flipH_, 0.0);
    c.flipV = req->GetInputNumber(flipV_, 0.0);
    c.invert = req->GetInputNumber(invert_, 0.0);
    return c;
}

void Transform::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    if (req->GetPri() != input_->Priority() || (req->GetFlags() & ReqFlagSkipRoI) || req->IsPreCalc()) return;
    const AutoImageRoI roi(req);
    const AutoImageDoD dod(req, input_);
    if (!roi || !dod || !dod->HasFrame()) return; // the whole input, or nothing known to map
    if (static_cast<int>(req->GetInputNumber(edges_, 0.0)) != EdgeCanvas) {
        req->SetInputRoI(input_, nullptr); // folding edges may read anywhere in the frame
        return;
    }
    const double W = dod->FrameWidth(), H = dod->FrameHeight();
    const Matrix3 m = NormalisedToPixelMatrix(
        TransformTagsMatrix(ReadControls(req).GeometryTags(), W, H, dod->xScale, dod->yScale), W, H);
    // The widest filter: the chain resamples with the filter of its last step.
    const ImgRectI need = TransformSourceWindow(roi->rect, m, {RszSinc, RszWindowHanning, EdgeCanvas});
    if (need.IsNull()) return; // singular: nothing of the input shows
    const ImgRectI inside = need & dod->rect;
    const ImageDomain region = dod->WithRect(inside.IsNull() ? need : inside);
    req->SetInputRoI(input_, &region);
}

void Transform::Process(Request *req) {
    Parameter *value = req->GetInputData(input_);
    if (!dynamic_cast<Image *>(value) && !dynamic_cast<TransformMatrix *>(value)) {
        Fail(req, "%s: no input image at time %g\n", Name().c_str(), req->Time());
        req->SetOutputData(output_, nullptr);
        return;
    }
    auto tm = MakeRef<TransformMatrix>(value, req, input_, 0u, TimeUndefined);
    {
        std::lock_guard<std::mutex> guard(screenLock_);
        srcWidth_ = tm->Width(), srcHeight_ = tm->Height();
        srcAspectX_ = tm->XScale(), srcAspectY_ = tm->YScale();
    }
    RebuildOnScreenMatrix();

    TagList tags = ReadControls(req).GeometryTags();
    tags.Set({XfEdges, static_cast<int>(req->GetInputNumber(edges_, 0.0))});
    tags.Set({XfFilter, FilterOf(req, filter_)});
    tags.Set({XfWindow, WindowOf(req, filter_)});
    tags.Set({XfFlatten, req->GetInputNumber(flatten_, 0.0) > 0.5});
    tags.Set({XfGPUEnabled, IsGPUEnabled(req, false)});
    tags.Set({XfRequest, static_cast<const void *>(req)});
    if (!tm->ImageConcatenateTagList(tags)) {
        // Flattening stopped: the render was abandoned, or memory ran out.
        if (!(req->GetTask() && req->GetTask()->IsAborted())) FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    // Nothing left pending (nothing to do, or flattened): the image itself.
    Image *src = tm->Source();
    if (tm->SourceToOutput().IsIdentity() && src->Width() == tm->Width() && src->Height() == tm->Height() &&
        src->XScale() == tm->XScale() && src->YScale() == tm->YScale()) {
        req->SetOutputData(output_, src);
        return;
    }
    req->SetOutputData(output_, tm.Get());
}

std::array<double, 16> Transform::OnScreenMatrix() const {
    std::lock_guard<std::mutex> guard(screenLock_);
    return screenMatrix_;
}

void Transform::RebuildOnScreenMatrix() {
    std::lock_guard<std::mutex> guard(screenLock_);
    const Matrix3 n = TransformTagsMatrix(screen_.GeometryTags(), srcWidth_, srcHeight_, srcAspectX_, srcAspectY_);
    screenMatrix_ = {n(0, 0), n(0, 1), 0, n(0, 2), n(1, 0), n(1, 1), 0, n(1, 2), 0, 0, 1, 0, 0, 0, 0, 1};
}

void Transform::FollowFrameFormat() {
    OrvaneDoc *doc = GetDoc();
    if (!doc) return;
    const double w = doc->GetPrefLong(PREF_FFWidth), h = doc->GetPrefLong(PREF_FFHeight);
    if (std::fabs(ControlNumber(width_, TimeUndefined) - w) > kEps) WriteControl(this, width_, w, TimeUndefined);
    if (std::fabs(ControlNumber(height_, TimeUndefined) - h) > kEps) WriteControl(this, height_, h, TimeUndefined);
}

void Transform::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    const auto *num = dynamic_cast<const Number *>(param);
    const auto *pt = dynamic_cast<const Point *>(param);
    if (num || pt) {
        bool matrix = true;
        bool aspectMoved = false;
        {
            std::lock_guard<std::mutex> guard(screenLock_);
            Controls &c = screen_;
            if (in == center_ && pt) {
                c.centerX = pt->x, c.centerY = pt->y;
            } else if (in == pivot_ && pt) {
                c.pivotX = pt->x, c.pivotY = pt->y;
            } else if (in == useSizeAndAspect_ && num) {
                c.useSizeAndAspect = num->value;
            } else if (in == size_ && num) {
                c.size = num->value;
            } else if (in == aspect_ && num) {
                aspectMoved = UsesSizeAndAspect(c.useSizeAndAspect) && num->value != c.aspect;
                c.aspect = num->value;
            } else if (in == xSize_ && num) {
                c.xSize = num->value;
            } else if (in == ySize_ && num) {
                c.ySize = num->value;
            } else if (in == angle_ && num) {
                c.angle = num->value;
            } else if (in == flipH_ && num) {
                c.flipH = num->value;
            } else if (in == flipV_ && num) {
                c.flipV = num->value;
            } else if (in == invert_ && num) {
                c.invert = num->value;
            } else {
                matrix = false;
            }
        }
        if (in == useSizeAndAspect_ && num) {
            const bool on = std::floor(num->value + 0.5) != 0.0;
            for (Input *i : {size_, aspect_}) i->SetAttrsTagList({{ControlVisible, on}, {PreviewShown, on}});
            for (Input *i : {xSize_, ySize_}) i->SetAttrsTagList({{ControlVisible, !on}, {PreviewShown, !on}});
        } else if (in == aspect_ && aspectMoved && num->value > 0.0) {
            size_->SetAttrsTagList({{RectanglePreviewAspect, 1.0 / num->value}});
        } else if (in == filter_.filter && num) {
            ShowWindowFor(filter_, num->value);
        } else if ((in == useFrameFormat_ || in == width_ || in == height_) && num) {
            if (ControlNumber(useFrameFormat_, TimeUndefined) >= 0.5) FollowFrameFormat();
            const double w = ControlNumber(width_, TimeUndefined, 1.0), h = ControlNumber(height_, TimeUndefined, 1.0);
            for (Input *i : {center_, pivot_}) i->SetAttrsTagList({{OffsetDisplayScaleX, w}, {OffsetDisplayScaleY, h}});
        } else if (in == center_ && pt) {
            for (Input *i : {pivot_, angle_})
                i->SetAttrsTagList({{PreviewOffsetX, pt->x - 0.5}, {PreviewOffsetY, pt->y - 0.5}});
        }
        if (matrix) RebuildOnScreenMatrix();
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

} // namespace Orvane
