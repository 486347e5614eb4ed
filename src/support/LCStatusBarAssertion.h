#pragma once
// The status bar's word of a recording.

#include <memory>
#include <optional>
#include <string>

#include "base/Guarded.h"
#include "base/Identifiers.h"
#include "platform/Platform.h"
#include "platform/StatusBarOverride.h"
#include "support/Localization.h"

namespace lumacast {

/// Told of taps on the indicator. This platform shows none, so nothing is told.
class LCStatusBarAssertionDelegate {
public:
    virtual ~LCStatusBarAssertionDelegate() = default;
};

/// The indicator of a running recording or broadcast: a status-bar override with its state and elapsed time. This
/// platform has no status bar, so what would show, update and take away an override is deliberately empty; its texts and
/// its timer are there for one that has. Held by shared_ptr; belongs to the main queue, but for startRepeatingTimer.
class LCStatusBarAssertion : public std::enable_shared_from_this<LCStatusBarAssertion> {
public:
    /// Both are borrowed and outlive the assertion.
    LCStatusBarAssertion(const Platform& platform, Localization& localization)
        : platform_(platform), localization_(localization) {}
    virtual ~LCStatusBarAssertion() = default;

    bool microphoneEnabled = false;
    bool broadcasting = false;
    bool paused = false;
    /// What the broadcast is sent to, as the user reads it.
    std::string broadcastServiceName;
    std::weak_ptr<LCStatusBarAssertionDelegate> delegate, assertionDelegate;
    std::shared_ptr<StatusBarOverride> assertion;
    std::shared_ptr<StatusBarStyleCoordinator> coordinator;

    /// `showDoubleHeightStatusBarWithPid:`, `invalidateDoubleHeightStatusBar`,
    /// `updateDoubleHeightStatusBarWithDuration:paused:` — deliberately empty.
    void showDoubleHeightStatusBarWithPid(ProcessID) {}
    void invalidateDoubleHeightStatusBar() {}
    void updateDoubleHeightStatusBarWithDuration(double, bool) {}
    /// `updateStatusStringWithTimer:` — deliberately empty; virtual for a platform with a status bar.
    virtual void updateStatusStringWithTimer() {}

    /// `startRepeatingTimer` — from now on the status is updated twice a second, by one timer however often this is
    /// called. Any lane; takes effect on the main queue.
    void startRepeatingTimer();
    std::optional<Date> timerStartDate() const { return timerStartDate_; }
    bool hasTimer() const { return timer_ != nullptr; }

    /// `stringWithTimeInterval:` — elapsed time: below a minute padded ("00:05"), from then on the two largest units that
    /// are not leading zeros ("1:00" for a minute and for an hour). Cut off, never rounded up.
    static std::string stringWithTimeInterval(double seconds);
    /// `lcLocalizedRecordingDuration:paused:` — the state in the user's language; the duration is deliberately not in it.
    std::string lcLocalizedRecordingDuration(double duration, bool isPaused);

private:
    const Platform platform_;
    Localization& localization_;
    std::unique_ptr<Timer> timer_;
    std::optional<Date> timerStartDate_;
};

}  // namespace lumacast
