// What the wire tests share: a daemon of the suite's own, a client of it, and what must not change.
#pragma once

#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <memory>
#include <span>
#include <utility>
#include <vector>

#include "platform/MachMessage.h"
#include "tests/support/PhoneRoot.h"

namespace wire {

using phone::Bytes;
using platform::OwnedFd;

// The codes of the documentation, written out once more: the sources' own constants would agree
// with any mistake.
inline constexpr std::int32_t kSuccess = 0;
inline constexpr std::int32_t kFailure = 5;
inline constexpr std::int32_t kResourceShortage = 6;
inline constexpr std::int32_t kNoAccess = 8;
inline constexpr std::int32_t kInvalidSecurity = 35;
inline constexpr std::int32_t kTypeError = -300;
inline constexpr std::int32_t kBadId = -303;
inline constexpr std::int32_t kBadArguments = -304;

inline constexpr std::uint32_t kComplex = 0x80000000;
inline constexpr std::size_t kHeaderSize = 24;

template <typename T>
void Put(Bytes& message, std::size_t offset, const T& value) {
    platform::Store(std::span<std::byte>(message), offset, value);
}

/// A request that its stub accepts: zeros in all fields, and no data where data belongs.
[[nodiscard]] Bytes WellFormedRequest(const RoutineLayout& layout);

/// The 36 bytes that answer a request with nothing but a code.
[[nodiscard]] Bytes SimpleReply(std::int32_t requestId, std::int32_t code);

/// Sends one request and tells the code of its reply, of which each byte is checked.
[[nodiscard]] std::int32_t CodeOf(const phone::Connection& connection,
                                  std::span<const std::byte> request,
                                  std::span<const int> descriptors = {});

using Ends = std::pair<OwnedFd, OwnedFd>;

[[nodiscard]] Ends Pipe();
[[nodiscard]] Ends SocketPair(int type);

/// A memory file of `size` bytes with these seals.
[[nodiscard]] OwnedFd MemoryFile(std::size_t size, int seals);

[[nodiscard]] std::size_t OpenDescriptors(pid_t pid);

/// Each suite has a daemon of its own, and each test a client. Behind each test the daemon has as
/// many descriptors open as before it.
class WireTest : public testing::Test {
protected:
    static void SetUpTestSuite();
    static void TearDownTestSuite();

    void SetUp() override;
    void TearDown() override;

    [[nodiscard]] std::int32_t codeOf(std::span<const std::byte> request,
                                      std::span<const int> descriptors = {}) const {
        return CodeOf(client_.privatePort, request, descriptors);
    }

    static inline std::unique_ptr<phone::Daemon> daemon_;
    phone::Client client_;

private:
    /// Keeps the daemon from leaving between two tests.
    static inline phone::Client resident_;
    std::size_t descriptorsBefore_ = 0;
};

}  // namespace wire
