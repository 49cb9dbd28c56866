#include "platform/hvu/cf.h"

bool hvu::cf::assign(std::string& text, const platform::PropertyList* value) {
    const auto* const string = value == nullptr ? nullptr : value->as<std::string>();
    if (string != nullptr) {
        text = *string;
    }
    return string != nullptr;
}
