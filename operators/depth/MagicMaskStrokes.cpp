#include "operators/depth/MagicMaskStrokes.h"

#include <cmath>
#include <limits>
#include <stdexcept>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "operators/frame/Registration.h"

namespace Orvane {

const OvID CLSID_DataType_MagicMaskStrokes("MagicMaskStrokes");

static ClassRegistration<MagicMaskStrokes, Parameter> s_Registration(CLSID_DataType_MagicMaskStrokes, &CLSID_Parameter,
                                                                     {{RegTypeFlags, RegFamilyDataType},
                                                                      {RegClassName, "MagicMaskStrokes"}});

namespace {

constexpr const char *kPosKey = "PosStrokes";
constexpr const char *kNegKey = "NegStrokes";

std::vector<MagicMaskStrokes::Stroke> ReadStrokes(const ScriptVal *list, const char *key) {
    std::vector<MagicMaskStrokes::Stroke> strokes;
    if (!list || list->IsNil()) return strokes;
    if (!list->IsTable()) throw std::invalid_argument(std::string(key) + " is not a table");
    for (size_t i = 1; i <= list->ArrayLength(); ++i) {
        const ScriptVal *stroke = list->At(i);
        if (!stroke->IsTable() || stroke->ArrayLength() % 2 != 0)
            throw std::invalid_argument(std::string(key) + ": a stroke is a table of x, y pairs");
        MagicMaskStrokes::Stroke points;
        for (size_t k = 1; k <= stroke->ArrayLength(); ++k) {
            const ScriptVal *v = stroke->At(k);
            if (!v->IsNumber() || !std::isfinite(v->AsNumber()))
                throw std::invalid_argument(std::string(key) + ": a point is not a pair of numbers");
            points.push_back(v->AsNumber());
        }
        if (!points.empty()) strokes.push_back(std::move(points));
    }
    return strokes;
}

ScriptVal WriteStrokes(const std::vector<MagicMaskStrokes::Stroke> &strokes) {
    ScriptVal list = ScriptVal::Table();
    for (const auto &stroke : strokes) {
        ScriptVal points = ScriptVal::Table();
        for (double v : stroke) points.Append(ScriptVal(v));
        list.Append(std::move(points));
    }
    return list;
}

uint64_t HashStrokes(uint64_t h, const std::vector<MagicMaskStrokes::Stroke> &strokes) {
    h = HashMix(h, strokes.size());
    for (const auto &stroke : strokes) {
        h = HashMix(h, stroke.size());
        for (double v : stroke) h = HashMix(h, HashDouble(v));
    }
    return h;
}

} // namespace

MagicMaskStrokes::MagicMaskStrokes(const Registry *, const ScriptVal &args, const TagList &) {
    if (args.IsNil()) return;
    if (!args.IsTable()) throw std::invalid_argument("strokes are a table");
    pos = ReadStrokes(args.Find(kPosKey), kPosKey);
    neg = ReadStrokes(args.Find(kNegKey), kNegKey);
}

ScriptVal MagicMaskStrokes::ToScript() const {
    ScriptVal v = ScriptVal::Table();
    v.Set(kPosKey, WriteStrokes(pos));
    v.Set(kNegKey, WriteStrokes(neg));
    return v;
}

bool MagicMaskStrokes::Equals(const Parameter &other) const {
    const auto *o = dynamic_cast<const MagicMaskStrokes *>(&other);
    return o && o->pos == pos && o->neg == neg;
}

uint64_t MagicMaskStrokes::Hash() const { return HashStrokes(HashStrokes(HashBytes(kPosKey, 10), pos), neg); }

Ref<Parameter> MagicMaskStrokes::Copy() const {
    Ref<MagicMaskStrokes> copy = MakeRef<MagicMaskStrokes>();
    copy->pos = pos;
    copy->neg = neg;
    return copy;
}

size_t MagicMaskStrokes::SizeOf() const {
    size_t bytes = sizeof(*this);
    for (const auto *list : {&pos, &neg})
        for (const auto &stroke : *list) bytes += sizeof(Stroke) + stroke.size() * sizeof(double);
    return bytes;
}

std::vector<float> MagicMaskStrokes::PixelList(const std::vector<Stroke> &strokes, int width, int height) {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    std::vector<float> list;
    for (const auto &stroke : strokes) {
        for (size_t i = 0; i + 1 < stroke.size(); i += 2) {
            list.push_back(static_cast<float>(stroke[i] * width));
            list.push_back(static_cast<float>(stroke[i + 1] * height));
        }
        list.push_back(nan);
        list.push_back(nan);
    }
    return list;
}

} // namespace Orvane
