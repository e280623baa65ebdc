#pragma once
// A look at OpenEXR headers before the library reads them. The library
// trusts the sizes a file states: it sets aside an attribute's value, a
// preview image or a part's table of chunk offsets at the size the header
// gives before it reads a byte of it, so a damaged header of a few bytes can
// make it ask for gigabytes. ExrHeadersFit walks the headers as the library
// will and refuses every such size that the rest of the stream cannot hold.
//
// Thread safety: a plain function on a stream the caller owns.
#include <string>

namespace Orvane {

class IOClass;

/// True when every size the headers state fits in the stream; otherwise false
/// with the reason. The stream is left where it was. A stream of unknown
/// length, or headers the library will refuse anyway, pass.
bool ExrHeadersFit(IOClass *io, std::string &why);

} // namespace Orvane
