#include "wire/AlarmAnswer.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <string_view>

namespace wire {

namespace {

constexpr std::uint8_t kVersion = 1;

} // namespace

std::vector<std::uint8_t> encodeAlarmAnswer(const AlarmAnswer& answer) {
    const std::string_view reason = std::string_view(answer.reason).substr(0, kAlarmReasonMaxSize);
    std::vector<std::uint8_t> bytes(kAlarmAnswerMaxSize - kAlarmReasonMaxSize + reason.size());
    base::ByteWriter writer(bytes);
    static_cast<void>(
        writer.writeU8(kVersion) && writer.writeU8(static_cast<std::uint8_t>(answer.timer)) &&
        writer.writeU8(answer.wakesMachine ? 1 : 0) &&
        writer.writeU64(static_cast<std::uint64_t>(answer.date)) && writer.writeText(reason));
    return bytes;
}

std::optional<AlarmAnswer> decodeAlarmAnswer(std::span<const std::uint8_t> bytes) {
    base::ByteReader reader(bytes);
    std::uint8_t version = 0;
    std::uint8_t timer = 0;
    std::uint8_t wakesMachine = 0;
    std::uint64_t date = 0;
    std::string_view reason;
    if (!reader.readU8(version) || !reader.readU8(timer) || !reader.readU8(wakesMachine) ||
        !reader.readU64(date)) {
        return std::nullopt;
    }
    static_cast<void>(reader.readText(reason, reader.left()));
    if (version != kVersion || timer > static_cast<std::uint8_t>(AlarmAnswer::Timer::failed) ||
        wakesMachine > 1 || reason.size() > kAlarmReasonMaxSize) {
        return std::nullopt;
    }
    return AlarmAnswer{static_cast<AlarmAnswer::Timer>(timer), wakesMachine == 1,
                       static_cast<std::int64_t>(date), std::string(reason)};
}

} // namespace wire
