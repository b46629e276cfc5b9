#include "kstd/Analytics/SQLite/DatabaseFile.h"

#include "base/FileDescriptor.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstddef>
#include <fcntl.h>
#include <functional>
#include <map>
#include <sqlite3.h>
#include <string>
#include <sys/mman.h>
#include <vector>

namespace kstd {
namespace {

constexpr int kRegion = 32768;

/// Stands for SQLite's own files before anybody asks for them: they map what a test says.
class FilesBeneath {
  public:
    using Map = std::function<int(volatile void** mapped)>;

    /// None: as SQLite does.
    static inline Map map;

    FilesBeneath() {
        beneath_ = *own_;
        beneath_.zName = "beneath";
        beneath_.xOpen = open;
        sqlite3_vfs_register(&beneath_, 1);
    }

  private:
    static int open(sqlite3_vfs* /*files*/, const char* path, sqlite3_file* file, int flags,
                    int* outFlags) {
        const int code = own_->xOpen(own_, path, file, flags, outFlags);
        if (file->pMethods != nullptr && file->pMethods->xShmMap != nullptr) {
            ownMap_ = file->pMethods->xShmMap;
            sqlite3_io_methods& methods = methods_[file->pMethods];
            methods = *file->pMethods;
            methods.xShmMap = mapAsTold;
            file->pMethods = &methods;
        }
        return code;
    }

    static int mapAsTold(sqlite3_file* file, int region, int size, int extend,
                         volatile void** mapped) {
        return map ? map(mapped) : ownMap_(file, region, size, extend, mapped);
    }

    static inline sqlite3_vfs* const own_ = sqlite3_vfs_find(nullptr);
    static inline sqlite3_vfs beneath_{};
    static inline decltype(sqlite3_io_methods::xShmMap) ownMap_ = nullptr;
    static inline std::map<const sqlite3_io_methods*, sqlite3_io_methods> methods_;
};

const FilesBeneath filesBeneath;

/// Pages that are given back at the end.
class Pages {
  public:
    Pages(int protection, int flags, int file = -1)
        : address_(::mmap(nullptr, kRegion, protection, flags, file, 0)) {}
    Pages(const Pages&) = delete;
    Pages& operator=(const Pages&) = delete;
    ~Pages() { giveBack(); }

    void giveBack() { ::munmap(address_, kRegion); }
    [[nodiscard]] volatile void* address() const { return address_; }

  private:
    void* const address_;
};

/// A file of a database, open by the files of kstd.
class DatabaseFileTest : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(files_->xOpen(files_, path_.c_str(), file(),
                                SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_MAIN_DB,
                                nullptr),
                  SQLITE_OK);
    }

    void TearDown() override {
        FilesBeneath::map = nullptr;
        file()->pMethods->xShmUnmap(file(), 1);
        file()->pMethods->xClose(file());
    }

    /// What mapping gives where SQLite's own gives `code` and `address`, with that errno.
    int codeOf(int code, volatile void* address = nullptr, int error = 0) {
        FilesBeneath::map = [=](volatile void** place) {
            *place = address;
            errno = error;
            return code;
        };
        return file()->pMethods->xShmMap(file(), 0, kRegion, 1, &mapped);
    }

    sqlite3_file* file() { return reinterpret_cast<sqlite3_file*>(room_.data()); }

    volatile void* mapped = nullptr;

  private:
    support::TemporaryDirectory directory_;
    const std::string path_ = directory_.file("x.db");
    sqlite3_vfs* const files_ = sqlite3_vfs_find(registerDatabaseFiles());
    std::vector<std::max_align_t> room_ = std::vector<std::max_align_t>(
        static_cast<std::size_t>(files_->szOsFile) / sizeof(std::max_align_t) + 1);
};

TEST(DatabaseFilesTest, StandBesideSQLitesOwn) {
    EXPECT_STREQ(registerDatabaseFiles(), "kstd");
    EXPECT_STREQ(sqlite3_vfs_find("kstd")->zName, "kstd");
    EXPECT_STREQ(sqlite3_vfs_find(nullptr)->zName, "beneath");
}

TEST_F(DatabaseFileTest, MemoryIsMappedAsSQLiteDoes) {
    EXPECT_EQ(file()->pMethods->xShmMap(file(), 0, kRegion, 1, &mapped), SQLITE_OK);
    ASSERT_NE(mapped, nullptr);
    static_cast<volatile char*>(mapped)[kRegion - 1] = 'x';
    EXPECT_EQ(static_cast<volatile char*>(mapped)[kRegion - 1], 'x');
}

TEST_F(DatabaseFileTest, DiskWithoutRoomForTheMemoryIsFull) {
    EXPECT_EQ(codeOf(SQLITE_IOERR_SHMSIZE, nullptr, ENOSPC), SQLITE_FULL);
    EXPECT_EQ(codeOf(SQLITE_IOERR_SHMSIZE, nullptr, EIO), SQLITE_IOERR_SHMSIZE);
    EXPECT_EQ(codeOf(SQLITE_IOERR_SHMMAP, nullptr, ENOSPC), SQLITE_IOERR_SHMMAP);
    EXPECT_EQ(codeOf(SQLITE_OK, nullptr, ENOSPC), SQLITE_OK);
}

TEST_F(DatabaseFileTest, PagesThatCannotBeHadAreNotMapped) {
    Pages none(PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS);
    if (::madvise(const_cast<void*>(none.address()), kRegion, MADV_POPULATE_WRITE) != 0) {
        GTEST_SKIP() << "the kernel cannot be asked for pages beforehand";
    }
    // What lies behind the end of a file is nowhere.
    const base::FileDescriptor empty(::memfd_create("empty", MFD_CLOEXEC));
    const Pages behindTheEnd(PROT_READ | PROT_WRITE, MAP_SHARED, empty.get());
    EXPECT_EQ(codeOf(SQLITE_OK, behindTheEnd.address()), SQLITE_FULL);
    EXPECT_EQ(mapped, nullptr);
    EXPECT_EQ(codeOf(SQLITE_READONLY, behindTheEnd.address()), SQLITE_FULL);
    EXPECT_EQ(mapped, nullptr);
    EXPECT_EQ(codeOf(SQLITE_NOMEM, behindTheEnd.address()), SQLITE_NOMEM);
    none.giveBack();
    EXPECT_EQ(codeOf(SQLITE_OK, none.address()), SQLITE_IOERR_SHMMAP);
    EXPECT_EQ(mapped, nullptr);
}

TEST_F(DatabaseFileTest, WhatCanOnlyBeReadIsNotWritten) {
    const Pages pages(PROT_READ, MAP_PRIVATE | MAP_ANONYMOUS);
    EXPECT_EQ(codeOf(SQLITE_READONLY, pages.address()), SQLITE_READONLY);
    EXPECT_EQ(mapped, pages.address());
}

TEST_F(DatabaseFileTest, NothingMappedIsLeftAsItIs) {
    for (const int code : {SQLITE_OK, SQLITE_READONLY, SQLITE_READONLY_CANTINIT, SQLITE_NOMEM}) {
        EXPECT_EQ(codeOf(code), code);
        EXPECT_EQ(mapped, nullptr);
    }
}

} // namespace
} // namespace kstd
