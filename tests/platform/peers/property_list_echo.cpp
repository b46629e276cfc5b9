// Reads binary property lists from standard input, each behind its length in 4 bytes, high byte
// first, and answers each on standard output: its description (see Description) behind its length,
// then the binary form that is written of what was read behind its length. What is not read has an
// empty description and an empty binary form.

#include "base/Concat.h"
#include "platform/ValueBuilder.h"
#include "platform/formats/PropertyListCodec.h"

#include <bit>
#include <cstdio>
#include <string>

namespace {

using platform::Bytes;

/// A value as a text that needs no parser: texts and bytes in hexadecimal digits, reals and dates
/// by their bits.
///
///     T F i-5 r3ff8000000000000 d3ff8000000000000 "6162 #0001 [i1,i2,] {"61:T,"62:F,}
class Description final : public platform::ValueSink {
  public:
    void beginMap() override { text_ += '{'; }
    void key(std::string_view key) override {
        hex('"', {reinterpret_cast<const std::uint8_t*>(key.data()), key.size()});
        text_ += ':';
    }
    void endMap() override { end('}'); }
    void beginList() override { text_ += '['; }
    void endList() override { end(']'); }

    void null() override { end('N'); }
    void boolean(bool value) override { end(value ? 'T' : 'F'); }
    void integer(std::int64_t value) override { number(value); }
    void largeInteger(std::uint64_t value) override { number(value); }
    void real(double value) override { bits('r', value); }
    void text(std::string_view utf8) override {
        hex('"', {reinterpret_cast<const std::uint8_t*>(utf8.data()), utf8.size()});
        text_ += ',';
    }
    void bytes(std::span<const std::uint8_t> value) override {
        hex('#', value);
        text_ += ',';
    }
    void date(platform::Timestamp value) override { bits('d', value.secondsSince2001); }
    void other(std::string_view /*kind*/) override { end('?'); }

    [[nodiscard]] const std::string& result() const { return text_; }

  private:
    void end(char last) {
        text_ += last;
        text_ += ',';
    }

    void number(auto value) {
        base::append(text_, std::string_view(base::concat('i', value, ',')));
    }

    void bits(char kind, double value) {
        const base::Hex digits{std::bit_cast<std::uint64_t>(value)};
        base::append(text_, std::string_view(base::concat(kind, digits, ',')));
    }

    void hex(char kind, std::span<const std::uint8_t> bytes) {
        constexpr char kDigits[] = "0123456789abcdef";
        text_ += kind;
        for (const std::uint8_t byte : bytes) {
            text_ += kDigits[byte >> 4U];
            text_ += kDigits[byte & 0xfU];
        }
    }

    std::string text_;
};

bool take(Bytes& bytes) {
    std::uint8_t length[4];
    if (std::fread(length, 1, sizeof length, stdin) != sizeof length) {
        return false;
    }
    bytes.resize((std::size_t{length[0]} << 24U) | (std::size_t{length[1]} << 16U) |
                 (std::size_t{length[2]} << 8U) | length[3]);
    return std::fread(bytes.data(), 1, bytes.size(), stdin) == bytes.size();
}

void give(const void* bytes, std::size_t size) {
    const std::uint8_t length[] = {
        static_cast<std::uint8_t>(size >> 24U), static_cast<std::uint8_t>(size >> 16U),
        static_cast<std::uint8_t>(size >> 8U), static_cast<std::uint8_t>(size)};
    std::fwrite(length, 1, sizeof length, stdout);
    std::fwrite(bytes, 1, size, stdout);
}

void answer(const Bytes& bytes) {
    Description description;
    platform::ValueBuilder builder;
    std::string text;
    Bytes written;
    if (platform::readBinaryPropertyList(bytes, description) &&
        platform::readBinaryPropertyList(bytes, builder)) {
        text = description.result();
        platform::Result<Bytes> result = platform::writeBinaryPropertyList(builder.take());
        if (result) {
            written = std::move(result).value();
        }
    }
    give(text.data(), text.size());
    give(written.data(), written.size());
}

} // namespace

int main() {
    Bytes bytes;
    while (take(bytes)) {
        answer(bytes);
    }
    return std::ferror(stdin) == 0 && std::fflush(stdout) == 0 ? 0 : 1;
}
