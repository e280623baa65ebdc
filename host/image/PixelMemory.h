#pragma once
// Pixel memory: where image rows live.
//
// Large blocks (a frame's rows) are expensive to get from the system: every
// fresh page faults and is zeroed by the kernel on first touch, which costs
// more than the tool that fills it. Freed large blocks therefore wait in a
// pool, by size, and a new image of the same size takes one back; new large
// blocks are aligned to 2 MiB and offered to the kernel for huge pages. Small
// blocks come from the ordinary heap.
//
// Blocks come back zeroed either way. The pool keeps at most PoolLimit()
// bytes; the oldest blocks leave first.
//
// Thread safety: all functions may be called from any thread.
#include <cstddef>
#include <cstdint>

#include "host/core/Export.h"

namespace Orvane {

/// A zeroed block of `bytes`; null when memory ran out or the block would
/// take more than half the machine's memory.
ORVANE_API uint8_t *AllocPixels(size_t bytes);
/// Gives a block from AllocPixels back; `bytes` must be the size asked.
ORVANE_API void FreePixels(uint8_t *block, size_t bytes);

/// Bytes the pool may keep (default 1 GiB); 0 turns the pool off.
ORVANE_API void SetPixelPoolLimit(size_t bytes);
ORVANE_API size_t PixelPoolLimit();
/// Bytes held in the pool now.
ORVANE_API size_t PixelPoolBytes();

} // namespace Orvane
