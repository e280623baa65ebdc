// libFuzzer harness for documents: the script parser on any text, and
// documents loaded with the tool library. Besides crashes it checks two
// promises: a value written as text reads back the same, and a document as
// saved loads again and saves to the same text.
#include <optional>
#include <string>

#include "host/core/ScriptVal.h"
#include "host/flow/DocumentIO.h"
#include "host/flow/OrvaneDoc.h"
#include "tests/fuzz/FuzzSupport.h"

namespace {

std::optional<Orvane::ScriptVal> Parse(const std::string &text) {
    try {
        return Orvane::ScriptVal::FromText(text);
    } catch (const Orvane::ScriptParseError &) {
        return std::nullopt;
    }
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    Orvane::Fuzz::LoadOperators();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    using namespace Orvane;
    const std::string text(reinterpret_cast<const char *>(data), size);
    if (const std::optional<ScriptVal> value = Parse(text)) {
        const std::optional<ScriptVal> again = Parse(value->ToText());
        if (!again || *again != *value) Fuzz::Fatal("a value written as text does not read back the same");
    }

    OrvaneDoc doc;
    const DocumentLoadResult loaded = LoadDocument(text, doc);
    if (!loaded.ok) {
        if (loaded.error.empty()) Fuzz::Fatal("a refused document gives no reason");
        return 0;
    }
    const std::string saved = SaveDocument(doc);
    OrvaneDoc reloaded;
    if (!LoadDocument(saved, reloaded).ok || SaveDocument(reloaded) != saved)
        Fuzz::Fatal("a saved document does not load back to the same text");
    return 0;
}
