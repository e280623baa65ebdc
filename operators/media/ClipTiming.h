#pragma once
// ClipTiming: the arithmetic that places a clip's file frames on the global
// time line, shared by the Loader (reading) and the Saver (writing).
//
// A clip element covers global frames [start, end]. Inside it the first
// `holdFirst` frames show the first used file frame (trimIn), then the file
// frames trimIn..trimOut follow one per global frame, and the rest of the
// element shows trimOut. Reverse plays the used range backwards after the
// holds are applied; Loop repeats the element after its end (never before
// its start).
//
// The 2:3 cadence tables turn 24 frame-per-second film into 30 frame video
// (pull-down: five video frames from four film frames, two of them mixing
// fields of neighbouring film frames) and back (pull-up). Rows are the
// cadence type (0 standard, 1 advanced), columns the position in it.
//
// Thread safety: plain functions of their arguments.
#include <cstdint>
#include <optional>
#include <vector>

namespace Orvane {

namespace cadence {
extern const int PullupStart[2][5];
extern const int PullupFrame[2][4];
extern const int PullupMixed[2][5];
extern const int PulldownStart[2][5];
extern const int PulldownFrame[2][5];
extern const int PulldownMixed[2][5];
extern const int TrimFilmStart[2][5];
extern const int TrimFilmFirst[2][5];
extern const int TrimFilmLast[2][5];
extern const int TrimVideoFirst[2][4];
extern const int TrimVideoLast[2][4];
} // namespace cadence

/// Import modes of a clip.
enum ClipImportMode : int { ImportNormal = 0, ImportPullUp = 1, ImportPullDown = 2 };

/// One clip's place on the time line and the choices that map time to frames.
struct ClipPlacement {
    double start = 0, end = 0; ///< global frames of the element
    int trimIn = 0, trimOut = 0;
    int holdFirst = 0, holdLast = 0;
    bool loop = false, reverse = false;
    int importMode = ImportNormal;
    int pullType = 0;  ///< cadence row
    int pullFirst = 0; ///< position in the cadence (the "First Frame" choice)
};

/// A trim (or any file frame) of a clip in pulled time: film frames for a
/// pull-up clip, video frames for a pull-down clip; unchanged otherwise.
int ConvertPullFrame(int frame, int importMode, int pullType, int pullFirst);

/// The file frame that global time `t` shows, or nothing when the clip has
/// no image there (before its start, or after its end without loop).
std::optional<int64_t> FileFrameAt(const ClipPlacement &clip, double t);

/// Frames of a clip element from its trims and holds.
inline int64_t ElementLength(const ClipPlacement &clip) {
    return static_cast<int64_t>(clip.trimOut) - clip.trimIn + 1 + clip.holdFirst + clip.holdLast;
}

/// How one output frame of a pulled clip is assembled from file frames.
struct PullPlan {
    int64_t frame = 0;        ///< the file frame fetched first
    bool mix = false;         ///< the second field comes from frame + 1
    int dominance = 0;        ///< field order before the height rule
    bool doubleField = false; ///< one field alone, line-doubled
};

/// The assembly of output frame `f` of a clip `length` frames long in
/// import mode 1 (pull-up: film frames from video) or 2 (pull-down).
PullPlan PlanPullFrame(int importMode, int pullType, int pullFirst, int64_t f, int64_t length);

/// The field a request at `time` renders: -1 for full frames (process mode
/// 0), else 0 or 1 by the field parity of the time and the mode's order
/// (1 PAL, 2 NTSC, 3 NTSC reversed, 4 PAL reversed).
int FieldForTime(int processMode, double time, double fieldStep);

/// Clip elements in time order: the index of the one holding `t`, or, in
/// a gap, of the element before it (which may loop or hold into the gap);
/// nothing before the first element.
std::optional<size_t> FindClipAt(const std::vector<ClipPlacement> &clips, double t);

} // namespace Orvane
