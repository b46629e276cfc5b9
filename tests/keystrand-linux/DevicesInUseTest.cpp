// Against real disks: files that the kernel shows as such.

#include "keystrand-linux/DevicesInUse.h"

#include "base/Concat.h"
#include "tests/support/TemporaryDirectory.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <linux/blkpg.h>
#include <linux/loop.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace keystrand::usb {
namespace {

namespace fs = std::filesystem;

/// A file as a disk, gone with the object.
class LoopDisk {
  public:
    explicit LoopDisk(const std::string& file) {
        const base::FileDescriptor control(::open("/dev/loop-control", O_RDWR | O_CLOEXEC));
        const base::FileDescriptor backing(
            ::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
        constexpr off_t kSize = 1 << 20;
        if (!control.isOpen() || ::ftruncate(backing.get(), kSize) != 0) {
            return;
        }
        // Another test may take the free one first.
        for (int attempt = 0; attempt < 100 && !disk_.isOpen(); ++attempt) {
            const int number = ::ioctl(control.get(), LOOP_CTL_GET_FREE);
            name = base::concat("loop", number);
            base::FileDescriptor disk(::open(("/dev/" + name).c_str(), O_RDWR | O_CLOEXEC));
            loop_config config{};
            config.fd = static_cast<__u32>(backing.get());
            config.info.lo_flags = LO_FLAGS_AUTOCLEAR | LO_FLAGS_PARTSCAN;
            if (disk.isOpen() && ::ioctl(disk.get(), LOOP_CONFIGURE, &config) == 0) {
                disk_ = std::move(disk);
            }
        }
    }
    LoopDisk(const LoopDisk&) = delete;
    LoopDisk& operator=(const LoopDisk&) = delete;
    ~LoopDisk() {
        if (disk_.isOpen()) {
            static_cast<void>(::ioctl(disk_.get(), LOOP_CLR_FD));
        }
    }

    [[nodiscard]] bool isThere() const { return disk_.isOpen(); }
    [[nodiscard]] dev_t number() const {
        struct stat status {};
        return ::fstat(disk_.get(), &status) == 0 ? status.st_rdev : 0;
    }
    /// Its first partition's, 0 when it cannot be made.
    [[nodiscard]] dev_t addPartition() const {
        blkpg_partition partition{};
        partition.start = 4096;
        partition.length = 65536;
        partition.pno = 1;
        blkpg_ioctl_arg what{};
        what.op = BLKPG_ADD_PARTITION;
        what.datalen = sizeof partition;
        what.data = &partition;
        if (::ioctl(disk_.get(), BLKPG, &what) != 0) {
            return 0;
        }
        unsigned first = 0;
        unsigned second = 0;
        char colon = 0;
        std::ifstream(base::concat("/sys/class/block/", name, "p1/dev")) >> first >> colon >>
            second;
        return colon == ':' ? makedev(first, second) : 0;
    }

    std::string name;

  private:
    base::FileDescriptor disk_;
};

class DevicesInUseTest : public testing::Test {
  protected:
    void SetUp() override {
        if (!disk.isThere()) {
            GTEST_SKIP() << "no file can be made a disk here";
        }
        fs::create_directories(directory.path() / "dev/block");
        node = (directory.path() / "dev" / disk.name).string();
        if (::mknod(node.c_str(), S_IFBLK | 0600, disk.number()) != 0) {
            GTEST_SKIP() << "no node can be made here";
        }
        const fs::path below = device / "1-1:1.0/host0/block" / disk.name;
        fs::create_directories(below);
        std::ofstream(below / "dev") << major(disk.number()) << ':' << minor(disk.number()) << '\n';
    }

    [[nodiscard]] DevicesInUse look() const {
        return {directory.path().string(), device.string(), openDiskAlone};
    }
    [[nodiscard]] std::string claimed() const {
        return base::concat("the disk ", disk.name, " is mounted or claimed");
    }
    static base::FileDescriptor claim(const std::string& path) {
        return base::FileDescriptor(::open(path.c_str(), O_RDONLY | O_EXCL | O_CLOEXEC));
    }

    const support::TemporaryDirectory directory;
    const fs::path device = directory.path() / "sys/1-1";
    const LoopDisk disk{directory.file("image")};
    std::string node;
};

TEST_F(DevicesInUseTest, FreeDiskIsHeldAsLongAsItIsLookedAt) {
    {
        const DevicesInUse use = look();
        EXPECT_EQ(use.user(), "");
        EXPECT_FALSE(claim(node).isOpen());
        EXPECT_EQ(errno, EBUSY);
    }
    EXPECT_TRUE(claim(node).isOpen());
}

TEST_F(DevicesInUseTest, ClaimedDiskIsInUse) {
    base::FileDescriptor holder = claim(node);
    EXPECT_EQ(look().user(), claimed());
    holder.reset();
    EXPECT_EQ(look().user(), "");
}

TEST_F(DevicesInUseTest, DiskThatIsOnlyOpenIsNotInUse) {
    const base::FileDescriptor reader(::open(node.c_str(), O_RDONLY | O_CLOEXEC));
    ASSERT_TRUE(reader.isOpen());
    EXPECT_EQ(look().user(), "");
}

TEST_F(DevicesInUseTest, DiskWithAClaimedPartitionIsInUse) {
    const dev_t number = disk.addPartition();
    const std::string partition = directory.file("dev/partition");
    if (number == 0 || ::mknod(partition.c_str(), S_IFBLK | 0600, number) != 0) {
        GTEST_SKIP() << "no partition can be made here";
    }
    EXPECT_EQ(look().user(), "");
    base::FileDescriptor holder = claim(partition);
    ASSERT_TRUE(holder.isOpen());
    EXPECT_EQ(look().user(), claimed());
    holder.reset();
    EXPECT_EQ(look().user(), "");
}

TEST_F(DevicesInUseTest, DiskIsFoundByItsNumberWhenItsNameIsAnothers) {
    const std::string byNumber =
        base::concat(directory.file("dev/block/"), major(disk.number()), ':', minor(disk.number()));
    fs::rename(node, byNumber);
    std::ofstream(node) << "no disk";
    const base::FileDescriptor holder = claim(byNumber);
    ASSERT_TRUE(holder.isOpen());
    EXPECT_EQ(look().user(), claimed());
}

} // namespace
} // namespace keystrand::usb
