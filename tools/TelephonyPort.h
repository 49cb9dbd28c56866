// The telephony daemon's side of its port, as docs/wire-protocol.md tells it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/PropertyList.h"
#include "tools/NamedPort.h"

namespace tools {

inline constexpr std::string_view kTelephonyPort = "com.vendra.linefold.server";
inline constexpr std::string_view kDatabasePort = "com.vendra.Linefold.lasd";

/// A text that came with a report; none when the sender left it out, which is not an empty one.
struct ReportedText {
    std::string_view key;   ///< of the message
    std::string_view name;  ///< for people
    std::optional<std::string> value{};
};

struct TelephonyMessage {
    enum class Kind : std::uint8_t {
        kOpen,
        kCivicInfo,
        kLocalRoutableAddress,
        kUnknown  ///< no message of the port, or one whose contents are not as documented
    };

    Kind kind = Kind::kUnknown;
    std::vector<std::string> identifiers{};  ///< of an opening: the clients that are exempted
    std::vector<ReportedText> texts{};       ///< of a report, in the order of its arguments

    /// What brings texts, and waits for an answer.
    [[nodiscard]] bool isReport() const {
        return kind == Kind::kCivicInfo || kind == Kind::kLocalRoutableAddress;
    }
};

[[nodiscard]] TelephonyMessage ReadTelephonyMessage(const PortMessage& message);

/// The status of an answer; an error of 0 is a success.
struct TelephonyStatus {
    std::int32_t domain = 0;
    std::int32_t error = 0;
};

/// False when whoever sent the report is gone.
bool AnswerReport(const NamedPort& port, const PortMessage& report, TelephonyStatus status);

/// Tells the sender of a message something of the daemon's own accord.
bool NotifySender(const NamedPort& port,
                  const PortMessage& message,
                  const platform::PropertyList& notification);

}  // namespace tools
