// Ports: names for the ends of message queues, and the rights that this process holds to them.
#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

namespace platform {

// The names of the port interface keep the spelling that everybody knows them by.
using mach_port_t = std::uint32_t;
using kern_return_t = std::int32_t;

inline constexpr mach_port_t MACH_PORT_NULL = 0;
inline constexpr mach_port_t MACH_PORT_DEAD = 0xFFFFFFFF;

inline constexpr kern_return_t KERN_SUCCESS = 0;
inline constexpr kern_return_t KERN_NO_SPACE = 3;
inline constexpr kern_return_t KERN_INVALID_ARGUMENT = 4;
inline constexpr kern_return_t KERN_FAILURE = 5;
inline constexpr kern_return_t KERN_RESOURCE_SHORTAGE = 6;
inline constexpr kern_return_t KERN_NO_ACCESS = 8;
inline constexpr kern_return_t KERN_INVALID_NAME = 15;
inline constexpr kern_return_t KERN_INVALID_RIGHT = 17;
inline constexpr kern_return_t KERN_INVALID_SECURITY = 35;

enum class MachPortRight : std::uint8_t { kSend, kReceive };

/// How a right travels in a port descriptor, or is made.
enum class MachMsgType : std::uint8_t { kMoveSend = 17, kCopySend = 19, kMakeSend = 20 };

/// True for a name that can stand for a port.
[[nodiscard]] constexpr bool MachPortIsValid(mach_port_t name) {
    return name != MACH_PORT_NULL && name != MACH_PORT_DEAD;
}

/// Makes a port of which this process holds the receive right; `*name` is written on success only.
/// KERN_RESOURCE_SHORTAGE without descriptors, KERN_NO_SPACE without memory,
/// KERN_INVALID_ARGUMENT for any right but the receive right.
[[nodiscard]] kern_return_t mach_port_allocate(MachPortRight right, mach_port_t* name);

/// Makes a send right to a port whose receive right is here (kMakeSend, nothing else).
/// KERN_INVALID_NAME, KERN_INVALID_RIGHT (no receive right), KERN_INVALID_ARGUMENT.
[[nodiscard]] kern_return_t mach_port_insert_right(mach_port_t name, MachMsgType disposition);

/// Drops one right of a kind (`delta` is -1); a name without rights is gone and not reused soon.
/// KERN_INVALID_NAME, KERN_INVALID_RIGHT, KERN_INVALID_ARGUMENT (any other delta).
kern_return_t mach_port_mod_refs(mach_port_t name, MachPortRight right, int delta);

/// Drops one send right. Releasing twice is harmless: KERN_INVALID_NAME.
kern_return_t mach_port_deallocate(mach_port_t name);

/// Takes over the receive right of a service that the service manager started this process for, or
/// else claims the service itself. KERN_FAILURE when somebody alive holds it or it cannot be made.
[[nodiscard]] kern_return_t bootstrap_check_in(std::string_view serviceName, mach_port_t* port);

class MachPort;

/// Runs on the loop that created the object, once, when the other side of the port is gone or the
/// object is invalidated.
using MachPortInvalidation = void (*)(MachPort& port, void* info);

/// A send right whose death is noticed. What arrives on it is ignored and wakes nobody.
/// Not thread-safe: it belongs to the loop of the thread that created it.
class MachPort {
public:
    /// Null when the right is of a kind whose end cannot be noticed, or resources are short.
    /// The right itself stays with the caller.
    [[nodiscard]] static std::shared_ptr<MachPort> create(mach_port_t name, void* info);

    MachPort(const MachPort&) = delete;
    MachPort& operator=(const MachPort&) = delete;

    [[nodiscard]] mach_port_t port() const;
    [[nodiscard]] void* info() const;
    [[nodiscard]] bool isValid() const;

    /// Stops watching; a callback that is set runs before this returns. Twice is harmless. Whoever
    /// calls holds the object until then: the callback may let go of it.
    void invalidate();

    /// A port that is dead already is invalidated at once, and the callback runs before this
    /// returns. Null clears.
    void setInvalidationCallBack(MachPortInvalidation callBack);

protected:
    MachPort() = default;
    ~MachPort() = default;
};

}  // namespace platform
