// orvane stroke: adds a stroke to a tool's strokes (the Magic Mask's object
// marks), as drawing on the picture does, and saves the flow. The points are
// frame fractions, x to the right and y up from the bottom-left corner, so
// they mean the same at any resolution.
#include <cstdio>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/Suggest.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane::Cli {
namespace {

constexpr const char *kStrokesInput = "Strokes";

/// The strokes' document form with `points` appended to `list` ("PosStrokes" or "NegStrokes").
ScriptVal WithStroke(const Parameter *current, const char *list, const std::vector<double> &points) {
    ScriptVal v = current ? current->ToScript() : ScriptVal::Table();
    if (!v.IsTable()) v = ScriptVal::Table();
    ScriptVal strokes = v.Find(list) && v.Find(list)->IsTable() ? *v.Find(list) : ScriptVal::Table();
    ScriptVal stroke = ScriptVal::Table();
    for (double p : points) stroke.Append(ScriptVal(p));
    strokes.Append(std::move(stroke));
    v.Set(list, std::move(strokes));
    return v;
}

} // namespace

int RunStroke(const std::vector<std::string> &args) {
    bool lenient = false;
    std::vector<std::string> positional;
    for (const std::string &arg : args) {
        if (arg == "--lenient")
            lenient = true;
        else if (arg.size() > 1 && arg[0] == '-' && arg[1] == '-')
            throw CliError(ExitUsage, "stroke: unknown option " + arg);
        else
            positional.push_back(arg);
    }
    if (positional.size() < 3) throw CliError(ExitUsage, "see orvane stroke --help");
    const std::string &flow = positional[0], &toolName = positional[1], &action = positional[2];
    if (action != "add" && action != "sub" && action != "clear")
        throw CliError(ExitUsage, "stroke: the action is add, sub or clear, not '" + action + "'");
    std::vector<double> points;
    for (size_t i = 3; i < positional.size(); ++i) {
        const std::vector<double> xy = ParseNumberList(positional[i], 2, "a point");
        points.insert(points.end(), xy.begin(), xy.end());
    }
    if (action == "clear" ? !points.empty() : points.empty())
        throw CliError(ExitUsage, action == "clear" ? "stroke: clear takes no points"
                                                    : "stroke: " + action + " needs at least one point X,Y");

    LoadLibrary();
    OrvaneDoc doc;
    LoadFlow(flow, doc, lenient);
    Operator *op = doc.FindTool(toolName);
    if (!op) {
        std::vector<std::string> names;
        for (const Operator *t : doc.Tools()) names.push_back(t->Name());
        throw CliError(ExitUsage, "stroke: the flow has no tool '" + toolName + "'" + DidYouMean(toolName, names));
    }
    Input *in = op->FindInput(kStrokesInput);
    if (!in || IsImageDataType(in->DataType()))
        throw CliError(ExitUsage, "stroke: " + toolName + " (" + op->ClassID().Text() + ") takes no strokes");
    if (in->IsAnimated() || in->Link())
        throw CliError(ExitUsage, "stroke: " + toolName + "'s strokes are animated or linked; edit them with set");
    if (action == "clear") {
        in->ResetValue();
    } else {
        const ScriptVal v = WithStroke(in->Constant().Get(), action == "add" ? "PosStrokes" : "NegStrokes", points);
        Ref<Parameter> value = ParameterFromScript(in->DataType(), v);
        if (!value || !in->SetValue(value))
            throw CliError(ExitFailed, "stroke: " + toolName + " refused the stroke " + v.ToText());
    }
    std::string error;
    if (!SaveDocumentFile(doc, flow, error)) throw CliError(ExitFailed, error);
    if (action == "clear")
        std::printf("%s: strokes cleared\n", toolName.c_str());
    else
        std::printf("%s: added a %s stroke of %zu points\n", toolName.c_str(),
                    action == "add" ? "positive" : "negative", points.size() / 2);
    return ExitOk;
}

} // namespace Orvane::Cli
