#pragma once
// EXRIO: direct reading and writing of OpenEXR files with several parts, for
// trusted scripts. The object is a script class (host/script/ScriptClasses.h)
// named EXRIO; its exported C functions below are what the class binds.
//
// Reading: EXRIO.__new(), ReadOpen(name, frame), ReadHeader(), then NumParts,
// FindPart, GetChannels, DataWindow, GetAttribute as needed, and per part
// Part(n), Channel(...) for each channel wanted, ReadPart(n, imgs); Close().
// Writing: __new, WriteOpen(name, frame), per part Part(name, dispw, dataw,
// aspect) and Channel(...); SetAttribute as needed; WriteHeader(); WritePart(n,
// imgs) for each part; Close().
//
// A channel entry names a file channel, its pixel type (ANY_TYPE: whatever
// the file holds; FLOAT when writing), the image (directly, or by its 1-based
// place in the `imgs` array of ReadPart / WritePart), the image channel
// (0 R, 1 G, 2 B, 3 A, 4 and on the auxiliary planes in the order of
// AuxChannelKind: 4 Z, 5 coverage, ...), the value read where the file lacks
// the channel, and the canvas value the image gets for that channel. A
// channel whose type differs from the file's is skipped on reading.
//
// Geometry: files run top down, images bottom up. With the display window's
// height h, a file row y is image row h - 1 - y; a data window (min, max)
// is the image rectangle x0 = min.x, x1 = max.x + 1, y0 = h - max.y - 1,
// y1 = h - min.y. Part(), DataWindow() and DisplayWindow() take and give
// image rectangles.
//
// Failures: every library exception is caught; the call returns false (or
// nil) and GetLastError() says why. Part numbers and channel names are
// checked, so a wrong one fails the call rather than the process.
//
// Thread safety: an object belongs to one script thread.
#include <memory>
#include <string>
#include <vector>

#include <ImfForward.h>
#include <ImfHeader.h>

#include "host/core/Object.h"
#include "host/image/Rect.h"
#include "host/script/ScriptClasses.h"

struct lua_State;

namespace Orvane {

class Image;

class EXRIO : public ScriptObject {
public:
    /// Pixel types as the library numbers them, and "any".
    enum PixelTypeValue : int { AnyType = -1, UIntType = 0, HalfType = 1, FloatType = 2 };

    struct ChannelEntry {
        std::string name;
        int type = AnyType;
        Ref<Image> image; ///< the image given directly, else null and `index` is used
        int index = 0;    ///< 1-based place in the imgs array
        int channel = 0;  ///< image channel (0..3 colour, 4.. auxiliary planes)
        double fill = 0, canvas = 0;
    };
    struct PartEntry {
        std::string name;
        double aspect = 1;
        ImgRectI display, data;
        int compression = 3; ///< zip
        std::vector<ChannelEntry> channels;
    };

    EXRIO();
    ~EXRIO() override;

    /// Closes the file and forgets parts, headers and the name (not the last error).
    void Reset();
    /// Starts reading or writing `fileName` (frame -1: the name as it stands, else that frame's name).
    void Open(const char *fileName, int frame, bool writing);
    bool ReadHeader();
    bool WriteHeader();
    bool ReadPart(int part, Image **imgs);
    bool WritePart(int part, Image **imgs);
    int FindPart(const char *name) const;
    int PartR(int part);
    int PartW(const char *name, const ImgRectI *display, const ImgRectI *data, double aspect);
    void AddChannel(const char *name, int type, Image *img, int index, int channel, double fill, double canvas);
    /// The header of a 1-based part, null when out of range.
    Imf::Header *Header(int part);
    /// A file's box as an image rectangle, with the flip for a display window of height `h`.
    static ImgRectI ImageRect(int minX, int minY, int maxX, int maxY, int h);

    std::string fileName, lastError;
    bool isOpen = false, isWriting = false;
    int numParts = 0, currentPart = 0;
    std::vector<PartEntry> parts;
    std::vector<Imf::Header> headers;
    std::unique_ptr<Imf::MultiPartInputFile> input;
    std::unique_ptr<Imf::MultiPartOutputFile> output;

private:
    /// The image an entry writes to or reads from.
    static Image *EntryImage(const ChannelEntry &e, Image **imgs);
};

} // namespace Orvane

// The exported interface (C linkage, default visibility), bound by the script class.
#define EXRIO_EXPORT extern "C" __attribute__((visibility("default")))
EXRIO_EXPORT Orvane::EXRIO *ffi_EXRIO__new();
EXRIO_EXPORT Orvane::EXRIO *ffi_EXRIO_cast(void *obj);
EXRIO_EXPORT Orvane::ScriptObject *ffi_EXRIO_uncast(Orvane::EXRIO *self);
EXRIO_EXPORT bool EXRIO_Get_IsOpen(Orvane::EXRIO *self);
EXRIO_EXPORT bool EXRIO_Get_IsWriting(Orvane::EXRIO *self);
EXRIO_EXPORT int EXRIO_Get_NumParts(Orvane::EXRIO *self);
EXRIO_EXPORT const char *ffi_EXRIOGetLastError(Orvane::EXRIO *self);
EXRIO_EXPORT void ffi_EXRIOClearLastError(Orvane::EXRIO *self);
EXRIO_EXPORT void ffi_EXRIOReadOpen(Orvane::EXRIO *self, const char *filename, int frame);
EXRIO_EXPORT void ffi_EXRIOWriteOpen(Orvane::EXRIO *self, const char *filename, int frame);
EXRIO_EXPORT int ffi_EXRIOFindPart(Orvane::EXRIO *self, const char *name);
EXRIO_EXPORT int ffi_EXRIO_PartR(Orvane::EXRIO *self, int partnum);
EXRIO_EXPORT int ffi_EXRIO_PartW(Orvane::EXRIO *self, const char *name, Orvane::ImgRectI *dispw,
                                 Orvane::ImgRectI *dataw, double aspect);
EXRIO_EXPORT void ffi_EXRIOChannelImage(Orvane::EXRIO *self, const char *name, int type, Orvane::Image *img, int ichan,
                                        double def, double cv);
EXRIO_EXPORT void ffi_EXRIOChannelIndex(Orvane::EXRIO *self, const char *name, int type, int index, int ichan,
                                        double def, double cv);
EXRIO_EXPORT bool ffi_EXRIOWriteHeader(Orvane::EXRIO *self);
EXRIO_EXPORT bool ffi_EXRIOReadHeader(Orvane::EXRIO *self);
EXRIO_EXPORT bool ffi_EXRIOClose(Orvane::EXRIO *self);
EXRIO_EXPORT bool ffi_EXRIO_ReadPart(Orvane::EXRIO *self, int partnum, Orvane::Image **imgs);
EXRIO_EXPORT bool ffi_EXRIO_WritePart(Orvane::EXRIO *self, int partnum, Orvane::Image **imgs);
EXRIO_EXPORT Orvane::ImgRectI *ffi_EXRIODataWindow(Orvane::EXRIO *self, int partnum);
EXRIO_EXPORT Orvane::ImgRectI *ffi_EXRIODisplayWindow(Orvane::EXRIO *self, int partnum);
EXRIO_EXPORT int olcf_func_EXRIOGetPartNames(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIOGetChannels(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIOGetAttributeNames(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIOGetAttribute(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIOSetAttribute(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIORemoveAttribute(lua_State *L);
EXRIO_EXPORT int olcf_func_EXRIOPixelAspectRatio(lua_State *L);
