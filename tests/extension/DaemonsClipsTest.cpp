// Clips that the daemon's own writer makes, as it cuts them.

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cmath>
#include <fstream>
#include <numbers>
#include <optional>

#include "examples/scene/Scene.h"
#include "extensions/hls-clips/Segmenter.h"
#include "linux/media/LinuxContainerWriters.h"
#include "tests/contract/MediaWorld.h"
#include "tests/contract/ScratchDirectory.h"
#include "tests/extension/StreamJudge.h"

namespace lumacast::test {
namespace {

constexpr int kWidth = 320, kHeight = 180, kRate = 30;
constexpr double kClipSeconds = 1.5;
/// What a tap hands over at a time, of 44,100 a second.
constexpr int kSamplesPerBuffer = 882, kSoundRate = 44'100;
/// A buffer and a picture both last whole cycles: where whole ones of them are left out, the tone stays unbroken.
constexpr double kTone = 600, kQuietTone = 3100;
constexpr double kToneLevel = -10.3;  ///< dB; an amplitude of 10,000

/// Writes clip after clip. The sound cuts: the buffer that exceeds the length is the clip's last, and what comes before
/// the next clip's first picture is in neither.
class Daemon final {
public:
    explicit Daemon(const std::string& folder) : folder_(folder) { clock_.startCaptureClock(); }

    /// The next clip's file.
    std::string cut() {
        const std::string path = folder_ + "/clip-" + std::to_string(++clips_) + ".mp4";
        auto made = writers_.make(URL::file(path), ContainerType::Mpeg4);
        auto& writer = std::get<0>(made);
        const auto video = writer->addVideoInput(testing::videoSettings(kWidth, kHeight));
        const auto audio = writer->addAudioInput(testing::audioSettings());
        EXPECT_TRUE(writer->startWriting());
        std::optional<double> first;
        for (bool isOver = false; !isOver;) {
            const double shown = static_cast<double>(frame_) / kRate;
            // Sound comes when its last sample was heard.
            if (shown <= soundTime() + static_cast<double>(kSamplesPerBuffer) / kSoundRate) {
                goOnTo(shown);
                if (!first) writer->startSession(testing::atSeconds(*(first = shown)));
                append(*video, picture(shown));
                ++frame_;
                continue;
            }
            isOver = soundTime() - begin_ > kClipSeconds;
            if (isOver) begin_ = soundTime();
            const SampleRef buffer = sound();
            goOnTo(soundTime());
            if (first) append(*audio, buffer);
        }
        testing::Happening finished;
        writer->finishWriting([&] { finished.happen(); });
        EXPECT_TRUE(finished.waitFor());
        EXPECT_EQ(writer->status(), ContainerStatus::Completed);
        seconds_ += soundTime() - first.value_or(0);
        return path;
    }
    std::uint32_t frames() const { return frame_; }
    /// Of all clips so far, each from its first picture to the end of its sound.
    double seconds() const { return seconds_; }

private:
    double soundTime() const { return static_cast<double>(sample_) / kSoundRate; }
    void goOnTo(double seconds) {
        const auto wanted = std::chrono::nanoseconds(std::llround(seconds * 1e9));
        clock_.advance(wanted - now_);
        now_ = wanted;
    }
    static void append(TrackInput& input, const SampleRef& sample) {
        EXPECT_TRUE(eventually([&] { return input.isReadyForMoreMediaData(); }));
        EXPECT_TRUE(input.append(sample));
    }
    SampleRef picture(double seconds) {
        auto plane = std::make_shared<testing::PaintedPlane>(kWidth, kHeight, frame_ + 1);
        auto* const pixels = const_cast<std::uint8_t*>(plane->pixels().data());
        scene_.draw({pixels, kWidth, kHeight, plane->stride()}, frame_, {12, 34, 56, 789});
        return testing::picture(std::move(plane), testing::atSeconds(seconds));
    }
    SampleRef sound() {
        const double start = soundTime();
        Data bytes;
        for (int at = 0; at < kSamplesPerBuffer; ++at, ++sample_) {
            const double phase = 2 * std::numbers::pi * kTone * soundTime();
            const auto value = static_cast<std::uint16_t>(static_cast<std::int16_t>(10'000 * std::sin(phase)));
            bytes.push_back(static_cast<std::uint8_t>(value >> 8));
            bytes.push_back(static_cast<std::uint8_t>(value));
        }
        const SampleTiming timing{MediaTime::make(1, kSoundRate), testing::atSeconds(start), kInvalidMediaTime};
        return SampleBuffer::makeAudio(testing::tapFormat(), std::move(bytes), kSamplesPerBuffer, timing);
    }

    const std::string folder_;
    testing::HandClock clock_;
    LinuxContainerWriters writers_{clock_};
    scene::Scene scene_{kWidth, kHeight, scene::Motion::Everywhere};
    std::chrono::nanoseconds now_{};
    int clips_ = 0;
    double begin_ = 0, seconds_ = 0;
    std::uint32_t frame_ = 0;
    std::int64_t sample_ = 0;
};

TEST(DaemonsClips, BecomeAStreamWithEveryFrameAndAnUnbrokenTone) {
    ScratchDirectory scratch;
    Daemon daemon(scratch.path());
    extensions::Segmenter segmenter{6};
    const std::string joined = scratch.path("joined.mp4");
    std::ofstream file(joined, std::ios::binary);
    const auto write = [&](const Data& bytes) {
        file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    };
    Data init;
    double seconds = 0;
    for (int at = 0; at < 4; ++at) {
        const Fd clip(::open(daemon.cut().c_str(), O_RDONLY | O_CLOEXEC));
        std::string error;
        const auto segments = segmenter.add(clip, at == 3, error);
        ASSERT_EQ(error, "");
        ASSERT_EQ(segments.size(), 1u);
        if (at == 0) write(init = segments[0].init);
        EXPECT_EQ(segments[0].init, init);
        write(segments[0].media);
        seconds += static_cast<double>(segments[0].ticks) / extensions::kTicksPerSecond;
    }
    file.close();
    EXPECT_NEAR(seconds, daemon.seconds(), 0.001);
    expectFrames(joined, 0, daemon.frames() - 1);
    const auto sound = soundOf(joined);
    // A hole of half a picture's length costs 2 dB where it is in the middle of a window, little at its edge: so twice,
    // half a window apart.
    using std::chrono::milliseconds;
    for (const milliseconds from : {milliseconds(50), milliseconds(100)})
        expectUnbrokenTone(sound, kTone, kQuietTone, {from, milliseconds(5900)}, kToneLevel - 1);
}

}  // namespace
}  // namespace lumacast::test
