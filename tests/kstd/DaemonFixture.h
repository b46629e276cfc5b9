#pragma once

#include "KSTLib/AllocatedBytes.h"
#include "KSTLib/Command.h"
#include "base/ByteReader.h"
#include "kstd/Analytics/Analytics.h"
#include "kstd/Daemon.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "platform/fake/FakeHost.h"
#include "tests/kstd/MachineWithDirectory.h"
#include "wire/RestrictedMode.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kstd {

using Bytes = std::vector<std::uint8_t>;

inline constexpr char kStatePath[] = "/var/root/.usbrestrictedmode_v2";
inline constexpr char kAnalyticsPath[] = "/var/root/.usbrestrictedmode_analytics";
inline constexpr char kAlarmStreamName[] = "com.zerva.alarm";
inline constexpr char kAlarmEventName[] = "com.zerva.kstd.alarm";
inline constexpr char kServiceSource[] = "kstd/DeviceRestrictedMode/DeviceRestrictedModeService";

/// A kernel-control request as the kernel side saw it.
struct ControlRequest {
    std::uint32_t code = 0;
    Bytes payload;

    friend bool operator==(const ControlRequest&, const ControlRequest&) = default;
    friend std::ostream& operator<<(std::ostream& out, const ControlRequest& request) {
        out << "request " << request.code << ":";
        for (const auto byte : request.payload) {
            out << ' ' << static_cast<unsigned>(byte);
        }
        return out;
    }
};

/// The daemon's classes on a fake machine, with the library on the same one.
class DaemonFixture : public testing::Test, protected MachineWithDirectory {
  protected:
    ~DaemonFixture() override {
        library.reset();
        EXPECT_EQ(gAllocatedBytes, allocatedBefore_);
        EXPECT_EQ(fake.events.transactions().count(), 0U);
    }

    /// The log, with the line numbers of assertion lines shown as "#".
    [[nodiscard]] std::vector<std::string> lines() const {
        std::vector<std::string> texts = fake.log.texts();
        for (std::string& text : texts) {
            hideLineNumber(text);
        }
        return texts;
    }

    /// What "AssertMacros" lines look like, with the line number hidden.
    static std::string assertion(std::string_view condition, std::string_view value,
                                 std::string_view source = kServiceSource) {
        return "kstd: AssertMacros: " + std::string(condition) + " (value: 0x" +
               std::string(value) + "),  file: " + std::string(source) + ":#";
    }

    /// The kernel-control requests that reached the kernel side. Every one must be a whole frame.
    [[nodiscard]] std::vector<ControlRequest> requests() const {
        std::vector<ControlRequest> requests;
        for (const auto& call : machine.kernel.structCalls) {
            requests.push_back(decode(call.input));
        }
        return requests;
    }

    void putRecord(std::string_view property, const Bytes& record) {
        machine.kernel.properties.insert_or_assign(std::string(property), record);
    }

    void failRequest(std::uint32_t code, platform::Status status) {
        machine.kernel.onStructCall = [code, status](const platform::FakeStructCall& call) {
            platform::FakeStructAnswer answer;
            answer.status = decode(call.input).code == code ? status : platform::kSuccess;
            return answer;
        };
    }

    /// A 36-byte record: its type, then `body` from offset 4, then 0xEE.
    static Bytes record(std::uint32_t type, const Bytes& body = {}) {
        Bytes bytes = littleEndian(type, 4);
        bytes.insert(bytes.end(), body.begin(), body.end());
        bytes.resize(36, 0xEE);
        return bytes;
    }

    static Bytes timerRecord(std::uint64_t alarm, const Bytes& stateBlob = defaultStateBlob()) {
        return record(1, joined({littleEndian(alarm, 8), stateBlob}));
    }

    /// version 2, standardModeStartTimestamp 1700000000, lockedInRestrictedMode 1.
    static Bytes defaultStateBlob() {
        return joined({littleEndian(2, 4), littleEndian(1700000000, 8), {1}});
    }

    static Bytes littleEndian(std::uint64_t value, std::size_t width) {
        Bytes bytes;
        for (std::size_t i = 0; i < width; ++i) {
            bytes.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
        }
        return bytes;
    }

    static Bytes joined(const std::vector<Bytes>& parts) {
        Bytes all;
        for (const Bytes& part : parts) {
            all.insert(all.end(), part.begin(), part.end());
        }
        return all;
    }

    /// `count` bytes that count up from `first`.
    static Bytes counting(std::size_t count, std::uint8_t first) {
        Bytes bytes(count);
        for (std::size_t i = 0; i < count; ++i) {
            bytes[i] = static_cast<std::uint8_t>(first + i);
        }
        return bytes;
    }

    /// The payload of an acknowledgement.
    static Bytes ackPayload(std::string_view property) {
        Bytes bytes(property.begin(), property.end());
        bytes.resize(64, 0);
        return bytes;
    }

    [[nodiscard]] std::shared_ptr<DeviceRestrictedModeService> makeService() {
        return DeviceRestrictedModeService::make(fake.host());
    }

    [[nodiscard]] std::optional<std::int64_t> registeredAlarm() const {
        const auto date = machine.alarms.date(kAlarmStreamName, kAlarmEventName);
        return date ? std::optional(date->nanosecondsSince1970) : std::nullopt;
    }

    platform::FakeHost fake{machine};
    std::optional<DaemonLibrary> library{fake.host()};
    AnalyticsLifetime analytics;

  private:
    static ControlRequest decode(const Bytes& frame) {
        EXPECT_GE(frame.size(), 12U);
        EXPECT_EQ(Bytes(frame.begin(), frame.begin() + 7), (Bytes{'D', 'R', 'C', 'S', 26, 0, 0}));
        base::ByteReader reader(frame);
        ControlRequest request;
        EXPECT_TRUE(reader.skip(8) && reader.readU32(request.code));
        request.payload.assign(reader.rest().begin(), reader.rest().end());
        return request;
    }

    static void hideLineNumber(std::string& text) {
        const auto file = text.find(",  file: ");
        const auto colon = text.rfind(':');
        if (file == std::string::npos || colon == std::string::npos || colon < file) {
            return;
        }
        const bool isNumber = colon + 1 < text.size() &&
                              std::all_of(text.begin() + static_cast<std::ptrdiff_t>(colon) + 1,
                                          text.end(), [](char c) { return c >= '0' && c <= '9'; });
        if (isNumber) {
            text.replace(colon + 1, std::string::npos, "#");
        }
    }

    std::int64_t allocatedBefore_ = gAllocatedBytes;
};

} // namespace kstd
