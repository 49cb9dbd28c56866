// The service databases: one for each radio technology, one bit of a request's mask each.
#pragma once

#include <algorithm>
#include <array>
#include <cstdint>

enum class DatabaseType : std::int32_t {
    kUmts = 1,
    kCdma = 2,
    kLte = 4,
    kGsm = 8,
    kScdma = 16,
};

/// The order in which they are read and brought up to date: gsm first, on purpose, and then by bit.
inline constexpr std::array kDatabaseTypes{DatabaseType::kGsm,
                                           DatabaseType::kUmts,
                                           DatabaseType::kCdma,
                                           DatabaseType::kLte,
                                           DatabaseType::kScdma};

/// Key of the record and of the index, and what notifications and log lines say; "unknown" for a
/// value that is none of the five.
[[nodiscard]] constexpr const char* DatabaseTypeName(DatabaseType type) {
    switch (type) {
        case DatabaseType::kUmts:
            return "umts";
        case DatabaseType::kCdma:
            return "cdma";
        case DatabaseType::kLte:
            return "lte";
        case DatabaseType::kGsm:
            return "gsm";
        case DatabaseType::kScdma:
            return "scdma";
    }
    return "unknown";
}

[[nodiscard]] constexpr bool IsKnownDatabaseType(DatabaseType type) {
    return std::ranges::find(kDatabaseTypes, type) != kDatabaseTypes.end();
}

[[nodiscard]] constexpr std::uint32_t MaskOf(DatabaseType type) {
    return static_cast<std::uint32_t>(type);
}
