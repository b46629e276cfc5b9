#include "keystrand-linux/JournalGateLog.h"

namespace keystrand::usb {

void JournalGateLog::write(GateLine about, const std::string& text) {
    const GateLineClass& is = classOf(about);
    writeLine(target_, {.program = "keystrand",
                        .messageId = is.messageId,
                        .level = static_cast<int>(is.level),
                        .text = text});
}

} // namespace keystrand::usb
