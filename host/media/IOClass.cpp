#include "host/media/IOClass.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace Orvane {

IOClass::~IOClass() = default;

const char *FileKindName(unsigned mode) {
    if (S_ISDIR(mode)) return "a folder";
    if (S_ISFIFO(mode)) return "a FIFO";
    if (S_ISCHR(mode)) return "a character device";
    if (S_ISBLK(mode)) return "a block device";
    if (S_ISSOCK(mode)) return "a socket";
    return "not a regular file";
}

namespace {

/// Opens `path` for reading without ever waiting: O_NONBLOCK keeps a FIFO
/// without a writer from blocking the open, and anything but a regular file
/// (FIFO, device, directory) is refused before a byte is read.
std::FILE *OpenForReading(const std::string &path, std::string &error) {
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        error = path + ": " + std::strerror(errno);
        return nullptr;
    }
    struct stat st {};
    const bool statted = fstat(fd, &st) == 0;
    if (!statted || !S_ISREG(st.st_mode)) {
        error = statted ? path + " is not a regular file (" + FileKindName(st.st_mode) + ")"
                        : path + ": " + std::strerror(errno);
        ::close(fd);
        return nullptr;
    }
    // Reads of a regular file block as usual.
    const int flags = fcntl(fd, F_GETFL);
    std::FILE *f = flags == -1 || fcntl(fd, F_SETFL, flags & ~O_NONBLOCK) == -1 ? nullptr : fdopen(fd, "rb");
    if (!f) {
        error = path + ": " + std::strerror(errno);
        ::close(fd);
    }
    return f;
}

} // namespace

std::unique_ptr<FileIO> FileIO::Open(const std::string &path, Mode mode, std::string &error, const std::string &name) {
    std::FILE *f = nullptr;
    if (mode == Mode::Read) {
        f = OpenForReading(path, error);
    } else if (mode == Mode::CreateNew) {
        const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0666);
        f = fd < 0 ? nullptr : fdopen(fd, "wb");
        if (!f) {
            error = path + ": " + std::strerror(errno);
            if (fd >= 0) ::close(fd);
        }
    } else if (!(f = std::fopen(path.c_str(), "wb"))) {
        error = path + ": " + std::strerror(errno);
    }
    return f ? std::unique_ptr<FileIO>(new FileIO(f, name.empty() ? path : name)) : nullptr;
}

FileIO::~FileIO() { Close(); }

int64_t FileIO::Read(void *buffer, int64_t bytes) {
    if (!file_ || bytes <= 0) return 0;
    return static_cast<int64_t>(std::fread(buffer, 1, static_cast<size_t>(bytes), file_));
}

int64_t FileIO::Write(const void *buffer, int64_t bytes) {
    if (!file_ || bytes <= 0) return 0;
    return static_cast<int64_t>(std::fwrite(buffer, 1, static_cast<size_t>(bytes), file_));
}

bool FileIO::Seek(int64_t offset, int origin) {
    if (!file_) return false;
    const int whence = origin == SeekRelative ? SEEK_CUR : SEEK_SET;
    if (whence == SEEK_SET && offset < 0) return false;
    return fseeko(file_, static_cast<off_t>(offset), whence) == 0;
}

int64_t FileIO::Tell() const { return file_ ? static_cast<int64_t>(ftello(file_)) : -1; }

int64_t FileIO::Size() {
    if (!file_) return -1;
    const off_t here = ftello(file_);
    if (fseeko(file_, 0, SEEK_END) != 0) return -1;
    const off_t end = ftello(file_);
    fseeko(file_, here, SEEK_SET);
    return static_cast<int64_t>(end);
}

bool FileIO::Close() {
    if (!file_) return true;
    const bool ok = std::fflush(file_) == 0 && !std::ferror(file_);
    const bool closed = std::fclose(file_) == 0;
    file_ = nullptr;
    return ok && closed;
}

int64_t MemoryIO::Read(void *buffer, int64_t bytes) {
    if (bytes <= 0 || pos_ >= Size()) return 0;
    const int64_t n = std::min(bytes, Size() - pos_);
    std::memcpy(buffer, data_.data() + pos_, static_cast<size_t>(n));
    pos_ += n;
    return n;
}

int64_t MemoryIO::Write(const void *buffer, int64_t bytes) {
    if (bytes <= 0) return 0;
    if (pos_ + bytes > Size()) data_.resize(static_cast<size_t>(pos_ + bytes));
    std::memcpy(data_.data() + pos_, buffer, static_cast<size_t>(bytes));
    pos_ += bytes;
    return bytes;
}

bool MemoryIO::Seek(int64_t offset, int origin) {
    const int64_t to = origin == SeekRelative ? pos_ + offset : offset;
    if (to < 0) return false;
    pos_ = to;
    return true;
}

} // namespace Orvane
