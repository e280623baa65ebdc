#pragma once
// A named mask input of a keyer, with its own invert: the garbage and solid
// mattes. The mask tools feed it; a mask input's request carries this tool's
// frame, so the mask is drawn in the frame of the image it limits.
//
// MaskInputs(op, "Garbage", "Garbage Matte", page) adds, in order:
//   "Garbage.MaskNest"      a nest labelled "Garbage Matte"
//   "Garbage.Mask"          the mask link (data type Mask, not required)
//   "Garbage.MaskInverted"  the "Invert" checkbox (default 0)
// and closes the nest. docs/MATTE.md shows the inputs a keyer gets.
//
// Thread safety: made in the tool's constructor; GetMask is called from the
// tool's Process, on the render's thread.
#include "host/core/Export.h"

namespace Orvane {

class Image;
class Input;
class Operator;
class Request;

class ORVANE_API MaskInputs {
public:
    /// Adds the inputs to `op` under the prefix `name` (an ID word), the nest
    /// labelled `label`, on the page `page` (null: the current page).
    MaskInputs(Operator &op, const char *name, const char *label, const char *page = nullptr);

    /// The connected mask at this request, null when none is connected or it
    /// gave no image; `inverted` (may be null) receives the Invert switch.
    Image *GetMask(Request *req, bool *inverted = nullptr) const;

    Input *Mask() const { return mask_; }
    Input *Inverted() const { return inverted_; }

private:
    Input *mask_ = nullptr, *inverted_ = nullptr;
};

} // namespace Orvane
