#pragma once
// Clip: a file or a numbered sequence of files, read and written frame by
// frame through the file formats.
//
// Frames of a clip count from 0; frame f of a sequence is the file numbered
// InitialFrame() + f ("shot.1001.exr" is frame 0 of a clip whose first file
// is 1001). A single file is a clip of one frame. Scan() looks at the disk:
// the numbers present, the first, the last, and the gaps between.
//
// Reading (GetFrameTagList) finds the format by extension and check (once
// per file name) and loads the frame with the tags a format takes
// (ClipFrameRegion, ClipFrameHeaderOnly, ClipFrameProxyScale, ClipFrameAbort).
// Writing (PutFrameTagList) replaces only a regular file (or writes through
// a link to one; host/media/OutputFile.h). It writes the frame to a
// temporary name beside the target and renames it when complete, so no
// truncated frame ever stands under a final name; the temporary goes on any
// failure, an exception included, and a replaced file's permissions are
// kept. Missing folders are made when the tag ClipFrameMakeFolders asks for
// it. Write errors name the frame's file once ("path: reason").
//
// Attributes (ClipStart, ClipTrimIn, ... in host/core/Tags.h) carry what a
// tool decides about the clip: its place on the time line, trims, holds.
//
// Thread safety: a clip serialises its reads and writes with its own lock,
// so several render threads may share one clip.
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>

#include "host/flow/Parameter.h"
#include "host/image/Image.h"
#include "host/media/ImageFormat.h"
#include "host/media/Sequence.h"

namespace Orvane {

class ORVANE_API Clip : public Parameter {
public:
    explicit Clip(std::string fileName = {});

    const std::string &FileName() const { return fileName_; }
    void SetFileName(std::string fileName);
    const SequenceName &Sequence() const { return sequence_; }
    bool IsSequence() const { return sequence_.hasNumber; }

    /// Reads the folder: which frames exist. False (with a reason) when no
    /// file of the clip exists.
    bool Scan(std::string &error);
    /// Sequence number of frame 0; the number in the file name until Scan.
    int64_t InitialFrame() const { return initialFrame_; }
    /// Frames from the first to the last file found (gaps included); 1 for
    /// a single file.
    int64_t Length() const { return length_; }
    const SequenceScan &Found() const { return found_; }

    /// The path of clip frame `frame`.
    std::string FramePath(int64_t frame) const;
    /// The number written into the file of clip frame `frame`.
    int64_t SequenceNumber(int64_t frame) const { return initialFrame_ + frame; }
    /// Makes frame 0 the file numbered `number` (writing a sequence).
    void SetStartFrame(int64_t number) { initialFrame_ = number; }

    /// Loads clip frame `frame`; null with a reason when it cannot. `prepare`,
    /// when given, is called with the format before the file is read (the
    /// reading tool's options). A successful read records the frame's size
    /// and aspect in the attributes ClipWidth, ClipHeight, ClipAspectX/Y.
    Ref<Image> GetFrameTagList(int64_t frame, const TagList &tags, std::string &error,
                               const std::function<void(ImageFormat &)> &prepare = {});
    /// The format that read the last frame (its header fields), if any.
    const Ref<ImageFormat> &ReadFormat() const { return readFormat_; }

    /// The format class that writes this clip; null: the one the file
    /// extension names.
    void SetSaveFormat(OvID formatClass) { saveFormat_ = formatClass; }
    OvID SaveFormat() const { return saveFormat_; }

    /// Writes `image` as clip frame `frame`. `configure`, when given, is
    /// called with the format before writing (the writing tool's options).
    bool PutFrameTagList(int64_t frame, Image *image, const TagList &tags, std::string &error,
                         const std::function<void(ImageFormat &)> &configure = {});

    // Parameter
    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(fileName_); }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;

private:
    std::string fileName_;
    SequenceName sequence_;
    int64_t initialFrame_ = 0, length_ = 1;
    SequenceScan found_;
    std::mutex lock_;
    Ref<ImageFormat> readFormat_;
    std::string readFormatPath_;
    OvID saveFormat_;
};

} // namespace Orvane
