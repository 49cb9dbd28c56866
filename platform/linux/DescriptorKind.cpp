#include "platform/linux/DescriptorKind.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/socket.h>

#include <algorithm>
#include <limits>
#include <memory>
#include <utility>

#include "platform/SerialQueue.h"

namespace platform {
namespace {

constexpr int kKeptBack = 64;
constexpr int kSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK;

int descriptorLimit = std::numeric_limits<int>::max();

int SocketOption(int descriptor, int option) {
    int value = -1;
    socklen_t size = sizeof value;
    return getsockopt(descriptor, SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
}

bool IsConnectedLocalSocket(int descriptor) {
    if (SocketOption(descriptor, SO_DOMAIN) != AF_UNIX) {
        return false;
    }
    const int type = SocketOption(descriptor, SO_TYPE);
    sockaddr_storage peer{};
    socklen_t size = sizeof peer;
    return (type == SOCK_STREAM || type == SOCK_SEQPACKET) &&
           getpeername(descriptor, reinterpret_cast<sockaddr*>(&peer), &size) == 0;
}

}  // namespace

DescriptorKind ClassifyDescriptor(int descriptor) {
    if (IsConnectedLocalSocket(descriptor)) {
        return DescriptorKind::kConnectedLocalSocket;
    }
    if (fcntl(descriptor, F_GETPIPE_SZ) >= 0) {
        return DescriptorKind::kPipe;
    }
    return fcntl(descriptor, F_GET_SEALS) >= 0 ? DescriptorKind::kMemoryFile
                                               : DescriptorKind::kOther;
}

bool IsSealedMemoryFile(int descriptor) {
    const int seals = fcntl(descriptor, F_GET_SEALS);
    return seals >= 0 && (seals & kSeals) == kSeals;
}

void CloseForeignDescriptor(OwnedFd descriptor) {
    if (!descriptor.isOpen() || ClassifyDescriptor(descriptor.get()) != DescriptorKind::kOther) {
        return;
    }
    static const auto* const closer = new SerialQueue("closer", QualityOfService::kUtility);
    closer->async([shared = std::make_shared<OwnedFd>(std::move(descriptor))] { shared->reset(); });
}

int ForeignDescriptorLimit() {
    return descriptorLimit;
}

void UpdateForeignDescriptorLimit() {
    rlimit limit{};
    if (getrlimit(RLIMIT_NOFILE, &limit) == 0) {
        const auto soft = std::min<rlim_t>(limit.rlim_cur, std::numeric_limits<int>::max());
        descriptorLimit = std::max(static_cast<int>(soft) - kKeptBack, 0);
    }
}

}  // namespace platform
