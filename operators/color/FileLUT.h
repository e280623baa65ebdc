#pragma once
// FileLUT: applies a lookup table read from a file: 1D or 3D tables in the
// .cube, .3dl, .spi1d, .spi3d, .csp (and the other formats colour
// management reads), forward or inverted, with a choice of interpolation
// between the table's points. A relative file name is taken from the
// document's folder. No file named: the input is handed on; a file that
// cannot be read: the tool's console line naming it, and a null output.
//
// Thread safety: as ColorProcessorTool.
#include "operators/color/ColorProcessorTool.h"

namespace Orvane {

class FileLUT : public ColorProcessorTool {
public:
    FileLUT(const Registry *reg, const ScriptVal &args, const TagList &tags);
    size_t SizeOf() const override { return sizeof(*this); }

protected:
    ColorProcessorPtr ProcessorFor(Request *req, bool *passThrough, std::string *error) override;

private:
    Input *file_, *interpolation_, *direction_;
};

} // namespace Orvane
