#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/PropertyListXML.h"
#include "platform/values/PropertyListXMLForms.h"
#include "platform/values/Values.h"

using namespace platform::values;

namespace {

void require(bool holds, const char* what) {
    if (!holds) {
        std::fprintf(stderr, "%s\n", what);
        std::abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(bytes), size);
    ParseError error;
    const Owned<CFPropertyListRef> value = parseAnyPropertyListXML(text, error);
    const Owned<CFPropertyListRef> plain = parsePlainPropertyListXML(text);
    if (!value) {
        require(!error.reason.empty() && error.line > 0 && error.column > 0, "a refusal without a place");
        require(!plain, "the plain form took what is no property list");
        return 0;
    }
    require(!plain || CFEqual(plain.get(), value.get()) != 0, "two readings differ");
    require(frozen(value.get()).get() == value.get(), "a value that was read can change");
    const std::optional<std::string> written = writePropertyListXML(value.get());
    require(written.has_value(), "what was read cannot be written");
    const Owned<CFPropertyListRef> back = parsePlainPropertyListXML(*written);
    require(static_cast<bool>(back), "what was written is not in plain form");
    require(CFEqual(value.get(), back.get()) != 0, "what was written reads differently");
    require(writePropertyListXML(back.get()) == written, "what was read again is written differently");
    return 0;
}
