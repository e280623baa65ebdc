// Writes the starting corpora of the fuzz harnesses: small files made by our
// own writers with each writing option (plus the harness's control byte),
// and a dictionary of the words documents are made of.
//   fuzz_seeds OUTDIR   writes OUTDIR/<harness>/seed-N and OUTDIR/document.dict
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"
#include "tests/fuzz/FuzzSupport.h"

namespace {

using namespace Orvane;
using Options = std::vector<std::pair<const char *, double>>;

struct SeedSet {
    const char *harness, *format;
    std::vector<Options> options; ///< one file per entry
};

std::vector<SeedSet> Sets() {
    std::vector<Options> exr;
    for (int i = 0; i < 20; ++i) exr.push_back({{"Compression", i / 2}}); // each for a float and a half image
    return {
        {"bmp", "BMPFormat", {{{"SaveAlpha", 0}}, {{"SaveAlpha", 1}}}},
        {"targa", "TargaFormat", {{{"Compress", 0}, {"SaveAlpha", 0}}, {{"Compress", 1}, {"SaveAlpha", 1}}}},
        {"raw", "RawFormat", {{{"Compression", 0}}, {{"Compression", 1}}, {{"Compression", 2}}}},
        {"jpeg", "JpegFormat", {{{"Quality", 60}, {"ChromaSubsampling", 1}}, {{"Quality", 95}}}},
        {"ipl", "IPLFormat", {{{"Quality", 80}}}},
        {"png", "PNGFormat", {{{"Depth", 1}, {"SaveAlpha", 0}}, {{"Depth", 2}, {"GammaMode", 3}, {"Gamma", 2.2}}}},
        {"openexr", "OpenEXRFormat", exr},
    };
}

/// A small image with varied pixels, of floats; the odd ones are of halves
/// and carry a data window off the frame's origin and a depth channel.
Ref<Image> SeedImage(int index) {
    const int w = 3 + index % 5, h = 2 + index % 3;
    const int depth = index % 2 ? DepthRGBAFlt16 : DepthRGBAFlt32;
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    if (index % 2) img->SetDataWindow(ImgRectI(1, 0, w, h - 1));
    if (!img->AllocScanLineData() || (index % 2 && !img->AddAuxChannel(AuxChannelKind::Z))) return nullptr;
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const float v = static_cast<float>((x * 7 + y * 13 + index) % 11) / 10.f;
            img->PutFlt(x, y, {v, 1.f - v, v * v, 0.5f + v / 2});
        }
    return img;
}

/// The file `format` writes for `image` with `options` set on a tool's inputs.
std::vector<uint8_t> Write(const char *format, Image *image, const Options &options) {
    Ref<ImageFormat> f = NewImageFormat(ClassRegistry->Find(OvID(format), RegFamilyImageFormat));
    OrvaneDoc doc;
    Operator *tool = doc.AddTool(OvID("Background"));
    if (!f || !tool) Fuzz::Fatal("cannot make a format or a tool");
    f->AddSaveInputs(tool);
    Request req(tool, nullptr, 0.0, 0, nullptr);
    for (const auto &[id, value] : options) {
        Input *in = tool->FindInput(OvID(id));
        if (!in) Fuzz::Fatal(id);
        req.SetInputData(in, MakeRef<Number>(value).Get());
    }
    f->SetupSave(tool, &req);
    MemoryIO io;
    const bool ok = f->SaveHeader(&io, image) && f->SaveFrame(0, image);
    f->CleanupSave(tool);
    if (!ok) std::fprintf(stderr, "%s: %s\n", format, f->Error().c_str());
    return ok ? io.Data() : std::vector<uint8_t>();
}

void WriteFile(const std::filesystem::path &path, const std::string &bytes) {
    std::ofstream(path, std::ios::binary).write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
}

/// Syntax, document keys, tool class names and their input IDs.
std::string DocumentDictionary() {
    std::set<std::string> words = {
        "{",       "}",       "=",           ",",           "[",     "]",     "\"",     "--",
        "return",  "true",    "false",       "nil",         "1/0",   "-1/0",  "0/0",    "Orvane.Document",
        "Version", "Program", "GlobalRange", "RenderRange", "Prefs", "Tools", "Inputs", "Curve",
        "Interp",  ".Output"};
    OrvaneDoc doc;
    for (const Registry *row : ClassRegistry->Rows()) {
        if (!row->IsRegClassType(RegKindTool)) continue;
        words.insert(row->ClassName());
        if (Operator *tool = doc.AddTool(row->ID()))
            for (const auto &in : tool->Inputs()) words.insert(in->ID().Text());
    }
    std::string dict;
    for (const std::string &w : words) {
        std::string escaped;
        for (char c : w) escaped += c == '"' || c == '\\' ? std::string("\\") + c : std::string(1, c);
        dict += "\"" + escaped + "\"\n";
    }
    return dict;
}

} // namespace

int main(int argc, char **argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: fuzz_seeds OUTDIR\n");
        return 2;
    }
    const std::filesystem::path out(argv[1]);
    Fuzz::LoadOperators();
    int written = 0;
    for (const SeedSet &set : Sets()) {
        std::filesystem::create_directories(out / set.harness);
        for (size_t i = 0; i < set.options.size(); ++i) {
            const Ref<Image> image = SeedImage(static_cast<int>(i));
            std::vector<uint8_t> bytes =
                image ? Write(set.format, image.Get(), set.options[i]) : std::vector<uint8_t>();
            if (bytes.empty()) return 1;
            bytes.push_back(static_cast<uint8_t>(i)); // the harness's control byte
            WriteFile(out / set.harness / ("seed-" + std::to_string(i)), std::string(bytes.begin(), bytes.end()));
            ++written;
        }
    }
    WriteFile(out / "document.dict", DocumentDictionary());
    std::printf("fuzz_seeds: %d files in %s\n", written, out.c_str());
    return 0;
}
