#pragma once
// Commands that a viewer, or the command line, sends to a tool
// (Operator::ControlCommand): the select of a rectangle of the frame, with
// which a keyer picks its colour ranges, a tracking run, and the reading
// of a file into a tool's inputs (a lens data file, for example).
//
// A select names its rectangle in frame fractions, x to the right and y up
// from the frame's bottom-left corner, so that it means the same at any
// proxy scale. A tool that takes it keeps the rectangle until its next
// Process, and writes what it picked back to its inputs through
// OrvaneDoc::DocExecute, so that the change lands between renders.
//
// Thread safety: constants and a plain value.
#include <utility>

#include "host/core/TagList.h"

namespace Orvane {

enum ControlCommands : int {
    CCMD_Select = 1,   ///< a rectangle of the frame was selected (picked)
    CCMD_Track = 2,    ///< track frame by frame from CCMD_TrackFrom to CCMD_TrackTo and write the paths
    CCMD_LoadFile = 3, ///< read the file CCMD_FileName into the tool's inputs (its load button)
};

/// CCMD_Select: the rectangle's edges in frame fractions (double).
constexpr Tag CCMD_SelectLeft = 0x200d0000;
constexpr Tag CCMD_SelectBottom = 0x200d0001;
constexpr Tag CCMD_SelectRight = 0x200d0002;
constexpr Tag CCMD_SelectTop = 0x200d0003;
/// CCMD_Select: modifier flags (int), CCMD_ModSubtract among them.
constexpr Tag CCMD_Modifiers = 0x100d0000;
/// The subtracting pick: the picked colours are taken out of the ranges.
constexpr int CCMD_ModSubtract = 1;

/// CCMD_Track: the run's first and last frames (double; the run goes backwards when To is before From).
constexpr Tag CCMD_TrackFrom = 0x200d0010;
constexpr Tag CCMD_TrackTo = 0x200d0011;
/// CCMD_Track: the RenderTask the frames render in (pointer; its abort stops the run, keeping what was tracked).
constexpr Tag CCMD_TrackTask = 0x600d0010;

/// CCMD_LoadFile: the file (const char *), the button it stands for (const Input *; absent: the tool's only
/// one), the time its values are written at (double; absent: not animated), and where a failure's text goes
/// (std::string *). A tool that takes the command returns true, failed or not; the text is empty on success.
constexpr Tag CCMD_FileName = 0x600d0020;
constexpr Tag CCMD_FileInput = 0x600d0021;
constexpr Tag CCMD_FileError = 0x600d0022;
constexpr Tag CCMD_FileTime = 0x200d0020;

/// A selected rectangle in frame fractions.
struct PickRect {
    double left = 0, bottom = 0, right = 0, top = 0;
    bool subtract = false;

    /// The rectangle of a CCMD_Select's tags (edges put in order).
    static PickRect FromTags(const TagList &tags) {
        PickRect r{tags.GetDouble(CCMD_SelectLeft, 0.0), tags.GetDouble(CCMD_SelectBottom, 0.0),
                   tags.GetDouble(CCMD_SelectRight, 0.0), tags.GetDouble(CCMD_SelectTop, 0.0),
                   (tags.GetLong(CCMD_Modifiers, 0) & CCMD_ModSubtract) != 0};
        if (r.left > r.right) std::swap(r.left, r.right);
        if (r.bottom > r.top) std::swap(r.bottom, r.top);
        return r;
    }
};

} // namespace Orvane
