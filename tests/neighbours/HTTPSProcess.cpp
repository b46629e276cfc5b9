#include "tests/neighbours/HTTPSProcess.h"

#include "base/Concat.h"
#include "base/UnixAddress.h"

#include <algorithm>
#include <array>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace neighbours {

namespace {

using Type = wire::HTTPMessageType;

constexpr char kTransport[] = "transport";
constexpr std::uint32_t kLargestPiece = 65536;

Bytes pieceOf(std::span<const std::uint8_t> content) {
    const auto header =
        wire::encodeHTTPHeader({Type::piece, static_cast<std::uint32_t>(content.size())});
    Bytes message(header.begin(), header.end());
    append(message, content);
    return message;
}

Bytes response(std::int32_t status, std::uint64_t bodySize) {
    return wire::encodeHTTPResponse({status, bodySize, "HTTPResponse"}).value();
}

bool isAcceptance(const Bytes& message) {
    if (message.size() < wire::kHTTPHeaderSize || message[5] != static_cast<int>(Type::response)) {
        return false;
    }
    const auto fields = wire::decodeHTTPResponse(std::span(message).subspan(wire::kHTTPHeaderSize));
    // One that was changed may still come out as one.
    return !fields || (fields->status && *fields->status >= 200 && *fields->status <= 299);
}

} // namespace

HTTPSProcess::HTTPSProcess(const std::string& path)
    : listener_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
    const auto address = base::UnixAddress::of(path);
    require(address && ::bind(listener_.get(), address->get(), address->size()) == 0 &&
                ::listen(listener_.get(), 16) == 0,
            "cannot listen on " + path);
}

void HTTPSProcess::beHostile(Random* ideas, std::size_t silences) {
    ideas_ = ideas;
    silences_ = silences;
}

void HTTPSProcess::addTo(std::vector<pollfd>& watched) const {
    watched.push_back({listener_.get(), POLLIN, 0});
    for (const Connection& connection : connections_) {
        const short more = connection.output.empty() ? 0 : POLLOUT;
        watched.push_back({connection.socket.get(), static_cast<short>(POLLIN | more), 0});
    }
}

void HTTPSProcess::serve(const std::vector<pollfd>& watched) {
    const auto eventsOf = [&watched](int descriptor) {
        const auto found = std::find_if(watched.begin(), watched.end(),
                                        [&](const pollfd& one) { return one.fd == descriptor; });
        return found != watched.end() ? found->revents : short{0};
    };
    std::erase_if(connections_, [&](Connection& connection) {
        const short events = eventsOf(connection.socket.get());
        return events != 0 && !serve(connection, events);
    });
    if (eventsOf(listener_.get()) != 0) {
        accept();
    }
}

void HTTPSProcess::accept() {
    base::FileDescriptor socket(
        ::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!socket.isOpen() || (ideas_ != nullptr && ideas_->oneIn(60))) {
        return;
    }
    connections_.push_back({std::move(socket)});
    Connection& connection = connections_.back();
    if (ideas_ != nullptr && ideas_->oneIn(40)) {
        // It does not even wait for the request.
        connection.output = ideas_->bytes(ideas_->length(100));
        connection.hangsUp = true;
    }
}

bool HTTPSProcess::serve(Connection& connection, short events) {
    if ((events & (POLLIN | POLLHUP)) != 0 && !receive(connection)) {
        return false;
    }
    advance(connection);
    return flush(connection);
}

bool HTTPSProcess::receive(Connection& connection) {
    std::array<std::uint8_t, 65536> buffer;
    const ssize_t length = ::recv(connection.socket.get(), buffer.data(), buffer.size(), 0);
    if (length <= 0) {
        return length < 0 && (errno == EAGAIN || errno == EINTR);
    }
    append(connection.input, std::span(buffer).first(static_cast<std::size_t>(length)));
    takeMessages(connection);
    return true;
}

void HTTPSProcess::takeMessages(Connection& connection) {
    std::span<const std::uint8_t> left(connection.input);
    while (left.size() >= wire::kHTTPHeaderSize) {
        const auto header = wire::decodeHTTPHeader(left.first<wire::kHTTPHeaderSize>());
        require(header.has_value(), "a message to the HTTPS process without a header");
        if (left.size() < wire::kHTTPHeaderSize + header->size) {
            break;
        }
        const auto fields = left.subspan(wire::kHTTPHeaderSize, header->size);
        left = left.subspan(wire::kHTTPHeaderSize + header->size);
        connection.awaitsAnswer = false;
        if (!std::exchange(connection.hasRequest, true)) {
            const auto request = wire::decodeHTTPRequest(fields);
            require(header->type == Type::request && request.has_value(), "a malformed request");
            begin(connection, *request);
        } else if (header->type == Type::piece) {
            connection.bodyLeft -= std::min<std::uint64_t>(connection.bodyLeft, fields.size());
            countEvents(connection, fields);
        } else {
            require(header->type == Type::verdict && wire::decodeHTTPVerdict(fields).has_value(),
                    "neither a piece nor a verdict");
        }
    }
    connection.input.erase(connection.input.begin(),
                           connection.input.end() - static_cast<std::ptrdiff_t>(left.size()));
}

void HTTPSProcess::countEvents(Connection& connection, std::span<const std::uint8_t> piece) {
    constexpr std::string_view kName = "\"eventType\":";
    constexpr std::string_view kSummary = "\"accumulatedPolicyStats\"";
    std::string& text = connection.tail;
    text.append(reinterpret_cast<const char*>(piece.data()), piece.size());
    for (auto at = text.find(kName); at != std::string::npos; at = text.find(kName)) {
        if (text.size() < at + kName.size() + kSummary.size() && connection.bodyLeft > 0) {
            break;
        }
        text.erase(0, at + kName.size());
        events_ += text.starts_with(kSummary) ? 0U : 1U;
    }
    const std::size_t kept = kName.size() + kSummary.size();
    text.erase(0, text.size() - std::min(text.size(), kept));
}

void HTTPSProcess::begin(Connection& connection, const wire::HTTPRequestFields& request) {
    connection.bodyLeft = request.bodySize;
    if (connection.hangsUp) {
        // It has said everything already.
        return;
    }
    if (ideas_ == nullptr || ideas_->oneIn(4)) {
        planAcceptance(connection, request);
    } else {
        planHostility(connection, request);
    }
}

/// By the rules to the end, though perhaps not as anybody would do it.
void HTTPSProcess::planAcceptance(Connection& connection, const wire::HTTPRequestFields& request) {
    const auto some = [this](std::size_t most) {
        return ideas_ != nullptr ? ideas_->below(most + 1) : 0;
    };
    for (std::size_t left = some(3); left > 0; --left) {
        connection.steps.push_back({wire::encodeHTTPWorking()});
    }
    for (std::size_t left = request.hasDelegate ? some(4) : 0; left > 0; --left) {
        connection.steps.push_back(
            {wire::encodeHTTPChallenge({"ServerTrust", static_cast<std::uint32_t>(some(5)), 5,
                                        std::string(some(255), 'h')})
                 .value(),
             true});
    }
    connection.asksForBody = request.bodySize > 0;
    appendAnswer(connection.steps, request);
}

void HTTPSProcess::appendAnswer(std::deque<Step>& steps, const wire::HTTPRequestFields& request) {
    if (request.method == "POST") {
        ++accepted_;
        steps.push_back({response(200, 0)});
        return;
    }
    const std::string content = bag();
    Bytes bytes;
    append(bytes, std::string_view(content));
    steps.push_back({response(200, bytes.size())});
    std::span<const std::uint8_t> left(bytes);
    while (!left.empty()) {
        const std::size_t most =
            ideas_ != nullptr && ideas_->oneIn(4) ? 1 + ideas_->below(50) : kLargestPiece;
        const auto piece = left.first(std::min(left.size(), most));
        steps.push_back({pieceOf(piece)});
        left = left.subspan(piece.size());
    }
}

/// A number of messages in any order, some of them broken, said in one go or after the answers.
void HTTPSProcess::planHostility(Connection& connection, const wire::HTTPRequestFields& request) {
    Random& random = *ideas_;
    bool waits = random.oneIn(2);
    for (std::size_t count = random.below(10); count > 0; --count) {
        Bytes message = anyMessage(request);
        const bool isWellFormed = !random.oneIn(6);
        const bool isQuestion = isWellFormed && waits &&
                                (message[5] == static_cast<int>(Type::challenge) ||
                                 message[5] == static_cast<int>(Type::bodyWanted));
        if (!isWellFormed) {
            mutate(random, message);
            // The daemon may wait for the rest of it.
            waits = false;
        }
        connection.steps.push_back({std::move(message), isQuestion});
    }
    if (request.method == "GET" && random.oneIn(2)) {
        appendAnswer(connection.steps, request);
        mutate(random, connection.steps.back().message);
    }
    connection.isSlow = random.oneIn(30);
    connection.hangsUp = true;
    if (silences_ > 0 && random.oneIn(100)) {
        --silences_;
        connection.hangsUp = false;
    }
    const bool mayBeAccepted =
        request.method == "POST" &&
        std::any_of(connection.steps.begin(), connection.steps.end(), [](const Step& step) {
            return isAcceptance(step.message) || step.message.size() < wire::kHTTPHeaderSize;
        });
    unclear_ += mayBeAccepted ? 1 : 0;
}

Bytes HTTPSProcess::anyMessage(const wire::HTTPRequestFields& request) {
    Random& random = *ideas_;
    switch (random.below(9)) {
    case 0:
        return wire::encodeHTTPWorking();
    case 1:
    case 2:
        return wire::encodeHTTPChallenge(
                   {random.oneIn(2) ? "ServerTrust" : "Basic",
                    static_cast<std::uint32_t>(random.number()),
                    static_cast<std::uint32_t>(random.oneIn(2) ? random.below(8) : random.number()),
                    std::string(random.below(256), '.')})
            .value();
    case 3:
    case 4:
        return wire::encodeHTTPBodyWanted(static_cast<std::uint32_t>(random.number() | 1U));
    case 5: {
        std::string description = random.text(random.length(4096));
        for (char& character : description) {
            const auto byte = static_cast<unsigned char>(character);
            character = byte < 0x20 || byte == 0x7f ? '.' : character;
        }
        return wire::encodeHTTPFailure(
                   {static_cast<std::int64_t>(random.oneIn(3) ? random.number() : random.below(8)),
                    random.oneIn(4) ? "elsewhere" : kTransport, description})
            .value();
    }
    case 6: {
        const std::int32_t statuses[] = {100, 199, 200, 204, 299, 300, 404, 500, -1, 2147483647};
        const std::uint64_t sizes[] = {0, 1, 1048576, 1048577, wire::kHTTPMaxBodySize};
        return wire::encodeHTTPResponse(
                   {random.oneIn(8) ? std::optional<std::int32_t>() : random.of(statuses),
                    random.of(sizes), std::string(random.below(65), 'c')})
            .value();
    }
    case 7:
        return pieceOf(random.bytes(1 + random.length(3000)));
    default:
        // What only the daemon says.
        return random.oneIn(2) ? wire::encodeHTTPVerdict(wire::HTTPVerdict::accept)
                               : wire::encodeHTTPRequest(request).value();
    }
}

/// What the server's switches could be. Those after which the daemon keeps no events come only when
/// they may.
std::string HTTPSProcess::bag() {
    if (ideas_ == nullptr) {
        return "{}";
    }
    Random& random = *ideas_;
    if (random.oneIn(30)) {
        return std::string(1 + random.below(200), '[') + std::string(random.below(200), ']');
    }
    static constexpr const char* kValues[] = {"true",
                                              "false",
                                              "null",
                                              "0",
                                              "-1",
                                              "1000",
                                              "999",
                                              "18446744073709551615",
                                              "1e400",
                                              "3.5",
                                              "\"\"",
                                              "\"https://host.example/u\"",
                                              "\"http://host.example/u\"",
                                              "\"https://u@h/\"",
                                              "[]",
                                              "[1,2]",
                                              "[\"eventField\"]",
                                              "{}",
                                              "{\"a\":{\"b\":[1,2.5,\"c\",true]}}",
                                              "{\"eventVersion\":7}",
                                              "\"\\u0000\\ud800\"",
                                              "\"\xff\""};
    static constexpr const char* kKeys[] = {"postFrequency", "blacklistedFields", "metricsUrl",
                                            "sendDisabled",  "anything",          "metricsUrl"};
    static constexpr const char* kPoisons[] = {
        "\"disabled\":true", "\"blacklistedEvents\":[\"policy\",\"timerRestarted\"]",
        "\"metricsBase\":{\"a\":null}", "\"metricsBase\":{\"eventType\":[[[[]]]]}"};
    std::string text = "{";
    for (std::size_t count = random.below(6); count > 0; --count) {
        text += base::concat("\"", random.of(kKeys), "\":", random.of(kValues), ",");
    }
    text += mayPoison_ ? random.of(kPoisons) : "\"end\":1";
    if (random.oneIn(400)) {
        text += ",\"long\":\"" + std::string((1U << 20U) - random.below(200), 'x') + "\"";
    }
    return text + "}";
}

void HTTPSProcess::advance(Connection& connection) {
    while (connection.hasRequest && !connection.awaitsAnswer) {
        const bool isAnswerNext = connection.steps.empty() || !connection.steps.front().isQuestion;
        if (connection.asksForBody && connection.bodyLeft > 0 && isAnswerNext) {
            append(connection.output, std::span<const std::uint8_t>(wire::encodeHTTPBodyWanted(
                                          ideas_ != nullptr && ideas_->oneIn(3)
                                              ? static_cast<std::uint32_t>(1 + ideas_->below(5000))
                                              : kLargestPiece)));
            connection.awaitsAnswer = true;
            ++exchanges_;
            return;
        }
        if (connection.steps.empty()) {
            return;
        }
        append(connection.output, std::span<const std::uint8_t>(connection.steps.front().message));
        connection.awaitsAnswer = connection.steps.front().isQuestion;
        connection.steps.pop_front();
        ++exchanges_;
    }
}

/// False when the connection is over.
bool HTTPSProcess::flush(Connection& connection) {
    while (!connection.output.empty()) {
        const std::size_t most =
            connection.isSlow ? 1 + ideas_->below(20) : connection.output.size();
        const ssize_t sent =
            ::send(connection.socket.get(), connection.output.data(),
                   std::min(most, connection.output.size()), MSG_NOSIGNAL | MSG_DONTWAIT);
        if (sent < 0) {
            return errno == EAGAIN || errno == EINTR;
        }
        connection.output.erase(connection.output.begin(), connection.output.begin() + sent);
    }
    const bool hasSaidAll = connection.steps.empty() && !connection.awaitsAnswer;
    return !(connection.hangsUp && hasSaidAll);
}

} // namespace neighbours
