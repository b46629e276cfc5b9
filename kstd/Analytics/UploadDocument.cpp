#include "kstd/Analytics/UploadDocument.h"

#include <utility>

namespace kstd {

UploadDocument::UploadDocument(platform::JSON& json, platform::PropertyLists& propertyLists,
                               TQAnalyticsLoggerSQLiteStore& store, platform::ValueMap summary,
                               double postTime)
    : json_(json),
      propertyLists_(propertyLists),
      store_(store),
      summary_(std::move(summary)),
      postTime_(postTime),
      unchanging_(store) {}

std::optional<platform::Error> UploadDocument::measure() {
    Making& making = making_.emplace(*this);
    do {
        if (auto error = makePiece(making)) {
            return error;
        }
        if (size_ == 0) {
            beginning_ = piece_.view().substr(0, kBeginningSize);
        }
        size_ += piece_.size();
    } while (!making.isOver);
    // What was made of a longer one is its last piece.
    if (piece_.size() < size_) {
        making_.reset();
        piece_.truncate(0);
    }
    return std::nullopt;
}

std::string_view UploadDocument::next(std::size_t most) {
    if (given_ == piece_.size()) {
        Making& making = making_ ? *making_ : making_.emplace(*this);
        if (making.isOver || makePiece(making)) {
            return {};
        }
    }
    const std::string_view next = piece_.view().substr(given_, most);
    given_ += next.size();
    return next;
}

std::optional<platform::Error> UploadDocument::makePiece(Making& making) {
    piece_.truncate(0);
    given_ = 0;
    while (piece_.size() < kPieceSize && !making.isOver) {
        if (const auto event = making.events.next()) {
            making.text.addEvent(*event);
            making.text.moveTo(piece_);
            continue;
        }
        const auto rest = making.text.finish(summary_, postTime_);
        if (!rest) {
            return rest.error();
        }
        piece_.append(rest.value().view());
        making.isOver = true;
    }
    unchanging_.releasePages();
    return std::nullopt;
}

} // namespace kstd
