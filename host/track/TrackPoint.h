#pragma once
// TrackPoint: finds a pattern of one frame again in another frame.
//
// Coordinates are those of the tool's point inputs: x from 0 at the left edge
// to 1 at the right edge of the image rectangle, y from 0 at the bottom to 1
// at the top; a pattern's and a search area's sizes are fractions of the
// image's width and height.
//
// Use: SetPattern takes the pattern from an image around a centre; Track
// looks for it in another image around an expected position, within the
// search area, and gives the best position found and its match value (0 a
// perfect match; larger is worse). GetPatternRect and GetSearchRect give the
// pixel rectangles a caller must have in its images (its regions of
// interest) for SetPattern and Track.
//
// Thread safety: a TrackPoint belongs to one tracker; Lock() serialises the
// tracker's pattern and result changes. Track may run its rows on the workers.
#include <mutex>

#include "host/core/Export.h"
#include "host/image/Rect.h"

namespace Orvane {

class Image;

/// What one tracking step is asked to do (a tool fills it per request).
struct TrackSettings {
    int first = 64;              ///< always 64
    bool tracking = false;       ///< a tracking run is on
    float matchTolerance = 0.1f; ///< match values above it count as a weak match
    float adaptiveLow = 0.0f;    ///< adaptive gate: 0 in mode None, 0.3 otherwise
    float adaptiveHigh = 0.0f;   ///< 0 in mode None, 0.8 otherwise
    bool pathCenter = false;     ///< paths follow the track centre rather than the pattern centre
    bool fixedFlag = true;       ///< always set
    int fixedNumber = 2;         ///< always 2
    int framesPerPoint = 1;      ///< path keys every so many frames
    /// How the pattern follows the shot: None keeps the first pattern, EveryFrame takes it again at
    /// each tracked position, BestMatch takes it again where a step matched best so far.
    enum class Adaptive { None, EveryFrame, BestMatch } adaptive = Adaptive::None;
};

/// The outcome of one Track.
struct TrackResult {
    double x = 0.0, y = 0.0; ///< position found (normalised, as the centre given)
    double match = 0.0;      ///< 0 a perfect match; larger is worse
    bool found = false;      ///< false: no pattern, no image, or no place in the search area
};

class ORVANE_API TrackPoint {
public:
    TrackPoint();
    ~TrackPoint();
    TrackPoint(const TrackPoint &) = delete;
    TrackPoint &operator=(const TrackPoint &) = delete;

    /// Forgets the pattern and everything learnt from it.
    void Reset();
    /// Marks the pattern to be taken again from the next image given to Track, at the expected position.
    void Invalidate();
    /// The channel matched: -1 luminance (default), 0..3 red, green, blue, alpha.
    void SetChannel(int channel);
    /// Takes the pattern of `width` x `height` around (x, y) from `img`, at `time`; false when the image does
    /// not cover it (the pattern is then unset).
    bool SetPattern(const Image *img, double x, double y, double width, double height, double time);
    /// The search area's size (fractions of the image's width and height), around the expected position.
    void SetSearchArea(double width, double height);

    /// Pixels of an image of `width` x `height` the pattern at its set centre needs.
    ImgRectI GetPatternRect(int width, int height) const;
    /// Pixels of an image of `width` x `height` a Track around (x, y) needs.
    ImgRectI GetSearchRect(int width, int height, double x, double y) const;

    /// Looks for the pattern in `img` around (x, y) within the search area. An image of another size than the
    /// one the pattern came from (another proxy scale) has the pattern taken again at (x, y), as after
    /// Invalidate: that step answers (x, y), and the next steps match at the new size.
    TrackResult Track(const Image *img, double time, double x, double y, TrackSettings &settings);

    std::recursive_mutex &Lock() { return lock_; }

private:
    struct State;
    std::recursive_mutex lock_;
    State *state_;
};

} // namespace Orvane
