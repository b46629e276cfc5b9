#pragma once

#include "KSTLib/Channel.h"
#include "KSTLib/LibraryLogging.h"
#include "KSTLib/Platform.h"
#include "tests/support/LibraryFixture.h"
#include "tests/support/ScriptedChannel.h"
#include "tests/support/ScriptedRegistry.h"

#include <cstdint>
#include <string>
#include <vector>

namespace support {

using Bytes = std::vector<std::uint8_t>;
using Lines = std::vector<std::string>;

/// A library on scripted parts, started anew for each test.
class ChannelFixture : public LibraryFixture {
  protected:
    void SetUp() override {
        LibraryFixture::SetUp();
        kst::installPlatform({log, registry, channel});
    }

    void TearDown() override {
        kst::removePlatform();
        LibraryFixture::TearDown();
    }

    ScriptedRegistry registry;
    ScriptedChannel channel;
};

} // namespace support
