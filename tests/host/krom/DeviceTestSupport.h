#pragma once
// The OpenCL device the device tests run on (PoCL without a GPU). Without one the tests skip, unless
// ORVANE_REQUIRE_DEVICE=opencl says the machine must have it, when they fail.
#include <cstdlib>
#include <string>

#include <gtest/gtest.h>

#include "host/app/Application.h"
#include "host/core/Tags.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/krom/DeviceContext.h"

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

/// A render on `ctx` (none when null): the request a host service is handed, and the tags asking for the device.
struct DeviceRender {
    RenderTask task;
    Request req{nullptr, nullptr, 0.0, 0, &task};
    explicit DeviceRender(IDeviceContext *ctx) {
        if (ctx) task.SetDevice(ctx);
    }
    TagList On(TagList tags) {
        tags.Set({WorkUseGPU, 1});
        tags.Set({WorkRequest, &req});
        return tags;
    }
};

} // namespace Orvane::Test
