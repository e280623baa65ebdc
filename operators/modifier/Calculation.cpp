#include "operators/modifier/Calculation.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "host/core/MtRand.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/InputAt.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"
#include "operators/modifier/Modifier.h"

namespace Orvane {

static const OvID CLSID_Calculation("Calculation");
static ClassRegistration<Calculation, ThreadedOperator>
    s_Registration(CLSID_Calculation, &CLSID_ThreadedOperator,
                   {{RegTypeFlags, RegKindOperator | RegKindModifier},
                    {RegClassName, "Calculation"},
                    {RegPath, "Tools/Modifiers/Calculation"},
                    {RegName, "Calculation"},
                    {RegHelp, "Drives a number from two others by an arithmetic operation"},
                    {RegKeepsTimeState, 1},
                    {RegOutputType, "Number"}});

namespace {

// The labels of the Operator list, in CalcOp order.
constexpr const char *kOperatorLabels[] = {"Add",
                                           "Subtract (First - Second)",
                                           "Multiply",
                                           "Divide   (First / Second)",
                                           "Divide   (Second / First)",
                                           "Subtract (Second - First)",
                                           "Minimum",
                                           "Maximum",
                                           "Average",
                                           "First Only",
                                           "Second Only",
                                           "Add Random",
                                           "Multiply Random",
                                           "Modulo (First % Second)",
                                           "Modulo (Second % First)",
                                           "Difference",
                                           "Power (First ^ Second)",
                                           "Power (Second ^ First)"};
static_assert(std::size(kOperatorLabels) == static_cast<size_t>(CalcOp::Count));

/// trunc(v) as int64, saturated at its limits; 0 for NaN.
int64_t TruncToInt64(double v) {
    if (std::isnan(v)) return 0;
    constexpr double limit = 9223372036854775808.0; // 2^63
    if (v >= limit) return std::numeric_limits<int64_t>::max();
    if (v <= -limit) return std::numeric_limits<int64_t>::min();
    return static_cast<int64_t>(std::trunc(v));
}

TagList OperandTags(int link) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Screw},
            {LinkMain, link},
            {InputDefault, 0.0}};
}

TagList TimeTags(double def) {
    return {{LinkDataType, CLSID_DataType_Number}, {InputControl, CLSID_InputControl_Screw}, {InputDefault, def}};
}

/// Asks `operand` at s * t + o, marked as time-shifted, unless the scale is 1 and the offset 0.
void ShiftOperand(Request *req, Input *operand, const Input *scale, const Input *offset) {
    const double t = req->Time();
    const double s = InputNumberAt(req, scale, t, 1.0), o = InputNumberAt(req, offset, t, 0.0);
    if (s == 1.0 && o == 0.0) return;
    req->SetInputTime(operand, s * t + o);
    req->SetInputFlags(operand, ReqFlagTimeShifted);
}

} // namespace

uint32_t CalculationSeed(double t) {
    if (!std::isfinite(t)) t = 0.0;
    const int64_t a = TruncToInt64(t * 100000.0);
    const int64_t b = a ^ int64_t(0x78654232);
    const int64_t c = TruncToInt64(static_cast<double>(b) * -t);
    return static_cast<uint32_t>(static_cast<uint64_t>(c ^ int64_t(0x74529812)));
}

double Calculate(CalcOp op, double a, double b, int r) {
    switch (op) {
    case CalcOp::Add: return a + b;
    case CalcOp::Subtract: return a - b;
    case CalcOp::Multiply: return a * b;
    case CalcOp::Divide: return b != 0.0 ? a / b : 0.0;
    case CalcOp::DivideReversed: return a != 0.0 ? b / a : 0.0;
    case CalcOp::SubtractReversed: return b - a;
    case CalcOp::Minimum: return std::min(a, b);
    case CalcOp::Maximum: return std::max(a, b);
    case CalcOp::Average: return (a + b) * 0.5;
    case CalcOp::FirstOnly: return a;
    case CalcOp::SecondOnly: return b;
    case CalcOp::AddRandom: return b * r / double(MtRand::kMax) + a;
    case CalcOp::MultiplyRandom: return b * r * a / double(MtRand::kMax);
    case CalcOp::Modulo: return b != 0.0 ? std::fmod(a, b) : 0.0;
    case CalcOp::ModuloReversed: return a != 0.0 ? std::fmod(b, a) : 0.0;
    case CalcOp::Difference: return std::fabs(a - b);
    case CalcOp::Power: return std::pow(a, b);
    case CalcOp::PowerReversed: return std::pow(b, a);
    case CalcOp::Count: break;
    }
    return 0.0;
}

Calculation::Calculation(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    AddControlPageTagList("Calc", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Calculation")}});
    first_ = AddInputTagList("First Operand", "FirstOperand", OperandTags(1));
    TagList ops{{LinkDataType, CLSID_DataType_Number},
                {InputControl, CLSID_InputControl_Combo},
                {InputInteger, 1},
                {InputMinAllowed, 0.0},
                {InputMaxAllowed, double(int(CalcOp::Count) - 1)},
                {InputDefault, 0.0}};
    for (const char *label : kOperatorLabels) ops.Add({ListAddItem, label});
    operator_ = AddInputTagList("Operator", "Operator", ops);
    second_ = AddInputTagList("Second Operand", "SecondOperand", OperandTags(2));

    AddControlPageTagList("Time", {{PageIcon, static_cast<const void *>("Icons.Tools.Tabs.Time")}});
    firstScale_ = AddInputTagList("First Operand Time Scale", "FirstOperandTimeScale", TimeTags(1.0));
    firstOffset_ = AddInputTagList("First Operand Time Offset", "FirstOperandTimeOffset", TimeTags(0.0));
    secondScale_ = AddInputTagList("Second Operand Time Scale", "SecondOperandTimeScale", TimeTags(1.0));
    secondOffset_ = AddInputTagList("Second Operand Time Offset", "SecondOperandTimeOffset", TimeTags(0.0));

    result_ = AddOutputTagList("Result", "Result", {{LinkDataType, CLSID_DataType_Number}});
}

void Calculation::CheckRequest(Request *req) {
    // The operands are fetched after this, at the level they share with the time controls, so those are read here
    // directly (at the request's time).
    ShiftOperand(req, first_, firstScale_, firstOffset_);
    ShiftOperand(req, second_, secondScale_, secondOffset_);
    ThreadedOperator::CheckRequest(req);
}

void Calculation::Process(Request *req) {
    const double a = req->GetInputNumber(first_, 0.0), b = req->GetInputNumber(second_, 0.0);
    const int op = std::clamp(static_cast<int>(std::lround(req->GetInputNumber(operator_, 0.0))), 0,
                              static_cast<int>(CalcOp::Count) - 1);
    int r = 0;
    if (op == int(CalcOp::AddRandom) || op == int(CalcOp::MultiplyRandom)) {
        MtRand random(CalculationSeed(req->Time()));
        r = random.mt_rand();
    }
    req->SetOutputData(result_, MakeRef<Number>(Calculate(static_cast<CalcOp>(op), a, b, r)));
}

std::string Calculation::GetTitle() const {
    const std::string title = DrivenTitle("Calculation", {result_});
    return title.empty() ? Name() : title;
}

} // namespace Orvane
