#pragma once
// ColorCorrector: colour correction of the whole image (Master) and of three
// tonal ranges at once (Shadows, Midtones, Highlights), each with hue,
// saturation and tint on a colour wheel, contrast, gain, lift, gamma and
// brightness per channel, levels, and suppression of colours by hue. The
// ranges are weighted by editable curves over luminance (ColorCurvesTable).
//
// Process folds every control into three range records
// (ColorCorrectorRanges.h). With all controls neutral the input is handed on;
// when only Master's levels, gain, lift, contrast and brightness are set the
// correction is linear and goes to the host as one colour matrix; otherwise
// one pixel function runs over the rows (PointRows.h), the canvas colour once
// through the same function. With "Output the range you see now
// as final render" the result is the chosen range's weight instead.
//
// The panel: a Correction page whose Menu shows one group of controls
// (Colors, Levels, Histogram, Suppress) for the range and channel chosen
// above it, a Ranges page with the curves, and an Options page.
//
// When the render has a device, the kernels "CCProcessPixel" (with
// suppression), "CCProcessPixelSimple" (without) or "CCProcessRange" of the
// common library run first, and the rows only if they fail.
//
// Histogram modes (HistogramType Equalize, Match): the input's histogram is
// counted first (over the match rectangle, every HistogramProxyScale-th
// pixel), curves are built that equalise it or match it onto the reference's
// (MatchReference, or the histogram kept by Snapshot Match Time until Release
// Match), and the pixel function reads the curves
// (ColorCorrectorHistogram.h); "CCProcessEqualize" runs it on a device. The
// snapshot's counts are kept in the hidden input MatchSnapshotData, so a
// saved document keeps them.
//
// Thread safety: the constructor and NotifyChanged on the main thread;
// Process writes the settings before any row starts, rows only read them.
#include <memory>
#include <vector>

#include "host/color/Histogram.h"
#include "host/flow/Operator.h"
#include "operators/color/ColorCorrectorHistogram.h"
#include "operators/color/ColorCorrectorRanges.h"

namespace Orvane {

class Image;

class ColorCorrector : public ThreadedOperator {
public:
    ColorCorrector(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

    static constexpr int kRanges = 4;      ///< Master, Shadows, Midtones, Highlights
    static constexpr int kChannels = 4;    ///< RGB, Red, Green, Blue
    static constexpr int kAttributes = 10; ///< Contrast ... OutputHigh
    static constexpr int kSuppressed = 6;  ///< red, yellow, green, cyan, blue, magenta

    /// The controls that shape the correction, as numbers.
    struct Controls {
        double attr[kRanges][kChannels][kAttributes];
        double hue[kRanges], saturation[kRanges], tintAngle[kRanges], tintLength[kRanges];
        double suppress[kRanges][kSuppressed], suppressAngle[kRanges];
        int tintMode = cc::TintBetter;
        bool gammaAfterLevels = false, prePost = false;
    };
    /// Folds the controls into the pixel function's settings; suppression
    /// tables go to `tables` (three, one per record).
    static void Fold(const Controls &c, cc::PixelSettings &s, std::vector<cc::Suppression> &tables);

private:
    enum Group { Always = -1, Colors = 0, Levels = 1, Histograms = 2, Suppress = 3 };
    /// Shows an input only in its Menu group, for its range and channel (-1: any).
    struct Shown {
        Input *in;
        int group, range, channel;
    };
    Input *Add(const char *name, const char *id, const TagList &tags, int group, int range = -1, int channel = -1);
    void UpdateVisibility();
    void ResetGroup(int group);
    Controls ReadControls(Request *req) const;
    /// The kernels "CCProcessPixel" / "CCProcessPixelSimple" / "CCProcessRange"; false when they did not run.
    bool RunDevice(Request *req, const Image *src, Image *dst, bool rangeOutput, int shown);
    /// The histogram modes: counts, builds the curves, corrects.
    void ProcessHistogram(Request *req, Image *src, bool match);
    /// The kernel "CCProcessEqualize"; false when it did not run.
    bool RunEqualizeDevice(Request *req, const Image *src, Image *dst);
    HistogramSampling Sampling(double proxy, double ignoreTransparent, double prePost) const;
    /// Counts the reference of Match now and keeps it in MatchSnapshotData (Snapshot Match Time).
    void TakeSnapshot(double time);

    Input *attr_[kRanges][kChannels][kAttributes];
    Input *wheel_[kRanges][4], *hue_[kRanges], *saturation_[kRanges];
    Input *suppress_[kRanges][kSuppressed], *suppressAngle_[kRanges];
    Input *menu_, *correctionRange_, *channel_, *tintMode_;
    Input *histogramType_, *resetHistogram_, *resetColors_, *resetLevels_, *resetSuppression_;
    Input *rangesRange_, *colorRanges_, *renderOutputRange_, *presetSimple_, *presetSmooth_;
    Input *prePost_, *processOrder_;
    Input *equalizeL_, *lockRGB_, *equalizeRGB_[3], *precision_, *smooth_, *snapshotButton_, *release_;
    Input *matchCenter_, *matchWidth_, *matchHeight_, *proxyScale_, *ignoreTransparent_, *snapshotData_;
    Input *input_, *matchReference_, *matchMask_;
    Output *output_;
    std::vector<Shown> shown_;

    // ---- per request, written by Process, read by the rows ----
    cc::PixelSettings settings_;
    std::vector<cc::Suppression> tables_;
    Ref<Parameter> curves_;
    Histogram histogram_{256};
    cc::HistogramSettings histogramSettings_;
    // The snapshot read from MatchSnapshotData, kept while that value stays (requests run one at a time).
    Ref<Parameter> snapshotValue_;
    std::unique_ptr<Histogram> snapshot_;
};

} // namespace Orvane
