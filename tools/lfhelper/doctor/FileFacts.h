// What there is at a path, and who may change it.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include "platform/PropertyList.h"

namespace lfhelper::doctor {

struct FileFacts {
    enum class State : std::uint8_t { kThere, kAbsent, kUnseen };

    State state = State::kAbsent;
    std::string error{};  ///< why it could not be seen
    mode_t mode = 0;
    uid_t owner = 0;
    off_t size = 0;

    [[nodiscard]] bool isThere() const { return state == State::kThere; }

    [[nodiscard]] bool isAbsent() const { return state == State::kAbsent; }

    [[nodiscard]] bool isUnseen() const { return state == State::kUnseen; }

    [[nodiscard]] bool is(mode_t type) const;
};

enum class Links : bool { kSeen, kFollowed };

[[nodiscard]] FileFacts LookAt(const std::string& path, Links links = Links::kSeen);

/// Such as "a folder".
[[nodiscard]] std::string KindOf(const FileFacts& facts);

/// Why the thing at the path is not a thing of that type, root's and not writable by others; empty
/// when it is. For what is there.
[[nodiscard]] std::string WhyNotRootsOwn(const FileFacts& facts, mode_t type);

/// What makes it so.
[[nodiscard]] std::string MakeRootsOwn(const std::string& path);

/// A configuration file as the service reads it.
struct ConfigurationFile {
    enum class State : std::uint8_t { kRead, kAbsent, kUnseen, kUseless };

    State state = State::kAbsent;
    std::string text{};    ///< why it is not read
    std::string remedy{};  ///< what makes it readable
    platform::PropertyList entries{};
};

[[nodiscard]] ConfigurationFile ReadConfigurationFile(const std::string& path);

}  // namespace lfhelper::doctor
