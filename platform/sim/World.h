// What the parts of the simulated platform share: time, the scheduler, faults and the journal.
#pragma once

#include <cstdint>
#include <functional>
#include <limits>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/sim/Sim.h"

namespace sim {

inline constexpr double kNever = std::numeric_limits<double>::infinity();

/// Something that has things to do of its own accord: the main loop, a queue, the script.
class Actor {
public:
    Actor() = default;
    Actor(const Actor&) = delete;
    Actor& operator=(const Actor&) = delete;
    virtual ~Actor() = default;

    /// How many things could be served now, each equally likely to be next.
    [[nodiscard]] virtual std::size_t readyCount() const = 0;

    /// When something becomes ready by itself.
    [[nodiscard]] virtual double nextDue() const = 0;

    /// Serves the ready thing of that number.
    virtual void serve(std::size_t which) = 0;

    /// What must live for as long as it serves.
    [[nodiscard]] virtual std::shared_ptr<void> kept() { return nullptr; }

    /// In the middle of serving: a thread does one thing at a time.
    bool isServing = false;
};

/// Tasks in the order of handing over, and tasks by time.
class TaskList {
public:
    void post(std::function<void()> task) { tasks_.push_back(std::move(task)); }

    void postAt(double due, std::function<void()> task) {
        timed_.emplace(std::pair(due, order_++), std::move(task));
    }

    [[nodiscard]] std::size_t readyCount() const;

    [[nodiscard]] double nextDue() const {
        return timed_.empty() ? kNever : timed_.begin()->first.first;
    }

    /// Takes the ready task of that number out.
    [[nodiscard]] std::function<void()> take(std::size_t which);

    [[nodiscard]] bool empty() const { return tasks_.empty() && timed_.empty(); }

    void clear();

private:
    [[nodiscard]] bool isTimedReady() const { return nextDue() <= Now(); }

    std::vector<std::function<void()>> tasks_;
    std::map<std::pair<double, std::uint64_t>, std::function<void()>> timed_;
    std::uint64_t order_ = 0;
};

/// An actor that does nothing but run tasks.
class TaskActor : public Actor {
public:
    [[nodiscard]] std::size_t readyCount() const override { return tasks.readyCount(); }

    [[nodiscard]] double nextDue() const override { return tasks.nextDue(); }

    void serve(std::size_t which) override { tasks.take(which)(); }

    TaskList tasks;
};

// The scheduler.

void AddActor(Actor* actor);
void RemoveActor(Actor* actor);

/// Serves one thing that is ready, chosen by the seed. False when nothing is.
bool ServeOne();

/// The innermost actor that serves now: the thread that code runs on. Null outside of all.
[[nodiscard]] const Actor* CurrentActor();

/// When the next thing becomes ready by itself.
[[nodiscard]] double NextDue();

void AdvanceTo(double time);

/// The global queue of default priority.
TaskActor& GlobalQueue();

// Platform calls.

/// Notes a call, and tells whether it is to fail.
[[nodiscard]] bool CallFails(std::string_view name, std::string_view details = {});

/// Notes a call that cannot fail.
void NoteCall(std::string_view name, std::string_view details = {});

// Each part forgets the old world.

void ResetMainLoop();
void ResetQueues();
void ResetPorts();
void ResetEcho();
void ResetArchives();
void ResetFiles();
void ResetLibraries();
void ResetMailbox();
void ResetRadioManager();
void ResetProcesses();
void ResetLogs();
void ResetServices();
void ResetGeocoding();
void ResetTelephony();
void ResetMemory();
void ResetMessagePorts();
void ResetHttp();

/// The daemon's exit sources see the exit of every process.
void ExitAllProcesses();

}  // namespace sim
