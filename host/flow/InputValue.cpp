#include "host/flow/InputValue.h"

#include "host/core/ScriptVal.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"

namespace Orvane {

const char *ExpectedValueText(const Input *in) {
    const OvID t = in->DataType();
    if (t == CLSID_DataType_Number) return "a number";
    if (t == CLSID_DataType_Point) return "a point { x, y }";
    if (t == CLSID_DataType_Text) return "a text";
    if (t == CLSID_DataType_OvID) return "an ID (text)";
    if (t == CLSID_DataType_Gradient) return "a gradient";
    if (t == CLSID_DataType_Clip) return "a file name (text)";
    if (IsImageDataType(t)) return "a link to an image output (Tool.Output)";
    return "a value of its own type";
}

std::string ApplyInputValue(OrvaneDoc &doc, Input *in, const ScriptVal &v, bool keepUnknownLinks) {
    const OvID type = in->DataType();
    const bool wordInput = type == CLSID_DataType_OvID || type == CLSID_DataType_Text;
    if (v.IsRef() && wordInput && v.AsText().find('.') == std::string::npos)
        return ApplyInputValue(doc, in, ScriptVal(v.AsText()), keepUnknownLinks);

    if (v.IsRef()) {
        const std::string &path = v.AsText();
        const size_t dot = path.rfind('.');
        if (dot == std::string::npos || dot == 0 || dot + 1 == path.size())
            return "a link must name Tool.Output, not '" + path + "'";
        const std::string toolName = path.substr(0, dot), outputName = path.substr(dot + 1);
        Operator *tool = doc.FindTool(toolName);
        if (!tool) {
            if (keepUnknownLinks && doc.KeptTools().Find(toolName)) {
                in->Disconnect();
                in->SetUnresolvedLink(path);
                return "";
            }
            return "links to an unknown tool '" + toolName + "'";
        }
        Output *out = tool->FindOutput(outputName.c_str());
        if (!out) return "tool '" + toolName + "' has no output '" + outputName + "'";
        if (!in->ConnectTo(out))
            return "cannot take " + path + " (expects " + ExpectedValueText(in) + ", or the link would make a loop)";
        in->SetUnresolvedLink({});
        return "";
    }
    if (IsImageDataType(type)) return std::string("expects ") + ExpectedValueText(in);
    if (v.IsTable() && v.ClassName() == "Curve") {
        AnimCurve curve;
        if (!AnimCurve::FromScript(
                v, [type](const ScriptVal &k) { return ParameterFromScript(type, k); }, curve))
            return std::string("malformed curve: keys must be { time, value } with ") + ExpectedValueText(in);
        if (!in->SetCurve(std::move(curve))) return "cannot be animated";
        in->SetUnresolvedLink({});
        return "";
    }
    Ref<Parameter> value = ParameterFromScript(type, v);
    if (!value || !in->SetValue(value)) return std::string("expects ") + ExpectedValueText(in) + ", got " + v.ToText();
    in->SetUnresolvedLink({});
    return "";
}

} // namespace Orvane
