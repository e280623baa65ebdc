#include "host/flow/MergeInputs.h"

#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/MergeModes.h"
#include "host/image/TransformMatrix.h"

namespace Orvane {
namespace mergeinputs {

const char *const kModeNames[MrgModeCount] = {"Normal",     "Screen",     "Dissolve",    "Multiply",   "Overlay",
                                              "Soft Light", "Hard Light", "Color Dodge", "Color Burn", "Darken",
                                              "Lighten",    "Difference", "Exclusion",   "Hue",        "Saturation",
                                              "Color",      "Luminosity", "Add",         "Subtract"};
const char *const kOperatorNames[MrgOperatorCount] = {"Over", "In", "Held Out", "Atop", "XOr"};
/// The filter list, in RszTypes order (entry i is filter i + 1).
const char *const kFilterNames[] = {"Nearest Neighbor", "Box",      "Linear",  "Quadratic", "Cubic", "Catmull-Rom",
                                    "Gaussian",         "Mitchell", "Lanczos", "Sinc",      "Bessel"};
/// The window list (entry i is window 100 + i).
const char *const kWindowNames[] = {"Hanning", "Hamming", "Blackman", "Kaiser"};
const char *const kEdgeNames[] = {"Canvas", "Wrap", "Duplicate", "Mirror"};

constexpr int kDefaultFilterEntry = RszLinear - RszFirst;

int PageNamed(Operator *tool, const char *name) {
    const auto &pages = tool->Pages();
    for (size_t i = 0; i < pages.size(); ++i)
        if (pages[i].name == name) return static_cast<int>(i);
    return -1;
}

} // namespace mergeinputs

MergeInputs::MergeInputs(Operator *tool, Input *foreground, int mainIndex) : tool_(tool), foreground_(foreground) {
    if (!tool_) return;
    using namespace mergeinputs;
    int page = PageNamed(tool_, "Merge");
    if (page < 0)
        page = tool_->Pages().empty() ? tool_->AddControlPageTagList("Merge", {})
                                      : static_cast<int>(tool_->Pages().size()) - 1;
    const int channelPage = PageNamed(tool_, "Channels") >= 0 ? PageNamed(tool_, "Channels") : page;
    auto keep = [this](Input *in) {
        if (in) all_.push_back(in);
        return in;
    };

    if (!foreground_) {
        TagList fgTags{{LinkDataType, CLSID_DataType_Image},
                       {LinkSecondDataType, CLSID_DataType_TransformMatrix},
                       {InputRequired, 0},
                       {ImageFromRequestOK, 1},
                       {ImageForeground, 1}};
        if (mainIndex > 0) fgTags.Set({LinkMain, mainIndex});
        foreground_ = keep(tool_->AddInputTagList("Foreground", "Foreground", fgTags));
    }

    auto list = [&](const char *name, const char *id, const char *const *entries, int count, int def, int onPage) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Combo},
                  {ControlPage, onPage},
                  {InputInteger, 1},
                  {InputDefault, static_cast<double>(def)},
                  {InputMinAllowed, 0.0},
                  {InputMaxAllowed, static_cast<double>(count - 1)},
                  {InputNotify, 1}};
        for (int i = 0; i < count; ++i) t.Add({ListAddItem, entries[i]});
        return keep(tool_->AddInputTagList(name, id, t));
    };
    auto slider = [&](const char *name, const char *id, double def, double lo, double hi, double sliderLo,
                      double sliderHi, int onPage) {
        TagList t{{LinkDataType, CLSID_DataType_Number},
                  {InputControl, CLSID_InputControl_Slider},
                  {ControlPage, onPage},
                  {InputDefault, def},
                  {InputSliderLow, sliderLo},
                  {InputSliderHigh, sliderHi}};
        if (!std::isnan(lo)) t.Set({InputMinAllowed, lo});
        if (!std::isnan(hi)) t.Set({InputMaxAllowed, hi});
        return keep(tool_->AddInputTagList(name, id, t));
    };
    auto checkbox = [&](const char *name, const char *id, double def, int onPage) {
        return keep(tool_->AddInputTagList(name, id,
                                           {{LinkDataType, CLSID_DataType_Number},
                                            {InputControl, CLSID_InputControl_Checkbox},
                                            {ControlPage, onPage},
                                            {InputDefault, def}}));
    };
    const double none = std::nan("");

    // Placement.
    center_ = keep(tool_->AddInputTagList("Center", "Center",
                                          {{LinkDataType, CLSID_DataType_Point},
                                           {InputControl, CLSID_InputControl_Offset},
                                           {PreviewControl, CLSID_PreviewControl_Crosshair},
                                           {ControlPage, page},
                                           {InputDefaultX, 0.5},
                                           {InputDefaultY, 0.5}}));
    size_ = slider("Size", "Size", 1.0, 0.0, none, 0.0, 5.0, page);
    xSize_ = slider("X Size", "XSize", 1.0, 0.0, none, 0.0, 5.0, page);
    ySize_ = slider("Y Size", "YSize", 1.0, 0.0, none, 0.0, 5.0, page);
    angle_ = keep(tool_->AddInputTagList("Angle", "Angle",
                                         {{LinkDataType, CLSID_DataType_Number},
                                          {InputControl, CLSID_InputControl_Screw},
                                          {PreviewControl, CLSID_PreviewControl_Angle},
                                          {ControlPage, page},
                                          {InputDefault, 0.0},
                                          {InputSliderLow, -360.0},
                                          {InputSliderHigh, 360.0}}));
    flipH_ = checkbox("Flip Horizontal", "FlipHoriz", 0.0, page);
    flipV_ = checkbox("Flip Vertical", "FlipVert", 0.0, page);
    edges_ = list("Edges", "Edges", kEdgeNames, 4, EdgeCanvas, page);
    filter_ = list("Filter Method", "FilterMethod", kFilterNames, RszLast - RszFirst + 1, kDefaultFilterEntry, page);
    window_ = list("Window Method", "WindowMethod", kWindowNames, 4, 0, page);

    // Compositing.
    mode_ = list("Apply Mode", "ApplyMode", kModeNames, MrgModeCount, MrgNormal, page);
    operator_ = list("Operator", "Operator", kOperatorNames, MrgOperatorCount, MrgOver, page);
    additive_ = keep(tool_->AddInputTagList("Subtractive - Additive", "SubtractiveAdditive",
                                            {{LinkDataType, CLSID_DataType_Number},
                                             {InputControl, CLSID_InputControl_Slider},
                                             {ControlPage, page},
                                             {InputDefault, 0.0},
                                             {InputMinAllowed, 0.0},
                                             {InputMaxAllowed, 1.0},
                                             {SliderLowLabel, "Subtractive"},
                                             {SliderHighLabel, "Additive"}}));
    alphaGain_ = slider("Alpha Gain", "AlphaGain", 1.0, 0.0, 1.0, 0.0, 1.0, page);
    burnIn_ = slider("Burn In", "BurnIn", 0.0, 0.0, 1.0, 0.0, 1.0, page);
    blend_ = slider("Blend", "MergeBlend", 1.0, 0.0, 1.0, 0.0, 1.0, page);

    static const char *const channelNames[4] = {"Merge Red", "Merge Green", "Merge Blue", "Merge Alpha"};
    static const char *const channelIds[4] = {"MergeRed", "MergeGreen", "MergeBlue", "MergeAlpha"};
    for (int c = 0; c < 4; ++c)
        channels_[c] = keep(tool_->AddInputTagList(channelNames[c], channelIds[c],
                                                   {{LinkDataType, CLSID_DataType_Number},
                                                    {InputControl, CLSID_InputControl_Checkbox},
                                                    {ControlPage, channelPage},
                                                    {ControlGroup, 12},
                                                    {ControlMember, c},
                                                    {InputDefault, 1.0},
                                                    {ControlWidth, 0.25}}));

    int depthPage = PageNamed(tool_, "Depth Merge");
    if (depthPage < 0) depthPage = tool_->AddControlPageTagList("Depth Merge", {});
    zMerge_ = checkbox("Perform Depth Merge", "PerformDepthMerge", 0.0, depthPage);
    zLarger_ = checkbox("Larger Z Is Nearer", "ZLargerIsNearer", 0.0, depthPage);
    useReference_ = keep(tool_->AddInputTagList("Scale By Reference Size", "UseReferenceSize",
                                                {{LinkDataType, CLSID_DataType_Number},
                                                 {InputControl, CLSID_InputControl_Checkbox},
                                                 {ControlPage, page},
                                                 {InputDefault, 0.0},
                                                 {ControlVisible, 0}}));
    ShowFor(MrgNormal, RszLinear);
}

void MergeInputs::SetReferenceSize(Input *width, Input *height) {
    refWidth_ = width;
    refHeight_ = height;
    if (useReference_) useReference_->SetAttrsTagList({{ControlVisible, width && height ? 1 : 0}});
}

void MergeInputs::ShowFor(int mode, int filter) {
    auto show = [](Input *in, bool on) {
        if (in) in->SetAttrsTagList({{ControlVisible, on ? 1 : 0}});
    };
    show(operator_, mode == MrgNormal);
    show(window_, filter == RszSinc || filter == RszBessel);
}

void MergeInputs::NotifyChanged(Input *in, Parameter *param, double) {
    if (!in || (in != mode_ && in != filter_)) return;
    const auto *n = dynamic_cast<const Number *>(param);
    if (!n) return;
    auto current = [](const Input *i, double def) {
        const auto *v = dynamic_cast<const Number *>(i->Constant().Get());
        return v ? v->value : def;
    };
    const int mode = static_cast<int>(std::floor((in == mode_ ? n->value : current(mode_, 0.0)) + 0.5));
    const int entry = static_cast<int>(
        std::floor((in == filter_ ? n->value : current(filter_, mergeinputs::kDefaultFilterEntry)) + 0.5));
    ShowFor(mode, entry + RszFirst);
}

Matrix3 MergeInputs::PlacementOf(const Request *req, int fgW, int fgH, double fgAspect, int bgW, int bgH,
                                 double bgAspect) const {
    auto number = [req](const Input *in, double def) { return req ? req->GetInputNumber(in, def) : def; };
    double cx = 0.5, cy = 0.5;
    const Parameter *c = req ? req->GetInputData(center_) : nullptr;
    if (!c && center_) c = center_->Default().Get();
    if (const auto *p = dynamic_cast<const Point *>(c)) cx = p->x, cy = p->y;
    const double size = number(size_, 1.0);
    const double sx = size * number(xSize_, 1.0), sy = size * number(ySize_, 1.0);
    Matrix3 flip;
    if (number(flipH_, 0.0) >= 0.5) flip(0, 0) = -1.0;
    if (number(flipV_, 0.0) >= 0.5) flip(1, 1) = -1.0;
    // The foreground as if made for the reference frame, brought to the background's.
    double rx = 1.0, ry = 1.0;
    if (refWidth_ && refHeight_ && number(useReference_, 0.0) >= 0.5) {
        const double w = number(refWidth_, 0.0), h = number(refHeight_, 0.0);
        if (w > 0.0 && h > 0.0) rx = bgW / w, ry = bgH / h;
    }
    if (!(fgAspect > 0.0)) fgAspect = 1.0;
    if (!(bgAspect > 0.0)) bgAspect = 1.0;
    // Centre on the origin, flip, into square units (x by the pixel aspect),
    // scale, rotate, back to the background's pixels, to the centre point.
    return Matrix3::Translate(cx * bgW, cy * bgH) * Matrix3::Scale(1.0 / bgAspect, 1.0) *
           Matrix3::Rotate(number(angle_, 0.0)) * Matrix3::Scale(sx, sy) * Matrix3::Scale(fgAspect, 1.0) *
           Matrix3::Scale(rx, ry) * flip * Matrix3::Translate(-0.5 * fgW, -0.5 * fgH);
}

bool MergeInputs::Merge(Request *req, TransformMatrix *bg, const TagList &tags) {
    if (!req) return false;
    if (!bg || !bg->IsValid()) {
        Report(req, "the background is not an image");
        return false;
    }
    Parameter *fgValue = req->GetInputData(foreground_);
    if (!fgValue) return true; // nothing to lay on: the background as it is
    const TransformMatrix fg(fgValue, req, foreground_, 0, TimeUndefined);
    if (!fg.IsValid()) return true;

    auto number = [req](const Input *in, double def) { return req->GetInputNumber(in, def); };
    auto choice = [&](const Input *in, int def) { return static_cast<int>(std::floor(number(in, def) + 0.5)); };
    const Matrix3 placement = PlacementOf(req, fg.Width(), fg.Height(), fg.XScale() / fg.YScale(), bg->Width(),
                                          bg->Height(), bg->XScale() / bg->YScale());
    TagList t{{MrgApplyMode, choice(mode_, MrgNormal)},
              {MrgOperator, choice(operator_, MrgOver)},
              {MrgAdditive, number(additive_, 0.0)},
              {MrgAlphaGain, number(alphaGain_, 1.0)},
              {MrgBurnIn, number(burnIn_, 0.0)},
              {MrgBlend, number(blend_, 1.0)},
              {MrgDoRed, number(channels_[0], 1.0) >= 0.5},
              {MrgDoGreen, number(channels_[1], 1.0) >= 0.5},
              {MrgDoBlue, number(channels_[2], 1.0) >= 0.5},
              {MrgDoAlpha, number(channels_[3], 1.0) >= 0.5},
              {MrgZMerge, number(zMerge_, 0.0) >= 0.5},
              {MrgZLargerIsNearer, number(zLarger_, 0.0) >= 0.5},
              {MrgPlacement, static_cast<const void *>(&placement)},
              {XfFilter, choice(filter_, mergeinputs::kDefaultFilterEntry) + RszFirst},
              {XfWindow, choice(window_, 0) + RszWindowHanning},
              {XfEdges, choice(edges_, EdgeCanvas)},
              {XfRequest, static_cast<const void *>(req)},
              {WorkRequest, static_cast<const void *>(req)},
              {WorkUseGPU, tool_ && tool_->IsGPUEnabled(req, true)}};
    t.Merge(tags);
    if (bg->MergeConcatenateTagList(fgValue, t)) return true;
    Report(req, "out of memory");
    return false;
}

void MergeInputs::Report(Request *req, const char *what) const {
    // An abandoned render stops without a word.
    if (!tool_ || !tool_->GetDoc() || (req->GetTask() && req->GetTask()->IsAborted())) return;
    tool_->GetDoc()->PrintF(ConsoleError, "%s: the merge failed, %s (time = %g)\n", tool_->Name().c_str(), what,
                            req->Time());
}

} // namespace Orvane
