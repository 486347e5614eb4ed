#pragma once

#include <sys/types.h>

#include <chrono>
#include <string>
#include <vector>

namespace lumacast::checkers {

/// A process of the test's own, with pipes to its standard input and output. It is ended by its pid and waited for when
/// the object goes.
class Child final {
public:
    /// `environment` is added to the test's own, each "NAME=value"; `errorFile` takes its standard error.
    Child(const std::vector<std::string>& command, const std::vector<std::string>& environment,
          const std::string& errorFile);
    ~Child();
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    [[nodiscard]] pid_t pid() const { return pid_; }
    void send(const std::string& line);
    /// The next line it prints, empty when it prints none within the time or ends.
    [[nodiscard]] std::string readLine(std::chrono::seconds limit = std::chrono::seconds(20));
    /// Sends a line and answers the next one printed.
    [[nodiscard]] std::string ask(const std::string& line);
    /// Everything it still prints, until it closes its output.
    [[nodiscard]] std::string readAll();
    /// Waits for its end; its exit status, or -1 when it ended otherwise.
    int wait();

private:
    bool fill(std::chrono::steady_clock::time_point until);

    pid_t pid_ = -1;
    int input_ = -1;
    int output_ = -1;
    std::string pending_;
};

}  // namespace lumacast::checkers
