#pragma once
// MediaFormat and ImageFormat: the contract of a file format. A format class
// (registered with family RegFamilyImageFormat, its file type name and its
// extensions) turns a stream into images and images into a stream; the
// host's clip picks it by extension (ImageFormatList) and confirms it with
// CheckFormat.
//
// Reading:  LoadHeader(io) fills width, height, depth, aspect (and the data
//           window and auxiliary channels when the file has them); then
//           LoadFrameTagList(frame, image, tags) makes the image (the base
//           does that from the fields) and fills its pixels. The base
//           refuses, before anything is allocated, a frame whose header asks
//           for more pixel memory than the process may hold
//           (PixelMemory.h), so no format reads a damaged header's size.
//           Tags:
//             ClipFrameRegion      const ImageDomain *: decode only these rows
//                                   and columns (the image's data window)
//             ClipFrameHeaderOnly  1: the image gets no pixels (pre-calculation)
//             ClipFrameProxyScale  set as proxyScale before LoadHeader
// Writing:  SaveHeader(io, image), then SaveFrame(frame, image).
// Describing: DescribeFile(io, description) tells what a file holds (the
//           command line's info); formats add what their files carry.
// Options:  AddLoadInputs / AddSaveInputs add the format's inputs to the
//           reading or writing tool; SetupLoad / SetupSave read them for one
//           request (a null tool means the defaults); Cleanup* release.
//
// A format checks the abort word at each line and returns false when it is
// set. Failures return false and leave `error` saying why in a few words.
//
// Thread safety: one format object serves one clip, which serialises its use.
#include <atomic>
#include <cstdint>
#include <optional>
#include <string>

#include "host/core/Object.h"
#include "host/core/Registry.h"
#include "host/core/ScriptVal.h"
#include "host/image/Image.h"

namespace Orvane {

class Input;
class IOClass;
class Operator;
class Request;

class ORVANE_API MediaFormat : public RefObject {
public:
    MediaFormat(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~MediaFormat() override;

    /// True when the stream (at its start) holds this format.
    virtual bool CheckFormat(IOClass *io);
    /// Releases what the format holds between frames.
    virtual void Close();

    virtual void AddLoadInputs(Operator *tool);
    virtual void NotifyChangedLoad(Operator *tool, Input *in, Parameter *param, double time);
    virtual void SetupLoad(Operator *tool, Request *req);
    virtual void CleanupLoad(Operator *tool);
    virtual void AddSaveInputs(Operator *tool);
    virtual void NotifyChangedSave(Operator *tool, Input *in, Parameter *param, double time);
    virtual void SetupSave(Operator *tool, Request *req);
    virtual void CleanupSave(Operator *tool);

    /// What went wrong last, in a few words ("truncated line 12").
    const std::string &Error() const { return error_; }

    static bool RegInit(Registry *reg);
    static void RegCleanup(Registry *reg);

    /// Adds a yes-or-no option to the reading or writing tool (no external connection).
    static Input *AddOptionCheckbox(Operator *tool, const char *label, const char *id, double def);
    /// The number an option input of the tool's current group holds for
    /// `req`; `def` without a tool, a request or such an input.
    static double OptionValue(Operator *tool, Request *req, const char *id, double def);

protected:
    bool Fail(std::string why);
    std::string error_;
};

class ORVANE_API ImageFormat : public MediaFormat {
public:
    using MediaFormat::MediaFormat;

    virtual bool LoadHeader(IOClass *io);
    /// Makes `image` from the header fields (and the region tag) and, in a
    /// format's override, fills its pixels.
    virtual bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags);
    virtual bool SaveHeader(IOClass *io, Image *image);
    virtual bool SaveFrame(unsigned frame, Image *image);
    /// Bytes one frame will take (disk space checks).
    virtual int64_t PredictFileSize(Image *image);
    /// Describes the file at the stream's position, in these keys and any the
    /// format adds:
    ///   width, height, pixelAspect   the frame as read
    ///   imageDepth                   the image reading makes ("RGBA float16")
    ///   dataWindow                   { x0, y0, x1, y1 }: image coordinates, y up, max exclusive
    ///   channels                     { { name = "Y", type = "uint16" }, ... }: what the file stores
    ///   metadata                     what reading attaches to the image (when anything)
    /// The default reads the header and makes the header image. False, with
    /// Error(), when the header cannot be read.
    virtual bool DescribeFile(IOClass *io, ScriptVal &description);

    // The stream and the header fields, kept between the calls.
    IOClass *io = nullptr;
    const std::atomic<bool> *abortFlag = nullptr;
    int proxyScale = 1;
    int width = 0, height = 0;
    double aspectX = 1.0, aspectY = 1.0;
    int depth = 0; ///< image depth the file maps to (1..8)
    /// Where the file's pixels lie in image coordinates, when not the frame;
    /// the clip clears it (and auxChannels) before each LoadHeader.
    std::optional<ImgRectI> dataWindow;
    int auxChannels = 0; ///< auxiliary float planes the frame will carry
    /// Metadata read from the file, handed to the image it makes.
    ScriptVal metadata = ScriptVal::Table();
    /// What the file stores where it differs from `depth` (descriptions
    /// only): channel names separated by spaces ("Y A") and their sample
    /// type ("uint16"). LoadHeader sets both or neither.
    std::string fileChannels, fileSampleType;

    bool Aborted() const { return abortFlag && abortFlag->load(std::memory_order_relaxed); }
};

/// Makes a format object from its registry row; null if the row is no format.
ORVANE_API Ref<ImageFormat> NewImageFormat(const Registry *row);

} // namespace Orvane
