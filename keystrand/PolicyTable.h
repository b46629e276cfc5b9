#pragma once

#include "keystrand/PolicyRequirement.h"
#include "keystrand/TextParser.h"

#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace keystrand {

/// Policies by their names.
using Policies = std::map<std::string, PolicyRequirement, std::less<>>;

inline constexpr std::size_t kMaxPolicies = 256;

/// Takes a text of policies:
///
///     text = { "policy" name "=" requirement }
///
/// None, with the parser's error set, when something else is there; when a name is longer than
/// kKSTPolicyIdMaxLength or there twice; or when there are too many.
[[nodiscard]] std::optional<Policies> parsePolicies(TextParser& parser);

/// The policies that the service knows, and the file that they come from.
class PolicyTable {
  public:
    static constexpr std::size_t kMaxFileSize = std::size_t{256} * 1024;

    /// Takes the policies of a file in the place of those that are there. On failure these stay,
    /// and a reason is returned: the file, the line if one is to blame, and what is wrong.
    [[nodiscard]] std::optional<std::string> load(const std::string& path);
    /// `load` from the file that was last loaded.
    [[nodiscard]] std::optional<std::string> reload();

    void set(Policies policies) { policies_ = std::move(policies); }

    /// Null when there is no such policy. Valid until the next change.
    [[nodiscard]] const PolicyRequirement* find(std::string_view name) const;

    [[nodiscard]] const Policies& all() const { return policies_; }

  private:
    std::string path_;
    Policies policies_;
};

} // namespace keystrand
