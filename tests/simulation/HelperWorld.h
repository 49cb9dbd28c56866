// A random world around the helper: clients come, ask and die, the helper leaves when it is idle
// and is started again when somebody waits. What must hold is looked at after each step.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <set>
#include <vector>

#include "Helper/Shared/Server/HelperServerUtils.h"
#include "tests/simulation/PatientClient.h"
#include "tests/support/Messages.h"

[[nodiscard]] inline bool Chance(unsigned percent) {
    return sim::Random(100) < percent;
}

class HelperWorld {
public:
    struct Shape {
        std::uint64_t clientsMax = 8;
        double scriptEnd = 150.0;  ///< when the clients die that are left
        double worldEnd = 400.0;   ///< when a helper that is left is told to end
        double pauseMax = 4.0;     ///< between a client's questions
        double lifeMax = 30.0;     ///< of a client
    };

    /// What happened in all worlds: a simulation in which nothing happens proves nothing.
    struct Happenings {
        int instances = 0;
        int idleExits = 0;
        int answers = 0;
        int refusals = 0;
        int deadOnArrival = 0;
        int connectedAgain = 0;
    };

    HelperWorld(std::uint64_t seed, const Shape& shape, Happenings& happened);

    HelperWorld(const HelperWorld&) = delete;
    HelperWorld& operator=(const HelperWorld&) = delete;

    virtual ~HelperWorld() = default;

    /// The service manager's part: an instance whenever somebody waits, until all is over.
    void live();

protected:
    struct Question {
        messages::Bytes message;
        platform::kern_return_t code;  ///< the answer's
    };

    /// What a client asks next.
    [[nodiscard]] virtual Question nextQuestion() = 0;

    /// After each step while the helper lives, behind the checks of this class.
    virtual void checkMore() {}

    /// An instance is gone, with all that was waiting in it.
    virtual void instanceEnded() {}

    /// Whether the helper may still be there at the end of the world.
    [[nodiscard]] virtual bool mayStay() const { return true; }

    /// The clients are dead.
    virtual void scriptEnded() { isOver_ = true; }

    /// Any instant; in every other world on a grid, where things fall on one instant with the exit.
    [[nodiscard]] double randomSeconds(double most) const;

    void end() { isOver_ = true; }

    [[nodiscard]] MobileHelperServer* server() const { return server_; }

private:
    void scriptClients();
    void scriptServices();
    void checkedIn(PatientClient& client, bool isEntitled, platform::kern_return_t code);
    void ask(PatientClient& client);
    void readAnswer(PatientClient& client, platform::kern_return_t code);
    void liveOnce();
    void terminate();
    void killClients();
    void checkInvariants();
    void checkPortTable();
    void expectEverybodyServed() const;

    const Shape shape_;
    Happenings& happened_;
    std::vector<std::unique_ptr<PatientClient>> clients_;
    std::set<const PatientClient*> diedWaiting_;
    MobileHelperServer* server_ = nullptr;
    std::set<platform::mach_port_t> seenNames_;
    bool wasToldToEnd_ = false;
    bool hadDeadWatchPort_ = false;
    bool isOver_ = false;
    bool isOnGrid_ = false;
};
