#pragma once

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <new>
#include <string_view>
#include <sys/mman.h>
#include <utility>

namespace base {

/// A text that grows to any length without being copied: a large one lies in pages of its own,
/// which are moved when it grows, so that the text is never held twice, as it would be while a
/// std::string grows. Nor does a large text leave a hole in the heap.
class TextBuffer {
  public:
    TextBuffer() = default;
    TextBuffer(TextBuffer&& other) noexcept { swap(other); }
    TextBuffer& operator=(TextBuffer&& other) noexcept {
        TextBuffer(std::move(other)).swap(*this);
        return *this;
    }
    ~TextBuffer() { release(); }

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

    /// Appends what `write` writes: it gets room for `most` characters and gives the end of those
    /// that it used.
    template <typename Writer>
    void appendWritten(std::size_t most, Writer&& write) {
        size_ = static_cast<std::size_t>(write(extend(most)) - data_);
    }

    /// Shortens the text to its first `size` bytes, of which it must have so many.
    void truncate(std::size_t size) { size_ = size; }

    [[nodiscard]] std::size_t size() const { return size_; }
    [[nodiscard]] std::string_view view() const { return {data_, size_}; }

  private:
    /// The least capacity that is mapped. The allocator maps large blocks too, but from which size
    /// on depends on what was freed before.
    static constexpr std::size_t kLeastMapped = 256UL * 1024;

    void swap(TextBuffer& other) noexcept {
        std::swap(data_, other.data_);
        std::swap(size_, other.size_);
        std::swap(capacity_, other.capacity_);
    }

    void release() {
        if (isMapped()) {
            ::munmap(data_, capacity_);
        } else {
            std::free(data_);
        }
    }

    [[nodiscard]] bool isMapped() const { return capacity_ >= kLeastMapped; }

    /// Where `more` bytes can be written behind the text.
    char* extend(std::size_t more) {
        if (more > capacity_ - size_) {
            grow(size_ + more);
        }
        return data_ + size_;
    }

    void grow(std::size_t needed) {
        std::size_t capacity = capacity_ + capacity_ / 2 + 64;
        if (capacity < needed) {
            capacity = needed;
        }
        data_ = capacity < kLeastMapped ? reallocated(capacity) : mapped(capacity);
        capacity_ = capacity;
    }

    [[nodiscard]] char* reallocated(std::size_t capacity) {
        void* const block = std::realloc(data_, capacity);
        if (block == nullptr) {
            throw std::bad_alloc();
        }
        return static_cast<char*>(block);
    }

    [[nodiscard]] char* mapped(std::size_t capacity) {
        void* const pages = isMapped() ? ::mremap(data_, capacity_, capacity, MREMAP_MAYMOVE)
                                       : ::mmap(nullptr, capacity, PROT_READ | PROT_WRITE,
                                                MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
        if (pages == MAP_FAILED) {
            throw std::bad_alloc();
        }
        // Of use where it is obeyed: the first touch of every page is what a long text costs most.
        static_cast<void>(::madvise(pages, capacity, MADV_HUGEPAGE));
        if (!isMapped()) {
            if (size_ > 0) {
                std::memcpy(pages, data_, size_);
            }
            std::free(data_);
        }
        return static_cast<char*>(pages);
    }

    char* data_ = nullptr;
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
};

} // namespace base
