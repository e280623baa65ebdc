#pragma once
// IOClass: the byte stream a file format reads and writes through. FileIO is
// a file on disk, MemoryIO a buffer (tests, previews). Formats never touch
// the file system themselves, so every format can be fed from memory.
//
// Seek origins: SeekStart and SeekAbsolute both count from the start of the
// stream; SeekRelative counts from the current position.
//
// Thread safety: a stream belongs to one format at a time; none of its
// operations lock.
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "host/core/Export.h"

namespace Orvane {

class ORVANE_API IOClass {
public:
    enum Origin : int { SeekStart = 0, SeekAbsolute = 1, SeekRelative = 2 };

    virtual ~IOClass();
    /// Reads up to `bytes`; returns how many were read (0 at the end or on error).
    virtual int64_t Read(void *buffer, int64_t bytes) = 0;
    /// Writes `bytes`; returns how many were written.
    virtual int64_t Write(const void *buffer, int64_t bytes) = 0;
    virtual bool Seek(int64_t offset, int origin) = 0;
    virtual int64_t Tell() const = 0;
    /// Length of the stream in bytes, -1 when unknown.
    virtual int64_t Size() = 0;

    /// Reads exactly `bytes` or fails.
    bool ReadExact(void *buffer, int64_t bytes) { return Read(buffer, bytes) == bytes; }
    bool WriteExact(const void *buffer, int64_t bytes) { return Write(buffer, bytes) == bytes; }
};

class ORVANE_API FileIO : public IOClass {
public:
    /// Write truncates or creates the file; CreateNew makes a new file and
    /// fails when anything (a link included) already has the name.
    enum class Mode { Read, Write, CreateNew };
    /// Opens a file; null with a reason in `error` when it cannot. Reading
    /// takes regular files only and never waits: a FIFO, device or folder is
    /// refused at once ("x.exr is not a regular file (a FIFO)"). Every reader
    /// of files (clips, `orvane info`) comes through here. `name`, when given,
    /// is the name the stream goes by (a temporary file is known by the name
    /// it will become).
    static std::unique_ptr<FileIO> Open(const std::string &path, Mode mode, std::string &error,
                                        const std::string &name = {});
    ~FileIO() override;

    int64_t Read(void *buffer, int64_t bytes) override;
    int64_t Write(const void *buffer, int64_t bytes) override;
    bool Seek(int64_t offset, int origin) override;
    int64_t Tell() const override;
    int64_t Size() override;
    /// Flushes and closes; false when data could not be written.
    bool Close();
    /// The file's name as messages give it: the path opened, or the name given.
    const std::string &Path() const { return path_; }

private:
    FileIO(std::FILE *file, std::string path) : file_(file), path_(std::move(path)) {}
    std::FILE *file_;
    std::string path_;
};

class ORVANE_API MemoryIO : public IOClass {
public:
    MemoryIO() = default;
    explicit MemoryIO(std::vector<uint8_t> data) : data_(std::move(data)) {}

    int64_t Read(void *buffer, int64_t bytes) override;
    int64_t Write(const void *buffer, int64_t bytes) override;
    bool Seek(int64_t offset, int origin) override;
    int64_t Tell() const override { return pos_; }
    int64_t Size() override { return static_cast<int64_t>(data_.size()); }
    const std::vector<uint8_t> &Data() const { return data_; }

private:
    std::vector<uint8_t> data_;
    int64_t pos_ = 0;
};

/// What a file that is not a regular file is, in words for messages: "a
/// folder", "a FIFO", "a character device", ... (`mode` as stat gives it).
ORVANE_API const char *FileKindName(unsigned mode);

} // namespace Orvane
