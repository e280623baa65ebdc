#pragma once
// MultiPoly: a mask of any number of polygon layers, each a PolyMaskInputs
// with its own full set of mask controls, drawn and merged one over the other
// in the order of PolyOrder.
//
// Inputs after the common mask controls (which this tool hides and does not
// read: every layer carries its own): PolyOrder (a table of layer IDs in
// paint order), PolySelection (what the list shows selected; not saved),
// AddPolygon and AddBSpline (buttons that add a Bezier or a B-spline layer).
// Layer N adds the nest "PolyMaskN" and the inputs PolyMaskNameN ("Polygon
// N" or "BSpline N"), PolyMaskEnabledN, PolyMaskDeleteN ("Delete Layer"),
// PolyMaskResetN ("Reset Layer to Default") and its PolyMaskInputs under the
// group "PolyMaskN" ("PolyMaskN.Level", ..., "PolyMaskN.Polyline").
//
// Per frame: the incoming EffectMask (or a clear mask) is the accumulator;
// each enabled layer of PolyOrder is drawn into a mask of its own box (grown
// by its soft edge's reach) and merged onto the accumulator with its own
// Level, Filter, SoftEdge, Passes and PaintMode. The finished stack already
// holds the incoming mask, so the base's finishing merge leaves it out
// (HoldsIncomingMask). A layer that cannot deliver says so on the console
// and drops out.
//
// Documents: a PolyOrder value makes the layers it names, in ascending ID
// order, before the layers' own inputs (saved after it) are applied. Which
// layers are B-splines is kept in the tool's table as BSplineLayers = { IDs }
// (absent when there are none), read when the layers are made. Deleting a
// layer takes its inputs out of the tool; a reset sets them back to their
// defaults (the layer's name stays).
//
// Left out (no context menus or undo in this host): the list's menu entries
// (duplicate, split, rename, the reset and delete entries for selections),
// conversion between the curve kinds, and the layer object's script access.
//
// Thread safety: layers are added, reset and deleted on the main thread
// between renders; PreProcess and Process read them on the render thread.
#include <map>
#include <memory>
#include <vector>

#include "host/flow/MaskOperator.h"
#include "operators/mask/PolyMaskInputs.h"

namespace Orvane {

class MultiPoly : public MaskOperator {
public:
    MultiPoly(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~MultiPoly() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void PreProcess(Request *req) override;
    void Process(Request *req) override;

    struct Layer {
        bool bspline = false;
        Input *name = nullptr, *enabled = nullptr, *remove = nullptr, *reset = nullptr;
        std::unique_ptr<PolyMaskInputs> poly;
    };
    const std::map<int, Layer> &Layers() const { return layers_; }
    /// Adds a layer at the end of PolyOrder under the next free ID; returns the ID. Main thread.
    int AddLayer(bool bspline);

protected:
    bool HoldsIncomingMask() const override { return true; }

private:
    /// The layer of ID n, made with its inputs when missing. Main thread.
    Layer &EnsureLayer(int n, bool bspline);
    void DeleteLayer(int n);
    void ResetLayer(Layer &layer);
    void SetOrder(const std::vector<int> &order);
    /// Writes BSplineLayers into the tool's document table.
    void RecordKinds();
    /// The enabled layers of a request's PolyOrder, in paint order.
    std::vector<const Layer *> EnabledLayers(Request *req) const;

    Input *polyOrder_, *polySelection_, *addPolygon_, *addBSpline_;
    int page_ = 0;
    std::map<int, Layer> layers_;
    bool changingOrder_ = false;
};

} // namespace Orvane
