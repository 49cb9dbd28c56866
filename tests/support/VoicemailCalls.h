// The voicemail routines as calls of a raw client.
#pragma once

#include <cstring>
#include <string>

#include "tests/support/PhoneRoot.h"

namespace phone {

/// An answer of routine 4 or 5.
struct CopiedToken {
    std::int32_t code = 0;
    std::string token{};
    bool isWellFormed = false;  ///< the sizes as documented, and zeros behind the token
};

inline std::int32_t SetToken(const Client& client, std::string_view token) {
    return client.callTexts(8683549, {token});
}

inline std::int32_t SetTokenForKey(const Client& client,
                                   std::string_view key,
                                   std::string_view token) {
    return client.callTexts(8683550, {key, token});
}

inline std::int32_t ClearToken(const Client& client) {
    return client.callTexts(8683551, {});
}

inline std::int32_t RemoveAllRecords(const Client& client) {
    return client.callTexts(8683552, {});
}

inline CopiedToken TakeCopiedToken(const Reply& reply) {
    constexpr std::size_t kOffset = 36;
    CopiedToken copied{.code = reply.isEnd() ? -1 : reply.code()};
    if (reply.bytes.size() <= kOffset) {
        copied.isWellFormed = reply.bytes.size() == kOffset && copied.code != 0;
        return copied;
    }
    const std::string field(reinterpret_cast<const char*>(reply.bytes.data()) + kOffset,
                            reply.bytes.size() - kOffset);
    copied.token = field.c_str();
    copied.isWellFormed = reply.bytes.size() == 292 && reply.header().size == 292 &&
                          reply.header().bits == 0 &&
                          field.find_first_not_of('\0', copied.token.size()) == std::string::npos;
    return copied;
}

inline CopiedToken CopyToken(const Client& client) {
    return TakeCopiedToken(client.privatePort.call(Message(8683554, 24)));
}

inline CopiedToken CopyTokenForKey(const Client& client, std::string_view key) {
    auto message = Message(8683553, 288);
    PutText(message, 32, key);
    return TakeCopiedToken(client.privatePort.call(message));
}

}  // namespace phone
