#include "tests/support/Collector.h"

#include "base/Concat.h"

#include <fstream>
#include <iterator>
#include <stdexcept>

namespace support {

namespace {

std::vector<std::string> commandLine(const std::string& directory, bool secure) {
    std::vector<std::string> words = {COLLECTOR, "--quiet", "--directory", directory + "/kept"};
    if (secure) {
        words.insert(words.end(), {"--self-made", directory + "/certificates"});
    } else {
        words.emplace_back("--plain");
    }
    return words;
}

} // namespace

Collector::Collector(Protocol protocol)
    : scheme_(protocol == Protocol::https ? "https" : "http"),
      program_(commandLine(directory_.path().string(), protocol == Protocol::https),
               Program::Input::pipe) {
    const auto line = program_.awaitLine("collector: listening on ");
    if (!line) {
        throw std::runtime_error("the collector did not start");
    }
    port_ = std::stoi(line->substr(line->rfind(':') + 1));
}

std::string Collector::control(const std::string& line) {
    program_.writeLine(line);
    const std::string answer = program_.awaitLine("").value_or("nothing");
    if (answer.rfind("ok", 0) != 0) {
        throw std::runtime_error(base::concat("the collector answers to \"", line, "\": ", answer));
    }
    return answer.size() > 3 ? answer.substr(3) : std::string();
}

std::string Collector::link(const std::string& path, const std::string& host) const {
    return base::concat(scheme_, "://", host, ':', port_, path);
}

std::string Collector::certificate(const std::string& name) const {
    return directory_.file(base::concat("certificates/", name));
}

std::size_t Collector::requestCount() {
    return std::stoul(control("requests"));
}

std::size_t Collector::connectionCount() {
    return std::stoul(control("connections"));
}

std::string Collector::head(std::size_t number) const {
    return kept(number, "head");
}

std::string Collector::body(std::size_t number) const {
    return kept(number, "body");
}

std::vector<std::string> Collector::lastHead() {
    std::vector<std::string> lines;
    std::string rest = head(requestCount());
    for (auto end = rest.find("\r\n"); end != std::string::npos; end = rest.find("\r\n")) {
        lines.push_back(rest.substr(0, end));
        rest.erase(0, end + 2);
    }
    return lines;
}

std::string Collector::kept(std::size_t number, const std::string& kind) const {
    std::string stem = std::to_string(number);
    stem.insert(0, stem.size() < 4 ? 4 - stem.size() : 0, '0');
    std::ifstream file(directory_.file(base::concat("kept/", stem, '.', kind)), std::ios::binary);
    if (!file) {
        throw std::runtime_error(base::concat("the collector has kept no request ", stem));
    }
    return {std::istreambuf_iterator<char>(file), {}};
}

} // namespace support
