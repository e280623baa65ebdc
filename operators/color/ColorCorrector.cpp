#include "operators/color/ColorCorrector.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <optional>
#include <string>

#include "host/color/ColorCurvesTable.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/PointRows.h"
#include "host/flow/Request.h"
#include "host/image/ColorMatrix.h"
#include "host/image/Image.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/krom/KROMComputeNode.h"
#include "host/krom/PointKernel.h"
#include "host/krom/kernels/ColorKernelParams.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_ColorCorrector("ColorCorrector");
static ClassRegistration<ColorCorrector, ThreadedOperator>
    s_Registration(CLSID_ColorCorrector, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/ColorCorrector"},
                    {RegName, "Color Corrector"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "CC"},
                    {RegHelp, "Full color correction"},
                    {RegIcon, "Icons.Tools.Icons.ColorCorrector"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1},
                    {RegKeepsTimeState, 1},
                    {RegOwnCacheValidity, 1}});

namespace {

using namespace cc;

/// Settings closer than this to their neutral value count as neutral.
constexpr double kEps = 1.1920929e-07;

bool Near(double a, double b) { return std::fabs(a - b) < kEps; }

// The input table: IDs join range, channel and attribute ("MidTonesRedGain"),
// labels join the label words with " - " ("Midtones - Red - Gain"). The third
// range's ID word and label word differ; both are kept as documents know them.
const char *const kRangeIds[] = {"Master", "Shadows", "MidTones", "Highlights"};
const char *const kRangeLabels[] = {"Master", "Shadows", "Midtones", "Highlights"};
const char *const kChannelWords[] = {"RGB", "Red", "Green", "Blue"};
const char *const kSuppressedWords[] = {"Red", "Yellow", "Green", "Cyan", "Blue", "Magenta"};

enum Attribute { Contrast, Gain, Lift, Gamma, Brightness, Low, Mid, High, OutputLow, OutputHigh };
struct AttributeDesc {
    const char *word;
    double neutral, sliderLow, sliderHigh;
    bool multiplies; ///< values combine by product (else by summed offsets from neutral)
    bool nonNegative;
};
const AttributeDesc kAttributeTable[] = {
    {"Contrast", 1.0, 0.0, 2.0, true, true},      {"Gain", 1.0, 0.0, 2.0, true, true},
    {"Lift", 0.0, -1.0, 1.0, false, false},       {"Gamma", 1.0, 0.0, 5.0, true, true},
    {"Brightness", 0.0, -1.0, 1.0, false, false}, {"Low", 0.0, 0.0, 1.0, false, false},
    {"Mid", 1.0, 0.0, 5.0, true, true},           {"High", 1.0, 0.0, 1.0, false, false},
    {"OutputLow", 0.0, 0.0, 1.0, false, false},   {"OutputHigh", 1.0, 0.0, 1.0, false, false},
};
static_assert(std::size(kAttributeTable) == ColorCorrector::kAttributes);

/// Control groups of the combined controls: one wheel, one suppression
/// control per range; one levels and one output levels pair per range and
/// channel.
int WheelGroup(int r) { return 20 + r; }
int SuppressionGroup(int r) { return 30 + r; }
int LevelsGroup(int r, int ch) { return 40 + 2 * (4 * r + ch); }

// ---- colour matrices, in double, 4 by 4 with the offset in the last column ----

struct M4 {
    double m[4][4] = {{1, 0, 0, 0}, {0, 1, 0, 0}, {0, 0, 1, 0}, {0, 0, 0, 1}};
    /// this after `first`: (this * first)
    M4 After(const M4 &first) const {
        M4 out;
        for (int i = 0; i < 4; ++i)
            for (int j = 0; j < 4; ++j) {
                out.m[i][j] = 0;
                for (int k = 0; k < 4; ++k) out.m[i][j] += m[i][k] * first.m[k][j];
            }
        return out;
    }
    bool IsIdentity() const {
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 4; ++j)
                if (!Near(m[i][j], i == j ? 1.0 : 0.0)) return false;
        return true;
    }
    Matrix34 ToFloat() const {
        Matrix34 f;
        for (int i = 0; i < 3; ++i)
            for (int j = 0; j < 4; ++j) f.m[i][j] = static_cast<float>(m[i][j]);
        return f;
    }
};

/// RGB to luma-first (Y, Cb, Cr) and back.
M4 ToLumaFirst() {
    M4 t;
    const double rows[3][3] = {{0.299, 0.587, 0.114}, {-0.16873589, -0.33126414, 0.5}, {0.5, -0.4186876, -0.08131241}};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) t.m[i][j] = rows[i][j];
    return t;
}
M4 FromLumaFirst() {
    M4 t;
    const double rows[3][3] = {{1.0, 0.0, 1.402}, {1.0, -0.34413627, -0.71413624}, {1.0, 1.772, 0.0}};
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j) t.m[i][j] = rows[i][j];
    return t;
}

/// One range's colour step in luma-first space for the dark half (tint grows
/// from 0 at black to full at L = 0.5) or the light half (full at 0.5, 0 at
/// white). The luma passes unchanged; chroma turns by the hue, scales by the
/// saturation and moves by the tint. "Full" tints before turning and scaling,
/// "Better" and "Fast" after, so the tint keeps the angle chosen.
M4 RangeColorStep(double hueDeg, double sat, double tintDeg, double tintLength, int mode, bool lightHalf) {
    const double h = hueDeg * M_PI / 180.0, t = tintDeg * M_PI / 180.0;
    const double c[2][2] = {{sat * std::cos(h), -sat * std::sin(h)}, {sat * std::sin(h), sat * std::cos(h)}};
    double tint[2] = {tintLength * std::cos(t), tintLength * std::sin(t)};
    if (mode == TintFull) {
        const double turned[2] = {c[0][0] * tint[0] + c[0][1] * tint[1], c[1][0] * tint[0] + c[1][1] * tint[1]};
        tint[0] = turned[0], tint[1] = turned[1];
    }
    M4 m;
    for (int i = 0; i < 2; ++i) {
        m.m[1 + i][1] = c[i][0];
        m.m[1 + i][2] = c[i][1];
        // Tint weight 2L below the middle, 2 - 2L above it.
        m.m[1 + i][0] = lightHalf ? -2.0 * tint[i] : 2.0 * tint[i];
        m.m[1 + i][3] = lightHalf ? 2.0 * tint[i] : 0.0;
    }
    return m;
}

/// Factor of a range's suppression sliders at hue u (0..1): the six sliders
/// sit at red 0, yellow 1/6, ... magenta 5/6, turned by the angle, and are
/// joined linearly around the circle.
double SuppressionAt(const double *sliders, double angleDeg, double u) {
    double v = u - angleDeg / 360.0;
    v -= std::floor(v);
    const double pos = v * 6.0;
    const int k = std::min(static_cast<int>(pos), 5);
    const double f = pos - k;
    return sliders[k] * (1.0 - f) + sliders[(k + 1) % 6] * f;
}

bool SuppressionIsNeutral(const double *sliders) {
    return std::all_of(sliders, sliders + 6, [](double v) { return Near(v, 1.0); });
}

/// A block function (const float (*in)[4], float (*out)[4], int n: up to kBlock RGBA pixels, out possibly in)
/// over `count` stored pixels of `depth` (any depth: integer values are worked on as 0..1 and rounded back on
/// store).
template <class Block> void BlockSpan(int depth, const uint8_t *src, uint8_t *dst, int count, const Block &block) {
    const int bpp = FormatOfDepth(depth).BytesPerPixel();
    FltPixel loaded[kBlock];
    float pixels[kBlock][4];
    for (int i = 0; i < count; i += kBlock) {
        const int n = std::min(kBlock, count - i);
        const uint8_t *in = src + static_cast<size_t>(i) * bpp;
        uint8_t *out = dst + static_cast<size_t>(i) * bpp;
        if (depth == DepthRGBAFlt32) { // read from the input row, written to the output row
            block(reinterpret_cast<const float(*)[4]>(in), reinterpret_cast<float(*)[4]>(out), n);
            continue;
        }
        LoadFlt(depth, in, n, loaded);
        for (int k = 0; k < n; ++k)
            pixels[k][0] = loaded[k].R, pixels[k][1] = loaded[k].G, pixels[k][2] = loaded[k].B,
            pixels[k][3] = loaded[k].A;
        block(pixels, pixels, n);
        for (int k = 0; k < n; ++k) loaded[k] = {pixels[k][0], pixels[k][1], pixels[k][2], pixels[k][3]};
        StoreFlt(depth, loaded, n, out);
    }
}

/// CorrectBlock compiled, whole, for the machine's vector width: with AVX2
/// the planes' stages run twice as wide, and multiply-adds fuse (so the two
/// forms may differ in the last bit). The histogram modes keep one form: a
/// last-bit difference there can move a value into the next bin. (Clang does
/// not take `flatten` with clones: its build keeps the calls.)
#if defined(__clang__)
__attribute__((target_clones("arch=x86-64-v3", "default"))) void
#else
__attribute__((flatten, target_clones("arch=x86-64-v3", "default"))) void
#endif
CorrectSpan(const cc::PixelSettings &s, const float (*from)[4], float (*p)[4], int n) {
    cc::CorrectBlock(s, from, p, n);
}

} // namespace

// ---- the panel ----

Input *ColorCorrector::Add(const char *name, const char *id, const TagList &tags, int group, int range, int channel) {
    Input *in = AddInputTagList(name, id, tags);
    if (group != Always) shown_.push_back({in, group, range, channel});
    return in;
}

ColorCorrector::ColorCorrector(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    const TagItem number{LinkDataType, CLSID_DataType_Number};
    auto slider = [&](double def, double low, double high) {
        return TagList{number,
                       {InputControl, CLSID_InputControl_Slider},
                       {InputDefault, def},
                       {InputSliderLow, low},
                       {InputSliderHigh, high}};
    };
    auto checkbox = [&](double def) {
        return TagList{number,
                       {InputControl, CLSID_InputControl_Checkbox},
                       {InputDefault, def},
                       {InputMinAllowed, 0.0},
                       {InputMaxAllowed, 1.0}};
    };
    auto choice = [&](std::initializer_list<const char *> items, double def, bool passive) {
        TagList t{number, {InputControl, CLSID_InputControl_MultiButton}, {InputDefault, def}, {ButtonsFillRow, 1}};
        for (const char *item : items) t.Add({ListAddItem, item});
        if (passive) t.Add({InputPassive, 1}), t.Add({InputNotify, 1});
        return t;
    };
    auto button = [&] {
        return TagList{number,
                       {InputControl, CLSID_InputControl_Button},
                       {InputExternal, 0},
                       {LinkNotSaved, 1}, // a press is an event, not a setting
                       {InputNotify, 1},
                       {InputInitialNotify, 0},
                       {InputPassive, 1}};
    };
    auto histogramDisplay = [&] {
        return TagList{{LinkDataType, CLSID_DataType_Histogram},
                       {InputControl, CLSID_InputControl_Histogram},
                       {InputPassive, 1},
                       {LinkNotSaved, 1}};
    };

    // ---- Correction ----
    AddControlPageTagList("Correction", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Color")}});
    menu_ = Add("Menu", "Menu", choice({"Colors", "Levels", "Histogram", "Suppress"}, 0.0, true), Always);
    correctionRange_ =
        Add("Range", "CorrectionRange", choice({"Master", "Shadows", "Midtones", "Highlights"}, 0.0, true), Always);
    channel_ = Add("Channel", "Channel", choice({"RGB", "Red", "Green", "Blue"}, 0.0, true), Always);

    BeginControlNestTagList("Colors", "ColorsGroup", true, {});
    for (int r = 0; r < kRanges; ++r) {
        const std::string n = std::to_string(r);
        const char *words[] = {"WheelHue", "WheelSaturation", "WheelTintAngle", "WheelTintLength"};
        const char *labels[] = {"Hue", "Saturation", "Tint Angle", "Tint Length"};
        const double defs[] = {0.0, 1.0, 0.0, 0.0}, lows[] = {-180.0, 0.0, 0.0, 0.0},
                     highs[] = {180.0, 2.0, 360.0, 1.0};
        for (int k = 0; k < 4; ++k) {
            TagList t = slider(defs[k], lows[k], highs[k]);
            t.Set({InputControl, CLSID_InputControl_ColorWheel});
            t.Add({ControlGroup, WheelGroup(r)});
            t.Add({ControlMember, k});
            if (k == 1 || k == 3) t.Add({InputMinAllowed, 0.0});
            wheel_[r][k] = Add(labels[k], (words[k] + n).c_str(), t, Colors, r);
        }
        AddInputTagList(("Wheel Range Dummy " + n).c_str(), ("WheelRangeDummy" + n).c_str(),
                        {number,
                         {InputControl, CLSID_InputControl_ColorWheel},
                         {ControlGroup, WheelGroup(r)},
                         {ControlMember, 4},
                         {ControlVisible, 0},
                         {InputPassive, 1}});
        hue_[r] = Add("Hue", ("Hue" + n).c_str(), slider(0.0, -180.0, 180.0), Colors, r);
        TagList sat = slider(1.0, 0.0, 2.0);
        sat.Add({InputMinAllowed, 0.0});
        saturation_[r] = Add("Saturation", ("Saturation" + n).c_str(), sat, Colors, r);
        Add("", ("Blank" + n).c_str(), {number, {InputControl, CLSID_InputControl_Label}, {InputPassive, 1}}, Colors,
            r);
    }
    tintMode_ = Add("Tint Mode", "TintMode", choice({"Fast", "Full", "Better"}, 2.0, false), Colors);
    // The correction sliders of every range and channel, then (in Levels) their levels.
    auto addAttributes = [&](int first, int end, int group) {
        for (int r = 0; r < kRanges; ++r)
            for (int ch = 0; ch < kChannels; ++ch)
                for (int a = first; a < end; ++a) {
                    const AttributeDesc &d = kAttributeTable[a];
                    const std::string id = std::string(kRangeIds[r]) + kChannelWords[ch] + d.word;
                    const std::string label = std::string(kRangeLabels[r]) + " - " + kChannelWords[ch] + " - " + d.word;
                    TagList t = slider(d.neutral, d.sliderLow, d.sliderHigh);
                    if (d.nonNegative) t.Add({InputMinAllowed, 0.0});
                    if (a >= Low) {
                        const bool output = a >= OutputLow;
                        t.Set({InputControl, output ? CLSID_InputControl_LevelsOutput : CLSID_InputControl_Levels});
                        t.Add({ControlGroup, LevelsGroup(r, ch) + (output ? 1 : 0)});
                        t.Add({ControlMember, output ? a - OutputLow : a - Low});
                    }
                    attr_[r][ch][a] = Add(label.c_str(), id.c_str(), t, group, r, ch);
                }
    };
    addAttributes(Contrast, Low, Colors);
    resetColors_ = Add("Reset All Color Changes", "ResetAllColorChanges", button(), Colors);
    EndControlNest();

    BeginControlNestTagList("Levels", "LevelsGroup", true, {});
    Add("Histogram", "Histogram", histogramDisplay(), Levels);
    addAttributes(Low, kAttributes, Levels);
    resetLevels_ = Add("Reset All Levels", "ResetAllLevels", button(), Levels);
    EndControlNest();

    BeginControlNestTagList("Histogram", "HistogramGroup", true, {});
    Add("Histogram", "HistogramReference", histogramDisplay(), Histograms);
    Add("Histogram", "HistogramOutput", histogramDisplay(), Histograms);
    Add("Histogram", "HistogramCurve", histogramDisplay(), Histograms);
    histogramType_ =
        Add("Histogram Type", "HistogramType", choice({"Keep", "Equalize", "Match"}, 0.0, false), Histograms);
    equalizeL_ = Add("Equalize Luminance", "EqualizeLuminance", slider(0.0, 0.0, 1.0), Histograms);
    lockRGB_ = Add("Lock R/G/B", "LockRedGreenBlue", checkbox(1.0), Histograms);
    const char *const rgbWords[] = {"Red", "Green", "Blue"};
    for (int i = 0; i < 3; ++i)
        equalizeRGB_[i] = Add((std::string("Equalize ") + rgbWords[i]).c_str(),
                              (std::string("Equalize") + rgbWords[i]).c_str(), slider(0.0, 0.0, 1.0), Histograms);
    precision_ = Add("Precision", "Precision", choice({"8-bit", "10-bit", "16-bit"}, 2.0, false), Histograms);
    smooth_ = Add("Smooth Correction", "SmoothOutCorrectionCurve", slider(0.0, 0.0, 1.0), Histograms);
    snapshotButton_ = Add("Snapshot Match Time", "SnapshotMatch", button(), Histograms);
    release_ = Add("Release Match", "ReleaseMatch", button(), Histograms);
    Add("Match Rectangle", "MatchNest", {number, {InputControl, CLSID_InputControl_Nest}, {InputPassive, 1}},
        Histograms);
    Add("Show Match Rectangle", "MatchShow", checkbox(0.0), Histograms);
    matchCenter_ = Add("Match Center", "MatchCenter",
                       {{LinkDataType, CLSID_DataType_Point},
                        {InputControl, CLSID_InputControl_Offset},
                        {PreviewControl, CLSID_PreviewControl_Rectangle},
                        {InputDefaultX, 0.5},
                        {InputDefaultY, 0.5}},
                       Histograms);
    matchWidth_ = Add("Match Width", "MatchWidth", slider(1.0, 0.0, 1.0), Histograms);
    matchHeight_ = Add("Match Height", "MatchHeight", slider(1.0, 0.0, 1.0), Histograms);
    // The counts kept by Snapshot Match Time: never shown, saved with the document.
    snapshotData_ =
        AddInputTagList("Match Snapshot", "MatchSnapshotData",
                        {{LinkDataType, CLSID_DataType_ScriptVal}, {InputExternal, 0}, {ControlVisible, 0}});
    resetHistogram_ = Add("Reset All Histogram Changes", "ResetAllHistogramChanges", button(), Histograms);
    EndControlNest();

    BeginControlNestTagList("Suppress", "SuppressGroup", true, {});
    AddInputTagList(
        "Suppression Range", "SuppressionRangeDummy",
        {number, {InputControl, CLSID_InputControl_ColorSuppression}, {ControlVisible, 0}, {InputPassive, 1}});
    for (int r = 0; r < kRanges; ++r) {
        for (int k = 0; k < kSuppressed; ++k) {
            TagList t = slider(1.0, 0.0, 1.0);
            t.Set({InputControl, CLSID_InputControl_ColorSuppression});
            t.Add({ControlGroup, SuppressionGroup(r)});
            t.Add({ControlMember, k});
            t.Add({InputMinAllowed, 0.0});
            suppress_[r][k] =
                Add(kSuppressedWords[k], (kSuppressedWords[k] + std::to_string(r)).c_str(), t, Suppress, r);
        }
        TagList angle = slider(0.0, -180.0, 180.0);
        angle.Set({InputControl, CLSID_InputControl_Screw});
        suppressAngle_[r] =
            Add("Suppression Angle", ("SuppressionAngle" + std::to_string(r)).c_str(), angle, Suppress, r);
    }
    resetSuppression_ = Add("Reset All Suppression", "ResetAllSuppression", button(), Suppress);
    EndControlNest();

    // ---- Ranges ----
    AddControlPageTagList("Ranges", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Ranges")}});
    rangesRange_ = AddInputTagList("Ranges Range", "RangesRange",
                                   choice({"Result", "Shadows", "Midtones", "Highlights"}, 0.0, false));
    AddInputTagList("Channel", "RangesChannel", choice({"Luminance", "Red", "Green", "Blue", "Alpha"}, 0.0, true));
    colorRanges_ =
        AddInputTagList("Color Ranges", "ColorRanges",
                        {{LinkDataType, CLSID_DataType_ColorCurves}, {InputControl, CLSID_InputControl_ColorRanges}});
    renderOutputRange_ =
        AddInputTagList("Output the range you see now as final render", "RenderOutputRange", checkbox(0.0));
    presetSimple_ = AddInputTagList("Simple", "PresetSimpleRanges", button());
    presetSmooth_ = AddInputTagList("Smooth", "PresetSmoothRanges", button());

    // ---- Options ----
    AddControlPageTagList("Options", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Controls")}});
    prePost_ = AddInputTagList("Pre-Divide / Post-Multiply", "PreDividePostMultiply", checkbox(0.0));
    TagList proxy = slider(1.0, 1.0, 8.0);
    proxy.Add({InputInteger, 1});
    proxy.Add({InputMinAllowed, 1.0});
    proxyScale_ = AddInputTagList("Histogram Proxy Scale", "HistogramProxyScale", proxy);
    ignoreTransparent_ = AddInputTagList("Histogram Ignore Transparent", "HistogramIgnoreTransparent", checkbox(0.0));
    processOrder_ = AddInputTagList("Process Order", "ProcessOrder",
                                    choice({"Gamma Before Levels", "Gamma After Levels"}, 0.0, false));

    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    matchReference_ = AddInputTagList(
        "Match Reference", "MatchReference",
        {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 2}, {InputRequired, 0}, {ImageFromRequestOK, 1}});
    matchMask_ = AddInputTagList("Match Mask", "MatchMask",
                                 {{LinkDataType, CLSID_DataType_Mask},
                                  {InputPriority, PriorityMask},
                                  {InputRequired, 0},
                                  {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
    UpdateVisibility();
}

namespace {
int ChoiceOf(const Input *in) {
    const auto *n = dynamic_cast<const Number *>(in->Constant().Get());
    return n ? static_cast<int>(std::lround(n->value)) : 0;
}
} // namespace

void ColorCorrector::UpdateVisibility() {
    const int group = ChoiceOf(menu_), range = ChoiceOf(correctionRange_), channel = ChoiceOf(channel_);
    for (const Shown &s : shown_) {
        const bool on =
            s.group == group && (s.range < 0 || s.range == range) && (s.channel < 0 || s.channel == channel);
        s.in->SetAttrsTagList({{ControlVisible, on ? 1 : 0}});
    }
    // The channel chooser means nothing to the histogram and suppression groups.
    channel_->SetAttrsTagList({{ControlVisible, group == Colors || group == Levels ? 1 : 0}});
    correctionRange_->SetAttrsTagList({{ControlVisible, group != Histograms ? 1 : 0}});
}

void ColorCorrector::ResetGroup(int group) {
    for (const Shown &s : shown_)
        if (s.group == group && !s.in->IsPassive() && s.in->Default()) s.in->SetValue(s.in->Default()->Copy());
}

void ColorCorrector::NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) {
    if (in == menu_ || in == correctionRange_ || in == channel_) UpdateVisibility();
    if (param) {
        if (in == presetSimple_) colorRanges_->SetValue(MakeRef<ColorCurvesTable>(ColorCurvesTable::Preset::Simple));
        if (in == presetSmooth_) colorRanges_->SetValue(MakeRef<ColorCurvesTable>(ColorCurvesTable::Preset::Smooth));
        if (in == resetColors_) ResetGroup(Colors);
        if (in == resetLevels_) ResetGroup(Levels);
        if (in == resetSuppression_) ResetGroup(Suppress);
        if (in == resetHistogram_) ResetGroup(Histograms);
        if (in == snapshotButton_) TakeSnapshot(time);
        if (in == release_) snapshotData_->SetValue(MakeRef<ScriptValue>());
    }
    ThreadedOperator::NotifyChanged(in, param, time, tags);
}

void ColorCorrector::CheckRequest(Request *req) {
    ThreadedOperator::CheckRequest(req);
    const auto *type = dynamic_cast<const Number *>(histogramType_->ValueAt(req->Time()).Get());
    const int mode = type ? static_cast<int>(std::lround(type->value)) : 0;
    if (mode == 0) { // the match reference and mask only feed the histogram modes
        if (req->GetPri() == PriorityMask) req->SetInputData(matchMask_, nullptr);
        if (req->GetPri() == PriorityImage) req->SetInputData(matchReference_, nullptr);
        return;
    }
    if (req->GetPri() != PriorityImage) return;
    // The histograms count the whole images, whatever part of the output is asked for.
    req->SetInputRoI(input_, nullptr);
    const auto *kept = dynamic_cast<const ScriptValue *>(snapshotData_->ValueAt(req->Time()).Get());
    if (mode != 2 || (kept && kept->value.Size() > 0))
        req->SetInputData(matchReference_, nullptr);
    else
        req->SetInputRoI(matchReference_, nullptr);
}

// ---- folding the controls ----

ColorCorrector::Controls ColorCorrector::ReadControls(Request *req) const {
    Controls c;
    for (int r = 0; r < kRanges; ++r) {
        for (int ch = 0; ch < kChannels; ++ch)
            for (int a = 0; a < kAttributes; ++a) c.attr[r][ch][a] = req->GetInputNumber(attr_[r][ch][a]);
        c.hue[r] = req->GetInputNumber(wheel_[r][0]) + req->GetInputNumber(hue_[r]);
        c.saturation[r] = req->GetInputNumber(wheel_[r][1]) * req->GetInputNumber(saturation_[r]);
        c.tintAngle[r] = req->GetInputNumber(wheel_[r][2]);
        c.tintLength[r] = req->GetInputNumber(wheel_[r][3]);
        for (int k = 0; k < kSuppressed; ++k) c.suppress[r][k] = req->GetInputNumber(suppress_[r][k]);
        c.suppressAngle[r] = req->GetInputNumber(suppressAngle_[r]);
    }
    c.tintMode = std::clamp(static_cast<int>(std::lround(req->GetInputNumber(tintMode_))), 0, 2);
    c.gammaAfterLevels = std::lround(req->GetInputNumber(processOrder_)) == 1;
    c.prePost = req->GetInputNumber(prePost_) >= 0.5;
    return c;
}

void ColorCorrector::Fold(const Controls &c, PixelSettings &s, std::vector<Suppression> &tables) {
    s = PixelSettings{};
    s.tintMode = c.tintMode;
    s.gammaAfterLevels = c.gammaAfterLevels;
    s.preDivide = s.postMultiply = c.prePost;
    s.toLumaFirst = ToLumaFirst().ToFloat();
    s.fromLumaFirst = FromLumaFirst().ToFloat();

    auto colorNeutral = [&c](int r) {
        return Near(c.hue[r], 0.0) && Near(c.saturation[r], 1.0) && Near(c.tintLength[r], 0.0);
    };
    auto rangeNeutral = [&](int r) {
        for (int ch = 0; ch < kChannels; ++ch)
            for (int a = 0; a < kAttributes; ++a)
                if (!Near(c.attr[r][ch][a], kAttributeTable[a].neutral)) return false;
        return colorNeutral(r) && SuppressionIsNeutral(c.suppress[r]);
    };
    s.rangesInUse = !rangeNeutral(1) || !rangeNeutral(2) || !rangeNeutral(3);

    tables.assign(3, Suppression{});
    const M4 to = ToLumaFirst(), from = FromLumaFirst();
    for (int k = 0; k < 3; ++k) {
        const int r = k + 1;
        RangeRecord &rec = s.records[k];

        // Colour: the range's step after Master's, per half, in luma-first space.
        if (!colorNeutral(0) || !colorNeutral(r)) {
            M4 half[2];
            for (int light = 0; light < 2; ++light) {
                const M4 master =
                    RangeColorStep(c.hue[0], c.saturation[0], c.tintAngle[0], c.tintLength[0], c.tintMode, light);
                const M4 range =
                    RangeColorStep(c.hue[r], c.saturation[r], c.tintAngle[r], c.tintLength[r], c.tintMode, light);
                half[light] = range.After(master);
            }
            rec.belowBlack = half[0].ToFloat();
            rec.aboveWhite = half[1].ToFloat();
            rec.low = from.After(half[0]).After(to).ToFloat();
            rec.high = from.After(half[1]).After(to).ToFloat();
            rec.doMatrix = !half[0].IsIdentity() || !half[1].IsIdentity();
        }

        // Levels and gamma per channel: the four values of an attribute
        // (Master and range, each RGB and the channel's own) combine by
        // product or by their summed offsets from neutral.
        for (int i = 0; i < 3; ++i) {
            double v[kAttributes];
            for (int a = 0; a < kAttributes; ++a) {
                const AttributeDesc &d = kAttributeTable[a];
                const double parts[4] = {c.attr[0][0][a], c.attr[0][i + 1][a], c.attr[r][0][a], c.attr[r][i + 1][a]};
                v[a] = d.multiplies ? 1.0 : d.neutral;
                for (double p : parts) v[a] = d.multiplies ? v[a] * p : v[a] + (p - d.neutral);
            }
            // In levels, gain and lift, contrast around 0.5 and brightness: one multiply-add.
            double span = v[High] - v[Low];
            if (std::fabs(span) < 1e-6) span = 1e-6;
            const double gainScale = v[Gain] - v[Lift];
            double mul = gainScale / span * v[Contrast];
            double add = ((-v[Low] / span) * gainScale + v[Lift] - 0.5) * v[Contrast] + 0.5 + v[Brightness];
            const double power = v[Gamma] * v[Mid];
            double exponent = power < 1e-5 ? 1e5 : 1.0 / power;
            if (Near(exponent, 1.0)) exponent = 1.0;
            double mul2 = v[OutputHigh] - v[OutputLow], add2 = v[OutputLow];
            if (!c.gammaAfterLevels) { // gamma first, then every multiply-add as one
                add = add * mul2 + add2;
                mul *= mul2;
                mul2 = 1.0, add2 = 0.0;
            }
            rec.mul1[i] = static_cast<float>(mul), rec.add1[i] = static_cast<float>(add);
            rec.mul2[i] = static_cast<float>(mul2), rec.add2[i] = static_cast<float>(add2);
            rec.gamma[i] = static_cast<float>(exponent);
            rec.doLevels1 = rec.doLevels1 || !Near(mul, 1.0) || !Near(add, 0.0);
            rec.doLevels2 = rec.doLevels2 || !Near(mul2, 1.0) || !Near(add2, 0.0);
            rec.doGamma = rec.doGamma || exponent != 1.0;
        }

        // Suppression: Master's factors times the range's, by hue.
        if (!SuppressionIsNeutral(c.suppress[0]) || !SuppressionIsNeutral(c.suppress[r])) {
            Suppression &t = tables[k];
            for (int i = 0; i < Suppression::kSamples; ++i) {
                const double u = (i + 0.5) / Suppression::kSamples;
                t.factor[i] = static_cast<float>(SuppressionAt(c.suppress[0], c.suppressAngle[0], u) *
                                                 SuppressionAt(c.suppress[r], c.suppressAngle[r], u));
            }
            rec.suppression = &t;
        }
    }
}

// ---- the device ----

namespace {
/// The windows of one of the tool's kernel blocks (srcWindow, dstWindow, workSize), as every per-pixel kernel has them.
template <class Params> void SetWindows(Params &p, const Image &src, const Image &dst) {
    struct {
        int inDataWindow[4], outDataWindow[4], workSize[2];
    } w;
    SetPointKernelWindows(w, src, dst);
    std::memcpy(p.srcWindow, w.inDataWindow, sizeof w.inDataWindow);
    std::memcpy(p.dstWindow, w.outDataWindow, sizeof w.outDataWindow);
    std::memcpy(p.workSize, w.workSize, sizeof w.workSize);
}
} // namespace

bool ColorCorrector::RunDevice(Request *req, const Image *src, Image *dst, bool rangeOutput, int shown) {
    const PixelSettings &s = settings_;
    const FltPixel canvas = dst->GetCanvasColor(); // already through the pixel function
    const float canvasColor[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
    constexpr int kWidth = ColorCurvesTable::kSamples;

    // The tables as a small float image: suppression factors by record in rows
    // 0..2, the range weights (and the desaturation weights) in the last row.
    const int rows = rangeOutput ? 1 : 4;
    Ref<Image> tables = NewImageTagList({{ImgWidth, kWidth}, {ImgHeight, rows}, {ImgDepth, DepthRGBAFlt32}});
    if (!tables || !tables->AllocScanLineData()) return false;
    for (int y = 0; y < rows; ++y) std::fill_n(tables->Row<float>(y), 4 * kWidth, 0.f);
    float *weights = tables->Row<float>(rows - 1);
    if (s.curves)
        for (int i = 0; i < kWidth; ++i) std::copy_n(s.curves->Sample(i), 3, weights + 4 * i);

    if (rangeOutput) {
        auto block = std::make_shared<CCProcessRangeParams>();
        CCProcessRangeParams &p = *block;
        std::memcpy(p.defaultP, canvasColor, sizeof canvasColor);
        p.channel = 0, p.selected = shown, p.sampleCount = kWidth, p.invSampleHeight = 1.f, p.sampleWidth = kWidth;
        p.preDivide = s.preDivide;
        SetWindows(p, *src, *dst);
        return KROMComputeNode::ExecKernelI(
            req, "CCProcessRange", nullptr, CCProcessRangeParamsText, sizeof p,
            offsetof(CCProcessRangeParams, srcCompOrder), offsetof(CCProcessRangeParams, dstCompOrder), block,
            {{"input", const_cast<Image *>(src)}, {"tables", tables.Get()}, {"output", dst}});
    }

    auto block = std::make_shared<CCProcessPixelParams>();
    CCProcessPixelParams &p = *block;
    std::memcpy(p.processCanvasColor, canvasColor, sizeof canvasColor);
    auto putMatrix = [&p](int slot, const Matrix34 &m) { std::memcpy(p.colorMat + 12 * slot, m.m, sizeof m.m); };
    bool suppression = false;
    p.doFlag = 0;
    for (int r = 0; r < 3; ++r) {
        const RangeRecord &rec = s.records[r];
        const Matrix34 *mats[4] = {&rec.low, &rec.high, &rec.belowBlack, &rec.aboveWhite};
        for (int k = 0; k < 4; ++k) putMatrix(4 * r + k, *mats[k]);
        float *levels = p.colorMatSimple + 16 * r;
        for (int i = 0; i < 3; ++i) {
            p.gamma[4 * r + i] = rec.gamma[i];
            levels[i] = rec.mul1[i], levels[4 + i] = rec.add1[i];
            levels[8 + i] = rec.mul2[i], levels[12 + i] = rec.add2[i];
        }
        p.gamma[4 * r + 3] = 1.f, levels[3] = levels[11] = 1.f, levels[7] = levels[15] = 0.f;
        p.doFlag |= (rec.doMatrix | rec.doGamma << 1 | rec.doLevels1 << 2 | rec.doLevels2 << 3) << (4 * r);
        p.hasSuppressionTable[r] = rec.suppression != nullptr;
        p.sampleCount[r] = Suppression::kSamples;
        if (const Suppression *t = rec.suppression) {
            suppression = true;
            float *row = tables->Row<float>(r);
            for (int i = 0; i < Suppression::kSamples; ++i) row[4 * i] = t->factor[i];
            const float w[4] = {t->wR, t->wG, t->wB, t->offset};
            for (int i = 0; i < 4; ++i) weights[4 * i + 3] = w[i];
        }
    }
    putMatrix(12, s.toLumaFirst);
    putMatrix(13, s.fromLumaFirst);
    p.orderTintChannel = s.gammaAfterLevels | s.tintMode << 1 | s.rangesInUse << 3;
    p.prePost = s.preDivide | s.postMultiply << 1;
    p.sampleCount[3] = kWidth, p.invSampleHeight = 0.25f, p.sampleWidth = kWidth;
    SetWindows(p, *src, *dst);
    return KROMComputeNode::ExecKernelI(
        req, suppression ? "CCProcessPixel" : "CCProcessPixelSimple", nullptr, CCProcessPixelParamsText, sizeof p,
        offsetof(CCProcessPixelParams, srcCompOrder), offsetof(CCProcessPixelParams, dstCompOrder), block,
        {{"input", const_cast<Image *>(src)}, {"tables", tables.Get()}, {"output", dst}});
}

// ---- the histogram modes ----

namespace {

const char *const kSnapshotChannels[kHistogramChannels] = {"L", "R", "G", "B"};

/// The saved form of a histogram: its size, samples, and per channel the bins that are not empty as the text
/// "bin count bin count ...".
ScriptVal SnapshotToScript(const Histogram &h) {
    ScriptVal t = ScriptVal::Table();
    t.Set("Size", h.Size());
    t.Set("Samples", static_cast<double>(h.Samples()));
    for (int c = 0; c < kHistogramChannels; ++c) {
        std::string text;
        const uint64_t *counts = h.Counts(static_cast<HistogramChannel>(c));
        for (int i = 0; i < h.Size(); ++i)
            if (counts[i]) text += std::to_string(i) + ' ' + std::to_string(counts[i]) + ' ';
        t.Set(kSnapshotChannels[c], text);
    }
    return t;
}

/// The histogram of a saved form; null when it is not one.
std::unique_ptr<Histogram> SnapshotFromScript(const ScriptVal &v) {
    const ScriptVal *size = v.Find("Size"), *samples = v.Find("Samples");
    if (!size || !samples || !size->IsNumber() || !samples->IsNumber() || !(samples->AsNumber() >= 0) ||
        samples->AsNumber() > 9e15)
        return nullptr;
    auto h = std::make_unique<Histogram>(static_cast<int>(size->AsNumber()));
    if (h->Size() != size->AsNumber()) return nullptr;
    std::vector<uint64_t> counts(static_cast<size_t>(kHistogramChannels) * h->Size());
    for (int c = 0; c < kHistogramChannels; ++c) {
        const ScriptVal *text = v.Find(kSnapshotChannels[c]);
        if (!text || !text->IsText()) return nullptr;
        const char *at = text->AsText().c_str();
        for (;;) {
            while (*at == ' ') ++at;
            if (!*at) break;
            char *end;
            const unsigned long long bin = std::strtoull(at, &end, 10);
            if (end == at || *end != ' ') return nullptr;
            at = end;
            const unsigned long long count = std::strtoull(at, &end, 10);
            if (end == at || bin >= static_cast<unsigned long long>(h->Size())) return nullptr;
            at = end;
            counts[static_cast<size_t>(c) * h->Size() + bin] = count;
        }
    }
    if (!h->SetCounts(counts, static_cast<uint64_t>(samples->AsNumber()))) return nullptr;
    return h;
}

} // namespace

HistogramSampling ColorCorrector::Sampling(double proxy, double ignoreTransparent, double prePost) const {
    HistogramSampling s;
    s.proxyStep = static_cast<int>(std::clamp(std::lround(std::isnan(proxy) ? 1.0 : proxy), 1L, 1L << 20));
    s.ignoreTransparent = ignoreTransparent >= 0.5;
    s.divideByAlpha = prePost >= 0.5;
    return s;
}

void ColorCorrector::TakeSnapshot(double time) {
    auto number = [time](const Input *in) {
        const auto *n = dynamic_cast<const Number *>(in->ValueAt(time).Get());
        return n ? n->value : 0.0;
    };
    // The reference of Match at this time: the Match Reference image, or the input itself when none is connected.
    Output *from = matchReference_->Link() ? matchReference_->Link() : input_->Link();
    const Ref<Parameter> value = from ? Evaluate(from, time) : Ref<Parameter>();
    const auto *img = dynamic_cast<const Image *>(value.Get());
    Histogram counted;
    if (!img || !counted.CountImage(*img, img->DataWindow(),
                                    Sampling(number(proxyScale_), number(ignoreTransparent_), number(prePost_)))) {
        if (GetDoc())
            GetDoc()->PrintF(60, "%s: Snapshot Match Time found no image to count at time %g\n", Name().c_str(), time);
        return;
    }
    snapshotData_->SetValue(MakeRef<ScriptValue>(SnapshotToScript(counted)));
}

void ColorCorrector::ProcessHistogram(Request *req, Image *src, bool match) {
    auto fail = [&](const char *why) {
        Fail(req, "%s: %s\n", Name().c_str(), why);
        req->SetOutputData(output_, nullptr);
    };
    const int size = Histogram::SizeForPrecision(static_cast<int>(std::lround(req->GetInputNumber(precision_))));
    const double blendL = std::clamp(req->GetInputNumber(equalizeL_), 0.0, 1.0);
    double blendRGB[3];
    for (int i = 0; i < 3; ++i) blendRGB[i] = std::clamp(req->GetInputNumber(equalizeRGB_[i]), 0.0, 1.0);
    HistogramCorrection choice;
    choice.luminance = blendL > 0, choice.red = blendRGB[0] > 0, choice.green = blendRGB[1] > 0,
    choice.blue = blendRGB[2] > 0;
    choice.lockRGB = req->GetInputNumber(lockRGB_) >= 0.5;
    choice.smooth = req->GetInputNumber(smooth_);
    if (!choice.luminance && !choice.red && !choice.green && !choice.blue) { // every blend at 0: nothing to do
        req->SetOutputData(output_, src);
        return;
    }
    const bool prePost = req->GetInputNumber(prePost_) >= 0.5;
    const HistogramSampling sampling =
        Sampling(req->GetInputNumber(proxyScale_), req->GetInputNumber(ignoreTransparent_), prePost);

    // The reference: the kept snapshot, else the Match Reference image.
    std::optional<Histogram> counted; // the reference's counts, or the snapshot's in fewer bins
    const Histogram *reference = nullptr;
    if (match) {
        Parameter *kept = req->GetInputData(snapshotData_);
        const auto *script = dynamic_cast<const ScriptValue *>(kept);
        if (script && script->value.Size() > 0) {
            if (kept != snapshotValue_.Get()) {
                snapshotValue_ = Ref<Parameter>(kept);
                snapshot_ = SnapshotFromScript(script->value);
            }
            if (!snapshot_) return fail("the kept match snapshot is damaged; take it again with Snapshot Match Time");
            if (snapshot_->Size() < size)
                return fail("the kept match snapshot has fewer bins than the Precision asks for");
            if (snapshot_->Size() != size) counted = snapshot_->Reduced(size);
            reference = counted ? &*counted : snapshot_.get();
        } else if (const auto *ref = dynamic_cast<const Image *>(req->GetInputData(matchReference_))) {
            if (!req->IsPreCalc()) {
                counted.emplace(size);
                if (!counted->CountImage(*ref, ref->DataWindow(), sampling)) {
                    if (!ref->CheckAbort()) fail("the Match Reference image's pixels could not be read");
                    return;
                }
                reference = &*counted;
            }
        } else {
            return fail("Match needs a Match Reference image or a snapshot (Snapshot Match Time)");
        }
    }

    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    if (!dst) return FailOutOfMemory(req);
    if (req->IsPreCalc()) { // no pixels to count: the output's shape only
        req->SetOutputData(output_, dst.Get());
        return;
    }

    // The pre-pass: the input's histogram over the match rectangle, then the curves.
    Histogram &h = histogram_;
    h = Histogram(size);
    const auto *center = dynamic_cast<const Point *>(req->GetInputData(matchCenter_));
    const ImgRectI rect = HistogramMatchRect(src->Width(), src->Height(), src->DataWindow(), center ? center->x : 0.5,
                                             center ? center->y : 0.5, req->GetInputNumber(matchWidth_),
                                             req->GetInputNumber(matchHeight_));
    // The Match Mask limits which of the input's pixels are counted (not which are corrected: that is the
    // effect mask's job).
    HistogramSampling inputSampling = sampling;
    inputSampling.mask = dynamic_cast<const Image *>(req->GetInputData(matchMask_));
    if (!h.CountImage(*src, rect, inputSampling)) {
        if (!src->CheckAbort()) fail("the input's pixels could not be read");
        return;
    }
    if (!match)
        h.Equalize(choice);
    else if (!h.Match(*reference, choice))
        return fail("the match reference has no pixels to count");
    h.BlendCurve(HistogramChannel::L, blendL);
    for (int i = 0; i < 3; ++i) h.BlendCurve(static_cast<HistogramChannel>(1 + i), blendRGB[i]);

    HistogramSettings &s = histogramSettings_;
    s.curves = &h;
    for (int i = 0; i < 3; ++i) {
        const uint16_t *curve = h.Curve(static_cast<HistogramChannel>(1 + i));
        s.rgb[i].resize(h.Size());
        for (int k = 0; k < h.Size(); ++k) s.rgb[i][k] = curve[k] / 65535.f;
    }
    s.luminance = choice.luminance;
    s.preDivide = s.postMultiply = prePost;
    s.toLumaFirst = ToLumaFirst().ToFloat();
    s.fromLumaFirst = FromLumaFirst().ToFloat();

    const int depth = src->Depth();
    uint8_t canvasPixel[16];
    {
        const FltPixel in = src->GetCanvasColor();
        float p[4] = {in.R, in.G, in.B, in.A};
        HistogramPixel(s, p);
        FltPixel canvas{p[0], p[1], p[2], p[3]};
        StoreFlt(depth, &canvas, 1, canvasPixel);
        LoadFlt(depth, canvasPixel, 1, &canvas);
        dst->SetCanvasColor(canvas);
    }
    if (!dst->ValidWindow().IsNull() && !(IsGPUEnabled(req, true) && RunEqualizeDevice(req, src, dst.Get()))) {
        if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return FailOutOfMemory(req);
        const PointRows rows(*src, *dst, canvasPixel);
        DoMultiProcess(
            [&](int i) {
                rows.Row(i, [&](const uint8_t *in, uint8_t *out, int n) {
                    BlockSpan(depth, in, out, n, [&](const float(*from)[4], float(*p)[4], int count) {
                        if (from != p) std::memcpy(p, from, sizeof *p * count);
                        HistogramBlock(s, p, count);
                    });
                });
            },
            rows.Count());
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

bool ColorCorrector::RunEqualizeDevice(Request *req, const Image *src, Image *dst) {
    const HistogramSettings &s = histogramSettings_;
    const Histogram &h = *s.curves;
    // The four curves as one RGBA float texel per bin, rows of up to 1024 bins.
    const int width = std::min(h.Size(), 1024), rows = h.Size() / width;
    Ref<Image> tables = NewImageTagList({{ImgWidth, width}, {ImgHeight, rows}, {ImgDepth, DepthRGBAFlt32}});
    if (!tables || !tables->AllocScanLineData()) return false;
    for (int k = 0; k < h.Size(); ++k) {
        float *texel = tables->Row<float>(k / width) + 4 * (k % width);
        texel[0] = h.GetValueL(k), texel[1] = h.GetValueR(k), texel[2] = h.GetValueG(k), texel[3] = h.GetValueB(k);
    }
    auto block = std::make_shared<CCProcessEqualizeParams>();
    CCProcessEqualizeParams &p = *block;
    const FltPixel canvas = dst->GetCanvasColor(); // already through the pixel function
    const float canvasColor[4] = {canvas.R, canvas.G, canvas.B, canvas.A};
    std::memcpy(p.processCanvasColor, canvasColor, sizeof canvasColor);
    std::memcpy(p.colorMat, s.toLumaFirst.m, sizeof s.toLumaFirst.m);
    std::memcpy(p.colorMat + 12, s.fromLumaFirst.m, sizeof s.fromLumaFirst.m);
    p.histogramBlendL = s.luminance ? 1.f : 0.f;
    p.preDivide = s.preDivide;
    p.shift = h.Shift(), p.sampleCount = h.Size(), p.sampleWidth = width;
    SetWindows(p, *src, *dst);
    return KROMComputeNode::ExecKernelI(
        req, "CCProcessEqualize", nullptr, CCProcessEqualizeParamsText, sizeof p,
        offsetof(CCProcessEqualizeParams, srcCompOrder), offsetof(CCProcessEqualizeParams, dstCompOrder), block,
        {{"input", const_cast<Image *>(src)}, {"tables", tables.Get()}, {"output", dst}});
}

// ---- a frame ----

void ColorCorrector::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (const int mode = static_cast<int>(std::lround(req->GetInputNumber(histogramType_))); mode == 1 || mode == 2)
        return ProcessHistogram(req, src, mode == 2);
    Fold(ReadControls(req), settings_, tables_);
    PixelSettings &s = settings_;
    for (RangeRecord &r : s.records) SetFiniteWithin(s, r);
    const bool rangeOutput = req->GetInputNumber(renderOutputRange_) >= 0.5;
    const int shown = std::clamp(static_cast<int>(std::lround(req->GetInputNumber(rangesRange_))), 0, 3);
    curves_ = Ref<Parameter>(req->GetInputData(colorRanges_));
    s.curves = dynamic_cast<const ColorCurvesTable *>(curves_.Get());
    if (!s.curves && (s.rangesInUse || rangeOutput)) {
        Fail(req, "%s: the Color Ranges input holds no range curves\n", Name().c_str());
        req->SetOutputData(output_, nullptr);
        return;
    }

    // Nothing to do: hand the input on.
    bool work = s.preDivide || rangeOutput;
    for (const RangeRecord &r : s.records)
        work = work || r.doMatrix || r.doGamma || r.doLevels1 || r.doLevels2 || r.suppression;
    if (!work) {
        req->SetOutputData(output_, src);
        return;
    }

    const OvID clipping = GetClippingMode(req);
    Ref<Image> dst = NewPointOutput(req, input_, src, clipping);
    auto outOfMemory = [&] {
        Fail(req, "%s: out of memory (time = %f)\n", Name().c_str(), req->Time());
        req->SetOutputData(output_, nullptr);
    };
    if (!dst) return outOfMemory();

    // Master levels alone (no colour, gamma, suppression, ranges or
    // pre-divide) are linear: one colour matrix, applied by the host.
    const RangeRecord &first = s.records[0];
    if (!rangeOutput && !s.rangesInUse && !s.preDivide && !first.doMatrix && !first.doGamma && !first.suppression) {
        ColorMatrixFull full;
        for (int i = 0; i < 3; ++i) {
            if (first.doLevels1) full.Scale(i, first.mul1[i]).Offset(i, first.add1[i]);
            if (first.doLevels2 && s.gammaAfterLevels) full.Scale(i, first.mul2[i]).Offset(i, first.add2[i]);
        }
        const ColorMatrix m(full); // alpha passes
        const bool precalc = req->IsPreCalc();
        if (!ApplyMatrixTagList(src, dst.Get(),
                                {{MtxColorMatrix, &m},
                                 {WorkOperator, this},
                                 {WorkThreaded, 1},
                                 {WorkUseGPU, !precalc && IsGPUEnabled(req, false)},
                                 {WorkRequest, req}}))
            return outOfMemory();
        if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
        req->SetOutputData(output_, dst.Get());
        return;
    }

    // The canvas colour through the same function, stored once for the spans
    // beyond the input's window.
    const int depth = src->Depth();
    uint8_t canvasPixel[16];
    {
        const FltPixel in = src->GetCanvasColor();
        float p[4] = {in.R, in.G, in.B, in.A};
        if (rangeOutput)
            RangeOutput(s, shown, p);
        else
            CorrectSpan(s, reinterpret_cast<float(*)[4]>(p), reinterpret_cast<float(*)[4]>(p), 1); // as the rows do
        FltPixel canvas{p[0], p[1], p[2], p[3]};
        StoreFlt(depth, &canvas, 1, canvasPixel);
        LoadFlt(depth, canvasPixel, 1, &canvas); // as the depth holds it
        dst->SetCanvasColor(canvas);
    }

    const bool rowsWanted = !req->IsPreCalc() && !dst->ValidWindow().IsNull();
    const bool onDevice = rowsWanted && IsGPUEnabled(req, true) && RunDevice(req, src, dst.Get(), rangeOutput, shown);
    if (rowsWanted && !onDevice) {
        if (!src->DownloadGPUMem() || !dst->AllocScanLineData()) return outOfMemory();
        const PointRows rows(*src, *dst, canvasPixel);
        DoMultiProcess(
            [&](int i) {
                rows.Row(i, [&](const uint8_t *in, uint8_t *out, int n) {
                    BlockSpan(depth, in, out, n, [&](const float(*from)[4], float(*p)[4], int count) {
                        if (!rangeOutput) return CorrectSpan(s, from, p, count);
                        if (from != p) std::memcpy(p, from, sizeof *p * count);
                        for (int k = 0; k < count; ++k) RangeOutput(s, shown, p[k]);
                    });
                });
            },
            rows.Count());
    }
    if (clipping != ClippingMode_None) dst->CopyCanvasColor(src);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
