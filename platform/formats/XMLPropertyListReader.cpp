#include "base/Concat.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <dlfcn.h>
#include <memory>
#include <plist/plist.h>
#include <stdlib.h>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

namespace platform {

namespace {

/// The functions of libplist, which is loaded by the first file in XML: a machine without
/// configuration files has none, and saves at each start of the daemon what mapping a library
/// takes.
class LibPlist {
    /// Becomes a pointer to a function of any type.
    struct Address {
        void* address;

        template <typename Function>
        requires std::is_function_v<Function>
        operator Function*() const { // NOLINT(google-explicit-constructor)
            return reinterpret_cast<Function*>(address);
        }
    };

    [[nodiscard]] Address function(const char* name) {
        void* const address = library_ != nullptr ? ::dlsym(library_, name) : nullptr;
        isComplete_ = isComplete_ && address != nullptr;
        return {address};
    }

    void* const library_ = ::dlopen(KSTD_LIBPLIST, RTLD_NOW | RTLD_LOCAL);
    bool isComplete_ = true;

  public:
    [[nodiscard]] bool isComplete() const { return isComplete_; }

    decltype(::plist_from_xml)* from_xml = function("plist_from_xml");
    decltype(::plist_to_bin)* to_bin = function("plist_to_bin");
    decltype(::plist_free)* free = function("plist_free");
    decltype(::plist_get_node_type)* get_node_type = function("plist_get_node_type");
    decltype(::plist_compare_node_value)* compare_node_value = function("plist_compare_node_value");
    decltype(::plist_get_bool_val)* get_bool_val = function("plist_get_bool_val");
    decltype(::plist_get_uint_val)* get_uint_val = function("plist_get_uint_val");
    decltype(::plist_get_real_val)* get_real_val = function("plist_get_real_val");
    decltype(::plist_get_string_ptr)* get_string_ptr = function("plist_get_string_ptr");
    decltype(::plist_get_data_ptr)* get_data_ptr = function("plist_get_data_ptr");
    decltype(::plist_array_new_iter)* array_new_iter = function("plist_array_new_iter");
    decltype(::plist_array_next_item)* array_next_item = function("plist_array_next_item");
    decltype(::plist_dict_new_iter)* dict_new_iter = function("plist_dict_new_iter");
    decltype(::plist_dict_next_item)* dict_next_item = function("plist_dict_next_item");
};

const LibPlist& libplist() {
    static const LibPlist functions;
    return functions;
}

struct Release {
    void operator()(void* memory) const { ::free(memory); }
};

struct ReleaseNode {
    void operator()(void* node) const { libplist().free(node); }
};
using Node = std::unique_ptr<void, ReleaseNode>;

Node parse(std::string_view xml) {
    plist_t node = nullptr;
    libplist().from_xml(xml.data(), static_cast<std::uint32_t>(xml.size()), &node);
    return Node(node);
}

std::size_t occurrences(std::string_view text, std::string_view part) {
    std::size_t count = 0;
    for (std::size_t at = text.find(part); at != std::string_view::npos;
         at = text.find(part, at + part.size())) {
        ++count;
    }
    return count;
}

/// libplist goes through nested nodes by recursion when it releases them, so that their number has
/// to be bounded before it sees the text; it would also end a text at a NUL.
bool isWithinLimits(std::string_view xml) {
    return xml.size() <= kMaxXMLPropertyListSize && xml.find('\0') == std::string_view::npos &&
           occurrences(xml, "<array") + occurrences(xml, "<dict") <= kMaxXMLPropertyListContainers;
}

/// Hands the nodes of a tree to a sink.
class Walk {
  public:
    explicit Walk(ValueSink& sink) : sink_(sink) {}

    [[nodiscard]] bool read(plist_t node) {
        switch (libplist().get_node_type(node)) {
        case PLIST_BOOLEAN:
            return readBoolean(node);
        case PLIST_UINT:
            return readInteger(node);
        case PLIST_REAL:
            return readReal(node);
        case PLIST_STRING:
            return readText(node);
        case PLIST_DATA:
            return readBytes(node);
        case PLIST_DATE:
            return readDate(node);
        case PLIST_ARRAY:
        case PLIST_DICT:
            return readContainer(node);
        default:
            return false;
        }
    }

  private:
    bool readBoolean(plist_t node) {
        std::uint8_t value = 0;
        libplist().get_bool_val(node, &value);
        sink_.boolean(value != 0);
        return true;
    }

    bool readInteger(plist_t node) {
        std::uint64_t bits = 0;
        libplist().get_uint_val(node, &bits);
        if (std::in_range<std::int64_t>(bits) || isNegative(node, bits)) {
            sink_.integer(static_cast<std::int64_t>(bits));
        } else {
            sink_.largeInteger(bits);
        }
        return true;
    }

    /// libplist gives -1 and 2^64-1 as the same 64 bits, but knows one from the other when it
    /// compares two nodes.
    static bool isNegative(plist_t node, std::uint64_t bits) {
        const Node unsignedNode =
            parse(base::concat("<plist><integer>", bits, "</integer></plist>"));
        return libplist().compare_node_value(node, unsignedNode.get()) == 0;
    }

    bool readReal(plist_t node) {
        double value = 0;
        libplist().get_real_val(node, &value);
        sink_.real(value);
        return true;
    }

    bool readText(plist_t node) {
        std::uint64_t length = 0;
        const char* const characters = libplist().get_string_ptr(node, &length);
        const std::string_view text(characters, length);
        if (!isUTF8WithoutNUL(text)) {
            return false;
        }
        sink_.text(text);
        return true;
    }

    bool readBytes(plist_t node) {
        std::uint64_t length = 0;
        const char* const bytes = libplist().get_data_ptr(node, &length);
        sink_.bytes({reinterpret_cast<const std::uint8_t*>(bytes), length});
        return true;
    }

    /// libplist hands out a date in 32 bits only, but keeps and writes it in full.
    bool readDate(plist_t node) {
        char* binary = nullptr;
        std::uint32_t size = 0;
        libplist().to_bin(node, &binary, &size);
        const std::unique_ptr<char, Release> owner(binary);
        return readBinaryPropertyList({reinterpret_cast<const std::uint8_t*>(binary), size}, sink_);
    }

    bool readContainer(plist_t node) {
        if (depth_ == kMaxPropertyListDepth) {
            return false;
        }
        ++depth_;
        const bool read =
            libplist().get_node_type(node) == PLIST_ARRAY ? readList(node) : readMap(node);
        --depth_;
        return read;
    }

    bool readList(plist_t list) {
        plist_array_iter iterator = nullptr;
        libplist().array_new_iter(list, &iterator);
        const std::unique_ptr<void, Release> owner(iterator);
        sink_.beginList();
        plist_t item = nullptr;
        libplist().array_next_item(list, iterator, &item);
        while (item != nullptr) {
            if (!read(item)) {
                return false;
            }
            libplist().array_next_item(list, iterator, &item);
        }
        sink_.endList();
        return true;
    }

    bool readMap(plist_t map) {
        sink_.beginMap();
        for (const auto& [key, value] : sortedEntries(map)) {
            if (!isUTF8WithoutNUL(key)) {
                return false;
            }
            sink_.key(key);
            if (!read(value)) {
                return false;
            }
        }
        sink_.endMap();
        return true;
    }

    static std::vector<std::pair<std::string, plist_t>> sortedEntries(plist_t map) {
        plist_dict_iter iterator = nullptr;
        libplist().dict_new_iter(map, &iterator);
        const std::unique_ptr<void, Release> owner(iterator);
        std::vector<std::pair<std::string, plist_t>> entries;
        while (true) {
            char* key = nullptr;
            plist_t value = nullptr;
            libplist().dict_next_item(map, iterator, &key, &value);
            const std::unique_ptr<char, Release> keyOwner(key);
            if (key == nullptr) {
                break;
            }
            entries.emplace_back(key, value);
        }
        std::sort(entries.begin(), entries.end());
        return entries;
    }

    ValueSink& sink_;
    std::size_t depth_ = 0;
};

} // namespace

bool readXMLPropertyList(std::span<const std::uint8_t> data, ValueSink& sink) {
    const std::string_view xml(reinterpret_cast<const char*>(data.data()), data.size());
    if (!isWithinLimits(xml) || !libplist().isComplete()) {
        return false;
    }
    const Node root = parse(xml);
    return root && Walk(sink).read(root.get());
}

} // namespace platform
