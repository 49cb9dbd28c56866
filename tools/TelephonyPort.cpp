#include "tools/TelephonyPort.h"

#include <array>
#include <utility>

namespace tools {
namespace {

using platform::PropertyList;

// The numbers of the messages.
constexpr std::int32_t kOpen = 1;
constexpr std::int32_t kSetCivicInfo = 2;
constexpr std::int32_t kSetLocalRoutableAddress = 3;
constexpr std::int32_t kReplyOffset = 100;
constexpr std::int32_t kNotification = 200;

/// What the keys of a report stand for. False when one holds anything but a text.
bool TakeTexts(const PropertyList& body, std::vector<ReportedText>& texts) {
    for (ReportedText& text : texts) {
        const PropertyList* const value = body.find(text.key);
        const auto* const string = value == nullptr ? nullptr : value->as<std::string>();
        if (value != nullptr && string == nullptr) {
            return false;
        }
        if (string != nullptr) {
            text.value = *string;
        }
    }
    return true;
}

TelephonyMessage ReadReport(TelephonyMessage::Kind kind,
                            const PropertyList& body,
                            std::vector<ReportedText> texts) {
    return TakeTexts(body, texts) ? TelephonyMessage{.kind = kind, .texts = std::move(texts)}
                                  : TelephonyMessage();
}

TelephonyMessage ReadOpening(const PropertyList& body) {
    TelephonyMessage message{.kind = TelephonyMessage::Kind::kOpen};
    const PropertyList* const value = body.find("IdentifierExceptions");
    const auto* const list = value == nullptr ? nullptr : value->as<PropertyList::Array>();
    if (list == nullptr) {
        return {};
    }
    for (const PropertyList& entry : *list) {
        const auto* const identifier = entry.as<std::string>();
        if (identifier == nullptr) {
            return {};
        }
        message.identifiers.push_back(*identifier);
    }
    return message;
}

bool Send(const NamedPort& port, int sender, std::int32_t id, const PropertyList& body) {
    const auto bytes = platform::PropertyListCreateXmlData(body);
    return bytes && port.send(sender, id, *bytes);
}

}  // namespace

TelephonyMessage ReadTelephonyMessage(const PortMessage& message) {
    const auto body = platform::PropertyListCreateWithData(message.body);
    if (!body || body->kind() != PropertyList::Kind::kDictionary) {
        return {};
    }
    switch (message.id) {
        case kOpen:
            return ReadOpening(*body);
        case kSetCivicInfo:
            return ReadReport(TelephonyMessage::Kind::kCivicInfo,
                              *body,
                              {{.key = "CountryCode", .name = "country code"},
                               {.key = "State", .name = "state"},
                               {.key = "City", .name = "city"},
                               {.key = "PostalCode", .name = "postal code"}});
        case kSetLocalRoutableAddress:
            return ReadReport(TelephonyMessage::Kind::kLocalRoutableAddress,
                              *body,
                              {{.key = "Address", .name = "address"}});
        default:
            return {};
    }
}

bool AnswerReport(const NamedPort& port, const PortMessage& report, TelephonyStatus status) {
    const PropertyList answer(
        PropertyList::Dictionary{{"Domain", PropertyList(std::int64_t{status.domain})},
                                 {"Error", PropertyList(std::int64_t{status.error})}});
    return Send(port, report.sender, report.id + kReplyOffset, answer);
}

bool NotifySender(const NamedPort& port,
                  const PortMessage& message,
                  const PropertyList& notification) {
    return Send(port, message.sender, kNotification, notification);
}

}  // namespace tools
