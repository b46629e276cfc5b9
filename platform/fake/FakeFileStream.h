#pragma once

#include "platform/Files.h"
#include "platform/fake/FakeDisk.h"

#include <cstddef>
#include <memory>
#include <string>

namespace platform {

class FakeFiles;

/// The stream of FakeFiles.
class FakeFileStream final : public FileStream {
  public:
    FakeFileStream(FakeFiles& files, int descriptor, std::shared_ptr<FakeFile> file,
                   std::string path);
    ~FakeFileStream() override;

    [[nodiscard]] std::size_t write(const void* data, std::size_t elementSize,
                                    std::size_t count) override;
    [[nodiscard]] int fullSync() override;
    int close() override;

  private:
    [[nodiscard]] int closeNow();

    FakeFiles& files_;
    int descriptor_;
    /// Null when closed.
    std::shared_ptr<FakeFile> file_;
    std::string path_;
    std::size_t position_ = 0;
};

} // namespace platform
