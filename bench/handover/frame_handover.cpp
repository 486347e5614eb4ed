// How long a frame takes to an upload extension: from the moment it is handed over to the moment the extension's
// handler has it with its pixels mapped and has read one, between two processes. Prints microseconds, one line a frame.
//
//   frame_handover transport|bare FRAMES FRAMES-A-SECOND
//
// `transport` is our transport and the library that extensions link; `bare` the same memory over a socket with blocking
// calls (a descriptor and eight bytes, mapped on arrival).

#include <fcntl.h>
#include <sys/socket.h>

#include <cstring>
#include <future>
#include <memory>
#include <string_view>
#include <utility>

#include "base/Log.h"
#include "bench/handover/Handover.h"
#include "broadcast/PayloadKeys.h"
#include "client/extension/Extension.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "writer/media/SampleBuffer.h"

namespace {

using namespace lumacast;
using namespace lumacast::bench;

constexpr std::size_t kPlanesUsed = 4;
constexpr std::uint8_t kFirstGrey = 100;

/// Frame memory as the capture makes it: whoever gets the descriptor can only read.
class SealedPlane final : public SharedPlane {
public:
    explicit SealedPlane(std::uint8_t grey) : descriptor_(::memfd_create("plane", MFD_CLOEXEC | MFD_ALLOW_SEALING)) {
        if (!descriptor_ || ::ftruncate(descriptor_.get(), kFrameBytes) != 0) std::exit(1);
        void* const memory = ::mmap(nullptr, kFrameBytes, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor_.get(), 0);
        if (memory == MAP_FAILED) std::exit(1);
        pixels_ = static_cast<std::uint8_t*>(memory);
        std::memset(pixels_, grey, kFrameBytes);
        ::fcntl(descriptor_.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_FUTURE_WRITE | F_SEAL_SEAL);
    }
    ~SealedPlane() override { ::munmap(pixels_, kFrameBytes); }
    std::int32_t width() const override { return kWidth; }
    std::int32_t height() const override { return kHeight; }
    std::size_t stride() const override { return kStride; }
    std::span<const std::uint8_t> pixels() const override { return {pixels_, kFrameBytes}; }
    std::span<const PixelRect> damage() const override { return {&whole_, 1}; }
    std::uint64_t pictureNumber() const override { return 1; }
    int descriptor() const override { return descriptor_.get(); }

private:
    const Fd descriptor_;
    std::uint8_t* pixels_ = nullptr;
    const PixelRect whole_{0, 0, kWidth, kHeight};
};

struct Pair {
    explicit Pair(int flags) {
        int both[2];
        if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | flags, 0, both) != 0) std::exit(1);
        here = Fd(both[0]), there = Fd(both[1]);
    }
    Fd here, there;
};

using Planes = std::vector<std::shared_ptr<SealedPlane>>;

/// Ends the process unless it is a pixel of one of the planes.
void read(std::uint8_t pixel) {
    if (pixel < kFirstGrey || pixel >= kFirstGrey + kPlanesUsed) ::_exit(1);
}

std::vector<double> bareSocket(int frames, int rate, const Planes& planes) {
    Pair link(0);
    Results results(frames);
    const Child child([&] {
        alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))];
        for (;;) {
            std::int64_t sent = 0;
            iovec part{&sent, sizeof sent};
            msghdr message{};
            message.msg_iov = &part, message.msg_iovlen = 1;
            message.msg_control = control, message.msg_controllen = sizeof control;
            if (::recvmsg(link.there.get(), &message, MSG_CMSG_CLOEXEC) != sizeof sent) ::_exit(0);
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(CMSG_FIRSTHDR(&message)), sizeof descriptor);
            void* const memory = ::mmap(nullptr, kFrameBytes, PROT_READ, MAP_SHARED, descriptor, 0);
            if (memory == MAP_FAILED) ::_exit(1);
            read(static_cast<const std::uint8_t*>(memory)[0]);
            const std::int64_t arrived = now();
            results.add(sent, arrived);
            ::munmap(memory, kFrameBytes);
            ::close(descriptor);
        }
    });
    atPace(frames, rate, [&](std::size_t number) {
        alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
        std::int64_t sent = now();
        iovec part{&sent, sizeof sent};
        msghdr message{};
        message.msg_iov = &part, message.msg_iovlen = 1;
        message.msg_control = control, message.msg_controllen = sizeof control;
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET, header->cmsg_type = SCM_RIGHTS, header->cmsg_len = CMSG_LEN(sizeof(int));
        const int descriptor = planes[number % planes.size()]->descriptor();
        std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
        if (::sendmsg(link.here.get(), &message, MSG_NOSIGNAL) != sizeof sent) std::exit(1);
    });
    return results.take();
}

/// Notes when it has a frame and its pixels.
class Receiver final : public extension::Handler {
public:
    explicit Receiver(Results& results) : results_(results) {}
    void frame(extension::Frame frame) override {
        const auto pixels = frame.plane->pixels();
        if (pixels.size() != kFrameBytes) ::_exit(1);
        read(pixels[0]);
        const std::int64_t arrived = now();
        results_.add(frame.timing.presentation.value, arrived);
    }

private:
    Results& results_;
};

/// The daemon to the extension, as far as its frames need one.
class Host final : public IpcListenerDelegate, public IpcExportedObject, public std::enable_shared_from_this<Host> {
public:
    void connect(Fd requests, Fd auxiliary) {
        reactor_.sync([&] {
            requests_ = ipc_.adopt(std::move(requests), Peer{});
            requests_->setExportedInterface(extensionRequestHostProtocol());
            requests_->setRemoteInterface(extensionRequestProtocol());
            requests_->resume();
            auxiliary_ = ipc_.adopt(std::move(auxiliary), Peer{});
            auxiliary_->setExportedInterface(extensionHostProtocol());
            auxiliary_->setRemoteInterface(extensionVendorProtocol());
            auxiliary_->resume();
            listener_ = ipc_.anonymousListener();
            listener_->setDelegate(shared_from_this());
            listener_->resume();
            auxiliary_->remoteProxy([](const Error&) {})->send(0, {Value(listener_->endpoint())}, [](Array) {});
        });
        pinged_.get_future().wait();
    }
    void send(const std::shared_ptr<SealedPlane>& plane) {
        const SampleTiming timing{kInvalidMediaTime, MediaTime::make(now(), 1'000'000'000), kInvalidMediaTime};
        Data bytes(sizeof timing);
        std::memcpy(bytes.data(), &timing, sizeof timing);
        Dictionary payload{{std::string(kPayloadVideoOrientation), std::uint32_t{1}},
                           {std::string(kPayloadSampleType), std::int64_t{1}},
                           {std::string(kPayloadSharedPlane), Value(std::shared_ptr<SharedPlane>(plane))},
                           {std::string(kPayloadTimingInfo), std::move(bytes)}};
        extension_->remoteProxy([](const Error&) {})->send(0, {Value(std::move(payload))}, [](Array) {});
    }
    ~Host() override {
        reactor_.requestStop();
        loop_.join();
    }

    bool listenerShouldAcceptNewConnection(IpcListener&, const std::shared_ptr<IpcConnection>& connection) override {
        extension_ = connection;
        connection->setExportedInterface(broadcastDaemonProtocol());
        connection->setExportedObject(shared_from_this());
        connection->setRemoteInterface(broadcastExtensionProtocol());
        connection->resume();
        return true;
    }
    void receiveMessage(const std::shared_ptr<IpcConnection>&, std::uint16_t, Array, IpcReply) override {
        pinged_.set_value();
    }
    void close() {
        reactor_.sync([&] {
            for (const auto& connection : {requests_, auxiliary_, extension_}) connection->invalidate();
            listener_->invalidate();
        });
    }

private:
    Log log_;
    Reactor reactor_;
    LinuxIpc ipc_{reactor_, log_, {}};
    std::shared_ptr<IpcConnection> requests_, auxiliary_, extension_;
    std::shared_ptr<IpcListener> listener_;
    std::promise<void> pinged_;
    std::thread loop_{[this] { reactor_.run(); }};
};

std::vector<double> transport(int frames, int rate, const Planes& planes) {
    Pair requests(SOCK_NONBLOCK), auxiliary(SOCK_NONBLOCK);
    Results results(frames);
    const Child child([&] {
        Receiver receiver(results);
        extension::Options options;
        options.requestsDescriptor = ::dup(requests.there.get());
        options.auxiliaryDescriptor = ::dup(auxiliary.there.get());
        requests.here = {}, auxiliary.here = {};
        extension::run(receiver, options);
    });
    requests.there = {}, auxiliary.there = {};
    const auto host = std::make_shared<Host>();
    host->connect(std::move(requests.here), std::move(auxiliary.here));
    atPace(frames, rate, [&](std::size_t number) { host->send(planes[number % planes.size()]); });
    auto times = results.take();
    host->close();
    return times;
}

}  // namespace

int main(int argc, char** argv) {
    const std::string_view way = argc == 4 ? argv[1] : "";
    const int frames = argc == 4 ? std::atoi(argv[2]) : 0;
    const int rate = argc == 4 ? std::atoi(argv[3]) : 0;
    if ((way != "transport" && way != "bare") || frames < 1 || rate < 1)
        return std::fprintf(stderr, "usage: frame_handover transport|bare FRAMES FRAMES-A-SECOND\n"), 2;
    Planes planes;
    for (std::size_t i = 0; i < kPlanesUsed; ++i)
        planes.push_back(std::make_shared<SealedPlane>(static_cast<std::uint8_t>(kFirstGrey + i)));
    return print({way == "bare" ? bareSocket(frames, rate, planes) : transport(frames, rate, planes)});
}
