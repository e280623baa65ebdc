// Clips: frames of a sequence read and written through a format found by extension and check, written atomically.
#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <fstream>

#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/media/Clip.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormatList.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cliptest {
namespace {

namespace fs = std::filesystem;
using Orvane::Test::TempDir;

/// A tiny format for these tests: "TFMT", width, height, then RGBA floats.
class TestFormat : public ImageFormat {
public:
    using ImageFormat::ImageFormat;
    bool CheckFormat(IOClass *io) override {
        char magic[4];
        return io->ReadExact(magic, 4) && std::memcmp(magic, "TFMT", 4) == 0;
    }
    bool LoadHeader(IOClass *stream) override {
        int32_t head[3];
        if (!stream->ReadExact(head, sizeof head)) return Fail("short header");
        width = head[1] / proxyScale, height = head[2] / proxyScale, depth = DepthRGBAFlt32;
        return width > 0 && height > 0 ? true : Fail("bad size");
    }
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override {
        if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
        if (image->IsNoData()) return true;
        std::vector<FltPixel> px(static_cast<size_t>(width) * height);
        if (!image->AllocScanLineData() || !io->ReadExact(px.data(), int64_t(px.size() * sizeof(FltPixel))))
            return Fail("short data");
        for (int y = 0; y < height; ++y)
            for (int x = 0; x < width; ++x) image->PutFlt(x, y, px[size_t(y) * width + x]);
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

class Clips : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        static TagList tags{{RegConstructor, &Orvane::Test::MakeTool<TestFormat>},
                            {RegTypeFlags, static_cast<long long>(RegFamilyImageFormat)},
                            {RegFormatName, "Test Frames"},
                            {RegFormatExtension, ".tfmt"},
                            {RegFormatCanLoad, 1},
                            {RegFormatCanSave, 1}};
        static const Registry *row = Registry::_Init(&ClassRegistry, OvID("TestFrameFormat"), tags);
        (void)row;
    }
    TempDir dir;
    std::string error;
};

TEST_F(Clips, WritesASequenceAndReadsItBackWithItsFramesAndGaps) {
    Clip out(dir / "deep/folder/shot.0000.tfmt");
    out.SetStartFrame(1001);
    Ref<Image> img = Orvane::Test::PatternImage(5, 3);
    // Missing folders are made only when asked for.
    EXPECT_FALSE(out.PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_FALSE(fs::exists(dir / "deep"));
    for (int64_t f : {0, 1, 3})
        ASSERT_TRUE(out.PutFrameTagList(f, img.Get(), {{ClipFrameMakeFolders, 1}}, error)) << error;
    EXPECT_TRUE(fs::exists(dir / "deep/folder/shot.1001.tfmt") && fs::exists(dir / "deep/folder/shot.1004.tfmt"));

    Clip in(dir / "deep/folder/shot.1003.tfmt");
    ASSERT_TRUE(in.Scan(error)) << error;
    EXPECT_EQ(std::pair(in.InitialFrame(), in.Length()), std::pair(int64_t(1001), int64_t(4)));
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

TEST_F(Clips, HeaderOnlyAndRegionRequestsReachTheFormat) {
    Clip clip(dir / "one.tfmt");
    ASSERT_TRUE(clip.PutFrameTagList(0, Orvane::Test::PatternImage(8, 6).Get(), {}, error)) << error;
    ASSERT_TRUE(clip.Scan(error));
    EXPECT_EQ(clip.Length(), 1);
    Ref<Image> shape = clip.GetFrameTagList(0, {{ClipFrameHeaderOnly, 1}}, error);
    ASSERT_TRUE(shape) << error;
    EXPECT_TRUE(shape->IsNoData() && shape->Width() == 8);
    const ImageDomain region(ImgRectI(2, 1, 5, 9));
    Ref<Image> part = clip.GetFrameTagList(0, {{ClipFrameRegion, &region}}, error);
    ASSERT_TRUE(part) << error;
    EXPECT_EQ(part->DataWindow(), ImgRectI(2, 1, 5, 6));
}

TEST_F(Clips, AFailedWriteKeepsTheOldFileAndASuccessfulOneItsPermissions) {
    const std::string target = dir / "keep.tfmt";
    std::ofstream(target) << "old contents";
    fs::permissions(target, fs::perms(0640));
    Clip clip(target);
    Ref<Image> img = Orvane::Test::PatternImage(4, 4);
    TestFormat::failWrites = true;
    EXPECT_FALSE(clip.PutFrameTagList(0, img.Get(), {}, error));
    TestFormat::failWrites = false;
    EXPECT_EQ(error, target + ": told to fail"); // the file once, never the temporary
    std::ifstream kept(target);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(kept), {}), "old contents");
    EXPECT_EQ(std::distance(fs::directory_iterator(dir.path), {}), 1) << "no temporary file is left";
    ASSERT_TRUE(clip.PutFrameTagList(0, img.Get(), {}, error)) << error;
    EXPECT_EQ(fs::status(target).permissions(), fs::perms(0640));
    // An unknown extension names no format; a missing folder is said plainly.
    EXPECT_FALSE(Clip(dir / "x.nosuchformat").PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_NE(error.find("no format writes"), std::string::npos) << error;
    EXPECT_FALSE(Clip(dir / "none/x.tfmt").PutFrameTagList(0, img.Get(), {}, error));
    EXPECT_EQ(error, dir / "none/x.tfmt: the folder does not exist");
}

TEST_F(Clips, AFileThatIsNotWhatItsNameSaysIsRefusedClearly) {
    std::ofstream(dir / "fake.tfmt") << "this is not an image";
    EXPECT_FALSE(Clip(dir / "fake.tfmt").GetFrameTagList(0, {}, error));
    EXPECT_NE(error.find("not a valid Test Frames file"), std::string::npos) << error;
    EXPECT_FALSE(Clip(dir / "absent.0001.tfmt").Scan(error));
    EXPECT_NE(error.find("absent.####.tfmt"), std::string::npos) << error;
}

} // namespace
} // namespace Orvane::cliptest
