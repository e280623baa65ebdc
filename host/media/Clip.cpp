#include "host/media/Clip.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <unistd.h>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormatList.h"

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

bool Clip::PutFrameTagList(int64_t frame, Image *image, const TagList &tags, std::string &error,
                           const std::function<void(ImageFormat &)> &configure) {
    if (!image) {
        error = "no image to write";
        return false;
    }
    std::lock_guard<std::mutex> guard(lock_);
    const std::filesystem::path target(FramePath(frame));
    Ref<ImageFormat> format;
    if (!saveFormat_.IsNull()) {
        const Registry *row = ClassRegistry ? ClassRegistry->Find(saveFormat_) : nullptr;
        format = row ? NewImageFormat(row) : Ref<ImageFormat>();
        if (!format) error = std::string(saveFormat_.Text()) + " is not a file format that can write";
    } else {
        format = FindFormatForWriting(target.string(), error);
    }
    if (!format) return false;
    if (configure) configure(*format);
    std::error_code ec;
    if (target.has_parent_path() && tags.GetBool(ClipFrameMakeFolders))
        std::filesystem::create_directories(target.parent_path(), ec);
    // The temporary name keeps the extension, so tools that look at it see the format.
    const std::filesystem::path temp = target.parent_path() / ("." + target.stem().string() + ".part" +
                                                               std::to_string(getpid()) + target.extension().string());
    std::unique_ptr<FileIO> io = FileIO::Open(temp.string(), FileIO::Mode::Write, error);
    if (!io) return false;
    format->io = io.get();
    bool ok = format->SaveHeader(io.get(), image) &&
              format->SaveFrame(static_cast<unsigned>(std::max<int64_t>(frame, 0)), image);
    format->Close();
    format->io = nullptr;
    if (!ok) error = target.string() + ": " + (format->Error().empty() ? "cannot write the frame" : format->Error());
    if (!io->Close() && ok) {
        ok = false;
        error = target.string() + ": " + std::strerror(errno ? errno : EIO);
    }
    if (ok) {
        std::filesystem::rename(temp, target, ec);
        if (ec) {
            ok = false;
            error = target.string() + ": " + ec.message();
        }
    }
    if (!ok) std::filesystem::remove(temp, ec);
    return ok;
}

OvID Clip::DataType() const { return CLSID_DataType_Clip; }

bool Clip::Equals(const Parameter &other) const {
    auto *o = dynamic_cast<const Clip *>(&other);
    return o && o->fileName_ == fileName_;
}

uint64_t Clip::Hash() const { return HashBytes(fileName_.data(), fileName_.size()); }

Ref<Parameter> Clip::Copy() const { return MakeRef<Clip>(fileName_); }

} // namespace Orvane
