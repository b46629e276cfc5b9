#include "platform/linux/LinuxEventStream.h"

#include "base/Concat.h"
#include "platform/MessageClasses.h"

#include <utility>

namespace platform {

LinuxEventStream::LinuxEventStream(LinuxRunLoop& loop, SystemLog& log)
    : log_(log), delivery_(loop.addPending([this] { deliverOne(); })) {}

void LinuxEventStream::setHandler(std::string_view stream, Handler handler) {
    queue_.setHandler(stream, std::move(handler));
    if (handlerSet_) {
        handlerSet_(stream);
    }
}

void LinuxEventStream::post(Event event) {
    queue_.push(std::move(event));
    delivery_->setEnabled(true);
}

void LinuxEventStream::drop(std::string_view stream, std::string_view name) {
    queue_.drop(stream, name);
    delivery_->setEnabled(!queue_.empty());
}

void LinuxEventStream::deliverOne() {
    const Event event = queue_.front();
    if (!queue_.deliverOne()) {
        log_.write(LogLevel::warning,
                   base::concat("kstd: EventStream: dropped event ", event.name,
                                " on unknown stream ", event.stream, ".\n"),
                   {.messageId = message::kMalformedEvent});
    }
    delivery_->setEnabled(!queue_.empty());
    for (const Observer& observer : observers_) {
        observer(event);
    }
}

} // namespace platform
