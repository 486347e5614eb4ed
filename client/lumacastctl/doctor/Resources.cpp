#include "client/lumacastctl/doctor/Resources.h"

namespace lumacast::ctl {

ResourceFacts probeResources(Bundles& bundles, const std::string& dataHome) {
    ResourceFacts facts;
    facts.path = bundles.frameworkBundlePath();
    facts.languages = bundles.preferredLanguages();
    facts.dataHome = dataHome;
    const auto bundle = bundles.open(facts.path);
    if (!bundle) return facts;
    facts.localizations = bundle->localizations();
    facts.suitable = bundles.preferredLocalizations(*facts.localizations);
    return facts;
}

Findings checkResources(const ResourceFacts& facts) {
    constexpr char kSubject[] = "resources";
    const std::string where = "copy Lumacast.bundle to " + facts.dataHome + "/lumacast/.";
    if (!facts.localizations)
        return {warning(kSubject, "no Lumacast.bundle was found (it would be " + facts.path +
                                      "), so errors come without texts; " + where)};
    if (facts.localizations->empty())
        return {
            warning(kSubject, facts.path + " has no texts in any language, so errors come without texts; " + where)};
    const std::string languages = listText(*facts.localizations);
    if (facts.suitable.empty())
        return {warning(kSubject, facts.path + " has the languages " + languages + " but none of yours (" +
                                      listText(facts.languages) + "); set LANGUAGE or LANG for the daemon.")};
    return {
        ok(kSubject, facts.path + " has the languages " + languages + "; yours is " + facts.suitable.front() + ".")};
}

}  // namespace lumacast::ctl
