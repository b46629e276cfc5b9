#pragma once

#include "base/FileDescriptor.h"
#include "platform/Result.h"
#include "platform/Value.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace kstctl {

/// A row of the events' table.
struct StoredEvent {
    std::int64_t id = 0;
    /// When it was added, in seconds since 2001-01-01 UTC; none when the row does not say.
    std::optional<double> added;
    /// The event as a property list; none when the row holds something else.
    std::optional<platform::Bytes> data;
};

/// Rows in the order in which they were added. Few are kept in memory; many go into a file without
/// a name, so that memory does not grow with them and the database need not stay open meanwhile.
/// The file is in the directory TMPDIR names, or in /var/tmp.
class EventRows {
  public:
    /// How many bytes are kept in memory.
    static constexpr std::size_t kBytesInMemory = 1024UL * 1024;

    /// False when it cannot be kept; `problem` then says why, and nothing is added any more.
    [[nodiscard]] bool add(const StoredEvent& event);

    /// Why rows could not be kept: ExitStatus::failed.
    [[nodiscard]] const std::optional<platform::Error>& problem() const { return problem_; }

    [[nodiscard]] std::uint64_t size() const { return size_; }

    /// Shows the rows to `visitor`, one after the other, as often as it is called. None when all
    /// were shown.
    [[nodiscard]] std::optional<platform::Error>
    visit(const std::function<void(const StoredEvent& event)>& visitor) const;

  private:
    [[nodiscard]] bool moveToFile();

    std::string inMemory_;
    base::FileDescriptor file_;
    std::uint64_t sizeInFile_ = 0;
    std::uint64_t size_ = 0;
    std::optional<platform::Error> problem_;
};

} // namespace kstctl
