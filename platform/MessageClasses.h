#pragma once

/// The classes of the daemon's log lines that an operator can act on: the one list of them. Who
/// writes a line of a class gives it the class's identifier (LogFields), by which it is found in
/// the journal and explained by packaging/systemd/kstd.catalog. An identifier is never given to
/// another class.
namespace platform::message {

inline constexpr char kDaemonStarted[] = "7dccb63d23e541889ee00d6f0d3c5009";
inline constexpr char kCannotStart[] = "c0bd1ae3d3c14d1fb0f5f1f6a1c50d27";
inline constexpr char kStateFileNotSaved[] = "008de38b32f5452cbba50c270c7106f4";
inline constexpr char kStateFileNotLoaded[] = "a3b469b827d8490a8f1f5b04ba9ebb93";
inline constexpr char kStateFileFailed[] = "7f3e4ddf63324ac483b4858955e7f02f";
inline constexpr char kKernelServiceFailed[] = "a96313973bc847c795eaa660fcad1191";
inline constexpr char kKernelServiceNotTrusted[] = "ceacf11f0178447fb0a68a202d9000cc";
inline constexpr char kKernelSideNotTold[] = "1da102237b4e4a0082e5de9e6f1c220c";
inline constexpr char kDatabaseNotOpened[] = "245c7ca10c564524bed71ee6eaa81dbf";
inline constexpr char kDatabaseFailed[] = "941d4db2a65d4920b812057317207820";
inline constexpr char kEventNotStored[] = "b8fb289b7d164f9c88b8f49a360221e9";
inline constexpr char kServerNotTrusted[] = "2762e2e224ee4b66941f41eb60d60d9e";
inline constexpr char kServerChallenge[] = "4a45c2734527422d8ec0380e474594f5";
inline constexpr char kServerAccepted[] = "167c31c411104aafab5a6d66573d3247";
inline constexpr char kUploadFailed[] = "d7130baf298243dfb29cb75a269e26ad";
inline constexpr char kNoUploadAddress[] = "fcfde6f87b9144919cd8d41e19715807";
inline constexpr char kUploadsDisabled[] = "2626bc183d8c4895ad1252f3fb05800a";
inline constexpr char kForeignEvent[] = "7ebf560740f1454ba57e03547da24790";
inline constexpr char kMalformedEvent[] = "cbf8f4177f25453fac858a45bda82558";
inline constexpr char kNoEventSocket[] = "d51a48700d914fe2834a619ff49b188a";
inline constexpr char kSettingsNotUsed[] = "1699858cf330423f849effe5cc5b3d83";
inline constexpr char kSettingsNotWatched[] = "c440e14511aa4cbe9493c86b771de725";
inline constexpr char kConfigurationNotUsed[] = "cbb56232475f452eaa4c55d725479c81";
inline constexpr char kUploadSettingInDoubt[] = "05779f7538d34662ba69ab4773d00966";
inline constexpr char kAlarmNotKept[] = "28956f503d6840c6b95823e4541c8c11";
inline constexpr char kAlarmWithoutInitSystem[] = "105f14b0574c4d4ea79747e7cfe9333b";
inline constexpr char kAlarmDoesNotWake[] = "285fb5ce60d749ddb2a777dc495019ae";

} // namespace platform::message
