#pragma once
// A display whose monitors can be turned off.

#include <atomic>
#include <cstdint>
#include <string>
#include <thread>
#include <vector>

#include "linux/display/Wake.h"
#include "linux/ipc/Fd.h"

namespace lumacast::test {

/// Headless servers know nothing of a monitor's power. This stands between them and a client under another name, passes
/// everything on, and adds the extension that tells of it: a question for the power goes to the server as another one
/// of the same length, whose answer is rewritten. For one client at a time.
class PoweredDisplay final {
public:
    enum Power : std::uint16_t { On, Standby, Suspend, Off };

    /// `behind` is the server's name, as in $DISPLAY.
    explicit PoweredDisplay(const std::string& behind);
    ~PoweredDisplay();
    PoweredDisplay(const PoweredDisplay&) = delete;
    PoweredDisplay& operator=(const PoweredDisplay&) = delete;

    const std::string& name() const { return name_; }
    void set(Power power) { power_ = power; }
    /// How often it was asked for.
    int questions() const { return questions_; }

private:
    using Bytes = std::vector<std::uint8_t>;
    struct Relay;
    void serve();
    void relay(Fd client);
    bool passRequests(Relay& relay);
    bool passAnswers(Relay& relay);

    const std::string behind_;
    std::string name_;
    Fd listener_;
    std::atomic<std::uint16_t> power_{On};
    std::atomic<int> questions_{0};
    x11::Wake over_;
    std::thread thread_;
};

}  // namespace lumacast::test
