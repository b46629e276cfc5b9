// The power goes while a state file is replaced: behind it there is the text of before or the new
// one, and the new one as soon as it was said to be there.

#include "keystrand-linux/StateFile.h"
#include "tests/support/PowerCut.h"
#include "tests/support/SystemCallGate.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <filesystem>
#include <set>

namespace keystrand::usb {
namespace {

using support::DiskState;
using support::DiskStep;

class StateFilePowerCutTest : public testing::Test {
  protected:
    [[nodiscard]] std::string text(std::size_t number) const {
        return number == 0 ? std::string() : texts_[number - 1];
    }

    /// What the program does to the disk when it replaces the file by each of the texts. It is
    /// killed before its killAt-th step; the next one then begins anew.
    [[nodiscard]] std::vector<DiskStep> record(std::size_t killAt) const {
        support::DiskRecorder recorder(directory_.path().string());
        if (run(recorder, killAt)) {
            EXPECT_FALSE(run(recorder, SIZE_MAX));
        }
        return recorder.steps();
    }

    [[nodiscard]] static std::size_t countSteps(const std::vector<DiskStep>& steps) {
        std::size_t count = 0;
        for (const DiskStep& step : steps) {
            count += step.what != DiskStep::What::mark ? 1 : 0;
        }
        return count;
    }

    void tryEachState(const std::vector<DiskStep>& steps, const DiskState& before) {
        support::PowerCut cut(before);
        // The text that is there for certain, and the one that may be there as well.
        std::size_t certain = 0;
        for (const DiskStep& step : steps) {
            for (std::size_t i = 0; i < texts_.size(); ++i) {
                if (step.what == DiskStep::What::mark &&
                    step.other == "replaced by " + texts_[i] + '\n') {
                    certain = i + 1;
                }
            }
            cut.add(step);
            cut.eachState([&](const DiskState& state) {
                ++states_;
                if (known_.emplace(state.hash(), certain).second) {
                    expectOldOrNew(state, certain);
                }
            });
        }
    }

    void expectOldOrNew(const DiskState& state, std::size_t certain) const {
        const support::TemporaryDirectory behind{support::directoryInMemory()};
        state.restore(behind.path().string());
        std::string problem;
        const StateFile file(behind.file("state"), StateFile::Durability::synced);
        const auto found = file.read(problem);
        EXPECT_EQ(problem, "");
        EXPECT_EQ(found.has_value() || certain == 0, true) << "lost after " << certain;
        // Behind a killed program the next one begins with the first text again.
        const std::set<std::string> allowed = {text(certain), text(1),
                                               text(std::min(certain + 1, texts_.size()))};
        EXPECT_TRUE(allowed.contains(found.value_or(""))) << found.value_or("") << certain;
        EXPECT_TRUE(file.replace("another", problem)) << problem;
        EXPECT_EQ(file.read(problem), "another");
    }

    support::TemporaryDirectory directory_{support::directoryInMemory()};
    const std::vector<std::string> texts_ = {std::string(700, 'a'), std::string(1500, 'b'), "c"};
    std::set<std::pair<std::size_t, std::size_t>> known_;
    std::size_t states_ = 0;

  private:
    /// Whether it was killed.
    [[nodiscard]] bool run(support::DiskRecorder& recorder, std::size_t killAt) const {
        std::vector<std::string> words = {STATE_FILE_REPLACER, directory_.file("state")};
        words.insert(words.end(), texts_.begin(), texts_.end());
        std::atomic<bool> wasKilled = false;
        support::SystemCallGate gate(words, [&](const support::SystemCall& call) {
            const std::size_t before = recorder.steps().size();
            recorder.note(call);
            if (!wasKilled && recorder.steps().size() > before &&
                recorder.steps().back().what != DiskStep::What::mark &&
                countSteps(recorder.steps()) > killAt) {
                recorder.forgetLast();
                wasKilled = true;
                ::kill(call.thread, SIGKILL);
                return EINTR;
            }
            return 0;
        });
        const auto status = gate.program().awaitEnd();
        EXPECT_EQ(status, wasKilled ? 128 + SIGKILL : 0);
        return wasKilled;
    }
};

TEST_F(StateFilePowerCutTest, FileIsOldOrNewAndNewOnceItWasSaid) {
    const DiskState before = DiskState::of(directory_.path().string());
    const auto steps = record(SIZE_MAX);
    EXPECT_GT(countSteps(steps), 10U);
    tryEachState(steps, before);
    EXPECT_GT(known_.size(), 20U);
    RecordProperty("states", static_cast<int>(states_));
}

TEST_F(StateFilePowerCutTest, TheSameBehindAProgramThatWasKilled) {
    const DiskState before = DiskState::of(directory_.path().string());
    for (std::size_t killAt = 1; !HasFailure(); ++killAt) {
        SCOPED_TRACE("killed before step " + std::to_string(killAt));
        before.restore(directory_.path().string());
        const auto steps = record(killAt);
        tryEachState(steps, before);
        if (countSteps(steps) < killAt) {
            break;
        }
    }
    RecordProperty("states", static_cast<int>(states_));
}

} // namespace
} // namespace keystrand::usb
