#pragma once
// A browser of the test's own, without a window.

#include <string>
#include <vector>

#include "tests/checkers/tests/Child.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {

/// Shows one page until the object goes. It reaches this machine's loopback and nothing else.
class PrivateBrowser final {
public:
    explicit PrivateBrowser(const std::string& url, std::vector<std::string> more = {})
        : process_(command(url, std::move(more)), {"HOME=" + scratch_.path(), "DBUS_SESSION_BUS_ADDRESS="},
                   scratch_.path("stderr.log")) {}

    std::string log() const { return ScratchDirectory::read(scratch_.path("stderr.log")); }

private:
    std::vector<std::string> command(const std::string& url, std::vector<std::string> more) const {
        std::vector<std::string> all{"chromium",
                                     "--headless",
                                     "--no-sandbox",  // which a superuser's browser can't have
                                     "--disable-gpu",
                                     "--disable-dev-shm-usage",
                                     "--no-first-run",
                                     "--disable-background-networking",
                                     "--disable-component-update",
                                     "--disable-sync",
                                     "--host-resolver-rules=MAP * ~NOTFOUND, EXCLUDE 127.0.0.1",
                                     "--autoplay-policy=no-user-gesture-required",
                                     "--user-data-dir=" + scratch_.path("profile")};
        all.insert(all.end(), more.begin(), more.end());
        all.push_back(url);
        return all;
    }

    ScratchDirectory scratch_;
    checkers::Child process_;
};

}  // namespace lumacast::test
