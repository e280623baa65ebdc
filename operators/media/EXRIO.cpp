#include "operators/media/EXRIO.h"

#include <ImfChannelList.h>
#include <ImfCompressionAttribute.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputPart.h>
#include <ImfMultiPartInputFile.h>
#include <ImfMultiPartOutputFile.h>
#include <ImfOutputPart.h>
#include <ImfPartType.h>
#include <ImfThreading.h>

#include <Imath/half.h>

#include <atomic>
#include <cstring>
#include <exception>

extern "C" {
#include <lua.h>
}

#include "host/core/Parallel.h"
#include "host/image/Image.h"
#include "host/media/Sequence.h"
#include "operators/media/formats/ExrAttributes.h"

namespace Orvane {
namespace {

/// Largest data window read or written, in pixels: a damaged header must not make us ask for terabytes.
constexpr int64_t kMaxWindowPixels = int64_t(1) << 28;

Imath::Box2i FileBox(const ImgRectI &r, int h) { return {{r.x0, h - r.y1}, {r.x1 - 1, h - r.y0 - 1}}; }

int DisplayHeight(const Imf::Header &h) { return h.displayWindow().max.y - h.displayWindow().min.y + 1; }

size_t SampleSize(Imf::PixelType t) { return t == Imf::HALF ? 2 : 4; }

/// One value of an image channel at (x, y): colour 0..3, auxiliary planes from 4.
float ImageValue(const Image &img, int channel, int x, int y) {
    if (channel < 4) {
        const FltPixel p = img.GetFlt(x, y);
        return (&p.R)[channel];
    }
    const auto kind = static_cast<AuxChannelKind>(channel - 4);
    const float *row = img.HasAuxChannel(kind) ? img.AuxRow(kind, y) : nullptr;
    const ImgRectI &dw = img.DataWindow();
    return row && x >= dw.x0 && x < dw.x1 ? row[x - dw.x0] : 0.f;
}

void SetImageValue(Image &img, int channel, int x, int y, float v) {
    const ImgRectI &dw = img.DataWindow();
    if (x < dw.x0 || x >= dw.x1 || y < dw.y0 || y >= dw.y1) return;
    if (channel < 4) {
        FltPixel p = img.GetFlt(x, y);
        (&p.R)[channel] = v;
        img.PutFlt(x, y, p);
        return;
    }
    if (float *row = img.AuxRow(static_cast<AuxChannelKind>(channel - 4), y)) row[x - dw.x0] = v;
}

bool ValidChannel(int channel) { return channel >= 0 && channel < 4 + static_cast<int>(AuxChannelKind::Count); }

float Sample(const char *p, Imf::PixelType t) {
    if (t == Imf::HALF) {
        Imath::half h;
        std::memcpy(&h, p, 2);
        return float(h);
    }
    if (t == Imf::UINT) {
        uint32_t u;
        std::memcpy(&u, p, 4);
        return static_cast<float>(u);
    }
    float f;
    std::memcpy(&f, p, 4);
    return f;
}

void StoreSample(char *p, Imf::PixelType t, float v) {
    if (t == Imf::HALF) {
        const Imath::half h(v);
        std::memcpy(p, &h, 2);
    } else if (t == Imf::UINT) {
        const uint32_t u = v > 0.f ? (v < 4294967040.f ? static_cast<uint32_t>(v) : 4294967040u) : 0u;
        std::memcpy(p, &u, 4);
    } else {
        std::memcpy(p, &v, 4);
    }
}

/// Width and height of a data window, false when it is empty or too large to buffer.
bool WindowSize(const Imath::Box2i &dw, int64_t &w, int64_t &h, std::string &error) {
    w = int64_t(dw.max.x) - dw.min.x + 1;
    h = int64_t(dw.max.y) - dw.min.y + 1;
    if (w <= 0 || h <= 0 || w * h > kMaxWindowPixels) {
        error = "the data window is empty or too large";
        return false;
    }
    return true;
}

} // namespace

EXRIO::EXRIO() = default;
EXRIO::~EXRIO() { Reset(); }

void EXRIO::Reset() {
    try {
        input.reset();
        output.reset();
    } catch (const std::exception &e) {
        lastError = e.what();
    }
    fileName.clear();
    isOpen = isWriting = false;
    numParts = currentPart = 0;
    parts.clear();
    headers.clear();
}

void EXRIO::Open(const char *name, int frame, bool writing) {
    Reset();
    const std::string given = name ? name : "";
    fileName = frame == -1 ? given : SequencePath(OutputSequenceName(given, true), frame);
    isOpen = true;
    isWriting = writing;
}

Imf::Header *EXRIO::Header(int part) {
    return part >= 1 && part <= static_cast<int>(headers.size()) ? &headers[part - 1] : nullptr;
}

ImgRectI EXRIO::ImageRect(int minX, int minY, int maxX, int maxY, int h) {
    return ImgRectI{minX, h - maxY - 1, maxX + 1, h - minY};
}

bool EXRIO::ReadHeader() {
    if (!isOpen || isWriting) {
        lastError = "ReadHeader: the object is not open for reading (ReadOpen first)";
        return false;
    }
    try {
        input.reset();
        input = std::make_unique<Imf::MultiPartInputFile>(fileName.c_str(), Imf::globalThreadCount(), true);
        headers.clear();
        for (int i = 0; i < input->parts(); ++i) headers.push_back(input->header(i));
    } catch (const std::exception &e) {
        input.reset();
        headers.clear();
        lastError = e.what();
        return false;
    }
    numParts = static_cast<int>(headers.size());
    parts.resize(headers.size());
    for (size_t i = 0; i < headers.size(); ++i) {
        const Imf::Header &h = headers[i];
        const int height = DisplayHeight(h);
        const Imath::Box2i &d = h.displayWindow(), &w = h.dataWindow();
        PartEntry &p = parts[i];
        p.name = h.hasName() ? h.name() : "";
        p.aspect = h.pixelAspectRatio();
        p.display = ImageRect(d.min.x, d.min.y, d.max.x, d.max.y, height);
        p.data = ImageRect(w.min.x, w.min.y, w.max.x, w.max.y, height);
        p.compression = static_cast<int>(h.compression());
    }
    return true;
}

int EXRIO::FindPart(const char *name) const {
    if (!name || !*name) return 0;
    for (size_t i = 0; i < headers.size(); ++i)
        if (headers[i].hasName() && headers[i].name() == name) return static_cast<int>(i) + 1;
    return 0;
}

int EXRIO::PartR(int part) {
    if (part < 1 || part > std::max<int>(numParts, 1) + 1024) {
        lastError = "Part: no part " + std::to_string(part);
        return 0;
    }
    currentPart = part;
    if (part > static_cast<int>(parts.size())) parts.resize(static_cast<size_t>(part));
    numParts = std::max(numParts, part);
    parts[part - 1].channels.clear();
    return part;
}

int EXRIO::PartW(const char *name, const ImgRectI *display, const ImgRectI *data, double aspect) {
    if (!display || !data || display->IsNull()) {
        lastError = "Part: a part needs a display window and a data window";
        return 0;
    }
    PartEntry p;
    p.name = name ? name : "";
    p.aspect = aspect > 0 ? aspect : 1.0;
    p.display = *display;
    p.data = *data;
    const int h = display->Height();
    try {
        Imf::Header header(FileBox(*display, h), FileBox(*data, h), static_cast<float>(p.aspect), Imath::V2f(0, 0), 1,
                           Imf::INCREASING_Y, static_cast<Imf::Compression>(p.compression));
        if (!p.name.empty()) header.setName(p.name);
        header.setType(Imf::SCANLINEIMAGE);
        header.setVersion(1);
        headers.push_back(header);
    } catch (const std::exception &e) {
        lastError = e.what();
        return 0;
    }
    parts.push_back(std::move(p));
    numParts = static_cast<int>(parts.size());
    currentPart = numParts;
    return numParts;
}

void EXRIO::AddChannel(const char *name, int type, Image *img, int index, int channel, double fill, double canvas) {
    if (currentPart < 1 || currentPart > static_cast<int>(parts.size())) {
        lastError = "Channel: no current part (Part first)";
        return;
    }
    if (!name || !*name || !ValidChannel(channel) || type < AnyType || type > FloatType) {
        lastError = "Channel: a channel needs a name, a pixel type and an image channel 0 to " +
                    std::to_string(3 + static_cast<int>(AuxChannelKind::Count));
        return;
    }
    ChannelEntry e;
    e.name = name;
    e.type = type;
    e.image = Ref<Image>(img);
    e.index = index;
    e.channel = channel;
    e.fill = fill;
    e.canvas = canvas;
    parts[currentPart - 1].channels.push_back(std::move(e));
}

bool EXRIO::WriteHeader() {
    if (!isOpen || !isWriting) {
        lastError = "WriteHeader: the object is not open for writing (WriteOpen first)";
        return false;
    }
    if (headers.empty()) {
        lastError = "WriteHeader: no parts (Part first)";
        return false;
    }
    try {
        for (size_t i = 0; i < headers.size(); ++i)
            for (const ChannelEntry &c : parts[i].channels) {
                const int type = c.type == AnyType ? FloatType : c.type;
                headers[i].channels().insert(c.name, Imf::Channel(static_cast<Imf::PixelType>(type), 1, 1));
            }
        output.reset();
        output = std::make_unique<Imf::MultiPartOutputFile>(
            fileName.c_str(), headers.data(), static_cast<int>(headers.size()), false, Imf::globalThreadCount());
    } catch (const std::exception &e) {
        output.reset();
        lastError = e.what();
        return false;
    }
    return true;
}

Image *EXRIO::EntryImage(const ChannelEntry &e, Image **imgs) {
    if (e.image) return e.image.Get();
    // The snippets copy the script's table {img1, img2, ...} into an array from element 0.
    return imgs && e.index >= 1 ? imgs[e.index - 1] : nullptr;
}

bool EXRIO::ReadPart(int part, Image **imgs) {
    if (!input || part < 1 || part > input->parts() || part > static_cast<int>(parts.size())) {
        lastError = input ? "ReadPart: no part " + std::to_string(part) : "ReadPart: no file read (ReadHeader first)";
        return false;
    }
    try {
        const Imf::Header &header = input->header(part - 1);
        const Imath::Box2i dw = header.dataWindow();
        int64_t w = 0, h = 0;
        if (!WindowSize(dw, w, h, lastError)) return false;
        struct Read {
            const ChannelEntry *entry;
            Imf::PixelType type;
            std::vector<char> pixels;
        };
        std::vector<Read> reads;
        Imf::FrameBuffer fb;
        for (const ChannelEntry &e : parts[part - 1].channels) {
            const Imf::Channel *file = header.channels().findChannel(e.name);
            if (file && e.type != AnyType && e.type != static_cast<int>(file->type)) continue;
            const Imf::PixelType type =
                file ? file->type : static_cast<Imf::PixelType>(e.type == AnyType ? FloatType : e.type);
            const size_t size = SampleSize(type);
            reads.push_back({&e, type, std::vector<char>(static_cast<size_t>(w * h) * size)});
            if (fb.findSlice(e.name)) continue; // read once, copied to every entry naming it
            fb.insert(e.name, Imf::Slice::Make(type, reads.back().pixels.data(), dw, size,
                                               size * static_cast<size_t>(w), 1, 1, e.fill));
        }
        if (reads.empty()) return true; // every channel skipped: nothing to read
        Imf::InputPart in(*input, part - 1);
        in.setFrameBuffer(fb);
        in.readPixels(dw.min.y, dw.max.y);
        const int height = DisplayHeight(header);
        for (Read &r : reads) {
            Image *img = EntryImage(*r.entry, imgs);
            if (!img || img->IsReadOnly()) continue;
            // An entry whose name another entry read first takes that entry's pixels.
            const std::vector<char> *pixels = &r.pixels;
            for (const Read &first : reads)
                if (first.entry->name == r.entry->name) {
                    pixels = &first.pixels;
                    break;
                }
            const int c = r.entry->channel;
            if (c >= 4 && !img->HasAuxChannel(static_cast<AuxChannelKind>(c - 4)) &&
                !img->AddAuxChannel(static_cast<AuxChannelKind>(c - 4))) {
                lastError = "ReadPart: out of memory";
                return false;
            }
            if (!img->AllocScanLineData()) {
                lastError = "ReadPart: out of memory";
                return false;
            }
            const size_t size = SampleSize(r.type);
            for (int64_t y = 0; y < h; ++y) {
                const int iy = height - 1 - static_cast<int>(dw.min.y + y);
                const char *row = pixels->data() + static_cast<size_t>(y * w) * size;
                for (int64_t x = 0; x < w; ++x)
                    SetImageValue(*img, c, static_cast<int>(dw.min.x + x), iy, Sample(row + x * size, r.type));
            }
            if (c < 4) img->SetCanvasColorFltChan(c, static_cast<float>(r.entry->canvas));
        }
    } catch (const std::exception &e) {
        lastError = e.what();
        return false;
    }
    return true;
}

bool EXRIO::WritePart(int part, Image **imgs) {
    if (!output || part < 1 || part > output->parts() || part > static_cast<int>(parts.size())) {
        lastError = output ? "WritePart: no part " + std::to_string(part) : "WritePart: no file (WriteHeader first)";
        return false;
    }
    try {
        const Imf::Header &header = output->header(part - 1);
        const Imath::Box2i dw = header.dataWindow();
        int64_t w = 0, h = 0;
        if (!WindowSize(dw, w, h, lastError)) return false;
        const int height = DisplayHeight(header);
        std::vector<std::vector<char>> buffers;
        Imf::FrameBuffer fb;
        for (const ChannelEntry &e : parts[part - 1].channels) {
            const auto type = static_cast<Imf::PixelType>(e.type == AnyType ? FloatType : e.type);
            const size_t size = SampleSize(type);
            std::vector<char> &pixels = buffers.emplace_back(static_cast<size_t>(w * h) * size);
            const Image *img = EntryImage(e, imgs);
            for (int64_t y = 0; y < h; ++y) {
                const int iy = height - 1 - static_cast<int>(dw.min.y + y);
                char *row = pixels.data() + static_cast<size_t>(y * w) * size;
                for (int64_t x = 0; x < w; ++x) {
                    const float v = img ? ImageValue(*img, e.channel, static_cast<int>(dw.min.x + x), iy)
                                        : static_cast<float>(e.fill);
                    StoreSample(row + x * size, type, v);
                }
            }
            fb.insert(e.name, Imf::Slice::Make(type, pixels.data(), dw, size, size * static_cast<size_t>(w)));
        }
        Imf::OutputPart out(*output, part - 1);
        out.setFrameBuffer(fb);
        out.writePixels(static_cast<int>(h));
    } catch (const std::exception &e) {
        lastError = *e.what() ? e.what() : "Write failed";
        return false;
    } catch (...) {
        lastError = "Write failed";
        return false;
    }
    return true;
}

} // namespace Orvane

using Orvane::EXRIO;
using Orvane::Image;
using Orvane::ImgRectI;
using Orvane::ScriptObject;

namespace {

void FreeObject(void *p) { delete static_cast<EXRIO *>(p); }
void FreeRect(void *p) { delete static_cast<ImgRectI *>(p); }

/// The object of a Lua C function (argument 1, then removed); null when it is none.
EXRIO *TakeSelf(lua_State *L) {
    auto *self = static_cast<EXRIO *>(Orvane::ScriptObjectArgument(L, 1));
    if (lua_gettop(L) >= 1) lua_remove(L, 1);
    return self;
}

/// The header of the part number at stack `index`, or null with last error set.
Imf::Header *PartHeader(lua_State *L, EXRIO *self, int index) {
    const int part = lua_isnumber(L, index) ? static_cast<int>(lua_tointeger(L, index)) : 0;
    Imf::Header *h = self ? self->Header(part) : nullptr;
    if (self && !h) self->lastError = "no part " + std::to_string(part);
    return h;
}

/// Nil as a Lua C function's one result.
int PushNil(lua_State *L) {
    lua_pushnil(L);
    return 1;
}

void PushValue(lua_State *L, const Orvane::ScriptVal &v) {
    using Orvane::ScriptVal;
    switch (v.GetType()) {
    case ScriptVal::Type::Bool: lua_pushboolean(L, v.AsBool()); break;
    case ScriptVal::Type::Number: lua_pushnumber(L, v.AsNumber()); break;
    case ScriptVal::Type::Text: lua_pushlstring(L, v.AsText().data(), v.AsText().size()); break;
    case ScriptVal::Type::Table:
        lua_createtable(L, static_cast<int>(v.ArrayLength()), 0);
        for (const auto &[key, value] : v.Entries()) {
            PushValue(L, key);
            PushValue(L, value);
            lua_settable(L, -3);
        }
        break;
    default: lua_pushnil(L);
    }
}

/// A Lua number, string, boolean or table (two levels deep) as a script value.
Orvane::ScriptVal ValueAt(lua_State *L, int index, int depth = 0) {
    using Orvane::ScriptVal;
    switch (lua_type(L, index)) {
    case LUA_TBOOLEAN: return ScriptVal(lua_toboolean(L, index) != 0);
    case LUA_TNUMBER: return ScriptVal(static_cast<double>(lua_tonumber(L, index)));
    case LUA_TSTRING: return ScriptVal(std::string(lua_tostring(L, index)));
    case LUA_TTABLE: {
        if (depth > 1) return {};
        ScriptVal t = ScriptVal::Table();
        const int abs = index > 0 ? index : lua_gettop(L) + index + 1;
        lua_pushnil(L);
        while (lua_next(L, abs) != 0) {
            ScriptVal key = lua_type(L, -2) == LUA_TNUMBER   ? ScriptVal(static_cast<double>(lua_tonumber(L, -2)))
                            : lua_type(L, -2) == LUA_TSTRING ? ScriptVal(std::string(lua_tostring(L, -2)))
                                                             : ScriptVal();
            if (!key.IsNil()) t.Set(key, ValueAt(L, lua_gettop(L), depth + 1));
            lua_pop(L, 1);
        }
        return t;
    }
    default: return {};
    }
}

/// The attribute type a new value gets when the script names none.
std::string InferredType(const Orvane::ScriptVal &v) {
    if (!v.IsTable() || v.Size() == 0 || v.ArrayLength() != v.Size()) return {};
    bool texts = true;
    for (size_t i = 1; i <= v.Size(); ++i) texts = texts && v.At(i)->IsText();
    if (texts) return "stringvector";
    switch (v.Size()) {
    case 2: return "v2f";
    case 3: return "v3f";
    default: return {};
    }
}

} // namespace

EXRIO *ffi_EXRIO__new() {
    static std::atomic<bool> initialized{false};
    if (!initialized.exchange(true)) {
        Orvane::exrfmt::EnsureThreads();
        Imf::staticInitialize();
        const int threads = Orvane::WorkerCount();
        Imf::setGlobalThreadCount(threads > 1 ? threads : 0);
    }
    return new (std::nothrow) EXRIO();
}

EXRIO *ffi_EXRIO_cast(void *obj) { return obj ? dynamic_cast<EXRIO *>(static_cast<ScriptObject *>(obj)) : nullptr; }
ScriptObject *ffi_EXRIO_uncast(EXRIO *self) { return self; }
bool EXRIO_Get_IsOpen(EXRIO *self) { return self && self->isOpen; }
bool EXRIO_Get_IsWriting(EXRIO *self) { return self && self->isWriting; }
int EXRIO_Get_NumParts(EXRIO *self) { return self ? self->numParts : 0; }
const char *ffi_EXRIOGetLastError(EXRIO *self) { return self ? self->lastError.c_str() : ""; }
void ffi_EXRIOClearLastError(EXRIO *self) {
    if (self) self->lastError.clear();
}
void ffi_EXRIOReadOpen(EXRIO *self, const char *filename, int frame) {
    if (self) self->Open(filename, frame, false);
}
void ffi_EXRIOWriteOpen(EXRIO *self, const char *filename, int frame) {
    if (self) self->Open(filename, frame, true);
}
int ffi_EXRIOFindPart(EXRIO *self, const char *name) { return self ? self->FindPart(name) : 0; }
int ffi_EXRIO_PartR(EXRIO *self, int partnum) { return self ? self->PartR(partnum) : 0; }
int ffi_EXRIO_PartW(EXRIO *self, const char *name, ImgRectI *dispw, ImgRectI *dataw, double aspect) {
    return self ? self->PartW(name, dispw, dataw, aspect) : 0;
}
void ffi_EXRIOChannelImage(EXRIO *self, const char *name, int type, Image *img, int ichan, double def, double cv) {
    if (self) self->AddChannel(name, type, img, 0, ichan, def, cv);
}
void ffi_EXRIOChannelIndex(EXRIO *self, const char *name, int type, int index, int ichan, double def, double cv) {
    if (self) self->AddChannel(name, type, nullptr, index, ichan, def, cv);
}
bool ffi_EXRIOWriteHeader(EXRIO *self) { return self && self->WriteHeader(); }
bool ffi_EXRIOReadHeader(EXRIO *self) { return self && self->ReadHeader(); }
bool ffi_EXRIOClose(EXRIO *self) {
    if (self) self->Reset();
    return true;
}
bool ffi_EXRIO_ReadPart(EXRIO *self, int partnum, Image **imgs) { return self && self->ReadPart(partnum, imgs); }
bool ffi_EXRIO_WritePart(EXRIO *self, int partnum, Image **imgs) { return self && self->WritePart(partnum, imgs); }

static ImgRectI *WindowOf(EXRIO *self, int partnum, bool data) {
    const Imf::Header *h = self ? self->Header(partnum) : nullptr;
    if (!h) {
        if (self) self->lastError = "no part " + std::to_string(partnum);
        return nullptr;
    }
    const Imath::Box2i &b = data ? h->dataWindow() : h->displayWindow();
    return new (std::nothrow) ImgRectI(EXRIO::ImageRect(b.min.x, b.min.y, b.max.x, b.max.y, Orvane::DisplayHeight(*h)));
}
ImgRectI *ffi_EXRIODataWindow(EXRIO *self, int partnum) { return WindowOf(self, partnum, true); }
ImgRectI *ffi_EXRIODisplayWindow(EXRIO *self, int partnum) { return WindowOf(self, partnum, false); }

int olcf_func_EXRIOGetPartNames(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    if (!self) return PushNil(L);
    lua_createtable(L, static_cast<int>(self->headers.size()), 0);
    for (size_t i = 0; i < self->headers.size(); ++i) {
        lua_pushstring(L, self->headers[i].hasName() ? self->headers[i].name().c_str() : "");
        lua_rawseti(L, -2, static_cast<int>(i) + 1);
    }
    return 1;
}

int olcf_func_EXRIOGetChannels(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    if (!h) return PushNil(L);
    lua_newtable(L);
    int i = 0;
    for (auto c = h->channels().begin(); c != h->channels().end(); ++c) {
        lua_createtable(L, 0, 2);
        lua_pushstring(L, c.name());
        lua_setfield(L, -2, "Name");
        lua_pushinteger(L, static_cast<int>(c.channel().type));
        lua_setfield(L, -2, "Type");
        lua_rawseti(L, -2, ++i);
    }
    return 1;
}

int olcf_func_EXRIOGetAttributeNames(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    if (!h) return PushNil(L);
    lua_newtable(L);
    int i = 0;
    for (auto a = h->begin(); a != h->end(); ++a) {
        lua_pushstring(L, a.name());
        lua_rawseti(L, -2, ++i);
    }
    return 1;
}

int olcf_func_EXRIOGetAttribute(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    const char *name = lua_tostring(L, 2);
    if (!h || !name) return PushNil(L);
    const Imf::Attribute *a = h->findTypedAttribute<Imf::Attribute>(name);
    if (!a) {
        self->lastError = std::string("no attribute ") + name;
        return PushNil(L);
    }
    if (const auto *c = dynamic_cast<const Imf::CompressionAttribute *>(a)) {
        lua_pushinteger(L, static_cast<int>(c->value()));
    } else {
        std::string hint;
        const Orvane::ScriptVal v = Orvane::exrfmt::AttributeValue(*a, hint);
        if (v.IsNil()) {
            self->lastError = std::string("attribute ") + name + " of type " + a->typeName() + " has no script form";
            return PushNil(L);
        }
        PushValue(L, v);
    }
    lua_pushstring(L, a->typeName());
    return 2;
}

int olcf_func_EXRIOSetAttribute(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    const char *name = lua_tostring(L, 2);
    if (!h || !name) {
        lua_pushboolean(L, 0);
        return 1;
    }
    try {
        const Imf::Attribute *old = h->findTypedAttribute<Imf::Attribute>(name);
        std::string type = lua_isstring(L, 4) ? lua_tostring(L, 4) : old ? old->typeName() : "";
        if (type == "compression" || (type.empty() && std::strcmp(name, "compression") == 0)) {
            const int c = static_cast<int>(lua_tointeger(L, 3));
            if (!lua_isnumber(L, 3) || c < 0 || c >= Imf::NUM_COMPRESSION_METHODS)
                throw std::invalid_argument("compression: no method " + std::string(lua_tostring(L, 3) ?: "nil"));
            h->compression() = static_cast<Imf::Compression>(c);
            const int part = static_cast<int>(lua_tointeger(L, 1));
            if (part <= static_cast<int>(self->parts.size())) self->parts[part - 1].compression = c;
        } else {
            Orvane::ScriptVal v = ValueAt(L, 3);
            if (type.empty()) type = InferredType(v);
            if (v.IsTable()) v.SetClassName(type);
            std::unique_ptr<Imf::Attribute> a = Orvane::exrfmt::MakeAttribute(name, v, type);
            if (!a || (!type.empty() && type != a->typeName()))
                throw std::invalid_argument(std::string(name) + ": the value does not make an attribute" +
                                            (type.empty() ? std::string() : " of type " + type));
            if (old && std::strcmp(old->typeName(), a->typeName()) != 0) h->erase(name);
            h->insert(name, *a);
        }
    } catch (const std::exception &e) {
        self->lastError = e.what();
        lua_pushboolean(L, 0);
        return 1;
    }
    lua_pushboolean(L, 1);
    return 1;
}

int olcf_func_EXRIORemoveAttribute(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    const char *name = lua_tostring(L, 2);
    const bool found = h && name && h->find(name) != h->end();
    if (found) h->erase(name);
    lua_pushboolean(L, found);
    return 1;
}

int olcf_func_EXRIOPixelAspectRatio(lua_State *L) {
    EXRIO *self = TakeSelf(L);
    Imf::Header *h = PartHeader(L, self, 1);
    if (!h) return PushNil(L);
    lua_pushnumber(L, h->pixelAspectRatio());
    return 1;
}

namespace {

using Fn = Orvane::ScriptClassFunction;

Fn Bind(const char *scriptName, const char *declaration, const char *symbol, void *address, Fn::Kind kind = Fn::Method,
        bool text = false, void (*release)(void *) = nullptr) {
    return Fn{scriptName, declaration, symbol, address, kind, text, release};
}

// The class scripts see. The snippets are the methods that pick between reading and writing and
// turn a table of images into the array the C functions take.
struct RegisterEXRIO {
    RegisterEXRIO() {
        Orvane::ScriptClass c;
        c.name = "EXRIO";
        c.declarations = "typedef struct EXRIO EXRIO;";
#define EXRIO_FN(script, decl, fn, ...) Bind(script, decl, #fn, reinterpret_cast<void *>(&fn), ##__VA_ARGS__)
        c.functions = {
            EXRIO_FN("__new", "EXRIO * ffi_EXRIO__new()", ffi_EXRIO__new, Fn::Static, false, FreeObject),
            EXRIO_FN("cast", "EXRIO * ffi_EXRIO_cast(void * obj)", ffi_EXRIO_cast, Fn::Static),
            EXRIO_FN("uncast", "ScriptObject * ffi_EXRIO_uncast(EXRIO * self)", ffi_EXRIO_uncast, Fn::Static),
            EXRIO_FN("IsOpen", "bool EXRIO_Get_IsOpen(EXRIO *self)", EXRIO_Get_IsOpen, Fn::Getter),
            EXRIO_FN("IsWriting", "bool EXRIO_Get_IsWriting(EXRIO *self)", EXRIO_Get_IsWriting, Fn::Getter),
            EXRIO_FN("NumParts", "int EXRIO_Get_NumParts(EXRIO *self)", EXRIO_Get_NumParts, Fn::Getter),
            EXRIO_FN("GetLastError", "const char * ffi_EXRIOGetLastError(EXRIO * self)", ffi_EXRIOGetLastError,
                     Fn::Method, true),
            EXRIO_FN("ClearLastError", "void ffi_EXRIOClearLastError(EXRIO * self)", ffi_EXRIOClearLastError),
            EXRIO_FN("ReadOpen", "void ffi_EXRIOReadOpen(EXRIO * self, const char * filename, int frame)",
                     ffi_EXRIOReadOpen),
            EXRIO_FN("WriteOpen", "void ffi_EXRIOWriteOpen(EXRIO * self, const char * filename, int frame)",
                     ffi_EXRIOWriteOpen),
            EXRIO_FN("FindPart", "int ffi_EXRIOFindPart(EXRIO * self, const char * name)", ffi_EXRIOFindPart),
            EXRIO_FN("_PartR", "int ffi_EXRIO_PartR(EXRIO * self, int partnum)", ffi_EXRIO_PartR),
            EXRIO_FN("_PartW",
                     "int ffi_EXRIO_PartW(EXRIO * self, const char * name, ImgRectI * dispw, ImgRectI * dataw, "
                     "float64 aspect)",
                     ffi_EXRIO_PartW),
            EXRIO_FN("ChannelImage",
                     "void ffi_EXRIOChannelImage(EXRIO * self, const char * name, int type, Image * img, int ichan, "
                     "float64 def, float64 cv)",
                     ffi_EXRIOChannelImage),
            EXRIO_FN("ChannelIndex",
                     "void ffi_EXRIOChannelIndex(EXRIO * self, const char * name, int type, int index, int ichan, "
                     "float64 def, float64 cv)",
                     ffi_EXRIOChannelIndex),
            EXRIO_FN("WriteHeader", "bool ffi_EXRIOWriteHeader(EXRIO * self)", ffi_EXRIOWriteHeader),
            EXRIO_FN("ReadHeader", "bool ffi_EXRIOReadHeader(EXRIO * self)", ffi_EXRIOReadHeader),
            EXRIO_FN("Close", "bool ffi_EXRIOClose(EXRIO * self)", ffi_EXRIOClose),
            EXRIO_FN("_ReadPart", "bool ffi_EXRIO_ReadPart(EXRIO * self, int partnum, Image ** imgs)",
                     ffi_EXRIO_ReadPart),
            EXRIO_FN("_WritePart", "bool ffi_EXRIO_WritePart(EXRIO * self, int partnum, Image ** imgs)",
                     ffi_EXRIO_WritePart),
            EXRIO_FN("DataWindow", "ImgRectI * ffi_EXRIODataWindow(EXRIO * self, int partnum)", ffi_EXRIODataWindow,
                     Fn::Method, false, FreeRect),
            EXRIO_FN("DisplayWindow", "ImgRectI * ffi_EXRIODisplayWindow(EXRIO * self, int partnum)",
                     ffi_EXRIODisplayWindow, Fn::Method, false, FreeRect),
        };
#undef EXRIO_FN
        c.snippets = {
            {"Part(self, a1, a2, a3, a4)",
             "local ret\nif self.IsWriting then\n\tret = self:_PartW(a1,a2,a3,a4)\nelse\n\tret = "
             "self:_PartR(a1)\nend\nreturn ret\n"},
            {"Channel(self, cname, ctype, i, ichan, def, cv)",
             "local ret = false\nif type(i) == 'number' then\n\tret = self:ChannelIndex(cname, ctype, i, ichan, def "
             "or 0, cv or 0)\nelse\n\tret = self:ChannelImage(cname, ctype, i, ichan, def or 0, cv or 0)\nend\nreturn "
             "ret\n"},
            {"WritePart(self, part, imgs)", "local imgptr\nif type(imgs) == 'table' then\n\timgptr = ffi.new('Image "
                                            "*[?]', #imgs+1, imgs)\nend\nreturn "
                                            "self:_WritePart(part, imgptr)\n"},
            {"ReadPart(self, part, imgs)", "local imgptr\nif type(imgs) == 'table' then\n\timgptr = ffi.new('Image "
                                           "*[?]', #imgs+1, imgs)\nend\nreturn "
                                           "self:_ReadPart(part, imgptr)\n"},
        };
        c.cFunctions = {
            {"GetPartNames", olcf_func_EXRIOGetPartNames},
            {"GetChannels", olcf_func_EXRIOGetChannels},
            {"GetAttributeNames", olcf_func_EXRIOGetAttributeNames},
            {"GetAttribute", olcf_func_EXRIOGetAttribute},
            {"SetAttribute", olcf_func_EXRIOSetAttribute},
            {"RemoveAttribute", olcf_func_EXRIORemoveAttribute},
            {"PixelAspectRatio", olcf_func_EXRIOPixelAspectRatio},
        };
        c.numbers = {{"NO_COMPRESSION", Imf::NO_COMPRESSION},
                     {"RLE_COMPRESSION", Imf::RLE_COMPRESSION},
                     {"ZIPS_COMPRESSION", Imf::ZIPS_COMPRESSION},
                     {"ZIP_COMPRESSION", Imf::ZIP_COMPRESSION},
                     {"PIZ_COMPRESSION", Imf::PIZ_COMPRESSION},
                     {"PXR24_COMPRESSION", Imf::PXR24_COMPRESSION},
                     {"B44_COMPRESSION", Imf::B44_COMPRESSION},
                     {"B44A_COMPRESSION", Imf::B44A_COMPRESSION},
                     {"DWAA_COMPRESSION", Imf::DWAA_COMPRESSION},
                     {"DWAB_COMPRESSION", Imf::DWAB_COMPRESSION},
                     {"UINT", Imf::UINT},
                     {"HALF", Imf::HALF},
                     {"FLOAT", Imf::FLOAT},
                     {"ANY_TYPE", EXRIO::AnyType}};
        c.texts = {{"SCANLINEIMAGE", Imf::SCANLINEIMAGE},
                   {"TILEDIMAGE", Imf::TILEDIMAGE},
                   {"DEEPSCANLINE", Imf::DEEPSCANLINE}};
        Orvane::RegisterScriptClass(std::move(c));
    }
} s_registerEXRIO;

} // namespace
