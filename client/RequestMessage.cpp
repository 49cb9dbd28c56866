#include "client/RequestMessage.h"

#include <algorithm>
#include <cstring>

#include "client/MemoryFile.h"
#include "client/linefold_helper.h"

namespace linefold_client {
namespace {

using platform::Store;

constexpr std::uint8_t kVirtualCopy = 1;
constexpr std::size_t kOffsetOfCopyOption = platform::kOffsetOfOutOfLineFlags + 1;

static_assert(LF_MOBILE_HELPER_MAX_VALUE_SIZE == platform::kMaxRequestData,
              "the documented limit is the protocol's");

void StoreHeader(std::span<std::byte> message, std::int32_t id, std::uint32_t bits) {
    Store(message,
          0,
          platform::MachMsgHeader{
              .bits = bits, .size = static_cast<std::uint32_t>(message.size()), .id = id});
}

}  // namespace

RequestMessage::RequestMessage(const RoutineLayout& layout) : layout_(layout) {
    static_assert(std::ranges::all_of(
                      kRoutineLayouts,
                      [](const RoutineLayout& routine) { return routine.requestSize <= kMaxSize; }),
                  "every request fits");
    StoreHeader(message(), layout.id, layout.bringsData() ? platform::MACH_MSGH_BITS_COMPLEX : 0);
    const std::size_t ndrOffset = layout.offsetOfField(0) - platform::kNdrRecord.size();
    // A routine without fields has no body at all, so no NDR record either.
    if (layout.requestSize > ndrOffset) {
        Store(message(), ndrOffset, platform::kNdrRecord);
    }
}

std::int32_t RequestMessage::put(std::size_t index, const char* text) {
    if (text == nullptr) {
        return LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT;
    }
    const auto field =
        message().subspan(layout_.offsetOfField(index), SizeOfField(layout_.request[index]));
    const std::size_t length = strnlen(text, field.size() + 1);
    if (length > field.size()) {
        return LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG;
    }
    std::memcpy(field.data(), text, length);
    return LF_MOBILE_HELPER_SUCCESS;
}

std::int32_t RequestMessage::put(std::size_t index, std::int32_t number) {
    Store(message(), layout_.offsetOfField(index), number);
    return LF_MOBILE_HELPER_SUCCESS;
}

std::int32_t RequestMessage::put(std::size_t index, double number) {
    Store(message(), layout_.offsetOfField(index), number);
    return LF_MOBILE_HELPER_SUCCESS;
}

std::int32_t RequestMessage::put(std::size_t index, Data data) {
    if (data.data() == nullptr && !data.empty()) {
        return LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT;
    }
    if (data.size() > platform::kMaxRequestData) {
        return LF_MOBILE_HELPER_ERROR_ARGUMENT_TOO_LONG;
    }
    const auto size = static_cast<std::uint32_t>(data.size());
    Store(message(), platform::kOffsetOfDescriptorCount, std::uint32_t{1});
    Store(message(), kOffsetOfCopyOption, kVirtualCopy);
    Store(message(), platform::kOffsetOfDescriptorType, platform::DescriptorType::kOutOfLine);
    Store(message(), platform::kOffsetOfOutOfLineSize, size);
    Store(message(), layout_.offsetOfField(index), size);
    data_ = data;
    return LF_MOBILE_HELPER_SUCCESS;
}

std::int32_t RequestMessage::finish(OutgoingMessage& outgoing) {
    outgoing = {.message = message()};
    if (data_.size() <= platform::kMaxInlineData) {
        outgoing.behind = data_;
        return LF_MOBILE_HELPER_SUCCESS;
    }
    memoryFile_ = MakeMemoryFile(data_);
    outgoing.descriptor = memoryFile_.get();
    return memoryFile_.isOpen() ? LF_MOBILE_HELPER_SUCCESS : LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
}

CheckInMessage MakeCheckInMessage() {
    CheckInMessage message{};
    StoreHeader(message, kCheckInId, platform::MACH_MSGH_BITS_COMPLEX);
    Store<std::uint32_t>(message, platform::kOffsetOfDescriptorCount, 1);
    Store(std::span<std::byte>(message),
          platform::kOffsetOfPortDisposition,
          platform::MachMsgType::kMoveSend);
    Store(std::span<std::byte>(message),
          platform::kOffsetOfDescriptorType,
          platform::DescriptorType::kPort);
    return message;
}

}  // namespace linefold_client
