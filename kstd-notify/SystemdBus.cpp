#include "kstd-notify/SystemdBus.h"

#include "base/Concat.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <system_error>

namespace notify {

namespace {

constexpr char kSystemd[] = "org.freedesktop.systemd1";
constexpr char kManagerPath[] = "/org/freedesktop/systemd1";
constexpr char kManager[] = "org.freedesktop.systemd1.Manager";

constexpr std::uint64_t kPatienceMicroseconds =
    std::chrono::microseconds(SystemdBus::kPatience).count();

int connect(sd_bus** bus, const std::string& socket) {
    int result = sd_bus_new(bus);
    const auto then = [&result](int next) {
        result = next;
        return result >= 0;
    };
    if (result >= 0 && then(sd_bus_set_address(*bus, base::concat("unix:path=", socket).c_str())) &&
        then(sd_bus_set_bus_client(*bus, 1)) &&
        then(sd_bus_set_method_call_timeout(*bus, kPatienceMicroseconds))) {
        then(sd_bus_start(*bus));
    }
    return result;
}

/// The error of a call: the bus's own words, or the system's where it has none.
platform::Error errorOf(int result, const sd_bus_error& error) {
    const std::string text =
        error.message != nullptr ? error.message : std::generic_category().message(-result);
    return {error.name != nullptr ? error.name : platform::kSystemErrorDomain, -result, text};
}

platform::Error systemError(int result) {
    return errorOf(result, sd_bus_error{});
}

int takeRemovedJob(sd_bus_message* signal, void* removedJob, sd_bus_error* /*error*/) {
    std::uint32_t id = 0;
    const char* path = nullptr;
    const char* unit = nullptr;
    const char* result = nullptr;
    if (sd_bus_message_read(signal, "uoss", &id, &path, &unit, &result) >= 0) {
        *static_cast<std::string*>(removedJob) = path;
    }
    return 0;
}

} // namespace

SystemdBus::SystemdBus(const std::string& socket) {
    const int result = connect(&bus_, socket);
    failure_ = result < 0 ? result : 0;
}

SystemdBus::~SystemdBus() {
    sd_bus_close_unref(bus_);
}

platform::Result<std::uint64_t>
SystemdBus::unsignedProperty(const char* path, const char* interface, const char* name) {
    if (failure_ != 0) {
        return systemError(failure_);
    }
    std::uint64_t value = 0;
    sd_bus_error error{};
    const int result = sd_bus_get_property_trivial(bus_, kSystemd, path, interface, name, &error,
                                                   SD_BUS_TYPE_UINT64, &value);
    if (result < 0) {
        const platform::Error failed = errorOf(result, error);
        sd_bus_error_free(&error);
        return failed;
    }
    return value;
}

std::optional<platform::Error> SystemdBus::runJob(const char* method, const Arguments& arguments) {
    if (failure_ != 0) {
        return systemError(failure_);
    }
    sd_bus_message* call = nullptr;
    sd_bus_message* reply = nullptr;
    sd_bus_error error{};
    const char* job = nullptr;
    // Only the jobs of this connection's calls are told to it.
    int result = sd_bus_match_signal(bus_, nullptr, kSystemd, kManagerPath, kManager, "JobRemoved",
                                     takeRemovedJob, &removedJob_);
    const auto then = [&result](int next) {
        result = next;
        return result >= 0;
    };
    const bool isBegun = result >= 0 &&
                         then(sd_bus_message_new_method_call(bus_, &call, kSystemd, kManagerPath,
                                                             kManager, method)) &&
                         then(arguments(call)) &&
                         then(sd_bus_call(bus_, call, kPatienceMicroseconds, &error, &reply)) &&
                         then(sd_bus_message_read(reply, "o", &job));
    std::optional<platform::Error> failed = isBegun ? awaitRemoval(job) : errorOf(result, error);
    sd_bus_error_free(&error);
    sd_bus_message_unref(reply);
    sd_bus_message_unref(call);
    return failed;
}

std::optional<platform::Error> SystemdBus::awaitRemoval(const std::string& job) {
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (removedJob_ != job) {
        const int processed = sd_bus_process(bus_, nullptr);
        if (processed < 0) {
            return systemError(processed);
        }
        if (processed > 0) {
            continue;
        }
        const auto left = std::chrono::duration_cast<std::chrono::microseconds>(
            deadline - std::chrono::steady_clock::now());
        if (left.count() <= 0) {
            return systemError(-ETIMEDOUT);
        }
        const int waited = sd_bus_wait(bus_, static_cast<std::uint64_t>(left.count()));
        if (waited < 0 && waited != -EINTR) {
            return systemError(waited);
        }
    }
    return std::nullopt;
}

} // namespace notify
