#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace keystrand::sim {

/// A connection to the control socket of a running simulator. Calls block.
class ControlClient {
  public:
    static constexpr std::chrono::seconds kReceiveTimeout{30};

    struct Answer {
        bool ok = false;
        /// Why it failed, empty on success: what the simulator said, or that it could not be
        /// asked.
        std::string reason;
        /// What stood before the last line.
        std::vector<std::string> lines;

        /// The rest of the first line that begins with `key` and a blank; none without one.
        [[nodiscard]] std::optional<std::string> value(std::string_view key) const;
    };

    /// None when nobody listens at `path`, not even at the last of `attempts`, which are 10 ms
    /// apart.
    [[nodiscard]] static std::optional<ControlClient> connect(const std::string& path,
                                                              int attempts = 1);

    ControlClient(ControlClient&& other) noexcept;
    ControlClient& operator=(ControlClient&& other) noexcept;
    ~ControlClient();

    /// Sends one line and waits for its answer. After a failure to send or receive, and after a
    /// timeout, every further command fails too.
    [[nodiscard]] Answer command(std::string_view line);

    /// The two halves of `command`, for a caller that has something to do while the answer is due.
    [[nodiscard]] bool send(std::string_view line);
    [[nodiscard]] Answer receive();

  private:
    explicit ControlClient(int fd) : fd_(fd) {}
    [[nodiscard]] std::optional<std::string> readLine();
    void hangUp();

    int fd_;
    std::string received_;
};

} // namespace keystrand::sim
