#pragma once

#include "KSTLib/Command.h"
#include "KSTLib/Contexts.h"
#include "keystrand/CredentialSet.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace keystrand {

/// Values of up to 64 bytes under numbers: the service's environment variables, the properties of a
/// context.
class NumberedValues {
  public:
    static constexpr std::size_t kMaxCount = 64;
    static constexpr std::size_t kMaxValueSize = kKSTEnvironmentVariableMaxSize;

    /// Sets a value; an empty one is removed. False, with nothing changed, when the value is too
    /// long or would be one too many.
    [[nodiscard]] bool set(std::uint32_t id, std::span<const std::uint8_t> value);

    /// The value, empty when it is not set. Valid until the next `set`.
    [[nodiscard]] std::span<const std::uint8_t> get(std::uint32_t id) const;

    [[nodiscard]] std::size_t count() const { return values_.size(); }

  private:
    std::map<std::uint32_t, std::vector<std::uint8_t>> values_;
};

/// Where the names of new contexts come from; none when there are none to be had.
using HandleSource = std::function<std::optional<KSTHandle>()>;

/// 16 bytes that nobody can guess.
[[nodiscard]] std::optional<KSTHandle> randomHandle();

/// Whether the handle is the one that stands for no context.
[[nodiscard]] bool isNoHandle(const KSTHandle& handle);

[[nodiscard]] std::string toHex(const KSTHandle& handle);

/// Handles by their bytes.
struct HandleOrder {
    [[nodiscard]] bool operator()(const KSTHandle& left, const KSTHandle& right) const;
};

struct Context {
    CredentialSet credentials;
    NumberedValues properties;
};

/// The contexts of all clients by their handles. A context lasts until it is destroyed, whoever
/// made it.
class ContextTable {
  public:
    static constexpr std::size_t kMaxCount = 256;
    using Contexts = std::map<KSTHandle, Context, HandleOrder>;

    explicit ContextTable(HandleSource handles = randomHandle);

    /// Makes an empty context. None when it would be one too many, or when no handle that is free
    /// can be had.
    [[nodiscard]] std::optional<KSTHandle> create();

    /// False when there is no such context.
    [[nodiscard]] bool destroy(const KSTHandle& handle);

    /// Null when there is no such context. Valid until it is destroyed.
    [[nodiscard]] Context* find(const KSTHandle& handle);

    [[nodiscard]] const Contexts& all() const { return contexts_; }

  private:
    HandleSource handles_;
    Contexts contexts_;
};

} // namespace keystrand
