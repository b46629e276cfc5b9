#include "keystrand-linux/UsbDescriptors.h"

#include "tests/keystrand-linux/FakeUsbBus.h"

#include <gtest/gtest.h>

#include <memory>

namespace keystrand::usb {
namespace {

using Bytes = std::vector<std::uint8_t>;

constexpr std::size_t kDevice = 18;
constexpr std::size_t kTotal = kDevice + 2;
constexpr std::size_t kInterfaces = kDevice + 4;
constexpr std::size_t kInterface = kDevice + 9;

/// From memory that ends where the bytes end, so that a sanitizer sees what reads on.
UsbFunctions readExactly(const Bytes& bytes) {
    const auto exact = std::make_unique<std::uint8_t[]>(bytes.size());
    std::copy(bytes.begin(), bytes.end(), exact.get());
    return readDescriptors({exact.get(), bytes.size()});
}

void expectNotUnderstood(const Bytes& bytes) {
    EXPECT_EQ(readExactly(bytes), UsbFunctions());
}

Bytes with(Bytes bytes, std::size_t at, std::uint8_t value) {
    bytes.at(at) = value;
    return bytes;
}

TEST(UsbDescriptorsTest, Keyboard) {
    const UsbFunctions functions = readExactly(aKeyboard().descriptors);
    EXPECT_TRUE(functions.understood);
    EXPECT_TRUE(functions.isKeyboard);
    EXPECT_TRUE(functions.isOnlyKeyboard);
    EXPECT_FALSE(functions.isHub);
    EXPECT_EQ(functions.classes, (std::vector<UsbClass>{{3, 1, 1}, {3, 0, 0}}));
}

TEST(UsbDescriptorsTest, EachOfTheThreeNumbersMakesAKeyboard) {
    const Bytes keyboard = descriptorsOf(std::vector<UsbClass>{{3, 1, 1}});
    EXPECT_TRUE(readExactly(keyboard).isOnlyKeyboard);
    EXPECT_FALSE(readExactly(with(keyboard, kInterface + 5, 2)).isKeyboard);
    EXPECT_FALSE(readExactly(with(keyboard, kInterface + 6, 0)).isKeyboard);
    EXPECT_FALSE(readExactly(with(keyboard, kInterface + 7, 2)).isKeyboard);
}

TEST(UsbDescriptorsTest, KeyboardThatIsMore) {
    const UsbFunctions functions = readExactly(aKeyboardWithDisk().descriptors);
    EXPECT_TRUE(functions.isKeyboard);
    EXPECT_FALSE(functions.isOnlyKeyboard);
}

TEST(UsbDescriptorsTest, KeyboardInOneConfigurationAndDiskInAnother) {
    Bytes bytes = with(aKeyboard().descriptors, kDevice - 1, 2);
    const Bytes disk = aDisk().descriptors;
    bytes.insert(bytes.end(), disk.begin() + kDevice, disk.end());
    const UsbFunctions functions = readExactly(bytes);
    EXPECT_TRUE(functions.isKeyboard);
    EXPECT_FALSE(functions.isOnlyKeyboard);
}

TEST(UsbDescriptorsTest, KeyboardBehindTheDisk) {
    const UsbFunctions functions =
        readExactly(descriptorsOf(std::vector<UsbClass>{{8, 6, 0x50}, {3, 1, 1}}));
    EXPECT_TRUE(functions.isKeyboard);
    EXPECT_FALSE(functions.isOnlyKeyboard);
}

TEST(UsbDescriptorsTest, AlternateSettingCounts) {
    // The second interface is another setting of the first one.
    Bytes bytes =
        with(descriptorsOf(std::vector<UsbClass>{{3, 1, 1}, {8, 6, 0x50}}), kInterfaces, 1);
    bytes = with(bytes, kInterface + 9 + 2, 0);
    bytes = with(bytes, kInterface + 9 + 3, 1);
    const UsbFunctions functions = readExactly(bytes);
    EXPECT_TRUE(functions.isKeyboard);
    EXPECT_FALSE(functions.isOnlyKeyboard);
}

TEST(UsbDescriptorsTest, HubByItsDeviceOrByAnInterface) {
    EXPECT_TRUE(readExactly(aHub().descriptors).isHub);
    const UsbFunctions functions = readExactly(with(aKeyboard().descriptors, 4, 9));
    EXPECT_TRUE(functions.isHub);
    EXPECT_FALSE(functions.isOnlyKeyboard);
    EXPECT_EQ(functions.classes.front(), (UsbClass{9, 0, 0}));
}

TEST(UsbDescriptorsTest, OtherDescriptorsArePassedOver) {
    Bytes bytes = descriptorsOf(std::vector<UsbClass>{{3, 1, 1}});
    const Bytes more = {9, 0x21, 0x11, 1, 0, 1, 0x22, 65, 0, 7, 5, 0x81, 3, 8, 0, 10, 2, 0x30};
    bytes.insert(bytes.end(), more.begin(), more.end());
    bytes[kTotal] = static_cast<std::uint8_t>(bytes.size() - kDevice);
    EXPECT_TRUE(readExactly(bytes).isOnlyKeyboard);
}

TEST(UsbDescriptorsTest, NothingShorterIsUnderstood) {
    const Bytes whole = aKeyboard().descriptors;
    for (std::size_t size = 0; size < whole.size(); ++size) {
        expectNotUnderstood({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)});
    }
    EXPECT_TRUE(readExactly(whole).understood);
    Bytes longer = whole;
    longer.push_back(0);
    expectNotUnderstood(longer);
}

TEST(UsbDescriptorsTest, WhatContradictsItselfIsNotUnderstood) {
    const Bytes keyboard = aKeyboard().descriptors;
    expectNotUnderstood(with(keyboard, 0, 17));
    expectNotUnderstood(with(keyboard, 1, 2));
    for (const std::uint8_t configurations : Bytes{0, 2}) {
        expectNotUnderstood(with(keyboard, kDevice - 1, configurations));
    }
    expectNotUnderstood(with(keyboard, kDevice, 8));
    expectNotUnderstood(with(keyboard, kDevice, 10));
    expectNotUnderstood(with(keyboard, kDevice + 1, 4));
    for (const int total : {8, 26, 28}) {
        expectNotUnderstood(with(keyboard, kTotal, static_cast<std::uint8_t>(total)));
    }
    expectNotUnderstood(with(keyboard, kTotal + 1, 1));
    for (const std::uint8_t interfaces : Bytes{1, 3}) {
        expectNotUnderstood(with(keyboard, kInterfaces, interfaces));
    }
    for (const std::uint8_t length : Bytes{0, 1, 2, 8, 10, 255}) {
        expectNotUnderstood(with(keyboard, kInterface, length));
    }
    for (const std::uint8_t type : Bytes{1, 2}) {
        expectNotUnderstood(with(keyboard, kInterface + 1, type));
    }
    // A single byte behind the last descriptor, which the configuration counts as its own.
    Bytes longer = with(keyboard, kTotal, static_cast<std::uint8_t>(keyboard.size() + 1 - kDevice));
    longer.push_back(2);
    expectNotUnderstood(longer);
}

TEST(UsbDescriptorsTest, DeviceWithoutInterfacesIsNotUnderstood) {
    expectNotUnderstood(descriptorsOf({}));
    Bytes none = descriptorsOf({});
    none[kDevice - 1] = 0;
    none.resize(kDevice);
    expectNotUnderstood(none);
}

TEST(UsbDescriptorsTest, HashIsTheSameEverywhere) {
    EXPECT_EQ(hashOfDescriptors({}), 0xCBF29CE484222325U);
    const Bytes a = {'a'};
    EXPECT_EQ(hashOfDescriptors(a), 0xAF63DC4C8601EC8CU);
    const Bytes foobar = {'f', 'o', 'o', 'b', 'a', 'r'};
    EXPECT_EQ(hashOfDescriptors(foobar), 0x85944171F73967E8U);
}

} // namespace
} // namespace keystrand::usb
