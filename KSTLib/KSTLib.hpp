#ifndef KST_KSTLIB_KSTLIB_HPP
#define KST_KSTLIB_KSTLIB_HPP

#include "KSTLib/KSTLib.h"
#include "KSTLib/Words.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <optional>
#include <poll.h>
#include <string>
#include <sys/signalfd.h>
#include <system_error>
#include <termios.h>
#include <type_traits>
#include <unistd.h>
#include <utility>
#include <vector>

/** The library for C++17: values that own what they hold, over the functions of KSTLib/KSTLib.h,
 *  which say what each call does and can be used beside them. All of it is in this header.
 *
 *  What can fail gives a kst::Result: a value, or a std::error_code whose number is the KSTStatus.
 *  Nothing here throws but Result::value(), which is for programs that want that; memory that is
 *  not to be had is kKSTErrorOutOfMemory. Only words(), which makes a text, throws std::bad_alloc.
 *  The header does without exceptions, too (-fno-exceptions), and memory that is not to be had then
 *  ends the program.
 *
 *  Passphrases are in kst::Passphrase, which has them in one place and wipes it. What the header
 *  hands to the library, the library wipes.
 *
 *  Threads: as KSTLib/KSTLib.h says, a program with several makes one call at a time. */

namespace kst {

namespace detail {

/// The numbers of this category are KSTStatus.
class StatusCategory : public std::error_category {
  public:
    [[nodiscard]] const char* name() const noexcept override { return "KSTLib"; }

    [[nodiscard]] std::string message(int status) const override { return KSTStatusText(status); }

    [[nodiscard]] std::error_condition default_error_condition(int status) const noexcept override {
        switch (status) {
        case kKSTErrorBadParameter:
            return std::make_error_condition(std::errc::invalid_argument);
        case kKSTErrorOutOfMemory:
            return std::make_error_condition(std::errc::not_enough_memory);
        default:
            break;
        }
        constexpr int kLastErrno = 4095;
        const int error = KST_STATUS_OF_ERRNO(0) - status;
        return error > 0 && error <= kLastErrno
                   ? std::error_condition(error, std::generic_category())
                   : std::error_condition(status, *this);
    }
};

} // namespace detail

/** The category of the library's errors, "KSTLib". A message is the text of KSTStatusText. A failed
 *  connection equals the condition of its errno: `error == std::errc::permission_denied`. */
[[nodiscard]] inline const std::error_category& statusCategory() noexcept {
    static const detail::StatusCategory category;
    return category;
}

/** The status as an error; no error for 0. */
[[nodiscard]] inline std::error_code errorOf(KSTStatus status) noexcept {
    return {status, statusCategory()};
}

/** A value, or the error for which there is none. True when there is a value, whatever it is: a
 *  Result<bool> is asked twice, whether there is an answer and, with *, what it is. */
template <typename Value>
class [[nodiscard]] Result {
  public:
    Result(Value value) noexcept : value_(std::move(value)) {}
    Result(std::error_code error) noexcept : error_(error) {}

    [[nodiscard]] explicit operator bool() const noexcept { return value_.has_value(); }

    /** No error when there is a value. */
    [[nodiscard]] std::error_code error() const noexcept { return error_; }

    /** The value, which must be there. */
    [[nodiscard]] Value& operator*() & noexcept KST_LIFETIMEBOUND { return *value_; }
    [[nodiscard]] const Value& operator*() const& noexcept KST_LIFETIMEBOUND { return *value_; }
    [[nodiscard]] Value&& operator*() && noexcept KST_LIFETIMEBOUND { return std::move(*value_); }
    [[nodiscard]] Value* operator->() noexcept KST_LIFETIMEBOUND { return &*value_; }
    [[nodiscard]] const Value* operator->() const noexcept KST_LIFETIMEBOUND { return &*value_; }

    /** The value; throws std::system_error with the error when there is none. */
    [[nodiscard]] Value value() && {
        if (!value_) {
#ifdef __cpp_exceptions
            throw std::system_error(error_);
#else
            std::abort();
#endif
        }
        return std::move(*value_);
    }

  private:
    std::optional<Value> value_;
    std::error_code error_;
};

/** Nothing, or an error. */
template <>
class [[nodiscard]] Result<void> {
  public:
    Result() noexcept = default;
    Result(std::error_code error) noexcept : error_(error) {}

    [[nodiscard]] explicit operator bool() const noexcept { return !error_; }
    [[nodiscard]] std::error_code error() const noexcept { return error_; }

    /** Throws std::system_error with the error, if there is one. */
    void value() const {
        if (error_) {
#ifdef __cpp_exceptions
            throw std::system_error(error_);
#else
            std::abort();
#endif
        }
    }

  private:
    std::error_code error_;
};

/** Bytes that belong to somebody else. */
struct Bytes {
    const void* data = nullptr;
    std::size_t length = 0;

    /** They are the number of that type; none when they are of another size. */
    template <typename Number>
    [[nodiscard]] std::optional<Number> as() const noexcept {
        static_assert(std::is_trivially_copyable_v<Number>);
        Number number;
        if (data == nullptr || length != sizeof number) {
            return std::nullopt;
        }
        std::memcpy(&number, data, sizeof number);
        return number;
    }
};

namespace detail {

[[nodiscard]] inline Result<void> resultOf(KSTStatus status) noexcept {
    return errorOf(status);
}

/// What it returns; kKSTErrorOutOfMemory when memory runs out in it.
template <typename Work>
[[nodiscard]] KSTStatus withMemory(Work&& work) noexcept {
#ifdef __cpp_exceptions
    try {
        return work();
    } catch (...) {
        return kKSTErrorOutOfMemory;
    }
#else
    return work();
#endif
}

/// A yes or no that came as a status.
[[nodiscard]] inline Result<bool> answerOf(KSTStatus status) noexcept {
    if (status == kKSTErrorSuccess || status == kKSTErrorNotContained) {
        return status == kKSTErrorSuccess;
    }
    return errorOf(status);
}

/// Bytes in the object itself that are wiped when it goes, and where it was when it is moved. There
/// are no copies.
template <std::size_t Room>
class WipedBytes {
  public:
    static constexpr std::size_t kRoom = Room;

    WipedBytes() noexcept = default;
    WipedBytes(WipedBytes&& other) noexcept { take(other); }
    WipedBytes& operator=(WipedBytes&& other) noexcept {
        if (this != &other) {
            wipe();
            take(other);
        }
        return *this;
    }
    WipedBytes(const WipedBytes&) = delete;
    WipedBytes& operator=(const WipedBytes&) = delete;
    ~WipedBytes() { wipe(); }

    [[nodiscard]] const std::uint8_t* data() const noexcept KST_LIFETIMEBOUND {
        return bytes_.data();
    }
    [[nodiscard]] std::size_t size() const noexcept { return size_; }

    void wipe() noexcept {
        ::explicit_bzero(bytes_.data(), bytes_.size());
        size_ = 0;
    }

  protected:
    std::array<std::uint8_t, Room> bytes_{};
    std::size_t size_ = 0;

  private:
    void take(WipedBytes& other) noexcept {
        bytes_ = other.bytes_;
        size_ = other.size_;
        other.wipe();
    }
};

/// A terminal without echo until the end of the scope. Signals that would end or stop the program
/// wait so long, and make a read end.
class SilentTerminal {
  public:
    explicit SilentTerminal(int terminal) noexcept : terminal_(terminal) {
        if (::tcgetattr(terminal, &before_) != 0) {
            return;
        }
        sigset_t signals;
        ::sigemptyset(&signals);
        for (const int number : {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGTSTP}) {
            ::sigaddset(&signals, number);
        }
        signals_ = ::signalfd(-1, &signals, SFD_CLOEXEC);
        if (signals_ < 0 || ::pthread_sigmask(SIG_BLOCK, &signals, &mask_) != 0) {
            return;
        }
        termios silent = before_;
        silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        silent.c_lflag |= ECHONL;
        isSilent_ = ::tcsetattr(terminal, TCSAFLUSH, &silent) == 0;
        if (!isSilent_) {
            ::pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
        }
    }
    SilentTerminal(const SilentTerminal&) = delete;
    SilentTerminal& operator=(const SilentTerminal&) = delete;
    ~SilentTerminal() {
        if (isSilent_) {
            ::tcsetattr(terminal_, TCSAFLUSH, &before_);
        }
        if (signals_ >= 0) {
            ::close(signals_);
        }
        if (isSilent_) {
            ::pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
        }
    }

    [[nodiscard]] bool isSilent() const noexcept { return isSilent_; }

    /// False when a signal came first.
    [[nodiscard]] bool awaitInput() const noexcept {
        std::array<pollfd, 2> ends = {pollfd{terminal_, POLLIN, 0}, pollfd{signals_, POLLIN, 0}};
        while (::poll(ends.data(), ends.size(), -1) < 0) {
            if (errno != EINTR) {
                return true;
            }
        }
        return ends[1].revents == 0;
    }

  private:
    int terminal_;
    int signals_ = -1;
    bool isSilent_ = false;
    termios before_{};
    sigset_t mask_{};
};

} // namespace detail

/** A passphrase, at most 128 bytes. They are in the object itself and nowhere else, and are wiped
 *  when it goes. It is moved, which wipes where it was, and not copied. */
class Passphrase : public detail::WipedBytes<kKSTPassphraseMaxLength> {
  public:
    /** An empty one. */
    Passphrase() noexcept = default;

    /** Copies `length` bytes at `bytes`, which stay the caller's to wipe. kKSTErrorBadParameter:
     *  more than 128, or null with a length. */
    [[nodiscard]] static Result<Passphrase> from(const void* bytes, std::size_t length) noexcept {
        if (length > kRoom || (bytes == nullptr && length > 0)) {
            return errorOf(kKSTErrorBadParameter);
        }
        Passphrase passphrase;
        if (length > 0) {
            std::memcpy(passphrase.bytes_.data(), bytes, length);
        }
        passphrase.size_ = length;
        return passphrase;
    }

    /** Reads a line from `input`, without its end and no further.
     *
     *  On a terminal `prompt` is written to standard error, and nothing of what is typed is shown.
     *  A signal that ends or stops the program does so when the terminal shows again what is typed,
     *  and if the program goes on, the error is std::errc::interrupted. That holds for signals that
     *  this thread gets: a program with several blocks them in the others.
     *
     *  kKSTErrorBadParameter: the line has more than 128 bytes; it is read to its end.
     *  std::errc::no_message: there is no line any more. Or the system's error of reading, or of
     *  silencing the terminal. */
    [[nodiscard]] static Result<Passphrase> read(const char* prompt,
                                                 int input = STDIN_FILENO) noexcept {
        if (::isatty(input) == 0) {
            return readLine(input, nullptr);
        }
        const detail::SilentTerminal terminal(input);
        if (!terminal.isSilent()) {
            return std::error_code(errno, std::generic_category());
        }
        const ssize_t ignored = ::write(STDERR_FILENO, prompt, std::strlen(prompt));
        static_cast<void>(ignored);
        return readLine(input, &terminal);
    }

  private:
    static Result<Passphrase> readLine(int input, const detail::SilentTerminal* terminal) noexcept {
        Passphrase line;
        std::size_t length = 0;
        for (;;) {
            if (terminal != nullptr && !terminal->awaitInput()) {
                return std::make_error_code(std::errc::interrupted);
            }
            std::uint8_t spare = 0;
            std::uint8_t* const place = length < kRoom ? &line.bytes_[length] : &spare;
            const ssize_t got = ::read(input, place, 1);
            if (got < 0 && errno == EINTR) {
                continue;
            }
            if (got < 0) {
                return std::error_code(errno, std::generic_category());
            }
            if (got == 0 && length == 0) {
                return std::make_error_code(std::errc::no_message);
            }
            if (got == 0 || *place == '\n') {
                break;
            }
            ::explicit_bzero(&spare, sizeof spare);
            ++length;
        }
        if (length > kRoom) {
            return errorOf(kKSTErrorBadParameter);
        }
        line.size_ = length;
        return line;
    }
};

/** A credential in the program's memory, wiped and freed at its end. */
class Credential {
  public:
    /** As KSTCredentialCreate. */
    [[nodiscard]] static Result<Credential> create(std::uint32_t type) noexcept {
        KSTCredential* created = nullptr;
        const KSTStatus status = KSTCredentialCreate(type, &created);
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return Credential(created);
    }

    /** A passphrase that this process's user has entered, or another user. */
    [[nodiscard]] static Result<Credential> create(const Passphrase& passphrase,
                                                   KSTPassphrasePurpose purpose,
                                                   std::uint32_t userId = ::getuid()) noexcept {
        Result<Credential> made = create(kKSTCredentialTypePassphraseEntered);
        if (made) {
            Result<void> done = made->set(kKSTCredentialPropertyUserId, userId);
            if (done) {
                done = made->set(kKSTCredentialPropertyPurpose, purpose);
            }
            if (done && passphrase.size() > 0) {
                done = made->set(kKSTCredentialPropertyPassphrase, passphrase.data(),
                                 passphrase.size());
            }
            if (!done) {
                return done.error();
            }
        }
        return made;
    }

    Credential(Credential&& other) noexcept
        : credential_(std::exchange(other.credential_, nullptr)) {}
    Credential& operator=(Credential&& other) noexcept {
        Credential taken(std::move(other));
        std::swap(credential_, taken.credential_);
        return *this;
    }
    Credential(const Credential&) = delete;
    Credential& operator=(const Credential&) = delete;
    ~Credential() {
        if (credential_ != nullptr) {
            KSTCredentialDelete(credential_);
        }
    }

    [[nodiscard]] std::uint32_t type() const noexcept { return KSTCredentialGetType(credential_); }

    /** As KSTCredentialSetProperty. */
    [[nodiscard]] Result<void> set(std::uint32_t propertyId, const void* data,
                                   std::size_t length) noexcept {
        return detail::resultOf(KSTCredentialSetProperty(credential_, propertyId, data, length));
    }

    /** Sets a property that is a number. */
    [[nodiscard]] Result<void> set(std::uint32_t propertyId, std::uint32_t number) noexcept {
        return set(propertyId, &number, sizeof number);
    }

    /** As KSTCredentialGetPropertyData: bytes of this credential, until it is changed or goes. */
    [[nodiscard]] Result<Bytes>
    property(std::uint32_t propertyId) const noexcept KST_LIFETIMEBOUND {
        Bytes bytes;
        const KSTStatus status =
            KSTCredentialGetPropertyData(credential_, propertyId, &bytes.data, &bytes.length);
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return bytes;
    }

    /** For the functions of KSTLib/KSTLib.h; null after it was moved away. */
    [[nodiscard]] const KSTCredential* get() const noexcept KST_LIFETIMEBOUND {
        return credential_;
    }

  private:
    explicit Credential(KSTCredential* credential) noexcept : credential_(credential) {}

    KSTCredential* credential_;
};

/** A node of a tree of requirements with all that is below it, copied out of the library: it stays
 *  when the call is over, and can be copied, moved and compared. The tree of an answer is at most
 *  as deep as 4092 bytes can be. */
class Requirement {
  public:
    /** Copies a tree, for blocks of the functions of KSTLib/KSTLib.h; none of null.
     *  kKSTErrorOutOfMemory. */
    [[nodiscard]] static Result<Requirement> of(const KSTRequirement* requirement) noexcept {
        if (requirement == nullptr) {
            return errorOf(kKSTErrorBadParameter);
        }
        Requirement copy;
        const KSTStatus status = detail::withMemory([&] { return copy.take(requirement); });
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return copy;
    }

    [[nodiscard]] std::uint32_t type() const noexcept { return type_; }
    [[nodiscard]] std::uint32_t state() const noexcept { return state_; }
    [[nodiscard]] std::uint32_t priority() const noexcept { return priority_; }
    /** In the order of the policy; none for a leaf. */
    [[nodiscard]] const std::vector<Requirement>& children() const noexcept KST_LIFETIMEBOUND {
        return children_;
    }

    /** The bytes of a property of 100 and above (kKSTRequirementProperty...), whole; none when the
     *  requirement does not have it. */
    [[nodiscard]] std::optional<Bytes>
    property(std::uint32_t propertyId) const noexcept KST_LIFETIMEBOUND {
        for (const Property& property : properties_) {
            if (property.id == propertyId) {
                return Bytes{property.bytes.data(), property.bytes.size()};
            }
        }
        return std::nullopt;
    }

    /** A property that is a number. */
    [[nodiscard]] std::optional<std::uint32_t> number(std::uint32_t propertyId) const noexcept {
        const auto bytes = property(propertyId);
        return bytes ? bytes->as<std::uint32_t>() : std::nullopt;
    }

    /** The purpose that a passphrase is asked for; none when none is. */
    [[nodiscard]] std::optional<KSTPassphrasePurpose> purpose() const noexcept {
        return number(kKSTRequirementPropertyPurpose);
    }

    /** This node in words, on one line: "a passphrase for purpose 1, too old", "2 of". */
    [[nodiscard]] std::string words() const {
        const auto k = number(kKSTRequirementPropertyK);
        std::string text = k ? std::to_string(*k) + " of" : KSTRequirementTypeText(type_);
        if (const auto wanted = purpose(); wanted && *wanted == kKSTPassphrasePurposeAny) {
            text += std::string(" for ") + KSTPassphrasePurposeText(*wanted);
        } else if (wanted) {
            text += " for purpose " + std::to_string(*wanted);
        }
        const auto ageLimit = number(kKSTRequirementPropertyAgeLimit);
        if (ageLimit && *ageLimit != kKSTNoAgeLimit) {
            text += " of the last " + std::to_string(*ageLimit) + " seconds";
        }
        if (state_ == kKSTRequirementStateTooOld) {
            text += std::string(", ") + KSTRequirementStateText(state_);
        } else if (state_ != kKSTRequirementStateMissing) {
            text += ", state " + std::to_string(state_);
        }
        return text;
    }

    /** Calls `visit` with each node and its depth, 0 for this one: a node before its children, and
     *  those in their order. What it throws passes through. */
    template <typename Visit>
    void walk(Visit&& visit, std::size_t depth = 0) const {
        visit(*this, depth);
        for (const Requirement& child : children_) {
            child.walk(visit, depth + 1);
        }
    }

    [[nodiscard]] friend bool operator==(const Requirement& one,
                                         const Requirement& other) noexcept {
        return one.type_ == other.type_ && one.state_ == other.state_ &&
               one.priority_ == other.priority_ && one.properties_ == other.properties_ &&
               one.children_ == other.children_;
    }
    [[nodiscard]] friend bool operator!=(const Requirement& one,
                                         const Requirement& other) noexcept {
        return !(one == other);
    }

  private:
    struct Property {
        std::uint32_t id;
        std::vector<std::uint8_t> bytes;

        [[nodiscard]] friend bool operator==(const Property& one, const Property& other) noexcept {
            return one.id == other.id && one.bytes == other.bytes;
        }
    };

    /// The first that are members.
    static constexpr std::uint32_t kFirstProperty = 100;

    Requirement() noexcept = default;

    void keep(std::uint32_t id, const void* data, std::size_t length) {
        const auto* bytes = static_cast<const std::uint8_t*>(data);
        properties_.push_back({id, {bytes, bytes + length}});
    }

    /// What is listed of a property may be less than all of it.
    void keepWhole(const KSTRequirement* node, std::uint32_t id, const void* data,
                   std::size_t length) {
        const void* whole = nullptr;
        std::size_t wholeLength = 0;
        const bool isShortened =
            id >= kKSTRequirementProperty300 && id <= kKSTRequirementProperty302;
        if (isShortened && KSTRequirementGetPropertyData(node, id, &whole, &wholeLength) == 0) {
            keep(id, whole, wholeLength);
        } else {
            keep(id, data, length);
        }
    }

    /// Nothing is thrown through the library: the first status that is not 0 is the end.
    KSTStatus take(const KSTRequirement* node) {
        type_ = KSTRequirementGetType(node);
        state_ = KSTRequirementGetState(node);
        priority_ = KSTRequirementGetPriority(node);
        KSTStatus status = kKSTErrorSuccess;
        const KSTStatus listed = KSTRequirementGetProperties(
            node, [&](std::uint32_t id, const void* data, std::size_t length) {
                if (id >= kFirstProperty && status == kKSTErrorSuccess) {
                    status = detail::withMemory([&] {
                        keepWhole(node, id, data, length);
                        return KSTStatus(kKSTErrorSuccess);
                    });
                }
            });
        const void* data = nullptr;
        std::size_t length = 0;
        if (type_ == kKSTRequirementTypeUserOutputDisplayed &&
            KSTRequirementGetPropertyData(node, kKSTRequirementProperty400, &data, &length) == 0) {
            keep(kKSTRequirementProperty400, data, length);
        }
        KSTRequirementGetSubrequirements(node, [&](const KSTRequirement* child) {
            if (child != nullptr && status == kKSTErrorSuccess) {
                status = detail::withMemory([&] {
                    Requirement copy;
                    const KSTStatus taken = copy.take(child);
                    children_.push_back(std::move(copy));
                    return taken;
                });
            }
        });
        return listed != kKSTErrorSuccess ? listed : status;
    }

    std::uint32_t type_ = 0;
    std::uint32_t state_ = 0;
    std::uint32_t priority_ = 0;
    std::vector<Property> properties_;
    std::vector<Requirement> children_;
};

/** What a question about a policy comes with. */
struct Question {
    /** Asks without using anything up. */
    bool preflight = false;
    /** Up to 10; null when there are none. They are the caller's and outlive the call. */
    const KSTParameter* parameters = nullptr;
    std::uint32_t parametersCount = 0;
    /** In seconds; global credentials count up to this age, and with 0 not at all. */
    std::uint32_t maxGlobalCredentialAge = 0;
};

/** The parameter that says whose credentials count. It points to `userId`. */
[[nodiscard]] inline KSTParameter
userParameter(const std::uint32_t& userId KST_LIFETIMEBOUND) noexcept {
    return {kKSTParameterTypeUserId, &userId, sizeof userId};
}

/** The answer about a policy. */
struct Answer {
    bool satisfied = false;
    /** What is still to be done; may be none even when the policy is not satisfied. */
    std::optional<Requirement> missing;
};

namespace detail {

/// Takes what the block of a question is handed.
struct AnswerTaker {
    KSTStatus status = kKSTErrorUnexpected;
    Answer answer;

    void operator()(KSTStatus asked, bool satisfied, const KSTRequirement* requirement) noexcept {
        status = asked;
        answer.satisfied = satisfied;
        if (requirement != nullptr) {
            Result<Requirement> copy = Requirement::of(requirement);
            if (copy) {
                answer.missing = *std::move(copy);
            } else {
                status = copy.error().value();
            }
        }
    }

    [[nodiscard]] Result<Answer> result() noexcept {
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return std::move(answer);
    }
};

/// Takes bytes from a block.
class BytesTaker {
  public:
    [[nodiscard]] KSTStatus take(const void* data, std::size_t length) noexcept {
        return withMemory([&] {
            const auto* bytes = static_cast<const std::uint8_t*>(data);
            bytes_.assign(bytes, bytes + length);
            return KSTStatus(kKSTErrorSuccess);
        });
    }

    [[nodiscard]] Result<std::vector<std::uint8_t>> result(KSTStatus status) noexcept {
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return std::move(bytes_);
    }

  private:
    std::vector<std::uint8_t> bytes_;
};

} // namespace detail

/** What another process opens a context by, 16 bytes. Who has them can use the context: they are
 *  wiped like a passphrase. */
class ExternalForm : public detail::WipedBytes<kKSTHandleSize> {
  public:
    /** Copies 16 bytes. kKSTErrorBadParameter: it is another number, or null. */
    [[nodiscard]] static Result<ExternalForm> from(const void* bytes, std::size_t length) noexcept {
        if (bytes == nullptr || length != kRoom) {
            return errorOf(kKSTErrorBadParameter);
        }
        ExternalForm form;
        std::memcpy(form.bytes_.data(), bytes, length);
        form.size_ = length;
        return form;
    }

  private:
    ExternalForm() noexcept = default;
};

/** A context, deleted at its end. One that was created here is destroyed then, so that the kernel
 *  service forgets it; one that was opened stays for the others. */
class Context {
  public:
    /** As KSTContextCreate. */
    [[nodiscard]] static Result<Context> create() noexcept {
        KSTContextRef created = nullptr;
        const KSTStatus status = KSTContextCreate(&created);
        if (status != kKSTErrorSuccess) {
            return errorOf(status);
        }
        return Context(created, true);
    }

    /** As KSTContextCreateWithExternalForm, which does not tell a context that is not there from a
     *  failure: kKSTKernelErrorNoSuchContext stands for both. */
    [[nodiscard]] static Result<Context> open(const ExternalForm& form) noexcept {
        KSTContextRef opened = KSTContextCreateWithExternalForm(form.data(), form.size());
        if (opened == nullptr) {
            return errorOf(kKSTKernelErrorNoSuchContext);
        }
        return Context(opened, false);
    }

    Context(Context&& other) noexcept
        : context_(std::exchange(other.context_, nullptr)), destroys_(other.destroys_) {}
    Context& operator=(Context&& other) noexcept {
        Context taken(std::move(other));
        std::swap(context_, taken.context_);
        std::swap(destroys_, taken.destroys_);
        return *this;
    }
    Context(const Context&) = delete;
    Context& operator=(const Context&) = delete;
    ~Context() {
        if (context_ != nullptr && KSTContextDelete(context_, destroys_) != kKSTErrorSuccess) {
            KSTContextDelete(context_, false);
        }
    }

    /** Whether the kernel service's end goes with this one. */
    void destroyAtTheEnd(bool destroys) noexcept { destroys_ = destroys; }

    /** Deletes it now, and the kernel service's end with it. After a failure it still is there. */
    [[nodiscard]] Result<void> destroy() noexcept {
        const KSTStatus status = KSTContextDelete(context_, true);
        if (status == kKSTErrorSuccess) {
            context_ = nullptr;
        }
        return detail::resultOf(status);
    }

    /** As KSTContextGetExternalForm, which does not tell why there is none:
     *  kKSTErrorUnexpected. */
    [[nodiscard]] Result<ExternalForm> externalForm() const noexcept {
        Result<ExternalForm> form = errorOf(kKSTErrorUnexpected);
        KSTContextGetExternalForm(context_, [&form](const void* data, std::size_t length) {
            form = ExternalForm::from(data, length);
        });
        return form;
    }

    /** As KSTContextAddCredentialWithScope. */
    [[nodiscard]] Result<void> add(const Credential& credential,
                                   KSTScope scope = kKSTScopeContext) noexcept {
        return detail::resultOf(
            KSTContextAddCredentialWithScope(context_, credential.get(), scope));
    }

    /** As KSTContextReplacePassphraseCredentialsWithScope. */
    [[nodiscard]] Result<void> replacePassphrases(const Credential& credential,
                                                  KSTScope scope = kKSTScopeContext) noexcept {
        return detail::resultOf(
            KSTContextReplacePassphraseCredentialsWithScope(context_, credential.get(), scope));
    }

    /** As KSTContextRemoveCredentialsByTypeAndScope. */
    [[nodiscard]] Result<void> remove(std::uint32_t type,
                                      KSTScope scope = kKSTScopeContext) noexcept {
        return detail::resultOf(KSTContextRemoveCredentialsByTypeAndScope(context_, type, scope));
    }

    /** As KSTContextRemoveCredentialsByValueAndScope. */
    [[nodiscard]] Result<void> remove(const Credential& credential,
                                      KSTScope scope = kKSTScopeContext) noexcept {
        return detail::resultOf(
            KSTContextRemoveCredentialsByValueAndScope(context_, credential.get(), scope));
    }

    /** As KSTContextRemovePassphraseCredentialsByPurposeAndScope. */
    [[nodiscard]] Result<void> removePassphrases(KSTPassphrasePurpose purpose,
                                                 KSTScope scope = kKSTScopeContext) noexcept {
        return detail::resultOf(
            KSTContextRemovePassphraseCredentialsByPurposeAndScope(context_, purpose, scope));
    }

    /** As KSTContextContainsCredentialTypeEx. */
    [[nodiscard]] Result<bool> contains(std::uint32_t type,
                                        std::uint32_t argument = 0) const noexcept {
        return detail::answerOf(KSTContextContainsCredentialTypeEx(context_, type, argument));
    }

    /** As KSTContextContainsPassphraseCredentialWithPurpose. */
    [[nodiscard]] Result<bool> containsPassphrase(KSTPassphrasePurpose purpose,
                                                  std::uint32_t argument = 0) const noexcept {
        return detail::answerOf(
            KSTContextContainsPassphraseCredentialWithPurpose(context_, purpose, argument));
    }

    /** As KSTContextVerifyPolicyEx. */
    [[nodiscard]] Result<Answer> verify(const char* policyId,
                                        const Question& question = {}) const noexcept {
        detail::AnswerTaker taker;
        KSTContextVerifyPolicyEx(context_, policyId, question.preflight, question.parameters,
                                 question.parametersCount, question.maxGlobalCredentialAge, taker);
        return taker.result();
    }

    /** As KSTContextVerifyAclConstraint. */
    [[nodiscard]] Result<Answer> verifyConstraint(const void* constraint, std::size_t length,
                                                  const Question& question = {}) const noexcept {
        detail::AnswerTaker taker;
        KSTContextVerifyAclConstraint(context_, constraint, length, question.preflight,
                                      question.parameters, question.parametersCount,
                                      question.maxGlobalCredentialAge, taker);
        return taker.result();
    }

    /** For the functions of KSTLib/KSTLib.h; null after it was moved away or destroyed. */
    [[nodiscard]] KSTContextRef get() const noexcept KST_LIFETIMEBOUND { return context_; }

  private:
    Context(KSTContextRef context, bool destroys) noexcept
        : context_(context), destroys_(destroys) {}

    KSTContextRef context_;
    bool destroys_;
};

/** As KSTGlobalContextAddCredential. */
[[nodiscard]] inline Result<void> addGlobally(const Credential& credential) noexcept {
    return detail::resultOf(KSTGlobalContextAddCredential(credential.get()));
}

/** As KSTGlobalContextRemoveCredentialsByType. */
[[nodiscard]] inline Result<void> removeGlobally(std::uint32_t type) noexcept {
    return detail::resultOf(KSTGlobalContextRemoveCredentialsByType(type));
}

/** As KSTGlobalContextVerifyPolicy; the age in `question` does not matter. */
[[nodiscard]] inline Result<Answer> verifyGlobally(const char* policyId,
                                                   const Question& question = {}) noexcept {
    detail::AnswerTaker taker;
    KSTGlobalContextVerifyPolicy(policyId, question.preflight, question.parameters,
                                 question.parametersCount, taker);
    return taker.result();
}

/** As KSTParseAclAndCopyConstraintCharacteristics. */
[[nodiscard]] inline Result<std::vector<std::uint8_t>>
constraintCharacteristics(const void* acl, std::size_t length) noexcept {
    detail::BytesTaker taker;
    KSTStatus kept = kKSTErrorSuccess;
    const KSTStatus status = KSTParseAclAndCopyConstraintCharacteristics(
        acl, length, [&](KSTStatus parsed, const void* data, std::size_t size) {
            kept = parsed == kKSTErrorSuccess ? taker.take(data, size) : parsed;
        });
    return taker.result(status != kKSTErrorSuccess ? status : kept);
}

} // namespace kst

#endif
