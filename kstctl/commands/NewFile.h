#pragma once

#include "base/FileDescriptor.h"
#include "kstctl/WholeWrite.h"
#include "platform/Error.h"
#include "platform/Result.h"

#include <optional>
#include <string>
#include <string_view>

namespace kstctl {

/// A file, for its owner alone, that was not there before. It is gone again unless it is finished.
class NewFile {
  public:
    [[nodiscard]] static platform::Result<NewFile> make(const std::string& path);

    NewFile(NewFile&& other) noexcept = default;
    NewFile& operator=(NewFile&& other) = delete;
    ~NewFile();

    void put(std::string_view bytes) { content_.put(bytes); }

    /// Why it could not be written whole.
    [[nodiscard]] std::optional<platform::Error> finish();

  private:
    NewFile(std::string path, base::FileDescriptor file);

    std::string path_;
    base::FileDescriptor file_;
    BufferedWriter content_;
};

} // namespace kstctl
