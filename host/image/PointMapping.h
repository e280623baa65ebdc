#pragma once
// Resampling through a general point mapping: each output pixel centre is
// sent to a source position by a function (a projective matrix, a bilinear
// quad map, a chain of them), and the source is filtered there with the
// filters and edge policies of the transform sampler (TransformSampler.h).
//
// Footprint. The filter's stretch along each source axis comes from the
// mapping's local Jacobian at each output pixel: the stretch along source x
// is |(du/dx, du/dy)|, along source y |(dv/dx, dv/dy)|, at least 1 and at
// most MaxTransformStretch, as the affine sampler computes it from its
// matrix. Nearest never stretches. A mapping gives the Jacobian itself
// where it knows it (a projective matrix does); otherwise it is taken by
// central differences over one output pixel.
//
// An output position the mapping does not reach (Map returns false: beyond
// a projective horizon, outside a quad's solutions) takes the source's
// canvas colour.
//
// Thread safety: rows run in parallel on the worker pool, so Map is called
// from several threads at once and must only read its object. The source is
// only read; each worker writes rows of its own and reuses its buffers (no
// allocation per pixel).
#include <atomic>

#include "host/image/Matrix3.h"
#include "host/image/TransformSampler.h"

namespace Orvane {

class Image;

/// Where an output pixel centre samples the source: the position and the
/// filter's stretch along source x and y; `ok` false where it has none.
struct MappedSample {
    double u = 0.0, v = 0.0, sx = 1.0, sy = 1.0;
    bool ok = false;
};

/// The filter stretch of a local Jacobian (du/dx, du/dy; dv/dx, dv/dy).
ORVANE_API void FootprintStretch(double dudx, double dudy, double dvdx, double dvdy, double &sx, double &sy);

/// Output pixel position -> source pixel position (both in the pixel
/// coordinates of TransformSampler.h: pixel (i, j) covers [i, i + 1) x
/// [j, j + 1), rows counted from the bottom).
class ORVANE_API PointMapping {
public:
    virtual ~PointMapping() = default;
    /// False when (x, y) has no source position.
    virtual bool Map(double x, double y, double &u, double &v) const = 0;
    /// The samples of `count` output positions (x0 + i, y), i = 0..count-1;
    /// with `stretch` false every sx and sy is 1. The default calls Map,
    /// four more times per position for the Jacobian (one-sided where a
    /// neighbour has no source).
    virtual void MapSpan(double x0, double y, int count, MappedSample *out, bool stretch) const;
};

/// A 3x3 matrix as a point mapping, projective included: positions where
/// w = m(2, 0) x + m(2, 1) y + m(2, 2) is not above a small positive bound
/// lie beyond the horizon and have no source. Scale the matrix so that the
/// visible side has w > 0 (ProjectiveMapping::Facing does it).
class ORVANE_API ProjectiveMapping : public PointMapping {
public:
    explicit ProjectiveMapping(const Matrix3 &outputToSource) : m_(outputToSource) {}
    bool Map(double x, double y, double &u, double &v) const override;
    /// The exact Jacobian, (A - p c^T) / w, with no further mapping.
    void MapSpan(double x0, double y, int count, MappedSample *out, bool stretch) const override;
    /// `outputToSource` scaled by -1 when needed so that positions whose
    /// source lies in front (on the side of source point (sx, sy)) have w > 0.
    /// False for a singular matrix.
    static bool Facing(const Matrix3 &outputToSource, double sx, double sy, Matrix3 &out);

private:
    Matrix3 m_;
};

/// Fills `dst`'s data window from `src` through `outputToSource` with
/// `sampling` (any depths; the filtered path of the sampler, never the byte
/// copy). Sets dst's canvas to src's. False on abort (`abort`, or either
/// image's flag) or when memory ran out; an image without rows on either
/// side (pre-calculation) does nothing and succeeds.
ORVANE_API bool MapImage(const Image &src, Image &dst, const PointMapping &outputToSource,
                         const TransformSampling &sampling, const std::atomic<bool> *abort = nullptr);

} // namespace Orvane
