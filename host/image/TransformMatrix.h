#pragma once
// TransformMatrix: a 2D transform not yet applied to pixels. It travels on
// image links in place of an Image, so that a chain of Transforms and Merges
// resamples each source once, at the end, with the chain's combined matrix.
//
// What it holds:
//   - the source: the image whose pixels the transform will move (never
//     changed; shared, Use()d);
//   - the output frame: width, height and pixel aspect of the image the
//     transform produces (the frame of the first image of the chain);
//   - the pending matrix, in pixel coordinates: a point of the source frame
//     (x right, y up, pixel (i, j) covering [i, i + 1) x [j, j + 1)) maps to
//     SourceToOutput() * (x, y, 1) in the output frame;
//   - how to resample: filter (RszTypes), window, edge policy (EdgeMode),
//     taken from the latest transform concatenated.
//
// Where it comes from: a tool builds one on the value of an image input
// (an Image starts an identity transform; a TransformMatrix is continued),
// multiplies transforms on to it (ImageConcatenateTagList) or composites
// on to its source (MergeInputs), and hands it on as its output.
//
// Where it ends: the engine turns it into pixels (ApplyTransformTagList)
// for every consumer input that does not declare LinkSecondDataType
// TransformMatrix, and for whoever asks from outside the flow. An identity
// transform gives the source itself without copying.
//
// Ownership: reference counted like every Parameter.
// Thread safety: built by one tool on its render thread, then immutable once
// handed over; ApplyTransformTagList may be called from any thread.
#include "host/core/TagList.h"
#include "host/image/Image.h"
#include "host/image/Matrix3.h"
#include "host/image/ResizeFilters.h"
#include "host/image/TransformSampler.h"

namespace Orvane {

class Input;
class Request;
struct TimeExtent;

class ORVANE_API TransformMatrix : public Parameter {
public:
    /// Builds on `value` (an Image or a TransformMatrix) that came in on `in`
    /// for `req`; `index` and `time` name the input slot (TimeUndefined: the
    /// request's). A TransformMatrix value is continued (same source, frame,
    /// matrix and sampling); an Image starts an identity transform whose
    /// output frame is the image's. A null or other value makes an invalid
    /// object (IsValid false).
    TransformMatrix(Parameter *value, Request *req, Input *in, unsigned index, double time);
    /// Directly around an image (tests, host services).
    explicit TransformMatrix(Image *source);

    bool IsValid() const { return source_ != nullptr; }
    Image *Source() const { return source_.Get(); }
    const Matrix3 &SourceToOutput() const { return matrix_; }
    void SetSourceToOutput(const Matrix3 &m) { matrix_ = m; }
    /// The output frame.
    int Width() const { return width_; }
    int Height() const { return height_; }
    double XScale() const { return xScale_; }
    double YScale() const { return yScale_; }
    int Filter() const { return filter_; }
    int Window() const { return window_; }
    int Edges() const { return edges_; }
    TransformSampling Sampling() const { return {filter_, window_, edges_}; }
    /// The request this object was built for (null when built outside a
    /// render). Valid only while that request is being processed: a cached
    /// object outlives it, so later readers must not use it.
    Request *GetRequest() const { return req_; }

    /// Multiplies the transform the Xf* tags describe on to the matrix
    /// (after the pending one). The tags' geometry is in normalised output
    /// coordinates (0..1 across the output frame, y up). XfFlatten turns the
    /// chain into pixels now: the source becomes the result, the matrix the
    /// identity. False when flattening failed.
    bool ImageConcatenateTagList(const TagList &tags);
    /// Replaces the source by the result of compositing `fg` over this
    /// object's pixels (MergeInputs); see MergeInputs.h.
    bool MergeConcatenateTagList(Parameter *fg, const TagList &tags);
    /// Whether `in` is the input this object was built on (its source came
    /// in there, directly or through a chain); `time` receives the time it
    /// was fetched at. `extent` is not filled (no time ranges are tracked).
    bool IsSourceInput(Input *in, double &time, TimeExtent *extent) const;

    /// The pixels: the source resampled through the matrix into the output
    /// frame (TransformSampler.h) over OutputDataWindow(), cut to
    /// ImgDataWindow (const ImgRectI *) when given; endless sides left after
    /// the cut are cut to the frame. The valid window is the data window.
    /// Tags: ImgDataWindow, WorkRequest (its render's abort flag). In a
    /// pre-calculation (a source without pixels) the result has the windows
    /// and no pixels. An identity matrix over a source of the output frame
    /// gives the source itself. Null on abort or when memory ran out.
    Ref<Image> ApplyTransformTagList(const TagList &tags) const;
    /// The output's domain of definition: the bounding box of the moved
    /// source data window grown by the filter's reach; endless when the
    /// edges are not Canvas (every position then has a colour); null for a
    /// singular matrix.
    ImgRectI OutputDataWindow() const;
    /// Number of resamplings (ApplyTransformTagList and flattening runs that
    /// moved pixels) in this process; tests count them.
    static long ResampleCount();

    // Parameter
    OvID DataType() const override;
    ScriptVal ToScript() const override { return ScriptVal(); }
    bool Equals(const Parameter &other) const override;
    uint64_t Hash() const override;
    Ref<Parameter> Copy() const override;
    size_t SizeOf() const override;

private:
    Ref<Image> source_;
    Matrix3 matrix_;
    int width_ = 0, height_ = 0;
    double xScale_ = 1.0, yScale_ = 1.0;
    int filter_ = RszLinear, window_ = RszWindowHanning, edges_ = EdgeCanvas;
    Request *req_ = nullptr;
    Input *input_ = nullptr;  ///< the input the chain's source came in on
    double inputTime_ = -2e9; ///< TimeUndefined
};

/// The transform the Xf* tags describe (XfCenterX/Y, XfPivotX/Y, XfXSize,
/// XfYSize, XfAngle, XfFlipX/Y, XfInvert), in normalised coordinates of a
/// frame of W x H pixels with pixel aspect ax:ay (0..1 across, y up): flip
/// about the middle, minus the pivot, into square units (x by ax, y by
/// ay H / W), scale, rotate anticlockwise, back, plus pivot + centre - 0.5;
/// inverted with XfInvert unless singular. The identity unless W, H, ax and
/// ay are all above zero.
ORVANE_API Matrix3 TransformTagsMatrix(const TagList &tags, double W, double H, double ax, double ay);
/// A matrix on normalised coordinates of a W x H frame as a matrix on pixel
/// coordinates of that frame.
ORVANE_API Matrix3 NormalisedToPixelMatrix(const Matrix3 &normalised, double W, double H);

/// The pixels of an image-link value: the Image itself, or a TransformMatrix
/// applied (tags as ApplyTransformTagList). Null for other values.
ORVANE_API Ref<Image> ImageOfValue(Parameter *value, const TagList &tags = {});

} // namespace Orvane
