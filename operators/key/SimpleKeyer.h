#pragma once
// SimpleKeyer: the frame the chroma, luma and difference keyers share. The
// tool declares its own controls and main links, reads its key values
// (ReadKey) and makes the first matte, the source colour with the key in
// alpha (FirstMatte); the frame makes the image over the window the clipping
// mode and the chain's reach give, and runs the refining chain (KeyerMatte.h)
// on it.
//
// Failure: a missing input gives no output; memory refused while keying or
// refining fails the request with the tool's line; an abandoned render gives
// no output silently.
//
// Thread safety: one request at a time (the tool's request lock); the first
// matte and the chain's stages spread rows over the workers.
#include "host/flow/Operator.h"
#include "operators/key/KeyerMatte.h"

namespace Orvane {

class SimpleKeyer : public ThreadedOperator {
public:
    void NotifyChanged(Input *in, Parameter *param, double time, TagList *tags) override;
    void CheckRequest(Request *req) override;
    void Process(Request *req) override;

protected:
    SimpleKeyer(const Registry *reg, const ScriptVal &args, const TagList &tags, KeyerMatte::Flavour flavour);

    /// Reads the tool's own values for this request (the spill channel among
    /// them); false gives no output (the tool has written its line).
    virtual bool ReadKey(Request *req, KeyerMatte::Values &v) = 0;
    /// Fills `dst`'s data window: `src`'s colour, the key in alpha. False when
    /// memory ran out.
    virtual bool FirstMatte(Request *req, const Image *src, Image *dst) = 0;

    /// A Range control's half: member 0 the low end, 1 the high end of the
    /// pair `group`, slider 0 to 1.
    static TagList RangeTags(int group, int member, double def);
    /// The main image link and the output; the tool adds them.
    Input *AddImageInput(const char *name, const char *id, int main, bool required);
    Output *AddImageOutput();

    KeyerMatte matte_;
    Input *input_ = nullptr;
    Output *output_ = nullptr;
};

} // namespace Orvane
