#include <curl/curl.h>

#include <algorithm>
#include <cstring>

#include "extensions/hls-clips/Destination.h"

namespace lumacast::extensions {

namespace {

constexpr long kConnectSeconds = 5;
constexpr long kTransferSeconds = 20;

struct CurlFree {
    void operator()(CURL* handle) const { curl_easy_cleanup(handle); }
    void operator()(curl_slist* list) const { curl_slist_free_all(list); }
};

class Upload final : public Destination {
public:
    Upload(std::string url, std::function<bool()> isGivenUp)
        : url_(std::move(url)), isGivenUp_(std::move(isGivenUp)), handle_(curl_easy_init()) {
        if (!url_.ends_with('/')) url_ += '/';
    }

    std::string put(const std::string& name, const Data& contents, std::string_view contentType) override {
        if (!prepare(name)) return "no transfer can be made";
        const std::string type = "Content-Type: " + std::string(contentType);
        std::unique_ptr<curl_slist, CurlFree> headers(curl_slist_append(nullptr, type.c_str()));
        // Servers that answer late with "100 Continue" would cost a second for each file.
        curl_slist_append(headers.get(), "Expect:");
        Rest rest{contents.data(), contents.size()};
        curl_easy_setopt(handle_.get(), CURLOPT_HTTPHEADER, headers.get());
        curl_easy_setopt(handle_.get(), CURLOPT_UPLOAD, 1L);
        curl_easy_setopt(handle_.get(), CURLOPT_READFUNCTION, &read);
        curl_easy_setopt(handle_.get(), CURLOPT_READDATA, &rest);
        curl_easy_setopt(handle_.get(), CURLOPT_INFILESIZE_LARGE, static_cast<curl_off_t>(contents.size()));
        return perform();
    }

    void remove(const std::string& name) override {
        if (!prepare(name)) return;
        curl_easy_setopt(handle_.get(), CURLOPT_CUSTOMREQUEST, "DELETE");
        perform();
    }

private:
    struct Rest {
        const std::uint8_t* bytes;
        std::size_t count;
    };

    /// The handle keeps its connection from one transfer to the next, and nothing else.
    bool prepare(const std::string& name) {
        if (!handle_) return false;
        curl_easy_reset(handle_.get());
        curl_easy_setopt(handle_.get(), CURLOPT_URL, (url_ + name).c_str());
        curl_easy_setopt(handle_.get(), CURLOPT_PROTOCOLS_STR, "http,https");
        curl_easy_setopt(handle_.get(), CURLOPT_NOSIGNAL, 1L);
        curl_easy_setopt(handle_.get(), CURLOPT_CONNECTTIMEOUT, kConnectSeconds);
        curl_easy_setopt(handle_.get(), CURLOPT_TIMEOUT, kTransferSeconds);
        curl_easy_setopt(handle_.get(), CURLOPT_FAILONERROR, 1L);
        curl_easy_setopt(handle_.get(), CURLOPT_WRITEFUNCTION, &discard);
        curl_easy_setopt(handle_.get(), CURLOPT_NOPROGRESS, 0L);
        curl_easy_setopt(handle_.get(), CURLOPT_XFERINFOFUNCTION, &progress);
        curl_easy_setopt(handle_.get(), CURLOPT_XFERINFODATA, this);
        return true;
    }
    std::string perform() {
        const CURLcode code = curl_easy_perform(handle_.get());
        return code == CURLE_OK ? std::string() : curl_easy_strerror(code);
    }

    static std::size_t read(char* into, std::size_t size, std::size_t count, void* opaque) {
        Rest& rest = *static_cast<Rest*>(opaque);
        const std::size_t taken = std::min(size * count, rest.count);
        std::memcpy(into, rest.bytes, taken);
        rest.bytes += taken;
        rest.count -= taken;
        return taken;
    }
    static std::size_t discard(char*, std::size_t size, std::size_t count, void*) { return size * count; }
    static int progress(void* opaque, curl_off_t, curl_off_t, curl_off_t, curl_off_t) {
        return static_cast<Upload*>(opaque)->isGivenUp_() ? 1 : 0;
    }

    std::string url_;
    const std::function<bool()> isGivenUp_;
    const std::unique_ptr<CURL, CurlFree> handle_;
};

}  // namespace

std::unique_ptr<Destination> makeUpload(std::string url, std::function<bool()> isGivenUp) {
    return std::make_unique<Upload>(std::move(url), std::move(isGivenUp));
}

}  // namespace lumacast::extensions
