#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "tests/platform/contract/KernelContract.h"
#include "tests/platform/linux/KernelReplies.h"
#include "tests/support/SeqpacketServer.h"
#include "tests/support/TemporaryDirectory.h"
#include "wire/KernelSocket.h"

#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <span>

namespace contract {

namespace {

using support::Packet;
using support::reply;
using wire::KernelOperation;

/// A kernel side on a socket, as scripted as the fixture needs it.
class ScriptedKernel {
  public:
    struct ScalarAnswer {
        platform::Status status = platform::kSuccess;
        std::vector<std::uint64_t> outputs;
    };

    [[nodiscard]] Packet answer(const Packet& request) {
        const std::lock_guard lock(mutex_);
        const auto body = std::span(request).subspan(wire::kKernelRequestHeaderSize);
        switch (static_cast<KernelOperation>(request[5])) {
        case KernelOperation::findByPath:
            return found(request, wire::decodeKernelFindByPath(body) == kPath);
        case KernelOperation::findByClassName:
            return found(request, wire::decodeKernelFindByClassName(body) == "Keystrand");
        case KernelOperation::copyProperty:
            return property(request, wire::decodeKernelProperty(body).value());
        case KernelOperation::open:
            openedTypes.push_back(wire::decodeKernelOpen(body).value().connectionType);
            return reply(request, openStatus, 0, "");
        case KernelOperation::structCall:
            return structCall(request, wire::decodeKernelStruct(body).value());
        case KernelOperation::scalarCall:
            return scalarCall(request, wire::decodeKernelScalar(body).value());
        }
        return {};
    }

    /// Gives the fixture the members below while no request is answered.
    [[nodiscard]] std::unique_lock<std::mutex> lock() { return std::unique_lock(mutex_); }

    bool entryPresent = true;
    platform::Status openStatus = platform::kSuccess;
    std::map<std::string, std::vector<std::uint8_t>, std::less<>> properties;
    std::deque<KernelAnswer> structAnswers;
    std::deque<ScalarAnswer> scalarAnswers;
    std::vector<KernelFixture::StructCall> structCalls;
    std::vector<KernelFixture::ScalarCall> scalarCalls;
    std::vector<std::uint32_t> openedTypes;

  private:
    static constexpr std::string_view kPath = "IOService:/IOResources/Keystrand";

    [[nodiscard]] Packet found(const Packet& request, bool matches) const {
        const bool isThere = matches && entryPresent;
        return reply(request, 0, isThere ? 1 : 0, isThere ? kPath : "");
    }

    [[nodiscard]] Packet property(const Packet& request,
                                  const wire::KernelPropertyRequest& wanted) const {
        const auto value = properties.find(wanted.name);
        if (!entryPresent || value == properties.end()) {
            return reply(request, entryPresent ? 0 : -6002, 0, "");
        }
        return reply(request, 0, 1, text(value->second));
    }

    [[nodiscard]] Packet structCall(const Packet& request, const wire::KernelStructRequest& call) {
        structCalls.push_back(
            {call.selector, {call.input.begin(), call.input.end()}, call.offeredSize});
        KernelAnswer answer;
        if (!structAnswers.empty()) {
            answer = structAnswers.front();
            structAnswers.pop_front();
        }
        return reply(request, answer.status, static_cast<std::uint32_t>(answer.output.size()),
                     text(answer.output));
    }

    [[nodiscard]] Packet scalarCall(const Packet& request, const wire::KernelScalarRequest& call) {
        scalarCalls.push_back({call.selector, call.inputs, call.offeredCount});
        ScalarAnswer answer;
        if (!scalarAnswers.empty()) {
            answer = scalarAnswers.front();
            scalarAnswers.pop_front();
        }
        const std::string_view outputs(reinterpret_cast<const char*>(answer.outputs.data()),
                                       answer.outputs.size() * sizeof(std::uint64_t));
        return reply(request, answer.status, static_cast<std::uint32_t>(answer.outputs.size()),
                     outputs);
    }

    static std::string_view text(const std::vector<std::uint8_t>& bytes) {
        return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
    }

    std::mutex mutex_;
};

class LinuxKernelFixture final : public KernelFixture {
  public:
    LinuxKernelFixture() { setReachable(true); }

    platform::ServiceRegistry& registry() override { return registry_; }
    platform::KernelChannel& channel() override { return channel_; }

    void setReachable(bool reachable) override {
        server_.reset();
        if (reachable) {
            server_ = std::make_unique<support::SeqpacketServer>(
                path_, [this](const support::SeqpacketServer::Peer& peer) {
                    for (Packet request = peer.receive(); !request.empty();
                         request = peer.receive()) {
                        peer.send(kernel_.answer(request));
                    }
                });
        }
    }

    void setEntryPresent(bool present) override {
        const auto lock = kernel_.lock();
        kernel_.entryPresent = present;
    }
    void setProperty(const std::string& name,
                     const std::optional<std::vector<std::uint8_t>>& value) override {
        const auto lock = kernel_.lock();
        kernel_.properties.erase(name);
        if (value) {
            kernel_.properties.emplace(name, *value);
        }
    }
    void setOpenStatus(platform::Status status) override {
        const auto lock = kernel_.lock();
        kernel_.openStatus = status;
    }
    void answerStructCall(const KernelAnswer& answer) override {
        const auto lock = kernel_.lock();
        kernel_.structAnswers.push_back(answer);
    }
    void answerScalarCall(platform::Status status,
                          const std::vector<std::uint64_t>& outputs) override {
        const auto lock = kernel_.lock();
        kernel_.scalarAnswers.push_back({status, outputs});
    }
    std::vector<StructCall> structCalls() override {
        const auto lock = kernel_.lock();
        return kernel_.structCalls;
    }
    std::vector<ScalarCall> scalarCalls() override {
        const auto lock = kernel_.lock();
        return kernel_.scalarCalls;
    }
    std::vector<std::uint32_t> openedTypes() override {
        const auto lock = kernel_.lock();
        return kernel_.openedTypes;
    }
    std::size_t maxStructInput() override {
        return wire::kKernelMessageMaxSize - wire::kKernelRequestHeaderSize -
               wire::kKernelStructPrefixSize;
    }

  private:
    support::TemporaryDirectory directory_;
    std::string path_ = directory_.file("service.sock");
    ScriptedKernel kernel_;
    std::unique_ptr<support::SeqpacketServer> server_;
    platform::FakeSystemLog log_;
    platform::LinuxServiceRegistry registry_{path_, log_};
    platform::LinuxKernelChannel channel_{path_, registry_, log_};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, KernelContract, (fixtureOf<KernelFixture, LinuxKernelFixture>()));

} // namespace contract
