#include "base/Concat.h"
#include "kstctl/Output.h"
#include "kstctl/Report.h"
#include "kstctl/status/UploadSection.h"
#include "platform/MessageClasses.h"

#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include <memory>
#include <system_error>
#include <unistd.h>

namespace kstctl {

namespace {

constexpr std::string_view kStart = "Splunk upload start";
constexpr std::string_view kSuccess = "Splunk upload success";

struct Ending {
    std::string_view line;
    UploadOutcome outcome;
};

constexpr Ending kEndings[] = {
    {kStart, UploadOutcome::begun},
    {kSuccess, UploadOutcome::accepted},
    {"failed to get a splunk upload endpoint - not uploading", UploadOutcome::noAddress},
    {"Error in uploading the events to splunk: ", UploadOutcome::failed},
    {"Received the wrong kind of response: ", UploadOutcome::failed},
    {"Splunk upload unexpected status to URL: ", UploadOutcome::failed},
    {"TQAnalytics: failed to upload json to analytics server with error: ", UploadOutcome::failed},
};

/// What the journal has of an upload's last line.
struct Entry {
    UploadOutcome outcome{};
    std::string line;
    platform::Date date;
};

/// The journal of the system, newest lines first, of those that may be about uploads.
class Journal {
  public:
    Journal() {
        sd_journal* opened = nullptr;
        error_ = -::sd_journal_open(&opened, SD_JOURNAL_LOCAL_ONLY | SD_JOURNAL_SYSTEM);
        journal_.reset(opened);
        // Only root's lines are the daemon's: these two fields are not the sender's to choose.
        match("_UID=0");
        match("SYSLOG_IDENTIFIER=kstd");
        note(::sd_journal_add_conjunction(journal_.get()));
        for (const char* const id :
             {platform::message::kUploadFailed, platform::message::kServerNotTrusted,
              platform::message::kNoUploadAddress}) {
            match(base::concat("MESSAGE_ID=", id));
        }
        // Lines of the course of things have no identifier.
        note(::sd_journal_add_disjunction(journal_.get()));
        match(base::concat("MESSAGE=", kStart));
        match(base::concat("MESSAGE=", kSuccess));
        note(::sd_journal_seek_tail(journal_.get()));
    }

    /// The number of the error because of which nothing can be read, or 0.
    [[nodiscard]] int error() const { return error_; }

    /// The last line that an upload has left, if there is one.
    [[nodiscard]] std::optional<Entry> last() {
        while (error_ == 0) {
            const int moved = ::sd_journal_previous(journal_.get());
            note(moved);
            if (moved <= 0) {
                return std::nullopt;
            }
            const std::string line = message();
            if (const auto outcome = uploadOutcomeOf(line)) {
                return Entry{*outcome, line, date()};
            }
        }
        return std::nullopt;
    }

  private:
    struct Closer {
        void operator()(sd_journal* journal) const { ::sd_journal_close(journal); }
    };

    void note(int result) {
        if (result < 0 && error_ == 0) {
            error_ = -result;
        }
    }

    void match(const std::string& field) {
        note(::sd_journal_add_match(journal_.get(), field.data(), field.size()));
    }

    [[nodiscard]] std::string message() {
        constexpr std::string_view kField = "MESSAGE=";
        const void* data = nullptr;
        std::size_t size = 0;
        if (::sd_journal_get_data(journal_.get(), "MESSAGE", &data, &size) < 0 ||
            size < kField.size()) {
            return {};
        }
        return std::string(static_cast<const char*>(data), size).substr(kField.size());
    }

    [[nodiscard]] platform::Date date() {
        std::uint64_t microseconds = 0;
        note(::sd_journal_get_realtime_usec(journal_.get(), &microseconds));
        return {static_cast<std::int64_t>(microseconds) * 1000};
    }

    std::unique_ptr<sd_journal, Closer> journal_;
    int error_ = 0;
};

const char* nameOf(UploadOutcome outcome) {
    switch (outcome) {
    case UploadOutcome::accepted:
        return "accepted";
    case UploadOutcome::failed:
        return "failed";
    case UploadOutcome::noAddress:
        return "no address";
    case UploadOutcome::begun:
        return "begun";
    }
    return "";
}

Report::Datum reasonOf(const Entry& entry) {
    if (entry.outcome == UploadOutcome::accepted) {
        return Report::None();
    }
    return entry.outcome == UploadOutcome::begun ? "it is under way, or the daemon was ended in it"
                                                 : Report::Datum(entry.line);
}

} // namespace

std::optional<UploadOutcome> uploadOutcomeOf(std::string_view line) {
    for (const Ending& ending : kEndings) {
        const bool isBeginning = ending.line.ends_with(' ');
        if (isBeginning ? line.starts_with(ending.line) : line == ending.line) {
            return ending.outcome;
        }
    }
    return std::nullopt;
}

void addLastUpload(Section& section, const Environment& environment) {
    const std::string socket(platform::Paths::kJournalSocket);
    if (!environment.paths.isSystemRoot() || ::access(socket.c_str(), F_OK) != 0) {
        section.report.add("last", Report::Unknown{"only the journal keeps it, and this daemon "
                                                   "does not write to one"});
        return;
    }
    Journal journal;
    const auto entry = journal.last();
    if (journal.error() != 0) {
        section.addUnknown("last",
                           failure(ExitStatus::failed,
                                   base::concat("the journal cannot be read: ",
                                                std::generic_category().message(journal.error()))));
    } else if (entry) {
        section.report.add("last", Report()
                                       .add("time", timeText(entry->date))
                                       .add("outcome", nameOf(entry->outcome))
                                       .add("reason", reasonOf(*entry)));
    } else if (::geteuid() != 0) {
        section.addUnknown("last", failure(ExitStatus::unreadable,
                                           "the journal shows this user none of the daemon's"));
    } else {
        section.report.add("last", Report::None(), "there is none in the journal");
    }
}

} // namespace kstctl
