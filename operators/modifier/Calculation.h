#pragma once
// Calculation: a modifier that makes a number from two others, a first and
// a second operand, by one of eighteen operations (add, divide, power, a
// random offset and so on). Each operand can be read at another time: at
// scale * t + offset, for a driven value that runs slower, faster or later
// than the frame.
//
// The random operations draw once from a Mersenne Twister seeded from the
// time alone (CalculationSeed), so a frame always gives the same value.
//
// Thread safety: as ThreadedOperator; Process keeps nothing between requests.
#include <cstdint>

#include "host/flow/Operator.h"

namespace Orvane {

/// The operations of the Operator input, in list order.
enum class CalcOp {
    Add,
    Subtract,
    Multiply,
    Divide,
    DivideReversed,
    SubtractReversed,
    Minimum,
    Maximum,
    Average,
    FirstOnly,
    SecondOnly,
    AddRandom,
    MultiplyRandom,
    Modulo,
    ModuloReversed,
    Difference,
    Power,
    PowerReversed,
    Count
};

/// The seed of the random draw at time `t`:
///   a = int64(trunc(t * 100000)), b = a ^ 0x78654232 (on 64 bits),
///   c = int64(trunc(double(b) * -t)), seed = uint32(c ^ 0x74529812) (the low 32 bits).
/// The conversions to int64 saturate at its limits, and a time that is not finite counts as 0.
uint32_t CalculationSeed(double t);

/// The result of `op` on `a` and `b`, with `r` the random draw (0..32767) for the random operations.
double Calculate(CalcOp op, double a, double b, int r);

class Calculation : public ThreadedOperator {
public:
    Calculation(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    std::string GetTitle() const override;

private:
    Input *first_, *operator_, *second_;
    Input *firstScale_, *firstOffset_, *secondScale_, *secondOffset_;
    Output *result_;
};

} // namespace Orvane
