#pragma once
// The named tags of the host's vocabulary: registry rows, links, inputs,
// controls, control kinds, image creation and whole-image work. Every tag
// number the host or a tool passes has a name here.
#include "host/core/TagList.h"

namespace Orvane {

// ---- Registry rows -------------------------------------------------------
constexpr Tag RegConstructor = 0x60000000;
constexpr Tag RegInitFunc = 0x60000001;
constexpr Tag RegCleanupFunc = 0x60000002;
constexpr Tag RegScriptInfo = 0x60000005;
constexpr Tag RegOutputDesc = 0x60000009;
constexpr Tag RegInputDesc = 0x6000000a;
constexpr Tag RegBaseClass = 0x60000010;
constexpr Tag RegSubInputsCreate = 0x60000014;
constexpr Tag RegTypeFlags = 0x10000000;
constexpr Tag RegApiVersion = 0x1000271f;
constexpr Tag RegName = 0x30000002;
constexpr Tag RegCategory = 0x30000003;
constexpr Tag RegAbbreviation = 0x30000004;
constexpr Tag RegHelp = 0x30000005;
constexpr Tag RegMaskName = 0x30000006;
constexpr Tag RegBuildNote = 0x30000008;
constexpr Tag RegVendorName = 0x30000009;
constexpr Tag RegVendorHome = 0x3000000a;
constexpr Tag RegPath = 0x3000000c;
constexpr Tag RegIcon = 0x30000010;
constexpr Tag RegClassName = 0x30000015;
constexpr Tag RegTemplateName = 0x30000016;
constexpr Tag RegFormatName = 0x30000064;
constexpr Tag RegFormatExtension = 0x38000064;
constexpr Tag RegAlias = 0x38000000;
constexpr Tag RegOldClassId = 0x88000000;
constexpr Tag RegOutputType = 0x80000001;
constexpr Tag RegOutputType2 = 0x80000002;
constexpr Tag RegInputType = 0x80000004;

/// The tag vocabulary version every row carries.
constexpr long long RegApiVersionCurrent = 7;

// RegTypeFlags bits (low byte: what the class does; high half: family).
constexpr uint32_t RegKindOperator = 1;
constexpr uint32_t RegKindTool = 2;
constexpr uint32_t RegKindModifier = 4;
constexpr uint32_t RegKindSource = 8;
constexpr uint32_t RegKindTerminal = 16;
constexpr uint32_t RegKindMask = 32;
constexpr uint32_t RegKindTwoImage = 128;
constexpr uint32_t RegKindVariableInputs = 256;
constexpr uint32_t RegKindSubInputs = 1024;
constexpr uint32_t RegKind3D = 2048;
constexpr uint32_t RegFamilyTransition = 0x000f0000;
constexpr uint32_t RegFamilyDataType = 0x00170000;
constexpr uint32_t RegFamilyImageFormat = 0x00180000;
constexpr uint32_t RegFamilyPreviewControl = 0x001b0000;
constexpr uint32_t RegFamilyMaterial = 0x00470000;
constexpr uint32_t RegFamilyShape = 0x00560000;
constexpr uint32_t RegFamilyMask = 0xffff0000;

// Yes-or-no class attributes.
constexpr Tag RegNoBlendControls = 0x10000003;
constexpr Tag RegNoEffectMask = 0x10000017;
constexpr Tag RegNoObjectMaterialControls = 0x10000018;
constexpr Tag RegNoMotionBlurControls = 0x10000019;
constexpr Tag RegHidden = 0x1000000c;
constexpr Tag RegOptionalClass = 0x1000000d;
constexpr Tag RegHasOperatorControl = 0x1000000f;
constexpr Tag RegSourceRangeControls = 0x10000012;
constexpr Tag RegSourceSizeControls = 0x10000013;
constexpr Tag RegSourceAspectControls = 0x10000014;
constexpr Tag RegSourceDepthControls = 0x10000028;
constexpr Tag RegNoAutoProxy = 0x10000015;
constexpr Tag RegSortOrder = 0x10000016;
constexpr Tag RegNoCache = 0x1000002e;
constexpr Tag RegUnpredictable = 0x1000002f;
constexpr Tag RegSupportsRoI = 0x10000036;
constexpr Tag RegProcessesCanvasColor = 0x1000003d;
constexpr Tag RegSupportsDoD = 0x1000003e;
constexpr Tag RegStereoAware = 0x1000003f;
constexpr Tag RegSwitchClass = 0x10000040;
constexpr Tag RegSwitchDataKind = 0x10000041;
constexpr Tag RegSupportsGPUImages = 0x10000058;
constexpr Tag RegGroupPrimatte = 0x1000005a;
constexpr Tag RegGroupMedia = 0x1000005b;
// Further attributes the library sets and the host reads.
constexpr Tag RegKeepsTimeState = 0x1000005d;
constexpr Tag RegPreviewTerminal = 0x10000030;
constexpr Tag RegClipSourceTool = 0x10000039;
constexpr Tag RegMaskMultiPart = 0x10002710;
constexpr Tag RegOwnCacheValidity = 0x10002720;
constexpr Tag RegMaskHasPolygon = 0x10002711;
constexpr Tag RegMaskHasSize = 0x10002714;
constexpr Tag RegShapeGenFilled = 0x10002716;
constexpr Tag RegShapeGenOutline = 0x10002717;
constexpr Tag RegShapeGenTransform = 0x10002719;
constexpr Tag RegShapeGenStyle = 0x1000271a;
/// The library names this class but does not build it yet: it constructs,
/// and every request it gets fails with a line saying so.
constexpr Tag RegPlanned = 0x10007fff;
// Image format capabilities.
constexpr Tag RegFormatCanLoad = 0x10000064;
constexpr Tag RegFormatCanSave = 0x10000065;
constexpr Tag RegFormatHeaderOnly = 0x10000069;
constexpr Tag RegFormatHasOptions = 0x1000006f;
constexpr Tag RegFormatHasSaveOptions = 0x10000070;
constexpr Tag RegFormatMultiPart = 0x10000077;
constexpr Tag RegFormatOneChannel = 0x10000079;
constexpr Tag RegFormatKeepsAspect = 0x1000007a;
constexpr Tag RegFormatHasDomain = 0x1000007b;
constexpr Tag RegFormatLosslessOnly = 0x100000ca;

// ---- Links --------------------------------------------------------------
constexpr Tag LinkDataType = 0x88020000;
constexpr Tag LinkSecondDataType = 0x88020001;
constexpr Tag LinkMain = 0x10020001;
constexpr Tag LinkForceSave = 0x10020002;
constexpr Tag LinkNotSaved = 0x10020003;

// ---- Inputs -------------------------------------------------------------
constexpr Tag InputControl = 0x80030000;
constexpr Tag PreviewControl = 0x80030001;
constexpr Tag InputSplineClass = 0x80030002;
constexpr Tag InputDefaultId = 0x80030003;
constexpr Tag InputMinAllowed = 0x20030000;
constexpr Tag InputMaxAllowed = 0x20030001;
constexpr Tag InputSliderLow = 0x20030002;
constexpr Tag InputSliderHigh = 0x20030003;
constexpr Tag InputDefault = 0x20030004;
constexpr Tag InputDefaultX = 0x20030005;
constexpr Tag InputDefaultY = 0x20030006;
constexpr Tag InputDefaultText = 0x30030003;
constexpr Tag InputExternal = 0x10030000;
constexpr Tag InputRequired = 0x10030002;
constexpr Tag InputPriority = 0x10030004;
constexpr Tag InputSendRequest = 0x10030005;
constexpr Tag ControlGroup = 0x10030006;
constexpr Tag ControlMember = 0x10030007;
constexpr Tag PreviewGroup = 0x10030008;
constexpr Tag PreviewMember = 0x10030009;
constexpr Tag InputNotify = 0x1003000a;
constexpr Tag InputInitialNotify = 0x1003000b;
constexpr Tag InputInteger = 0x1003000c;
constexpr Tag InputPassive = 0x10030010;
constexpr Tag ColorChannel = 0x10030011;
constexpr Tag InputDelayDefault = 0x10030012;
constexpr Tag ImageFromRequestOK = 0x1003001a;
constexpr Tag ImageBackground = 0x1003001e;
constexpr Tag ImageForeground = 0x10030027;
// Rarely used input tags that tools pass as they stand.
constexpr Tag InputFlag03 = 0x10030003;
constexpr Tag InputFlag0D = 0x1003000d;
constexpr Tag InputFlag0E = 0x1003000e;
constexpr Tag InputFlag0F = 0x1003000f;
constexpr Tag InputFlag13 = 0x10030013;
constexpr Tag InputFlag14 = 0x10030014;
constexpr Tag InputFlag17 = 0x10030017;
constexpr Tag InputFlag1B = 0x1003001b;
constexpr Tag InputFlag1D = 0x1003001d;
constexpr Tag InputFlag20 = 0x10030020;
constexpr Tag InputFlag21 = 0x10030021;

/// Channel numbers of ColorChannel.
constexpr int ColorChannelRed = 6, ColorChannelGreen = 7, ColorChannelBlue = 8, ColorChannelAlpha = 9;
/// Fetch priorities.
constexpr int PriorityMask = -1000, PriorityImage = -1, PriorityDefault = 0, PriorityLast = 1999;

// ---- Controls -----------------------------------------------------------
constexpr Tag ControlLabel = 0x30040000;
constexpr Tag ControlRowLabel = 0x30040001;
constexpr Tag SliderSteps = 0x10040003;
constexpr Tag ControlDecimals = 0x10040004;
constexpr Tag ControlPage = 0x10040005;
constexpr Tag ControlShowsTime = 0x10040006;
constexpr Tag SliderSnap = 0x10040007;
constexpr Tag ControlVisible = 0x10040008;
constexpr Tag SliderRest = 0x20040006;
constexpr Tag ControlWidth = 0x20040007;
constexpr Tag ListAddItem = 0x38040000;
constexpr Tag ListItemId = 0x88030000;
/// An ID a list input takes besides its entries, without a button of its own:
/// the setting of an older document, an ID scripts may set.
constexpr Tag ListAcceptedId = 0x88030001;
constexpr Tag PageIcon = 0x60000004;
constexpr Tag ControlFlag0E = 0x1004000e;
constexpr Tag ControlFlag0F = 0x1004000f;
constexpr Tag ControlFlag10 = 0x10040010;
constexpr Tag ControlFlag8000 = 0x10048000;
constexpr Tag ControlFlag8001 = 0x10048001;

// ---- Control kinds ------------------------------------------------------
constexpr Tag ButtonsFillRow = 0x1005000c;
constexpr Tag ButtonLook02 = 0x10050002;
constexpr Tag ButtonLook04 = 0x10050004;
constexpr Tag ButtonLook08 = 0x10050008;
constexpr Tag ButtonLook11 = 0x10050011;
constexpr Tag ButtonIconOff = 0x68050001;
constexpr Tag ButtonIconOn = 0x68050003;
constexpr Tag ButtonIcon = 0x68050005;
constexpr Tag ControlKindValue = 0x10050000;
/// TextEdit: the language of its text ("lua"), for the editor's highlighting.
constexpr Tag TextEditLanguage = 0x30050003;
constexpr Tag SliderLowLabel = 0x30050000;
constexpr Tag SliderHighLabel = 0x30050002;
constexpr Tag OffsetXLabel = 0x30050000;
constexpr Tag OffsetYLabel = 0x30050001;
constexpr Tag PreviewInputFirst = 0x60058000;
/// The n-th companion input of a preview is at PreviewInputFirst + n.
constexpr int PreviewInputCount = 16;
// What a tool changes on the previews and Offset controls of its inputs at run time.
constexpr Tag PreviewShown = ControlFlag8001; ///< a preview of a group is drawn
constexpr Tag PreviewOffsetX = 0x20048000;    ///< the preview's origin moves by this (normalised units)
constexpr Tag PreviewOffsetY = 0x20048001;
constexpr Tag OffsetDisplayScaleX = 0x20050002; ///< an Offset control shows its value times this
constexpr Tag OffsetDisplayScaleY = 0x20050003;
constexpr Tag RectanglePreviewAspect = 0x20058003; ///< height over width of a Rectangle preview

// ---- Image creation (NewImageTagList) -----------------------------------
constexpr Tag ImgLikeImage = 0x60020000;
constexpr Tag ImgDocument = 0x60020001;
constexpr Tag ImgDataWindow = 0x60020006;
constexpr Tag ImgValidWindow = 0x60020007;
constexpr Tag ImgWidth = 0x10020000;
constexpr Tag ImgHeight = 0x10020001;
constexpr Tag ImgDepth = 0x10020002;
constexpr Tag ImgNoData = 0x1002000a;
constexpr Tag ImgXScale = 0x20000000;
constexpr Tag ImgYScale = 0x20000001;
constexpr Tag ImgKeepAttrs = 0x10020008;
constexpr Tag ImgForRequest = 0x10020009;
constexpr Tag ImgSameKind = 0x10020015;
constexpr Tag ImgTakeWindows = 0x10020017;
// Generator tags 0x1002000b and 0x1002000c: the proxy scale and quick mode of
// the request that made the image.
constexpr Tag ImgProxyScale = 0x1002000b;
constexpr Tag ImgQuickMode = 0x1002000c;
// Image attributes (also accepted at creation): the full-resolution format of
// an image that is a proxy or one field of a frame.
constexpr Tag ImgFullWidth = 0x1002000d;
constexpr Tag ImgFullHeight = 0x1002000e;
constexpr Tag ImgField = 0x1002000f; ///< field number; -1 for a whole frame
constexpr Tag ImgFullXScale = 0x20000005;
constexpr Tag ImgFullYScale = 0x20000006;
constexpr Tag ImgFieldOffset = 0x20000007; ///< Y offset of a field, in image heights
constexpr Tag ImgTimeCode = 0x10020012;    ///< time code of the frame
constexpr Tag ImgCanvasColor = 0x60020008;
constexpr Tag ImgAbortFlag = 0x60020009;

/// A channel the image holds (repeated; the value is the channel's slot).
constexpr Tag ImgChannel = 0x18020000;

// ---- Frame requests to clips and formats ----------------------------------
constexpr Tag ClipFrameField = 0x100000cc;        ///< field number, -1 for a whole frame
constexpr Tag ClipFrameProxyScale = 0x100000cd;   ///< divisor of width and height
constexpr Tag ClipFrameQuickProxy = 0x10000065;   ///< a quick request at proxy scale
constexpr Tag ClipFrameAbort = 0x60000064;        ///< const std::atomic<bool> *: the render's abort word
constexpr Tag ClipFrameUseAlternate = 0x10000002; ///< read the clip's alternate (proxy) file
constexpr Tag ClipFrameHeaderOnly = 0x10000069;   ///< pre-calculation: header data only
constexpr Tag ClipFrameRegion = 0x600000c9;       ///< const ImageDomain *: the region to decode
constexpr Tag ClipFrameCachePath = 0x30000000;    ///< local cache path
constexpr Tag ClipFrameUseLocalCache = 0x10000003;
constexpr Tag ClipFrameMakeFolders = 0x100000d0; ///< writing: make missing folders of the path
// ---- Clip attributes (Clip::SetAttrsTagList, GetAttrL / GetAttrD) ---------
constexpr Tag ClipStart = 0x20020000;   ///< first global frame of the clip
constexpr Tag ClipEnd = 0x20020001;     ///< last global frame of the clip
constexpr Tag ClipAspectX = 0x20020003; ///< pixel aspect the file reports
constexpr Tag ClipAspectY = 0x20020004;
constexpr Tag ClipInitialFrame = 0x20020005; ///< sequence number of the first file, -1 for none
constexpr Tag ClipWidth = 0x10020000;        ///< frame size
constexpr Tag ClipHeight = 0x10020001;
constexpr Tag ClipLength = 0x10020002;       ///< number of frames
constexpr Tag ClipIsMultiFrame = 0x10020003; ///< one file holds every frame
constexpr Tag ClipSaving = 0x10020004;       ///< open for writing
constexpr Tag ClipIsPreviewSaver = 0x10020005;
constexpr Tag ClipTrimIn = 0x10020006;      ///< first file frame used, from 0
constexpr Tag ClipTrimOut = 0x10020007;     ///< last file frame used
constexpr Tag ClipExtendFirst = 0x10020008; ///< frames holding the first frame
constexpr Tag ClipExtendLast = 0x10020009;  ///< frames holding the last frame
constexpr Tag ClipNoLoop = 0x1002000a;      ///< set when the clip does NOT loop (saved data relies on it)
constexpr Tag ClipReverse = 0x1002000b;
constexpr Tag ClipImportMode = 0x1002000c; ///< 0 normal, 1 2:3 pull-up, 2 2:3 pull-down
constexpr Tag ClipAspectMode = 0x1002000e; ///< 0 from file, 1 default, 2 custom
constexpr Tag ClipPullOffset = 0x1002000f; ///< position in the 2:3 cadence, 0..4
constexpr Tag ClipIsLinear = 0x10020010;   ///< the file needs no linear conversion
constexpr Tag ClipNoAlpha = 0x10020011;    ///< the file has no alpha: make it solid
constexpr Tag ClipTimeCode = 0x10020012;
constexpr Tag ClipPullType = 0x10020013;   ///< cadence row: 0 standard, 1 advanced
constexpr Tag ClipFormatAttr = 0x60020001; ///< ImageFormat *: the format in use
constexpr Tag ClipOwner = 0x60020008;      ///< the tool a saved clip belongs to

/// A format attribute: the Raw format restores the image's saved tags.
constexpr Tag FormatRestoreTags = 0x1000012c;
/// A format attribute: the eye a multi-view file is read for, 0 left, 1 right.
constexpr Tag FormatStereoEye = 0x1000012d;

// ---- Whole-image work ---------------------------------------------------
constexpr Tag WorkOperator = 0x60010000;
constexpr Tag WorkRequest = 0x60010001;
constexpr Tag WorkThreaded = 0x10010000;
constexpr Tag WorkUseGPU = 0x10010002;
constexpr Tag MtxColorMatrix = 0x60030000;
constexpr Tag MtxColorMatrixFull = 0x60030001;

// ---- The blur request (Image::BlurTagList, BlurOfImageTagList) -------------
constexpr Tag BlurFilterType = 0x10000000; ///< BlurTypes value
constexpr Tag BlurDoRed = 0x10000001;
constexpr Tag BlurDoGreen = 0x10000002;
constexpr Tag BlurDoBlue = 0x10000003;
constexpr Tag BlurDoAlpha = 0x10000004;
constexpr Tag BlurPasses = 0x10000006;
constexpr Tag BlurXSize = 0x20000000; ///< normalised: control value / 720
constexpr Tag BlurYSize = 0x20000001;
constexpr Tag BlurBlend = 0x20000002;
constexpr Tag BlurScale = 0x20000003;
constexpr Tag BlurRedScale = 0x20000004;
constexpr Tag BlurGreenScale = 0x20000005;
constexpr Tag BlurBlueScale = 0x20000006;
constexpr Tag BlurAlphaScale = 0x20000007;
constexpr Tag BlurSourceWindow = 0x60000002; ///< const ImgRectI *

// ---- The resize request (Image::ResizePreCalcTagList, ResizeTagList) -------
constexpr Tag ResizeFilter = 0x10000003; ///< RszTypes value
constexpr Tag ResizeWindow = 0x10000004; ///< ResizeWindowType value (window method + 100)
constexpr Tag ResizeXEdges = 0x10000005; ///< EdgeMode
constexpr Tag ResizeYEdges = 0x10000006;
constexpr Tag ResizeXScale = 0x20000000; ///< output pixels per source pixel
constexpr Tag ResizeYScale = 0x20000001;
constexpr Tag ResizeXOffset = 0x20000002; ///< output pixels
constexpr Tag ResizeYOffset = 0x20000003;
constexpr Tag ResizeSourceWindow = 0x60000000; ///< const ImgRectI *

// ---- The transform request (TransformMatrix::ImageConcatenateTagList) ------
constexpr Tag XfCenterX = 0x20030000;
constexpr Tag XfCenterY = 0x20030001;
constexpr Tag XfPivotX = 0x20030003;
constexpr Tag XfPivotY = 0x20030004;
constexpr Tag XfXSize = 0x20030006;
constexpr Tag XfYSize = 0x20030007;
constexpr Tag XfAngle = 0x2003000b; ///< degrees, anticlockwise
constexpr Tag XfEdges = 0x10030000; ///< EdgeMode
constexpr Tag XfFlipX = 0x10030001;
constexpr Tag XfFlipY = 0x10030002;
constexpr Tag XfInvert = 0x10030004;
/// MergeConcatenateTagList: -1 blends the merged stack over the unmerged
/// background with the asking tool's own Blend (and effect mask).
constexpr Tag XfMergeToolBlend = 0x10030005;
constexpr Tag XfGPUEnabled = 0x10030008;
constexpr Tag XfFilter = 0x1003000b; ///< RszTypes value
constexpr Tag XfWindow = 0x1003000c; ///< ResizeWindowType value
constexpr Tag XfFlatten = 0x10030010;
constexpr Tag XfRequest = 0x60030003; ///< Request *

// ---- The merge request (MergeImagesTagList; formulas in docs/MERGE.md) ------
constexpr Tag MrgApplyMode = 0x10090000; ///< MergeApplyMode value
constexpr Tag MrgOperator = 0x10090001;  ///< MergeOperatorType value (Normal mode)
constexpr Tag MrgDoRed = 0x10090002;     ///< channels taken from the merge (off: the background's)
constexpr Tag MrgDoGreen = 0x10090003;
constexpr Tag MrgDoBlue = 0x10090004;
constexpr Tag MrgDoAlpha = 0x10090005;
constexpr Tag MrgZMerge = 0x10090006; ///< the nearer of the two wins where both carry Z
constexpr Tag MrgZLargerIsNearer = 0x10090007;
constexpr Tag MrgFgOffsetX = 0x10090008; ///< foreground pixel (i, j) lies at (i + x, j + y)
constexpr Tag MrgFgOffsetY = 0x10090009;
constexpr Tag MrgBlend = 0x20090000;    ///< 0 the background, 1 the full merge
constexpr Tag MrgAdditive = 0x20090001; ///< 0 subtractive (over), 1 additive
constexpr Tag MrgAlphaGain = 0x20090002;
constexpr Tag MrgBurnIn = 0x20090003;
/// const Matrix3 *: foreground output pixels to background output pixels
/// (TransformMatrix::MergeConcatenateTagList; the identity when absent).
constexpr Tag MrgPlacement = 0x60090000;

// ---- Shapes (Shape::FlattenOfShapeTagList, OutlineOfShapeTagList, ExpandOfShapeTagList) ----
constexpr Tag ShapeJoin = 0x100b0000; ///< ShapeJoinKind: 0 bevel, 1 miter, 2 round, 3 miter clip
constexpr Tag ShapeCap = 0x100b0001;  ///< ShapeCapKind: 0 flat, 1 square, 2 round
/// ShapeStyle::CanCombine: compare only what filling needs (the line may differ).
constexpr Tag ShapeCombineFillOnly = 0x100b0002;
constexpr Tag ShapeWriteStart = 0x200b0000; ///< write-on: fraction of the path length where the stroke starts
constexpr Tag ShapeWriteEnd = 0x200b0001;   ///< write-on: fraction where it ends
constexpr Tag ShapeTolerance = 0x200b0002;  ///< the longest step of a flattened curve or arc
constexpr Tag ShapeMiterLimit = 0x200b0003; ///< miter length over stroke width before a miter is cut

// ---- Masks (host/flow/MaskOperator.h) ------------------------------------
/// CreateMaskImage: const ImgRectI *, the pixel rectangle the mask's shape can
/// touch (absent: everywhere the mask may be needed).
constexpr Tag MaskRegion = 0x60060000;
/// CreateMaskImage: the mask's depth (1..4), instead of the tool's Depth control.
constexpr Tag MaskDepth = 0x10060000;
/// CreateMaskImage: pixels a soft edge reaches from the shape (a layer's own),
/// instead of the reach of the tool's SoftEdge.
constexpr Tag MaskReach = 0x10060001;
/// Request flag: the mask is asked for in the mask domain (the consumer reads
/// it over its own region). A finished mask records it in its metadata under
/// MaskDomainKey. Bit 5, where other hosts keep it, is ReqFlagNoGPU here.
constexpr uint32_t ReqFlagMaskDomain = 1u << 6;
constexpr const char *MaskDomainKey = "MaskDomain";

// ---- Matte levels (host/matte/MatteSteps.h: DoLevels, DoLevelsFlt) ---------
constexpr Tag MatteLevelsChannel = 0x100c0000;  ///< int: 0 red, 1 green, 2 blue, 3 alpha (default)
constexpr Tag MatteLevelsLow = 0x200c0000;      ///< low threshold over 0..1 (default 0)
constexpr Tag MatteLevelsHigh = 0x200c0001;     ///< high threshold over 0..1 (default 1)
constexpr Tag MatteLevelsContrast = 0x200c0002; ///< contract (< 0) / expand (> 0), -1..1 (default 0)
constexpr Tag MatteLevelsGamma = 0x200c0003;    ///< gamma > 0 (default 1)

// ---- Application attributes (GetApp()->GetAttrB) -------------------------
/// Rows use fast true powers rather than gamma tables.
constexpr Tag AppFastPower = 0x10010002;
/// Rows use the four-channel vector loops for RGBA float.
constexpr Tag AppVectorRows = 0x10010005;
/// Quick requests may resize with cheaper filters: the Loader's proxy
/// shrink takes the box filter, and the sizing tools with Only Use Filter in
/// HiQ on take nearest neighbour.
constexpr Tag AppFastScale = 0x10010006;

} // namespace Orvane
