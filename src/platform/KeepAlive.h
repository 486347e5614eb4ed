#pragma once
namespace lumacast {

/// Keep-alive transactions: while any is open the platform does not end the idle daemon. Callable from any lane; does
/// not block. Every begin is matched by one end.
class KeepAlive {
public:
    virtual ~KeepAlive() = default;
    virtual void beginTransaction() = 0;
    virtual void endTransaction() = 0;
};

}  // namespace lumacast
