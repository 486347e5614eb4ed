#pragma once
#include <map>
#include <memory>
#include <mutex>
#include <sstream>
#include <utility>
#include <vector>

#include "platform/AdminService.h"
#include "platform/Scheduler.h"

namespace lumacast {

/// An administrator inside the test. Thread-safe. Whoever still waits for an answer when the service ends gets none:
/// the function that was to be given it is destroyed uncalled.
class FakeAdminService final : public AdminService {
public:
    explicit FakeAdminService(Scheduler& scheduler) : scheduler_(scheduler) {}
    ~FakeAdminService() override {
        for (const auto& question : questions_)
            if (const auto waiting = question.lock()) (void)waiting->take();
    }

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
        scheduler_.mainQueue().async([snapshot, question = addQuestion(std::move(answer))] {
            if (question->isOpen()) question->answer(snapshot());
        });
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
        scheduler_.mainQueue().async([command, arguments, question = addQuestion(std::move(answer))] {
            if (!question->isOpen()) return;
            command(arguments, [question](Dictionary result) { question->answer(std::move(result)); });
        });
        return true;
    }

private:
    /// Answered once at most, and not when the service has taken the function back.
    class Question {
    public:
        explicit Question(std::function<void(Dictionary)> answer) : answer_(std::move(answer)) {}
        bool isOpen() {
            const std::lock_guard lock(mutex_);
            return answer_ != nullptr;
        }
        std::function<void(Dictionary)> take() {
            const std::lock_guard lock(mutex_);
            return std::exchange(answer_, nullptr);
        }
        void answer(Dictionary result) {
            if (const auto answer = take()) answer(std::move(result));
        }

    private:
        std::mutex mutex_;
        std::function<void(Dictionary)> answer_;
    };

    std::shared_ptr<Question> addQuestion(std::function<void(Dictionary)> answer) {
        const auto question = std::make_shared<Question>(std::move(answer));
        const std::lock_guard lock(mutex_);
        std::erase_if(questions_, [](const auto& one) { return one.expired(); });
        questions_.push_back(question);
        return question;
    }

    Scheduler& scheduler_;
    std::mutex mutex_;
    std::map<std::string, AdminCommand> commands_;
    std::function<Dictionary()> snapshot_;
    std::vector<std::weak_ptr<Question>> questions_;
};

}  // namespace lumacast
