#include "kstctl/Output.h"

#include "base/Concat.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"

#include <algorithm>
#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <sys/ioctl.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace kstctl {

namespace {

bool isSet(const char* variable) {
    const char* const value = std::getenv(variable);
    return value != nullptr && *value != '\0';
}

bool isDumbTerminal() {
    const char* const kind = std::getenv("TERM");
    return kind == nullptr || std::string_view(kind) == "dumb";
}

std::optional<std::size_t> widthOf(int terminal) {
    winsize size{};
    return ::ioctl(terminal, TIOCGWINSZ, &size) == 0 && size.ws_col > 0
               ? std::optional<std::size_t>(size.ws_col)
               : std::nullopt;
}

} // namespace

Output::Output(bool isJSON, int descriptor)
    : isJSON_(isJSON),
      isTerminal_(::isatty(descriptor) == 1),
      colours_(isTerminal_ && !isJSON && !isSet("NO_COLOR") && !isDumbTerminal() ? Colours::yes
                                                                                 : Colours::no),
      width_(isTerminal_ ? widthOf(descriptor) : std::nullopt),
      results_(descriptor) {}

void Output::show(const Report& report) {
    put(isJSON_ ? JSONForm(report) : textForm(report, colours_));
}

void Output::complain(std::string_view message) {
    // There is nowhere left to say that this could not be said.
    static_cast<void>(
        writeWhole(STDERR_FILENO, base::concat("kstctl: ", printable(message), '\n')));
}

ExitStatus Output::finish(ExitStatus status) {
    const int error = results_.finish();
    if (error == 0) {
        return status;
    }
    complain(base::concat("cannot write: ", std::generic_category().message(error)));
    return ExitStatus::failed;
}

ExitStatus Output::finish(const platform::Error& error) {
    complain(error.description);
    return finish(statusOf(error));
}

namespace {

constexpr mode_t kOwnerOnly = 0600;

/// Of a file that is written all faults are plain failures.
platform::Error writeError(const std::string& path, int error) {
    return failure(ExitStatus::failed, fileError(path, error).description);
}

} // namespace

platform::Result<NewFile> NewFile::make(const std::string& path) {
    base::FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnly));
    if (!file.isOpen()) {
        return writeError(path, errno);
    }
    return NewFile(path, std::move(file));
}

NewFile::NewFile(std::string path, base::FileDescriptor file)
    : path_(std::move(path)), file_(std::move(file)), content_(file_.get()) {}

NewFile::~NewFile() {
    if (file_.isOpen()) {
        ::unlink(path_.c_str());
    }
}

std::optional<platform::Error> NewFile::finish() {
    if (const int error = content_.finish(); error != 0) {
        return writeError(path_, error);
    }
    // What is still open at the end is removed.
    file_.reset();
    return std::nullopt;
}

namespace {

constexpr std::chrono::seconds kSilence{1};
constexpr std::chrono::milliseconds kBetweenTwo{100};
constexpr std::uint64_t kWhole = 100;

} // namespace

Progress::Progress()
    : Progress(::isatty(STDERR_FILENO) == 1 ? STDERR_FILENO : -1,
               [] { return std::chrono::steady_clock::now(); }) {}

Progress::Progress(int descriptor, Now now)
    : descriptor_(descriptor), now_(std::move(now)), next_(now_() + kSilence) {}

void Progress::begin(std::string what, std::uint64_t steps) {
    what_ = std::move(what);
    steps_ = steps;
    done_ = 0;
}

void Progress::advance() {
    ++done_;
    if (descriptor_ < 0) {
        return;
    }
    if (const auto now = now_(); now > next_) {
        next_ = now + kBetweenTwo;
        show();
    }
}

void Progress::show() {
    const std::uint64_t share = done_ < steps_ ? done_ * kWhole / steps_ : kWhole;
    std::string line = base::concat("kstctl: ", what_, ": ", share, " %");
    const std::size_t width = line.size();
    line.resize(std::max(width, shownWidth_), ' ');
    shownWidth_ = width;
    // What a terminal was not shown is no loss.
    static_cast<void>(writeWhole(descriptor_, base::concat('\r', line)));
}

void Progress::end() {
    if (shownWidth_ > 0) {
        static_cast<void>(
            writeWhole(descriptor_, base::concat('\r', std::string(shownWidth_, ' '), '\r')));
        shownWidth_ = 0;
    }
}

} // namespace kstctl
