#include "operators/media/formats/JpegFamily.h"

#include "host/core/Tags.h"
#include "host/media/IOClass.h"

namespace Orvane {

bool JpegFamily::LoadHeader(IOClass *stream) {
    io = stream;
    if (!io) return Fail("no stream");
    start_ = io->Tell();
    if (!AcceptsStream(io)) return Fail(fourComponents_ ? "not an IPL file" : "not a JPEG file");
    JpegStream::HeaderInfo info;
    std::string why;
    if (!JpegStream::ReadHeader(io, proxyScale, fourComponents_, info, why)) return Fail(why);
    width = info.width;
    height = info.height;
    aspectX = info.aspectX;
    aspectY = info.aspectY;
    depth = DepthRGBAInt8;
    fileChannels = info.components == 1 ? "Y" : info.components == 4 ? "R G B A" : "R G B";
    fileSampleType = "uint8";
    fullWidth_ = info.fullWidth;
    fullHeight_ = info.fullHeight;
    metadata = info.metadata;
    return true;
}

bool JpegFamily::LoadFrameTagList(unsigned frame, Ref<Image> &image, const TagList &tags) {
    if (!ImageFormat::LoadFrameTagList(frame, image, tags)) return false;
    if (proxyScale > 1) image->SetAttrsTagList({{ImgFullWidth, fullWidth_}, {ImgFullHeight, fullHeight_}});
    if (tags.GetBool(ClipFrameHeaderOnly) || image->IsNoData()) return true;
    if (!io->Seek(start_, IOClass::SeekAbsolute)) return Fail("seek error");
    std::string why;
    if (!JpegStream::DecodeInto(io, proxyScale, fourComponents_, *image, abortFlag, why)) return Fail(why);
    return true;
}

bool JpegFamily::SaveHeader(IOClass *stream, Image *) {
    io = stream;
    return io ? true : Fail("no stream");
}

bool JpegFamily::SaveFrame(unsigned, Image *image) {
    if (!io || !image) return Fail("nothing to write");
    std::string why;
    return JpegStream::Encode(io, *image, SaveSettings(), abortFlag, why) || Fail(why);
}

} // namespace Orvane
