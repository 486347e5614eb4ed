#include "linux/audio/PulseConnection.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <algorithm>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <thread>
#include <vector>

#include "linux/audio/ServerWatch.h"
#include "linux/ipc/Fd.h"
#include "linux/system/Threads.h"

namespace lumacast::sound {

namespace {

using std::chrono::milliseconds;

/// A socket is there before its server listens.
constexpr milliseconds kAfterSocket{100};

void drain(int descriptor) {
    std::uint64_t count = 0;
    [[maybe_unused]] const ssize_t ignored = ::read(descriptor, &count, sizeof count);
}

}  // namespace

/// What the thread and the owner share; the thread keeps it alive.
class PulseConnection::Core final : public std::enable_shared_from_this<Core> {
public:
    explicit Core(Options options) : options_(std::move(options)) {}

    bool attach(std::shared_ptr<PulseUser> user) {
        const std::lock_guard lock(mutex_);
        if (ended_) return false;
        if (!wake_) wake_.reset(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
        if (!wake_) return false;
        attached_.push_back(user);
        tasks_.emplace_back([this, user] { addUser(user); });
        if (!running_) {
            running_ = startDetachedThread([self = shared_from_this()] { self->run(); });
            if (!running_) {
                attached_.pop_back();
                tasks_.pop_back();
                return false;
            }
        }
        wakeLocked();
        return true;
    }

    void detach(const std::shared_ptr<PulseUser>& user) {
        const std::lock_guard lock(mutex_);
        const auto found = std::find(attached_.begin(), attached_.end(), user);
        if (found == attached_.end()) return;
        attached_.erase(found);
        tasks_.emplace_back([this, user] { removeUser(user); });
        wakeLocked();
    }

    void post(std::function<void()> task) {
        const std::lock_guard lock(mutex_);
        if (attached_.empty()) return;
        tasks_.push_back(std::move(task));
        wakeLocked();
    }

    bool hasThread() const {
        const std::lock_guard lock(mutex_);
        return running_;
    }

    void end() {
        std::unique_lock lock(mutex_);
        ended_ = true;
        for (const auto& user : attached_) tasks_.emplace_back([this, user] { removeUser(user); });
        attached_.clear();
        if (!running_) return;
        wakeLocked();
        if (std::this_thread::get_id() != thread_) stopped_.wait(lock, [this] { return !running_; });
    }

private:
    void wakeLocked() {
        const std::uint64_t one = 1;
        [[maybe_unused]] const ssize_t ignored = ::write(wake_.get(), &one, sizeof one);
    }

    // From here on: on the sound thread.

    void run() {
        {
            const std::lock_guard lock(mutex_);
            thread_ = std::this_thread::get_id();
        }
        while (true) {
            loop_.reset(pa_mainloop_new());
            if (loop_) {
                serve();
            } else {
                // No descriptors left, perhaps later.
                pollfd polled{wake_.get(), POLLIN, 0};
                ::poll(&polled, 1, 1000);
                drain(wake_.get());
                runTasks();
            }
            const std::lock_guard lock(mutex_);
            if (!attached_.empty() || !tasks_.empty()) continue;
            running_ = false;
            thread_ = {};
            stopped_.notify_all();
            return;
        }
    }

    /// Until nobody is attached.
    void serve() {
        api_ = pa_mainloop_get_api(loop_.get());
        pa_io_event* const woken =
            api_->io_new(api_, wake_.get(), PA_IO_EVENT_INPUT,
                         [](pa_mainloop_api*, pa_io_event*, int descriptor, pa_io_event_flags_t, void*) { drain(descriptor); },
                         nullptr);
        if (watch_)
            watch_->resume();
        else
            watch_.emplace(options_.server);
        pa_io_event* const watched =
            watch_->descriptor() < 0 ? nullptr
                                     : api_->io_new(api_, watch_->descriptor(), PA_IO_EVENT_INPUT,
                                                    [](pa_mainloop_api*, pa_io_event*, int, pa_io_event_flags_t, void* self) {
                                                        static_cast<Core*>(self)->serverMayBeThere();
                                                    },
                                                    this);
        {
            PulseTimer retry(*api_, [this] { connect(); });
            PulseTimer givesUp(*api_, [this] { lost_ = true; });
            PulseTimer isMissed(*api_, [this] { tell(false); });
            retry_ = &retry;
            givesUp_ = &givesUp;
            isMissed_ = &isMissed;
            isMissed.start(options_.toldAfter);
            delay_ = options_.firstRetry;
            connect();
            while (true) {
                runTasks();
                if (lost_) lose();
                if (isUnused() || pa_mainloop_iterate(loop_.get(), 1, nullptr) < 0) break;
            }
            lose();
            retry_ = givesUp_ = isMissed_ = nullptr;
        }
        if (watched) api_->io_free(watched);
        watch_->rest();
        api_->io_free(woken);
        loop_.reset();
        api_ = nullptr;
    }

    /// Something has come where its socket is made.
    void serverMayBeThere() {
        if (!watch_->take()) return;
        delay_ = kAfterSocket;
        if (context_) return;  // an attempt that fails is followed by another at once
        retry_->cancel();
        connect();
    }

    bool isUnused() const {
        const std::lock_guard lock(mutex_);
        return attached_.empty() && tasks_.empty();
    }

    void runTasks() {
        std::vector<std::function<void()>> tasks;  // an empty one takes no memory
        {
            const std::lock_guard lock(mutex_);
            tasks.swap(tasks_);
        }
        for (auto& task : tasks) {
            task();
            task = nullptr;
        }
    }

    void connect() {
        const PropertyListHandle properties(pa_proplist_new());
        pa_proplist_sets(properties.get(), PA_PROP_APPLICATION_NAME, options_.applicationName.c_str());
        context_.reset(pa_context_new_with_proplist(api_, nullptr, properties.get()));
        ready_ = false;
        lost_ = false;
        if (!context_) return lose();
        pa_context_set_state_callback(context_.get(), [](pa_context*, void* self) { static_cast<Core*>(self)->stateChanged(); },
                                      this);
        // Nobody starts a server on our account.
        const char* const server = options_.server.empty() ? nullptr : options_.server.c_str();
        if (pa_context_connect(context_.get(), server, PA_CONTEXT_NOAUTOSPAWN, nullptr) < 0) return lose();
        if (context_) givesUp_->start(options_.patience);
    }

    void stateChanged() {
        const pa_context_state_t state = pa_context_get_state(context_.get());
        if (!PA_CONTEXT_IS_GOOD(state)) lost_ = true;  // dealt with outside the library's call
        if (state != PA_CONTEXT_READY || ready_) return;
        ready_ = true;
        delay_ = options_.firstRetry;
        givesUp_->cancel();
        isMissed_->cancel();
        tell(true);
        pa_context_set_subscribe_callback(
            context_.get(),
            [](pa_context*, pa_subscription_event_type_t event, std::uint32_t index, void* core) {
                const auto users = static_cast<Core*>(core)->users_;
                for (const auto& user : users) user->serverChanged(event, index);
            },
            this);
        interest_ = PA_SUBSCRIPTION_MASK_NULL;
        const auto users = users_;
        for (const auto& user : users) introduce(*user);
    }

    void introduce(PulseUser& user) {
        const auto interest = static_cast<pa_subscription_mask_t>(interest_ | user.interest());
        if (interest != interest_) {
            // Unanswered at worst: then the server goes, too.
            if (pa_operation* const operation = pa_context_subscribe(context_.get(), interest, nullptr, nullptr))
                pa_operation_unref(operation);
            interest_ = interest;
        }
        user.serverCame({*context_, *api_});
    }

    /// Lets go of the server, or of the attempt, and tries again later.
    void lose() {
        lost_ = false;
        givesUp_->cancel();
        if (ready_) {
            ready_ = false;
            isMissed_->start(options_.toldAfter);
            const auto users = users_;
            for (const auto& user : users) user->serverWent();
        }
        context_.reset();
        retry_->start(delay_);
        delay_ = std::min(delay_ * 2, watch_->waitsForServer() ? options_.slowestWithoutSocket : options_.slowestRetry);
    }

    /// Each once: one that was never missed has not come back.
    void tell(bool isThere) {
        if (isThere == !toldMissing_) return;
        toldMissing_ = !isThere;
        if (options_.tell) options_.tell(isThere);
    }

    void addUser(const std::shared_ptr<PulseUser>& user) {
        users_.push_back(user);
        if (ready_) introduce(*user);
    }

    void removeUser(const std::shared_ptr<PulseUser>& user) {
        const auto found = std::find(users_.begin(), users_.end(), user);
        if (found == users_.end()) return;
        users_.erase(found);
        if (ready_) user->serverWent();
    }

    const Options options_;

    mutable std::mutex mutex_;
    std::condition_variable stopped_;
    Fd wake_;
    std::vector<std::shared_ptr<PulseUser>> attached_;
    std::vector<std::function<void()>> tasks_;
    bool running_ = false, ended_ = false;
    std::thread::id thread_;

    MainLoopHandle loop_;
    pa_mainloop_api* api_ = nullptr;
    ContextHandle context_;
    bool ready_ = false, lost_ = false, toldMissing_ = false;
    pa_subscription_mask_t interest_ = PA_SUBSCRIPTION_MASK_NULL;
    std::vector<std::shared_ptr<PulseUser>> users_;
    /// From the first thread on: a thread that closed it could be kept from ending for seconds, and the next recording's
    /// sound with it.
    std::optional<ServerWatch> watch_;
    PulseTimer* retry_ = nullptr;
    PulseTimer* givesUp_ = nullptr;
    PulseTimer* isMissed_ = nullptr;
    milliseconds delay_{0};
};

PulseConnection::PulseConnection(Options options) : core_(std::make_shared<Core>(std::move(options))) {}
void PulseConnection::end() { core_->end(); }
bool PulseConnection::attach(std::shared_ptr<PulseUser> user) { return core_->attach(std::move(user)); }
void PulseConnection::detach(const std::shared_ptr<PulseUser>& user) { core_->detach(user); }
void PulseConnection::post(std::function<void()> task) { core_->post(std::move(task)); }
bool PulseConnection::hasThread() const { return core_->hasThread(); }

void PulseTimer::start(milliseconds delay) {
    cancel();
    timeval moment{};
    pa_timeval_add(pa_gettimeofday(&moment), static_cast<pa_usec_t>(delay.count()) * PA_USEC_PER_MSEC);
    event_ = loop_.time_new(
        &loop_, &moment,
        [](pa_mainloop_api*, pa_time_event*, const timeval*, void* timer) {
            auto& self = *static_cast<PulseTimer*>(timer);
            self.cancel();
            self.task_();
        },
        this);
}

void PulseTimer::cancel() {
    if (event_) loop_.time_free(event_);
    event_ = nullptr;
}

}  // namespace lumacast::sound
