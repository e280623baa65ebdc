#include "operators/warp/LensFiles.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <fstream>
#include <istream>
#include <optional>
#include <type_traits>

namespace Orvane::lensfiles {

UndefinedParameter::UndefinedParameter(std::string name, int line)
    : Error("ldpk::error: undefined parameter"), name_(std::move(name)), line_(line) {}

CouldNotReadValue::CouldNotReadValue(std::string_view name)
    : Error("ldpk::error: could not read value for parameter '" + std::string(name) + "'") {}

IndexOutOfRange::IndexOutOfRange(std::size_t index, std::size_t count)
    : Error("ldpk::error: index " + std::to_string(index) + " out of range, range [0, " +
            std::to_string(static_cast<long long>(count) - 1) + "]") {}

namespace {

bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\v' || c == '\f'; }

std::string_view Trim(std::string_view s) {
    while (!s.empty() && IsBlank(s.front())) s.remove_prefix(1);
    while (!s.empty() && IsBlank(s.back())) s.remove_suffix(1);
    return s;
}

/// Trimmed, with every run of blanks inside turned into one space.
std::string Normalise(std::string_view s) {
    std::string out;
    for (char c : Trim(s)) {
        if (!IsBlank(c))
            out.push_back(c);
        else if (out.back() != ' ')
            out.push_back(' ');
    }
    return out;
}

/// A line as it may appear in a message: control characters replaced, long text cut.
std::string Quote(std::string_view s) {
    constexpr std::size_t shown = 80;
    std::string out(s.substr(0, shown));
    for (char &c : out)
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) c = '?';
    if (s.size() > shown) out += "...";
    return out;
}

/// Lines of a stream, at most MaxLineLength bytes each, without their ends, a first line's UTF-8 byte order
/// mark or surrounding blanks. Blank lines, and with `comments` lines starting with '#', are passed over.
class LineReader {
public:
    LineReader(std::istream &in, bool comments) : buf_(in.rdbuf()), comments_(comments) {}

    bool Next(std::string &line) {
        while (ReadRaw(line)) {
            const std::string_view t = Trim(line);
            if (t.empty() || (comments_ && t.front() == '#')) continue;
            line = std::string(t);
            return true;
        }
        return false;
    }
    int Number() const { return number_; }

private:
    bool ReadRaw(std::string &line) {
        using Traits = std::char_traits<char>;
        line.clear();
        if (!buf_) return false;
        Traits::int_type c = buf_->sbumpc();
        if (Traits::eq_int_type(c, Traits::eof())) return false;
        ++number_;
        for (; !Traits::eq_int_type(c, Traits::eof()) && c != '\n'; c = buf_->sbumpc()) {
            if (line.size() == MaxLineLength)
                throw ParseError("parse error - line " + std::to_string(number_) + " is too long");
            line.push_back(Traits::to_char_type(c));
        }
        if (number_ == 1 && line.starts_with("\xEF\xBB\xBF")) line.erase(0, 3);
        return true;
    }

    std::streambuf *buf_;
    bool comments_;
    int number_ = 0;
};

/// Numbers in the C locale, the whole text taken: an optional '+' sign, no NaN or infinity.
template <typename T> std::optional<T> ParseNumber(std::string_view s) {
    if (s.size() > 1 && s.front() == '+' && s[1] != '-') s.remove_prefix(1);
    T v{};
    const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), v);
    if (ec != std::errc() || end != s.data() + s.size() || s.empty()) return std::nullopt;
    if constexpr (std::is_floating_point_v<T>)
        if (!std::isfinite(v)) return std::nullopt;
    return v;
}

std::optional<bool> ParseBool(std::string_view s) {
    std::string lower(s);
    std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    if (lower == "1" || lower == "true") return true;
    if (lower == "0" || lower == "false") return false;
    return std::nullopt;
}

ParameterValue ParseValue(std::string_view text, const ParameterInfo &param) {
    std::optional<ParameterValue> v;
    switch (param.type) {
    case ParameterType::Bool: v = ParseBool(text); break;
    case ParameterType::Int: v = ParseNumber<int>(text); break;
    case ParameterType::Double: v = ParseNumber<double>(text); break;
    case ParameterType::Text: v = std::string(text); break;
    }
    if (!v) throw CouldNotReadValue(param.name);
    return *v;
}

} // namespace

// ---- ".data" ---------------------------------------------------------------------------------------------

std::vector<DataEntry> ReadDataEntries(std::istream &in, std::span<const ParameterInfo> params) {
    std::vector<std::string> names;
    for (const ParameterInfo &p : params) names.push_back(Normalise(p.name));
    const auto find = [&](std::string_view name) -> std::optional<std::size_t> {
        const auto it = std::find(names.begin(), names.end(), name);
        if (it == names.end()) return std::nullopt;
        return static_cast<std::size_t>(it - names.begin());
    };

    LineReader lines(in, true);
    std::vector<DataEntry> entries;
    std::string line, valueLine;
    while (lines.Next(line)) {
        const std::string entry = Normalise(line);
        std::optional<std::size_t> index = find(entry);
        if (index) {
            // The name alone: the value is the next line, as it stands (a text may hold spaces).
            if (!lines.Next(valueLine)) throw CouldNotReadValue(params[*index].name);
        } else {
            const std::size_t space = entry.rfind(' ');
            if (space != std::string::npos) index = find(std::string_view(entry).substr(0, space));
            if (!index) throw UndefinedParameter(entry, lines.Number());
            valueLine = entry.substr(space + 1);
        }
        if (entries.size() == MaxDataEntries)
            throw ParseError("parse error - more than " + std::to_string(MaxDataEntries) + " entries");
        entries.push_back({*index, ParseValue(valueLine, params[*index])});
    }
    return entries;
}

void ApplyDataEntries(std::span<const DataEntry> entries, std::span<const ParameterInfo> params,
                      const ParameterSetter &set) {
    for (const DataEntry &e : entries) {
        if (e.index >= params.size()) throw IndexOutOfRange(e.index, params.size());
        if (e.value.index() != static_cast<std::size_t>(params[e.index].type))
            throw CouldNotReadValue(params[e.index].name);
    }
    for (const DataEntry &e : entries) set(e.index, e.value);
}

void ReadData(std::istream &in, std::span<const ParameterInfo> params, const ParameterSetter &set) {
    ApplyDataEntries(ReadDataEntries(in, params), params, set);
}

namespace {
/// A regular file opened for reading; devices and folders are refused, as they may never end or not read.
std::ifstream OpenRegular(const std::filesystem::path &path) {
    std::error_code ec;
    std::ifstream in;
    if (std::filesystem::is_regular_file(path, ec)) in.open(path, std::ios::binary);
    if (!in.is_open()) throw ParseError("failed to open file");
    return in;
}
} // namespace

void ReadDataFile(const std::filesystem::path &path, std::span<const ParameterInfo> params,
                  const ParameterSetter &set) {
    std::ifstream in = OpenRegular(path);
    ReadData(in, params, set);
}

std::vector<ParameterInfo> PfBarrelParameters() {
    std::vector<ParameterInfo> out;
    for (std::string_view name : PfBarrelParameterNames) out.push_back({std::string(name), ParameterType::Double});
    return out;
}

ParameterSetter PfBarrelSetter(PfBarrelSettings &s) {
    return [&s](std::size_t index, const ParameterValue &value) {
        double *const fields[] = {&s.lowOrder, &s.highOrder, &s.centerX, &s.centerY, &s.squeeze};
        static_assert(std::size(fields) == PfBarrelParameterNames.size());
        if (index >= std::size(fields)) throw IndexOutOfRange(index, std::size(fields));
        const double *v = std::get_if<double>(&value);
        if (!v) throw CouldNotReadValue(PfBarrelParameterNames[index]);
        *fields[index] = *v;
    };
}

// ---- ".pfb" ----------------------------------------------------------------------------------------------

namespace {

[[noreturn]] void Fail(std::string_view what, std::string_view line) {
    throw ParseError("parse error - " + std::string(what) + " - \"" + Quote(line) + "\"");
}

/// The next line of a ".pfb" (whitespace runs made one space); a missing one is an error.
std::string NextPfbLine(LineReader &lines) {
    std::string line;
    if (!lines.Next(line)) throw ParseError("parse error - unexpected end of file");
    return Normalise(line);
}

/// The line's fields, separated by spaces or commas, as `count` numbers; nothing if they aren't.
template <typename T, std::size_t N> std::optional<std::array<T, N>> Fields(std::string_view line) {
    std::array<T, N> out{};
    std::size_t n = 0;
    while (!line.empty()) {
        const std::size_t end = std::min(line.find_first_of(" ,"), line.size());
        if (end > 0) {
            const std::optional<T> v = ParseNumber<T>(line.substr(0, end));
            if (!v || n == N) return std::nullopt;
            out[n++] = *v;
        }
        line.remove_prefix(std::min(end + 1, line.size()));
    }
    if (n != N) return std::nullopt;
    return out;
}

} // namespace

PfbFile ReadPfb(std::istream &in) {
    LineReader lines(in, false);
    PfbFile f;
    std::string line;
    if (lines.Next(line)) line = Normalise(line);
    if (line == "#PFBarrel 2011 v1")
        f.version = 1;
    else if (line == "#PFBarrel 2011 v2")
        f.version = 2;
    else
        Fail("unrecognized file version", line);

    line = NextPfbLine(lines);
    const auto size = Fields<int, 2>(line);
    if (!size || (*size)[0] <= 0 || (*size)[1] <= 0) Fail("expected a width and height in pixels", line);
    f.width = (*size)[0];
    f.height = (*size)[1];

    if (f.version == 2) {
        line = NextPfbLine(lines);
        const auto aspect = Fields<double, 1>(line);
        if (!aspect || (*aspect)[0] <= 0.0) Fail("expected a pixel aspect", line);
        f.pixelAspect = (*aspect)[0];
    }

    line = NextPfbLine(lines);
    const auto frames = Fields<int, 2>(line);
    if (!frames || std::int64_t((*frames)[1]) - (*frames)[0] < 0 ||
        std::int64_t((*frames)[1]) - (*frames)[0] >= std::int64_t(MaxTableRows))
        Fail("expected a first and last frame", line);
    f.firstFrame = (*frames)[0];
    f.lastFrame = (*frames)[1];

    line = NextPfbLine(lines);
    if (line == "Low Order")
        f.order = PfbOrder::Low;
    else if (line == "High Order")
        f.order = PfbOrder::High;
    else
        Fail("unrecognized lens model", line);

    line = NextPfbLine(lines);
    const auto squeeze = Fields<double, 1>(line);
    if (!squeeze || (*squeeze)[0] <= 0.0) Fail("expected an anamorphic squeeze", line);
    f.squeeze = (*squeeze)[0];

    const std::size_t count = std::size_t(f.lastFrame - f.firstFrame) + 1;
    for (std::size_t i = 0; i < count; ++i) {
        line = NextPfbLine(lines);
        const auto row = Fields<double, 5>(line);
        if (!row || std::abs((*row)[4] - f.squeeze) > 1e-6 * f.squeeze) Fail("bad table row", line);
        f.rows.push_back({(*row)[0], (*row)[1], (*row)[2], (*row)[3], (*row)[4]});
    }
    if (lines.Next(line)) Fail("text after the table", line);
    return f;
}

PfbFile ReadPfbFile(const std::filesystem::path &path) {
    std::ifstream in = OpenRegular(path);
    return ReadPfb(in);
}

PfBarrelSettings PfBarrelSettingsAt(const PfbFile &file, int frame, int width, int height) {
    PfBarrelSettings s;
    s.width = width;
    s.height = height;
    if (file.rows.empty()) return s;
    const std::int64_t last = std::int64_t(file.rows.size()) - 1;
    const PfbRow &row = file.rows[std::clamp<std::int64_t>(std::int64_t(frame) - file.firstFrame, 0, last)];
    s.lowOrder = row.lowOrder;
    s.highOrder = file.order == PfbOrder::High ? row.highOrder : 0.0;
    s.centerX = row.centerX;
    s.centerY = row.centerY;
    s.squeeze = row.squeeze;
    return s;
}

} // namespace Orvane::lensfiles
