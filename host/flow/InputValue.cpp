#include "host/flow/InputValue.h"

#include <cctype>
#include <cmath>
#include <stdexcept>

#include "host/core/ScriptVal.h"
#include "host/core/Suggest.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/shape/PolyLine.h"

namespace Orvane {
namespace {

bool IsWordType(OvID t) { return t == CLSID_DataType_OvID || t == CLSID_DataType_Text || t == CLSID_DataType_Clip; }

bool TakesWords(const Input *in) {
    return IsWordType(in->DataType()) || (in->DataType() == CLSID_DataType_Number && !InputChoices(in).empty());
}

std::string NumberText(double v) { return ScriptVal(v).ToText(); }

// Names match without regard to case and spaces: "soft light" finds "Soft Light".
std::string Folded(const std::string &s) {
    std::string out;
    for (char c : s)
        if (c != ' ') out += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return out;
}

std::string ChoiceList(const std::vector<InputChoice> &choices, bool numbered) {
    std::string out;
    for (size_t i = 0; i < choices.size(); ++i) {
        if (i) out += ", ";
        out += numbered ? std::to_string(i) + " " + choices[i].label : choices[i].id;
    }
    return out;
}

// The entry a name stands for: an exact ID first, then an ID or label folded.
int FindChoice(const std::vector<InputChoice> &choices, const std::string &name) {
    for (size_t i = 0; i < choices.size(); ++i)
        if (!choices[i].id.empty() && choices[i].id == name) return static_cast<int>(i);
    const std::string folded = Folded(name);
    for (size_t i = 0; i < choices.size(); ++i)
        if (Folded(choices[i].id) == folded || Folded(choices[i].label) == folded) return static_cast<int>(i);
    return -1;
}

std::string NoSuchChoice(const std::vector<InputChoice> &choices, const std::string &name, bool numbered) {
    std::vector<std::string> names;
    for (const InputChoice &c : choices) names.push_back(numbered || c.id.empty() ? c.label : c.id);
    const std::string hint = DidYouMean(name, names);
    return "no choice '" + name + "'" + (hint.empty() ? " (choices: " + ChoiceList(choices, numbered) + ")" : hint);
}

// A number checked against the input's hard limits and wholeness. Returns the problem ("" when none); `out` is the
// value to set: the number itself, or brought inside the limits when lenient. Not finite: nothing to set.
std::string CheckNumber(const Input *in, double v, bool lenient, double &out, bool &usable) {
    usable = std::isfinite(v);
    if (!usable) return "expects a finite number, got " + NumberText(v);
    const TagList &t = in->Tags();
    std::string problem;
    if (t.Has(InputMinAllowed) && v < t.GetDouble(InputMinAllowed))
        problem = NumberText(v) + " is below the least allowed value " + NumberText(t.GetDouble(InputMinAllowed));
    else if (t.Has(InputMaxAllowed) && v > t.GetDouble(InputMaxAllowed))
        problem = NumberText(v) + " is above the greatest allowed value " + NumberText(t.GetDouble(InputMaxAllowed));
    else if (in->IsInteger() && v != std::round(v))
        problem = NumberText(v) + " is not a whole number";
    usable = problem.empty() || lenient;
    out = v; // Input::SetValue applies the limits and rounding
    return problem;
}

// A list choice given by number or by name, as its number.
std::string CheckListChoice(const Input *in, const std::vector<InputChoice> &choices, const ScriptVal &v, bool lenient,
                            double &out, bool &usable) {
    usable = false;
    if (v.IsText()) {
        const int at = FindChoice(choices, v.AsText());
        if (at < 0) return NoSuchChoice(choices, v.AsText(), true);
        out = at;
        usable = true;
        return {};
    }
    if (!v.IsNumber()) return std::string("expects ") + ExpectedValueText(in) + ", got " + v.ToText();
    const double n = v.AsNumber();
    if (std::isfinite(n) && n == std::round(n) && n >= 0 && n < static_cast<double>(choices.size())) {
        out = n;
        usable = true;
        return {};
    }
    usable = lenient && std::isfinite(n);
    out = n;
    return NumberText(n) + " is not a choice (" + ChoiceList(choices, true) + ")";
}

// The parameter a script value gives the input, checked; null when nothing can be set. `problem` says what is
// wrong (also when lenient still gives a parameter).
Ref<Parameter> CheckedParameter(const Input *in, const ScriptVal &v, bool lenient, std::string &problem) {
    const OvID type = in->DataType();
    const std::vector<InputChoice> choices = InputChoices(in);
    bool usable = true;
    if (type == CLSID_DataType_Number) {
        double n = 0;
        if (!choices.empty() && (v.IsText() || v.IsNumber()))
            problem = CheckListChoice(in, choices, v, lenient, n, usable);
        else if (v.IsNumber())
            problem = CheckNumber(in, v.AsNumber(), lenient, n, usable);
        else if (v.IsBool())
            n = v.AsBool() ? 1.0 : 0.0;
        else
            usable = false;
        if (!usable && problem.empty())
            problem = std::string("expects ") + ExpectedValueText(in) + ", got " + v.ToText();
        return usable ? MakeRef<Number>(n) : nullptr;
    }
    if (type == CLSID_DataType_Point && v.IsTable() && v.ArrayLength() == 2 && v.At(1)->IsNumber() &&
        v.At(2)->IsNumber()) {
        double x = 0, y = 0;
        bool usableY = true;
        problem = CheckNumber(in, v.At(1)->AsNumber(), lenient, x, usable);
        const std::string problemY = CheckNumber(in, v.At(2)->AsNumber(), lenient, y, usableY);
        if (problem.empty()) problem = problemY;
        return usable && usableY ? MakeRef<Point>(x, y) : nullptr;
    }
    if (type == CLSID_DataType_OvID && v.IsText() && !choices.empty()) {
        const int at = FindChoice(choices, v.AsText());
        for (const TagItem *accepted : in->Tags().FindAll(ListAcceptedId))
            if (at < 0 && v.AsText() == accepted->AsID().Text()) return MakeRef<IDValue>(OvID(v.AsText()));
        if (at < 0) {
            problem = NoSuchChoice(choices, v.AsText(), false);
            return nullptr;
        }
        return MakeRef<IDValue>(OvID(choices[at].id.empty() ? choices[at].label : choices[at].id));
    }
    if (PolyLine::IsPolyLineType(type)) return PolyLine::FromScript(type, v, problem);
    Ref<Parameter> value = ParameterFromScript(type, v);
    if (!value) problem = std::string("expects ") + ExpectedValueText(in) + ", got " + v.ToText();
    return value;
}

/// "expects a number or Tool.Output": what the input takes, a link included.
std::string ExpectsOrLink(const Input *in) {
    const std::string what = std::string("expects ") + ExpectedValueText(in);
    return IsImageDataType(in->DataType()) ? what : what + " or Tool.Output";
}

std::vector<std::string> ToolNames(const OrvaneDoc &doc) {
    std::vector<std::string> names;
    for (const Operator *op : doc.Tools()) names.push_back(op->Name());
    return names;
}

std::string ApplyLink(OrvaneDoc &doc, Input *in, const std::string &path, const InputValueOptions &options) {
    const size_t dot = path.rfind('.');
    if (dot == std::string::npos || dot == 0 || dot + 1 == path.size())
        return "a link must name Tool.Output, not '" + path + "'";
    const std::string toolName = path.substr(0, dot), outputName = path.substr(dot + 1);
    Operator *tool = doc.FindTool(toolName);
    if (!tool) {
        if (options.keepUnknownLinks && doc.KeptTools().Find(toolName)) {
            in->Disconnect();
            in->SetUnresolvedLink(path);
            return "";
        }
        return "links to an unknown tool '" + toolName + "'" + DidYouMean(toolName, ToolNames(doc));
    }
    Output *out = tool->FindOutput(outputName.c_str());
    if (!out) {
        std::vector<std::string> outputs;
        for (const auto &o : tool->Outputs()) outputs.push_back(o->ID().Text());
        return "tool '" + toolName + "' has no output '" + outputName + "'" + DidYouMean(outputName, outputs);
    }
    if (!in->ConnectTo(out, options.checkLoops))
        return "cannot take " + path + " (expects " + ExpectedValueText(in) + ", or the link would make a loop)";
    in->SetUnresolvedLink({});
    return "";
}

} // namespace

std::vector<InputChoice> InputChoices(const Input *in) {
    const auto labels = in->Tags().FindAll(ListAddItem);
    const auto ids = in->Tags().FindAll(ListItemId);
    std::vector<InputChoice> choices;
    for (size_t i = 0; i < labels.size(); ++i)
        choices.push_back({labels[i]->AsText(), i < ids.size() ? ids[i]->AsID().Text() : std::string()});
    return choices;
}

const char *ExpectedValueText(const Input *in) {
    const OvID t = in->DataType();
    if (t == CLSID_DataType_Number) return InputChoices(in).empty() ? "a number" : "a choice (number or name)";
    if (t == CLSID_DataType_Point) return "a point { x, y }";
    if (t == CLSID_DataType_Text) return "a text";
    if (t == CLSID_DataType_OvID) return "an ID (text)";
    if (t == CLSID_DataType_Gradient) return "a gradient";
    if (t == CLSID_DataType_ColorCurves) return "range curves (ColorCurves { Shadows = ..., Highlights = ... })";
    if (t == CLSID_DataType_LookUpTable) return "a curve (LookUpTable { Points = { { x, y }, ... } })";
    if (t == CLSID_DataType_Clip) return "a file name (text)";
    if (PolyLine::IsPolyLineType(t)) return "a polyline (Polyline { \"x y\", ... })";
    if (IsImageDataType(t)) return "a link to an image output (Tool.Output)";
    return "a value of its own type";
}

std::string ApplyInputValue(OrvaneDoc &doc, Input *in, const ScriptVal &v, const InputValueOptions &options) {
    const OvID type = in->DataType();
    if (v.IsRef()) {
        // A bare word is a name for inputs that take names, never a link.
        if (v.AsText().find('.') == std::string::npos) {
            if (TakesWords(in)) return ApplyInputValue(doc, in, ScriptVal(v.AsText()), options);
            return ExpectsOrLink(in) + ", not '" + v.AsText() + "'";
        }
        return ApplyLink(doc, in, v.AsText(), options);
    }
    if (IsImageDataType(type)) return std::string("expects ") + ExpectedValueText(in);
    std::string problem;
    if (v.IsTable() && v.ClassName() == "Curve") {
        AnimCurve curve;
        const bool read = AnimCurve::FromScript(
            v,
            [&](const ScriptVal &k) {
                std::string keyProblem;
                Ref<Parameter> p = CheckedParameter(in, k, options.lenient, keyProblem);
                if (problem.empty() && !keyProblem.empty()) problem = "a key: " + keyProblem;
                return p;
            },
            curve);
        if (!read) {
            if (problem.empty())
                problem = std::string("malformed curve: keys must be { time, value } with ") + ExpectedValueText(in);
            return problem;
        }
        if (!in->SetCurve(std::move(curve))) return "cannot be animated";
        in->SetUnresolvedLink({});
        return problem;
    }
    Ref<Parameter> value = CheckedParameter(in, v, options.lenient, problem);
    if (!value) return problem;
    if (!in->SetValue(value)) return std::string("expects ") + ExpectedValueText(in) + ", got " + v.ToText();
    in->SetUnresolvedLink({});
    return problem;
}

ScriptVal InputValueFromText(const OrvaneDoc &doc, const Input *in, const std::string &text) {
    const bool words = IsWordType(in->DataType());
    ScriptVal value;
    try {
        value = ScriptVal::FromText(text);
    } catch (const ScriptParseError &e) {
        if (TakesWords(in)) return ScriptVal(text);
        throw std::invalid_argument(ExpectsOrLink(in) + ", not '" + text + "' (" + e.Message() + ")");
    }
    if (words && !value.IsText()) {
        // Text as it stands, unless it names an existing tool's output.
        const bool link = value.IsRef() && text.find('.') != std::string::npos &&
                          doc.FindTool(value.AsText().substr(0, value.AsText().rfind('.')));
        if (!link) return ScriptVal(text);
    }
    return value;
}

} // namespace Orvane
