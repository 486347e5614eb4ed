#pragma once
// A user of the test's own: directories, installed applications, the daemon.

#include <memory>
#include <nlohmann/json.hpp>
#include <string>
#include <utility>
#include <vector>

#include "tests/checkers/tests/Child.h"
#include "tests/contract/ScratchDirectory.h"

namespace lumacast::test {

/// A user with directories of their own, in which the system is installed and no application yet, and their daemon. What
/// the daemon wrote is printed after a test that failed.
class DaemonUser final {
public:
    DaemonUser();
    ~DaemonUser();
    DaemonUser(const DaemonUser&) = delete;
    DaemonUser& operator=(const DaemonUser&) = delete;

    std::string path(const std::string& name) const { return folder_.path(name); }
    /// What every process of the user's gets, each "NAME=value".
    const std::vector<std::string>& environment() const { return environment_; }
    void addVariable(std::string variable) { environment_.push_back(std::move(variable)); }

    /// Installs a program as an application.
    void install(const std::string& identifier, const std::string& name, const std::string& executable) const;

    /// Starts the daemon by a command and waits until it answers. `variables` are its alone.
    void startDaemon(const std::vector<std::string>& command, const std::vector<std::string>& variables = {});
    checkers::Child& daemon() { return *daemon_; }
    /// What `status` of the administrator's socket answers; null when nobody does.
    nlohmann::json status() const;
    std::string daemonLog() const { return ScratchDirectory::read(path("daemon.log")); }

private:
    const ScratchDirectory folder_;
    std::vector<std::string> environment_{"LANG=C", "LANGUAGE=en"};
    std::unique_ptr<checkers::Child> daemon_;
};

}  // namespace lumacast::test
