#include "host/flow/ImageFormatInputs.h"

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/Operator.h"
#include "host/flow/Request.h"

namespace Orvane {

void ImageFormatInputs::Add(Operator *op, int page, const FrameFormat &ff, bool size, bool pixelAspect, bool depthList,
                            const char *const sizeIds[2]) {
    if (size) {
        static const char *const plain[2] = {"Width", "Height"};
        const char *const *ids = sizeIds ? sizeIds : plain;
        for (int axis = 0; axis < 2; ++axis)
            (axis ? height : width) =
                op->AddInputTagList(plain[axis], ids[axis],
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_Slider},
                                     {ControlPage, page},
                                     {InputInteger, 1},
                                     {InputMinAllowed, 1.0},
                                     {InputMaxAllowed, 32768.0},
                                     {InputSliderLow, 1.0},
                                     {InputSliderHigh, 4096.0},
                                     {InputDefault, static_cast<double>(axis ? ff.height : ff.width)},
                                     {InputDelayDefault, 1},
                                     {LinkForceSave, 1}});
    }
    if (pixelAspect)
        aspect = op->AddInputTagList("Pixel Aspect", "PixelAspect",
                                     {{LinkDataType, CLSID_DataType_Point},
                                      {InputControl, CLSID_InputControl_Offset},
                                      {ControlPage, page},
                                      {InputDefaultX, ff.aspectX},
                                      {InputDefaultY, ff.aspectY},
                                      {InputMinAllowed, 1e-5},
                                      {InputDelayDefault, 1},
                                      {LinkForceSave, 1}});
    if (depthList)
        depth = op->AddInputTagList("Depth", "Depth",
                                    {{LinkDataType, CLSID_DataType_Number},
                                     {InputControl, CLSID_InputControl_Combo},
                                     {ControlPage, page},
                                     {InputInteger, 1},
                                     {InputMinAllowed, 0.0},
                                     {InputMaxAllowed, 4.0},
                                     {ListAddItem, "Default"},
                                     {ListAddItem, "int8"},
                                     {ListAddItem, "int16"},
                                     {ListAddItem, "float16"},
                                     {ListAddItem, "float32"}});
}

ImageFormatInputs::Values ImageFormatInputs::Read(const Request *req, const FrameFormat &ff) const {
    Values v;
    v.width = static_cast<int>(req->GetInputNumber(width, ff.width));
    v.height = static_cast<int>(req->GetInputNumber(height, ff.height));
    if (const auto *p = aspect ? dynamic_cast<const Point *>(req->GetInputData(aspect)) : nullptr) {
        v.aspectX = p->x;
        v.aspectY = p->y;
    } else {
        v.aspectX = ff.aspectX;
        v.aspectY = ff.aspectY;
    }
    v.depthChoice = static_cast<int>(req->GetInputNumber(depth, 0.0));
    return v;
}

} // namespace Orvane
