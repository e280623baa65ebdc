#include "operators/color/AutoGain.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "operators/color/ColorGain.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_AutoGain("AutoGain");
static ClassRegistration<AutoGain, ThreadedOperator>
    s_Registration(CLSID_AutoGain, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/AutoGain"},
                    {RegName, "Auto Gain"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "AG"},
                    {RegHelp, "Stretches the image range to fill black to white"},
                    {RegIcon, "Icons.Tools.Icons.AutoGain"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegSupportsDoD, 1}});

namespace {

constexpr double kEps = 1.1920929e-07;

/// The lowest and highest finite values of red, green, blue and alpha.
struct Extent {
    float lo[4], hi[4];
    Extent() {
        std::fill(lo, lo + 4, std::numeric_limits<float>::infinity());
        std::fill(hi, hi + 4, -std::numeric_limits<float>::infinity());
    }
    void Add(const Extent &e) {
        for (int c = 0; c < 4; ++c) lo[c] = std::min(lo[c], e.lo[c]), hi[c] = std::max(hi[c], e.hi[c]);
    }
};

/// Adds n pixels (red, green, blue, alpha) to `e`; values that are not
/// finite are left out. Written without branches, so that it vectorises.
void AddPixels(Extent &e, const float *px, int n) {
    for (int c = 0; c < 4; ++c) {
        float lo = e.lo[c], hi = e.hi[c];
        for (int k = 0; k < n; ++k) {
            const float v = px[4 * k + c];
            const bool finite = std::fabs(v) <= std::numeric_limits<float>::max(); // false for NaN too
            lo = std::min(lo, finite ? v : lo);
            hi = std::max(hi, finite ? v : hi);
        }
        e.lo[c] = lo, e.hi[c] = hi;
    }
}

/// The extent of every pixel of `src`'s data window (not its canvas), a row
/// per chunk, combined in row order.
Extent Measure(ThreadedOperator &op, const Image &src) {
    constexpr int kBlock = 256;
    const ImgRectI dw = src.DataWindow();
    std::vector<Extent> rows(static_cast<size_t>(std::max(0, dw.Height())));
    const bool direct = src.Depth() == DepthRGBAFlt32;
    op.DoMultiProcess(
        [&](int i) {
            if (src.CheckAbort()) return;
            const uint8_t *row = src.ScanLine(dw.y0 + i);
            Extent &e = rows[static_cast<size_t>(i)];
            if (direct) return AddPixels(e, reinterpret_cast<const float *>(row), dw.Width());
            const int bpp = src.BytesPerPixel();
            FltPixel px[kBlock];
            for (int x = 0; x < dw.Width(); x += kBlock) {
                const int n = std::min(kBlock, dw.Width() - x);
                LoadFlt(src.Depth(), row + static_cast<size_t>(x) * bpp, n, px);
                float flat[kBlock][4];
                for (int k = 0; k < n; ++k)
                    flat[k][0] = px[k].R, flat[k][1] = px[k].G, flat[k][2] = px[k].B, flat[k][3] = px[k].A;
                AddPixels(e, flat[0], n);
            }
        },
        static_cast<int>(rows.size()));
    Extent all;
    for (const Extent &e : rows) all.Add(e);
    return all;
}

} // namespace

AutoGain::AutoGain(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Controls", {});
    auto end = [this](const char *name, int member, double def) {
        return AddInputTagList(name, name,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Range},
                                {ControlGroup, 1},
                                {ControlMember, member},
                                {InputDefault, def},
                                {InputSliderLow, 0.0},
                                {InputSliderHigh, 1.0}});
    };
    low_ = end("Low", 0, 0.0);
    high_ = end("High", 1, 1.0);
    channels_ = AddInputTagList("Channels", "Channels",
                                {{LinkDataType, CLSID_DataType_Number},
                                 {InputControl, CLSID_InputControl_MultiButton},
                                 {InputDefault, 0.0},
                                 {ButtonsFillRow, 1},
                                 {ListAddItem, "Together"},
                                 {ListAddItem, "Separate"}});
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

AutoGain::~AutoGain() = default;

void AutoGain::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    // The measurement needs every pixel of the input, whatever is asked of the output.
    if (req->GetPri() == input_->Priority() && !(req->GetFlags() & ReqFlagSkipRoI)) req->SetInputRoI(input_, nullptr);
}

void AutoGain::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    auto outOfMemory = [&] {
        FailOutOfMemory(req);
        req->SetOutputData(output_, nullptr);
    };
    if (req->IsPreCalc()) { // no pixels to measure: the windows only
        Ref<Image> dst = NewPointOutput(req, input_, src, GetClippingMode(req));
        if (!dst) return outOfMemory();
        dst->CopyCanvasColor(src);
        req->SetOutputData(output_, dst.Get());
        return;
    }
    if (!src->DownloadGPUMem()) return outOfMemory();
    const Extent e = src->HasScanLineData() ? Measure(*this, *src) : Extent();
    const double low = req->GetInputNumber(low_), high = req->GetInputNumber(high_);
    const bool separate = std::lround(req->GetInputNumber(channels_)) == 1;
    // The channels to stretch, and the extent each is stretched from.
    const int first = src->IsMask() ? 3 : 0, last = src->IsMask() ? 4 : 3;
    Extent from;
    for (int c = first; c < last; ++c)
        if (separate)
            from.lo[c] = e.lo[c], from.hi[c] = e.hi[c];
        else
            for (int k = first; k < last; ++k)
                from.lo[c] = std::min(from.lo[c], e.lo[k]), from.hi[c] = std::max(from.hi[c], e.hi[k]);
    ColorMatrixFull m;
    bool identity = true;
    for (int c = first; c < last; ++c) {
        const double width = static_cast<double>(from.hi[c]) - from.lo[c];
        if (!(width > kEps)) continue; // flat, or nothing measured: left as it is
        const double scale = (high - low) / width, offset = low - from.lo[c] * scale;
        m.Scale(c, scale).Offset(c, offset);
        identity = identity && std::fabs(scale - 1.0) < kEps && std::fabs(offset) < kEps;
    }
    if (identity) {
        req->SetOutputData(output_, src);
        return;
    }
    Ref<Image> dst = RunGainMatrix(*this, req, input_, src, m);
    if (!dst) return outOfMemory();
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
