#include "keystrand-linux/DevicesInUse.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "keystrand-linux/SmallFile.h"
#include "wire/SystemPaths.h"

#include <cerrno>
#include <charconv>
#include <fcntl.h>
#include <filesystem>
#include <net/if.h>
#include <optional>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace keystrand::usb {

namespace {

namespace fs = std::filesystem;

/// Seven tiers of hubs full of devices have less.
constexpr std::size_t kMostEntries = std::size_t{1} << 20U;
constexpr int kDeepest = 64;

bool hasLeft(int error) {
    return error == ENOENT || error == ENODEV || error == ENXIO;
}

/// "8:16"
std::optional<dev_t> numberOfDisk(std::string_view text) {
    text = trimmed(text);
    const std::size_t colon = text.find(':');
    if (colon == std::string_view::npos) {
        return std::nullopt;
    }
    const auto first = base::parseNumber<unsigned>(text.substr(0, colon));
    const auto second = base::parseNumber<unsigned>(text.substr(colon + 1));
    return first && second ? std::optional(makedev(*first, *second)) : std::nullopt;
}

/// "0x1003"
std::optional<unsigned> flagsOfNetwork(std::string_view text) {
    text = trimmed(text);
    if (!text.starts_with("0x")) {
        return std::nullopt;
    }
    text.remove_prefix(2);
    unsigned flags = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, flags, 16);
    return result.ec == std::errc() && result.ptr == end ? std::optional(flags) : std::nullopt;
}

/// "1-2.3:1.0"
bool isInterface(std::string_view name) {
    return !name.empty() && name.front() >= '0' && name.front() <= '9' &&
           name.find('-') != std::string_view::npos && name.find(':') != std::string_view::npos;
}

/// Where nothing is that can be in use, and much besides.
bool isLeftOut(std::string_view name) {
    return name == "power" || name.starts_with("ep_");
}

} // namespace

base::FileDescriptor openDiskAlone(const std::string& node, dev_t number) {
    base::FileDescriptor fd(
        ::open(node.c_str(), O_RDONLY | O_EXCL | O_NONBLOCK | O_CLOEXEC | O_NOCTTY));
    struct stat status {};
    if (fd.isOpen() && ::fstat(fd.get(), &status) != 0) {
        return {};
    }
    if (fd.isOpen() && (!S_ISBLK(status.st_mode) || status.st_rdev != number)) {
        fd.reset();
        errno = ENOTBLK;
    }
    return fd;
}

DevicesInUse::DevicesInUse(std::string root, const std::string& directory,
                           const OpenDiskAlone& openAlone)
    : root_(std::move(root)) {
    lookBelow(directory, openAlone);
    if (!user_.empty()) {
        held_.clear();
    }
}

void DevicesInUse::lookBelow(const std::string& directory, const OpenDiskAlone& openAlone) {
    std::error_code error;
    std::size_t entries = 0;
    // The device itself may be given by a link; below it none is followed.
    fs::recursive_directory_iterator each(fs::path(directory) / "", error);
    for (; !error && user_.empty() && each != fs::recursive_directory_iterator();
         each.increment(error)) {
        if (++entries > kMostEntries || each.depth() > kDeepest) {
            user_ = "there is more below it than can be looked at";
            return;
        }
        std::error_code ignored;
        if (!each->is_directory(ignored) || each->is_symlink(ignored)) {
            continue;
        }
        const std::string path = each->path().string();
        const std::string name = each->path().filename().string();
        const std::string above = each->path().parent_path().filename().string();
        if (above == "block" || above == "net" || isLeftOut(name)) {
            each.disable_recursion_pending();
        }
        if (above == "block") {
            lookAtDisk(path, name, openAlone);
        } else if (above == "net") {
            lookAtNetwork(path, name);
        } else if (isInterface(name)) {
            lookAtInterface(path, name);
        }
    }
    if (error && !hasLeft(error.value())) {
        user_ = base::concat("it cannot be looked at: ", errorText(error.value()));
    }
}

void DevicesInUse::lookAtDisk(const std::string& directory, const std::string& name,
                              const OpenDiskAlone& openAlone) {
    const SmallFile file = readSmallFile(directory + "/dev", kAttributeLimit);
    if (hasLeft(file.error)) {
        return;
    }
    const auto number = numberOfDisk(file.bytes);
    if (!number) {
        user_ = base::concat("the disk ", name, " has no number");
        return;
    }
    // The kernel writes a slash of a node's name as an exclamation mark.
    std::string node = name;
    std::replace(node.begin(), node.end(), '!', '/');
    base::FileDescriptor fd = openAlone(wire::underRoot(root_, "/dev/" + node), *number);
    if (!fd.isOpen() && (errno == ENOENT || errno == ENOTBLK)) {
        // Another name was given to it.
        fd = openAlone(wire::underRoot(
                           root_, base::concat("/dev/block/", major(*number), ':', minor(*number))),
                       *number);
    }
    if (fd.isOpen()) {
        held_.push_back(std::move(fd));
    } else if (errno == EBUSY) {
        user_ = base::concat("the disk ", name, " is mounted or claimed");
    } else if (errno != ENOMEDIUM && errno != ENODEV && errno != ENXIO) {
        user_ = base::concat("the disk ", name, " cannot be opened: ", errorText(errno));
    }
}

void DevicesInUse::lookAtNetwork(const std::string& directory, const std::string& name) {
    const SmallFile file = readSmallFile(directory + "/flags", kAttributeLimit);
    if (hasLeft(file.error)) {
        return;
    }
    const auto flags = flagsOfNetwork(file.bytes);
    if (!flags) {
        user_ = base::concat("the network interface ", name, " has no flags");
    } else if ((*flags & IFF_UP) != 0) {
        user_ = base::concat("the network interface ", name, " is up");
    }
}

void DevicesInUse::lookAtInterface(const std::string& directory, const std::string& name) {
    std::error_code none;
    if (fs::read_symlink(fs::path(directory) / "driver", none).filename() == "usbfs") {
        user_ = base::concat("a program has taken the interface ", name);
    }
}

} // namespace keystrand::usb
