#pragma once
// Transform: moves, scales, rotates and mirrors the frame. It holds no
// resampler: each frame it continues the pending transform of its input (a
// TransformMatrix, or an identity one around an image), multiplies its own
// matrix on to it (TransformMatrix::ImageConcatenateTagList) and hands that
// object on, so a chain of Transforms (and Merges) resamples once, where a
// consumer needs pixels. Flatten Transform makes the pixels here instead.
//
// The matrix, in normalised coordinates of the frame (0..1 across, y up):
// flip about the middle, minus Pivot, into square units (x by the pixel
// aspect X, y by aspect Y x H / W), scale by (X Size, Y Size) (or Size and
// Size x Aspect), rotate by Angle anticlockwise, back, plus Pivot + Center -
// (0.5, 0.5); Invert Transform takes its inverse unless it is singular
// (TransformTagsMatrix, docs/TRANSFORM.md).
//
// A frame (this host has no per-request processing objects: Process does
// the work directly):
//  1. read the controls; X size and Y size from Size and Aspect while Use
//     Size and Aspect is on, else X Size and Y Size;
//  2. continue the input's transform and concatenate the Xf* request;
//  3. hand on the object, or, when the result is the identity (nothing to
//     do, or flattened), the image itself.
// CheckRequest asks the input for the region the requested one reads
// through this tool's matrix, widened by the widest filter's reach so that
// a filter chosen further down the chain is covered too; with edges other
// than Canvas the whole input. The input is fetched after the controls
// (priority 1) so that CheckRequest can read them.
//
// On-screen controls. NotifyChanged keeps copies of the controls and of the
// source's size and pixel aspect (noted by Process) and rebuilds the 4x4
// form of the matrix the viewer's controls of the following tools follow;
// OnScreenMatrix reads it. It also shows Size/Aspect or X Size/Y Size, the
// window list for Sinc and Bessel, and follows the document's frame format
// in the reference size.
//
// Thread safety: Process and CheckRequest run on the render thread, one
// request at a time; NotifyChanged on the main thread. The control copies
// and the 4x4 matrix are shared under a mutex.
#include <array>
#include <mutex>

#include "host/flow/Operator.h"
#include "host/image/Matrix3.h"
#include "operators/warp/SizingCommon.h"

namespace Orvane {

class Transform : public ThreadedOperator {
public:
    Transform(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Transform() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

    /// The matrix of the on-screen controls (normalised coordinates, 4x4 row
    /// major, points as column vectors), as the controls and the source last
    /// seen make it.
    std::array<double, 16> OnScreenMatrix() const;

    /// The values of the controls a matrix is made from.
    struct Controls {
        double centerX = 0.5, centerY = 0.5, pivotX = 0.5, pivotY = 0.5;
        double useSizeAndAspect = 1.0, size = 1.0, aspect = 1.0, xSize = 1.0, ySize = 1.0;
        double angle = 0.0, flipH = 0.0, flipV = 0.0, invert = 0.0;
        /// The Xf* tags of the geometry (sizes resolved).
        TagList GeometryTags() const;
    };

private:
    Controls ReadControls(const Request *req) const;
    void RebuildOnScreenMatrix();
    void FollowFrameFormat();

    Input *center_, *pivot_, *useSizeAndAspect_, *size_, *aspect_, *xSize_, *ySize_, *angle_;
    Input *flipH_, *flipV_, *edges_, *invert_, *flatten_;
    FilterInputs filter_;
    Input *width_, *height_, *useFrameFormat_;
    Input *input_;
    Output *output_;

    // ---- shared between the main thread and the render thread ----
    mutable std::mutex screenLock_;
    Controls screen_;                            ///< copies of the controls
    double srcWidth_ = 1.0, srcHeight_ = 1.0;    ///< the source last seen
    double srcAspectX_ = 1.0, srcAspectY_ = 1.0; ///< its pixel aspect
    std::array<double, 16> screenMatrix_{1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
};

} // namespace Orvane
