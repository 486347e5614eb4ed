#include <algorithm>
#include <optional>

#include "client/lumacastctl/Fields.h"
#include "client/lumacastctl/save/Save.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

namespace {

std::optional<SaveState> stateOf(std::string_view name) {
    if (name == "mixing") return SaveState::Mixing;
    if (name == "adding") return SaveState::Adding;
    if (name == "saved") return SaveState::Saved;
    if (name == "failed") return SaveState::Failed;
    return std::nullopt;
}

std::optional<SaveProgress> readEntry(const Dictionary& entry) {
    const auto state = stateOf(textIn(entry, "state").value_or(""));
    if (!state) return std::nullopt;
    SaveProgress result;
    result.state = *state;
    const double part = numberIn(entry, "progress").value_or(0);
    result.part = part > 0 ? std::min(part, 1.0) : 0;
    result.savedAs = textIn(entry, "savedAs").value_or("");
    result.error = textIn(entry, "error").value_or("");
    if (result.state == SaveState::Saved && result.savedAs.empty()) return std::nullopt;
    result.entry = entry;
    return result;
}

}  // namespace

std::string fileURL(std::string_view path) {
    static constexpr char kDigits[] = "0123456789ABCDEF";
    std::string url = "file://";
    for (const char c : path) {
        const bool isPlain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                             std::string_view("-._~/").find(c) != std::string_view::npos;
        if (isPlain) {
            url += c;
            continue;
        }
        const auto byte = static_cast<unsigned char>(c);
        url += {'%', kDigits[byte >> 4], kDigits[byte & 15]};
    }
    return url;
}

std::variant<std::uint64_t, std::string> readSaveNumber(std::string_view answer) {
    const auto value = valueFromJson(answer);
    const auto* top = value ? value->as<Dictionary>() : nullptr;
    if (!top) return kNotUnderstood;
    if (const auto error = textIn(*top, "error")) return *error;
    if (const auto number = countIn(*top, "save")) return *number;
    return kNotUnderstood;
}

std::variant<SaveProgress, SaveUnseen, std::string> readSaveProgress(std::string_view answer, std::uint64_t number) {
    const auto value = valueFromJson(answer);
    if (const auto* top = value ? value->as<Dictionary>() : nullptr)
        if (textIn(*top, "error")) return SaveUnseen{};
    const auto* list = value ? value->as<Array>() : nullptr;
    if (!list) return kNotUnderstood;
    for (const Value& each : *list) {
        const auto* entry = each.as<Dictionary>();
        if (!entry || countIn(*entry, "number") != number) continue;
        if (auto progress = readEntry(*entry)) return std::move(*progress);
        return kNotUnderstood;
    }
    return "it knows nothing of this save any more; was it started anew?";
}

std::string progressBar(const SaveProgress& progress) {
    constexpr std::size_t kWidth = 30;
    const bool isMixing = progress.state == SaveState::Mixing;
    const double part = isMixing ? progress.part : 1;
    const auto done = static_cast<std::size_t>(part * kWidth);
    const std::string percent = std::to_string(static_cast<int>(part * 100));
    return std::string(isMixing ? "mixing   [" : "copying  [") + std::string(done, '#') +
           std::string(kWidth - done, ' ') + "] " + std::string(3 - std::min<std::size_t>(3, percent.size()), ' ') +
           percent + " %";
}

}  // namespace lumacast::ctl
