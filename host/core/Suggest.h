#pragma once
// "Did you mean": the known name closest to a misspelt one.
//
// Names compare without regard to case; the distance counts inserted,
// deleted, replaced and swapped neighbouring characters. A name is offered
// only when it is close for its length (about one edit in three characters),
// so that a wholly different word gets no suggestion.
//
// Thread safety: pure functions.
#include <string>
#include <string_view>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

/// Edits between two names, ignoring case (optimal string alignment distance).
ORVANE_API size_t NameDistance(std::string_view a, std::string_view b);

/// The candidate closest to `word` when it is close enough, else "".
ORVANE_API std::string ClosestName(std::string_view word, const std::vector<std::string> &candidates);

/// " (did you mean 'Gain'?)" for the closest candidate, or "".
ORVANE_API std::string DidYouMean(std::string_view word, const std::vector<std::string> &candidates);

} // namespace Orvane
