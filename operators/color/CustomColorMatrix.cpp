#include "operators/color/CustomColorMatrix.h"

#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_CustomColorMatrix("CustomColorMatrix");
static ClassRegistration<CustomColorMatrix, ThreadedOperator>
    s_Registration(CLSID_CustomColorMatrix, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegClassName, "UserColorMatrix"},
                    {RegPath, "Tools/Color/CustomColorMatrix"},
                    {RegName, "Color Matrix"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "CMx"},
                    {RegHelp, "Mixes the channels by a user matrix"},
                    {RegIcon, "Icons.Tools.Icons.UserColorMatrix"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {
const char *const kChannels[4] = {"Red", "Green", "Blue", "Alpha"};
} // namespace

CustomColorMatrix::CustomColorMatrix(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    // One row of the panel per output channel: its four weights, then its offset.
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) {
            const std::string id = std::string(kChannels[i]) + (j < 4 ? std::string("From") + kChannels[j] : "Offset");
            const std::string label = j < 4 ? kChannels[j] : "Offset";
            TagList t{{LinkDataType, CLSID_DataType_Number},
                      {InputControl, CLSID_InputControl_Screw},
                      {InputDefault, i == j ? 1.0 : 0.0},
                      {InputSliderLow, -1.0},
                      {InputSliderHigh, 1.0},
                      {ControlLabel, label.c_str()},
                      {ControlWidth, 0.2}};
            if (j == 0) t.Add({ControlRowLabel, kChannels[i]});
            entry_[i][j] = AddInputTagList(id.c_str(), id.c_str(), t);
        }
    invert_ = AddInputTagList("Invert", "Invert",
                              {{LinkDataType, CLSID_DataType_Number},
                               {InputControl, CLSID_InputControl_Checkbox},
                               {InputDefault, 0.0},
                               {InputMinAllowed, 0.0},
                               {InputMaxAllowed, 1.0}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

bool CustomColorMatrix::ReadMatrix(const Request *req, ColorMatrixFull &m) const {
    m.SetIdentity();
    for (int i = 0; i < 4; ++i)
        for (int j = 0; j < 5; ++j) m.m[i][j] = req->GetInputNumber(entry_[i][j]);
    // The smallest determinant a 32-bit float can tell from 0 at 1.
    return req->GetInputNumber(invert_) < 0.5 || m.Invert(1.1920929e-07);
}

void CustomColorMatrix::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    ColorMatrixFull m;
    if (src && !ReadMatrix(req, m)) {
        Fail(req, "%s: the matrix cannot be inverted (its determinant is 0)\n", Name().c_str());
        src = nullptr;
    }
    if (!src || m.IsIdentity()) {
        req->SetOutputData(output_, src);
        return;
    }
    const bool precalc = req->IsPreCalc();
    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    const TagList tags{{MtxColorMatrixFull, &m},
                       {WorkOperator, this},
                       {WorkThreaded, 1},
                       {WorkUseGPU, !precalc && IsGPUEnabled(req, false)},
                       {WorkRequest, req}};
    if (!dst || !ApplyMatrixTagList(src, dst.Get(), tags)) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src); // beyond the frame or domain: the input's
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
