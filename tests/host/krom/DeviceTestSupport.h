#pragma once
// The OpenCL device the device tests run on (PoCL on machines without a
// GPU). Without one the tests skip, unless ORVANE_REQUIRE_DEVICE=opencl says
// the machine must have it (the test script sets it), when they fail.
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include "host/app/Application.h"

namespace Orvane::Test {

inline IDeviceContext *OpenCLDevice() {
    std::string error;
    IDeviceContext *ctx = GetApp()->Device(DeviceChoice::OpenCL, &error);
    if (!ctx) {
        const char *required = std::getenv("ORVANE_REQUIRE_DEVICE");
        if (required && std::string(required) == "opencl") ADD_FAILURE() << "no OpenCL device: " << error;
    }
    return ctx;
}

#define ORVANE_NEED_OPENCL(ctx)                                                                                        \
    IDeviceContext *ctx = Orvane::Test::OpenCLDevice();                                                                \
    if (!ctx) GTEST_SKIP() << "no OpenCL device"

} // namespace Orvane::Test
