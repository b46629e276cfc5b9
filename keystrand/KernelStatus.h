#pragma once

#include <cstdint>

namespace keystrand {

/// What the kernel service answers when it refuses; listed in docs/kernel-socket.md.
using KernelStatus = std::int32_t;

inline constexpr KernelStatus kKernelSuccess = 0;
inline constexpr KernelStatus kKernelMalformedRequest = -6001;
inline constexpr KernelStatus kKernelNoSuchEntry = -6002;
inline constexpr KernelStatus kKernelNotOpen = -6003;
inline constexpr KernelStatus kKernelUnknownSelector = -6004;
inline constexpr KernelStatus kKernelMalformedFrame = -6005;
inline constexpr KernelStatus kKernelUnknownCommand = -6006;
inline constexpr KernelStatus kKernelBadPayload = -6007;
inline constexpr KernelStatus kKernelReplyDoesNotFit = -6008;
inline constexpr KernelStatus kKernelTableFull = -6009;
inline constexpr KernelStatus kKernelNoSuchContext = -6010;
inline constexpr KernelStatus kKernelTooManyContexts = -6011;
inline constexpr KernelStatus kKernelTooManyCredentials = -6012;
inline constexpr KernelStatus kKernelNoSuchPolicy = -6013;
inline constexpr KernelStatus kKernelBadConstraint = -6014;

} // namespace keystrand
