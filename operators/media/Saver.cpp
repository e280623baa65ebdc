#include "operators/media/Saver.h"

#include <cmath>
#include <filesystem>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/GamutInputs.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Half.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/media/ImageFormatList.h"
#include "host/media/OutputFile.h"
#include "host/script/ScriptClasses.h"
#include "host/script/ScriptPermission.h"
#include "host/script/ScriptState.h"
#include "operators/frame/IdChoices.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Saver("Saver");
static ClassRegistration<Saver, ThreadedOperator>
    s_SaverRegistration(CLSID_Saver, &CLSID_ThreadedOperator,
                        {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindTerminal},
                         {RegPath, "Tools/IO/Saver"},
                         {RegName, "Saver"},
                         {RegCategory, "I/O"},
                         {RegAbbreviation, "SV"},
                         {RegHelp, "Saves frames to a clip sequence or device"},
                         {RegIcon, "Icons.Tools.Icons.Saver"},
                         {RegAlias, "Write"},
                         {RegAlias, "Export"},
                         {RegAlias, "Media"},
                         {RegNoBlendControls, 1},
                         {RegNoMotionBlurControls, 1},
                         {RegNoCache, 1},
                         {RegSupportsRoI, 1},
                         {RegSupportsDoD, 1},
                         {RegStereoAware, 1}});

namespace saver_detail {

constexpr IdChoice kSaveFrames[] = {{"Hi Quality Interactive", "HiQInteractive"}, {"Full Renders Only", "Full"}};
constexpr IdChoice kProcessModes[] = {{"Auto", "Auto"},
                                      {"Full Frames", "FullFrames"},
                                      {"NTSC Fields", "NTSC"},
                                      {"PAL/HD Fields", "PAL"},
                                      {"PAL/HD Fields (Reversed)", "PALReversed"},
                                      {"NTSC Fields (Reversed)", "NTSCReversed"}};
constexpr IdChoice kExportModes[] = {{"Normal", "Normal"}, {"2:3 Pulldown", "Pulldown"}};
constexpr IdChoice kPullTypes[] = {{"Standard 2:3", "Standard"}, {"Advanced 2:3", "Advanced"}};
constexpr IdChoice kClipping[] = {
    {"Frame", "ClippingMode_Frame"}, {"Domain", "ClippingMode_Domain"}, {"None", "ClippingMode_None"}};
constexpr IdChoice kVideoTypes[] = {{"NTSC", "NTSC"}, {"NHK", "NHK"}, {"PAL/SECAM", "PAL_SECAM"}};
constexpr IdChoice kActions[] = {{"No Changes", "None"},
                                 {"Indicate as White", "White"},
                                 {"Indicate as Black", "Black"},
                                 {"Adjust to Legal", "Legal"}};
constexpr IdChoice kAdjust[] = {{"100% Saturation 100% Amplitude", "100Sat_100Amp"},
                                {"100% Saturation 75% Amplitude", "100Sat_75Amp"}};

template <size_t N> TagList IdList(const IdChoice (&list)[N], OvID control, TagList extra = {}) {
    TagList t{{LinkDataType, CLSID_DataType_OvID}, {InputControl, control}, {InputDefaultId, OvID(list[0].id)}};
    t.Merge(extra);
    return WithIdChoices(std::move(t), list);
}

/// An unlinked input's number at `time` (outside a request).
double NumberAt(const Input *in, double time) {
    Ref<Parameter> v = in->ValueAt(time);
    auto *n = dynamic_cast<const Number *>(v.Get());
    return n ? n->value : 0.0;
}

/// A copy whose R, G and B take the value of alpha.
Ref<Image> AlphaToColor(const Image &src) {
    Ref<Image> out = CopyOfImage(&src);
    if (!out || !out->HasScanLineData()) return out;
    const ImgRectI dw = out->DataWindow();
    for (int y = dw.y0; y < dw.y1; ++y) {
        const int n = dw.Width();
        if (out->IsRGBAInt32()) {
            uint8_t *p = out->Row<uint8_t>(y);
            for (int x = 0; x < n; ++x, p += 4) p[0] = p[1] = p[2] = p[3];
        } else if (out->IsRGBAInt64()) {
            uint16_t *p = out->Row<uint16_t>(y);
            for (int x = 0; x < n; ++x, p += 4) p[0] = p[1] = p[2] = p[3];
        } else if (out->IsRGBAFlt64()) {
            uint16_t *p = out->Row<uint16_t>(y);
            for (int x = 0; x < n; ++x, p += 4) p[0] = p[1] = p[2] = p[3];
        } else if (out->IsRGBAFlt128()) {
            float *p = out->Row<float>(y);
            for (int x = 0; x < n; ++x, p += 4) p[0] = p[1] = p[2] = p[3];
        }
    }
    return out;
}

} // namespace saver_detail

using namespace saver_detail;

Saver::Saver(const Registry *reg, const ScriptVal &args, const TagList &tags) : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("File", {{PageIcon, static_cast<const void *>("Icons.Tools.Icons.Saver.Toolbar")}});
    inClip_ = AddInputTagList("Destination Filename", "Clip",
                              {{LinkDataType, CLSID_DataType_Clip},
                               {InputControl, CLSID_InputControl_Clip},
                               {ControlLabel, "Filename"},
                               {InputExternal, 0},
                               {InputNotify, 1}});
    const TagList check{{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Checkbox}};
    inCreateDir_ = AddInputTagList("Create Folder During Render", "CreateDir", check);
    inCreateDirNow_ = AddInputTagList("Create", "CreateDirNow",
                                      {{LinkDataType, CLSID_DataType_Number},
                                       {InputControl, CLSID_InputControl_Button},
                                       {InputExternal, 0},
                                       {InputNotify, 1}});
    TagList formats{{LinkDataType, CLSID_DataType_OvID},
                    {InputControl, CLSID_InputControl_ComboID},
                    {InputDefaultId, OvID("OpenEXRFormat")},
                    {InputNotify, 1},
                    {InputInitialNotify, 1}};
    for (const Registry *row : FormatsThatSave()) {
        formats.Add({ListAddItem, row->Tags().GetText(RegFormatName, "")});
        formats.Add({ListItemId, row->ID()});
    }
    inOutputFormat_ = AddInputTagList("Output Format", "OutputFormat", formats);
    inSaveFrames_ = AddInputTagList("Save Frames", "SaveFrames", IdList(kSaveFrames, CLSID_InputControl_MultiButtonID));
    inRelative_ = AddInputTagList("Saver-relative Numbering", "SetSequenceStart", check);
    inOffset_ = AddInputTagList("Frame Offset", "SequenceStartFrame",
                                {{LinkDataType, CLSID_DataType_Number}, {InputInteger, 1}});

    AddControlPageTagList("Export", {});
    inProcessMode_ = AddInputTagList("Process Mode", "ProcessMode", IdList(kProcessModes, CLSID_InputControl_ComboID));
    inExportMode_ = AddInputTagList("Export Mode", "ExportMode",
                                    IdList(kExportModes, CLSID_InputControl_MultiButtonID, {{InputNotify, 1}}));
    inPullType_ =
        AddInputTagList("2:3 Type", "PullType", IdList(kPullTypes, CLSID_InputControl_ComboID, {{ControlVisible, 0}}));
    inFirstFrame_ = AddInputTagList("First Frame", "FirstFrame",
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_MultiButton},
                                     {InputInteger, 1},
                                     {ControlVisible, 0},
                                     {ListAddItem, "AA"},
                                     {ListAddItem, "BB"},
                                     {ListAddItem, "BC"},
                                     {ListAddItem, "CD"},
                                     {ListAddItem, "DD"}});
    inClipping_ = AddInputTagList("Clipping Mode", "ClippingMode", IdList(kClipping, CLSID_InputControl_MultiButtonID));
    inAlphaToColor_ = AddInputTagList("Save Alpha to Color", "SaveAlphaToColor", check);
    gamut_ = std::make_unique<GamutInputs>(this, GamutInputs::FromLinear);

    AddControlPageTagList("Audio", {});
    inSound_ = AddInputTagList("Sound Filename", "SoundFilename",
                               {{LinkDataType, CLSID_DataType_Text}, {InputControl, CLSID_InputControl_File}});
    inSoundOffset_ = AddInputTagList("Sound Offset", "SoundOffset", {{LinkDataType, CLSID_DataType_Number}});

    AddControlPageTagList("Legal", {});
    inVideoType_ = AddInputTagList("Video Type", "VideoType", IdList(kVideoTypes, CLSID_InputControl_ComboID));
    inAction_ = AddInputTagList("Action", "Action", IdList(kActions, CLSID_InputControl_ComboID));
    inAdjust_ = AddInputTagList("Adjust based on", "AdjustBasedOn", IdList(kAdjust, CLSID_InputControl_ComboID));
    inSoftClip_ = AddInputTagList("Soft clip", "SoftClip",
                                  {{LinkDataType, CLSID_DataType_Number},
                                   {InputControl, CLSID_InputControl_Slider},
                                   {InputMinAllowed, 0.0},
                                   {InputMaxAllowed, 1.0}});

    AddControlPageTagList("Common", {});
    inFrameScript_ = AddInputTagList("Frame Saved Script", "FrameSavedScript",
                                     {{LinkDataType, CLSID_DataType_Text},
                                      {InputControl, CLSID_InputControl_TextEdit},
                                      {TextEditLanguage, "lua"},
                                      {ControlKindValue, 8},
                                      {InputExternal, 0}});

    AddControlPageTagList("Format", {});
    inInput_ =
        AddInputTagList("Input", "Input", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {InputRequired, 1}});
    outImage_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

Saver::~Saver() = default;

std::string Saver::GetTitle() const {
    auto *c = dynamic_cast<const Clip *>(inClip_->Constant().Get());
    return c && !c->FileName().empty() ? Name() + ": " + c->FileName() : Name();
}

void Saver::AddFormatInputs(OvID format) {
    const Registry *row = ClassRegistry ? ClassRegistry->Find(format) : nullptr;
    if (!row || !formatGroups_.insert(format).second) return;
    Ref<ImageFormat> f = NewImageFormat(row);
    if (!f) return;
    SetCurrentGroup(format.Text());
    f->AddSaveInputs(this);
    SetCurrentGroup({});
}

OvID Saver::ExtensionFormat(const Parameter *clip) const {
    auto *c = dynamic_cast<const Clip *>(clip);
    const Registry *row = c ? FormatRowForWriting(c->FileName()) : nullptr;
    return row ? row->ID() : OvID();
}

void Saver::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (param && !filling_) {
        if (in == inClip_) {
            // The format follows the extension unless one was chosen that differs from it.
            const OvID named = ExtensionFormat(param);
            auto *current = dynamic_cast<const IDValue *>(inOutputFormat_->Constant().Get());
            if (formatChosen_ && current && named == current->value) formatChosen_ = false;
            if (!formatChosen_ && !named.IsNull()) {
                filling_ = true;
                inOutputFormat_->SetValue(MakeRef<IDValue>(named));
                filling_ = false;
                AddFormatInputs(named);
            }
        } else if (in == inOutputFormat_) {
            // The default's own object: the first notification, or a reset,
            // after which the format follows the extension again.
            OvID chosen = static_cast<IDValue *>(param)->value;
            const OvID named = ExtensionFormat(inClip_->Constant().Get());
            formatChosen_ = param != in->Default().Get() && chosen != named;
            if (!formatChosen_ && !named.IsNull() && named != chosen) {
                filling_ = true;
                inOutputFormat_->SetValue(MakeRef<IDValue>(named));
                filling_ = false;
                chosen = named;
            }
            AddFormatInputs(chosen);
        } else if (in == inCreateDirNow_) {
            auto *clip = dynamic_cast<const Clip *>(inClip_->Constant().Get());
            if (clip && !clip->FileName().empty() && GetDoc()) {
                const std::filesystem::path dir =
                    std::filesystem::path(GetDoc()->MapPath(clip->FileName())).parent_path();
                std::error_code ec;
                if (!dir.empty()) std::filesystem::create_directories(dir, ec);
            }
        } else if (in == inExportMode_) {
            const bool pulled = static_cast<IDValue *>(param)->value != OvID("Normal");
            inPullType_->SetAttrsTagList({{ControlVisible, pulled}});
            inFirstFrame_->SetAttrsTagList({{ControlVisible, pulled}});
        }
        gamut_->NotifyChanged(in, param, time);
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void Saver::OnStartRender() {
    firstFrame_ = true;
    audioWarned_ = false;
    scriptRefused_ = false;
    // Temporary files of renders of this output that were killed.
    auto *clip = dynamic_cast<const Clip *>(inClip_->Constant().Get());
    if (clip && !clip->FileName().empty()) {
        const std::string name = GetDoc() ? GetDoc()->MapPath(clip->FileName()) : clip->FileName();
        RemoveStaleTemporaries(OutputSequenceName(name, false));
        RemoveStaleTemporaries(OutputSequenceName(name, true));
    }
    ThreadedOperator::OnStartRender();
}

void Saver::OnEndRender() {
    firstFrame_ = true;
    ThreadedOperator::OnEndRender();
}

int64_t Saver::FileNumber(double time, double renderStart) const {
    int64_t s = static_cast<int64_t>(NumberAt(inOffset_, time));
    if (NumberAt(inRelative_, time) > 0.5) {
        const double base = renderStart > -999999999 ? renderStart : (GetDoc() ? GetDoc()->GlobalStart() : 0.0);
        s -= static_cast<int64_t>(base);
    }
    return static_cast<int64_t>(time) + s;
}

SequenceName Saver::OutputName(double time, const RenderTask *task) const {
    Ref<Parameter> v = inClip_->ValueAt(time);
    auto *clip = dynamic_cast<const Clip *>(v.Get());
    if (!clip || clip->FileName().empty()) return {};
    const bool severalFrames = task && task->endTime > task->startTime;
    return OutputSequenceName(GetDoc() ? GetDoc()->MapPath(clip->FileName()) : clip->FileName(), severalFrames);
}

std::string Saver::FrameFileName(double time, const RenderTask *task) const {
    const SequenceName name = OutputName(time, task);
    return name.prefix.empty() && !name.hasNumber ? std::string()
                                                  : SequencePath(name, FileNumber(time, task ? task->startTime : -2e9));
}

std::string Saver::FrameFilePattern(double time, const RenderTask *task) const {
    return SequenceDisplayName(OutputName(time, task));
}

bool Saver::SavesThisRequest(Request *req, const Image &image) const {
    const uint32_t flags = req->GetFlags();
    bool whole = true;
    if (AutoImageRoI roi(req); roi) {
        const ImgRectI frame = image.Frame() & image.DataWindow();
        const OvID mode = req->GetInputID(inClipping_, ClippingMode_Frame);
        whole = mode == ClippingMode_None ? roi->rect == image.DataWindow() : (roi->rect & frame) == frame;
    }
    if (!whole) return false;
    if (!(flags & (ReqFlagInteractive | ReqFlagPreview))) return true;
    // Interactive views write only when the render armed the tool for it.
    const bool hiQ = req->GetInputID(inSaveFrames_) == OvID("HiQInteractive");
    const bool armed = req->GetTask() && !req->GetTask()->interactive;
    return hiQ && armed && (flags & ReqFlagInteractive) && !(flags & (ReqFlagPreview | ReqFlagProxy)) &&
           !(((flags >> 21) | flags) & 1);
}

Ref<Image> Saver::GamutAndLegal(Request *req, Ref<Image> image, std::string *error) {
    image = gamut_->ProcessOf(req, image.Get(), nullptr, GetClippingMode(req), true, error);
    if (!image) return image;
    const int action = IdIndex(req->GetInputID(inAction_), kActions);
    if (action == 0) return image;
    const int video = IdIndex(req->GetInputID(inVideoType_), kVideoTypes);
    const int adjust = IdIndex(req->GetInputID(inAdjust_), kAdjust);
    return image->LegalOfImage(video, action, adjust, req->GetInputNumber(inSoftClip_));
}

bool Saver::SaveFrame(Request *req, Ref<Image> image) {
    auto *clipValue = dynamic_cast<Clip *>(req->GetInputData(inClip_));
    if (!clipValue || clipValue->FileName().empty()) {
        Fail(req, "%s: no file name to save to", Name().c_str());
        return false;
    }
    const double t = req->Time();
    if (req->GetInputID(inExportMode_) != OvID("Normal")) {
        Fail(req, "%s: 2:3 pull-down export is not available yet in this version of Orvane", Name().c_str());
        return false;
    }
    // With Frame clipping the file holds the frame exactly.
    if (req->GetInputID(inClipping_, ClippingMode_Frame) == ClippingMode_Frame &&
        image->DataWindow() != image->Frame()) {
        const ImgRectI frameRect = image->Frame();
        image = image->CopyOfImageTagList({{ImgDataWindow, &frameRect}, {ImgValidWindow, &frameRect}});
        if (!image) {
            Fail(req, "%s: out of memory", Name().c_str());
            return false;
        }
    }
    std::string colourError;
    image = GamutAndLegal(req, image, &colourError);
    if (image && req->GetInputNumber(inAlphaToColor_) >= 0.5) image = AlphaToColor(*image);
    if (!image) {
        if (colourError.empty())
            Fail(req, "%s: out of memory", Name().c_str());
        else
            Fail(req, "%s: %s", Name().c_str(), colourError.c_str());
        return false;
    }
    if (!audioWarned_) {
        auto *sound = dynamic_cast<Text *>(req->GetInputData(inSound_));
        if (sound && !sound->value.empty())
            GetDoc()->PrintF(req, ConsoleWarning, "Warning: %s: No supported audio found in %s", Name().c_str(),
                             sound->value.c_str());
        audioWarned_ = true;
    }

    // A clip of the file this frame goes to.
    const SequenceName name = OutputName(t, req->GetTask());
    Clip clip(SequenceDisplayName(name));
    const int64_t number = FileNumber(t, req->GetTask() ? req->GetTask()->startTime : -2e9);
    clip.SetStartFrame(number);
    const OvID format = req->GetInputID(inOutputFormat_);
    if (!format.IsNull()) clip.SetSaveFormat(format);
    const bool makeFolders = req->GetInputNumber(inCreateDir_) >= 0.5;
    std::string error;
    const bool ok =
        clip.PutFrameTagList(0, image.Get(), {{ClipFrameMakeFolders, makeFolders}}, error, [&](ImageFormat &f) {
            SetCurrentGroup(format.Text());
            f.SetupSave(this, req);
            SetCurrentGroup({});
        });
    firstFrame_ = false;
    if (!ok) {
        GetDoc()->PrintF(req, ConsoleError, "%s failed to write %s", Name().c_str(), error.c_str());
        return false;
    }
    if (RenderTask *task = req->GetTask()) task->NoteFileWritten(Name(), clip.FramePath(0));
    RunFrameScript(req, number, clip.FramePath(0));
    return true;
}

void Saver::RunFrameScript(Request *req, int64_t frame, const std::string &filename) {
    auto *text = dynamic_cast<Text *>(req->GetInputData(inFrameScript_));
    if (!text || text->value.empty()) return;
    if (!ScriptsAllowed()) {
        if (!scriptRefused_) {
            scriptRefused_ = true;
            NoteScriptRefused();
            GetDoc()->PrintF(req, ConsoleWarning,
                             "%s: frame saved script not run: scripts are not allowed (use --allow-scripts)",
                             Name().c_str());
        }
        return;
    }
    std::lock_guard<std::mutex> guard(scriptLock_);
    OrvaneDoc *doc = GetDoc();
    auto alert = [&](const std::string &line) {
        doc->PrintF(req, ConsoleWarning, "%s: %s", Name().c_str(), line.c_str());
    };
    if (!script_) {
        try {
            auto state = std::make_unique<ScriptState>();
            if (std::string error = InstallScriptClasses(*state); !error.empty()) {
                alert("frame saved script not run: " + error);
                return;
            }
            script_ = std::move(state);
        } catch (const std::exception &) {
            alert("frame saved script not run: out of memory");
            return;
        }
    }
    ScriptState &s = *script_;
    s.SetAlert(alert);
    constexpr ScriptEnv env = ScriptEnv::Trusted;
    s.SetNumber(env, "time", req->Time());
    s.SetNumber(env, "basetime", req->Time()); // the request's own time: frames are saved unshifted
    s.SetPointer(env, "req", "Request *", req);
    s.SetPointer(env, "OrvaneScriptReq", "Request *", req);
    s.SetNumber(env, "OrvaneScriptReqFlags", req->GetFlags());
    s.SetNumber(env, "frame", static_cast<double>(frame));
    s.SetString(env, "filename", filename);
    // A render stopped while the script runs stops the script too.
    int32_t abortWord = 0;
    RenderTask *task = req->GetTask();
    if (task) task->LinkAbortWord(&abortWord);
    s.SetAbortWord(&abortWord);
    const std::string error = s.Run(env, text->value, Name());
    s.SetAbortWord(nullptr);
    if (task) task->UnlinkAbortWord(&abortWord);
    if (!error.empty()) alert("frame saved script failed: " + error);
    s.SetPointer(env, "req", "Request *", nullptr);
    s.SetPointer(env, "OrvaneScriptReq", "Request *", nullptr);
    s.SetAlert(nullptr);
}

void Saver::Process(Request *req) {
    auto *input = dynamic_cast<Image *>(req->GetInputData(inInput_));
    if (!input) {
        req->SetOutputData(outImage_, nullptr);
        return;
    }
    Ref<Image> image(input);
    if (req->IsPreCalc()) {
        req->SetOutputData(outImage_, image.Get());
        return;
    }
    if (!SavesThisRequest(req, *image)) {
        std::string colourError;
        Ref<Image> shown = GamutAndLegal(req, image, &colourError);
        if (!shown && !colourError.empty()) Fail(req, "%s: %s", Name().c_str(), colourError.c_str());
        req->SetOutputData(outImage_, shown.Get());
        return;
    }
    req->SetOutputData(outImage_, SaveFrame(req, image) ? input : nullptr);
}

} // namespace Orvane
