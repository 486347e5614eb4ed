#include "linux/extensions/FileTokens.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include "linux/storage/BeneathDirectory.h"

namespace lumacast {

namespace {

constexpr std::chrono::milliseconds kPatience{100};
constexpr std::size_t kTokenBytes = 32;
/// One that comes late, or twice, is no attack yet.
constexpr int kWrongTokens = 8;
/// Tokens that no request was begun with yet.
constexpr std::size_t kMostWaiting = 16;

std::optional<std::string> randomToken() {
    std::array<unsigned char, kTokenBytes> bytes;
    std::size_t got = 0;
    while (got < bytes.size()) {
        const ssize_t count = ::getrandom(bytes.data() + got, bytes.size() - got, 0);
        if (count < 0 && errno != EINTR) return std::nullopt;
        if (count > 0) got += static_cast<std::size_t>(count);
    }
    static constexpr char kDigits[] = "0123456789abcdef";
    std::string text;
    for (const unsigned char byte : bytes) {
        text += kDigits[byte >> 4];
        text += kDigits[byte & 15];
    }
    return text;
}

/// To be read only, beneath the directory, no link followed. -1 when it can't be had.
int openToRead(const std::string& directory, const std::string& path) {
    const auto place = resolveBeneath(directory, path, availableResolution());
    const auto* name = std::get_if<ResolvedName>(&place);
    if (!name || withSingleSlashes(path) == withSingleSlashes(directory)) return -1;
    Fd file(
        ::openat(name->directory.get(), name->name.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != ::geteuid())
        return -1;
    return file.release();
}

/// Takes as long for every text of the same length.
bool isSame(Bytes given, const std::string& text) {
    if (given.size() != text.size()) return false;
    unsigned difference = 0;
    for (std::size_t i = 0; i < text.size(); ++i) difference |= given[i] ^ static_cast<unsigned char>(text[i]);
    return difference == 0;
}

}  // namespace

FileTokens::FileTokens(std::string directory, std::shared_ptr<DiskLane> disk)
    : directory_(std::move(directory)), disk_(std::move(disk)) {}

std::optional<std::string> FileTokens::issue(const std::string& path) {
    const auto answer = disk_->ask<std::shared_ptr<Fd>>(
        kPatience, [directory = directory_, path] { return std::make_shared<Fd>(openToRead(directory, path)); });
    if (!answer || !**answer) return std::nullopt;
    auto text = randomToken();
    if (!text) return std::nullopt;
    const std::lock_guard lock(mutex_);
    const auto waiting = std::count_if(tokens_.begin(), tokens_.end(), [](const Token& t) { return !t.request; });
    if (static_cast<std::size_t>(waiting) >= kMostWaiting) return std::nullopt;
    tokens_.push_back({*text, std::move(**answer), std::nullopt});
    return text;
}

void FileTokens::handOver(std::optional<ExtensionRequestID> request, const std::vector<ExtensionItem>& items) {
    const std::lock_guard lock(mutex_);
    for (const ExtensionItem& item : items)
        for (const ItemProvider& attachment : item.attachments) {
            const Data* data = attachment.item.as<Data>();
            const auto token = std::find_if(tokens_.begin(), tokens_.end(), [&](const Token& one) {
                return data && !one.request && isSame(*data, one.text);
            });
            if (token == tokens_.end()) continue;
            if (request)
                token->request = request;
            else
                tokens_.erase(token);
        }
}

void FileTokens::end(ExtensionRequestID request) {
    const std::lock_guard lock(mutex_);
    std::erase_if(tokens_, [&](const Token& token) { return token.request == request; });
}

void FileTokens::endAll() {
    const std::lock_guard lock(mutex_);
    std::erase_if(tokens_, [](const Token& token) { return token.request.has_value(); });
    wrong_ = 0;
}

TokenAnswer FileTokens::exchange(Bytes given) {
    const std::lock_guard lock(mutex_);
    TokenAnswer answer;
    auto found = tokens_.end();
    for (auto token = tokens_.begin(); token != tokens_.end(); ++token)
        if (isSame(given, token->text) && token->request) found = token;
    if (found == tokens_.end()) {
        answer.error = EACCES;
        answer.isPeerRefused = ++wrong_ >= kWrongTokens;
        return answer;
    }
    answer.file = std::move(found->file);
    tokens_.erase(found);
    return answer;
}

}  // namespace lumacast
