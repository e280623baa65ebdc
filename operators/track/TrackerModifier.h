#pragma once
// TrackerModifier: one tracker as a modifier, to drive any point input by a
// tracked feature. It has the tracker's inputs and outputs (TrackerData,
// number 1: Position1 is the point it drives with), the shared tracker
// controls (TrackerInputs) and the image it tracks on its input "Input".
// Runs are as the Tracker tool's: the track buttons from the time they are
// pressed at, or CCMD_Track.
//
// Thread safety: as TrackerDeluxe.
#include <atomic>
#include <memory>

#include "host/flow/Operator.h"
#include "operators/track/TrackerData.h"
#include "operators/track/TrackerInputs.h"

namespace Orvane {

class TrackerModifier : public ThreadedOperator {
public:
    TrackerModifier(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    bool ControlCommand(int command, const TagList &tags) override;

    bool RunTracking(double from, double to, RenderTask *task);

private:
    TrackerInputs shared_;
    Input *input_;
    std::unique_ptr<TrackerData> tracker_;
    std::atomic<bool> stop_{false};
};

} // namespace Orvane
