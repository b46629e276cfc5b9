// Feeds the reader of binary property lists: whatever the bytes are, its sink is served as it
// should be, and what was read can be written and read again without a change.

#include "platform/ValueBuilder.h"
#include "platform/formats/JSONCodec.h"
#include "platform/formats/PropertyListCodec.h"
#include "platform/formats/UnicodeText.h"

#include <algorithm>
#include <cstdint>
#include <limits>
#include <numeric>
#include <optional>
#include <span>
#include <string>
#include <utility>
#include <vector>

namespace {

using platform::Bytes;

void require(bool condition) {
    if (!condition) {
        __builtin_trap();
    }
}

/// Checks that pieces come as a ValueSink may expect them.
class CheckingSink final : public platform::ValueSink {
  public:
    void beginMap() override { begin(true); }
    void key(std::string_view key) override {
        require(!open_.empty() && open_.back().isMap && !open_.back().hasKey);
        require(platform::isUTF8WithoutNUL(key));
        require(!open_.back().lastKey || *open_.back().lastKey < key);
        open_.back().lastKey = key;
        open_.back().hasKey = true;
    }
    void endMap() override { end(true); }
    void beginList() override { begin(false); }
    void endList() override { end(false); }

    void null() override { require(false); }
    void boolean(bool /*value*/) override { value(); }
    void integer(std::int64_t /*value*/) override { value(); }
    void largeInteger(std::uint64_t number) override {
        require(number > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()));
        value();
    }
    void real(double /*value*/) override { value(); }
    void text(std::string_view utf8) override {
        require(platform::isUTF8WithoutNUL(utf8));
        value();
    }
    void bytes(std::span<const std::uint8_t> bytes) override {
        // Touches what was handed over.
        sum_ = std::accumulate(bytes.begin(), bytes.end(), sum_);
        value();
    }
    void date(platform::Timestamp /*value*/) override { value(); }
    void other(std::string_view /*kind*/) override { require(false); }

    [[nodiscard]] bool isComplete() const { return outermostValues_ == 1 && open_.empty(); }
    [[nodiscard]] std::size_t values() const { return values_; }

  private:
    struct Open {
        bool isMap;
        bool hasKey = false;
        std::optional<std::string> lastKey = {};
    };

    void begin(bool isMap) {
        value();
        require(open_.size() < platform::kMaxPropertyListDepth);
        open_.push_back({isMap});
    }

    void end(bool isMap) {
        require(!open_.empty() && open_.back().isMap == isMap && !open_.back().hasKey);
        open_.pop_back();
    }

    void value() {
        ++values_;
        if (open_.empty()) {
            ++outermostValues_;
        } else if (open_.back().isMap) {
            require(open_.back().hasKey);
            open_.back().hasKey = false;
        }
    }

    std::vector<Open> open_;
    std::size_t values_ = 0;
    std::size_t outermostValues_ = 0;
    std::uint64_t sum_ = 0;
};

Bytes writtenAfterReading(std::span<const std::uint8_t> file) {
    platform::ValueBuilder builder;
    require(platform::readBinaryPropertyList(file, builder));
    platform::Result<Bytes> written = platform::writeBinaryPropertyList(builder.take());
    require(static_cast<bool>(written));
    return std::move(written).value();
}

std::string asJSON(std::span<const std::uint8_t> file, platform::KnownKeys* known) {
    platform::JSONWriter writer;
    const bool isRead = platform::readBinaryPropertyList(file, writer, known);
    const auto text = writer.finish();
    return isRead && text ? std::string(text.value().view()) : std::string();
}

/// Once the keys are not known, and once they are.
void checkWithKnownKeys(std::span<const std::uint8_t> file) {
    platform::KnownKeys known;
    const std::string expected = asJSON(file, nullptr);
    require(asJSON(file, &known) == expected);
    require(asJSON(file, &known) == expected);
}

void check(std::span<const std::uint8_t> file) {
    CheckingSink sink;
    if (platform::readBinaryPropertyList(file, sink)) {
        require(sink.isComplete());
        // What is referred to over and over takes long to build and shows nothing new.
        constexpr std::size_t kMostValues = 100;
        if (sink.values() > kMostValues) {
            return;
        }
        checkWithKnownKeys(file);
        const Bytes once = writtenAfterReading(file);
        require(writtenAfterReading(once) == once);
    }
}

/// A file whose objects begin at every single byte, so that nearly every reference is to something.
Bytes framed(std::span<const std::uint8_t> objects) {
    Bytes file(platform::kBinaryPropertyListMagic.begin(),
               platform::kBinaryPropertyListMagic.end());
    file.insert(file.end(), objects.begin(), objects.end());
    const std::size_t offsetTable = file.size();
    for (std::size_t place = offsetTable - objects.size(); place < offsetTable; ++place) {
        file.push_back(static_cast<std::uint8_t>(place));
    }
    const Bytes trailer = {
        0, 0, 0, 0, 0, 0, 1, 1, 0, 0, 0, 0, 0, 0, 0, static_cast<std::uint8_t>(objects.size()),
        0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, static_cast<std::uint8_t>(offsetTable)};
    file.insert(file.end(), trailer.begin(), trailer.end());
    return file;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::span<const std::uint8_t> input(data, size);
    check(input);
    constexpr std::size_t kMostObjects = 0xff - platform::kBinaryPropertyListMagic.size();
    check(framed(input.first(std::min(size, kMostObjects))));
    return 0;
}
