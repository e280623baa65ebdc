#pragma once
// Rectangles of an image, in pixels, rows counted from the bottom.
//
// ImgRectI is half open: x0 <= x < x1, y0 <= y < y1. An empty rectangle (no
// pixel in it) is "null". ImageDomain is the region where an image is defined
// (its domain of definition); its sides may be endless, written as +-1000000,
// and endless sides are never scaled or moved.
//
// Thread safety: plain values.
#include <algorithm>

#include "host/core/Export.h"

namespace Orvane {

/// A side at this distance or beyond means "without end".
constexpr int DomainEndless = 1000000;

struct ORVANE_API ImgRectI {
    int x0 = 0, y0 = 0, x1 = 0, y1 = 0;

    constexpr ImgRectI() = default;
    constexpr ImgRectI(int ax0, int ay0, int ax1, int ay1) : x0(ax0), y0(ay0), x1(ax1), y1(ay1) {}

    constexpr int Width() const { return x1 - x0; }
    constexpr int Height() const { return y1 - y0; }
    constexpr bool IsNull() const { return x1 <= x0 || y1 <= y0; }
    constexpr void SetNull() { *this = ImgRectI(); }
    constexpr bool Contains(int x, int y) const { return x >= x0 && x < x1 && y >= y0 && y < y1; }
    constexpr bool Contains(const ImgRectI &r) const {
        return r.IsNull() || (r.x0 >= x0 && r.y0 >= y0 && r.x1 <= x1 && r.y1 <= y1);
    }
    /// Orders the corners so that x0 <= x1 and y0 <= y1.
    constexpr void Normalise() {
        if (x0 > x1) std::swap(x0, x1);
        if (y0 > y1) std::swap(y0, y1);
    }
    /// Intersection; disjoint rectangles give a null one.
    constexpr ImgRectI operator&(const ImgRectI &o) const {
        ImgRectI r(std::max(x0, o.x0), std::max(y0, o.y0), std::min(x1, o.x1), std::min(y1, o.y1));
        if (r.IsNull()) r.SetNull();
        return r;
    }
    constexpr ImgRectI &operator&=(const ImgRectI &o) { return *this = *this & o; }
    /// The smallest rectangle holding both; a null side contributes nothing.
    constexpr ImgRectI operator|(const ImgRectI &o) const {
        if (IsNull()) return o;
        if (o.IsNull()) return *this;
        return ImgRectI(std::min(x0, o.x0), std::min(y0, o.y0), std::max(x1, o.x1), std::max(y1, o.y1));
    }
    constexpr ImgRectI &operator|=(const ImgRectI &o) { return *this = *this | o; }
    constexpr bool operator==(const ImgRectI &) const = default;

    /// Scales the corners (x0, y0 down, x1, y1 up to whole pixels); endless sides stay.
    void Scale(double sx, double sy);
    /// Moves the rectangle; endless sides stay.
    void Offset(int dx, int dy);
    /// Grows each side outward by dx, dy pixels (shrinks for negative values).
    constexpr ImgRectI Grown(int dx, int dy) const { return ImgRectI(x0 - dx, y0 - dy, x1 + dx, y1 + dy); }
};

/// A rectangle in real coordinates (the bounds of vector shapes), closed: x0 <= x <= x1, y0 <= y <= y1, so a
/// single point has bounds. Empty when x1 < x0 or y1 < y0 (the default).
struct ImgRectF {
    double x0 = 0.0, y0 = 0.0, x1 = -1.0, y1 = -1.0;

    constexpr ImgRectF() = default;
    constexpr ImgRectF(double ax0, double ay0, double ax1, double ay1) : x0(ax0), y0(ay0), x1(ax1), y1(ay1) {}

    constexpr bool IsEmpty() const { return !(x1 >= x0 && y1 >= y0); }
    constexpr double Width() const { return IsEmpty() ? 0.0 : x1 - x0; }
    constexpr double Height() const { return IsEmpty() ? 0.0 : y1 - y0; }
    /// Intersection; disjoint rectangles give an empty one.
    constexpr ImgRectF operator&(const ImgRectF &o) const {
        if (IsEmpty() || o.IsEmpty()) return ImgRectF();
        const ImgRectF r(std::max(x0, o.x0), std::max(y0, o.y0), std::min(x1, o.x1), std::min(y1, o.y1));
        return r.IsEmpty() ? ImgRectF() : r;
    }
    /// The smallest rectangle holding both; an empty one contributes nothing.
    constexpr ImgRectF operator|(const ImgRectF &o) const {
        if (IsEmpty()) return o;
        if (o.IsEmpty()) return *this;
        return ImgRectF(std::min(x0, o.x0), std::min(y0, o.y0), std::max(x1, o.x1), std::max(y1, o.y1));
    }
    constexpr ImgRectF &operator|=(const ImgRectF &o) { return *this = *this | o; }
    /// Whether the two share a point.
    constexpr bool Overlaps(const ImgRectF &o) const { return !(*this & o).IsEmpty(); }
    constexpr bool operator==(const ImgRectF &) const = default;
};

constexpr bool IsEndlessSide(int v) { return v <= -DomainEndless || v >= DomainEndless; }

struct ORVANE_API ImageDomain {
    ImgRectI rect;
    /// The frame of the image the domain belongs to, and its pixel aspect,
    /// when known (a null frame: unknown). Tools that turn relative sizes
    /// into pixels before the image exists read them here.
    ImgRectI frame;
    double xScale = 1.0, yScale = 1.0;

    constexpr ImageDomain() = default;
    constexpr explicit ImageDomain(const ImgRectI &r) : rect(r) {}
    static constexpr ImageDomain Endless() {
        return ImageDomain(ImgRectI(-DomainEndless, -DomainEndless, DomainEndless, DomainEndless));
    }

    constexpr bool IsNull() const { return rect.IsNull(); }
    constexpr void SetNull() { rect.SetNull(); }
    /// Combining keeps this domain's frame and aspect.
    constexpr ImageDomain operator&(const ImageDomain &o) const { return WithRect(rect & o.rect); }
    constexpr ImageDomain &operator&=(const ImageDomain &o) {
        rect &= o.rect;
        return *this;
    }
    constexpr ImageDomain operator|(const ImageDomain &o) const { return WithRect(rect | o.rect); }
    constexpr ImageDomain WithRect(const ImgRectI &r) const {
        ImageDomain d = *this;
        d.rect = r;
        return d;
    }
    /// The frame's size, and whether it is known.
    constexpr bool HasFrame() const { return !frame.IsNull(); }
    constexpr int FrameWidth() const { return frame.Width(); }
    constexpr int FrameHeight() const { return frame.Height(); }
    constexpr void ClipTo(const ImgRectI &r) { rect &= r; }
    void Scale(double sx, double sy) { rect.Scale(sx, sy); }
    void Offset(int dx, int dy) { rect.Offset(dx, dy); }
    constexpr bool operator==(const ImageDomain &) const = default;
};

} // namespace Orvane
