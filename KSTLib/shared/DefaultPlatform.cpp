// What the installed library stands on without being told: this machine's log and kernel service.

#include "KSTLib/Platform.h"
#include "platform/linux/LinuxKernelChannel.h"
#include "platform/linux/LinuxServiceRegistry.h"
#include "platform/linux/LinuxSystemLog.h"
#include "platform/linux/Paths.h"

#include <cerrno>
#include <cstddef>
#include <new>
#include <string_view>

namespace {

/// The program that the library is part of, as it was called when the library was loaded.
class ProgramName {
  public:
    ProgramName() {
        const char* const name = program_invocation_short_name;
        if (name != nullptr && *name != '\0') {
            text_ = {kept_, std::string_view(name).copy(kept_, sizeof kept_)};
        }
    }

    [[nodiscard]] std::string_view text() const { return text_; }

  private:
    // A copy: a program may write over its arguments.
    char kept_[255];
    std::string_view text_ = "KSTLib";
};

struct DefaultPlatform {
    ProgramName program;
    platform::Paths paths{"/"};
    platform::LinuxSystemLog log{paths};
    platform::LinuxServiceRegistry registry{platform::Paths::kKernelSocket, log,
                                            platform::kKernelTimeout, program.text()};
    platform::LinuxKernelChannel channel{platform::Paths::kKernelSocket, registry, log};
};

// Not allocated: there may be no memory when the library is loaded, which nobody could be told.
alignas(DefaultPlatform) std::byte place[sizeof(DefaultPlatform)];

/// Runs when the library is loaded, before any function of it can be called. What it makes is never
/// destroyed: a program may call the library from its own last destructor.
[[gnu::constructor]] void installDefaultPlatform() {
    auto* const made = new (place) DefaultPlatform;
    kst::installPlatform({made->log, made->registry, made->channel});
}

} // namespace
