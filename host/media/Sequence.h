#pragma once
// Numbered file sequences: "shot_v2.0042.exr" is frame 42 of the sequence
// "shot_v2.####.exr".
//
// The frame number is the last run of digits in the file name before its
// extension. A '-' right before those digits is a minus sign when it follows
// '.', '_' or the start of the name ("shot.-0005.exr" is frame -5); otherwise
// it belongs to the name ("shot-0005.exr" is frame 5). The padding is the
// number of digits written (1 to 8 here; more are accepted when a number
// needs them). A sequence padded to p digits holds names whose digit run is
// p long, or longer without a leading zero (frame 10000 of "####"); a
// sequence with padding 1 holds numbers of any width without leading zeros.
// A marker in the file name stands for the number instead: a run of '#'
// ("shot.####.exr", padded to as many digits as there are signs), printf's
// "%04d" ("%d" unpadded, "%4d" also zero-padded to 4) or "$F4" ("$F"
// unpadded). The last marker of the name counts; markers in the folder are
// plain text. A marked name's number is 0.
//
// Output names (OutputSequenceName): a name with neither marker nor number
// written for several frames gets four digits before its extension
// ("out.exr" -> out.0001.exr, "out_.exr" -> out_0001.exr); written for one
// frame it stays as it is.
//
// Thread safety: pure functions; ScanSequence reads the file system.
#include <cstdint>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

struct SequenceName {
    std::string folder; ///< with a trailing separator, or "" for the current folder
    std::string prefix; ///< the file name before the number (sign excluded)
    std::string suffix; ///< after the number, extension included
    int64_t number = 0;
    int padding = 0;        ///< digits of the number as written
    bool hasNumber = false; ///< false: a single file, no sequence
};

/// Splits a path into folder, prefix, number, padding and suffix.
ORVANE_API SequenceName ParseSequenceName(const std::string &path);
/// The files a render writes for `path`: ParseSequenceName's, except that a
/// name without number or marker becomes a sequence when `severalFrames`.
ORVANE_API SequenceName OutputSequenceName(const std::string &path, bool severalFrames);
/// The path of frame `number` of the sequence (its padding kept; wider
/// numbers grow). For a name without a number, the name itself.
ORVANE_API std::string SequencePath(const SequenceName &seq, int64_t number);
/// The display form: "shot.####.exr" (one '#' per digit of padding).
ORVANE_API std::string SequenceDisplayName(const SequenceName &seq);
/// True when `fileName` (no folder) is a frame of `seq`; sets `number`.
ORVANE_API bool MatchesSequence(const SequenceName &seq, const std::string &fileName, int64_t &number);

struct SequenceScan {
    std::vector<int64_t> frames; ///< numbers present, ascending
    /// Runs of missing numbers between the first and last frames, as
    /// inclusive [first, last] pairs.
    std::vector<std::pair<int64_t, int64_t>> gaps;
};

/// The frames of `seq` present in its folder.
ORVANE_API SequenceScan ScanSequence(const SequenceName &seq);

} // namespace Orvane
