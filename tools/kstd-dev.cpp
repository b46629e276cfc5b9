// The daemon's own code under a root directory of one's choice, for development, tests and the
// demonstration. The installed daemon takes no options.

#include "kstd/Analytics/Analytics.h"
#include "kstd/Daemon.h"
#include "platform/linux/EventSocket.h"
#include "platform/linux/LinuxHost.h"
#include "platform/linux/StopRequest.h"
#include "wire/SystemPaths.h"

#include <CLI/CLI.hpp>

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <fcntl.h>
#include <filesystem>
#include <iostream>
#include <string>
#include <sys/file.h>
#include <system_error>
#include <utility>
#include <vector>

namespace {

struct Options {
    std::string root;
    int idleMilliseconds = 0;
    bool httpsSocket = false;
    std::string trustAnchors;
    double fetchSeconds = 0;
    double answerSeconds = 0;
};

/// The HTTPS client, which lies beside this program, with what it is to be told.
std::vector<std::string> httpsClient(const Options& options) {
    const auto directory = std::filesystem::read_symlink("/proc/self/exe").parent_path();
    std::vector<std::string> words = {(directory / "kstd-https").string()};
    if (!options.trustAnchors.empty()) {
        words.insert(words.end(), {"--trust-anchors", options.trustAnchors});
    }
    if (options.fetchSeconds > 0) {
        words.insert(words.end(), {"--fetch-limit", std::to_string(options.fetchSeconds)});
    }
    if (options.answerSeconds > 0) {
        words.insert(words.end(), {"--answer-limit", std::to_string(options.answerSeconds)});
    }
    return words;
}

/// What the package makes on a real system.
void makeDirectories(const platform::Paths& paths) {
    using std::filesystem::perms;
    for (const auto& path :
         {paths.under(wire::kDaemonDirectory), paths.under(wire::kKernelDirectory),
          paths.managedSettingsDirectory(), paths.alarmDirectory()}) {
        std::filesystem::create_directories(path);
    }
    std::filesystem::create_directories(paths.stateDirectory());
    std::filesystem::permissions(paths.stateDirectory(), perms::owner_all);
}

/// Holds the root directory for this process, as long as it is open; not open when another one
/// does.
base::FileDescriptor holdRoot(const platform::Paths& paths) {
    base::FileDescriptor root(::open(paths.under("/").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (root.isOpen() && ::flock(root.get(), LOCK_EX | LOCK_NB) != 0) {
        root.reset();
    }
    return root;
}

base::FileDescriptor eventSocket(const platform::Paths& paths) {
    const bool isHandedOver = std::getenv("LISTEN_FDS") != nullptr;
    base::FileDescriptor activated = platform::takeActivatedEventSocket();
    // What is handed over but cannot be used is not replaced: events wait in it.
    return activated.isOpen() || isHandedOver ? std::move(activated)
                                              : platform::makeEventSocket(paths.eventSocket());
}

int runDaemon(const Options& options, const platform::StopRequest& stop) {
    const platform::Paths paths(options.root);
    makeDirectories(paths);
    const base::FileDescriptor held = holdRoot(paths);
    if (!held.isOpen()) {
        std::cerr << "kstd-dev: another kstd-dev runs under " << options.root << '\n';
        return 1;
    }
    platform::LinuxHostOptions hostOptions{
        .paths = paths, .eventSocket = eventSocket(paths), .stop = &stop};
    if (!hostOptions.eventSocket.isOpen()) {
        std::cerr << "kstd-dev: cannot make the event socket " << paths.eventSocket() << ": "
                  << std::generic_category().message(errno) << '\n';
        return 1;
    }
    if (options.idleMilliseconds > 0) {
        hostOptions.idleTime = std::chrono::milliseconds(options.idleMilliseconds);
    }
    if (!options.httpsSocket) {
        hostOptions.https.program = httpsClient(options);
    }
    platform::LinuxHost host(std::move(hostOptions));
    return host.run([](const platform::Host& interfaces) {
        const kstd::DaemonLibrary library(interfaces);
        const kstd::AnalyticsLifetime analytics;
        return kstd::Daemon(interfaces, kstd::makeServices(interfaces)).run();
    });
}

} // namespace

int main(int argc, char** argv) try {
    const platform::StopRequest stop;
    std::signal(SIGPIPE, SIG_IGN);
    CLI::App app("Runs the daemon with all its paths under a root directory of its own.");
    Options options;
    app.add_option("--root", options.root, "The directory in which /run, /etc and /var lie")
        ->required();
    app.add_option("--idle-exit", options.idleMilliseconds,
                   "End after this many milliseconds without work; 0 is never");
    app.add_flag(
        "--https-socket", options.httpsSocket,
        "Reach the HTTPS client behind /run/kstd/https.sock, as the installed daemon does, "
        "and start none");
    app.add_option("--trust-anchors", options.trustAnchors,
                   "Certificates (PEM) that servers are trusted by, in place of the system's");
    app.add_option("--fetch-limit", options.fetchSeconds,
                   "Seconds that an endpoint bag may take; 0 is the default");
    app.add_option("--answer-limit", options.answerSeconds,
                   "Seconds that a server may take to answer a document; 0 is the default");
    CLI11_PARSE(app, argc, argv);
    return runDaemon(options, stop);
} catch (const std::exception& error) {
    std::fprintf(stderr, "kstd-dev: %s\n", error.what());
    return 1;
}
