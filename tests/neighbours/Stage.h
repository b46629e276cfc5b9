#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/neighbours/Daemon.h"
#include "tests/neighbours/HTTPSProcess.h"
#include "tests/neighbours/KernelSide.h"
#include "tests/neighbours/Random.h"
#include "tests/support/TemporaryDirectory.h"

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

struct sqlite3;

namespace neighbours {

/// A daemon under a root directory of its own with everything that is around it: the event socket,
/// the kernel side and, when it is wanted, the HTTPS process. All of them are served in one loop.
///
/// Each acknowledgement is held against what the daemon was given and what is in its files at that
/// moment.
class Stage : private base::NotCopied {
  public:
    /// `program` is the daemon for a root directory, `options` what else it is told.
    Stage(std::string program, std::vector<std::string> options);
    ~Stage();

    [[nodiscard]] std::string real(const std::string& path) const { return root_.path() / path; }

    /// Starts a daemon; it may meet a hostile kernel side. It is in its run loop afterwards.
    void launch();
    /// Ends the daemon in order.
    void end();
    [[nodiscard]] bool hasDaemon() const { return daemon_ != nullptr; }
    [[nodiscard]] const Daemon& daemon() const { return *daemon_; }
    /// Of the daemon, and of those before it.
    [[nodiscard]] std::uint64_t lines() const {
        return formerLines_ + (daemon_ ? daemon_->lines() : 0);
    }
    /// What the daemon has said last.
    [[nodiscard]] std::string report() const;

    /// Sends a datagram, when the queue of the event socket has room for it.
    void send(std::span<const std::uint8_t> datagram, bool withDescriptors = false);
    /// Puts a record where the kernel side has it, and sends its event.
    void publish(const std::string& property, Bytes record);

    /// Serves everybody once; waits a little when nobody wants anything.
    void turn();
    /// Serves until it is so. That it never is, is a fault.
    void await(const std::string& what, const std::function<bool()>& isSo);
    /// Until the daemon has taken every event that was sent.
    void awaitEmptyQueue();

    /// A record of each type from a kernel side that behaves: acknowledged, and in the files.
    void exchangeProperly(Random& random);

    /// How many acknowledgements of records of types 1 to 4 there were.
    [[nodiscard]] std::uint64_t acknowledged() const { return acknowledged_; }
    /// How many of them were of figures.
    [[nodiscard]] std::uint64_t figures() const { return figures_; }

    /// Rows in the table of events.
    [[nodiscard]] std::uint64_t storedEvents();
    void makeUploadDue();
    /// Bytes of everything that the daemon keeps.
    [[nodiscard]] std::uint64_t bytesOnDisk() const;

    std::unique_ptr<KernelSide> kernel;
    /// Null where there is none.
    std::unique_ptr<HTTPSProcess> https;

  private:
    /// Whether anybody wanted anything.
    bool serveOnce();
    void checkAcknowledged(const std::string& property, const std::optional<Bytes>& record,
                           bool waits);
    void checkFiles(std::uint32_t type, std::span<const std::uint8_t> record) const;
    void checkFile(const std::string& path, std::span<const std::uint8_t> expected) const;
    void checkAlarm(std::uint64_t seconds) const;
    [[nodiscard]] sqlite3* database();
    std::uint64_t query(const std::string& sql);

    support::TemporaryDirectory root_;
    std::string program_;
    std::vector<std::string> options_;
    base::FileDescriptor events_;
    base::FileDescriptor sender_;
    std::unique_ptr<Daemon> daemon_;
    std::uint64_t formerLines_ = 0;
    std::uint64_t acknowledged_ = 0;
    std::uint64_t figures_ = 0;
    /// The newest record of each property that was acknowledged.
    std::map<std::string, Bytes> confirmed_;
    std::size_t turns_ = 0;
    std::vector<pollfd> watched_;
    sqlite3* database_ = nullptr;
};

} // namespace neighbours
