#include "host/color/ColorConfig.h"

#include <OpenColorIO/OpenColorIO.h>

#include <cstdlib>
#include <map>
#include <mutex>
#include <sstream>

#include "host/flow/OrvaneDoc.h"

namespace OCIO = OCIO_NAMESPACE;

namespace Orvane {

struct ColorProcessor::Impl {
    OCIO::ConstCPUProcessorRcPtr cpu;
};

struct ColorConfig::Impl {
    OCIO::ConstConfigRcPtr config;
    std::string source;
};

namespace {

// Scene-linear light with Rec.709 primaries is the reference. The encodings:
// sRGB and the BT.709 camera curve as power functions with a linear toe,
// Cineon printing density with black at code 95 and white at 685 (film gamma
// 0.6: 10^((c - 685) / 300), rescaled so that code 95 is 0), and Rec.2020
// primaries through the matrix from Rec.709 (D65 on both sides).
constexpr const char *kBuiltInConfig = R"(ocio_profile_version: 2.1
name: orvane-builtin
description: Orvane's built-in colour configuration
search_path: ""
strictparsing: true
luma: [0.2126, 0.7152, 0.0722]

roles:
  default: Linear Rec.709
  reference: Linear Rec.709
  scene_linear: Linear Rec.709
  rendering: Linear Rec.709
  data: Raw
  color_picking: sRGB
  texture_paint: sRGB
  matte_paint: sRGB
  color_timing: Cineon Log
  compositing_log: Cineon Log

file_rules:
  - !<Rule> {name: Default, colorspace: default}

displays:
  sRGB:
    - !<View> {name: Standard, colorspace: sRGB}
    - !<View> {name: Raw, colorspace: Raw}

active_displays: []
active_views: []

colorspaces:
  - !<ColorSpace>
    name: Linear Rec.709
    aliases: [linear, lin_rec709, lin_srgb]
    family: Linear
    encoding: scene-linear
    description: Linear light with the Rec.709 and sRGB primaries and a D65 white

  - !<ColorSpace>
    name: Linear Rec.2020
    aliases: [lin_rec2020]
    family: Linear
    encoding: scene-linear
    description: Linear light with the Rec.2020 primaries and a D65 white
    from_scene_reference: !<MatrixTransform> {matrix: [0.627403895934699, 0.329283038377884, 0.0433130656874167, 0, 0.0690972894471817, 0.919540395075459, 0.0113623154773596, 0, 0.0163914388751705, 0.0880133078772257, 0.895595253247604, 0, 0, 0, 0, 1]}

  - !<ColorSpace>
    name: sRGB
    aliases: [srgb_texture, srgb_display]
    family: Encoded
    encoding: sdr-video
    description: The sRGB curve (IEC 61966-2-1) over the Rec.709 primaries
    to_scene_reference: !<ExponentWithLinearTransform> {gamma: 2.4, offset: 0.055}

  - !<ColorSpace>
    name: Rec.709
    aliases: [rec709, bt709]
    family: Encoded
    encoding: sdr-video
    description: The BT.709 camera curve over the Rec.709 primaries
    to_scene_reference: !<ExponentWithLinearTransform> {gamma: 2.22222222222222, offset: 0.099}

  - !<ColorSpace>
    name: Cineon Log
    aliases: [cineon, log]
    family: Log
    encoding: log
    description: Printing-density log, black at code 95 and white at code 685 of 1023
    from_scene_reference: !<LogAffineTransform> {base: 10, log_side_slope: 0.293255131964809, log_side_offset: 0.669599217986315, lin_side_slope: 0.989202248376805, lin_side_offset: 0.0107977516231954}

  - !<ColorSpace>
    name: Raw
    family: Data
    encoding: data
    isdata: true
    description: Values that are not colour; no transform applies to them
)";

/// OpenColorIO's own messages go nowhere: failures reach the user through
/// the tools' console lines.
void QuietLibrary() {
    static std::once_flag once;
    std::call_once(once, [] { OCIO::SetLoggingLevel(OCIO::LOGGING_LEVEL_NONE); });
}

ColorProcessorPtr MakeProcessor(const OCIO::ConstProcessorRcPtr &proc) {
    auto impl = std::make_unique<ColorProcessor::Impl>();
    impl->cpu = proc->getOptimizedCPUProcessor(OCIO::BIT_DEPTH_F32, OCIO::BIT_DEPTH_F32, OCIO::OPTIMIZATION_DEFAULT);
    return std::make_shared<const ColorProcessor>(std::move(impl));
}

OCIO::Interpolation ToOcio(LUTInterpolation interp) {
    switch (interp) {
    case LUTInterpolation::Linear: return OCIO::INTERP_LINEAR;
    case LUTInterpolation::Tetrahedral: return OCIO::INTERP_TETRAHEDRAL;
    case LUTInterpolation::Best: return OCIO::INTERP_BEST;
    case LUTInterpolation::Default: break;
    }
    return OCIO::INTERP_DEFAULT;
}

} // namespace

ColorProcessor::ColorProcessor(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
ColorProcessor::~ColorProcessor() = default;

bool ColorProcessor::IsNoOp() const { return impl_->cpu->isNoOp(); }

void ColorProcessor::Apply(float *rgba, int count) const {
    if (count <= 0) return;
    OCIO::PackedImageDesc desc(rgba, count, 1, 4);
    impl_->cpu->apply(desc);
}

ColorProcessorPtr KeptColorProcessor::Get(const std::string &key,
                                          const std::function<ColorProcessorPtr(std::string *)> &make,
                                          std::string *error) {
    std::lock_guard<std::mutex> hold(lock_);
    if (kept_ && key == key_) return kept_;
    ColorProcessorPtr made = make(error);
    if (made) kept_ = made, key_ = key;
    return made;
}

ColorConfig::ColorConfig(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
ColorConfig::~ColorConfig() = default;

const char *ColorConfig::BuiltInText() { return kBuiltInConfig; }

std::shared_ptr<const ColorConfig> ColorConfig::BuiltIn() {
    static const std::shared_ptr<const ColorConfig> builtIn = [] {
        QuietLibrary();
        std::istringstream text(kBuiltInConfig);
        auto impl = std::make_unique<Impl>();
        impl->config = OCIO::Config::CreateFromStream(text);
        impl->source = "built-in";
        return std::make_shared<const ColorConfig>(std::move(impl));
    }();
    return builtIn;
}

std::shared_ptr<const ColorConfig> ColorConfig::Load(const std::string &path, std::string *error) {
    if (path.empty()) return BuiltIn();
    static std::mutex lock;
    static std::map<std::string, std::shared_ptr<const ColorConfig>> loaded;
    std::lock_guard<std::mutex> hold(lock);
    if (auto found = loaded.find(path); found != loaded.end()) return found->second;
    QuietLibrary();
    try {
        auto impl = std::make_unique<Impl>();
        impl->config = OCIO::Config::CreateFromFile(path.c_str());
        impl->source = path;
        auto config = std::make_shared<const ColorConfig>(std::move(impl));
        loaded.emplace(path, config);
        return config;
    } catch (const std::exception &e) {
        if (error) *error = "cannot read colour configuration '" + path + "': " + e.what();
        return nullptr;
    }
}

std::string ColorConfig::PathFor(const OrvaneDoc *doc) {
    if (doc && !doc->ColorConfigPath().empty()) return doc->MapPath(doc->ColorConfigPath());
    const char *env = std::getenv("OCIO");
    return env ? env : "";
}

std::shared_ptr<const ColorConfig> ColorConfig::ForDocument(const OrvaneDoc *doc, std::string *error) {
    return Load(PathFor(doc), error);
}

const std::string &ColorConfig::Source() const { return impl_->source; }

std::vector<ColorSpaceInfo> ColorConfig::Spaces() const {
    std::vector<ColorSpaceInfo> spaces;
    const OCIO::Config &config = *impl_->config;
    for (int i = 0; i < config.getNumColorSpaces(); ++i) {
        const OCIO::ConstColorSpaceRcPtr space = config.getColorSpace(config.getColorSpaceNameByIndex(i));
        if (!space) continue;
        ColorSpaceInfo info{space->getName(), space->getFamily(), space->getDescription(), {}, space->isData()};
        for (size_t a = 0; a < space->getNumAliases(); ++a) info.aliases.emplace_back(space->getAlias(a));
        spaces.push_back(std::move(info));
    }
    return spaces;
}

std::vector<std::pair<std::string, std::string>> ColorConfig::Roles() const {
    std::vector<std::pair<std::string, std::string>> roles;
    const OCIO::Config &config = *impl_->config;
    for (int i = 0; i < config.getNumRoles(); ++i)
        roles.emplace_back(config.getRoleName(i), config.getRoleColorSpace(i));
    return roles;
}

std::string ColorConfig::Resolve(const std::string &name) const {
    if (name.empty()) return {};
    return impl_->config->getCanonicalName(name.c_str());
}

ColorProcessorPtr ColorConfig::SpaceProcessor(const std::string &from, const std::string &to,
                                              std::string *error) const {
    for (const std::string *name : {&from, &to})
        if (Resolve(*name).empty()) {
            if (error) *error = "no colour space '" + *name + "' in the configuration " + Source();
            return nullptr;
        }
    try {
        return MakeProcessor(impl_->config->getProcessor(from.c_str(), to.c_str()));
    } catch (const std::exception &e) {
        if (error) *error = "cannot convert '" + from + "' to '" + to + "': " + e.what();
        return nullptr;
    }
}

ColorProcessorPtr ColorConfig::FileProcessor(const std::string &path, LUTInterpolation interp, bool inverse,
                                             std::string *error) {
    QuietLibrary();
    try {
        OCIO::FileTransformRcPtr file = OCIO::FileTransform::Create();
        file->setSrc(path.c_str());
        file->setInterpolation(ToOcio(interp));
        file->setDirection(inverse ? OCIO::TRANSFORM_DIR_INVERSE : OCIO::TRANSFORM_DIR_FORWARD);
        return MakeProcessor(OCIO::Config::CreateRaw()->getProcessor(file));
    } catch (const std::exception &e) {
        if (error) *error = "cannot read LUT file '" + path + "': " + e.what();
        return nullptr;
    }
}

ColorProcessorPtr ColorConfig::DescribedProcessor(const std::string &text, std::string *error) {
    QuietLibrary();
    // A configuration of two spaces, the second reached through the transform.
    const std::string configText = "ocio_profile_version: 2\n"
                                   "roles: {default: a}\n"
                                   "colorspaces:\n"
                                   "  - !<ColorSpace> {name: a}\n"
                                   "  - !<ColorSpace>\n"
                                   "    name: b\n"
                                   "    from_scene_reference: " +
                                   text + "\n";
    try {
        std::istringstream in(configText);
        return MakeProcessor(OCIO::Config::CreateFromStream(in)->getProcessor("a", "b"));
    } catch (const std::exception &e) {
        if (error) *error = std::string("cannot build the transform: ") + e.what();
        return nullptr;
    }
}

} // namespace Orvane
