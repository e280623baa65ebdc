#pragma once
// What the fuzz harnesses share: loading the tool library, reading bytes as
// an image file the way a clip does, and failing loudly.
//
// Thread safety: harnesses run one input at a time.
#include <cstddef>
#include <cstdint>

namespace Orvane::Fuzz {

/// Pixels (data window area) a header may ask for before the harness skips
/// reading the pixels. A few bytes can claim a huge image, which the readers
/// do not refuse by its size yet; the budget keeps such inputs from
/// exhausting memory, and small images keep the runs fast.
constexpr int64_t kPixelBudget = int64_t(1) << 18;

/// Loads the tool library from beside the host library; aborts when it cannot.
void LoadOperators();
/// Prints `why` and aborts, so the fuzzer keeps the input.
[[noreturn]] void Fatal(const char *why);
/// Reads `data` as a file of the format class `formatId`: confirms the format,
/// reads the header alone (as a render's pre-calculation does), then, within
/// the pixel budget, the pixels at a proxy scale and region picked by the
/// last byte of the input.
void ReadImage(const char *formatId, const uint8_t *data, size_t size);

} // namespace Orvane::Fuzz
