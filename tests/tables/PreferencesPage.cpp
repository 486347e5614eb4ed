#include "platform/PreferenceKeys.h"
#include "platform/Preferences.h"
#include "tests/tables/Tables.h"

namespace lumacast::tables {

std::string preferencesPage() {
    std::string text =
        "# Preferences\n\n"
        "Printed by `scripts/tables` from `src/platform/PreferenceKeys.h`. Read at each use: no restart is needed.\n\n"
        "The file is `lumacast/" +
        std::string(kPreferenceDomain) +
        ".conf` in `$XDG_CONFIG_HOME` (the user's) or one of `$XDG_CONFIG_DIRS` (the\n"
        "administrator's): a line `key=value` each. The first file that has the key decides, so the user's goes first. "
        "A file over 64 KiB, and\n"
        "a disk that does not answer within 40 ms, count as missing. `lumacastctl doctor` shows what is set and "
        "where.\n\n" +
        head({"key", "value", "what it does", "without it"});
    for (const PreferenceRow& preference : kPreferenceTable)
        text += row({code(preference.key), std::string(preference.kind), std::string(preference.meaning),
                     std::string(preference.without)});
    return text +
           "\nYes is `yes`, `true` or a number that is not 0.\n\n"
           "What the administrator sets besides stands in [on a device](../on-a-device.md).\n";
}

}  // namespace lumacast::tables
