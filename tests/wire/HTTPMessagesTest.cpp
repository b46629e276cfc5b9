#include "wire/HTTPMessages.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <string>
#include <vector>

namespace {

using namespace wire;
using Bytes = std::vector<std::uint8_t>;
using Type = HTTPMessageType;

std::span<const std::uint8_t> fieldsOf(const Bytes& message) {
    return std::span(message).subspan(kHTTPHeaderSize);
}

Bytes headerOf(Type type, std::uint32_t size) {
    const auto bytes = encodeHTTPHeader({type, size});
    return {bytes.begin(), bytes.end()};
}

std::optional<HTTPHeader> decodeHeader(const Bytes& bytes) {
    return decodeHTTPHeader(std::span<const std::uint8_t, kHTTPHeaderSize>(bytes));
}

HTTPRequestFields sampleRequest() {
    return {.method = "POST",
            .link = "https://a/",
            .headers = {{"N", "va"}, {"Empty", ""}},
            .bodySize = 0x0102,
            .maximumAnswerSize = 0x0304,
            .hasDelegate = true};
}

const Bytes kSampleRequest = {
    'K', 'S', 'T', 'H', 1,   1,   0,   0,   52,  0,   0,   0, // header
    1,   4,   2,   0,   10,  0,   0,   0,                     // delegate, method, headers, link
    2,   1,   0,   0,   0,   0,   0,   0,                     // size of the body
    4,   3,   0,   0,   0,   0,   0,   0,                     // most of the answer
    'P', 'O', 'S', 'T', 'h', 't', 't', 'p', 's', ':', '/', '/', 'a', '/', //
    1,   2,   0,   'N', 'v', 'a',                                         //
    5,   0,   0,   'E', 'm', 'p', 't', 'y'};

const Bytes kSampleChallenge = {'K', 'S', 'T', 'H', 1, 4, 0, 0, 15,  0,   0,   0,   2,  3,
                                7,   0,   0,   0,   5, 0, 0, 0, 'M', 'e', 'h', 's', 't'};

const Bytes kSampleFailure = {'K', 'S', 'T',  'H',  1,    7,    0,    0,    16,   0,
                              0,   0,   0xfe, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff,
                              2,   3,   0,    'd',  'o',  'w',  'h',  'y'};

const Bytes kSampleResponse = {'K', 'S', 'T', 'H', 1, 8, 0, 0, 16, 0, 0, 0, 1,   200,
                               0,   0,   0,   5,   6, 0, 0, 0, 0,  0, 0, 2, 'C', 'n'};

/// Fields with one byte changed, cut off or added are refused, or are what other fields encode to.
template <typename Decode, typename Encode>
void expectCanonical(const Bytes& message, Decode decode, Encode encode) {
    const Bytes good(message.begin() + kHTTPHeaderSize, message.end());
    ASSERT_TRUE(decode(good));
    EXPECT_EQ(encode(*decode(good)), message);
    for (std::size_t length = 0; length < good.size(); ++length) {
        EXPECT_FALSE(decode(std::span(good).first(length))) << length;
    }
    Bytes longer = good;
    longer.push_back('x');
    EXPECT_FALSE(decode(longer));
    std::size_t accepted = 0;
    for (std::size_t offset = 0; offset < good.size(); ++offset) {
        for (int value = 0; value < 256; ++value) {
            Bytes changed = good;
            changed[offset] = static_cast<std::uint8_t>(value);
            const auto fields = decode(changed);
            if (fields) {
                ++accepted;
                const auto again = encode(*fields);
                ASSERT_TRUE(again) << offset << ' ' << value;
                EXPECT_TRUE(std::ranges::equal(fieldsOf(*again), changed));
            }
        }
    }
    EXPECT_GT(accepted, good.size());
}

} // namespace

TEST(HTTPMessages, ExactBytes) {
    EXPECT_EQ(encodeHTTPRequest(sampleRequest()), kSampleRequest);
    EXPECT_EQ(encodeHTTPChallenge({"Me", 7, 5, "hst"}), kSampleChallenge);
    EXPECT_EQ(encodeHTTPVerdict(HTTPVerdict::leaveToEvaluation),
              (Bytes{'K', 'S', 'T', 'H', 1, 2, 0, 0, 1, 0, 0, 0, 2}));
    EXPECT_EQ(encodeHTTPBodyWanted(0x01020304),
              (Bytes{'K', 'S', 'T', 'H', 1, 5, 0, 0, 4, 0, 0, 0, 4, 3, 2, 1}));
    EXPECT_EQ(encodeHTTPWorking(), (Bytes{'K', 'S', 'T', 'H', 1, 6, 0, 0, 0, 0, 0, 0}));
    EXPECT_EQ(encodeHTTPFailure({-2, "do", "why"}), kSampleFailure);
    EXPECT_EQ(encodeHTTPResponse({200, 0x0605, "Cn"}), kSampleResponse);
    EXPECT_EQ(headerOf(Type::piece, 0x10000), (Bytes{'K', 'S', 'T', 'H', 1, 3, 0, 0, 0, 0, 1, 0}));
}

TEST(HTTPMessages, WhatWasEncodedIsDecodedAndNothingElse) {
    expectCanonical(kSampleRequest, decodeHTTPRequest, encodeHTTPRequest);
    expectCanonical(kSampleChallenge, decodeHTTPChallenge, encodeHTTPChallenge);
    expectCanonical(kSampleFailure, decodeHTTPFailure, encodeHTTPFailure);
    expectCanonical(*encodeHTTPResponse({-1, 7, "HTTPResponse"}), decodeHTTPResponse,
                    encodeHTTPResponse);
    EXPECT_EQ(decodeHTTPRequest(fieldsOf(kSampleRequest)), sampleRequest());
    EXPECT_EQ(decodeHTTPFailure(fieldsOf(kSampleFailure)), (HTTPFailureFields{-2, "do", "why"}));
    EXPECT_EQ(decodeHTTPChallenge(fieldsOf(kSampleChallenge)),
              (HTTPChallengeFields{"Me", 7, 5, "hst"}));
}

TEST(HTTPMessages, ResponseWithoutAStatus) {
    const auto message = encodeHTTPResponse({std::nullopt, 0, ""});
    ASSERT_TRUE(message);
    EXPECT_EQ(decodeHTTPResponse(fieldsOf(*message)), HTTPResponseFields{});
    Bytes withNumber = *message;
    withNumber[kHTTPHeaderSize + 1] = 1;
    EXPECT_FALSE(decodeHTTPResponse(fieldsOf(withNumber)));
}

TEST(HTTPMessages, VerdictsAndWantedBytes) {
    for (int value = 0; value < 256; ++value) {
        const Bytes fields = {static_cast<std::uint8_t>(value)};
        const auto verdict = decodeHTTPVerdict(fields);
        EXPECT_EQ(verdict.has_value(), value >= 1 && value <= 3) << value;
        if (verdict) {
            EXPECT_TRUE(std::ranges::equal(fieldsOf(encodeHTTPVerdict(*verdict)), fields));
        }
    }
    EXPECT_FALSE(decodeHTTPVerdict({}));
    EXPECT_FALSE(decodeHTTPVerdict(Bytes{1, 1}));
    EXPECT_EQ(decodeHTTPBodyWanted(Bytes{1, 0, 0, 0}), 1U);
    EXPECT_EQ(decodeHTTPBodyWanted(Bytes{255, 255, 255, 255}), 4294967295U);
    for (const Bytes& fields : {Bytes{}, Bytes{0, 0, 0, 0}, Bytes{1, 0, 0}, Bytes{1, 0, 0, 0, 0}}) {
        EXPECT_FALSE(decodeHTTPBodyWanted(fields)) << fields.size();
    }
}

TEST(HTTPMessages, Headers) {
    const struct {
        Type type;
        std::uint32_t least;
        std::uint32_t most;
    } kSizes[] = {
        {Type::request, 26, 131072}, {Type::verdict, 1, 1},    {Type::piece, 1, 65536},
        {Type::challenge, 11, 329},  {Type::bodyWanted, 4, 4}, {Type::working, 0, 0},
        {Type::failure, 12, 4171},   {Type::response, 14, 78},
    };
    for (const auto& [type, least, most] : kSizes) {
        SCOPED_TRACE(static_cast<int>(type));
        EXPECT_EQ(decodeHeader(headerOf(type, least)), (HTTPHeader{type, least}));
        EXPECT_EQ(decodeHeader(headerOf(type, most)), (HTTPHeader{type, most}));
        EXPECT_FALSE(decodeHeader(headerOf(type, most + 1)));
        EXPECT_FALSE(decodeHeader(headerOf(type, 0xffffffff)));
        if (least > 0) {
            EXPECT_FALSE(decodeHeader(headerOf(type, least - 1)));
        }
    }
    const Bytes good = headerOf(Type::verdict, 1);
    for (std::size_t offset = 0; offset < good.size(); ++offset) {
        for (int value = 0; value < 256; ++value) {
            Bytes changed = good;
            changed[offset] = static_cast<std::uint8_t>(value);
            // Another type may have one byte of fields, too.
            const bool isGood = changed == good || changed == headerOf(Type::piece, 1);
            EXPECT_EQ(decodeHeader(changed).has_value(), isGood) << offset << ' ' << value;
        }
    }
}

TEST(HTTPMessages, TextsAtTheirLimits) {
    const auto text = [](std::size_t size) {
        return std::string(size, 't');
    };
    const auto request = [](std::string_view method, std::string_view link) {
        return encodeHTTPRequest({.method = method, .link = link}).has_value();
    };
    const auto header = [](std::string_view name, std::string_view value) {
        return encodeHTTPRequest({.method = "GET", .link = "l", .headers = {{name, value}}})
            .has_value();
    };
    const struct {
        const char* what;
        std::size_t least;
        std::size_t most;
        std::function<bool(std::string_view)> encodes;
    } kTexts[] = {
        {"method", 1, 16,
         [&](auto method) {
             return request(method, "l");
         }},
        {"link", 1, 65536,
         [&](auto link) {
             return request("GET", link);
         }},
        {"name", 1, 255,
         [&](auto name) {
             return header(name, "v");
         }},
        {"value", 0, 8192,
         [&](auto value) {
             return header("n", value);
         }},
        {"challenge", 1, 64,
         [](auto method) {
             return encodeHTTPChallenge({method, 0, 0, "h"}).has_value();
         }},
        {"host", 0, 255,
         [](auto host) {
             return encodeHTTPChallenge({"m", 0, 0, host}).has_value();
         }},
        {"domain", 1, 64,
         [](auto domain) {
             return encodeHTTPFailure({1, domain, "d"}).has_value();
         }},
        {"description", 0, 4096,
         [](auto description) {
             return encodeHTTPFailure({1, "d", description}).has_value();
         }},
        {"class", 0, 64,
         [](auto name) {
             return encodeHTTPResponse({1, 0, name}).has_value();
         }},
    };
    for (const auto& [what, least, most, encodes] : kTexts) {
        SCOPED_TRACE(what);
        EXPECT_EQ(encodes(""), least == 0);
        EXPECT_TRUE(encodes(text(1)));
        EXPECT_TRUE(encodes(text(most - 1)));
        EXPECT_TRUE(encodes(text(most)));
        EXPECT_FALSE(encodes(text(most + 1)));
        EXPECT_TRUE(encodes("\xc3\xa4 ~"));
        for (const char* const control : {"a\nb", "a\rb", "\t", "\x1f", "\x7f"}) {
            EXPECT_FALSE(encodes(control));
        }
        EXPECT_FALSE(encodes(std::string_view("a\0", 2)));
    }
}

TEST(HTTPMessages, NumbersOfARequestAtTheirLimits) {
    const auto encoded = [](std::size_t headers, std::uint64_t body, std::uint64_t answer) {
        HTTPRequestFields fields{
            .method = "GET", .link = "l", .bodySize = body, .maximumAnswerSize = answer};
        fields.headers.resize(headers, {"n", "v"});
        const auto message = encodeHTTPRequest(fields);
        return message && decodeHTTPRequest(fieldsOf(*message)) == fields;
    };
    EXPECT_TRUE(encoded(63, 0, 0));
    EXPECT_TRUE(encoded(64, 0, 0));
    EXPECT_FALSE(encoded(65, 0, 0));
    HTTPRequestFields many{.method = "GET", .link = "l"};
    many.headers.resize(65, {"n", "v"});
    EXPECT_FALSE(encodeHTTPRequest(many));
    EXPECT_TRUE(encoded(0, kHTTPMaxBodySize, kHTTPMaxBodySize));
    EXPECT_FALSE(encoded(0, kHTTPMaxBodySize + 1, 0));
    EXPECT_FALSE(encoded(0, 0, kHTTPMaxBodySize + 1));
    EXPECT_TRUE(encodeHTTPResponse({1, kHTTPMaxBodySize, ""}));
    EXPECT_FALSE(encodeHTTPResponse({1, kHTTPMaxBodySize + 1, ""}));
}

TEST(HTTPMessages, RequestAsAWholeAtItsLimit) {
    const std::string value(8192, 'v');
    HTTPRequestFields fields{.method = "GET", .link = "l"};
    fields.headers.resize(15, {"n", value});
    const std::size_t left = 131072 - (24 + 3 + 1) - 15 * (3 + 1 + 8192) - (3 + 1);
    for (const std::size_t size : {left - 1, left, left + 1}) {
        const std::string last(size, 'v');
        fields.headers.resize(15);
        fields.headers.emplace_back("n", last);
        const auto message = encodeHTTPRequest(fields);
        EXPECT_EQ(message.has_value(), size <= left);
        if (message) {
            EXPECT_EQ(decodeHTTPRequest(fieldsOf(*message)), fields);
        }
    }
    EXPECT_FALSE(decodeHTTPRequest(Bytes(131073)));

    // One more byte in the last header, and all lengths say so.
    const std::string last(left, 'v');
    fields.headers.back().second = last;
    Bytes message = encodeHTTPRequest(fields).value_or(Bytes{});
    ASSERT_EQ(fieldsOf(message).size(), 131072U);
    message.push_back('v');
    const std::size_t length = message.size() - (left + 1) - 1 - 2;
    message.at(length) = static_cast<std::uint8_t>((left + 1) & 0xffU);
    message.at(length + 1) = static_cast<std::uint8_t>((left + 1) >> 8U);
    EXPECT_FALSE(decodeHTTPRequest(fieldsOf(message)));
}
