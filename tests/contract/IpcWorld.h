#pragma once
// What the contract suite of the IPC roles needs of a world, and the objects its tests are made of.

#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/IpcListener.h"
#include "platform/Scheduler.h"
#include "writer/media/PixelBuffer.h"

namespace lumacast {

/// Three processes that talk to each other, each with a main queue of its own.
enum class Side { Daemon, Client, Other };

class IpcWorld {
public:
    virtual ~IpcWorld() = default;
    virtual Ipc& ipc(Side side) = 0;
    /// Runs `task` on the side's main queue; returns when it is done.
    virtual void on(Side side, const Task& task) = 0;
    /// Whether the caller runs on the side's main queue.
    virtual bool isOnMainQueue(Side side) = 0;
    /// Returns when everything that is on its way has been delivered.
    virtual void settle() = 0;
    virtual ProcessID pid(Side side) = 0;
    /// What `side` answers when it is asked for this entitlement of any process.
    virtual void grant(Side side, const std::string& name, Value value) = 0;
};

using IpcWorldMaker = std::unique_ptr<IpcWorld> (*)();

/// A value that several lanes write and read.
template <class T>
class Shared {
public:
    T get() const {
        const std::lock_guard lock(mutex_);
        return value_;
    }
    void set(T value) {
        const std::lock_guard lock(mutex_);
        value_ = std::move(value);
    }
    template <class Change>
    void change(Change&& change) {
        const std::lock_guard lock(mutex_);
        change(value_);
    }

private:
    mutable std::mutex mutex_;
    T value_{};
};

/// Keeps the messages it is given, and answers requests with what it was told to, or keeps their replies too.
class RecordingObject final : public IpcExportedObject {
public:
    struct Received {
        std::weak_ptr<IpcConnection> connection;
        std::uint16_t message;
        Array arguments;
        IpcReply reply;
        bool wasOnMainQueue;
    };
    RecordingObject(IpcWorld& world, Side side) : world_(world), side_(side) {}

    void receiveMessage(const std::shared_ptr<IpcConnection>& connection, std::uint16_t message, Array arguments,
                        IpcReply reply) override {
        received.change([&](auto& list) {
            list.push_back({connection, message, std::move(arguments), reply, world_.isOnMainQueue(side_)});
        });
        if (const auto action = onMessage.get()) action(connection, reply);
    }
    std::size_t count() const { return received.get().size(); }

    Shared<std::vector<Received>> received;
    /// Called with each message.
    Shared<std::function<void(const std::shared_ptr<IpcConnection>&, const IpcReply&)>> onMessage;

private:
    IpcWorld& world_;
    const Side side_;
};

/// Accepts (or refuses) and keeps accepted connections weakly.
class RecordingDelegate final : public IpcListenerDelegate {
public:
    using Decision = std::function<bool(const std::shared_ptr<IpcConnection>&)>;
    explicit RecordingDelegate(Decision decision) : decision_(std::move(decision)) {}

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        accepted.change([&](auto& list) { list.push_back(connection); });
        return decision_(connection);
    }
    std::shared_ptr<IpcConnection> last() const {
        const auto list = accepted.get();
        return list.empty() ? nullptr : list.back().lock();
    }
    Shared<std::vector<std::weak_ptr<IpcConnection>>> accepted;

private:
    const Decision decision_;
};

/// Counts the losses of one connection.
struct LossRecorder {
    Shared<int> invalidations;
    Shared<int> interruptions;
    void watch(IpcConnection& connection) {
        connection.setInvalidationHandler([this] { invalidations.change([](int& n) { ++n; }); });
        connection.setInterruptionHandler([this] { interruptions.change([](int& n) { ++n; }); });
    }
};

/// What became of one message. Its handlers may outlive it.
struct Outcome {
    std::shared_ptr<Shared<std::vector<Array>>> replies = std::make_shared<Shared<std::vector<Array>>>();
    std::shared_ptr<Shared<std::vector<Error>>> errors = std::make_shared<Shared<std::vector<Error>>>();
    std::size_t replyCount() const { return replies->get().size(); }
    std::size_t errorCount() const { return errors->get().size(); }
    std::function<void(Array)> onReply() {
        return [replies = replies](Array values) {
            replies->change([&](auto& list) { list.push_back(std::move(values)); });
        };
    }
    IpcConnection::ErrorHandler onError() {
        return [errors = errors](const Error& error) { errors->change([&](auto& list) { list.push_back(error); }); };
    }
};

/// A plane in ordinary memory.
class PlainPlane final : public SharedPlane {
public:
    PlainPlane(std::int32_t width, std::int32_t height, std::vector<PixelRect> damage = {}, std::uint64_t number = 1)
        : width_(width),
          height_(height),
          pixels_(stride() * static_cast<std::size_t>(height)),
          damage_(std::move(damage)),
          number_(number) {
        for (std::size_t i = 0; i < pixels_.size(); ++i) pixels_[i] = static_cast<std::uint8_t>(i * 7 + number);
    }
    std::int32_t width() const override { return width_; }
    std::int32_t height() const override { return height_; }
    std::size_t stride() const override { return static_cast<std::size_t>(width_) * 4 + 16; }
    std::span<const std::uint8_t> pixels() const override { return pixels_; }
    std::span<const PixelRect> damage() const override { return damage_; }
    std::uint64_t pictureNumber() const override { return number_; }
    int descriptor() const override { return -1; }

private:
    const std::int32_t width_;
    const std::int32_t height_;
    std::vector<std::uint8_t> pixels_;
    const std::vector<PixelRect> damage_;
    const std::uint64_t number_;
};

}  // namespace lumacast
