#include "apps/orvane/Cli.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <map>

#include "host/app/Application.h"
#include "host/app/FrameSpec.h"
#include "host/core/ScriptVal.h"
#include "host/core/Suggest.h"
#include "host/core/Tags.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/InputValue.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"

namespace Orvane::Cli {

size_t ParseSize(const std::string &text, const std::string &what) {
    size_t used = 0;
    double v = 0;
    try {
        v = std::stod(text, &used);
    } catch (...) {
        used = 0;
    }
    std::string unit = text.substr(used);
    for (char &c : unit) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    if (!unit.empty() && unit.back() == 'B') unit.pop_back();
    if (unit.size() == 2 && unit[1] == 'I') unit.pop_back();
    static const std::map<std::string, double> kUnits = {
        {"", 1.0}, {"K", 1024.0}, {"M", 1048576.0}, {"G", 1073741824.0}, {"T", 1099511627776.0}};
    const auto u = kUnits.find(unit);
    if (!used || u == kUnits.end() || !(v > 0) || !(v * u->second < 1e18))
        throw CliError(ExitUsage, what + ": bad size '" + text + "' (examples: 512M, 8G)");
    return static_cast<size_t>(v * u->second);
}

std::string FrameRuns(std::vector<int64_t> frames) {
    std::sort(frames.begin(), frames.end());
    frames.erase(std::unique(frames.begin(), frames.end()), frames.end());
    std::string out;
    for (size_t i = 0; i < frames.size();) {
        size_t j = i;
        while (j + 1 < frames.size() && frames[j + 1] == frames[j] + 1) ++j;
        if (!out.empty()) out += ",";
        out += std::to_string(frames[i]);
        if (j > i) out += "-" + std::to_string(frames[j]);
        i = j + 1;
    }
    return out;
}

std::vector<Operator *> ChooseSavers(const OrvaneDoc &doc, const std::vector<std::string> &names,
                                     const std::string &command, const std::string &flow) {
    std::vector<Operator *> savers;
    const OvID saverClass("Saver");
    auto isSaver = [&](const Operator *op) { return op->GetRegistry() && op->GetRegistry()->IsClassType(saverClass); };
    if (names.empty()) {
        for (Operator *op : doc.Tools())
            if (isSaver(op)) savers.push_back(op);
        if (savers.empty()) throw CliError(ExitUsage, command + ": " + flow + " has no Saver to render");
    } else {
        for (const std::string &name : names) {
            Operator *op = doc.FindTool(name);
            if (!op || !isSaver(op)) throw CliError(ExitUsage, command + ": the flow has no Saver '" + name + "'");
            if (std::find(savers.begin(), savers.end(), op) == savers.end()) savers.push_back(op);
        }
    }
    return savers;
}

std::vector<int64_t> RenderFrames(const OrvaneDoc &doc, const std::string &spec, const std::string &command) {
    if (spec.empty())
        return FrameRange(static_cast<int64_t>(std::floor(doc.RenderStart())),
                          static_cast<int64_t>(std::floor(doc.RenderEnd())));
    std::vector<int64_t> frames;
    std::string error;
    if (!ParseFrameSpec(spec, frames, error)) throw CliError(ExitUsage, command + ": --frames: " + error);
    return frames;
}

void SpanWholeRange(RenderTask &task, const std::vector<int64_t> &frames) {
    task.startTime = frames.empty() ? 0.0 : static_cast<double>(*std::min_element(frames.begin(), frames.end()));
    task.endTime = frames.empty() ? 0.0 : static_cast<double>(*std::max_element(frames.begin(), frames.end()));
}

void LoadLibrary() {
    std::string error;
    if (!GetApp()->LoadOperators(error)) throw CliError(ExitFailed, "cannot load the tool library: " + error);
}

IDeviceContext *ChooseDevice(const char *command, const std::string &choice, const OrvaneDoc &doc, bool json) {
    DeviceChoice wanted = DeviceChoice::CPU;
    const bool fromCommandLine = !choice.empty();
    if (fromCommandLine) {
        if (!ParseDeviceChoice(choice, wanted))
            throw CliError(ExitUsage, std::string(command) + ": --device is cpu, auto, opencl or cuda");
    } else {
        static const DeviceChoice kByPreference[] = {DeviceChoice::CPU, DeviceChoice::Auto, DeviceChoice::OpenCL,
                                                     DeviceChoice::CUDA};
        const long pref = doc.GetPrefLong(PREF_UseGPU);
        wanted = pref >= 0 && pref <= 3 ? kByPreference[pref] : DeviceChoice::CPU;
    }
    if (wanted == DeviceChoice::CPU) return nullptr;
    std::string error;
    IDeviceContext *device = GetApp()->Device(wanted, &error);
    if (!device && wanted != DeviceChoice::Auto) {
        if (fromCommandLine) throw CliError(ExitUsage, std::string(command) + ": --device " + choice + ": " + error);
        const std::string why =
            std::string("the document asks for ") + DeviceChoiceName(wanted) + ": " + error + "; rendering on the CPU";
        if (json)
            std::printf("{\"event\": \"warning\", \"code\": \"device\", \"device\": %s, \"warning\": %s}\n",
                        JsonString(DeviceChoiceName(wanted)).c_str(), JsonString(why).c_str());
        else
            std::fprintf(stderr, "WARNING: %s\n", why.c_str());
    }
    return device;
}

void ReportDeviceLog(const RenderTask &task) {
    for (const std::string &line : task.DeviceLog())
        std::fprintf(stderr, "WARNING: device: %s (the CPU made those frames)\n", line.c_str());
}

std::string JsonString(const std::string &s) {
    std::string out = "\"";
    for (unsigned char c : s) {
        switch (c) {
        case '"': out += "\\\""; break;
        case '\\': out += "\\\\"; break;
        case '\n': out += "\\n"; break;
        case '\r': out += "\\r"; break;
        case '\t': out += "\\t"; break;
        default:
            if (c < 0x20) {
                char buf[8];
                std::snprintf(buf, sizeof buf, "\\u%04x", c);
                out += buf;
            } else {
                out += static_cast<char>(c);
            }
        }
    }
    return out + "\"";
}

std::string JsonNumber(double v) {
    if (!std::isfinite(v)) return "null";
    char buf[32];
    std::snprintf(buf, sizeof buf, "%.9g", v);
    return buf;
}

std::vector<double> ParseNumberList(const std::string &text, size_t count, const char *what) {
    std::vector<double> values;
    size_t at = 0;
    while (at <= text.size()) {
        const size_t comma = text.find(',', at);
        const std::string part = text.substr(at, comma == std::string::npos ? std::string::npos : comma - at);
        char *end = nullptr;
        const double v = std::strtod(part.c_str(), &end);
        if (part.empty() || !end || *end != '\0' || !std::isfinite(v))
            throw CliError(ExitUsage, std::string("bad ") + what + " '" + text + "'");
        values.push_back(v);
        if (comma == std::string::npos) break;
        at = comma + 1;
    }
    if ((count && values.size() != count) || values.empty())
        throw CliError(ExitUsage, std::string("bad ") + what + " '" + text + "' (expected " + std::to_string(count) +
                                      " numbers separated by commas)");
    return values;
}

void LoadFlow(const std::string &path, OrvaneDoc &doc, bool lenient, bool json) {
    const DocumentLoadResult loaded = LoadDocumentFile(path, doc, {.lenient = lenient});
    size_t errors = 0;
    for (const DocumentProblem &p : loaded.problems) {
        errors += p.error;
        if (json) {
            const char *kind = p.error ? "error" : "warning";
            std::printf("{\"event\": \"%s\", \"code\": \"document\", \"file\": %s, \"line\": %d, \"column\": %d, "
                        "\"%s\": %s}\n",
                        kind, JsonString(path).c_str(), p.line, p.column, kind, JsonString(p.message).c_str());
            continue;
        }
        const std::string place =
            p.line > 0 ? path + ":" + std::to_string(p.line) + ":" + std::to_string(p.column) : path;
        std::fprintf(stderr, "%s: %s: %s\n", p.error ? "ERROR" : "WARNING", place.c_str(), p.message.c_str());
    }
    std::fflush(stdout);
    if (!loaded.ok)
        throw CliError(ExitUsage, path + ": " + std::to_string(errors) + (errors == 1 ? " problem" : " problems") +
                                      (lenient ? "" : " (--lenient goes on with them as warnings where it can)"));
}

void ApplySet(OrvaneDoc &doc, const std::string &set, const char *what) {
    const size_t eq = set.find('=');
    const size_t dot = set.find('.');
    if (eq == std::string::npos || dot == std::string::npos || dot > eq)
        throw CliError(ExitUsage, std::string(what) + " expects TOOL.INPUT=VALUE, not '" + set + "'");
    const std::string toolName = set.substr(0, dot), inputId = set.substr(dot + 1, eq - dot - 1);
    Operator *op = doc.FindTool(toolName);
    if (!op) {
        std::vector<std::string> names;
        for (const Operator *t : doc.Tools()) names.push_back(t->Name());
        throw CliError(ExitUsage,
                       std::string(what) + ": the flow has no tool '" + toolName + "'" + DidYouMean(toolName, names));
    }
    Input *in = op->FindInput(inputId.c_str());
    if (!in) {
        std::vector<std::string> ids;
        for (const auto &i : op->Inputs()) ids.push_back(i->ID().Text());
        throw CliError(ExitUsage, std::string(what) + ": " + toolName + " has no input '" + inputId + "'" +
                                      DidYouMean(inputId, ids));
    }
    const std::string place = std::string(what) + " " + toolName + "." + inputId + ": ";
    if (in->Tags().GetID(InputControl) == CLSID_InputControl_Button) {
        // A button that loads a file takes the file as its value.
        const std::string file = set.substr(eq + 1);
        std::string error;
        if (!op->ControlCommand(CCMD_LoadFile, {{CCMD_FileName, static_cast<const void *>(file.c_str())},
                                                {CCMD_FileInput, static_cast<const void *>(in)},
                                                {CCMD_FileError, static_cast<void *>(&error)}}))
            throw CliError(ExitUsage, place + "a button that takes no value");
        if (!error.empty()) throw CliError(ExitFailed, place + error);
        return;
    }
    ScriptVal value;
    try {
        value = InputValueFromText(doc, in, set.substr(eq + 1));
    } catch (const std::invalid_argument &e) {
        throw CliError(ExitUsage, place + e.what());
    }
    const std::string error = ApplyInputValue(doc, in, value);
    if (!error.empty()) throw CliError(ExitUsage, place + error);
}

} // namespace Orvane::Cli
