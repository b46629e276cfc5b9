#pragma once

#include "kstctl/Report.h"
#include "kstctl/decode/Decoded.h"

namespace kstctl::decode {

/// One decoder for each byte format that has a kind of its own. Each reads with the product's own
/// code and refuses what that refuses.

[[nodiscard]] Result decodeRecord(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeStateFile(Bytes bytes, Secrets secrets);
/// The daemon hands these bytes on without a look. They are shown as keystrand-sim lays them out
/// when they have that layout.
[[nodiscard]] Result decodeAnalyticsFile(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeEvent(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeFrame(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeCredential(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeCredentialList(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeRequirement(Bytes bytes, Secrets secrets);
[[nodiscard]] Result decodeContextProperty(Bytes bytes, Secrets secrets);

/// Adds the fields of a state record. `blob` holds at least as many bytes as one has.
void addStateFields(Report& report, Bytes blob);

/// Adds the fields of an analytics record, or its bytes when their layout is not known. `blob`
/// holds at least as many bytes as one has.
void addAnalyticsFields(Report& report, Bytes blob);

} // namespace kstctl::decode
