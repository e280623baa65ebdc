#pragma once
// The libjpeg glue shared by the JPEG and IPL formats: a source manager that
// reads from an IOClass, a destination manager that writes to one, and an
// error manager that turns libjpeg's fatal errors into a longjmp back to the
// calling format (which then returns Fail). Nothing here opens files.
//
// Usage: a caller makes a JpegReader or JpegWriter before its setjmp, keeps
// every object with a destructor outside the region between setjmp and the
// last libjpeg call, and on a jump reports Message().
//
// Thread safety: one reader or writer per thread; nothing is shared.
#include <atomic>
#include <csetjmp>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

#include <jpeglib.h>

#include "host/core/ScriptVal.h"

namespace Orvane {

class Image;
class IOClass;
struct Pixel;

namespace JpegStream {

/// Error manager: error_exit formats the message and jumps to `jump`;
/// warnings are kept silent (libjpeg goes on after them).
struct ErrorTrap {
    jpeg_error_mgr mgr;
    std::jmp_buf jump;
    char message[JMSG_LENGTH_MAX];
};

struct Source {
    jpeg_source_mgr mgr;
    IOClass *io;
    JOCTET buffer[16384];
};

struct Destination {
    jpeg_destination_mgr mgr;
    IOClass *io;
    bool failed;
    JOCTET buffer[16384];
};

/// A decompressor reading `io` from its current position. The struct must
/// not move after construction (libjpeg keeps pointers into it).
class JpegReader {
public:
    explicit JpegReader(IOClass *io);
    ~JpegReader();
    JpegReader(const JpegReader &) = delete;
    JpegReader &operator=(const JpegReader &) = delete;

    jpeg_decompress_struct cinfo;
    ErrorTrap trap;
    Source source;
    std::string Message() const { return trap.message; }
};

class JpegWriter {
public:
    explicit JpegWriter(IOClass *io);
    ~JpegWriter();
    JpegWriter(const JpegWriter &) = delete;
    JpegWriter &operator=(const JpegWriter &) = delete;

    jpeg_compress_struct cinfo;
    ErrorTrap trap;
    Destination dest;
    std::string Message() const { return trap.message; }
};

/// Pixel aspect from the JFIF density fields: aspectX / aspectY is the
/// width of a pixel over its height.
void AspectFromDensity(const jpeg_decompress_struct &cinfo, double &aspectX, double &aspectY);

/// Reads one row of the image frame (row y, columns 0..Width-1) in 16-bit
/// units: the image's pixels inside its data window, its canvas elsewhere.
void ReadFrameRow(const Image &img, int y, Pixel *dst);

/// Fills `metadata` from an ICC profile: ColorSpace and ColorSpaceID from
/// the words of its description, GammaSpace (with Gamma) from a tone curve
/// that is a plain power. False when the profile names no known space.
bool MetadataFromICC(const uint8_t *icc, size_t size, ScriptVal &metadata);

/// What a JPEG stream holds, read from its header.
struct HeaderInfo {
    int width = 0, height = 0;         ///< after the proxy scale
    int fullWidth = 0, fullHeight = 0; ///< as stored
    int components = 0;
    double aspectX = 1.0, aspectY = 1.0;
    ScriptVal metadata = ScriptVal::Table(); ///< what an ICC profile says (MetadataFromICC)
};

/// Reads the header of the stream at io's current position, with libjpeg's
/// scaling set to 1 / proxyScale. `fourComponents` picks the IPL reading (four
/// components passed through as R, G, B, A) over the ordinary one (any other
/// count decoded to RGB). False with `error` set when the stream is no JPEG
/// or has the wrong number of components.
bool ReadHeader(IOClass *io, int proxyScale, bool fourComponents, HeaderInfo &info, std::string &error);

/// Decodes the rows of `image`'s data window (the image was made from
/// ReadHeader's sizes). False with `error` set on a bad or short stream or
/// an abort.
bool DecodeInto(IOClass *io, int proxyScale, bool fourComponents, Image &image, const std::atomic<bool> *abortFlag,
                std::string &error);

/// Settings of one written stream.
struct EncodeSettings {
    bool fourComponents = false; ///< IPL: R, G, B, A as four plain components
    int quality = 97;            ///< libjpeg quality 0..100
    bool chromaSubsampling = false;
    int dpi = 0; ///< resolution written in the density fields; 0: pixel aspect only
};

/// Writes `image` (its frame, the canvas colour outside its data window) to
/// `io`. False with `error` set when writing fails or on an abort.
bool Encode(IOClass *io, const Image &image, const EncodeSettings &settings, const std::atomic<bool> *abortFlag,
            std::string &error);

} // namespace JpegStream
} // namespace Orvane
