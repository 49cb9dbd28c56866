// The voicemail record store in memory.
#include "platform/MailboxStore.h"

#include "platform/sim/SimMailbox.h"
#include "platform/sim/World.h"

namespace sim {

Mailbox& TheMailbox() {
    static Mailbox& mailbox = *new Mailbox;
    return mailbox;
}

void ResetMailbox() {
    TheMailbox() = Mailbox();
}

}  // namespace sim

namespace platform {

using sim::CallFails;
using sim::TheMailbox;

void MailboxStoreSetToken(std::optional<std::string_view> token) {
    if (!CallFails("MailboxStoreSetToken", token ? "a token" : "none")) {
        TheMailbox().token = token;
    }
}

void MailboxStoreSetTokenForKey(std::string_view key, std::string_view token) {
    if (CallFails("MailboxStoreSetTokenForKey", key)) {
        return;
    }
    auto& tokens = TheMailbox().tokensForKeys;
    if (tokens.size() < kMostMailboxRecords || tokens.contains(key)) {
        tokens.insert_or_assign(std::string(key), std::string(token));
    }
}

std::optional<std::string> MailboxStoreCopyToken() {
    return CallFails("MailboxStoreCopyToken") ? std::nullopt : TheMailbox().token;
}

std::optional<std::string> MailboxStoreCopyTokenForKey(std::string_view key) {
    const auto& tokens = TheMailbox().tokensForKeys;
    const auto found = tokens.find(key);
    return CallFails("MailboxStoreCopyTokenForKey", key) || found == tokens.end()
               ? std::nullopt
               : std::optional(found->second);
}

void MailboxStoreRemoveAllRecords(std::uint32_t flags) {
    if (!CallFails("MailboxStoreRemoveAllRecords", std::to_string(flags))) {
        TheMailbox().tokensForKeys.clear();
    }
}

}  // namespace platform
