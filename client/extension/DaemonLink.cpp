#include "client/extension/DaemonLink.h"

#include <cerrno>
#include <utility>

namespace lumacast::extension {

namespace {

/// What keeps a payload from counting as processed, and the lane that says so when it is. In this order: the reply goes
/// before the lane.
class Processing {
public:
    Processing(std::shared_ptr<World> world, IpcReply reply) : world_(std::move(world)), reply_(std::move(reply)) {}
    Processing(const Processing&) = delete;
    Processing& operator=(const Processing&) = delete;
    ~Processing() { reply_({}); }

private:
    const std::shared_ptr<World> world_;
    const IpcReply reply_;
};

template <class... Fs>
struct Overloaded : Fs... {
    using Fs::operator()...;
};
template <class... Fs>
Overloaded(Fs...) -> Overloaded<Fs...>;  // clang 16 doesn't find it by itself

}  // namespace

class DaemonLink::Vendor final : public IpcExportedObject {
public:
    explicit Vendor(DaemonLink& link) : link_(link) {}
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array arguments, IpcReply reply) override {
        const auto* endpoint = arguments[0].as<Value::EndpointRef>();
        link_.connectTo(endpoint ? *endpoint : nullptr);
        reply({});
    }

private:
    DaemonLink& link_;
};

class DaemonLink::Extension final : public IpcExportedObject {
public:
    explicit Extension(DaemonLink& link) : link_(link) {}
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array arguments, IpcReply reply) override {
        link_.takePayload(*arguments[0].as<Dictionary>(), std::move(reply));
    }

private:
    DaemonLink& link_;
};

DaemonLink::DaemonLink(std::shared_ptr<World> world, Handler& handler) : world_(std::move(world)), handler_(handler) {}

void DaemonLink::open(Fd auxiliary, std::function<void()> gone) {
    gone_ = std::move(gone);
    vendor_ = std::make_shared<Vendor>(*this);
    extension_ = std::make_shared<Extension>(*this);
    Peer host = Peer::of(auxiliary.get());
    auxiliary_ = world_->ipc.adopt(std::move(auxiliary), std::move(host));
    auxiliary_->setExportedInterface(extensionVendorProtocol());
    auxiliary_->setExportedObject(vendor_);
    auxiliary_->setRemoteInterface(extensionHostProtocol());
    auxiliary_->resume();
}

void DaemonLink::close() {
    auxiliary_->invalidate();
    const std::lock_guard lock(mutex_);
    if (!daemon_) return;
    daemon_->setInvalidationHandler({});
    daemon_->invalidate();
    daemon_ = nullptr;
}

void DaemonLink::connectTo(const std::shared_ptr<IpcEndpoint>& endpoint) {
    if (!endpoint) return sayRefused("an endpoint that is none");
    auto daemon = world_->ipc.connectToEndpoint(endpoint);
    daemon->setExportedInterface(broadcastExtensionProtocol());
    daemon->setExportedObject(extension_);
    daemon->setRemoteInterface(broadcastDaemonProtocol());
    daemon->setInvalidationHandler([this, self = shared_from_this()] { gone_(); });
    {
        const std::lock_guard lock(mutex_);
        daemon_.swap(daemon);
        daemon_->resume();
    }
    if (daemon) {  // of an endpoint before: this one counts
        daemon->setInvalidationHandler({});
        daemon->invalidate();
    }
    lastFrame_.reset();
    send(BroadcastDaemonMessage::Ping, {});
}

void DaemonLink::takePayload(const Dictionary& payload, IpcReply reply) {
    auto decoded = payloadIn(payload);
    if (!decoded) return sayRefused("a payload that makes no sense");  // and leave it without a reply
    if (std::holds_alternative<UnknownPayload>(*decoded)) return reply({});
    if (const Frame* frame = std::get_if<Frame>(&*decoded); frame && isRepeated(*frame)) return reply({});
    if (std::holds_alternative<ActionPayload>(*decoded) && std::get<ActionPayload>(*decoded).action == Action::Start)
        lastFrame_.reset();
    deliver(std::move(*decoded), std::move(reply));
}

/// A source that goes on after a pause sends its last picture once more.
bool DaemonLink::isRepeated(const Frame& frame) {
    const MediaTime stamp = frame.timing.presentation;
    if (lastFrame_ && compare(stamp, *lastFrame_) <= 0) return true;
    lastFrame_ = stamp;
    return false;
}

void DaemonLink::deliver(Payload payload, IpcReply reply) {
    const auto processing = std::make_shared<Processing>(world_, std::move(reply));
    // On the way to the handler the payload has one holder.
    const auto held = std::make_shared<Payload>(std::move(payload));
    world_->lane.call([this, self = shared_from_this(), held, completion = Completion(processing)]() mutable {
        std::visit(Overloaded{
                       [](UnknownPayload&) {},
                       [&](ActionPayload& action) {
                           switch (action.action) {
                               case Action::Start:
                                   return handler_.started(std::move(action.userInfo), std::move(completion));
                               case Action::Pause: return handler_.paused(std::move(completion));
                               case Action::Resume: return handler_.resumed(std::move(completion));
                               case Action::Finish: return handler_.finished(std::move(completion));
                           }
                       },
                       [&](Frame& frame) {
                           // Whoever holds the plane holds the frame. The plane goes first: it is given back before the
                           // frame counts as processed.
                           const SharedPlane* plane = frame.plane.get();
                           frame.plane = std::shared_ptr<const SharedPlane>(
                               plane, [completion, owner = std::move(frame.plane)](const SharedPlane*) mutable {
                                   owner = nullptr;
                               });
                           frame.completion = std::move(completion);
                           handler_.frame(std::move(frame));
                       },
                       [&](Sound& sound) {
                           sound.completion = std::move(completion);
                           handler_.sound(std::move(sound));
                       },
                       [&](BundleIdentifier& application) { handler_.frontmostApplication(std::move(application)); },
                   },
                   *held);
    });
}

void DaemonLink::updateServiceInfo(Dictionary info) {
    send(BroadcastDaemonMessage::UpdateServiceInfo, {Value(std::move(info))});
}

void DaemonLink::updateBroadcastURL(URL url) { send(BroadcastDaemonMessage::UpdateBroadcastURL, {Value(std::move(url))}); }

void DaemonLink::finishWithError(Error error) {
    send(BroadcastDaemonMessage::FinishBroadcastWithError, {Value(std::move(error))});
}

void DaemonLink::send(BroadcastDaemonMessage message, Array arguments) {
    std::shared_ptr<IpcConnection> daemon;
    {
        const std::lock_guard lock(mutex_);
        daemon = daemon_;
    }
    if (!daemon) return;
    daemon->remoteProxy([](const Error& error) {
              if (error.code() != EPIPE) sayRefused("a report that can't be sent");
          })
        ->send(static_cast<std::uint16_t>(message), std::move(arguments));
}

}  // namespace lumacast::extension
