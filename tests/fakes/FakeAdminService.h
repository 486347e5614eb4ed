#pragma once
#include <map>
#include <mutex>
#include <sstream>
#include <utility>

#include "platform/AdminService.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// An administrator inside the test. Thread-safe.
class FakeAdminService final : public AdminService {
public:
    explicit FakeAdminService(Scheduler& scheduler) : scheduler_(scheduler) {}

    void addCommand(std::string name, AdminCommand command) override {
        const std::lock_guard lock(mutex_);
        commands_[std::move(name)] = std::move(command);
    }
    void resume(std::function<Dictionary()> snapshot) override {
        const std::lock_guard lock(mutex_);
        snapshot_ = std::move(snapshot);
    }

    /// Asks for the status; `answer` is called on the main queue, after the snapshot was taken there. Nobody answers
    /// before the service was resumed: false then.
    bool ask(std::function<void(Dictionary)> answer) {
        std::function<Dictionary()> snapshot;
        {
            const std::lock_guard lock(mutex_);
            snapshot = snapshot_;
        }
        if (!snapshot) return false;
        scheduler_.mainQueue().async([snapshot, answer = std::move(answer)] { answer(snapshot()); });
        return true;
    }
    /// Gives a command, a line of words; `answer` is called on the lane that answers, once at most. False when nobody
    /// serves it.
    bool command(const std::string& line, std::function<void(Dictionary)> answer) {
        std::istringstream words(line);
        std::string name;
        words >> name;
        std::vector<std::string> arguments;
        for (std::string word; words >> word;) arguments.push_back(word);
        AdminCommand command;
        {
            const std::lock_guard lock(mutex_);
            const auto found = commands_.find(name);
            if (!snapshot_ || found == commands_.end()) return false;
            command = found->second;
        }
        auto once = [answered = std::make_shared<std::once_flag>(), answer = std::move(answer)](Dictionary result) {
            std::call_once(*answered, [&] { answer(std::move(result)); });
        };
        scheduler_.mainQueue().async([command, arguments, once] { command(arguments, once); });
        return true;
    }

private:
    Scheduler& scheduler_;
    std::mutex mutex_;
    std::map<std::string, AdminCommand> commands_;
    std::function<Dictionary()> snapshot_;
};

}  // namespace lumacast
