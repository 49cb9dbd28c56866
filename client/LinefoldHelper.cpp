// The C interface: each call is one row of the message layouts, with its arguments.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <new>
#include <span>
#include <string_view>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "client/HelperConnection.h"
#include "client/MemoryFile.h"
#include "client/Reply.h"
#include "client/RequestMessage.h"
#include "client/linefold_helper.h"

struct LFMobileHelper {
    explicit LFMobileHelper(std::string_view servicePath) : connection(servicePath) {}

    std::mutex mutex;
    linefold_client::HelperConnection connection;  // under the mutex
};

namespace {

using namespace linefold_client;

/// The row of a routine, found while compiling.
consteval std::size_t Row(std::string_view name) {
    std::size_t row = 0;
    while (kRoutineLayouts.at(row).name != name) {
        ++row;
    }
    return row;
}

template <typename... Arguments>
constexpr bool ArgumentsFit(const RoutineLayout& layout) {
    std::size_t index = 0;
    const bool allFit = (ArgumentFits<Arguments>(layout.request.at(index++)) && ...);
    return allFit && (index == layout.request.size() || layout.request.at(index) == Field::kNone);
}

// Where the out value of a routine goes. Each can be emptied, and filled from a valid reply.

struct NoValue {
    static constexpr bool matches(Field field) { return field == Field::kNone; }

    [[nodiscard]] bool clear() const { return true; }

    [[nodiscard]] std::int32_t take(const Reply& /*reply*/, int /*file*/) const {
        return LF_MOBILE_HELPER_SUCCESS;
    }
};

struct Number {
    std::int32_t* number;

    static constexpr bool matches(Field field) { return field == Field::kInt32; }

    [[nodiscard]] bool clear() const {
        if (number != nullptr) {
            *number = 0;
        }
        return number != nullptr;
    }

    [[nodiscard]] std::int32_t take(const Reply& reply, int /*file*/) const {
        *number = platform::Load<std::int32_t>(reply.value, 0);
        return LF_MOBILE_HELPER_SUCCESS;
    }
};

/// A buffer that is one byte larger than the field, so that the text always ends.
struct Text {
    char* buffer;

    static constexpr bool matches(Field field) {
        return field == Field::kString64 || field == Field::kString256;
    }

    [[nodiscard]] bool clear() const {
        if (buffer != nullptr) {
            *buffer = '\0';
        }
        return buffer != nullptr;
    }

    [[nodiscard]] std::int32_t take(const Reply& reply, int /*file*/) const {
        std::memcpy(buffer, reply.value.data(), reply.value.size());
        buffer[reply.value.size()] = '\0';
        return LF_MOBILE_HELPER_SUCCESS;
    }
};

static_assert(LF_MOBILE_HELPER_TOKEN_SIZE == SizeOfField(Field::kString256) + 1);
static_assert(LF_MOBILE_HELPER_COUNTRY_CODE_SIZE == SizeOfField(Field::kString64) + 1);

struct Bulk {
    void** data;
    std::size_t* size;

    static constexpr bool matches(Field field) { return field == Field::kData; }

    [[nodiscard]] bool clear() const {
        if (data != nullptr) {
            *data = nullptr;
        }
        if (size != nullptr) {
            *size = 0;
        }
        return data != nullptr && size != nullptr;
    }

    [[nodiscard]] std::int32_t take(const Reply& reply, int file) const {
        if (reply.dataSize == 0) {
            return LF_MOBILE_HELPER_SUCCESS;
        }
        Memory memory;
        if (const auto code = copy(reply, file, memory); code != LF_MOBILE_HELPER_SUCCESS) {
            return code;
        }
        *data = memory.release();
        *size = reply.dataSize;
        return LF_MOBILE_HELPER_SUCCESS;
    }

private:
    [[nodiscard]] static std::int32_t copy(const Reply& reply, int file, Memory& memory) {
        if (file < 0) {
            memory.reset(std::malloc(reply.dataSize));
            if (memory == nullptr) {
                return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
            }
            std::memcpy(memory.get(), reply.inlineData.data(), reply.dataSize);
            return LF_MOBILE_HELPER_SUCCESS;
        }
        switch (ReadMemoryFile(file, reply.dataSize, memory)) {
            case ReadResult::kRead:
                return LF_MOBILE_HELPER_SUCCESS;
            case ReadResult::kUnusable:
                return LF_MOBILE_HELPER_ERROR_INVALID_REPLY;
            case ReadResult::kNoResources:
                break;
        }
        return LF_MOBILE_HELPER_ERROR_NO_RESOURCES;
    }
};

template <typename Out>
std::int32_t Exchange(LFMobileHelper& helper,
                      const RoutineLayout& layout,
                      RequestMessage& request,
                      Out out) {
    OutgoingMessage outgoing;
    if (const auto code = request.finish(outgoing); code != LF_MOBILE_HELPER_SUCCESS) {
        return code;
    }
    const std::lock_guard lock(helper.mutex);
    Reply reply;
    Descriptor file;
    const auto code = helper.connection.call(layout, outgoing, reply, file);
    if (code != LF_MOBILE_HELPER_SUCCESS || reply.returnCode != LF_MOBILE_HELPER_SUCCESS) {
        return code != LF_MOBILE_HELPER_SUCCESS ? code : reply.returnCode;
    }
    const std::int32_t taken = out.take(reply, file.get());
    if (taken == LF_MOBILE_HELPER_ERROR_INVALID_REPLY) {
        helper.connection.disconnect();
    }
    return taken;
}

/// One call of a routine, whose arguments and out value are held to its row while compiling.
template <std::size_t kRow, typename Out, typename... Arguments>
std::int32_t Call(LFMobileHelper* helper, Out out, Arguments... arguments) noexcept {
    constexpr const RoutineLayout& kLayout = kRoutineLayouts[kRow];
    static_assert(ArgumentsFit<Arguments...>(kLayout),
                  "the arguments are the fields of the request");
    static_assert(Out::matches(kLayout.reply), "the out value is the field of the reply");
    if (!out.clear() || helper == nullptr) {
        return LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT;
    }
    RequestMessage request(kLayout);
    std::int32_t code = LF_MOBILE_HELPER_SUCCESS;
    [[maybe_unused]] std::size_t index = 0;
    // The first argument that does not fit decides, and the others are not looked at.
    ((code = code == LF_MOBILE_HELPER_SUCCESS ? request.put(index++, arguments) : code), ...);
    return code != LF_MOBILE_HELPER_SUCCESS ? code : Exchange(*helper, kLayout, request, out);
}

struct RawReply {
    std::span<std::byte> buffer;
    std::size_t* size;
    int* descriptor;
};

std::int32_t ExchangeRaw(LFMobileHelper* helper, const OutgoingMessage& request, RawReply reply) {
    if (reply.size != nullptr) {
        *reply.size = 0;
    }
    if (reply.descriptor != nullptr) {
        *reply.descriptor = -1;
    }
    const bool hasHole = (request.message.data() == nullptr && !request.message.empty()) ||
                         (request.behind.data() == nullptr && !request.behind.empty()) ||
                         (reply.buffer.data() == nullptr && !reply.buffer.empty());
    if (helper == nullptr || reply.size == nullptr || hasHole) {
        return LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT;
    }
    const std::lock_guard lock(helper->mutex);
    IncomingMessage incoming;
    if (const auto code = helper->connection.exchange(request, reply.buffer, incoming);
        code != LF_MOBILE_HELPER_SUCCESS) {
        return code;
    }
    *reply.size = incoming.size;
    if (reply.descriptor != nullptr) {
        *reply.descriptor = incoming.descriptor.release();
    }
    return incoming.size <= reply.buffer.size() ? LF_MOBILE_HELPER_SUCCESS
                                                : LF_MOBILE_HELPER_ERROR_REPLY_TOO_LARGE;
}

}  // namespace

LFMobileHelper* LFMobileHelperCreate(void) {
    return LFMobileHelperCreateWithPath(nullptr);
}

LFMobileHelper* LFMobileHelperCreateWithPath(const char* servicePath) {
    return new (std::nothrow) LFMobileHelper(
        servicePath == nullptr ? LF_MOBILE_HELPER_DEFAULT_SERVICE_PATH : servicePath);
}

void LFMobileHelperDestroy(LFMobileHelper* helper) {
    delete helper;
}

int32_t LFMobileHelperCheckIn(LFMobileHelper* helper) {
    if (helper == nullptr) {
        return LF_MOBILE_HELPER_ERROR_INVALID_ARGUMENT;
    }
    const std::lock_guard lock(helper->mutex);
    return helper->connection.checkIn();
}

void LFMobileHelperFree(void* data) {
    std::free(data);
}

int32_t LFMobileHelperSetVoicemailToken(LFMobileHelper* helper, const char* token) {
    return Call<Row("SetVoicemailToken")>(helper, NoValue{}, token);
}

int32_t LFMobileHelperSetVoicemailTokenForKey(LFMobileHelper* helper,
                                              const char* key,
                                              const char* token) {
    return Call<Row("SetVoicemailTokenForKey")>(helper, NoValue{}, key, token);
}

int32_t LFMobileHelperClearVoicemailToken(LFMobileHelper* helper) {
    return Call<Row("ClearVoicemailToken")>(helper, NoValue{});
}

int32_t LFMobileHelperRemoveAllVoicemailRecords(LFMobileHelper* helper) {
    return Call<Row("RemoveAllVoicemailRecords")>(helper, NoValue{});
}

int32_t LFMobileHelperCopyVoicemailTokenForKey(LFMobileHelper* helper,
                                               const char* key,
                                               char token[LF_MOBILE_HELPER_TOKEN_SIZE]) {
    return Call<Row("CopyVoicemailTokenForKey")>(helper, Text{token}, key);
}

int32_t LFMobileHelperCopyVoicemailToken(LFMobileHelper* helper,
                                         char token[LF_MOBILE_HELPER_TOKEN_SIZE]) {
    return Call<Row("CopyVoicemailToken")>(helper, Text{token});
}

int32_t LFMobileHelperIsVoicemailSubscribed(LFMobileHelper* helper, int32_t* isSubscribed) {
    return Call<Row("IsVoicemailSubscribed")>(helper, Number{isSubscribed});
}

int32_t LFMobileHelperSetPreferenceValue(LFMobileHelper* helper,
                                         const char* domain,
                                         const char* key,
                                         const void* value,
                                         size_t valueSize) {
    const Data data(static_cast<const std::byte*>(value), valueSize);
    return Call<Row("SetPreferenceValue")>(helper, NoValue{}, domain, key, data);
}

int32_t LFMobileHelperRemovePreferenceValue(LFMobileHelper* helper,
                                            const char* domain,
                                            const char* key) {
    // The protocol has no routine of its own for it: one byte, whichever, stands for no value.
    constexpr std::byte kNoValue{};
    return LFMobileHelperSetPreferenceValue(helper, domain, key, &kNoValue, sizeof kNoValue);
}

int32_t LFMobileHelperCopyPreferenceValue(
    LFMobileHelper* helper, const char* domain, const char* key, void** value, size_t* valueSize) {
    return Call<Row("CopyPreferenceValue")>(helper, Bulk{value, valueSize}, domain, key);
}

int32_t LFMobileHelperCopyAppPreferenceValue(
    LFMobileHelper* helper, const char* domain, const char* key, void** value, size_t* valueSize) {
    return Call<Row("CopyAppPreferenceValue")>(helper, Bulk{value, valueSize}, domain, key);
}

int32_t LFMobileHelperLinkCarrierBundle(LFMobileHelper* helper,
                                        const char* target,
                                        const char* linkPath,
                                        const char* domain) {
    return Call<Row("LinkCarrierBundle")>(helper, NoValue{}, target, linkPath, domain);
}

int32_t LFMobileHelperCreateSymlink(LFMobileHelper* helper,
                                    const char* target,
                                    const char* linkPath) {
    return Call<Row("CreateSymlink")>(helper, NoValue{}, target, linkPath);
}

int32_t LFMobileHelperRemovePreferenceDomain(LFMobileHelper* helper,
                                             const char* path,
                                             const char* domain) {
    return Call<Row("RemovePreferenceDomain")>(helper, NoValue{}, path, domain);
}

int32_t LFMobileHelperCopyFile(LFMobileHelper* helper,
                               const char* sourceDirectory,
                               const char* destinationDirectory,
                               const char* name,
                               int32_t* isDone) {
    return Call<Row("CopyFile")>(
        helper, Number{isDone}, sourceDirectory, destinationDirectory, name);
}

int32_t LFMobileHelperCopyLogDirectory(LFMobileHelper* helper,
                                       const char* source,
                                       int32_t* isDone) {
    return Call<Row("CopyLogDirectory")>(helper, Number{isDone}, source);
}

int32_t LFMobileHelperMoveDirectory(LFMobileHelper* helper,
                                    const char* source,
                                    const char* destinationDirectory,
                                    const char* name,
                                    int32_t* isDone) {
    return Call<Row("MoveDirectory")>(helper, Number{isDone}, source, destinationDirectory, name);
}

int32_t LFMobileHelperCopyArchive(LFMobileHelper* helper,
                                  const char* source,
                                  const char* destination,
                                  int32_t* isDone) {
    return Call<Row("CopyArchive")>(helper, Number{isDone}, source, destination);
}

int32_t LFMobileHelperLoadPlistFile(LFMobileHelper* helper,
                                    const char* path,
                                    void** data,
                                    size_t* dataSize) {
    return Call<Row("LoadPlistFile")>(helper, Bulk{data, dataSize}, path);
}

int32_t LFMobileHelperRequestCountryCodeFromLocation(LFMobileHelper* helper,
                                                     double latitude,
                                                     double longitude) {
    return Call<Row("RequestCountryCodeFromLocation")>(helper, NoValue{}, latitude, longitude);
}

int32_t LFMobileHelperCopyCountryCode(LFMobileHelper* helper,
                                      char countryCode[LF_MOBILE_HELPER_COUNTRY_CODE_SIZE]) {
    return Call<Row("CopyCountryCode")>(helper, Text{countryCode});
}

int32_t LFMobileHelperRequestWanIPFromLocation(LFMobileHelper* helper) {
    return Call<Row("RequestWanIPFromLocation")>(helper, NoValue{});
}

int32_t LFMobileHelperSetHeartbeatEnabled(LFMobileHelper* helper, int32_t isEnabled) {
    return Call<Row("SetHeartbeatEnabled")>(helper, NoValue{}, isEnabled);
}

int32_t LFMobileHelperSetRadioManagerLogging(LFMobileHelper* helper, int32_t isEnabled) {
    return Call<Row("SetRadioManagerLogging")>(helper, NoValue{}, isEnabled);
}

int32_t LFMobileHelperCheckForDatabaseUpdate(LFMobileHelper* helper, int32_t types) {
    return Call<Row("CheckForDatabaseUpdate")>(helper, NoValue{}, types);
}

int32_t LFMobileHelperSendRaw(LFMobileHelper* helper,
                              int32_t id,
                              const void* bytes,
                              size_t size,
                              void* reply,
                              size_t replyCapacity,
                              size_t* replySize,
                              int* replyDescriptor) {
    const platform::MachMsgHeader header{
        .size = static_cast<std::uint32_t>(sizeof(platform::MachMsgHeader) + size), .id = id};
    return ExchangeRaw(
        helper,
        {.message = std::as_bytes(std::span(&header, 1)),
         .behind = {static_cast<const std::byte*>(bytes), size}},
        {{static_cast<std::byte*>(reply), replyCapacity}, replySize, replyDescriptor});
}

int32_t LFMobileHelperSendMessage(LFMobileHelper* helper,
                                  const void* message,
                                  size_t size,
                                  void* reply,
                                  size_t replyCapacity,
                                  size_t* replySize,
                                  int* replyDescriptor) {
    return ExchangeRaw(
        helper,
        {.message = {static_cast<const std::byte*>(message), size}},
        {{static_cast<std::byte*>(reply), replyCapacity}, replySize, replyDescriptor});
}
