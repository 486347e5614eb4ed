#pragma once
// How the tests of extensions ask and wait.

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "tests/contract/Eventually.h"
#include "tests/contract/ExtensionsWorld.h"
#include "tests/contract/IpcWorld.h"

namespace lumacast {

/// Processes that were started with a path of this test's.
inline std::size_t processesWith(const std::string& path) {
    std::size_t count = 0;
    for (const auto& entry : std::filesystem::directory_iterator("/proc")) {
        const std::string name = entry.path().filename().string();
        if (name.find_first_not_of("0123456789") != std::string::npos) continue;
        std::ifstream file(entry.path() / "cmdline");
        std::string command;
        std::getline(file, command, '\n');  // all of it; an iterator would throw when the process has just gone
        if (command.find(path) != std::string::npos) ++count;
    }
    return count;
}

struct Lookup {
    std::vector<std::shared_ptr<AppExtension>> found;
    std::optional<Error> error;
    bool wasInline = false;
};

inline Lookup findExtensions(ExtensionsWorld& world, const std::string& point = "org.example.point") {
    const auto answer = std::make_shared<Shared<std::optional<Lookup>>>();
    world.extensions().extensionsWithMatchingPoint(point, [answer](auto found, auto error) {
        answer->set(Lookup{std::move(found), std::move(error), false});
    });
    if (!eventually([&] { return answer->get().has_value(); })) return {};
    // The lane that answered may hold its copies for a moment.
    Lookup lookup = *answer->get();
    answer->set(std::nullopt);
    return lookup;
}

inline ExtensionItem textItem(std::string title, std::string text) {
    return {std::move(title), {{std::string(kGenericDataType), Value(std::move(text)), std::nullopt}}};
}

inline std::string textOf(const ExtensionItem& item) {
    const auto* text = item.attachments.empty() ? nullptr : item.attachments.front().item.as<std::string>();
    return text ? *text : std::string();
}

inline Data pngOf(std::uint8_t contents) {
    return {0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n', contents};
}

struct BegunRequest {
    std::optional<ExtensionRequestID> request;
    std::optional<Error> error;
};

/// Begins a request with a command for the program, and waits for the answer.
inline BegunRequest begin(AppExtension& extension, const std::string& command, std::vector<ExtensionItem> items = {}) {
    const auto answer = std::make_shared<Shared<std::optional<BegunRequest>>>();
    items.insert(items.begin(), textItem("command", command));
    extension.beginExtensionRequestWithInputItems(std::move(items), [answer](auto request, auto error) {
        answer->set(BegunRequest{request, error});
    });
    static_cast<void>(eventually([&] { return answer->get().has_value(); }));
    return answer->get().value_or(BegunRequest{});
}

/// Keeps what an extension's requests are completed with.
class Completions {
public:
    struct Completed {
        ExtensionRequestID request;
        std::vector<ExtensionItem> items;
    };
    explicit Completions(AppExtension& extension) {
        extension.setRequestCompletionHandler(
            [kept = kept_](ExtensionRequestID request, std::vector<ExtensionItem> items) {
                kept->change([&](auto& all) { all.push_back({request, std::move(items)}); });
            });
    }
    std::vector<Completed> get() const { return kept_->get(); }
    std::size_t count() const { return kept_->get().size(); }
    std::vector<Completed> take() {
        auto all = kept_->get();
        kept_->set({});
        return all;
    }
    bool hasTitle(const std::string& title) const {
        for (const Completed& one : kept_->get())
            for (const ExtensionItem& item : one.items)
                if (item.attributedTitle == title) return true;
        return false;
    }

private:
    const std::shared_ptr<Shared<std::vector<Completed>>> kept_ = std::make_shared<Shared<std::vector<Completed>>>();
};

}  // namespace lumacast
