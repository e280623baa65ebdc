#pragma once
// What the fuzz harnesses share: loading the tool library, reading bytes as
// an image file the way a clip does, and failing loudly.
//
// Thread safety: harnesses run one input at a time.
#include <cstddef>
#include <cstdint>

namespace Orvane::Fuzz {

/// The process's pixel memory limit while fuzzing. A few bytes can claim a
/// huge image; the host's header budget must refuse it before any pixel is
/// allocated, and small images keep the runs fast.
constexpr size_t kPixelMemoryLimit = size_t(64) << 20;

/// Loads the tool library from beside the host library and sets the pixel
/// memory limit; aborts when it cannot.
void LoadOperators();
/// Prints `why` and aborts, so the fuzzer keeps the input.
[[noreturn]] void Fatal(const char *why);
/// Reads `data` as a file of the format class `formatId`: confirms the format,
/// reads the header alone (as a render's pre-calculation does), then, within
/// the pixel budget, the pixels at a proxy scale and region picked by the
/// last byte of the input.
void ReadImage(const char *formatId, const uint8_t *data, size_t size);

} // namespace Orvane::Fuzz
