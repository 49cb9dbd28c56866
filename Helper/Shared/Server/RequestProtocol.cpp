#include "Helper/Shared/Server/RequestProtocol.h"

#include <algorithm>
#include <array>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "Helper/Shared/Server/RequestStub.h"
#include "platform/MachCarriage.h"

using namespace platform;

void request_stub::Parameter<OutOfLineData&>::fill(ReplyMessage& reply) const {
    auto header = reply.header();
    header.bits |= MACH_MSGH_BITS_COMPLEX;
    header.size = kOutOfLineReplySize;
    reply.setHeader(header);
    Store(reply.bytes, kOffsetOfDescriptorCount, std::uint32_t{1});
    Store(reply.bytes, kOffsetOfDescriptor, reinterpret_cast<std::uintptr_t>(value.address));
    Store(reply.bytes, kOffsetOfOutOfLineFlags, kOutOfLineReplyFlags);
    Store(reply.bytes, kOffsetOfOutOfLineSize, value.count);
    Store(reply.bytes, kOffsetOfOutOfLineReplyNdr, kNdrRecord);
    Store(reply.bytes, kOffsetOfOutOfLineReplyCount, value.count);
}

namespace {

constexpr const RoutineLayout& kSetPreferenceValue = kRoutineLayouts[6];

kern_return_t CallSetPreferenceValue(ReceivedMessage& request) {
    const std::span<const std::byte> bytes = request.bytes;
    const auto header = request.header();
    if ((header.bits & MACH_MSGH_BITS_COMPLEX) == 0 ||
        header.size != kSetPreferenceValue.requestSize ||
        Load<std::uint32_t>(bytes, kOffsetOfDescriptorCount) != 1) {
        return MIG_BAD_ARGUMENTS;
    }
    const auto type =
        static_cast<DescriptorType>(Load<std::uint8_t>(bytes, kOffsetOfDescriptorType));
    const auto size = Load<std::uint32_t>(bytes, kOffsetOfOutOfLineSize);
    const auto count = Load<std::uint32_t>(bytes, kSetPreferenceValue.offsetOfField(2));
    if (type != DescriptorType::kOutOfLine || count != size) {
        return MIG_TYPE_ERROR;
    }
    if (const auto code = MachMessageAccept(request); code != KERN_SUCCESS) {
        return code;
    }
    String256 domain(bytes.subspan<kSetPreferenceValue.offsetOfField(0), 256>());
    String256 key(bytes.subspan<kSetPreferenceValue.offsetOfField(1), 256>());
    const auto address = Load<std::uintptr_t>(bytes, kOffsetOfDescriptor);
    return server_LFMobileHelperSetPreferenceValue(
        header.localPort, domain, key, {reinterpret_cast<const std::byte*>(address), count});
}

/// The one request that brings out-of-line data; its memory goes with the message.
void SetPreferenceValueStub(ReceivedMessage& request, ReplyMessage& reply) {
    MigSetReturnCode(reply, CallSetPreferenceValue(request));
    MigSetNdrRecord(reply);
}

template <std::size_t kNumber, auto kHandler, NdrRecord kNdr = NdrRecord::kWrittenAgain>
consteval MigStub Row() {
    static_assert(HandlerMatches<kHandler>(kRoutineLayouts[kNumber]),
                  "the handler's parameters are the fields of its routine");
    return kSimpleRequestStub<kHandler, kNdr>;
}

// clang-format off
constexpr std::array<MigStub, kRoutineCount> kStubs{
    Row< 0, server_LFMobileHelperSetVoicemailToken>(),
    Row< 1, server_LFMobileHelperSetVoicemailTokenForKey>(),
    Row< 2, server_LFMobileHelperClearVoicemailToken>(),
    Row< 3, server_LFMobileHelperRemoveAllVoicemailRecords>(),
    Row< 4, server_LFMobileHelperCopyVoicemailTokenForKey>(),
    Row< 5, server_LFMobileHelperCopyVoicemailToken>(),
    SetPreferenceValueStub,
    Row< 7, server_LFMobileHelperCopyPreferenceValue>(),
    Row< 8, server_LFMobileHelperCopyAppPreferenceValue>(),
    Row< 9, server_LFMobileHelperLinkCarrierBundle>(),
    Row<10, server_LFMobileHelperCreateSymlink>(),
    Row<11, server_LFMobileHelperRemovePreferenceDomain>(),
    Row<12, server_LFMobileHelperIsVoicemailSubscribed>(),
    Row<13, server_LFMobileHelperSetHeartbeatEnabled>(),
    // This one leaves the dispatcher's NDR record in place; the others write it again.
    Row<14, server_LFMobileHelperCheckForDatabaseUpdate, NdrRecord::kLeftAsPreset>(),
    Row<15, server_LFMobileHelperCopyFile>(),
    Row<16, server_LFMobileHelperCopyLogDirectory>(),
    Row<17, server_LFMobileHelperMoveDirectory>(),
    Row<18, server_LFMobileHelperRequestCountryCodeFromLocation>(),
    Row<19, server_LFMobileHelperCopyCountryCode>(),
    Row<20, server_LFMobileHelperRequestWanIPFromLocation>(),
    Row<21, server_LFMobileHelperSetRadioManagerLogging>(),
    Row<22, server_LFMobileHelperCopyArchive>(),
    Row<23, server_LFMobileHelperLoadPlistFile>(),
};
// clang-format on

static_assert(std::ranges::all_of(kRoutineLayouts,
                                  [](const RoutineLayout& layout) {
                                      return layout.requestSize <= kMaxRequestSize &&
                                             layout.replySize <= kMaxReplySize;
                                  }),
              "the carriage's buffers hold every message");

MigStub RequestServerRoutine(const MachMsgHeader& request) {
    const auto index =
        static_cast<std::uint32_t>(request.id) - static_cast<std::uint32_t>(kFirstRoutineId);
    return index < kStubs.size() ? kStubs[index] : nullptr;
}

}  // namespace

constinit const MigSubsystem kRequestSubsystem{
    .server = RequestServerRoutine,
    .firstId = kFirstRoutineId,
    .endId = kFirstRoutineId + static_cast<std::int32_t>(kRoutineCount),
    .declaredMaxRequestSize = 292,
};
