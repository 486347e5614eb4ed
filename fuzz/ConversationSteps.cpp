// The steps of a conversation: what the peer says, and what this end does meanwhile.

#include <sys/socket.h>

#include <cerrno>
#include <iterator>

#include "base/Limits.h"
#include "base/Wire.h"
#include "fuzz/Conversation.h"
#include "tests/fakes/FakePlane.h"

namespace lumacast::fuzz {

namespace {

/// An array of the one handle, which is a plane; an array of true.
const Data kOnePlane{9, 1, 0, 0, 0, 13, 0}, kTrue{9, 1, 0, 0, 0, 1, 1},
    kNumber{9, 1, 0, 0, 0, 2, 1, 0, 0, 0, 0, 0, 0, 0};

/// A picture in memory that can't shrink.
class LentPlane final : public SharedPlane {
public:
    explicit LentPlane(int memory) : memory_(memory) {}
    std::int32_t width() const override { return 8; }
    std::int32_t height() const override { return 4; }
    std::size_t stride() const override { return 32; }
    std::span<const std::uint8_t> pixels() const override { return {}; }
    std::span<const PixelRect> damage() const override { return {}; }
    std::uint64_t pictureNumber() const override { return 7; }
    int descriptor() const override { return memory_; }

private:
    const int memory_;
};

Data dataOf(Bytes bytes) {
    return Data(bytes.begin(), bytes.end());
}

FrameHeader headerOf(FrameKind kind, std::uint64_t sequence, std::uint16_t message = 0) {
    FrameHeader header;
    header.kind = kind;
    header.sequence = sequence;
    header.message = message;
    return header;
}

}  // namespace

void Conversation::step() {
    switch (script_.below(11)) {
        case 0: return lend();
        case 1: return giveBackPlane();
        case 2: return sendPlane();
        case 3: return letGo();
        case 4: return changeTokens();
        case 5: return exchangeToken();
        case 6: return askForFile();
        case 7: return sendFile();
        case 8: return ask();
        case 9: return answer();
        default: return sendAnything();
    }
}

std::uint64_t Conversation::numberFrom(const Numbers& numbers) {
    const std::uint8_t which = script_.byte();
    if (which >= 200 || numbers.empty()) return which;
    return *std::next(numbers.begin(), static_cast<std::ptrdiff_t>(which % numbers.size()));
}

void Conversation::say(FrameHeader header, const Data& value, const Data& records, std::vector<int> descriptors) {
    header.valueBytes = static_cast<std::uint32_t>(value.size());
    header.recordBytes = static_cast<std::uint32_t>(records.size());
    header.handles = static_cast<std::uint8_t>(descriptors.size());
    Data frame(kFrameHeaderBytes);
    writeFrameHeader(header, frame);
    frame.insert(frame.end(), value.begin(), value.end());
    frame.insert(frame.end(), records.begin(), records.end());
    sendTo(peer_.get(), frame, descriptors);
}

void Conversation::lend() {
    const std::uint8_t how = script_.byte();
    std::shared_ptr<SharedPlane> plane;
    if (how & 1)
        plane = std::make_shared<FakePlane>(2, 2, 3, std::vector<PixelRect>{{0, 0, 1, 1}});
    else
        plane = std::make_shared<LentPlane>(wares_.descriptor(0));
    lent_.push_back(plane);
    const auto asked = std::make_shared<Asked>();
    asked->wantsReply = (how & 2) != 0;
    asked_.push_back(asked);
    auto proxy = connection_->remoteProxy([asked](const Error&) { ++asked->errors; });
    if (!asked->wantsReply) return proxy->send(0, {Value(std::move(plane))});
    proxy->send(1, {Value(std::move(plane))}, [asked](const Array&) { ++asked->replies; });
}

void Conversation::giveBackPlane() {
    const std::uint64_t lease = numberFrom(leases_);
    peerBroke(leases_.erase(lease) == 0);
    say(headerOf(FrameKind::PlaneReturned, lease), {});
}

/// A plane of 4096 bytes at most; it is lent under a lease of its own. Or, deliberately, under none that is good.
void Conversation::sendPlane() {
    const std::uint8_t size = script_.byte(), ware = script_.byte();
    const auto width = static_cast<std::int32_t>(size % 16), height = static_cast<std::int32_t>(size / 16);
    PlaneRecord record{++lastLease_, width, height, 4 * static_cast<std::uint64_t>(width), 1, {}};
    if (script_.flag()) record.damage.push_back({0, 0, width, height});
    if (script_.below(8) == 7) record.stride = script_.number(4);
    Data records;
    appendRecord(records, record);
    const int kind = ware < 200 ? 0 : ware % 5;
    const bool isGood = kind == 0 && width > 0 && height > 0 &&
                        record.stride >= 4 * static_cast<std::uint64_t>(width) &&
                        record.stride * static_cast<std::uint64_t>(height) <= 4096;
    peerBroke(!isGood);
    if (isGood) ownLeases_.insert(lastLease_);
    say(headerOf(FrameKind::Message, ++sequence_), kOnePlane, records,
        {wares_.descriptor(static_cast<unsigned>(kind))});
}

void Conversation::ask() {
    const std::uint16_t message = script_.byte() < 200 ? 2 : script_.byte();
    Array arguments{Value(dataOf(script_.bytes(script_.below(64))))};
    WireBody body;
    if (!encodeArray(arguments, body)) return;
    peerBroke(message != 2);
    ++sequence_;
    if (message == 2) ownRequests_.insert(sequence_);
    say(headerOf(FrameKind::Request, sequence_, message), body.bytes);
}

void Conversation::answer() {
    const std::uint64_t request = numberFrom(requests_);
    const unsigned how = script_.below(4);
    peerBroke(requests_.erase(request) == 0 || how == 3);
    if (how == 0) return say(headerOf(FrameKind::NoReply, request, script_.byte()), {});
    say(headerOf(FrameKind::Reply, request), how == 3 ? kNumber : kTrue);
}

void Conversation::letGo() {
    const std::uint8_t which = script_.byte();
    if (which % 2 == 0 && !held_.empty()) {
        held_.erase(held_.begin() + which / 2 % static_cast<std::ptrdiff_t>(held_.size()));
    } else if (!replies_.empty()) {
        const auto at = replies_.begin() + which / 2 % static_cast<std::ptrdiff_t>(replies_.size());
        if (which < 200) (*at)({which < 100 ? Value(true) : Value()});
        if (which < 20) (*at)({Value(false)});  // a second time, which does nothing
        replies_.erase(at);
    }
}

void Conversation::changeTokens() {
    const std::uint8_t request = script_.below(3);
    const ExtensionRequestID id{request};
    switch (script_.below(5)) {
        case 0:
        case 1: {
            if (issued_.size() >= 8) return;
            // A disk that does not answer in time issues none.
            if (auto text = tokens_.issue(files_.file())) issued_.push_back({std::move(*text), true, std::nullopt});
            return;
        }
        case 2: {
            std::vector<ExtensionItem> items;
            for (Token& token : issued_) {
                if (token.request) continue;
                token.request = request;
                items.push_back({"", {{std::string(kGenericDataType), Data(token.text.begin(), token.text.end()), {}}}});
            }
            tokens_.handOver(id, items);
            return;
        }
        case 3:
            tokens_.end(id);
            for (Token& token : issued_) token.isGood = token.isGood && token.request != request;
            return;
        default:
            tokens_.endAll();
            wrongTokens_ = 0;
            for (Token& token : issued_) token.isGood = token.isGood && !token.request;
            return;
    }
}

void Conversation::exchangeToken() {
    const std::uint8_t which = script_.byte(), change = script_.byte();
    std::string text = "no token";
    Token* token = which < 200 && !issued_.empty() ? &issued_[which % issued_.size()] : nullptr;
    if (token) text = token->text;
    if (change >= 200 && change < 216) text[change % text.size()] ^= 1;
    if (change >= 216 && change < 232) text.resize(text.size() + change % 16 - 8);
    if (change >= 232) text = std::string(textOf(script_.bytes(change)));
    const bool canBeOne = !text.empty() && text.size() <= kMaximumTokenBytes;
    const bool isGood = token && token->text == text && token->isGood && token->request;
    if (isGood) token->isGood = false;
    if (canBeOne && !isGood) ++wrongTokens_;
    peerBroke(!canBeOne || wrongTokens_ >= 8);
    if (!mustBeRefused_) ownExchanges_[exchange_ + 1] = isGood;
    say(headerOf(FrameKind::ExchangeToken, ++exchange_), Data(text.begin(), text.end()));
}

void Conversation::askForFile() {
    const Data token(script_.byte(), 'x');
    const auto asked = std::make_shared<Asked>();
    asked->wantsReply = true;
    asked_.push_back(asked);
    exchangeFileToken(connection_, token, [this, asked](const Fd& file, const std::optional<Error>& error) {
        ++(file ? asked->replies : asked->errors);
        if (static_cast<bool>(file) == error.has_value()) wrong_ = "an exchange ends with a file or with an error";
    });
}

void Conversation::sendFile() {
    const std::uint64_t exchange = numberFrom(filesAskedFor_);
    const std::uint8_t how = script_.byte();
    const bool isKnown = filesAskedFor_.erase(exchange) == 1;
    if (how % 4 == 0) {
        const auto error = static_cast<std::uint16_t>(how / 4);
        peerBroke(!isKnown || error == 0);
        return say(headerOf(FrameKind::TokenExchanged, exchange, error), {});
    }
    const std::uint8_t record = how >= 200 ? 1 : kFileRecord;
    peerBroke(!isKnown || record != kFileRecord);
    say(headerOf(FrameKind::TokenExchanged, exchange), {}, {record}, {wares_.descriptor(4)});
}

/// Some frame, or some bytes, with some descriptors. From here on only what always holds can be expected.
void Conversation::sendAnything() {
    isWild_ = true;
    FrameHeader header;
    header.kind = static_cast<FrameKind>(script_.below(9));
    header.sequence = script_.byte();
    header.message = script_.byte();
    if (script_.flag()) header.sequence = ++sequence_;
    const std::uint8_t how = script_.byte();
    std::vector<int> descriptors;
    for (unsigned count = script_.below(10); count > 0; --count)
        descriptors.push_back(wares_.descriptor(script_.byte()));
    const Data value = dataOf(script_.bytes(script_.byte())), records = dataOf(script_.bytes(script_.byte()));
    if (how < 224) return say(header, value, records, descriptors);
    if (!value.empty()) sendTo(peer_.get(), value, descriptors);
}

}  // namespace lumacast::fuzz
