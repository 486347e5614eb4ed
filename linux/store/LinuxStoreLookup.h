#pragma once
#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "platform/Scheduler.h"
#include "platform/StoreLookup.h"

namespace lumacast {

struct LinuxEnvironment;

/// Looks products up in this device's AppStream catalogues, by a program of its own; see the folder's README for what
/// is found. One lookup at a time, on a queue of the scheduler, where the handlers are called, too. With it ends the
/// lookup in progress; handlers that wait then hear of nothing found.
class LinuxStoreLookup final : public StoreLookup {
public:
    struct Options {
        std::string program;                   ///< lumacast-catalog
        std::vector<std::string> environment;  ///< the program's, "NAME=value"
        std::string locale;                    ///< of the user, e.g. "pt_BR"
        /// Catalogues instead of the device's, each with folders "xml" and "yaml". For tests.
        std::vector<std::string> catalogs;
        std::chrono::milliseconds patience{20'000};
    };
    static Options optionsFrom(const LinuxEnvironment& environment);

    /// The scheduler outlives it.
    LinuxStoreLookup(Scheduler& scheduler, Options options);
    ~LinuxStoreLookup() override;

    void start(const StoreRequest& request, Handler handler) override;

private:
    struct State;
    const std::shared_ptr<State> state_;
    const std::shared_ptr<SerialQueue> queue_;
};

}  // namespace lumacast
