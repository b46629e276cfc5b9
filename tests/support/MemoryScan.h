#pragma once

#include "base/NotCopied.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <functional>
#include <pthread.h>
#include <stdexcept>
#include <string>
#include <string_view>
#include <sys/mman.h>
#include <unistd.h>

namespace support {

/// Looks for a secret in everything that the process can write to. The secret is known here only
/// with its bits turned round, so that looking for it makes no copy.
class MemoryScan : private base::NotCopied {
  public:
    static constexpr std::size_t kSecretSize = 16;
    using Turned = std::array<std::uint8_t, kSecretSize>;

    explicit MemoryScan(const Turned& turnedSecret)
        : turned_(turnedSecret), memory_(::open("/proc/self/mem", O_RDONLY | O_CLOEXEC)) {
        if (memory_ < 0) {
            throw std::runtime_error("cannot read the process's memory");
        }
    }
    ~MemoryScan() { ::close(memory_); }

    /// How many places hold at least the first half of the secret.
    [[nodiscard]] std::size_t places() {
        std::size_t found = 0;
        std::ifstream maps("/proc/self/maps");
        for (std::string line; std::getline(maps, line);) {
            std::uint64_t begin = 0;
            std::uint64_t end = 0;
            char access[5] = {};
            if (std::sscanf(line.c_str(), "%lx-%lx %4s", &begin, &end, access) == 3 &&
                std::string_view(access).substr(0, 2) == "rw" && end - begin <= kLargestMapping) {
                found += placesIn(begin, end);
            }
        }
        ::explicit_bzero(buffer_.data(), buffer_.size());
        return found;
    }

  private:
    /// What is larger is a sanitizer's.
    static constexpr std::uint64_t kLargestMapping = std::uint64_t{1} << 25U;
    static constexpr std::size_t kHalf = kSecretSize / 2;

    std::size_t placesIn(std::uint64_t begin, std::uint64_t end) {
        std::size_t found = 0;
        for (std::uint64_t at = begin; at < end; at += buffer_.size() - (kHalf - 1)) {
            const auto wanted =
                static_cast<std::size_t>(std::min<std::uint64_t>(buffer_.size(), end - at));
            const ssize_t got = ::pread(memory_, buffer_.data(), wanted, static_cast<off_t>(at));
            if (got >= static_cast<ssize_t>(kHalf)) {
                found += placesInBuffer(at, static_cast<std::size_t>(got));
            }
        }
        return found;
    }

    std::size_t placesInBuffer(std::uint64_t at, std::size_t size) {
        const auto own = reinterpret_cast<std::uintptr_t>(buffer_.data());
        const int first = static_cast<std::uint8_t>(~turned_[0]);
        std::size_t found = 0;
        std::size_t from = 0;
        while (from + kHalf <= size) {
            const void* hit = std::memchr(buffer_.data() + from, first, size - from);
            if (hit == nullptr) {
                break;
            }
            from = static_cast<std::size_t>(static_cast<const std::uint8_t*>(hit) - buffer_.data());
            // The window through which the process is looked at is no copy of its own.
            const std::uint64_t place = at + from;
            const bool isWindow = place >= own && place < own + buffer_.size();
            if (!isWindow && isSecret(from, size)) {
                ++found;
            }
            ++from;
        }
        return found;
    }

    [[nodiscard]] bool isSecret(std::size_t from, std::size_t size) const {
        return from + kHalf <= size &&
               std::equal(turned_.begin(), turned_.begin() + kHalf,
                          buffer_.begin() + static_cast<long>(from),
                          [](std::uint8_t turned, std::uint8_t byte) {
                              return static_cast<std::uint8_t>(~byte) == turned;
                          });
    }

    Turned turned_;
    int memory_;
    std::array<std::uint8_t, 65536> buffer_{};
};

/// A stack that one piece of work has for itself, and that can be looked at afterwards: nobody else
/// has written over what was left on it.
class OwnStack : private base::NotCopied {
  public:
    /// Four bytes with their bits turned round, as with MemoryScan.
    using TurnedWord = std::array<std::uint8_t, 4>;

    OwnStack()
        : bytes_(
              ::mmap(nullptr, kSize, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0)) {
        if (bytes_ == MAP_FAILED) {
            throw std::runtime_error("no memory for a stack");
        }
    }
    ~OwnStack() { ::munmap(bytes_, kSize); }

    /// Runs `work` to its end.
    void run(std::function<void()> work) {
        pthread_attr_t attributes;
        pthread_t thread{};
        ::pthread_attr_init(&attributes);
        const bool runs = ::pthread_attr_setstack(&attributes, bytes_, kSize) == 0 &&
                          ::pthread_create(&thread, &attributes, callWork, &work) == 0 &&
                          ::pthread_join(thread, nullptr) == 0;
        ::pthread_attr_destroy(&attributes);
        if (!runs) {
            throw std::runtime_error("no thread on a stack of its own");
        }
    }

    /// How many places on the stack hold the four bytes.
    [[nodiscard]] std::size_t places(const TurnedWord& turned) const {
        // Not through functions of the C library, which a sanitizer would stop here.
        const auto* at = static_cast<const volatile std::uint8_t*>(bytes_);
        std::size_t found = 0;
        for (std::size_t i = 0; i + turned.size() <= kSize; ++i) {
            std::size_t equal = 0;
            while (equal < turned.size() &&
                   static_cast<std::uint8_t>(~at[i + equal]) == turned[equal]) {
                ++equal;
            }
            found += equal == turned.size() ? 1 : 0;
        }
        return found;
    }

  private:
    static constexpr std::size_t kSize = 1U << 20U;

    static void* callWork(void* work) {
        (*static_cast<std::function<void()>*>(work))();
        return nullptr;
    }

    void* bytes_;
};

} // namespace support
