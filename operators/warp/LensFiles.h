#pragma once
// Readers of the two lens distortion file formats. Neither knows a lens model: the ".data" reader resolves
// names against a parameter list the caller gives and hands the values to the caller's setter; the ".pfb"
// reader returns the file's fields and its table, which PfBarrelSettingsAt() turns into barrel settings.
//
// ".data": a text stream of entries, each a parameter's name and then its value. Lines end in LF or CR LF;
// runs of spaces and tabs count as one space and both ends of a line are trimmed; blank lines and lines
// starting with '#' are skipped. An entry is either
//   * a line holding exactly a parameter's name, and the next non-blank line holding its value, or
//   * one line "NAME VALUE": the text before the line's last space is the name, the rest the value (so a
//     one-line text value has no spaces; a text value with spaces takes the two-line form).
// Values: double and integer in the C locale ("-1.5e-3"; a leading '+' is allowed; no NaN or infinity, an
// integer has no fraction), boolean "0", "1", "true" or "false", text as it stands. A later entry of a name
// replaces an earlier one. The whole stream is read before anything is set, so a bad file sets nothing.
//
// ".pfb": lines, each trimmed as above; blank lines are skipped.
//   1. "#PFBarrel 2011 v1" or "#PFBarrel 2011 v2"
//   2. two integers: the width and height in pixels of the images the lens was solved on
//   3. version 2 only: the pixel aspect those images had (version 1: 1.0)
//   4. two integers: the first and last frame the table covers
//   5. "Low Order" (c3 only: the model's high order is set to 0) or "High Order" (c3 and c5)
//   6. the anamorphic squeeze
//   7. one row per frame, first to last: c3, c5, lens centre x, lens centre y (fractions of the width and
//      height) and the squeeze again, separated by spaces, tabs or commas.
// Every number is checked (finite; sizes, aspect and squeeze positive; a row's squeeze equal to line 6's);
// a missing line or row, a short row, or text after the table is an error.
//
// Both readers bound what they take in: a line longer than MaxLineLength, more than MaxDataEntries entries or
// more than MaxTableRows rows is an error, so no file makes them hang or grow without limit.
//
// Errors are exceptions derived from lensfiles::Error, whose texts are meant for the user as they stand. They are
// kept apart from the lens model kit's error classes; the lens tool (not built yet) is to map them onto its own
// reports (the ".data" ones match the kit's error kinds).
//
// Thread safety: the functions keep no state; each call uses only its arguments.
#include <cstddef>
#include <filesystem>
#include <functional>
#include <iosfwd>
#include <span>
#include <stdexcept>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "operators/warp/ModelPf.h"

namespace Orvane::lensfiles {

inline constexpr std::size_t MaxLineLength = 4096;
inline constexpr std::size_t MaxDataEntries = 4096;
inline constexpr std::size_t MaxTableRows = 100000;

// ---- errors ----------------------------------------------------------------------------------------------

struct Error : std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// A name the parameter list does not hold. The text is fixed; name() and line() say which.
class UndefinedParameter : public Error {
public:
    UndefinedParameter(std::string name, int line);
    const std::string &name() const { return name_; }
    int line() const { return line_; }

private:
    std::string name_;
    int line_;
};

/// A value that does not read as its parameter's type, or a name with no value after it.
struct CouldNotReadValue : Error {
    explicit CouldNotReadValue(std::string_view name);
};

/// An entry whose index lies beyond the parameter list.
struct IndexOutOfRange : Error {
    IndexOutOfRange(std::size_t index, std::size_t count);
};

/// Any other file fault: a file that can't be opened, an over-long line, a malformed ".pfb".
struct ParseError : Error {
    using Error::Error;
};

// ---- ".data" ---------------------------------------------------------------------------------------------

enum class ParameterType { Bool, Int, Double, Text };

struct ParameterInfo {
    std::string name;
    ParameterType type = ParameterType::Double;
};

/// One value; the alternative follows ParameterType's order.
using ParameterValue = std::variant<bool, int, double, std::string>;

struct DataEntry {
    std::size_t index = 0; ///< into the parameter list
    ParameterValue value;
};

using ParameterSetter = std::function<void(std::size_t index, const ParameterValue &value)>;

/// The stream's entries in file order, resolved against `params`.
std::vector<DataEntry> ReadDataEntries(std::istream &in, std::span<const ParameterInfo> params);

/// Checks every entry (index within the list, value of the parameter's type), then calls `set` for each.
void ApplyDataEntries(std::span<const DataEntry> entries, std::span<const ParameterInfo> params,
                      const ParameterSetter &set);

/// Reads a stream, or a file ("failed to open file" when it can't be opened), and applies its entries.
void ReadData(std::istream &in, std::span<const ParameterInfo> params, const ParameterSetter &set);
void ReadDataFile(const std::filesystem::path &path, std::span<const ParameterInfo> params, const ParameterSetter &set);

/// The barrel model's parameters as a list, and a setter writing them into `s`.
std::vector<ParameterInfo> PfBarrelParameters();
ParameterSetter PfBarrelSetter(PfBarrelSettings &s);

// ---- ".pfb" ----------------------------------------------------------------------------------------------

enum class PfbOrder { Low, High };

struct PfbRow {
    double lowOrder = 0.0, highOrder = 0.0, centerX = 0.5, centerY = 0.5, squeeze = 1.0;
};

struct PfbFile {
    int version = 1;
    int width = 0, height = 0;
    double pixelAspect = 1.0;
    int firstFrame = 0, lastFrame = 0;
    PfbOrder order = PfbOrder::Low;
    double squeeze = 1.0;
    std::vector<PfbRow> rows; ///< one per frame, first to last
};

PfbFile ReadPfb(std::istream &in);
PfbFile ReadPfbFile(const std::filesystem::path &path);

/// The settings of `frame` (clamped to the table) for an image width x height. A low-order file gives a
/// high order of 0.
PfBarrelSettings PfBarrelSettingsAt(const PfbFile &file, int frame, int width, int height);

} // namespace Orvane::lensfiles
