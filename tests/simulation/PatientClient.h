// A client as the client library has it: it waits for its answer, and connects again when the
// daemon left without one.
#pragma once

#include <gtest/gtest.h>

#include <functional>

#include "tests/support/TestClient.h"

class PatientClient {
public:
    PatientClient(std::int32_t pid, std::uint32_t gid) : client(pid, gid) {}

    PatientClient(const PatientClient&) = delete;
    PatientClient& operator=(const PatientClient&) = delete;

    /// Connects, sends its check-in and goes on with `then` when the answer is here.
    void checkIn(std::function<void(platform::kern_return_t)> then) {
        then_ = std::move(then);
        connect();
    }

    [[nodiscard]] int connections() const { return connections_; }

    [[nodiscard]] bool isAnswered() const { return isAnswered_; }

    /// Gives up waiting, as a process that ends does.
    void die() {
        isGone_ = true;
        client.die();
    }

    TestClient client;

private:
    static constexpr double kPollInterval = 0.001;
    static constexpr int kPollsInHaste = 1000;  ///< from then on it looks once a second
    static constexpr int kPollsMax = 1100;

    void connect() {
        ++connections_;
        polls_ = 0;
        client.closeAll();
        client.sendCheckIn();
        sim::In(kPollInterval, [this] { poll(); });
    }

    void poll() {
        if (isGone_) {
            return;
        }
        const auto code = client.readCheckIn();
        if (code != kNoReply) {
            isAnswered_ = true;
            then_(code);
        } else if (client.service.isHungUp()) {
            connect();
        } else if (++polls_ < kPollsMax) {
            sim::In(polls_ < kPollsInHaste ? kPollInterval : 1.0, [this] { poll(); });
        } else {
            ADD_FAILURE() << "client " << client.identity.pid << " waits for ever at "
                          << sim::Now();
        }
    }

    std::function<void(platform::kern_return_t)> then_;
    int connections_ = 0;
    int polls_ = 0;
    bool isAnswered_ = false;
    bool isGone_ = false;
};
