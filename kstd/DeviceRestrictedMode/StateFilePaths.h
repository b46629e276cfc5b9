#pragma once

namespace kstd {

/// The KSTRMStateBlob of the last timer notification, 13 bytes; what follows them is an older,
/// longer record's rest and means nothing.
inline constexpr char kStateFilePath[] = "/var/root/.usbrestrictedmode_v2";

/// The KSTRMAnalyticsBlob of the last save-analytics notification, 32 bytes; what follows them
/// means nothing.
inline constexpr char kAnalyticsFilePath[] = "/var/root/.usbrestrictedmode_analytics";

} // namespace kstd
