#include "host/media/ImageFormat.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"

namespace Orvane {

MediaFormat::MediaFormat(const Registry *reg, const ScriptVal &, const TagList &) { SetRegistry(reg); }
MediaFormat::~MediaFormat() = default;

bool MediaFormat::CheckFormat(IOClass *) { return false; }
void MediaFormat::Close() {}
void MediaFormat::AddLoadInputs(Operator *) {}
void MediaFormat::NotifyChangedLoad(Operator *, Input *, Parameter *, double) {}
void MediaFormat::SetupLoad(Operator *, Request *) {}
void MediaFormat::CleanupLoad(Operator *) {}
void MediaFormat::AddSaveInputs(Operator *) {}
void MediaFormat::NotifyChangedSave(Operator *, Input *, Parameter *, double) {}
void MediaFormat::SetupSave(Operator *, Request *) {}
void MediaFormat::CleanupSave(Operator *) {}
bool MediaFormat::RegInit(Registry *) { return true; }
void MediaFormat::RegCleanup(Registry *) {}

Input *MediaFormat::AddOptionCheckbox(Operator *tool, const char *label, const char *id, double def) {
    return tool->AddInputTagList(label, id,
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Checkbox},
                                  {InputDefault, def},
                                  {InputExternal, 0}});
}

double MediaFormat::OptionValue(Operator *tool, Request *req, const char *id, double def) {
    if (!tool || !req) return def;
    Input *in = tool->FindGroupInput(id);
    return in ? req->GetInputNumber(in, def) : def;
}

bool MediaFormat::Fail(std::string why) {
    error_ = std::move(why);
    return false;
}

bool ImageFormat::LoadHeader(IOClass *) { return Fail("this format cannot read"); }

bool ImageFormat::LoadFrameTagList(unsigned, Ref<Image> &image, const TagList &tags) {
    if (width < 1 || height < 1 || !IsValidDepth(depth)) return Fail("no header");
    ImgRectI window(0, 0, width, height);
    if (const auto *region = tags.GetPtrAs<const ImageDomain>(ClipFrameRegion)) window &= region->rect;
    image = NewImageTagList({{ImgWidth, width},
                             {ImgHeight, height},
                             {ImgDepth, depth},
                             {ImgXScale, aspectX > 0 ? aspectX : 1.0},
                             {ImgYScale, aspectY > 0 ? aspectY : 1.0},
                             {ImgDataWindow, &window},
                             {ImgNoData, tags.GetBool(ClipFrameHeaderOnly)},
                             {ImgAbortFlag, static_cast<const void *>(abortFlag)}});
    if (!image) return Fail("cannot make an image of " + std::to_string(width) + " x " + std::to_string(height));
    if (metadata.IsTable() && metadata.Size()) image->Metadata() = metadata;
    return true;
}

bool ImageFormat::SaveHeader(IOClass *, Image *) { return Fail("this format cannot write"); }
bool ImageFormat::SaveFrame(unsigned, Image *) { return Fail("this format cannot write"); }
int64_t ImageFormat::PredictFileSize(Image *) { return 0; }

Ref<ImageFormat> NewImageFormat(const Registry *row) {
    if (!row || !row->IsRegClassType(RegFamilyImageFormat)) return nullptr;
    Object *obj = row->New(ScriptVal(), TagList());
    auto *format = dynamic_cast<ImageFormat *>(obj);
    if (!format) {
        delete obj;
        return nullptr;
    }
    return Ref<ImageFormat>::Adopt(format);
}

} // namespace Orvane
