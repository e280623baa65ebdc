#pragma once
// GamutInputs: the group of inputs a tool adds to itself to convert images
// between a file's encoding and linear light. A loader converts to linear
// (ToLinear), a saver from linear to the file's encoding (FromLinear). The
// curves are those of host/color/Gamut.h; docs/GAMUT.md lists the inputs.
// The choice Color Space names a colour space of the document's colour
// configuration instead (host/color/ColorConfig.h): a loader converts from
// it to the role scene_linear, a saver from scene_linear to it.
//
// Use: make the group in the tool's constructor (after adding the page the
// inputs should sit on), forward the tool's NotifyChanged to it, and pass each
// image through ProcessOf in Process.
//
// Inputs (on the tool's current page; a tool without pages gets "Gamut"):
//   GamutSpace        "Source Space" / "Output Space": No Change (default),
//                     Linear, sRGB, Rec.709, Gamma, Cineon Log, Color Space
//   GamutColorSpace   "Color Space" (sRGB): a configuration's colour space,
//                     name, role or alias; shown for Color Space
//   GamutGamma        "Gamma" (2.2), shown for Gamma
//   GamutLogBlack, GamutLogWhite, GamutLogFilmGamma, GamutLogSoftClip
//                     "Black Level" (95), "White Level" (685), "Film Gamma"
//                     (0.6), "Soft Clip" (0 code values), shown for Cineon Log
//   GamutRemoveGamma / GamutAddGamma   "Remove Gamma" / "Add Gamma" (on): off
//                     passes the image on unconverted
//   GamutPreDivide    "Pre-Divide/Post-Multiply" (off): colour over alpha
//                     before the curve, times alpha after it
//
// Thread safety: construction and NotifyChanged on the main thread; ProcessOf
// on the tool's render thread (its rows on the workers).
#include <string>

#include "host/color/ColorConfig.h"
#include "host/color/Gamut.h"
#include "host/core/OvID.h"
#include "host/image/Image.h"

namespace Orvane {

class Input;
class Operator;
class Parameter;
class Request;

class ORVANE_API GamutInputs {
public:
    enum Direction { ToLinear, FromLinear };

    /// Adds the group's inputs to `tool` on its current page (a page "Gamut"
    /// when it has none yet).
    GamutInputs(Operator *tool, Direction direction);
    /// Keeps visibility of dependent inputs (gamma value shown only for a plain gamma, Cineon
    /// parameters only for log). Call from the tool's NotifyChanged with its arguments.
    void NotifyChanged(Input *in, Parameter *param, double time);
    /// Converts `in` for `req`'s time and writes into `out` (may equal `in` when `in` is owned
    /// and writable, or null to make a new image); `convert` false means pass-through.
    /// `clippingMode` is the ClippingMode ID (ClippingMode_Frame, _Domain, _None) of the
    /// caller: Frame converts only the part of the data window inside the frame (a new
    /// image gets the data window cut to the frame). With _None the canvas colour is
    /// converted too; otherwise it stays the input's.
    /// Returns the image to use (possibly `in` itself when nothing is to be done); null
    /// when memory ran out or the render was aborted, or with `error` set when the
    /// colour configuration or colour space cannot be found.
    Ref<Image> ProcessOf(Request *req, Image *in, Image *out, OvID clippingMode, bool convert,
                         std::string *error = nullptr);

    /// The curve the inputs choose for `req` (its time's values; defaults without a request).
    GamutCurve CurveOf(const Request *req) const;
    Direction GetDirection() const { return direction_; }
    Input *SpaceInput() const { return space_; }

    /// The IDs of the GamutSpace choices, and the encoding each stands for
    /// (GamutSpace::NoChange for an unknown ID).
    static OvID SpaceID(GamutSpace space);
    static GamutSpace SpaceOf(OvID id);

private:
    void ShowFor(GamutSpace space);
    /// The configuration's transform for the chosen colour space; null with `error` set.
    ColorProcessorPtr ConfigProcessor(const Request *req, std::string *error);

    Operator *tool_;
    Direction direction_;
    Input *space_ = nullptr, *gamma_ = nullptr, *logBlack_ = nullptr, *logWhite_ = nullptr;
    Input *logFilmGamma_ = nullptr, *logSoftClip_ = nullptr, *enable_ = nullptr, *preDivide_ = nullptr;
    Input *colorSpace_ = nullptr;
    KeptColorProcessor kept_;
};

} // namespace Orvane
