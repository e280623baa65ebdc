#include "operators/media/formats/TargaFormat.h"

#include "operators/media/formats/RunLength.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/ByteOrder.h"
#include "operators/media/formats/FrameRows.h"

namespace Orvane {

static const OvID CLSID_TargaFormat("TargaFormat");
static ClassRegistration<TargaFormat, ImageFormat> s_TargaFormatReg(CLSID_TargaFormat, &CLSID_ImageFormat,
                                                                    {{RegTypeFlags, RegFamilyImageFormat},
                                                                     {RegFormatCanLoad, 1},
                                                                     {RegFormatCanSave, 1},
                                                                     {RegFormatHasOptions, 1},
                                                                     {RegFormatHasSaveOptions, 1},
                                                                     {RegFormatLosslessOnly, 1},
                                                                     {RegFormatKeepsAspect, 1},
                                                                     {RegFormatName, "Targa Files"},
                                                                     {RegFormatExtension, ".tga"}});

namespace tga_format_detail {

constexpr int kHeader = 18;
constexpr uint8_t kTopOrigin = 0x20, kRightToLeft = 0x10;

uint16_t Five(unsigned v) {
    v &= 31;
    return static_cast<uint16_t>(((v << 3) | (v >> 2)) * 257);
}

/// One stored value of `bytes` bytes (2, 3 or 4: 5-5-5, BGR, BGRA) as a pixel.
Pixel DecodeColour(const uint8_t *s, int bytes, bool alpha) {
    Pixel p;
    if (bytes == 2) {
        const unsigned v = LE::Get16(s);
        p.R = Five(v >> 10), p.G = Five(v >> 5), p.B = Five(v);
        p.A = alpha && !(v & 0x8000) ? 0 : 65535;
        return p;
    }
    p.B = static_cast<uint16_t>(s[0] * 257), p.G = static_cast<uint16_t>(s[1] * 257);
    p.R = static_cast<uint16_t>(s[2] * 257);
    p.A = bytes == 4 && alpha ? static_cast<uint16_t>(s[3] * 257) : 65535;
    return p;
}

/// Reads a stream in large pieces for the run-length decoder.
class ByteSource {
public:
    explicit ByteSource(IOClass *io) : io_(io), buf_(64 * 1024) {}
    /// Copies `n` bytes out; false at the end of the stream.
    bool Get(uint8_t *dst, int n) {
        while (n > 0) {
            if (pos_ == end_ && !Fill()) return false;
            const int take = std::min(n, end_ - pos_);
            std::memcpy(dst, buf_.data() + pos_, static_cast<size_t>(take));
            pos_ += take, dst += take, n -= take;
        }
        return true;
    }

private:
    bool Fill() {
        const int64_t got = io_->Read(buf_.data(), static_cast<int64_t>(buf_.size()));
        pos_ = 0, end_ = static_cast<int>(std::max<int64_t>(got, 0));
        return end_ > 0;
    }
    IOClass *io_;
    std::vector<uint8_t> buf_;
    int pos_ = 0, end_ = 0;
};

} // namespace tga_format_detail

using namespace tga_format_detail;

bool TargaFormat::CheckFormat(IOClass *stream) {
    uint8_t h[kHeader];
    if (!stream || !stream->ReadExact(h, kHeader)) return false;
    const int type = h[2], bits = h[16];
    if (type != 1 && type != 2 && type != 3 && type != 9 && type != 10 && type != 11) return false;
    if (bits != 8 && bits != 16 && bits != 24 && bits != 32) return false;
    return h[1] <= 1 && LE::Get16(h + 12) > 0 && LE::Get16(h + 14) > 0;
}

void TargaFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    AddOptionCheckbox(tool, "Save Alpha", "SaveAlpha", 1.0);
    AddOptionCheckbox(tool, "Compress", "Compress", 1.0);
}

void TargaFormat::SetupSave(Operator *tool, Request *req) {
    saveAlpha_ = OptionValue(tool, req, "SaveAlpha", 1.0) >= 0.5;
    compress_ = OptionValue(tool, req, "Compress", 1.0) >= 0.5;
}

void TargaFormat::CleanupSave(Operator *) {}

Pixel TargaFormat::Decode(const uint8_t *s) const {
    const bool alpha = (descriptor_ & 15) != 0;
    if (bits_ == 8) {
        if (type_ == 1 || type_ == 9) {
            const int entry = s[0] - mapFirst_;
            return entry >= 0 && entry < static_cast<int>(map_.size()) ? map_[entry] : Pixel{0, 0, 0, 65535};
        }
        const uint16_t g = static_cast<uint16_t>(s[0] * 257);
        return Pixel{g, g, g, 65535};
    }
    if (bits_ == 16 && (type_ == 3 || type_ == 11)) { // grey and alpha
        const uint16_t g = static_cast<uint16_t>(s[0] * 257);
        return Pixel{g, g, g, alpha ? static_cast<uint16_t>(s[1] * 257) : uint16_t(65535)};
    }
    return DecodeColour(s, bits_ / 8, alpha);
}

bool TargaFormat::LoadHeader(IOClass *stream) {
    io = stream;
    map_.clear();
    if (!io) return Fail("no stream");
    uint8_t h[kHeader];
    if (!io->ReadExact(h, kHeader)) return Fail("truncated header");
    const int idLength = h[0], mapType = h[1], type = h[2];
    const int mapFirst = LE::Get16(h + 3), mapLength = LE::Get16(h + 5), mapBits = h[7];
    const int w = LE::Get16(h + 12), hh = LE::Get16(h + 14), bits = h[16];
    if (type != 1 && type != 2 && type != 3 && type != 9 && type != 10 && type != 11)
        return Fail("unsupported image type " + std::to_string(type));
    if (bits != 8 && bits != 16 && bits != 24 && bits != 32)
        return Fail("unsupported bit depth " + std::to_string(bits));
    if (mapType > 1) return Fail("bad colour map type");
    const bool mapped = type == 1 || type == 9;
    if (mapped && (mapType != 1 || bits != 8)) return Fail("bad colour-mapped image");
    if ((type == 3 || type == 11) && bits > 16) return Fail("bad grey image");
    if (w < 1 || hh < 1) return Fail("empty image");

    if (idLength && !io->Seek(idLength, IOClass::SeekRelative)) return Fail("seek error");
    int64_t mapBytes = 0;
    if (mapType == 1) {
        if (mapBits != 15 && mapBits != 16 && mapBits != 24 && mapBits != 32)
            return Fail("bad colour map entry size " + std::to_string(mapBits));
        const int entryBytes = (mapBits + 7) / 8;
        mapBytes = int64_t(mapLength) * entryBytes;
        std::vector<uint8_t> raw(static_cast<size_t>(mapBytes));
        if (mapBytes && !io->ReadExact(raw.data(), mapBytes)) return Fail("truncated colour map");
        const bool alpha = (h[17] & 15) != 0;
        map_.resize(static_cast<size_t>(mapLength));
        for (int i = 0; i < mapLength; ++i)
            map_[i] = DecodeColour(&raw[static_cast<size_t>(i) * entryBytes], entryBytes, alpha);
    }
    type_ = type, bits_ = bits, descriptor_ = h[17], mapFirst_ = mapFirst;
    fullWidth_ = w, fullHeight_ = hh;
    dataStart_ = kHeader + idLength + mapBytes;
    if (type < 9) {
        const int64_t size = io->Size();
        if (size >= 0 && size < dataStart_ + int64_t(w) * hh * (bits / 8)) return Fail("truncated pixel data");
        scale_ = std::max(1, proxyScale);
    } else {
        scale_ = 1; // a run-length file is decoded whole
    }
    width = std::max(1, w / scale_), height = std::max(1, hh / scale_);
    depth = DepthRGBAInt8;
    const bool grey = type == 3 || type == 11, alphaBits = (h[17] & 15) != 0;
    fileChannels = std::string(grey ? "Y" : "R G B") + (alphaBits || (grey && bits == 16) ? " A" : "");
    fileSampleType = !mapped && (bits == 15 || (bits == 16 && !grey)) ? "uint5" : "uint8";
    aspectX = aspectY = 1.0;
    return true;
}

bool TargaFormat::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    if (scale_ > 1) image->SetAttrsTagList({{ImgFullWidth, fullWidth_}, {ImgFullHeight, fullHeight_}});
    if (image->IsNoData()) return true;
    const ImgRectI win = image->DataWindow() & ImgRectI(0, 0, width, height);
    if (win.IsNull()) return true;
    if (!image->AllocScanLineData()) return Fail("out of memory");
    return type_ < 9 ? ReadPlain(*image, win) : ReadRunLength(*image, win);
}

bool TargaFormat::ReadPlain(Image &image, const ImgRectI &win) {
    const int bpp = bits_ / 8;
    const int64_t stride = int64_t(fullWidth_) * bpp;
    uint8_t *line = static_cast<uint8_t *>(std::malloc(static_cast<size_t>(stride)));
    if (!line) return Fail("out of memory");
    std::vector<Pixel> px(static_cast<size_t>(win.Width()));
    bool ok = true;
    for (int y = win.y0; y < win.y1 && ok; ++y) {
        if (Aborted()) {
            ok = Fail("aborted");
            break;
        }
        const int fy = y * scale_;
        const int fileRow = (descriptor_ & kTopOrigin) ? fullHeight_ - 1 - fy : fy;
        if (!io->Seek(dataStart_ + fileRow * stride, IOClass::SeekAbsolute)) {
            ok = Fail("seek error");
            break;
        }
        if (!io->ReadExact(line, stride)) {
            ok = Fail("truncated line " + std::to_string(fileRow));
            break;
        }
        for (int x = win.x0; x < win.x1; ++x) {
            int fx = x * scale_;
            if (descriptor_ & kRightToLeft) fx = fullWidth_ - 1 - fx;
            px[x - win.x0] = Decode(line + static_cast<size_t>(fx) * bpp);
        }
        StorePixel(image.Depth(), px.data(), win.Width(), image.PixelAddress(win.x0, y));
    }
    std::free(line);
    return ok;
}

bool TargaFormat::ReadRunLength(Image &image, const ImgRectI &win) {
    if (!io->Seek(dataStart_, IOClass::SeekAbsolute)) return Fail("seek error");
    const int bpp = bits_ / 8;
    const bool top = descriptor_ & kTopOrigin;
    ByteSource src(io);
    std::vector<Pixel> line(static_cast<size_t>(fullWidth_));
    // Packets may run on from one line into the next.
    int left = 0;
    bool run = false;
    uint8_t value[4] = {};
    Pixel runPixel;
    for (int s = 0; s < fullHeight_; ++s) {
        const int y = top ? fullHeight_ - 1 - s : s;
        if (top ? y < win.y0 : y >= win.y1) break; // the window is complete
        if (Aborted()) return Fail("aborted");
        for (int x = 0; x < fullWidth_; ++x) {
            if (left == 0) {
                uint8_t control;
                if (!src.Get(&control, 1)) return Fail("truncated run-length data, line " + std::to_string(s));
                run = control & 0x80;
                left = (control & 0x7f) + 1;
                if (run) {
                    if (!src.Get(value, bpp)) return Fail("truncated run-length data, line " + std::to_string(s));
                    runPixel = Decode(value);
                }
            }
            if (run) {
                line[x] = runPixel;
            } else {
                if (!src.Get(value, bpp)) return Fail("truncated run-length data, line " + std::to_string(s));
                line[x] = Decode(value);
            }
            --left;
        }
        if (y < win.y0 || y >= win.y1) continue;
        if (descriptor_ & kRightToLeft) std::reverse(line.begin(), line.end());
        StorePixel(image.Depth(), line.data() + win.x0, win.Width(), image.PixelAddress(win.x0, y));
    }
    return true;
}

bool TargaFormat::SaveHeader(IOClass *stream, Image *image) {
    io = stream;
    if (!io || !image) return Fail("nothing to write");
    if (image->Width() > 65535 || image->Height() > 65535) return Fail("image too large for a Targa file");
    uint8_t h[kHeader] = {};
    h[2] = compress_ ? 10 : 2;
    LE::Put16(h + 12, static_cast<uint32_t>(image->Width()));
    LE::Put16(h + 14, static_cast<uint32_t>(image->Height()));
    h[16] = saveAlpha_ ? 32 : 24;
    h[17] = saveAlpha_ ? 8 : 0;
    if (!io->WriteExact(h, kHeader)) return Fail("write error");
    return true;
}

size_t TargaFormat::EncodeLine(const uint8_t *pixels, int count, int bpp, uint8_t *out) {
    switch (bpp) {
    case 1: return RunLengthEncode<1>(pixels, count, out);
    case 2: return RunLengthEncode<2>(pixels, count, out);
    case 3: return RunLengthEncode<3>(pixels, count, out);
    default: return RunLengthEncode<4>(pixels, count, out);
    }
}

bool TargaFormat::SaveFrame(unsigned, Image *image) {
    if (!io || !image) return Fail("nothing to write");
    const int w = image->Width(), h = image->Height();
    const int bpp = saveAlpha_ ? 4 : 3;
    const size_t lineBytes = static_cast<size_t>(w) * bpp;
    const size_t worstLine = lineBytes + (w + 127) / 128;
    const int linesPerBlock = std::max<int64_t>(1, 0x100000 / ((int64_t(w) + (w + 127) / 128) * bpp));
    const size_t bufferBytes = std::max<size_t>(2 * worstLine, 0x100000);
    uint8_t *buffer = static_cast<uint8_t *>(std::malloc(bufferBytes));
    uint8_t *raw = static_cast<uint8_t *>(std::malloc(lineBytes));
    if (!buffer || !raw) {
        std::free(buffer);
        std::free(raw);
        return Fail("out of memory");
    }
    std::vector<Pixel> px;
    std::vector<FltPixel> flt;
    size_t used = 0;
    int inBlock = 0;
    bool ok = true;
    for (int y = 0; y < h && ok; ++y) {
        if (Aborted()) {
            ok = Fail("aborted");
            break;
        }
        FrameRows::Row16(*image, y, w, px, flt);
        FrameRows::PackBGRA8(px, w, saveAlpha_, raw);
        if (compress_) {
            used += EncodeLine(raw, w, bpp, buffer + used);
        } else {
            std::memcpy(buffer + used, raw, lineBytes);
            used += lineBytes;
        }
        if (++inBlock >= linesPerBlock || used + worstLine > bufferBytes || y == h - 1) {
            if (!io->WriteExact(buffer, static_cast<int64_t>(used))) ok = Fail("write error");
            used = 0, inBlock = 0;
        }
    }
    std::free(buffer);
    std::free(raw);
    return ok;
}

int64_t TargaFormat::PredictFileSize(Image *image) {
    if (!image) return 0;
    const int64_t w = image->Width(), h = image->Height();
    const int bpp = saveAlpha_ ? 4 : 3;
    return kHeader + h * (w * bpp + (compress_ ? (w + 127) / 128 : 0));
}

} // namespace Orvane
