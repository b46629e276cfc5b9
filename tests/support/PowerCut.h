#pragma once

#include "tests/support/DiskRecorder.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace support {

/// What is on a disk: files by their paths, and the directories.
struct DiskState {
    std::map<std::string, std::vector<std::uint8_t>> files = {};
    std::set<std::string> directories = {};

    /// What is below a directory now. Paths begin with what is behind it.
    [[nodiscard]] static DiskState of(const std::string& root);
    /// Makes all of it below a directory, in the place of what is there.
    void restore(const std::string& root) const;

    /// The same for equal states.
    [[nodiscard]] std::size_t hash() const;

    friend auto operator<=>(const DiskState&, const DiskState&) = default;
};

/// The states that a disk may be in when the power goes during a run.
///
/// Nothing is promised of what was not synced: of the last kMostPending such steps any may be on
/// the disk and any not, in whatever order, and a write in part, cut at its sectors. Older ones
/// are. The name of a file is a step of its directory, which only a sync of that promises.
class PowerCut {
  public:
    static constexpr std::size_t kMostPending = 8;
    static constexpr std::size_t kSectorSize = 512;

    /// `before` is on the disk as a whole when the run begins.
    explicit PowerCut(const DiskState& before);

    /// The run goes on with a step.
    void add(const DiskStep& step);

    /// Every state, if the power goes now; some of them are alike.
    void eachState(const std::function<void(const DiskState&)>& visit) const;

    /// How many steps are not synced.
    [[nodiscard]] std::size_t pending() const { return pending_.size(); }

  private:
    using Bytes = std::vector<std::uint8_t>;

    struct Pending {
        DiskStep step;
        /// The file's content, also when it has another name later; none for a directory.
        int content = -1;
    };
    struct Disk {
        std::map<std::string, int> names;
        std::set<std::string> directories;
        std::map<int, Bytes> contents;
    };
    /// What of a write is on the disk: the sectors from `first` up to `last`.
    struct Sectors {
        std::size_t first = 0;
        std::size_t last = SIZE_MAX;
    };

    static void carryOut(Disk& disk, const Pending& pending, Sectors sectors);
    [[nodiscard]] static DiskState visible(const Disk& disk);
    void settle(const std::function<bool(const Pending&)>& isSynced);
    void eachOrder(const Disk& older, const std::vector<Pending>& last,
                   const std::function<void(const DiskState&)>& visit) const;
    void eachTear(const Disk& older, const std::vector<Pending>& last,
                  const std::function<void(const DiskState&)>& visit) const;

    Disk durable_;
    std::map<std::string, int> liveNames_;
    int nextContent_ = 0;
    std::vector<Pending> pending_;
};

} // namespace support
