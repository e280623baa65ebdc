#pragma once
// Shared pieces of the orvane command line: exit codes, errors, loading the
// tool library and documents, JSON text.
#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

namespace Orvane {
class IDeviceContext;
class Operator;
class OrvaneDoc;
class RenderTask;
} // namespace Orvane

namespace Orvane::Cli {

enum ExitCode : int {
    ExitOk = 0,
    ExitUsage = 2,     ///< a bad command line or document
    ExitFailed = 3,    ///< a tool failed: nothing (or not everything) was produced
    ExitNoCluster = 4, ///< the cluster's commands (sbatch) are not on PATH: nothing was submitted
    ExitInterrupted = 130,
};

/// A failure the command reports in one line and exits with.
struct CliError : std::runtime_error {
    CliError(int code, const std::string &message) : std::runtime_error(message), exitCode(code) {}
    int exitCode;
};

/// Reads a flow document for a command. Prints every problem on stderr as
/// "ERROR: FLOW:LINE:COLUMN: message" (or WARNING:; with `json`, one object
/// per problem on stdout) and throws a usage error when the document has
/// errors. `lenient` takes errors as warnings where the document can still
/// be used.
void LoadFlow(const std::string &path, OrvaneDoc &doc, bool lenient, bool json = false);

/// Applies one "TOOL.INPUT=VALUE" (as --set and orvane set give it) to a
/// document or throws a usage error saying what is wrong. `what` names the
/// option in messages.
void ApplySet(OrvaneDoc &doc, const std::string &set, const char *what = "--set");

/// Loads the standard tool library or throws.
void LoadLibrary();

/// The device a command renders on: `choice` ("cpu", "auto", "opencl",
/// "cuda"; empty: the document's UseGPU preference, 0 cpu, 1 auto, 2 opencl,
/// 3 cuda). A back end named on the command line that has no device is a
/// usage error; one chosen by the preference falls back to the CPU with a
/// warning on stderr. Null: rows on the CPU.
/// With `json` that warning is an object on stdout ("code": "device").
IDeviceContext *ChooseDevice(const char *command, const std::string &choice, const OrvaneDoc &doc, bool json = false);
/// Prints the device runs that failed during a render (the rows made those
/// frames) as "WARNING: device: ..." lines on stderr.
void ReportDeviceLog(const RenderTask &task);

/// JSON text of a string (quoted, escaped) and of a number (null for NaN/inf).
std::string JsonString(const std::string &s);
std::string JsonNumber(double v);

/// A memory size ("512M", "8G", "1.5G"; K, M, G, T with an optional B or iB;
/// plain bytes without a unit) in bytes; a usage error naming `what`
/// ("render: --memory-limit") otherwise.
size_t ParseSize(const std::string &text, const std::string &what);
/// "1001-1012,1015": a frame list in ascending runs.
std::string FrameRuns(std::vector<int64_t> frames);

/// The Savers a render writes: those `names` gives, else every Saver of the
/// document; a usage error (starting "COMMAND: ") for none or an unknown name.
std::vector<Operator *> ChooseSavers(const OrvaneDoc &doc, const std::vector<std::string> &names,
                                     const std::string &command, const std::string &flow);
/// The frames of a render: the frame list `spec` (host/app/FrameSpec.h), else
/// the document's render range.
std::vector<int64_t> RenderFrames(const OrvaneDoc &doc, const std::string &spec, const std::string &command);
/// Gives the task the whole list's first and last frame: Saver-relative
/// numbering counts from there, so every chunk of a job array names its
/// files alike, and a name without a number gets one when the whole list has
/// several frames.
void SpanWholeRange(RenderTask &task, const std::vector<int64_t> &frames);

/// Parses "a,b,c,..." into exactly `count` numbers (count 0: any number >= 1).
std::vector<double> ParseNumberList(const std::string &text, size_t count, const char *what);

/// The usage text of a command ("" for an unknown one).
const char *CommandUsage(const std::string &command);

int RunCheck(const std::vector<std::string> &args);
int RunNew(const std::vector<std::string> &args);
int RunAdd(const std::vector<std::string> &args);
int RunSetCommand(const std::vector<std::string> &args);
int RunConnect(const std::vector<std::string> &args);
int RunRemove(const std::vector<std::string> &args);
int RunTools(const std::vector<std::string> &args);
int RunDescribe(const std::vector<std::string> &args);
int RunEval(const std::vector<std::string> &args);
int RunInfo(const std::vector<std::string> &args);
int RunRender(const std::vector<std::string> &args);
int RunColorSpaces(const std::vector<std::string> &args);
int RunPick(const std::vector<std::string> &args);
int RunTrack(const std::vector<std::string> &args);
int RunStroke(const std::vector<std::string> &args);
int RunScript(const std::vector<std::string> &args);
int RunSubmit(const std::vector<std::string> &args);
int RunStatus(const std::vector<std::string> &args);
int RunResubmit(const std::vector<std::string> &args);

} // namespace Orvane::Cli
