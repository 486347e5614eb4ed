#pragma once
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "linux/ipc/FileTokens.h"
#include "linux/system/DiskLane.h"
#include "platform/AppExtension.h"

namespace lumacast {

/// The tokens that one extension was handed. A token stands for one file, opened when it was issued, so nothing put in
/// its place later is ever handed out. It is good once, while the request it was handed over with goes on. Thread-safe.
class FileTokens final {
public:
    /// Files beneath `directory` only.
    FileTokens(std::string directory, std::shared_ptr<DiskLane> disk);

    /// A token for the file: 256 random bits as 64 digits. None when it is not a regular file of this user's beneath
    /// the directory, a link is on the way, or the disk has not answered within 100 ms.
    std::optional<std::string> issue(const std::string& path);
    /// The tokens that are among these items belong to this request; without a request they are worth nothing.
    void handOver(std::optional<ExtensionRequestID> request, const std::vector<ExtensionItem>& items);
    /// The request is over, and so are its tokens.
    void end(ExtensionRequestID request);
    /// The process is over: so are the tokens of its requests, and what was counted. One that was issued and not handed
    /// over yet stays: it is of a request that the next process will get.
    void endAll();

    /// Answers one exchange. A peer that guesses is refused after a few tries.
    TokenAnswer exchange(Bytes token);

private:
    struct Token {
        std::string text;
        Fd file;
        std::optional<ExtensionRequestID> request;
    };
    const std::string directory_;
    const std::shared_ptr<DiskLane> disk_;
    std::mutex mutex_;
    std::vector<Token> tokens_;
    int wrong_ = 0;
};

}  // namespace lumacast
