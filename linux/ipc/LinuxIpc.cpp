#include "linux/ipc/LinuxIpc.h"

#include <utility>

#include "linux/ipc/LinuxIpcConnection.h"
#include "linux/ipc/LinuxIpcEndpoint.h"
#include "linux/ipc/LinuxIpcListener.h"

namespace lumacast {

LinuxIpc::LinuxIpc(Reactor& reactor, Log& log, LinuxIpcOptions options)
    : core_(std::make_shared<IpcCore>(reactor, log, std::move(options.entitlements), options.helloDeadline,
                                      std::move(options.serviceUnavailable))),
      runtimeDirectory_(std::move(options.runtimeDirectory)),
      activated_(std::move(options.activated)) {}

LinuxIpc::~LinuxIpc() { core_->releaseAll(); }

std::shared_ptr<IpcListener> LinuxIpc::listenerForService(const std::string& name) {
    const std::lock_guard lock(mutex_);
    ServiceSocket socket = ServiceSocket::open(runtimeDirectory_, name, activated_, core_->log);
    if (socket.descriptor() < 0 && core_->serviceUnavailable) core_->serviceUnavailable();
    return std::make_shared<LinuxIpcListener>(core_, std::move(socket));
}

std::shared_ptr<IpcListener> LinuxIpc::anonymousListener() {
    return std::make_shared<LinuxIpcListener>(core_, ServiceSocket());
}

std::shared_ptr<IpcConnection> LinuxIpc::connectToService(const std::string& name) {
    Fd socket = connectToServiceSocket(runtimeDirectory_, name);
    Peer peer = socket ? Peer::of(socket.get()) : Peer();
    return connectionOver(std::move(socket), std::move(peer));
}

LinuxIpc::Attempt LinuxIpc::tryService(const std::string& name) {
    Attempt attempt;
    ServiceCall call = callServiceSocket(runtimeDirectory_, name);
    attempt.isBusy = call.isBusy;
    if (!call.socket) return attempt;
    attempt.peer = Peer::of(call.socket.get());
    Peer peer = Peer::of(call.socket.get());
    attempt.connection = connectionOver(std::move(call.socket), std::move(peer));
    return attempt;
}

std::shared_ptr<IpcConnection> LinuxIpc::connectToEndpoint(const std::shared_ptr<IpcEndpoint>& endpoint) {
    EndpointCall call;
    if (endpoint) call = ringEndpoint(*endpoint);
    return connectionOver(std::move(call.socket), std::move(call.peer));
}

std::shared_ptr<IpcConnection> LinuxIpc::adopt(Fd socket, Peer peer) {
    return connectionOver(std::move(socket), std::move(peer));
}

std::shared_ptr<IpcConnection> LinuxIpc::connectionOver(Fd socket, Peer peer) {
    auto connection = std::make_shared<LinuxIpcConnection>(core_, std::move(socket), std::move(peer), std::nullopt);
    connection->sendHello();
    return connection;
}

int LinuxIpc::descriptorOf(const IpcEndpoint& endpoint) {
    const auto* ours = dynamic_cast<const LinuxIpcEndpoint*>(&endpoint);
    return ours ? ours->descriptor() : -1;
}

std::shared_ptr<IpcEndpoint> LinuxIpc::endpointFrom(Fd descriptor) {
    return LinuxIpcEndpoint::make(std::move(descriptor));
}

}  // namespace lumacast
