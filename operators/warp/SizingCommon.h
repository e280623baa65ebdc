#pragma once
// What the frame-sizing tools (Resize, Scale, Crop, Letterbox) share:
//
//  * the Filter Method and Window Method inputs, and the numbers they send to
//    the host's resizer (the list index plus 1: RszTypes; plus 100: windows);
//    the window list shows only for Sinc and Bessel;
//  * the size, Only Use Filter in HiQ and pixel aspect inputs;
//  * SourceFormat: the full-resolution size, field and pixel aspect of a
//    source, from its attributes (ImgFullWidth, ImgFullHeight, ImgField,
//    ImgFullXScale, ImgFullYScale; the image's own values when absent). A
//    field holds every other line of its frame: its full height is twice the
//    stored one and its Y aspect half its own;
//  * ScaleWindow: a window taken to a new size (corners rounded outward in
//    single precision), endless sides left as they are;
//  * ResizeTables: the coefficient tables of the last resize, kept from frame
//    to frame while the geometry, filter and edges stay the same;
//  * WriteFormatAttrs: the format attributes and pixel aspect of a result;
//  * WriteControl: a tool writing one of its own controls (kept sizes,
//    centred offsets), which a write-protected document does not allow.
//
// Thread safety: the free functions are pure or act on the objects given.
// A ResizeTables object belongs to one tool and is used by its render thread
// (one request at a time).
#include <optional>

#include "host/core/Object.h"
#include "host/core/TagList.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;
class Input;
class Operator;
class Output;
class Request;

// ---- inputs ----------------------------------------------------------------

/// The Filter Method list (11 filters, default Linear) and the Window
/// Method list (4 windows) of a tool, added in that order.
struct FilterInputs {
    Input *filter = nullptr;
    Input *window = nullptr;
};
FilterInputs AddFilterInputs(Operator *op);
/// Shows the window list for a Filter Method value (Sinc and Bessel only).
void ShowWindowFor(const FilterInputs &in, double filterMethod);
/// The filter a Filter Method value sends to the host (RszTypes).
int FilterValue(double filterMethod);
/// The window a Window Method value sends to the host (index + 100).
int WindowValue(double windowMethod);
/// Filter and window of a request.
int FilterOf(const Request *req, const FilterInputs &in);
int WindowOf(const Request *req, const FilterInputs &in);

/// Hard upper limit of frame sizes typed into the sizing tools: 32767, or
/// 1000000 when the environment switch ORVANE_HUGE_FRAMES is on.
double MaxFrameSize();
/// A whole-number size control: slider 1..4096, hard limits 1..MaxFrameSize(),
/// default `def`, saved always, default taken once the document is known.
/// `extra` adds to (or overrides) these tags.
Input *AddSizeInput(Operator *op, const char *name, const char *id, double def, const TagList &extra = {});
/// "Only Use Filter in HiQ".
Input *AddHiQOnlyInput(Operator *op);
/// "Change Pixel Aspect" and the "Pixel Aspect" point (the document's pixel
/// aspect by default, 6 decimals, saved always, hidden until the checkbox is on).
struct AspectInputs {
    Input *change = nullptr;
    Input *aspect = nullptr;
};
AspectInputs AddAspectInputs(Operator *op);
/// The main image input, fetched after the controls so that CheckRequest can
/// read them; `extra` adds tags.
Input *AddSourceImageInput(Operator *op, const TagList &extra = {});
/// A checkbox, default `def`.
Input *AddCheckbox(Operator *op, const char *name, const char *id, double def, const TagList &extra = {});
/// A button (a change of its value is the press): passive, not heard at construction.
Input *AddButton(Operator *op, const char *name, const char *id, const TagList &extra = {});
/// Shows or hides a control.
void ShowInput(Input *in, bool visible);

/// Whether a draft of this request resizes with nearest neighbour: a quick
/// request, the application allows quick filters (AppFastScale) and the
/// tool's HiQOnly is on.
bool DraftDropsFilter(const Request *req, bool hiQOnly);

// ---- the source's format -----------------------------------------------------

struct SourceFormat {
    int width = 0, height = 0;           ///< the image's own size
    double xScale = 1.0, yScale = 1.0;   ///< the image's own pixel aspect
    int fullWidth = 0, fullHeight = 0;   ///< full resolution, whole frame
    double aspectX = 1.0, aspectY = 1.0; ///< full-resolution pixel aspect of the frame
    int field = -1;                      ///< field number, -1 for a whole frame
    double fieldOffset = 0.0;
    /// The attributes as the image carries them (absent: not carried).
    std::optional<double> fullWidthAttr, fullHeightAttr, fullXScaleAttr, fullYScaleAttr;

    bool IsField() const { return field != -1; }
    bool Known() const { return width > 0 && height > 0; }
    /// Frame aspect of the full-resolution frame: (fullWidth x aspectX) / (fullHeight x aspectY).
    double FrameAspect() const;
};

SourceFormat ReadSourceFormat(const Image &img);
/// The format as far as a domain tells it: its frame and pixel aspect,
/// taken as a proxy of `proxy` and as a field when `field` is not -1.
SourceFormat SourceFormatOfDomain(const ImageDomain &domain, int field, int proxy);

/// The height that keeps the frame aspect of `src` for width `w` at target
/// pixel aspect (tax, tay): truncate(w x tax / (FrameAspect x tay) + 0.5).
int HeightKeepingAspect(const SourceFormat &src, double w, double tax, double tay);
/// The width for height `h`: truncate(h x FrameAspect x tay / tax + 0.5).
int WidthKeepingAspect(const SourceFormat &src, double h, double tax, double tay);

// ---- windows -------------------------------------------------------------------

/// `r` scaled by (sx, sy) in single precision, left and bottom rounded down,
/// right and top up, after growing each side by (reachX, reachY) source
/// pixels. Endless sides (DomainEndless and beyond) stay as they are.
ImgRectI ScaleWindow(const ImgRectI &r, float sx, float sy, float reachX = 0.f, float reachY = 0.f);
/// `r` placed by a resize of scale (sx, sy) and offset (ox, oy) in output
/// pixels: left = floor(left x sx + ox), right = ceil(right x sx + ox), and
/// the same upward. Endless sides stay.
ImgRectI PlaceWindow(const ImgRectI &r, double sx, double sy, double ox, double oy);
/// The region of the source that output region `r` reads, for rx, ry source
/// pixels per output pixel and the source's origin at (ox, oy) in the
/// output, widened by the reach in source pixels: left = floor((left - ox) x
/// rx - reachX), right = ceil((right - ox) x rx + reachX), and the same
/// upward, computed in double and rounded through float. Endless sides stay.
ImgRectI SourceRegion(const ImgRectI &r, double rx, double ry, double reachX, double reachY, double ox = 0.0,
                      double oy = 0.0);

// ---- coefficient tables --------------------------------------------------------

/// What the tables of one resize depend on.
struct ResizeKey {
    ImgRectI srcFrame, srcWindow, dstFrame, dstWindow, readWindow;
    int filter = 0, window = 0, xEdges = 0, yEdges = 0;
    double xScale = 0.0, yScale = 0.0, xOffset = 0.0, yOffset = 0.0;
    bool operator==(const ResizeKey &) const = default;
};

class ResizeTables {
public:
    ResizeTables() = default;
    ResizeTables(const ResizeTables &) = delete;
    ResizeTables &operator=(const ResizeTables &) = delete;
    ~ResizeTables() { Free(); }

    /// Makes sure the tables fit `key`: the kept ones when the key is the
    /// one they were made for, else new ones from
    /// src.ResizePreCalcTagList(dst, ..., tags) (the old ones freed first).
    /// False when the host could not make them.
    bool Prepare(const Image &src, Image *dst, const ResizeKey &key, const TagList &tags);
    void *XTable() const { return x_; }
    void *YTable() const { return y_; }
    /// Frees the tables (Image::ResizePostCalc) and forgets the key.
    void Free();
    /// How many times tables were made.
    long Builds() const { return builds_; }

private:
    std::optional<ResizeKey> key_;
    void *x_ = nullptr, *y_ = nullptr;
    long builds_ = 0;
};

/// The work tags of a whole-image host call made by `op` for `req`.
TagList WorkTags(Operator *op, Request *req);

/// The result image of a sizing tool: like `src` (depth, attributes) at
/// w x h, data window `window`, valid window the request's region of
/// interest within it, no rows in a pre-calculation, src's canvas colour.
Ref<Image> NewSizedImage(const Image &src, int w, int h, const ImgRectI &window, const Request *req);
/// Resamples `src` into `dst`'s data window through `tables` (made again
/// only when `key` changed); `tags` is the resize request. False when the
/// tables could not be made, memory ran out or the render was abandoned.
bool ResizeInto(const Image &src, Image *dst, ResizeTables &tables, const ResizeKey &key, const TagList &tags);
/// Hands a failed result over: one console line (unless the render was
/// abandoned) and a null output.
void FailSizing(Operator *op, Request *req, Output *out, const char *what);

// ---- results -------------------------------------------------------------------

/// Sets the format attributes of a sizing result `out` made from `src`:
/// where the source carries them, ImgFullWidth becomes `fullWidth` and
/// ImgFullHeight `fullHeight` (the frame's, halved here for a field); a
/// field offset above 0 becomes 0.5 / out's height. With `aspect` the pixel
/// aspect changes: X = max(1e-5, x), Y = max(1e-5, y), doubled for a field;
/// where the source carries ImgFullXScale / ImgFullYScale they take the new
/// values and the scale keeps the source's proxy ratio (source scale x new /
/// source attribute).
void WriteFormatAttrs(Image &out, const SourceFormat &src, int fullWidth, int fullHeight,
                      const std::optional<std::pair<double, double>> &aspect);

// ---- controls -------------------------------------------------------------------

/// Writes `value` into `in`, one of `op`'s own controls, at `time`: a key
/// when the control is animated (the constant at TimeUndefined), else the
/// constant. Nothing is written to a linked control or in a write-protected
/// document. True when written.
bool WriteControl(Operator *op, Input *in, double value, double time);
bool WriteControlPoint(Operator *op, Input *in, double x, double y, double time);
/// The number a control holds at `time` (its constant or curve; `def` for a
/// link or no value).
double ControlNumber(const Input *in, double time, double def = 0.0);
/// The point a control holds at `time`.
std::pair<double, double> ControlPoint(const Input *in, double time, std::pair<double, double> def = {1.0, 1.0});

} // namespace Orvane
