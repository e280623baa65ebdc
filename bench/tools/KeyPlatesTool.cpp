// orvane_key_plates: writes the synthetic keying plates to OpenEXR files, for looking at them and for feeding them
// to other programs. Every kind on both screens; per plate NAME.composite.exr, NAME.alpha.exr (the true matte),
// NAME.foreground.exr (the true foreground without spill, premultiplied) and NAME.screen.exr (the clean screen).
#include <charconv>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <string_view>

#include "host/app/Application.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"
#include "tests/support/KeyPlates.h"

namespace {

using namespace Orvane;

constexpr const char *kUsage = "usage: orvane_key_plates FOLDER [WIDTH HEIGHT [SEED]]   (default 1920 1080 1)\n";

/// Writes one image as float EXR (Zip); false, with a line on stderr, when it cannot.
bool WriteExr(const Image &image, const std::string &path) {
    Ref<ImageFormat> exr = NewImageFormat(ClassRegistry->Find(OvID("OpenEXRFormat"), RegFamilyImageFormat));
    std::string error; // the file's own errors name the file
    std::unique_ptr<FileIO> file = exr ? FileIO::Open(path, FileIO::Mode::Write, error) : nullptr;
    if (!exr) error = "no OpenEXR format in the tool library";
    if (file) {
        exr->SetupSave(nullptr, nullptr);
        Image *img = const_cast<Image *>(&image); // saving reads the image only
        if (!exr->SaveHeader(file.get(), img) || !exr->SaveFrame(0, img))
            error = path + ": " + exr->Error();
        else if (!file->Close())
            error = path + ": cannot finish writing";
        else
            return true;
    }
    std::fprintf(stderr, "orvane_key_plates: %s\n", error.c_str());
    return false;
}

bool ParseNumber(const char *text, long long lo, long long hi, long long &value) {
    const std::string_view s(text);
    const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), value);
    return ec == std::errc() && end == s.data() + s.size() && value >= lo && value <= hi;
}

} // namespace

int main(int argc, char **argv) {
    long long width = 1920, height = 1080, seed = 1;
    if (argc < 2 || argc == 3 || argc > 5 ||
        (argc >= 4 && (!ParseNumber(argv[2], 16, 16384, width) || !ParseNumber(argv[3], 16, 16384, height))) ||
        (argc == 5 && !ParseNumber(argv[4], 0, INT64_MAX, seed))) {
        std::fputs(kUsage, stderr);
        return 2;
    }
    std::string error;
    if (!GetApp()->LoadOperators(error)) {
        std::fprintf(stderr, "orvane_key_plates: cannot load the tool library: %s\n", error.c_str());
        return 1;
    }
    const std::string folder = argv[1];
    using Test::KeyPlateKind;
    for (const KeyPlateKind kind : {KeyPlateKind::HardEdges, KeyPlateKind::SoftEdges, KeyPlateKind::Hair,
                                    KeyPlateKind::MotionBlur, KeyPlateKind::Veils, KeyPlateKind::Everything})
        for (const Test::ScreenColor screen : {Test::ScreenColor::Green, Test::ScreenColor::Blue}) {
            const Test::KeyPlate plate = Test::MakeKeyPlate(kind, screen, static_cast<int>(width),
                                                            static_cast<int>(height), static_cast<uint64_t>(seed));
            const std::string stem = folder + "/" + plate.name;
            if (!WriteExr(*plate.composite, stem + ".composite.exr") ||
                !WriteExr(*plate.trueAlpha, stem + ".alpha.exr") ||
                !WriteExr(*plate.trueForeground, stem + ".foreground.exr") ||
                !WriteExr(*plate.cleanScreen, stem + ".screen.exr"))
                return 1;
            std::printf("%s: screen %.3f %.3f %.3f, grain %.3f\n", stem.c_str(), plate.screenR, plate.screenG,
                        plate.screenB, plate.grainSigma);
        }
    return 0;
}
