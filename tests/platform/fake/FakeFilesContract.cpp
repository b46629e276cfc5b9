#include "platform/fake/FakeFiles.h"
#include "tests/platform/contract/FilesContract.h"

namespace contract {

namespace {

class FakeFilesFixture final : public FilesFixture {
  public:
    FakeFilesFixture() { disk_.makeDirectory("/var/root"); }

    platform::Files& files() override { return files_; }
    std::string real(const std::string& path) const override { return "/some/directory" + path; }
    void makeDirectory(const std::string& path) override { disk_.makeDirectory(path); }
    void put(const std::string& path, const Bytes& bytes, unsigned mode) override {
        disk_.put(path, bytes, mode);
    }
    std::optional<Bytes> bytesOf(const std::string& path) override { return disk_.read(path); }
    unsigned modeOf(const std::string& path) override { return disk_.find(path)->mode; }
    std::size_t openDescriptors() override { return files_.openDescriptors(); }
    void closeDescriptor(int descriptor) override { files_.closeDescriptor(descriptor); }

  private:
    platform::FakeDisk disk_;
    platform::FakeFiles files_{disk_, "/some/directory"};
};

} // namespace

INSTANTIATE_TEST_SUITE_P(Fake, FilesContract, (fixtureOf<FilesFixture, FakeFilesFixture>()));

} // namespace contract
