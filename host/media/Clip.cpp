#include "host/media/Clip.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormatList.h"
#include "host/media/OutputFile.h"

namespace Orvane {

namespace {

/// `why` without the path in it (a library may quote it): a message names
/// the file once, in front.
std::string WithoutPath(std::string why, const std::string &path) {
    for (const std::string &form : {" \"" + path + "\"", "\"" + path + "\"", path})
        for (size_t at; !form.empty() && (at = why.find(form)) != std::string::npos;) why.erase(at, form.size());
    return why;
}

} // namespace

Clip::Clip(std::string fileName) { SetFileName(std::move(fileName)); }

void Clip::SetFileName(std::string fileName) {
    fileName_ = std::move(fileName);
    sequence_ = ParseSequenceName(fileName_);
    initialFrame_ = sequence_.hasNumber ? sequence_.number : 0;
    length_ = 1;
    found_ = {};
    readFormat_.Reset();
    readFormatPath_.clear();
}

bool Clip::Scan(std::string &error) {
    if (!sequence_.hasNumber) {
        // The file must open for reading as a regular file; a FIFO or folder is said so.
        if (!FileIO::Open(fileName_, FileIO::Mode::Read, error)) return false;
        length_ = 1;
        return true;
    }
    found_ = ScanSequence(sequence_);
    if (found_.frames.empty()) {
        error = SequenceDisplayName(sequence_) + ": no file of the sequence exists";
        return false;
    }
    initialFrame_ = found_.frames.front();
    length_ = found_.frames.back() - found_.frames.front() + 1;
    return true;
}

std::string Clip::FramePath(int64_t frame) const {
    return sequence_.hasNumber ? SequencePath(sequence_, SequenceNumber(frame)) : fileName_;
}

Ref<Image> Clip::GetFrameTagList(int64_t frame, const TagList &tags, std::string &error,
                                 const std::function<void(ImageFormat &)> &prepare) {
    std::lock_guard<std::mutex> guard(lock_);
    const std::string path = FramePath(frame);
    std::unique_ptr<FileIO> io = FileIO::Open(path, FileIO::Mode::Read, error);
    if (!io) return nullptr;
    Ref<ImageFormat> format;
    if (readFormat_ && readFormatPath_ == SequenceDisplayName(sequence_)) {
        // The same format serves every file of a sequence; confirm the file.
        if (readFormat_->CheckFormat(io.get()) && io->Seek(0, IOClass::SeekStart)) format = readFormat_;
    }
    if (!format) {
        io->Seek(0, IOClass::SeekStart);
        format = FindFormatForReading(path, io.get(), error);
        if (!format) return nullptr;
    }
    format->Close();
    format->io = io.get();
    format->abortFlag = tags.GetPtrAs<const std::atomic<bool>>(ClipFrameAbort);
    format->proxyScale = static_cast<int>(std::max<long long>(1, tags.GetLong(ClipFrameProxyScale, 1)));
    format->metadata = ScriptVal::Table();
    format->dataWindow.reset();
    format->auxChannels = 0;
    if (prepare) prepare(*format);
    Ref<Image> image;
    const bool ok = format->LoadHeader(io.get()) &&
                    format->LoadFrameTagList(static_cast<unsigned>(std::max<int64_t>(frame, 0)), image, tags);
    format->Close();
    format->io = nullptr;
    if (!ok || !image) {
        error = path + ": " +
                (format->Error().empty() ? std::string("cannot read the frame") : WithoutPath(format->Error(), path));
        return nullptr;
    }
    readFormat_ = format;
    readFormatPath_ = SequenceDisplayName(sequence_);
    SetAttrsTagList({{ClipWidth, format->width},
                     {ClipHeight, format->height},
                     {ClipAspectX, format->aspectX},
                     {ClipAspectY, format->aspectY}});
    return image;
}

namespace {

/// A temporary file that is removed unless it was renamed into place.
struct TemporaryFile {
    explicit TemporaryFile(std::string p) : path(std::move(p)) {}
    ~TemporaryFile() {
        if (!path.empty()) unlink(path.c_str());
    }
    std::string path;
};

} // namespace

bool Clip::PutFrameTagList(int64_t frame, Image *image, const TagList &tags, std::string &error,
                           const std::function<void(ImageFormat &)> &configure) {
    if (!image) {
        error = "no image to write";
        return false;
    }
    std::lock_guard<std::mutex> guard(lock_);
    const std::string path = FramePath(frame);
    auto fail = [&](const std::string &reason) {
        error = path + ": " + reason;
        return false;
    };
    std::string target;
    if (!ResolveOutputFile(path, target, error)) return false;
    Ref<ImageFormat> format;
    if (!saveFormat_.IsNull()) {
        const Registry *row = ClassRegistry ? ClassRegistry->Find(saveFormat_) : nullptr;
        format = row ? NewImageFormat(row) : Ref<ImageFormat>();
        if (!format) return fail(std::string(saveFormat_.Text()) + " is not a file format that can write");
    } else {
        format = FindFormatForWriting(path, error);
    }
    if (!format) return false;
    if (configure) configure(*format);
    const std::filesystem::path folder = std::filesystem::path(target).parent_path();
    std::error_code ec;
    if (!folder.empty() && tags.GetBool(ClipFrameMakeFolders)) std::filesystem::create_directories(folder, ec);
    if (!folder.empty() && !std::filesystem::is_directory(folder, ec)) return fail("the folder does not exist");

    TemporaryFile temp(TemporaryFileFor(target));
    std::unique_ptr<FileIO> io = FileIO::Open(temp.path, FileIO::Mode::CreateNew, error, path);
    int err = io ? 0 : errno;
    if (err == EEXIST) { // left by an earlier process with this number
        unlink(temp.path.c_str());
        io = FileIO::Open(temp.path, FileIO::Mode::CreateNew, error, path);
        err = io ? 0 : errno;
    }
    if (!io) return fail(std::strerror(err));
    format->io = io.get();
    const bool written = format->SaveHeader(io.get(), image) &&
                         format->SaveFrame(static_cast<unsigned>(std::max<int64_t>(frame, 0)), image);
    format->Close();
    format->io = nullptr;
    if (!written) return fail(format->Error().empty() ? "cannot write the frame" : format->Error());
    if (!io->Close()) return fail(std::strerror(errno ? errno : EIO));
    // The target may have changed while the frame was written: check again.
    std::string again;
    if (!ResolveOutputFile(path, again, error)) return false;
    if (again != target) return fail("the file was replaced by a link while the frame was written");
    struct stat old {};
    if (stat(target.c_str(), &old) == 0) chmod(temp.path.c_str(), old.st_mode & 07777); // keep its permissions
    if (std::rename(temp.path.c_str(), target.c_str()) != 0) return fail(std::strerror(errno));
    temp.path.clear();
    return true;
}

OvID Clip::DataType() const { return CLSID_DataType_Clip; }

bool Clip::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Clip *>(&other);
    return o && o->fileName_ == fileName_;
}

uint64_t Clip::Hash() const { return HashBytes(fileName_.data(), fileName_.size()); }

Ref<Parameter> Clip::Copy() const { return MakeRef<Clip>(fileName_); }

} // namespace Orvane
