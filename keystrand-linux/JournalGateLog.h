#pragma once

#include "keystrand-linux/GateLog.h"

#include <string>

namespace keystrand::usb {

/// The gate's lines as they leave the program: in the journal, each with the identifier of its
/// class and its level, or on standard error, one line each, where there is no journal.
class JournalGateLog final : public GateLog {
  public:
    /// Where the journal takes its messages.
    static constexpr char kJournalSocket[] = "/run/systemd/journal/socket";

    enum class Target { journal, standardError };
    explicit JournalGateLog(Target target) : target_(target) {}

    /// The journal for a program that works on the machine itself, and only if there is one. What
    /// works under another root than "/" keeps its lines to itself.
    [[nodiscard]] static Target targetFor(const std::string& root,
                                          const char* journalSocket = kJournalSocket);

    /// What the journal does not take goes to standard error.
    void write(GateLine about, const std::string& text) override;

  private:
    Target target_;
};

} // namespace keystrand::usb
