#include "linux/desktop/LinuxUserAlerts.h"

#include <algorithm>
#include <array>
#include <utility>

#include "linux/accessibility/BusAnswers.h"
#include "linux/desktop/DialogLane.h"
#include "linux/desktop/DialogWatch.h"

namespace lumacast {
namespace {

constexpr std::array<std::string_view, 5> kPassedOn{"HOME", "PATH", "XAUTHORITY", "USER", "DBUS_SESSION_BUS_ADDRESS"};
constexpr std::string_view kFamilyPassedOn = "XDG_";
constexpr std::string_view kBus = "DBUS_SESSION_BUS_ADDRESS=", kNoBus = "DBUS_SESSION_BUS_ADDRESS=disabled:",
                           kNoBridge = "NO_AT_BRIDGE=1";

/// The dialog would wait for a bus that doesn't answer, before it shows anything.
void leaveOutSilentBus(std::vector<std::string>& environment, const LinuxUserAlerts::Options& options) {
    const auto bus = std::find_if(environment.begin(), environment.end(), [](const std::string& variable) {
        return variable.starts_with(kBus) && variable != kNoBus;
    });
    if (bus == environment.end() || busAnswers(bus->substr(kBus.size()), options.busPatience)) return;
    *bus = kNoBus;
    environment.emplace_back(kNoBridge);
    if (options.note) options.note("the session bus does not answer: the dialog does without it, and screen readers");
}

class LinuxUserAlert final : public UserAlert {
public:
    explicit LinuxUserAlert(std::shared_ptr<AlertAnswer> answer) : answer_(std::move(answer)) {}
    ~LinuxUserAlert() override { answer_->abandon(); }
    void receiveResponse(std::function<void(Response)> handler) override { answer_->receive(std::move(handler)); }
    void cancel() override { answer_->cancel(); }
    bool wasShown() const override { return answer_->wasShown(); }

private:
    const std::shared_ptr<AlertAnswer> answer_;
};

}  // namespace

LinuxUserAlerts::LinuxUserAlerts(Options options) : options_(std::move(options)) {}

std::shared_ptr<UserAlert> LinuxUserAlerts::show(const AlertContent& content) {
    const auto none = [this](std::string_view reason) -> std::shared_ptr<UserAlert> {
        if (options_.explain) options_.explain(reason);
        return nullptr;
    };
    const auto texts = dialogTexts(content, options_.icon ? options_.icon(content.application) : std::nullopt);
    if (!texts) return none("its buttons can't be told apart");
    const auto program = findDialogProgram(options_.searchPath, options_.programOwner);
    if (!program) return none("neither yad nor zenity is installed");
    if (options_.display.empty()) return none("there is no display");
    if (!writeDialogStyle(options_.styleDirectory)) return none("the dialog's style can't be written");
    const auto answer = std::make_shared<AlertAnswer>();
    const auto watch = DialogWatch::start(options_.display, [answer] { answer->wake(); });
    if (!watch || !watch->waitForDisplay(options_.displayPatience)) {
        if (watch) watch->stop();
        return none("the display does not answer");
    }
    DialogLane::Question question{
        .program = *program,
        .texts = *texts,
        .command = {program->path, dialogArguments(*program, *texts, options_.styleDirectory), options_.environment},
        .tooSoon = options_.tooSoon,
        .windowPatience = options_.windowPatience,
        .explain = options_.explain};
    leaveOutSilentBus(question.command.environment, options_);
    // zenity takes its style from the user's configuration only.
    if (program->kind == DialogProgram::Kind::Zenity) {
        auto& environment = question.command.environment;
        std::erase_if(environment,
                      [](const std::string& variable) { return variable.starts_with("XDG_CONFIG_HOME="); });
        environment.push_back("XDG_CONFIG_HOME=" + options_.styleDirectory);
    }
    if (!DialogLane::start(answer, watch, std::move(question))) {
        watch->stop();
        return none("there are no more threads");
    }
    return std::make_shared<LinuxUserAlert>(answer);
}

std::vector<std::string> dialogEnvironment(const char* const* variables, const std::string& display) {
    std::vector<std::string> environment{"DISPLAY=" + display, "GDK_BACKEND=x11", "LC_ALL=C.UTF-8"};
    bool hasBus = false;
    for (; *variables != nullptr; ++variables) {
        const std::string_view variable = *variables;
        const std::string_view name = variable.substr(0, variable.find('='));
        if (std::find(kPassedOn.begin(), kPassedOn.end(), name) == kPassedOn.end() &&
            !name.starts_with(kFamilyPassedOn))
            continue;
        hasBus |= name == "DBUS_SESSION_BUS_ADDRESS";
        environment.emplace_back(variable);
    }
    // Without one the library would start a bus of its own, which outlives the dialog.
    if (!hasBus) {
        environment.emplace_back(kNoBridge);
        environment.emplace_back(kNoBus);
    }
    return environment;
}

}  // namespace lumacast
