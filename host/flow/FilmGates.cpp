#include "host/flow/FilmGates.h"

#include <iterator>

namespace Orvane {
namespace {

struct FilmGateRow {
    const char *id;
    const char *name;
    double width; // inches
    double height;
};

// Camera apertures from published film and sensor dimensions, in inches.
// Projection entries are the smaller areas a projector shows of the camera frame.
constexpr FilmGateRow kFilmGateRows[] = {
    {"FilmGate_User", "User", 0.980, 0.735},
    {"FilmGate_Standard8mm", "8mm", 0.192, 0.145},
    {"FilmGate_Super8mm", "Super 8mm", 0.228, 0.158},
    {"FilmGate_16mm", "16mm", 0.404, 0.295},
    {"FilmGate_Super16mm", "Super 16mm", 0.493, 0.292},
    {"FilmGate_Sensor1_2_3in", "Sensor 1/2.3in 6.17x4.55mm", 0.243, 0.179},
    {"FilmGate_Sensor2_3in", "Sensor 2/3in 8.8x6.6mm", 0.346, 0.260},
    {"FilmGate_Sensor1in", "Sensor 1in 13.2x8.8mm", 0.520, 0.346},
    {"FilmGate_FourThirds", "Four Thirds 17.3x13mm", 0.681, 0.512},
    {"FilmGate_APSC", "APS-C 23.6x15.6mm", 0.929, 0.614},
    {"FilmGate_35mmTVProjection", "35mm TV Projection", 0.816, 0.612},
    {"FilmGate_35mmAcademy", "35mm Academy", 0.864, 0.630},
    {"FilmGate_35mmAcademyProjection", "35mm Academy Projection", 0.825, 0.602},
    {"FilmGate_35mm166Projection", "35mm 1.66 Projection", 0.825, 0.497},
    {"FilmGate_35mm185Projection", "35mm 1.85 Projection", 0.825, 0.446},
    {"FilmGate_35mmAnamorphic", "35mm 2.39 Anamorphic", 0.864, 0.732},
    {"FilmGate_35mmAnamorphicProjection", "35mm 2.39 Anamorphic Projection", 0.825, 0.690},
    {"FilmGate_35mmFullAperture", "35mm Full Aperture (Super 35)", 0.980, 0.735},
    {"FilmGate_Super35_3Perf", "Super 35 3-perf", 0.980, 0.546},
    {"FilmGate_Super35_239", "Super 35 2.39 Extraction", 0.945, 0.395},
    {"FilmGate_FullFrame", "Full Frame 36x24mm", 1.417, 0.945},
    {"FilmGate_35mm8PerfHorizontal", "35mm 8-perf Horizontal", 1.485, 0.991},
    {"FilmGate_MediumFormat", "Medium Format 44x33mm", 1.732, 1.299},
    {"FilmGate_70mmProjection", "70mm Projection", 1.912, 0.870},
    {"FilmGate_65mm5Perf", "65mm 5-perf", 2.066, 0.906},
    {"FilmGate_LargeFormat15Perf", "65mm 15-perf Large Format", 2.772, 2.072},
};
static_assert(std::size(kFilmGateRows) == kFilmGateCount, "one row per gate");

constexpr std::array<const char *, kFilmGateCount> MakeFilmGateNames() {
    std::array<const char *, kFilmGateCount> names{};
    for (size_t i = 0; i < kFilmGateCount; ++i) names[i] = kFilmGateRows[i].name;
    return names;
}

constexpr std::array<double, 2 * kFilmGateCount> MakeApertureTable() {
    std::array<double, 2 * kFilmGateCount> sizes{};
    for (size_t i = 0; i < kFilmGateCount; ++i) {
        sizes[2 * i] = kFilmGateRows[i].width;
        sizes[2 * i + 1] = kFilmGateRows[i].height;
    }
    return sizes;
}

std::array<OvID, kFilmGateCount> MakeFilmGateIDs() {
    std::array<OvID, kFilmGateCount> ids;
    for (size_t i = 0; i < kFilmGateCount; ++i) ids[i] = OvID(kFilmGateRows[i].id);
    return ids;
}

template <size_t N> int IndexOfID(const std::array<OvID, N> &ids, OvID id) {
    if (!id) return -1;
    for (size_t i = 0; i < N; ++i)
        if (ids[i] == id) return static_cast<int>(i);
    return -1;
}

} // namespace

const OvID FilmGate_User("FilmGate_User");
const std::array<OvID, kFilmGateCount> FilmGateID = MakeFilmGateIDs();
constinit const std::array<const char *, kFilmGateCount> FilmGateName = MakeFilmGateNames();
constinit const std::array<double, 2 *kFilmGateCount> ApertureTable = MakeApertureTable();

const OvID FMID_Inside("FMID_Inside");
const OvID FMID_Width("FMID_Width");
const OvID FMID_Height("FMID_Height");
const OvID FMID_Outside("FMID_Outside");
const OvID FMID_Stretch("FMID_Stretch");
const std::array<OvID, kFitMethodCount> FitMethodID = {FMID_Inside, FMID_Width, FMID_Height, FMID_Outside,
                                                       FMID_Stretch};

int FindFilmGate(OvID id) { return IndexOfID(FilmGateID, id); }

std::optional<FilmAperture> ApertureOf(OvID id) {
    int gate = FindFilmGate(id);
    if (gate < 0) return std::nullopt;
    return FilmAperture{ApertureTable[2 * gate], ApertureTable[2 * gate + 1]};
}

int FindFitMethod(OvID id) { return IndexOfID(FitMethodID, id); }

FilmbackScale FitFilmback(double width, double height, double pixelAspect, double wFb, double hFb, int fit) {
    const double imageAspect = width / height * pixelAspect;
    const double gateAspect = wFb / hFb;
    const double widthFit = wFb / width;
    const double heightFit = hFb / height;
    switch (fit) {
    case 0: // Inside
        return gateAspect < imageAspect ? FilmbackScale{heightFit, heightFit} : FilmbackScale{widthFit, widthFit};
    case 1: // Width
        return {widthFit, widthFit};
    case 2: // Height
        return {heightFit, heightFit};
    case 3: // Outside
        return imageAspect <= gateAspect ? FilmbackScale{heightFit, heightFit} : FilmbackScale{widthFit, widthFit};
    case 4: // Stretch
        return {widthFit, heightFit};
    default: return {};
    }
}

} // namespace Orvane
