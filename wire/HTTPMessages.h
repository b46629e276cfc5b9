#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

/// The messages between the daemon and the HTTPS client, a program of its own: one connection is
/// one request. The layout and the order are described in docs/https-process.md.
namespace wire {

inline constexpr char kHTTPMagic[4] = {'K', 'S', 'T', 'H'};
inline constexpr std::uint8_t kHTTPVersion = 1;
inline constexpr std::size_t kHTTPHeaderSize = 4 + 1 + 1 + 2 + 4;

/// Where the client finds its connection: the first descriptor of socket activation.
inline constexpr int kHTTPConnectionDescriptor = 3;

inline constexpr std::size_t kHTTPMaxMethodLength = 16;
inline constexpr std::size_t kHTTPMaxLinkLength = 64UL * 1024;
inline constexpr std::size_t kHTTPMaxHeaders = 64;
inline constexpr std::size_t kHTTPMaxHeaderNameLength = 255;
inline constexpr std::size_t kHTTPMaxHeaderValueLength = 8192;
inline constexpr std::size_t kHTTPMaxChallengeMethodLength = 64;
inline constexpr std::size_t kHTTPMaxHostLength = 255;
inline constexpr std::size_t kHTTPMaxDomainLength = 64;
inline constexpr std::size_t kHTTPMaxDescriptionLength = 4096;
inline constexpr std::size_t kHTTPMaxClassNameLength = 64;
/// Of a body, and of an answer that may be asked for.
inline constexpr std::uint64_t kHTTPMaxBodySize = std::uint64_t{1} << 40U;
/// The most bytes of a body in one message.
inline constexpr std::size_t kHTTPMaxPieceSize = 64UL * 1024;

/// What stands before the texts of a message's fields.
inline constexpr std::size_t kHTTPRequestFixedSize = 1 + 1 + 2 + 4 + 8 + 8;
inline constexpr std::size_t kHTTPRequestHeaderFixedSize = 1 + 2;
inline constexpr std::size_t kHTTPChallengeFixedSize = 1 + 1 + 4 + 4;
inline constexpr std::size_t kHTTPFailureFixedSize = 8 + 1 + 2;
inline constexpr std::size_t kHTTPResponseFixedSize = 1 + 4 + 8 + 1;

/// The most that the fields of any message take.
inline constexpr std::size_t kHTTPMaxFieldsSize = 128UL * 1024;

enum class HTTPMessageType : std::uint8_t {
    /// From the daemon.
    request = 1,
    verdict = 2,
    /// From either side: bytes of a body, of the request or of the answer.
    piece = 3,
    /// From the client.
    challenge = 4,
    bodyWanted = 5,
    working = 6,
    failure = 7,
    response = 8,
};

struct HTTPHeader {
    HTTPMessageType type = HTTPMessageType::request;
    /// Of what follows the header.
    std::uint32_t size = 0;

    friend bool operator==(const HTTPHeader&, const HTTPHeader&) = default;
};

using HTTPHeaderBytes = std::array<std::uint8_t, kHTTPHeaderSize>;
using HTTPMessageBytes = std::vector<std::uint8_t>;

// The fields of the messages. Decoded views point into the message.

struct HTTPRequestFields {
    /// "GET" or "POST"; the client knows no other.
    std::string_view method;
    std::string_view link;
    std::vector<std::pair<std::string_view, std::string_view>> headers = {};
    std::uint64_t bodySize = 0;
    std::uint64_t maximumAnswerSize = 0;
    /// Whether challenges are to be asked about.
    bool hasDelegate = false;

    friend bool operator==(const HTTPRequestFields&, const HTTPRequestFields&) = default;
};

struct HTTPChallengeFields {
    std::string_view method;
    std::uint32_t previousFailureCount = 0;
    /// How the evaluation of the server's certificate ended; 0 where there is none.
    std::uint32_t evaluation = 0;
    std::string_view host;

    friend bool operator==(const HTTPChallengeFields&, const HTTPChallengeFields&) = default;
};

enum class HTTPVerdict : std::uint8_t {
    accept = 1,
    /// Trust what the evaluation trusts.
    leaveToEvaluation = 2,
    refuse = 3,
};

struct HTTPFailureFields {
    std::int64_t code = 0;
    std::string_view domain;
    std::string_view description;

    friend bool operator==(const HTTPFailureFields&, const HTTPFailureFields&) = default;
};

/// The body follows in pieces.
struct HTTPResponseFields {
    /// None when what answered did not speak HTTP.
    std::optional<std::int32_t> status;
    std::uint64_t bodySize = 0;
    std::string_view className;

    friend bool operator==(const HTTPResponseFields&, const HTTPResponseFields&) = default;
};

[[nodiscard]] HTTPHeaderBytes encodeHTTPHeader(const HTTPHeader& header);
/// The header of a message, or none when it has another magic or version, an unknown type, reserved
/// bytes that are not zero, or more behind it than a message of its type can have.
[[nodiscard]] std::optional<HTTPHeader>
decodeHTTPHeader(std::span<const std::uint8_t, kHTTPHeaderSize> bytes);

/// Whole messages. None when something in them is longer than it may be, empty although it may not
/// be, or no text of a single line.
[[nodiscard]] std::optional<HTTPMessageBytes> encodeHTTPRequest(const HTTPRequestFields& fields);
[[nodiscard]] std::optional<HTTPMessageBytes>
encodeHTTPChallenge(const HTTPChallengeFields& fields);
[[nodiscard]] HTTPMessageBytes encodeHTTPVerdict(HTTPVerdict verdict);
/// `most` is 1 or more.
[[nodiscard]] HTTPMessageBytes encodeHTTPBodyWanted(std::uint32_t most);
[[nodiscard]] HTTPMessageBytes encodeHTTPWorking();
[[nodiscard]] std::optional<HTTPMessageBytes> encodeHTTPFailure(const HTTPFailureFields& fields);
[[nodiscard]] std::optional<HTTPMessageBytes> encodeHTTPResponse(const HTTPResponseFields& fields);

/// What follows the header of a message of that type, or none when no encoder gives it.
[[nodiscard]] std::optional<HTTPRequestFields>
decodeHTTPRequest(std::span<const std::uint8_t> fields);
[[nodiscard]] std::optional<HTTPChallengeFields>
decodeHTTPChallenge(std::span<const std::uint8_t> fields);
[[nodiscard]] std::optional<HTTPVerdict> decodeHTTPVerdict(std::span<const std::uint8_t> fields);
[[nodiscard]] std::optional<std::uint32_t>
decodeHTTPBodyWanted(std::span<const std::uint8_t> fields);
[[nodiscard]] std::optional<HTTPFailureFields>
decodeHTTPFailure(std::span<const std::uint8_t> fields);
[[nodiscard]] std::optional<HTTPResponseFields>
decodeHTTPResponse(std::span<const std::uint8_t> fields);

} // namespace wire
