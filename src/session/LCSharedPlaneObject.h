#pragma once
#include <memory>
#include <string_view>
#include <utility>

#include "base/Coder.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {

/// Carries a frame's memory to another process without copying its pixels. Supports secure coding. Not thread-safe.
class LCSharedPlaneObject {
public:
    /// `supportsSecureCoding`
    static constexpr bool kSupportsSecureCoding = true;
    static constexpr std::string_view kSharedPlaneKey = "sharedPlane";

    LCSharedPlaneObject() = default;
    explicit LCSharedPlaneObject(std::shared_ptr<SharedPlane> plane) { setSharedPlane(std::move(plane)); }

    /// `setSharedPlane:` — the same one again changes nothing; null is allowed.
    void setSharedPlane(std::shared_ptr<SharedPlane> plane) {
        if (plane == sharedPlane_) return;
        sharedPlane_ = std::move(plane);
    }
    /// `sharedPlane` — not retained for the caller; null when it has none.
    SharedPlane* sharedPlane() const { return sharedPlane_.get(); }

    /// `encodeWithCoder:` — deliberately writes nothing to a coder that is no connection's: memory can't be archived.
    void encodeWithCoder(Coder& coder) const {
        if (coder.isIpcConnectionCoder() && sharedPlane_) coder.encodeObject(Value(sharedPlane_), kSharedPlaneKey);
    }
    /// `initWithCoder:` — without a plane where the coder is no connection's, or has none.
    static LCSharedPlaneObject initWithCoder(const Coder& coder) {
        LCSharedPlaneObject object;
        if (!coder.isIpcConnectionCoder()) return object;
        const Value form = coder.decodeObject(kSharedPlaneKey);
        if (const auto* plane = form.as<Value::PlaneRef>()) object.setSharedPlane(*plane);
        return object;
    }

    /// What stands for the object in a message: its plane's transferable form, or null.
    Value messageForm() const {
        IpcConnectionCoder coder;
        encodeWithCoder(coder);
        return coder.decodeObject(kSharedPlaneKey);
    }

private:
    std::shared_ptr<SharedPlane> sharedPlane_;
};

}  // namespace lumacast
