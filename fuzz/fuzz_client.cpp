// Whole client calls against a kernel side that answers whatever the input says, with an allocation
// that fails where the input says. Whatever happens: nothing is read or written out of bounds,
// every block is called as often as it is promised, and nothing stays allocated.

#include "KSTLib/Platform.h"
#include "fuzz/ClientCalls.h"

#include <cstdio>
#include <optional>

namespace {

using fuzz::Client;
using fuzz::require;
using fuzz::Script;

class NoLog : public platform::SystemLog {
  public:
    void write(platform::LogLevel /*level*/, std::string_view text,
               const platform::LogFields& /*fields*/) override {
        require(!text.empty());
    }
};

class ScriptedKernel : public platform::KernelChannel, public platform::ServiceRegistry {
  public:
    explicit ScriptedKernel(Script& script) : script_(script) {}

    /// Contexts that KSTContextCreate made, each of which leaves one byte in the account.
    std::int64_t created = 0;
    /// Whether contexts are made by something else now.
    bool isOtherCreation = false;

    platform::ServiceHandle findByPath(std::string_view /*path*/) override { return 1; }
    platform::ServiceHandle findByClassName(std::string_view /*name*/) override { return 1; }
    std::optional<std::vector<std::uint8_t>> copyProperty(platform::ServiceHandle /*entry*/,
                                                          std::string_view /*name*/) override {
        return std::nullopt;
    }
    void release(platform::ServiceHandle /*entry*/) override {}

    platform::Status open(platform::ServiceHandle /*service*/, std::uint32_t /*connectionType*/,
                          platform::ConnectionHandle* connection) override {
        *connection = 1;
        return 0;
    }

    platform::Status structCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const void* input,
                                std::size_t inputSize, void* output,
                                std::size_t* outputSize) override {
        const auto* frame = static_cast<const std::uint8_t*>(input);
        require(inputSize >= 8 && std::memcmp(frame, "DRCS", 4) == 0);
        const std::uint8_t status = script_.byte();
        if (status >= 0xf0) {
            return status - 0x100;
        }
        // The usual size of the reply to the command, or any.
        const std::size_t reported = status < 0x80 ? usualSize(frame[4]) : script_.word();
        const std::size_t offered = *outputSize;
        script_.fill({static_cast<std::uint8_t*>(output), std::min(reported, offered)});
        *outputSize = reported;
        created += frame[4] == 1 && reported == 17 && !isOtherCreation ? 1 : 0;
        return 0;
    }

    platform::Status scalarCall(platform::ConnectionHandle /*connection*/,
                                std::uint32_t /*selector*/, const std::uint64_t* /*inputs*/,
                                std::uint32_t /*inputCount*/, std::uint64_t* outputs,
                                std::uint32_t* outputCount) override {
        const std::uint8_t level = script_.byte();
        *outputs = level;
        *outputCount = level == 0 ? 0 : 1;
        return level == 1 ? -1 : 0;
    }

  private:
    static std::size_t usualSize(std::uint8_t code) {
        switch (code) {
        case 1:
            return 17;
        case 3:
        case 11:
            return 128;
        case 4:
        case 13:
            return 4;
        case 18:
            return 5;
        case 20:
        case 25:
        case 26:
            return 20;
        default:
            return 0;
        }
    }

    Script& script_;
};

/// Refuses one allocation of the call.
class RefusingGate : public fuzz::SizeLimit {
  public:
    void refuse(std::uint8_t number) { left_ = number; }

    bool admits(std::size_t size) override {
        return (left_ == 0 || --left_ != 0) && SizeLimit::admits(size);
    }

  private:
    /// 0: none.
    std::uint8_t left_ = 0;
};

/// Calls know of each other by a context, the channel and the log level alone. A longer input would
/// take the time of several and show nothing else.
constexpr int kMaxActions = 32;

} // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
    // The LibCall functions print their failures.
    return std::freopen("/dev/null", "w", stdout) != nullptr ? 0 : 1;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::int64_t allocatedBefore = gAllocatedBytes;
    Script script({data, size});
    NoLog log;
    ScriptedKernel kernel(script);
    kst::installPlatform({log, kernel, kernel});
    {
        RefusingGate gate;
        Client client(script, kernel.isOtherCreation);
        for (int actions = 0; actions < kMaxActions && !script.isOver(); ++actions) {
            gate.refuse(script.byte() % 32);
            client.act();
        }
        gate.refuse(0);
    }
    kst::removePlatform();
    require(gAllocatedBytes == allocatedBefore + kernel.created);
    gAllocatedBytes = allocatedBefore;
    return 0;
}
