// A datagram socket to a log, written without ever blocking.
#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>

#include "platform/linux/OwnedFd.h"

namespace platform {

/// One destination. Objects live for the whole process.
class LogSocket {
public:
    enum class Outcome : std::uint8_t { kSent, kDropped, kAbsent };

    explicit LogSocket(const char* path) : path_(path) {}

    /// kAbsent when nobody listens at the path; kDropped when the reader does not keep up or the
    /// entry is too long. From any thread.
    Outcome send(const std::string& entry);

    /// Entries dropped since the last call.
    [[nodiscard]] std::uint32_t takeDroppedCount() { return dropped_.exchange(0); }

private:
    [[nodiscard]] bool connect();

    const char* const path_;
    std::mutex lock_;
    OwnedFd socket_;  // under lock_
    std::atomic<std::uint32_t> dropped_ = 0;
};

inline constexpr const char* kLogIdentity = "LinefoldMobileHelper";

/// The way out for a line whose log is absent: standard error, without its last newline.
void WriteToStandardError(const std::string& text);

}  // namespace platform
