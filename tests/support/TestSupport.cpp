#include "tests/support/TestSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/image/NewImage.h"

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

std::string SourcePath(const std::string &relative) { return std::string(ORVANE_SOURCE_DIR) + "/" + relative; }

Ref<Image> PatternImage(int w, int h, int depth, unsigned seed) {
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, h}, {ImgDepth, depth}});
    img->AllocScanLineData();
    uint32_t state = seed * 2654435761u + 12345u;
    auto next = [&state] {
        state = state * 1664525u + 1013904223u;
        return (state >> 8) * (1.0f / 16777216.0f);
    };
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const float r = -0.25f + 1.75f * next(), g = -0.25f + 1.75f * next();
            const float b = -0.25f + 1.75f * next(), a = -0.25f + 1.75f * next();
            img->PutFlt(x, y, {r, g, b, a});
        }
    return img;
}

} // namespace Orvane::Test

#include "host/core/Registry.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Request.h"

namespace Orvane::Test {
namespace {

const OvID ImageSourceClass("TestImageSource");

Object *MakeImageSource(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new ImageSourceTool(reg, args, tags);
}

const Registry *ImageSourceRow() {
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeImageSource},
                     {RegTypeFlags, static_cast<long long>(RegKindOperator | RegKindTool | RegKindSource)},
                     {RegName, "Test Image Source"},
                     {RegAbbreviation, "Src"},
                     {RegNoBlendControls, 1},
                     {RegNoEffectMask, 1},
                     {RegSupportsRoI, 1},
                     {RegSupportsDoD, 1}};
        return Registry::_Init(&ClassRegistry, ImageSourceClass, tags);
    }();
    return row;
}

} // namespace

ImageSourceTool::ImageSourceTool(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ThreadedOperator(reg, args, tags) {
    output_ = AddOutputTagList("Output", "Output", {{LinkDataType, CLSID_DataType_Image}, {LinkMain, 1}});
}

void ImageSourceTool::Process(Request *req) {
    if (!image_) {
        req->SetOutputData(output_, nullptr);
        return;
    }
    if (req->IsPreCalc()) {
        const ImgRectI dw = image_->DataWindow();
        const FltPixel canvas = image_->GetCanvasColor();
        Ref<Image> shape = NewImageTagList(
            {{ImgLikeImage, image_.Get()}, {ImgDataWindow, &dw}, {ImgNoData, 1}, {ImgCanvasColor, &canvas}});
        req->SetOutputData(output_, shape.Get());
        return;
    }
    ++processCount;
    req->SetOutputData(output_, image_.Get());
}

ImageSourceTool *AddImageSource(OrvaneDoc &doc, const std::string &name, Ref<Image> img) {
    ImageSourceRow();
    auto *tool = dynamic_cast<ImageSourceTool *>(doc.AddTool(ImageSourceClass, name));
    EXPECT_NE(tool, nullptr);
    if (tool) tool->SetImage(std::move(img));
    return tool;
}

Ref<Image> EvalImage(Operator *op, double time, const ImgRectI *roi) {
    EvalOptions opt;
    if (roi) opt.roi = ImageDomain(*roi);
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), time, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

void SetNumber(Operator *op, const char *id, double value) {
    Input *in = op->FindInput(id);
    ASSERT_NE(in, nullptr) << "no input " << id;
    ASSERT_TRUE(in->SetValue(MakeRef<Number>(value))) << id;
}

void SetPoint(Operator *op, const char *id, double x, double y) {
    Input *in = op->FindInput(id);
    ASSERT_NE(in, nullptr) << "no input " << id;
    ASSERT_TRUE(in->SetValue(MakeRef<Point>(x, y))) << id;
}

void SetID(Operator *op, const char *id, const char *value) {
    Input *in = op->FindInput(id);
    ASSERT_NE(in, nullptr) << "no input " << id;
    ASSERT_TRUE(in->SetValue(MakeRef<IDValue>(OvID(value)))) << id;
}

} // namespace Orvane::Test
