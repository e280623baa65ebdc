#include "operators/color/CineonLog.h"

#include <cmath>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Request.h"
#include "operators/color/PointColor.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_CineonLog("CineonLog");
static ClassRegistration<CineonLog, ThreadedOperator>
    s_Registration(CLSID_CineonLog, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                    {RegPath, "Tools/Color/CineonLog"},
                    {RegName, "Cineon Log"},
                    {RegCategory, "Color"},
                    {RegAbbreviation, "Log"},
                    {RegHelp, "Converts between logarithmic film encoding and linear"},
                    {RegIcon, "Icons.Tools.Icons.CineonLog"},
                    {RegNoMotionBlurControls, 1},
                    {RegSupportsRoI, 1},
                    {RegProcessesCanvasColor, 1},
                    {RegSupportsDoD, 1},
                    {RegSupportsGPUImages, 1}});

namespace {

/// The curve over one pixel or a block of them: float rows through the host's
/// row functions, integer codes from the table (other values, such as a
/// canvas colour between codes, straight from the curve).
struct LogCurve {
    GamutCurve curve;
    bool toLinear;
    const std::vector<double> *table; ///< by 16-bit code; empty for float images
    int step;                         ///< codes held: multiples of this (257 for 8 bits)

    double Value(double v) const {
        const double code = v * 65535.0;
        if (!table->empty() && code >= 0.0 && code <= 65535.0 && code == std::floor(code) &&
            static_cast<int>(code) % step == 0)
            return (*table)[static_cast<size_t>(code)];
        return toLinear ? GamutToLinear(curve, v) : GamutFromLinear(curve, v);
    }
    void operator()(float (*px)[4], int n) const {
        if (toLinear)
            GamutRowToLinear(curve, &px[0][0], n);
        else
            GamutRowFromLinear(curve, &px[0][0], n);
    }
    void operator()(float *p) const { (*this)(reinterpret_cast<float(*)[4]>(p), 1); }
    void operator()(double *p) const {
        for (int c = 0; c < 3; ++c) p[c] = Value(p[c]);
    }
};

} // namespace

CineonLog::CineonLog(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    const CineonLogParams defaults;
    AddControlPageTagList("Controls", {});
    mode_ = AddInputTagList("Mode", "Mode",
                            {{LinkDataType, CLSID_DataType_Number},
                             {InputControl, CLSID_InputControl_MultiButton},
                             {InputDefault, 0.0},
                             {InputMinAllowed, 0.0},
                             {InputMaxAllowed, 1.0},
                             {InputInteger, 1},
                             {ButtonsFillRow, 1},
                             {ListAddItem, "Log to Lin"},
                             {ListAddItem, "Lin to Log"}});
    auto level = [this](const char *name, const char *id, double def, double low, double high, double most) {
        return AddInputTagList(name, id,
                               {{LinkDataType, CLSID_DataType_Number},
                                {InputControl, CLSID_InputControl_Slider},
                                {InputDefault, def},
                                {InputMinAllowed, 0.0},
                                {InputMaxAllowed, most},
                                {InputSliderLow, low},
                                {InputSliderHigh, high}});
    };
    black_ = level("Black Level", "BlackLevel", defaults.black, 0.0, 1023.0, 1023.0);
    white_ = level("White Level", "WhiteLevel", defaults.white, 0.0, 1023.0, 1023.0);
    filmGamma_ = AddInputTagList("Film Gamma", "FilmGamma",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Slider},
                                  {InputDefault, defaults.filmGamma},
                                  {InputMinAllowed, 0.01},
                                  {InputSliderLow, 0.1},
                                  {InputSliderHigh, 2.0}});
    softClip_ = level("Soft Clip", "SoftClip", defaults.softClip, 0.0, 100.0, 1023.0);
    input_ = AddInputTagList("Input", "Input",
                             {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}, {ImageFromRequestOK, 1}});
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void CineonLog::Process(Request *req) {
    auto *src = dynamic_cast<Image *>(req->GetInputData(input_));
    if (!src) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    LogCurve fn{};
    fn.curve.space = GamutSpace::CineonLog;
    fn.curve.log = {req->GetInputNumber(black_), req->GetInputNumber(white_), req->GetInputNumber(filmGamma_),
                    req->GetInputNumber(softClip_)};
    fn.toLinear = req->GetInputNumber(mode_) < 0.5;
    const CineonLogParams &p = fn.curve.log;
    if (!(p.white > p.black)) {
        Fail(req, "%s: the white level (%g) must lie above the black level (%g)\n", Name().c_str(), p.white, p.black);
        req->SetOutputData(output_, nullptr);
        return;
    }
    // Integer images hold at most 65536 codes (256 for 8 bits): each is worked out once.
    std::vector<double> table;
    fn.step = FormatOfDepth(src->Depth()).bytesPerComponent == 1 ? 257 : 1;
    if (!src->IsFloat() && !req->IsPreCalc()) {
        table.resize(65536);
        for (int code = 0; code <= 65535; code += fn.step) {
            const double v = code / 65535.0;
            table[static_cast<size_t>(code)] = fn.toLinear ? GamutToLinear(fn.curve, v) : GamutFromLinear(fn.curve, v);
        }
    }
    fn.table = &table;
    Ref<Image> dst = RunPointColor(*this, req, input_, src, fn);
    if (!dst) FailOutOfMemory(req);
    req->SetOutputData(output_, dst.Get());
}

} // namespace Orvane
