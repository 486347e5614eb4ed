#include "linux/admin/LinuxAdminService.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <list>
#include <mutex>
#include <set>
#include <sstream>
#include <vector>

#include "linux/admin/UnixSocket.h"
#include "linux/ipc/QuietThread.h"
#include "linux/system/Json.h"

namespace lumacast {

namespace {

using Moment = std::chrono::steady_clock::time_point;

constexpr std::size_t kMaximumPeers = 8;
/// A command with a path of 4096 bytes, each written as three.
constexpr std::size_t kMaximumRequest = 16 * 1024;

using Commands = std::map<std::string, AdminCommand, std::less<>>;

/// Where the main queue leaves its newest snapshot, and commands their answers. Outlives the server as long as a question
/// is under way.
struct Mailbox {
    std::mutex mutex;
    std::optional<Dictionary> snapshot;
    std::uint64_t question = 0;  ///< the one it answers, and so all before it
    bool closed = false;
    std::size_t asked = 0;  ///< questions the main queue has not answered
    std::map<std::uint64_t, Dictionary> answers;   ///< of commands, by their question
    std::set<std::uint64_t> commandsUnderWay;     ///< whose answer has not come
    Fd arrived{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
};

struct Peer {
    enum class State { Asking, Waiting, Reading };
    Fd socket;
    State state = State::Asking;
    Moment deadline;
    std::string request;
    std::uint64_t question = 0;  ///< the snapshot that is new enough for this peer, or its command
    bool waitsForCommand = false;
    bool isStillToBeAsked = false;
    std::string reply;
};

std::string errorReply(std::string_view reason) { return jsonText(Dictionary{{"error", reason}}) + "\n"; }

std::string replyTo(const std::string& request, const Dictionary& snapshot) {
    if (request == "status") return jsonText(snapshot) + "\n";
    const Value* entry = snapshot.find(request);
    return entry ? jsonText(*entry) + "\n" : errorReply("unknown request");
}

std::vector<std::string> wordsOf(const std::string& request) {
    std::istringstream text(request);
    std::vector<std::string> words;
    for (std::string word; text >> word;) words.push_back(word);
    return words;
}

void raise(const Fd& event) {
    const std::uint64_t one = 1;
    (void)!::write(event.get(), &one, sizeof one);  // fails only when it is raised already
}

void lower(const Fd& event) {
    std::uint64_t count = 0;
    (void)!::read(event.get(), &count, sizeof count);
}

}  // namespace

class LinuxAdminService::Server {
public:
    Server(Scheduler& scheduler, const Limits& limits, Commands commands, std::function<Dictionary()> snapshot,
           Fd listener)
        : scheduler_(scheduler),
          limits_(limits),
          commands_(std::move(commands)),
          snapshot_(std::move(snapshot)),
          listener_(std::move(listener)) {}

    bool isComplete() const { return listener_ && end_ && mailbox_->arrived; }
    void requestEnd() { raise(end_); }

    /// Serves until requestEnd.
    void run() {
        while (true) {
            std::vector<pollfd> waited{{end_.get(), POLLIN, 0}, {mailbox_->arrived.get(), POLLIN, 0}};
            const bool room = peers_.size() < kMaximumPeers;
            waited.push_back({room ? listener_.get() : -1, POLLIN, 0});
            for (const Peer& peer : peers_) {
                const short events = peer.state == Peer::State::Asking    ? POLLIN
                                     : peer.state == Peer::State::Reading ? POLLOUT
                                                                          : 0;
                waited.push_back({peer.socket.get(), events, 0});
            }
            if (::poll(waited.data(), waited.size(), timeout()) < 0 && errno != EINTR) break;
            if (waited[0].revents != 0) break;
            if (waited[1].revents != 0) takeAnswers();
            std::size_t index = 3;
            for (auto peer = peers_.begin(); peer != peers_.end(); ++index)
                peer = serve(*peer, waited[index].revents) ? std::next(peer) : peers_.erase(peer);
            if (waited[2].revents != 0) accept();
        }
        const std::lock_guard lock(mailbox_->mutex);
        mailbox_->closed = true;
    }

private:
    int timeout() const {
        if (peers_.empty()) return -1;
        const auto earliest = std::min_element(peers_.begin(), peers_.end(), [](const Peer& a, const Peer& b) {
                                  return a.deadline < b.deadline;
                              })->deadline;
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(earliest - std::chrono::steady_clock::now());
        return static_cast<int>(std::max<std::int64_t>(0, left.count()));
    }

    static Moment in(std::chrono::milliseconds limit) { return std::chrono::steady_clock::now() + limit; }

    void accept() {
        Fd socket(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
        if (!socket) return;
        const auto user = peerUser(socket.get());
        if (!user || (*user != ::geteuid() && *user != 0)) return;
        Peer peer;
        peer.socket = std::move(socket);
        peer.deadline = in(limits_.request);
        peers_.push_back(std::move(peer));
    }

    /// False when the peer is done with.
    bool serve(Peer& peer, short events) {
        if ((events & (POLLERR | POLLNVAL)) != 0) return false;
        if ((events & POLLHUP) != 0 && peer.state != Peer::State::Asking) return false;
        if (peer.state == Peer::State::Asking && (events & (POLLIN | POLLHUP)) != 0 && !readRequest(peer)) return false;
        if (std::chrono::steady_clock::now() >= peer.deadline) {
            if (peer.state != Peer::State::Waiting) return false;
            reply(peer, errorReply("the daemon is busy"));
        }
        if (peer.state == Peer::State::Reading) return writeReply(peer);
        return true;
    }

    bool readRequest(Peer& peer) {
        std::array<char, kMaximumRequest + 1> buffer;
        const ssize_t count = ::recv(peer.socket.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
        if (count < 0) return errno == EAGAIN || errno == EINTR;
        if (count == 0) return false;
        peer.request.append(buffer.data(), static_cast<std::size_t>(count));
        const std::size_t newline = peer.request.find('\n');
        if (std::min(newline, peer.request.size()) > kMaximumRequest) {
            reply(peer, errorReply("the request is too long"));
        } else if (newline != std::string::npos) {
            peer.request.resize(newline);
            if (peer.request.ends_with('\r')) peer.request.pop_back();
            ask(peer);
        }
        return true;
    }

    void ask(Peer& peer) {
        peer.state = Peer::State::Waiting;
        peer.question = ++questions_;
        std::vector<std::string> words = wordsOf(peer.request);
        const auto command = words.empty() ? commands_.end() : commands_.find(words.front());
        peer.waitsForCommand = command != commands_.end();
        peer.deadline = in(peer.waitsForCommand ? limits_.command : limits_.snapshot);
        if (peer.waitsForCommand) {
            words.erase(words.begin());
            submit(peer, command->second, std::move(words));
        } else {
            submitQuestion(peer);
        }
    }

    void submit(Peer& peer, const AdminCommand& command, std::vector<std::string> arguments) {
        {
            const std::lock_guard lock(mailbox_->mutex);
            if (mailbox_->commandsUnderWay.size() == kMaximumPeers)
                return reply(peer, errorReply("the daemon is busy with other commands"));
            mailbox_->commandsUnderWay.insert(peer.question);
        }
        AdminAnswer answer = [mailbox = mailbox_, question = peer.question](Dictionary result) {
            const std::lock_guard lock(mailbox->mutex);
            if (mailbox->commandsUnderWay.erase(question) == 0 || mailbox->closed) return;
            mailbox->answers.emplace(question, std::move(result));
            raise(mailbox->arrived);
        };
        scheduler_.mainQueue().async([mailbox = mailbox_, command, arguments = std::move(arguments),
                                      answer = std::move(answer)] {
            {
                const std::lock_guard lock(mailbox->mutex);
                if (mailbox->closed) return;
            }
            command(arguments, answer);
        });
    }

    void submitQuestion(Peer& peer) {
        {
            // A main queue that does not answer must not be heaped with questions; this one is put when others were
            // answered (they may be of peers that have left), or the peer is told that the daemon is busy.
            const std::lock_guard lock(mailbox_->mutex);
            peer.isStillToBeAsked = mailbox_->asked == kMaximumPeers;
            if (peer.isStillToBeAsked) return;
            ++mailbox_->asked;
        }
        scheduler_.mainQueue().async([mailbox = mailbox_, snapshot = snapshot_, question = peer.question] {
            {
                const std::lock_guard lock(mailbox->mutex);
                if (mailbox->closed) return;
            }
            Dictionary answer = snapshot();
            const std::lock_guard lock(mailbox->mutex);
            --mailbox->asked;
            mailbox->snapshot = std::move(answer);
            mailbox->question = question;
            raise(mailbox->arrived);
        });
    }

    /// A snapshot answers all who asked no later than it was asked for, a command the one who gave it.
    void takeAnswers() {
        lower(mailbox_->arrived);
        std::optional<Dictionary> snapshot;
        std::uint64_t question = 0;
        std::map<std::uint64_t, Dictionary> answers;
        {
            const std::lock_guard lock(mailbox_->mutex);
            snapshot = std::exchange(mailbox_->snapshot, std::nullopt);
            question = mailbox_->question;
            answers.swap(mailbox_->answers);
        }
        for (Peer& peer : peers_) {
            if (peer.state != Peer::State::Waiting) continue;
            if (const auto answer = answers.find(peer.question); answer != answers.end())
                reply(peer, jsonText(answer->second) + "\n");
            else if (snapshot && !peer.waitsForCommand && peer.question <= question)
                reply(peer, replyTo(peer.request, *snapshot));
            else if (peer.isStillToBeAsked)
                submitQuestion(peer);
        }
    }

    void reply(Peer& peer, std::string text) const {
        peer.state = Peer::State::Reading;
        peer.deadline = in(limits_.reply);
        peer.reply = std::move(text);
    }

    static bool writeReply(Peer& peer) {
        const ssize_t count =
            ::send(peer.socket.get(), peer.reply.data(), peer.reply.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0) return errno == EAGAIN || errno == EINTR;
        peer.reply.erase(0, static_cast<std::size_t>(count));
        return !peer.reply.empty();
    }

    Scheduler& scheduler_;
    const Limits limits_;
    const Commands commands_;
    const std::function<Dictionary()> snapshot_;
    const Fd listener_;
    const Fd end_{::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)};
    const std::shared_ptr<Mailbox> mailbox_ = std::make_shared<Mailbox>();
    std::list<Peer> peers_;
    std::uint64_t questions_ = 0;
};

LinuxAdminService::LinuxAdminService(Scheduler& scheduler, std::string socketPath, Limits limits,
                                     Unavailable unavailable)
    : scheduler_(scheduler),
      socketPath_(std::move(socketPath)),
      limits_(limits),
      unavailable_(std::move(unavailable)) {}

LinuxAdminService::~LinuxAdminService() {
    if (!thread_.joinable()) return;
    server_->requestEnd();
    thread_.join();
    ::unlink(socketPath_.c_str());
}

void LinuxAdminService::addCommand(std::string name, AdminCommand command) {
    commands_[std::move(name)] = std::move(command);
}

void LinuxAdminService::resume(std::function<Dictionary()> snapshot) {
    if (thread_.joinable()) return;
    std::string reason;
    Fd listener = listenAt(socketPath_, reason);
    if (listener) {
        server_ = std::make_unique<Server>(scheduler_, limits_, commands_, std::move(snapshot), std::move(listener));
        // isAnswering() tells whether there was a thread to be had.
        if (server_->isComplete()) thread_ = quietThreadIfAny([server = server_.get()] { server->run(); });
        if (!thread_.joinable()) reason = "no thread or no descriptor is left";
    }
    if (!thread_.joinable() && unavailable_) unavailable_(reason);
}

std::optional<std::string> askAdminService(const std::string& socketPath, std::string_view request,
                                           std::chrono::milliseconds limit) {
    const auto deadline = std::chrono::steady_clock::now() + limit;
    Fd socket = connectTo(socketPath);
    while (!socket && errno == EAGAIN && std::chrono::steady_clock::now() < deadline) {  // others wait to be heard
        ::poll(nullptr, 0, 5);
        socket = connectTo(socketPath);
    }
    const std::string line = std::string(request) + "\n";
    if (!socket || ::send(socket.get(), line.data(), line.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(line.size()))
        return std::nullopt;
    std::string answer;
    while (!answer.ends_with('\n')) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
        pollfd waited{socket.get(), POLLIN, 0};
        if (left.count() <= 0 || ::poll(&waited, 1, static_cast<int>(left.count())) <= 0) return std::nullopt;
        std::array<char, 4096> buffer;
        const ssize_t count = ::recv(socket.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
        if (count <= 0) return std::nullopt;
        answer.append(buffer.data(), static_cast<std::size_t>(count));
    }
    answer.pop_back();
    return answer;
}

}  // namespace lumacast
