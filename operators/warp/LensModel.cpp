#include "operators/warp/LensModel.h"

#include <cmath>

#include "host/flow/FilmGates.h"
#include "operators/warp/LensFiles.h"
#include "operators/warp/ldpk/Models.h"

namespace Orvane::lensdistort {

namespace {

constexpr double kCmPerInch = 2.54;

std::string LettersAndDigits(const std::string &name) {
    std::string id;
    for (unsigned char ch : name)
        if (std::isalnum(ch)) id += static_cast<char>(ch);
    return id;
}

} // namespace

void Model::MapDirectRow(const double *x, double y, int n, double *ox, double *oy, bool *ok) const {
    for (int i = 0; i < n; ++i) ok[i] = MapDirect(x[i], y, ox[i], oy[i]);
}

// ---- ModelEq ---------------------------------------------------------------------------------------------

ModelEq::ModelEq(std::unique_ptr<ldpk::ldp_builtin> plugin)
    : Model(plugin->getModelName(), OvID(ldpk::model_id(plugin->getModelName()).c_str()), true),
      plugin_(std::move(plugin)) {
    for (int i = 0; i < plugin_->getNumParameters(); ++i) {
        const ldpk::parameter_descriptor &d = plugin_->parameter(i);
        params_.push_back({d.name, LettersAndDigits(d.name), d.type, d.range_min, d.range_max, d.default_value});
    }
}

void ModelEq::Update(const ModelSettings &s, std::span<const double> values) {
    ldpk::ldp_builtin &p = *plugin_;
    for (size_t i = 0; i < params_.size() && i < values.size(); ++i) {
        const char *name = params_[i].name.c_str();
        switch (params_[i].type) {
        case ldpk::parameter_type::boolean: p.setParameterValue(name, values[i] > 0.5); break;
        case ldpk::parameter_type::integer: p.setParameterValue(name, static_cast<int>(values[i])); break;
        default: p.setParameterValue(name, values[i]); break;
        }
    }
    const char *const *b = ldpk::ldp_builtin::builtin_names;
    p.setParameterValue(b[0], s.focalLengthMm * 0.1);
    p.setParameterValue(b[1], s.apertureWidthIn * kCmPerInch);
    p.setParameterValue(b[2], s.apertureHeightIn * kCmPerInch);
    // The lens centre offset is the shift times the aperture in inches, as lens files give it back (Load).
    p.setParameterValue(b[3], s.shiftX * s.apertureWidthIn);
    p.setParameterValue(b[4], s.shiftY * s.apertureHeightIn);
    p.setParameterValue(b[5], s.pixelAspect);
    p.setParameterValue(b[6], s.focusDistanceCm);

    const FilmbackScale k = FitFilmback(s.width, s.height, s.pixelAspect, s.apertureWidthIn, s.apertureHeightIn, s.fit);
    toNormX_ = k.x / s.apertureWidthIn;
    toNormY_ = k.y / s.apertureHeightIn;
    fromNormX_ = 1.0 / toNormX_;
    fromNormY_ = 1.0 / toNormY_;
    centreX_ = 0.5 * s.width;
    centreY_ = 0.5 * s.height;
    p.initializeParameters();
}

LoadedLens ModelEq::Load(const std::filesystem::path &path) {
    std::vector<lensfiles::ParameterInfo> list;
    for (const char *name : ldpk::ldp_builtin::builtin_names) list.push_back({name, lensfiles::ParameterType::Double});
    for (const ModelParameter &p : params_) list.push_back({p.name, lensfiles::ParameterType::Double});
    LoadedLens lens;
    std::optional<double> builtin[ldpk::ldp_builtin::n_builtin];
    lensfiles::ReadDataFile(path, list, [&](std::size_t index, const lensfiles::ParameterValue &value) {
        const double v = std::get<double>(value);
        if (index < std::size(builtin))
            builtin[index] = v;
        else
            lens.values.emplace_back(static_cast<int>(index - std::size(builtin)), v);
    });
    if (builtin[0]) lens.focalLengthMm = *builtin[0] * 10.0;
    if (builtin[1]) lens.apertureWidthIn = *builtin[1] / kCmPerInch;
    if (builtin[2]) lens.apertureHeightIn = *builtin[2] / kCmPerInch;
    lens.lensOffsetXCm = builtin[3];
    lens.lensOffsetYCm = builtin[4];
    lens.pixelAspect = builtin[5];
    lens.focusDistanceCm = builtin[6];
    return lens;
}

bool ModelEq::MapDirect(double x, double y, double &ox, double &oy) const {
    double nx, ny;
    const bool ok = plugin_->undistort(0.5 + (x - centreX_) * toNormX_, 0.5 + (y - centreY_) * toNormY_, nx, ny);
    ox = centreX_ + (nx - 0.5) * fromNormX_;
    oy = centreY_ + (ny - 0.5) * fromNormY_;
    return ok;
}

void ModelEq::MapDirectRow(const double *x, double y, int n, double *ox, double *oy, bool *ok) const {
    std::vector<ldpk::vec2d> positions(static_cast<size_t>(n));
    const double ny = 0.5 + (y - centreY_) * toNormY_;
    for (int i = 0; i < n; ++i) positions[i] = {0.5 + (x[i] - centreX_) * toNormX_, ny};
    plugin_->undistort_span(positions.data(), positions.data(), n);
    for (int i = 0; i < n; ++i) {
        ox[i] = centreX_ + (positions[i].x - 0.5) * fromNormX_;
        oy[i] = centreY_ + (positions[i].y - 0.5) * fromNormY_;
        ok[i] = std::isfinite(ox[i]) && std::isfinite(oy[i]);
    }
}

bool ModelEq::MapInverse(double x, double y, double startX, double startY, double &ox, double &oy) const {
    double nx, ny;
    const bool ok =
        plugin_->distort(0.5 + (x - centreX_) * toNormX_, 0.5 + (y - centreY_) * toNormY_,
                         0.5 + (startX - centreX_) * toNormX_, 0.5 + (startY - centreY_) * toNormY_, nx, ny);
    ox = centreX_ + (nx - 0.5) * fromNormX_;
    oy = centreY_ + (ny - 0.5) * fromNormY_;
    return ok && std::isfinite(ox) && std::isfinite(oy);
}

// ---- ModelPf ---------------------------------------------------------------------------------------------

ModelPf::ModelPf() : Model("PFTrack", OvID("PFTrack"), false) {
    // Ranges of the sliders: the coefficients of real lenses lie well inside +-1, centres inside the image.
    const double ranges[][3] = {{-1.0, 1.0, 0.0}, {-1.0, 1.0, 0.0}, {0.0, 1.0, 0.5}, {0.0, 1.0, 0.5}, {0.25, 4.0, 1.0}};
    for (size_t i = 0; i < PfBarrelParameterNames.size(); ++i) {
        const std::string name(PfBarrelParameterNames[i]);
        params_.push_back(
            {name, LettersAndDigits(name), ldpk::parameter_type::real, ranges[i][0], ranges[i][1], ranges[i][2]});
    }
}

void ModelPf::Update(const ModelSettings &s, std::span<const double> values) {
    PfBarrelSettings b;
    double *const fields[] = {&b.lowOrder, &b.highOrder, &b.centerX, &b.centerY, &b.squeeze};
    for (size_t i = 0; i < std::size(fields) && i < values.size(); ++i) *fields[i] = values[i];
    b.width = s.width;
    b.height = s.height;
    barrel_ = PfBarrel(b);
}

LoadedLens ModelPf::Load(const std::filesystem::path &path) {
    const lensfiles::PfbFile file = lensfiles::ReadPfbFile(path);
    LoadedLens lens;
    lens.firstFrame = file.firstFrame;
    for (const lensfiles::PfbRow &r : file.rows)
        lens.frames.push_back({r.lowOrder, r.highOrder, r.centerX, r.centerY, r.squeeze});
    if (!lens.frames.empty())
        for (size_t i = 0; i < lens.frames[0].size(); ++i) lens.values.emplace_back(int(i), lens.frames[0][i]);
    return lens;
}

bool ModelPf::MapDirect(double x, double y, double &ox, double &oy) const {
    const PfPoint p = barrel_.Direct({x, y});
    ox = p.x;
    oy = p.y;
    return std::isfinite(ox) && std::isfinite(oy);
}

bool ModelPf::MapInverse(double x, double y, double startX, double startY, double &ox, double &oy) const {
    const PfInverse r = barrel_.Inverse({x, y}, {startX, startY});
    ox = r.p.x;
    oy = r.p.y;
    return std::isfinite(ox) && std::isfinite(oy);
}

std::vector<std::unique_ptr<Model>> MakeModels() {
    std::vector<std::unique_ptr<Model>> models;
    for (auto &plugin : ldpk::make_models()) models.push_back(std::make_unique<ModelEq>(std::move(plugin)));
    models.push_back(std::make_unique<ModelPf>());
    return models;
}

} // namespace Orvane::lensdistort
