#include "host/segment/OnnxObjectMask.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include <opencv2/dnn.hpp>
#include <opencv2/imgproc.hpp>

#include "host/image/Image.h"
#include "host/image/PixelConvert.h"

namespace Orvane {

struct OnnxObjectMaskProvider::Net {
    cv::dnn::Net net;
};

OnnxObjectMaskProvider::OnnxObjectMaskProvider(const std::string &path) {
    try {
        cv::dnn::Net net = cv::dnn::readNetFromONNX(path);
        if (net.empty()) {
            loadError_ = "\"" + path + "\" holds no network";
            return;
        }
        net.setPreferableBackend(cv::dnn::DNN_BACKEND_OPENCV);
        net.setPreferableTarget(cv::dnn::DNN_TARGET_CPU);
        net_ = std::make_unique<Net>(Net{std::move(net)});
    } catch (const cv::Exception &e) {
        loadError_ = "\"" + path + "\" is not a network that loads: " + e.msg;
    }
}

OnnxObjectMaskProvider::~OnnxObjectMaskProvider() = default;

namespace {

/// Draws the strokes of a list (x, y pairs in frame pixels, strokes ended by NaN pairs) into `plane`, whose pixel
/// (i, j) covers frame pixels from `origin` on at `scale` network pixels per frame pixel.
void DrawStrokes(const std::vector<float> *list, cv::Mat &plane, double originX, double originY, double scale) {
    if (!list) return;
    std::vector<cv::Point> stroke;
    auto flush = [&] {
        if (stroke.size() == 1) stroke.push_back(stroke.front()); // a dot
        if (!stroke.empty())
            cv::polylines(plane, stroke, false, cv::Scalar(1.0), OnnxObjectMaskProvider::NetStrokeWidth, cv::LINE_8);
        stroke.clear();
    };
    for (size_t i = 0; i + 1 < list->size(); i += 2) {
        const float x = (*list)[i], y = (*list)[i + 1];
        if (!std::isfinite(x) || !std::isfinite(y)) {
            flush();
            continue;
        }
        stroke.emplace_back(static_cast<int>(std::floor((x - originX) * scale)),
                            static_cast<int>(std::floor((y - originY) * scale)));
    }
    flush();
}

/// One channel of an image's data window as floats, a row of the matrix per image row from the bottom.
cv::Mat Plane(const Image &img, int channel) {
    const ImgRectI dw = img.DataWindow();
    cv::Mat out(dw.Height(), dw.Width(), CV_32F);
    std::vector<FltPixel> row(static_cast<size_t>(dw.Width()));
    for (int j = 0; j < dw.Height(); ++j) {
        LoadFlt(img.Depth(), img.ScanLine(dw.y0 + j), dw.Width(), row.data());
        float *o = out.ptr<float>(j);
        for (int i = 0; i < dw.Width(); ++i) o[i] = (&row[static_cast<size_t>(i)].R)[channel];
    }
    return out;
}

} // namespace

bool OnnxObjectMaskProvider::Run(const ProviderCall &call, std::string &error) {
    auto in = call.inputs.find("src");
    auto dst = call.outputs.find("dst");
    if (in == call.inputs.end() || !in->second || dst == call.outputs.end() || !dst->second) {
        error = "the object mask needs the images \"src\" and \"dst\"";
        return false;
    }
    const Image &src = *in->second;
    const ImgRectI dw = src.DataWindow();
    if (dw.IsNull() || !src.HasScanLineData() || dst->second->DataWindow() != dw || !dst->second->HasScanLineData()) {
        error = "the object mask needs \"src\" and \"dst\" with rows over one data window";
        return false;
    }
    const double scale = std::min(1.0, double(NetLongSide) / std::max(dw.Width(), dw.Height()));
    const cv::Size net(std::max(1, static_cast<int>(std::lround(dw.Width() * scale))),
                       std::max(1, static_cast<int>(std::lround(dw.Height() * scale))));

    // The six planes at the network's size.
    std::vector<cv::Mat> planes;
    const cv::Mat alpha = Plane(src, 3);
    for (int c = 0; c < 3; ++c) {
        cv::Mat p = Plane(src, c);
        // Not premultiplied: divided by alpha where there is some.
        for (int j = 0; j < p.rows; ++j)
            for (int i = 0; i < p.cols; ++i) {
                const float a = alpha.at<float>(j, i);
                float &v = p.at<float>(j, i);
                v = std::clamp(a > 0.f ? v / a : v, 0.f, 1.f);
            }
        cv::Mat small;
        cv::resize(p, small, net, 0, 0, cv::INTER_AREA);
        planes.push_back(small);
    }
    for (const char *name : {"posStroke", "negStroke"}) {
        cv::Mat plane = cv::Mat::zeros(net, CV_32F);
        auto list = call.floatLists.find(name);
        DrawStrokes(list == call.floatLists.end() ? nullptr : &list->second, plane, dw.x0, dw.y0, scale);
        planes.push_back(plane);
    }
    cv::Mat carried = cv::Mat::zeros(net, CV_32F);
    const auto *block = static_cast<const OrvaneSemanticSegmentationParams *>(call.block);
    auto prop = call.inputs.find("cachePropMaskIn");
    if (block && call.blockSize == sizeof(OrvaneSemanticSegmentationParams) && block->hasCachePropMask &&
        prop != call.inputs.end() && prop->second && prop->second->DataWindow() == dw &&
        prop->second->HasScanLineData())
        cv::resize(Plane(*prop->second, 3), carried, net, 0, 0, cv::INTER_AREA);
    planes.push_back(carried);

    cv::Mat matte;
    try {
        const int shape[4] = {1, 6, net.height, net.width};
        cv::Mat input(4, shape, CV_32F);
        for (int c = 0; c < 6; ++c)
            planes[static_cast<size_t>(c)].copyTo(cv::Mat(net.height, net.width, CV_32F, input.ptr<float>(0, c)));
        cv::Mat output;
        {
            std::lock_guard<std::mutex> guard(runLock_);
            net_->net.setInput(input);
            output = net_->net.forward();
        }
        if (output.dims != 4 || output.size[0] != 1 || output.size[1] != 1 || output.size[2] != net.height ||
            output.size[3] != net.width) {
            error = "the network's output is not one plane of the input's size";
            return false;
        }
        cv::Mat plane(net.height, net.width, CV_32F, output.ptr<float>(0, 0));
        cv::resize(plane, matte, cv::Size(dw.Width(), dw.Height()), 0, 0, cv::INTER_LINEAR);
    } catch (const cv::Exception &e) {
        error = "the network did not run: " + e.msg;
        return false;
    }

    std::vector<FltPixel> row(static_cast<size_t>(dw.Width()));
    for (auto &[name, img] : call.outputs) {
        if (!img || img->DataWindow() != dw || !img->HasScanLineData()) continue;
        for (int j = 0; j < dw.Height(); ++j) {
            const float *m = matte.ptr<float>(j);
            for (int i = 0; i < dw.Width(); ++i) {
                const float v = std::clamp(m[i], 0.f, 1.f);
                row[static_cast<size_t>(i)] = FltPixel{v, v, v, v};
            }
            StoreFlt(img->Depth(), row.data(), dw.Width(), img->ScanLine(dw.y0 + j));
        }
    }
    return true;
}

void RegisterOnnxObjectMaskProvider() {
    const char *path = std::getenv("ORVANE_MAGIC_MASK_MODEL");
    if (!path || !*path) return;
    auto provider = std::make_shared<OnnxObjectMaskProvider>(path);
    if (!provider->Available()) {
        std::fprintf(stderr, "ORVANE_MAGIC_MASK_MODEL: %s; the classical object mask stays in use\n",
                     provider->LoadError().c_str());
        return;
    }
    RegisterKernelProvider("GetObjectMask", std::move(provider));
}

} // namespace Orvane
