#include "client/lumacastctl/doctor/Doctor.h"

#include <iterator>

#include "client/lumacastctl/doctor/Daemon.h"
#include "client/lumacastctl/doctor/Display.h"
#include "client/lumacastctl/doctor/Encoders.h"
#include "client/lumacastctl/doctor/Preferences.h"
#include "client/lumacastctl/doctor/Question.h"
#include "client/lumacastctl/doctor/Resources.h"
#include "client/lumacastctl/doctor/Sound.h"
#include "client/lumacastctl/doctor/Storage.h"

namespace lumacast::ctl {

namespace {

constexpr std::chrono::seconds kPatience{3};

bool isAbsolute(const std::optional<std::string>& path) { return path && path->starts_with('/'); }

}  // namespace

Findings examine(const LinuxEnvironment& environment, const LinuxEnvironment::Variables& variables,
                 const IdentityQuestion& question) {
    Findings all;
    const auto add = [&all](Findings findings) {
        all.insert(all.end(), std::make_move_iterator(findings.begin()), std::make_move_iterator(findings.end()));
    };
    const LinuxBundles::Options options = LinuxBundles::optionsFrom(environment);
    LinuxBundles bundles(options);
    const DaemonFacts daemon =
        probeDaemon(environment.runtimeDirectory, isAbsolute(variables("XDG_RUNTIME_DIR")), kPatience);

    add(checkDisplay(probeDisplay(variables, kPatience)));
    add(checkSound(probeSound(variables)));
    add(checkEncoders(probeEncoders()));
    add(checkIdentity(probeIdentity(bundles, options, question)));
    add(checkEntitlements(probeEntitlements(bundles, Entitlements::directoriesFrom(environment), question)));
    add(checkPreferences(probePreferences(environment.configDirectories)));
    add(checkQuestion(probeQuestion(environment.searchPath)));
    add(checkStorage(probeStorage(environment.root, daemon.temporaryDirectory)));
    add(checkResources(probeResources(bundles, environment.dataHome)));
    add(checkDaemon(daemon));
    return all;
}

}  // namespace lumacast::ctl
