#pragma once
#include <functional>
#include <memory>
#include <utility>

#include "base/Guarded.h"
#include "writer/media/SampleBuffer.h"

namespace lumacast {

/// A handler of samples, or none, that is set and called from any lane. A call keeps the handler it found until it
/// returns, whatever is set meanwhile, and holds no lock; it takes no memory, as copying the handler would.
class SharedSampleHandler {
public:
    using Handler = std::function<void(const SampleRef&)>;

    void set(Handler handler) {
        handler_.set(handler ? std::make_shared<const Handler>(std::move(handler)) : nullptr);
    }
    /// A copy; empty when there is none.
    Handler get() const {
        const auto handler = handler_.get();
        return handler ? *handler : nullptr;
    }
    /// Nothing when there is none.
    void call(const SampleRef& sample) const {
        if (const auto handler = handler_.get()) (*handler)(sample);
    }

private:
    Guarded<std::shared_ptr<const Handler>> handler_;
};

}  // namespace lumacast
