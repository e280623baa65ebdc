#include "operators/color/FileLUT.h"

#include <cmath>
#include <filesystem>
#include <system_error>

#include "host/core/Tags.h"
#include "host/flow/DataTypes.h"
#include "host/flow/OrvaneDoc.h"
#include "host/flow/Parameter.h"
#include "host/flow/Request.h"
#include "operators/frame/Registration.h"

namespace Orvane {

static const OvID CLSID_FileLUT("FileLUT");
static ClassRegistration<FileLUT, ThreadedOperator> s_Registration(CLSID_FileLUT, &CLSID_ThreadedOperator,
                                                                   {{RegTypeFlags, RegKindOperator | RegKindTool},
                                                                    {RegPath, "Tools/Color/FileLUT"},
                                                                    {RegName, "File LUT"},
                                                                    {RegCategory, "Color"},
                                                                    {RegAbbreviation, "FLUT"},
                                                                    {RegHelp, "Applies a lookup table from a file"},
                                                                    {RegIcon, "Icons.Tools.Icons.FileLUT"},
                                                                    {RegNoMotionBlurControls, 1},
                                                                    {RegSupportsRoI, 1},
                                                                    {RegProcessesCanvasColor, 1},
                                                                    {RegSupportsDoD, 1},
                                                                    {RegSupportsGPUImages, 1}});

FileLUT::FileLUT(const Registry *reg, const ScriptVal &args, const TagList &tags)
    : ColorProcessorTool(reg, args, tags) {
    file_ = AddInputTagList("LUT File", "LUTFile",
                            {{LinkDataType, CLSID_DataType_Text}, {InputControl, CLSID_InputControl_File}});
    // The numbers are those of LUTInterpolation.
    interpolation_ = AddInputTagList("Interpolation", "Interpolation",
                                     {{LinkDataType, CLSID_DataType_Number},
                                      {InputControl, CLSID_InputControl_Combo},
                                      {InputInteger, 1},
                                      {InputMinAllowed, 0.0},
                                      {InputMaxAllowed, 3.0},
                                      {InputDefault, 0.0},
                                      {ListAddItem, "File's Own"},
                                      {ListAddItem, "Linear"},
                                      {ListAddItem, "Tetrahedral"},
                                      {ListAddItem, "Best"}});
    direction_ = AddInputTagList("Direction", "Direction",
                                 {{LinkDataType, CLSID_DataType_Number},
                                  {InputControl, CLSID_InputControl_Combo},
                                  {InputInteger, 1},
                                  {InputMinAllowed, 0.0},
                                  {InputMaxAllowed, 1.0},
                                  {InputDefault, 0.0},
                                  {ListAddItem, "Forward"},
                                  {ListAddItem, "Inverse"}});
    AddImageLinks();
}

ColorProcessorPtr FileLUT::ProcessorFor(Request *req, bool *passThrough, std::string *error) {
    const auto *name = dynamic_cast<const Text *>(req->GetInputData(file_));
    if (!name || name->value.empty()) {
        *passThrough = true;
        return nullptr;
    }
    const std::string path = GetDoc() ? GetDoc()->MapPath(name->value) : name->value;
    const auto interp = static_cast<LUTInterpolation>(std::lround(req->GetInputNumber(interpolation_)));
    const bool inverse = req->GetInputNumber(direction_) >= 0.5;
    // The file's time of change is part of the key, so that a table written
    // again is read again.
    std::error_code ec;
    const auto changed = std::filesystem::last_write_time(path, ec).time_since_epoch().count();
    const std::string key = path + '\n' + std::to_string(static_cast<int>(interp)) + (inverse ? "i" : "f") +
                            std::to_string(ec ? 0 : changed);
    return Kept(
        key, [&](std::string *err) { return ColorConfig::FileProcessor(path, interp, inverse, err); }, error);
}

} // namespace Orvane
