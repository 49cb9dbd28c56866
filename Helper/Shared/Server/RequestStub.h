// The generic stub: sizes and offsets follow from the handler's own parameter types.
#pragma once

#include <cstddef>
#include <cstdint>
#include <tuple>
#include <utility>

#include "Helper/Shared/Server/MessageLayouts.h"
#include "Helper/Shared/Server/MigSubsystem.h"
#include "Helper/Shared/Server/RequestFields.h"

/// Whether a stub writes the NDR record again after its handler, or leaves the preset one.
enum class NdrRecord : bool { kWrittenAgain, kLeftAsPreset };

namespace request_stub {

/// A parameter of a handler: which field it is, and how it travels between message and call.
template <typename T>
struct Parameter;

template <typename T>
concept OutParameter = Parameter<T>::kIsOut;

template <std::size_t N>
consteval Field FieldOfString() {
    static_assert(N == 64 || N == 256 || N == 1024, "no such text field in this interface");
    return N == 64 ? Field::kString64 : N == 256 ? Field::kString256 : Field::kString1024;
}

template <std::size_t N>
struct Parameter<InlineString<N>&> {
    static constexpr Field kField = FieldOfString<N>();
    static constexpr bool kIsOut = false;
    InlineString<N> value;

    Parameter(std::span<const std::byte> request, std::size_t offset)
        : value(std::span<const std::byte, N>(request.subspan(offset, N))) {}
};

template <typename T, Field kFieldOfT>
struct NumberParameter {
    static constexpr Field kField = kFieldOfT;
    static constexpr bool kIsOut = false;
    T value;

    NumberParameter(std::span<const std::byte> request, std::size_t offset)
        : value(platform::Load<T>(request, offset)) {}
};

template <>
struct Parameter<std::int32_t> : NumberParameter<std::int32_t, Field::kInt32> {
    using NumberParameter::NumberParameter;
};

template <>
struct Parameter<double> : NumberParameter<double, Field::kDouble> {
    using NumberParameter::NumberParameter;
};

/// An out value that stands inside the reply.
template <typename T, Field kFieldOfT>
struct OutValueParameter {
    static constexpr Field kField = kFieldOfT;
    static constexpr bool kIsOut = true;
    T value{};

    OutValueParameter(std::span<const std::byte>, std::size_t) {}

    void fill(platform::ReplyMessage& reply) const {
        auto header = reply.header();
        header.size = kOutValueOffset + SizeOfField(kField);
        reply.setHeader(header);
        platform::Store(reply.bytes, kOutValueOffset, value);
    }
};

template <>
struct Parameter<std::int32_t&> : OutValueParameter<std::int32_t, Field::kInt32> {
    using OutValueParameter::OutValueParameter;
};

template <std::size_t N>
struct Parameter<OutString<N>&> : OutValueParameter<OutString<N>, FieldOfString<N>()> {
    using OutValueParameter<OutString<N>, FieldOfString<N>()>::OutValueParameter;
};

/// Bulk data, which makes the reply complex.
template <>
struct Parameter<OutOfLineData&> {
    static constexpr Field kField = Field::kData;
    static constexpr bool kIsOut = true;
    OutOfLineData value;

    Parameter(std::span<const std::byte>, std::size_t) {}

    void fill(platform::ReplyMessage& reply) const;
};

template <typename... Fields>
struct Signature {
    static constexpr std::array<Field, sizeof...(Fields)> kFields{Parameter<Fields>::kField...};
    static constexpr std::array<bool, sizeof...(Fields)> kIsOut{Parameter<Fields>::kIsOut...};

    /// Out values stand in the reply and take no room in the request.
    static consteval std::uint32_t offset(std::size_t index) {
        std::uint32_t offset = kFirstFieldOffset;
        for (std::size_t i = 0; i < index; ++i) {
            offset += kIsOut[i] ? 0 : SizeOfField(kFields[i]);
        }
        return offset;
    }

    static consteval std::uint32_t requestSize() {
        const auto end = offset(sizeof...(Fields));
        return end == kFirstFieldOffset ? sizeof(platform::MachMsgHeader) : end;
    }

    static consteval Field reply() {
        for (std::size_t i = 0; i < sizeof...(Fields); ++i) {
            if (kIsOut[i]) {
                return kFields[i];
            }
        }
        return Field::kNone;
    }

    static consteval bool matches(const RoutineLayout& layout) {
        std::size_t at = 0;
        for (std::size_t i = 0; i < sizeof...(Fields); ++i) {
            if (!kIsOut[i] && (at == layout.request.size() || layout.request[at++] != kFields[i])) {
                return false;
            }
        }
        return (at == layout.request.size() || layout.request[at] == Field::kNone) &&
               layout.requestSize == requestSize() && layout.reply == reply();
    }
};

template <auto kHandler>
struct Stub;

template <typename... Fields, platform::kern_return_t (*kHandler)(platform::mach_port_t, Fields...)>
struct Stub<kHandler> {
    using Shape = Signature<Fields...>;

    template <NdrRecord kNdr>
    static void run(platform::ReceivedMessage& request, platform::ReplyMessage& reply) {
        const platform::MachMsgHeader header = request.header();
        const bool isComplex = (header.bits & platform::MACH_MSGH_BITS_COMPLEX) != 0;
        auto code = isComplex || header.size != Shape::requestSize()
                        ? platform::MIG_BAD_ARGUMENTS
                        : platform::MachMessageAccept(request);
        if (code == platform::KERN_SUCCESS) {
            code = call(request, reply, std::index_sequence_for<Fields...>());
        }
        // A complex reply has no return code, and its NDR record stands elsewhere.
        if (code != platform::KERN_SUCCESS || Shape::reply() != Field::kData) {
            if (kNdr == NdrRecord::kWrittenAgain || code != platform::KERN_SUCCESS) {
                MigSetNdrRecord(reply);
            }
            MigSetReturnCode(reply, code);
        }
    }

private:
    template <std::size_t... kIndex>
    static platform::kern_return_t call(platform::ReceivedMessage& request,
                                        platform::ReplyMessage& reply,
                                        std::index_sequence<kIndex...> /*indices*/) {
        [[maybe_unused]] const std::span<const std::byte> bytes = request.bytes;
        std::tuple<Parameter<Fields>...> fields{Parameter<Fields>(bytes, Shape::offset(kIndex))...};
        const auto code = kHandler(request.header().localPort, std::get<kIndex>(fields).value...);
        if (code == platform::KERN_SUCCESS) {
            (fillReply(std::get<kIndex>(fields), reply), ...);
        }
        return code;
    }

    template <typename T>
    static void fillReply([[maybe_unused]] const T& field,
                          [[maybe_unused]] platform::ReplyMessage& reply) {
        if constexpr (T::kIsOut) {
            field.fill(reply);
        }
    }
};

}  // namespace request_stub

/// The stub of a simple request: refuses a complex or wrongly sized one with MIG_BAD_ARGUMENTS, and
/// sends out values only with success.
template <auto kHandler, NdrRecord kNdr = NdrRecord::kWrittenAgain>
inline constexpr MigStub kSimpleRequestStub = &request_stub::Stub<kHandler>::template run<kNdr>;

/// Whether a handler's parameters are the fields that the layout states.
template <auto kHandler>
consteval bool HandlerMatches(const RoutineLayout& layout) {
    return request_stub::Stub<kHandler>::Shape::matches(layout);
}
