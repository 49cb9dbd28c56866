// Reports to the telephony daemon, on a connection of its own for each.
#pragma once

#include <string>

/// A civic address as far as it is known; UTF-8, empty where it is not.
struct CivicFields {
    std::string countryCode{};
    std::string state{};
    std::string city{};
    std::string postalCode{};
};

/// Both calls wait for the telephony daemon, two seconds at most, and only log what became of the
/// report: there is no second try. From any thread but the main loop's.
class TelephonyClient {
public:
    static void sendCivicInfoToHV(const CivicFields& fields);

    /// An empty address tells the daemon that there is none.
    static void sendWanIPToHV(const std::string& address);
};
