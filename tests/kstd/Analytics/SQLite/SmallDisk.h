#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/support/Program.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <fcntl.h>
#include <filesystem>
#include <sched.h>
#include <string>
#include <sys/mount.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace kstd {

/// A small file system of its own, seen by this process and its children only. Without the right to
/// mount one there is none.
class SmallDisk : private base::NotCopied {
  public:
    enum class Blocks {
        /// 1 MiB of memory, in pages.
        pages,
        /// 2 MiB of ext4 on a file, in blocks smaller than a page.
        ofOneKiB,
    };

    explicit SmallDisk(std::string at, Blocks blocks = Blocks::pages) : path_(std::move(at)) {
        std::filesystem::create_directory(path_);
        mounted_ = ::unshare(CLONE_NEWNS) == 0 &&
                   ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
                   (blocks == Blocks::pages ? mountMemory() : mountImage());
    }
    ~SmallDisk() {
        if (mounted_) {
            EXPECT_EQ(::umount2(path_.c_str(), MNT_DETACH), 0);
        }
    }

    [[nodiscard]] bool isMounted() const { return mounted_; }
    [[nodiscard]] std::string file(const std::string& name) const { return path_ + "/" + name; }

    [[nodiscard]] std::uint64_t freeBytes() const {
        struct statvfs status {};
        EXPECT_EQ(::statvfs(path_.c_str(), &status), 0);
        return status.f_bavail * status.f_bsize;
    }

    /// Takes room away until at most `bytes` are free.
    void leaveFree(std::uint64_t bytes) const {
        const base::FileDescriptor filler(
            ::open(file("filler").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
        // What is written only when it must be has no blocks before.
        ASSERT_EQ(::syncfs(filler.get()), 0);
        off_t size = 0;
        // What the file system needs to keep account of the filler is room as well.
        for (std::uint64_t left = freeBytes(); left > bytes; left = freeBytes()) {
            const auto more = static_cast<off_t>(left - bytes);
            if (const int code = ::posix_fallocate(filler.get(), size, more); code != 0) {
                ASSERT_EQ(code, ENOSPC);
                return;
            }
            size += more;
        }
    }
    void fill() const { leaveFree(0); }
    void makeRoom() const { std::filesystem::remove(file("filler")); }

  private:
    [[nodiscard]] bool mountMemory() const {
        return ::mount("none", path_.c_str(), "tmpfs", 0, "size=1m,mode=700") == 0;
    }

    /// The loop device lets go of the image with the last mount of it.
    [[nodiscard]] bool mountImage() const {
        const std::string image = path_ + ".image";
        return run({"/usr/bin/truncate", "--size=2M", image}) &&
               run({"/usr/sbin/mkfs.ext4", "-q", "-b", "1024", "-m", "0", "-O", "^has_journal",
                    image}) &&
               run({"/usr/bin/mount", "-o", "loop", image, path_});
    }

    [[nodiscard]] static bool run(const std::vector<std::string>& command) {
        return support::Program(command).awaitEnd() == 0;
    }

    std::string path_;
    bool mounted_ = false;
};

} // namespace kstd
