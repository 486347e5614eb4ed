// The round trip of a state request, as a client measures it: to the daemon, or to a service on a message bus that
// answers the same seven keys. Prints the times of all of them, in microseconds, one per line. compare_state_requests
// drives it.
//
//   state_round_trip daemon RUNTIME_DIRECTORY COUNT
//   state_round_trip bus COUNT            over $DBUS_SESSION_BUS_ADDRESS
//   state_round_trip serve                the service on that bus; prints "ready"

#include <systemd/sd-bus.h>

#include <array>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/Log.h"
#include "base/MessageTables.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/Reactor.h"

namespace {

using namespace lumacast;
using Clock = std::chrono::steady_clock;

constexpr char kService[] = "org.lumacast.Bench", kPath[] = "/org/lumacast/Bench", kMember[] = "State";
constexpr std::array kKeys{"isRecording",
                           "isBroadcasting",
                           "microphoneEnabled",
                           "isSystemRecording",
                           "hasUserConsentForMicrophone",
                           "hasUserConsentForCamera",
                           "microphoneEnabledPersistent"};

[[noreturn]] void fail(const char* what) {
    std::fprintf(stderr, "state_round_trip: %s\n", what);
    std::exit(1);
}

void check(int result, const char* what) {
    if (result < 0) fail(what);
}

void print(const std::vector<Clock::duration>& times) {
    for (const auto time : times) std::printf("%.2f\n", std::chrono::duration<double, std::micro>(time).count());
}

/// Asks the next question when the last was answered.
class Asker {
public:
    Asker(Reactor& reactor, IpcConnection& connection, int count)
        : reactor_(reactor), connection_(connection), left_(count) {}

    void ask() {
        begin_ = Clock::now();
        connection_.remoteProxy([](const Error&) { fail("the connection was lost"); })
            ->send(static_cast<std::uint16_t>(DaemonMessage::SynchronousGetCurrentState), {},
                   [this](const Array& values) {
                       times.push_back(Clock::now() - begin_);
                       const Dictionary* state = values.at(0).as<Dictionary>();
                       if (!state || state->size() != kKeys.size()) fail("that is no state");
                       if (--left_ > 0) return ask();
                       reactor_.requestStop();
                   });
    }
    std::vector<Clock::duration> times;

private:
    Reactor& reactor_;
    IpcConnection& connection_;
    int left_;
    Clock::time_point begin_;
};

void askDaemon(const std::string& directory, int count) {
    Reactor reactor;
    Log log;
    LinuxIpc ipc(reactor, log, {directory});
    const auto connection = ipc.connectToService("com.orvane.lumacastd");
    connection->setRemoteInterface(daemonProtocol());
    connection->resume();
    Asker asker(reactor, *connection, count);
    asker.ask();
    reactor.run();
    print(asker.times);
}

struct Unref {
    void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
    void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Bus = std::unique_ptr<sd_bus, Unref>;
using Message = std::unique_ptr<sd_bus_message, Unref>;

Bus openBus() {
    sd_bus* bus = nullptr;
    check(sd_bus_open_user(&bus), "no bus");
    return Bus(bus);
}

void askBus(int count) {
    const Bus bus = openBus();
    std::vector<Clock::duration> times;
    for (int i = 0; i < count; ++i) {
        const auto begin = Clock::now();
        sd_bus_message* answer = nullptr;
        check(sd_bus_call_method(bus.get(), kService, kPath, kService, kMember, nullptr, &answer, ""), "no answer");
        const Message held(answer);
        std::size_t keys = 0;
        check(sd_bus_message_enter_container(answer, 'a', "{sv}"), "no dictionary");
        while (sd_bus_message_enter_container(answer, 'e', "sv") > 0) {
            const char* key = nullptr;
            int value = 0;
            check(sd_bus_message_read(answer, "s", &key), "no key");
            check(sd_bus_message_read(answer, "v", "b", &value), "no value");
            check(sd_bus_message_exit_container(answer), "no end");
            ++keys;
        }
        times.push_back(Clock::now() - begin);
        if (keys != kKeys.size()) fail("that is no state");
    }
    print(times);
}

int answerState(sd_bus_message* request, void*, sd_bus_error*) {
    sd_bus_message* answer = nullptr;
    if (const int failed = sd_bus_message_new_method_return(request, &answer); failed < 0) return failed;
    const Message held(answer);
    if (const int failed = sd_bus_message_open_container(answer, 'a', "{sv}"); failed < 0) return failed;
    for (const char* key : kKeys)
        if (const int failed = sd_bus_message_append(answer, "{sv}", key, "b", 0); failed < 0) return failed;
    if (const int failed = sd_bus_message_close_container(answer); failed < 0) return failed;
    return sd_bus_send(nullptr, answer, nullptr);
}

[[noreturn]] void serveBus() {
    static const sd_bus_vtable table[] = {SD_BUS_VTABLE_START(0),
                                          SD_BUS_METHOD(kMember, "", "a{sv}", answerState, SD_BUS_VTABLE_UNPRIVILEGED),
                                          SD_BUS_VTABLE_END};
    const Bus bus = openBus();
    check(sd_bus_add_object_vtable(bus.get(), nullptr, kPath, kService, table, nullptr), "no object");
    check(sd_bus_request_name(bus.get(), kService, 0), "the name is taken");
    std::puts("ready");
    std::fflush(stdout);
    for (;;) {
        const int did = sd_bus_process(bus.get(), nullptr);
        check(did, "the bus has gone");
        if (did == 0) check(sd_bus_wait(bus.get(), UINT64_MAX), "the bus has gone");
    }
}

}  // namespace

int main(int argc, char** argv) {
    const std::string_view what = argc > 1 ? argv[1] : "";
    if (what == "serve" && argc == 2) serveBus();
    if (what == "bus" && argc == 3) return askBus(std::atoi(argv[2])), 0;
    if (what == "daemon" && argc == 4) return askDaemon(argv[2], std::atoi(argv[3])), 0;
    std::fprintf(stderr, "usage: state_round_trip daemon RUNTIME_DIRECTORY COUNT | bus COUNT | serve\n");
    return 2;
}
