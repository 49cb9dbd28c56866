// XML property lists, in and out.
#pragma once

#include <functional>
#include <optional>
#include <string_view>

#include "platform/PropertyList.h"
#include "platform/PropertyListLimits.h"

namespace platform {

/// Parses at most PropertyListLimits::bytes of text, under the rules of PropertyListCreateWithData.
/// Every element that property lists have no name for, every attribute but those of the plist
/// element, and every declaration inside the document type are refused. Carriage returns stay.
[[nodiscard]] std::optional<PropertyList> ReadXmlPropertyList(std::string_view text);

/// The bytes of the XML form; none when the value exceeds the limits or what XML 1.0 can hold.
[[nodiscard]] std::optional<std::size_t> XmlPropertyListSize(const PropertyList& value);

/// Takes a piece of the text.
using PropertyListSink = std::function<void(std::string_view)>;

/// Hands out the XML form piece by piece, so that a large one need not lie in memory as a whole.
/// For values that have a size.
void WriteXmlPropertyList(const PropertyList& value, const PropertyListSink& sink);

}  // namespace platform
