#include "kstd/Daemon.h"

#include "KSTLib/Platform.h"
#include "kstd/DeviceRestrictedMode/DeviceRestrictedModeService.h"
#include "kstd/LogLines.h"
#include "platform/EventStream.h"
#include "platform/MainRunLoop.h"
#include "platform/MessageClasses.h"
#include "platform/ProcessTransaction.h"
#include "wire/EventDatagram.h"

#include <utility>

namespace kstd {

namespace {

constexpr char kMain[] = "main";
constexpr char kMainBlock[] = "main_block_invoke";

} // namespace

struct Daemon::MatchingStream {
    const char* name;
    const char* transactionLabel;
    const char* shortName;
};

Daemon::Daemon(const platform::Host& host, Services services)
    : host_(host), services_(std::make_shared<const Services>(std::move(services))) {}

int Daemon::run() {
    startServices();
    subscribe({wire::kNotifydMatchingStream, "processing notifyd.matching", "notifyd"});
    subscribe({wire::kCorvidMatchingStream, "processing corvid.matching", "corvid"});
    logLineOfClass(host_.log, platform::message::kDaemonStarted, kMain,
                   "Entering the main runloop.");
    while (host_.runLoop.runOnce(platform::kDistantFuture)) {
    }
    stopServices();
    services_.reset();
    return 0;
}

void Daemon::startServices() {
    for (const auto& service : *services_) {
        logLine(host_.log, kMain, "Started service - ", service->description(), ".");
        service->start();
    }
}

void Daemon::subscribe(const MatchingStream& stream) {
    host_.events.setHandler(stream.name, [host = host_, services = services_,
                                          stream](const platform::Event& event) {
        // Until every service is done with the event, the process does not count as idle.
        const platform::ProcessTransaction transaction(host.transactions, stream.transactionLabel);
        logLine(host.log, kMainBlock, "Wisp Event: ", event.name, " (", stream.shortName, ").");
        for (const auto& service : *services) {
            service->handleWispEventWithName(event.name);
        }
    });
}

void Daemon::stopServices() {
    for (const auto& service : *services_) {
        logLine(host_.log, kMain, "Stoping service - ", service->description(), ".");
        service->stop();
    }
}

Daemon::Services makeServices(const platform::Host& host) {
    return {DeviceRestrictedModeService::make(host)};
}

DaemonLibrary::DaemonLibrary(const platform::Host& host)
    : log_(host.log, platform::message::kKernelServiceFailed,
           "KSTLib: KSTKernelControl: returning, err = ") {
    kst::installPlatform({log_, host.registry, host.channel});
}

DaemonLibrary::~DaemonLibrary() {
    kst::removePlatform();
}

} // namespace kstd
