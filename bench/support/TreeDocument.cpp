#include "bench/support/TreeDocument.h"

#include <cstdlib>
#include <memory>
#include <plist/plist.h>
#include <rapidjson/writer.h>
#include <stdexcept>
#include <type_traits>

namespace bench {

namespace {

using Allocator = rapidjson::Document::AllocatorType;

struct Release {
    void operator()(void* node) const { plist_free(node); }
};
using Tree = std::unique_ptr<std::remove_pointer_t<plist_t>, Release>;

struct Free {
    void operator()(void* memory) const { std::free(memory); }
};
using Text = std::unique_ptr<char, Free>;

rapidjson::Value textValue(const char* text, std::uint64_t length, Allocator& allocator) {
    return {text, static_cast<rapidjson::SizeType>(length), allocator};
}

rapidjson::Value valueOf(plist_t node, Allocator& allocator) {
    switch (plist_get_node_type(node)) {
    case PLIST_UINT: {
        std::uint64_t number = 0;
        plist_get_uint_val(node, &number);
        return rapidjson::Value(number);
    }
    case PLIST_REAL: {
        double number = 0;
        plist_get_real_val(node, &number);
        return rapidjson::Value(number);
    }
    case PLIST_STRING: {
        std::uint64_t length = 0;
        const char* const text = plist_get_string_ptr(node, &length);
        return textValue(text, length, allocator);
    }
    default:
        throw std::runtime_error("an event holds a value of a kind that no event has");
    }
}

rapidjson::Value mapOf(plist_t tree, Allocator& allocator) {
    rapidjson::Value map(rapidjson::kObjectType);
    plist_dict_iter created = nullptr;
    plist_dict_new_iter(tree, &created);
    const std::unique_ptr<void, Free> iterator(created);
    for (;;) {
        char* key = nullptr;
        plist_t node = nullptr;
        plist_dict_next_item(tree, created, &key, &node);
        if (node == nullptr) {
            return map;
        }
        const Text owned(key);
        map.AddMember(rapidjson::Value(key, allocator), valueOf(node, allocator), allocator);
    }
}

} // namespace

TreeDocument::TreeDocument() : document_(rapidjson::kObjectType), events_(rapidjson::kArrayType) {}

void TreeDocument::addEvent(std::span<const std::uint8_t> propertyList) {
    plist_t parsed = nullptr;
    plist_from_bin(reinterpret_cast<const char*>(propertyList.data()),
                   static_cast<std::uint32_t>(propertyList.size()), &parsed);
    const Tree tree(parsed);
    if (tree == nullptr || plist_get_node_type(parsed) != PLIST_DICT) {
        throw std::runtime_error("an event is no map");
    }
    Allocator& allocator = document_.GetAllocator();
    events_.PushBack(mapOf(parsed, allocator), allocator);
}

std::string_view TreeDocument::finish() {
    document_.AddMember("events", events_, document_.GetAllocator());
    rapidjson::Writer<rapidjson::StringBuffer> writer(text_);
    document_.Accept(writer);
    return {text_.GetString(), text_.GetSize()};
}

} // namespace bench
