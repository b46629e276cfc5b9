#include "keystrand-sim/Paths.h"

namespace keystrand::sim {

namespace {

std::string withoutTrailingSlashes(std::string root) {
    while (!root.empty() && root.back() == '/') {
        root.pop_back();
    }
    return root;
}

} // namespace

Paths::Paths(const std::string& root)
    : runDirectory(withoutTrailingSlashes(root) + "/run"),
      serviceDirectory(runDirectory + "/keystrand"),
      serviceSocket(serviceDirectory + "/service.sock"),
      controlSocket(serviceDirectory + "/control.sock"),
      eventSocket(runDirectory + "/kstd/events.sock") {}

} // namespace keystrand::sim
