#pragma once
// The switches: one tool that hands on the value of one of its inputs,
// chosen by Source (a zero-based index, rounded), as it is: the same object
// with one more reference, never a copy. So one class serves every kind of
// value that travels on its links:
//   Switch       images (and pending transforms, which pass unflattened);
//   Switch3D     3D scenes;
//   MtlSwitch3D  material graphs.
//
// Inputs: Source, NumberOfInputs (page "Config"), and per position i an
// Input%i link with a Name%i text. Raising NumberOfInputs adds positions
// (from its notification, so a document that sets it before naming Input5
// finds Input5); lowering it hides the positions beyond, which keep their
// links.
//
// Only the chosen input is rendered: at the fetch level of the inputs,
// CheckRequest clears every other one. Source is fetched one level earlier
// so that its value (animated or linked) is known there.
//
// Thread safety: NotifyChanged runs on the main thread, between renders;
// CheckRequest and Process on the tool's render thread and only read the
// members.
#include <vector>

#include "host/flow/Operator.h"

namespace Orvane {

class SwitchBase : public ThreadedOperator {
public:
    /// `dataType`: what travels on the Input%i links and the output.
    SwitchBase(const Registry *reg, const ScriptVal &args, const TagList &tags, OvID dataType);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

    /// The positions made so far (some may be hidden).
    int Positions() const { return static_cast<int>(positions_.size()); }

private:
    struct Position {
        Input *input;
        Input *name;
    };
    /// Makes positions up to `count` and shows exactly the first `count`.
    void SetCount(int count);
    /// Source's entries: each shown position by its name, else the tool linked to it.
    void NameSources();

    OvID dataType_;
    Input *source_;
    Input *numberOfInputs_;
    Output *output_;
    int configPage_;
    std::vector<Position> positions_;
    int shown_ = 0;
};

class Switch : public SwitchBase {
public:
    Switch(const Registry *reg, const ScriptVal &args, const TagList &tags);
};

class Switch3D : public SwitchBase {
public:
    Switch3D(const Registry *reg, const ScriptVal &args, const TagList &tags);
};

class MtlSwitch3D : public SwitchBase {
public:
    MtlSwitch3D(const Registry *reg, const ScriptVal &args, const TagList &tags);
};

} // namespace Orvane
