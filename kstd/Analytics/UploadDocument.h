#pragma once

#include "base/TextBuffer.h"
#include "kstd/Analytics/ServerDocuments.h"
#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/HTTPSession.h"
#include "platform/Result.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace kstd {

/// The document of an upload, made from an open store while it is sent: a piece and an event is all
/// that is held of it, however many events there are. A document of no more than one piece is made
/// once; a longer one is made twice, first for its size, from the same events.
///
/// Belongs to the queue of the store, which waits while a thread of a session takes the pieces.
/// Nothing writes to the store as long as it is there.
class UploadDocument final : public platform::HTTPBody {
  public:
    /// `postTime` is in milliseconds since 1970. The rest outlives the document.
    UploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                   TQAnalyticsLoggerSQLiteStore& store, platform::ValueMap summary,
                   double postTime);

    /// Reads the events for the first time. Nothing else is of use before; nor after an error.
    [[nodiscard]] std::optional<platform::Error> measure();

    [[nodiscard]] std::uint64_t size() const override { return size_; }
    [[nodiscard]] std::string_view next(std::size_t most) override;

    /// The first kBeginningSize bytes.
    [[nodiscard]] std::string_view beginning() const { return beginning_; }

    /// The log shows a part of so long a line only.
    static constexpr std::size_t kBeginningSize = 8192;
    /// A piece has that size, and as much more as one event takes.
    static constexpr std::size_t kPieceSize = 64UL * 1024;

  private:
    /// One making of the text.
    struct Making {
        explicit Making(UploadDocument& document)
            : text(document.json_, document.propertyLists_), events(document.store_) {}

        UploadText text;
        StoredEventCursor events;
        bool isOver = false;
    };

    /// Puts the next piece in the place of the last one.
    [[nodiscard]] std::optional<platform::Error> makePiece(Making& making);

    platform::JSON& json_;
    platform::PropertyLists& propertyLists_;
    TQAnalyticsLoggerSQLiteStore& store_;
    const platform::ValueMap summary_;
    const double postTime_;
    UnchangingEvents unchanging_;
    std::uint64_t size_ = 0;
    std::string beginning_;
    base::TextBuffer piece_;
    /// Of the piece, what was given.
    std::size_t given_ = 0;
    std::optional<Making> making_;
};

} // namespace kstd
