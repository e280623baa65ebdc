#pragma once
// The pixel API scripts reach through LuaJIT's FFI: plain C functions over the
// host's own Image and FltPixel, so a script reads and writes image rows in
// place, without copies. Every script state declares the C types of
// ScriptImageDeclarations() and binds them as FltPixel, PixPtr and Image
// (ScriptState.cpp); the functions are handed over as the table
// OrvaneScriptApi, so no symbol lookup is needed.
//
// A script pixel (FltPixel in scripts, OrvaneScriptPixel here) holds the four
// colour channels first, as the host's FltPixel, then the background colour
// channels and the auxiliary channels. Cursors and samplers read and write the
// auxiliary channels an image has and leave the other fields as they are; the
// background colour channels are scratch for scripts (images do not carry them).
//
// Safety: a script holds a cursor only as opaque constant bytes and makes one
// only through ovs_PixPtrInit, so it cannot aim it at other memory; every read
// and write checks the cursor against the image's data window; writes to a
// read-only (shared) image are dropped. Null images read as cleared pixels;
// null cursors and pixels are ignored.
//
// Thread safety: functions on different cursors and rows may run at once;
// a cursor belongs to one thread. The line counter is atomic.
#include <cstdint>

#include "host/core/Export.h"

namespace Orvane {
class Image;
}

/// A pixel as scripts see it: colour, background colour, auxiliary channels.
struct OrvaneScriptPixel {
    float R, G, B, A;
    float BgR, BgG, BgB, BgA;
    float Z, Coverage, U, V, NX, NY, NZ, VectX, VectY, BackVectX, BackVectY, PositionX, PositionY, PositionZ,
        DisparityX, DisparityY;
};

/// The auxiliary channels of a script pixel, in field order from Z.
inline constexpr int kScriptAuxFields = 16;

/// A cursor over one image's pixels (scripts see it as opaque bytes).
struct OrvanePixPtr {
    Orvane::Image *img;
    uint8_t *row; ///< row y from the data window's left column, null outside the window or without rows
    int32_t x, y;
    int32_t x0, x1; ///< the data window's columns
    int32_t bytesPerPixel, depth;
    int32_t writable;
    uint32_t auxFields; ///< bit k: the image has the script pixel's auxiliary field k
};

/// Edge rules of ovs_ImageSample beyond the image frame.
enum OrvaneSampleEdges : int32_t {
    OrvaneEdgeBlack = 0,     ///< cleared pixels (0, 0, 0, 0)
    OrvaneEdgeWrap = 1,      ///< the frame repeats
    OrvaneEdgeDuplicate = 2, ///< the border pixel repeats
    OrvaneEdgeMirror = 3,    ///< the frame repeats mirrored (-1 reads 0, -2 reads 1)
};

extern "C" {
/// Sets `p` on `img` at (0, 0); a null image gives a cursor that reads clear pixels.
ORVANE_API void ovs_PixPtrInit(OrvanePixPtr *p, Orvane::Image *img);
ORVANE_API void ovs_PixPtrGotoXY(OrvanePixPtr *p, int32_t x, int32_t y);
/// One pixel to the right.
ORVANE_API void ovs_PixPtrNextPixel(OrvanePixPtr *p);
/// The pixel at the cursor, or the canvas colour outside the data window.
ORVANE_API void ovs_PixPtrGetPixel(const OrvanePixPtr *p, OrvaneScriptPixel *out);
/// Writes at the cursor (in the image's depth); nothing outside the window or on a read-only image.
ORVANE_API void ovs_PixPtrSetPixel(const OrvanePixPtr *p, const OrvaneScriptPixel *in);
/// Get/Set, then one pixel to the right.
ORVANE_API void ovs_PixPtrGetNextPixel(OrvanePixPtr *p, OrvaneScriptPixel *out);
ORVANE_API void ovs_PixPtrSetNextPixel(OrvanePixPtr *p, const OrvaneScriptPixel *in);

ORVANE_API int32_t ovs_ImageWidth(const Orvane::Image *img);
ORVANE_API int32_t ovs_ImageHeight(const Orvane::Image *img);
ORVANE_API double ovs_ImageXScale(const Orvane::Image *img);
ORVANE_API double ovs_ImageYScale(const Orvane::Image *img);
/// Bilinear sample at (x, y) in pixels, pixel centres at whole numbers (rows from the bottom): exactly
/// Image::GetFlt at whole positions. Inside the frame pixels outside the data window have the canvas
/// colour; beyond the frame `edges` (OrvaneSampleEdges) decides. NaN positions give a clear pixel.
ORVANE_API void ovs_ImageSample(const Orvane::Image *img, double x, double y, int32_t edges, OrvaneScriptPixel *out);
ORVANE_API void ovs_ImageGetCanvasColorFlt(const Orvane::Image *img, OrvaneScriptPixel *out);

/// A new image of `width` x `height` pixels in `depth` (ImageDepthValue; 8 is RGBA float32), its rows
/// allocated and cleared, holding one reference for the caller; null for an impossible format or when
/// memory ran out. Trusted scripts only (the script frees it with ovs_ImageFree).
ORVANE_API Orvane::Image *ovs_ImageNew(int32_t width, int32_t height, int32_t depth);
/// Drops the reference ovs_ImageNew gave.
ORVANE_API void ovs_ImageFree(Orvane::Image *img);

/// Takes the next line from a shared counter (atomic fetch-and-add of 1).
ORVANE_API int32_t ovs_NextLine(int32_t *counter);
/// True when the abort word is non-zero (atomic read).
ORVANE_API int32_t ovs_Aborted(const int32_t *abort);
}

/// The functions above as one table; its declaration is part of ScriptImageDeclarations().
struct OrvaneScriptApi {
    decltype(&ovs_PixPtrInit) PixPtrInit;
    decltype(&ovs_PixPtrGotoXY) PixPtrGotoXY;
    decltype(&ovs_PixPtrNextPixel) PixPtrNextPixel;
    decltype(&ovs_PixPtrGetPixel) PixPtrGetPixel;
    decltype(&ovs_PixPtrSetPixel) PixPtrSetPixel;
    decltype(&ovs_PixPtrGetNextPixel) PixPtrGetNextPixel;
    decltype(&ovs_PixPtrSetNextPixel) PixPtrSetNextPixel;
    decltype(&ovs_ImageWidth) ImageWidth;
    decltype(&ovs_ImageHeight) ImageHeight;
    decltype(&ovs_ImageXScale) ImageXScale;
    decltype(&ovs_ImageYScale) ImageYScale;
    decltype(&ovs_ImageSample) ImageSample;
    decltype(&ovs_ImageGetCanvasColorFlt) ImageGetCanvasColorFlt;
    decltype(&ovs_NextLine) NextLine;
    decltype(&ovs_Aborted) Aborted;
    decltype(&ovs_ImageNew) ImageNew;
    decltype(&ovs_ImageFree) ImageFree;
};

namespace Orvane {
enum class AuxChannelKind : uint8_t;
/// The image channel behind auxiliary field `k` of a script pixel (0: Z, 1: Coverage .. 15: DisparityY).
ORVANE_API AuxChannelKind ScriptAuxChannel(int k);
/// The one table of the functions.
ORVANE_API const OrvaneScriptApi &ScriptImageApi();
/// The ffi.cdef text declaring FltPixel, Image, PixPtr, OrvaneScriptApi, and the opaque types
/// scripts pass on (ImgRectI, Request, ScriptObject).
ORVANE_API const char *ScriptImageDeclarations();
} // namespace Orvane
