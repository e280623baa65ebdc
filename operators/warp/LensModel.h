#pragma once
// A lens model as the Lens Distort tool sees it: a name and ID, a list of parameters that become the tool's
// inputs, an update from one request's values, a reader of its lens file, and the two maps between pixel
// positions.
//
// Pixel positions are continuous: pixel (i, j) covers [i, i + 1) x [j, j + 1), rows counted from the bottom.
// MapDirect is the model's direct function (distorted to undistorted); MapInverse its inverse, iterated from
// a start near the answer.
//
//  * ModelEq wraps one lens model of the kit (ldpk). The filmback is fitted to the image by the fit method
//    (FitFilmback) and centred on it: normalised x = 0.5 + (px - W / 2) kx / w_fb, and the same for y, with
//    kx, ky the fit's filmback units per pixel. For a width fit (or an image of the filmback's aspect) this is
//    px / W. The camera values reach the kit's built-in parameters: focal length mm x 0.1, aperture inches x
//    2.54, lens shift (apertures) x aperture inches as the lens centre offset, the pixel aspect and the focus
//    distance. Its file is ".data".
//  * ModelPf wraps the barrel model of ".pfb" files (PfBarrel, pixel positions of the image itself); it has no
//    camera parameters.
//
// Thread safety: Update and Load run on the tool's thread; afterwards the maps may run on many threads at
// once (the kit's only lazily filled state is guarded by its own lock).
#include <filesystem>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "host/core/OvID.h"
#include "operators/warp/ModelPf.h"
#include "operators/warp/ldpk/Builtin.h"

namespace Orvane::lensdistort {

/// The camera and the image a model is fitted to, all from one request.
struct ModelSettings {
    int width = 0, height = 0;
    double pixelAspect = 1.0; ///< x / y
    double focalLengthMm = 35.0;
    double apertureWidthIn = 0.980, apertureHeightIn = 0.735;
    double shiftX = 0.0, shiftY = 0.0; ///< in apertures
    double focusDistanceCm = 100.0;
    int fit = 0; ///< index into FitMethodID
};

/// One parameter of a model, as an input of the tool.
struct ModelParameter {
    std::string name;          ///< the model's name for it (and the input's label)
    std::string id;            ///< the input's ID within the model's group: the name's letters and digits
    ldpk::parameter_type type; ///< every parameter of the built-in models is real
    double low, high, def;
};

/// What a lens file sets: parameter values (by index into Parameters()) and, for models with camera
/// parameters, the camera values the file names.
struct LoadedLens {
    std::vector<std::pair<int, double>> values;
    std::optional<double> focalLengthMm, apertureWidthIn, apertureHeightIn, pixelAspect, focusDistanceCm;
    /// The lens centre offset as the file gives it, in cm; the tool turns it into lens shift with the aperture.
    std::optional<double> lensOffsetXCm, lensOffsetYCm;
    /// ".pfb" tables of more than one frame: per frame, the values of every parameter (first frame first).
    int firstFrame = 0;
    std::vector<std::vector<double>> frames;
};

class Model {
public:
    virtual ~Model() = default;
    OvID ID() const { return id_; }
    const std::string &Name() const { return name_; }
    const std::vector<ModelParameter> &Parameters() const { return params_; }
    bool HasCameraParameters() const { return hasCamera_; }
    /// The file filter of the load dialog: "3D Equalizer (*.data)|*.data||" or "PFTrack (*.pfb)|*.pfb||".
    virtual const char *FileFilter() const = 0;

    /// Takes the request's values (one per parameter, in order) and camera; ready to map after.
    virtual void Update(const ModelSettings &s, std::span<const double> values) = 0;
    /// Reads a lens file; throws lensfiles::Error or ldpk::error_base with a text for the user.
    virtual LoadedLens Load(const std::filesystem::path &path) = 0;
    virtual bool MapDirect(double x, double y, double &ox, double &oy) const = 0;
    virtual bool MapInverse(double x, double y, double startX, double startY, double &ox, double &oy) const = 0;
    /// MapDirect of the n positions (x[i], y) of a row; ok[i] says whether each succeeded. One call per row:
    /// the kit's models run their chain over it without a call per position.
    virtual void MapDirectRow(const double *x, double y, int n, double *ox, double *oy, bool *ok) const;

protected:
    Model(std::string name, OvID id, bool hasCamera) : name_(std::move(name)), id_(id), hasCamera_(hasCamera) {}
    std::vector<ModelParameter> params_;

private:
    std::string name_;
    OvID id_;
    bool hasCamera_;
};

class ModelEq : public Model {
public:
    explicit ModelEq(std::unique_ptr<ldpk::ldp_builtin> plugin);
    const char *FileFilter() const override { return "3D Equalizer (*.data)|*.data||"; }
    void Update(const ModelSettings &s, std::span<const double> values) override;
    LoadedLens Load(const std::filesystem::path &path) override;
    bool MapDirect(double x, double y, double &ox, double &oy) const override;
    bool MapInverse(double x, double y, double startX, double startY, double &ox, double &oy) const override;
    void MapDirectRow(const double *x, double y, int n, double *ox, double *oy, bool *ok) const override;
    ldpk::ldp_builtin &Plugin() const { return *plugin_; }
    /// The normalisation of the last Update: x_n = 0.5 + (x - CentreX()) ToNormX(), the same for y.
    double ToNormX() const { return toNormX_; }
    double ToNormY() const { return toNormY_; }
    double CentreX() const { return centreX_; }
    double CentreY() const { return centreY_; }

private:
    std::unique_ptr<ldpk::ldp_builtin> plugin_;
    double toNormX_ = 1.0, toNormY_ = 1.0, fromNormX_ = 1.0, fromNormY_ = 1.0; // per pixel and back
    double centreX_ = 0.0, centreY_ = 0.0;                                     // the image centre in pixels
};

class ModelPf : public Model {
public:
    ModelPf();
    const char *FileFilter() const override { return "PFTrack (*.pfb)|*.pfb||"; }
    void Update(const ModelSettings &s, std::span<const double> values) override;
    LoadedLens Load(const std::filesystem::path &path) override;
    bool MapDirect(double x, double y, double &ox, double &oy) const override;
    bool MapInverse(double x, double y, double startX, double startY, double &ox, double &oy) const override;

private:
    PfBarrel barrel_{PfBarrelSettings{0, 0, 0.5, 0.5, 1, 1, 1}};
};

/// The tool's models in their listing order: the kit's six, then the barrel model.
std::vector<std::unique_ptr<Model>> MakeModels();

} // namespace Orvane::lensdistort
