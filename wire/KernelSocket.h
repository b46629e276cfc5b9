#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

/// The messages on the kernel service's socket: a request, then its reply, each one packet of a
/// SOCK_SEQPACKET connection. The layout is described in docs/kernel-socket.md.
namespace wire {

inline constexpr char kKernelRequestMagic[4] = {'K', 'S', 'T', 'Q'};
inline constexpr char kKernelReplyMagic[4] = {'K', 'S', 'T', 'R'};
inline constexpr std::uint8_t kKernelSocketVersion = 1;
inline constexpr std::size_t kKernelRequestHeaderSize = 4 + 1 + 1 + 2 + 8;
inline constexpr std::size_t kKernelReplyHeaderSize = 4 + 1 + 1 + 2 + 8 + 4 + 4;

/// The largest request or reply, header included.
inline constexpr std::size_t kKernelMessageMaxSize = 131072;
inline constexpr std::size_t kKernelMaxPathLength = 1024;
inline constexpr std::size_t kKernelMaxNameLength = 255;
inline constexpr std::size_t kKernelMaxScalars = 16;

enum class KernelOperation : std::uint8_t {
    findByPath = 1,
    findByClassName = 2,
    copyProperty = 3,
    open = 4,
    structCall = 5,
    scalarCall = 6,
};

/// The head of a reply. `reported` means: found or not (1, 0), property present or absent (1, 0),
/// the size of a struct call's output, the number of a scalar call's outputs.
struct KernelReplyHeader {
    KernelOperation operation = KernelOperation::findByPath;
    std::uint64_t sequence = 0;
    std::int32_t status = 0;
    std::uint32_t reported = 0;
};

struct KernelRequestHeader {
    KernelOperation operation = KernelOperation::findByPath;
    std::uint64_t sequence = 0;
};

using KernelRequestHeaderBytes = std::array<std::uint8_t, kKernelRequestHeaderSize>;
using KernelReplyHeaderBytes = std::array<std::uint8_t, kKernelReplyHeaderSize>;

[[nodiscard]] KernelRequestHeaderBytes encodeKernelRequestHeader(const KernelRequestHeader& header);
[[nodiscard]] KernelReplyHeaderBytes encodeKernelReplyHeader(const KernelReplyHeader& header);

/// The header at the start of `message`, or none when it is too short, has another magic, version
/// or an unknown operation. The reserved bytes of a request must be zero; those of a reply are not
/// looked at.
[[nodiscard]] std::optional<KernelRequestHeader>
decodeKernelRequestHeader(std::span<const std::uint8_t> message);
[[nodiscard]] std::optional<KernelReplyHeader>
decodeKernelReplyHeader(std::span<const std::uint8_t> message);

/// The parts of a request's body, for the operations that have more than one text in it. The views
/// point into the message.
struct KernelPropertyRequest {
    std::string_view path;
    std::string_view name;
};
struct KernelOpenRequest {
    std::uint32_t connectionType = 0;
    std::string_view path;
};
struct KernelStructRequest {
    std::uint32_t selector = 0;
    std::uint32_t offeredSize = 0;
    std::span<const std::uint8_t> input;
};
struct KernelScalarRequest {
    std::uint32_t selector = 0;
    std::uint32_t offeredCount = 0;
    std::vector<std::uint64_t> inputs;
};

/// What stands in a body before its variable part, which is sent from where it lies.
using KernelPropertyPrefixBytes = std::array<std::uint8_t, 2>;
using KernelOpenPrefixBytes = std::array<std::uint8_t, 4>;
inline constexpr std::size_t kKernelStructPrefixSize = 4 + 4;
using KernelStructPrefixBytes = std::array<std::uint8_t, kKernelStructPrefixSize>;
using KernelScalarPrefixBytes = std::array<std::uint8_t, 4 + 4 + 4>;
using KernelScalarBytes = std::array<std::uint8_t, 8 * kKernelMaxScalars>;

[[nodiscard]] KernelPropertyPrefixBytes encodeKernelPropertyPrefix(std::size_t pathLength);
[[nodiscard]] KernelOpenPrefixBytes encodeKernelOpenPrefix(std::uint32_t connectionType);
[[nodiscard]] KernelStructPrefixBytes encodeKernelStructPrefix(std::uint32_t selector,
                                                               std::uint32_t offeredSize);
[[nodiscard]] KernelScalarPrefixBytes encodeKernelScalarPrefix(std::uint32_t selector,
                                                               std::uint32_t offeredCount,
                                                               std::uint32_t inputCount);

/// The bytes of at most kKernelMaxScalars numbers; of what is not there they are zero.
[[nodiscard]] KernelScalarBytes encodeKernelScalars(std::span<const std::uint64_t> scalars);

/// The parts of `body` (what follows the header), or none when it is malformed: a length that does
/// not fit, an empty or overlong text, more than kKernelMaxScalars scalars, bytes left over.
[[nodiscard]] std::optional<std::string_view>
decodeKernelFindByPath(std::span<const std::uint8_t> body);
[[nodiscard]] std::optional<std::string_view>
decodeKernelFindByClassName(std::span<const std::uint8_t> body);
[[nodiscard]] std::optional<KernelPropertyRequest>
decodeKernelProperty(std::span<const std::uint8_t> body);
[[nodiscard]] std::optional<KernelOpenRequest> decodeKernelOpen(std::span<const std::uint8_t> body);
[[nodiscard]] std::optional<KernelStructRequest>
decodeKernelStruct(std::span<const std::uint8_t> body);
[[nodiscard]] std::optional<KernelScalarRequest>
decodeKernelScalar(std::span<const std::uint8_t> body);

/// Reads the scalars of a reply or request: `bytes` must hold exactly as many as `scalars` has room
/// for, kKernelMaxScalars at most. False, with nothing read, when they do not.
[[nodiscard]] bool decodeKernelScalars(std::span<const std::uint8_t> bytes,
                                       std::span<std::uint64_t> scalars);

} // namespace wire
