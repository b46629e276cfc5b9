#pragma once

#include "base/TextBuffer.h"
#include "platform/Result.h"
#include "platform/Value.h"

namespace platform {
struct Host;
}

namespace kstd {

class TQAnalyticsLoggerSQLiteStore;

/// The JSON text of an upload: every event of the store in its order, then `summary`, under
/// "events"; and `postTime`, in milliseconds since 1970.
///
/// An event goes from its stored form straight into the text, so that nothing but the text grows
/// with their number. A row that holds no event leaves no trace. Called on the queue of the store.
[[nodiscard]] platform::Result<base::TextBuffer>
makeUploadDocument(const platform::Host& host, TQAnalyticsLoggerSQLiteStore& store,
                   const platform::ValueMap& summary, double postTime);

} // namespace kstd
