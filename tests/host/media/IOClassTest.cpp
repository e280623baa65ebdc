// FileIO and MemoryIO: reads, writes, the three seek origins, sizes and
// short reads, checked against bytes the test knows; reading refuses what is
// not a regular file without waiting.
#include <gtest/gtest.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <future>
#include <numeric>
#include <string>
#include <vector>

#include "host/media/IOClass.h"

namespace Orvane {
namespace io_class_test {

std::vector<uint8_t> Bytes(int n, int start = 0) {
    std::vector<uint8_t> v(static_cast<size_t>(n));
    for (int i = 0; i < n; ++i) v[i] = static_cast<uint8_t>((start + i * 7) & 0xff);
    return v;
}

/// A temporary file path, removed when the test ends.
struct TempPath {
    std::string path;
    TempPath() {
        char buf[] = "/tmp/orvane-io-XXXXXX";
        const int fd = mkstemp(buf);
        EXPECT_GE(fd, 0);
        if (fd >= 0) close(fd);
        path = buf;
    }
    ~TempPath() { std::remove(path.c_str()); }
};

std::vector<uint8_t> FileBytes(const std::string &path) {
    std::ifstream f(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(f), {});
}

/// The checks every stream must pass, given one holding `data` at position 0.
void CheckReadAndSeek(IOClass &io, const std::vector<uint8_t> &data) {
    const int64_t n = static_cast<int64_t>(data.size());
    EXPECT_EQ(io.Size(), n);
    EXPECT_EQ(io.Tell(), 0);
    std::vector<uint8_t> buf(data.size() + 10, 0xee);
    // Plain read of a part, then the rest.
    ASSERT_EQ(io.Read(buf.data(), 10), 10);
    EXPECT_TRUE(std::equal(buf.begin(), buf.begin() + 10, data.begin()));
    EXPECT_EQ(io.Tell(), 10);
    // Size does not move the position.
    EXPECT_EQ(io.Size(), n);
    EXPECT_EQ(io.Tell(), 10);
    // A short read at the end returns what is there; a further read gives 0.
    ASSERT_EQ(io.Read(buf.data(), n + 5), n - 10);
    EXPECT_TRUE(std::equal(buf.begin(), buf.begin() + (n - 10), data.begin() + 10));
    EXPECT_EQ(io.Read(buf.data(), 4), 0);
    EXPECT_FALSE(io.ReadExact(buf.data(), 1));
    // Start and absolute origins count from the start.
    ASSERT_TRUE(io.Seek(5, IOClass::SeekStart));
    EXPECT_EQ(io.Tell(), 5);
    ASSERT_TRUE(io.Seek(20, IOClass::SeekAbsolute));
    uint8_t b = 0;
    ASSERT_TRUE(io.ReadExact(&b, 1));
    EXPECT_EQ(b, data[20]);
    // Relative counts from the current point, both ways.
    ASSERT_TRUE(io.Seek(-11, IOClass::SeekRelative));
    EXPECT_EQ(io.Tell(), 10);
    ASSERT_TRUE(io.ReadExact(&b, 1));
    EXPECT_EQ(b, data[10]);
    ASSERT_TRUE(io.Seek(4, IOClass::SeekRelative));
    EXPECT_EQ(io.Tell(), 15);
    // Before the start is refused, whichever origin.
    EXPECT_FALSE(io.Seek(-1, IOClass::SeekStart));
    EXPECT_FALSE(io.Seek(-1, IOClass::SeekAbsolute));
    ASSERT_TRUE(io.Seek(0, IOClass::SeekStart));
    EXPECT_FALSE(io.Seek(-1, IOClass::SeekRelative));
    // Past the end a read gives nothing; ReadExact over the end fails.
    ASSERT_TRUE(io.Seek(n + 100, IOClass::SeekStart));
    EXPECT_EQ(io.Read(buf.data(), 4), 0);
    ASSERT_TRUE(io.Seek(n - 3, IOClass::SeekStart));
    EXPECT_FALSE(io.ReadExact(buf.data(), 4));
    // Zero and negative counts read nothing.
    ASSERT_TRUE(io.Seek(0, IOClass::SeekStart));
    EXPECT_EQ(io.Read(buf.data(), 0), 0);
    EXPECT_EQ(io.Read(buf.data(), -3), 0);
    EXPECT_EQ(io.Tell(), 0);
}

TEST(MemoryIO, ReadSeekSizeAndShortReads) {
    const auto data = Bytes(64);
    MemoryIO io(data);
    CheckReadAndSeek(io, data);
    MemoryIO empty;
    uint8_t b;
    EXPECT_EQ(empty.Size(), 0);
    EXPECT_EQ(empty.Read(&b, 1), 0);
}

TEST(MemoryIO, WritesGrowOverwriteAndFillGaps) {
    MemoryIO io;
    const auto a = Bytes(10, 1);
    ASSERT_TRUE(io.WriteExact(a.data(), 10));
    EXPECT_EQ(io.Size(), 10);
    EXPECT_EQ(io.Tell(), 10);
    // Overwrite in the middle, partly past the end.
    ASSERT_TRUE(io.Seek(8, IOClass::SeekStart));
    const uint8_t over[4] = {0xa0, 0xa1, 0xa2, 0xa3};
    ASSERT_EQ(io.Write(over, 4), 4);
    EXPECT_EQ(io.Size(), 12);
    // A write beyond the end leaves zeros in the gap.
    ASSERT_TRUE(io.Seek(15, IOClass::SeekStart));
    ASSERT_EQ(io.Write(over, 1), 1);
    std::vector<uint8_t> expect(a.begin(), a.begin() + 8);
    expect.insert(expect.end(), over, over + 4);
    expect.insert(expect.end(), {0, 0, 0, 0xa0});
    EXPECT_EQ(io.Data(), expect);
    EXPECT_EQ(io.Write(over, 0), 0);
    EXPECT_EQ(io.Size(), 16);
    // What was written reads back.
    ASSERT_TRUE(io.Seek(0, IOClass::SeekStart));
    std::vector<uint8_t> back(16);
    ASSERT_TRUE(io.ReadExact(back.data(), 16));
    EXPECT_EQ(back, expect);
}

TEST(FileIO, WriteThenReadBackAndSeek) {
    TempPath tmp;
    const auto data = Bytes(300, 3);
    std::string error;
    {
        auto out = FileIO::Open(tmp.path, FileIO::Mode::Write, error);
        ASSERT_NE(out, nullptr) << error;
        EXPECT_EQ(out->Path(), tmp.path);
        ASSERT_TRUE(out->WriteExact(data.data(), 200));
        EXPECT_EQ(out->Tell(), 200);
        EXPECT_EQ(out->Size(), 200);
        // Patch a field behind the end, then go on at the end.
        ASSERT_TRUE(out->Seek(16, IOClass::SeekAbsolute));
        const uint8_t patch[2] = {0xfe, 0xfd};
        ASSERT_TRUE(out->WriteExact(patch, 2));
        ASSERT_TRUE(out->Seek(200, IOClass::SeekStart));
        ASSERT_TRUE(out->WriteExact(data.data() + 200, 100));
        EXPECT_TRUE(out->Close());
        EXPECT_TRUE(out->Close()); // twice is harmless
        uint8_t b;
        EXPECT_EQ(out->Read(&b, 1), 0);
        EXPECT_EQ(out->Write(&b, 1), 0);
        EXPECT_FALSE(out->Seek(0, IOClass::SeekStart));
        EXPECT_EQ(out->Tell(), -1);
        EXPECT_EQ(out->Size(), -1);
    }
    auto expect = data;
    expect[16] = 0xfe, expect[17] = 0xfd;
    EXPECT_EQ(FileBytes(tmp.path), expect);
    auto in = FileIO::Open(tmp.path, FileIO::Mode::Read, error);
    ASSERT_NE(in, nullptr) << error;
    CheckReadAndSeek(*in, expect);
    // A read stream does not write.
    const uint8_t b = 1;
    EXPECT_EQ(in->Write(&b, 1), 0);
}

TEST(FileIO, OpenFailsWithAReason) {
    std::string error;
    EXPECT_EQ(FileIO::Open("/nonexistent-dir-orvane/x.bin", FileIO::Mode::Read, error), nullptr);
    EXPECT_NE(error.find("/nonexistent-dir-orvane/x.bin"), std::string::npos);
    error.clear();
    EXPECT_EQ(FileIO::Open("/nonexistent-dir-orvane/x.bin", FileIO::Mode::Write, error), nullptr);
    EXPECT_FALSE(error.empty());
}

TEST(FileIO, ReadingRefusesWhatIsNotARegularFileWithoutWaiting) {
    TempPath tmp;
    const std::string fifo = tmp.path + ".fifo", folder = tmp.path + ".dir";
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
    std::remove(fifo.c_str());
    rmdir(folder.c_str());
}

} // namespace io_class_test
} // namespace Orvane
