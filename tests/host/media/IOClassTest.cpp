// FileIO and MemoryIO against bytes the test knows; reading refuses what is not a regular file without waiting.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <future>
#include <string>
#include <vector>

#include "host/media/IOClass.h"
#include "tests/support/TestSupport.h"

namespace Orvane {
namespace io_class_test {

using Orvane::Test::TempDir;

std::vector<uint8_t> Bytes(int n, int start = 0) {
    std::vector<uint8_t> v(static_cast<size_t>(n));
    for (int i = 0; i < n; ++i) v[i] = static_cast<uint8_t>((start + i * 7) & 0xff);
    return v;
}

/// The checks every stream holding `data` (64 bytes or more) at position 0 must pass: each step reads (`origin` Read)
/// or seeks, and gives `result` (bytes read, or 1 for a seek done) and the position after it. Short reads at the end,
/// relative seeks both ways, refused negative seeks, seeks and reads past the end.
void CheckReadAndSeek(IOClass &io, const std::vector<uint8_t> &data) {
    const int64_t n = static_cast<int64_t>(data.size()), past = n + 100, end3 = n - 3;
    EXPECT_EQ(io.Size(), n);
    constexpr int Read = -1, Start = IOClass::SeekStart, Absolute = IOClass::SeekAbsolute,
                  Relative = IOClass::SeekRelative;
    const int64_t steps[][4] = {
        {10, Read, 10, 10},    {n + 5, Read, n - 10, n}, {4, Read, 0, n},        {5, Start, 1, 5},
        {20, Absolute, 1, 20}, {1, Read, 1, 21},         {-11, Relative, 1, 10}, {1, Read, 1, 11},
        {4, Relative, 1, 15},  {-1, Start, 0, 15},       {-1, Absolute, 0, 15},  {0, Start, 1, 0},
        {-1, Relative, 0, 0},  {past, Start, 1, past},   {4, Read, 0, past},     {end3, Start, 1, end3},
        {4, Read, 3, n},       {0, Start, 1, 0},         {0, Read, 0, 0},        {-3, Read, 0, 0}};
    std::vector<uint8_t> buf(data.size() + 10);
    for (const auto [amount, origin, result, tell] : steps) {
        SCOPED_TRACE(::testing::Message() << amount << " origin " << origin << " from " << io.Tell());
        const int64_t from = io.Tell();
        if (origin == Read) {
            ASSERT_EQ(io.Read(buf.data(), amount), result);
            EXPECT_TRUE(std::equal(buf.begin(), buf.begin() + result, data.begin() + std::min(from, n)));
        } else {
            EXPECT_EQ(io.Seek(amount, int(origin)), result == 1);
        }
        EXPECT_EQ(io.Tell(), tell);
        EXPECT_EQ(io.Size(), n); // and the size does not move the position
        EXPECT_EQ(io.Tell(), tell);
    }
    ASSERT_TRUE(io.Seek(end3, IOClass::SeekStart));
    EXPECT_FALSE(io.ReadExact(buf.data(), 4));
}

TEST(MemoryIO, ReadSeekSizeAndShortReads) {
    const auto data = Bytes(64);
    MemoryIO io(data);
    CheckReadAndSeek(io, data);
    MemoryIO empty;
    uint8_t b;
    EXPECT_EQ(std::pair(empty.Size(), empty.Read(&b, 1)), std::pair(int64_t(0), int64_t(0)));
}

TEST(MemoryIO, WritesGrowOverwriteAndFillGaps) {
    MemoryIO io;
    const auto a = Bytes(10, 1);
    ASSERT_TRUE(io.WriteExact(a.data(), 10));
    EXPECT_EQ(io.Tell(), 10);
    // Overwrite in the middle, partly past the end; a write beyond the end leaves zeros in the gap.
    const uint8_t over[4] = {0xa0, 0xa1, 0xa2, 0xa3};
    ASSERT_TRUE(io.Seek(8, IOClass::SeekStart));
    ASSERT_EQ(io.Write(over, 4), 4);
    EXPECT_EQ(io.Size(), 12);
    ASSERT_TRUE(io.Seek(15, IOClass::SeekStart));
    ASSERT_EQ(io.Write(over, 1), 1);
    EXPECT_EQ(io.Write(over, 0), 0);
    std::vector<uint8_t> expect(a.begin(), a.begin() + 8);
    expect.insert(expect.end(), {0xa0, 0xa1, 0xa2, 0xa3, 0, 0, 0, 0xa0});
    EXPECT_EQ(io.Data(), expect);
    // What was written reads back.
    ASSERT_TRUE(io.Seek(0, IOClass::SeekStart));
    std::vector<uint8_t> back(16);
    ASSERT_TRUE(io.ReadExact(back.data(), 16));
    EXPECT_EQ(back, expect);
}

TEST(FileIO, WriteThenReadBackAndSeek) {
    TempDir dir;
    const std::string path = dir / "f.bin";
    const auto data = Bytes(300, 3);
    std::string error;
    {
        auto out = FileIO::Open(path, FileIO::Mode::Write, error);
        ASSERT_NE(out, nullptr) << error;
        EXPECT_EQ(out->Path(), path);
        ASSERT_TRUE(out->WriteExact(data.data(), 200));
        EXPECT_EQ(std::pair(out->Tell(), out->Size()), std::pair(int64_t(200), int64_t(200)));
        // Patch a field behind the end, then go on at the end.
        const uint8_t patch[2] = {0xfe, 0xfd};
        ASSERT_TRUE(out->Seek(16, IOClass::SeekAbsolute));
        ASSERT_TRUE(out->WriteExact(patch, 2));
        ASSERT_TRUE(out->Seek(200, IOClass::SeekStart));
        ASSERT_TRUE(out->WriteExact(data.data() + 200, 100));
        EXPECT_TRUE(out->Close());
        EXPECT_TRUE(out->Close()); // twice is harmless; a closed stream does nothing
        uint8_t b;
        EXPECT_EQ(
            std::tuple(out->Read(&b, 1), out->Write(&b, 1), out->Seek(0, IOClass::SeekStart), out->Tell(), out->Size()),
            std::tuple(int64_t(0), int64_t(0), false, int64_t(-1), int64_t(-1)));
    }
    auto expect = data;
    expect[16] = 0xfe, expect[17] = 0xfd;
    std::ifstream f(path, std::ios::binary);
    EXPECT_EQ(std::vector<uint8_t>(std::istreambuf_iterator<char>(f), {}), expect);
    auto in = FileIO::Open(path, FileIO::Mode::Read, error);
    ASSERT_NE(in, nullptr) << error;
    CheckReadAndSeek(*in, expect);
    const uint8_t b = 1;
    EXPECT_EQ(in->Write(&b, 1), 0) << "a read stream does not write";
    // Opening fails with a reason.
    for (auto mode : {FileIO::Mode::Read, FileIO::Mode::Write}) {
        EXPECT_EQ(FileIO::Open("/nonexistent-dir-orvane/x.bin", mode, error), nullptr);
        EXPECT_NE(error.find("/nonexistent-dir-orvane/x.bin"), std::string::npos) << error;
    }
}

TEST(FileIO, ReadingRefusesWhatIsNotARegularFileWithoutWaiting) {
    TempDir dir;
    const std::string fifo = dir / "fifo", folder = dir / "folder";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    ASSERT_EQ(mkdir(folder.c_str(), 0700), 0);
    for (auto [path, kind] : {std::pair{fifo, "a FIFO"}, {folder, "a folder"}, {"/dev/null", "a character device"}}) {
        auto opening = std::async(std::launch::async, [path = path] {
            std::string error;
            return FileIO::Open(path, FileIO::Mode::Read, error) ? std::string("opened") : error;
        });
        if (opening.wait_for(std::chrono::seconds(5)) != std::future_status::ready) {
            ADD_FAILURE() << path << ": the open waits";
            close(open(path.c_str(), O_WRONLY | O_NONBLOCK)); // a writer ends a FIFO's blocked open
        }
        EXPECT_EQ(opening.get(), path + " is not a regular file (" + kind + ")");
    }
}

} // namespace io_class_test
} // namespace Orvane
