#pragma once
// A web and media server of the test's own: a process on this machine's loopback, ended with the test.

#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "linux/ipc/Fd.h"
#include "tests/checkers/tests/Child.h"
#include "tests/client/WaitUntil.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {

/// Takes PUT, DELETE and GET below `url()` (files in `files()`), and RTMP at `rtmpURL()`, which it records in
/// `recordings()`.
class PrivateNginx final {
public:
    PrivateNginx() : httpPort_(freePort()), rtmpPort_(freePort()) {
        for (const char* folder : {"www", "temp"}) scratch_.makeDirectory(folder);
        start();
    }

    ~PrivateNginx() { stop(); }
    PrivateNginx(const PrivateNginx&) = delete;
    PrivateNginx& operator=(const PrivateNginx&) = delete;

    /// After stop(): the same server on the same ports.
    void start() {
        ++starts_;
        scratch_.makeDirectory("recordings-" + std::to_string(starts_));
        scratch_.write("nginx.conf", configuration());
        process_ = std::make_unique<checkers::Child>(
            std::vector<std::string>{"/usr/sbin/nginx", "-p", scratch_.path(), "-c", scratch_.path("nginx.conf"), "-e",
                                     scratch_.path("error.log")},
            std::vector<std::string>{}, scratch_.path("stderr.log"));
        EXPECT_TRUE(waitUntil([&] { return isListening(httpPort_) && isListening(rtmpPort_); })) << log();
    }
    /// Ends it, and every connection with it.
    void stop() {
        if (process_) ::kill(process_->pid(), SIGKILL);
        process_ = nullptr;
    }

    /// It does nothing any more, and its connections stay.
    void hang() { ::kill(process_->pid(), SIGSTOP); }

    std::string url() const { return "http://127.0.0.1:" + std::to_string(httpPort_) + "/live/"; }
    std::string rtmpURL(const std::string& name) const {
        return "rtmp://127.0.0.1:" + std::to_string(rtmpPort_) + "/live/" + name;
    }
    std::string files() const { return scratch_.path("www/live"); }
    /// Since the last start: recordings of the same second would have the same name.
    std::string recordings() const { return scratch_.path("recordings-" + std::to_string(starts_)); }
    std::string log() const { return ScratchDirectory::read(scratch_.path("error.log")); }

    /// A port that nobody listens on.
    static int freePort() {
        const Fd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        sockaddr_in address = loopback(0);
        socklen_t size = sizeof address;
        EXPECT_EQ(::bind(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::getsockname(socket.get(), reinterpret_cast<sockaddr*>(&address), &size), 0);
        return ntohs(address.sin_port);
    }

private:
    static sockaddr_in loopback(int port) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_port = htons(static_cast<std::uint16_t>(port));
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        return address;
    }
    static bool isListening(int port) {
        const Fd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_in address = loopback(port);
        return ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
    }

    std::string configuration() const {
        const auto temporary = [this](const std::string& kind) {
            return "  " + kind + "_temp_path " + scratch_.path("temp/" + kind) + ";\n";
        };
        const std::string user = ::geteuid() == 0 ? "user root;\n" : "";
        return "load_module /usr/lib/nginx/modules/ngx_rtmp_module.so;\n" + user +
               "daemon off;\nmaster_process off;\npid " + scratch_.path("nginx.pid") + ";\n" +
               "events { worker_connections 64; }\n"
               "http {\n  access_log off;\n  client_max_body_size 64m;\n" +
               temporary("client_body") + temporary("proxy") + temporary("fastcgi") + temporary("uwsgi") +
               temporary("scgi") + "  server {\n    listen 127.0.0.1:" + std::to_string(httpPort_) + ";\n    root " +
               scratch_.path("www") +
               ";\n    location / { dav_methods PUT DELETE; create_full_put_path on; }\n  }\n}\n"
               "rtmp {\n  server {\n    listen 127.0.0.1:" +
               std::to_string(rtmpPort_) +
               ";\n    application live {\n      live on;\n      record all;\n      record_unique on;\n      "
               "record_path " +
               recordings() + ";\n    }\n  }\n}\n";
    }

    ScratchDirectory scratch_;
    const int httpPort_, rtmpPort_;
    int starts_ = 0;
    std::unique_ptr<checkers::Child> process_;
};

}  // namespace lumacast::test
