#pragma once

#include "base/FileDescriptor.h"
#include "base/NotCopied.h"
#include "tests/support/Program.h"

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <sys/types.h>
#include <thread>
#include <vector>

namespace support {

/// A system call that a program is about to make.
struct SystemCall {
    /// The thread that makes it, by the system's number, and the name of the program that it runs.
    pid_t thread = 0;
    std::string program;
    int number = -1;
    std::array<std::uint64_t, 6> arguments{};

    /// The file behind the descriptor in an argument, as the system names it; empty when there is
    /// none.
    [[nodiscard]] std::string fileBehind(int descriptor) const;
    /// Bytes of the program's memory; fewer when not all can be read.
    [[nodiscard]] std::vector<std::uint8_t> bytesAt(std::uint64_t address, std::size_t size) const;
    /// A text in the program's memory, up to its zero byte.
    [[nodiscard]] std::string textAt(std::uint64_t address) const;
    /// A path in the program's memory, made absolute by the directory it is relative to.
    [[nodiscard]] std::string pathAt(int directory, std::uint64_t address) const;
};

/// Runs a program of which each system call, and each of the programs that it starts, is shown to a
/// judge before it is carried out. Neither is traced, so what stands in the way of a debugger does
/// not stand in this one's.
class SystemCallGate : private base::NotCopied {
  public:
    /// 0 lets the call go on; with an error's number it fails, and nothing is carried out. Called
    /// on a thread of the gate's own, for one call at a time.
    using Judge = std::function<int(const SystemCall&)>;

    /// `prepare` is run in the new process before everything else.
    SystemCallGate(const std::vector<std::string>& arguments, Judge judge,
                   const std::function<void()>& prepare = {});
    /// Kills the program if it still runs.
    ~SystemCallGate();

    [[nodiscard]] Program& program() { return *program_; }

  private:
    void serve();
    void serveOne();
    [[nodiscard]] std::string programOf(pid_t thread, int number);

    Judge judge_;
    base::FileDescriptor listener_;
    base::FileDescriptor end_;
    std::unique_ptr<Program> program_;
    std::map<pid_t, std::string> programs_;
    std::vector<std::uint8_t> notification_;
    std::vector<std::uint8_t> answer_;
    std::thread server_;
};

} // namespace support
