#pragma once

#include "tests/support/SystemCallGate.h"

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace support {

/// One thing that a program did to a directory, in the order in which it did them.
struct DiskStep {
    enum class What {
        makeFile,
        write,
        /// The file is `offset` long from then on.
        resize,
        sync,
        rename,
        removeFile,
        makeDirectory,
        syncDirectory,
        /// Nothing of the disk: somebody was told something, which is `other`.
        mark,
    };

    What what = What::mark;
    std::string path = {};
    /// The new name of what is renamed; what was said.
    std::string other = {};
    std::uint64_t offset = 0;
    std::vector<std::uint8_t> bytes = {};
};

/// Notes what programs behind a SystemCallGate are about to do to files under a directory. What
/// cannot succeed because of what is there already is left out. Stores into mapped files are not
/// seen.
class DiskRecorder {
  public:
    explicit DiskRecorder(std::string root) : root_(std::move(root)) {}

    /// To be called for each system call, in order.
    void note(const SystemCall& call);

    /// The call that was noted last is not carried out.
    void forgetLast() { steps_.pop_back(); }

    /// What was noted. Paths begin with what is behind the root.
    [[nodiscard]] const std::vector<DiskStep>& steps() const { return steps_; }

  private:
    void noteOpening(const std::string& path, std::uint64_t flags);
    void noteRemoval(const std::string& path);
    void noteWrite(const SystemCall& call, std::vector<std::uint8_t> bytes, std::uint64_t offset);
    void noteSync(const std::string& path);
    void noteSaid(const std::vector<std::uint8_t>& bytes);
    void add(DiskStep step);
    [[nodiscard]] bool isInside(const std::string& path) const;

    std::string root_;
    std::vector<DiskStep> steps_;
};

} // namespace support
