// Whether a location look-up is waited for.
#pragma once

/// A look-up was submitted.
void LocationWaitFlagSet();

/// Clears the flag, in one step, and tells whether it was set: of an answer and a time-out that
/// meet, one reports. There is one flag for both kinds of look-up on purpose: the first answer or
/// time-out of either ends the wait of both, and the other kind is not reported at all.
[[nodiscard]] bool LocationWaitFlagTake();
