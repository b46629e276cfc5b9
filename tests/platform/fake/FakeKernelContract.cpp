#include "platform/fake/FakeKernel.h"
#include "tests/platform/contract/KernelContract.h"

#include <algorithm>
#include <cerrno>
#include <iterator>

namespace contract {

namespace {

class FakeKernelFixture final : public KernelFixture {
  public:
    platform::ServiceRegistry& registry() override { return registry_; }
    platform::KernelChannel& channel() override { return channel_; }

    void setReachable(bool reachable) override { kernel_.absence = reachable ? 0 : ECONNREFUSED; }
    void setEntryPresent(bool present) override { kernel_.entryPresent = present; }
    void setProperty(const std::string& name,
                     const std::optional<std::vector<std::uint8_t>>& value) override {
        kernel_.properties.erase(name);
        if (value) {
            kernel_.properties.emplace(name, *value);
        }
    }
    void setOpenStatus(platform::Status status) override { kernel_.openStatus = status; }
    void answerStructCall(const KernelAnswer& answer) override {
        kernel_.structAnswers.push_back({answer.status, answer.output, std::nullopt});
    }
    void answerScalarCall(platform::Status status,
                          const std::vector<std::uint64_t>& outputs) override {
        kernel_.scalarAnswers.push_back({status, outputs});
    }

    std::vector<StructCall> structCalls() override {
        std::vector<StructCall> calls;
        for (const platform::FakeStructCall& call : kernel_.structCalls) {
            calls.push_back({call.selector, call.input, call.offeredSize});
        }
        return calls;
    }
    std::vector<ScalarCall> scalarCalls() override {
        std::vector<ScalarCall> calls;
        for (const platform::FakeScalarCall& call : kernel_.scalarCalls) {
            calls.push_back({call.selector, call.inputs, call.offeredCount});
        }
        return calls;
    }
    std::vector<std::uint32_t> openedTypes() override {
        std::vector<std::uint32_t> types;
        std::transform(kernel_.opens.begin(), kernel_.opens.end(), std::back_inserter(types),
                       [](const platform::FakeKernelOpen& open) { return open.connectionType; });
        return types;
    }
    std::size_t maxStructInput() override { return platform::FakeKernelChannel::kMaxStructInput; }

  private:
    platform::FakeKernel kernel_;
    platform::FakeServiceRegistry registry_{kernel_};
    platform::FakeKernelChannel channel_{kernel_, registry_};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, KernelContract, (fixtureOf<KernelFixture, FakeKernelFixture>()));

} // namespace contract
