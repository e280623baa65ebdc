#pragma once
// Colour picking for the keyers that key by a box of four ranges (the Chroma,
// Ultra and Delta keyers), and the eight range inputs they share.
//
// A pick comes as CCMD_Select (host/flow/ControlCommand.h) with a rectangle
// in frame fractions. RangePicker::Select keeps it unless the tool's Lock
// Color Picking is on; the next pixel render hands the source and the ranges
// it keys with to Apply, which walks the source under the rectangle on the
// tool's axes (PickRanges) and queues the eight new limits on the document
// (OrvaneDoc::DocExecute under the tool's undo name). That render still keys
// with the ranges it was asked with, so that its result matches its inputs;
// the next one keys with the picked ranges.
//
// Thread safety: Select runs on the main thread, Apply on the render thread;
// the waiting rectangle is all they share, under the picker's lock. The
// write-back finds the tool by name when it runs, so a tool deleted meanwhile
// is no harm.
#include <mutex>
#include <optional>

#include "host/flow/ControlCommand.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;
class Input;
class Operator;
class Request;

/// The eight limits of a box: Range controls (slider 0..1) in four rows,
/// Red, Green, Blue and Luminance, labelled "<axis> Low" (default 0) and
/// "<axis> High" (default 1).
struct RangeInputs {
    Input *low[4] = {}, *high[4] = {};

    /// Adds them to `op` with the IDs `ids` (the four lows, then the four
    /// highs), the rows in control groups firstGroup .. firstGroup + 3.
    void Add(Operator &op, const char *const ids[8], int firstGroup);
    /// Every limit back to its default (a Reset button).
    void Reset() const;
    /// The limits for `req`; true when every one stands exactly at its default.
    bool Read(Request *req, float lowOut[4], float highOut[4]) const;
};

class RangePicker {
public:
    /// `lockId`: the ID of the tool's Lock Color Picking input; `rangeIds`:
    /// its range inputs' IDs, four lows then four highs; all these and
    /// `undoName` are string literals (kept, not copied).
    RangePicker(Operator &owner, const char *lockId, const char *const rangeIds[8], const char *undoName);

    /// CCMD_Select's tags: keeps the rectangle for the next render. With the
    /// lock on, false and one console warning, the tool's name first.
    bool Select(const TagList &tags);
    /// In a pixel render (not a pre-calc): walks `src` under a waiting
    /// rectangle on `keyType`'s axes (ChromaKeyAxes) from the ranges `low`,
    /// `high` the render keys with, and queues the result on the document.
    /// Nothing is queued when the rectangle holds none of src's pixels.
    void Apply(const Image &src, int keyType, const float low[4], const float high[4]);

private:
    Operator &owner_;
    const char *lockId_;
    const char *const *rangeIds_;
    const char *undoName_;
    std::mutex pickLock_;
    std::optional<PickRect> pick_; ///< a select waiting for the next pixel render
};

/// The pixels of a pick rectangle given in frame fractions (left, bottom,
/// right, top) of `img`'s frame: the right and top edges take in the pixel
/// they fall on.
ImgRectI PickRectPixels(const Image &img, double left, double bottom, double right, double top);

/// Walks the pixels of `img` within `rect` (cut to its data window), each
/// placed on the four axes of `keyType` (ChromaKeyAxes: 0 the chroma axes,
/// 1 plain colour; luminance fourth). Normally each value widens its range,
/// low := min(low, v - 3.0517578e-5), high := max(high, v + 3.0517578e-5);
/// while every limit stands at its default (within 1.1920928955078125e-7)
/// the walk starts from an empty box, so that the picked colours alone make
/// the box (widening the default box, which holds everything, would change
/// nothing). `subtract`ing, a value strictly inside a range moves the nearer
/// limit onto it (low when low + high > 2 v, else high). False, the limits
/// untouched, when no pixel was walked.
bool PickRanges(const Image &img, const ImgRectI &rect, int keyType, bool subtract, float low[4], float high[4]);

} // namespace Orvane
