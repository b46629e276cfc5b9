#pragma once

#include "keystrand-linux/GateLog.h"
#include "keystrand/JournalLines.h"

#include <string>

namespace keystrand::usb {

/// The gate's lines as they leave the program.
class JournalGateLog final : public GateLog {
  public:
    using Target = LineTarget;
    explicit JournalGateLog(Target target) : target_(target) {}

    [[nodiscard]] static Target targetFor(const std::string& root,
                                          const char* journalSocket = kJournalSocket) {
        return lineTargetFor(root, journalSocket);
    }

    void write(GateLine about, const std::string& text) override;

  private:
    Target target_;
};

} // namespace keystrand::usb
