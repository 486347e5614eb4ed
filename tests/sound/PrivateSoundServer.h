#pragma once
// Sound servers of a test's own, without devices: PulseAudio, or PipeWire in its place.

#include <memory>
#include <string>
#include <vector>

#include "tests/sound/SoundProcess.h"

namespace lumacast::test {

/// A sound server with two outputs, "null0" (where everything goes) and "null1", that plays to nobody. Its sockets and
/// files lie in a directory of its own; it has gone when this object has. One that has ended by itself by then fails the
/// test that it was made in, and says how: what was silent since was not the daemon's doing.
class SoundServer {
public:
    virtual ~SoundServer() = default;
    /// As in $PULSE_SERVER: for every process that is to use it.
    virtual std::string address() const = 0;
    /// What a user would call it, with its version.
    virtual std::string name() const = 0;
    /// Whether it accepts clients.
    virtual bool isThere() const = 0;
    /// Starts it, also again after kill(), at the same address; whether applications can play.
    virtual bool start() = 0;
    /// Ends it at once.
    virtual void kill() = 0;
    /// Lets it hang, and go on.
    virtual void hang() = 0;
    virtual void goOn() = 0;
};

/// PulseAudio, without real-time priority, which root's would have: the kernel kills it when it then computes for 200 ms
/// without a rest. Started by the constructor unless told otherwise.
class PrivateSoundServer final : public SoundServer {
public:
    enum class Begin { Now, Later };
    explicit PrivateSoundServer(Begin begin = Begin::Now);
    ~PrivateSoundServer() override;

    std::string address() const override { return "unix:" + directory_ + "/pulse/native"; }
    std::string name() const override;
    bool isThere() const override;
    bool start() override;
    void kill() override;
    void hang() override;
    void goOn() override;

private:
    std::string directory_;
    std::unique_ptr<SoundProcess> server_;
};

/// PipeWire with WirePlumber and its own PulseAudio service, without D-Bus and without PulseAudio.
class PrivatePipeWire final : public SoundServer {
public:
    explicit PrivatePipeWire(PrivateSoundServer::Begin begin = PrivateSoundServer::Begin::Now);
    ~PrivatePipeWire() override;

    std::string address() const override { return "unix:" + directory_ + "/run/pulse/native"; }
    std::string name() const override;
    bool isThere() const override;
    bool start() override;
    void kill() override;
    void hang() override;
    void goOn() override;
    /// For native clients: the variables with which they find it.
    std::vector<std::string> environment() const;

private:
    std::string directory_;
    std::vector<std::unique_ptr<SoundProcess>> servers_;
};

}  // namespace lumacast::test
