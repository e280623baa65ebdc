#pragma once
// Lens Distort: applies a measured lens distortion to an image (Distort) or
// takes it out (Undistort), with one of seven lens models (LensModel.h):
// the kit's six and the barrel model. Each model's parameters are inputs of
// the tool, shown while the model is chosen; the camera settings (focal
// length, film gate and aperture, the fit of the filmback to the image,
// lens shift, focus distance, pixel aspect) reach the kit's models.
//
// Per output sample at p (n x n samples per pixel at (i + 0.5) / n):
//   Distort    the source is read at MapDirect(p) (the model's undistort);
//   Undistort  the source is read at MapInverse(p), iterated from a start:
//              each row runs from its middle pixel (started from the image
//              centre) to the left, then from the pixel after it to the
//              right, each pixel starting from its neighbour's result. A
//              sample whose result lies further (|dx| + |dy|) from its start
//              than a tenth of the image's larger side is dropped; a pixel
//              whose samples all dropped ends its run, which is cleared
//              from there to the row's end (the inverse diverged).
// The pixel is the mean of its kept samples, read bilinearly or nearest
// with Canvas or Duplicate edges (EdgeSampler.h). Output Distortion Map
// writes the mean offset (source - sample, in pixels) into red and green,
// 0 into blue and 1 into alpha, as float pixels. Drafts whose application
// allows quick filters use 1 x 1 bilinear.
//
// Windows. The output's data window is the image of the input's (domain ∩
// data window) under the map of the mode: the rectangle's boundary is
// walked in unit steps (the inverse walk starting from the centre and each
// step from the last result; a step that jumps further than the maximal
// step is skipped), grown by one pixel and rounded outward, then limited to
// the source window grown by one image size on each side, to the region of
// interest, and with Clipping Mode Frame to the frame. CheckRequest asks the
// input for the region the requested one reads, the same walk in the other
// direction grown by the bilinear reach, clipped to the input's domain
// (Clipping Mode Domain) or frame (Frame). A source whose window is not the
// one to read (Frame: the frame) or that is not float is read through a
// float copy of that window.
//
// Lens files. ControlCommand CCMD_LoadFile (the command line: orvane set
// FLOW TOOL.Load=FILE) reads a ".data" file for the kit's models, a ".pfb"
// file for the barrel model, into the chosen model's inputs and the camera
// settings (a ".pfb" table of several frames becomes keys at its frames).
// A bad file changes nothing and gives one console line, the tool's name
// first. This host has no file dialog: the Load button alone says so.
//
// Thread safety: Process and CheckRequest run on the render thread, one
// request at a time; their setup updates the chosen model, which the row
// chunks then only read. NotifyChanged and ControlCommand run on the main
// thread between renders.
#include <memory>
#include <string>
#include <vector>

#include "host/flow/Operator.h"
#include "host/image/Pixel.h"
#include "host/image/Rect.h"
#include "operators/warp/LensModel.h"

namespace Orvane {

class Image;

class LensDistort : public ThreadedOperator {
public:
    LensDistort(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~LensDistort() override;
    size_t SizeOf() const override { return sizeof(*this); }

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    bool ControlCommand(int command, const TagList &tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;
    void ProcessChunk(Request *req, int chunk) override;

    /// What one request asks for, read by Setup.
    struct Setup {
        lensdistort::Model *model = nullptr;
        int mode = 1;    ///< 0 Distort, 1 Undistort
        int samples = 1; ///< per axis: 1, 2, 4, 8
        bool bilinear = true;
        int edge = 0;     ///< EdgeMode
        int clipping = 1; ///< 0 none, 1 domain, 2 frame
        bool distortionMap = false;
        int width = 0, height = 0;
        double maxStep = 0.0; ///< the largest believable jump between neighbouring inverses, pixels
    };
    /// The box (rounded outward, grown by one pixel) that `r`'s boundary reaches through the model: the
    /// direct map (`direct`) or the inverse.
    static ImgRectI MappedBounds(const Setup &s, const ImgRectI &r, bool direct);

private:
    bool ReadSetup(Request *req, const Image *img, const ImageDomain *domain, Setup &s);
    lensdistort::Model *ChosenModel(OvID id) const;
    void ShowModelInputs(OvID chosen);
    bool LoadLensFile(const std::string &path, double time, std::string &error);
    void ProcessRow(int y, std::vector<FltPixel> &row) const;

    std::vector<std::unique_ptr<lensdistort::Model>> models_;
    std::vector<std::vector<Input *>> modelInputs_; ///< per model, its parameter inputs in order
    Input *mode_, *edgeMode_, *clipping_, *distortionMap_, *model_;
    Input *useSourceAspect_, *pixelAspect_, *focalLength_, *filmGate_, *apertureW_, *apertureH_, *fit_;
    Input *shiftX_, *shiftY_, *focusDistance_;
    Input *supersampling_, *subsampleMode_, *load_;
    Input *input_;
    Output *output_;

    // The request being processed, for the row chunks.
    Setup setup_;
    const Image *source_ = nullptr;
    Image *dest_ = nullptr;
};

} // namespace Orvane
