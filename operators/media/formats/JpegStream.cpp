#include "operators/media/formats/JpegStream.h"

#include <algorithm>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <memory>

#include <jerror.h>

#include "host/image/Image.h"
#include "host/image/PixelConvert.h"
#include "host/image/PixelMemory.h"
#include "host/media/IOClass.h"

namespace Orvane {
namespace JpegStream {
namespace jpegstream_detail {

void ErrorExit(j_common_ptr cinfo) {
    auto *trap = reinterpret_cast<ErrorTrap *>(cinfo->err);
    (*cinfo->err->format_message)(cinfo, trap->message);
    std::longjmp(trap->jump, 1);
}

void OutputMessage(j_common_ptr) {} // warnings stay silent

void InitTrap(ErrorTrap &trap) {
    jpeg_std_error(&trap.mgr);
    trap.mgr.error_exit = ErrorExit;
    trap.mgr.output_message = OutputMessage;
    trap.message[0] = 0;
}

void InitSource(j_decompress_ptr) {}

boolean FillInput(j_decompress_ptr cinfo) {
    auto *src = reinterpret_cast<Source *>(cinfo->src);
    const int64_t got = src->io->Read(src->buffer, sizeof(src->buffer));
    // A file that ends early is an error: libjpeg's usual fake end marker
    // would hand back a half grey picture as if it were whole.
    if (got <= 0) ERREXIT(cinfo, JERR_INPUT_EOF);
    src->mgr.next_input_byte = src->buffer;
    src->mgr.bytes_in_buffer = static_cast<size_t>(got);
    return TRUE;
}

void SkipInput(j_decompress_ptr cinfo, long count) {
    auto *src = reinterpret_cast<Source *>(cinfo->src);
    if (count <= 0) return;
    while (count > static_cast<long>(src->mgr.bytes_in_buffer)) {
        count -= static_cast<long>(src->mgr.bytes_in_buffer);
        FillInput(cinfo);
    }
    src->mgr.next_input_byte += count;
    src->mgr.bytes_in_buffer -= static_cast<size_t>(count);
}

void TermSource(j_decompress_ptr) {}

void InitDestination(j_compress_ptr cinfo) {
    auto *dst = reinterpret_cast<Destination *>(cinfo->dest);
    dst->mgr.next_output_byte = dst->buffer;
    dst->mgr.free_in_buffer = sizeof(dst->buffer);
}

boolean EmptyOutput(j_compress_ptr cinfo) {
    auto *dst = reinterpret_cast<Destination *>(cinfo->dest);
    if (!dst->io->WriteExact(dst->buffer, sizeof(dst->buffer))) {
        dst->failed = true;
        ERREXIT(cinfo, JERR_FILE_WRITE);
    }
    dst->mgr.next_output_byte = dst->buffer;
    dst->mgr.free_in_buffer = sizeof(dst->buffer);
    return TRUE;
}

void TermDestination(j_compress_ptr cinfo) {
    auto *dst = reinterpret_cast<Destination *>(cinfo->dest);
    const size_t n = sizeof(dst->buffer) - dst->mgr.free_in_buffer;
    if (n && !dst->io->WriteExact(dst->buffer, static_cast<int64_t>(n))) {
        dst->failed = true;
        ERREXIT(cinfo, JERR_FILE_WRITE);
    }
}

uint32_t BE32(const uint8_t *p) {
    return (uint32_t(p[0]) << 24) | (uint32_t(p[1]) << 16) | (uint32_t(p[2]) << 8) | p[3];
}

/// The text of an ICC "desc" tag (v2 'desc' or v4 'mluc'), ASCII only.
std::string DescriptionText(const uint8_t *tag, size_t size) {
    std::string text;
    if (size >= 12 && std::memcmp(tag, "desc", 4) == 0) {
        const size_t n = BE32(tag + 8);
        for (size_t i = 0; i < n && 12 + i < size && tag[12 + i]; ++i) text += char(tag[12 + i]);
    } else if (size >= 28 && std::memcmp(tag, "mluc", 4) == 0) {
        const size_t length = BE32(tag + 20), offset = BE32(tag + 24);
        for (size_t i = 0; i + 1 < length && offset + i + 1 < size; i += 2) {
            const unsigned c = (unsigned(tag[offset + i]) << 8) | tag[offset + i + 1];
            text += c < 128 ? char(c) : '?';
        }
    }
    return text;
}

/// Gamma of a tone curve that is a plain power; 0 when it is not one.
double CurveGamma(const uint8_t *tag, size_t size) {
    if (size >= 12 && std::memcmp(tag, "curv", 4) == 0) {
        const uint32_t n = BE32(tag + 8);
        if (n == 0) return 1.0;
        if (n == 1 && size >= 14) return ((tag[12] << 8) | tag[13]) / 256.0;
    } else if (size >= 16 && std::memcmp(tag, "para", 4) == 0) {
        const unsigned function = (tag[8] << 8) | tag[9];
        if (function == 0) return static_cast<int32_t>(BE32(tag + 12)) / 65536.0;
    }
    return 0.0;
}

struct SpaceWord {
    const char *word;
    const char *space;
};

// Looked for in this order: the longer, more telling words come first.
constexpr SpaceWord kSpaceWords[] = {
    {"sRGB", "sRGB"},
    {"61966-2", "sRGB"},
    {"AdobeRGB", "AdobeRGB"},
    {"Adobe RGB", "AdobeRGB"},
    {"opRGB", "AdobeRGB"},
    {"OptionalRGB", "AdobeRGB"},
    {"Optional RGB", "AdobeRGB"},
    {"AppleRGB", "AppleRGB"},
    {"Apple RGB", "AppleRGB"},
    {"CIERGB", "CIERGB"},
    {"CIE RGB", "CIERGB"},
    {"ColorMatch", "ColorMatchRGB"},
    {"Color Match", "ColorMatchRGB"},
    {"eciRGB", "eciRGB"},
    {"eci RGB", "eciRGB"},
    {"WideRGB", "WideGamutRGB"},
    {"Wide RGB", "WideGamutRGB"},
    {"AdobeWide", "WideGamutRGB"},
    {"Adobe Wide", "WideGamutRGB"},
    {"ProPhoto", "ProPhotoRGB"},
    {"Pro Photo", "ProPhotoRGB"},
    {"Rec709", "Rec709"},
    {"Rec-709", "Rec709"},
    {"Rec 709", "Rec709"},
    {"BT.709", "Rec709"},
    {"WideGamut", "WideGamutRGB"},
    {"v2", "eciRGB"},
    {"ECIv2", "eciRGB"},
    {"ECI", "eciRGB"},
    {"CIE", "CIERGB"},
    {"Apple", "AppleRGB"},
    {"Adobe", "AdobeRGB"},
};

} // namespace jpegstream_detail

namespace detail = jpegstream_detail;

JpegReader::JpegReader(IOClass *io) {
    std::memset(&cinfo, 0, sizeof(cinfo));
    detail::InitTrap(trap);
    cinfo.err = &trap.mgr;
    jpeg_create_decompress(&cinfo); // cannot fail: it only allocates a small pool
    // Progressive and multi-scan files keep every coefficient of the frame
    // while decoding (two bytes per sample at full size, whatever the proxy
    // scale). That buffer counts against what the pixel memory limit has
    // left, so a header claiming a huge frame fails before the allocation.
    // libjpeg reads 0 as "no limit", hence the floor.
    const size_t limit = PixelMemoryLimit(), used = PixelMemoryInUse();
    cinfo.mem->max_memory_to_use = static_cast<long>(std::min<size_t>(
        std::max<size_t>(limit > used ? limit - used : 0, size_t(1) << 20), static_cast<size_t>(LONG_MAX)));
    source.io = io;
    source.mgr.init_source = detail::InitSource;
    source.mgr.fill_input_buffer = detail::FillInput;
    source.mgr.skip_input_data = detail::SkipInput;
    source.mgr.resync_to_restart = jpeg_resync_to_restart;
    source.mgr.term_source = detail::TermSource;
    source.mgr.next_input_byte = nullptr;
    source.mgr.bytes_in_buffer = 0;
    cinfo.src = &source.mgr;
}

JpegReader::~JpegReader() { jpeg_destroy_decompress(&cinfo); }

JpegWriter::JpegWriter(IOClass *io) {
    std::memset(&cinfo, 0, sizeof(cinfo));
    detail::InitTrap(trap);
    cinfo.err = &trap.mgr;
    jpeg_create_compress(&cinfo);
    dest.io = io;
    dest.failed = false;
    dest.mgr.init_destination = detail::InitDestination;
    dest.mgr.empty_output_buffer = detail::EmptyOutput;
    dest.mgr.term_destination = detail::TermDestination;
    cinfo.dest = &dest.mgr;
}

JpegWriter::~JpegWriter() { jpeg_destroy_compress(&cinfo); }

void AspectFromDensity(const jpeg_decompress_struct &cinfo, double &aspectX, double &aspectY) {
    aspectX = aspectY = 1.0;
    if (!cinfo.saw_JFIF_marker || cinfo.X_density == 0 || cinfo.Y_density == 0) return;
    // More pixels per unit across than down means narrower pixels.
    aspectX = static_cast<double>(cinfo.Y_density) / cinfo.X_density;
}

void ReadFrameRow(const Image &img, int y, Pixel *dst) {
    const int w = img.Width();
    const ImgRectI &dw = img.DataWindow();
    Pixel canvas;
    img.GetCanvasColor(canvas);
    const int x0 = std::max(0, dw.x0), x1 = std::min(w, dw.x1);
    const uint8_t *row = img.ScanLine(y);
    if (!row || x0 >= x1) {
        for (int x = 0; x < w; ++x) dst[x] = canvas;
        return;
    }
    for (int x = 0; x < x0; ++x) dst[x] = canvas;
    LoadPixel(img.Depth(), img.PixelAddress(x0, y), x1 - x0, dst + x0);
    for (int x = x1; x < w; ++x) dst[x] = canvas;
}

bool MetadataFromICC(const uint8_t *icc, size_t size, ScriptVal &metadata) {
    if (!icc || size < 132) return false;
    const uint32_t count = detail::BE32(icc + 128);
    std::string desc;
    double gamma = 0.0;
    for (uint32_t i = 0; i < count && 132 + 12 * (size_t(i) + 1) <= size; ++i) {
        const uint8_t *entry = icc + 132 + 12 * size_t(i);
        const size_t offset = detail::BE32(entry + 4), length = detail::BE32(entry + 8);
        if (offset >= size || length > size - offset) continue;
        if (std::memcmp(entry, "desc", 4) == 0) desc = detail::DescriptionText(icc + offset, length);
        if (std::memcmp(entry, "rTRC", 4) == 0 || (gamma == 0.0 && std::memcmp(entry, "kTRC", 4) == 0))
            gamma = detail::CurveGamma(icc + offset, length);
    }
    for (const auto &w : detail::kSpaceWords) {
        if (desc.find(w.word) == std::string::npos) continue;
        if (!metadata.IsTable()) metadata = ScriptVal::Table();
        metadata.Set("ColorSpace", ScriptVal(w.space));
        metadata.Set("ColorSpaceID", ScriptVal(w.space));
        if (gamma > 0.0) {
            ScriptVal space = ScriptVal::Table();
            space.Set("Gamma", ScriptVal(gamma));
            space.Set("LinearLimit", ScriptVal(0.0));
            space.Set("LinearSlope", ScriptVal(1.0));
            metadata.Set("GammaSpace", space);
            metadata.Set("GammaSpaceID", ScriptVal("Gamma"));
            metadata.Set("Gamma", ScriptVal(gamma));
        }
        return true;
    }
    return false;
}

} // namespace JpegStream
} // namespace Orvane

namespace Orvane {
namespace JpegStream {
namespace jpegstream_detail {

// Both run libjpeg between a setjmp and its last call; every object with a
// destructor is made before the setjmp.
bool HeaderOf(JpegReader &r, int proxyScale, bool four, HeaderInfo &info, std::string &error) {
    jpeg_decompress_struct &c = r.cinfo;
    if (setjmp(r.trap.jump)) {
        error = std::string("JPEG: ") + r.trap.message;
        return false;
    }
    jpeg_save_markers(&c, JPEG_APP0 + 2, 0xFFFF); // ICC profile chunks
    jpeg_read_header(&c, TRUE);
    info.components = c.num_components;
    info.fullWidth = static_cast<int>(c.image_width);
    info.fullHeight = static_cast<int>(c.image_height);
    if (four && c.num_components != 4) {
        error = "not a four-component JPEG (" + std::to_string(c.num_components) + " components)";
        return false;
    }
    if (!four && c.num_components == 4) {
        error = "four-component JPEG: read it as an IPL file";
        return false;
    }
    if (!four && c.num_components != 1 && c.num_components != 3) {
        error = "unsupported JPEG with " + std::to_string(c.num_components) + " components";
        return false;
    }
    c.out_color_space = four ? JCS_CMYK : JCS_RGB;
    c.scale_num = 1;
    c.scale_denom = static_cast<unsigned>(std::max(1, proxyScale));
    jpeg_calc_output_dimensions(&c);
    info.width = static_cast<int>(c.output_width);
    info.height = static_cast<int>(c.output_height);
    AspectFromDensity(c, info.aspectX, info.aspectY);
    JOCTET *icc = nullptr;
    unsigned int iccSize = 0;
    if (jpeg_read_icc_profile(&c, &icc, &iccSize) && icc) {
        MetadataFromICC(icc, iccSize, info.metadata);
        std::free(icc);
    }
    return true;
}

bool DecodeRows(JpegReader &r, Image &image, const std::atomic<bool> *abortFlag, std::vector<JSAMPLE> &line,
                std::vector<Pixel> &pixels, std::string &error) {
    jpeg_decompress_struct &c = r.cinfo;
    if (setjmp(r.trap.jump)) {
        error = c.err->msg_code == JERR_NO_BACKING_STORE
                    ? "JPEG: decoding this multi-scan file needs more memory than the memory limit leaves"
                    : std::string("JPEG: ") + r.trap.message;
        return false;
    }
    jpeg_start_decompress(&c);
    const int height = image.Height(), comps = c.output_components;
    const ImgRectI dw = image.DataWindow() & image.Frame();
    if (static_cast<int>(c.output_height) != height || static_cast<int>(c.output_width) != image.Width()) {
        jpeg_abort_decompress(&c);
        error = "JPEG size changed since the header was read";
        return false;
    }
    // File rows run top down; image row y is file row height - 1 - y.
    const int first = height - dw.y1, last = height - 1 - dw.y0;
    if (first > 0) jpeg_skip_scanlines(&c, static_cast<JDIMENSION>(first));
    for (int fileRow = first; fileRow <= last; ++fileRow) {
        if (abortFlag && abortFlag->load(std::memory_order_relaxed)) {
            jpeg_abort_decompress(&c);
            error = "aborted";
            return false;
        }
        JSAMPROW row = line.data();
        if (jpeg_read_scanlines(&c, &row, 1) != 1) {
            jpeg_abort_decompress(&c);
            error = "JPEG: short read at line " + std::to_string(fileRow);
            return false;
        }
        for (int x = dw.x0; x < dw.x1; ++x) {
            const JSAMPLE *s = line.data() + static_cast<size_t>(x) * comps;
            Pixel &p = pixels[x - dw.x0];
            p.R = static_cast<uint16_t>(s[0] * 257);
            p.G = static_cast<uint16_t>(s[1] * 257);
            p.B = static_cast<uint16_t>(s[2] * 257);
            p.A = comps == 4 ? static_cast<uint16_t>(s[3] * 257) : 65535;
        }
        const int y = height - 1 - fileRow;
        StorePixel(image.Depth(), pixels.data(), dw.Width(), image.PixelAddress(dw.x0, y));
    }
    jpeg_abort_decompress(&c);
    return true;
}

bool EncodeRows(JpegWriter &w, const Image &image, const EncodeSettings &s, const std::atomic<bool> *abortFlag,
                std::vector<JSAMPLE> &line, std::vector<Pixel> &pixels, std::string &error) {
    jpeg_compress_struct &c = w.cinfo;
    if (setjmp(w.trap.jump)) {
        error = w.dest.failed ? std::string("write error") : std::string("JPEG: ") + w.trap.message;
        return false;
    }
    const int width = image.Width(), height = image.Height();
    c.image_width = static_cast<JDIMENSION>(width);
    c.image_height = static_cast<JDIMENSION>(height);
    c.input_components = s.fourComponents ? 4 : 3;
    c.in_color_space = s.fourComponents ? JCS_CMYK : JCS_RGB;
    jpeg_set_defaults(&c); // four components: stored untransformed behind an Adobe marker
    jpeg_set_quality(&c, std::clamp(s.quality, 0, 100), TRUE);
    if (!s.fourComponents) {
        const int f = s.chromaSubsampling ? 2 : 1;
        c.comp_info[0].h_samp_factor = c.comp_info[0].v_samp_factor = f;
        if (s.dpi > 0) {
            c.density_unit = 1;
            c.X_density = c.Y_density = static_cast<UINT16>(std::clamp(s.dpi, 1, 65535));
        } else {
            // Pixel aspect as a ratio: X over Y density is pixel height over width.
            const double aspect = image.XScale() > 0 && image.YScale() > 0 ? image.XScale() / image.YScale() : 1.0;
            c.density_unit = 0;
            c.X_density = 1000;
            c.Y_density = static_cast<UINT16>(std::clamp(std::lround(1000.0 * aspect), 1L, 65535L));
            if (c.Y_density == 1000) c.X_density = c.Y_density = 1;
        }
    }
    jpeg_start_compress(&c, TRUE);
    for (int fileRow = 0; fileRow < height; ++fileRow) {
        if (abortFlag && abortFlag->load(std::memory_order_relaxed)) {
            jpeg_abort_compress(&c);
            error = "aborted";
            return false;
        }
        ReadFrameRow(image, height - 1 - fileRow, pixels.data());
        JSAMPLE *d = line.data();
        for (int x = 0; x < width; ++x) {
            const Pixel &p = pixels[x];
            *d++ = static_cast<JSAMPLE>(p.R >> 8);
            *d++ = static_cast<JSAMPLE>(p.G >> 8);
            *d++ = static_cast<JSAMPLE>(p.B >> 8);
            if (s.fourComponents) *d++ = static_cast<JSAMPLE>(p.A >> 8);
        }
        JSAMPROW row = line.data();
        jpeg_write_scanlines(&c, &row, 1);
    }
    jpeg_finish_compress(&c);
    return true;
}

} // namespace jpegstream_detail

bool ReadHeader(IOClass *io, int proxyScale, bool fourComponents, HeaderInfo &info, std::string &error) {
    auto reader = std::make_unique<JpegReader>(io);
    return detail::HeaderOf(*reader, proxyScale, fourComponents, info, error);
}

bool DecodeInto(IOClass *io, int proxyScale, bool fourComponents, Image &image, const std::atomic<bool> *abortFlag,
                std::string &error) {
    const ImgRectI dw = image.DataWindow() & image.Frame();
    if (dw.IsNull()) return true;
    if (!image.HasScanLineData() && !image.AllocScanLineData()) {
        error = "out of memory";
        return false;
    }
    auto reader = std::make_unique<JpegReader>(io);
    HeaderInfo info;
    if (!detail::HeaderOf(*reader, proxyScale, fourComponents, info, error)) return false;
    std::vector<JSAMPLE> line(static_cast<size_t>(info.width) * (fourComponents ? 4 : 3));
    std::vector<Pixel> pixels(static_cast<size_t>(dw.Width()));
    return detail::DecodeRows(*reader, image, abortFlag, line, pixels, error);
}

bool Encode(IOClass *io, const Image &image, const EncodeSettings &settings, const std::atomic<bool> *abortFlag,
            std::string &error) {
    if (image.Width() < 1 || image.Height() < 1 || image.Width() > 65500 || image.Height() > 65500) {
        error =
            "JPEG cannot hold an image of " + std::to_string(image.Width()) + " x " + std::to_string(image.Height());
        return false;
    }
    auto writer = std::make_unique<JpegWriter>(io);
    std::vector<JSAMPLE> line(static_cast<size_t>(image.Width()) * 4);
    std::vector<Pixel> pixels(static_cast<size_t>(image.Width()));
    return detail::EncodeRows(*writer, image, settings, abortFlag, line, pixels, error);
}

} // namespace JpegStream
} // namespace Orvane
