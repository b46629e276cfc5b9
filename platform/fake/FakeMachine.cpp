#include "platform/fake/FakeMachine.h"

namespace platform {

FakeMachine::FakeMachine() {
    disk.makeDirectory("/var/root");
}

FakeMachine::~FakeMachine() = default;

} // namespace platform
