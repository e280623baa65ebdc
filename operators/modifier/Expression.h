#pragma once
// Expression: a modifier that makes a number and a point from expressions
// over nine number inputs (n1..n9), nine point inputs (p1x, p1y .. p9x,
// p9y), the time, and the inputs at other times (n1_at(t), p1x_at(t) ..).
// The language is the host Parser's (docs/EXPRESSIONS.md); each name field
// gives its input one more name in the expressions ("speed" for n1,
// "target" for p1: targetx, targety, and their _at forms).
//
// The expressions run in a sandboxed script state of the tool's own, made on
// first use; their text is translated and compiled again only when it (or a
// name) changes. rand() repeats for a given seed and time.
//
// Thread safety: as ThreadedOperator. The script state belongs to the tool's
// render thread (one request at a time); _at forms evaluate other tools on it.
#include <memory>
#include <string>

#include "host/flow/Operator.h"
#include "operators/modifier/VariableFields.h"

namespace Orvane {

class ScriptState;

class Expression : public ThreadedOperator {
public:
    static constexpr int kInputs = 9;

    Expression(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Expression() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;
    std::string GetTitle() const override;

private:
    /// Translates and loads the expressions when their text or the names changed; false when the state cannot be
    /// had (its console line written).
    bool Prepare(Request *req);
    /// _numat(k, t) (Axis -1), _ptxat(k, t) (0) and _ptyat(k, t) (1): input k at time t.
    template <int Axis> static double InputAt(void *self, const double *args, int count);

    Input *numberIn_[kInputs], *pointIn_[kInputs];
    VariableFields numberFields_, pointFields_;
    Input *numberExpr_, *pointExprX_, *pointExprY_, *randomSeed_, *randomize_;
    Output *numberResult_, *pointResult_;

    std::unique_ptr<ScriptState> state_;
    std::string loaded_;               // the texts and names the state holds, joined
    const Request *current_ = nullptr; // the request being processed, for the _at functions
};

} // namespace Orvane
