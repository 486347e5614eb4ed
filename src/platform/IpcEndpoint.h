#pragma once
namespace lumacast {

/// Names an anonymous listener; travels in messages. Whoever holds one can connect to that listener.
class IpcEndpoint {
public:
    virtual ~IpcEndpoint() = default;
};

}  // namespace lumacast
