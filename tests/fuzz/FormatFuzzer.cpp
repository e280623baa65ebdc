// libFuzzer harness for one image format reader; the build names the format
// class in ORVANE_FUZZ_FORMAT (one program per format).
#include "tests/fuzz/FuzzSupport.h"

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    Orvane::Fuzz::LoadOperators();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    Orvane::Fuzz::ReadImage(ORVANE_FUZZ_FORMAT, data, size);
    return 0;
}
