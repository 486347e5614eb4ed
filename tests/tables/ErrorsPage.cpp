#include <fstream>
#include <iterator>
#include <set>
#include <string>

#include "base/RecordingErrorCodes.h"
#include "client/Errors.h"
#include "client/lumacastctl/ExitStatus.h"
#include "linux/apps/StringsTable.h"
#include "tests/tables/Tables.h"
#include "tests/unit/architecture/SourceText.h"

namespace lumacast::tables {

namespace {

constexpr char kStrings[] = LC_SOURCE_DIR "/resources/Lumacast.bundle/en.lproj/Localizable.strings";

/// By code, from -5800 down.
constexpr std::string_view kEnumerators[] = {"Unknown",
                                             "UserDeclined",
                                             "Disabled",
                                             "FailedToStart",
                                             "Failed",
                                             "InsufficientStorage",
                                             "Interrupted",
                                             "ContentResize",
                                             "InvalidBroadcastSession",
                                             "SystemDormancy",
                                             "Entitlements",
                                             "ActivePhoneCall",
                                             "FailedToSave",
                                             "DashLink",
                                             "ConnectionInvalid",
                                             "ConnectionInterrupted",
                                             "NoContextIDMatch",
                                             "MediaServicesFailed",
                                             "MixingFailure"};

/// The files of the system that raise a code, by its enumerator.
std::string raisedIn(std::string_view enumerator) {
    static const auto kSources = architecture::sourcesBelow("src");
    const std::string name = "RecordingErrorCode::" + std::string(enumerator);
    std::set<std::string> files;
    for (const auto& file : kSources)
        if (file.path.ends_with(".cpp") && file.path.find("RecordingError") == std::string::npos &&
            architecture::usesName(architecture::codeOf(file.text), name))
            files.insert(file.path.substr(file.path.rfind('/') + 1));
    std::string list;
    for (const std::string& file : files) list += (list.empty() ? "" : ", ") + code(file);
    return list.empty() ? "nowhere" : list;
}

std::string recordingErrors() {
    std::ifstream stream(kStrings, std::ios::binary);
    const StringsTable texts = StringsTable::parse(std::string(std::istreambuf_iterator<char>(stream), {}));
    std::string text = head({"code", "key", "text", "raised in"});
    std::int64_t value = static_cast<std::int64_t>(RecordingErrorCode::Unknown);
    for (const std::string_view enumerator : kEnumerators) {
        const std::string key(recordingErrorKey(value));
        const std::string* shown = texts.find(key);
        text += row({std::to_string(value--), code(key), shown ? *shown : "", raisedIn(enumerator)});
    }
    return text;
}

std::string connectionErrors() {
    using client::ConnectionError;
    std::string text = head({"code", "key", "text"});
    for (std::int64_t value = 1; value <= static_cast<std::int64_t>(ConnectionError::WouldBlock); ++value)
        text += row({std::to_string(value), code(client::connectionErrorKey(value)),
                     client::textOf(client::connectionError(static_cast<ConnectionError>(value)))});
    return text;
}

std::string exitStatuses() {
    std::string text = head({"status", "meaning"});
    for (const ctl::ExitStatusRow& each : ctl::kExitStatuses) text += row({std::to_string(each.status), each.meaning});
    return text;
}

}  // namespace

std::string errorsPage() {
    return "# Errors\n\n"
           "Printed by `scripts/tables` from the code. What an application meets when: "
           "[client](../../client/README.md).\n\n"
           "## Of the daemon\n\nDomain " +
           code(kRecordingErrorDomain) +
           ". Any other code of this domain has the key and the text of the first row. The texts are those of the "
           "English\n"
           "bundle; others lie beside it in `resources/`. \"Nowhere\" means that this version never raises the "
           "code.\n\n" +
           recordingErrors() + "\n## Of the connection\n\nDomain " + code(client::kConnectionErrorDomain) +
           ": what the client library answers itself.\n\n" + connectionErrors() +
           "\n## Of lumacastctl\n\nIts exit statuses. Those of the daemon: [linux](../../linux/README.md).\n\n" +
           exitStatuses();
}

}  // namespace lumacast::tables
