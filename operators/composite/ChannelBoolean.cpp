#include "operators/composite/ChannelBoolean.h"

#include <algorithm>
#include <cmath>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ChannelBoolean("ChannelBoolean");
static ClassRegistration<ChannelBoolean, ThreadedOperator>
    s_Registration(CLSID_ChannelBoolean, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool | RegKindTwoImage},
                    {RegPath, "Tools/Composite/ChannelBoolean"},
                    {RegName, "Channel Booleans"},
                    {RegCategory, "Composite"},
                    {RegAbbreviation, "Bol"},
                    {RegHelp, "Combines and copies the channels of two images"},
                    {RegIcon, "Icons.Tools.Icons.ChannelBoolean"},
                    {RegAlias, "shuffle"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

constexpr const char *kChannels[4] = {"Red", "Green", "Blue", "Alpha"};
constexpr const char *kSources[] = {"Red BG",  "Green BG", "Blue BG", "Alpha BG", "Red FG",       "Green FG",
                                    "Blue FG", "Alpha FG", "Black",   "White",    "Luminance BG", "Luminance FG"};
constexpr const char *kOperations[] = {"Copy",    "Add",     "Subtract",   "Multiply", "Divide",
                                       "Minimum", "Maximum", "Difference", "Average"};
constexpr int kSourceCount = static_cast<int>(std::size(kSources));
constexpr int kOperationCount = static_cast<int>(std::size(kOperations));

/// The request's choices; the function of one Background and one Foreground
/// pixel, written into the Background's.
struct Mix {
    int source[4];
    int operation;

    template <class T> void operator()(T *bg, const T *fg) const {
        using C = ChannelBoolean;
        T s[4];
        for (int c = 0; c < 4; ++c) {
            const int k = source[c];
            s[c] = k <= C::AlphaBG   ? bg[k]
                   : k <= C::AlphaFG ? fg[k - C::RedFG]
                   : k == C::Black   ? T(0)
                   : k == C::White   ? T(1)
                   : k == C::LumaBG  ? T(0.2126) * bg[0] + T(0.7152) * bg[1] + T(0.0722) * bg[2]
                                     : T(0.2126) * fg[0] + T(0.7152) * fg[1] + T(0.0722) * fg[2];
        }
        for (int c = 0; c < 4; ++c) {
            const T b = bg[c], v = s[c];
            switch (operation) {
            case C::Copy: bg[c] = v; break;
            case C::Add: bg[c] = b + v; break;
            case C::Subtract: bg[c] = b - v; break;
            case C::Multiply: bg[c] = b * v; break;
            case C::Divide: bg[c] = v == T(0) ? T(0) : b / v; break;
            case C::Minimum: bg[c] = std::min(b, v); break;
            case C::Maximum: bg[c] = std::max(b, v); break;
            case C::Difference: bg[c] = std::fabs(b - v); break;
            default: bg[c] = (b + v) / T(2); break;
            }
        }
    }
};

} // namespace

ChannelBoolean::ChannelBoolean(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Channels", {});
    TagList operation{{LinkDataType, CLSID_DataType_Number},
                      {InputControl, CLSID_InputControl_Combo},
                      {InputDefault, 0.0},
                      {InputMinAllowed, 0.0},
                      {InputMaxAllowed, kOperationCount - 1.0},
                      {InputInteger, 1}};
    for (const char *item : kOperations) operation.Add({ListAddItem, item});
    operation_ = AddInputTagList("Operation", "Operation", operation);
    // By default each channel is the Background's own: the tool changes nothing until a source is picked.
    for (int c = 0; c < 4; ++c) {
        const std::string id = std::string("To") + kChannels[c];
        TagList to{{LinkDataType, CLSID_DataType_Number},  {InputControl, CLSID_InputControl_Combo},
                   {InputDefault, static_cast<double>(c)}, {InputMinAllowed, 0.0},
                   {InputMaxAllowed, kSourceCount - 1.0},  {InputInteger, 1}};
        for (const char *item : kSources) to.Add({ListAddItem, item});
        to_[c] = AddInputTagList((std::string("To ") + kChannels[c]).c_str(), id.c_str(), to);
    }
    background_ = AddInputTagList(
        "Background", "Background",
        {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}, {ImageBackground, 1}});
    foreground_ = AddInputTagList("Foreground", "Foreground",
                                  {{LinkDataType, CLSID_DataType_Image},
                                   {LinkMain, 2},
                                   {InputRequired, 0},
                                   {ImageFromRequestOK, 1},
                                   {ImageForeground, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void ChannelBoolean::Process(Request *req) {
    auto *bg = dynamic_cast<Image *>(req->GetInputData(background_));
    auto *fg = dynamic_cast<Image *>(req->GetInputData(foreground_));
    Mix mix{};
    mix.operation = static_cast<int>(std::lround(req->GetInputNumber(operation_)));
    bool identity = mix.operation == Copy;
    for (int c = 0; c < 4; ++c) {
        mix.source[c] = std::clamp(static_cast<int>(std::lround(req->GetInputNumber(to_[c]))), 0, kSourceCount - 1);
        identity = identity && mix.source[c] == c;
    }
    if (!bg || identity) {
        req->SetOutputData(output_, bg);
        return;
    }

    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, background_, bg, clipping);
    bool ok = dst != nullptr;
    const int depth = bg->Depth();
    if (ok) {
        const FltPixel bc = bg->GetCanvasColor(), fc = fg ? fg->GetCanvasColor() : FltPixel{};
        WithUnit(depth, [&](auto zero) {
            using T = decltype(zero);
            T b[4] = {bc.R, bc.G, bc.B, bc.A};
            const T f[4] = {fc.R, fc.G, fc.B, fc.A};
            mix(b, f);
            dst->SetCanvasColor(FltPixel{static_cast<float>(b[0]), static_cast<float>(b[1]), static_cast<float>(b[2]),
                                         static_cast<float>(b[3])});
        });
    }
    if (ok && !req->IsPreCalc() && !dst->ValidWindow().IsNull()) {
        ok = bg->DownloadGPUMem() && (!fg || fg->DownloadGPUMem()) && dst->AllocScanLineData();
        if (ok) {
            const ImgRectI out = dst->DataWindow();
            const size_t bpp = static_cast<size_t>(dst->BytesPerPixel());
            DoMultiProcess(
                [&](int i) {
                    const int y = out.y0 + i;
                    uint8_t *row = dst->ScanLine(y);
                    if (!row || dst->CheckAbort()) return;
                    WithUnit(depth, [&](auto zero) {
                        using T = decltype(zero);
                        T b[kPointBlock][4], f[kPointBlock][4];
                        for (int x = out.x0; x < out.x1; x += kPointBlock) {
                            const int n = std::min(kPointBlock, out.x1 - x);
                            ReadUnitSpan(bg, y, x, x + n, b);
                            ReadUnitSpan(fg, y, x, x + n, f);
                            for (int k = 0; k < n; ++k) mix(b[k], f[k]);
                            StoreUnits(depth, b, n, row + static_cast<size_t>(x - out.x0) * bpp, NoDither{});
                        }
                    });
                },
                out.Height());
        }
    }
    if (!ok) {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(bg);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
