#pragma once
// Helpers shared by the Background tests: a document with one Background
// tool, setting its colours and gradient, rendering with options, reading
// stored pixels, and the fixed point ramp of integer images worked out
// independently in 64-bit arithmetic.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <string>
#include <vector>

#include "host/flow/DataTypes.h"
#include "host/flow/Engine.h"
#include "host/flow/Gradient.h"
#include "host/flow/Operator.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/RenderTask.h"
#include "host/flow/Request.h"
#include "host/image/Image.h"
#include "tests/support/TestSupport.h"

namespace Orvane::BgTest {

// Inside a test body `Test` names the framework's class, so the shared
// helpers are brought in by name.
using Orvane::Test::EvalImage;
using Orvane::Test::LoadOperators;
using Orvane::Test::SetID;
using Orvane::Test::SetNumber;
using Orvane::Test::SetNumbers;
using Orvane::Test::SetPoint;

/// Loads the tool library once for the whole suite.
class BackgroundSuite : public ::testing::Test {
protected:
    static void SetUpTestSuite() { LoadOperators(); }
    void SetUp() override {
        bg = doc.AddTool(OvID("Background"));
        ASSERT_NE(bg, nullptr);
    }
    /// Frame size and Type in one go.
    void Frame(int w, int h, const char *type) {
        SetNumber(bg, "Width", w);
        SetNumber(bg, "Height", h);
        SetID(bg, "Type", type);
    }
    OrvaneDoc doc;
    Operator *bg = nullptr;
};

/// Sets the four inputs of one corner colour ("TopLeft", "BottomRight", ...).
inline void SetColor(Operator *op, const std::string &corner, const double rgba[4]) {
    static const char *const channels[4] = {"Red", "Green", "Blue", "Alpha"};
    for (int ch = 0; ch < 4; ++ch) SetNumber(op, (corner + channels[ch]).c_str(), rgba[ch]);
}

inline void SetGradient(Operator *op, std::vector<GradientStop> stops) {
    Input *in = op->FindInput("Gradient");
    ASSERT_NE(in, nullptr);
    ASSERT_TRUE(in->SetValue(MakeRef<Gradient>(std::move(stops))));
}

/// The main output rendered with `opt` (cache off unless asked), or null.
inline Ref<Image> Render(Operator *op, EvalOptions opt = {}) {
    Ref<Parameter> p = Evaluate(op->FindMainOutput(), 0.0, opt);
    return Ref<Image>(dynamic_cast<Image *>(p.Get()));
}

/// Runs one field request straight through Process, the way the engine would
/// for an interlaced render: the inputs' own values, no region, no domain.
inline Ref<Image> RenderField(Operator *op, int field) {
    Output *out = op->FindMainOutput();
    Request req(op, out, 0.0, 0, nullptr);
    req.SetField(field);
    for (const auto &in : op->Inputs()) req.SlotOf(in.get()).data = in->ValueAt(0.0);
    op->Process(&req);
    return Ref<Image>(dynamic_cast<Image *>(req.GetOutputData(out)));
}

inline float Channel(const FltPixel &p, int ch) { return ch == 0 ? p.R : ch == 1 ? p.G : ch == 2 ? p.B : p.A; }

/// The stored integer of channel `ch` at (x, y) of an 8- or 16-bit image;
/// single-channel images hold one value per pixel whatever `ch` is.
inline int StoredInt(const Image &img, int x, int y, int ch) {
    const int channels = img.IsMask() ? 1 : 4;
    const int i = (x - img.DataWindow().x0) * channels + (channels == 4 ? ch : 0);
    if (img.Format().bytesPerComponent == 1) return img.Row<uint8_t>(y)[i];
    return img.Row<uint16_t>(y)[i];
}

/// The fixed point ramp of one row between two end values: each end scaled
/// by 65535 x 32768 with 0.5 added and truncated, a per-column step of their
/// difference over (W - 1) truncated towards zero, 16384 added once, and the
/// 16-bit value in bits 15 and up.
inline std::vector<int> FixedRow(float left, float right, int width) {
    const double one = 65535.0 * 32768.0;
    const int64_t a = static_cast<int64_t>(static_cast<double>(left) * one + 0.5);
    const int64_t b = static_cast<int64_t>(static_cast<double>(right) * one + 0.5);
    const int64_t step = width > 1 ? (b - a) / (width - 1) : 0;
    std::vector<int> row(width);
    for (int x = 0; x < width; ++x) row[x] = static_cast<int>((a + 16384 + x * step) >> 15);
    return row;
}

/// A 16-bit value as stored in 8 bits (nearest).
inline int To8(int v16) { return static_cast<int>(std::floor(v16 * 255.0 / 65535.0 + 0.5)); }

} // namespace Orvane::BgTest
