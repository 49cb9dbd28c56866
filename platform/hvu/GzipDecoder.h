// Decodes gzip data (RFC 1952) that arrives piece by piece.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>

namespace hvu::Compression {

/// All members of the data are decoded, one behind the other. At its end there may be zero bytes,
/// which tapes leave, and nothing else.
class GzipDecoder final {
public:
    enum class Result : std::uint8_t {
        kGoOn,
        kDamaged,
        kTooLarge,  ///< it decodes to more than the maximum; up to that, all was handed over
        kSinkFailed,
    };

    /// Takes what was decoded; false when it cannot.
    using Sink = std::function<bool(std::span<const std::byte>)>;

    GzipDecoder(std::uint64_t outputMax, Sink sink);
    GzipDecoder(const GzipDecoder&) = delete;
    GzipDecoder& operator=(const GzipDecoder&) = delete;
    ~GzipDecoder();

    /// Decodes what this piece completes. After another result than kGoOn it gives that again.
    [[nodiscard]] Result decode(std::span<const std::byte> piece);

    /// True when what has come so far is whole: at least one member, and none in the middle.
    [[nodiscard]] bool isComplete() const;

private:
    struct State;
    const std::unique_ptr<State> state_;
};

}  // namespace hvu::Compression
