#pragma once

#include "platform/Error.h"
#include "platform/Result.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

struct sd_bus;
struct sd_bus_message;

namespace notify {

/// A connection to systemd's manager over the system's message bus, for a few calls in a row.
///
/// Every call waits for its answer, and a job for its end, as long as `kPatience`.
class SystemdBus {
  public:
    static constexpr std::chrono::seconds kPatience{5};

    /// `socket` is the file of the bus's socket. That nobody serves it shows in the calls.
    explicit SystemdBus(const std::string& socket);
    SystemdBus(const SystemdBus&) = delete;
    SystemdBus& operator=(const SystemdBus&) = delete;
    ~SystemdBus();

    [[nodiscard]] platform::Result<std::uint64_t>
    unsignedProperty(const char* path, const char* interface, const char* name);

    /// Adds the arguments of a call to its message; negative when that failed.
    using Arguments = std::function<int(sd_bus_message* call)>;

    /// Calls a method of the manager that begins a job, and waits until the job has ended, however
    /// it did.
    [[nodiscard]] std::optional<platform::Error> runJob(const char* method,
                                                        const Arguments& arguments);

    /// The name of the bus's error for a unit that is not there.
    static constexpr char kNoSuchUnit[] = "org.freedesktop.systemd1.NoSuchUnit";

  private:
    [[nodiscard]] std::optional<platform::Error> awaitRemoval(const std::string& job);

    sd_bus* bus_ = nullptr;
    /// Why there is no connection; 0 when there is one.
    int failure_ = 0;
    /// The job whose end was told last.
    std::string removedJob_;
};

} // namespace notify
