// Other processes: who lives, who watches for their end, and what they are entitled to.
#include <algorithm>
#include <cerrno>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "platform/ProcessExit.h"
#include "platform/SecTask.h"
#include "platform/sim/SimClient.h"
#include "platform/sim/World.h"

using platform::PropertyList;

namespace {

constexpr std::uint32_t kOverflowId = 65534;

class ExitSource;

struct ProcessTable {
    std::map<std::int32_t, std::uint64_t> living;  // process id, and which of its bearers it is
    std::uint64_t started = 0;
    std::vector<std::shared_ptr<ExitSource>> sources;  // active ones
    std::map<std::pair<std::uint32_t, std::string>, PropertyList> groupGrants;
    std::map<std::pair<std::int32_t, std::string>, PropertyList> processGrants;
};

ProcessTable& Processes() {
    static auto& table = *new ProcessTable;
    return table;
}

class ExitSource final : public platform::ProcessExitSource,
                         public std::enable_shared_from_this<ExitSource> {
public:
    ExitSource(std::int32_t pid, std::uint64_t bearer) : pid_(pid), bearer_(bearer) {}

    ~ExitSource() = default;

    void exited(std::int32_t pid) {
        if (pid == pid_) {
            sim::GlobalQueue().tasks.post([self = shared_from_this()] { self->notify(); });
        }
    }

    void end() {
        if (std::exchange(isCancelled_, true)) {
            return;
        }
        std::erase(Processes().sources, shared_from_this());
        if (onCancel) {
            sim::GlobalQueue().tasks.post(std::exchange(onCancel, nullptr));
        }
    }

    [[nodiscard]] bool lives() const {
        const auto process = Processes().living.find(pid_);
        return process != Processes().living.end() && process->second == bearer_;
    }

    std::function<void()> onEvent;
    std::function<void()> onCancel;

private:
    void notify() {
        if (!isCancelled_ && onEvent) {
            onEvent();
        }
    }

    const std::int32_t pid_;
    const std::uint64_t bearer_;
    bool isCancelled_ = false;
};

ExitSource& AsExitSource(platform::ProcessExitSource& source) {
    return static_cast<ExitSource&>(source);
}

}  // namespace

namespace sim {

void StartProcess(std::int32_t pid) {
    if (pid > 0 && !Processes().living.contains(pid)) {
        Processes().living.emplace(pid, ++Processes().started);
    }
}

void ExitProcess(std::int32_t pid) {
    if (Processes().living.erase(pid) != 0) {
        const auto sources = Processes().sources;
        for (const auto& source : sources) {
            source->exited(pid);
        }
    }
}

void ExitAllProcesses() {
    while (!Processes().living.empty()) {
        ExitProcess(Processes().living.begin()->first);
    }
}

void ResetProcesses() {
    Processes().sources.clear();
    Processes().groupGrants.clear();
    Processes().processGrants.clear();
}

void GrantToGroup(std::uint32_t gid, std::string_view entitlement, PropertyList value) {
    Processes().groupGrants.insert_or_assign({gid, std::string(entitlement)}, std::move(value));
}

void GrantToProcess(std::int32_t pid, std::string_view entitlement, PropertyList value) {
    Processes().processGrants.insert_or_assign({pid, std::string(entitlement)}, std::move(value));
}

}  // namespace sim

namespace platform {

std::shared_ptr<ProcessExitSource> ProcessExitSource::create(std::int32_t pid) {
    const auto process = Processes().living.find(pid);
    if (sim::CallFails("ProcessExitSource.create", std::to_string(pid)) ||
        process == Processes().living.end()) {
        return nullptr;
    }
    return std::make_shared<ExitSource>(pid, process->second);
}

void ProcessExitSource::setEventHandler(std::function<void()> handler) {
    AsExitSource(*this).onEvent = std::move(handler);
}

void ProcessExitSource::setCancelHandler(std::function<void()> handler) {
    AsExitSource(*this).onCancel = std::move(handler);
}

void ProcessExitSource::activate() {
    auto& source = AsExitSource(*this);
    Processes().sources.push_back(source.shared_from_this());
    if (!source.lives()) {
        sim::GlobalQueue().tasks.post([kept = source.shared_from_this()] {
            if (kept->onEvent) {
                kept->onEvent();
            }
        });
    }
}

void ProcessExitSource::cancel() {
    sim::NoteCall("ProcessExitSource.cancel");
    AsExitSource(*this).end();
}

bool ProcessExitSource::processLives() const {
    return static_cast<const ExitSource*>(this)->lives();
}

struct SecTask::State {
    AuditIdentity identity;
};

SecTask::SecTask(std::unique_ptr<State> state) : state_(std::move(state)) {}

SecTask::~SecTask() = default;

std::unique_ptr<SecTask> SecTask::createWithAuditToken(const AuditToken& token) {
    const AuditIdentity identity = audit_token_to_identity(token);
    const auto isUnknown = [](std::uint32_t id) {
        return id == kOverflowId || id == kUnknownIdentity;
    };
    if (sim::CallFails("SecTask.createWithAuditToken", std::to_string(identity.pid)) ||
        identity.pid <= 0 || isUnknown(identity.euid) || isUnknown(identity.egid)) {
        return nullptr;
    }
    return std::unique_ptr<SecTask>(new SecTask(std::make_unique<State>(State{identity})));
}

SecTask::Answer SecTask::copyValueForEntitlement(std::string_view entitlement) const {
    // An error may stand beside a value, which must not be believed then.
    const int error = sim::CallFails("SecTask.copyValueForEntitlement", entitlement) ? EIO : 0;
    const std::string name(entitlement);
    const ProcessTable& table = Processes();
    if (const auto grant = table.processGrants.find({state_->identity.pid, name});
        grant != table.processGrants.end()) {
        return {.value = grant->second, .error = error};
    }
    if (const auto grant = table.groupGrants.find({state_->identity.egid, name});
        grant != table.groupGrants.end()) {
        return {.value = grant->second, .error = error};
    }
    return {.value = std::nullopt, .error = error};
}

}  // namespace platform
