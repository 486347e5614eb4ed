// How long a frame takes to an upload extension: from the moment it is handed over to the moment the extension's
// handler has it with its pixels mapped, between two processes, over the transport and the library that extensions
// link. Beside it the same memory over a bare socket with blocking calls (a descriptor and eight bytes, mapped on
// arrival). In alternation. Prints microseconds.
//
//   frame_handover [frames of a run] [runs] [frames a second]

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <future>
#include <memory>
#include <thread>
#include <utility>
#include <vector>

#include "base/Log.h"
#include "broadcast/PayloadKeys.h"
#include "client/extension/Extension.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"
#include "writer/media/SampleBuffer.h"

namespace {

using namespace lumacast;

constexpr std::int32_t kWidth = 1920, kHeight = 1080;
constexpr std::size_t kPlanesUsed = 4;

std::int64_t now() {
    return std::chrono::steady_clock::now().time_since_epoch().count();
}

/// Frame memory as the capture makes it: whoever gets the descriptor can only read.
class SealedPlane final : public SharedPlane {
public:
    explicit SealedPlane(std::uint8_t grey) : descriptor_(::memfd_create("plane", MFD_CLOEXEC | MFD_ALLOW_SEALING)) {
        if (!descriptor_ || ::ftruncate(descriptor_.get(), kBytes) != 0) std::exit(1);
        void* const memory = ::mmap(nullptr, kBytes, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor_.get(), 0);
        if (memory == MAP_FAILED) std::exit(1);
        pixels_ = static_cast<std::uint8_t*>(memory);
        std::memset(pixels_, grey, kBytes);
        ::fcntl(descriptor_.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_FUTURE_WRITE | F_SEAL_SEAL);
    }
    ~SealedPlane() override { ::munmap(pixels_, kBytes); }
    std::int32_t width() const override { return kWidth; }
    std::int32_t height() const override { return kHeight; }
    std::size_t stride() const override { return kStride; }
    std::span<const std::uint8_t> pixels() const override { return {pixels_, kBytes}; }
    std::span<const PixelRect> damage() const override { return {&whole_, 1}; }
    std::uint64_t pictureNumber() const override { return 1; }
    int descriptor() const override { return descriptor_.get(); }

    static constexpr std::size_t kStride = std::size_t{kWidth} * 4;
    static constexpr std::size_t kBytes = kStride * kHeight;

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

/// A child process that runs `body`; ended by its number.
class Child {
public:
    explicit Child(const std::function<void()>& body) : pid_(::fork()) {
        if (pid_ != 0) return;
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        body();
        ::_exit(0);
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }

private:
    const pid_t pid_;
};

using Planes = std::vector<std::shared_ptr<SealedPlane>>;

/// Calls `send` at the pace of a recording, with the planes taking turns.
void atPace(int frames, int rate, const Planes& planes,
            const std::function<void(const std::shared_ptr<SealedPlane>&)>& send) {
    auto next = std::chrono::steady_clock::now();
    for (int i = 0; i < frames; ++i) {
        next += std::chrono::nanoseconds(1'000'000'000 / rate);
        std::this_thread::sleep_until(next);
        send(planes[static_cast<std::size_t>(i) % planes.size()]);
    }
}

/// What the other process measured, in memory that both see.
class Results final {
public:
    explicit Results(int frames) : frames_(static_cast<std::size_t>(frames)) {
        void* const memory = ::mmap(nullptr, bytes(), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (memory == MAP_FAILED) std::exit(1);
        shared_ = static_cast<Shared*>(memory);
    }
    Results(const Results&) = delete;
    Results& operator=(const Results&) = delete;
    ~Results() { ::munmap(shared_, bytes()); }

    void add(std::int64_t sent, std::int64_t arrived) {
        const std::size_t index = shared_->count.load(std::memory_order_relaxed);
        if (index == frames_) return;
        shared_->microseconds[index] = static_cast<double>(arrived - sent) / 1e3;
        shared_->count.store(index + 1, std::memory_order_release);
    }
    /// Those of all frames, or of what has come when the last is a second late.
    std::vector<double> take() const {
        for (int patience = 0; patience < 100 && shared_->count.load(std::memory_order_acquire) < frames_; ++patience)
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        return {shared_->microseconds, shared_->microseconds + shared_->count.load(std::memory_order_acquire)};
    }

private:
    struct Shared {
        std::atomic<std::size_t> count;
        double microseconds[1];  // as many as there are frames
    };
    std::size_t bytes() const { return sizeof(Shared) + frames_ * sizeof(double); }

    const std::size_t frames_;
    Shared* shared_ = nullptr;
};

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
            void* const memory = ::mmap(nullptr, SealedPlane::kBytes, PROT_READ, MAP_SHARED, descriptor, 0);
            const std::int64_t arrived = now();
            if (memory == MAP_FAILED) ::_exit(1);
            results.add(sent, arrived);
            ::munmap(memory, SealedPlane::kBytes);
            ::close(descriptor);
        }
    });
    atPace(frames, rate, planes, [&](const std::shared_ptr<SealedPlane>& plane) {
        alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
        std::int64_t sent = now();
        iovec part{&sent, sizeof sent};
        msghdr message{};
        message.msg_iov = &part, message.msg_iovlen = 1;
        message.msg_control = control, message.msg_controllen = sizeof control;
        cmsghdr* const header = CMSG_FIRSTHDR(&message);
        header->cmsg_level = SOL_SOCKET, header->cmsg_type = SCM_RIGHTS, header->cmsg_len = CMSG_LEN(sizeof(int));
        const int descriptor = plane->descriptor();
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
        const bool isThere = frame.plane->pixels().size() == SealedPlane::kBytes;
        const std::int64_t arrived = now();
        if (!isThere) ::_exit(1);
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
    atPace(frames, rate, planes, [&](const std::shared_ptr<SealedPlane>& plane) { host->send(plane); });
    auto times = results.take();
    host->close();
    return times;
}

void print(const char* name, std::vector<double> times) {
    std::sort(times.begin(), times.end());
    if (times.empty()) return;
    std::printf("%-12s %6zu frames  p50 %8.1f  p99 %8.1f  max %8.1f\n", name, times.size(), times[times.size() / 2],
                times[times.size() * 99 / 100], times.back());
}

}  // namespace

int main(int argc, char** argv) {
    const int frames = argc > 1 ? std::atoi(argv[1]) : 600;
    const int runs = argc > 2 ? std::atoi(argv[2]) : 3;
    const int rate = argc > 3 ? std::atoi(argv[3]) : 30;
    if (frames < 1 || runs < 1 || rate < 1)
        return std::fprintf(stderr, "frame_handover [frames] [runs] [a second]\n"), 2;
    Planes planes;
    for (std::size_t i = 0; i < kPlanesUsed; ++i)
        planes.push_back(std::make_shared<SealedPlane>(static_cast<std::uint8_t>(i)));
    std::vector<double> bare, ours;
    for (int run = 0; run < runs; ++run) {
        for (double time : bareSocket(frames, rate, planes)) bare.push_back(time);
        for (double time : transport(frames, rate, planes)) ours.push_back(time);
    }
    print("bare socket", bare);
    print("transport", ours);
    const auto expected = static_cast<std::size_t>(frames) * static_cast<std::size_t>(runs);
    return ours.size() == expected && bare.size() == expected ? 0 : 1;
}
