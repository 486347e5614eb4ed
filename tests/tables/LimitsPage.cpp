#include "base/Limits.h"
#include "tests/tables/Tables.h"

namespace lumacast::tables {

namespace {

std::string_view nameOf(LimitKeeper keeper) {
    switch (keeper) {
        case LimitKeeper::Connections: return "the connections, `linux/ipc`";
        case LimitKeeper::Manager: return "the manager, `src/daemon`";
        case LimitKeeper::Archives: return "the archives, `linux/ipc`";
        case LimitKeeper::Extensions: return "the extensions, `linux/extensions`";
        case LimitKeeper::ExtensionProxy: return "the extension's proxy, `src/broadcast`";
    }
    return "";
}

}  // namespace

std::string limitsPage() {
    std::string text =
        "# Limits\n\n"
        "Printed by `scripts/tables` from `src/base/Limits.h`.\n\n"
        "## What a peer controls\n\n"
        "Each has a test that goes one beyond it.\n\n" +
        head({"limit", "of what", "beyond it", "kept by"});
    for (const LimitRow& limit : kLimits)
        text += row({grouped(limit.value), std::string(limit.meaning), std::string(limit.beyond),
                     std::string(nameOf(limit.keeper))});
    text += "\n## Free space\n\nWhere movies are written. The service looks every ten seconds.\n\n" +
            head({"urgency", "free bytes below", "meaning"});
    for (const PurgeLevel& level : kPurgeLevels)
        text += row({std::to_string(level.urgency), grouped(level.freeBytesBelow), std::string(level.meaning)});
    return text;
}

}  // namespace lumacast::tables
