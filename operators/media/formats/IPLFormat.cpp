#include "operators/media/formats/IPLFormat.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/JpegStream.h"

namespace Orvane {
namespace iplformat_detail {

const OvID CLSID_IPLFormat("IPLFormat");

ClassRegistration<IPLFormat, ImageFormat> s_Reg(CLSID_IPLFormat, &CLSID_ImageFormat,
                                                {{RegTypeFlags, RegFamilyImageFormat},
                                                 {RegFormatCanLoad, 1},
                                                 {RegFormatCanSave, 1},
                                                 {RegFormatHasOptions, 1},
                                                 {RegFormatHasSaveOptions, 1},
                                                 {RegFormatOneChannel, 1},
                                                 {RegFormatLosslessOnly, 1},
                                                 {RegFormatName, "IPL Files"},
                                                 {RegFormatExtension, ".ipl"}});

constexpr double kDefaultQuality = 93.0;

} // namespace iplformat_detail

IPLFormat::IPLFormat(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : JpegFamily(reg, args, tags, true) {}

bool IPLFormat::CheckMarkers(IOClass *stream) {
    uint8_t head[16];
    const int64_t at = stream->Tell();
    const bool got = stream->ReadExact(head, sizeof(head));
    stream->Seek(at, IOClass::SeekAbsolute);
    if (!got || head[0] != 0xFF || head[1] != 0xD8 || head[2] != 0xFF) return false;
    return (head[3] == 0xE0 && std::memcmp(head + 6, "JFIF", 4) == 0) ||
           (head[3] == 0xEE && std::memcmp(head + 6, "Adobe", 5) == 0);
}

bool IPLFormat::CheckFormat(IOClass *stream) { return stream && CheckMarkers(stream); }

void IPLFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    tool->AddInputTagList("Quality", "Quality",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Slider},
                           {InputInteger, 1},
                           {InputMinAllowed, 0.0},
                           {InputMaxAllowed, 100.0},
                           {InputDefault, iplformat_detail::kDefaultQuality},
                           {InputExternal, 0}});
}

void IPLFormat::SetupSave(Operator *tool, Request *req) {
    const double q = OptionValue(tool, req, "Quality", iplformat_detail::kDefaultQuality);
    quality_ = std::clamp(static_cast<int>(std::lround(q)), 0, 100);
}

JpegStream::EncodeSettings IPLFormat::SaveSettings() const {
    JpegStream::EncodeSettings s;
    s.fourComponents = true;
    s.quality = quality_;
    return s;
}

int64_t IPLFormat::PredictFileSize(Image *image) {
    return image ? 4 * static_cast<int64_t>(image->Width()) * image->Height() + 4096 : 0;
}

} // namespace Orvane
