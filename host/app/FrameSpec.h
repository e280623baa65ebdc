#pragma once
// Frame lists as render commands give them:
//   "1-100"      every frame from 1 to 100
//   "1-100x2"    every second frame (1, 3, ... 99)
//   "1,5,10-20"  several items, rendered in the order written
//   "10-1"       descending
//   "-23--5"     negative frames
// A frame named twice is rendered once, where it first appears. A chunk
// "I/N" takes the I-th (from 1) of N contiguous pieces of the list, the
// first pieces one frame longer when the list does not divide evenly, so a
// job array can pass its task index.
//
// Thread safety: pure functions.
#include <cstdint>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// Parses a frame list; false with a one-line reason on bad text.
ORVANE_API bool ParseFrameSpec(const std::string &text, std::vector<int64_t> &frames, std::string &error);
/// The frames from `first` to `last` (either direction), step 1.
ORVANE_API std::vector<int64_t> FrameRange(int64_t first, int64_t last);
/// Parses "I/N" and cuts `frames` to that chunk; false with a reason.
ORVANE_API bool TakeChunk(const std::string &chunk, std::vector<int64_t> &frames, std::string &error);

} // namespace Orvane
