// The voicemail store's file: what is taken for tokens is written and read back as it was.
#include "fuzz/Fuzz.h"
#include "platform/linux/MailboxRecords.h"

using platform::MailboxRecords;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto list = platform::PropertyListCreateWithData(std::as_bytes(std::span(data, size)));
    const auto records = list ? platform::MailboxRecordsOf(*list) : std::nullopt;
    if (!records) {
        return 0;
    }
    const auto file = platform::PropertyListCreateXmlData(platform::PropertyListOf(*records));
    if (!file) {
        return 0;  // beyond what a file may hold
    }
    Require(platform::MailboxRecordsOf(*platform::PropertyListCreateWithData(*file)) == *records);
    for (const MailboxRecords::Record& record : records->records) {
        Require(records->find(record.key) != nullptr);
    }
    return 0;
}
