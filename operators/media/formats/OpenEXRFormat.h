#pragma once
// OpenEXRFormat: OpenEXR files (.exr, .sxr) read and written through the
// OpenEXR library over the format's stream (FileIStream / FileOStream), with
// the library's worker threads (Imf::globalThreadCount, set once from the
// machine's core count).
//
// Geometry. The display window gives the image size; the data window becomes
// the image's data window, turned upside down because files run top down and
// images bottom up. With the display window's origin subtracted and its
// height h:  x0 = min.x, x1 = max.x + 1, y0 = h - max.y - 1, y1 = h - min.y.
// The data window may lie partly or wholly outside the frame. Pixels outside
// it are canvas (zero). Pixel aspect: aspectX = pixelAspectRatio, aspectY = 1.
//
// Parts and views. LoadHeader reads every part's header (Parts()). The part
// read is the one the Part option names; by default the first flat part of
// the chosen view that holds colour channels. A multi-view file (a
// "multiView" attribute, or parts with a "view" attribute) is read in the view
// the View option names; by default in its left eye: the view named "left"
// (else the file's default view), or its right eye, the view named "right"
// (else the second view), when the format attribute FormatStereoEye is 1
// (SetAttrsTagList before LoadHeader). A Part or View the file lacks fails.
// In a single-part multi-view file the default view's channels have bare
// names, the others carry the view's name. Auxiliary channels are read from
// the chosen part only.
//
// Channels. 22 slots (Slot): R, G, B, A and the 18 auxiliary channels, in
// the order of AuxChannelKind. Each slot reads the channel its chooser names,
// or by default the channel of its default name (DefaultChannelName; for the
// colour slots lower-case r, g, b, a too), in the view's prefix and in the
// layer the Layer option names; without one, when the part has no bare
// colour channels, in the first layer that has them (or the layer of a
// channel the user chose for R, G, B or A). A file with Y but no
// R, G, B loads as grey; one with RY / BY chroma too is converted to RGB by
// the library's luminance / chroma reader (first part only). Missing colour
// channels read as 0, a missing A as 1. Images are premultiplied, as EXR
// pixels are: no alpha conversion. The image is float16 (depth 7) when every
// colour channel read is HALF, float32 (depth 8) otherwise; HALF pixels load
// bit-exact. Auxiliary channels go to float planes of the image. Deep parts
// and sub-sampled channels (other than luminance / chroma) are refused.
//
// Layers. With "Load All Layers" on, Metadata "Layers" lists the layer names
// of the part read (ChannelList::layers); the layers themselves are not
// loaded, since an image here has one set of colour channels: a layer is read
// by choosing its channels in the channel choosers.
//
// Display conversion (load options). With Bypass off and any of Defog,
// Exposure, Knee Low, Knee High away from its neutral value (0, 0, 0, 5),
// R, G and B become
//     v = max(0, v - defog) * 2^(exposure + 2.47393)
//     if v > k = 2^kneeLow:  v = k + log(1 + (v - k) f) / f,
//         with f > 0 such that 2^kneeHigh maps to 2^3.5 (f = 0 when kneeHigh <= 3.5)
//     v = v * 0.184874
// Alpha and auxiliary channels are left alone. At the neutral values nothing
// is touched and pixels load exactly as stored.
//
// Metadata. Every header attribute of a known type is read into Metadata
// under its name: string, int, float, double as text and numbers; v2/v3,
// box2, m33/m44, chromaticities, rational, keycode, string and float vectors
// as tables whose class name is the attribute type ("v2f { 1, 2 }"); time
// codes as text "hh:mm:ss:ff". timeCode, envmap and focus are named TimeCode,
// EnvMap and Focus. Metadata "OpenEXRTypes" records the type of each number
// and time code so writing gives back the same types. Writing puts back every
// entry that is not structural (channels, windows, compression, line order,
// aspect, screen window, name, type, view, version, chunk count, tiles);
// numbers without a recorded type are written as float, flags as int, text
// lists as string vectors, other tables only when their class names a type.
//
// Writing. One scan-line part: display window 0..w-1 x 0..h-1, the data
// window from the image's (flipped; an empty one is written as one zero
// pixel at 0,0), the chosen compression and levels, the slots whose boxes are
// ticked under their file names (auxiliary slots only where the image has the
// plane). Depth Auto writes HALF colour for float16 and 8-bit images (half
// keeps every 8-bit level) and FLOAT for float32 and 16-bit ones, with FLOAT
// auxiliary channels; float16 / float32 force every channel. Pixels whose
// stored type is the channel's go to the library as they are; the others
// (integer and mask images, 0..max to 0..1; floats of the other width) are
// converted a band of rows at a time. A single-channel image writes its
// value in every colour slot.
//
// Describing (DescribeFile) adds, under "openexr": version, multiPart,
// views, partRead, viewRead, slots (slot ID = file channel read) and parts,
// each with index, name, view, type, dataWindow and displayWindow (as the
// file holds them: y down, max inclusive), compression, lineOrder, tiles,
// channels (name, type half / float / uint32, xSampling, ySampling, pLinear) and every
// header attribute (name, type, value). "channels" is the part read's list.
// A file the reader refuses (deep data only, say) is still described, with
// "readError" in place of the image keys.
//
// Options: see AddLoadInputs / AddSaveInputs. An older input ID for the zip
// level is not accepted: inputs here have one ID each.
//
// Thread safety: one object serves one clip, which serialises its use.
#include <memory>
#include <string>
#include <vector>

#include "host/image/Rect.h"
#include "host/media/ImageFormat.h"

namespace Orvane {

/// One part of a file, as its header describes it.
struct OpenEXRPart {
    std::string name; ///< "name" attribute ("" when absent)
    std::string view; ///< "view" attribute ("" when absent)
    std::vector<std::string> channels;
    /// File coordinates (rows top down), max exclusive: x1 = max.x + 1.
    ImgRectI dataWindow, displayWindow;
    bool tiled = false, deep = false;
};

class OpenEXRFormat : public ImageFormat {
public:
    OpenEXRFormat(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~OpenEXRFormat() override;

    enum Slot : int {
        SlotR,
        SlotG,
        SlotB,
        SlotA,
        SlotZ,
        SlotCoverage,
        SlotObjID,
        SlotMatID,
        SlotU,
        SlotV,
        SlotXNorm,
        SlotYNorm,
        SlotZNorm,
        SlotXVel,
        SlotYVel,
        SlotXRevVel,
        SlotYRevVel,
        SlotXPos,
        SlotYPos,
        SlotZPos,
        SlotXDisp,
        SlotYDisp,
        SlotCount
    };
    static constexpr int FirstAuxSlot = SlotZ;
    /// "R", "XVel", ...: the slot's part of its input IDs.
    static const char *SlotID(int slot);
    /// "Red", "X Velocity", ...
    static const char *SlotLabel(int slot);
    /// "R", "velX", ...: the channel name read and written by default.
    static const char *DefaultChannelName(int slot);

    bool CheckFormat(IOClass *io) override;
    void Close() override;
    void AddLoadInputs(Operator *tool) override;
    void SetupLoad(Operator *tool, Request *req) override;
    void AddSaveInputs(Operator *tool) override;
    void SetupSave(Operator *tool, Request *req) override;
    bool LoadHeader(IOClass *io) override;
    bool LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) override;
    bool SaveHeader(IOClass *io, Image *image) override;
    bool SaveFrame(unsigned frame, Image *image) override;
    int64_t PredictFileSize(Image *image) override;
    bool DescribeFile(IOClass *io, ScriptVal &description) override;

    // What the last LoadHeader found.
    const std::vector<OpenEXRPart> &Parts() const { return parts_; }
    const std::vector<std::string> &Views() const { return views_; }
    int ChosenPart() const { return part_; }
    const std::string &ChosenView() const { return view_; }
    /// The file channel a slot reads ("" for none).
    const std::string &SlotChannel(int slot) const { return slotChannel_[slot]; }

    struct Reader;
    struct Writer;

private:
    bool ReadRows(Image &image, const ImgRectI &window);
    bool ReadLumaChroma(Image &image, const ImgRectI &window);
    void ApplyDisplay(Image &image, const ImgRectI &window) const;

    std::unique_ptr<Reader> reader_;
    std::unique_ptr<Writer> writer_;
    std::vector<OpenEXRPart> parts_;
    std::vector<std::string> views_;
    std::string view_;
    int part_ = 0;
    std::string slotChannel_[SlotCount];
    bool lumaOnly_ = false, lumaChroma_ = false;

    // Load options.
    bool bypass_ = false, loadLayers_ = false;
    double defog_ = 0.0, exposure_ = 0.0, kneeLow_ = 0.0, kneeHigh_ = 5.0;
    std::string partChoice_, viewChoice_, layerChoice_;
    std::string channelChoice_[SlotCount];

    // Save options.
    int depthMode_ = 0, compression_ = 3, zipLevel_ = 4;
    double dwaLevel_ = 45.0;
    bool saveSlot_[SlotCount];
    std::string saveName_[SlotCount];
};

} // namespace Orvane
