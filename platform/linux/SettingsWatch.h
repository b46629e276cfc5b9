#pragma once

#include "base/FileDescriptor.h"
#include "platform/SystemLog.h"
#include "platform/linux/LinuxRunLoop.h"

#include <functional>
#include <memory>
#include <string>
#include <string_view>

namespace platform {

/// Tells when the settings file is written, replaced, removed, or changes its owner or mode. Its
/// directory need not be there at first; the directory above it must.
class SettingsWatch {
  public:
    using Changed = std::function<void()>;

    SettingsWatch(const std::string& path, LinuxRunLoop& loop, SystemLog& log, Changed changed);

  private:
    void readEvents();
    [[nodiscard]] bool concernsFile(int watch, std::string_view name);
    void watchDirectory();

    std::string directory_;
    std::string directoryName_;
    std::string fileName_;
    Changed changed_;
    base::FileDescriptor inotify_;
    int parentWatch_ = -1;
    int directoryWatch_ = -1;
    std::unique_ptr<RunLoopSource> source_;
};

} // namespace platform
