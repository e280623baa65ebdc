#pragma once
// Shared by the tests of the colour-managed tools: a chain of tools after an image source, rows of known colours,
// and the same image converted by oiiotool.
#include <algorithm>
#include <array>
#include <cmath>
#include <string>
#include <utility>
#include <vector>

#include "host/flow/Engine.h"
#include "host/flow/OrvaneDoc.h"
#include "host/image/NewImage.h"
#include "tests/host/image/ImageTestSupport.h"
#include "tests/support/TestSupport.h"

namespace Orvane::cmtest {

using Rgb = std::array<double, 3>;

/// One row of float pixels of the given colours, alpha `alpha`.
inline Ref<Image> ColourRow(const std::vector<Rgb> &colours, float alpha = 1.f) {
    const int w = static_cast<int>(colours.size());
    Ref<Image> img = NewImageTagList({{ImgWidth, w}, {ImgHeight, 1}, {ImgDepth, DepthRGBAFlt32}});
    img->AllocScanLineData();
    for (int x = 0; x < w; ++x) {
        const Rgb &c = colours[x];
        img->PutFlt(x, 0, {static_cast<float>(c[0]), static_cast<float>(c[1]), static_cast<float>(c[2]), alpha});
    }
    return img;
}

/// The colours of row 0.
inline std::vector<Rgb> ColoursOf(const Image &img) {
    std::vector<Rgb> out;
    for (int x = 0; x < img.Width(); ++x) {
        const FltPixel p = img.GetFlt(x, 0);
        out.push_back({p.R, p.G, p.B});
    }
    return out;
}

/// A document: an image source, then tools added one after the other.
struct Chain {
    OrvaneDoc doc;
    Operator *last;
    explicit Chain(Ref<Image> img) : last(Test::AddImageSource(doc, "Src", std::move(img))) {}
    Operator *Add(const char *classId, const std::vector<std::pair<const char *, std::string>> &texts = {},
                  const std::vector<std::pair<const char *, double>> &numbers = {}) {
        Operator *op = doc.AddTool(OvID(classId));
        EXPECT_TRUE(op && op->FindInput("Input")->ConnectTo(last->FindMainOutput()));
        if (!op) return last;
        for (const auto &[id, text] : texts) Test::SetText(op, id, text);
        Test::SetNumbers(op, numbers);
        return last = op;
    }
    /// The last tool's output without the cache (null when it failed).
    Ref<Image> Run(const ImgRectI *roi = nullptr) {
        EvalOptions opt;
        opt.useCache = false;
        if (roi) opt.roi = ImageDomain(*roi);
        return Test::EvalImage(last, 0.0, opt);
    }
};

/// `src` through oiiotool with `args` between reading and writing (the files in `dir`); null when it failed.
inline Ref<Image> ThroughOiiotool(const Image &src, const std::string &dir, const std::string &args) {
    Test::WritePfm(src, dir + "/oiio-in.pfm");
    if (!Test::RunQuiet("oiiotool " + dir + "/oiio-in.pfm " + args + " -o " + dir + "/oiio-out.exr")) return nullptr;
    return Test::ReadOiioDump(dir + "/oiio-out.exr", src.Width(), src.Height());
}

/// The largest difference of red, green or blue between two images of the same size.
inline double WorstColourDifference(const Image &a, const Image &b) {
    double worst = 0;
    for (int y = 0; y < a.Height(); ++y)
        for (int x = 0; x < a.Width(); ++x) {
            const FltPixel p = a.GetFlt(x, y), q = b.GetFlt(x, y);
            worst = std::max<double>({worst, std::fabs(p.R - q.R), std::fabs(p.G - q.G), std::fabs(p.B - q.B)});
        }
    return worst;
}

/// Expects each colour within `tol` of the wanted one.
inline void ExpectColoursNear(const std::vector<Rgb> &got, const std::vector<Rgb> &want, double tol) {
    ASSERT_EQ(got.size(), want.size());
    for (size_t i = 0; i < got.size(); ++i)
        for (int c = 0; c < 3; ++c) EXPECT_NEAR(got[i][c], want[i][c], tol) << "colour " << i << " channel " << c;
}

} // namespace Orvane::cmtest
