#pragma once
// Colour matrices and ApplyMatrixTagList.
//
// ColorMatrixFull is 5 x 5 over (red, green, blue, alpha, 1): output channel i
// is the sum over j of m[i][j] times input j, with input 4 the constant 1.
// ColorMatrix is the 4 x 4 cut without the alpha row and column: alpha passes
// unchanged. Matrices compose in the order the steps are applied: Then(b)
// makes "this, then b".
//
// ApplyMatrixTagList(src, dst, tags) runs a matrix over every pixel of dst's
// data window (src pixels where src has them, src's canvas elsewhere) and
// sets dst's canvas colour to the matrix of src's canvas. Tags:
//   MtxColorMatrix      const ColorMatrix *       (alpha untouched)
//   MtxColorMatrixFull  const ColorMatrixFull *   (one of the two is required)
//   WorkThreaded        1: rows on the worker pool (default 1)
//   WorkUseGPU          1: try the request's device first ("ColorMatrix" of
//                       the common kernel library); needs WorkRequest
//   WorkRequest         Request *
//   WorkOperator        accepted
// src and dst may be the same image. Returns false when there was no matrix or
// the rows could not be allocated.
//
// Thread safety: matrices are values; ApplyMatrixTagList writes only dst.
#include "host/core/TagList.h"
#include "host/image/Pixel.h"

namespace Orvane {

class Image;

struct ORVANE_API ColorMatrixFull {
    double m[5][5];

    ColorMatrixFull() { SetIdentity(); }
    void SetIdentity();
    bool IsIdentity() const;
    /// this = b x this: b applied after this.
    ColorMatrixFull &Then(const ColorMatrixFull &b);
    /// Scales channel c (0..3) after the current steps.
    ColorMatrixFull &Scale(int c, double s);
    /// Adds o to channel c (0..3) after the current steps.
    ColorMatrixFull &Offset(int c, double o);
    double Determinant() const;
    /// Inverts in place; false (and unchanged) when the matrix is singular
    /// (|determinant| below `eps`).
    bool Invert(double eps = 1e-12);
    FltPixel Apply(const FltPixel &p) const;
};

struct ORVANE_API ColorMatrix {
    double m[4][4];

    ColorMatrix() { SetIdentity(); }
    /// The cut of a full matrix (rows and columns red, green, blue, constant).
    explicit ColorMatrix(const ColorMatrixFull &full);
    void SetIdentity();
    FltPixel Apply(const FltPixel &p) const;
};

ORVANE_API bool ApplyMatrixTagList(const Image *src, Image *dst, const TagList &tags);

} // namespace Orvane
