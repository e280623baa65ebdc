#pragma once
// MagicMaskStrokes: the strokes a user draws on the picture to mark an object
// for the Magic Mask tool. Two lists of strokes, the positive ones (the
// object) and the negative ones (not the object); each stroke is a run of
// points, kept flat as x, y, x, y, ...
//
// Points are in frame fractions, x to the right and y up from the frame's
// bottom-left corner (as the pick rectangles of ControlCommand.h), so a
// stroke means the same at any proxy scale; the tool turns them into pixels
// of the frame it renders (PixelList).
//
// Document form: { PosStrokes = { { x, y, x, y, ... }, ... },
// NegStrokes = { ... } }. Reading refuses (throws, so the class factory gives
// null) a value that is not a table, a stroke that is not a table of numbers,
// an odd count of numbers, or a number that is not finite; a stroke without
// points is dropped.
//
// Thread safety: a value is immutable once published (Parameter.h); Copy is
// deep, so an edit works on a copy.
#include <vector>

#include "host/core/OvID.h"
#include "host/flow/Parameter.h"

namespace Orvane {

class Registry;
class TagList;

/// The data type of the strokes (and the class ID of the parameter class).
extern const OvID CLSID_DataType_MagicMaskStrokes;

class MagicMaskStrokes : public Parameter {
public:
    using Stroke = std::vector<double>; ///< x, y pairs

    MagicMaskStrokes() = default;
    /// The class factory's form: reads the document form in `args` (nil gives no strokes).
    MagicMaskStrokes(const Registry *reg, const ScriptVal &args, const TagList &tags);

    std::vector<Stroke> pos, neg;

    bool Empty() const { return pos.empty() && neg.empty(); }

    OvID DataType() const override { return CLSID_DataType_MagicMaskStrokes; }
    ScriptVal ToScript() const override;
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override;

    /// The strokes as the kernel takes them: x, y pairs in pixels of a frame
    /// of width x height (x * width, y * height), each stroke followed by a
    /// pair of NaNs.
    static std::vector<float> PixelList(const std::vector<Stroke> &strokes, int width, int height);
};

} // namespace Orvane
