// One client of the daemon that asks for its state at a steady rate. It says "ready" once it was answered for the first
// time, then waits: a client that is connected and idle. Each line on standard input
//
//   load RATE SECONDS BEGIN      requests a second; BEGIN is a time of the monotonic clock, in ns
//
// is answered by one line: requests due, answered in time, the longest that this process itself woke too late (us), and
// "us:count" for each round trip, rounded to three digits. The end of the input ends it.
//
// Requests are due at fixed times, whether the ones before were answered or not, and a round trip counts from when its
// request was due. As many as the daemon takes from one connection are under way; the others wait, and their waiting
// counts. What was not answered at the end counts with its age then.
//
//   state_load RUNTIME_DIRECTORY

#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include "base/Limits.h"
#include "base/MessageTables.h"
#include "tests/contract/RawPeer.h"

namespace {

using namespace lumacast;
using std::chrono::nanoseconds;

constexpr char kSocket[] = "/com.orvane.lumacastd.sock";
constexpr std::uint64_t kMostUnderWay = limitOf(Limit::MessagesInFlight);

nanoseconds now() { return std::chrono::steady_clock::now().time_since_epoch(); }

[[noreturn]] void fail(const char* what) {
    std::fprintf(stderr, "state_load: %s\n", what);
    std::exit(1);
}

class Client {
public:
    explicit Client(const std::string& directory) : peer_(directory + kSocket) {
        if (!peer_.hello() || peer_.read(kHelloBytes) != makeHello()) fail("the daemon says no hello");
    }

    void sendOne() {
        append();
        flush();
    }
    void append() {
        const Data frame =
            rawFrame(messageHeader(FrameKind::Request,
                                   static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState), ++sent_),
                     nothing_);
        out_.insert(out_.end(), frame.begin(), frame.end());
    }
    void flush() {
        if (!out_.empty() && !peer_.send(out_)) fail("the daemon has ended the connection");
        out_.clear();
    }
    std::uint64_t sent() const { return sent_; }

    /// Waits until something comes, or so long.
    bool wait(nanoseconds time) {
        const timespec limit{time.count() / 1'000'000'000, time.count() % 1'000'000'000};
        pollfd readable{peer_.descriptor(), POLLIN, 0};
        return ::ppoll(&readable, 1, &limit, nullptr) == 1;
    }
    /// Reads what is there; calls `answered` with the number of each request whose answer it holds.
    template <class Function>
    void read(const Function& answered) {
        std::array<std::uint8_t, 65'536> bytes;
        const ssize_t got = ::recv(peer_.descriptor(), bytes.data(), bytes.size(), 0);
        if (got <= 0) fail("the daemon has ended the connection");
        in_.insert(in_.end(), bytes.begin(), bytes.begin() + got);
        std::size_t at = 0;
        while (in_.size() - at >= kFrameHeaderBytes) {
            FrameHeader header;
            if (readFrameHeader(Bytes(in_).subspan(at, kFrameHeaderBytes), header)) fail("that is no frame");
            const std::size_t size = kFrameHeaderBytes + header.valueBytes + header.recordBytes;
            if (in_.size() - at < size) break;
            if (header.kind == FrameKind::NoReply) fail("a request is not answered");
            if (header.kind == FrameKind::Reply) answered(header.sequence);
            at += size;
        }
        in_.erase(in_.begin(), in_.begin() + static_cast<std::ptrdiff_t>(at));
    }

private:
    RawPeer peer_;
    const Data nothing_ = encoded(Array{});
    Data out_, in_;
    std::uint64_t sent_ = 0;
};

/// Three digits of a time in us.
double rounded(nanoseconds time) {
    const double us = std::max(1e-3, static_cast<double>(time.count()) / 1e3);
    const double unit = std::pow(10.0, std::floor(std::log10(us)) - 2);
    return std::round(us / unit) * unit;
}

/// One stretch of requests.
class Load {
public:
    Load(Client& client, double rate, double seconds, nanoseconds begin)
        : client_(client), interval_(1e9 / rate), begin_(begin),
          end_(begin + nanoseconds(static_cast<std::int64_t>(seconds * 1e9))), first_(client.sent() + 1),
          count_(static_cast<std::uint64_t>(rate * seconds)) {
        times_.reserve(count_);
    }

    void run() {
        while (answered_ < count_ && now() < end_ + kGrace) {
            const nanoseconds time = now();
            const bool over = time >= end_;
            while (!over && next_ < count_ && due(next_) <= time && next_ - answered_ < kMostUnderWay) {
                client_.append();
                ++next_;
            }
            client_.flush();
            if (over && answered_ == next_) break;
            waitForMore(over);
        }
        // Those that were never sent, or not answered: as old as they are. Answers come in the order of the requests.
        const nanoseconds last = now();
        for (std::uint64_t number = answered_; number < count_; ++number) times_.push_back(last - due(number));
    }

    void print() const {
        std::printf("%llu %llu %.1f", static_cast<unsigned long long>(count_),
                    static_cast<unsigned long long>(inTime_), static_cast<double>(lateMost_.count()) / 1e3);
        std::map<double, std::size_t> steps;
        for (const nanoseconds time : times_) ++steps[rounded(time)];
        for (const auto& [time, count] : steps) std::printf(" %.6g:%zu", time, count);
        std::printf("\n");
        std::fflush(stdout);
    }

private:
    /// How long answers are waited for after the end, so that the next stretch begins with none under way.
    static constexpr std::chrono::seconds kGrace{10};

    nanoseconds due(std::uint64_t number) const {
        return begin_ + nanoseconds(static_cast<std::int64_t>(static_cast<double>(number) * interval_));
    }
    void waitForMore(bool over) {
        const bool full = next_ - answered_ >= kMostUnderWay;
        const bool mayAsk = !over && !full && next_ < count_;
        const nanoseconds until = mayAsk ? due(next_) : end_ + kGrace;
        if (client_.wait(std::max(nanoseconds(0), until - now()))) {
            client_.read([this](std::uint64_t sequence) { onAnswer(sequence - first_); });
        } else if (mayAsk) {
            lateMost_ = std::max(lateMost_, now() - due(next_));
        }
    }
    void onAnswer(std::uint64_t number) {
        const nanoseconds time = now();
        times_.push_back(time - due(number));
        if (time <= end_) ++inTime_;
        ++answered_;
    }

    Client& client_;
    const double interval_;
    const nanoseconds begin_, end_;
    const std::uint64_t first_, count_;
    std::uint64_t next_ = 0, answered_ = 0, inTime_ = 0;
    nanoseconds lateMost_{0};
    std::vector<nanoseconds> times_;
};

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: state_load RUNTIME_DIRECTORY\n");
        return 2;
    }
    // Wakes when a request is due, not up to 50 us later.
    ::prctl(PR_SET_TIMERSLACK, 1UL, 0UL, 0UL, 0UL);
    Client client(argv[1]);
    client.sendOne();
    for (bool answered = false; !answered;) client.read([&](std::uint64_t) { answered = true; });
    std::puts("ready");
    std::fflush(stdout);
    std::array<char, 256> line;
    while (std::fgets(line.data(), static_cast<int>(line.size()), stdin)) {
        double rate = 0, seconds = 0;
        long long begin = 0;
        if (std::sscanf(line.data(), "load %lf %lf %lld", &rate, &seconds, &begin) != 3 || rate <= 0 || seconds <= 0)
            fail("load RATE SECONDS BEGIN");
        Load load(client, rate, seconds, nanoseconds(begin));
        load.run();
        load.print();
    }
    return 0;
}
