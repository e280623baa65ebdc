#include "operators/generate/Background.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <string>
#include <type_traits>

#include "host/color/ColorSpace.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Gradient.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMBuffer.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/kernels/GeneratorKernelParams.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_Background("Background");
static ClassRegistration<Background, SourceOperator>
    s_Registration(CLSID_Background, &CLSID_SourceOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindSource},
                    {RegClassName, "Background"},
                    {RegPath, "Tools/Creator/Background"},
                    {RegName, "Background"},
                    {RegCategory, "Generator"},
                    {RegAbbreviation, "BG"},
                    {RegHelp, "Creates a four-point gradient frame"},
                    {RegIcon, "Icons.Tools.Icons.Background"},
                    {RegAlias, "Constant"},
                    {RegAlias, "Solid"},
                    {RegAlias, "Gradient"},
                    {RegAlias, "Ramp"},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1},
                    {RegSourceRangeControls, 1},
                    {RegSourceSizeControls, 1},
                    {RegSourceAspectControls, 1},
                    {RegSourceDepthControls, 1}});

namespace {

/// One entry of a button row: its ID, its label and, for the Type row, its icon.
struct Choice {
    const char *id;
    const char *label;
    const char *icon = nullptr;
};

constexpr Choice kTypes[] = {
    {"SolidColor", "Solid Color", ":/Res/IDB_BACKGROUND_SOLID_H"},
    {"Horizontal", "Horizontal", ":/Res/IDB_BACKGROUND_HORIZONTAL_H"},
    {"Vertical", "Vertical", ":/Res/IDB_BACKGROUND_VERTICAL_H"},
    {"FourCorner", "Four Corner", ":/Res/IDB_BACKGROUND_FOURCORNER_H"},
    {"Gradient", "Gradient", ":/Res/IDB_BACKGROUND_GRADIENT_H"},
};
enum GradientShape { ShapeLinear, ShapeReflect, ShapeSquare, ShapeCross, ShapeRadial, ShapeAngle };
constexpr Choice kGradientTypes[] = {{"Linear", "Linear"}, {"Reflect", "Reflect"}, {"Square", "Square"},
                                     {"Cross", "Cross"},   {"Radial", "Radial"},   {"Angle", "Angle"}};
constexpr Choice kSpaces[] = {{"RGB", "RGB"}, {"HLS", "HLS"}, {"HSV", "HSV"}, {"LAB", "LAB"}};
/// The host colour space of each interpolation choice.
constexpr ColorSpaceType kSpaceTypes[] = {ColorSpaceType::RGB, ColorSpaceType::HLS, ColorSpaceType::HSV,
                                          ColorSpaceType::LAB};
enum RepeatMode { RepeatOnce, RepeatRepeat, RepeatPingPong };
constexpr Choice kRepeats[] = {{"Once", "Once"}, {"Repeat", "Repeat"}, {"PingPong", "Ping-Pong"}};
constexpr Choice kSubPixels[] = {{"1x1", "1x1 (no Sub-Pixel)"},
                                 {"2x2", "2x2 Sub-Pixel"},
                                 {"3x3", "3x3 Sub-Pixel"},
                                 {"4x4", "4x4 Sub-Pixel"},
                                 {"5x5", "5x5 Sub-Pixel"}};

struct CornerDesc {
    const char *id, *label, *separator;
};
constexpr CornerDesc kCorners[4] = {{"TopLeft", "Top Left", nullptr},
                                    {"TopRight", "Top Right", "TopRightSep"},
                                    {"BottomLeft", "Bottom Left", "BottomLeftSep"},
                                    {"BottomRight", "Bottom Right", "BottomRightSep"}};
struct ChannelDesc {
    const char *name;
    int colorChannel;
    double def;
};
constexpr ChannelDesc kChannels[4] = {{"Red", ColorChannelRed, 0.0},
                                      {"Green", ColorChannelGreen, 0.0},
                                      {"Blue", ColorChannelBlue, 0.0},
                                      {"Alpha", ColorChannelAlpha, 1.0}};

/// Colour labels by mode: top left, top right, bottom left, bottom right.
constexpr const char *kCornerLabels[5][4] = {{"Color", "Top Right", "Bottom Left", "Bottom Right"},
                                             {"Left", "Right", "Bottom Left", "Bottom Right"},
                                             {"Top", "Top Right", "Bottom", "Bottom Right"},
                                             {"Top Left", "Top Right", "Bottom Left", "Bottom Right"},
                                             {"Top Left", "Top Right", "Bottom Left", "Bottom Right"}};

/// The gradient control reads its preview strip's colour space from its
/// private control value.
constexpr Tag GradientControlColorSpace = ControlKindValue;

/// Start and End closer than this count as one point.
constexpr float kTiny = 1.1920929e-07f;
/// Ramps on integer images run in fixed point: 1.0 is 65535 << 15.
constexpr double kFixedOne = 65535.0 * 32768.0;
constexpr int kFixedShift = 15;
constexpr int32_t kFixedHalf = 16384;
constexpr float kTwoPi = 6.2831855f;
/// Entries of the gradient table the device reads.
constexpr int kGradientTableSize = 256;

/// The list tags of a button row, appended to `tags`.
template <size_t N> TagList WithChoices(TagList tags, const Choice (&list)[N]) {
    for (const Choice &c : list) {
        tags.Add({ListAddItem, c.label});
        tags.Add({ListItemId, OvID(c.id)});
        if (c.icon) tags.Add({ButtonIcon, c.icon});
    }
    return tags;
}

/// The index of `id` in a button row; the first entry for an unknown ID.
template <size_t N> int ChoiceIndex(OvID id, const Choice (&list)[N]) {
    for (size_t i = 0; i < N; ++i)
        if (id == OvID(list[i].id)) return static_cast<int>(i);
    return 0;
}

template <size_t N> int ChoiceAt(const Request *req, const Input *in, const Choice (&list)[N]) {
    return ChoiceIndex(req->GetInputID(in), list);
}

uint16_t UnitToU16(float v) {
    if (!(v > 0.0f)) return 0; // NaN too
    if (v >= 1.0f) return 65535;
    return static_cast<uint16_t>(v * 65535.0f);
}

/// Writes `count` pixels, pixelAt(0) .. pixelAt(count - 1) in that order, to
/// a row in the image's own format. Px is FltPixel or Pixel (16-bit).
template <class Px, class PixelAt> void StoreRow(const Image &img, uint8_t *row, int count, PixelAt &&pixelAt) {
    const int depth = img.Depth();
    if constexpr (std::is_same_v<Px, FltPixel>) {
        if (depth == DepthRGBAFlt32) {
            auto *dst = reinterpret_cast<FltPixel *>(row);
            for (int i = 0; i < count; ++i) dst[i] = pixelAt(i);
            return;
        }
    }
    constexpr int kBlock = 256;
    Px block[kBlock];
    const size_t bpp = static_cast<size_t>(img.BytesPerPixel());
    for (int first = 0; first < count; first += kBlock) {
        const int n = std::min(kBlock, count - first);
        for (int i = 0; i < n; ++i) block[i] = pixelAt(first + i);
        if constexpr (std::is_same_v<Px, FltPixel>)
            StoreFlt(depth, block, n, row + first * bpp);
        else
            StorePixel(depth, block, n, row + first * bpp);
    }
}

} // namespace

Background::Background(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : SourceOperator(reg, args, tags) {
    // The page icon tag holds a pointer; the name is static text.
    AddControlPageTagList("Color", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Color")}});
    inType_ = AddInputTagList("Type", "Type",
                              WithChoices({{LinkDataType, CLSID_DataType_OvID},
                                           {InputControl, CLSID_InputControl_MultiButtonID},
                                           {InputDefaultId, OvID(kTypes[ModeSolid].id)},
                                           {InputNotify, 1}},
                                          kTypes));

    BeginControlNestTagList("Background", "BackgroundNest", true, {});
    for (int c = 0; c < 4; ++c) {
        inSeparator_[c] = nullptr;
        if (kCorners[c].separator)
            inSeparator_[c] = AddInputTagList("", kCorners[c].separator,
                                              {{LinkDataType, CLSID_DataType_Number},
                                               {InputControl, CLSID_InputControl_Label},
                                               {InputExternal, 0},
                                               {InputPassive, 1},
                                               {LinkNotSaved, 1}});
        for (int ch = 0; ch < 4; ++ch) {
            const std::string name = std::string(kCorners[c].label) + " " + kChannels[ch].name;
            const std::string id = std::string(kCorners[c].id) + kChannels[ch].name;
            TagList t{{LinkDataType, CLSID_DataType_Number},
                      {InputControl, CLSID_InputControl_Color},
                      {ControlGroup, c + 1},
                      {ControlMember, ch},
                      {ColorChannel, kChannels[ch].colorChannel},
                      {InputSliderLow, 0.0},
                      {InputSliderHigh, 1.0},
                      {InputDefault, kChannels[ch].def}};
            // The first member names the whole colour control.
            if (ch == 0) t.Add({ControlLabel, kCorners[c].label});
            inColor_[c][ch] = AddInputTagList(name.c_str(), id.c_str(), t);
        }
    }

    inGradientType_ = AddInputTagList("Gradient Type", "GradientType",
                                      WithChoices({{LinkDataType, CLSID_DataType_OvID},
                                                   {InputControl, CLSID_InputControl_MultiButtonID},
                                                   {ButtonsFillRow, 1},
                                                   {InputDefaultId, OvID(kGradientTypes[ShapeLinear].id)}},
                                                  kGradientTypes));
    inStart_ = AddInputTagList("Start", "Start",
                               {{LinkDataType, CLSID_DataType_Point},
                                {InputControl, CLSID_InputControl_Offset},
                                {PreviewControl, CLSID_PreviewControl_Point},
                                {InputDefaultX, 0.0},
                                {InputDefaultY, 0.5}});
    inEnd_ = AddInputTagList("End", "End",
                             {{LinkDataType, CLSID_DataType_Point},
                              {InputControl, CLSID_InputControl_Offset},
                              {PreviewControl, CLSID_PreviewControl_Point},
                              {PreviewInputFirst, static_cast<const void *>(inGradientType_)},
                              {InputDefaultX, 1.0},
                              {InputDefaultY, 0.5}});
    inGradient_ = AddInputTagList("Gradient", "Gradient",
                                  {{LinkDataType, CLSID_DataType_Gradient},
                                   {InputControl, CLSID_InputControl_Gradient},
                                   {InputMinAllowed, -100000.0},
                                   {InputMaxAllowed, 100000.0},
                                   {InputSliderLow, 0.0},
                                   {InputSliderHigh, 1.0}});
    inInterpolation_ = AddInputTagList(
        "Interpolation Space", "GradientInterpolationMethod",
        WithChoices(
            {{LinkDataType, CLSID_DataType_OvID}, {InputControl, CLSID_InputControl_MultiButtonID}, {InputNotify, 1}},
            kSpaces));
    inOffset_ = AddInputTagList("Offset", "Offset",
                                {{LinkDataType, CLSID_DataType_Number},
                                 {InputControl, CLSID_InputControl_Screw},
                                 {InputDefault, 0.0},
                                 {InputSliderLow, 0.0},
                                 {InputSliderHigh, 1.0}});
    inRepeat_ = AddInputTagList(
        "Repeat", "Repeat",
        WithChoices({{LinkDataType, CLSID_DataType_OvID}, {InputControl, CLSID_InputControl_MultiButtonID}}, kRepeats));
    inSubPixel_ = AddInputTagList(
        "Sub-Pixel", "SubPixel",
        WithChoices({{LinkDataType, CLSID_DataType_OvID}, {InputControl, CLSID_InputControl_MultiButtonID}},
                    kSubPixels));
    EndControlNest();

    outImage_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});

    // The panel starts as the first notification of the default Type would leave it.
    ShowControlsFor(ModeSolid);
}

Background::~Background() = default;

size_t Background::SizeOf() const {
    return sizeof(*this) + (columnX_.capacity() + columnY_.capacity()) * sizeof(float);
}

void Background::ShowControlsFor(int mode) {
    const bool shown[4] = {mode < ModeGradient, mode == ModeHorizontal || mode == ModeFourCorner,
                           mode == ModeVertical || mode == ModeFourCorner, mode == ModeFourCorner};
    for (int c = 0; c < 4; ++c) {
        for (Input *in : inColor_[c]) in->SetAttrsTagList({{ControlVisible, shown[c]}});
        if (inSeparator_[c]) inSeparator_[c]->SetAttrsTagList({{ControlVisible, shown[c]}});
        inColor_[c][0]->SetAttrsTagList({{ControlLabel, kCornerLabels[mode][c]}});
    }
    for (Input *in :
         {inGradientType_, inStart_, inEnd_, inGradient_, inInterpolation_, inOffset_, inRepeat_, inSubPixel_})
        in->SetAttrsTagList({{ControlVisible, mode == ModeGradient}});
}

void Background::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (const auto *id = dynamic_cast<const IDValue *>(param)) {
        if (in == inType_) {
            ShowControlsFor(ChoiceIndex(id->value, kTypes));
        } else if (in == inInterpolation_) {
            // Keeps the gradient control's preview strip in the space the frame is rendered in.
            const int space = static_cast<int>(kSpaceTypes[ChoiceIndex(id->value, kSpaces)]);
            inGradient_->SetAttrsTagList({{GradientControlColorSpace, space}});
        }
    }
    SourceOperator::NotifyChanged(in, param, time, tags);
}

void Background::ReleaseRequestState() {
    gradient_.Reset();
    std::vector<float>().swap(columnX_);
    std::vector<float>().swap(columnY_);
    image_ = nullptr;
    field_ = false;
}

void Background::Process(Request *req) {
    // Whatever way Process ends, the gradient and the column arrays go.
    struct Release {
        Background *self;
        ~Release() { self->ReleaseRequestState(); }
    } release{this};

    // The frame: aspect from the full size, then proxy, field, and the least size.
    const SourceFrame frame = GetSourceFrame(req);
    const int fullWidth = frame.width, fullHeight = frame.height;
    aspect_ = static_cast<float>(frame.aspectY / frame.aspectX * fullHeight / std::max(fullWidth, 1));
    int width = fullWidth, height = fullHeight;
    if (frame.proxyScale != 1) {
        width /= frame.proxyScale;
        height /= frame.proxyScale;
    }
    field_ = frame.field;
    fieldDominance_ = frame.fieldDominance;
    if (field_) height = static_cast<int>(static_cast<unsigned>(height) >> 1);
    width_ = std::max(width, 1);
    height_ = std::max(height, 2);

    // Colours: only those the mode shows are read; the others copy them.
    mode_ = ChoiceAt(req, inType_, kTypes);
    auto readColor = [&](int corner) {
        for (int ch = 0; ch < 4; ++ch)
            color_[corner][ch] = static_cast<float>(req->GetInputNumber(inColor_[corner][ch], kChannels[ch].def));
    };
    auto copyColor = [&](int to, int from) { std::copy_n(color_[from], 4, color_[to]); };
    readColor(TopLeft);
    if (mode_ & 1)
        readColor(TopRight);
    else
        copyColor(TopRight, TopLeft);
    if (mode_ & 2)
        readColor(BottomLeft);
    else
        copyColor(BottomLeft, TopLeft);
    if (mode_ == ModeFourCorner)
        readColor(BottomRight);
    else
        copyColor(BottomRight, (mode_ & 2) ? BottomLeft : TopRight);

    if (mode_ == ModeGradient) {
        gradient_ = Ref<Gradient>(dynamic_cast<Gradient *>(req->GetInputData(inGradient_)));
        if (!gradient_) gradient_ = MakeRef<Gradient>();
        colorSpace_ = static_cast<int>(kSpaceTypes[ChoiceAt(req, inInterpolation_, kSpaces)]);
        gradientType_ = ChoiceAt(req, inGradientType_, kGradientTypes);
        repeat_ = ChoiceAt(req, inRepeat_, kRepeats);
        offset_ = static_cast<float>(req->GetInputNumber(inOffset_));
        const auto *start = dynamic_cast<const Point *>(req->GetInputData(inStart_));
        const auto *end = dynamic_cast<const Point *>(req->GetInputData(inEnd_));
        start_[0] = static_cast<float>(start ? start->x : 0.0);
        start_[1] = static_cast<float>(start ? start->y : 0.5) * aspect_;
        end_[0] = static_cast<float>(end ? end->x : 1.0);
        end_[1] = static_cast<float>(end ? end->y : 0.5) * aspect_;
    }
    // Fast interactive previews skip the sub-pixel grid.
    subpixel_ = frame.quick ? 1 : ChoiceAt(req, inSubPixel_, kSubPixels) + 1;

    // The output: the frame, narrowed to the domain and the region asked for.
    window_ = ImgRectI(0, 0, width_, height_);
    {
        const AutoImageDoD dod(req);
        const AutoImageRoI roi(req);
        if (dod) window_ &= dod->rect;
        if (roi) window_ &= roi->rect;
    }
    TagList imgTags{{ImgDocument, static_cast<const void *>(GetDoc())},
                    {ImgWidth, width_},
                    {ImgHeight, height_},
                    {ImgXScale, frame.aspectX},
                    {ImgYScale, frame.aspectY},
                    {ImgProxyScale, frame.proxyScale},
                    {ImgQuickMode, frame.quick},
                    {ImgDataWindow, &window_},
                    {ImgValidWindow, &window_},
                    {ImgNoData, req->IsPreCalc()},
                    {ImgForRequest, 1},
                    {ImgTakeWindows, 1}};
    if (frame.depth != 0) imgTags.Add({ImgDepth, frame.depth});
    if (frame.proxyScale != 1) {
        imgTags.Add({ImgFullWidth, std::max(fullWidth, 1)});
        imgTags.Add({ImgFullHeight, std::max(fullHeight, 1)});
    }
    if (const RenderTask *task = req->GetTask())
        imgTags.Add({ImgAbortFlag, static_cast<const void *>(task->AbortFlag())});
    Ref<Image> img = NewImageTagList(imgTags);
    if (!img) {
        req->SetOutputData(outImage_, nullptr);
        return;
    }

    if (!req->IsPreCalc() && !window_.IsNull()) {
        // Fixed point ramps hold only 0..1: other colours go through floats.
        outOfRange_ = false;
        if (!img->IsFloat())
            for (const auto &color : color_)
                for (float v : color) outOfRange_ |= !(v >= 0.0f && v <= 1.0f);

        // Rows are flat when the colours that the mode spreads across a row agree.
        auto same = [this](int p, int q) { return std::equal(color_[p], color_[p] + 4, color_[q]); };
        constant_ = false;
        if (img->IsSimple()) {
            switch (mode_) {
            case ModeSolid:
            case ModeVertical: constant_ = true; break;
            case ModeHorizontal: constant_ = same(TopLeft, TopRight); break;
            case ModeFourCorner: constant_ = same(TopLeft, TopRight) && same(BottomLeft, BottomRight); break;
            default: break;
            }
        }

        if (mode_ == ModeGradient) {
            toEnd_[0] = end_[0] - start_[0];
            toEnd_[1] = end_[1] - start_[1];
            length2_ = toEnd_[0] * toEnd_[0] + toEnd_[1] * toEnd_[1];
            length_ = std::sqrt(length2_);
            if (std::fabs(length_) < kTiny) {
                // One point: the whole frame is the gradient's first colour.
                constant_ = true;
                gradient_->QuickEvaluate(0.0, constantColor_[0], constantColor_[1], constantColor_[2],
                                         constantColor_[3], colorSpace_);
                for (int ch = 0; ch < 3; ++ch) constantColor_[ch] *= constantColor_[3];
            } else {
                invLength2_ = 1.0f / length2_;
                invLength_ = 1.0f / length_;
                const int count = window_.Width();
                columnX_.resize(count);
                columnY_.resize(count);
                for (int i = 0; i < count; ++i) {
                    const float t =
                        (static_cast<float>(window_.x0 + i) / static_cast<float>(width_) - start_[0]) * invLength2_;
                    columnX_[i] = t * toEnd_[0];
                    columnY_[i] = t * toEnd_[1];
                }
            }
        }

        // The device first when the render has one; a field has no device form.
        const bool onDevice = !field_ && IsGPUEnabled(req, true) && RunDevice(req, img.Get());
        if (!onDevice) {
            if (!img->AllocScanLineData()) {
                FailOutOfMemory(req);
                req->SetOutputData(outImage_, nullptr);
                return;
            }
            image_ = img.Get();
            DoMultiProcess(req, window_.Height());
        }
    }

    if (mode_ == ModeGradient)
        img->SetIsOpaque(gradient_->IsOpaque());
    else
        img->SetIsOpaque(
            std::all_of(std::begin(color_), std::end(color_), [](const float *c) { return c[3] >= 1.0f; }));

    if (field_) {
        img->SetScale(img->XScale(), img->YScale() * 2.0);
        TagList fieldTags{{ImgField, fieldDominance_}};
        if (fieldDominance_ != 0) fieldTags.Add({ImgFieldOffset, 0.5 / height_});
        img->SetAttrsTagList(fieldTags);
    }
    req->SetOutputData(outImage_, img.Get());
}

bool Background::RunDevice(Request *req, Image *img) {
    const int window[4] = {window_.x0, window_.x1, window_.y0, window_.y1};
    const int size[2] = {width_ - 1, height_ - 1}, work[2] = {window_.Width(), window_.Height()};
    const int dstOrder = img->IsMask() ? CompOrderAlpha : CompOrderRGBA;
    if (mode_ != ModeGradient) {
        auto block = std::make_shared<BackgroundParams>();
        BackgroundParams &p = *block;
        p.mode = mode_;
        std::copy_n(color_[TopLeft], 4, p.tl);
        std::copy_n(color_[TopRight], 4, p.tr);
        std::copy_n(color_[BottomLeft], 4, p.bl);
        std::copy_n(color_[BottomRight], 4, p.br);
        std::copy_n(window, 4, p.imgDataWindow);
        std::copy_n(size, 2, p.imgSize);
        std::copy_n(work, 2, p.workSize);
        p.dstCompOrder = dstOrder;
        return KROMComputeNode::ExecKernelI(req, "Background", nullptr, BackgroundParamsText, sizeof p, -1, -1, block,
                                            {{"output", img}});
    }

    auto block = std::make_shared<BackgroundGradParams>();
    BackgroundGradParams &p = *block;
    std::copy_n(start_, 2, p.start);
    std::copy_n(end_, 2, p.end);
    p.offset = offset_;
    p.aspect = aspect_;
    p.type = gradientType_;
    p.repeat = repeat_;
    p.subpixel = subpixel_;
    std::copy_n(window, 4, p.imgDataWindow);
    std::copy_n(size, 2, p.imgSize);
    std::copy_n(work, 2, p.workSize);
    p.dstCompOrder = dstOrder;
    // The gradient baked into a 256-entry table, premultiplied like the pixels.
    float table[kGradientTableSize][4];
    for (int k = 0; k < kGradientTableSize; ++k) {
        float *e = table[k];
        gradient_->QuickEvaluate(k * 0.00392156862745098, e[0], e[1], e[2], e[3], colorSpace_);
        for (int ch = 0; ch < 3; ++ch) e[ch] *= e[3];
    }
    RenderTask *task = req->GetTask();
    if (!task) return false;
    std::string failure;
    const bool ok = task->Execute("Background::RunDevice", [&](IDeviceContext *ctx) {
        std::unique_ptr<KROMComputeNode> node =
            KROMComputeNode::Create(ctx, "BackgroundGrad", nullptr, BackgroundGradParamsText, false);
        std::unique_ptr<KROMBuffer> grad = KROMBuffer::CreateImage(ctx, kGradientTableSize, 1, DepthRGBAFlt32, table);
        std::unique_ptr<KROMBuffer> out = KROMBuffer::CreateImage(ctx, img, KROMBufferWrite);
        if (!node->IsValid() || !grad->IsValid() || !out->IsValid()) {
            failure = !node->IsValid() ? node->Error() : (!grad->IsValid() ? grad->Error() : out->Error());
            return false;
        }
        node->SetParamStruct(block, sizeof p);
        node->AddInput("p_Grad", grad.get());
        node->AddOutput("output", out.get());
        node->AddSampler("RowSampler", TextureFilterLinear, TextureAddressClamp, TextureCoordsNormalized);
        node->AddKernelOption(KROMCommonKernelOption, ScriptVal(1.0));
        if (!node->RunSession()) {
            failure = node->Error();
            return false;
        }
        img->SetGPUMem(out->GetGPUMemory(), true);
        return true;
    });
    if (!ok) task->NoteDeviceFailure("BackgroundGrad", failure.empty() ? "failed" : failure);
    return ok;
}

void Background::ProcessChunk(Request *, int chunk) {
    if (!image_ || image_->CheckAbort()) return;
    const int y = window_.y0 + chunk;
    uint8_t *row = image_->ScanLine(y);
    if (!row) return;
    if (mode_ == ModeGradient)
        GradientRow(y, row);
    else
        RampRow(y, row);
}

void Background::RampRow(int y, uint8_t *row) const {
    // v runs from the bottom row (0) to the top row (1); a field's rows sit
    // at every other line of the frame.
    const float v = field_ ? static_cast<float>(2 * y + fieldDominance_) / static_cast<float>(2 * height_ - 1)
                           : static_cast<float>(y) / static_cast<float>(height_ - 1);
    // The colours at the left (u = 0) and right (u = 1) ends of this row.
    float left[4], right[4];
    for (int ch = 0; ch < 4; ++ch) {
        const float *tl = color_[TopLeft], *tr = color_[TopRight];
        const float *bl = color_[BottomLeft], *br = color_[BottomRight];
        switch (mode_) {
        case ModeSolid: left[ch] = right[ch] = tl[ch]; break;
        case ModeHorizontal: left[ch] = tl[ch], right[ch] = tr[ch]; break;
        case ModeVertical: left[ch] = right[ch] = bl[ch] * (1.0f - v) + tl[ch] * v; break;
        default:
            left[ch] = bl[ch] * (1.0f - v) + tl[ch] * v;
            right[ch] = br[ch] * (1.0f - v) + tr[ch] * v;
            break;
        }
    }
    const int count = window_.Width(), x0 = window_.x0;

    if (!image_->IsFloat() && !outOfRange_) {
        // Fixed point: each end scaled so that 1.0 is 65535 << 15, then one
        // truncated step per column; half a unit of the result rounds.
        // The running values are unsigned: the step after the last column may
        // pass 2^31, which must wrap rather than overflow.
        uint32_t value[4], step[4];
        for (int ch = 0; ch < 4; ++ch) {
            const auto a = static_cast<int32_t>(static_cast<double>(left[ch]) * kFixedOne + 0.5);
            const auto b = static_cast<int32_t>(static_cast<double>(right[ch]) * kFixedOne + 0.5);
            const int32_t signedStep = width_ > 1 ? (b - a) / (width_ - 1) : 0;
            step[ch] = static_cast<uint32_t>(signedStep);
            value[ch] = static_cast<uint32_t>(a + kFixedHalf + static_cast<int64_t>(x0) * signedStep);
        }
        StoreRow<Pixel>(*image_, row, count, [&](int) {
            const Pixel p{
                static_cast<uint16_t>(value[0] >> kFixedShift), static_cast<uint16_t>(value[1] >> kFixedShift),
                static_cast<uint16_t>(value[2] >> kFixedShift), static_cast<uint16_t>(value[3] >> kFixedShift)};
            for (int ch = 0; ch < 4; ++ch) value[ch] += step[ch];
            return p;
        });
        return;
    }

    if (constant_) {
        const FltPixel p{left[0], left[1], left[2], left[3]};
        StoreRow<FltPixel>(*image_, row, count, [&](int) { return p; });
        return;
    }
    const float perColumn = width_ > 1 ? 1.0f / static_cast<float>(width_ - 1) : 0.0f;
    StoreRow<FltPixel>(*image_, row, count, [&](int i) {
        const float u = static_cast<float>(x0 + i) * perColumn, w = 1.0f - u;
        return FltPixel{left[0] * w + right[0] * u, left[1] * w + right[1] * u, left[2] * w + right[2] * u,
                        left[3] * w + right[3] * u};
    });
}

inline float Background::GradientPosition(float a, float b, float px, float offY) const {
    switch (gradientType_) {
    case ShapeLinear: return a;
    case ShapeReflect: return std::fabs(a);
    case ShapeSquare: return std::max(std::fabs(a), std::fabs(b));
    case ShapeCross: return std::min(std::fabs(a), std::fabs(b));
    default: break;
    }
    // Radial keeps the raw X position and the aspect-scaled Y offset.
    const float ox = px * invLength_ - start_[0] * invLength_;
    const float r = std::sqrt(ox * ox + offY * offY * invLength2_);
    if (gradientType_ == ShapeRadial) return r;
    const float c = r != 0.0f ? a / r : 0.0f;
    if (c <= -1.0f) return 0.5f;
    if (c >= 1.0f) return 0.0f;
    const float turn = std::acos(c) / kTwoPi;
    return b >= 0.0f ? turn : 1.0f - turn;
}

void Background::GradientRow(int y, uint8_t *row) const {
    const int count = window_.Width(), x0 = window_.x0;
    const bool integer = !image_->IsFloat();
    if (constant_) {
        const FltPixel c{constantColor_[0], constantColor_[1], constantColor_[2], constantColor_[3]};
        if (integer) {
            const Pixel p{UnitToU16(c.R), UnitToU16(c.G), UnitToU16(c.B), UnitToU16(c.A)};
            StoreRow<Pixel>(*image_, row, count, [&](int) { return p; });
        } else {
            StoreRow<FltPixel>(*image_, row, count, [&](int) { return c; });
        }
        return;
    }

    // Sample (i, j) of a pixel lies at (x + j/n, y + i/n)/(W, H); the Y step
    // is added after the aspect scaling.
    const int n = subpixel_;
    const float w = static_cast<float>(width_), h = static_cast<float>(height_), fn = static_cast<float>(n);
    const float rowY = aspect_ * (static_cast<float>(y) / h);
    float offY[5], rowA[5], rowB[5], subX[5], subA[5], subB[5];
    for (int i = 0; i < n; ++i) {
        offY[i] = rowY + static_cast<float>(i) / (fn * h) - start_[1];
        rowA[i] = toEnd_[1] * offY[i] * invLength2_;
        rowB[i] = toEnd_[0] * offY[i] * invLength2_;
        subX[i] = static_cast<float>(i) / (fn * w);
        subA[i] = subX[i] * toEnd_[0] * invLength2_;
        subB[i] = subX[i] * toEnd_[1] * invLength2_;
    }
    const float weight = 1.0f / (fn * fn);

    auto pixelAt = [&](int k) {
        const float px = static_cast<float>(x0 + k) / w;
        float sum[4] = {};
        for (int i = 0; i < n; ++i)
            for (int j = 0; j < n; ++j) {
                // a runs along Start..End, b across it, both in units of its length squared.
                const float a = columnX_[k] + subA[j] + rowA[i];
                const float b = rowB[i] - (columnY_[k] + subB[j]);
                float pos = GradientPosition(a, b, px + subX[j], offY[i]) - offset_;
                if (repeat_ == RepeatRepeat) {
                    pos = std::fmod(pos, 1.0f);
                    if (pos < 0.0f) pos += 1.0f;
                } else if (repeat_ == RepeatPingPong) {
                    pos = std::fmod(pos, 2.0f);
                    if (pos < 0.0f) pos += 2.0f;
                    if (pos > 1.0f) pos = 2.0f - pos;
                }
                // The gradient gives straight colour; pixels hold it premultiplied.
                float r, g, bl, al;
                gradient_->QuickEvaluate(pos, r, g, bl, al, colorSpace_);
                sum[0] += r * al, sum[1] += g * al, sum[2] += bl * al, sum[3] += al;
            }
        return FltPixel{sum[0] * weight, sum[1] * weight, sum[2] * weight, sum[3] * weight};
    };
    if (integer)
        StoreRow<Pixel>(*image_, row, count, [&](int k) {
            const FltPixel f = pixelAt(k);
            return Pixel{UnitToU16(f.R), UnitToU16(f.G), UnitToU16(f.B), UnitToU16(f.A)};
        });
    else
        StoreRow<FltPixel>(*image_, row, count, pixelAt);
}

} // namespace Orvane
