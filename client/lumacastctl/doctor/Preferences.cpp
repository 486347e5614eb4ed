#include "client/lumacastctl/doctor/Preferences.h"

#include <unistd.h>

#include "client/lumacastctl/Text.h"
#include "linux/system/IniFile.h"
#include "linux/system/LinuxPreferences.h"
#include "linux/system/SmallFile.h"
#include "platform/PreferenceKeys.h"

namespace lumacast::ctl {

namespace {

using File = PreferenceFacts::File;
using Preference = PreferenceFacts::Preference;

constexpr char kSubject[] = "preferences";
constexpr std::size_t kMaximumBytes = 64 * 1024;  // larger ones count as missing, see LinuxPreferences

Preference probePreference(const LinuxPreferences& preferences, const PreferenceFacts& facts, std::string_view key) {
    Preference preference{preferences.value(kPreferenceDomain, key), ""};
    for (const File& file : facts.files) {
        if (file.state != File::State::Read) continue;
        const auto text = readSmallFile(file.path, kMaximumBytes);
        if (!text || !IniFile::parse(text->text).find("", key)) continue;
        preference.path = file.path;
        break;
    }
    return preference;
}

const bool* flagOf(const Preference& preference) { return preference.value ? preference.value->as<bool>() : nullptr; }

std::string placeText(const Preference& preference) {
    return preference.path.empty() ? "" : " (" + preference.path + ")";
}

/// "LCFullResCapture=1 (file)"
std::string preferenceText(const std::string& key, const Preference& preference) {
    return key + "=" + (preference.value ? settingText(*preference.value) : "") + placeText(preference);
}

Finding notAFlag(const std::string& key, const Preference& preference, Severity severity,
                 const std::string& consequence) {
    return {severity, kSubject,
            preferenceText(key, preference) + " is neither true nor false, " + consequence + "; write " + key +
                "=true or =false."};
}

Findings checkFiles(const std::vector<File>& files) {
    Findings findings;
    std::vector<std::string> read, missing;
    for (const File& file : files) {
        if (file.state == File::State::Read) read.push_back(file.path);
        if (file.state == File::State::Missing) missing.push_back(file.path);
        if (file.state == File::State::Unreadable)
            findings.push_back(
                warning(kSubject, file.path + " counts as missing: it can't be read, is no file, or is larger than "
                                              "64 KiB; mend or remove it."));
    }
    std::string text = read.empty() ? "no file is there" : "read from " + listText(read);
    if (!missing.empty())
        text += read.empty() ? "; looked for " + listText(missing) : "; not there: " + listText(missing);
    findings.push_back(ok(kSubject, text + "."));
    return findings;
}

Finding checkSuppressAlert(const PreferenceFacts& facts) {
    const Preference& preference = facts.suppressAlert;
    const bool* flag = flagOf(preference);
    if (flag && *flag)
        return ok(kSubject, preferenceText("LCSuppressAlert", preference) +
                                ": applications may record themselves without the user being asked.");
    if (preference.value && !flag)
        return notAFlag("LCSuppressAlert", preference, Severity::Warning, "so it counts as not set");
    return ok(kSubject,
              (flag ? preferenceText("LCSuppressAlert", preference) : std::string("LCSuppressAlert is not set")) +
                  ": the user is asked before an application records itself.");
}

Finding checkBitRate(const Preference& preference) {
    if (!preference.value)
        return ok(kSubject, "LCBitRateOverride is not set: the bit rate follows from the movie's size.");
    const auto* rate = preference.value->as<std::int64_t>();
    const std::string setting = preferenceText("LCBitRateOverride", preference);
    if (rate && *rate > 0)
        return ok(kSubject, setting + ": movies get this many bits per second, whatever their size.");
    return warning(kSubject, setting + " is no bit rate; write a whole number of bits per second, or remove it.");
}

Finding checkFullResolution(const Preference& preference) {
    const bool* flag = flagOf(preference);
    if (preference.value && !flag)
        return notAFlag("LCFullResCapture", preference, Severity::Warning, "so it counts as not set");
    if (flag && *flag)
        return ok(kSubject, preferenceText("LCFullResCapture", preference) + ": movies keep the window's full size.");
    return ok(kSubject,
              (flag ? preferenceText("LCFullResCapture", preference) : std::string("LCFullResCapture is not set")) +
                  ": a movie's longer side has at most 1920 pixels (on devices of reduced capture 1600).");
}

}  // namespace

PreferenceFacts probePreferences(const std::vector<std::string>& configDirectories) {
    PreferenceFacts facts;
    for (const std::string& directory : configDirectories) {
        File file{directory + "/lumacast/" + std::string(kPreferenceDomain) + ".conf"};
        if (readSmallFile(file.path, kMaximumBytes)) file.state = File::State::Read;
        else if (::access(file.path.c_str(), F_OK) == 0) file.state = File::State::Unreadable;
        facts.files.push_back(std::move(file));
    }
    const LinuxPreferences preferences(configDirectories);
    facts.suppressAlert = probePreference(preferences, facts, kSuppressAlertKey);
    facts.bitRate = probePreference(preferences, facts, kBitRateOverrideKey);
    facts.fullResolution = probePreference(preferences, facts, kFullResCaptureKey);
    return facts;
}

Findings checkPreferences(const PreferenceFacts& facts) {
    Findings findings = checkFiles(facts.files);
    findings.push_back(checkSuppressAlert(facts));
    findings.push_back(checkBitRate(facts.bitRate));
    findings.push_back(checkFullResolution(facts.fullResolution));
    return findings;
}

}  // namespace lumacast::ctl
