// Domain files: one key is set, and nothing else changes.
#include "fuzz/Fuzz.h"
#include "platform/PreferenceChanges.h"

using platform::PropertyList;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto before = platform::PropertyListCreateWithData(std::as_bytes(std::span(data, size)));
    if (!before || before->kind() != PropertyList::Kind::kDictionary) {
        return 0;
    }
    PropertyList entries = *before;
    (void)platform::ApplyPreferenceChanges({{.key = "a", .value = PropertyList("set")}}, entries);
    const auto file = platform::PropertyListCreateXmlData(entries);
    if (!file) {
        return 0;  // beyond what a domain may hold
    }
    auto after = platform::PropertyListCreateWithData(*file).value();
    Require(*after.find("a") == PropertyList("set"));
    const PropertyList* const old = before->find("a");
    (void)platform::ApplyPreferenceChanges(
        {{.key = "a", .value = old == nullptr ? std::nullopt : std::optional(*old)}}, after);
    Require(platform::PropertyListCreateXmlData(after) ==
            platform::PropertyListCreateXmlData(*before));
    return 0;
}
