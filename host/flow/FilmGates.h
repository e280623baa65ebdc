#pragma once
// FilmGates: the camera film gates a lens tool offers, and the fit of a
// camera's filmback to an image.
//
// Gate tables (all in the same gate order, FilmGate_User first):
//   FilmGateID     one OvID per gate
//   FilmGateName   its display name
//   ApertureTable  width and height of each gate's camera aperture in inches,
//                  interleaved: gate i has width [2i] and height [2i + 1]
// Gate kDefaultFilmGate (FilmGateID[17]) is 35 mm full aperture, the gate
// Super 35 is shot on (0.980 x 0.735 in); its aperture is ApertureTable[34]
// and [35]. FilmGate_User stands for an aperture the user types in; its table
// entry holds the default gate's size as a starting value.
//
// Fit methods: FitMethodID lists FMID_Inside, FMID_Width, FMID_Height,
// FMID_Outside and FMID_Stretch at indices 0..4, the indices FitFilmback takes.
//
// Thread safety: the tables are constant once static initialisation is done
// (do not read them from other static initialisers); every function is pure
// and may be called from any thread.
#include <array>
#include <cstddef>
#include <optional>

#include "host/core/OvID.h"

namespace Orvane {

inline constexpr size_t kFilmGateCount = 26;
inline constexpr size_t kDefaultFilmGate = 17;
inline constexpr size_t kFitMethodCount = 5;

ORVANE_API extern const OvID FilmGate_User;
ORVANE_API extern const std::array<OvID, kFilmGateCount> FilmGateID;
ORVANE_API extern const std::array<const char *, kFilmGateCount> FilmGateName;
ORVANE_API extern const std::array<double, 2 * kFilmGateCount> ApertureTable;

ORVANE_API extern const OvID FMID_Inside;
ORVANE_API extern const OvID FMID_Width;
ORVANE_API extern const OvID FMID_Height;
ORVANE_API extern const OvID FMID_Outside;
ORVANE_API extern const OvID FMID_Stretch;
ORVANE_API extern const std::array<OvID, kFitMethodCount> FitMethodID;

/// A camera aperture in inches.
struct FilmAperture {
    double width = 0.0;
    double height = 0.0;
};

inline constexpr size_t FilmGateCount() { return kFilmGateCount; }
/// Index of `id` in FilmGateID, or -1 when it names no gate.
ORVANE_API int FindFilmGate(OvID id);
/// The aperture of gate `id`; empty when it names no gate.
ORVANE_API std::optional<FilmAperture> ApertureOf(OvID id);
/// Index of `id` in FitMethodID, or -1 when it names no fit method.
ORVANE_API int FindFitMethod(OvID id);

/// Scale per axis from image pixels to filmback units.
struct FilmbackScale {
    double x = 1.0;
    double y = 1.0;
};

/// How a filmback of wFb x hFb (any unit) lies over an image of `width` x
/// `height` pixels whose pixels are `pixelAspect` (x / y) wide; `fit` is an
/// index into FitMethodID. "The width fits" means the filmback's width spans
/// the image's width, so one pixel is wFb / width units on both axes; "the
/// height fits" likewise with hFb / height. Inside makes the whole filmback
/// lie inside the image (the height fits when the image, pixel aspect
/// included, is wider than the filmback, else the width); Outside makes the
/// image lie inside the filmback (the height fits when the filmback is at
/// least as wide as the image, else the width); Width and Height force one
/// side; Stretch fits both sides on their own axes. Any other index gives 1
/// on both axes.
ORVANE_API FilmbackScale FitFilmback(double width, double height, double pixelAspect, double wFb, double hFb, int fit);

} // namespace Orvane
