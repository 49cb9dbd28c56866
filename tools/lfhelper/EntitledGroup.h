// The group by which the service decides who may call it.
#pragma once

#include <optional>
#include <string>

namespace lfhelper {

/// Makes the group the only one of this process, which stays with its user. The service looks when
/// the connection is made, so this comes first. Only root can take a group; whoever has it as the
/// effective one already goes on as he is. Answers why it is not so now, or nothing.
[[nodiscard]] std::optional<std::string> TakeEntitledGroup(const std::string& name);

}  // namespace lfhelper
