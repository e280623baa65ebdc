#pragma once
// ColorConfig: the colour management configuration that colour spaces are
// found in, and the pixel processors made from it or from a LUT file. The
// work is done by OpenColorIO; nothing outside this file and its .cpp sees it.
//
// Which configuration a document uses, first found wins:
//   1. the document's preference ColorConfig (a file name, relative names
//      taken from the document's folder),
//   2. the environment variable OCIO,
//   3. the built-in configuration compiled into Orvane: scene-linear Rec.709
//      as the reference, sRGB, Rec.709, linear Rec.2020, Cineon log and raw
//      data, with roles and aliases (docs/COLOR_MANAGEMENT.md lists them).
// A configuration that cannot be read is an error naming the file; the
// built-in one is never used in its place.
//
// A ColorProcessor applies one optimised transform to RGBA float pixels;
// alpha passes unchanged.
//
// Thread safety: configurations and processors are immutable once made, and
// may be used from any number of threads at once. The functions that load
// configurations keep a cache under a lock, and are safe from any thread.
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class OrvaneDoc;

/// One transform made ready for the CPU.
class ORVANE_API ColorProcessor {
public:
    struct Impl;
    explicit ColorProcessor(std::unique_ptr<Impl> impl);
    ~ColorProcessor();
    ColorProcessor(const ColorProcessor &) = delete;
    ColorProcessor &operator=(const ColorProcessor &) = delete;

    /// True when the transform changes no value.
    bool IsNoOp() const;
    /// Applies the transform to `count` RGBA float pixels in place.
    void Apply(float *rgba, int count) const;

private:
    std::unique_ptr<Impl> impl_;
};

using ColorProcessorPtr = std::shared_ptr<const ColorProcessor>;

/// The processor last made for a tool's settings, kept under a key that
/// stands for them, so that it is built and optimised once and not per frame.
class ORVANE_API KeptColorProcessor {
public:
    /// The processor kept under `key`, made by `make` when the key changed
    /// (a failure, with `error` set by `make`, is not kept).
    ColorProcessorPtr Get(const std::string &key, const std::function<ColorProcessorPtr(std::string *)> &make,
                          std::string *error);

private:
    std::mutex lock_;
    std::string key_;
    ColorProcessorPtr kept_;
};

/// How a LUT file's table is read between its points: the file format's
/// own way, linear (1D) and trilinear (3D), tetrahedral (3D), or the best
/// the table's kind offers.
enum class LUTInterpolation : int { Default = 0, Linear = 1, Tetrahedral = 2, Best = 3 };

/// A colour space as a configuration lists it.
struct ColorSpaceInfo {
    std::string name, family, description;
    std::vector<std::string> aliases;
    bool isData = false;
};

class ORVANE_API ColorConfig {
public:
    struct Impl;
    explicit ColorConfig(std::unique_ptr<Impl> impl);
    ~ColorConfig();
    ColorConfig(const ColorConfig &) = delete;
    ColorConfig &operator=(const ColorConfig &) = delete;

    /// The configuration read from `path` (kept for the process: a second
    /// call gives the same object); null with `error` set when it cannot be
    /// read. An empty path gives the built-in configuration.
    static std::shared_ptr<const ColorConfig> Load(const std::string &path, std::string *error);
    static std::shared_ptr<const ColorConfig> BuiltIn();
    /// The built-in configuration as the text of a configuration file.
    static const char *BuiltInText();
    /// The file a document's colour work uses: its preference, else $OCIO,
    /// else "" (the built-in configuration). `doc` may be null.
    static std::string PathFor(const OrvaneDoc *doc);
    /// Load(PathFor(doc)).
    static std::shared_ptr<const ColorConfig> ForDocument(const OrvaneDoc *doc, std::string *error);

    /// Where it came from: the file name, or "built-in".
    const std::string &Source() const;
    std::vector<ColorSpaceInfo> Spaces() const;
    /// Roles and the colour space each names, in the configuration's order.
    std::vector<std::pair<std::string, std::string>> Roles() const;
    /// The colour space a name, role or alias stands for ("" when none).
    std::string Resolve(const std::string &name) const;

    /// From one colour space to another (names, roles or aliases); null with
    /// `error` naming the space that is not found.
    ColorProcessorPtr SpaceProcessor(const std::string &from, const std::string &to, std::string *error) const;

    /// A LUT file's transform, forward or inverse (a 3D table's inverse is
    /// found by search; a format that cannot be inverted is an error).
    /// Null with `error` naming the file when it cannot be read.
    static ColorProcessorPtr FileProcessor(const std::string &path, LUTInterpolation interp, bool inverse,
                                           std::string *error);

    /// A transform described in OpenColorIO's text form of one transform (a
    /// "!<MatrixTransform> {...}" or a "!<GroupTransform> {children: [...]}"
    /// entry); null with `error` when it does not parse.
    static ColorProcessorPtr DescribedProcessor(const std::string &text, std::string *error);

private:
    std::unique_ptr<Impl> impl_;
};

} // namespace Orvane
