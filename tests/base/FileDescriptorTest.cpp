#include "base/FileDescriptor.h"

#include "tests/support/ChildProcess.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>
#include <utility>

using base::FileDescriptor;

namespace {

int openedNumber() {
    return ::open("/dev/null", O_RDONLY | O_CLOEXEC);
}

bool isOpenInTheProcess(int number) {
    return ::fcntl(number, F_GETFD) != -1 || errno != EBADF;
}

} // namespace

TEST(FileDescriptorTest, ZeroIsOneAndMinusOneIsNone) {
    FileDescriptor first(0);
    EXPECT_TRUE(first.isOpen());
    EXPECT_EQ(first.release(), 0);
    EXPECT_FALSE(first.isOpen());
    EXPECT_EQ(first.get(), -1);
    EXPECT_FALSE(FileDescriptor().isOpen());
    EXPECT_EQ(FileDescriptor().get(), -1);
    EXPECT_FALSE(FileDescriptor(-1).isOpen());
}

TEST(FileDescriptorTest, ClosesAtItsEndAndWhenItIsReset) {
    const int number = openedNumber();
    ASSERT_GE(number, 0);
    {
        const FileDescriptor owner(number);
        EXPECT_EQ(owner.get(), number);
        EXPECT_TRUE(isOpenInTheProcess(number));
    }
    EXPECT_FALSE(isOpenInTheProcess(number));
    FileDescriptor owner(openedNumber());
    const int another = owner.get();
    owner.reset();
    EXPECT_FALSE(owner.isOpen());
    EXPECT_FALSE(isOpenInTheProcess(another));
    owner.reset();
}

TEST(FileDescriptorTest, ZeroIsClosedToo) {
    EXPECT_EQ(support::exitStatusOfChild([] {
                  const bool isThere = ::dup2(openedNumber(), 0) == 0;
                  { const FileDescriptor owner(0); }
                  return isThere && !isOpenInTheProcess(0) ? 0 : 1;
              }),
              0);
}

TEST(FileDescriptorTest, MovingHandsItOverAndClosesWhatWasThere) {
    FileDescriptor first(openedNumber());
    const int number = first.get();
    FileDescriptor second(openedNumber());
    const int replaced = second.get();
    second = std::move(first);
    EXPECT_EQ(first.get(), -1); // NOLINT(bugprone-use-after-move)
    EXPECT_EQ(second.get(), number);
    EXPECT_FALSE(isOpenInTheProcess(replaced));
    FileDescriptor& same = second;
    second = std::move(same);
    EXPECT_EQ(second.get(), number);
    const FileDescriptor third(std::move(second));
    EXPECT_EQ(third.get(), number);
    EXPECT_TRUE(isOpenInTheProcess(number));
    EXPECT_EQ(second.release(), -1); // NOLINT(bugprone-use-after-move)
}
