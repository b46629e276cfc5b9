#include "keystrand/AnalyticsBlob.h"

#include "base/ByteReader.h"
#include "base/ByteWriter.h"

#include <cassert>

namespace keystrand {

namespace {

constexpr std::uint32_t kBlobVersion = 1;
constexpr std::uint32_t kReserved = 0;

} // namespace

AnalyticsBytes encodeFigures(const AnalyticsFigures& figures) {
    AnalyticsBytes bytes{};
    base::ByteWriter writer(bytes);
    [[maybe_unused]] const bool fits =
        writer.writeU64(figures.periodStart) && writer.writeU32(figures.restrictedInPeriod) &&
        writer.writeU32(figures.totalRestricted) && writer.writeU64(figures.restrictedSince) &&
        writer.writeU32(kBlobVersion) && writer.writeU32(kReserved);
    assert(fits && writer.left() == 0);
    return bytes;
}

std::optional<AnalyticsFigures> decodeFigures(const AnalyticsBytes& bytes) {
    AnalyticsFigures figures;
    std::uint32_t version = 0;
    std::uint32_t reserved = 0;
    base::ByteReader reader(bytes);
    const bool fits =
        reader.readU64(figures.periodStart) && reader.readU32(figures.restrictedInPeriod) &&
        reader.readU32(figures.totalRestricted) && reader.readU64(figures.restrictedSince) &&
        reader.readU32(version) && reader.readU32(reserved);
    if (!fits || version != kBlobVersion || reserved != kReserved) {
        return std::nullopt;
    }
    return figures;
}

} // namespace keystrand
