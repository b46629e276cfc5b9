#include "keystrand-linux/MachineSwitches.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "keystrand-linux/SmallFile.h"
#include "wire/SystemPaths.h"

#include <systemd/sd-login.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <unistd.h>
#include <utility>

namespace keystrand::usb {

namespace {

constexpr std::string_view kSwitchedOff = "keystrand.restricted_mode=off";
constexpr std::size_t kCommandLineLimit = 65536;
/// More seats than a machine has.
constexpr std::size_t kMostUsers = 64;

struct Free {
    void operator()(char* text) const { std::free(text); }
};
using OwnedText = std::unique_ptr<char, Free>;

std::optional<uid_t> userAt(const char* seat) {
    char* text = nullptr;
    uid_t user = 0;
    if (sd_seat_get_active(seat, &text, &user) < 0) {
        return std::nullopt;
    }
    const OwnedText session(text);
    text = nullptr;
    const bool isUsers = session != nullptr && sd_session_get_class(session.get(), &text) >= 0 &&
                         std::string_view(text) == "user";
    const OwnedText sessionClass(std::exchange(text, nullptr));
    const bool isClosing = isUsers && sd_session_get_state(session.get(), &text) >= 0 &&
                           std::string_view(text) == "closing";
    const OwnedText state(text);
    return isUsers && !isClosing ? std::optional(user) : std::nullopt;
}

/// The first fields of one line of /etc/passwd or /etc/shadow. The second one, which may be a
/// password's hash, is never kept.
struct AccountLine {
    std::string name;
    bool isSecondEmpty = true;
    std::string third;
    /// How many of them are there, the last one also when it is empty.
    std::size_t fields = 1;

    void take(char character) {
        // Longer than any name or number: no line of a user who is looked for.
        constexpr std::size_t kLongest = 256;
        if (character == ':') {
            ++fields;
        } else if (fields == 2) {
            isSecondEmpty = false;
        } else if (fields == 1 && name.size() <= kLongest) {
            name += character;
        } else if (fields == 3 && third.size() <= kLongest) {
            third += character;
        }
    }
};

/// What was read goes with it.
class WipedBuffer : private base::NotCopied {
  public:
    WipedBuffer() = default;
    ~WipedBuffer() { ::explicit_bzero(bytes_.data(), bytes_.size()); }

    [[nodiscard]] ssize_t fillFrom(int fd) { return ::read(fd, bytes_.data(), bytes_.size()); }
    [[nodiscard]] std::string_view view(ssize_t size) const {
        return {bytes_.data(), static_cast<std::size_t>(size)};
    }

  private:
    std::array<char, 4096> bytes_{};
};

/// Calls `take` with each line that has three fields. False, with errno set, when the file cannot
/// be read.
template <typename Take>
bool readAccounts(const std::string& path, const Take& take) {
    const base::FileDescriptor fd(
        ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    if (!fd.isOpen()) {
        return false;
    }
    WipedBuffer buffer;
    AccountLine line;
    const auto end = [&] {
        if (line.fields >= 3) {
            take(std::as_const(line));
        }
        line = AccountLine();
    };
    for (;;) {
        const ssize_t count = buffer.fillFrom(fd.get());
        if (count < 0 && errno != EINTR) {
            return false;
        }
        if (count == 0) {
            end();
            return true;
        }
        for (const char character : buffer.view(std::max<ssize_t>(count, 0))) {
            character == '\n' ? end() : line.take(character);
        }
    }
}

/// None for what is no list of users' numbers.
std::optional<std::vector<uid_t>> decodeUsers(std::string_view text) {
    std::vector<uid_t> users;
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        const auto user = base::parseNumber<uid_t>(text.substr(0, end));
        if (end == std::string_view::npos || !user || users.size() == kMostUsers) {
            return std::nullopt;
        }
        users.push_back(*user);
        text.remove_prefix(end + 1);
    }
    return users;
}

} // namespace

std::vector<uid_t> usersAtTheSeats() {
    std::vector<uid_t> users;
    char** seats = nullptr;
    const int count = sd_get_seats(&seats);
    for (int each = 0; each < count; ++each) {
        const OwnedText seat(seats[each]);
        if (const auto user = userAt(seat.get())) {
            users.push_back(*user);
        }
    }
    std::free(seats);
    return users;
}

MachineSwitches::MachineSwitches(std::string root, const StateFile& lastUsers, GateLog& log,
                                 ActiveUsers activeUsers)
    : root_(std::move(root)),
      lastUsers_(lastUsers),
      log_(log),
      activeUsers_(std::move(activeUsers)) {}

PolicySwitches MachineSwitches::read() {
    const Users users = usersThatCount();
    const bool isUnprotected =
        !users.empty() && std::all_of(users.begin(), users.end(),
                                      [this](uid_t user) { return isWithoutPassword(user); });
    return {.passwordSet = !isUnprotected, .bootArgument = bootArgument()};
}

bool MachineSwitches::bootArgument() const {
    constexpr std::string_view kBlanks = " \t\n";
    const SmallFile file =
        readSmallFile(wire::underRoot(root_, "/proc/cmdline"), kCommandLineLimit);
    std::string_view text = file.bytes;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find_first_of(kBlanks), text.size());
        if (text.substr(0, end) == kSwitchedOff) {
            return true;
        }
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return false;
}

MachineSwitches::Users MachineSwitches::usersThatCount() {
    Users users = activeUsers_();
    if (users.empty()) {
        return kept();
    }
    std::sort(users.begin(), users.end());
    users.erase(std::unique(users.begin(), users.end()), users.end());
    users.resize(std::min(users.size(), kMostUsers));
    keep(users);
    return users;
}

void MachineSwitches::keep(const Users& users) {
    if (kept() == users) {
        return;
    }
    std::string text;
    for (const uid_t user : users) {
        text += base::concat(user, '\n');
    }
    std::string problem;
    if (!lastUsers_.replace(text, problem)) {
        tell(GateLine::recordFailed, problem, "after a restart nobody knows who was active last");
    }
    // Also when that failed: it holds until then, and is not tried again each time.
    kept_ = users;
}

MachineSwitches::Users MachineSwitches::kept() {
    if (!kept_) {
        std::string problem;
        const auto text = lastUsers_.read(problem);
        kept_ = text ? decodeUsers(*text) : std::nullopt;
        if (!kept_ && (text || !problem.empty())) {
            tell(GateLine::recordFailed,
                 problem.empty() ? base::concat(lastUsers_.path(), ": not a list of users")
                                 : problem,
                 "whoever was active last counts as having a password");
        }
        kept_ = kept_.value_or(Users());
    }
    return *kept_;
}

bool MachineSwitches::isWithoutPassword(uid_t user) {
    constexpr std::string_view kConsequence = "every user counts as having a password";
    std::vector<std::string> names;
    const std::string accounts = wire::underRoot(root_, "/etc/passwd");
    if (!readAccounts(accounts, [&](const AccountLine& line) {
            if (base::parseNumber<uid_t>(line.third) == user) {
                names.push_back(line.name);
            }
        })) {
        tell(GateLine::configuration, base::concat(accounts, ": ", errorText(errno)), kConsequence);
        return false;
    }
    // A user with two names has a password when one of them has.
    std::vector<std::string> open;
    std::vector<std::string> others;
    const std::string passwords = wire::underRoot(root_, "/etc/shadow");
    if (!readAccounts(passwords, [&](const AccountLine& line) {
            if (std::find(names.begin(), names.end(), line.name) != names.end()) {
                (line.isSecondEmpty ? open : others).push_back(line.name);
            }
        })) {
        tell(GateLine::configuration, base::concat(passwords, ": ", errorText(errno)),
             kConsequence);
        return false;
    }
    return !names.empty() && others.empty() &&
           std::all_of(names.begin(), names.end(), [&](const std::string& name) {
               return std::find(open.begin(), open.end(), name) != open.end();
           });
}

void MachineSwitches::tell(GateLine about, const std::string& problem,
                           std::string_view consequence) {
    const std::string line = base::concat("keystrand: ", problem, "; ", consequence);
    if (std::exchange(told_, line) != line) {
        log_.write(about, line);
    }
}

} // namespace keystrand::usb
