#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include "base/Concat.h"
#include "base/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <new>
#include <sqlite3.h>
#include <sys/mman.h>
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

constexpr char kDatabaseFilesName[] = "kstd";

/// SQLite's own, as they were before others were put in front of them.
sqlite3_vfs ownFiles{};

/// What lies behind SQLite's own data of an open file: the rest of SQLite goes on using its own
/// functions on them.
struct ReservingTail {
    decltype(sqlite3_io_methods::xShmMap) ownMap;
    sqlite3_io_methods methods;

    static constexpr std::size_t kAlignment = 16;

    static std::size_t offset() {
        const auto size = static_cast<std::size_t>(ownFiles.szOsFile);
        return (size + kAlignment - 1) / kAlignment * kAlignment;
    }
    static void* placeIn(sqlite3_file* file) { return reinterpret_cast<char*>(file) + offset(); }
};
static_assert(alignof(ReservingTail) <= 8, "SQLite aligns open files to eight bytes");

/// Faults in what was mapped as a use would. This takes the place of posix_fallocate, for which
/// the file would have to be opened once more: closing that descriptor would drop the locks that
/// SQLite has on the file. It also works where a file system cannot reserve.
int reserveMapped(volatile void* mapped, int size, bool isWritable) {
    const int advice = isWritable ? MADV_POPULATE_WRITE : MADV_POPULATE_READ;
    // SQLite's pointers are to volatile, the kernel's are not.
    if (::madvise(const_cast<void*>(mapped), static_cast<std::size_t>(size), advice) == 0 ||
        errno == EINVAL) {
        return SQLITE_OK;
    }
    return errno == EFAULT ? SQLITE_FULL : SQLITE_IOERR_SHMMAP;
}

int mapReserved(sqlite3_file* file, int region, int size, int extend, volatile void** mapped) {
    const auto* const tail = static_cast<const ReservingTail*>(ReservingTail::placeIn(file));
    const int code = tail->ownMap(file, region, size, extend, mapped);
    if (code == SQLITE_IOERR_SHMSIZE && errno == ENOSPC) {
        return SQLITE_FULL;
    }
    // SQLITE_READONLY comes with a mapping that can only be read.
    if ((code == SQLITE_OK || code == SQLITE_READONLY) && *mapped != nullptr) {
        if (const int reserved = reserveMapped(*mapped, size, code == SQLITE_OK);
            reserved != SQLITE_OK) {
            *mapped = nullptr;
            return reserved;
        }
    }
    return code;
}

int openReserving(sqlite3_vfs* /*files*/, const char* path, sqlite3_file* file, int flags,
                  int* outFlags) {
    const int code = ownFiles.xOpen(&ownFiles, path, file, flags, outFlags);
    const sqlite3_io_methods* const own = file->pMethods;
    if (code == SQLITE_OK && own != nullptr && own->iVersion >= 2 && own->xShmMap != nullptr) {
        auto* const tail = new (ReservingTail::placeIn(file)) ReservingTail{own->xShmMap, *own};
        tail->methods.xShmMap = mapReserved;
        file->pMethods = &tail->methods;
    }
    return code;
}

} // namespace

const char* registerDatabaseFiles() {
    static const int code = [] {
        const sqlite3_vfs* const found = sqlite3_vfs_find(nullptr);
        if (found == nullptr) {
            return SQLITE_ERROR;
        }
        ownFiles = *found;
        static sqlite3_vfs reserving = ownFiles;
        reserving.pNext = nullptr;
        reserving.zName = kDatabaseFilesName;
        reserving.szOsFile = static_cast<int>(ReservingTail::offset() + sizeof(ReservingTail));
        reserving.xOpen = openReserving;
        return sqlite3_vfs_register(&reserving, 0);
    }();
    static_cast<void>(code);
    return kDatabaseFilesName;
}

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

bool createDatabaseFile(const std::string& path) {
    struct stat found {};
    const bool isNew = ::stat(path.c_str(), &found) != 0 && errno == ENOENT;
    const base::FileDescriptor created(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnlyFile));
    if (created.isOpen()) {
        static_cast<void>(::fchmod(created.get(), kOwnerOnlyFile));
    }
    return isNew;
}

void keepForOwner(const std::string& path) {
    static_cast<void>(::chmod(path.c_str(), kOwnerOnlyFile));
}

void removeDatabaseFiles(const std::string& path) {
    for (const char* const suffix : {"", "-journal", "-wal", "-shm"}) {
        static_cast<void>(::unlink((path + suffix).c_str()));
    }
}

} // namespace kstd
