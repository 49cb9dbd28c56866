#include "tests/support/ZipWriter.h"

#include <array>
#include <utility>

namespace zip {
namespace {

constexpr std::uint16_t kDeflated = 8;

std::string HeaderFields(const Entry& entry, const Fields& fields) {
    const auto size = entry.size.value_or(static_cast<std::uint32_t>(entry.data.size()));
    return Number(fields.flags.value_or(entry.flags), 2) +
           Number(fields.method.value_or(entry.method), 2) + Number(0x6000, 2) +  // 12:00:00
           Number(0x5A21, 2) +                                                    // 2025-01-01
           Number(fields.crc.value_or(entry.crc.value_or(Crc32(entry.data))), 4) +
           Number(fields.compressedSize.value_or(entry.data.size()), 4) +
           Number(fields.size.value_or(size), 4) +
           Number(fields.name.value_or(entry.name).size(), 2) + Number(fields.extra.size(), 2);
}

std::string LocalHeader(const Entry& entry) {
    return "PK\3\4" + Number(20, 2) + HeaderFields(entry, entry.local) +
           entry.local.name.value_or(entry.name) + entry.local.extra;
}

std::string DirectoryRecord(const Entry& entry, std::size_t offset) {
    return "PK\1\2" + Number(20, 1) + Number(entry.system, 1) + Number(20, 2) +
           HeaderFields(entry, entry.central) + Number(0, 2) + Number(0, 2) + Number(0, 2) +
           Number(std::uint64_t{entry.mode} << 16, 4) + Number(entry.offset.value_or(offset), 4) +
           entry.central.name.value_or(entry.name) + entry.central.extra;
}

/// Bits in the order of a deflated stream; Huffman codes begin with their highest bit.
class Bits {
public:
    void add(std::uint32_t value, int count) {
        for (int i = 0; i < count; ++i) {
            addBit((value >> i) & 1U);
        }
    }

    void addCode(std::uint32_t code, int count) {
        while (count-- > 0) {
            addBit((code >> count) & 1U);
        }
    }

    /// Puts a copy of the last bytes behind them, so many times: for codes whose bits repeat so.
    void repeat(std::size_t bytes, std::uint32_t times) {
        const std::string pattern = bytes_.substr(bytes_.size() - bytes);
        bytes_.reserve(bytes_.size() + bytes * times);
        for (; times > 0; --times) {
            bytes_ += pattern;
        }
    }

    [[nodiscard]] std::string take() {
        addBit(0);
        while (filled_ != 0) {
            addBit(0);
        }
        return std::move(bytes_);
    }

private:
    void addBit(std::uint32_t bit) {
        last_ |= bit << filled_;
        if (++filled_ == 8) {
            bytes_ += static_cast<char>(last_);
            last_ = 0;
            filled_ = 0;
        }
    }

    std::string bytes_;
    std::uint32_t last_ = 0;
    unsigned filled_ = 0;
};

std::string DeflateZeros(std::uint32_t size) {
    constexpr std::uint32_t kLongest = 258;
    constexpr std::uint32_t kLiteralZero = 0x30;
    constexpr std::uint32_t kCodeOf258 = 0xC5;
    constexpr std::uint32_t kRepeating = 16;
    Bits bits;
    const auto addCopy = [&] {
        bits.addCode(kCodeOf258, 8);
        bits.addCode(0, 5);
    };
    bits.add(1, 1);  // the last block
    bits.add(1, 2);  // with the fixed codes
    if (size > 0) {
        bits.addCode(kLiteralZero, 8);
        --size;
    }
    std::uint32_t copies = size / kLongest;
    size %= kLongest;
    for (std::uint32_t i = 0; i < kRepeating && copies > 0; ++i, --copies) {
        addCopy();
    }
    // Eight codes of thirteen bits are thirteen bytes.
    if (copies >= 8) {
        bits.repeat(13, copies / 8);
    }
    for (copies %= 8; copies > 0; --copies) {
        addCopy();
    }
    for (; size > 0; --size) {
        bits.addCode(kLiteralZero, 8);
    }
    bits.addCode(0, 7);  // the end
    return bits.take();
}

}  // namespace

std::string Number(std::uint64_t value, std::size_t bytes) {
    std::string number;
    for (; bytes > 0; --bytes, value >>= 8) {
        number += static_cast<char>(value);
    }
    return number;
}

std::uint32_t Crc32(std::string_view data) {
    static const auto table = [] {
        std::array<std::uint32_t, 256> made{};
        for (std::uint32_t i = 0; i < made.size(); ++i) {
            made[i] = i;
            for (int bit = 0; bit < 8; ++bit) {
                made[i] = (made[i] >> 1) ^ ((made[i] & 1U) != 0 ? 0xEDB88320U : 0U);
            }
        }
        return made;
    }();
    std::uint32_t crc = 0xFFFFFFFF;
    for (const char c : data) {
        crc = (crc >> 8) ^ table[(crc ^ static_cast<unsigned char>(c)) & 0xFF];
    }
    return ~crc;
}

Entry File(std::string name, std::string data, std::uint32_t mode) {
    return {.name = std::move(name), .data = std::move(data), .mode = kFile | mode};
}

Entry Folder(std::string name, std::uint32_t mode) {
    return {.name = std::move(name), .mode = kFolder | mode};
}

Entry Link(std::string name, std::string target) {
    return {.name = std::move(name), .data = std::move(target), .mode = kLink | 0777};
}

Entry Zeros(std::string name, std::uint32_t size) {
    constexpr std::uint32_t kMostSummed = 64 << 20;
    return {.name = std::move(name),
            .data = DeflateZeros(size),
            .method = kDeflated,
            .size = size,
            .crc = size <= kMostSummed ? Crc32(std::string(size, '\0')) : 0};
}

Entry Zip64(Entry entry, std::uint64_t size, std::uint64_t compressedSize) {
    const std::string extra =
        Number(1, 2) + Number(16, 2) + Number(size, 8) + Number(compressedSize, 8);
    for (Fields* const fields : {&entry.local, &entry.central}) {
        fields->size = 0xFFFFFFFF;
        fields->compressedSize = 0xFFFFFFFF;
        fields->extra = extra;
    }
    return entry;
}

std::string Write(const Archive& archive) {
    std::string bytes = archive.before;
    std::string directory;
    for (const Entry& entry : archive.entries) {
        directory += DirectoryRecord(entry, bytes.size());
        if (entry.hasHeader) {
            bytes += LocalHeader(entry) + entry.data;
        }
    }
    const auto count = archive.count.value_or(static_cast<std::uint16_t>(archive.entries.size()));
    const std::size_t offset = bytes.size();
    bytes += directory + archive.locator;
    return bytes + "PK\5\6" + Number(0, 4) + Number(count, 2) + Number(count, 2) +
           Number(archive.directorySize.value_or(directory.size()), 4) +
           Number(archive.directoryOffset.value_or(offset), 4) + Number(archive.comment.size(), 2) +
           archive.comment;
}

std::string Write(std::vector<Entry> entries) {
    return Write(Archive{.entries = std::move(entries)});
}

}  // namespace zip
