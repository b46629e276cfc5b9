#include "platform/linux/HTTPSClient.h"

#include "base/Concat.h"
#include "platform/HTTPSession.h"
#include "platform/linux/LocalConnection.h"

#include <string_view>
#include <sys/socket.h>
#include <system_error>

namespace platform {

namespace {

Error unreachable(std::string_view path, std::string_view reason) {
    return {kTransportErrorDomain, kCannotConnect,
            base::concat("cannot connect: no HTTPS client at ", path, ": ", reason)};
}

std::string wordsFor(int error) {
    return std::generic_category().message(error);
}

} // namespace

Result<HTTPSClient> HTTPSClient::reach(const RemoteHTTPOptions& options) {
    return options.program.empty() ? connect(options) : start(options);
}

Result<HTTPSClient> HTTPSClient::start(const RemoteHTTPOptions& options) {
    int error = 0;
    auto program = ConnectedProgram::start(options.program, error);
    if (!program) {
        return unreachable(options.program.front(), wordsFor(error));
    }
    wire::HTTPConnection connection(program->takeConnection(), options.silenceLimit,
                                    options.stopDescriptor());
    return HTTPSClient(std::move(program), std::move(connection));
}

Result<HTTPSClient> HTTPSClient::connect(const RemoteHTTPOptions& options) {
    LocalConnection reached = connectLocally(options.socket, SOCK_STREAM, options.silenceLimit);
    if (reached.stranger) {
        return unreachable(options.socket,
                           base::concat("it is served by user ", *reached.stranger));
    }
    if (reached.error != 0) {
        return unreachable(options.socket, wordsFor(reached.error));
    }
    return HTTPSClient(std::nullopt,
                       wire::HTTPConnection(std::move(reached.socket), options.silenceLimit,
                                            options.stopDescriptor()));
}

} // namespace platform
