#include "operators/media/formats/BMPFormat.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/ByteOrder.h"
#include "operators/media/formats/FrameRows.h"

namespace Orvane {

static const OvID CLSID_BMPFormat("BMPFormat");
static ClassRegistration<BMPFormat, ImageFormat> s_BMPFormatReg(CLSID_BMPFormat, &CLSID_ImageFormat,
                                                                {{RegTypeFlags, RegFamilyImageFormat},
                                                                 {RegFormatCanLoad, 1},
                                                                 {RegFormatCanSave, 1},
                                                                 {RegFormatHasOptions, 1},
                                                                 {RegFormatHasSaveOptions, 1},
                                                                 {RegFormatKeepsAspect, 1},
                                                                 {RegFormatName, "Windows Bitmap Files"},
                                                                 {RegFormatExtension, ".BMP"},
                                                                 {RegFormatExtension, ".DIB"}});

namespace bmp_format_detail {

constexpr int kFileHeader = 14, kInfoHeader = 40, kOS2Header = 12;

/// Row y of an image, columns 0..width-1, as 16-bit pixels: canvas colour
/// outside the data window.
} // namespace bmp_format_detail

using namespace bmp_format_detail;

int64_t BMPFormat::Stride(int bits, int width) {
    const int64_t w = width;
    switch (bits) {
    case 8: return (w + 3) & ~int64_t(3);
    case 24: return ((w + 1) * 3) & ~int64_t(3);
    default: return w * 4;
    }
}

bool BMPFormat::CheckFormat(IOClass *stream) {
    uint8_t magic[2];
    if (!stream || !stream->ReadExact(magic, 2)) return false;
    return LE::Get16(magic) == 19778;
}

void BMPFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    AddOptionCheckbox(tool, "Save Alpha", "SaveAlpha", 1.0);
}

void BMPFormat::SetupSave(Operator *tool, Request *req) {
    saveAlpha_ = OptionValue(tool, req, "SaveAlpha", 1.0) >= 0.5;
}

void BMPFormat::CleanupSave(Operator *) {}

bool BMPFormat::LoadHeader(IOClass *stream) {
    io = stream;
    palette_.clear();
    if (!io) return Fail("no stream");
    uint8_t fh[kFileHeader];
    if (!io->ReadExact(fh, kFileHeader)) return Fail("truncated file header");
    if (LE::Get16(fh) != 19778) return Fail("not a BMP file");
    const uint32_t pixelOffset = LE::Get32(fh + 10);

    uint8_t ih[kInfoHeader] = {};
    const int64_t got = io->Read(ih, kInfoHeader);
    if (got < 4) return Fail("truncated info header");
    const uint32_t headerSize = LE::Get32(ih);
    int64_t w, h;
    int bits;
    bool topDown = false;
    uint32_t compression = 0, colours = 0;
    const bool os2 = headerSize == kOS2Header;
    if (os2) {
        if (got < kOS2Header) return Fail("truncated info header");
        w = LE::Get16(ih + 4), h = LE::Get16(ih + 6), bits = LE::Get16(ih + 10);
        // Back to the end of the short header, where its palette starts.
        if (!io->Seek(kFileHeader + kOS2Header, IOClass::SeekAbsolute)) return Fail("seek error");
    } else {
        if (got < kInfoHeader || headerSize < kInfoHeader) return Fail("truncated info header");
        w = LE::GetS32(ih + 4), h = LE::GetS32(ih + 8), bits = LE::Get16(ih + 14);
        // A negative height marks lines stored top first.
        topDown = h < 0 && h > INT32_MIN;
        if (topDown) h = -h;
        compression = LE::Get32(ih + 16), colours = LE::Get32(ih + 32);
        // A larger header (with colour masks and colour space) is read for its first 40 bytes.
        if (headerSize > kInfoHeader && !io->Seek(kFileHeader + int64_t(headerSize), IOClass::SeekAbsolute))
            return Fail("seek error");
    }
    if (bits != 8 && bits != 24 && bits != 32) return Fail("unsupported bit depth " + std::to_string(bits));
    if (compression != 0 && compression != 3) return Fail("unsupported compression " + std::to_string(compression));
    if (w < 1 || h < 1 || w > MaxImageSide || h > MaxImageSide)
        return Fail("bad size " + std::to_string(w) + " x " + std::to_string(h));
    if (colours == 0 && bits < 9) colours = 1u << bits;

    if (bits == 8) {
        const int entries = static_cast<int>(std::min<uint32_t>(colours, 256));
        const int entryBytes = os2 ? 3 : 4;
        std::vector<uint8_t> raw(static_cast<size_t>(entries) * entryBytes);
        if (!io->ReadExact(raw.data(), static_cast<int64_t>(raw.size()))) return Fail("truncated palette");
        palette_.assign(256 * 4, 0);
        for (int i = 0; i < entries; ++i) std::memcpy(&palette_[i * 4], &raw[i * entryBytes], 3);
    }
    if (pixelOffset != 0 && !io->Seek(pixelOffset, IOClass::SeekAbsolute)) return Fail("seek error");
    dataStart_ = io->Tell();
    if (dataStart_ < 0) return Fail("seek error");
    const int64_t size = io->Size();
    if (size >= 0 && size - dataStart_ < Stride(bits, static_cast<int>(w)) * h) return Fail("truncated pixel data");

    bits_ = bits;
    topDown_ = topDown;
    width = static_cast<int>(w), height = static_cast<int>(h);
    depth = DepthRGBAInt8;
    fileChannels = bits == 32 ? "R G B A" : "R G B";
    fileSampleType = "uint8";
    aspectX = aspectY = 1.0;
    return true;
}

bool BMPFormat::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    if (image->IsNoData()) return true;
    const ImgRectI win = image->DataWindow() & ImgRectI(0, 0, width, height);
    if (win.IsNull()) return true;
    if (!image->AllocScanLineData()) return Fail("out of memory");

    const int64_t stride = Stride(bits_, width);
    std::vector<uint8_t> line(static_cast<size_t>(stride));
    std::vector<Pixel> px(static_cast<size_t>(win.Width()));
    const int bpp = bits_ / 8;
    if (!topDown_ && !io->Seek(dataStart_ + stride * win.y0, IOClass::SeekAbsolute)) return Fail("seek error");
    for (int y = win.y0; y < win.y1; ++y) {
        if (Aborted()) return Fail("aborted");
        if (topDown_ && !io->Seek(dataStart_ + stride * (height - 1 - y), IOClass::SeekAbsolute))
            return Fail("seek error");
        if (!io->ReadExact(line.data(), stride)) return Fail("truncated line " + std::to_string(y));
        for (int x = win.x0; x < win.x1; ++x) {
            const uint8_t *s = bits_ == 8 ? &palette_[line[x] * 4] : &line[static_cast<size_t>(x) * bpp];
            Pixel &p = px[x - win.x0];
            p.B = static_cast<uint16_t>(s[0] * 257), p.G = static_cast<uint16_t>(s[1] * 257);
            p.R = static_cast<uint16_t>(s[2] * 257);
            p.A = bits_ == 32 ? static_cast<uint16_t>(s[3] * 257) : 65535;
        }
        uint8_t *dst = image->PixelAddress(win.x0, y);
        if (dst) StorePixel(image->Depth(), px.data(), win.Width(), dst);
    }
    return true;
}

bool BMPFormat::SaveHeader(IOClass *stream, Image *image) {
    io = stream;
    if (!io || !image) return Fail("nothing to write");
    const uint32_t w = static_cast<uint32_t>(image->Width()), h = static_cast<uint32_t>(image->Height());
    uint8_t hdr[66] = {};
    hdr[0] = 'B', hdr[1] = 'M';
    LE::Put32(hdr + 2, saveAlpha_ ? 4 * w * h + 66 : 3 * (w * h + 18));
    LE::Put32(hdr + 10, saveAlpha_ ? 66 : 54);
    uint8_t *ih = hdr + kFileHeader;
    LE::Put32(ih, kInfoHeader);
    LE::Put32(ih + 4, w);
    LE::Put32(ih + 8, h);
    LE::Put16(ih + 12, 1);
    LE::Put16(ih + 14, saveAlpha_ ? 32 : 24);
    LE::Put32(ih + 20, (saveAlpha_ ? 4 : 3) * w * h);
    if (saveAlpha_) {
        // Colour masks after the header; compression stays 0, and readers go
        // by the pixel offset, so the masks are skipped.
        LE::Put32(hdr + 54, 0xff0000);
        LE::Put32(hdr + 58, 0xff00);
        LE::Put32(hdr + 62, 0xff);
    }
    if (!io->WriteExact(hdr, saveAlpha_ ? 66 : 54)) return Fail("write error");
    width = static_cast<int>(w), height = static_cast<int>(h);
    return true;
}

bool BMPFormat::SaveFrame(unsigned, Image *image) {
    if (!io || !image) return Fail("nothing to write");
    const int w = image->Width(), h = image->Height();
    const int64_t stride = saveAlpha_ ? int64_t(w) * 4 : Stride(24, w);
    uint8_t *line = static_cast<uint8_t *>(std::calloc(static_cast<size_t>(stride), 1));
    if (!line) return Fail("out of memory");
    std::vector<Pixel> px;
    std::vector<FltPixel> flt;
    bool ok = true;
    for (int y = 0; y < h && ok; ++y) {
        if (Aborted()) {
            ok = Fail("aborted");
            break;
        }
        FrameRows::Row16(*image, y, w, px, flt);
        FrameRows::PackBGRA8(px, w, saveAlpha_, line);
        if (!io->WriteExact(line, stride)) ok = Fail("write error");
    }
    std::free(line);
    return ok;
}

int64_t BMPFormat::PredictFileSize(Image *image) {
    if (!image) return 0;
    const int64_t w = image->Width(), h = image->Height();
    return saveAlpha_ ? 4 * w * h + 66 : Stride(24, image->Width()) * h + 54;
}

} // namespace Orvane
