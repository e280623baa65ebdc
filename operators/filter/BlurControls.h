#pragma once
// The blur controls that the Blur tool and the keyers' matte blur share: the
// Filter buttons (and the filter IDs older documents and scripts may set),
// Num Passes, Clipping Mode; and what a CheckRequest needs to size a blur's
// reach before the controls are fetched.
//
// Thread safety: the tag lists are built on the spot; the request helpers run
// on the render thread of the request.
#include "host/core/OvID.h"
#include "host/core/TagList.h"
#include "host/flow/Parameter.h"
#include "host/image/Rect.h"

namespace Orvane {

class Input;
class Request;

/// The Filter input: buttons Box, Bartlett, Multi-box, Gaussian, Fast
/// Gaussian (default), the other known filters accepted, notifying.
TagList BlurFilterTags();
/// The BlurTypes value of a filter ID; IDs outside the table ("Soften" among
/// them) give the fallback kernel, 1.
int BlurTypeOfFilter(OvID id);
/// Num Passes: whole 1..64 (slider to 16), default 4, hidden until Multi-box.
TagList BlurPassesTags();
/// Clipping Mode buttons None, Domain, Frame, with the default `def`.
TagList ClippingModeTags(OvID def);

/// An input's value for this request: the fetched one, else (CheckRequest
/// runs before the controls' level is fetched) asked for at the request's
/// time.
Ref<Parameter> AskInputValue(Request *req, Input *in);
double AskInputNumber(Request *req, Input *in, double fallback);
OvID AskInputID(Request *req, Input *in, OvID fallback);

/// `r` grown by whole pixels; endless sides stay endless.
ImgRectI GrownKeepingEndless(ImgRectI r, int dx, int dy);

} // namespace Orvane
