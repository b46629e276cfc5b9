#pragma once

#include <gtest/gtest.h>

#include <fcntl.h>
#include <filesystem>
#include <sched.h>
#include <string>
#include <sys/mount.h>
#include <unistd.h>

namespace kstd {

/// A file system of 1 MiB of its own, seen by this process only. Without the right to mount one
/// there is none.
class SmallDisk {
  public:
    explicit SmallDisk(std::string at) : path_(std::move(at)) {
        std::filesystem::create_directory(path_);
        mounted_ = ::unshare(CLONE_NEWNS) == 0 &&
                   ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
                   ::mount("none", path_.c_str(), "tmpfs", 0, "size=1m,mode=700") == 0;
    }
    SmallDisk(const SmallDisk&) = delete;
    SmallDisk& operator=(const SmallDisk&) = delete;
    ~SmallDisk() {
        if (mounted_) {
            EXPECT_EQ(::umount2(path_.c_str(), MNT_DETACH), 0);
        }
    }

    [[nodiscard]] bool isMounted() const { return mounted_; }
    [[nodiscard]] std::string file(const std::string& name) const { return path_ + "/" + name; }

    /// Leaves no page free.
    void fill() const {
        const int filler = ::open(file("filler").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
        const std::string page(4096, 'f');
        while (::write(filler, page.data(), page.size()) > 0) {
        }
        EXPECT_EQ(errno, ENOSPC);
        ::close(filler);
    }
    void makeRoom() const { std::filesystem::remove(file("filler")); }

  private:
    std::string path_;
    bool mounted_ = false;
};

} // namespace kstd
