// Watched send rights: the loop hears when the other end of one is gone.
#include "platform/MachPort.h"

#include <utility>

#include "platform/sim/MainLoop.h"
#include "platform/sim/Ports.h"
#include "platform/sim/World.h"

namespace {

class WatchedPort;

class HangUp final : public sim::Source {
public:
    HangUp(WatchedPort& port, const std::shared_ptr<sim::Endpoint>& end) : port_(port), end_(end) {}

    [[nodiscard]] bool isHungUp() const {
        const auto end = end_.lock();
        return end == nullptr || end->isHungUp();
    }

    [[nodiscard]] std::size_t readyCount() const override { return isHungUp() ? 1 : 0; }

    void serve(std::size_t which) override;

private:
    WatchedPort& port_;
    const std::weak_ptr<sim::Endpoint> end_;
};

class WatchedPort final : public platform::MachPort,
                          public std::enable_shared_from_this<WatchedPort> {
public:
    WatchedPort(platform::mach_port_t port,
                const std::shared_ptr<sim::Endpoint>& end,
                void* context)
        : name(port), info(context), source(std::make_shared<HangUp>(*this, end)) {}

    ~WatchedPort() { source->leave(); }

    void end() {
        if (!std::exchange(isWatching, false)) {
            return;
        }
        const auto keptThroughTheCallBack = shared_from_this();
        source->leave();
        if (const auto callOut = std::exchange(callBack, nullptr); callOut != nullptr) {
            callOut(*this, info);
        }
    }

    const platform::mach_port_t name;
    void* const info;
    const std::shared_ptr<HangUp> source;
    platform::MachPortInvalidation callBack = nullptr;
    bool isWatching = true;
};

void HangUp::serve(std::size_t /*which*/) {
    port_.end();
}

}  // namespace

namespace platform {

std::shared_ptr<MachPort> MachPort::create(mach_port_t name, void* info) {
    if (sim::CallFails("MachPort.create")) {
        return nullptr;
    }
    const sim::Port* const port = sim::FindPort(name);
    const auto end =
        port == nullptr ? nullptr : std::dynamic_pointer_cast<sim::Endpoint>(port->send);
    if (end == nullptr || port->sendRights == 0) {
        return nullptr;
    }
    auto watched = std::make_shared<WatchedPort>(name, end, info);
    RunLoop::current().addSource(watched->source);
    return watched;
}

mach_port_t MachPort::port() const {
    return static_cast<const WatchedPort*>(this)->name;
}

void* MachPort::info() const {
    return static_cast<const WatchedPort*>(this)->info;
}

bool MachPort::isValid() const {
    return static_cast<const WatchedPort*>(this)->isWatching;
}

void MachPort::invalidate() {
    sim::NoteCall("MachPort.invalidate");
    static_cast<WatchedPort*>(this)->end();
}

void MachPort::setInvalidationCallBack(MachPortInvalidation callBack) {
    auto* const watched = static_cast<WatchedPort*>(this);
    if (callBack != nullptr) {
        sim::NoteCall("MachPort.setInvalidationCallBack");
    }
    watched->callBack = callBack;
    if (callBack == nullptr) {
        return;
    }
    if (!watched->isWatching) {
        watched->callBack = nullptr;
        callBack(*this, watched->info);
    } else if (watched->source->isHungUp()) {
        watched->end();
    }
}

}  // namespace platform
