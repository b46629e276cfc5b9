#include "kstctl/CommandLine.h"

#include "base/Concat.h"
#include "base/Digits.h"
#include "kstctl/Output.h"
#include "kstctl/commands/Inputs.h"
#include "kstctl/decode/Kinds.h"
#include "wire/GateMessages.h"

#include <CLI/CLI.hpp>

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <limits>
#include <memory>
#include <string>
#include <system_error>

namespace kstctl {

namespace {

constexpr std::int64_t kLongestPatience = 3'600'000;
/// The end of the year 9999.
constexpr double kLatestPostTime = 253'402'300'800'000.0;

constexpr std::int64_t kSmallest = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kLargest = std::numeric_limits<std::int64_t>::max();

/// A word that is wholly a number from `least` to `greatest`, in decimal digits.
template <typename Number>
CLI::Validator numberBetween(Number least, Number greatest) {
    return CLI::Validator(
        [least, greatest](std::string& word) {
            Number number{};
            const char* const end = word.data() + word.size();
            const auto result = std::from_chars(word.data(), end, number);
            if (result.ec == std::errc() && result.ptr == end && number >= least &&
                number <= greatest) {
                // The parser would take some words for octal numbers.
                word = std::to_string(number);
                return std::string();
            }
            return base::concat("Value ", word, " not in range ", std::to_string(least), " to ",
                                std::to_string(greatest));
        },
        "");
}

bool isNumber(const std::string& word) {
    return base::parseNumber<std::uint32_t>(word).has_value();
}

/// A word like "10min", which becomes the number of seconds.
CLI::Validator timeSpan(std::uint32_t greatest) {
    return CLI::Validator(
        [greatest](std::string& word) {
            const std::size_t unitStart =
                std::min(word.find_first_not_of("0123456789"), word.size());
            const std::string unit = word.substr(unitStart);
            const auto count = base::parseNumber<std::uint32_t>(word.substr(0, unitStart));
            std::uint32_t factor = 0;
            if (unit == "s" || word == "0") {
                factor = 1;
            } else if (unit == "min") {
                factor = 60;
            } else if (unit == "h") {
                factor = 3600;
            }
            if (unitStart == 0 || factor == 0) {
                return base::concat("Value ", word, " is no time such as 30s, 10min or 2h");
            }
            if (!count || *count > greatest / factor) {
                return base::concat("Value ", word, " is longer than ", greatest / 3600, "h");
            }
            word = std::to_string(*count * factor);
            return std::string();
        },
        "");
}

/// A chain of ports behind a bus: "1-2.3".
CLI::Validator port() {
    return CLI::Validator(
        [](std::string& word) {
            const std::size_t hyphen = word.find('-');
            bool isPort = hyphen != std::string::npos && isNumber(word.substr(0, hyphen));
            for (std::size_t start = hyphen; isPort && start < word.size();) {
                const std::size_t end = std::min(word.find('.', start + 1), word.size());
                isPort = isNumber(word.substr(start + 1, end - start - 1));
                start = end;
            }
            return isPort ? std::string()
                          : base::concat("Value ", word, " is no port such as 1-2 or 1-2.3");
        },
        "");
}

CLI::App* addCommand(CLI::App& parent, const char* name, const char* description) {
    CLI::App* const command = parent.add_subcommand(name, description);
    command->fallthrough();
    return command;
}

/// Makes the command the one to run when it is given, with what its options have filled.
template <typename Command>
Command& chosenBy(CLI::App* app, CommandLine& options) {
    const auto command = std::make_shared<Command>();
    app->final_callback([command, &options] { options.command = *command; });
    return *command;
}

void addEvents(CLI::App& app, CommandLine& options) {
    CLI::App* const events = addCommand(app, "events", "The events that wait for upload");
    events->require_subcommand(1);

    CLI::App* const list = addCommand(*events, "list", "A table of them");
    auto& listing = chosenBy<EventsListCommand>(list, options);
    list->add_option("--limit", listing.limit, "Only the last so many")
        ->transform(numberBetween<std::int64_t>(0, kLargest));
    list->add_option("--type", listing.type, "Only those of this type");

    CLI::App* const show = addCommand(*events, "show", "One of them");
    show->add_option("id", chosenBy<EventsShowCommand>(show, options).id, "Its number")
        ->required()
        ->transform(numberBetween(kSmallest, kLargest));

    CLI::App* const exporting = addCommand(*events, "export", "All of them, for other programs");
    exporting->add_option("--output", chosenBy<EventsExportCommand>(exporting, options).output,
                          "A file that is not there yet");
}

void addUpload(CLI::App& app, CommandLine& options) {
    CLI::App* const upload =
        addCommand(app, "upload", "The document of an upload, and the date of the next one");
    auto& command = chosenBy<UploadCommand>(upload, options);
    CLI::Option* const dryRun =
        upload->add_flag("--dry-run", command.isDryRun, "Print it; nothing is sent or changed");
    CLI::Option* const postTime =
        upload
            ->add_option("--post-time", command.postTime,
                         "As if it were sent then, in milliseconds since 1970")
            ->check(numberBetween(0.0, kLatestPostTime));
    upload->add_flag("--now", command.isNow, "Make it due: the next event uploads")
        ->excludes(dryRun)
        ->excludes(postTime);
    upload->parse_complete_callback([&command] {
        if (!command.isDryRun && !command.isNow) {
            throw CLI::RequiredError("--dry-run or --now");
        }
    });
}

void addSend(CLI::App& app, CommandLine& options) {
    CLI::App* const send = addCommand(app, "send", "Send an event to the daemon");
    auto& command = chosenBy<SendCommand>(send, options);
    send->add_option("name", command.name, base::concat(eventShortNames(), ", or a whole name"))
        ->required();
    send->add_option("--stream", command.stream,
                     base::concat(streamShortNames(), ", or a whole name"));
    CLI::Option* const payload =
        send->add_option("--payload", command.payload, "The payload, in hexadecimal");
    send->add_option("--date", command.date, "The payload is this date")->excludes(payload);
    send->add_flag("--exact", command.isExact, "Send a name that is not known");
}

void addDecode(CLI::App& app, CommandLine& options) {
    CLI::App* const decode = addCommand(app, "decode", "Show bytes as named fields");
    auto& command = chosenBy<DecodeCommand>(decode, options);
    CLI::Option* const digits =
        decode->add_option("hex", command.digits, "The bytes; standard input without them");
    CLI::Option* const kind = decode->add_option("--kind", command.kind, "What they are")
                                  ->check(CLI::IsMember(decode::kindNames()));
    decode->add_option("--payload-of", command.payloadOf, "They are the payload of this command")
        ->check(CLI::IsMember(decode::commandNames()))
        ->excludes(kind);
    decode->add_option("--file", command.file, "The bytes are in this file")->excludes(digits);
    decode->add_flag("--hex", command.isHex, "The file or input holds hexadecimal digits");
    decode->add_flag("--show-secrets", command.showSecrets, "Show passphrases");
}

void addSim(CLI::App& app, CommandLine& options) {
    CLI::App* const sim = addCommand(app, "sim", "Send a control command to keystrand-sim");
    sim->add_option("words", chosenBy<SimCommand>(sim, options).words, "The command")->required();
}

void addGate(CLI::App& app, CommandLine& options) {
    CLI::App* const devices =
        addCommand(app, "devices", "The USB devices, and which of them are let in");
    devices->require_subcommand(0, 1);
    auto& command = chosenBy<DevicesCommand>(devices, options);
    addCommand(*devices, "accept", "Let one in that was refused")
        ->add_option("port", command.toAccept, "Where it is plugged in, as the list shows it")
        ->required()
        ->check(port());

    CLI::App* const open = addCommand(app, "open", "Let all new USB devices in for a while");
    open->add_option("--for", chosenBy<OpenCommand>(open, options).seconds,
                     "How long, with s, min or h behind the number; 0 ends it")
        ->required()
        ->type_name("TIME")
        ->transform(timeSpan(wire::kMostGateOpenSeconds));

    for (const bool isLocked : {true, false}) {
        CLI::App* const lock = addCommand(app, isLocked ? "lock" : "unlock",
                                          isLocked ? "Tell logind that your screen is locked"
                                                   : "Tell it that it is not any more");
        chosenBy<LockCommand>(lock, options).isLocked = isLocked;
    }
}

/// What the parser says, or the word that stands where a command must.
std::string reasonOf(const CLI::App& app, const CLI::ParseError& problem) {
    const std::vector<std::string> words = app.remaining(true);
    const bool isCommand = dynamic_cast<const CLI::RequiredError*>(&problem) != nullptr &&
                           !words.empty() && !words.front().starts_with('-');
    return isCommand ? base::concat("there is no command ", words.front()) : problem.what();
}

/// Help and version go to standard output; everything else is a mistake.
ExitStatus statusOfParseError(const CLI::App& app, const CLI::ParseError& problem) {
    if (problem.get_exit_code() == static_cast<int>(CLI::ExitCodes::Success)) {
        app.exit(problem);
        return std::fflush(stdout) == 0 ? ExitStatus::success : ExitStatus::failed;
    }
    Output::complain(reasonOf(app, problem));
    return ExitStatus::usage;
}

} // namespace

std::optional<CommandLine> parseCommandLine(int argc, const char* const* argv, ExitStatus& status) {
    CommandLine options;
    CLI::App app("Shows what kstd does and keeps, and drives it.", "kstctl");
    app.set_version_flag("--version", "kstctl " KSTD_VERSION);
    app.require_subcommand(1);
    app.add_option("--root", options.root, "All paths lie under this directory")
        ->capture_default_str();
    app.add_flag("--json", options.isJSON, "Results as JSON");
    int patience = static_cast<int>(options.patience.count());
    app.add_option("--wait", patience, "Longest wait for a lock or a full socket, in milliseconds")
        ->transform(numberBetween<std::int64_t>(0, kLongestPatience))
        ->capture_default_str();
    addCommand(app, "status", "The daemon, its files and what it will do next");
    addEvents(app, options);
    addUpload(app, options);
    addSend(app, options);
    addDecode(app, options);
    addSim(app, options);
    addGate(app, options);
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& problem) {
        status = statusOfParseError(app, problem);
        return std::nullopt;
    }
    options.patience = std::chrono::milliseconds(patience);
    return options;
}

} // namespace kstctl
