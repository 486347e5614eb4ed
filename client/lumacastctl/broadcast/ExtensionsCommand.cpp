#include "client/lumacastctl/broadcast/ExtensionsCommand.h"

#include <nlohmann/json.hpp>

#include "client/Recorder.h"
#include "client/lumacastctl/AskDaemon.h"
#include "client/lumacastctl/ExitStatus.h"
#include "client/lumacastctl/Table.h"
#include "client/lumacastctl/Text.h"

namespace lumacast::ctl {

std::string extensionsText(const client::BroadcastExtensionsAnswer& answer) {
    if (answer.extensions.empty())
        return "No upload extension is installed. They are folders with a manifest in lumacast/extensions of the data "
               "directories.\n";
    std::vector<std::vector<std::string>> rows;
    for (const auto& extension : answer.extensions)
        rows.push_back({printable(extension.identifier.text()), printable(extension.displayName)});
    return tableText({{"IDENTIFIER"}, {"NAME"}}, rows);
}

std::string extensionsJson(const client::BroadcastExtensionsAnswer& answer) {
    nlohmann::json list = nlohmann::json::array();
    for (const auto& extension : answer.extensions)
        list.push_back({{"identifier", extension.identifier.text()},
                        {"displayName", extension.displayName},
                        {"iconBytes", extension.icon.size()}});
    return nlohmann::json{{"extensions", list}}.dump(-1, ' ', false, nlohmann::json::error_handler_t::replace) + "\n";
}

int showExtensions(const std::string& runtimeDirectory, Form form, std::FILE* out, std::FILE* complaints,
                   std::chrono::milliseconds limit) {
    client::Recorder recorder({}, runtimeDirectory);
    const auto answer = recorder.broadcastExtensionsAndWait(limit);
    if (answer.error)
        return complain(complaints, "no extensions to show: " + printable(client::textOf(*answer.error)));
    std::fputs((form == Form::Json ? extensionsJson(answer) : extensionsText(answer)).c_str(), out);
    return kGood;
}

}  // namespace lumacast::ctl
