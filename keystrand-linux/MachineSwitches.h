#pragma once

#include "keystrand-linux/GateLog.h"
#include "keystrand-linux/Keystrand.h"
#include "keystrand-linux/StateFile.h"

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace keystrand::usb {

/// The users of the sessions that are active now, at most one for each seat. Sessions that are
/// closing, and those in which nobody has logged in (greeters), have none. Asks logind's files, not
/// a message bus.
[[nodiscard]] std::vector<uid_t> usersAtTheSeats();

/// What the machine itself says about its policy, under a root directory.
///
/// A password protects nothing where the user has none. The users that count are those of the
/// active sessions; while there are none, those who were active last, which is kept on disk. Where
/// several seats have one, all of them must be without a password: one who has one is protected.
///
/// Without a password is who is found by name and number in /etc/passwd, and has an empty second
/// field in /etc/shadow. Everybody else has one: users of a directory service, users that are
/// locked out, and all of them while the files cannot be read, which a line tells.
class MachineSwitches {
  public:
    using ActiveUsers = std::function<std::vector<uid_t>()>;

    /// File and log outlive it. The file holds the users' numbers, one a line.
    MachineSwitches(std::string root, const StateFile& lastUsers, GateLog& log,
                    ActiveUsers activeUsers);

    /// Reads everything anew, and keeps who is active.
    [[nodiscard]] PolicySwitches read();

  private:
    using Users = std::vector<uid_t>;

    [[nodiscard]] bool bootArgument() const;
    [[nodiscard]] Users usersThatCount();
    void keep(const Users& users);
    [[nodiscard]] Users kept();
    [[nodiscard]] bool isWithoutPassword(uid_t user);
    void tell(GateLine about, const std::string& problem, std::string_view consequence);

    std::string root_;
    const StateFile& lastUsers_;
    GateLog& log_;
    ActiveUsers activeUsers_;
    /// What the file holds, once it was read or written.
    std::optional<Users> kept_;
    std::string told_;
};

} // namespace keystrand::usb
