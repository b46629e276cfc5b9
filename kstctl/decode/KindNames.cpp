#include "kstctl/decode/KindNames.h"

#include "base/Concat.h"
#include "kstctl/decode/Kinds.h"
#include "kstctl/decode/Payloads.h"

namespace kstctl::decode {

std::vector<std::string> kindNames() {
    std::vector<std::string> names;
    for (const Kind& kind : kinds()) {
        names.emplace_back(kind.name);
    }
    return names;
}

std::vector<std::string> commandNames() {
    std::vector<std::string> names;
    for (const CommandPayload& command : commandPayloads()) {
        names.emplace_back(command.name);
        names.push_back(base::concat(command.code));
    }
    return names;
}

} // namespace kstctl::decode
