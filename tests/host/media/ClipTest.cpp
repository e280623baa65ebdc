// Clips: frames of a sequence read and written through a format, with the
// format found by extension and check, and frames written atomically.
#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>
#include <unistd.h>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/media/Clip.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormatList.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cliptest {
namespace {

/// A tiny format for these tests: "TFMT", width, height, then RGBA floats.
class TestFormat : public ImageFormat {
public:
    using ImageFormat::ImageFormat;
    bool CheckFormat(IOClass *io) override {
        char magic[4];
        return io->ReadExact(magic, 4) && std::memcmp(magic, "TFMT", 4) == 0;
    }
    bool LoadHeader(IOClass *stream) override {
        char magic[4];
        int32_t size[2];
        if (!stream->ReadExact(magic, 4) || !stream->ReadExact(size, sizeof size)) return Fail("short header");
        width = size[0] / proxyScale, height = size[1] / proxyScale, depth = DepthRGBAFlt32;
        return width > 0 && height > 0 ? true : Fail("bad size");
    }
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override {
        if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
        if (image->IsNoData()) return true;
        if (!image->AllocScanLineData()) return Fail("no memory");
        for (int y = 0; y < height; ++y) {
            std::vector<float> row(4 * static_cast<size_t>(width));
            if (!io->ReadExact(row.data(), static_cast<int64_t>(row.size() * sizeof(float)))) return Fail("short row");
            for (int x = 0; x < width; ++x)
                image->PutFlt(x, y, {row[4 * x], row[4 * x + 1], row[4 * x + 2], row[4 * x + 3]});
        }
        return true;
    }
    bool SaveHeader(IOClass *stream, Image *image) override {
        const int32_t size[2] = {image->Width(), image->Height()};
        return stream->WriteExact("TFMT", 4) && stream->WriteExact(size, sizeof size) ? true : Fail("short write");
    }
    bool SaveFrame(unsigned, Image *image) override {
        if (failWrites) return Fail("told to fail");
        for (int y = 0; y < image->Height(); ++y)
            for (int x = 0; x < image->Width(); ++x) {
                const FltPixel p = image->GetFlt(x, y);
                if (!io->WriteExact(&p, sizeof p)) return Fail("short write");
            }
        return true;
    }
    static inline bool failWrites = false;
};

Object *MakeTestFormat(const Registry *reg, const ScriptVal &args, const TagList &tags) {
    return new TestFormat(reg, args, tags);
}

void RegisterOnce() {
    static const Registry *row = [] {
        TagList tags{{RegConstructor, &MakeTestFormat},
                     {RegTypeFlags, static_cast<long long>(RegFamilyImageFormat)},
                     {RegFormatName, "Test Frames"},
                     {RegFormatExtension, ".tfmt"},
                     {RegFormatCanLoad, 1},
                     {RegFormatCanSave, 1}};
        return Registry::_Init(&ClassRegistry, OvID("TestFrameFormat"), tags);
    }();
    (void)row;
}

struct TempDir {
    std::filesystem::path path =
        std::filesystem::temp_directory_path() / ("orvane-clip-" + std::to_string(getpid()) + "-" + Name());
    TempDir() { std::filesystem::create_directories(path); }
    ~TempDir() { std::filesystem::remove_all(path); }
    static std::string Name() { return ::testing::UnitTest::GetInstance()->current_test_info()->name(); }
};

TEST(Clip, WritesASequenceAndReadsItBackWithItsFramesAndGaps) {
    RegisterOnce();
    TempDir dir;
    Clip out((dir.path / "deep/folder/shot.0000.tfmt").string());
    out.SetStartFrame(1001);
    Ref<Image> img = Orvane::Test::PatternImage(5, 3);
    std::string error;
    // Missing folders are made only when asked for.
    EXPECT_FALSE(out.PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_FALSE(std::filesystem::exists(dir.path / "deep"));
    for (int64_t f : {0, 1, 3})
        ASSERT_TRUE(out.PutFrameTagList(f, img.Get(), {{ClipFrameMakeFolders, 1}}, error)) << error;
    EXPECT_TRUE(std::filesystem::exists(dir.path / "deep/folder/shot.1001.tfmt"));
    EXPECT_TRUE(std::filesystem::exists(dir.path / "deep/folder/shot.1004.tfmt"));

    Clip in((dir.path / "deep/folder/shot.1003.tfmt").string());
    ASSERT_TRUE(in.Scan(error)) << error;
    EXPECT_EQ(in.InitialFrame(), 1001);
    EXPECT_EQ(in.Length(), 4);
    ASSERT_EQ(in.Found().gaps.size(), 1u);
    EXPECT_EQ(in.Found().gaps[0], (std::pair<int64_t, int64_t>{1003, 1003}));
    Ref<Image> back = in.GetFrameTagList(3, {}, error);
    ASSERT_TRUE(back) << error;
    for (int y = 0; y < 3; ++y)
        for (int x = 0; x < 5; ++x) EXPECT_EQ(back->GetFlt(x, y), img->GetFlt(x, y));
    // The missing frame fails with the file it wanted.
    EXPECT_FALSE(in.GetFrameTagList(2, {}, error));
    EXPECT_NE(error.find("shot.1003.tfmt"), std::string::npos) << error;
}

TEST(Clip, HeaderOnlyAndRegionRequestsReachTheFormat) {
    RegisterOnce();
    TempDir dir;
    Clip clip((dir.path / "one.tfmt").string());
    std::string error;
    ASSERT_TRUE(clip.PutFrameTagList(0, Orvane::Test::PatternImage(8, 6).Get(), {}, error)) << error;
    ASSERT_TRUE(clip.Scan(error));
    EXPECT_EQ(clip.Length(), 1);
    Ref<Image> shape = clip.GetFrameTagList(0, {{ClipFrameHeaderOnly, 1}}, error);
    ASSERT_TRUE(shape) << error;
    EXPECT_TRUE(shape->IsNoData());
    EXPECT_EQ(shape->Width(), 8);
    const ImageDomain region(ImgRectI(2, 1, 5, 9));
    Ref<Image> part = clip.GetFrameTagList(0, {{ClipFrameRegion, &region}}, error);
    ASSERT_TRUE(part) << error;
    EXPECT_EQ(part->DataWindow(), ImgRectI(2, 1, 5, 6));
}

TEST(Clip, AFailedWriteKeepsTheOldFileAndASuccessfulOneItsPermissions) {
    RegisterOnce();
    TempDir dir;
    const auto target = dir.path / "keep.tfmt";
    std::ofstream(target) << "old contents";
    std::filesystem::permissions(target, std::filesystem::perms(0640));
    Clip clip(target.string());
    Ref<Image> img = Orvane::Test::PatternImage(4, 4);
    std::string error;
    TestFormat::failWrites = true;
    EXPECT_FALSE(clip.PutFrameTagList(0, img.Get(), {}, error));
    TestFormat::failWrites = false;
    EXPECT_EQ(error, target.string() + ": told to fail"); // the file once, never the temporary
    std::ifstream kept(target);
    std::string text((std::istreambuf_iterator<char>(kept)), std::istreambuf_iterator<char>());
    EXPECT_EQ(text, "old contents");
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(dir.path), {}), 1) << "no temporary file is left";
    ASSERT_TRUE(clip.PutFrameTagList(0, img.Get(), {}, error)) << error;
    EXPECT_EQ(std::filesystem::status(target).permissions(), std::filesystem::perms(0640));
    // An unknown extension names no format; a missing folder is said plainly.
    EXPECT_FALSE(Clip((dir.path / "x.nosuchformat").string()).PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_NE(error.find("no format writes"), std::string::npos) << error;
    EXPECT_FALSE(Clip((dir.path / "none/x.tfmt").string()).PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_EQ(error, (dir.path / "none/x.tfmt").string() + ": the folder does not exist");
}

TEST(Clip, AFileThatIsNotWhatItsNameSaysIsRefusedClearly) {
    RegisterOnce();
    TempDir dir;
    std::ofstream(dir.path / "fake.tfmt") << "this is not an image";
    Clip clip((dir.path / "fake.tfmt").string());
    std::string error;
    EXPECT_FALSE(clip.GetFrameTagList(0, {}, error));
    EXPECT_NE(error.find("not a valid Test Frames file"), std::string::npos) << error;
    Clip none((dir.path / "absent.0001.tfmt").string());
    EXPECT_FALSE(none.Scan(error));
    EXPECT_NE(error.find("absent.####.tfmt"), std::string::npos) << error;
}

} // namespace
} // namespace Orvane::cliptest
