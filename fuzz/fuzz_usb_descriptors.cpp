// What a USB device says about itself: whatever it is, it is refused as unknown or what is told of
// it is in its bytes.

#include "keystrand-linux/UsbDescriptors.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <span>

namespace {

using keystrand::usb::UsbClass;
using keystrand::usb::UsbFunctions;
using Bytes = std::span<const std::uint8_t>;

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

bool isIn(const UsbClass& wanted, Bytes bytes) {
    const std::uint8_t triple[] = {wanted.number, wanted.subclass, wanted.protocol};
    return std::search(bytes.begin(), bytes.end(), std::begin(triple), std::end(triple)) !=
           bytes.end();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const Bytes bytes(data, size);
    const UsbFunctions functions = keystrand::usb::readDescriptors(bytes);
    if (!functions.understood) {
        require(functions == UsbFunctions());
        return 0;
    }
    require(!functions.classes.empty());
    for (const UsbClass& each : functions.classes) {
        require(isIn(each, bytes));
    }
    const auto has = [&](auto matches) {
        return std::any_of(functions.classes.begin(), functions.classes.end(), matches);
    };
    if (functions.isOnlyKeyboard) {
        require(functions.isKeyboard && !functions.isHub);
    }
    require(functions.isHub == has([](const UsbClass& each) { return each.number == 9; }));
    // One byte less or more is another thing altogether.
    require(!keystrand::usb::readDescriptors(bytes.first(size - 1)).understood);
    return 0;
}
