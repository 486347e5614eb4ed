#include "client/lumacastctl/doctor/Display.h"

namespace lumacast::ctl {

namespace {

using Version = DisplayFacts::Version;
using Reach = DisplayFacts::Reach;

constexpr char kSubject[] = "display";
constexpr char kServers[] = "use a display server that has it, such as a current Xorg, Xwayland or Xvfb";

Finding checkExtension(const char* name, const std::optional<Version>& version, Version needed, const char* without) {
    const auto text = [](Version v) { return std::to_string(v.major) + "." + std::to_string(v.minor); };
    if (!version)
        return problem(kSubject,
                       std::string("the extension ") + name + " is missing: " + without + "; " + kServers + ".");
    if (*version < needed)
        return problem(kSubject, std::string("the extension ") + name + " is of version " + text(*version) + ", " +
                                     text(needed) + " is needed: " + without + "; " + kServers + ".");
    return ok(kSubject, std::string(name) + " " + text(*version));
}

Finding reachFinding(const DisplayFacts& facts) {
    switch (facts.reach) {
        case Reach::NotLocal:
            return problem(kSubject,
                           "DISPLAY=" + facts.name +
                               " is no display of this machine, and only those can be recorded; set DISPLAY to one "
                               "like :0.");
        case Reach::NoServer:
            return problem(kSubject,
                           "DISPLAY=" + facts.name +
                               " can't be reached: no server is there, or it does not let this user in; start it, or "
                               "set DISPLAY and XAUTHORITY as the session has them.");
        case Reach::NoAnswer:
            return problem(kSubject, "DISPLAY=" + facts.name + " does not answer; see whether its server hangs.");
        case Reach::Connected: break;
    }
    return ok(kSubject, "DISPLAY=" + facts.name + " answers; the daemon needs the same DISPLAY.");
}

void checkWhatCapturingTakes(const DisplayFacts& facts, Findings& findings) {
    constexpr char kNoWindow[] = "no window can be captured";
    Findings extensions{
        checkExtension("COMPOSITE", facts.composite, {0, 2}, kNoWindow),
        checkExtension("DAMAGE", facts.damage, {0, 0}, kNoWindow),
        checkExtension("XFIXES", facts.fixes, {2, 0}, kNoWindow),
        checkExtension("MIT-SHM", facts.sharedMemory, {1, 2}, kNoWindow),
        checkExtension("RES", facts.resources, {1, 2}, "no window's owner can be told, so every start is refused"),
    };
    std::vector<std::string> present;
    for (Finding& extension : extensions) {
        if (extension.severity == Severity::Ok) present.push_back(std::move(extension.text));
        else findings.push_back(std::move(extension));
    }
    if (!present.empty()) findings.push_back(ok(kSubject, "extensions: " + listText(present)));
    if (facts.sharedMemory >= Version{1, 2})
        findings.push_back(
            facts.takesMemoryByDescriptor
                ? ok(kSubject, "shared memory is taken by descriptor.")
                : problem(kSubject,
                          "MIT-SHM refuses memory that is passed by descriptor, so no window can be captured; "
                          "see whether the server runs on this machine and outside of a sandbox."));
    if (!facts.pixelsAreBgrx)
        findings.push_back(
            problem(kSubject,
                    "its pixels are not 24-bit colours in little-endian order, so no window can be captured; "
                    "start the server with a depth of 24."));
}

}  // namespace

Findings checkDisplay(const DisplayFacts& facts) {
    Findings findings;
    if (facts.isWaylandSession)
        findings.push_back(
            warning(kSubject,
                    "this is a Wayland session: windows of X11 applications can be recorded, through Xwayland; "
                    "windows of Wayland applications can't yet. Start the application as an X11 one (for example "
                    "GDK_BACKEND=x11, QT_QPA_PLATFORM=xcb, SDL_VIDEODRIVER=x11)."));
    if (facts.name.empty()) {
        findings.push_back(
            problem(kSubject, facts.isWaylandSession
                                  ? "DISPLAY is not set, so there are no windows that could be recorded; turn on "
                                    "Xwayland in the compositor."
                                  : "DISPLAY is not set, so there are no windows that could be recorded; start "
                                    "lumacastd from the session, or set DISPLAY as the session has it."));
        return findings;
    }
    findings.push_back(reachFinding(facts));
    if (facts.reach == Reach::Connected) checkWhatCapturingTakes(facts, findings);
    return findings;
}

}  // namespace lumacast::ctl
