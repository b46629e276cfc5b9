#pragma once

#include "base/FileDescriptor.h"
#include "platform/SystemLog.h"
#include "platform/linux/LinuxRunLoop.h"

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <string_view>

namespace platform {

/// Tells when the settings file is written, replaced, removed, or changes its owner or mode; also
/// through links that lead to it, and when one of these or a directory on the way is made, renamed,
/// replaced or removed. Its directory need not be there at first; the directory above it must.
class SettingsWatch {
  public:
    using Changed = std::function<void()>;

    SettingsWatch(const std::string& path, LinuxRunLoop& loop, SystemLog& log, Changed changed);

  private:
    /// The names that matter in each watched directory, by the number of its watch.
    using Watches = std::map<int, std::set<std::string, std::less<>>>;

    void readEvents();
    [[nodiscard]] bool isChange(int watch, std::uint32_t what, std::string_view name) const;
    void watchTheWay();
    [[nodiscard]] Watches addWatches();
    void sayThatItCannotWatch(const std::string& directory, int error);

    /// The directory that must be there, and the way from it to the file.
    std::string start_;
    std::string way_;
    SystemLog& log_;
    Changed changed_;
    base::FileDescriptor inotify_;
    Watches watches_;
    /// The directory of each watch, as a path.
    std::map<int, std::string> directories_;
    std::string said_;
    std::unique_ptr<RunLoopSource> source_;
};

} // namespace platform
