#pragma once
// Peer programs in the benchmarks: OpenImageIO's oiiotool and vips doing the
// same work as a benchmark row of ours, timed in the same run.
//
// Each peer row runs a whole command (load, work, save) once per iteration
// and reports two figures: the whole-process wall time (the row's time) and
// the time of the operation alone as counter "op_s": oiiotool's own
// per-operation figure from --runstats, and for vips the whole time minus
// that of a plain copy of the same files (load + save), measured once.
//
// Thread safety: benchmark registration and runs are single-threaded.
#include <functional>
#include <string>

namespace Orvane::Bench {

/// The program is on PATH.
bool PeerAvailable(const char *program);
/// A 3840x2160 RGBA float frame written once per run: ".exr" (uncompressed
/// float, made by oiiotool) or ".v" (vips's own format, converted from it).
/// Empty when the programs to make it are missing.
const std::string &PeerUHDFrame(const char *ext);
/// A temporary output path with the given extension, removed at exit.
std::string PeerOutput(const char *ext);
/// Runs a shell command, giving its exit status and what it printed (stdout and stderr).
int CapturePeer(const std::string &command, std::string &output);
/// Wall seconds of a shell command, negative when it failed.
double RunPeerSeconds(const std::string &command);

/// Registers a row "Peer/<name>" running `program` with the arguments that
/// `args()` gives (called at run time, so PeerUHDFrame runs only when the row
/// does). `oiiotoolOp` names the oiiotool operation whose --runstats line
/// gives the op time ("blur", "resize", "over"); empty for vips rows.
void RegisterPeerBenchmark(const std::string &name, const char *program, std::function<std::string()> args,
                           const std::string &oiiotoolOp = "");

} // namespace Orvane::Bench
