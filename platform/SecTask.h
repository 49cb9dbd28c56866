// Task entitlements: what a process may do, asked of the system by the process's audit token.
#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "platform/MachMessage.h"
#include "platform/PropertyList.h"

namespace platform {

class SecTask {
public:
    /// Null when the token does not name a process and a user that can be told apart.
    [[nodiscard]] static std::unique_ptr<SecTask> createWithAuditToken(const AuditToken& token);

    SecTask(const SecTask&) = delete;
    SecTask& operator=(const SecTask&) = delete;
    ~SecTask();

    struct Answer {
        std::optional<PropertyList> value;
        int error = 0;  ///< an errno value; 0 when the question could be answered
    };

    /// The value that is bound to the entitlement for this task. No value and no error: not held.
    [[nodiscard]] Answer copyValueForEntitlement(std::string_view entitlement) const;

private:
    struct State;
    explicit SecTask(std::unique_ptr<State> state);
    std::unique_ptr<State> state_;
};

}  // namespace platform
