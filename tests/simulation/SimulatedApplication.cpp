#include "tests/simulation/SimulatedApplication.h"

namespace lumacast {

class SimulatedApplication::Inbox final : public IpcExportedObject {
public:
    Inbox(std::shared_ptr<std::vector<Told>> told, std::size_t firstOfProcess)
        : told_(std::move(told)), firstOfProcess_(firstOfProcess) {}
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t message, Array arguments,
                        IpcReply) override {
        told_->push_back({static_cast<ClientMessage>(message), std::move(arguments), firstOfProcess_});
    }

private:
    const std::shared_ptr<std::vector<Told>> told_;
    const std::size_t firstOfProcess_;
};

SimulatedApplication::SimulatedApplication(FakePlatform& machine, BundleIdentifier theIdentifier,
                                           const std::string& theName, ProcessID pid, ContextID theWindow)
    : identifier(std::move(theIdentifier)), name(theName), window(theWindow), machine_(machine), pid_(pid) {
    machine_.bundles.installApplication(identifier, name);
    machine_.appStateMonitor.setState(identifier, AppStateMonitor::kRunningForeground);
    startAgain(pid);
}

SimulatedApplication::~SimulatedApplication() { die(); }

void SimulatedApplication::startAgain(ProcessID pid) {
    pid_ = pid;
    firstOfProcess_ = asked_.size();
    process_ = machine_.makeProcess(pid);
    machine_.bundles.run(pid, identifier);
    machine_.renderServer.addLayer(window, pid);
}

void SimulatedApplication::replaceProcess(ProcessID pid) {
    const auto former = std::move(process_);
    const auto itsConnection = std::move(connection_);
    startAgain(pid);
    connect();
    if (former) machine_.endProcess(*former);
}

void SimulatedApplication::connect() {
    firstOfConnection_ = asked_.size();
    inbox_ = std::make_shared<Inbox>(told_, firstOfProcess_);
    connection_ = process_->connectToService("com.orvane.lumacastd");
    connection_->setExportedInterface(clientProtocol());
    connection_->setExportedObject(inbox_);
    connection_->setRemoteInterface(daemonProtocol());
    connection_->setInvalidationHandler([losses = losses_] { ++*losses; });
    connection_->resume();
}

void SimulatedApplication::die() {
    if (!process_) return;
    machine_.endProcess(*process_);
    connection_.reset();
    process_.reset();
}

std::shared_ptr<SimulatedApplication::Asked> SimulatedApplication::ask(DaemonMessage message, Array arguments) {
    auto asked = std::make_shared<Asked>(Asked{message, 0, 0, {}, firstOfProcess_});
    asked_.push_back(asked);
    connection_->remoteProxy([asked](const Error&) { ++asked->failures; })
        ->send(static_cast<std::uint16_t>(message), std::move(arguments), [asked](Array values) {
            ++asked->answers;
            asked->values = std::move(values);
        });
    return asked;
}

void SimulatedApplication::tell(DaemonMessage message, Array arguments) {
    connection_->remoteProxy([](const Error&) {})->send(static_cast<std::uint16_t>(message), std::move(arguments));
}

std::shared_ptr<SimulatedApplication::Asked> SimulatedApplication::start(const std::vector<ContextID>& windows,
                                                                          const Wishes& wishes) {
    Array ids;
    for (const ContextID id : windows) ids.emplace_back(number(id));
    return ask(DaemonMessage::StartRecording,
               {std::move(ids), Array{wishes.width, 360.0}, wishes.microphone, wishes.camera, wishes.broadcast,
                wishes.system, wishes.capture, Value()});
}

}  // namespace lumacast
