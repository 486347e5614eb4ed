#include "client/lumacastctl/doctor/Identity.h"

#include <filesystem>
#include <system_error>

namespace lumacast::ctl {

namespace {

constexpr char kSubject[] = "identity";

std::string processText(ProcessID pid) { return "process " + std::to_string(number(pid)); }

std::string whoText(const IdentityFacts& facts) {
    const std::string program = facts.executable.value_or("");
    return facts.question.pid ? processText(*facts.question.pid) + " (" + program + ")" : program;
}

std::string howToGetOne(const IdentityFacts& facts) {
    const std::string place = facts.applicationDirectories.empty() ? "an XDG data directory's applications"
                                                                   : facts.applicationDirectories.front();
    return "put a desktop entry named like org.example.Player.desktop into " + place +
           " whose Exec (or X-Lumacast-Executable) is this program, or a manifest.json with an \"identifier\" beside "
           "the program. "
           "Scripts have no identity of their own: their interpreter runs";
}

Finding unknownProgram(const IdentityFacts& facts) {
    if (facts.question.pid)
        return problem(kSubject,
                       processText(*facts.question.pid) +
                           " is not there, is another user's, or runs a program whose path means another file here "
                           "(a container); give the pid of a running process of this user.");
    return problem(
        kSubject, "\"" + facts.question.executable.value_or("") + "\" is no program that can be found; give its path.");
}

}  // namespace

IdentityFacts probeIdentity(LinuxBundles& bundles, const LinuxBundles::Options& options,
                            const IdentityQuestion& question) {
    IdentityFacts facts;
    facts.question = question;
    facts.applicationDirectories = options.applicationDirectories;
    if (question.pid) {
        facts.executable = bundles.executablePath(*question.pid);
    } else if (question.executable) {
        std::error_code error;
        const auto path = std::filesystem::canonical(*question.executable, error);
        if (!error && std::filesystem::is_regular_file(path, error)) facts.executable = path.string();
    }
    if (!facts.executable) return facts;
    facts.bundlePath = bundles.bundlePathForExecutable(*facts.executable);
    const auto bundle = facts.bundlePath ? bundles.open(*facts.bundlePath) : nullptr;
    if (!bundle) return facts;
    if (const auto identifier = bundle->identifier(); identifier && !identifier->text().empty())
        facts.identifier = identifier->text();
    facts.name = bundle->localizedInfo(kInfoDisplayName).value_or("");
    for (const auto key : {kInfoDisplayName, kInfoName})
        if (facts.name.empty()) facts.name = bundle->info(key).value_or("");
    return facts;
}

Findings checkIdentity(const IdentityFacts& facts) {
    const bool nobodyAsked = facts.question.isExample;
    Findings findings;
    if (!facts.executable) {
        findings.push_back(unknownProgram(facts));
        if (nobodyAsked) findings.back().severity = Severity::Ok;  // about whoever called, which nobody wants to record
    } else if (facts.identifier) {
        std::string text = whoText(facts) + " is " + *facts.identifier;
        if (!facts.name.empty()) text += " (\"" + facts.name + "\")";
        findings.push_back(ok(kSubject, text + ", by " + facts.bundlePath.value_or("") + "."));
    } else if (nobodyAsked) {
        findings.push_back(ok(kSubject, whoText(facts) +
                                            ", which started this tool, belongs to no application; ask about yours "
                                            "with --pid or --exe."));
    } else {
        findings.push_back(problem(kSubject, whoText(facts) +
                                                 " belongs to no application, so the daemon refuses its connection; " +
                                                 howToGetOne(facts) + "."));
    }
    if (nobodyAsked)
        findings.push_back(
            ok(kSubject, "an application is known by its executable: from a desktop entry in " +
                             listText(facts.applicationDirectories) +
                             ", else from a manifest.json in the executable's folder or one of the three above it."));
    return findings;
}

}  // namespace lumacast::ctl
