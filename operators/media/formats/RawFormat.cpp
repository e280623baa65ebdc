#include "operators/media/formats/RawFormat.h"

#include "operators/media/formats/RunLength.h"

#include <zlib.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <deque>
#include <string>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/ByteOrder.h"

// Header fields (byte offsets):
//   0 "RAWI"   4 end of the tag block   8 tag block offset   12 pixel data offset
//  16 pixel data size (bytes written, patched after a compressed frame)
//  20 width  24 height  28 main line bytes  32 auxiliary line bytes  36 depth 1..8
//  40 data window x0 y0 x1 y1   56 valid window   72, 80 aspect X, Y (double)
//  88, 96 offset X, Y (double; Y is the field offset)   104 image flags
// 108 proxy scale  112 reserved  116 time code  120, 124 full width, height
// 128, 136 full aspect X, Y (double)  144 field (-1 whole frame)  148 reserved
// 152 time extent (three doubles)  176 channel flags (bit per slot)
// 180, 182 main, auxiliary pixel bytes  184 slot count (64)
// 186 main slot offsets (64 x int16, -1 absent)  314 reserved (0xff)
// 442 auxiliary slot offsets  570 reserved (0xff)  698 reserved
// 700 compression  704 canvas colour offset  708 Metadata block offset

namespace Orvane {

static const OvID CLSID_RawFormat("RawFormat");
static ClassRegistration<RawFormat, ImageFormat> s_RawFormatReg(CLSID_RawFormat, &CLSID_ImageFormat,
                                                                {{RegTypeFlags, RegFamilyImageFormat},
                                                                 {RegSortOrder, 1000000},
                                                                 {RegFormatCanLoad, 1},
                                                                 {RegFormatCanSave, 1},
                                                                 {RegFormatKeepsAspect, 1},
                                                                 {RegFormatHasDomain, 1},
                                                                 {RegFormatName, "Orvane Raw Image Files"},
                                                                 {RegFormatExtension, ".raw"}});

namespace raw_format_detail {

constexpr uint32_t FlagOpaque = 1, FlagSimple = 2;
constexpr uint32_t kMetadataLimit = 0x10000;
constexpr int kAuxKinds = static_cast<int>(AuxChannelKind::Count);

int64_t ZlibBuffer(int64_t line) {
    return std::max<int64_t>(
        {1024, static_cast<int64_t>(line * 1.01) + 12, static_cast<int64_t>(compressBound(static_cast<uLong>(line)))});
}

void PutRect(uint8_t *p, const ImgRectI &r) {
    LE::Put32(p, static_cast<uint32_t>(r.x0));
    LE::Put32(p + 4, static_cast<uint32_t>(r.y0));
    LE::Put32(p + 8, static_cast<uint32_t>(r.x1));
    LE::Put32(p + 12, static_cast<uint32_t>(r.y1));
}
ImgRectI GetRect(const uint8_t *p) {
    return ImgRectI(LE::GetS32(p), LE::GetS32(p + 4), LE::GetS32(p + 8), LE::GetS32(p + 12));
}
bool SaneRect(const ImgRectI &r) {
    constexpr int lim = 4 * MaxImageSide;
    return r.IsNull() || (r.x0 >= -lim && r.y0 >= -lim && r.x1 <= lim && r.y1 <= lim);
}

/// Reads the pixel data in pieces through a window of 128 KiB, never past
/// the end of the data.
class DataSource {
public:
    DataSource(IOClass *io, int64_t available) : io_(io), left_(available), buf_(128 * 1024) {}
    /// Copies `n` bytes; false when the data ends first.
    bool Get(uint8_t *dst, int64_t n) {
        while (n > 0) {
            if (pos_ == end_ && !Fill()) return false;
            const int64_t take = std::min<int64_t>(n, end_ - pos_);
            std::memcpy(dst, buf_.data() + pos_, static_cast<size_t>(take));
            pos_ += take, dst += take, n -= take;
        }
        return true;
    }

private:
    bool Fill() {
        if (left_ <= 0) return false;
        const int64_t got = io_->Read(buf_.data(), std::min<int64_t>(left_, static_cast<int64_t>(buf_.size())));
        if (got <= 0) return false;
        left_ -= got, pos_ = 0, end_ = got;
        return true;
    }
    IOClass *io_;
    int64_t left_;
    std::vector<uint8_t> buf_;
    int64_t pos_ = 0, end_ = 0;
};

/// Decodes one line of `count` elements; false when the data ends first.
bool DecodeElements(DataSource &src, int count, int n, uint8_t *dst) {
    for (int x = 0; x < count;) {
        uint8_t control;
        if (!src.Get(&control, 1)) return false;
        const int len = (control & 0x7f) + 1;
        const int take = std::min(len, count - x); // a packet never crosses the line end
        if (control & 0x80) {
            uint8_t element[16];
            if (!src.Get(element, n)) return false;
            for (int k = 0; k < take; ++k) std::memcpy(dst + static_cast<size_t>(x + k) * n, element, n);
        } else {
            if (!src.Get(dst + static_cast<size_t>(x) * n, int64_t(take) * n)) return false;
            if (take < len) {
                std::vector<uint8_t> skip(static_cast<size_t>(len - take) * n);
                if (!src.Get(skip.data(), static_cast<int64_t>(skip.size()))) return false;
            }
        }
        x += take;
    }
    return true;
}

// ---- the tag block: the image's attributes ----

void PutBytes(std::vector<uint8_t> &out, const void *p, size_t n) {
    const auto *b = static_cast<const uint8_t *>(p);
    out.insert(out.end(), b, b + n);
}
void Put32(std::vector<uint8_t> &out, uint32_t v) {
    uint8_t b[4];
    LE::Put32(b, v);
    PutBytes(out, b, 4);
}

std::vector<uint8_t> SaveTags(const TagList &tags) {
    std::vector<uint8_t> out;
    Put32(out, 0);
    uint32_t count = 0;
    for (const TagItem &item : tags.Items()) {
        if (item.tag == ImgChannel) continue; // follows from the slot table
        const TagKind kind = KindOfTag(item.tag);
        if (kind == TagKind::Integer || kind == TagKind::Double) {
            Put32(out, item.tag);
            uint8_t b[8];
            LE::Put64(b, item.value);
            PutBytes(out, b, 8);
        } else if (kind == TagKind::Text || kind == TagKind::ID) {
            const char *text = kind == TagKind::Text ? item.AsText() : item.AsID().Text();
            const std::string s = text ? text : "";
            Put32(out, item.tag);
            Put32(out, static_cast<uint32_t>(s.size()));
            PutBytes(out, s.data(), s.size());
        } else {
            continue; // pointers mean nothing in a file
        }
        ++count;
    }
    LE::Put32(out.data(), count);
    return out;
}

/// Parses a tag block; false when it is damaged.
bool LoadTags(const std::vector<uint8_t> &in, TagList &tags, std::deque<std::string> &texts) {
    size_t pos = 0;
    auto need = [&](size_t n) { return pos + n <= in.size(); };
    if (!need(4)) return false;
    const uint32_t count = LE::Get32(&in[pos]);
    pos += 4;
    for (uint32_t i = 0; i < count; ++i) {
        if (!need(4)) return false;
        const Tag tag = LE::Get32(&in[pos]);
        pos += 4;
        const TagKind kind = KindOfTag(tag);
        if (kind == TagKind::Integer || kind == TagKind::Double) {
            if (!need(8)) return false;
            tags.Add(TagItem::Raw(tag, LE::Get64(&in[pos])));
            pos += 8;
        } else if (kind == TagKind::Text || kind == TagKind::ID) {
            if (!need(4)) return false;
            const uint32_t len = LE::Get32(&in[pos]);
            pos += 4;
            if (!need(len)) return false;
            texts.emplace_back(reinterpret_cast<const char *>(&in[pos]), len);
            pos += len;
            if (kind == TagKind::Text)
                tags.Add(TagItem(tag, texts.back().c_str()));
            else
                tags.Add(TagItem(tag, OvID(texts.back().c_str())));
        } else {
            return false;
        }
    }
    return true;
}

} // namespace raw_format_detail

using namespace raw_format_detail;

size_t RawFormat::EncodeRunLength(const uint8_t *src, int count, int elementBytes, uint8_t *out) {
    switch (elementBytes) {
    case 1: return RunLengthEncode<1>(src, count, out);
    case 2: return RunLengthEncode<2>(src, count, out);
    case 4: return RunLengthEncode<4>(src, count, out);
    case 8: return RunLengthEncode<8>(src, count, out);
    case 16: return RunLengthEncode<16>(src, count, out);
    default: return 0;
    }
}

bool RawFormat::CheckFormat(IOClass *stream) {
    uint8_t magic[4];
    return stream && stream->ReadExact(magic, 4) && std::memcmp(magic, "RAWI", 4) == 0;
}

void RawFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    tool->AddInputTagList("Compression", "Compression",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Combo},
                           {InputDefault, 2.0},
                           {ListAddItem, "None"},
                           {ListAddItem, "Zlib"},
                           {ListAddItem, "Runlength"}});
}

void RawFormat::SetupSave(Operator *tool, Request *req) {
    const double v = OptionValue(tool, req, "Compression", 2.0);
    saveCompression_ = std::clamp(static_cast<int>(std::lround(v)), 0, 2);
}

void RawFormat::CleanupSave(Operator *) {}

// ---- reading ----

bool RawFormat::LoadHeader(IOClass *stream) {
    io = stream;
    metadata = ScriptVal::Table();
    if (!io) return Fail("no stream");
    const int64_t base = io->Tell();
    std::memset(hdr_, 0, sizeof hdr_);
    if (!io->ReadExact(hdr_, 704)) return Fail("truncated header");
    if (std::memcmp(hdr_, "RAWI", 4) != 0) return Fail("not a Raw image file");
    tagEnd_ = LE::Get32(hdr_ + 4);
    tagOffset_ = LE::Get32(hdr_ + 8);
    if (tagOffset_ < 704) return Fail("bad header: tag block at " + std::to_string(tagOffset_));
    canvasOffset_ = 0;
    int64_t metaOffset = 0;
    if (tagOffset_ >= 708) {
        if (!io->ReadExact(hdr_ + 704, 4)) return Fail("truncated header");
        canvasOffset_ = LE::Get32(hdr_ + 704);
        if (tagOffset_ >= 712) {
            if (!io->ReadExact(hdr_ + 708, 4)) return Fail("truncated header");
            metaOffset = LE::Get32(hdr_ + 708);
        }
    }
    const int d = LE::GetS32(hdr_ + 36);
    if (!IsValidDepth(d)) return Fail("bad depth code " + std::to_string(d));
    const int w = LE::GetS32(hdr_ + 20), h = LE::GetS32(hdr_ + 24);
    if (w < 1 || h < 1 || w > MaxImageSide || h > MaxImageSide)
        return Fail("bad size " + std::to_string(w) + " x " + std::to_string(h));

    Layout &L = in_;
    L.mainPix = LE::Get16(hdr_ + 180), L.auxPix = LE::Get16(hdr_ + 182);
    L.mainLine = LE::Get32(hdr_ + 28), L.auxLine = LE::Get32(hdr_ + 32);
    L.window = GetRect(hdr_ + 40), L.valid = GetRect(hdr_ + 56);
    if (L.window.IsNull()) L.window.SetNull();
    if (!SaneRect(L.window) || !SaneRect(L.valid)) return Fail("bad data window");
    if (L.mainPix != FormatOfDepth(d).BytesPerPixel()) return Fail("bad pixel size");
    if (L.auxPix % 4 != 0 || L.auxPix / 4 > kAuxKinds) return Fail("bad auxiliary pixel size");
    const int64_t rows = L.window.Height(), cols = L.window.Width();
    if (L.mainLine != cols * L.mainPix || L.auxLine != cols * L.auxPix) return Fail("bad line size");
    if (LE::Get16(hdr_ + 184) != kSlots) return Fail("bad channel table");
    L.aux.clear();
    int auxSlots = 0;
    for (int s = 0; s < kSlots; ++s) {
        L.auxOffset[s] = LE::GetS16(hdr_ + 442 + 2 * s);
        if (L.auxOffset[s] < 0) continue;
        if (s < kFirstAuxSlot || s >= kFirstAuxSlot + kAuxKinds || L.auxOffset[s] % 4 != 0 ||
            L.auxOffset[s] + 4 > L.auxPix)
            return Fail("bad auxiliary channel table");
        L.aux.push_back(static_cast<AuxChannelKind>(s - kFirstAuxSlot));
        ++auxSlots;
    }
    if (auxSlots * 4 != L.auxPix) return Fail("bad auxiliary channel table");

    compression_ = LE::GetS32(hdr_ + 700);
    if (compression_ < CompressNone || compression_ > CompressRunLength)
        return Fail("unknown compression " + std::to_string(compression_));
    dataOffset_ = LE::Get32(hdr_ + 12);
    dataSize_ = LE::Get32(hdr_ + 16);
    const int64_t fileSize = io->Size();
    const int64_t end = fileSize >= 0 ? fileSize - base : -1;
    if (dataOffset_ < 704 || (end >= 0 && dataOffset_ > end)) return Fail("bad pixel data offset");
    const int64_t both = L.mainLine + L.auxLine;
    if (compression_ == CompressNone) {
        const bool agrees = dataSize_ == both * h || dataSize_ == both * rows ||
                            (end >= 0 && (end == dataOffset_ + both * h || end == dataOffset_ + both * rows));
        if (!agrees) return Fail("pixel data size does not match the image");
    } else if (compression_ == CompressZlib && end >= 0 && rows * (L.auxLine ? 8 : 4) > end - dataOffset_) {
        return Fail("truncated pixel data"); // every zlib line has at least its size word
    }

    // Metadata: ignored when absent, empty or too large.
    if (metaOffset >= kHeaderSize && metaOffset + 8 <= tagOffset_) {
        uint8_t sizes[8];
        if (!io->Seek(base + metaOffset, IOClass::SeekAbsolute) || !io->ReadExact(sizes, 8))
            return Fail("truncated metadata");
        const uint32_t packed = LE::Get32(sizes), textSize = LE::Get32(sizes + 4);
        if (packed && textSize && packed < kMetadataLimit && textSize < kMetadataLimit) {
            std::vector<uint8_t> z(packed);
            std::string text(textSize, '\0');
            uLongf outLen = textSize;
            if (!io->ReadExact(z.data(), packed)) return Fail("truncated metadata");
            if (uncompress(reinterpret_cast<Bytef *>(text.data()), &outLen, z.data(), packed) == Z_OK) {
                text.resize(outLen);
                while (!text.empty() && text.back() == '\0') text.pop_back();
                try {
                    ScriptVal v = ScriptVal::FromText(text);
                    if (v.IsTable()) metadata = std::move(v);
                } catch (const ScriptParseError &) {
                    // Damaged metadata is dropped; the pixels still read.
                }
            }
        }
    }

    width = w, height = h, depth = d;
    dataWindow = L.window;
    auxChannels = static_cast<int>(L.aux.size());
    const double ax = LE::GetDouble(hdr_ + 72), ay = LE::GetDouble(hdr_ + 80);
    aspectX = std::isfinite(ax) && ax > 0 ? ax : 1.0;
    aspectY = std::isfinite(ay) && ay > 0 ? ay : 1.0;
    dataOffset_ += base, tagOffset_ += base, tagEnd_ += base;
    if (canvasOffset_) canvasOffset_ += base;
    return true;
}

bool RawFormat::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    const Layout &L = in_;
    ImgRectI window = L.window;
    if (const auto *region = tags.GetPtrAs<const ImageDomain>(ClipFrameRegion)) window &= region->rect;
    image->SetDataWindow(window);
    image->SetValidWindow(L.valid);

    // Attributes from the header fields.
    TagList attrs;
    const uint8_t *h = hdr_;
    if (const int v = LE::GetS32(h + 108); v != 1 && v > 0) attrs.Set({ImgProxyScale, v});
    if (const int v = LE::GetS32(h + 116); v != 0) attrs.Set({ImgTimeCode, v});
    if (const int v = LE::GetS32(h + 120); v > 0) attrs.Set({ImgFullWidth, v});
    if (const int v = LE::GetS32(h + 124); v > 0) attrs.Set({ImgFullHeight, v});
    if (const double v = LE::GetDouble(h + 128); std::isfinite(v) && v > 0) attrs.Set({ImgFullXScale, v});
    if (const double v = LE::GetDouble(h + 136); std::isfinite(v) && v > 0) attrs.Set({ImgFullYScale, v});
    if (const int v = LE::GetS32(h + 144); v != -1) attrs.Set({ImgField, v});
    if (const double v = LE::GetDouble(h + 96); std::isfinite(v) && v != 0) attrs.Set({ImgFieldOffset, v});
    for (int s = 0; s < kSlots; ++s)
        if (LE::GetS16(h + 186 + 2 * s) >= 0) attrs.Add({ImgChannel, s});
    if (!attrs.Empty()) image->SetAttrsTagList(attrs);
    for (AuxChannelKind k : L.aux)
        if (!image->AddAuxChannel(k)) return Fail("out of memory");

    // Saved attributes, when the clip asks for them.
    if (GetAttrB(FormatRestoreTags) && tagEnd_ > tagOffset_ + 4) {
        const int64_t n = tagEnd_ - tagOffset_;
        if (n > (16 << 20)) return Fail("bad tag block");
        std::vector<uint8_t> block(static_cast<size_t>(n));
        if (!io->Seek(tagOffset_, IOClass::SeekAbsolute) || !io->ReadExact(block.data(), n))
            return Fail("truncated tag block");
        TagList saved;
        std::deque<std::string> texts;
        if (!LoadTags(block, saved, texts)) return Fail("bad tag block");
        if (!saved.Empty()) image->SetAttrsTagList(saved);
        const uint32_t flags = LE::Get32(h + 104);
        image->SetIsOpaque(flags & FlagOpaque);
        image->SetSimple(flags & FlagSimple);
    }

    // Canvas colour: one main pixel (the auxiliary one is not kept by images).
    if (canvasOffset_) {
        uint8_t px[16];
        if (!io->Seek(canvasOffset_, IOClass::SeekAbsolute) || !io->ReadExact(px, L.mainPix))
            return Fail("truncated canvas colour");
        FltPixel c;
        LoadFlt(depth, px, 1, &c);
        image->SetCanvasColor(c);
    }
    if (window.IsNull() || image->IsNoData()) return true;
    if (!image->AllocScanLineData()) return Fail("out of memory");
    return ReadPixels(*image, window);
}

bool RawFormat::ReadPixels(Image &image, const ImgRectI &want) {
    const Layout &L = in_;
    const int rows = L.window.Height(), cols = L.window.Width();
    const size_t skip = static_cast<size_t>(want.x0 - L.window.x0);
    const int nAux = static_cast<int>(L.aux.size());
    std::vector<uint8_t> line(static_cast<size_t>(std::max(L.mainLine, L.auxLine)));

    auto storeMain = [&](int y, const uint8_t *src) {
        std::memcpy(image.ScanLine(y), src + skip * L.mainPix, static_cast<size_t>(want.Width()) * L.mainPix);
    };
    auto storeAux = [&](int y, const uint8_t *src) {
        for (int a = 0; a < nAux; ++a) {
            float *dst = image.AuxRow(L.aux[a], y);
            const int off = L.auxOffset[kFirstAuxSlot + static_cast<int>(L.aux[a])];
            if (!dst) continue;
            for (int x = 0; x < want.Width(); ++x)
                std::memcpy(dst + x, src + (skip + x) * L.auxPix + off, sizeof(float));
        }
    };
    auto wanted = [&](int y) { return y >= want.y0 && y < want.y1; };

    if (compression_ == CompressNone) {
        const int64_t limit = std::min<int64_t>(int64_t(rows) * (L.mainLine + L.auxLine), dataSize_);
        for (int plane = 0; plane < (nAux ? 2 : 1); ++plane) {
            const int64_t lineBytes = plane ? L.auxLine : L.mainLine;
            const int64_t start = plane ? int64_t(rows) * L.mainLine : 0;
            for (int y = want.y0; y < want.y1; ++y) {
                if (Aborted()) return Fail("aborted");
                const int64_t at = start + int64_t(y - L.window.y0) * lineBytes;
                if (at + lineBytes > limit) break; // the rest was not stored
                if (!io->Seek(dataOffset_ + at, IOClass::SeekAbsolute)) return Fail("seek error");
                if (!io->ReadExact(line.data(), lineBytes))
                    return Fail("truncated pixel data at line " + std::to_string(y));
                plane ? storeAux(y, line.data()) : storeMain(y, line.data());
            }
        }
        return true;
    }

    if (!io->Seek(dataOffset_, IOClass::SeekAbsolute)) return Fail("seek error");
    const int64_t fileSize = io->Size();
    int64_t available = dataSize_;
    if (fileSize >= 0) available = std::min<int64_t>(available ? available : fileSize, fileSize - dataOffset_);
    DataSource src(io, std::max<int64_t>(available, 0));
    std::vector<uint8_t> packed;

    auto zlibLine = [&](int y, int64_t lineBytes) -> bool {
        uint8_t sz[4];
        if (!src.Get(sz, 4)) return Fail("truncated pixel data at line " + std::to_string(y));
        const uint32_t n = LE::Get32(sz);
        if (n > ZlibBuffer(lineBytes)) return Fail("bad compressed line " + std::to_string(y));
        packed.resize(n);
        if (!src.Get(packed.data(), n)) return Fail("truncated pixel data at line " + std::to_string(y));
        uLongf outLen = static_cast<uLongf>(lineBytes);
        if (uncompress(line.data(), &outLen, packed.data(), n) != Z_OK || outLen != static_cast<uLongf>(lineBytes))
            return Fail("bad compressed line " + std::to_string(y));
        return true;
    };

    for (int i = 0; i < rows; ++i) {
        const int y = L.window.y0 + i;
        if (Aborted()) return Fail("aborted");
        if (compression_ == CompressZlib) {
            if (!zlibLine(y, L.mainLine)) return false;
        } else if (!DecodeElements(src, cols, L.mainPix, line.data())) {
            return Fail("truncated pixel data at line " + std::to_string(y));
        }
        if (wanted(y)) storeMain(y, line.data());
    }
    for (int i = 0; i < rows && nAux; ++i) {
        const int y = L.window.y0 + i;
        if (Aborted()) return Fail("aborted");
        if (!zlibLine(y, L.auxLine)) return false;
        if (wanted(y)) storeAux(y, line.data());
    }
    return true;
}

// ---- writing ----

bool RawFormat::SaveHeader(IOClass *stream, Image *image) {
    io = stream;
    if (!io || !image) return Fail("nothing to write");
    headerPos_ = io->Tell();
    Layout &L = out_;
    L.window = image->DataWindow();
    if (L.window.IsNull()) L.window.SetNull();
    L.valid = image->ValidWindow();
    L.mainPix = image->BytesPerPixel();
    L.aux.clear();
    for (int k = 0; k < kAuxKinds; ++k)
        if (image->HasAuxChannel(static_cast<AuxChannelKind>(k))) L.aux.push_back(static_cast<AuxChannelKind>(k));
    L.auxPix = static_cast<int>(L.aux.size()) * 4;
    L.mainLine = int64_t(L.window.Width()) * L.mainPix;
    L.auxLine = int64_t(L.window.Width()) * L.auxPix;

    // Metadata block.
    std::vector<uint8_t> meta;
    if (image->Metadata().IsTable() && image->Metadata().Size()) {
        std::string text = image->Metadata().ToText();
        text.push_back('\0');
        uLongf packed = compressBound(static_cast<uLong>(text.size()));
        meta.resize(8 + packed);
        if (compress2(meta.data() + 8, &packed, reinterpret_cast<const Bytef *>(text.data()),
                      static_cast<uLong>(text.size()), 5) != Z_OK)
            return Fail("cannot compress metadata");
        meta.resize(8 + packed);
        LE::Put32(meta.data(), static_cast<uint32_t>(packed));
        LE::Put32(meta.data() + 4, static_cast<uint32_t>(text.size()));
    }
    const std::vector<uint8_t> tagBlock = SaveTags(image->Attrs());

    const int64_t canvasAt = kHeaderSize, metaAt = kHeaderSize + L.mainPix + L.auxPix;
    const int64_t tagAt = metaAt + static_cast<int64_t>(meta.size());
    const int64_t tagEnd = tagAt + static_cast<int64_t>(tagBlock.size());
    const int64_t dataAt = (tagEnd + 511) & ~int64_t(511);

    std::vector<uint8_t> head(static_cast<size_t>(dataAt), 0);
    uint8_t *h = head.data();
    std::memcpy(h, "RAWI", 4);
    LE::Put32(h + 4, static_cast<uint32_t>(tagEnd));
    LE::Put32(h + 8, static_cast<uint32_t>(tagAt));
    LE::Put32(h + 12, static_cast<uint32_t>(dataAt));
    LE::Put32(h + 16, static_cast<uint32_t>(int64_t(L.window.Height()) * (L.mainLine + L.auxLine)));
    LE::Put32(h + 20, static_cast<uint32_t>(image->Width()));
    LE::Put32(h + 24, static_cast<uint32_t>(image->Height()));
    LE::Put32(h + 28, static_cast<uint32_t>(L.mainLine));
    LE::Put32(h + 32, static_cast<uint32_t>(L.auxLine));
    LE::Put32(h + 36, static_cast<uint32_t>(image->Depth()));
    PutRect(h + 40, L.window);
    PutRect(h + 56, L.valid);
    LE::PutDouble(h + 72, image->XScale());
    LE::PutDouble(h + 80, image->YScale());
    LE::PutDouble(h + 88, 0.0);
    LE::PutDouble(h + 96, image->GetAttrD(ImgFieldOffset, 0.0));
    LE::Put32(h + 104, (image->IsOpaque() ? FlagOpaque : 0) | (image->IsSimple() ? FlagSimple : 0));
    LE::Put32(h + 108, static_cast<uint32_t>(image->GetAttrL(ImgProxyScale, 1)));
    LE::Put32(h + 116, static_cast<uint32_t>(image->GetAttrL(ImgTimeCode, 0)));
    LE::Put32(h + 120, static_cast<uint32_t>(image->GetAttrL(ImgFullWidth, 0)));
    LE::Put32(h + 124, static_cast<uint32_t>(image->GetAttrL(ImgFullHeight, 0)));
    LE::PutDouble(h + 128, image->GetAttrD(ImgFullXScale, 0.0));
    LE::PutDouble(h + 136, image->GetAttrD(ImgFullYScale, 0.0));
    LE::Put32(h + 144, static_cast<uint32_t>(image->GetAttrL(ImgField, -1)));
    // 152: time extent, not kept by images: zero.
    std::memset(h + 186, 0xff, 4 * 128);
    uint32_t channelFlags = 0;
    const PixelFormat f = image->Format();
    for (int c = 0; c < 4; ++c) {
        if (f.channels == 1 && c != 3) continue;
        LE::Put16(h + 186 + 2 * c, static_cast<uint32_t>(f.channels == 1 ? 0 : c * f.bytesPerComponent));
        channelFlags |= 1u << c;
    }
    for (size_t a = 0; a < L.aux.size(); ++a) {
        const int slot = kFirstAuxSlot + static_cast<int>(L.aux[a]);
        LE::Put16(h + 442 + 2 * slot, static_cast<uint32_t>(4 * a));
        channelFlags |= 1u << slot;
    }
    LE::Put32(h + 176, channelFlags);
    LE::Put16(h + 180, static_cast<uint32_t>(L.mainPix));
    LE::Put16(h + 182, static_cast<uint32_t>(L.auxPix));
    LE::Put16(h + 184, kSlots);
    LE::Put32(h + 700, static_cast<uint32_t>(saveCompression_));
    LE::Put32(h + 704, static_cast<uint32_t>(canvasAt));
    LE::Put32(h + 708, static_cast<uint32_t>(metaAt));
    const FltPixel canvas = image->GetCanvasColor();
    StoreFlt(image->Depth(), &canvas, 1, h + canvasAt); // the auxiliary canvas is zero
    if (!meta.empty()) std::memcpy(h + metaAt, meta.data(), meta.size());
    std::memcpy(h + tagAt, tagBlock.data(), tagBlock.size());
    if (!io->WriteExact(head.data(), static_cast<int64_t>(head.size()))) return Fail("write error");
    return true;
}

bool RawFormat::SaveFrame(unsigned, Image *image) {
    if (!io || !image) return Fail("nothing to write");
    const Layout &L = out_;
    if (image->DataWindow() != L.window && !(image->DataWindow().IsNull() && L.window.IsNull()))
        return Fail("the image changed since its header was written");
    const int rows = L.window.Height(), cols = L.window.Width();
    if (rows <= 0 || cols <= 0) return true;
    const int nAux = static_cast<int>(L.aux.size());
    std::vector<uint8_t> line(static_cast<size_t>(std::max(L.mainLine, L.auxLine)));
    std::vector<uint8_t> packed(static_cast<size_t>(
        std::max(ZlibBuffer(std::max(L.mainLine, L.auxLine)), int64_t(cols) * (L.mainPix + 1) + 16)));
    int64_t written = 0;

    auto mainLine = [&](int y) -> const uint8_t * {
        const uint8_t *row = image->ScanLine(y);
        if (row) return row;
        std::fill(line.begin(), line.end(), 0); // an image without rows stores zeros
        return line.data();
    };
    auto auxLine = [&](int y) {
        for (int x = 0; x < cols; ++x)
            for (int a = 0; a < nAux; ++a) {
                const float *src = image->AuxRow(L.aux[a], y);
                const float v = src ? src[x] : 0.f;
                std::memcpy(&line[static_cast<size_t>(x) * L.auxPix + 4 * a], &v, 4);
            }
        return line.data();
    };
    auto put = [&](const uint8_t *p, int64_t n) {
        written += n;
        return io->WriteExact(p, n);
    };
    auto zlibLine = [&](const uint8_t *src, int64_t n) {
        uLongf len = static_cast<uLongf>(packed.size() - 4);
        if (compress2(packed.data() + 4, &len, src, static_cast<uLong>(n), 1) != Z_OK) return false;
        LE::Put32(packed.data(), static_cast<uint32_t>(len));
        return put(packed.data(), static_cast<int64_t>(len) + 4);
    };

    for (int plane = 0; plane < (nAux ? 2 : 1); ++plane) {
        for (int y = L.window.y0; y < L.window.y1; ++y) {
            if (Aborted()) return Fail("aborted");
            const uint8_t *src = plane ? auxLine(y) : mainLine(y);
            const int64_t n = plane ? L.auxLine : L.mainLine;
            bool ok;
            if (saveCompression_ == CompressNone)
                ok = put(src, n);
            else if (saveCompression_ == CompressRunLength && plane == 0)
                ok = put(packed.data(), static_cast<int64_t>(EncodeRunLength(src, cols, L.mainPix, packed.data())));
            else
                ok = zlibLine(src, n);
            if (!ok) return Fail("write error");
        }
    }
    if (saveCompression_ != CompressNone) {
        // The size field holds the bytes actually written.
        const int64_t end = io->Tell();
        uint8_t b[4];
        LE::Put32(b, static_cast<uint32_t>(written));
        if (!io->Seek(headerPos_ + 16, IOClass::SeekAbsolute) || !io->WriteExact(b, 4) ||
            !io->Seek(end, IOClass::SeekAbsolute))
            return Fail("write error");
    }
    return true;
}

int64_t RawFormat::PredictFileSize(Image *image) {
    if (!image) return 0;
    const ImgRectI &w = image->DataWindow();
    const int64_t rows = w.IsNull() ? 0 : w.Height(), cols = w.IsNull() ? 0 : w.Width();
    int64_t aux = 0;
    for (int k = 0; k < kAuxKinds; ++k) aux += image->HasAuxChannel(static_cast<AuxChannelKind>(k)) ? 4 : 0;
    const int64_t mainPix = image->BytesPerPixel();
    int64_t text = 0;
    if (image->Metadata().IsTable() && image->Metadata().Size())
        text = static_cast<int64_t>(image->Metadata().ToText().size()) + 1;
    return rows * ((mainPix + aux) * cols + (cols + 127) / 128) + 1024 + mainPix + aux + text;
}

} // namespace Orvane
