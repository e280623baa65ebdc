#pragma once
// Image: the host's picture.
//
// Geometry. The image rectangle runs from (0, 0) to (width, height); rows are
// counted from the bottom. The data window is where pixels exist; it may lie
// partly or wholly outside the image rectangle. The valid window is the part
// of the data window a request needed filled. Everything outside the data
// window has the canvas colour.
//
// Storage. Rows are allocated late, by AllocScanLineData, just before the
// first write; an image made for pre-calculation never gets rows (IsNoData).
// Row y (data-window coordinates y0..y1-1) starts at the pixel x = x0 of the
// data window; PixelAddress(x, y) finds any pixel of the window.
//
// Auxiliary channels (Z, coverage, IDs, UV, normals, vectors, positions,
// disparity) live in planes of their own beside the colour rows, sharing the
// data window, so adding one never changes the colour layout.
//
// Ownership: reference counted (Use/Recycle, Ref<Image>). An image handed on
// unchanged is shared, never copied; a shared image is read only.
//
// Thread safety: the rows may be written by several workers at once as long as
// each writes rows of its own; metadata changes belong to the image's maker
// before it is handed over.
#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

#include "host/flow/Parameter.h"
#include "host/image/Pixel.h"
#include "host/image/Rect.h"

namespace Orvane {

class GPUMemory;
class OrvaneDoc;
class Request;

enum class AuxChannelKind : uint8_t {
    Z,
    Coverage,
    ObjectID,
    MaterialID,
    U,
    V,
    NormalX,
    NormalY,
    NormalZ,
    VectorX,
    VectorY,
    BackVectorX,
    BackVectorY,
    PositionX,
    PositionY,
    PositionZ,
    DisparityX,
    DisparityY,
    Count
};

/// Gives an image's row block back to pixel memory.
struct ORVANE_API PixelBlockDeleter {
    size_t bytes = 0;
    void operator()(uint8_t *block) const;
};

class ORVANE_API Image : public Parameter {
public:
    /// Use NewImageTagList to make images for requests.
    Image(int width, int height, int depth);
    ~Image() override;

    // ---- format ----
    int Width() const { return width_; }
    int Height() const { return height_; }
    int Depth() const { return depth_; }
    const PixelFormat &Format() const { return format_; }
    int BytesPerPixel() const { return format_.BytesPerPixel(); }
    bool IsMask() const { return depth_ <= DepthAFlt32; }
    bool IsFloat() const { return format_.isFloat; }
    bool IsAInt8() const { return depth_ == DepthAInt8; }
    bool IsAInt16() const { return depth_ == DepthAInt16; }
    bool IsAFlt16() const { return depth_ == DepthAFlt16; }
    bool IsAFlt32() const { return depth_ == DepthAFlt32; }
    bool IsRGBAInt32() const { return depth_ == DepthRGBAInt8; }
    bool IsRGBAInt64() const { return depth_ == DepthRGBAInt16; }
    bool IsRGBAFlt64() const { return depth_ == DepthRGBAFlt16; }
    bool IsRGBAFlt128() const { return depth_ == DepthRGBAFlt32; }
    double XScale() const { return xScale_; }
    double YScale() const { return yScale_; }
    void SetScale(double x, double y) {
        xScale_ = x;
        yScale_ = y;
    }
    ImgRectI Frame() const { return ImgRectI(0, 0, width_, height_); }

    // ---- windows ----
    const ImgRectI &DataWindow() const { return dataWindow_; }
    const ImgRectI &ValidWindow() const { return validWindow_; }
    /// Sets the data window; only before rows exist.
    void SetDataWindow(const ImgRectI &r);
    void SetValidWindow(const ImgRectI &r) { validWindow_ = r & dataWindow_; }

    // ---- canvas ----
    FltPixel GetCanvasColor() const { return canvas_; }
    void GetCanvasColor(Pixel &p) const;
    void SetCanvasColor(const FltPixel &c) { canvas_ = c; }
    void SetCanvasColor(const Pixel &p);
    void CopyCanvasColor(const Image *from) { canvas_ = from->canvas_; }
    bool IsCanvasColorClear() const { return canvas_ == FltPixel{}; }
    /// One channel of the canvas colour (0 R, 1 G, 2 B, 3 A). A single-channel
    /// image reads its value into all four channels, so setting its channel 3
    /// sets all four.
    float GetCanvasColorFltChan(int channel) const;
    void SetCanvasColorFltChan(int channel, float v);

    // ---- rows ----
    /// Makes the rows exist (zeroed). False when memory ran out or the
    /// memory limit refused them (PixelMemory.h: TakePixelRefusal says what
    /// was needed).
    bool AllocScanLineData();
    bool HasScanLineData() const { return !rows_.empty(); }
    bool IsNoData() const { return noData_; }
    void SetNoData(bool v) { noData_ = v; }
    /// Start of row y (x = data window x0), or null outside the window / without rows.
    uint8_t *ScanLine(int y) const {
        const int i = y - dataWindow_.y0;
        return (i < 0 || i >= static_cast<int>(rows_.size())) ? nullptr : rows_[i];
    }
    template <class T> T *Row(int y) const { return reinterpret_cast<T *>(ScanLine(y)); }
    /// Address of pixel (x, y) inside the data window, null elsewhere.
    uint8_t *PixelAddress(int x, int y) const;
    size_t RowBytes() const { return static_cast<size_t>(dataWindow_.Width()) * BytesPerPixel(); }
    /// Bytes of pixel memory held.
    size_t DataBytes() const;

    // ---- device memory (GPUMemory.h) ----
    /// The image's device image, if it has one.
    Ref<GPUMemory> GetGPUMem() const;
    /// Gives the image a device image (null: none). `dirty`: the device holds
    /// pixels that main memory does not have yet.
    void SetGPUMem(GPUMemory *mem, bool dirty);
    /// Main memory lags behind the device image.
    bool IsGPUMemDirty() const;
    void SetGPUMemDirtyFlag(bool dirty);
    /// Brings main memory up to date from the device (allocating the rows);
    /// does nothing when it is not behind. False when the download failed.
    bool DownloadGPUMem() const;
    /// Bytes of device memory held.
    size_t GPUBytes() const;

    // ---- attributes and state ----
    void SetReadOnly(bool v = true) { readOnly_ = v; }
    bool IsReadOnly() const { return readOnly_; }
    void SetIsOpaque(bool v) { opaque_ = v; }
    bool IsOpaque() const { return opaque_; }
    /// True when the image may be stored as one constant colour.
    bool IsSimple() const { return simple_; }
    void SetSimple(bool v) { simple_ = v; }
    /// The render this image belongs to was abandoned.
    bool CheckAbort() const { return abort_ && abort_->load(std::memory_order_relaxed); }
    void SetAbortFlag(const std::atomic<bool> *flag) { abort_ = flag; }
    const std::atomic<bool> *AbortFlag() const { return abort_; }

    /// The image's script table of metadata (colour space, gamma, time code,
    /// format attributes); an empty table when there is none.
    ScriptVal &Metadata() { return metadata_; }
    const ScriptVal &Metadata() const { return metadata_; }

    // ---- auxiliary channels ----
    /// Adds a float plane for `kind` over the data window (zeroed).
    bool AddAuxChannel(AuxChannelKind kind);
    bool HasAuxChannel(AuxChannelKind kind) const;
    /// True when the image has any auxiliary channel.
    bool HasAuxChannels() const { return !aux_.empty(); }
    float *AuxRow(AuxChannelKind kind, int y) const;

    // ---- pixel access (slow path: per call dispatch on depth) ----
    /// Pixel (x, y), or the canvas colour outside the data window.
    FltPixel GetFlt(int x, int y) const;
    void PutFlt(int x, int y, const FltPixel &p);

    // ---- whole-image services ----
    /// Fills the data window (or `within` clipped to it) with one colour.
    void Fill(const FltPixel &color);
    void FillWithin(const FltPixel &color, const ImgRectI &within);
    /// Sets every pixel, every auxiliary channel and the canvas to zero.
    void Clear();
    /// Copies `src` into this image over this image's data window: pixels of
    /// src where it has them, its canvas colour elsewhere; converts depth.
    void ImageCopy(const Image *src);

    // ---- field, scale and legal services (ImageFields.cpp, ImageResize.cpp, ImageLegal.cpp) ----
    /// Field work. Field 0 is the field holding the frame's top line, field 1 the other
    /// (counted from the top of the image rectangle, whatever the data window).
    /// `destField`: -1 makes a half-height image of that field alone (tagged ImgField = field,
    /// ImgFullHeight = this height, and ImgFieldOffset); 0 or 1 writes into that field of a
    /// full-height frame; 2 writes into the same field position as `field`.
    /// `mode`: 1 writes the destination field's lines only; 3 writes them and doubles each
    /// into the neighbouring line of the other field (line doubling).
    /// `into`: an existing full-height image to write into, or null to make a new one
    /// (same size, depth, windows and canvas as this; lines not written are zero/canvas).
    /// Returns the image written (into, or the new one); null when memory ran out, the
    /// arguments are out of range, or (destField -1) the field has no line.
    Ref<Image> CopyField(int field, Image *into, int destField, int mode) const;
    /// Swaps the temporal order of the two fields in place: the picture moves down
    /// by one line (the top line repeats). Only on an image this tool owns.
    void ReverseFieldDominance();
    /// A new image shrunk by whole factors (xFactor, yFactor >= 1, each a whole number)
    /// by averaging each xFactor x yFactor block; windows scale with it (rounded outward),
    /// the pixel aspect (XScale:YScale) follows unequal factors; rows in parallel. `req` may be null (used for abort).
    /// Null on abort, out of memory, or a factor below 1.
    Ref<Image> ScaleOfImage(Request *req, double xFactor, double yFactor) const;
    // ---- resampling (ImageResize.cpp, ImageCrop.cpp; docs/RESAMPLING.md) ----
    /// The resize request (Tags.h): ResizeFilter (RszTypes; default linear),
    /// ResizeWindow (sinc and Bessel), ResizeXScale/YScale (output pixels per
    /// source pixel; default dest.Width()/Width(), dest.Height()/Height()),
    /// ResizeXOffset/YOffset (output pixels; default 0), ResizeXEdges/YEdges
    /// (EdgeMode beyond the source window; default Duplicate),
    /// ResizeSourceWindow (const ImgRectI *: where the source may be read;
    /// default the data window joined with the frame), and the work tags.
    /// Output pixel o's centre o + 0.5 lies at source position
    /// (o + 0.5 - offset) / scale on each axis.
    /// Computes the per-axis coefficient tables for filling `dest`'s data
    /// window; `xTable`/`yTable` receive them (free with ResizePostCalc).
    /// False (and null tables) for an impossible request.
    bool ResizePreCalcTagList(Image *dest, void *&xTable, void *&yTable, const TagList &tags) const;
    /// Frees tables of ResizePreCalcTagList and nulls the pointers.
    static void ResizePostCalc(void *&xTable, void *&yTable);
    /// Fills `dest`'s data window from this image under the resize request
    /// (dest's canvas becomes this image's). Tables from ResizePreCalcTagList
    /// are used when they were made for the same request and cover dest's
    /// data window; other (or null) tables are ignored and the call builds
    /// its own. WorkUseGPU with a request whose render has a device runs it
    /// there (rows on failure). False on abort, an impossible request, or
    /// when memory ran out.
    bool ResizeTagList(Image *dest, void *xTable, void *yTable, const TagList &tags) const;
    bool ResizeTagList(Image *dest, const TagList &tags) const { return ResizeTagList(dest, nullptr, nullptr, tags); }
    /// The radius of a resize filter in source pixels at scale 1.
    static double GetResizeFilterSupport(int rszType);
    /// Copies this image into `dest`: dest pixel (i, j) is this image's
    /// (x + i * xStep, y + j * yStep), so with steps of 1 the picture moves by
    /// (-x, -y); outside this image's data window the canvas colour, which
    /// dest takes over. Converts depth. Tags: WorkRequest (abort),
    /// WorkThreaded. False on abort, steps below 1 or out of memory.
    bool ImageCrop(Image *dest, int x, int y, const TagList &tags, int xStep = 1, int yStep = 1) const;
    /// The colour at a position in 1/65536 pixel: x = (i << 16) + 32768 is
    /// the centre of pixel column i (so (i << 16) is its left edge), and the
    /// same for y and rows (counted from the bottom). Bilinear between the
    /// four pixels around the position, exact at centres; the canvas colour
    /// outside the data window. Into 8-bit (B), 16-bit (W) or float (D) RGBA
    /// (integers round to nearest and clamp). Slow path per call; tools use
    /// it for a few samples.
    void SamplePixelB(int32_t x, int32_t y, uint8_t out[4]) const;
    void SamplePixelW(int32_t x, int32_t y, uint16_t out[4]) const;
    void SamplePixelD(int32_t x, int32_t y, FltPixel &out) const;

    // ---- blur (ImageBlur.cpp; sizes and kernels in docs/BLUR.md) ----
    /// Blurs this image into `dest` (may be this image: in place) under the
    /// blur request (Tags.h: BlurFilterType, BlurDo*, BlurXSize/YSize
    /// normalised as control value / 720, BlurBlend, BlurScale, Blur*Scale,
    /// BlurPasses, BlurSourceWindow, work tags). Fills dest's data window.
    /// False on abort or when memory ran out.
    bool BlurTagList(Image *dest, const TagList &tags);
    /// The same into a new image like this one.
    Ref<Image> BlurOfImageTagList(const TagList &tags);
    /// Replaces normalised sizes x, y by the blur's reach in pixels for an
    /// image of `domain`'s frame (static) or this image; false when the
    /// filter's reach is unbounded (recursive Gaussians).
    static bool GetBlurSupport(int blurType, const ImageDomain *domain, double &x, double &y, int passes);
    bool GetBlurSupport(int blurType, double &x, double &y, int passes) const;
    /// A copy cut to (or grown to) the data window given by ImgDataWindow (const ImgRectI *)
    /// and valid window ImgValidWindow; outside this image's data window the canvas colour.
    /// Other tags as NewImageTagList.
    Ref<Image> CopyOfImageTagList(const TagList &tags) const;
    /// Broadcast-legal pass: videoType 0 NTSC, 1 NHK, 2 PAL/SECAM; action 0 none,
    /// 1 indicate illegal pixels as white, 2 as black, 3 adjust to legal; adjust 0 "100%
    /// saturation 100% amplitude", 1 "100% saturation 75% amplitude"; softClip 0..1 is the
    /// knee width as a fraction of the legal range (limits in ImageLegal.cpp).
    /// LegalOfImage makes a new image, ImageLegal works in place.
    Ref<Image> LegalOfImage(int videoType, int action, int adjust, double softClip) const;
    void ImageLegal(int videoType, int action, int adjust, double softClip);

    // Parameter
    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(); }
    bool Equals(const Parameter &other) const override { return &other == this; }
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override { return sizeof(*this) + DataBytes() + GPUBytes(); }

private:
    friend ORVANE_API Ref<Image> CopyOfImage(const Image *src);
    int width_, height_, depth_;
    PixelFormat format_;
    double xScale_ = 1.0, yScale_ = 1.0;
    ImgRectI dataWindow_, validWindow_;
    FltPixel canvas_;
    std::vector<uint8_t *> rows_;
    std::unique_ptr<uint8_t, PixelBlockDeleter> pixels_; // from AllocPixels (pooled for frame sizes)
    struct AuxPlane {
        AuxChannelKind kind;
        std::unique_ptr<uint8_t, PixelBlockDeleter> data; // from AllocPixels, like the rows
        float *Floats() const { return reinterpret_cast<float *>(data.get()); }
    };
    /// A zeroed auxiliary plane over the data window, from pixel memory.
    bool AllocAuxPlane(AuxPlane &plane);
    /// Names a refused allocation after this image (its size and depth).
    void NameRefusal() const;
    std::vector<AuxPlane> aux_;
    const std::atomic<bool> *abort_ = nullptr;
    ScriptVal metadata_ = ScriptVal::Table();
    bool noData_ = false, readOnly_ = false, opaque_ = false, simple_ = true;
    mutable std::mutex gpuLock_;
    Ref<GPUMemory> gpuMem_;
    bool gpuDirty_ = false;
};

/// A domain of `rect` carrying `img`'s frame and pixel aspect.
inline ImageDomain DomainOfImage(const Image &img, const ImgRectI &rect) {
    ImageDomain d(rect);
    d.frame = img.Frame();
    d.xScale = img.XScale();
    d.yScale = img.YScale();
    return d;
}

/// A new image with the same format, windows, canvas, attributes and pixels.
ORVANE_API Ref<Image> CopyOfImage(const Image *src);

} // namespace Orvane
