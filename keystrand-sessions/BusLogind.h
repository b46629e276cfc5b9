#pragma once

#include "base/FileDescriptor.h"
#include "keystrand-sessions/Logind.h"
#include "keystrand-sessions/SessionsLog.h"
#include "keystrand/EventLoop.h"
#include "keystrand/Timers.h"

#include <systemd/sd-bus.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>

namespace keystrand::sessions {

/// logind over the system's message bus. It asks without ever waiting, and launches nothing.
///
/// The bus tells every change but that a session is closing, which logind writes to the session's
/// file only. So a change in the directory of these files has the sessions asked for anew; where
/// that cannot be watched, a session that closes counts until it is gone.
class BusLogind : public Logind {
  public:
    /// The time after which a bus, or a logind that did not answer, is tried again.
    static constexpr std::chrono::seconds kBackoff{1};
    static constexpr std::chrono::seconds kPatience{5};

    struct Places {
        /// The file of the bus's socket.
        std::string bus;
        /// The directory of the sessions' files.
        std::string sessions;
    };

    /// The loop and the timers outlive it.
    BusLogind(EventLoop& loop, Timers& timers, Places places, SessionsLog log);
    ~BusLogind() override;

    void start(LogindListener& listener) override;
    void delaySleep() override;
    void letSleep() override;

  private:
    using Arguments = std::function<int(sd_bus_message* call)>;
    using Reply = std::function<void(sd_bus_message* reply)>;
    using Signal = void (BusLogind::*)(sd_bus_message* signal);
    struct Call;

    void tryAgain();
    [[nodiscard]] int connect();
    [[nodiscard]] bool addMatches();
    void disconnect();
    template <Signal handler>
    static int handle(sd_bus_message* signal, void* self, sd_bus_error* error);

    void call(const char* destination, const char* path, const char* interface, const char* method,
              const Arguments& arguments, Reply reply);
    void getProperty(const char* destination, const char* path, const char* interface,
                     const char* name, Reply reply);

    void askForOwner();
    void ownerIs(const std::string& name);
    void askWhenItStarted();
    void askForSleep();
    void askForSessions();
    void readSessions(sd_bus_message* reply);
    void askFor(const std::string& path);
    void answered();
    void askForAll();
    void watchFiles();

    void onDisconnected(sd_bus_message* signal);
    void onOwnerChanged(sd_bus_message* signal);
    void onManagerSignal(sd_bus_message* signal);
    void onPropertiesChanged(sd_bus_message* signal);
    void change(const std::string& path, const Session& session);

    void takeDelay();
    void readDelay(sd_bus_message* reply);

    EventLoop& loop_;
    Places places_;
    SessionsLog log_;
    LogindListener* listener_ = nullptr;
    sd_bus* bus_ = nullptr;
    std::unique_ptr<Timer> backoff_;
    std::string busTrouble_;

    /// Answers to questions of an earlier turn count for nothing.
    std::uint64_t turn_ = 0;
    /// Without a name when there is none.
    LogindProcess process_;
    bool isPreparingForSleep_ = false;
    /// Whether the listener was told that it is there.
    bool isTold_ = false;
    /// By the paths of their objects.
    std::map<std::string, Session> sessions_;
    bool areSessionsListed_ = false;
    unsigned unanswered_ = 0;
    bool isAskedAgain_ = false;

    bool wantsDelay_ = false;
    bool isDelayAsked_ = false;
    base::FileDescriptor delay_;
    std::string delayTrouble_;

    base::FileDescriptor files_;
    EventSource filesSource_;
};

} // namespace keystrand::sessions
