// Matrix3 arithmetic and TransformMatrix: the pending transform of an image
// link, how tools multiply transforms on to it, and how it becomes pixels.
#include "host/image/TransformMatrix.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstring>
#include <numbers>
#include <optional>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/NewImage.h"

namespace Orvane {

// ---- Matrix3 ----------------------------------------------------------------

Matrix3 Matrix3::Translate(double tx, double ty) {
    Matrix3 r;
    r(0, 2) = tx;
    r(1, 2) = ty;
    return r;
}

Matrix3 Matrix3::Scale(double sx, double sy) {
    Matrix3 r;
    r(0, 0) = sx;
    r(1, 1) = sy;
    return r;
}

Matrix3 Matrix3::Rotate(double degrees) {
    double c, s;
    const double turns = degrees / 90.0;
    if (turns == std::floor(turns) && std::isfinite(turns)) {
        // Quarter turns exactly, so that they keep pixels on the grid.
        static constexpr double kCos[4] = {1, 0, -1, 0}, kSin[4] = {0, 1, 0, -1};
        int q = static_cast<int>(std::fmod(turns, 4.0));
        if (q < 0) q += 4;
        c = kCos[q], s = kSin[q];
    } else {
        const double a = degrees * (std::numbers::pi / 180.0);
        c = std::cos(a), s = std::sin(a);
    }
    Matrix3 r;
    r(0, 0) = c, r(0, 1) = -s;
    r(1, 0) = s, r(1, 1) = c;
    return r;
}

Matrix3 Matrix3::operator*(const Matrix3 &o) const {
    Matrix3 r;
    for (int i = 0; i < 3; ++i)
        for (int j = 0; j < 3; ++j)
            r(i, j) = (*this)(i, 0) * o(0, j) + (*this)(i, 1) * o(1, j) + (*this)(i, 2) * o(2, j);
    return r;
}

double Matrix3::Determinant() const {
    const Matrix3 &a = *this;
    return a(0, 0) * (a(1, 1) * a(2, 2) - a(1, 2) * a(2, 1)) - a(0, 1) * (a(1, 0) * a(2, 2) - a(1, 2) * a(2, 0)) +
           a(0, 2) * (a(1, 0) * a(2, 1) - a(1, 1) * a(2, 0));
}

bool Matrix3::Invert(Matrix3 &out) const {
    const Matrix3 &a = *this;
    const double det = Determinant();
    if (det == 0.0 || !std::isfinite(det)) {
        out = Identity();
        return false;
    }
    Matrix3 r;
    if (IsAffine()) {
        // The affine inverse directly, so that exact entries (quarter turns,
        // whole moves) stay exact.
        const double d = a(0, 0) * a(1, 1) - a(0, 1) * a(1, 0);
        r(0, 0) = a(1, 1) / d, r(0, 1) = -a(0, 1) / d;
        r(1, 0) = -a(1, 0) / d, r(1, 1) = a(0, 0) / d;
        r(0, 2) = -(r(0, 0) * a(0, 2) + r(0, 1) * a(1, 2));
        r(1, 2) = -(r(1, 0) * a(0, 2) + r(1, 1) * a(1, 2));
        out = r;
        return true;
    }
    r(0, 0) = (a(1, 1) * a(2, 2) - a(1, 2) * a(2, 1)) / det;
    r(0, 1) = (a(0, 2) * a(2, 1) - a(0, 1) * a(2, 2)) / det;
    r(0, 2) = (a(0, 1) * a(1, 2) - a(0, 2) * a(1, 1)) / det;
    r(1, 0) = (a(1, 2) * a(2, 0) - a(1, 0) * a(2, 2)) / det;
    r(1, 1) = (a(0, 0) * a(2, 2) - a(0, 2) * a(2, 0)) / det;
    r(1, 2) = (a(0, 2) * a(1, 0) - a(0, 0) * a(1, 2)) / det;
    r(2, 0) = (a(1, 0) * a(2, 1) - a(1, 1) * a(2, 0)) / det;
    r(2, 1) = (a(0, 1) * a(2, 0) - a(0, 0) * a(2, 1)) / det;
    r(2, 2) = (a(0, 0) * a(1, 1) - a(0, 1) * a(1, 0)) / det;
    out = r;
    return true;
}

bool Matrix3::IsIdentity(double tolerance) const {
    static const Matrix3 id;
    for (int i = 0; i < 9; ++i)
        if (!(std::fabs(m[i] - id.m[i]) <= tolerance)) return false;
    return true;
}

void Matrix3::Apply(double x, double y, double &ox, double &oy) const {
    ox = m[0] * x + m[1] * y + m[2];
    oy = m[3] * x + m[4] * y + m[5];
    if (!IsAffine()) {
        const double w = m[6] * x + m[7] * y + m[8];
        ox /= w, oy /= w;
    }
}

// ---- the Transform tool's matrix ---------------------------------------------

Matrix3 TransformTagsMatrix(const TagList &tags, double W, double H, double ax, double ay) {
    if (!(W > 0.0 && H > 0.0 && ax > 0.0 && ay > 0.0)) return Matrix3::Identity();
    const double cx = tags.GetDouble(XfCenterX, 0.5), cy = tags.GetDouble(XfCenterY, 0.5);
    const double px = tags.GetDouble(XfPivotX, 0.5), py = tags.GetDouble(XfPivotY, 0.5);
    const double sx = tags.GetDouble(XfXSize, 1.0), sy = tags.GetDouble(XfYSize, 1.0);
    Matrix3 flip;
    if (tags.GetBool(XfFlipX)) flip(0, 0) = -1.0, flip(0, 2) = 1.0;
    if (tags.GetBool(XfFlipY)) flip(1, 1) = -1.0, flip(1, 2) = 1.0;
    const Matrix3 n = Matrix3::Translate(px + cx - 0.5, py + cy - 0.5) * Matrix3::Scale(1.0 / ax, (W / H) / ay) *
                      Matrix3::Rotate(tags.GetDouble(XfAngle, 0.0)) * Matrix3::Scale(sx, sy) *
                      Matrix3::Scale(ax, ay * H / W) * Matrix3::Translate(-px, -py) * flip;
    Matrix3 inv;
    if (tags.GetBool(XfInvert) && n.Invert(inv)) return inv; // a singular matrix stays as it is
    return n;
}

Matrix3 NormalisedToPixelMatrix(const Matrix3 &normalised, double W, double H) {
    return Matrix3::Scale(W, H) * normalised * Matrix3::Scale(1.0 / W, 1.0 / H);
}

// ---- TransformMatrix -------------------------------------------------------------

namespace {

std::atomic<long> g_resampleCount{0};

} // namespace

TransformMatrix::TransformMatrix(Parameter *value, Request *req, Input *in, unsigned index, double time)
    : req_(req), input_(in) {
    inputTime_ = time != TimeUndefined ? time
                 : req && in           ? req->GetInputTime(in, static_cast<int>(index))
                 : req                 ? req->Time()
                                       : TimeUndefined;
    if (auto *tm = dynamic_cast<TransformMatrix *>(value)) {
        source_ = tm->source_;
        matrix_ = tm->matrix_;
        width_ = tm->width_, height_ = tm->height_;
        xScale_ = tm->xScale_, yScale_ = tm->yScale_;
        filter_ = tm->filter_, window_ = tm->window_, edges_ = tm->edges_;
    } else if (auto *img = dynamic_cast<Image *>(value)) {
        source_ = Ref<Image>(img);
        width_ = img->Width(), height_ = img->Height();
        xScale_ = img->XScale(), yScale_ = img->YScale();
    }
}

TransformMatrix::TransformMatrix(Image *source) : TransformMatrix(source, nullptr, nullptr, 0, TimeUndefined) {}

bool TransformMatrix::ImageConcatenateTagList(const TagList &tags) {
    if (!source_) return false;
    if (auto *req = tags.GetPtrAs<Request>(XfRequest)) req_ = req;
    const Matrix3 n = TransformTagsMatrix(tags, width_, height_, xScale_, yScale_);
    matrix_ = NormalisedToPixelMatrix(n, width_, height_) * matrix_;
    if (tags.Has(XfFilter)) filter_ = ValidResizeFilter(static_cast<int>(tags.GetLong(XfFilter)));
    if (tags.Has(XfWindow)) window_ = ValidResizeWindow(static_cast<int>(tags.GetLong(XfWindow)));
    if (tags.Has(XfEdges)) edges_ = static_cast<int>(std::clamp<long long>(tags.GetLong(XfEdges), 0, 3));
    if (!tags.GetBool(XfFlatten)) return true;

    // Pixels now, over what the request needs of the output.
    TagList apply{{WorkRequest, static_cast<const void *>(req_)}};
    std::optional<ImageDomain> roi;
    if (req_) roi = req_->RoI();
    if (roi) apply.Set({ImgDataWindow, &roi->rect});
    Ref<Image> pixels = ApplyTransformTagList(apply);
    if (!pixels) return false;
    source_ = std::move(pixels);
    matrix_ = Matrix3::Identity();
    return true;
}

bool TransformMatrix::IsSourceInput(Input *in, double &time, TimeExtent *) const {
    if (!in || in != input_) return false;
    time = inputTime_;
    return true;
}

ImgRectI TransformMatrix::OutputDataWindow() const {
    if (!source_) return ImgRectI();
    if (matrix_.IsIdentity() && source_->Frame() == ImgRectI(0, 0, width_, height_)) return source_->DataWindow();
    return TransformedWindow(source_->DataWindow(), matrix_, Sampling());
}

Ref<Image> TransformMatrix::ApplyTransformTagList(const TagList &tags) const {
    if (!source_) return nullptr;
    const Image &src = *source_;
    const bool sameFrame =
        src.Width() == width_ && src.Height() == height_ && src.XScale() == xScale_ && src.YScale() == yScale_;
    if (sameFrame && matrix_.IsIdentity()) return source_;

    const auto *req = tags.GetPtrAs<const Request>(WorkRequest);
    const std::atomic<bool> *abort = req && req->GetTask() ? req->GetTask()->AbortFlag() : src.AbortFlag();
    ImgRectI dw = OutputDataWindow();
    if (const auto *cut = tags.GetPtrAs<const ImgRectI>(ImgDataWindow)) dw &= *cut;
    // Pixels cannot reach without end: what is left endless stops at the frame.
    if (!src.IsNoData() &&
        (IsEndlessSide(dw.x0) || IsEndlessSide(dw.y0) || IsEndlessSide(dw.x1) || IsEndlessSide(dw.y1)))
        dw &= ImgRectI(0, 0, width_, height_);
    const FltPixel canvas = src.GetCanvasColor();
    Ref<Image> out = NewImageTagList({{ImgLikeImage, &src},
                                      {ImgWidth, width_},
                                      {ImgHeight, height_},
                                      {ImgXScale, xScale_},
                                      {ImgYScale, yScale_},
                                      {ImgDataWindow, &dw},
                                      {ImgValidWindow, &dw},
                                      {ImgNoData, src.IsNoData()},
                                      {ImgCanvasColor, &canvas},
                                      {ImgAbortFlag, static_cast<const void *>(abort)}});
    if (!out) return nullptr;
    out->Metadata() = src.Metadata();
    if (out->IsNoData() || dw.IsNull()) return out;
    if (!src.DownloadGPUMem()) return nullptr;
    Matrix3 inv;
    if (!matrix_.Invert(inv)) return out; // nothing of the source shows (the window is empty)
    if (!TransformImage(src, *out, inv, Sampling(), abort)) return nullptr;
    g_resampleCount.fetch_add(1, std::memory_order_relaxed);
    return out;
}

long TransformMatrix::ResampleCount() { return g_resampleCount.load(std::memory_order_relaxed); }

OvID TransformMatrix::DataType() const { return CLSID_DataType_TransformMatrix; }

bool TransformMatrix::Equals(const Parameter &other) const {
    const auto *o = dynamic_cast<const TransformMatrix *>(&other);
    return o && o->source_ == source_ && o->matrix_ == matrix_ && o->width_ == width_ && o->height_ == height_ &&
           o->xScale_ == xScale_ && o->yScale_ == yScale_ && o->Sampling() == Sampling();
}

uint64_t TransformMatrix::Hash() const {
    // The source by identity: an image's pixels do not change once handed on.
    const Image *src = source_.Get();
    uint64_t h = HashBytes(&src, sizeof src);
    for (double v : matrix_.m) h = HashMix(h, HashDouble(v));
    h = HashMix(h, static_cast<uint64_t>(width_) << 32 | static_cast<uint32_t>(height_));
    h = HashMix(h, HashDouble(xScale_));
    h = HashMix(h, HashDouble(yScale_));
    return HashMix(h, static_cast<uint64_t>(filter_) << 32 | static_cast<uint64_t>(window_) << 8 |
                          static_cast<uint64_t>(edges_));
}

Ref<Parameter> TransformMatrix::Copy() const {
    auto copy = MakeRef<TransformMatrix>(static_cast<Parameter *>(const_cast<TransformMatrix *>(this)), req_, input_,
                                         0u, inputTime_);
    return copy;
}

size_t TransformMatrix::SizeOf() const { return sizeof(*this) + (source_ ? source_->SizeOf() : 0); }

Ref<Image> ImageOfValue(Parameter *value, const TagList &tags) {
    if (auto *img = dynamic_cast<Image *>(value)) return Ref<Image>(img);
    if (auto *tm = dynamic_cast<TransformMatrix *>(value)) return tm->ApplyTransformTagList(tags);
    return nullptr;
}

} // namespace Orvane
