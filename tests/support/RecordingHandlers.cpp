#include "tests/support/RecordingHandlers.h"

#include <cstring>
#include <utility>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/VirtualMemory.h"

namespace recording {

std::vector<Call>& Calls() {
    static std::vector<Call> calls;
    return calls;
}

Answer& NextAnswer() {
    static Answer answer;
    return answer;
}

void Reset() {
    Calls().clear();
    NextAnswer() = Answer();
}

namespace {

kern_return_t Record(Call call) {
    Calls().push_back(std::move(call));
    if (NextAnswer().meanwhile) {
        NextAnswer().meanwhile(Calls().back());
    }
    return NextAnswer().code;
}

template <std::size_t N>
std::string Text(const InlineString<N>& field) {
    return std::string(field.view());
}

template <std::size_t N>
void Fill(OutString<N>& out) {
    std::memcpy(out.data(), NextAnswer().text.data(), NextAnswer().text.size());
}

void Fill(std::int32_t& out) {
    out = NextAnswer().number;
}

void Fill(OutOfLineData& out) {
    const std::string& data = NextAnswer().data;
    if (platform::vm_allocate(&out.address, data.size()) == platform::KERN_SUCCESS &&
        !data.empty()) {
        std::memcpy(out.address, data.data(), data.size());
        out.count = static_cast<std::uint32_t>(data.size());
    }
}

template <typename Out>
kern_return_t RecordAndFill(Call call, Out& out) {
    const auto code = Record(std::move(call));
    Fill(out);
    return code;
}

/// Bulk data belongs to the reply with success only.
kern_return_t RecordAndFill(Call call, OutOfLineData& out) {
    const auto code = Record(std::move(call));
    if (code == platform::KERN_SUCCESS) {
        Fill(out);
    }
    return code;
}

}  // namespace
}  // namespace recording

using recording::Record;
using recording::RecordAndFill;
using recording::Text;

kern_return_t server_LFMobileHelperSetVoicemailToken(mach_port_t port, String256& token) {
    return Record({.number = 0, .port = port, .texts = {Text(token)}});
}

kern_return_t server_LFMobileHelperSetVoicemailTokenForKey(mach_port_t port,
                                                           String256& token,
                                                           String256& key) {
    return Record({.number = 1, .port = port, .texts = {Text(token), Text(key)}});
}

kern_return_t server_LFMobileHelperClearVoicemailToken(mach_port_t port) {
    return Record({.number = 2, .port = port});
}

kern_return_t server_LFMobileHelperRemoveAllVoicemailRecords(mach_port_t port) {
    return Record({.number = 3, .port = port});
}

kern_return_t server_LFMobileHelperCopyVoicemailTokenForKey(mach_port_t port,
                                                            String256& key,
                                                            OutString<256>& token) {
    return RecordAndFill({.number = 4, .port = port, .texts = {Text(key)}}, token);
}

kern_return_t server_LFMobileHelperCopyVoicemailToken(mach_port_t port, OutString<256>& token) {
    return RecordAndFill({.number = 5, .port = port}, token);
}

kern_return_t server_LFMobileHelperSetPreferenceValue(mach_port_t port,
                                                      String256& domain,
                                                      String256& key,
                                                      std::span<const std::byte> value) {
    std::string data(value.size(), '\0');
    if (!value.empty()) {
        std::memcpy(data.data(), value.data(), value.size());
    }
    return Record({.number = 6, .port = port, .texts = {Text(domain), Text(key)}, .data = data});
}

kern_return_t server_LFMobileHelperCopyPreferenceValue(mach_port_t port,
                                                       String256& domain,
                                                       String256& key,
                                                       OutOfLineData& value) {
    return RecordAndFill({.number = 7, .port = port, .texts = {Text(domain), Text(key)}}, value);
}

kern_return_t server_LFMobileHelperCopyAppPreferenceValue(mach_port_t port,
                                                          String256& domain,
                                                          String256& key,
                                                          OutOfLineData& value) {
    return RecordAndFill({.number = 8, .port = port, .texts = {Text(domain), Text(key)}}, value);
}

kern_return_t server_LFMobileHelperLinkCarrierBundle(mach_port_t port,
                                                     String1024& target,
                                                     String1024& linkPath,
                                                     String1024& domain) {
    return Record(
        {.number = 9, .port = port, .texts = {Text(target), Text(linkPath), Text(domain)}});
}

kern_return_t server_LFMobileHelperCreateSymlink(mach_port_t port,
                                                 String1024& target,
                                                 String1024& linkPath) {
    return Record({.number = 10, .port = port, .texts = {Text(target), Text(linkPath)}});
}

kern_return_t server_LFMobileHelperRemovePreferenceDomain(mach_port_t port,
                                                          String1024& path,
                                                          String1024& domain) {
    return Record({.number = 11, .port = port, .texts = {Text(path), Text(domain)}});
}

kern_return_t server_LFMobileHelperIsVoicemailSubscribed(mach_port_t port,
                                                         std::int32_t& isSubscribed) {
    return RecordAndFill({.number = 12, .port = port}, isSubscribed);
}

kern_return_t server_LFMobileHelperSetHeartbeatEnabled(mach_port_t port, std::int32_t isEnabled) {
    return Record({.number = 13, .port = port, .numbers = {static_cast<double>(isEnabled)}});
}

kern_return_t server_LFMobileHelperCheckForDatabaseUpdate(mach_port_t port, std::int32_t types) {
    return Record({.number = 14, .port = port, .numbers = {static_cast<double>(types)}});
}

kern_return_t server_LFMobileHelperCopyFile(mach_port_t port,
                                            String256& sourceDirectory,
                                            String256& destinationDirectory,
                                            String256& name,
                                            std::int32_t& isDone) {
    return RecordAndFill({.number = 15,
                          .port = port,
                          .texts = {Text(sourceDirectory), Text(destinationDirectory), Text(name)}},
                         isDone);
}

kern_return_t server_LFMobileHelperCopyLogDirectory(mach_port_t port,
                                                    String256& source,
                                                    std::int32_t& isDone) {
    return RecordAndFill({.number = 16, .port = port, .texts = {Text(source)}}, isDone);
}

kern_return_t server_LFMobileHelperMoveDirectory(mach_port_t port,
                                                 String256& source,
                                                 String256& destinationDirectory,
                                                 String256& name,
                                                 std::int32_t& isDone) {
    return RecordAndFill({.number = 17,
                          .port = port,
                          .texts = {Text(source), Text(destinationDirectory), Text(name)}},
                         isDone);
}

kern_return_t server_LFMobileHelperRequestCountryCodeFromLocation(mach_port_t port,
                                                                  double latitude,
                                                                  double longitude) {
    return Record({.number = 18, .port = port, .numbers = {latitude, longitude}});
}

kern_return_t server_LFMobileHelperCopyCountryCode(mach_port_t port, OutString<64>& countryCode) {
    return RecordAndFill({.number = 19, .port = port}, countryCode);
}

kern_return_t server_LFMobileHelperRequestWanIPFromLocation(mach_port_t port) {
    return Record({.number = 20, .port = port});
}

kern_return_t server_LFMobileHelperSetRadioManagerLogging(mach_port_t port,
                                                          std::int32_t isEnabled) {
    return Record({.number = 21, .port = port, .numbers = {static_cast<double>(isEnabled)}});
}

kern_return_t server_LFMobileHelperCopyArchive(mach_port_t port,
                                               String256& source,
                                               String256& destination,
                                               std::int32_t& isDone) {
    return RecordAndFill({.number = 22, .port = port, .texts = {Text(source), Text(destination)}},
                         isDone);
}

kern_return_t server_LFMobileHelperLoadPlistFile(mach_port_t port,
                                                 String256& path,
                                                 OutOfLineData& data) {
    return RecordAndFill({.number = 23, .port = port, .texts = {Text(path)}}, data);
}
