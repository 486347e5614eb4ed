#include "base/MessageTables.h"
#include "fuzz/seeds/Seeds.h"

namespace lumacast::fuzz {

namespace {

// The steps of a story, see the target; the lowest bit says whose.
constexpr std::uint8_t kSend = 15 << 1, kConnect = 9 << 1, kDie = 10 << 1, kAdvance = 13 << 1, kDisturb = 14 << 1;

class Story {
public:
    explicit Story(std::uint8_t circumstances) : bytes_{1, circumstances} {}

    Story& step(std::uint8_t what, std::uint8_t argument) { return add({what, argument}); }
    Story& step(std::uint8_t what) { return add({what}); }
    Story& send(std::uint8_t who, DaemonMessage message, const Data& arguments = {}) {
        add({static_cast<std::uint8_t>(kSend | who), static_cast<std::uint8_t>(message)});
        return add(arguments);
    }
    /// One window of one's own, 640x360, no flags, no endpoint.
    Story& start(std::uint8_t who) {
        return send(who, DaemonMessage::StartRecording, {1, who, 6, 7, 0, 0, 0, 0, 0, 0});
    }
    Story& aWhile() { return step(kAdvance, 100); }  // 200 ms
    const Data& bytes() const { return bytes_; }

private:
    Story& add(const Data& bytes) {
        bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
        return *this;
    }
    Data bytes_;
};

}  // namespace

void writeMessageSeeds(const std::filesystem::path& corpora) {
    using M = DaemonMessage;
    const auto write = [&](const char* name, const Story& story) {
        writeSeed(corpora, "messages", name, story.bytes());
    };
    write("record", Story(2).start(0).aWhile().send(0, M::StopRecording));
    write("pause", Story(2)
                       .start(0)
                       .aWhile()
                       .send(0, M::PauseRecording)
                       .aWhile()
                       .send(0, M::ResumeRecording, {0})
                       .aWhile()
                       .send(0, M::StopRecordingWithClipDurations, {3, 3})
                       .send(0, M::DiscardRecording));
    write("take-over", Story(0).start(0).aWhile().start(1).aWhile().step(kDie | 1).aWhile());
    write("again", Story(0).start(0).start(0).aWhile().step(kConnect).start(0).aWhile().send(0, M::StopRecording));
    write("odd-sizes", Story(4)
                           .send(0, M::StartRecording, {1, 0, 23, 21, 0, 0, 0, 0, 0, 0})
                           .send(0, M::StartRecording, {1, 0, 16, 3, 0, 0, 0, 0, 0, 0})
                           .aWhile());
    write("odd-clip", Story(0).start(0).aWhile().send(0, M::StopRecordingWithClipDurations, {23, 21}).aWhile());
    write("purge", Story(0).start(0).aWhile().step(kDisturb, 30).aWhile().send(0, M::StopRecording).step(kDisturb, 30));
    write("failing", Story(1).step(7).start(0).aWhile().step(kDisturb, 5).aWhile().start(1).step(kDisturb, 7).aWhile());
    write("entitled", Story(16).send(0, M::StartRecording, {0, 6, 7, 0, 0, 0, 1, 0, 0}).aWhile());
    write("asking", Story(8).start(0).aWhile());
    write("broadcast", Story(0).send(0, M::StartRecording, {1, 0, 6, 7, 0, 0, 1, 0, 0, 1}).aWhile());
    write("full-disk", Story(2).start(0).aWhile().step(kDisturb, 3).aWhile().send(0, M::StopRecording));
    Story all(0);
    all.start(0).aWhile();
    for (std::uint8_t message = 0; message < 20; ++message) all.send(0, static_cast<M>(message));
    write("every-message", all.aWhile());
}

}  // namespace lumacast::fuzz
