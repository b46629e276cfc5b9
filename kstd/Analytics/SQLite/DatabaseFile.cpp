#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace kstd {
namespace {

constexpr mode_t kOwnerOnlyDirectory = 0700;
constexpr mode_t kOwnerOnlyFile = 0600;

/// 0, or the errno value.
int makeDirectory(const std::string& path) {
    if (::mkdir(path.c_str(), kOwnerOnlyDirectory) == 0 || errno == EEXIST) {
        return 0;
    }
    return errno;
}

platform::Error directoryError(const std::string& directory, int code) {
    return {platform::kSystemErrorDomain, code,
            base::concat("Cannot make the directory ", directory, ": ",
                         std::generic_category().message(code))};
}

} // namespace

std::optional<platform::Error> makeParentDirectories(const std::string& path) {
    for (std::size_t slash = path.find('/', 1); slash != std::string::npos;
         slash = path.find('/', slash + 1)) {
        const std::string directory = path.substr(0, slash);
        if (const int code = makeDirectory(directory); code != 0) {
            return directoryError(directory, code);
        }
    }
    return std::nullopt;
}

void createDatabaseFile(const std::string& path) {
    const base::FileDescriptor created(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnlyFile));
}

void removeDatabaseFiles(const std::string& path) {
    for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
        static_cast<void>(::unlink((path + suffix).c_str()));
    }
}

} // namespace kstd
