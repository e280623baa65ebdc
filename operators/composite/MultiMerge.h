#pragma once
// MultiMerge: lays any number of layers onto one Background, in the order of
// its layer list. Each layer n has a foreground ("Layer<n>.Foreground") and
// a MergeInputs group of its own ("Layer<n>.ApplyMode" and so on), a name
// ("LayerName<n>", "Layer <n>" by default), a switch ("LayerEnabled<n>":
// the layer takes part when value + 0.5 floored is not 0) and two buttons
// ("LayerDelete<n>", "LayerReset<n>"). The layer records live in a map from
// layer number to record.
//
// Per frame: a TransformMatrix is built on the Background and every layer
// the LayerOrder table names (in table order; numbers of 0 or less and
// unknown layers are skipped), that is enabled and whose foreground came
// with the request, is merged onto it; a failing layer does not stop the
// walk. A LayerOrder that is no table gives the Background unchanged. With
// the common Blend below 1 a second TransformMatrix on the Background takes
// the merged stack back with that Blend and the Process switches
// (MergeConcatenateTagList, XfMergeToolBlend -1), so the host's common mix
// does not run again. With an effect mask connected the stack is handed on
// and the host's common controls mix it (the mask lives in output pixels).
//
// The list keeps one empty layer beyond those connected. Connecting a
// layer's foreground adds it to LayerOrder and names it after the source
// tool ("Background1 Layer") unless the user named it. Documents: a
// document's LayerOrder makes the layers it names; layer inputs read before
// their layer existed are taken from the inputs the document kept.
//
// Left out (the host has no context menus or undo): the list's menu entries
// ("Go to Source", "Split Here", the rename, reset and delete entries) and
// their undo steps. The Delete and Reset buttons do the same for one layer.
//
// Thread safety: layers are added and changed on the main thread between
// renders; CheckRequest and Process read them on the render thread.
#include <map>
#include <memory>

#include "host/flow/MergeInputs.h"
#include "host/flow/Operator.h"

namespace Orvane {

class MultiMerge : public ThreadedOperator {
public:
    MultiMerge(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~MultiMerge() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void PostProcess(Request *req) override;

    struct Layer {
        int number = 0;
        Input *foreground = nullptr;
        std::unique_ptr<MergeInputs> merge;
        Input *name = nullptr, *enabled = nullptr, *remove = nullptr, *reset = nullptr;
    };
    /// The layer of number n, made (with its inputs) when missing; null for
    /// n <= 0. Main thread.
    Layer *EnsureLayer(int n);
    const std::map<int, Layer> &Layers() const { return layers_; }
    /// The layer numbers of the LayerOrder value, in table order.
    std::vector<int> LayerOrder() const;

private:
    void SetLayerOrder(const std::vector<int> &order);
    /// Keeps one layer without a connected foreground at the end.
    void KeepEmptyLayer();
    /// Applies the document's kept values of inputs that did not exist yet.
    void TakeKeptInputs(const Layer &layer);
    bool LayerTakesPart(const Layer &layer, double time) const;

    Input *layerOrder_, *layerSelection_, *background_;
    Output *output_;
    int page_ = 0;
    std::map<int, Layer> layers_;
    bool blendedHere_ = false; ///< this request's Blend was applied in Process
    bool changingOrder_ = false;
};

} // namespace Orvane
