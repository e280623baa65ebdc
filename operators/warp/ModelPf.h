#pragma once
// The barrel lens model of ".pfb" files: a radial polynomial in the distance from a lens centre, on pixel
// positions of an image W x H, with an anamorphic squeeze on the vertical axis.
//
// Positions are in pixels. The distance is measured in units where half the image diagonal is 1:
// S = sqrt(2) / sqrt(W^2 + H^2) takes pixels there, so the same coefficients fit every resolution of a frame.
// The vertical axis is divided by the squeeze before the distance is taken and multiplied back after, so a
// squeezed lens bends as a round one would on the unsqueezed picture.
//
//   a = S x,  b = S y / sq,  da = a - S cx W,  db = b - S cy H / sq,  r2 = da^2 + db^2,
//   t = (c3 + c5 r2) r2,  X = (t da + a) / S,  Y = (t db + b) sq / S.
//
// Zero coefficients give the identity. The inverse has no closed form: Inverse() walks from a start by
// finite-difference steps (see there). Width, height and squeeze must be positive; otherwise the results are
// not finite numbers (the inverse still ends within its round limit).
//
// Thread safety: a PfBarrel is immutable after construction; its calls are const and allocate nothing, so
// any number of threads may share one.
#include <array>
#include <string_view>

namespace Orvane {

/// The model's parameters and the image they apply to.
struct PfBarrelSettings {
    double lowOrder = 0.0;  ///< "Low Order Distortion", c3
    double highOrder = 0.0; ///< "High Order Distortion", c5
    double centerX = 0.5;   ///< "Lens Center X", a fraction of the width
    double centerY = 0.5;   ///< "Lens Center Y", a fraction of the height
    double squeeze = 1.0;   ///< "Anamorphic Squeeze"
    int width = 0;          ///< image width in pixels
    int height = 0;         ///< image height in pixels
};

/// The parameter names, in the order of the fields above.
inline constexpr std::array<std::string_view, 5> PfBarrelParameterNames{
    "Low Order Distortion", "High Order Distortion", "Lens Center X", "Lens Center Y", "Anamorphic Squeeze"};

struct PfPoint {
    double x = 0.0;
    double y = 0.0;
};

/// An inverse and the number of steps it took (0 to PfBarrel::MaxRounds).
struct PfInverse {
    PfPoint p;
    int rounds = 0;
};

class PfBarrel {
public:
    static constexpr int MaxRounds = 10;
    /// Finite-difference offset of the inverse, in pixels.
    static constexpr double Step = 0.001;
    /// The inverse stops once a step's squared length is below this (pixels squared).
    static constexpr double StopStep2 = 0.0001;

    explicit PfBarrel(const PfBarrelSettings &s);

    /// The model's map of a pixel position.
    PfPoint Direct(PfPoint p) const;

    /// The position p with Direct(p) close to q, walking from `start`. Each round takes the error
    /// e0 = Direct(p) - q and the change of Direct over Step along x and along y; their lengths divided by Step
    /// are the gains lx and ly. A zero gain ends the walk (the map is flat there, a step would divide by zero);
    /// else p.x -= e0.x / lx and p.y -= e0.y / ly, and the walk ends once that step's squared length is below
    /// StopStep2, or after MaxRounds steps.
    PfInverse Inverse(PfPoint q, PfPoint start) const;

private:
    double c3_, c5_, squeeze_;
    double scale_, unscale_;   // S and 1 / S
    double centerA_, centerB_; // the lens centre in scaled units (b axis already unsqueezed)
};

} // namespace Orvane
