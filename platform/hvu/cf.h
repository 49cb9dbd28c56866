// Conversions out of property-list values.
#pragma once

#include <string>

#include "platform/PropertyList.h"

namespace hvu::cf {

/// Makes `text` what a string value holds. False, and `text` is untouched, when the value is none
/// or of another kind.
[[nodiscard]] bool assign(std::string& text, const platform::PropertyList* value);

}  // namespace hvu::cf
