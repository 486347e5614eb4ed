// An upload extension that does one thing wrong. See README.md.

#include <fcntl.h>
#include <poll.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

#include "broadcast/PayloadKeys.h"
#include "linux/ipc/ExtensionRequests.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/LinuxIpcListener.h"
#include "tests/extension_hostile/Channel.h"

namespace lumacast::hostile {

namespace {

constexpr auto kPing = static_cast<std::uint16_t>(BroadcastDaemonMessage::Ping);
constexpr auto kServiceInfo = static_cast<std::uint16_t>(BroadcastDaemonMessage::UpdateServiceInfo);
constexpr auto kFinish = static_cast<std::uint16_t>(BroadcastDaemonMessage::FinishBroadcastWithError);
constexpr auto kComplete = static_cast<std::uint16_t>(ExtensionRequestHostMessage::CompleteRequest);

Data nested(std::size_t depth) {
    Data bytes;
    for (std::size_t i = 0; i < depth; ++i) bytes.insert(bytes.end(), {9, 1, 0, 0, 0});
    bytes.push_back(0);
    return bytes;
}

ExtensionItem item(std::string_view title, Value value) {
    return {std::string(title), {{std::string(kGenericDataType), std::move(value), std::nullopt}}};
}

[[noreturn]] void waitForever() {
    for (;;) ::pause();
}

class Extension final {
public:
    Extension()
        : home_(std::getenv("HOME")),
          requests_(Fd(kExtensionRequestsDescriptor)),
          auxiliary_(Fd(kExtensionAuxiliaryDescriptor)) {
        std::ifstream(home_ + "/turn") >> turn_;
        report_ = std::fopen((home_ + "/report").c_str(), "a");
    }

    void run() {
        note("here");
        if (isTurn("silent")) waitForever();
        if (isTurn("closes-unheard")) closeAllAndWait();
        requests_.hello();
        auxiliary_.hello();
        if (isTurn("closes-after-hello")) closeAllAndWait();
        for (;;) {
            pollfd ready[]{{requests_.descriptor(), POLLIN, 0},
                           {auxiliary_.descriptor(), POLLIN, 0},
                           {broadcast_ ? broadcast_->descriptor() : -1, POLLIN, 0}};
            if (::poll(ready, 3, -1) < 0) return;
            if (ready[0].revents != 0) onRequest();
            if (ready[1].revents != 0) onEndpoint();
            if (ready[2].revents != 0) onPayload();
        }
    }

private:
    bool isTurn(std::string_view name) const { return turn_ == name; }
    void note(const std::string& line) {
        std::fprintf(report_, "%s\n", line.c_str());
        std::fflush(report_);
    }
    [[noreturn]] void closeAllAndWait() {
        requests_.close();
        auxiliary_.close();
        if (broadcast_) broadcast_->close();
        waitForever();
    }

    void onRequest() {
        const auto frame = requests_.read();
        if (!frame) std::exit(0);
        if (frame->header.kind != FrameKind::Request) return;
        if (isTurn("closes-at-request")) closeAllAndWait();
        if (isTurn("keeps-request")) return;
        requests_.reply(*frame);
        const auto arguments = decodeArray(frame->value, {});
        if (!arguments || arguments->size() != 2) return;
        const auto items = decodeItems(*(*arguments)[1].as<Array>());
        if (items && items->size() > 1) onClip(*(*arguments)[0].as<std::int64_t>());
    }

    void complete(std::int64_t request, const Array& items) {
        requests_.message(kComplete, Array{Value(request), Value(items)});
    }

    void onClip(std::int64_t request) {
        note("clip");
        if (isTurn("never-completes")) return;
        if (isTurn("completes-others"))
            for (std::int64_t other = -1; other < 200; ++other)
                if (other != request) complete(other, {});
        if (isTurn("returns-many")) {
            std::vector<ExtensionItem> many(500, item("x", Value("y")));
            return complete(request, encodeItems(many));
        }
        if (isTurn("returns-none"))
            return complete(request, Array{Value(1), Value("two"), Value(Dictionary{{"title", Value(5)}})});
        if (isTurn("returns-archives")) {
            const auto configuration = [](const Data& archive) {
                return item(kItemBroadcastConfiguration, Value(archive));
            };
            return complete(request, encodeItems({configuration(Data(1000, 0x41)), configuration(Data(200'000, 0xff)),
                                                  configuration(nested(50'000)), configuration(Data{}),
                                                  item(kItemBroadcastConfiguration, Value(7))}));
        }
        if (isTurn("returns-too-much")) {
            requests_.message(kComplete, Data(64, 0), 1U << 30);
            return;
        }
        if (isTurn("floods"))
            for (std::int64_t other = 1000; requests_.message(kComplete, Array{Value(other), Value(Array{})}); ++other)
                std::fprintf(stderr, "flood %ld\n", static_cast<long>(other));
        if (isTurn("guesses")) {
            for (int i = 0; i < 50; ++i)
                requests_.send(FrameKind::ExchangeToken, 0, ++exchanges_, Data(64, static_cast<std::uint8_t>('0' + i)));
            return;
        }
        complete(request, {});
        if (isTurn("completes-twice")) complete(request, encodeItems({item(kItemServiceInfo, Value("again"))}));
    }

    /// Everything that would change memory that was handed over to be read.
    void writeThrough(int descriptor, bool again = true) {
        if (::pwrite(descriptor, "x", 1, 0) == 1) note("GOT AWAY: write");
        if (::ftruncate(descriptor, 1) == 0) note("GOT AWAY: truncate");
        if (::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0) != MAP_FAILED)
            note("GOT AWAY: map");
        void* const map = ::mmap(nullptr, 4096, PROT_READ, MAP_SHARED, descriptor, 0);
        if (map != MAP_FAILED && again && ::mprotect(map, 4096, PROT_READ | PROT_WRITE) == 0) note("GOT AWAY: protect");
        const std::string link = "/proc/self/fd/" + std::to_string(descriptor);
        // Memory can be opened anew for writing; what keeps it from being written then is its seals.
        if (const Fd anew(again ? ::open(link.c_str(), O_RDWR | O_CLOEXEC) : -1); anew) {
            note("opened anew");
            writeThrough(anew.get(), false);
        }
        if (::fcntl(descriptor, F_ADD_SEALS, F_SEAL_FUTURE_WRITE | F_SEAL_GROW) == 0) note("GOT AWAY: seal");
        note("tried to write");
    }

    void onEndpoint() {
        const auto frame = auxiliary_.read();
        if (!frame) std::exit(0);
        if (frame->header.kind != FrameKind::Request || frame->descriptors.size() != 1) return;
        if (isTurn("closes-at-endpoint")) closeAllAndWait();
        const int doorbell = ::fcntl(frame->descriptors.front().get(), F_DUPFD_CLOEXEC, 3);
        const auto endpoint = LinuxIpc::endpointFrom(Fd(doorbell));
        if (!endpoint) return note("no endpoint");
        if (!isTurn("keeps-endpoint")) auxiliary_.reply(*frame);
        std::vector<EndpointCall> calls;
        if (isTurn("rings-often"))
            for (int i = 0; i < 200; ++i) calls.push_back(ringEndpoint(*endpoint));
        broadcast_.emplace(std::move(ringEndpoint(*endpoint).socket));
        ::fcntl(broadcast_->descriptor(), F_SETFL, 0);  // it waits
        broadcast_->hello();
        note("connected");
        if (isTurn("rings-often")) {
            broadcast_->message(kPing, Array{});
            waitForever();  // with all of them
        }
        if (isTurn("no-ping")) return;
        broadcast_->message(kPing, Array{});
        afterPing();
    }

    void afterPing() {
        if (isTurn("closes-after-ping")) closeAllAndWait();
        if (isTurn("floods-info"))
            for (int i = 0; i < 20'000; ++i)
                if (!broadcast_->message(kServiceInfo, Array{Value(Dictionary{{"n", Value(i)}})})) break;
        if (isTurn("floods-pings"))
            for (int i = 0; i < 20'000; ++i) broadcast_->message(kPing, Array{});
        if (isTurn("finishes-often"))
            for (int i = 0; i < 1000; ++i) broadcast_->message(kFinish, Array{Value(Error("hostile", i))});
        if (isTurn("oversized")) broadcast_->message(kServiceInfo, Data(64, 0), 1U << 30);
        if (isTurn("too-deep")) broadcast_->message(kServiceInfo, nested(100'000));
        if (isTurn("ill-typed")) broadcast_->message(kFinish, Array{Value(1.5), Value("text")});
        if (isTurn("unknown")) broadcast_->message(99, Array{});
        if (isTurn("answers-nothing-asked")) broadcast_->send(FrameKind::Reply, 0, 77, Channel::encoded(Array{}));
        if (isTurn("guesses-there")) broadcast_->send(FrameKind::ExchangeToken, 0, 1, Data(64, '0'));
        if (isTurn("guesses-tokens"))
            for (int i = 0; i < 50; ++i)
                requests_.send(FrameKind::ExchangeToken, 0, ++exchanges_, Data(64, static_cast<std::uint8_t>('0' + i)));
        if (isTurn("completes-others"))
            for (std::int64_t other = -1; other < 200; ++other)
                if (other != 1) complete(other, {});
        if (isTurn("forks"))
            for (int i = 0; i < 300; ++i)
                if (::fork() == 0) waitForever();
    }

    void onPayload() {
        auto frame = broadcast_->read();
        if (!frame) std::exit(0);
        if (frame->header.kind != FrameKind::Request) return;
        const bool isPicture = !frame->descriptors.empty();
        note(isPicture ? "frame" : "payload");
        if (isTurn("closes-at-payload")) closeAllAndWait();
        if (isTurn("writes") && isPicture) writeThrough(frame->descriptors.front().get());
        if (isTurn("keeps-frames") && isPicture) return kept_.push_back(std::move(*frame));
        broadcast_->reply(*frame);
        if (isTurn("answers-twice")) broadcast_->reply(*frame);
        if (isTurn("keeps-planes") && isPicture) return kept_.push_back(std::move(*frame));
        const auto records = readRecords(frame->records, frame->header.handles);
        if (!records) return;
        for (const HandleRecord& record : *records)
            if (const auto* plane = std::get_if<PlaneRecord>(&record))
                broadcast_->send(FrameKind::PlaneReturned, 0, plane->lease, {});
    }

    const std::string home_;
    std::string turn_;
    std::FILE* report_ = nullptr;
    Channel requests_, auxiliary_;
    std::optional<Channel> broadcast_;
    std::vector<Channel::Frame> kept_;
    std::uint64_t exchanges_ = 0;
};

}  // namespace

}  // namespace lumacast::hostile

int main() {
    lumacast::hostile::Extension().run();
}
