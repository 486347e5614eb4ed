#include <algorithm>

#include "tests/tables/Tables.h"
#include "tests/unit/architecture/SourceText.h"

namespace lumacast::tables {

std::string textsPage() {
    auto files = architecture::sourcesBelow("src");
    std::sort(files.begin(), files.end(), [](const auto& a, const auto& b) { return a.path < b.path; });
    std::string page =
        "# The texts of the system\n\n"
        "Every text in `src/`, file by file, as it stands in the code: log lines, keys, names that travel, texts that "
        "are\n"
        "printed. Other programs and people's searches rely on them, spelling and spacing included. Printed from the "
        "code by\n"
        "`scripts/tables` and compared with it by a test.\n";
    for (const auto& file : files) {
        const auto texts = architecture::textsOf(file.text);
        if (texts.empty()) continue;
        page += "\n## " + file.path + "\n\n";
        for (const std::string& text : texts) page += "- `" + text + "`\n";
    }
    return page;
}

}  // namespace lumacast::tables
