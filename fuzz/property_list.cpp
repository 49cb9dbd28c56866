// Property lists: what is taken comes back as it was, in both forms.
#include "fuzz/Fuzz.h"
#include "platform/PropertyList.h"

using platform::PropertyListCreateWithData;
using platform::PropertyListCreateXmlData;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto list = PropertyListCreateWithData(std::as_bytes(std::span(data, size)));
    if (!list) {
        return 0;
    }
    // Compared as written, since a NaN is not equal to itself.
    const auto xml = PropertyListCreateXmlData(*list);
    const auto binary = platform::PropertyListCreateBinaryData(*list);
    for (const auto& written : {xml, binary}) {
        if (written) {
            const auto copy = PropertyListCreateWithData(*written);
            Require(copy.has_value() && PropertyListCreateXmlData(*copy) == xml);
        }
    }
    return 0;
}
