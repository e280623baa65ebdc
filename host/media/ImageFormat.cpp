#include "host/media/ImageFormat.h"

#include <algorithm>
#include <sstream>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/Pixel.h"
#include "host/image/PixelMemory.h"

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
    const auto *region = tags.GetPtrAs<const ImageDomain>(ClipFrameRegion);
    if (region) window &= region->rect;
    if (!tags.GetBool(ClipFrameHeaderOnly)) {
        // What the pixels will take, checked before anything is allocated.
        ImgRectI held = dataWindow.value_or(ImgRectI(0, 0, width, height));
        if (region) held &= region->rect;
        const uint64_t pixelBytes = FormatOfDepth(depth).BytesPerPixel() + sizeof(float) * std::max(auxChannels, 0);
        const uint64_t bytes = held.IsNull() ? 0 : uint64_t(held.Width()) * uint64_t(held.Height()) * pixelBytes;
        const std::string why = PixelLimitRefusal(bytes, "the " + DescribeImage(held.Width(), held.Height(), depth) +
                                                             " its header describes");
        if (!why.empty()) return Fail(why);
    }
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

bool ImageFormat::DescribeFile(IOClass *stream, ScriptVal &d) {
    Ref<Image> header;
    fileChannels.clear();
    fileSampleType.clear();
    if (!LoadHeader(stream) || !LoadFrameTagList(0, header, {{ClipFrameHeaderOnly, 1}})) return false;
    d = ScriptVal::Table();
    d.Set("width", header->Width());
    d.Set("height", header->Height());
    d.Set("pixelAspect", header->YScale() > 0 ? header->XScale() / header->YScale() : 1.0);
    d.Set("imageDepth", DepthName(header->Depth()));
    const ImgRectI &w = header->DataWindow();
    ScriptVal window = ScriptVal::Table();
    for (int v : {w.x0, w.y0, w.x1, w.y1}) window.Append(v);
    d.Set("dataWindow", window);
    // The image depth's channels, unless the format said what the file holds.
    static const char *const kSampleTypes[] = {"uint8", "uint16", "half", "float"};
    const int step = (header->Depth() - 1) % 4;
    std::string names = fileChannels.empty() ? (header->IsMask() ? "A" : "R G B A") : fileChannels;
    const std::string type = fileChannels.empty() ? kSampleTypes[step < 0 ? 0 : step] : fileSampleType;
    ScriptVal channels = ScriptVal::Table();
    std::istringstream words(names);
    for (std::string name; words >> name;) {
        ScriptVal c = ScriptVal::Table();
        c.Set("name", name);
        c.Set("type", type);
        channels.Append(c);
    }
    d.Set("channels", channels);
    if (header->Metadata().IsTable() && header->Metadata().Size()) d.Set("metadata", header->Metadata());
    return true;
}

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
