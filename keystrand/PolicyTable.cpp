#include "keystrand/PolicyTable.h"

#include "KSTLib/RequestSerialization.h"
#include "base/Concat.h"
#include "keystrand/PolicyRequirement.h"

#include <fstream>
#include <sys/stat.h>
#include <utility>

namespace keystrand {

namespace {

bool parsePolicy(TextParser& parser, Policies& policies) {
    if (!parser.keyword("policy")) {
        return false;
    }
    const auto name = parser.word("name");
    if (!name) {
        return false;
    }
    if (name->size() > kKSTPolicyIdMaxLength) {
        parser.fail("the name is too long");
        return false;
    }
    if (policies.contains(*name)) {
        parser.fail(base::concat("there is a policy ", *name, " already"));
        return false;
    }
    if (!parser.mark('=')) {
        return false;
    }
    auto requirement = parseRequirement(parser);
    return requirement && policies.emplace(*name, std::move(*requirement)).second;
}

/// The whole file, or none when it cannot be read or has more than `limit` bytes.
std::optional<std::string> readFile(const std::string& path, std::size_t limit) {
    struct stat about {};
    if (::stat(path.c_str(), &about) != 0 || !S_ISREG(about.st_mode)) {
        return std::nullopt;
    }
    std::ifstream file(path, std::ios::binary);
    std::string text(limit + 1, '\0');
    file.read(text.data(), static_cast<std::streamsize>(text.size()));
    if (file.bad() || !file.eof()) {
        return std::nullopt;
    }
    text.resize(static_cast<std::size_t>(file.gcount()));
    return text;
}

} // namespace

std::optional<Policies> parsePolicies(TextParser& parser) {
    Policies policies;
    while (!parser.atEnd()) {
        if (policies.size() == kMaxPolicies) {
            parser.fail("too many policies");
            return std::nullopt;
        }
        if (!parsePolicy(parser, policies)) {
            return std::nullopt;
        }
    }
    return policies;
}

std::optional<std::string> PolicyTable::load(const std::string& path) {
    const auto text = readFile(path, kMaxFileSize);
    if (!text) {
        return base::concat(path, ": cannot be read, or is too large");
    }
    TextParser parser(*text);
    auto policies = parsePolicies(parser);
    if (!policies) {
        return base::concat(path, ':', parser.error()->line, ": ", parser.error()->reason);
    }
    policies_ = std::move(*policies);
    path_ = path;
    return std::nullopt;
}

std::optional<std::string> PolicyTable::reload() {
    if (path_.empty()) {
        return "no file was loaded";
    }
    const std::string path = path_;
    return load(path);
}

const PolicyRequirement* PolicyTable::find(std::string_view name) const {
    const auto found = policies_.find(name);
    return found == policies_.end() ? nullptr : &found->second;
}

} // namespace keystrand
