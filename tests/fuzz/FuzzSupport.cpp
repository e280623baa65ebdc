#include "tests/fuzz/FuzzSupport.h"

#include <fuzzer/FuzzedDataProvider.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "host/app/Application.h"
#include "host/core/Registry.h"
#include "host/core/Tags.h"
#include "host/image/Image.h"
#include "host/image/PixelMemory.h"
#include "host/media/IOClass.h"
#include "host/media/ImageFormat.h"

namespace Orvane::Fuzz {
namespace {

/// One read as a clip makes it: the check at the start of the stream, then
/// the header and the frame with `tags`. Null when the file is refused.
Ref<Image> ReadOnce(ImageFormat &format, MemoryIO &io, int proxy, const TagList &tags) {
    if (!io.Seek(0, IOClass::SeekStart) || !format.CheckFormat(&io) || !io.Seek(0, IOClass::SeekStart)) return nullptr;
    format.Close();
    format.io = &io;
    format.proxyScale = proxy;
    format.metadata = ScriptVal::Table();
    format.SetupLoad(nullptr, nullptr);
    Ref<Image> image;
    const bool ok = format.LoadHeader(&io) && format.LoadFrameTagList(0, image, tags);
    format.Close();
    format.io = nullptr;
    if (!ok && format.Error().empty()) Fatal("a refused file gives no reason");
    if (ok && !image) Fatal("a read that succeeds gives no image");
    return ok ? image : nullptr;
}

/// Reads every byte of the image's rows, so that rows shorter than the data
/// window claims show up under the address sanitizer.
uint32_t Checksum(const Image &image) {
    uint32_t sum = 0;
    const ImgRectI &dw = image.DataWindow();
    for (int y = dw.y0; y < dw.y1 && image.HasScanLineData(); ++y) {
        const uint8_t *row = image.ScanLine(y);
        if (!row) Fatal("a row inside the data window is missing");
        for (size_t i = 0; i < image.RowBytes(); ++i) sum = sum * 31 + row[i];
    }
    return sum;
}

} // namespace

void LoadOperators() {
    std::string error;
    if (!GetApp()->LoadOperators(error)) {
        std::fprintf(stderr, "cannot load the tool library: %s\n", error.c_str());
        std::abort();
    }
    SetPixelMemoryLimit(kPixelMemoryLimit, "the fuzzing limit");
}

void Fatal(const char *why) {
    std::fprintf(stderr, "fuzz harness: %s\n", why);
    std::abort();
}

void ReadImage(const char *formatId, const uint8_t *data, size_t size) {
    FuzzedDataProvider input(data, size);
    const uint8_t control = input.ConsumeIntegral<uint8_t>(); // the last byte
    MemoryIO io(input.ConsumeRemainingBytes<uint8_t>());
    Ref<ImageFormat> format = NewImageFormat(ClassRegistry->Find(OvID(formatId), RegFamilyImageFormat));
    if (!format) Fatal("no such format class");

    const Ref<Image> head = ReadOnce(*format, io, 1, {{ClipFrameHeaderOnly, 1}});
    if (!head) return;
    const ImgRectI dw = head->DataWindow();

    // Proxy scale 1 to 4; with bit 2, a region: the lower right of the window.
    const int proxy = 1 + (control & 3);
    const ImageDomain region(ImgRectI(dw.x0 + dw.Width() / 3, dw.y0 + dw.Height() / 3, dw.x1, dw.y1));
    TagList tags;
    if (control & 4) tags.Add({ClipFrameRegion, static_cast<const void *>(&region)});
    if (const Ref<Image> image = ReadOnce(*format, io, proxy, tags)) {
        volatile uint32_t sum = Checksum(*image);
        (void)sum;
    }
}

} // namespace Orvane::Fuzz
