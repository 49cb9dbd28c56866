// A descriptor with one owner.
#pragma once

#include <unistd.h>

#include <utility>

namespace platform {

class OwnedFd {
public:
    OwnedFd() = default;

    explicit OwnedFd(int descriptor) : descriptor_(descriptor) {}

    OwnedFd(OwnedFd&& other) noexcept : descriptor_(other.release()) {}

    OwnedFd& operator=(OwnedFd&& other) noexcept {
        reset(other.release());
        return *this;
    }

    OwnedFd(const OwnedFd&) = delete;
    OwnedFd& operator=(const OwnedFd&) = delete;

    ~OwnedFd() { reset(); }

    [[nodiscard]] int get() const { return descriptor_; }

    [[nodiscard]] bool isOpen() const { return descriptor_ >= 0; }

    [[nodiscard]] int release() { return std::exchange(descriptor_, -1); }

    void reset(int descriptor = -1) {
        if (const int old = std::exchange(descriptor_, descriptor); old >= 0) {
            close(old);
        }
    }

private:
    int descriptor_ = -1;
};

}  // namespace platform
