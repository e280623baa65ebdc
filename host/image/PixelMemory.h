#pragma once
// Pixel memory: where image rows live, and the limit on how much of it the
// process may hold.
//
// Large blocks (a frame's rows) are expensive to get from the system: every
// fresh page faults and is zeroed by the kernel on first touch, which costs
// more than the tool that fills it. Freed large blocks therefore wait in a
// pool, by size, and a new image of the same size takes one back; new large
// blocks are aligned to 2 MiB and offered to the kernel for huge pages. Small
// blocks come from the ordinary heap. Blocks come back zeroed either way. The
// pool keeps at most PixelPoolLimit() bytes; the oldest blocks leave first.
//
// The limit: every block handed out and every block in the pool counts
// against PixelMemoryLimit() (default three quarters of the machine's
// memory; `orvane render --memory-limit` sets it). An allocation that would
// pass it first empties the pool, then asks the reclaimers (the result
// cache registers one, which drops results nobody else holds), and only then
// is refused. A refusal is remembered for the calling thread, so the tool
// that asked can say what it needed (TakePixelRefusal). A file header that
// asks for more than the limit is refused before anything is allocated
// (PixelLimitRefusal, used by ImageFormat).
//
// Thread safety: all functions may be called from any thread. Reclaimers are
// called on the allocating thread with no pixel-memory lock held, one at a
// time; RemovePixelReclaimer waits for a call in progress to end.
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

#include "host/core/Export.h"

namespace Orvane {

/// A zeroed block of `bytes`; null when the limit or the system refused it.
ORVANE_API uint8_t *AllocPixels(size_t bytes);
/// Gives a block from AllocPixels back; `bytes` must be the size asked.
ORVANE_API void FreePixels(uint8_t *block, size_t bytes);

/// Bytes the pool may keep (default 1 GiB); 0 turns the pool off.
ORVANE_API void SetPixelPoolLimit(size_t bytes);
ORVANE_API size_t PixelPoolLimit();
/// Bytes held in the pool now.
ORVANE_API size_t PixelPoolBytes();

/// Sets the limit on pixel memory (blocks handed out plus the pool); 0 goes
/// back to the default. `source` names the setting in messages
/// ("--memory-limit"); null: "the memory limit".
ORVANE_API void SetPixelMemoryLimit(size_t bytes, const char *source = nullptr);
ORVANE_API size_t PixelMemoryLimit();
/// Bytes counted against the limit now, and the most counted since the last
/// ResetPixelMemoryPeak.
ORVANE_API size_t PixelMemoryInUse();
ORVANE_API size_t PixelMemoryPeak();
ORVANE_API void ResetPixelMemoryPeak();

/// Frees what it can towards `wanted` bytes; returns the bytes it let go.
using PixelReclaimer = std::function<size_t(size_t wanted)>;
/// Registers a reclaimer; the number it returns removes it.
ORVANE_API int AddPixelReclaimer(PixelReclaimer reclaimer);
ORVANE_API void RemovePixelReclaimer(int id);

/// Names what the calling thread's last refused block was for ("a 8192x4320
/// RGBA float32 image"); the image code calls it after a refusal.
ORVANE_API void NamePixelRefusal(const std::string &what);
/// Why the calling thread's last allocation was refused, and forgets it:
/// "needs 540 MiB for a 8192x4320 RGBA float32 image; --memory-limit is
/// 256 MiB, 300 MiB of it in use". Empty when nothing was refused since.
ORVANE_API std::string TakePixelRefusal();
/// Whether the calling thread has a refusal not taken yet.
ORVANE_API bool PixelMemoryRefused();
/// Forgets the calling thread's refusal (a new piece of work starts).
ORVANE_API void ClearPixelRefusal();
/// "needs 473 MiB for <what>; --memory-limit is 256 MiB" when `bytes` can
/// never fit under the limit; empty when they can.
ORVANE_API std::string PixelLimitRefusal(uint64_t bytes, const std::string &what);

/// A byte count for messages: "540 MiB", "1.5 GiB", "12 KiB" (rounded up).
ORVANE_API std::string FormatBytes(uint64_t bytes);

} // namespace Orvane
