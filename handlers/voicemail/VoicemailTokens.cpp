// Voicemail tokens: stored, read and wiped in the platform's record store. What they are appears in
// no log.
#include <cstring>
#include <optional>
#include <string>

#include "Helper/Shared/Server/RequestProtocol.h"
#include "platform/MailboxStore.h"
#include "platform/Utf8.h"

namespace {

/// A token that does not fit with its NUL is answered like an absent one: half a token is none.
void PutToken(const std::optional<std::string>& token, OutString<256>& reply) {
    reply.fill('\0');
    if (token && token->size() < reply.size()) {
        std::memcpy(reply.data(), token->data(), token->size());
    }
}

}  // namespace

kern_return_t server_LFMobileHelperSetVoicemailToken(mach_port_t /*port*/, String256& token) {
    if (!platform::IsUtf8(token.view())) {
        return platform::KERN_FAILURE;
    }
    platform::MailboxStoreSetToken(token.view());
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperSetVoicemailTokenForKey(mach_port_t /*port*/,
                                                           String256& key,
                                                           String256& token) {
    if (!platform::IsUtf8(key.view()) || !platform::IsUtf8(token.view())) {
        return platform::KERN_FAILURE;
    }
    platform::MailboxStoreSetTokenForKey(key.view(), token.view());
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperClearVoicemailToken(mach_port_t /*port*/) {
    platform::MailboxStoreSetToken(std::nullopt);
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperRemoveAllVoicemailRecords(mach_port_t /*port*/) {
    // First, so that the token is gone also when the records cannot be wiped.
    platform::MailboxStoreSetToken(std::nullopt);
    platform::MailboxStoreRemoveAllRecords(0);
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperCopyVoicemailTokenForKey(mach_port_t /*port*/,
                                                            String256& key,
                                                            OutString<256>& token) {
    if (!platform::IsUtf8(key.view())) {
        return platform::KERN_FAILURE;
    }
    PutToken(platform::MailboxStoreCopyTokenForKey(key.view()), token);
    return platform::KERN_SUCCESS;
}

kern_return_t server_LFMobileHelperCopyVoicemailToken(mach_port_t /*port*/, OutString<256>& token) {
    PutToken(platform::MailboxStoreCopyToken(), token);
    return platform::KERN_SUCCESS;
}
