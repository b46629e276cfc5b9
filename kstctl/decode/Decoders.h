#pragma once

#include "kstctl/decode/Decoded.h"

/// One decoder for each byte format that has a kind of its own. Each reads with the product's own
/// code and refuses what that refuses.
namespace kstctl::decode {

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

} // namespace kstctl::decode
