#include "keystrand-linux/UsbDescriptors.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <set>

namespace keystrand::usb {

namespace {

using Bytes = std::span<const std::uint8_t>;

constexpr std::uint8_t kDeviceType = 1;
constexpr std::uint8_t kConfigurationType = 2;
constexpr std::uint8_t kInterfaceType = 4;
constexpr std::size_t kDeviceLength = 18;
constexpr std::size_t kConfigurationLength = 9;
constexpr std::size_t kInterfaceLength = 9;
constexpr std::size_t kHeadLength = 2;

constexpr std::uint8_t kHidClass = 3;
constexpr std::uint8_t kHubClass = 9;
constexpr std::uint8_t kBootSubclass = 1;
constexpr std::uint8_t kKeyboardProtocol = 1;

class Reader {
  public:
    [[nodiscard]] UsbFunctions read(Bytes bytes) {
        if (!device(bytes)) {
            return {};
        }
        bytes = bytes.subspan(kDeviceLength);
        for (unsigned count = 0; count < configurations_; ++count) {
            const auto length = configuration(bytes);
            if (!length) {
                return {};
            }
            bytes = bytes.subspan(*length);
        }
        if (!bytes.empty() || !anyInterface_) {
            return {};
        }
        functions_.understood = true;
        functions_.isOnlyKeyboard = functions_.isKeyboard && onlyHid_ && !functions_.isHub;
        return functions_;
    }

  private:
    [[nodiscard]] bool device(Bytes bytes) {
        if (bytes.size() < kDeviceLength || bytes[0] != kDeviceLength || bytes[1] != kDeviceType) {
            return false;
        }
        configurations_ = bytes[17];
        const UsbClass own{.number = bytes[4], .subclass = bytes[5], .protocol = bytes[6]};
        // 0: the interfaces say it.
        if (own.number != 0) {
            add(own);
        }
        return true;
    }

    /// How many bytes the configuration takes, or none when it cannot be understood.
    [[nodiscard]] std::optional<std::size_t> configuration(Bytes bytes) {
        if (bytes.size() < kConfigurationLength || bytes[0] < kConfigurationLength ||
            bytes[1] != kConfigurationType) {
            return std::nullopt;
        }
        const std::size_t total = bytes[2] | (std::size_t{bytes[3]} << 8U);
        const unsigned interfaces = bytes[4];
        if (total < bytes[0] || total > bytes.size()) {
            return std::nullopt;
        }
        const auto numbers = interfacesIn(bytes.subspan(bytes[0], total - bytes[0]));
        if (!numbers || numbers->size() != interfaces) {
            return std::nullopt;
        }
        return total;
    }

    /// The numbers of the interfaces; alternate settings share one.
    [[nodiscard]] std::optional<std::set<std::uint8_t>> interfacesIn(Bytes bytes) {
        std::set<std::uint8_t> numbers;
        while (!bytes.empty()) {
            if (bytes.size() < kHeadLength || bytes[0] < kHeadLength || bytes[0] > bytes.size() ||
                bytes[1] == kConfigurationType || bytes[1] == kDeviceType) {
                return std::nullopt;
            }
            if (bytes[1] == kInterfaceType) {
                if (bytes[0] < kInterfaceLength) {
                    return std::nullopt;
                }
                numbers.insert(bytes[2]);
                interface({.number = bytes[5], .subclass = bytes[6], .protocol = bytes[7]});
            }
            bytes = bytes.subspan(bytes[0]);
        }
        return numbers;
    }

    void interface(const UsbClass& is) {
        anyInterface_ = true;
        add(is);
        onlyHid_ = onlyHid_ && is.number == kHidClass;
        functions_.isKeyboard =
            functions_.isKeyboard || is == UsbClass{kHidClass, kBootSubclass, kKeyboardProtocol};
    }

    void add(const UsbClass& is) {
        functions_.isHub = functions_.isHub || is.number == kHubClass;
        if (std::find(functions_.classes.begin(), functions_.classes.end(), is) ==
            functions_.classes.end()) {
            functions_.classes.push_back(is);
        }
    }

    UsbFunctions functions_;
    unsigned configurations_ = 0;
    bool anyInterface_ = false;
    bool onlyHid_ = true;
};

} // namespace

UsbFunctions readDescriptors(std::span<const std::uint8_t> bytes) {
    return Reader().read(bytes);
}

std::uint64_t hashOfDescriptors(std::span<const std::uint8_t> bytes) {
    constexpr std::uint64_t kOffset = 0xCBF29CE484222325;
    constexpr std::uint64_t kPrime = 0x100000001B3;
    std::uint64_t hash = kOffset;
    for (const std::uint8_t byte : bytes) {
        hash = (hash ^ byte) * kPrime;
    }
    return hash;
}

} // namespace keystrand::usb
