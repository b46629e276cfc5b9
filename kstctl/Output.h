#pragma once

#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"
#include "kstctl/WholeWrite.h"
#include "platform/Error.h"

#include <cstddef>
#include <optional>
#include <string_view>
#include <unistd.h>

namespace kstctl {

/// What the program says: results on standard output, reasons on standard error.
///
/// What is long is written in pieces while it is made: a command begins with that when it has read
/// all that it needs, so that what cannot be read leaves no half result, and nothing is held open
/// while a slow reader is waited for.
class Output {
  public:
    explicit Output(bool isJSON, int descriptor = STDOUT_FILENO);

    [[nodiscard]] bool isJSON() const { return isJSON_; }
    /// Whether standard output is a terminal.
    [[nodiscard]] bool isTerminal() const { return isTerminal_; }
    [[nodiscard]] Colours colours() const { return colours_; }
    /// How many characters fit into a line of the terminal; none when there is no terminal, or it
    /// does not say.
    [[nodiscard]] std::optional<std::size_t> width() const { return width_; }

    /// In the form that was asked for.
    void show(const Report& report);
    /// Bytes as they are.
    void put(std::string_view bytes) { results_.put(bytes); }

    /// One line "kstctl: …" on standard error, printable.
    static void complain(std::string_view message);

    /// Writes what is left of the results. `status`, or ExitStatus::failed with a line when they
    /// could not be written.
    [[nodiscard]] ExitStatus finish(ExitStatus status);
    /// The same after a line with the error's reason.
    [[nodiscard]] ExitStatus finish(const platform::Error& error);

  private:
    bool isJSON_;
    bool isTerminal_;
    Colours colours_;
    std::optional<std::size_t> width_;
    BufferedWriter results_;
};

} // namespace kstctl
