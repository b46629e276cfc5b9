#include "kstd/Analytics/UploadDocument.h"

#include "kstd/Analytics/TQAnalyticsLoggerSQLiteStore.h"
#include "platform/Host.h"
#include "platform/JSON.h"
#include "platform/PropertyLists.h"

namespace kstd {

platform::Result<base::TextBuffer> makeUploadDocument(const platform::Host& host,
                                                      TQAnalyticsLoggerSQLiteStore& store,
                                                      const platform::ValueMap& summary,
                                                      double postTime) {
    const auto text = host.json.makeText();
    text->beginMap();
    text->key("events");
    text->beginList();
    store.visitEvents([&host, &text](const platform::Bytes& event) {
        const auto before = text->mark();
        if (!host.propertyLists.read(event, *text)) {
            text->rewind(before);
        }
    });
    platform::describe(summary, *text);
    text->endList();
    text->key("postTime");
    text->real(postTime);
    text->endMap();
    return text->finish();
}

} // namespace kstd
