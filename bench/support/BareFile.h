#pragma once

#include "base/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace bench {

/// The floor under every durable write: a record overwritten in place and synced, and nothing else.
/// Each operation throws when it fails.
class BareFile {
  public:
    /// How the record is forced to permanent storage.
    enum class Sync { data, dataAndTimes };

    /// Makes the file, with a record of `size` bytes in it, on permanent storage. It stays open.
    BareFile(std::string path, std::size_t size, Sync sync);

    /// Writes and syncs through the descriptor that is open.
    void save();

    /// Opens the file anew, writes, syncs and closes.
    void openAndSave();

  private:
    void saveTo(int descriptor);

    std::string path_;
    std::vector<std::uint8_t> record_;
    Sync sync_;
    base::FileDescriptor held_;
};

} // namespace bench
