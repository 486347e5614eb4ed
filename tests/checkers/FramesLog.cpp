#include "tests/checkers/FramesLog.h"

#include <fstream>
#include <sstream>

namespace lumacast::checkers {

std::optional<FramesLog> readFramesLog(const std::string& path, std::string& error) {
    std::ifstream file(path);
    if (!file) {
        error = "can't read " + path;
        return std::nullopt;
    }
    FramesLog log;
    std::size_t count = 0;
    for (std::string line; std::getline(file, line);) {
        if (file.eof()) break;
        ++count;
        std::istringstream words(line);
        std::uint32_t number = 0;
        std::int64_t shown = 0, sent = 0;
        bool valid = static_cast<bool>(words >> number >> shown);
        if (valid && !(words >> sent)) {
            valid = words.eof();
            sent = shown;
        }
        std::string mark, rest;
        const bool isMarked = valid && static_cast<bool>(words >> mark);
        if (!valid || (isMarked && mark != "mark") || words >> rest || sent > shown) {
            error = path + ": line " + std::to_string(count) + " is not 'number shown_ns [sent_ns [mark]]'";
            return std::nullopt;
        }
        log[number] = {std::chrono::nanoseconds(sent), std::chrono::nanoseconds(shown), isMarked};
    }
    return log;
}

}  // namespace lumacast::checkers
