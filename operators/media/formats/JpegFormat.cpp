#include "operators/media/formats/JpegFormat.h"

#include <algorithm>
#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/JpegStream.h"

namespace Orvane {
namespace jpegformat_detail {

const OvID CLSID_JpegFormat("JpegFormat");

ClassRegistration<JpegFormat, ImageFormat> s_Reg(CLSID_JpegFormat, &CLSID_ImageFormat,
                                                 {{RegTypeFlags, RegFamilyImageFormat},
                                                  {RegFormatCanLoad, 1},
                                                  {RegFormatCanSave, 1},
                                                  {RegFormatHasOptions, 1},
                                                  {RegFormatHasSaveOptions, 1},
                                                  {RegFormatLosslessOnly, 1},
                                                  {RegFormatName, "JPEG Files"},
                                                  {RegFormatExtension, ".jpg"},
                                                  {RegFormatExtension, ".jpeg"}});

} // namespace jpegformat_detail

JpegFormat::JpegFormat(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : JpegFamily(reg, args, tags, false) {}

bool JpegFormat::CheckFormat(IOClass *io) {
    uint8_t head[3];
    const int64_t at = io->Tell();
    const bool ok = io->ReadExact(head, 3) && head[0] == 0xFF && head[1] == 0xD8 && head[2] == 0xFF;
    io->Seek(at, IOClass::SeekAbsolute);
    return ok;
}

void JpegFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    tool->AddInputTagList("Quality", "Quality",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Slider},
                           {InputInteger, 1},
                           {InputMinAllowed, 0.0},
                           {InputMaxAllowed, 100.0},
                           {InputDefault, 97.0},
                           {InputExternal, 0}});
    AddOptionCheckbox(tool, "Chroma Subsampling", "ChromaSubsampling", 0.0);
    tool->AddInputTagList("Set Custom Resolution", "SetCustomResolution",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Checkbox},
                           {InputDefault, 0.0},
                           {InputNotify, 1},
                           {InputExternal, 0}});
    tool->AddInputTagList("Resolution (DPI)", "ResolutionDPI",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Slider},
                           {InputInteger, 1},
                           {InputMinAllowed, 1.0},
                           {InputSliderLow, 1.0},
                           {InputSliderHigh, 1200.0},
                           {InputDefault, 300.0},
                           {ControlVisible, 0},
                           {InputExternal, 0}});
}

void JpegFormat::NotifyChangedSave(Operator *tool, Input *in, Parameter *param, double) {
    if (!tool || !in || in != tool->FindGroupInput("SetCustomResolution")) return;
    const auto *n = dynamic_cast<const Number *>(param);
    if (Input *dpi = tool->FindGroupInput("ResolutionDPI"))
        dpi->SetAttrsTagList({{ControlVisible, n && n->value > 0.5}});
}

void JpegFormat::SetupSave(Operator *tool, Request *req) {
    using namespace jpegformat_detail;
    quality_ = static_cast<int>(std::lround(OptionValue(tool, req, "Quality", 97.0)));
    chromaSubsampling_ = OptionValue(tool, req, "ChromaSubsampling", 0.0) > 0.5;
    dpi_ = OptionValue(tool, req, "SetCustomResolution", 0.0) > 0.5
               ? std::max(1, static_cast<int>(std::lround(OptionValue(tool, req, "ResolutionDPI", 300.0))))
               : 0;
}

JpegStream::EncodeSettings JpegFormat::SaveSettings() const {
    JpegStream::EncodeSettings s;
    s.quality = quality_;
    s.chromaSubsampling = chromaSubsampling_;
    s.dpi = dpi_;
    return s;
}

int64_t JpegFormat::PredictFileSize(Image *image) {
    // Three bytes a pixel bounds any quality; the header adds little.
    return image ? 3 * static_cast<int64_t>(image->Width()) * image->Height() + 4096 : 0;
}

} // namespace Orvane
