#include "operators/media/formats/ExrStreams.h"

#include <Iex.h>

#include <limits>

#include "host/media/IOClass.h"

namespace Orvane {
namespace exrstreams_detail {

/// The name the library puts into its messages: the file's path when the
/// stream is a file.
const char *StreamName(IOClass *io) {
    const auto *file = dynamic_cast<const FileIO *>(io);
    return file ? file->Path().c_str() : "stream";
}

int64_t Offset(int64_t base, uint64_t pos) {
    if (pos > static_cast<uint64_t>(std::numeric_limits<int64_t>::max() - base))
        throw Iex::InputExc("seek position out of range");
    return base + static_cast<int64_t>(pos);
}

} // namespace exrstreams_detail

namespace esd = exrstreams_detail;

FileIStream::FileIStream(IOClass *io) : Imf::IStream(esd::StreamName(io)), io_(io), base_(io->Tell()) {}

bool FileIStream::read(char c[], int n) {
    if (n < 0 || io_->Read(c, n) != n) throw Iex::InputExc("unexpected end of file");
    return true;
}

uint64_t FileIStream::tellg() { return static_cast<uint64_t>(io_->Tell() - base_); }

void FileIStream::seekg(uint64_t pos) {
    if (!io_->Seek(esd::Offset(base_, pos), IOClass::SeekAbsolute)) throw Iex::InputExc("seek error");
}

FileOStream::FileOStream(IOClass *io) : Imf::OStream(esd::StreamName(io)), io_(io), base_(io->Tell()) {}

void FileOStream::write(const char c[], int n) {
    if (n < 0 || !io_->WriteExact(c, n)) {
        failed_ = true;
        throw Iex::IoExc("write error");
    }
}

uint64_t FileOStream::tellp() { return static_cast<uint64_t>(io_->Tell() - base_); }

void FileOStream::seekp(uint64_t pos) {
    if (!io_->Seek(esd::Offset(base_, pos), IOClass::SeekAbsolute)) {
        failed_ = true;
        throw Iex::IoExc("seek error");
    }
}

} // namespace Orvane
