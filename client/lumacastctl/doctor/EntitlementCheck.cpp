#include "client/lumacastctl/Text.h"
#include "client/lumacastctl/doctor/Identity.h"

namespace lumacast::ctl {

namespace {

constexpr char kSubject[] = "entitlements";

std::string entitlementsText(const Dictionary& entitlements) {
    std::vector<std::string> parts;
    for (const auto& [name, value] : entitlements.entries()) parts.push_back(name + " = " + settingText(value));
    return listText(parts);
}

Finding passedOver(const std::string& finding) {
    return warning(kSubject,
                   finding + "; make the drop-in and its folders the administrator's (chown root, chmod go-w).");
}

}  // namespace

EntitlementFacts probeEntitlements(LinuxBundles& bundles, std::vector<std::string> directories,
                                   const IdentityQuestion& question) {
    EntitlementFacts facts;
    facts.directories = directories;
    if (!question.pid) return facts;
    Entitlements entitlements(bundles, {.directories = std::move(directories)});
    facts.explanation = entitlements.explain(*question.pid);
    return facts;
}

Findings checkEntitlements(const EntitlementFacts& facts) {
    const std::string none = "; an application that records its own windows needs none.";
    if (!facts.explanation)
        return {ok(kSubject, "they count for a running process only: ask with --pid" + none)};
    const Entitlements::Explanation& explanation = *facts.explanation;
    if (!explanation.application) return {ok(kSubject, "none, without an application" + none)};
    const std::string& application = explanation.application->text();
    if (!explanation.counts)
        return {ok(kSubject, "none can count for " + application + " (" + listText(explanation.findings) + ")" + none)};
    Findings findings;
    for (const std::string& finding : explanation.findings)
        if (finding.starts_with("passed over ")) findings.push_back(passedOver(finding));
    if (explanation.entitlements.empty())
        findings.push_back(
            ok(kSubject, application + " has none (looked for *.conf in " + listText(facts.directories) + ")" + none));
    else
        findings.push_back(ok(kSubject, application + " has " + entitlementsText(explanation.entitlements) + "."));
    return findings;
}

}  // namespace lumacast::ctl
