// What every still image format does alike, and files of other programs read exactly, and ours read by them.
#include "host/media/ImageFormatList.h"

#include "tests/operators/media/FormatTestSupport.h"

namespace Orvane {
namespace every_format_test {

using namespace Orvane::FmtTest;

class EveryFormat : public FormatSuite {};

struct Format {
    const char *id, *file; ///< a file name the format list gives it by
    Options options;       ///< what the sample file is saved with
    int magicAt;           ///< a byte of the start the content check looks at
    size_t header;         ///< leading bytes flipped one by one; damage scatters after them
    bool sizeKept;         ///< a damaged read that succeeds still has the stored size
    int minFailed = 0;     ///< of the 300 scattered damages, at least this many fail
    size_t tail = 0;       ///< end bytes a reader may do without (an end marker)
    int depth = DepthRGBAInt8;
};
const Format kFormats[] = {
    {"BMPFormat", "a.bmp", {{"SaveAlpha", 0}}, 1, 54, true},
    {"BMPFormat", "a.DIB", {{"SaveAlpha", 1}}, 1, 66, true},
    {"TargaFormat", "b.TGA", {{"Compress", 1}}, 2, 18, true},
    {"TargaFormat", "b.tga", {{"Compress", 0}}, 2, 18, true},
    {"TargaFormat", "b.tga", {{"Compress", 1}, {"SaveAlpha", 0}}, 2, 18, true},
    {"RawFormat", "c.raw", {{"Compression", 0}}, 3, 1024, true, 0, 0, DepthRGBAFlt32},
    {"RawFormat", "c.raw", {{"Compression", 1}}, 3, 1024, true},
    {"RawFormat", "c.raw", {{"Compression", 2}}, 3, 1024, true, 0, 0, DepthRGBAInt16},
    {"PNGFormat", "d.png", {}, 1, 8, true, 100, 12},
    {"PNGFormat", "d.png", {}, 1, 8, true, 100, 12, DepthRGBAInt16},
    {"JpegFormat", "e.jpeg", {{"ChromaSubsampling", 1}}, 1, 2, false},
    {"IPLFormat", "f.ipl", {}, 6, 2, false},
    {"OpenEXRFormat", "g.exr", {{"Compression", 3}}, 1, 4, false, 0, 0, DepthRGBAFlt16},
};

/// The row's sample image and file: lines longer than one run-length packet, more rows than one JPEG block row.
Ref<Image> Sample(const Format &f) { return Image8(150, 37, 4, f.depth); }
Bytes SampleFile(const Format &f) { return SaveWith(f.id, Sample(f).Get(), f.options); }

std::string Name(const Format &f) { return std::string(f.id) + " as " + f.file + " depth " + std::to_string(f.depth); }

// The host's format list chooses each format by extension and, for a misnamed file, by content.
TEST_F(EveryFormat, TheFormatListChoosesByExtensionAndContent) {
    for (const Format &f : kFormats) {
        SCOPED_TRACE(Name(f));
        const Bytes file = SampleFile(f);
        std::string error;
        // By content, a misnamed JPEG file goes to IPLFormat, whose check takes any JFIF start (it refuses three
        // components only when reading the header).
        const bool byContent = std::string(f.id) != "JpegFormat";
        for (const std::string &name : {std::string(f.file), std::string(byContent ? "misnamed.dat" : f.file)}) {
            MemoryIO io(file);
            Ref<ImageFormat> g = FindFormatForReading(name, &io, error);
            ASSERT_TRUE(g) << name << ": " << error;
            EXPECT_EQ(g->GetRegistry()->ID(), OvID(f.id)) << name;
            // And the format found reads the file.
            ASSERT_TRUE(g->LoadHeader(&io)) << g->Error();
            Ref<Image> back;
            ASSERT_TRUE(g->LoadFrameTagList(0, back, {})) << g->Error();
            EXPECT_EQ(back->Width(), 150);
        }
        Ref<ImageFormat> w = FindFormatForWriting(std::string("out") + f.file, error);
        ASSERT_TRUE(w) << error;
        EXPECT_EQ(w->GetRegistry()->ID(), OvID(f.id));
    }
}

// A header-only read makes no pixels; a set abort word stops reading and writing with "aborted"; the content check
// takes the format's files only.
TEST_F(EveryFormat, HeaderOnlyAbortAndCheck) {
    for (const Format &f : kFormats) {
        SCOPED_TRACE(Name(f));
        Ref<Image> src = Sample(f);
        const Bytes b = SaveWith(f.id, src.Get(), f.options);
        const LoadResult pre = Load(f.id, b, {{ClipFrameHeaderOnly, 1}});
        ASSERT_TRUE(pre.image) << pre.error;
        EXPECT_TRUE(pre.image->IsNoData() && !pre.image->HasScanLineData());
        EXPECT_EQ(std::pair(pre.image->Width(), pre.image->Height()), std::pair(150, 37));

        std::atomic<bool> abort{true};
        const LoadResult stopped = Load(f.id, b, {}, [&](ImageFormat &fmt) { fmt.abortFlag = &abort; });
        EXPECT_EQ(std::tuple(stopped.headerOk, stopped.image.Get(), stopped.error),
                  std::tuple(true, nullptr, std::string("aborted")));
        std::string error;
        MemoryIO out;
        EXPECT_FALSE(SaveTo(&out, f.id, src.Get(), f.options, error, &abort));
        EXPECT_EQ(error, "aborted");

        Bytes other = b;
        other[f.magicAt] ^= 0xff;
        Ref<ImageFormat> c = MakeFormat(f.id);
        MemoryIO good(b), bad(other), tiny(Bytes(b.begin(), b.begin() + 1)), junk(Bytes(100, 0x42));
        for (MemoryIO *io : {&good, &bad, &tiny, &junk}) EXPECT_EQ(c->CheckFormat(io), io == &good);
    }
}

TEST_F(EveryFormat, RegionReadEqualsTheCropOfAFullRead) {
    for (const Format &f : kFormats) ExpectRegionsMatchFullRead(f.id, SampleFile(f));
}

// Short writes (a full disk) fail at any point of the file, with a reason; files on disk hold what memory holds.
TEST_F(EveryFormat, FullDisksFailAndFilesOnDiskReadBack) {
    TempDir dir;
    for (const Format &f : kFormats) {
        SCOPED_TRACE(Name(f));
        Ref<Image> img = Sample(f);
        const Bytes whole = SaveWith(f.id, img.Get(), f.options);
        ASSERT_FALSE(whole.empty());
        for (int64_t limit : {int64_t(0), int64_t(10), int64_t(54), int64_t(700), int64_t(whole.size()) / 2,
                              int64_t(whole.size()) - 1}) {
            LimitedIO io(limit);
            std::string error;
            EXPECT_FALSE(SaveTo(&io, f.id, img.Get(), f.options, error)) << "limit " << limit;
            EXPECT_FALSE(error.empty());
        }
        const std::string path = dir / f.file;
        std::string error;
        auto out = FileIO::Open(path, FileIO::Mode::Write, error);
        ASSERT_NE(out, nullptr) << error;
        ASSERT_TRUE(SaveTo(out.get(), f.id, img.Get(), f.options, error)) << error;
        ASSERT_TRUE(out->Close());
        EXPECT_EQ(ReadFile(path), whole) << "the file holds what memory holds";
    }
}

TEST_F(EveryFormat, DamagedFilesFailCleanly) {
    for (const Format &f : kFormats)
        EXPECT_GE(ExpectDamageFailsCleanly(f.id, SampleFile(f), f.header, f.sizeKept, f.tail), f.minFailed) << Name(f);
}

bool HavePrograms() {
    for (const char *p : {"convert", "ppmtobmp", "bmptopnm", "ppmtotga", "tgatoppm", "pngtopnm", "cjpeg", "djpeg"})
        if (!HaveProgram(p)) return false;
    return true;
}

// Files made by other programs read to their picture exactly, or where lossy or oddly ordered, to what a reference
// decoder (djpeg, tgatoppm) reads from them.
TEST_F(EveryFormat, FilesOfOtherProgramsReadExactly) {
    if (!HavePrograms()) GTEST_SKIP() << "netpbm, libjpeg's tools or ImageMagick are not installed";
    TempDir dir;
    const std::string in = "cd '" + dir.path + "' && ";
    // Noise of 77 x 45 (not multiples of any block size), 20 of its colours, grey, and an alpha ramp.
    ASSERT_TRUE(RunShell(in + "convert -size 77x45 -seed 7 xc: +noise Random -depth 8 in.ppm && convert in.ppm "
                              "-colors 20 few.ppm && convert in.ppm -colorspace Gray -type TrueColor grey.ppm && "
                              "convert in.ppm -alpha set -channel A -fx i/w +channel rgba.pam"));
    const struct {
        const char *id, *command, *reference; ///< a command printing the picture f must read to
        Options load = {};
    } cases[] = {
        {"BMPFormat", "ppmtobmp in.ppm > f", "cat in.ppm"},
        {"BMPFormat", "ppmtobmp -os2 in.ppm > f", "cat in.ppm"},
        {"BMPFormat", "ppmtobmp -bpp=8 few.ppm > f", "cat few.ppm"},
        {"BMPFormat", "ppmtobmp -os2 -bpp=8 few.ppm > f", "cat few.ppm"},
        {"BMPFormat", "convert in.ppm BMP3:f", "cat in.ppm"},
        {"BMPFormat", "convert in.ppm -type TrueColor BMP:f", "cat in.ppm"},
        {"BMPFormat", "convert rgba.pam BMP:f", "cat rgba.pam"}, // 32 bits, colour masks, a long info header
        {"TargaFormat", "ppmtotga -rgb -norle in.ppm > f", "cat in.ppm"},
        {"TargaFormat", "ppmtotga -rgb in.ppm > f", "cat in.ppm"},
        {"TargaFormat", "ppmtotga -cmap -norle few.ppm > f", "cat few.ppm"},
        {"TargaFormat", "ppmtotga -cmap few.ppm > f", "cat few.ppm"},
        {"TargaFormat", "ppmtotga -mono -norle grey.ppm > f", "cat grey.ppm"},
        {"TargaFormat", "ppmtotga -mono grey.ppm > f", "cat grey.ppm"},
        // This ImageMagick stores its rows top first under a bottom-origin header.
        {"TargaFormat", "convert in.ppm -compress None TGA:f", "tgatoppm f"},
        {"TargaFormat", "convert in.ppm -compress RLE TGA:f", "tgatoppm f"},
        {"TargaFormat", "convert few.ppm -type Palette -compress None TGA:f", "tgatoppm f"},
        {"PNGFormat", "convert rgba.pam PNG32:f", "cat rgba.pam", {{"PostMultiply", 0}}},
        {"PNGFormat", "convert rgba.pam -interlace PNG PNG32:f", "cat rgba.pam", {{"PostMultiply", 0}}},
        {"PNGFormat", "convert rgba.pam -depth 16 PNG64:f", "cat rgba.pam", {{"PostMultiply", 0}}},
        {"PNGFormat", "convert grey.ppm PNG8:f", "cat grey.ppm"},
        {"JpegFormat", "cjpeg -quality 85 in.ppm > f", "djpeg -pnm f"},
        {"JpegFormat", "cjpeg -quality 92 -sample 1x1 -progressive in.ppm > f", "djpeg -pnm f"},
        {"JpegFormat", "cjpeg -grayscale in.ppm > f", "djpeg -pnm f"},
        {"JpegFormat", "cjpeg -restart 1 -sample 2x1 in.ppm > f", "djpeg -pnm f"},
        {"JpegFormat", "convert in.ppm -quality 70 jpg:f", "djpeg -pnm f"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.command);
        ASSERT_TRUE(RunShell(in + c.command));
        const Bytes want = Capture(in + c.reference + " | convert - -depth 8 rgba:-");
        const Bytes file = ReadFile(dir / "f");
        Ref<Image> img = c.load.empty() ? Load(c.id, file).image : LoadWith(c.id, file, c.load);
        ASSERT_TRUE(img);
        EXPECT_EQ(Mismatches(*img, want, 77, 45), 0);
    }
}

// Our files as netpbm and ImageMagick read them: sizes with and without line padding, plain and run-length, alpha where
// the reader keeps it.
TEST_F(EveryFormat, OurFilesReadByOtherPrograms) {
    if (!HavePrograms()) GTEST_SKIP() << "netpbm or ImageMagick is not installed";
    TempDir dir;
    const struct {
        const char *id;
        Options options;
        const char *netpbm, *extension;
        std::vector<int> widths;
        bool alpha; ///< ImageMagick reads the alpha we wrote
    } cases[] = {
        {"BMPFormat", {{"SaveAlpha", 0}}, "bmptopnm", ".bmp", {1, 2, 3, 10}, false},
        {"BMPFormat", {{"SaveAlpha", 1}}, "bmptopnm", ".bmp", {3}, false},
        {"TargaFormat", {{"SaveAlpha", 0}, {"Compress", 0}}, "tgatoppm", ".tga", {140}, false},
        {"TargaFormat", {{"SaveAlpha", 0}, {"Compress", 1}}, "tgatoppm", ".tga", {140}, false},
        {"TargaFormat", {{"SaveAlpha", 1}, {"Compress", 0}}, "tgatoppm", ".tga", {140}, true},
        {"TargaFormat", {{"SaveAlpha", 1}, {"Compress", 1}}, "tgatoppm", ".tga", {140}, true},
        {"PNGFormat", {{"SaveAlpha", 0}}, "pngtopnm", ".png", {33}, false},
        {"PNGFormat", {{"SaveAlpha", 1}, {"PreDivide", 0}}, "pngtopnm", ".png", {33}, true},
    };
    const int h = 5;
    for (const auto &c : cases)
        for (const int w : c.widths) {
            SCOPED_TRACE(::testing::Message() << c.id << " " << w << (c.alpha ? " alpha" : ""));
            Ref<Image> src = Image8(w, h, 7u + w);
            const std::string path = dir / (std::string("ours") + c.extension);
            WriteFile(path, SaveWith(c.id, src.Get(), c.options));
            const Bytes netpbm =
                Capture(std::string(c.netpbm) + " '" + path + "' 2>/dev/null | convert pnm:- -depth 8 rgba:-");
            const Bytes im = Capture("convert '" + path + "' -auto-orient -depth 8 rgba:-");
            EXPECT_EQ(Mismatches(*src, netpbm, w, h, false), 0) << "netpbm";
            EXPECT_EQ(Mismatches(*src, im, w, h, c.alpha), 0) << "ImageMagick";
        }
}

} // namespace every_format_test
} // namespace Orvane
