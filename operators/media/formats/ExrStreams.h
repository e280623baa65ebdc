#pragma once
// FileIStream and FileOStream: the OpenEXR library's input and output stream
// interfaces over the host's IOClass, so OpenEXR files are read and written
// through the format's stream (a file or memory) like every other format.
//
// Positions count from where the stream stood when the adaptor was made, so a
// file embedded at an offset reads as if it started at 0. Short reads, failed
// seeks and short writes throw Iex exceptions, which is how the library
// expects a stream to fail; FileOStream also remembers a failed write, since
// the library swallows exceptions while it finishes a file in a destructor.
//
// Thread safety: the library serialises its own stream access; one adaptor
// belongs to one file object.
#include <ImfIO.h>

#include <cstdint>
#include <string>

namespace Orvane {

class IOClass;

class FileIStream : public Imf::IStream {
public:
    explicit FileIStream(IOClass *io);

    bool read(char c[], int n) override;
    uint64_t tellg() override;
    void seekg(uint64_t pos) override;

private:
    IOClass *io_;
    int64_t base_;
};

class FileOStream : public Imf::OStream {
public:
    explicit FileOStream(IOClass *io);

    void write(const char c[], int n) override;
    uint64_t tellp() override;
    void seekp(uint64_t pos) override;

    /// True once a write or seek has failed.
    bool Failed() const { return failed_; }

private:
    IOClass *io_;
    int64_t base_;
    bool failed_ = false;
};

} // namespace Orvane
