// The simulated voicemail record store.
#pragma once

#include <map>
#include <optional>
#include <string>

namespace sim {

struct Mailbox {
    std::optional<std::string> token{};
    std::map<std::string, std::string, std::less<>> tokensForKeys{};
};

/// What is stored; a test may change it. Each of the five operations can be made to fail by its
/// name. The journal tells of them without the tokens.
[[nodiscard]] Mailbox& TheMailbox();

}  // namespace sim
