#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <thread>

#include "tests/contract/Twin.h"

namespace twin {

void Reset() {}

void Spend(double seconds) {
    std::this_thread::sleep_for(std::chrono::duration<double>(seconds));
}

Pair MakePair() {
    std::array<int, 2> ends{-1, -1};
    (void)socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data());
    return {.descriptor = ends[0], .closeOther = [other = ends[1]] { close(other); }};
}

}  // namespace twin
