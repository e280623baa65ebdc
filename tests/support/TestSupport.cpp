#include "tests/support/TestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "host/app/Application.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"
#include "host/image/TransformMatrix.h"

namespace Orvane::Test {

void LoadOperators() {
    std::string error;
    const std::string path = std::string(ORVANE_BINARY_DIR) + "/liborvaneoperators.so";
    ASSERT_TRUE(GetApp()->LoadModule(path, error)) << "cannot load the tool library: " << error;
}

TempDir::TempDir() {
    std::string pattern = (std::filesystem::temp_directory_path() / "orvane-test-XXXXXX").string();
    EXPECT_NE(mkdtemp(pattern.data()), nullptr) << pattern;
    path = pattern;
}

TempDir::~TempDir() {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
}

Ref<Image> PatternImage(int w, int h, int depth, unsigned seed) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    uint32_t state = seed * 2654435761u + 12345u;
    auto next = [&state] {
        state = state * 1664525u + 1013904223u;
        return -0.25f + 1.75f * ((state >> 8) * (1.0f / 16777216.0f));
    };
    for (int y = 0; y < h; ++y) // a braced list evaluates its elements in order: R, G, B, A
        for (int x = 0; x < w; ++x) img->PutFlt(x, y, {next(), next(), next(), next()});
    return img;
}

Ref<Image> WindowedImage(int w, int h, const ImgRectI &dw, const FltPixel &canvas, unsigned seed, int depth) {
    Ref<Image> pattern = PatternImage(dw.Width(), dw.Height(), 8, seed);
    Ref<Image> img = NewImageTagList(
        {{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}, {ImgDataWindow, &dw}, {ImgCanvasColor, &canvas}});
    img->AllocScanLineData();
    for (int y = dw.y0; y < dw.y1; ++y)
        for (int x = dw.x0; x < dw.x1; ++x) img->PutFlt(x, y, pattern->GetFlt(x - dw.x0, y - dw.y0));
    return img;
}

std::string RectText(const ImgRectI &r) {
    return "(" + std::to_string(r.x0) + "," + std::to_string(r.y0) + "," + std::to_string(r.x1) + "," +
           std::to_string(r.y1) + ")";
}

std::string ConsoleText(const OrvaneDoc &doc) {
    std::string text;
    for (const ConsoleLine &line : doc.ConsoleLines()) {
        const char *kind = line.code == ConsoleError ? "error: " : line.code == ConsoleWarning ? "warning: " : "";
        text += kind + line.text + "\n";
    }
    return text;
}

void ExpectPixelNear(const FltPixel &got, const FltPixel &want, double tol, const std::string &where) {
    EXPECT_NEAR(got.R, want.R, tol) << where << " red";
    EXPECT_NEAR(got.G, want.G, tol) << where << " green";
    EXPECT_NEAR(got.B, want.B, tol) << where << " blue";
    EXPECT_NEAR(got.A, want.A, tol) << where << " alpha";
}

namespace {

OvID RegisterToolWith(const char *id, ClassFactory make, const TagList &attrs) {
    if (ClassRegistry && ClassRegistry->Find(OvID(id))) return OvID(id);
    TagList tags{{RegConstructor, make}, {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool)}};
    tags.Merge(attrs);
    Registry::_Init(&ClassRegistry, OvID(id), tags);
    return OvID(id);
}

OvID ImageSourceClass() {
    return RegisterTestTool("TestImageSource", &MakeTool<ImageSourceTool>,
                            {{RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                             {RegName, "Test Image Source"},
                             {RegAbbreviation, "Src"}});
}

} // namespace

OvID RegisterTestTool(const char *id, ClassFactory make, std::initializer_list<TagItem> extra) {
    TagList attrs{{RegNoBlendControls, 1}, {RegNoEffectMask, 1}, {RegSupportsRoI, 1}, {RegSupportsDoD, 1}};
    for (const TagItem &a : extra) attrs.Set(a);
    return RegisterToolWith(id, make, attrs);
}

Input *AddIn(Operator *op, const char *id, OvID type, TagList tags) {
    tags.Set({LinkDataType, type});
    return op->AddInputTagList(id, id, tags);
}

Input *AddImageIn(Operator *op, TagList tags) {
    tags.Set({LinkMain, 1});
    return AddIn(op, "Input", CLSID_DataType_Image, tags);
}

Output *AddImageOut(Operator *op) {
    return op->AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

AnimCurve NumberCurve(const std::vector<std::pair<double, double>> &keys, KeyInterp interp) {
    AnimCurve curve;
    for (const auto &[t, v] : keys) curve.SetKey(t, MakeRef<Number>(v), interp);
    return curve;
}

ImageSourceTool::ImageSourceTool(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags), output_(AddImageOut(this)) {}

void ImageSourceTool::Process(Request *req) {
    if (!image_) return req->SetOutputData(output_, nullptr);
    if (req->IsPreCalc()) {
        const ImgRectI dw = image_->DataWindow();
        const FltPixel canvas = image_->GetCanvasColor();
        return req->SetOutputData(
            output_,
            NewImageTagList(
                {{ImgLikeImage, image_.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}}));
    }
    ++processCount;
    asked.push_back(req->RoI());
    if (cutToRegion && req->RoI() && !req->RoI()->rect.Contains(image_->DataWindow())) {
        const ImgRectI cut = image_->DataWindow() & req->RoI()->rect;
        return req->SetOutputData(output_, image_->CopyOfImageTagList({{ImgDataWindow, &cut}}).Get());
    }
    req->SetOutputData(output_, image_.Get());
}

ImageSourceTool *AddImageSource(OrvaneDoc &doc, const std::string &name, Ref<Image> img) {
    auto *tool = dynamic_cast<ImageSourceTool *>(doc.AddTool(ImageSourceClass(), name));
    EXPECT_NE(tool, nullptr);
    if (tool) tool->SetImage(std::move(img));
    return tool;
}

ValueProbe::ValueProbe(const Registry *reg, const ScriptVal &args, const TagList &tags, bool takesTransforms)
    : ThreadedOperator(reg, args, tags) {
    input_ =
        AddImageIn(this, takesTransforms ? TagList{{LinkSecondDataType, CLSID_DataType_TransformMatrix}} : TagList{});
    output_ = AddImageOut(this);
}

void ValueProbe::Process(Request *req) {
    Parameter *v = req->GetInputData(input_);
    if (!req->IsPreCalc())
        seen.emplace_back(v);
    else
        dod = req->GetInputDoD(input_);
    TagList cut{{WorkRequest, static_cast<const void *>(req)}};
    const AutoImageRoI roi(req);
    if (roi) cut.Set({ImgDataWindow, &roi->rect});
    Ref<Image> pixels = ImageOfValue(v, cut);
    req->SetOutputData(output_, pixels ? pixels.Get() : v);
}

template <bool TakesTransforms> Object *MakeValueProbe(const Registry *r, const ScriptVal &a, const TagList &t) {
    return new ValueProbe(r, a, t, TakesTransforms);
}

ValueProbe *AddValueProbe(OrvaneDoc &doc, Operator *src, bool takesTransforms) {
    static const OvID takes = RegisterTestTool("TestTakesTransforms", &MakeValueProbe<true>);
    static const OvID images = RegisterTestTool("TestTakesImages", &MakeValueProbe<false>);
    auto *probe = dynamic_cast<ValueProbe *>(doc.AddTool(takesTransforms ? takes : images));
    EXPECT_TRUE(probe && probe->FindInput("Input")->ConnectTo(src->FindMainOutput()));
    return probe;
}

Ref<Image> EvalImage(Operator *op, double time, const ImgRectI *roi) {
    return EvalImage(op, time, EvalOptions{.roi = roi ? std::optional(ImageDomain(*roi)) : std::nullopt});
}

Ref<Image> EvalImage(Operator *op, double time, const EvalOptions &options) {
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), time, options);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

OvID RegisterTool(const char *id, ClassFactory make, std::initializer_list<TagItem> attrs) {
    return RegisterToolWith(id, make, TagList(attrs));
}

namespace {
void SetValue(Operator *op, const char *id, Ref<Parameter> value) {
    Input *in = op->FindInput(id);
    ASSERT_NE(in, nullptr) << "no input " << id;
    ASSERT_TRUE(in->SetValue(std::move(value))) << id;
}
} // namespace

void SetNumber(Operator *op, const char *id, double value) { SetValue(op, id, MakeRef<Number>(value)); }

void SetNumbers(Operator *op, const std::vector<std::pair<const char *, double>> &values) {
    for (const auto &[id, value] : values) SetNumber(op, id, value);
}

void SetPoint(Operator *op, const char *id, double x, double y) { SetValue(op, id, MakeRef<Point>(x, y)); }
void SetID(Operator *op, const char *id, const char *value) { SetValue(op, id, MakeRef<IDValue>(OvID(value))); }
void SetText(Operator *op, const char *id, const std::string &value) { SetValue(op, id, MakeRef<Text>(value)); }

} // namespace Orvane::Test
