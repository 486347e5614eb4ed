#pragma once
#include <cstdint>
#include <optional>

#include "base/Value.h"
#include "client/Answers.h"
#include "writer/media/MediaTime.h"

namespace lumacast::client {

/// From the daemon's message to the application's event. On the library's thread.
class ClientMessages {
public:
    /// Borrows the events.
    explicit ClientMessages(const Events& events) : events_(events) {}

    /// Tells one message of LCClientProtocol, whose arguments match its declaration. A message that is unknown, and
    /// samples whose records are not of their size, are dropped.
    void deliver(std::uint16_t message, const Array& arguments);

    /// A new recording begins: its stamps begin anew.
    void forgetStamps() { lastPresentation_.reset(); }

private:
    void deliverVideo(const Array& arguments);
    void deliverAudio(const Array& arguments);

    const Events& events_;
    std::optional<MediaTime> lastPresentation_;  ///< of the picture told last
};

}  // namespace lumacast::client
