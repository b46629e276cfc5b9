#pragma once

#include "base/FileDescriptor.h"
#include "platform/Files.h"

#include <string>
#include <sys/types.h>

namespace platform {

class LinuxFiles;

/// The stream of LinuxFiles. It keeps its own position, so that it begins at 0 whatever was done
/// with the descriptor before.
class LinuxFileStream final : public FileStream {
  public:
    LinuxFileStream(LinuxFiles& files, base::FileDescriptor descriptor, std::string path);

    [[nodiscard]] std::size_t write(const void* data, std::size_t elementSize,
                                    std::size_t count) override;
    [[nodiscard]] int fullSync() override;
    int close() override;

  private:
    LinuxFiles& files_;
    base::FileDescriptor descriptor_;
    std::string path_;
    off_t position_ = 0;
};

} // namespace platform
