#pragma once

#include "base/NotCopied.h"
#include "platform/Files.h"
#include "tests/platform/contract/ContractTest.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace contract {

using Bytes = std::vector<std::uint8_t>;

/// A process with Files, on a system that has the directory /var/root and nothing in it. Paths are
/// the ones that programs know.
struct FilesFixture : private base::NotCopied {
    virtual ~FilesFixture() = default;

    virtual platform::Files& files() = 0;

    /// Where the file lies for libraries.
    [[nodiscard]] virtual std::string real(const std::string& path) const = 0;

    virtual void makeDirectory(const std::string& path) = 0;
    virtual void put(const std::string& path, const Bytes& bytes, unsigned mode) = 0;
    [[nodiscard]] virtual std::optional<Bytes> bytesOf(const std::string& path) = 0;
    [[nodiscard]] virtual unsigned modeOf(const std::string& path) = 0;
    [[nodiscard]] virtual std::size_t openDescriptors() = 0;
    virtual void closeDescriptor(int descriptor) = 0;
};

class FilesContract : public ContractTest<FilesFixture> {
  protected:
    [[nodiscard]] platform::Files& files() { return fixture().files(); }

    [[nodiscard]] platform::OpenFile open(const std::string& path, unsigned mode = 0600);

    /// A stream on a file that can be opened.
    [[nodiscard]] std::unique_ptr<platform::FileStream> stream(const std::string& path);

    /// How many whole elements of one byte were written.
    static std::size_t write(platform::FileStream& stream, const Bytes& bytes);
};

} // namespace contract
