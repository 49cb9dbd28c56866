#include "platform/sim/World.h"

#include <algorithm>
#include <random>
#include <utility>

#include "platform/Clock.h"

namespace sim {
namespace {

/// Steps without any time passing that no test needs: somebody keeps waking somebody.
constexpr std::uint64_t kStepsPerInstantMax = 2'000'000;
constexpr double kSecondsPerCall = 1e-6;

struct World {
    std::mt19937_64 random{1};
    double now = 0;
    std::uint64_t stepsThisInstant = 0;
    std::vector<Actor*> actors;
    const Actor* current = nullptr;
    bool interleavesAtCalls = false;
    std::function<void()> stepWatch;

    std::vector<std::string> journal;
    unsigned callsToFailure = 0;
    std::string failingCall;  // empty: calls of any name count
    std::string failedCall;

    TaskActor script;
    TaskActor globalQueue;
};

/// Never destroyed: core code still calls the platform from its exit handlers.
World& TheWorld() {
    static World& world = *[] {
        auto* made = new World;
        made->actors = {&made->script, &made->globalQueue};
        return made;
    }();
    return world;
}

bool Counts(const World& world, std::string_view name) {
    return world.callsToFailure != 0 && (world.failingCall.empty() || world.failingCall == name);
}

/// Marks an actor for as long as it serves, also when serving throws.
class Serving {
public:
    explicit Serving(Actor& actor)
        : actor_(actor), kept_(actor.kept()), outer_(std::exchange(TheWorld().current, &actor)) {
        actor_.isServing = true;
    }

    Serving(const Serving&) = delete;
    Serving& operator=(const Serving&) = delete;

    ~Serving() {
        actor_.isServing = false;
        TheWorld().current = outer_;
    }

private:
    Actor& actor_;
    const std::shared_ptr<void> kept_;
    const Actor* const outer_;
};

/// While a platform call lasts the world outside goes on.
void LetOthersIn(World& world) {
    if (!world.interleavesAtCalls) {
        return;
    }
    world.now += kSecondsPerCall;
    while (!world.script.isServing && world.script.readyCount() != 0) {
        const Serving serving(world.script);
        world.script.serve(0);
    }
}

void ForgetDaemonWork() {
    ResetMainLoop();
    ResetQueues();
    TheWorld().globalQueue.tasks.clear();
}

}  // namespace

std::size_t TaskList::readyCount() const {
    return (tasks_.empty() ? 0U : 1U) + (isTimedReady() ? 1U : 0U);
}

std::function<void()> TaskList::take(std::size_t which) {
    if (!tasks_.empty() && which == 0) {
        auto task = std::move(tasks_.front());
        tasks_.erase(tasks_.begin());
        return task;
    }
    auto task = std::move(timed_.begin()->second);
    timed_.erase(timed_.begin());
    return task;
}

void TaskList::clear() {
    // What a task holds may hand over more while it goes.
    while (!empty()) {
        const auto tasks = std::exchange(tasks_, {});
        const auto timed = std::exchange(timed_, {});
    }
}

void AddActor(Actor* actor) {
    TheWorld().actors.push_back(actor);
}

void RemoveActor(Actor* actor) {
    std::erase(TheWorld().actors, actor);
}

TaskActor& GlobalQueue() {
    return TheWorld().globalQueue;
}

bool ServeOne() {
    World& world = TheWorld();
    std::size_t ready = 0;
    for (const Actor* actor : world.actors) {
        ready += actor->isServing ? 0 : actor->readyCount();
    }
    if (ready == 0) {
        return false;
    }
    if (++world.stepsThisInstant > kStepsPerInstantMax) {
        throw NothingLeftToHappen("time stands still: something keeps waking something");
    }
    std::size_t which = Random(ready);
    for (Actor* actor : world.actors) {
        const std::size_t count = actor->isServing ? 0 : actor->readyCount();
        if (which < count) {
            const Serving serving(*actor);
            actor->serve(which);
            break;
        }
        which -= count;
    }
    if (world.stepWatch) {
        world.stepWatch();
    }
    return true;
}

const Actor* CurrentActor() {
    return TheWorld().current;
}

double NextDue() {
    double due = kNever;
    for (const Actor* actor : TheWorld().actors) {
        due = std::min(due, actor->isServing ? kNever : actor->nextDue());
    }
    return due;
}

void AdvanceTo(double time) {
    World& world = TheWorld();
    if (time > world.now) {
        world.now = time;
        world.stepsThisInstant = 0;
    }
}

void Reset(std::uint64_t seed) {
    World& world = TheWorld();
    ExitAllProcesses();
    while (world.globalQueue.readyCount() != 0) {
        world.globalQueue.serve(0);
    }
    ForgetDaemonWork();
    world.script.tasks.clear();
    ResetPorts();
    ResetProcesses();
    ResetEcho();
    ResetArchives();
    ResetFiles();
    ResetLibraries();
    ResetMailbox();
    ResetRadioManager();
    ResetServices();
    ResetGeocoding();
    ResetTelephony();
    ResetMemory();
    ResetMessagePorts();
    ResetHttp();
    ResetLogs();
    world.random.seed(seed);
    world.now = 0;
    world.stepsThisInstant = 0;
    world.interleavesAtCalls = false;
    world.stepWatch = nullptr;
    world.journal.clear();
    FailCall(0);
}

double Now() {
    return TheWorld().now;
}

void At(double seconds, std::function<void()> event) {
    TheWorld().script.tasks.postAt(seconds, std::move(event));
}

void In(double seconds, std::function<void()> event) {
    At(Now() + seconds, std::move(event));
}

void Settle() {
    while (ServeOne()) {
    }
}

void RunFor(double seconds) {
    const double end = Now() + seconds;
    for (;;) {
        Settle();
        const double due = NextDue();
        AdvanceTo(std::min(due, end));
        if (due > end) {
            return;
        }
    }
}

void RunOthersUntil(const std::function<bool()>& holds) {
    while (!holds()) {
        if (ServeOne()) {
            continue;
        }
        const double due = NextDue();
        if (due == kNever) {
            throw NothingLeftToHappen("a blocked callout waits for what can never happen");
        }
        AdvanceTo(due);
    }
}

void Spend(double seconds) {
    AdvanceTo(Now() + seconds);
}

void InterleaveAtCalls(bool isOn) {
    TheWorld().interleavesAtCalls = isOn;
}

void WatchSteps(std::function<void()> watch) {
    TheWorld().stepWatch = std::move(watch);
}

std::uint64_t Random(std::uint64_t bound) {
    return TheWorld().random() % bound;
}

void FailCall(unsigned n) {
    FailCall({}, n);
}

void FailCall(std::string_view call, unsigned n) {
    World& world = TheWorld();
    world.failingCall = call;
    world.callsToFailure = n;
    world.failedCall.clear();
}

const std::string& FailedCall() {
    return TheWorld().failedCall;
}

bool CallFails(std::string_view name, std::string_view details) {
    World& world = TheWorld();
    NoteCall(name, details);
    if (!Counts(world, name) || --world.callsToFailure != 0) {
        return false;
    }
    world.failedCall = name;
    return true;
}

void NoteCall(std::string_view name, std::string_view details) {
    World& world = TheWorld();
    std::string entry(name);
    if (!details.empty()) {
        entry.append(" ").append(details);
    }
    world.journal.push_back(std::move(entry));
    LetOthersIn(world);
}

const std::vector<std::string>& Journal() {
    return TheWorld().journal;
}

void ClearJournal() {
    TheWorld().journal.clear();
}

std::size_t JournalCount(std::string_view beginning) {
    return static_cast<std::size_t>(std::ranges::count_if(
        Journal(), [beginning](const std::string& entry) { return entry.starts_with(beginning); }));
}

bool JournalHasInOrder(std::initializer_list<std::string_view> beginnings) {
    auto wanted = beginnings.begin();
    for (const std::string& entry : Journal()) {
        if (wanted != beginnings.end() && entry.starts_with(*wanted)) {
            ++wanted;
        }
    }
    return wanted == beginnings.end();
}

}  // namespace sim

namespace platform {

AbsoluteTime AbsoluteTimeGetCurrent() {
    return sim::Now();
}

}  // namespace platform
