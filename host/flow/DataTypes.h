#pragma once
// Class IDs of the data types that travel on links, of the controls and
// preview handles an input can ask for, and of the host base classes. The
// host exports them so tools and documents refer to one interned ID each.
#include "host/core/OvID.h"

namespace Orvane {

#define ORVANE_CLASS_IDS(X)                                                                                            \
    X(CLSID_DataType_Number, "Number")                                                                                 \
    X(CLSID_DataType_Image, "Image")                                                                                   \
    X(CLSID_DataType_Point, "Point")                                                                                   \
    X(CLSID_DataType_Text, "Text")                                                                                     \
    X(CLSID_DataType_OvID, "ID")                                                                                       \
    X(CLSID_DataType_Mask, "Mask")                                                                                     \
    X(CLSID_DataType_Clip, "Clip")                                                                                     \
    X(CLSID_DataType_Gradient, "Gradient")                                                                             \
    X(CLSID_DataType_LookUpTable, "LookUpTable")                                                                       \
    X(CLSID_DataType_Histogram, "Histogram")                                                                           \
    X(CLSID_DataType_ColorCurves, "ColorCurves")                                                                       \
    X(CLSID_DataType_Polyline, "Polyline")                                                                             \
    X(CLSID_DataType_BSplinePolyline, "BSplinePolyline")                                                               \
    X(CLSID_DataType_CardinalSplinePolyline, "CardinalSplinePolyline")                                                 \
    X(CLSID_DataType_UniformBSplinePolyline, "UniformBSplinePolyline")                                                 \
    X(CLSID_DataType_ShapeTree, "ShapeTree")                                                                           \
    X(CLSID_DataType_Mesh, "Mesh")                                                                                     \
    X(CLSID_DataType_3D, "DataType3D")                                                                                 \
    X(CLSID_DataType_MtlGraph3D, "MtlGraph3D")                                                                         \
    X(CLSID_DataType_TransformMatrix, "TransformMatrix")                                                               \
    X(CLSID_DataType_ScriptVal, "ScriptVal")                                                                           \
    X(CLSID_DataType_Audio, "Audio")                                                                                   \
    X(CLSID_InputControl_Slider, "SliderControl")                                                                      \
    X(CLSID_InputControl_Screw, "ScrewControl")                                                                        \
    X(CLSID_InputControl_Checkbox, "CheckboxControl")                                                                  \
    X(CLSID_InputControl_Button, "ButtonControl")                                                                      \
    X(CLSID_InputControl_Combo, "ComboControl")                                                                        \
    X(CLSID_InputControl_ComboID, "ComboIDControl")                                                                    \
    X(CLSID_InputControl_MultiButton, "MultiButtonControl")                                                            \
    X(CLSID_InputControl_MultiButtonID, "MultiButtonIDControl")                                                        \
    X(CLSID_InputControl_CheckList, "CheckListControl")                                                                \
    X(CLSID_InputControl_Range, "RangeControl")                                                                        \
    X(CLSID_InputControl_Color, "ColorControl")                                                                        \
    X(CLSID_InputControl_ColorWheel, "ColorWheelControl")                                                              \
    X(CLSID_InputControl_ColorRanges, "ColorRangesControl")                                                            \
    X(CLSID_InputControl_ColorSuppression, "ColorSuppressionControl")                                                  \
    X(CLSID_InputControl_Levels, "LevelsControl")                                                                      \
    X(CLSID_InputControl_LevelsOutput, "LevelsOutputControl")                                                          \
    X(CLSID_InputControl_Histogram, "HistogramControl")                                                                \
    X(CLSID_InputControl_Spline, "SplineControl")                                                                      \
    X(CLSID_InputControl_Gradient, "GradientControl")                                                                  \
    X(CLSID_InputControl_Offset, "OffsetControl")                                                                      \
    X(CLSID_InputControl_TextEdit, "TextEditControl")                                                                  \
    X(CLSID_InputControl_File, "FileControl")                                                                          \
    X(CLSID_InputControl_Clip, "ClipControl")                                                                          \
    X(CLSID_InputControl_Image, "ImageControl")                                                                        \
    X(CLSID_InputControl_Label, "LabelControl")                                                                        \
    X(CLSID_InputControl_Nest, "NestControl")                                                                          \
    X(CLSID_InputControl_Pattern, "PatternControl")                                                                    \
    X(CLSID_InputControl_CustomFilter, "CustomFilterControl")                                                          \
    X(CLSID_PreviewControl_Crosshair, "CrosshairControl")                                                              \
    X(CLSID_PreviewControl_Point, "PointControl")                                                                      \
    X(CLSID_PreviewControl_Angle, "AngleControl")                                                                      \
    X(CLSID_PreviewControl_Ellipse, "EllipseControl")                                                                  \
    X(CLSID_PreviewControl_Rectangle, "RectangleControl")                                                              \
    X(CLSID_PreviewControl_Crop, "CropControl")                                                                        \
    X(CLSID_PreviewControl_Transform, "TransformControl")                                                              \
    X(CLSID_PreviewControl_Positioner, "PositionerControl")                                                            \
    X(CLSID_PreviewControl_Polyline, "PolylineControl")                                                                \
    X(CLSID_PreviewControl_Mesh, "MeshControl")                                                                        \
    X(CLSID_PreviewControl_Tracker, "TrackerControl")                                                                  \
    X(CLSID_LUT_Bezier, "BezierLUT")                                                                                   \
    X(CLSID_LUT_Cubic, "CubicLUT")                                                                                     \
    X(CLSID_Spline_Bezier, "BezierSpline")                                                                             \
    X(CLSID_Object, "Object")                                                                                          \
    X(CLSID_Operator, "Operator")                                                                                      \
    X(CLSID_ThreadedOperator, "ThreadedOperator")                                                                      \
    X(CLSID_SourceOperator, "SourceOperator")                                                                          \
    X(CLSID_MaskOperator, "MaskOperator")                                                                              \
    X(CLSID_ShapeOperator, "ShapeOperator")                                                                            \
    X(CLSID_Parameter, "Parameter")                                                                                    \
    X(CLSID_ImageFormat, "ImageFormat")                                                                                \
    X(CLSID_SubInputs, "SubInputs")                                                                                    \
    X(CLSID_PreviewControlBase, "PreviewControl")                                                                      \
    X(CLSID_ZQImageTransition, "ZQImageTransition")                                                                    \
    X(CLSID_Mask_Bitmap, "BitmapMask")                                                                                 \
    X(CLSID_Mask_Ellipse, "EllipseMask")                                                                               \
    X(CLSID_Mask_BSpline, "BSplineMask")                                                                               \
    X(CLSID_Mask_Polyline, "PolylineMask")                                                                             \
    X(CLSID_Mask_MultiPoly, "MultiPolyMask")                                                                           \
    X(CLSID_Mask_Rectangle, "RectangleMask")                                                                           \
    X(CLSID_Mask_Triangle, "TriangleMask")                                                                             \
    X(CLSID_Mask_Wand, "WandMask")                                                                                     \
    X(CLSID_Operator_UltraKeyer, "UltraKeyer")                                                                         \
    X(ClippingMode_None, "ClippingMode_None")                                                                          \
    X(ClippingMode_Domain, "ClippingMode_Domain")                                                                      \
    X(ClippingMode_Frame, "ClippingMode_Frame")

#define ORVANE_DECLARE_ID(name, text) ORVANE_API extern const OvID name;
ORVANE_CLASS_IDS(ORVANE_DECLARE_ID)
#undef ORVANE_DECLARE_ID

/// True for the data types that carry pixels (images and masks).
inline bool IsImageDataType(OvID type) { return type == CLSID_DataType_Image || type == CLSID_DataType_Mask; }

} // namespace Orvane
