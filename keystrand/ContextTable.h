#pragma once

#include "KSTLib/Contexts.h"
#include "keystrand/CredentialSet.h"
#include "keystrand/NumberedValues.h"

#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <string>

namespace keystrand {

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
