#include "host/flow/DataTypes.h"

namespace Orvane {

#define ORVANE_DEFINE_ID(name, text) const OvID name(text);
ORVANE_CLASS_IDS(ORVANE_DEFINE_ID)
#undef ORVANE_DEFINE_ID

} // namespace Orvane
