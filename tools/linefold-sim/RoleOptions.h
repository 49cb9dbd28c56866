// The options of a role, taken apart, and what the roles that serve somebody share.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/OwnedFd.h"

namespace simulator {

inline constexpr int kCannotPlay = 1;
inline constexpr int kUsage = 2;

struct KnownOption {
    enum class Takes : bool { kNothing, kValue };

    std::string_view name;  ///< with its dashes
    Takes takes = Takes::kValue;
};

/// Says on standard error what is wrong with a role, and gives the exit status.
int Complain(std::string_view role, const std::string& why, int status = kCannotPlay);

class RoleOptions {
public:
    /// None, with a complaint, when a word is no option of the role or lacks its value.
    [[nodiscard]] static std::optional<RoleOptions> parse(std::string_view role,
                                                          std::span<const std::string_view> words,
                                                          std::span<const KnownOption> known);

    [[nodiscard]] bool has(std::string_view name) const { return find(name) != nullptr; }

    [[nodiscard]] std::string value(std::string_view name, std::string_view otherwise) const;

    /// The number of an option; none, with a complaint, when it is no number or below `least`.
    [[nodiscard]] std::optional<double> number(std::string_view name,
                                               double otherwise,
                                               double least) const;

    /// "ADDRESS:PORT" or "[ADDRESS]:PORT"; none, with a complaint, when it is something else.
    [[nodiscard]] std::optional<std::string> place(std::string_view name,
                                                   std::string_view otherwise) const;

private:
    explicit RoleOptions(std::string_view role) : role_(role) {}

    [[nodiscard]] const std::string* find(std::string_view name) const;

    std::string role_;
    std::vector<std::pair<std::string, std::string>> given_;
};

/// SIGTERM and SIGINT, by which a role ends. Made before anything else is started.
class Termination {
public:
    Termination();

    /// Becomes readable with the first of them, for poll(2).
    [[nodiscard]] int descriptor() const { return signals_.get(); }

    /// Waits until one comes.
    void await() const;

private:
    platform::OwnedFd signals_;
};

/// A socket of a kind (SOCK_STREAM, SOCK_DGRAM) at a place; closed, with a complaint, when it
/// cannot be had.
[[nodiscard]] platform::OwnedFd SocketAt(std::string_view role, const std::string& place, int kind);

}  // namespace simulator
