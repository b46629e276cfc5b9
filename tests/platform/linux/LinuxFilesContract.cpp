#include "platform/fake/FakeSystemLog.h"
#include "platform/linux/LinuxFiles.h"
#include "tests/platform/contract/FilesContract.h"
#include "tests/platform/linux/OpenDescriptors.h"
#include "tests/platform/linux/RootDirectory.h"

#include <unistd.h>

namespace contract {

namespace {

class LinuxFilesFixture final : public FilesFixture {
  public:
    LinuxFilesFixture() { root_.makeDirectory("/var/root"); }

    platform::Files& files() override { return files_; }
    std::string real(const std::string& path) const override { return root_.real(path); }
    void makeDirectory(const std::string& path) override { root_.makeDirectory(path); }
    void put(const std::string& path, const Bytes& bytes, unsigned mode) override {
        root_.put(path, bytes, mode);
    }
    std::optional<Bytes> bytesOf(const std::string& path) override { return root_.bytesOf(path); }
    unsigned modeOf(const std::string& path) override { return root_.modeOf(path); }
    std::size_t openDescriptors() override {
        return support::countOpenDescriptors() - descriptorsBefore_;
    }
    void closeDescriptor(int descriptor) override { ::close(descriptor); }

  private:
    support::RootDirectory root_;
    platform::FakeSystemLog log_;
    platform::LinuxFiles files_{root_.paths(), log_};
    std::size_t descriptorsBefore_ = support::countOpenDescriptors();
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Linux, FilesContract, (fixtureOf<FilesFixture, LinuxFilesFixture>()));

} // namespace contract
