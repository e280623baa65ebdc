// Loader and Saver in a document.
#include <gtest/gtest.h>

#include <filesystem>

#include "host/flow/Engine.h"
#include "host/flow/InputValue.h"
#include "host/flow/RenderTask.h"
#include "host/image/PixelMemory.h"
#include "host/media/Clip.h"
#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane::FmtTest {
namespace {

constexpr int W = 6, H = 4;

/// Frame k of the test sequence: R = 1000 k + x + 10 y, G 500, B 65535, alpha one half.
Ref<Image> Frame16(int k) {
    return MakeImage(W, H, DepthRGBAInt16, [k](int x, int y) {
        return Pixel{uint16_t(1000 * k + x + 10 * y), 500, 65535, 32768};
    });
}

class LoaderSaver : public FormatSuite {
protected:
    void SetUp() override {
        for (int k = 1; k <= 4; ++k) {
            Clip c(dir / "plate.0000.raw");
            c.SetStartFrame(1000 + k);
            std::string error;
            ASSERT_TRUE(c.PutFrameTagList(0, Frame16(k).Get(), {}, error)) << error;
        }
        loader = doc.AddTool(OvID("Loader"), "Plate");
        ASSERT_NE(loader, nullptr);
        Set(loader, {{"Clip", dir / "plate.1001.raw"}});
    }
    /// Sets inputs by ID, in order, as a document does.
    void Set(Operator *op, std::initializer_list<std::pair<const char *, ScriptVal>> values) {
        for (const auto &[id, v] : values) {
            Input *in = op->FindInput(id);
            ASSERT_NE(in, nullptr) << id;
            ASSERT_EQ(ApplyInputValue(doc, in, v), "") << id;
        }
    }
    /// The file number a time shows (R of pixel 0,0 / 1000), -1 for no image.
    int FileAt(double t) {
        Ref<Image> img = Orvane::Test::EvalImage(loader, t);
        return img ? At(*img, 0, 0).R / 1000 : -1;
    }
    /// Evaluates a tool's main output for a render task.
    static Ref<Parameter> Render(Operator *op, double t, RenderTask &task, uint32_t flags = 0) {
        EvalOptions options;
        options.task = &task, options.flags = flags;
        return Evaluate(op->FindMainOutput(), t, options);
    }
    /// The frame a file holds, read back through a clip.
    static Ref<Image> ReadBack(const std::string &path) {
        std::string error;
        Ref<Image> img = Clip(path).GetFrameTagList(0, {}, error);
        EXPECT_TRUE(img) << error;
        return img;
    }
    std::string LastConsole() {
        const auto lines = doc.ConsoleLines();
        return lines.empty() ? std::string() : lines.back().text;
    }

    TempDir dir;
    OrvaneDoc doc;
    Operator *loader = nullptr;
};

TEST_F(LoaderSaver, LoaderPlacesTheSequenceOnTheTimeLine) {
    // The clip's length fills the trims and the out point.
    EXPECT_EQ(Orvane::Test::EvalImage(loader, 0)->Width(), W);
    Set(loader, {{"GlobalIn", 10}, {"HoldFirstFrame", 1}});
    EXPECT_EQ(loader->FindInput("GlobalOut")->Constant()->ToScript().AsNumber(), 14);
    const int expected[] = {1, 1, 2, 3, 4};
    for (int i = 0; i < 5; ++i) EXPECT_EQ(FileAt(10 + i), expected[i]) << i;
    EXPECT_EQ(FileAt(9), -1);
    EXPECT_EQ(LastConsole(), "Plate: no clip at frame 9 (the first starts later)");
    EXPECT_EQ(FileAt(15), -1);
    EXPECT_NE(LastConsole().find("Plate"), std::string::npos);
    Set(loader, {{"Reverse", 1}});
    for (auto [t, file] : {std::pair{10, 4}, {14, 1}}) EXPECT_EQ(FileAt(t), file) << t;
    Set(loader, {{"Loop", 1}, {"Reverse", 0}});
    for (auto [t, file] : {std::pair{15, 1}, {17, 2}}) EXPECT_EQ(FileAt(t), file) << t;
    // The trims choose the files used (looping the two used frames).
    Set(loader, {{"ClipTimeStart", 2}, {"HoldFirstFrame", 0}});
    for (auto [t, file] : {std::pair{10, 3}, {11, 4}, {12, 3}}) EXPECT_EQ(FileAt(t), file) << t;
}

TEST_F(LoaderSaver, MissingFramesFillHoldOrFail) {
    std::filesystem::remove(dir / "plate.1002.raw");
    // A colour, before anything was read: sized from the header of a frame that exists, not from the document.
    Set(loader, {{"MissingFrames", 2}, {"Red", 0.25}, {"Alpha", 1}});
    ASSERT_NE(doc.GetFrameFormat().width, W);
    Ref<Image> filled = Orvane::Test::EvalImage(loader, 1);
    ASSERT_TRUE(filled);
    EXPECT_EQ(filled->DataWindow(), ImgRectI(0, 0, W, H));
    EXPECT_EQ(filled->GetFlt(2, 2), (FltPixel{0.25f, 0.f, 0.f, 1.f}));
    Set(loader, {{"MissingFrames", 1}});
    EXPECT_EQ(std::pair(FileAt(1), FileAt(2)), std::pair(1, 3));
    // Failing names the file once, and the frame by the file's own number.
    Set(loader, {{"MissingFrames", 0}});
    EXPECT_EQ(FileAt(1), -1);
    EXPECT_EQ(LastConsole(), "Plate failed to load file \"" + (dir / "plate.1002.raw") +
                                 "\" (frame 1002) : No such file or directory");
}

TEST_F(LoaderSaver, AHeaderAskingForMoreThanTheMemoryLimitIsRefusedBeforeAllocating) {
    // A 100 x 59 OpenEXR file whose header claims a data window 100000 wide.
    Bytes exr = Save("OpenEXRFormat", Orvane::Test::PatternImage(100, 59).Get());
    const std::string key("dataWindow\0box2i\0", 17);
    const auto at = std::search(exr.begin(), exr.end(), key.begin(), key.end());
    ASSERT_NE(at, exr.end());
    const int32_t x1 = 99999;
    std::memcpy(&*(at + 17 + 4 + 8), &x1, 4); // after the size, x0 and y0
    WriteFile(dir / "huge.exr", exr);
    Set(loader, {{"Clip", dir / "huge.exr"}});
    struct Restore {
        ~Restore() { SetPixelMemoryLimit(0); }
    } restore;
    SetPixelMemoryLimit(size_t(64) << 20, "--memory-limit");
    ResetPixelMemoryPeak();
    const size_t before = PixelMemoryInUse();
    EXPECT_FALSE(Orvane::Test::EvalImage(loader, 0));
    EXPECT_LT(PixelMemoryPeak() - before, size_t(1) << 20);
    EXPECT_EQ(LastConsole(), "Plate failed to load file \"" + (dir / "huge.exr") +
                                 "\" : needs 91 MiB for the 100000x59 RGBA float32 image its header describes; "
                                 "--memory-limit is 64 MiB");
}

TEST_F(LoaderSaver, AlphaOptionsAndDepth) {
    Set(loader, {{"PostMultiplyByAlpha", 1}});
    Ref<Image> post = Orvane::Test::EvalImage(loader, 0);
    ASSERT_TRUE(post);
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            const double r = 1000 + x + 10 * y;
            EXPECT_EQ(At(*post, x, y).R, std::lround(r * 32768 / 65535)) << x << "," << y;
        }
    Set(loader, {{"PostMultiplyByAlpha", 0}, {"InvertAlpha", 1}});
    EXPECT_EQ(Orvane::Test::EvalImage(loader, 0)->GetFlt(0, 0).A * 65535.0f, 32767.0f);
    Set(loader, {{"MakeAlphaSolid", 1}});
    EXPECT_EQ(Orvane::Test::EvalImage(loader, 0)->GetFlt(0, 0).A, 0.0f); // solid, inverted
    Set(loader, {{"InvertAlpha", 0}, {"Depth", 5}});                     // float32
    Ref<Image> flt = Orvane::Test::EvalImage(loader, 0);
    ASSERT_TRUE(flt && flt->IsRGBAFlt128());
    EXPECT_FLOAT_EQ(flt->GetFlt(3, 1).R, 1013.0f / 65535.0f);
    EXPECT_EQ(flt->GetFlt(3, 1).A, 1.0f);
}

TEST_F(LoaderSaver, ProxyRendersAreShrunkByWholeFactors) {
    RenderTask task;
    task.proxyScale = 2;
    Ref<Parameter> v = Render(loader, 0, task, ReqFlagProxy);
    auto *img = dynamic_cast<Image *>(v.Get());
    ASSERT_NE(img, nullptr);
    EXPECT_EQ(std::pair(img->Width(), img->Height()), std::pair(W / 2, H / 2));
    // Each pixel averages a 2 x 2 block: R = 1000 + 2x + 20y + (0 + 1 + 10 + 11) / 4.
    EXPECT_NEAR(img->GetFlt(1, 1).R * 65535.0f, 1000 + 2 + 20 + 5.5, 0.51);
}

TEST_F(LoaderSaver, SaverNumbersFilesAndWritesOnlyInRenders) {
    Operator *saver = doc.AddTool(OvID("Saver"), "Out");
    ASSERT_NE(saver, nullptr);
    ASSERT_TRUE(saver->FindInput("Input")->ConnectTo(loader->FindMainOutput()));
    Set(saver, {{"Clip", dir / "out/shot.0000.raw"}, {"SequenceStartFrame", 1000}});
    Set(loader, {{"GlobalIn", 3}});
    RenderTask task;
    task.startTime = 3;
    auto render = [&](double t) { return Render(saver, t, task); };

    // Without "Create Folder During Render" a missing folder fails the frame.
    EXPECT_FALSE(render(5));
    EXPECT_EQ(LastConsole(), "Out failed to write " + (dir / "out/shot.1005.raw") + ": the folder does not exist");
    Set(saver, {{"CreateDir", 1}});
    ASSERT_TRUE(render(5));
    EXPECT_EQ(saver->FrameFileName(5, &task), dir / "out/shot.1005.raw");
    // The file holds the loaded frame exactly.
    Ref<Image> read = ReadBack(dir / "out/shot.1005.raw");
    ASSERT_TRUE(read);
    EXPECT_EQ(At(*read, 4, 2).R, 3000 + 4 + 20);

    // Saver-relative numbering counts from the render's first frame.
    Set(saver, {{"SetSequenceStart", 1}});
    ASSERT_TRUE(render(5));
    EXPECT_TRUE(std::filesystem::exists(dir / "out/shot.1002.raw"));
    EXPECT_EQ(saver->FrameFileName(5, nullptr), dir / "out/shot.1005.raw"); // from the global start, 0

    // Each file written is noted on the task, in order.
    const auto noted = task.FilesWritten();
    ASSERT_EQ(noted.size(), 2u);
    EXPECT_EQ(noted[1].tool, "Out");
    EXPECT_EQ(noted[1].path, dir / "out/shot.1002.raw");

    // An interactive look passes the image on and writes nothing.
    task.interactive = true;
    EXPECT_TRUE(Render(saver, 6, task, ReqFlagInteractive));
    EXPECT_FALSE(std::filesystem::exists(dir / "out/shot.1003.raw"));
}

TEST_F(LoaderSaver, TheOutputFormatFollowsTheExtensionUnlessAnotherWasChosen) {
    // Documents set inputs in any order: the result must not depend on it.
    const std::pair<std::vector<std::pair<const char *, const char *>>, const char *> cases[] = {
        {{{"Clip", "a.tga"}}, "TargaFormat"},
        {{{"Clip", "a.tga"}, {"OutputFormat", "PNGFormat"}}, "PNGFormat"},
        {{{"OutputFormat", "PNGFormat"}, {"Clip", "a.tga"}}, "PNGFormat"},
        {{{"OutputFormat", "OpenEXRFormat"}, {"Clip", "a.png"}}, "OpenEXRFormat"}, // the default, set explicitly
        {{{"OutputFormat", "TargaFormat"}, {"Clip", "a.tga"}, {"Clip", "b.png"}}, "PNGFormat"},
        {{{"Clip", "a.tga"}, {"OutputFormat", "PNGFormat"}, {"Clip", "b.png"}, {"Clip", "c.tga"}}, "TargaFormat"},
        {{{"Clip", "a.unknown"}}, "OpenEXRFormat"},
    };
    int n = 0;
    for (const auto &[steps, format] : cases) {
        Operator *saver = doc.AddTool(OvID("Saver"), "Out" + std::to_string(++n));
        for (const auto &[id, value] : steps) Set(saver, {{id, value}});
        EXPECT_EQ(saver->FindInput("OutputFormat")->Constant()->ToScript().AsText(), format) << n;
        // Resetting the choice hands the format back to the extension at once.
        Set(saver, {{"Clip", "z.tga"}});
        saver->FindInput("OutputFormat")->ResetValue();
        EXPECT_EQ(saver->FindInput("OutputFormat")->Constant()->ToScript().AsText(), "TargaFormat") << n;
    }
}

TEST_F(LoaderSaver, SaverCutsToTheFrameAndCanSaveAlphaAsColor) {
    ImgRectI window(-2, -1, 10, 7);
    Ref<Image> src =
        NewImageTagList({{ImgWidth, 8}, {ImgHeight, 6}, {ImgDepth, DepthRGBAFlt32}, {ImgDataWindow, &window}});
    src->AllocScanLineData();
    src->Fill(FltPixel{0.5f, 0.25f, 0.125f, 0.75f});
    Orvane::Test::AddImageSource(doc, "Src", src);
    Operator *saver = doc.AddTool(OvID("Saver"), "Out");
    ASSERT_TRUE(saver->FindInput("Input")->ConnectTo(doc.FindTool("Src")->FindMainOutput()));
    Set(saver, {{"Clip", dir / "cut.raw"}, {"SaveAlphaToColor", 1}});
    RenderTask task;
    ASSERT_TRUE(Render(saver, 0, task));
    Ref<Image> read = ReadBack(dir / "cut.raw");
    ASSERT_TRUE(read);
    EXPECT_EQ(read->DataWindow(), ImgRectI(0, 0, 8, 6));
    EXPECT_EQ(read->GetFlt(3, 3), (FltPixel{0.75f, 0.75f, 0.75f, 0.75f}));
}

} // namespace
} // namespace Orvane::FmtTest
