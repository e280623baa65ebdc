#include "host/core/Object.h"

namespace Orvane {

Object::~Object() = default;
RefObject::~RefObject() = default;

bool Object::RegInit(Registry *) { return true; }
void Object::RegCleanup(Registry *) {}

} // namespace Orvane
