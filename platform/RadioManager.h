// The platform's radio manager, which drives the modem and its radios.
#pragma once

namespace platform {

/// Has the radio manager log everything (true) or errors alone (false). From any thread; returns at
/// once and reports nothing: the request goes out behind the earlier ones, and where no radio
/// manager runs nothing happens, which is normal.
void RadioManagerSetLogToFile(bool isEnabled);

}  // namespace platform
