// orvane pick: picks colours for a tool from a rectangle of its frame, as a
// drag over the image in a viewer would, and saves what the tool found.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"
#include "host/core/ScriptVal.h"
#include "host/core/Suggest.h"
#include "host/flow/ControlCommand.h"
#include "host/flow/DataTypes.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"

namespace Orvane::Cli {
namespace {

struct PickArgs {
    std::string flow, tool;
    std::vector<double> rect; // x0, y0, x1, y1
    double time = 0.0;
    bool timeSet = false, subtract = false, fractions = false, lenient = false;
    std::string device;
};

PickArgs ParsePickArgs(const std::vector<std::string> &args) {
    PickArgs a;
    std::vector<std::string> positional;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &arg = args[i];
        const auto value = [&]() -> const std::string & {
            if (i + 1 >= args.size()) throw CliError(ExitUsage, "pick: " + arg + " needs a value");
            return args[++i];
        };
        if (arg == "--time") {
            a.time = ParseNumberList(value(), 1, "--time")[0];
            a.timeSet = true;
        } else if (arg == "--device") {
            a.device = value();
        } else if (arg == "--subtract") {
            a.subtract = true;
        } else if (arg == "--fractions") {
            a.fractions = true;
        } else if (arg == "--lenient") {
            a.lenient = true;
        } else if (arg.size() > 1 && arg[0] == '-' && arg[1] == '-') {
            throw CliError(ExitUsage, "pick: unknown option " + arg);
        } else {
            positional.push_back(arg);
        }
    }
    if (positional.size() != 3) throw CliError(ExitUsage, "see orvane pick --help");
    a.flow = positional[0];
    a.tool = positional[1];
    a.rect = ParseNumberList(positional[2], 4, "the rectangle");
    return a;
}

/// Every input's value at `time` as document text, by input ID.
std::map<std::string, std::string> Values(const Operator &op, double time) {
    std::map<std::string, std::string> values;
    for (const auto &in : op.Inputs())
        if (const Ref<Parameter> v = in->ValueAt(time)) values[in->ID().Text()] = v->ToScript().ToText();
    return values;
}

/// The inputs of a colour control named by its prefix ("Background":
/// BackgroundRed, BackgroundGreen, BackgroundBlue); none when one is missing.
std::vector<Input *> ColourInputs(const Operator &op, const std::string &prefix) {
    std::vector<Input *> inputs;
    for (const char *c : {"Red", "Green", "Blue"})
        if (Input *in = op.FindInput((prefix + c).c_str()); in && in->DataType() == CLSID_DataType_Number)
            inputs.push_back(in);
    return inputs.size() == 3 ? inputs : std::vector<Input *>{};
}

/// The mean colour of pixels x0..x1, y0..y1 (corners included) of `img`,
/// its canvas where the rectangle leaves its data window.
FltPixel MeanColour(const Image &img, const ImgRectI &pixels) {
    double sum[3] = {0, 0, 0};
    for (int y = pixels.y0; y < pixels.y1; ++y)
        for (int x = pixels.x0; x < pixels.x1; ++x) {
            const FltPixel p = img.GetFlt(x, y);
            sum[0] += p.R, sum[1] += p.G, sum[2] += p.B;
        }
    const double n = double(pixels.Width()) * pixels.Height();
    return {float(sum[0] / n), float(sum[1] / n), float(sum[2] / n), 1.f};
}

Ref<Parameter> EvaluateTool(Output *out, double time, RenderTask &task, bool useCache) {
    EvalOptions options;
    options.task = &task;
    options.flags = ReqFlagInteractive;
    options.useCache = useCache;
    return Evaluate(out, time, options);
}

/// The pixels a rectangle of the arguments names in `img`'s frame.
ImgRectI PickPixels(const PickArgs &a, const Image &img) {
    const double w = a.fractions ? img.Width() : 1.0, h = a.fractions ? img.Height() : 1.0;
    const auto pixel = [](double v) { return static_cast<int>(std::floor(std::clamp(v, -1e9, 1e9) + 1e-6)); };
    const int x0 = pixel(std::min(a.rect[0], a.rect[2]) * w), x1 = pixel(std::max(a.rect[0], a.rect[2]) * w);
    const int y0 = pixel(std::min(a.rect[1], a.rect[3]) * h), y1 = pixel(std::max(a.rect[1], a.rect[3]) * h);
    return ImgRectI(x0, y0, x1 + 1, y1 + 1);
}

/// TOOL.CONTROL: the colour control takes the mean colour of the rectangle of
/// the image on the tool's main input, as the colour picker of a viewer does.
int PickColour(const PickArgs &a, OrvaneDoc &doc, Operator &op, const std::string &control, double time,
               RenderTask &task, const std::vector<std::string> &console) {
    const std::vector<Input *> inputs = ColourInputs(op, control);
    if (inputs.empty())
        throw CliError(ExitUsage, "pick: " + op.Name() + " has no colour control '" + control + "' (inputs " + control +
                                      "Red, " + control + "Green and " + control + "Blue)");
    const Input *main = op.FindMainInput();
    if (!main || !main->Link())
        throw CliError(ExitUsage, "pick: " + op.Name() + " has no image connected to pick from");
    const Ref<Parameter> source = EvaluateTool(main->Link(), time, task, true);
    const auto *img = dynamic_cast<const Image *>(source.Get());
    if (!img) {
        const std::string why = console.empty() ? "its input produced no image" : console.back();
        throw CliError(ExitFailed, "pick: " + why);
    }
    const ImgRectI pixels = PickPixels(a, *img) & ImgRectI(0, 0, img->Width(), img->Height());
    if (pixels.IsNull()) throw CliError(ExitFailed, "pick: the rectangle lies outside the frame");
    const FltPixel mean = MeanColour(*img, pixels);
    const float values[3] = {mean.R, mean.G, mean.B};
    for (int c = 0; c < 3; ++c) inputs[size_t(c)]->SetValue(MakeRef<Number>(values[c]));
    std::string error;
    if (!SaveDocumentFile(doc, a.flow, error)) throw CliError(ExitFailed, error);
    std::printf("picked %s.%s from %d x %d pixels\n", op.Name().c_str(), control.c_str(), pixels.Width(),
                pixels.Height());
    for (const Input *in : inputs)
        std::printf("  %s.%s = %s\n", op.Name().c_str(), in->ID().Text(),
                    in->ValueAt(time)->ToScript().ToText().c_str());
    return ExitOk;
}

} // namespace

int RunPick(const std::vector<std::string> &args) {
    const PickArgs a = ParsePickArgs(args);
    LoadLibrary();
    OrvaneDoc doc;
    std::vector<std::string> console;
    doc.SetConsoleListener([&console](const ConsoleLine &line) { console.push_back(line.text); });
    LoadFlow(a.flow, doc, a.lenient);
    const size_t dot = a.tool.find('.');
    const std::string toolName = a.tool.substr(0, dot),
                      control = dot == std::string::npos ? "" : a.tool.substr(dot + 1);
    Operator *op = doc.FindTool(toolName);
    if (!op) {
        std::vector<std::string> names;
        for (const Operator *t : doc.Tools()) names.push_back(t->Name());
        throw CliError(ExitUsage, "pick: the flow has no tool '" + toolName + "'" + DidYouMean(toolName, names));
    }
    const double time = a.timeSet ? a.time : doc.RenderStart();
    RenderTask task;
    task.interactive = true;
    task.SetDevice(ChooseDevice("pick", a.device, doc));
    if (!control.empty()) return PickColour(a, doc, *op, control, time, task, console);

    Output *out = op->FindMainOutput();
    if (!out) throw CliError(ExitUsage, "pick: " + a.tool + " has no image to pick from");
    // The frame the rectangle is measured in: the tool's own image.
    const Ref<Parameter> first = EvaluateTool(out, time, task, true);
    const auto *img = dynamic_cast<const Image *>(first.Get());
    if (!img) {
        const std::string why = console.empty() ? a.tool + " produced no image" : console.back();
        throw CliError(ExitFailed, "pick: " + why);
    }
    // Pixels x0..x1, y0..y1 (both corners included, rows counted up) span
    // the frame fractions x0 / W .. x1 / W; the tool adds the last pixel back.
    const double w = a.fractions ? 1.0 : img->Width(), h = a.fractions ? 1.0 : img->Height();
    const TagList select{{CCMD_SelectLeft, a.rect[0] / w},
                         {CCMD_SelectBottom, a.rect[1] / h},
                         {CCMD_SelectRight, a.rect[2] / w},
                         {CCMD_SelectTop, a.rect[3] / h},
                         {CCMD_Modifiers, a.subtract ? CCMD_ModSubtract : 0}};
    const auto before = Values(*op, time);
    if (!op->ControlCommand(CCMD_Select, select))
        throw CliError(ExitUsage, "pick: " + a.tool + " (" + op->ClassID().Text() + ") takes no picks" +
                                      (console.empty() ? "" : ": " + console.back()));
    // The pick is the tool's own state: its cached result cannot know it.
    if (!EvaluateTool(out, time, task, false)) {
        const std::string why = console.empty() ? a.tool + " failed" : console.back();
        throw CliError(ExitFailed, "pick: " + why);
    }
    ReportDeviceLog(task);
    const std::vector<std::string> edits = doc.RunDeferred();
    if (edits.empty()) throw CliError(ExitFailed, "pick: " + a.tool + " picked nothing in that rectangle");
    std::string error;
    if (!SaveDocumentFile(doc, a.flow, error)) throw CliError(ExitFailed, error);
    for (const std::string &name : edits) std::printf("%s\n", name.c_str());
    for (const auto &[id, text] : Values(*op, time)) {
        const auto was = before.find(id);
        if (was == before.end() || was->second != text)
            std::printf("  %s.%s = %s\n", a.tool.c_str(), id.c_str(), text.c_str());
    }
    return ExitOk;
}

} // namespace Orvane::Cli
