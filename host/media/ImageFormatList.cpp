#include "host/media/ImageFormatList.h"

#include <algorithm>
#include <cctype>
#include <filesystem>

#include "host/core/Tags.h"
#include "host/media/IOClass.h"

namespace Orvane {
namespace {

std::string LowerExtension(const std::string &path) {
    std::string ext = std::filesystem::path(path).extension().string();
    for (char &c : ext) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return ext;
}

std::vector<const Registry *> AllFormats() {
    std::vector<const Registry *> rows;
    if (!ClassRegistry) return rows;
    for (const Registry *r : ClassRegistry->Rows())
        if (r->IsRegClassType(RegFamilyImageFormat) && r->CanCreate() && !r->Tags().GetBool(RegPlanned))
            rows.push_back(r);
    std::stable_sort(rows.begin(), rows.end(), [](const Registry *a, const Registry *b) {
        return a->Tags().GetLong(RegSortOrder, 0) < b->Tags().GetLong(RegSortOrder, 0);
    });
    return rows;
}

bool Accepts(ImageFormat &format, IOClass *io) {
    if (!io->Seek(0, IOClass::SeekStart)) return false;
    const bool ok = format.CheckFormat(io);
    io->Seek(0, IOClass::SeekStart);
    return ok;
}

} // namespace

std::mutex &FormatLock() {
    static std::mutex lock;
    return lock;
}

std::vector<const Registry *> FormatsForExtension(const std::string &path) {
    const std::string ext = LowerExtension(path);
    std::vector<const Registry *> found;
    if (ext.empty()) return found;
    for (const Registry *r : AllFormats())
        for (const TagItem *e : r->Tags().FindAll(RegFormatExtension)) {
            std::string registered = e->AsText() ? e->AsText() : "";
            for (char &c : registered) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            if (registered == ext) {
                found.push_back(r);
                break;
            }
        }
    return found;
}

std::vector<const Registry *> FormatsThatSave() {
    std::vector<const Registry *> rows;
    for (const Registry *r : AllFormats())
        if (r->Tags().GetBool(RegFormatCanSave)) rows.push_back(r);
    return rows;
}

Ref<ImageFormat> FindFormatForReading(const std::string &path, IOClass *io, std::string &error) {
    std::lock_guard<std::mutex> guard(FormatLock());
    const std::vector<const Registry *> named = FormatsForExtension(path);
    for (const Registry *r : named)
        if (Ref<ImageFormat> f = NewImageFormat(r); f && Accepts(*f, io)) return f;
    for (const Registry *r : AllFormats()) {
        if (std::find(named.begin(), named.end(), r) != named.end()) continue;
        if (Ref<ImageFormat> f = NewImageFormat(r); f && Accepts(*f, io)) return f;
    }
    error = named.empty() ? path + ": no format reads files like this"
                          : path + ": not a valid " +
                                std::string(named.front()->Tags().GetText(RegFormatName, "image")) + " file";
    return nullptr;
}

const Registry *FormatRowForWriting(const std::string &path) {
    for (const Registry *r : FormatsForExtension(path))
        if (r->Tags().GetBool(RegFormatCanSave)) return r;
    return nullptr;
}

Ref<ImageFormat> FindFormatForWriting(const std::string &path, std::string &error) {
    if (const Registry *r = FormatRowForWriting(path))
        if (Ref<ImageFormat> f = NewImageFormat(r)) return f;
    error = path + ": no format writes files with the extension '" + LowerExtension(path) + "'";
    return nullptr;
}

} // namespace Orvane
