#include "tests/support/PowerCut.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string_view>

namespace support {

namespace {

namespace fs = std::filesystem;
using What = DiskStep::What;

std::string parentOf(const std::string& path) {
    return fs::path(path).parent_path().string();
}

bool isOfName(const DiskStep& step) {
    return step.what == What::makeFile || step.what == What::rename ||
           step.what == What::removeFile || step.what == What::makeDirectory;
}

std::size_t sectorsOf(const DiskStep& step) {
    const std::uint64_t first = step.offset / PowerCut::kSectorSize;
    const std::uint64_t end =
        (step.offset + step.bytes.size() + PowerCut::kSectorSize - 1) / PowerCut::kSectorSize;
    return static_cast<std::size_t>(end - first);
}

} // namespace

DiskState DiskState::of(const std::string& root) {
    DiskState state;
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        const std::string path = entry.path().string().substr(root.size());
        if (entry.is_directory()) {
            state.directories.insert(path);
        } else if (entry.is_regular_file()) {
            std::ifstream file(entry.path(), std::ios::binary);
            state.files[path].assign(std::istreambuf_iterator<char>(file), {});
        }
    }
    return state;
}

void DiskState::restore(const std::string& root) const {
    for (const auto& entry : fs::directory_iterator(root)) {
        fs::remove_all(entry.path());
    }
    for (const std::string& directory : directories) {
        fs::create_directories(root + directory);
    }
    for (const auto& [path, bytes] : files) {
        std::ofstream(root + path, std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes.data()),
                   static_cast<std::streamsize>(bytes.size()));
        fs::permissions(root + path, fs::perms::owner_read | fs::perms::owner_write);
    }
}

std::size_t DiskState::hash() const {
    std::size_t sum = 0;
    const auto add = [&sum](std::string_view bytes) {
        sum = sum * 31 + std::hash<std::string_view>()(bytes);
    };
    for (const std::string& directory : directories) {
        add(directory);
    }
    for (const auto& [path, bytes] : files) {
        add(path);
        add({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    }
    return sum;
}

PowerCut::PowerCut(const DiskState& before) {
    durable_.directories = before.directories;
    for (const auto& [path, bytes] : before.files) {
        durable_.names[path] = nextContent_;
        durable_.contents[nextContent_++] = bytes;
    }
    liveNames_ = durable_.names;
}

void PowerCut::add(const DiskStep& step) {
    Pending pending{step, -1};
    switch (step.what) {
    case What::makeFile:
        pending.content = liveNames_[step.path] = nextContent_++;
        durable_.contents[pending.content] = {};
        break;
    case What::rename: {
        const auto from = liveNames_.find(step.path);
        if (from == liveNames_.end()) {
            return;
        }
        pending.content = liveNames_[step.other] = from->second;
        liveNames_.erase(step.path);
        break;
    }
    case What::removeFile:
        liveNames_.erase(step.path);
        break;
    case What::write:
    case What::resize: {
        const auto file = liveNames_.find(step.path);
        if (file == liveNames_.end()) {
            return;
        }
        pending.content = file->second;
        break;
    }
    case What::sync: {
        const auto file = liveNames_.find(step.path);
        const int content = file == liveNames_.end() ? -1 : file->second;
        return settle([content](const Pending& other) {
            return other.content == content && !isOfName(other.step);
        });
    }
    case What::syncDirectory:
        return settle([&step](const Pending& other) {
            return isOfName(other.step) && parentOf(other.step.path) == step.path;
        });
    case What::makeDirectory:
        break;
    case What::mark:
        return;
    }
    pending_.push_back(std::move(pending));
}

void PowerCut::settle(const std::function<bool(const Pending&)>& isSynced) {
    std::vector<Pending> left;
    for (const Pending& pending : pending_) {
        if (isSynced(pending)) {
            carryOut(durable_, pending, {});
        } else {
            left.push_back(pending);
        }
    }
    pending_ = std::move(left);
}

void PowerCut::carryOut(Disk& disk, const Pending& pending, Sectors sectors) {
    const DiskStep& step = pending.step;
    switch (step.what) {
    case What::makeFile:
        disk.names[step.path] = pending.content;
        break;
    case What::rename:
        disk.names.erase(step.path);
        disk.names[step.other] = pending.content;
        break;
    case What::removeFile:
        disk.names.erase(step.path);
        break;
    case What::makeDirectory:
        disk.directories.insert(step.path);
        break;
    case What::resize:
        disk.contents[pending.content].resize(step.offset);
        break;
    case What::write: {
        Bytes& content = disk.contents[pending.content];
        const std::uint64_t firstSector = step.offset / kSectorSize;
        for (std::size_t i = 0; i < step.bytes.size(); ++i) {
            const std::uint64_t at = step.offset + i;
            const std::uint64_t sector = at / kSectorSize - firstSector;
            if (sector < sectors.first || sector >= sectors.last) {
                continue;
            }
            if (content.size() <= at) {
                content.resize(at + 1);
            }
            content[at] = step.bytes[i];
        }
        break;
    }
    default:
        break;
    }
}

DiskState PowerCut::visible(const Disk& disk) {
    DiskState state;
    const auto isReachable = [&state](const std::string& path) {
        const std::string parent = parentOf(path);
        return parent == "/" || parent.empty() || state.directories.contains(parent);
    };
    // In the order of their names what is above comes first.
    for (const std::string& directory : disk.directories) {
        if (isReachable(directory)) {
            state.directories.insert(directory);
        }
    }
    for (const auto& [path, content] : disk.names) {
        if (isReachable(path)) {
            state.files[path] = disk.contents.at(content);
        }
    }
    return state;
}

void PowerCut::eachState(const std::function<void(const DiskState&)>& visit) const {
    const std::size_t older = pending_.size() - std::min(pending_.size(), kMostPending);
    Disk disk = durable_;
    for (std::size_t i = 0; i < older; ++i) {
        carryOut(disk, pending_[i], {});
    }
    const std::vector<Pending> last(pending_.begin() + static_cast<std::ptrdiff_t>(older),
                                    pending_.end());
    eachOrder(disk, last, visit);
    eachTear(disk, last, visit);
}

/// Each subset, in the order of the run and in the opposite one: between the two every write that
/// shares a sector with another is once above it and once below.
void PowerCut::eachOrder(const Disk& older, const std::vector<Pending>& last,
                         const std::function<void(const DiskState&)>& visit) const {
    for (std::size_t subset = 0; subset < std::size_t{1} << last.size(); ++subset) {
        std::vector<const Pending*> chosen;
        for (std::size_t i = 0; i < last.size(); ++i) {
            if ((subset >> i & 1U) != 0) {
                chosen.push_back(&last[i]);
            }
        }
        for (const bool isReversed : {false, true}) {
            Disk disk = older;
            for (const Pending* const pending : chosen) {
                carryOut(disk, *pending, {});
            }
            visit(visible(disk));
            std::reverse(chosen.begin(), chosen.end());
            if (isReversed || chosen.size() < 2) {
                break;
            }
        }
    }
}

/// Each write in part, from its beginning or to its end, with each of four choices of the others:
/// all, none, those before it, those behind it.
void PowerCut::eachTear(const Disk& older, const std::vector<Pending>& last,
                        const std::function<void(const DiskState&)>& visit) const {
    for (std::size_t torn = 0; torn < last.size(); ++torn) {
        const std::size_t count =
            last[torn].step.what == What::write ? sectorsOf(last[torn].step) : 0;
        for (std::size_t cut = 1; cut < count; ++cut) {
            for (const Sectors part : {Sectors{0, cut}, Sectors{cut, count}}) {
                for (unsigned others = 0; others < 4; ++others) {
                    Disk disk = older;
                    for (std::size_t i = 0; i < last.size(); ++i) {
                        const bool isChosen = (others & (i < torn ? 1U : 2U)) != 0;
                        if (i == torn || isChosen) {
                            carryOut(disk, last[i], i == torn ? part : Sectors{});
                        }
                    }
                    visit(visible(disk));
                }
            }
        }
    }
}

} // namespace support
