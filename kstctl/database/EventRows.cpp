#include "kstctl/database/EventRows.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Output.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string_view>
#include <unistd.h>

namespace kstctl {

namespace {

/// What stands before the bytes of each row. Only this process reads it.
struct Head {
    std::int64_t id;
    double added;
    std::uint64_t size;
    bool hasAdded;
    bool hasData;
};

std::string directoryForFiles() {
    const char* const chosen = std::getenv("TMPDIR");
    return chosen != nullptr && *chosen != '\0' ? chosen : "/var/tmp";
}

platform::Error cannotKeep(const std::string& directory, int error) {
    return failure(ExitStatus::failed, base::concat("cannot keep what was read: ",
                                                    fileError(directory, error).description));
}

/// Reads a file in large pieces, and gives it in small ones.
class FileReader {
  public:
    explicit FileReader(int file) : file_(file) {}

    /// The next `size` bytes, until the next call; null when they cannot be had.
    [[nodiscard]] const char* take(std::size_t size) {
        while (buffer_.size() - start_ < size) {
            if (!fill(size)) {
                return nullptr;
            }
        }
        start_ += size;
        return buffer_.data() + start_ - size;
    }

  private:
    static constexpr std::size_t kPiece = 64UL * 1024;

    [[nodiscard]] bool fill(std::size_t wanted) {
        buffer_.erase(0, start_);
        start_ = 0;
        const std::size_t held = buffer_.size();
        buffer_.resize(std::max(kPiece, wanted));
        const ssize_t length =
            ::pread(file_, buffer_.data() + held, buffer_.size() - held, offset_);
        buffer_.resize(held + static_cast<std::size_t>(std::max<ssize_t>(length, 0)));
        offset_ += std::max<ssize_t>(length, 0);
        return length > 0 || (length < 0 && errno == EINTR);
    }

    int file_;
    off_t offset_ = 0;
    std::string buffer_;
    std::size_t start_ = 0;
};

StoredEvent eventOf(const Head& head, const char* data) {
    StoredEvent event{.id = head.id, .added = {}, .data = {}};
    if (head.hasAdded) {
        event.added = head.added;
    }
    if (head.hasData) {
        event.data.emplace(data, data + head.size);
    }
    return event;
}

class MemoryReader {
  public:
    explicit MemoryReader(std::string_view bytes) : bytes_(bytes) {}

    [[nodiscard]] const char* take(std::size_t size) {
        const char* const place = bytes_.data();
        bytes_.remove_prefix(size);
        return place;
    }

  private:
    std::string_view bytes_;
};

/// False when the source ends before `count` rows.
template <typename Source>
bool show(std::uint64_t count, Source source,
          const std::function<void(const StoredEvent& event)>& visitor) {
    for (std::uint64_t i = 0; i < count; ++i) {
        const char* const start = source.take(sizeof(Head));
        if (start == nullptr) {
            return false;
        }
        Head head;
        std::memcpy(&head, start, sizeof head);
        const char* const data = source.take(head.size);
        if (data == nullptr) {
            return false;
        }
        visitor(eventOf(head, data));
    }
    return true;
}

} // namespace

bool EventRows::add(const StoredEvent& event) {
    if (problem_) {
        return false;
    }
    Head head{};
    head.id = event.id;
    head.added = event.added.value_or(0);
    head.hasAdded = event.added.has_value();
    head.hasData = event.data.has_value();
    head.size = event.data ? event.data->size() : 0;
    inMemory_.append(reinterpret_cast<const char*>(&head), sizeof head);
    if (head.size > 0) {
        inMemory_.append(reinterpret_cast<const char*>(event.data->data()), head.size);
    }
    ++size_;
    return inMemory_.size() <= kBytesInMemory || moveToFile();
}

bool EventRows::moveToFile() {
    const std::string directory = directoryForFiles();
    if (!file_.isOpen()) {
        std::string path = directory + "/kstctl.XXXXXX";
        file_ = base::FileDescriptor(::mkostemp(path.data(), O_CLOEXEC));
        if (!file_.isOpen()) {
            problem_ = cannotKeep(directory, errno);
            return false;
        }
        // Without a name it goes with the process, however that ends.
        ::unlink(path.c_str());
    }
    if (!writeWhole(file_.get(), inMemory_)) {
        problem_ = cannotKeep(directory, errno);
        return false;
    }
    sizeInFile_ = size_;
    inMemory_.clear();
    return true;
}

std::optional<platform::Error>
EventRows::visit(const std::function<void(const StoredEvent& event)>& visitor) const {
    if (!show(sizeInFile_, FileReader(file_.get()), visitor)) {
        return failure(ExitStatus::failed, "what was read cannot be read again");
    }
    static_cast<void>(show(size_ - sizeInFile_, MemoryReader(inMemory_), visitor));
    return std::nullopt;
}

} // namespace kstctl
