// PathPolicy: which paths a request may have replaced, removed, copied over or moved onto.
//
// Paths are taken as they came: nothing is normalised and nothing is resolved before the tests.
#pragma once

#include <string_view>

inline constexpr std::string_view kCarrierBundleId = "com.vendra.carrier";
inline constexpr std::string_view kCarrier1BundleId = "com.vendra.carrier_1";
inline constexpr std::string_view kCarrier2BundleId = "com.vendra.carrier_2";
inline constexpr std::string_view kOperatorBundleId = "com.vendra.operator";
inline constexpr std::string_view kOperator1BundleId = "com.vendra.operator_1";
inline constexpr std::string_view kOperator2BundleId = "com.vendra.operator_2";
inline constexpr std::string_view kBootstrapBundleId = "com.vendra.carrier.bootstrap";
inline constexpr std::string_view kDefaultBundleId = "com.vendra.carrier.default";
inline constexpr const char* kPlistExtension = ".plist";
inline constexpr const char* kUserCBDir = "/Library/Carrier Bundles/";

/// True for the 32 carrier and operator preference files and bundle links, unless an existing
/// directory or FIFO stands there. Says so in the log when true.
[[nodiscard]] bool IsAllowedLinkPath(const char* path);

/// True for anything below the carrier-bundle directories, for what IsAllowedLinkPath admits, and
/// for a carrier archive below a directory whose name begins with "/tmp". Says why in the log.
[[nodiscard]] bool IsAllowedCarrierPath(const char* path);
