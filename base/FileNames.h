#pragma once

#include <string>
#include <string_view>

// Not by std::filesystem: its paths bring the locales of the C++ library into a program, a megabyte
// that nothing else asks for.

namespace base {

/// The directory that the last name of an absolute path lies in; "/" is in itself.
[[nodiscard]] inline std::string directoryOf(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    return slash == 0 || slash == std::string_view::npos ? "/" : std::string(path.substr(0, slash));
}

/// An absolute path without ".", ".." and more slashes than it needs, by the text alone: what a
/// link leads to is not looked at.
[[nodiscard]] inline std::string withoutDots(std::string_view path) {
    std::string plain;
    while (!path.empty()) {
        const std::size_t slash = path.find('/');
        const std::string_view name = path.substr(0, slash);
        path.remove_prefix(slash == std::string_view::npos ? path.size() : slash + 1);
        if (name == "..") {
            plain.resize(plain.empty() ? 0 : plain.rfind('/'));
        } else if (!name.empty() && name != ".") {
            plain.append("/").append(name);
        }
    }
    return plain.empty() ? "/" : plain;
}

} // namespace base
