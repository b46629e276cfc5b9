#include "kstd/MessageIds.h"

namespace kstd {

namespace {

using namespace message;

constexpr platform::MessageClass kClasses[] = {
    {kDaemonStarted, "kstd: main: Entering the main runloop."},
    {kCannotStart, "kstd: cannot start: "},
    {kStateFileNotSaved,
     "kstd: -[DeviceRestrictedModeService saveDataBlob:data:]: returning, err = "},
    {kStateFileNotLoaded,
     "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: Analytics blob "
     "not loaded (length = "},
    {kStateFileNotLoaded,
     "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: State blob not loaded (length = "},
    {kStateFileFailed, "kstd: Files: cannot "},
    {kKernelServiceFailed, "KSTLib: KSTKernelControl: returning, err = "},
    {kKernelServiceFailed, "kstd: AssertMacros: entry "},
    {kKernelServiceFailed, "kstd: ServiceRegistry: cannot "},
    {kKernelServiceFailed, "kstd: KernelSocket: cannot connect to "},
    {kKernelSideNotTold,
     "kstd: -[DeviceRestrictedModeService notifyDaemonStarted]: returning, err = "},
    {kKernelSideNotTold,
     "kstd: -[DeviceRestrictedModeService onQuorvaneChanged]: returning, err = "},
    {kKernelServiceNotTrusted, "kstd: KernelSocket: * is served by user "},
    {kDatabaseNotOpened, "TQAnalyticsLogger: could not open db at init"},
    {kDatabaseNotOpened, "TQAnalyticsLogger: failed to open db"},
    {kDatabaseNotOpened, "can't get logging JSON because database is not openable"},
    {kDatabaseFailed, "KSTDSQLite: Failed to step "},
    {kDatabaseFailed, "KSTDSQLite: Error executing SQL: "},
    {kDatabaseFailed, "Error preparing statement: "},
    {kDatabaseFailed, "kstd: Database: "},
    {kEventNotStored, "Couldn't serialize failure record: "},
    {kServerChallenge, "Splunk upload challenge"},
    {kServerAccepted, "Force Accepting Splunk Credential"},
    {kServerNotTrusted, "Error in uploading the events to splunk: server not trusted"},
    {kServerNotTrusted, "Unable to fetch splunk endpoint at URL: * -- error: server not trusted"},
    {kUploadFailed, "Error in uploading the events to splunk: "},
    {kUploadFailed, "Received the wrong kind of response: "},
    {kUploadFailed, "Splunk upload unexpected status to URL: "},
    {kUploadFailed, "TQAnalytics: failed to upload json to analytics server "},
    {kNoUploadAddress, "failed to get a splunk upload endpoint - not uploading"},
    {kNoUploadAddress, "Unable to fetch splunk endpoint at URL: "},
    {kNoUploadAddress, "Malformed Ombrix config payload!"},
    {kUploadsDisabled, "not returning a splunk URL because uploads are disabled"},
    {kForeignEvent, "kstd: EventSocket: dropped datagram of "},
    {kMalformedEvent, "kstd: EventSocket: dropped "},
    {kMalformedEvent, "kstd: EventStream: dropped event "},
    {kNoEventSocket, "kstd: EventSocket: no socket was handed over"},
    {kNoEventSocket, "kstd: EventSocket: cannot receive"},
    {kSettingsNotUsed, "kstd: ManagedSettings: "},
    {kSettingsNotWatched, "kstd: SettingsWatch: cannot watch "},
    {kConfigurationNotUsed, "kstd: UserDefaults: "},
    {kConfigurationNotUsed, "kstd: ConfigurationResource: "},
    {kUploadSettingInDoubt, "kstd: AnalyticsConfiguration: "},
    {kAlarmNotKept, "kstd: AlarmStore: "},
    {kAlarmWithoutInitSystem, "kstd: AlarmWaker: no timer of the init system"},
    {kAlarmDoesNotWake, "kstd: AlarmWaker: this machine cannot be woken from sleep"},
};

} // namespace

std::span<const platform::MessageClass> messageClasses() {
    return kClasses;
}

} // namespace kstd
