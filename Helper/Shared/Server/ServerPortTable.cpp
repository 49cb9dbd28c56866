#include "Helper/Shared/Server/ServerPortTable.h"

#include <cstdlib>
#include <memory>
#include <mutex>

#include "Helper/Shared/Server/SortedTable.h"

namespace {

using Table = SortedTable<platform::mach_port_t, MobileHelperServer*>;

constinit std::mutex tableLock;
constinit Table* serverPortTable = nullptr;

void ReleaseTable() {
    const std::lock_guard guard(tableLock);
    delete std::exchange(serverPortTable, nullptr);
}

}  // namespace

void ServerPortTableCreate() {
    static std::once_flag once;
    std::call_once(once, [] {
        const std::lock_guard guard(tableLock);
        serverPortTable = new Table;
        (void)std::atexit(ReleaseTable);  // without it the end of the process releases the table
    });
}

void ServerPortTableAdd(platform::mach_port_t port, MobileHelperServer* server) {
    const std::lock_guard guard(tableLock);
    if (serverPortTable != nullptr) {
        serverPortTable->set(port, server);
    }
}

void ServerPortTableRemove(platform::mach_port_t port) {
    const std::lock_guard guard(tableLock);
    if (serverPortTable != nullptr) {
        serverPortTable->erase(port);
    }
}

MobileHelperServer* ServerForPort(platform::mach_port_t port) {
    const std::lock_guard guard(tableLock);
    return serverPortTable == nullptr ? nullptr : serverPortTable->get(port);
}
