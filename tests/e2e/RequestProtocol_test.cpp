// The request protocol's rules, as a client of the real daemon sees them.
#include <gtest/gtest.h>

#include "tests/support/PhoneRoot.h"

namespace {

class RequestProtocol : public testing::Test {
protected:
    [[nodiscard]] std::int32_t codeOf(std::int32_t id,
                                      std::size_t size,
                                      std::uint32_t bits = 0) const {
        return client_.privatePort.call(phone::Message(id, size, bits)).code();
    }

    phone::Daemon daemon_;
    phone::Client client_ = phone::Client::checkIn();
};

TEST_F(RequestProtocol, OneByteTooFewOrTooManyIsRefused) {
    EXPECT_EQ(codeOf(8683549, 287), -304);
    EXPECT_EQ(codeOf(8683549, 289), -304);
    EXPECT_NE(codeOf(8683549, 288), -304);
}

TEST_F(RequestProtocol, IdsBesideTheTableAreUnknown) {
    EXPECT_EQ(codeOf(8683548, 24), -303);
    EXPECT_EQ(codeOf(8683573, 24), -303);
    EXPECT_EQ(codeOf(kCheckInId, 40, platform::MACH_MSGH_BITS_COMPLEX), -303);
}

TEST_F(RequestProtocol, ComplexBitIsRefusedWhereNoneBelongs) {
    EXPECT_EQ(codeOf(8683551, 24, platform::MACH_MSGH_BITS_COMPLEX), -304);
    EXPECT_EQ(codeOf(8683555, 568), -304) << "and missed where it does";
}

TEST_F(RequestProtocol, RequestsAreAnsweredInOrder) {
    for (std::int32_t id = 8683540; id < 8683548; ++id) {
        ASSERT_TRUE(client_.privatePort.send(phone::Message(id, 24)));
    }
    for (std::int32_t id = 8683540; id < 8683548; ++id) {
        EXPECT_EQ(client_.privatePort.receive().header().id, id + 100);
    }
}

TEST_F(RequestProtocol, EveryRoutineAnswersAWellFormedRequest) {
    for (const RoutineLayout& layout : kRoutineLayouts) {
        const auto bits = layout.bringsData() ? platform::MACH_MSGH_BITS_COMPLEX : 0;
        auto message = phone::Message(layout.id, layout.requestSize, bits);
        if (layout.bringsData()) {
            message[platform::kOffsetOfDescriptorCount] = std::byte{1};
            message[platform::kOffsetOfDescriptorType] = std::byte{1};
        }
        const auto reply = client_.privatePort.call(message);
        EXPECT_EQ(reply.header().id, layout.id + 100) << layout.name;
        EXPECT_GE(reply.bytes.size(), 36U) << layout.name;
    }
}

}  // namespace
