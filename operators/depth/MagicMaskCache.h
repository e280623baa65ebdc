#pragma once
// MagicMaskCache: the tracked mattes of Magic Mask tools kept on disk, so
// that a later process (a render after a tracking run) reads a tracked
// frame's matte instead of carrying the masks again from the reference frame.
//
// One file a frame holds the frame's matte and the propagated mask the run
// handed on from it. The file's key covers the tool's settings (strokes,
// mode, refine range, algorithm version: the caller's settings key), the
// frame, its data window and frame size, and the source frame's pixels, so a
// changed plate or stroke never finds an old matte. The file name starts
// with a tag of the tool's name, which Clear uses to delete one tool's files.
//
// The folder is per user, never beside the flow: $ORVANE_MAGIC_MASK_CACHE
// ("off" switches the cache off), else $XDG_CACHE_HOME/orvane/magicmask,
// else ~/.cache/orvane/magicmask. Its size is bounded: after each write the
// files beyond the limit (4 GiB, or $ORVANE_MAGIC_MASK_CACHE_LIMIT in MiB)
// go, the least recently written first (never the file just written).
//
// File form: a 48-byte header (magic "OVMMASK1", the key, the frame, the data
// window x0, y0, x1, y1, the frame's width and height, the plane count 2,
// little-endian as the machine writes it), then the matte's rows and the
// propagated mask's rows as 32-bit floats, bottom row first. Files are
// written under a temporary name and renamed; a reader checks the header
// against what it asks for and the file's size, and ignores a file that does
// not fit (corrupt, truncated, foreign or of another key).
//
// Thread safety: safe from any thread and process (atomic renames; a file
// deleted under a reader is a miss).
#include <cstdint>
#include <string>

namespace Orvane {

class Image;

namespace MagicMaskCache {

/// The cache folder, or "" when it is off or there is no home.
std::string Folder();
/// The key of one frame: `settings` (the tool's settings key), the frame, and
/// `src`'s data window, frame size, depth and pixels (which must be in memory).
uint64_t FrameKey(uint64_t settings, int frame, const Image &src);
/// Writes a frame: `matte` an RGBA float image (its alpha is kept), `propMask`
/// a one-channel float image of the same window. False when nothing was written.
bool Store(const std::string &tool, uint64_t key, int frame, const Image &matte, const Image &propMask);
/// Reads a frame into images made by the caller of the window and kinds Store
/// takes: the matte in all four channels of `matte`. False on a miss or a file
/// that does not fit; the images are then left undefined.
bool Load(const std::string &tool, uint64_t key, int frame, Image &matte, Image &propMask);
/// Deletes the tool's files; the number deleted.
int Clear(const std::string &tool);

} // namespace MagicMaskCache
} // namespace Orvane
