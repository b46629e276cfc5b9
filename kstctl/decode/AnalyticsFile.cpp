#include "base/Concat.h"
#include "keystrand-sim/AnalyticsBlob.h"
#include "kstctl/TimeText.h"
#include "kstctl/decode/Decoders.h"
#include "kstctl/decode/RecordFields.h"
#include "wire/RestrictedMode.h"

#include <algorithm>

namespace kstctl::decode {

void addAnalyticsFields(Report& report, Bytes blob) {
    sim::AnalyticsBytes bytes{};
    std::copy_n(blob.begin(), bytes.size(), bytes.begin());
    const auto figures = sim::decodeFigures(bytes);
    if (!figures) {
        report.add("layout", "opaque").add("bytes", hexText(bytes));
        return;
    }
    report.add("layout", "keystrand-sim")
        .add("periodStart", figures->periodStart, timeText(figures->periodStart))
        .add("restrictedInPeriod", figures->restrictedInPeriod)
        .add("totalRestricted", figures->totalRestricted)
        .add("restrictedSince", figures->restrictedSince, timeText(figures->restrictedSince));
}

Result decodeAnalyticsFile(Bytes bytes, Secrets /*secrets*/) {
    if (bytes.size() < wire::rm::kAnalyticsBlobSize) {
        return malformed(base::concat("an analytics file has at least ",
                                      wire::rm::kAnalyticsBlobSize, " bytes, not ", bytes.size()));
    }
    Decoded decoded{.fields = {}, .size = wire::rm::kAnalyticsBlobSize};
    addAnalyticsFields(decoded.fields, bytes);
    return decoded;
}

} // namespace kstctl::decode
