#pragma once
// Background: the generator of flat colours, ramps and gradients.
//
// Five modes, chosen by the Type buttons:
//   Solid Color  one colour (the top left one) over the frame;
//   Horizontal   left to right between the top left and top right colours;
//   Vertical     bottom to top between the bottom left and top left colours;
//   Four Corner  a bilinear blend of the four corner colours;
//   Gradient     a Gradient parameter laid along Start..End in one of six
//                shapes, with offset, repetition and sub-pixel sampling.
//
// Ramps use u = x/(W - 1) across and v = y/(H - 1) up (rows count from the
// bottom), so the top left colour sits on the top row of a vertical ramp and
// on the left column of a horizontal one. Integer images take ramps by fixed
// point increments along each row; gradients are sampled per pixel.
//
// With a device, the frame is made there first (not for field requests): the
// ramps by the rows' own arithmetic; the gradient from a 256-entry table of
// the gradient, with positions taken against width - 1 and height - 1 and the
// sub-sample row step added before the aspect scaling (the device form,
// which differs from the rows by up to one table step and one pixel).
//
// Working values live in the tool for the length of one request: Process is
// their only writer, and the row workers read them.
#include <vector>

#include "host/flow/SourceOperator.h"
#include "host/image/Rect.h"

namespace Orvane {

class Gradient;
class Image;

class Background : public SourceOperator {
public:
    Background(const Registry *reg, const ScriptVal &args, const TagList &tags);
    ~Background() override;

    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void Process(Request *req) override;
    /// One row of the output's data window.
    void ProcessChunk(Request *req, int chunk) override;
    size_t SizeOf() const override;

    /// The Type choices, in button order.
    enum Mode { ModeSolid, ModeHorizontal, ModeVertical, ModeFourCorner, ModeGradient };

private:
    enum Corner { TopLeft, TopRight, BottomLeft, BottomRight };

    void ShowControlsFor(int mode);
    void RampRow(int y, uint8_t *row) const;
    void GradientRow(int y, uint8_t *row) const;
    /// Gradient position of one sample, before offset and repetition: `a`
    /// along Start..End, `b` across it, `px` the sample's X and `offY` its
    /// aspect-scaled Y offset from Start.
    float GradientPosition(float a, float b, float px, float offY) const;
    void ReleaseRequestState();
    /// The frame on the render's device ("Background" or "BackgroundGrad" of
    /// the common library); false when it did not run there.
    bool RunDevice(Request *req, Image *img);

    // Inputs, in panel order.
    Input *inType_;
    Input *inColor_[4][4];  ///< [corner][red, green, blue, alpha]
    Input *inSeparator_[4]; ///< none before the top left colour
    Input *inGradientType_, *inStart_, *inEnd_, *inGradient_, *inInterpolation_;
    Input *inOffset_, *inRepeat_, *inSubPixel_;
    Output *outImage_;

    // ---- per request ----
    float color_[4][4] = {}; ///< corner colours, [corner][channel]
    int mode_ = ModeSolid;
    Ref<Gradient> gradient_;
    int colorSpace_ = 0, gradientType_ = 0, repeat_ = 0, subpixel_ = 1;
    float offset_ = 0.0f;
    float start_[2] = {}, end_[2] = {}; ///< Y already multiplied by aspect_
    float toEnd_[2] = {};               ///< end - start
    float length2_ = 0.0f, invLength2_ = 0.0f, length_ = 0.0f, invLength_ = 0.0f;
    float aspect_ = 1.0f;
    /// Per data-window column x: (x/W - start.x)/L2 times the X and the Y
    /// component of end - start.
    std::vector<float> columnX_, columnY_;
    bool constant_ = false;       ///< every row holds one colour
    bool outOfRange_ = false;     ///< integer image with colours beyond 0..1: rows go through floats
    float constantColor_[4] = {}; ///< gradient colour when Start and End coincide
    int width_ = 1, height_ = 2;
    bool field_ = false;
    int fieldDominance_ = 0;
    Image *image_ = nullptr; ///< the output being filled
    ImgRectI window_;
};

} // namespace Orvane
