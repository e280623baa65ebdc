#include "operators/media/formats/OpenEXRFormat.h"

#include <Iex.h>
#include <ImfChannelList.h>
#include <ImfChannelListAttribute.h>
#include <ImfCompressionAttribute.h>
#include <ImfDoubleAttribute.h>
#include <ImfFloatVectorAttribute.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputPart.h>
#include <ImfIntAttribute.h>
#include <ImfLineOrderAttribute.h>
#include <ImfMultiPartInputFile.h>
#include <ImfMultiView.h>
#include <ImfOpaqueAttribute.h>
#include <ImfOutputFile.h>
#include <ImfPartType.h>
#include <ImfPreviewImageAttribute.h>
#include <ImfRgbaFile.h>
#include <ImfStandardAttributes.h>
#include <ImfThreading.h>
#include <ImfTileDescriptionAttribute.h>
#include <ImfVersion.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <set>
#include <thread>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Link.h"
#include "host/flow/Operator.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "host/image/Half.h"
#include "host/image/NewImage.h"
#include "host/image/PixelConvert.h"
#include "host/media/IOClass.h"
#include "operators/frame/Registration.h"
#include "operators/media/formats/ExrAttributes.h"
#include "operators/media/formats/ExrHeaderScan.h"
#include "operators/media/formats/ExrStreams.h"

namespace Orvane {
namespace exrfmt {

const OvID CLSID_OpenEXRFormat("OpenEXRFormat");

ClassRegistration<OpenEXRFormat, ImageFormat> s_Reg(CLSID_OpenEXRFormat, &CLSID_ImageFormat,
                                                    {{RegTypeFlags, RegFamilyImageFormat},
                                                     {RegStereoAware, 1},
                                                     {RegFormatCanLoad, 1},
                                                     {RegFormatCanSave, 1},
                                                     {RegFormatHasOptions, 1},
                                                     {RegFormatHasSaveOptions, 1},
                                                     {RegFormatHeaderOnly, 1},
                                                     {RegFormatMultiPart, 1},
                                                     {RegFormatKeepsAspect, 1},
                                                     {RegFormatHasDomain, 1},
                                                     {RegFormatName, "OpenEXR Files"},
                                                     {RegFormatExtension, ".exr"},
                                                     {RegFormatExtension, ".sxr"}});

struct SlotInfo {
    const char *id, *label, *file;
};
constexpr SlotInfo kSlots[OpenEXRFormat::SlotCount] = {
    {"R", "Red", "R"},
    {"G", "Green", "G"},
    {"B", "Blue", "B"},
    {"A", "Alpha", "A"},
    {"Z", "Z", "Z"},
    {"Coverage", "Coverage", "pixelCover"},
    {"ObjID", "Object ID", "objectID"},
    {"MatID", "Material ID", "materialID"},
    {"U", "U", "U"},
    {"V", "V", "V"},
    {"XNorm", "X Normal", "XNorm"},
    {"YNorm", "Y Normal", "YNorm"},
    {"ZNorm", "Z Normal", "ZNorm"},
    {"XVel", "X Velocity", "velX"},
    {"YVel", "Y Velocity", "velY"},
    {"XRevVel", "X Reverse Vel", "rvelX"},
    {"YRevVel", "Y Reverse Vel", "rvelY"},
    {"XPos", "X Position", "posX"},
    {"YPos", "Y Position", "posY"},
    {"ZPos", "Z Position", "posZ"},
    {"XDisp", "X Disparity", "dispX"},
    {"YDisp", "Y Disparity", "dispY"},
};

constexpr const char *kCompressionNames[] = {"None",  "RLE", "Zip (1 line)", "Zip (16 lines)", "Piz (wavelet)",
                                             "Pxr24", "B44", "B44A",         "DWA (32 line)",  "DWA (256 line)"};
const char *const kDefaultChoice = "Default";
/// Farthest a window coordinate may lie from the origin, and the most pixels
/// a data window may hold: damaged headers must not make us ask for terabytes.
constexpr int64_t kCoordLimit = int64_t(8) * MaxImageSide;
constexpr int64_t kMaxWindowPixels = int64_t(1) << 28;
/// Tile sides any data window may have (larger ones must fit the window).
constexpr int64_t kSmallTile = 256;

AuxChannelKind KindOfSlot(int slot) { return static_cast<AuxChannelKind>(slot - OpenEXRFormat::FirstAuxSlot); }

void EnsureThreads() {
    static std::once_flag once;
    std::call_once(once, [] {
        const unsigned n = std::thread::hardware_concurrency();
        Imf::setGlobalThreadCount(n > 1 ? static_cast<int>(n) : 0);
        // The library then refuses larger windows before it sizes any table by them.
        Imf::Header::setMaxImageSize(MaxImageSide, MaxImageSide);
    });
}

int LinesPerBlock(Imf::Compression c) {
    switch (c) {
    case Imf::ZIP_COMPRESSION:
    case Imf::PXR24_COMPRESSION: return 16;
    case Imf::PIZ_COMPRESSION:
    case Imf::B44_COMPRESSION:
    case Imf::B44A_COMPRESSION:
    case Imf::DWAA_COMPRESSION: return 32;
    case Imf::DWAB_COMPRESSION: return 256;
    default: return 1;
    }
}

/// True when colour is written as HALF: Depth float16, or Auto for float16
/// and 8-bit images (half keeps every 8-bit level, not every 16-bit one).
bool HalfColour(int depthMode, int imageDepth) {
    if (depthMode != 0) return depthMode == 1;
    return imageDepth == DepthRGBAFlt16 || imageDepth == DepthAFlt16 || imageDepth == DepthRGBAInt8 ||
           imageDepth == DepthAInt8;
}

/// Lines handed to the library at once: enough blocks to keep its threads
/// busy, few enough to check the abort word often.
int BandLines(int linesPerBlock) {
    const int threads = std::max(1, Imf::globalThreadCount());
    return std::clamp(linesPerBlock * std::max(4, 2 * threads), 64, 2048) / linesPerBlock * linesPerBlock;
}

char *Address(const void *p, int64_t offset) {
    return reinterpret_cast<char *>(reinterpret_cast<intptr_t>(p) + static_cast<intptr_t>(offset));
}

// ---- options ----

/// The option input `id` of the tool's current group (see ImageFormat::OptionValue).
Input *FindIn(Operator *tool, Request *req, const char *id) { return tool && req ? tool->FindGroupInput(id) : nullptr; }

std::string InputChoice(Operator *tool, Request *req, const std::string &id) {
    Input *in = FindIn(tool, req, id.c_str());
    if (!in) return {};
    const OvID v = req->GetInputID(in, OvID(kDefaultChoice));
    if (v.IsNull() || std::strcmp(v.Text(), kDefaultChoice) == 0) return {};
    return v.Text();
}

std::string InputText(Operator *tool, Request *req, const std::string &id, const char *def) {
    Input *in = FindIn(tool, req, id.c_str());
    if (!in) return def;
    const Parameter *p = req->GetInputData(in);
    if (!p) p = in->Default().Get();
    const auto *t = dynamic_cast<const Text *>(p);
    return t ? t->value : def;
}

void AddHeading(Operator *tool, const char *id) {
    tool->AddInputTagList("Channels", id,
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_Label},
                           {InputExternal, 0},
                           {InputPassive, 1},
                           {LinkNotSaved, 1}});
}

TagList Slider(double lo, double hi, double def) {
    return {{LinkDataType, CLSID_DataType_Number},
            {InputControl, CLSID_InputControl_Slider},
            {InputSliderLow, lo},
            {InputSliderHigh, hi},
            {InputDefault, def},
            {InputExternal, 0}};
}

/// A choice list whose value is the ID of an entry: "<Default>" first.
TagList Chooser(const std::vector<std::string> &entries) {
    TagList t{{LinkDataType, CLSID_DataType_OvID},
              {InputControl, CLSID_InputControl_ComboID},
              {InputDefaultId, OvID(kDefaultChoice)},
              {InputExternal, 0},
              {ListAddItem, "<Default>"},
              {ListItemId, OvID(kDefaultChoice)}};
    for (const std::string &e : entries) {
        t.Add({ListAddItem, e.c_str()});
        t.Add({ListItemId, OvID(e)});
    }
    t.Persist();
    return t;
}

std::string PartID(const OpenEXRPart &p, size_t index) { return p.name.empty() ? "#" + std::to_string(index) : p.name; }

// ---- headers ----

/// A file box as a rectangle (max exclusive); false when it lies absurdly far out.
bool ToRect(const Imath::Box2i &b, ImgRectI &r) {
    for (int64_t v : {int64_t(b.min.x), int64_t(b.min.y), int64_t(b.max.x), int64_t(b.max.y)})
        if (v < -kCoordLimit || v > kCoordLimit) return false;
    r = ImgRectI(b.min.x, b.min.y, b.max.x + 1, b.max.y + 1);
    return true;
}

/// The data window in image coordinates (rows bottom up, display origin at 0).
ImgRectI ImageWindow(const OpenEXRPart &p, int height) {
    const ImgRectI &d = p.dataWindow, &s = p.displayWindow;
    return ImgRectI(d.x0 - s.x0, height - (d.y1 - s.y0), d.x1 - s.x0, height - (d.y0 - s.y0));
}

bool IsColourName(const std::string &n) {
    static const std::set<std::string> names = {"R", "G", "B", "A", "Y", "r", "g", "b", "a"};
    const size_t dot = n.rfind('.');
    return names.count(dot == std::string::npos ? n : n.substr(dot + 1)) > 0;
}

// ---- attributes <-> Metadata ----

struct NameMap {
    const char *file, *metadata;
};
constexpr NameMap kNames[] = {{"timeCode", "TimeCode"}, {"envmap", "EnvMap"}, {"focus", "Focus"}};

std::string MetadataName(const std::string &file) {
    for (const NameMap &m : kNames)
        if (file == m.file) return m.metadata;
    return file;
}
std::string FileName(const std::string &key) {
    for (const NameMap &m : kNames)
        if (key == m.metadata) return m.file;
    return key;
}

bool IsStructural(const std::string &name) {
    static const std::set<std::string> names = {"channels",
                                                "compression",
                                                "dataWindow",
                                                "displayWindow",
                                                "lineOrder",
                                                "pixelAspectRatio",
                                                "screenWindowCenter",
                                                "screenWindowWidth",
                                                "name",
                                                "type",
                                                "view",
                                                "version",
                                                "chunkCount",
                                                "tiles",
                                                "multiView",
                                                "dwaCompressionLevel",
                                                "OpenEXRTypes",
                                                "Layers"};
    return names.count(name) > 0;
}

ScriptVal Tuple(const char *type, std::initializer_list<double> values) {
    ScriptVal t = ScriptVal::Table(type);
    for (double v : values) t.Append(ScriptVal(v));
    return t;
}

template <class M> ScriptVal MatrixTuple(const char *type, const M &m, int n) {
    ScriptVal t = ScriptVal::Table(type);
    for (int i = 0; i < n; ++i)
        for (int j = 0; j < n; ++j) t.Append(ScriptVal(static_cast<double>(m[i][j])));
    return t;
}

std::string TimeCodeText(const Imf::TimeCode &tc) {
    char buf[32];
    std::snprintf(buf, sizeof buf, "%02d:%02d:%02d:%02d", tc.hours(), tc.minutes(), tc.seconds(), tc.frame());
    return buf;
}

/// An attribute's value as a script value: text and numbers, compound types
/// as tables whose class name is the type ("v2f { 1, 2 }"), time codes as
/// "hh:mm:ss:ff"; nil for types with no script form (channel lists,
/// previews, opaque data). `hint` gets the type of numbers and time codes.
ScriptVal AttributeValue(const Imf::Attribute &a, std::string &hint) {
    const std::string type = a.typeName();
    hint.clear();
    auto as = [&a]<class T>(T *) -> const auto & { return static_cast<const T &>(a).value(); };
    if (type == "string") return ScriptVal(as((Imf::StringAttribute *)nullptr));
    if (type == "int" || type == "float" || type == "double" || type == "envmap" || type == "timecode") hint = type;
    if (type == "int") return ScriptVal(as((Imf::IntAttribute *)nullptr));
    if (type == "float") return ScriptVal(static_cast<double>(as((Imf::FloatAttribute *)nullptr)));
    if (type == "double") return ScriptVal(as((Imf::DoubleAttribute *)nullptr));
    if (type == "envmap") return ScriptVal(static_cast<int>(as((Imf::EnvmapAttribute *)nullptr)));
    if (type == "timecode") return ScriptVal(TimeCodeText(as((Imf::TimeCodeAttribute *)nullptr)));
    if (type == "v2i" || type == "v2f" || type == "v2d") {
        Imath::V2d p = type == "v2i"   ? Imath::V2d(as((Imf::V2iAttribute *)nullptr))
                       : type == "v2f" ? Imath::V2d(as((Imf::V2fAttribute *)nullptr))
                                       : as((Imf::V2dAttribute *)nullptr);
        return Tuple(type.c_str(), {p.x, p.y});
    }
    if (type == "v3i" || type == "v3f" || type == "v3d") {
        Imath::V3d p = type == "v3i"   ? Imath::V3d(as((Imf::V3iAttribute *)nullptr))
                       : type == "v3f" ? Imath::V3d(as((Imf::V3fAttribute *)nullptr))
                                       : as((Imf::V3dAttribute *)nullptr);
        return Tuple(type.c_str(), {p.x, p.y, p.z});
    }
    if (type == "box2i") {
        const Imath::Box2i &b = as((Imf::Box2iAttribute *)nullptr);
        return Tuple("box2i", {double(b.min.x), double(b.min.y), double(b.max.x), double(b.max.y)});
    }
    if (type == "box2f") {
        const Imath::Box2f &b = as((Imf::Box2fAttribute *)nullptr);
        return Tuple("box2f", {b.min.x, b.min.y, b.max.x, b.max.y});
    }
    if (type == "m33f") return MatrixTuple("m33f", as((Imf::M33fAttribute *)nullptr), 3);
    if (type == "m33d") return MatrixTuple("m33d", as((Imf::M33dAttribute *)nullptr), 3);
    if (type == "m44f") return MatrixTuple("m44f", as((Imf::M44fAttribute *)nullptr), 4);
    if (type == "m44d") return MatrixTuple("m44d", as((Imf::M44dAttribute *)nullptr), 4);
    if (type == "stringvector") {
        ScriptVal v = ScriptVal::Table("stringvector");
        for (const std::string &s : as((Imf::StringVectorAttribute *)nullptr)) v.Append(ScriptVal(s));
        return v;
    }
    if (type == "floatvector") {
        ScriptVal v = ScriptVal::Table("floatvector");
        for (float f : as((Imf::FloatVectorAttribute *)nullptr)) v.Append(ScriptVal(static_cast<double>(f)));
        return v;
    }
    if (type == "chromaticities") {
        const Imf::Chromaticities &c = as((Imf::ChromaticitiesAttribute *)nullptr);
        return Tuple("chromaticities",
                     {c.red.x, c.red.y, c.green.x, c.green.y, c.blue.x, c.blue.y, c.white.x, c.white.y});
    }
    if (type == "rational") {
        const Imf::Rational &r = as((Imf::RationalAttribute *)nullptr);
        return Tuple("rational", {double(r.n), double(r.d)});
    }
    if (type == "keycode") {
        const Imf::KeyCode &k = as((Imf::KeyCodeAttribute *)nullptr);
        return Tuple("keycode", {double(k.filmMfcCode()), double(k.filmType()), double(k.prefix()), double(k.count()),
                                 double(k.perfOffset()), double(k.perfsPerFrame()), double(k.perfsPerCount())});
    }
    return ScriptVal();
}

/// Every attribute of a known type, under its Metadata name; the types of
/// numbers and time codes in Metadata "OpenEXRTypes".
void ReadAttributes(const Imf::Header &h, ScriptVal &md) {
    ScriptVal types = ScriptVal::Table();
    std::string hint;
    for (auto it = h.begin(); it != h.end(); ++it) {
        ScriptVal v = AttributeValue(it.attribute(), hint);
        if (v.IsNil()) continue;
        const std::string key = MetadataName(it.name());
        md.Set(key, v);
        if (!hint.empty()) types.Set(key, ScriptVal(hint));
    }
    if (types.Size()) md.Set("OpenEXRTypes", types);
}

/// The numbers of an array table; false unless it holds exactly `n` of them (any count for n < 0).
bool Numbers(const ScriptVal &t, int n, std::vector<double> &out) {
    out.clear();
    const size_t len = t.ArrayLength();
    if (len != t.Size() || (n >= 0 && len != static_cast<size_t>(n))) return false;
    for (size_t i = 1; i <= len; ++i) {
        const ScriptVal *v = t.At(i);
        if (!v->IsNumber()) return false;
        out.push_back(v->AsNumber());
    }
    return true;
}

template <class M> M ToMatrix(const std::vector<double> &v, int n) {
    M m;
    for (int i = 0; i < n; ++i)
        for (int j = 0; j < n; ++j) m[i][j] = static_cast<typename M::BaseType>(v[i * n + j]);
    return m;
}

/// The attribute a Metadata value maps to; null when it has no file form.
std::unique_ptr<Imf::Attribute> MakeAttribute(const std::string &name, const ScriptVal &v, const std::string &hint) {
    using std::make_unique;
    if (v.IsText()) {
        if (hint == "timecode" || name == "timeCode") {
            int hh = 0, mm = 0, ss = 0, ff = 0;
            if (std::sscanf(v.AsText().c_str(), "%d:%d:%d:%d", &hh, &mm, &ss, &ff) != 4) return nullptr;
            return make_unique<Imf::TimeCodeAttribute>(Imf::TimeCode(hh, mm, ss, ff));
        }
        return make_unique<Imf::StringAttribute>(v.AsText());
    }
    if (v.IsBool()) return make_unique<Imf::IntAttribute>(v.AsBool() ? 1 : 0);
    if (v.IsNumber()) {
        const double d = v.AsNumber();
        if (hint == "envmap" || name == "envmap") {
            if (d != 0.0 && d != 1.0) return nullptr;
            return make_unique<Imf::EnvmapAttribute>(static_cast<Imf::Envmap>(static_cast<int>(d)));
        }
        if (hint == "int" && std::fabs(d) < 2147483648.0) return make_unique<Imf::IntAttribute>(static_cast<int>(d));
        if (hint == "double") return make_unique<Imf::DoubleAttribute>(d);
        return make_unique<Imf::FloatAttribute>(static_cast<float>(d));
    }
    if (!v.IsTable()) return nullptr;
    const std::string &type = v.ClassName();
    std::vector<double> n;
    auto texts = [&v](std::vector<std::string> &out) {
        if (v.ArrayLength() != v.Size() || v.Size() == 0) return false;
        for (size_t i = 1; i <= v.Size(); ++i) {
            if (!v.At(i)->IsText()) return false;
            out.push_back(v.At(i)->AsText());
        }
        return true;
    };
    if (type == "stringvector" || type.empty()) {
        std::vector<std::string> s;
        if (!texts(s)) return nullptr;
        return make_unique<Imf::StringVectorAttribute>(s);
    }
    if (type == "floatvector" && Numbers(v, -1, n))
        return make_unique<Imf::FloatVectorAttribute>(std::vector<float>(n.begin(), n.end()));
    auto i = [&n](int k) { return static_cast<int>(n[k]); };
    auto f = [&n](int k) { return static_cast<float>(n[k]); };
    if (type == "v2i" && Numbers(v, 2, n)) return make_unique<Imf::V2iAttribute>(Imath::V2i(i(0), i(1)));
    if (type == "v2f" && Numbers(v, 2, n)) return make_unique<Imf::V2fAttribute>(Imath::V2f(f(0), f(1)));
    if (type == "v2d" && Numbers(v, 2, n)) return make_unique<Imf::V2dAttribute>(Imath::V2d(n[0], n[1]));
    if (type == "v3i" && Numbers(v, 3, n)) return make_unique<Imf::V3iAttribute>(Imath::V3i(i(0), i(1), i(2)));
    if (type == "v3f" && Numbers(v, 3, n)) return make_unique<Imf::V3fAttribute>(Imath::V3f(f(0), f(1), f(2)));
    if (type == "v3d" && Numbers(v, 3, n)) return make_unique<Imf::V3dAttribute>(Imath::V3d(n[0], n[1], n[2]));
    if (type == "box2i" && Numbers(v, 4, n))
        return make_unique<Imf::Box2iAttribute>(Imath::Box2i(Imath::V2i(i(0), i(1)), Imath::V2i(i(2), i(3))));
    if (type == "box2f" && Numbers(v, 4, n))
        return make_unique<Imf::Box2fAttribute>(Imath::Box2f(Imath::V2f(f(0), f(1)), Imath::V2f(f(2), f(3))));
    if (type == "m33f" && Numbers(v, 9, n)) return make_unique<Imf::M33fAttribute>(ToMatrix<Imath::M33f>(n, 3));
    if (type == "m33d" && Numbers(v, 9, n)) return make_unique<Imf::M33dAttribute>(ToMatrix<Imath::M33d>(n, 3));
    if (type == "m44f" && Numbers(v, 16, n)) return make_unique<Imf::M44fAttribute>(ToMatrix<Imath::M44f>(n, 4));
    if (type == "m44d" && Numbers(v, 16, n)) return make_unique<Imf::M44dAttribute>(ToMatrix<Imath::M44d>(n, 4));
    if (type == "chromaticities" && Numbers(v, 8, n))
        return make_unique<Imf::ChromaticitiesAttribute>(Imf::Chromaticities(
            Imath::V2f(f(0), f(1)), Imath::V2f(f(2), f(3)), Imath::V2f(f(4), f(5)), Imath::V2f(f(6), f(7))));
    if (type == "rational" && Numbers(v, 2, n))
        return make_unique<Imf::RationalAttribute>(Imf::Rational(i(0), static_cast<unsigned>(n[1])));
    if (type == "keycode" && Numbers(v, 7, n))
        return make_unique<Imf::KeyCodeAttribute>(Imf::KeyCode(i(0), i(1), i(2), i(3), i(4), i(5), i(6)));
    return nullptr;
}

void WriteAttributes(const ScriptVal &md, Imf::Header &h) {
    if (!md.IsTable()) return;
    const ScriptVal *types = md.Find("OpenEXRTypes");
    for (const auto &[k, v] : md.Entries()) {
        if (!k.IsText()) continue;
        const std::string name = FileName(k.AsText());
        if (name.empty() || IsStructural(name) || IsStructural(k.AsText())) continue;
        const ScriptVal *hint = types && types->IsTable() ? types->Find(k.AsText()) : nullptr;
        try {
            if (auto attr = MakeAttribute(name, v, hint && hint->IsText() ? hint->AsText() : std::string()))
                h.insert(name, *attr);
        } catch (const std::exception &) {
            // A value the header refuses (a time code out of range, a type
            // clash with a standard attribute) is left out.
        }
    }
}

// ---- descriptions ----

const char *CompressionWord(Imf::Compression c) {
    static const char *const words[] = {"none", "rle", "zips", "zip", "piz", "pxr24", "b44", "b44a", "dwaa", "dwab"};
    return c >= 0 && c < static_cast<int>(std::size(words)) ? words[c] : "unknown";
}

const char *PixelTypeWord(Imf::PixelType t) { return t == Imf::HALF ? "half" : t == Imf::FLOAT ? "float" : "uint32"; }

const char *LineOrderWord(Imf::LineOrder o) {
    return o == Imf::INCREASING_Y ? "increasing y" : o == Imf::DECREASING_Y ? "decreasing y" : "random y";
}

/// A file box as the file holds it: { min.x, min.y, max.x, max.y }, y down, max inclusive.
ScriptVal FileBox(const Imath::Box2i &b) {
    ScriptVal t = ScriptVal::Table();
    for (int v : {b.min.x, b.min.y, b.max.x, b.max.y}) t.Append(v);
    return t;
}

ScriptVal Tiles(const Imf::TileDescription &t) {
    static const char *const levels[] = {"one level", "mipmap", "ripmap"};
    ScriptVal v = ScriptVal::Table();
    v.Set("xSize", static_cast<double>(t.xSize));
    v.Set("ySize", static_cast<double>(t.ySize));
    v.Set("levelMode", t.mode >= 0 && t.mode < 3 ? levels[t.mode] : "unknown");
    v.Set("roundingMode", t.roundingMode == Imf::ROUND_UP ? "up" : "down");
    return v;
}

/// An attribute's value for a description: AttributeValue's, words and
/// tables for the structural types, the size of data with no script form.
ScriptVal DescribedValue(const Imf::Attribute &a) {
    const std::string type = a.typeName();
    auto as = [&a]<class T>(T *) -> const auto & { return static_cast<const T &>(a).value(); };
    if (type == "compression") return ScriptVal(CompressionWord(as((Imf::CompressionAttribute *)nullptr)));
    if (type == "lineOrder") return ScriptVal(LineOrderWord(as((Imf::LineOrderAttribute *)nullptr)));
    if (type == "tiledesc") return Tiles(as((Imf::TileDescriptionAttribute *)nullptr));
    if (type == "chlist") {
        ScriptVal names = ScriptVal::Table();
        for (auto c = as((Imf::ChannelListAttribute *)nullptr).begin();
             c != as((Imf::ChannelListAttribute *)nullptr).end(); ++c)
            names.Append(ScriptVal(c.name()));
        return names;
    }
    if (type == "preview") {
        const Imf::PreviewImage &p = as((Imf::PreviewImageAttribute *)nullptr);
        ScriptVal v = ScriptVal::Table();
        v.Set("width", static_cast<double>(p.width()));
        v.Set("height", static_cast<double>(p.height()));
        return v;
    }
    std::string hint;
    ScriptVal v = AttributeValue(a, hint);
    if (v.IsNil())
        if (const auto *opaque = dynamic_cast<const Imf::OpaqueAttribute *>(&a)) {
            v = ScriptVal::Table();
            v.Set("bytes", static_cast<double>(opaque->dataSize()));
        }
    return v;
}

/// One part of a file: its identity, windows, storage, channels and every attribute.
ScriptVal DescribePart(const Imf::Header &h, int index) {
    ScriptVal p = ScriptVal::Table();
    p.Set("index", index);
    p.Set("name", h.hasName() ? h.name() : std::string());
    p.Set("view", h.hasView() ? h.view() : std::string());
    p.Set("type", h.hasType() ? h.type() : h.hasTileDescription() ? Imf::TILEDIMAGE : Imf::SCANLINEIMAGE);
    p.Set("dataWindow", FileBox(h.dataWindow()));
    p.Set("displayWindow", FileBox(h.displayWindow()));
    p.Set("compression", CompressionWord(h.compression()));
    p.Set("lineOrder", LineOrderWord(h.lineOrder()));
    if (h.hasTileDescription()) p.Set("tiles", Tiles(h.tileDescription()));
    ScriptVal channels = ScriptVal::Table();
    for (auto c = h.channels().begin(); c != h.channels().end(); ++c) {
        ScriptVal e = ScriptVal::Table();
        e.Set("name", c.name());
        e.Set("type", PixelTypeWord(c.channel().type));
        e.Set("xSampling", c.channel().xSampling);
        e.Set("ySampling", c.channel().ySampling);
        e.Set("pLinear", c.channel().pLinear);
        channels.Append(e);
    }
    p.Set("channels", channels);
    ScriptVal attributes = ScriptVal::Table();
    for (auto it = h.begin(); it != h.end(); ++it) {
        ScriptVal e = ScriptVal::Table();
        e.Set("name", it.name());
        e.Set("type", it.attribute().typeName());
        e.Set("value", DescribedValue(it.attribute()));
        attributes.Append(e);
    }
    p.Set("attributes", attributes);
    return p;
}

// ---- display conversion ----

double Knee(double x, double f) { return f > 0.0 ? std::log1p(x * f) / f : x; }

/// The f with Knee(x, f) == y (x > y > 0), by bisection as the curve falls with f.
double KneeF(double x, double y) {
    if (!(x > y) || y <= 0.0) return 0.0;
    double f0 = 0.0, f1 = 1.0;
    while (Knee(x, f1) > y && f1 < 1e30) f0 = f1, f1 *= 2.0;
    for (int i = 0; i < 40; ++i) {
        const double f = 0.5 * (f0 + f1);
        (Knee(x, f) > y ? f0 : f1) = f;
    }
    return 0.5 * (f0 + f1);
}

} // namespace exrfmt

namespace ef = exrfmt;

struct OpenEXRFormat::Reader {
    int64_t start = 0;
    std::unique_ptr<FileIStream> stream;
    std::unique_ptr<Imf::MultiPartInputFile> file;
    std::string lumaLayer; ///< layer of the Y / RY / BY channels
};

struct OpenEXRFormat::Writer {
    struct Channel {
        int slot;
        std::string name;
        Imf::PixelType type;
    };
    std::unique_ptr<FileOStream> stream;
    std::unique_ptr<Imf::OutputFile> file;
    std::vector<Channel> channels;
    Imf::PixelType colour = Imf::HALF; ///< the type of every colour channel
    ImgRectI window;                   ///< image coordinates of the file's data window
    bool empty = false;
    int band = 64;
};

const char *OpenEXRFormat::SlotID(int slot) { return slot >= 0 && slot < SlotCount ? ef::kSlots[slot].id : ""; }
const char *OpenEXRFormat::SlotLabel(int slot) { return slot >= 0 && slot < SlotCount ? ef::kSlots[slot].label : ""; }
const char *OpenEXRFormat::DefaultChannelName(int slot) {
    return slot >= 0 && slot < SlotCount ? ef::kSlots[slot].file : "";
}

OpenEXRFormat::OpenEXRFormat(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ImageFormat(reg, args, tags) {
    SetupSave(nullptr, nullptr);
}

OpenEXRFormat::~OpenEXRFormat() = default;

bool OpenEXRFormat::CheckFormat(IOClass *stream) {
    if (!stream) return false;
    char magic[4];
    const int64_t at = stream->Tell();
    const bool ok = stream->ReadExact(magic, 4) && Imf::isImfMagic(magic);
    stream->Seek(at, IOClass::SeekAbsolute);
    return ok;
}

void OpenEXRFormat::Close() {
    reader_.reset();
    writer_.reset();
}

// ---- options ----

void OpenEXRFormat::AddLoadInputs(Operator *tool) {
    if (!tool) return;
    AddOptionCheckbox(tool, "Bypass", "Bypass", 0.0);
    TagList defog = ef::Slider(0.0, 0.01, 0.0);
    defog.Add({InputMinAllowed, 0.0});
    tool->AddInputTagList("Defog", "Defog", defog);
    tool->AddInputTagList("Exposure", "Exposure", ef::Slider(-10.0, 10.0, 0.0));
    tool->AddInputTagList("Knee Low", "KneeLow", ef::Slider(-3.0, 3.0, 0.0));
    tool->AddInputTagList("Knee High", "KneeHigh", ef::Slider(3.5, 7.5, 5.0));
    AddOptionCheckbox(tool, "Load All Layers", "LoadLayers", 0.0);
    // The lists hold what the last header read offers; the value is the
    // entry's name, so a choice outlives a list made for another file.
    std::vector<std::string> partNames, channels, layers;
    auto addOnce = [](std::vector<std::string> &list, const std::string &e) {
        if (std::find(list.begin(), list.end(), e) == list.end()) list.push_back(e);
    };
    for (size_t p = 0; p < parts_.size(); ++p) {
        partNames.push_back(ef::PartID(parts_[p], p));
        for (const std::string &c : parts_[p].channels) {
            addOnce(channels, c);
            if (const size_t dot = c.rfind('.'); dot != std::string::npos && dot > 0) addOnce(layers, c.substr(0, dot));
        }
    }
    tool->AddInputTagList("Part", "Part", ef::Chooser(partNames));
    tool->AddInputTagList("View", "View", ef::Chooser(views_));
    tool->AddInputTagList("Layer", "Layer", ef::Chooser(layers));
    ef::AddHeading(tool, "ChannelsHeading");
    for (int s = 0; s < SlotCount; ++s)
        tool->AddInputTagList(SlotLabel(s), (std::string("Channel") + SlotID(s)).c_str(), ef::Chooser(channels));
}

void OpenEXRFormat::SetupLoad(Operator *tool, Request *req) {
    bypass_ = OptionValue(tool, req, "Bypass", 0.0) > 0.5;
    defog_ = std::max(0.0, OptionValue(tool, req, "Defog", 0.0));
    exposure_ = OptionValue(tool, req, "Exposure", 0.0);
    kneeLow_ = OptionValue(tool, req, "KneeLow", 0.0);
    kneeHigh_ = OptionValue(tool, req, "KneeHigh", 5.0);
    loadLayers_ = OptionValue(tool, req, "LoadLayers", 0.0) > 0.5;
    partChoice_ = ef::InputChoice(tool, req, "Part");
    viewChoice_ = ef::InputChoice(tool, req, "View");
    layerChoice_ = ef::InputChoice(tool, req, "Layer");
    for (int s = 0; s < SlotCount; ++s)
        channelChoice_[s] = ef::InputChoice(tool, req, std::string("Channel") + SlotID(s));
}

void OpenEXRFormat::AddSaveInputs(Operator *tool) {
    if (!tool) return;
    tool->AddInputTagList("Depth", "Depth",
                          {{LinkDataType, CLSID_DataType_Number},
                           {InputControl, CLSID_InputControl_MultiButton},
                           {InputDefault, 0.0},
                           {ListAddItem, "Auto"},
                           {ListAddItem, "float16"},
                           {ListAddItem, "float32"},
                           {InputExternal, 0}});
    TagList compression{{LinkDataType, CLSID_DataType_Number},
                        {InputControl, CLSID_InputControl_Combo},
                        {InputDefault, 3.0},
                        {InputExternal, 0}};
    for (const char *name : ef::kCompressionNames) compression.Add({ListAddItem, name});
    tool->AddInputTagList("Compression", "Compression", compression);
    TagList zip = ef::Slider(0.0, 9.0, 4.0);
    zip.Add({InputInteger, 1});
    zip.Add({InputMinAllowed, 0.0});
    zip.Add({InputMaxAllowed, 9.0});
    tool->AddInputTagList("Zip Compression level", "ZipCompressionLevel", zip);
    TagList dwa = ef::Slider(0.0, 300.0, 45.0);
    dwa.Add({InputMinAllowed, 0.0});
    tool->AddInputTagList("DWA Compression level", "DWACompressionLevel", dwa);
    ef::AddHeading(tool, "ChannelsHeading");
    for (int s = 0; s < SlotCount; ++s) {
        AddOptionCheckbox(tool, SlotLabel(s), (std::string("Save") + SlotID(s)).c_str(), 1.0);
        TagList name{{LinkDataType, CLSID_DataType_Text},
                     {InputControl, CLSID_InputControl_TextEdit},
                     {InputDefaultText, DefaultChannelName(s)},
                     {InputExternal, 0}};
        const std::string label = std::string(SlotLabel(s)) + " Name";
        tool->AddInputTagList(label.c_str(), (std::string("Name") + SlotID(s)).c_str(), name);
    }
}

void OpenEXRFormat::SetupSave(Operator *tool, Request *req) {
    auto number = [&](const char *id, double def, double lo, double hi) {
        const double v = OptionValue(tool, req, id, def);
        return std::isfinite(v) ? std::clamp(v, lo, hi) : def;
    };
    depthMode_ = static_cast<int>(std::lround(number("Depth", 0.0, 0.0, 2.0)));
    compression_ = static_cast<int>(std::lround(number("Compression", 3.0, 0.0, 9.0)));
    zipLevel_ = static_cast<int>(std::lround(number("ZipCompressionLevel", 4.0, 0.0, 9.0)));
    dwaLevel_ = number("DWACompressionLevel", 45.0, 0.0, 300.0);
    for (int s = 0; s < SlotCount; ++s) {
        saveSlot_[s] = OptionValue(tool, req, (std::string("Save") + SlotID(s)).c_str(), 1.0) > 0.5;
        saveName_[s] = ef::InputText(tool, req, std::string("Name") + SlotID(s), DefaultChannelName(s));
        if (saveName_[s].empty()) saveName_[s] = DefaultChannelName(s);
    }
}

// ---- reading ----

bool OpenEXRFormat::LoadHeader(IOClass *stream) {
    io = stream;
    reader_.reset();
    parts_.clear();
    views_.clear();
    view_.clear();
    part_ = 0;
    for (std::string &s : slotChannel_) s.clear();
    lumaOnly_ = lumaChroma_ = false;
    width = height = depth = 0;
    metadata = ScriptVal::Table();
    if (!io) return Fail("no stream");
    ef::EnsureThreads();
    auto r = std::make_unique<Reader>();
    r->start = io->Tell();
    try {
        std::string damage;
        if (!ExrHeadersFit(io, damage)) return Fail(damage);
        r->stream = std::make_unique<FileIStream>(io);
        r->file = std::make_unique<Imf::MultiPartInputFile>(*r->stream, Imf::globalThreadCount());
        for (int p = 0; p < r->file->parts(); ++p) {
            const Imf::Header &h = r->file->header(p);
            OpenEXRPart part;
            if (h.hasName()) part.name = h.name();
            if (h.hasView()) part.view = h.view();
            for (auto c = h.channels().begin(); c != h.channels().end(); ++c) part.channels.push_back(c.name());
            if (!ef::ToRect(h.dataWindow(), part.dataWindow) || !ef::ToRect(h.displayWindow(), part.displayWindow))
                return Fail("OpenEXR: part " + std::to_string(p) + " has a window out of range");
            part.tiled = h.hasTileDescription();
            part.deep = h.hasType() && Imf::isDeepData(h.type());
            parts_.push_back(std::move(part));
        }
        if (parts_.empty()) return Fail("OpenEXR: the file has no part");

        // Views: a single part's list, or the parts' own views in file order.
        const Imf::Header &first = r->file->header(0);
        if (parts_.size() == 1 && Imf::hasMultiView(first)) {
            views_ = Imf::multiView(first);
        } else {
            for (const OpenEXRPart &p : parts_)
                if (!p.view.empty() && std::find(views_.begin(), views_.end(), p.view) == views_.end())
                    views_.push_back(p.view);
        }
        auto named = [this](const char *a, const char *b) {
            for (const std::string &v : views_)
                if (v == a || v == b) return v;
            return std::string();
        };
        const bool right = GetAttrL(FormatStereoEye, 0) == 1;
        if (!viewChoice_.empty()) {
            if (std::find(views_.begin(), views_.end(), viewChoice_) == views_.end())
                return Fail("OpenEXR: the file has no view " + viewChoice_);
            view_ = viewChoice_;
        } else if (!views_.empty()) {
            view_ = right ? named("right", "Right") : named("left", "Left");
            if (view_.empty()) view_ = right && views_.size() > 1 ? views_[1] : views_[0];
        }

        // The part: the one asked for, else the best flat part of the view.
        part_ = -1;
        if (!partChoice_.empty()) {
            for (size_t p = 0; p < parts_.size(); ++p)
                if (ef::PartID(parts_[p], p) == partChoice_) part_ = static_cast<int>(p);
            if (part_ < 0) return Fail("OpenEXR: the file has no part " + partChoice_);
        } else {
            int best = -1;
            for (size_t p = 0; p < parts_.size(); ++p) {
                const OpenEXRPart &P = parts_[p];
                const bool viewOk = views_.empty() || parts_.size() == 1 || P.view.empty() || P.view == view_;
                const bool colour = std::any_of(P.channels.begin(), P.channels.end(), ef::IsColourName);
                const int score = (!P.deep) * 16 + viewOk * 8 + colour * 4 + (P.view == view_) * 2;
                if (score > best) best = score, part_ = static_cast<int>(p);
            }
        }
        const OpenEXRPart &P = parts_[part_];
        if (P.deep) return Fail("OpenEXR: part " + std::to_string(part_) + " holds deep data, which cannot be read");
        const Imf::Header &h = r->file->header(part_);
        const Imf::ChannelList &cl = h.channels();

        // Channel names: the view's form of a name in a single-part multi-view file.
        const int viewIndex = static_cast<int>(std::find(views_.begin(), views_.end(), view_) - views_.begin());
        const bool viewNames = parts_.size() == 1 && !views_.empty();
        auto present = [&](const std::string &n) -> std::string {
            const std::string full = viewNames ? Imf::insertViewName(n, views_, viewIndex) : n;
            return cl.findChannel(full) ? full : std::string();
        };
        auto lookup = [&](const std::string &layer, const char *name, bool lower) {
            std::string found = present(layer + name);
            if (found.empty() && lower) {
                std::string l = name;
                for (char &c : l) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
                found = present(layer + l);
            }
            return found;
        };
        std::string layer;
        if (!layerChoice_.empty()) {
            Imf::ChannelList::ConstIterator b, e;
            cl.channelsInLayer(layerChoice_, b, e);
            if (b == e) return Fail("OpenEXR: part " + std::to_string(part_) + " has no layer " + layerChoice_);
            layer = layerChoice_ + ".";
        }
        for (int s = 0; s < 4 && layer.empty(); ++s) {
            const size_t dot = channelChoice_[s].rfind('.');
            if (dot != std::string::npos && layer.empty()) layer = channelChoice_[s].substr(0, dot + 1);
        }
        if (layer.empty() && lookup("", "R", true).empty() && lookup("", "G", true).empty() &&
            lookup("", "B", true).empty() && lookup("", "A", true).empty() && lookup("", "Y", false).empty()) {
            std::set<std::string> layers;
            cl.layers(layers);
            for (const std::string &l : layers) {
                Imf::ChannelList::ConstIterator b, e;
                cl.channelsInLayer(l, b, e);
                bool rgba = false;
                for (auto c = b; c != e; ++c) rgba = rgba || ef::IsColourName(c.name());
                if (rgba) {
                    layer = l + ".";
                    break;
                }
            }
            if (viewNames && !layer.empty()) layer.clear(); // layers there are views; the names above are exact
        }
        for (int s = 0; s < SlotCount; ++s) {
            if (!channelChoice_[s].empty())
                slotChannel_[s] = cl.findChannel(channelChoice_[s]) ? channelChoice_[s] : std::string();
            else
                slotChannel_[s] = lookup(s < 4 ? layer : std::string(), DefaultChannelName(s), s < 4);
            if (slotChannel_[s].empty() && s >= FirstAuxSlot && !layer.empty())
                slotChannel_[s] = lookup(layer, DefaultChannelName(s), false);
        }
        // Luminance files: Y alone reads as grey, Y with chroma through the library's converter.
        if (slotChannel_[SlotR].empty() && slotChannel_[SlotG].empty() && slotChannel_[SlotB].empty() &&
            channelChoice_[SlotR].empty() && channelChoice_[SlotG].empty() && channelChoice_[SlotB].empty()) {
            const std::string y = lookup(layer, "Y", false);
            if (!y.empty()) {
                if (!lookup(layer, "RY", false).empty() || !lookup(layer, "BY", false).empty()) {
                    if (part_ != 0)
                        return Fail("OpenEXR: luminance / chroma channels are read from the first part only");
                    lumaChroma_ = true;
                    r->lumaLayer = layer.empty() ? std::string() : layer.substr(0, layer.size() - 1);
                } else {
                    lumaOnly_ = true;
                    slotChannel_[SlotR] = y;
                }
            }
        }

        // A part none of whose channels a slot reads would load as a blank
        // picture; say so instead (another channel can be chosen).
        if (!lumaChroma_ && std::all_of(std::begin(slotChannel_), std::end(slotChannel_),
                                        [](const std::string &s) { return s.empty(); }))
            return Fail("OpenEXR: part " + std::to_string(part_) + " has no channel that can be read");

        // Depth and sampling.
        bool allHalf = true;
        for (int s = 0; s < SlotCount && !lumaChroma_; ++s) {
            if (slotChannel_[s].empty()) continue;
            const Imf::Channel &c = *cl.findChannel(slotChannel_[s]);
            if (c.xSampling != 1 || c.ySampling != 1)
                return Fail("OpenEXR: channel " + slotChannel_[s] + " is sub-sampled, which cannot be read");
            if (s < FirstAuxSlot && c.type != Imf::HALF) allHalf = false;
        }
        depth = allHalf ? DepthRGBAFlt16 : DepthRGBAFlt32;

        const int64_t w = int64_t(P.displayWindow.Width()), hh = int64_t(P.displayWindow.Height());
        if (w < 1 || hh < 1 || w > MaxImageSide || hh > MaxImageSide)
            return Fail("OpenEXR: display window of " + std::to_string(w) + " x " + std::to_string(hh) +
                        " is out of range");
        if (int64_t(P.dataWindow.Width()) * P.dataWindow.Height() > ef::kMaxWindowPixels)
            return Fail("OpenEXR: data window too large");
        // The library sets buffers of whole tiles aside before it reads a
        // pixel; a tile larger than the data window (beyond a small size) is damage.
        if (P.tiled) {
            const Imf::TileDescription &tiles = h.tileDescription();
            if (int64_t(tiles.xSize) > std::max<int64_t>(P.dataWindow.Width(), ef::kSmallTile) ||
                int64_t(tiles.ySize) > std::max<int64_t>(P.dataWindow.Height(), ef::kSmallTile))
                return Fail("OpenEXR: tiles of " + std::to_string(tiles.xSize) + " x " + std::to_string(tiles.ySize) +
                            " are larger than the data window");
        }
        width = static_cast<int>(w);
        height = static_cast<int>(hh);
        dataWindow = ef::ImageWindow(P, height);
        auxChannels = lumaChroma_
                          ? 0
                          : static_cast<int>(std::count_if(slotChannel_ + FirstAuxSlot, slotChannel_ + SlotCount,
                                                           [](auto &n) { return !n.empty(); }));
        const float ratio = h.pixelAspectRatio();
        aspectX = std::isfinite(ratio) && ratio > 0.f ? ratio : 1.0;
        aspectY = 1.0;

        ef::ReadAttributes(h, metadata);
        if (loadLayers_) {
            std::set<std::string> layers;
            cl.layers(layers);
            ScriptVal list = ScriptVal::Table();
            for (const std::string &l : layers) list.Append(ScriptVal(l));
            metadata.Set("Layers", list);
        }
    } catch (const std::exception &e) {
        return Fail(std::string("OpenEXR: ") + e.what());
    }
    reader_ = std::move(r);
    return true;
}

bool OpenEXRFormat::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!reader_) return Fail("no header");
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    ImgRectI window = ef::ImageWindow(parts_[part_], height);
    if (const auto *region = tags.GetPtrAs<const ImageDomain>(ClipFrameRegion)) window &= region->rect;
    image->SetDataWindow(window);
    for (int s = FirstAuxSlot; s < SlotCount; ++s)
        if (!slotChannel_[s].empty() && !lumaChroma_ && !image->AddAuxChannel(ef::KindOfSlot(s)))
            return Fail("out of memory");
    if (tags.GetBool(ClipFrameHeaderOnly) || image->IsNoData() || window.IsNull()) return true;
    if (!image->AllocScanLineData()) return Fail("out of memory");
    if (!(lumaChroma_ ? ReadLumaChroma(*image, window) : ReadRows(*image, window))) return false;
    ApplyDisplay(*image, window);
    return true;
}

bool OpenEXRFormat::ReadRows(Image &image, const ImgRectI &window) {
    const OpenEXRPart &P = parts_[part_];
    const ImgRectI whole = ef::ImageWindow(P, height);
    const int dx = P.displayWindow.x0, dy = P.displayWindow.y0, h = height;
    const int first = dy + h - window.y1, last = dy + h - 1 - window.y0; // file lines, top down
    const bool half = image.Depth() == DepthRGBAFlt16;
    const int comp = half ? 2 : 4;
    // Where the lines go: the colour rows, then one float plane per auxiliary channel.
    struct Plane {
        int bpp;
        int slot; ///< -1 for the colour rows
        std::vector<uint8_t> scratch;
    };
    struct Target {
        size_t plane;
        int offset;
        Imf::PixelType type;
        std::string name;
        double fill;
    };
    std::vector<Plane> planes{{image.BytesPerPixel(), -1, {}}};
    std::vector<Target> targets;
    for (int c = 0; c < 4; ++c) {
        if (lumaOnly_ && (c == SlotG || c == SlotB)) continue; // copied from the grey channel afterwards
        std::string name = slotChannel_[c];
        // A name the file lacks makes the library fill the slice with its fill value.
        if (name.empty()) name = std::string("\x01missing.") + SlotID(c);
        targets.push_back({0, c * comp, half ? Imf::HALF : Imf::FLOAT, name, c == SlotA ? 1.0 : 0.0});
    }
    for (int s = FirstAuxSlot; s < SlotCount; ++s) {
        if (slotChannel_[s].empty()) continue;
        planes.push_back({4, s, {}});
        targets.push_back({planes.size() - 1, 0, Imf::FLOAT, slotChannel_[s], 0.0});
    }
    auto row = [&](const Plane &p, int y) -> uint8_t * {
        return p.slot < 0 ? image.ScanLine(y) : reinterpret_cast<uint8_t *>(image.AuxRow(ef::KindOfSlot(p.slot), y));
    };
    // Whole lines land in the image directly; a narrower window goes through
    // a band of whole lines and keeps its columns.
    const bool direct = window.x0 == whole.x0 && window.x1 == whole.x1;
    const int fileWidth = P.dataWindow.Width();
    try {
        Imf::InputPart in(*reader_->file, part_);
        const Imf::Header &hdr = in.header();
        const int block =
            P.tiled ? std::max(1, static_cast<int>(hdr.tileDescription().ySize)) : ef::LinesPerBlock(hdr.compression());
        const int band = ef::BandLines(block);
        auto frameBuffer = [&](int bandStart) {
            Imf::FrameBuffer fb;
            for (const Target &t : targets) {
                const Plane &p = planes[t.plane];
                char *base;
                int64_t yStride;
                if (direct) {
                    yStride = -int64_t(window.Width()) * p.bpp;
                    base = ef::Address(row(p, window.y0), -(int64_t(dy) + h - 1 - window.y0) * yStride -
                                                              (int64_t(dx) + window.x0) * p.bpp);
                } else {
                    yStride = int64_t(fileWidth) * p.bpp;
                    base =
                        ef::Address(p.scratch.data(), -int64_t(bandStart) * yStride - int64_t(P.dataWindow.x0) * p.bpp);
                }
                fb.insert(t.name,
                          Imf::Slice(t.type, base + t.offset, p.bpp, static_cast<size_t>(yStride), 1, 1, t.fill));
            }
            in.setFrameBuffer(fb);
        };
        if (direct) {
            frameBuffer(0);
        } else {
            for (Plane &p : planes) p.scratch.resize(size_t(fileWidth) * p.bpp * band);
        }
        for (int a = first; a <= last;) {
            if (Aborted()) return Fail("aborted");
            // Bands end on block boundaries, so no block is decoded twice.
            const int64_t end = P.dataWindow.y0 + (int64_t(a) - P.dataWindow.y0 + band) / block * block - 1;
            const int b = static_cast<int>(std::clamp<int64_t>(end, a, std::min<int64_t>(last, int64_t(a) + band - 1)));
            if (!direct) frameBuffer(a);
            in.readPixels(a, b);
            if (!direct) {
                for (int fy = a; fy <= b; ++fy)
                    for (const Plane &p : planes)
                        std::memcpy(row(p, dy + h - 1 - fy),
                                    p.scratch.data() +
                                        (size_t(fy - a) * fileWidth + (window.x0 + dx - P.dataWindow.x0)) * p.bpp,
                                    size_t(window.Width()) * p.bpp);
            }
            a = b + 1;
        }
    } catch (const std::exception &e) {
        return Fail(std::string("OpenEXR: ") + e.what());
    }
    if (lumaOnly_) {
        for (int y = window.y0; y < window.y1; ++y) {
            uint8_t *p = image.ScanLine(y);
            for (int x = 0; x < window.Width(); ++x, p += 4 * comp) {
                std::memcpy(p + comp, p, comp);
                std::memcpy(p + 2 * comp, p, comp);
            }
        }
    }
    return true;
}

bool OpenEXRFormat::ReadLumaChroma(Image &image, const ImgRectI &window) {
    const OpenEXRPart &P = parts_[part_];
    const int dx = P.displayWindow.x0, dy = P.displayWindow.y0, h = height;
    const int first = dy + h - window.y1, last = dy + h - 1 - window.y0;
    const int fileWidth = P.dataWindow.Width();
    if (image.Depth() != DepthRGBAFlt16) return Fail("luminance / chroma needs a float16 image");
    try {
        if (!io->Seek(reader_->start, IOClass::SeekAbsolute)) return Fail("seek error");
        FileIStream stream(io);
        std::unique_ptr<Imf::RgbaInputFile> in =
            reader_->lumaLayer.empty()
                ? std::make_unique<Imf::RgbaInputFile>(stream, Imf::globalThreadCount())
                : std::make_unique<Imf::RgbaInputFile>(stream, reader_->lumaLayer, Imf::globalThreadCount());
        const int band = ef::BandLines(16);
        std::vector<Imf::Rgba> lines(size_t(fileWidth) * band);
        for (int a = first; a <= last; a += band) {
            if (Aborted()) return Fail("aborted");
            const int b = std::min(last, a + band - 1);
            in->setFrameBuffer(
                reinterpret_cast<Imf::Rgba *>(ef::Address(lines.data(), -(int64_t(a) * fileWidth + P.dataWindow.x0) *
                                                                            int64_t(sizeof(Imf::Rgba)))),
                1, static_cast<size_t>(fileWidth));
            in->readPixels(a, b);
            for (int fy = a; fy <= b; ++fy) {
                auto *dst = reinterpret_cast<uint16_t *>(image.ScanLine(dy + h - 1 - fy));
                const Imf::Rgba *src = lines.data() + size_t(fy - a) * fileWidth + (window.x0 + dx - P.dataWindow.x0);
                for (int x = 0; x < window.Width(); ++x, dst += 4) {
                    dst[0] = src[x].r.bits();
                    dst[1] = src[x].g.bits();
                    dst[2] = src[x].b.bits();
                    dst[3] = src[x].a.bits();
                }
            }
        }
    } catch (const std::exception &e) {
        return Fail(std::string("OpenEXR: ") + e.what());
    }
    return true;
}

void OpenEXRFormat::ApplyDisplay(Image &image, const ImgRectI &window) const {
    const bool neutral = defog_ == 0.0 && exposure_ == 0.0 && kneeLow_ == 0.0 && kneeHigh_ == 5.0;
    if (bypass_ || neutral) return;
    const double gain = std::exp2(exposure_ + 2.47393);
    const double kl = std::exp2(kneeLow_);
    const double f = ef::KneeF(std::exp2(kneeHigh_) - kl, std::exp2(3.5) - kl);
    std::vector<FltPixel> px(static_cast<size_t>(window.Width()));
    for (int y = window.y0; y < window.y1; ++y) {
        uint8_t *row = image.ScanLine(y);
        LoadFlt(image.Depth(), row, window.Width(), px.data());
        for (FltPixel &p : px)
            for (float *c : {&p.R, &p.G, &p.B}) {
                double v = std::max(0.0, double(*c) - defog_) * gain;
                if (v > kl) v = kl + ef::Knee(v - kl, f);
                *c = static_cast<float>(v * 0.184874);
            }
        StoreFlt(image.Depth(), px.data(), window.Width(), row);
    }
}

// ---- writing ----

bool OpenEXRFormat::SaveHeader(IOClass *stream, Image *image) {
    io = stream;
    writer_.reset();
    if (!io || !image) return Fail("nothing to write");
    const int w = image->Width(), h = image->Height();
    if (w < 1 || h < 1) return Fail("empty image");
    ef::EnsureThreads();
    auto W = std::make_unique<Writer>();
    W->window = image->DataWindow();
    W->empty = W->window.IsNull();
    if (W->empty) W->window = ImgRectI(0, h - 1, 1, h); // one zero pixel at the file's origin
    const ImgRectI &win = W->window;
    const Imf::PixelType colour = ef::HalfColour(depthMode_, image->Depth()) ? Imf::HALF : Imf::FLOAT;
    const Imf::PixelType aux = depthMode_ == 1 ? Imf::HALF : Imf::FLOAT;
    W->colour = colour;
    for (int s = 0; s < SlotCount; ++s) {
        if (!saveSlot_[s] || (s >= FirstAuxSlot && !image->HasAuxChannel(ef::KindOfSlot(s)))) continue;
        for (const Writer::Channel &c : W->channels)
            if (c.name == saveName_[s]) return Fail("OpenEXR: channel name " + c.name + " is given twice");
        W->channels.push_back({s, saveName_[s], s < FirstAuxSlot ? colour : aux});
    }
    if (W->channels.empty()) return Fail("OpenEXR: no channel to write");
    const double xs = image->XScale(), ys = image->YScale();
    const float aspect = xs > 0 && ys > 0 && std::isfinite(xs / ys) ? static_cast<float>(xs / ys) : 1.f;
    const auto compression = static_cast<Imf::Compression>(compression_);
    try {
        Imf::Header hdr(Imath::Box2i(Imath::V2i(0, 0), Imath::V2i(w - 1, h - 1)),
                        Imath::Box2i(Imath::V2i(win.x0, h - win.y1), Imath::V2i(win.x1 - 1, h - 1 - win.y0)), aspect,
                        Imath::V2f(0.f, 0.f), 1.f, Imf::INCREASING_Y, compression);
        hdr.zipCompressionLevel() = zipLevel_;
        hdr.dwaCompressionLevel() = static_cast<float>(dwaLevel_);
        for (const Writer::Channel &c : W->channels) hdr.channels().insert(c.name, Imf::Channel(c.type));
        ef::WriteAttributes(image->Metadata(), hdr);
        W->band = ef::BandLines(ef::LinesPerBlock(compression));
        W->stream = std::make_unique<FileOStream>(io);
        W->file = std::make_unique<Imf::OutputFile>(*W->stream, hdr, Imf::globalThreadCount());
    } catch (const std::exception &e) {
        return Fail(std::string("OpenEXR: ") + e.what());
    }
    writer_ = std::move(W);
    return true;
}

bool OpenEXRFormat::SaveFrame(unsigned, Image *image) {
    if (!writer_ || !writer_->file || !image) return Fail("nothing to write");
    Writer &W = *writer_;
    const ImgRectI &win = W.window;
    if (!W.empty && image->DataWindow() != win) return Fail("the image changed since its header was written");
    const int h = image->Height(), cols = win.Width();
    const int first = h - win.y1, last = h - 1 - win.y0; // file lines
    const bool hasRows = image->HasScanLineData() && !W.empty;
    // Colour rows whose stored type is the file's go to the library as they
    // are; others are converted into `band`, a band of lines of the file's type.
    const int fileDepth = W.colour == Imf::HALF ? DepthRGBAFlt16 : DepthRGBAFlt32;
    const int comp = W.colour == Imf::HALF ? 2 : 4, pixelBytes = 4 * comp;
    const bool direct = hasRows && image->Depth() == fileDepth;
    std::vector<uint8_t> band;
    std::vector<FltPixel> row;
    if (hasRows && !direct) band.resize(size_t(cols) * W.band * pixelBytes), row.resize(size_t(cols));
    // Auxiliary planes are float; HALF channels take them through bands of halves.
    std::vector<std::vector<uint16_t>> halfAux(W.channels.size());
    const std::vector<float> zeros(size_t(cols) * 4, 0.f); // read again for every line (y stride 0)
    auto zeroSlice = [&](Imf::PixelType type) {
        const int bytes = type == Imf::HALF ? 2 : 4;
        return Imf::Slice(type, ef::Address(zeros.data(), -int64_t(win.x0) * bytes), bytes, 0);
    };
    try {
        for (int a = first; a <= last;) {
            if (Aborted()) {
                writer_.reset(); // the file stays unfinished; nothing may touch the stream later
                return Fail("aborted");
            }
            const int b = std::min(last, a + W.band - 1);
            Imf::FrameBuffer fb;
            for (size_t i = 0; i < W.channels.size(); ++i) {
                const Writer::Channel &c = W.channels[i];
                if (c.slot < FirstAuxSlot) {
                    if (!hasRows) {
                        fb.insert(c.name, zeroSlice(c.type));
                        continue;
                    }
                    char *base;
                    int64_t stride;
                    if (direct) {
                        stride = -int64_t(cols) * pixelBytes;
                        base = ef::Address(image->ScanLine(win.y0),
                                           -int64_t(h - 1 - win.y0) * stride - int64_t(win.x0) * pixelBytes);
                    } else {
                        stride = int64_t(cols) * pixelBytes;
                        base = ef::Address(band.data(), -int64_t(a) * stride - int64_t(win.x0) * pixelBytes);
                    }
                    fb.insert(c.name,
                              Imf::Slice(c.type, base + c.slot * comp, pixelBytes, static_cast<size_t>(stride)));
                    continue;
                }
                const AuxChannelKind kind = ef::KindOfSlot(c.slot);
                const float *plane = hasRows ? image->AuxRow(kind, win.y0) : nullptr;
                if (!plane) {
                    fb.insert(c.name, zeroSlice(c.type));
                } else if (c.type == Imf::FLOAT) {
                    const int64_t stride = -int64_t(cols) * 4;
                    char *base = ef::Address(plane, -int64_t(h - 1 - win.y0) * stride - int64_t(win.x0) * 4);
                    fb.insert(c.name, Imf::Slice(Imf::FLOAT, base, 4, static_cast<size_t>(stride)));
                } else {
                    std::vector<uint16_t> &halves = halfAux[i];
                    halves.resize(size_t(cols) * W.band);
                    for (int fy = a; fy <= b; ++fy) {
                        const float *src = image->AuxRow(kind, h - 1 - fy);
                        uint16_t *dst = halves.data() + size_t(fy - a) * cols;
                        for (int x = 0; x < cols; ++x) dst[x] = FloatToHalf(src[x]);
                    }
                    const int64_t stride = int64_t(cols) * 2;
                    char *base = ef::Address(halves.data(), -int64_t(a) * stride - int64_t(win.x0) * 2);
                    fb.insert(c.name, Imf::Slice(Imf::HALF, base, 2, static_cast<size_t>(stride)));
                }
            }
            if (hasRows && !direct)
                for (int fy = a; fy <= b; ++fy) {
                    LoadFlt(image->Depth(), image->ScanLine(h - 1 - fy), cols, row.data());
                    StoreFlt(fileDepth, row.data(), cols, band.data() + size_t(fy - a) * cols * pixelBytes);
                }
            W.file->setFrameBuffer(fb);
            W.file->writePixels(b - a + 1);
            a = b + 1;
        }
        W.file.reset(); // writes the line offsets
    } catch (const std::exception &e) {
        writer_.reset();
        return Fail(std::string("OpenEXR: ") + e.what());
    }
    const bool failed = W.stream->Failed();
    writer_.reset();
    return failed ? Fail("OpenEXR: write error") : true;
}

int64_t OpenEXRFormat::PredictFileSize(Image *image) {
    if (!image) return 0;
    const ImgRectI &w = image->DataWindow();
    const int64_t rows = w.IsNull() ? 1 : w.Height(), cols = w.IsNull() ? 1 : w.Width();
    const int64_t colour = ef::HalfColour(depthMode_, image->Depth()) ? 2 : 4;
    const int64_t aux = depthMode_ == 1 ? 2 : 4;
    int64_t pixel = 0;
    for (int s = 0; s < SlotCount; ++s)
        if (saveSlot_[s] && (s < FirstAuxSlot || image->HasAuxChannel(ef::KindOfSlot(s))))
            pixel += s < FirstAuxSlot ? colour : aux;
    // A block that does not shrink is stored as it is: raw size plus offsets,
    // block headers and the header itself.
    const int64_t blocks = rows; // at most one per line
    int64_t text = 0;
    if (image->Metadata().IsTable() && image->Metadata().Size())
        text = static_cast<int64_t>(image->Metadata().ToText().size());
    return rows * cols * pixel + blocks * 16 + 4096 + text;
}

bool OpenEXRFormat::DescribeFile(IOClass *stream, ScriptVal &d) {
    if (!stream) return Fail("no stream");
    const int64_t start = stream->Tell();
    // What reading makes, when the reader takes the file; then every header.
    const bool readable = ImageFormat::DescribeFile(stream, d);
    const std::string readError = readable ? std::string() : Error();
    if (!readable) d = ScriptVal::Table();
    ScriptVal exr = ScriptVal::Table();
    try {
        std::unique_ptr<FileIStream> ownStream;
        std::unique_ptr<Imf::MultiPartInputFile> ownFile;
        const Imf::MultiPartInputFile *file = reader_ ? reader_->file.get() : nullptr;
        if (!file) {
            if (!stream->Seek(start, IOClass::SeekAbsolute)) return Fail(readError);
            ownStream = std::make_unique<FileIStream>(stream);
            ownFile = std::make_unique<Imf::MultiPartInputFile>(*ownStream, Imf::globalThreadCount());
            file = ownFile.get();
        }
        exr.Set("version", Imf::getVersion(file->version()));
        exr.Set("multiPart", Imf::isMultiPart(file->version()));
        ScriptVal parts = ScriptVal::Table();
        for (int p = 0; p < file->parts(); ++p) parts.Append(ef::DescribePart(file->header(p), p));
        if (readable) {
            ScriptVal views = ScriptVal::Table(), slots = ScriptVal::Table();
            for (const std::string &v : views_) views.Append(ScriptVal(v));
            exr.Set("views", views);
            exr.Set("partRead", part_);
            exr.Set("viewRead", view_);
            for (int s = 0; s < SlotCount; ++s)
                if (!slotChannel_[s].empty()) slots.Set(SlotID(s), ScriptVal(slotChannel_[s]));
            if (lumaChroma_) slots.Set("RGB", ScriptVal("Y, RY, BY"));
            exr.Set("slots", slots);
        } else {
            d.Set("readError", readError);
        }
        // The file's own channels: the part read's, or the first part's.
        const ScriptVal *shown = parts.At(readable ? static_cast<size_t>(part_) + 1 : 1);
        if (shown) d.Set("channels", *shown->Find("channels"));
        exr.Set("parts", parts);
    } catch (const std::exception &e) {
        return Fail(readError.empty() ? std::string("OpenEXR: ") + e.what() : readError);
    }
    d.Set("openexr", exr);
    return true;
}

} // namespace Orvane
