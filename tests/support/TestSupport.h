#pragma once
// Helpers shared by the tests: the tool library, test tools in documents, small image utilities.
#include <initializer_list>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "host/core/Registry.h"
#include "host/flow/AnimCurve.h"
#include "host/flow/Engine.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"

namespace Orvane::Test {

/// Loads liborvaneoperators from the build folder (fails the test if it cannot).
void LoadOperators();

/// A fresh folder under the system's temporary folder, removed with all it holds when the object goes.
struct TempDir {
    std::string path;
    TempDir();
    ~TempDir();
    TempDir(const TempDir &) = delete;
    TempDir &operator=(const TempDir &) = delete;
    std::string operator/(const std::string &name) const { return path + "/" + name; }
};

/// An RGBA image of w x h with a deterministic pattern (values over -0.25..1.5 in every channel, alpha included).
Ref<Image> PatternImage(int w, int h, int depth = 8, unsigned seed = 1);

/// A w x h image whose data window `dw` holds PatternImage's pattern (from dw's corner), with `canvas` outside.
Ref<Image> WindowedImage(int w, int h, const ImgRectI &dw, const FltPixel &canvas, unsigned seed, int depth = 8);

/// "(x0,y0,x1,y1)", for comparisons whose failure should read well.
std::string RectText(const ImgRectI &r);

/// The document's console, a line each: "error: text", "warning: text" or the text of any other code.
std::string ConsoleText(const OrvaneDoc &doc);

/// Expects each channel of `got` within `tol` of `want`.
void ExpectPixelNear(const FltPixel &got, const FltPixel &want, double tol, const std::string &where = "");

/// A tool that outputs a fixed image (its windows without pixels in pre-calculation). Add it with AddImageSource.
class ImageSourceTool : public ThreadedOperator {
public:
    ImageSourceTool(const Registry *reg, const ScriptVal &args, const TagList &tags);
    void SetImage(Ref<Image> img) { image_ = std::move(img); }
    void Process(Request *req) override;
    Output *Out() const { return output_; }
    int processCount = 0; ///< pixel requests served (pre-calculations not counted)
    /// The regions of interest of the pixel requests so far (absent: the whole frame).
    std::vector<std::optional<ImageDomain>> asked;
    /// When set, a pixel request gets only the part of the image it asks for (the rest is canvas).
    bool cutToRegion = false;

private:
    Ref<Image> image_;
    Output *output_;
};

/// Registers a test tool class `id` made by `make` (an operator tool with regions and domains, no blend or effect mask
/// controls, `extra` on top); returns its ID.
OvID RegisterTestTool(const char *id, ClassFactory make, std::initializer_list<TagItem> extra = {});

/// One T for the whole test program, made on first use (classes of test tools are registered this way).
template <class T> const T &Once() {
    static const T once;
    return once;
}

/// Adds an input whose name and ID are `id`, of data type `type`, `tags` on top.
Input *AddIn(Operator *op, const char *id, OvID type, TagList tags = {});
/// The main image input "Input" (`tags` on top) and the main image output "Output".
Input *AddImageIn(Operator *op, TagList tags = {});
Output *AddImageOut(Operator *op);

/// A curve of numbers with one key per (time, value), all of `interp`.
AnimCurve NumberCurve(const std::vector<std::pair<double, double>> &keys, KeyInterp interp = KeyInterp::Linear);

/// Adds an ImageSourceTool named `name` that outputs `img`.
ImageSourceTool *AddImageSource(OrvaneDoc &doc, const std::string &name, Ref<Image> img);

/// A test tool that notes the value it gets on its image input (and, in a pre-calculation, the input's domain) and
/// hands on that value's pixels (or the value itself when it has none). With `takesTransforms` its input also takes a
/// pending transform.
class ValueProbe : public ThreadedOperator {
public:
    ValueProbe(const Registry *reg, const ScriptVal &args, const TagList &tags, bool takesTransforms);
    void Process(Request *req) override;
    std::vector<Ref<Parameter>> seen; ///< values of the pixel requests
    std::optional<ImageDomain> dod;   ///< the input's domain, as the engine told it

private:
    Input *input_;
    Output *output_;
};

/// Adds a ValueProbe reading `src`'s main output.
ValueProbe *AddValueProbe(OrvaneDoc &doc, Operator *src, bool takesTransforms);

/// Evaluates a tool's main output as an image (null on failure).
Ref<Image> EvalImage(Operator *op, double time = 0.0, const ImgRectI *roi = nullptr);
Ref<Image> EvalImage(Operator *op, double time, const EvalOptions &options);

/// Makes a T from the three arguments every tool constructor takes.
template <class T> Object *MakeTool(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new T(reg, args, tags);
}

/// Enters a tool class in the class registry (an operator tool made by `make`, `attrs` on top) and gives its ID.
OvID RegisterTool(const char *id, ClassFactory make, std::initializer_list<TagItem> attrs = {});

/// Set inputs by ID (several numbers in order); fail the test when an input is missing or refuses the value.
void SetNumber(Operator *op, const char *id, double value);
void SetNumbers(Operator *op, const std::vector<std::pair<const char *, double>> &values);
void SetPoint(Operator *op, const char *id, double x, double y);
void SetID(Operator *op, const char *id, const char *value);
void SetText(Operator *op, const char *id, const std::string &value);

} // namespace Orvane::Test
