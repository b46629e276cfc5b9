#pragma once

#include "tests/support/Program.h"
#include "tests/support/TemporaryDirectory.h"

#include <cstddef>
#include <string>
#include <vector>

namespace support {

/// A running tools/collector with certificates of its own (docs/collector.md).
class Collector {
  public:
    enum class Protocol { https, http };

    explicit Collector(Protocol protocol = Protocol::https);

    /// Sends a control line and gives what stands after "ok" in the answer. Any other answer is an
    /// exception: the test is wrong.
    std::string control(const std::string& line);

    [[nodiscard]] int port() const { return port_; }
    /// A link to the collector by its address, or by another of its names.
    [[nodiscard]] std::string link(const std::string& path,
                                   const std::string& host = "127.0.0.1") const;

    /// The certificate of the authority that issued the collector's "good" one.
    [[nodiscard]] std::string authority() const { return directory_.file("certificates/ca.pem"); }
    /// A file of tools/make-certificates.
    [[nodiscard]] std::string certificate(const std::string& name) const;

    /// How many requests came whole, since the start.
    [[nodiscard]] std::size_t requestCount();
    [[nodiscard]] std::size_t connectionCount();

    /// The header block of a request, the first being 1, with the empty line at its end.
    [[nodiscard]] std::string head(std::size_t number) const;
    [[nodiscard]] std::string body(std::size_t number) const;
    /// The header block of the last request, by lines.
    [[nodiscard]] std::vector<std::string> lastHead();

  private:
    [[nodiscard]] std::string kept(std::size_t number, const std::string& kind) const;

    TemporaryDirectory directory_;
    std::string scheme_;
    Program program_;
    int port_ = 0;
};

} // namespace support
