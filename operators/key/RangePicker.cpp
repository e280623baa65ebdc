#include "operators/key/RangePicker.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "operators/key/KeyFunctions.h"

namespace Orvane {

namespace {

/// What a pick adds on each side of a picked value.
constexpr float kPickMargin = 3.0517578e-5f;
/// Limits closer than this to their defaults count as them.
constexpr double kDefaultTolerance = 1.1920928955078125e-7;

} // namespace

void RangeInputs::Add(Operator &op, const char *const ids[8], int firstGroup) {
    static const char *const kAxes[4] = {"Red", "Green", "Blue", "Luminance"};
    for (int i = 0; i < 4; ++i)
        for (int member = 0; member < 2; ++member) {
            TagList t{{LinkDataType, CLSID_DataType_Number},
                      {InputControl, CLSID_InputControl_Range},
                      {ControlGroup, firstGroup + i},
                      {ControlMember, member},
                      {InputDefault, member ? 1.0 : 0.0},
                      {InputSliderLow, 0.0},
                      {InputSliderHigh, 1.0}};
            if (member == 0) t.Add({ControlRowLabel, kAxes[i]});
            const std::string label = std::string(kAxes[i]) + (member ? " High" : " Low");
            (member ? high : low)[i] = op.AddInputTagList(label.c_str(), ids[4 * member + i], t);
        }
}

void RangeInputs::Reset() const {
    for (int i = 0; i < 4; ++i) low[i]->ResetValue(), high[i]->ResetValue();
}

bool RangeInputs::Read(Request *req, float lowOut[4], float highOut[4]) const {
    bool defaults = true;
    for (int i = 0; i < 4; ++i) {
        lowOut[i] = static_cast<float>(req->GetInputNumber(low[i], 0.0));
        highOut[i] = static_cast<float>(req->GetInputNumber(high[i], 1.0));
        defaults = defaults && lowOut[i] == 0.f && highOut[i] == 1.f;
    }
    return defaults;
}

RangePicker::RangePicker(Operator &owner, const char *lockId, const char *const rangeIds[8], const char *undoName)
    : owner_(owner), lockId_(lockId), rangeIds_(rangeIds), undoName_(undoName) {}

bool RangePicker::Select(const TagList &tags) {
    const Input *lock = owner_.FindInput(lockId_);
    const auto *locked = lock ? dynamic_cast<const Number *>(lock->ValueAt(TimeUndefined).Get()) : nullptr;
    if (locked && locked->value >= 0.5) {
        if (OrvaneDoc *doc = owner_.GetDoc())
            doc->PrintF(ConsoleWarning, "%s: Lock Color Picking is on\n", owner_.Name().c_str());
        return false;
    }
    const std::lock_guard<std::mutex> hold(pickLock_);
    pick_ = PickRect::FromTags(tags);
    return true;
}

void RangePicker::Apply(const Image &src, int keyType, const float low[4], const float high[4]) {
    std::optional<PickRect> pick;
    {
        const std::lock_guard<std::mutex> hold(pickLock_);
        pick.swap(pick_);
    }
    OrvaneDoc *doc = owner_.GetDoc();
    if (!pick || !doc) return;
    float picked[8];
    std::copy(low, low + 4, picked), std::copy(high, high + 4, picked + 4);
    const ImgRectI rect = PickRectPixels(src, pick->left, pick->bottom, pick->right, pick->top);
    if (!PickRanges(src, rect, keyType, pick->subtract, picked, picked + 4)) return;
    doc->DocExecute(
        [name = owner_.Name(), ids = rangeIds_, picked](OrvaneDoc &d) {
            if (Operator *tool = d.FindTool(name))
                for (int i = 0; i < 8; ++i)
                    if (Input *in = tool->FindInput(ids[i])) in->SetValue(MakeRef<Number>(picked[i]));
        },
        undoName_);
}

ImgRectI PickRectPixels(const Image &img, double left, double bottom, double right, double top) {
    // A fraction made from a whole pixel may come back a hair below it.
    auto pixel = [](double f, int size) {
        return static_cast<int>(std::clamp(std::floor(f * size + 1e-6), -1e9, 1e9));
    };
    return ImgRectI(pixel(left, img.Width()), pixel(bottom, img.Height()), pixel(right, img.Width()) + 1,
                    pixel(top, img.Height()) + 1);
}

bool PickRanges(const Image &img, const ImgRectI &rect, int keyType, bool subtract, float low[4], float high[4]) {
    const ImgRectI area = rect & img.DataWindow();
    if (area.IsNull() || !img.DownloadGPUMem() || !img.HasScanLineData()) return false;
    bool defaults = true;
    for (int i = 0; i < 4; ++i)
        defaults = defaults && std::fabs(low[i]) < kDefaultTolerance && std::fabs(high[i] - 1.f) < kDefaultTolerance;
    if (!subtract && defaults)
        for (int i = 0; i < 4; ++i) low[i] = std::numeric_limits<float>::infinity(), high[i] = -low[i];
    std::vector<FltPixel> row(static_cast<size_t>(area.Width()));
    for (int y = area.y0; y < area.y1; ++y) {
        LoadFlt(img.Depth(), img.PixelAddress(area.x0, y), area.Width(), row.data());
        for (const FltPixel &p : row) {
            float v[4];
            ChromaKeyAxes(keyType, p.R, p.G, p.B, v);
            for (int i = 0; i < 4; ++i) {
                if (!subtract) {
                    low[i] = std::min(low[i], v[i] - kPickMargin);
                    high[i] = std::max(high[i], v[i] + kPickMargin);
                } else if (v[i] > low[i] && v[i] < high[i]) {
                    (low[i] + high[i] > 2.f * v[i] ? low[i] : high[i]) = v[i];
                }
            }
        }
    }
    return true;
}

} // namespace Orvane
