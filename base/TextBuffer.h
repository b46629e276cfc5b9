#pragma once

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <string_view>
#include <utility>

namespace base {

/// A text that grows to any length without being copied: a large block is grown by moving its
/// pages, so that the text is never held twice, as it would be while a std::string grows.
class TextBuffer {
  public:
    TextBuffer() = default;
    TextBuffer(TextBuffer&& other) noexcept { swap(other); }
    TextBuffer& operator=(TextBuffer&& other) noexcept {
        TextBuffer(std::move(other)).swap(*this);
        return *this;
    }
    TextBuffer(const TextBuffer&) = delete;
    TextBuffer& operator=(const TextBuffer&) = delete;
    ~TextBuffer() = default;

    void append(std::string_view text) {
        if (!text.empty()) {
            std::memcpy(extend(text.size()), text.data(), text.size());
            size_ += text.size();
        }
    }

    void append(char character) {
        *extend(1) = character;
        ++size_;
    }

    /// Appends the text between two of the character.
    void append(std::string_view text, char around) {
        char* const place = extend(text.size() + 2);
        *place = around;
        if (!text.empty()) {
            std::memcpy(place + 1, text.data(), text.size());
        }
        place[text.size() + 1] = around;
        size_ += text.size() + 2;
    }

    /// Shortens the text to its first `size` bytes, of which it must have so many.
    void truncate(std::size_t size) { size_ = size; }

    [[nodiscard]] std::size_t size() const { return size_; }
    [[nodiscard]] std::string_view view() const { return {data_.get(), size_}; }

  private:
    struct Release {
        void operator()(char* data) const { std::free(data); }
    };

    void swap(TextBuffer& other) noexcept {
        std::swap(data_, other.data_);
        std::swap(size_, other.size_);
        std::swap(capacity_, other.capacity_);
    }

    /// Where `more` bytes can be written behind the text.
    char* extend(std::size_t more) {
        if (more > capacity_ - size_) {
            grow(size_ + more);
        }
        return data_.get() + size_;
    }

    void grow(std::size_t needed) {
        std::size_t capacity = capacity_ + capacity_ / 2 + 64;
        if (capacity < needed) {
            capacity = needed;
        }
        void* const grown = std::realloc(data_.get(), capacity);
        if (grown == nullptr) {
            throw std::bad_alloc();
        }
        static_cast<void>(data_.release());
        data_.reset(static_cast<char*>(grown));
        capacity_ = capacity;
    }

    std::unique_ptr<char, Release> data_;
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
};

} // namespace base
