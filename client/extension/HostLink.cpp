#include "client/extension/HostLink.h"

#include <cerrno>
#include <utility>

#include "broadcast/PayloadKeys.h"

namespace lumacast::extension {

namespace {

/// The value of the item with this title; null when there is none, or none of the type that values have.
Value valueOf(const std::vector<ExtensionItem>& items, std::string_view title) {
    for (const ExtensionItem& item : items) {
        if (item.attributedTitle != title) continue;
        if (item.attachments.empty() || !item.attachments.front().hasItemConformingTo(kGenericDataType)) return {};
        return item.attachments.front().item;
    }
    return {};
}

/// The request that begins a broadcast of samples says nothing: what follows comes over the auxiliary connection.
bool saysNothing(const std::vector<ExtensionItem>& items) {
    for (const ExtensionItem& item : items)
        if (!item.attributedTitle.empty() || !item.attachments.empty()) return false;
    return true;
}

Error systemError(int number) { return Error(std::string(kSystemErrorDomain), number); }

}  // namespace

std::optional<ClipRequest> clipRequestIn(const std::vector<ExtensionItem>& items) {
    const Value finish = valueOf(items, kItemRequestedFinish), token = valueOf(items, kItemSandboxToken);
    const Value info = valueOf(items, kItemUserInfo), url = valueOf(items, kItemMovieClipURL);
    const auto* finishText = finish.as<std::string>();
    const auto* urlText = url.as<std::string>();
    const auto* tokenBytes = token.as<Data>();
    const auto* userInfo = info.as<Dictionary>();
    if (!finishText || (*finishText != "0" && *finishText != "1") || !urlText || !tokenBytes) return std::nullopt;
    if (!info.isNull() && !userInfo) return std::nullopt;
    return ClipRequest{*tokenBytes, *urlText, userInfo ? std::optional(*userInfo) : std::nullopt, *finishText == "1"};
}

void HostLink::open(Fd socket, std::function<void()> gone) {
    Peer host = Peer::of(socket.get());
    connection_ = world_->ipc.adopt(std::move(socket), std::move(host));
    connection_->setExportedInterface(extensionRequestProtocol());
    connection_->setExportedObject(weak_from_this());
    connection_->setRemoteInterface(extensionRequestHostProtocol());
    connection_->setInvalidationHandler(std::move(gone));
    connection_->resume();
}

void HostLink::close() {
    connection_->setInvalidationHandler({});
    connection_->invalidate();
    expected_.clear();
}

void HostLink::receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array arguments, IpcReply reply) {
    reply({});  // taken: whatever comes of it is told when it ends
    begin(*arguments[0].as<std::int64_t>(), *arguments[1].as<Array>());
}

void HostLink::begin(std::int64_t request, const Array& encoded) {
    const auto items = decodeItems(encoded);
    if (items && saysNothing(*items)) return;  // goes on for as long as the broadcast
    auto clip = items ? clipRequestIn(*items) : std::nullopt;
    if (!clip) {
        sayRefused("a request that is no clip's");
        cancel(request, systemError(EINVAL));
        return;
    }
    expect(request, std::move(*clip));
}

void HostLink::expect(std::int64_t request, ClipRequest clip) {
    Data token = std::move(clip.token);
    expected_.push_back({request, std::move(clip), ++clips_, std::nullopt});
    exchange_(connection_, std::move(token), [weak = weak_from_this(), request](Fd movie) {
        if (const auto self = weak.lock()) self->arrived(request, std::move(movie));
    });
}

void HostLink::arrived(std::int64_t request, Fd movie) {
    for (Expected& each : expected_) {
        if (each.request != request || each.movie) continue;
        each.movie = std::move(movie);
        break;
    }
    while (!expected_.empty() && expected_.front().movie) {
        Expected next = std::move(expected_.front());
        expected_.pop_front();
        handOver(std::move(next));
    }
}

void HostLink::handOver(Expected expected) {
    if (!*expected.movie) {
        sayRefused("a clip without a movie");
        cancel(expected.request, systemError(EACCES));
        world_->lane.call([this, self = shared_from_this(), isLast = expected.clip.isLast] { handler_.clipMissed(isLast); });
        return;
    }
    const auto clip = std::make_shared<Clip>(
        Clip{std::move(*expected.movie), std::move(expected.clip.url), expected.number, std::move(expected.clip.userInfo),
             expected.clip.isLast, ClipAnswer(world_, weak_from_this(), expected.request)});
    world_->lane.call([this, self = shared_from_this(), clip] { handler_.clip(std::move(*clip)); });
}

void HostLink::complete(std::int64_t request, const std::vector<ExtensionItem>& items) {
    send(ExtensionRequestHostMessage::CompleteRequest, {Value(request), Value(encodeItems(items))});
}

void HostLink::cancel(std::int64_t request, const std::optional<Error>& error) {
    send(ExtensionRequestHostMessage::CancelRequest, {Value(request), Value(error)});
}

void HostLink::send(ExtensionRequestHostMessage message, Array arguments) {
    connection_->remoteProxy([](const Error& error) {
                   if (error.code() != EPIPE) sayRefused("an answer that can't be sent");
               })
        ->send(static_cast<std::uint16_t>(message), std::move(arguments));
}

}  // namespace lumacast::extension
