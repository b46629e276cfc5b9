#pragma once

#include "base/TextBuffer.h"
#include "kstctl/ExitStatus.h"
#include "kstctl/Forms.h"
#include "platform/Error.h"

#include <string_view>

namespace kstctl {

/// What the program says: results on standard output, reasons on standard error.
///
/// Results are kept until `finish` writes them, so that standard output never ends in the middle of
/// one and nothing waits for a slow reader while something is held open.
class Output {
  public:
    explicit Output(bool isJSON);

    [[nodiscard]] bool isJSON() const { return isJSON_; }
    /// Whether standard output is a terminal.
    [[nodiscard]] bool isTerminal() const { return isTerminal_; }

    /// In the form that was asked for.
    void show(const Report& report);
    void show(const Table& table);
    /// Bytes as they are.
    void put(std::string_view bytes) { results_.append(bytes); }

    /// One line "kstctl: …" on standard error, printable.
    static void complain(std::string_view message);

    /// Writes the results. `status`, or ExitStatus::failed with a line when they could not be
    /// written.
    [[nodiscard]] ExitStatus finish(ExitStatus status);
    /// The same after a line with the error's reason.
    [[nodiscard]] ExitStatus finish(const platform::Error& error);

  private:
    bool isJSON_;
    bool isTerminal_;
    Colours colours_;
    base::TextBuffer results_;
};

} // namespace kstctl
