#include "platform/JSON.h"
#include "platform/formats/JSONCodec.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

namespace {

using platform::kMaxJSONDepth;
using platform::kMaxJSONSize;

TEST(JSONReaderTest, ErrorSaysWhatIsWrongAndWhere) {
    using std::literals::operator""sv;
    const std::string deep(kMaxJSONDepth + 1, '[');
    const std::string large(kMaxJSONSize + 1, '1');
    const std::vector<std::pair<std::string_view, std::string>> cases = {
        {"", "no JSON from byte 0 on: The document is empty."},
        {" x", "no JSON from byte 1 on: Invalid value."},
        {"[1,]", "no JSON from byte 3 on: Invalid value."},
        {"[1 2]", "no JSON from byte 3 on: Missing a comma or ']' after an array element."},
        {"{\"a\":1,}", "no JSON from byte 7 on: Missing a name for object member."},
        {"1 2", "no JSON from byte 2 on: "
                "The document root must not be followed by other values."},
        {"[]\0"sv, "no JSON from byte 2 on: "
                   "The document root must not be followed by other values."},
        {"[\"\xFF\"]", "no JSON from byte 2 on: Invalid encoding in string."},
        {"\"\\uD800\"", "no JSON from byte 1 on: The surrogate pair in string is invalid."},
        {"\"\\uDC00\"", "no JSON from byte 8 on: Half of a surrogate pair in string."},
        {"[1e309]", "no JSON from byte 1 on: Number too big to be stored in double."},
        {"[1e-400]", "no JSON from byte 1 on: Number out of the range of a double."},
        {deep, "no JSON from byte 128 on: Nested too deep."},
        {large, "no JSON from byte 1048576 on: The text is too long."},
    };
    for (const auto& [text, description] : cases) {
        const auto result = platform::readJSON(text);
        ASSERT_FALSE(result) << description;
        EXPECT_EQ(result.error(), (platform::Error{platform::kGenericErrorDomain, 0, description}));
    }
}

} // namespace
