// Whether the subscriber uses visual voicemail.
#pragma once

#include <mutex>

/// Asks the platform's visual-voicemail library. The library is loaded by the first question, from
/// whatever thread, and stays; whether it is there is looked at that once and never again.
class VoicemailSubscription {
public:
    /// False without the library or its function.
    [[nodiscard]] bool isSubscribed();

private:
    /// A boolean of the library's, whatever its language makes true.
    using IsSubscribed = unsigned char();

    void lookUp();

    std::once_flag isLookedUp_;
    IsSubscribed* function_ = nullptr;
};
