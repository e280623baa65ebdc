#pragma once
// Helpers shared by the tests: loading the tool library once, making
// documents and tools, and small image utilities.
#include <string>

#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"

namespace Orvane::Test {

/// Loads liborvaneoperators from the build folder (fails the test if it cannot).
void LoadOperators();

/// A path under the source tree.
std::string SourcePath(const std::string &relative);

/// A fresh folder under the system's temporary folder, removed with all it
/// holds when the object goes.
struct TempDir {
    std::string path;
    TempDir();
    ~TempDir();
    TempDir(const TempDir &) = delete;
    TempDir &operator=(const TempDir &) = delete;
    std::string operator/(const std::string &name) const { return path + "/" + name; }
};

/// An RGBA float image of w x h with a deterministic, non-constant pattern
/// (values spread over -0.25..1.5 in every channel, alpha included).
Ref<Image> PatternImage(int w, int h, int depth = 8, unsigned seed = 1);

} // namespace Orvane::Test

namespace Orvane::Test {

/// A tool for tests that outputs a fixed image (a copy of its windows
/// without pixels in pre-calculation). Add it with AddImageSource.
class ImageSourceTool : public ThreadedOperator {
public:
    ImageSourceTool(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void SetImage(Ref<Image> img) { image_ = std::move(img); }
    void Process(Request *req) override;
    Output *Out() const { return output_; }
    int processCount = 0; ///< pixel requests served (pre-calculations not counted)

private:
    Ref<Image> image_;
    Output *output_;
};

/// Adds an ImageSourceTool named `name` that outputs `img`.
ImageSourceTool *AddImageSource(OrvaneDoc &doc, const std::string &name, Ref<Image> img);

/// Evaluates a tool's main output as an image (null on failure).
Ref<Image> EvalImage(Operator *op, double time = 0.0, const ImgRectI *roi = nullptr);

/// Sets a number input by ID; fails the test when the input is missing.
void SetNumber(Operator *op, const char *id, double value);
void SetPoint(Operator *op, const char *id, double x, double y);
void SetID(Operator *op, const char *id, const char *value);

} // namespace Orvane::Test
