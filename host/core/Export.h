#pragma once
// Symbol visibility for the orvanesystem shared library. Everything a module or
// program may call is marked ORVANE_API; the rest stays internal.
#if defined(ORVANESYSTEM_BUILD)
#define ORVANE_API __attribute__((visibility("default")))
#else
#define ORVANE_API __attribute__((visibility("default")))
#endif
