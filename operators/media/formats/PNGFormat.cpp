#include "operators/media/formats/PNGFormat.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <memory>
#include <vector>

#include <png.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/JpegStream.h"

namespace Orvane {
namespace pngformat_detail {

const OvID CLSID_PNGFormat("PNGFormat");

ClassRegistration<PNGFormat, ImageFormat> s_Reg(CLSID_PNGFormat, &CLSID_ImageFormat,
                                                {{RegTypeFlags, RegFamilyImageFormat},
                                                 {RegFormatCanLoad, 1},
                                                 {RegFormatCanSave, 1},
                                                 {RegFormatHasOptions, 1},
                                                 {RegFormatHasSaveOptions, 1},
                                                 {RegFormatName, "PNG Files"},
                                                 {RegFormatExtension, ".png"}});

/// The stream and the reason a library call failed, reached through libpng's io pointer.
struct Channel {
    IOClass *io = nullptr;
    char message[200] = {};
};

void ErrorFn(png_structp png, png_const_charp msg) {
    auto *ch = static_cast<Channel *>(png_get_error_ptr(png));
    std::snprintf(ch->message, sizeof(ch->message), "PNG: %s", msg ? msg : "error");
    png_longjmp(png, 1);
}

void WarningFn(png_structp, png_const_charp) {}

void ReadFn(png_structp png, png_bytep data, size_t bytes) {
    auto *ch = static_cast<Channel *>(png_get_io_ptr(png));
    if (ch->io->Read(data, static_cast<int64_t>(bytes)) != static_cast<int64_t>(bytes))
        png_error(png, "file is truncated");
}

void WriteFn(png_structp png, png_bytep data, size_t bytes) {
    auto *ch = static_cast<Channel *>(png_get_io_ptr(png));
    if (!ch->io->WriteExact(data, static_cast<int64_t>(bytes))) png_error(png, "write error");
}

void FlushFn(png_structp) {}

/// A read or write struct pair, destroyed with the object.
struct PngHandle {
    Channel channel;
    png_structp png = nullptr;
    png_infop info = nullptr;
    bool writing = false;

    PngHandle(IOClass *io, bool write) : writing(write) {
        channel.io = io;
        png = write ? png_create_write_struct(PNG_LIBPNG_VER_STRING, &channel, ErrorFn, WarningFn)
                    : png_create_read_struct(PNG_LIBPNG_VER_STRING, &channel, ErrorFn, WarningFn);
        if (png) info = png_create_info_struct(png);
        if (png && info) {
            if (write) {
                png_set_write_fn(png, &channel, WriteFn, FlushFn);
            } else {
                png_set_read_fn(png, &channel, ReadFn);
                // libpng sets a chunk's data aside at the length the chunk
                // states before reading it. Only the chunks read here are
                // handled; the others (text, profiles, ...) are skipped unread.
                static const png_byte kUsed[] = "gAMA\0sRGB\0pHYs";
                png_set_keep_unknown_chunks(png, PNG_HANDLE_CHUNK_NEVER, nullptr, -1);
                png_set_keep_unknown_chunks(png, PNG_HANDLE_CHUNK_AS_DEFAULT, kUsed, 3);
            }
        }
    }
    ~PngHandle() {
        if (writing)
            png_destroy_write_struct(&png, &info);
        else
            png_destroy_read_struct(&png, &info, nullptr);
    }
    bool Ok() const { return png && info; }
};

struct Header {
    png_uint_32 width = 0, height = 0;
    int bitDepth = 0, colorType = 0, interlace = 0;
    bool alpha = false;
    double aspectX = 1.0, aspectY = 1.0;
};

// The functions below run libpng between a setjmp and its last call; every
// object with a destructor is made by their callers.
bool ReadInfo(PngHandle &h, Header &hd) {
    if (setjmp(png_jmpbuf(h.png))) return false;
    png_read_info(h.png, h.info);
    int compression = 0, filter = 0;
    png_get_IHDR(h.png, h.info, &hd.width, &hd.height, &hd.bitDepth, &hd.colorType, &hd.interlace, &compression,
                 &filter);
    hd.alpha = (hd.colorType & PNG_COLOR_MASK_ALPHA) || png_get_valid(h.png, h.info, PNG_INFO_tRNS);
    png_uint_32 xppu = 0, yppu = 0;
    int unit = 0;
    if (png_get_pHYs(h.png, h.info, &xppu, &yppu, &unit) && xppu && yppu)
        hd.aspectX = static_cast<double>(yppu) / xppu; // pixel width over height
    return true;
}

void ColourMetadata(PngHandle &h, ScriptVal &metadata) {
    int intent = 0;
    double fileGamma = 0.0;
    if (png_get_sRGB(h.png, h.info, &intent)) {
        metadata.Set("ColorSpace", ScriptVal("sRGB"));
        metadata.Set("ColorSpaceID", ScriptVal("sRGB"));
        metadata.Set("GammaSpaceID", ScriptVal("sRGB"));
    } else if (png_get_gAMA(h.png, h.info, &fileGamma) && fileGamma > 0.0) {
        const double gamma = 1.0 / fileGamma;
        ScriptVal space = ScriptVal::Table();
        space.Set("Gamma", ScriptVal(gamma));
        space.Set("LinearLimit", ScriptVal(0.0));
        space.Set("LinearSlope", ScriptVal(1.0));
        metadata.Set("GammaSpace", space);
        metadata.Set("GammaSpaceID", ScriptVal("Gamma"));
        metadata.Set("Gamma", ScriptVal(gamma));
    }
}

/// Converts one decoded RGBA row (8 or 16 bits a sample, big-endian) to Pixels.
void RowToPixels(const png_byte *src, int bitDepth, bool multiply, int x0, int count, Pixel *dst) {
    for (int i = 0; i < count; ++i) {
        Pixel &p = dst[i];
        if (bitDepth == 16) {
            const png_byte *s = src + static_cast<size_t>(x0 + i) * 8;
            uint32_t v[4];
            for (int c = 0; c < 4; ++c) v[c] = (uint32_t(s[2 * c]) << 8) | s[2 * c + 1];
            if (multiply)
                for (int c = 0; c < 3; ++c) v[c] = (v[c] * v[3] + 32767u) / 65535u;
            p = {uint16_t(v[0]), uint16_t(v[1]), uint16_t(v[2]), uint16_t(v[3])};
        } else {
            const png_byte *s = src + static_cast<size_t>(x0 + i) * 4;
            uint32_t v[4] = {s[0], s[1], s[2], s[3]};
            if (multiply)
                for (int c = 0; c < 3; ++c) v[c] = (v[c] * v[3] + 127u) / 255u;
            p = {uint16_t(v[0] * 257), uint16_t(v[1] * 257), uint16_t(v[2] * 257), uint16_t(v[3] * 257)};
        }
    }
}

struct DecodeJob {
    Image *image;
    const std::atomic<bool> *abortFlag;
    bool multiply;
    std::vector<png_byte> *rows; // one row, or the whole picture when interlaced
    std::vector<png_bytep> *pointers;
    std::vector<Pixel> *pixels;
    const char *abortReason;
};

bool DecodeRows(PngHandle &h, const Header &hd, DecodeJob &job) {
    if (setjmp(png_jmpbuf(h.png))) return false;
    png_set_expand(h.png);
    png_set_gray_to_rgb(h.png);
    // An opaque alpha channel where the rows have none. Not only when the
    // header promised none: libpng drops a tRNS chunk that came too early.
    png_set_filler(h.png, hd.bitDepth == 16 ? 0xffff : 0xff, PNG_FILLER_AFTER);
    const int passes = png_set_interlace_handling(h.png);
    png_read_update_info(h.png, h.info);
    const int bitDepth = png_get_bit_depth(h.png, h.info);
    const size_t rowBytes = png_get_rowbytes(h.png, h.info);
    if (png_get_channels(h.png, h.info) != 4 || rowBytes < size_t(hd.width) * 4 * (bitDepth / 8))
        png_error(h.png, "rows do not decode to four channels");
    Image &image = *job.image;
    const int height = image.Height();
    const ImgRectI dw = image.DataWindow() & image.Frame();
    const int first = height - dw.y1, last = height - 1 - dw.y0;
    const bool whole = passes > 1;
    job.rows->resize(rowBytes * (whole ? hd.height : 1));
    if (whole) {
        job.pointers->resize(hd.height);
        for (png_uint_32 r = 0; r < hd.height; ++r) (*job.pointers)[r] = job.rows->data() + rowBytes * r;
        png_read_image(h.png, job.pointers->data());
    }
    for (int fileRow = 0; fileRow <= last; ++fileRow) {
        if (job.abortFlag && job.abortFlag->load(std::memory_order_relaxed)) {
            job.abortReason = "aborted";
            return false;
        }
        png_bytep row = job.rows->data() + (whole ? rowBytes * fileRow : 0);
        if (!whole) png_read_row(h.png, row, nullptr);
        if (fileRow < first) continue;
        RowToPixels(row, bitDepth, job.multiply, dw.x0, dw.Width(), job.pixels->data());
        StorePixel(image.Depth(), job.pixels->data(), dw.Width(), image.PixelAddress(dw.x0, height - 1 - fileRow));
    }
    return true;
}

struct EncodeJob {
    const Image *image;
    const std::atomic<bool> *abortFlag;
    int bitDepth;
    bool alpha, divide;
    int level;
    int gammaMode; // resolved: none, sRGB or gamma
    double gamma;
    std::vector<png_byte> *row;
    std::vector<Pixel> *pixels;
    const char *abortReason;
};

uint32_t Straight(uint32_t c, uint32_t a, uint32_t outMax) {
    // c and a in 16-bit units; the straight colour rounded at the output depth.
    if (a == 0) return outMax == 65535 ? c : c >> 8;
    const uint64_t v = (uint64_t(c) * outMax + a / 2) / a;
    return static_cast<uint32_t>(std::min<uint64_t>(v, outMax));
}

bool EncodeRows(PngHandle &h, EncodeJob &job) {
    if (setjmp(png_jmpbuf(h.png))) return false;
    const Image &image = *job.image;
    const int width = image.Width(), height = image.Height();
    png_set_IHDR(h.png, h.info, static_cast<png_uint_32>(width), static_cast<png_uint_32>(height), job.bitDepth,
                 job.alpha ? PNG_COLOR_TYPE_RGB_ALPHA : PNG_COLOR_TYPE_RGB, PNG_INTERLACE_NONE,
                 PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
    png_set_compression_level(h.png, job.level);
    if (job.gammaMode == PNGFormat::GammaSRGB)
        png_set_sRGB(h.png, h.info, PNG_sRGB_INTENT_ABSOLUTE);
    else if (job.gammaMode == PNGFormat::GammaValue)
        png_set_gAMA(h.png, h.info, 1.0 / job.gamma);
    const double xs = image.XScale(), ys = image.YScale();
    if (xs > 0 && ys > 0 && std::fabs(xs / ys - 1.0) > 1e-6)
        png_set_pHYs(h.png, h.info, 100000u, static_cast<png_uint_32>(std::lround(100000.0 * xs / ys)),
                     PNG_RESOLUTION_UNKNOWN);
    png_write_info(h.png, h.info);
    const int channels = job.alpha ? 4 : 3;
    const uint32_t outMax = job.bitDepth == 16 ? 65535 : 255;
    for (int fileRow = 0; fileRow < height; ++fileRow) {
        if (job.abortFlag && job.abortFlag->load(std::memory_order_relaxed)) {
            job.abortReason = "aborted";
            return false;
        }
        JpegStream::ReadFrameRow(image, height - 1 - fileRow, job.pixels->data());
        png_byte *d = job.row->data();
        for (int x = 0; x < width; ++x) {
            const Pixel &p = (*job.pixels)[x];
            uint32_t v[4] = {p.R, p.G, p.B, p.A};
            if (job.alpha && job.divide && p.A != 65535) {
                for (int c = 0; c < 3; ++c) v[c] = Straight(v[c], p.A, outMax);
                v[3] = outMax == 65535 ? p.A : p.A >> 8;
            } else if (outMax == 255) {
                for (uint32_t &c : v) c >>= 8;
            }
            for (int c = 0; c < channels; ++c) {
                if (job.bitDepth == 16) *d++ = static_cast<png_byte>(v[c] >> 8);
                *d++ = static_cast<png_byte>(v[c]);
            }
        }
        png_write_row(h.png, job.row->data());
    }
    png_write_end(h.png, h.info);
    return true;
}

} // namespace pngformat_detail

namespace pd = pngformat_detail;

PNGFormat::PNGFormat(const Registry *reg, const ScriptVal &args, const TagList &tags) : ImageFormat(reg, args, tags) {}

bool PNGFormat::CheckFormat(IOClass *stream) {
    if (!stream) return false;
    png_byte sig[8];
    const int64_t at = stream->Tell();
    const bool ok = stream->ReadExact(sig, 8) && png_sig_cmp(sig, 0, 8) == 0;
    stream->Seek(at, IOClass::SeekAbsolute);
    return ok;
}

void PNGFormat::AddLoadInputs(Operator *tool) {
    if (!tool) return;
    AddOptionCheckbox(tool, "Multiply by Alpha", "PostMultiply", 1.0);
}

void PNGFormat::SetupLoad(Operator *tool, Request *req) {
    postMultiply_ = OptionValue(tool, req, "PostMultiply", 1.0) > 0.5;
}

void PNGFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    AddOptionCheckbox(tool, "Save Alpha", "SaveAlpha", 1.0);
    AddOptionCheckbox(tool, "Divide by Alpha", "PreDivide", 1.0);
    tool->AddInputTagList("Depth", "Depth",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Combo},
                           {InputDefault, 0.0},
                           {ListAddItem, "Auto"},
                           {ListAddItem, "int8"},
                           {ListAddItem, "int16"},
                           {InputExternal, 0}});
    tool->AddInputTagList("Compression level", "CompressionLevel",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Slider},
                           {InputInteger, 1},
                           {InputMinAllowed, 0.0},
                           {InputMaxAllowed, 9.0},
                           {InputDefault, 6.0},
                           {InputExternal, 0}});
    tool->AddInputTagList("Gamma Mode", "GammaMode",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_MultiButton},
                           {InputDefault, 0.0},
                           {InputNotify, 1},
                           {ListAddItem, "Auto"},
                           {ListAddItem, "None"},
                           {ListAddItem, "sRGB"},
                           {ListAddItem, "Gamma"},
                           {InputExternal, 0}});
    tool->AddInputTagList("Gamma", "Gamma",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Slider},
                           {InputMinAllowed, 0.0},
                           {InputSliderLow, 0.0},
                           {InputSliderHigh, 5.0},
                           {SliderSteps, 101},
                           {InputDefault, 1.0},
                           {ControlVisible, 0},
                           {InputExternal, 0}});
}

void PNGFormat::NotifyChangedSave(Operator *tool, Input *in, Parameter *param, double) {
    if (!tool || !in || in != tool->FindGroupInput("GammaMode")) return;
    const auto *n = dynamic_cast<const Number *>(param);
    const bool shown = n && std::lround(n->value) == GammaValue;
    if (Input *g = tool->FindGroupInput("Gamma")) g->SetAttrsTagList({{ControlVisible, shown}});
}

void PNGFormat::SetupSave(Operator *tool, Request *req) {
    saveAlpha_ = OptionValue(tool, req, "SaveAlpha", 1.0) > 0.5;
    preDivide_ = OptionValue(tool, req, "PreDivide", 1.0) > 0.5;
    depthMode_ = std::clamp(static_cast<int>(std::lround(OptionValue(tool, req, "Depth", 0.0))), 0, 2);
    compressionLevel_ =
        std::clamp(static_cast<int>(std::lround(OptionValue(tool, req, "CompressionLevel", 6.0))), 0, 9);
    gammaMode_ = std::clamp(static_cast<int>(std::lround(OptionValue(tool, req, "GammaMode", 0.0))), 0, 3);
    gamma_ = OptionValue(tool, req, "Gamma", 1.0);
}

bool PNGFormat::LoadHeader(IOClass *stream) {
    io = stream;
    if (!io) return Fail("no stream");
    start_ = io->Tell();
    if (!CheckFormat(io)) return Fail("not a PNG file");
    auto h = std::make_unique<pd::PngHandle>(io, false);
    if (!h->Ok()) return Fail("out of memory");
    pd::Header hd;
    if (!pd::ReadInfo(*h, hd)) return Fail(h->channel.message);
    if (hd.width > 0x7fffffffu || hd.height > 0x7fffffffu) return Fail("PNG too large");
    width = static_cast<int>(hd.width);
    height = static_cast<int>(hd.height);
    aspectX = hd.aspectX;
    aspectY = hd.aspectY;
    depth = hd.bitDepth == 16 ? DepthRGBAInt16 : DepthRGBAInt8;
    const bool palette = hd.colorType == PNG_COLOR_TYPE_PALETTE, colour = hd.colorType & PNG_COLOR_MASK_COLOR;
    fileChannels = std::string(colour ? "R G B" : "Y") +
                   ((hd.colorType & PNG_COLOR_MASK_ALPHA) || (palette && hd.alpha) ? " A" : "");
    fileSampleType = "uint" + std::to_string(palette ? 8 : hd.bitDepth); // a palette holds 8-bit colours
    metadata = ScriptVal::Table();
    pd::ColourMetadata(*h, metadata);
    return true;
}

bool PNGFormat::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    if (tags.GetBool(ClipFrameHeaderOnly) || image->IsNoData()) return true;
    const ImgRectI dw = image->DataWindow() & image->Frame();
    if (dw.IsNull()) return true;
    if (!image->HasScanLineData() && !image->AllocScanLineData()) return Fail("out of memory");
    if (!io->Seek(start_, IOClass::SeekAbsolute)) return Fail("seek error");
    auto h = std::make_unique<pd::PngHandle>(io, false);
    if (!h->Ok()) return Fail("out of memory");
    pd::Header hd;
    if (!pd::ReadInfo(*h, hd)) return Fail(h->channel.message);
    if (static_cast<int>(hd.width) != image->Width() || static_cast<int>(hd.height) != image->Height())
        return Fail("PNG size changed since the header was read");
    std::vector<png_byte> rows;
    std::vector<png_bytep> pointers;
    std::vector<Pixel> pixels(static_cast<size_t>(dw.Width()));
    pd::DecodeJob job{image.Get(), abortFlag, postMultiply_ && hd.alpha, &rows, &pointers, &pixels, nullptr};
    if (!pd::DecodeRows(*h, hd, job)) return Fail(job.abortReason ? job.abortReason : h->channel.message);
    return true;
}

bool PNGFormat::SaveHeader(IOClass *stream, Image *) {
    io = stream;
    return io ? true : Fail("no stream");
}

bool PNGFormat::SaveFrame(unsigned, Image *image) {
    if (!io || !image) return Fail("nothing to write");
    if (image->Width() < 1 || image->Height() < 1) return Fail("empty image");
    const int bitDepth = depthMode_ == 1                                                     ? 8
                         : depthMode_ == 2                                                   ? 16
                         : (image->Depth() == DepthRGBAInt8 || image->Depth() == DepthAInt8) ? 8
                                                                                             : 16;
    int mode = gammaMode_;
    double gamma = gamma_;
    if (mode == GammaValue && !(gamma > 0.0001)) mode = GammaNone;
    if (mode == GammaAuto) {
        // The image's own colour description decides.
        mode = GammaNone;
        const ScriptVal &md = image->Metadata();
        auto text = [&md](const char *key) {
            const ScriptVal *v = md.IsTable() ? md.Find(key) : nullptr;
            return v && v->IsText() ? v->AsText() : std::string();
        };
        const ScriptVal *space = md.IsTable() ? md.Find("GammaSpace") : nullptr;
        const std::string gammaID = text("GammaSpaceID");
        if ((text("ColorSpace") == "sRGB" || text("ColorSpaceID") == "sRGB") &&
            (gammaID.empty() || gammaID == "sRGB")) {
            mode = GammaSRGB;
        } else if (space && space->IsTable()) {
            auto number = [space](const char *key, double def) {
                const ScriptVal *v = space->Find(key);
                return v && v->IsNumber() ? v->AsNumber() : def;
            };
            const double g = number("Gamma", 0.0);
            if (number("LinearLimit", 0.0) == 0.0 && number("LinearSlope", 1.0) == 1.0 && g > 0.0001) {
                mode = GammaValue;
                gamma = g;
            }
        }
    }
    auto h = std::make_unique<pd::PngHandle>(io, true);
    if (!h->Ok()) return Fail("out of memory");
    std::vector<png_byte> row(static_cast<size_t>(image->Width()) * 8);
    std::vector<Pixel> pixels(static_cast<size_t>(image->Width()));
    pd::EncodeJob job{image, abortFlag, bitDepth, saveAlpha_, preDivide_, compressionLevel_,
                      mode,  gamma,     &row,     &pixels,    nullptr};
    if (!pd::EncodeRows(*h, job)) return Fail(job.abortReason ? job.abortReason : h->channel.message);
    return true;
}

int64_t PNGFormat::PredictFileSize(Image *image) {
    if (!image) return 0;
    const int bytes = (image->Depth() == DepthRGBAInt8 || image->Depth() == DepthAInt8) ? 4 : 8;
    // Stored deflate blocks bound the worst case: the raw rows plus a filter byte each.
    return (static_cast<int64_t>(image->Width()) * bytes + 1) * image->Height() * 1001 / 1000 + 4096;
}

} // namespace Orvane
