// The one owner of a file descriptor.
#pragma once

#include <unistd.h>

#include <utility>

namespace linefold_client {

class Descriptor final {
public:
    Descriptor() = default;

    explicit Descriptor(int number) : number_(number) {}

    Descriptor(Descriptor&& other) noexcept : number_(other.release()) {}

    Descriptor& operator=(Descriptor&& other) noexcept {
        if (this != &other) {
            reset();
            number_ = other.release();
        }
        return *this;
    }

    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;

    ~Descriptor() { reset(); }

    [[nodiscard]] int get() const { return number_; }

    [[nodiscard]] bool isOpen() const { return number_ >= 0; }

    [[nodiscard]] int release() { return std::exchange(number_, -1); }

    void reset() {
        if (isOpen()) {
            // Linux frees the number whatever close answers, so there is nothing to try again.
            (void)close(release());
        }
    }

private:
    int number_ = -1;
};

}  // namespace linefold_client
