#pragma once
// A mask tool in a document of a small frame, rendered without the cache, and
// the area a mask covers: what the mask tests share.
#include <gtest/gtest.h>

#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/Image.h"
#include "tests/support/TestSupport.h"

namespace Orvane::Test {

struct MaskRig {
    static constexpr int W = 256, H = 192;
    Ref<OrvaneDoc> doc = MakeRef<OrvaneDoc>();
    Operator *mask = nullptr;
    explicit MaskRig(const char *cls) {
        LoadOperators();
        doc->SetPref(PREF_FFWidth, W);
        doc->SetPref(PREF_FFHeight, H);
        mask = doc->AddTool(OvID(cls));
        EXPECT_TRUE(mask) << cls;
    }
    Ref<Image> Render() const {
        EvalOptions opt;
        opt.useCache = false;
        return EvalImage(mask, 0.0, opt);
    }
    /// A grey (0.25) plate of w x h pixels, `aspectY` tall each, through a Brightness/Contrast of gain 2 limited by
    /// this mask: 0.5 where the mask is 1, 0.25 where it is 0. Null on failure.
    Ref<Image> GainThroughMask(int w, int h, double aspectY = 1.0) const {
        Ref<Image> plate = MakeRef<Image>(w, h, DepthRGBAFlt32);
        if (!plate->AllocScanLineData()) return nullptr;
        plate->FillWithin({0.25f, 0.25f, 0.25f, 1.f}, plate->DataWindow());
        plate->SetScale(1.0, aspectY);
        Operator *bc = doc->AddTool(OvID("BrightnessContrast"), "BC1");
        if (!bc || !bc->FindInput("Input")->ConnectTo(AddImageSource(*doc, "Plate", plate)->Out()) ||
            !bc->FindInput("EffectMask")->ConnectTo(mask->FindMainOutput()))
            return nullptr;
        SetNumber(bc, "Gain", 2.0);
        return EvalImage(bc);
    }
    /// The covered area in pixels over the W x H frame (the canvas counts beyond the data window).
    static double Area(const Image &m) {
        double sum = 0;
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) sum += m.GetFlt(x, y).A;
        return sum;
    }
};

} // namespace Orvane::Test
