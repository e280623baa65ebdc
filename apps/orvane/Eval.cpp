// orvane eval: evaluates one output of a flow document and reports it.
#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>
#include <string>
#include <vector>

#include "apps/orvane/Cli.h"

#include "host/core/Parallel.h"
#include "host/core/ScriptVal.h"
#include "host/core/Suggest.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "host/image/Pixel.h"
#include "host/image/PixelConvert.h"
#include "host/shape/ShapeTree.h"
#include <fmt/format.h>

namespace Orvane::Cli {
namespace {

struct EvalArgs {
    std::string flow, target;
    double time = 0.0;
    bool timeSet = false, json = false, lenient = false;
    std::optional<ImgRectI> roi;
    std::vector<std::pair<int, int>> pixels;
    std::vector<std::string> sets;
    int threads = 0;
    std::string device;
};

EvalArgs ParseArgs(const std::vector<std::string> &args) {
    EvalArgs a;
    std::vector<std::string> positional;
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &arg = args[i];
        auto value = [&]() -> const std::string & {
            if (i + 1 >= args.size()) throw CliError(ExitUsage, "eval: " + arg + " needs a value");
            return args[++i];
        };
        if (arg == "--time") {
            a.time = ParseNumberList(value(), 1, "time")[0];
            a.timeSet = true;
        } else if (arg == "--roi") {
            const auto v = ParseNumberList(value(), 4, "region");
            ImgRectI r(static_cast<int>(v[0]), static_cast<int>(v[1]), static_cast<int>(v[2]), static_cast<int>(v[3]));
            if (r.IsNull()) throw CliError(ExitUsage, "eval: the region is empty");
            a.roi = r;
        } else if (arg == "--pixel") {
            // Takes X,Y pairs until the next option.
            bool any = false;
            while (i + 1 < args.size() && args[i + 1].rfind("--", 0) != 0) {
                const auto v = ParseNumberList(args[++i], 2, "pixel");
                a.pixels.emplace_back(static_cast<int>(std::floor(v[0])), static_cast<int>(std::floor(v[1])));
                any = true;
            }
            if (!any) throw CliError(ExitUsage, "eval: --pixel needs X,Y");
        } else if (arg == "--set") {
            a.sets.push_back(value());
        } else if (arg == "--threads") {
            const double n = ParseNumberList(value(), 1, "thread count")[0];
            if (n < 1 || n != std::floor(n)) throw CliError(ExitUsage, "eval: --threads needs a whole number >= 1");
            a.threads = static_cast<int>(n);
        } else if (arg == "--device") {
            a.device = value();
        } else if (arg == "--json") {
            a.json = true;
        } else if (arg == "--lenient") {
            a.lenient = true;
        } else if (arg.rfind("--", 0) == 0) {
            throw CliError(ExitUsage, "eval: unknown option " + arg);
        } else {
            positional.push_back(arg);
        }
    }
    if (positional.size() != 2) throw CliError(ExitUsage, "eval: expected FLOW and TOOL[.OUTPUT]");
    a.flow = positional[0];
    a.target = positional[1];
    return a;
}

struct ChannelStats {
    double min = std::numeric_limits<double>::infinity(), max = -std::numeric_limits<double>::infinity(), sum = 0;
    size_t count = 0;
};

std::vector<ChannelStats> Stats(const Image &img) {
    const int channels = img.IsMask() ? 1 : 4;
    std::vector<ChannelStats> stats(channels);
    const ImgRectI dw = img.DataWindow();
    if (img.IsNoData() || !img.HasScanLineData()) return stats;
    std::vector<FltPixel> row(dw.Width());
    for (int y = dw.y0; y < dw.y1; ++y) {
        ReadSpanFlt(img, y, dw.x0, dw.x1, row.data());
        for (const FltPixel &p : row) {
            const float v[4] = {p.R, p.G, p.B, p.A};
            for (int c = 0; c < channels; ++c) {
                const double x = channels == 1 ? v[3] : v[c];
                ChannelStats &s = stats[c];
                s.min = std::min(s.min, x);
                s.max = std::max(s.max, x);
                s.sum += x;
                ++s.count;
            }
        }
    }
    return stats;
}

const char *ChannelName(const Image &img, int c) {
    static const char *const names[4] = {"R", "G", "B", "A"};
    return img.IsMask() ? "A" : names[c];
}

std::string RectJson(const ImgRectI &r) {
    return "[" + std::to_string(r.x0) + ", " + std::to_string(r.y0) + ", " + std::to_string(r.x1) + ", " +
           std::to_string(r.y1) + "]";
}

/// The shortest text that reads back as the same float.
std::string ShortestFloat(float f) {
    char buf[32];
    const auto r = std::to_chars(buf, buf + sizeof buf, f);
    return std::string(buf, r.ptr);
}

std::vector<float> PixelValues(const Image &img, int x, int y) {
    const FltPixel p = img.GetFlt(x, y);
    if (img.IsMask()) return {p.A};
    return {p.R, p.G, p.B, p.A};
}

} // namespace

int RunEval(const std::vector<std::string> &rawArgs) {
    const EvalArgs a = ParseArgs(rawArgs);
    if (a.threads) SetWorkerCount(a.threads);
    LoadLibrary();

    OrvaneDoc doc;
    std::vector<std::string> console;
    doc.SetConsoleListener([&console](const ConsoleLine &line) { console.push_back(line.text); });
    LoadFlow(a.flow, doc, a.lenient);
    for (const std::string &set : a.sets) ApplySet(doc, set);

    const size_t dot = a.target.rfind('.');
    const std::string toolName = dot == std::string::npos ? a.target : a.target.substr(0, dot);
    Operator *op = doc.FindTool(toolName);
    if (!op) {
        if (doc.KeptTools().Find(toolName))
            throw CliError(ExitUsage, "tool '" + toolName + "' is of a class this program does not know");
        std::vector<std::string> names;
        for (const Operator *t : doc.Tools()) names.push_back(t->Name());
        throw CliError(ExitUsage, "the flow has no tool '" + toolName + "'" + DidYouMean(toolName, names));
    }
    Output *out = dot == std::string::npos ? op->FindMainOutput() : op->FindOutput(a.target.substr(dot + 1).c_str());
    if (!out) throw CliError(ExitUsage, "tool '" + toolName + "' has no output '" + a.target.substr(dot + 1) + "'");

    // An interactive look: Savers on the way pass their image on without writing.
    RenderTask task;
    task.interactive = true;
    task.SetDevice(ChooseDevice("eval", a.device, doc));
    EvalOptions options;
    options.task = &task;
    options.flags = ReqFlagInteractive;
    if (a.roi) options.roi = ImageDomain(*a.roi);
    const double time = a.timeSet ? a.time : doc.RenderStart();
    Ref<Parameter> result = Evaluate(out, time, options);
    ReportDeviceLog(task);

    const auto *img = dynamic_cast<const Image *>(result.Get());
    if (a.json) {
        std::string j = "{";
        j += "\"tool\": " + JsonString(op->Name()) + ", \"output\": " + JsonString(out->ID().Text());
        j += ", \"time\": " + JsonNumber(time) + ", \"ok\": " + (result ? "true" : "false");
        if (img) {
            const FltPixel c = img->GetCanvasColor();
            j += ", \"width\": " + std::to_string(img->Width()) + ", \"height\": " + std::to_string(img->Height());
            j += ", \"depth\": " + JsonString(DepthName(img->Depth()));
            j += ", \"data_window\": " + RectJson(img->DataWindow());
            j += ", \"valid_window\": " + RectJson(img->ValidWindow());
            j += ", \"canvas\": [" + JsonNumber(c.R) + ", " + JsonNumber(c.G) + ", " + JsonNumber(c.B) + ", " +
                 JsonNumber(c.A) + "]";
            j += ", \"channels\": {";
            const auto stats = Stats(*img);
            for (size_t c = 0; c < stats.size(); ++c) {
                const ChannelStats &s = stats[c];
                if (c) j += ", ";
                j += JsonString(ChannelName(*img, static_cast<int>(c))) +
                     ": {\"min\": " + JsonNumber(s.count ? s.min : NAN) +
                     ", \"max\": " + JsonNumber(s.count ? s.max : NAN) +
                     ", \"mean\": " + JsonNumber(s.count ? s.sum / s.count : NAN) + "}";
            }
            j += "}, \"pixels\": [";
            for (size_t i = 0; i < a.pixels.size(); ++i) {
                const auto [x, y] = a.pixels[i];
                if (i) j += ", ";
                j += "{\"x\": " + std::to_string(x) + ", \"y\": " + std::to_string(y) + ", \"values\": [";
                const auto v = PixelValues(*img, x, y);
                for (size_t k = 0; k < v.size(); ++k) j += (k ? ", " : "") + JsonNumber(v[k]);
                j += "]}";
            }
            j += "]";
        } else if (result) {
            j += ", \"value\": " + JsonString(result->ToScript().ToText());
        }
        j += ", \"console\": [";
        for (size_t i = 0; i < console.size(); ++i) j += (i ? ", " : "") + JsonString(console[i]);
        j += "]}";
        std::printf("%s\n", j.c_str());
    } else {
        std::printf("%s.%s at time %g\n", op->Name().c_str(), out->ID().Text(), time);
        if (img) {
            const ImgRectI d = img->DataWindow(), v = img->ValidWindow();
            const FltPixel c = img->GetCanvasColor();
            std::printf("  size          %d x %d, %s, pixel aspect %g:%g\n", img->Width(), img->Height(),
                        DepthName(img->Depth()).c_str(), img->XScale(), img->YScale());
            std::printf("  data window   %d,%d - %d,%d\n", d.x0, d.y0, d.x1, d.y1);
            std::printf("  valid window  %d,%d - %d,%d\n", v.x0, v.y0, v.x1, v.y1);
            std::printf("  canvas        %g %g %g %g\n", c.R, c.G, c.B, c.A);
            const auto stats = Stats(*img);
            for (size_t ch = 0; ch < stats.size(); ++ch) {
                const ChannelStats &s = stats[ch];
                if (!s.count) continue;
                std::printf("  %-13s min %.6g  max %.6g  mean %.6g\n", ChannelName(*img, static_cast<int>(ch)), s.min,
                            s.max, s.sum / s.count);
            }
            for (const auto &[x, y] : a.pixels) {
                const auto vals = PixelValues(*img, x, y);
                std::string text;
                for (float f : vals) text += " " + ShortestFloat(f);
                std::printf("  pixel %d,%d  %s\n", x, y, text.c_str());
            }
        } else if (const auto *tree = dynamic_cast<const ShapeTree *>(result.Get())) {
            const ImgRectF b = tree->Bounds();
            std::printf("  nodes         %d\n", tree->NodeCount());
            if (!b.IsEmpty()) std::printf("  bounds        %g,%g - %g,%g\n", b.x0, b.y0, b.x1, b.y1);
            int n = 0;
            for (const ShapeStyle &st : tree->Styles()) {
                std::string text;
                const auto colour = [](const float *c) {
                    return fmt::format("{:g} {:g} {:g} {:g}", c[0], c[1], c[2], c[3]);
                };
                if (st.fill) text += "fill " + colour(st.fillColor);
                if (st.line)
                    text += (text.empty() ? "" : ", ") +
                            fmt::format("line {} width {:g}", colour(st.lineColor), st.lineWidth);
                if (st.opacity != 1.0) text += fmt::format(", opacity {:g}", st.opacity);
                std::printf("  style %-7d %s\n", ++n, text.empty() ? "not drawn" : text.c_str());
            }
        } else if (result) {
            std::printf("  value         %s\n", result->ToScript().ToText().c_str());
        }
        for (const std::string &line : console) std::printf("  console: %s\n", line.c_str());
    }
    if (!result) {
        const std::string why = console.empty() ? op->Name() + " produced nothing" : console.back();
        std::fprintf(stderr, "ERROR: %s\n", why.c_str());
        return ExitFailed;
    }
    return ExitOk;
}

} // namespace Orvane::Cli
