// What a player shows and plays of a movie that was encoded anew, with its sound mixed.

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/resource.h>

#include <atomic>
#include <cerrno>
#include <fstream>
#include <cstring>
#include <functional>
#include <thread>

#include "linux/media/LinuxMovieExporters.h"
#include "linux/system/LowPriority.h"
#include "tests/unit/linux_media/FaultyFiles.h"
#include "tests/unit/linux_media/RecordedMovie.h"
#include "tests/unit/linux_media/Times.h"
#include "tests/unit/linux_media/Tones.h"

namespace lumacast::testing {
namespace {

/// A running export, and what it said.
struct Job {
    std::shared_ptr<MovieExporter> exporter;
    std::atomic<int> status{-1};
    std::optional<Error> error;
    Happening done;

    void run() {
        exporter->exportAsynchronously([this](ExportStatus ended, std::optional<Error> why) {
            error = std::move(why);
            status = static_cast<int>(ended);
            done.happen();
        });
    }
    ExportStatus wait() {
        EXPECT_TRUE(done.waitFor());
        return static_cast<ExportStatus>(status.load());
    }
};

class Mix : public ::testing::Test {
protected:
    static constexpr int kRate = 20;
    static int greyOf(int picture) { return 40 + picture * 7 % 200; }

    /// 20 pictures a second.
    void record(int seconds, const std::function<void(RecordedMovie&)>& addSound, int width = 128, int height = 96) {
        movie_ = std::make_unique<RecordedMovie>(width, height);
        movie_->video->setTransform(transform_);
        movie_->start();
        for (int i = 0; i < seconds * kRate; ++i) ASSERT_TRUE(movie_->appendGrey(greyOf(i), i * kSecond / kRate));
        addSound(*movie_);
        movie_->clock.advance(std::chrono::seconds(seconds));
        ASSERT_EQ(movie_->finish(), ContainerStatus::Completed);
    }
    std::unique_ptr<Job> job(const std::string& name = "mixed.mp4", const std::string& from = "",
                             LinuxMovieExporters* exporters = nullptr) {
        LinuxMovieExporters& used = exporters ? *exporters : exporters_;
        const auto asset = used.openMovie(URL::file(from.empty() ? movie_->path() : from));
        auto made = std::make_unique<Job>();
        made->exporter = used.makeExporter(asset, ExportPreset::HighestQuality, URL::file(path(name)));
        AudioMix mix;
        for (const std::int32_t track : asset->audioTracks()) mix.inputParameters.push_back({track});
        made->exporter->setAudioMix(mix);
        return made;
    }
    ExportStatus mixed() {
        const auto made = job();
        made->run();
        return made->wait();
    }
    checkers::Sound soundOf(const std::string& file) {
        auto sound = checkers::MovieReader(file).readSound();
        EXPECT_TRUE(sound);
        return sound.value_or(checkers::Sound{});
    }
    static double peakOf(const checkers::Sound& sound) {
        double peak = 0;
        for (const float sample : sound.samples) peak = std::max(peak, std::abs(static_cast<double>(sample)));
        return peak;
    }
    /// The level of one tone in what is heard.
    static double levelOf(const checkers::Sound& sound, double hertz, double from, double to) {
        double sine = 0, cosine = 0;
        const auto first = static_cast<std::size_t>(from * sound.rate);
        const auto last = static_cast<std::size_t>(to * sound.rate);
        if (last > sound.samples.size()) return -1;
        for (std::size_t i = first; i < last; ++i) {
            const double angle = 2 * std::numbers::pi * hertz * static_cast<double>(i) / sound.rate;
            sine += sound.samples[i] * std::sin(angle);
            cosine += sound.samples[i] * std::cos(angle);
        }
        return 2 * std::hypot(sine, cosine) / static_cast<double>(last - first);
    }
    void expectPictures(const std::string& file, int count) {
        const auto shown = shownPictures(file);
        ASSERT_EQ(shown.size(), static_cast<std::size_t>(count));
        for (int i = 0; i < count; ++i) {
            EXPECT_NEAR(shown[static_cast<std::size_t>(i)].nanoseconds, i * kSecond / kRate, kTick) << i;
            EXPECT_NEAR(shown[static_cast<std::size_t>(i)].luma, lumaOfGrey(greyOf(i)), 2) << i;
        }
    }
    std::string path(const std::string& name = "mixed.mp4") const { return directory_.path(name); }
    bool exists(const std::string& name = "mixed.mp4") const { return std::filesystem::exists(path(name)); }

    ScratchDirectory directory_;
    AffineTransform transform_;
    std::unique_ptr<RecordedMovie> movie_;
    LinuxMovieExporters exporters_{std::make_shared<media::PosixMovieFiles>(), media::EncodingPriority::AsUsual};
};

TEST_F(Mix, OfTwoTracksIsOneTrackWithBothInPlace) {
    record(4, [](RecordedMovie& movie) {
        appendTone(*movie.sound, tapFormat(), 0, 0, 4 * 44100, 441);
        appendTone(*movie.microphone, tapFormat(), kSecond, 44100, 44100, 882);  // stamped from 2 s on
    });
    ASSERT_EQ(exporters_.openMovie(URL::file(movie_->path()))->audioTracks().size(), 2u);
    ASSERT_EQ(mixed(), ExportStatus::Completed);
    checkers::MovieReader reader(path());
    ASSERT_EQ(reader.audioTracks().size(), 1u);
    EXPECT_EQ(reader.audioTracks()[0].codec, "aac");
    EXPECT_EQ(reader.audioTracks()[0].channels, 2);
    ASSERT_EQ(reader.videoTracks().size(), 1u);
    EXPECT_EQ(reader.videoTracks()[0].profile, "High");
    EXPECT_NEAR(static_cast<double>(reader.duration().count()), 4e9, 1e5);
    expectPictures(path(), 4 * kRate);
    const auto sound = soundOf(path());
    EXPECT_NEAR(levelOf(sound, 441, 0.2, 1.8), 0.5, 0.01) << "nothing was to be turned down";
    EXPECT_LT(levelOf(sound, 882, 0.2, 1.8), 0.005);
    EXPECT_NEAR(levelOf(sound, 882, 2.1, 2.9), 0.5, 0.03);
    EXPECT_LT(levelOf(sound, 882, 3.1, 3.9), 0.005);
    EXPECT_NEAR(phaseDelay(sound, 0.2, 1.8), 0, 0.1);
    EXPECT_NEAR(phaseDelay(sound, 2.1, 2.9, 882), 0, 0.1);
}

TEST_F(Mix, OfOneTrackKeepsLevelAndPlace) {
    record(3, [](RecordedMovie& movie) { appendTone(*movie.sound, tapFormat(), 0, 44100, 44100); });
    ASSERT_EQ(mixed(), ExportStatus::Completed);
    ASSERT_EQ(checkers::MovieReader(path()).audioTracks().size(), 1u);
    const auto sound = soundOf(path());
    EXPECT_LT(loudness(sound, 0.0, 0.95), 0.001);
    EXPECT_NEAR(loudness(sound, 1.05, 1.95), kToneLoudness, 0.005);
    EXPECT_NEAR(phaseDelay(sound, 1.1, 1.9), 0, 0.1);
}

TEST_F(Mix, OfNoTrackIsAMovieWithoutSound) {
    record(2, [](RecordedMovie&) {});
    ASSERT_EQ(mixed(), ExportStatus::Completed);
    EXPECT_TRUE(checkers::MovieReader(path()).audioTracks().empty());
    expectPictures(path(), 2 * kRate);
}

TEST_F(Mix, ThatIsNeverSetLeavesTheTracksAsTheyAre) {
    record(2, [](RecordedMovie& movie) {
        appendTone(*movie.sound, tapFormat(), 0, 0, 2 * 44100, 441);
        appendTone(*movie.microphone, tapFormat(), 0, 0, 2 * 44100, 882);
    });
    Job made;
    made.exporter = exporters_.makeExporter(exporters_.openMovie(URL::file(movie_->path())),
                                            ExportPreset::HighestQuality, URL::file(path()));
    made.exporter->setTimeRange({atSeconds(0.5), atSeconds(1)});
    made.run();
    ASSERT_EQ(made.wait(), ExportStatus::Completed);
    checkers::MovieReader reader(path());
    ASSERT_EQ(reader.audioTracks().size(), 2u);
    EXPECT_NEAR(static_cast<double>(reader.duration().count()), 1e9, 1e5);
    const double period = 1000.0 / 441;
    EXPECT_NEAR(std::remainder(phaseDelay(soundOf(path()), 0.1, 0.9) + std::remainder(500.0, period), period), 0, 0.1);
}

TEST_F(Mix, OfARangeBeginsWithThePictureOnShow) {
    record(4, [](RecordedMovie& movie) { appendTone(*movie.sound, tapFormat(), 0, 0, 4 * 44100); });
    const auto made = job();
    made->exporter->setTimeRange({atSeconds(1.26), atSeconds(2)});
    made->run();
    ASSERT_EQ(made->wait(), ExportStatus::Completed);
    const auto shown = shownPictures(path());
    ASSERT_EQ(shown.size(), 41u);
    EXPECT_NEAR(shown[0].luma, lumaOfGrey(greyOf(25)), 2);
    EXPECT_EQ(shown[0].nanoseconds, 0);
    EXPECT_NEAR(shown[1].nanoseconds, 40'000'000, kTick);
    const double period = 1000.0 / 441;
    EXPECT_NEAR(std::remainder(phaseDelay(soundOf(path()), 0.1, 1.9) + std::remainder(1260.0, period), period), 0, 0.1);
}

/// A full-scale tone, as whole numbers.
void appendLoud(TrackInput& input, double hertz, int seconds) {
    const AudioFormat format = formatOf(44100, 32, 1, AudioFormat::kFlagFloat);
    for (std::int64_t at = 0; at < seconds * 44100; at += 4410) {
        Data bytes = tone(format, hertz, at, 4410);
        for (std::size_t i = 0; i < bytes.size(); i += 4) {
            float value = 0;
            std::memcpy(&value, &bytes[i], 4);
            value *= 1.98f;
            std::memcpy(&bytes[i], &value, 4);
        }
        ASSERT_TRUE(eventually([&] { return input.isReadyForMoreMediaData(); }));
        ASSERT_TRUE(input.append(soundBuffer(format, std::move(bytes), 4410, at * kSecond / 44100)));
    }
}

TEST_F(Mix, OfTwoFullScaleTracksNeitherClipsNorPumps) {
    record(4, [](RecordedMovie& movie) {
        appendLoud(*movie.sound, 441, 4);
        appendLoud(*movie.microphone, 1000, 4);
    });
    ASSERT_EQ(mixed(), ExportStatus::Completed);
    const auto sound = soundOf(path());
    EXPECT_LT(peakOf(sound), 1.0);
    const double level = levelOf(sound, 441, 1, 3);
    EXPECT_NEAR(level, 0.9 / 2, 0.03);
    EXPECT_NEAR(levelOf(sound, 1000, 1, 3), level, 0.02) << "in the proportion they had";
    for (double at = 0.5; at < 3.4; at += 0.1) EXPECT_NEAR(levelOf(sound, 441, at, at + 0.1), level, 0.02 * level);
    // What clipping makes: sums and differences of the tones and their multiples.
    for (const double hertz : {118.0, 559.0, 1323.0, 1559.0, 3000.0}) EXPECT_LT(levelOf(sound, hertz, 1, 3), 0.003);
}

TEST_F(Mix, KeepsTheTransformOfThePicture) {
    transform_ = {0, 1, -1, 0, 96, 0};
    record(1, [](RecordedMovie&) {});
    ASSERT_EQ(mixed(), ExportStatus::Completed);
    EXPECT_EQ(checkers::MovieReader(path()).videoTracks().at(0).rotation, 90);
}

TEST_F(Mix, OntoADestinationThatExistsFailsAndLeavesIt) {
    record(1, [](RecordedMovie&) {});
    std::ofstream(path()) << "somebody's";
    const auto made = job();
    made->run();
    EXPECT_EQ(made->wait(), ExportStatus::Failed);
    ASSERT_TRUE(made->error);
    EXPECT_EQ(made->error->code(), EEXIST);
    EXPECT_EQ(std::filesystem::file_size(path()), 10u);
}

TEST_F(Mix, OntoAFullDiskLeavesNoFile) {
    record(3, [](RecordedMovie& movie) { appendTone(*movie.sound, tapFormat(), 0, 0, 3 * 44100); });
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxMovieExporters exporters(disk, media::EncodingPriority::AsUsual);
    for (std::uint64_t bytes = 0; bytes < 40'000; bytes += 9'000) {
        disk->failAfter(bytes, ENOSPC);
        const auto made = job("mixed.mp4", "", &exporters);
        made->run();
        EXPECT_EQ(made->wait(), ExportStatus::Failed) << bytes;
        ASSERT_TRUE(made->error);
        EXPECT_EQ(made->error->code(), ENOSPC);
        EXPECT_FALSE(exists());
    }
}

TEST_F(Mix, OfADamagedMovieFailsAndLeavesNoFile) {
    record(3, [](RecordedMovie& movie) { appendTone(*movie.sound, tapFormat(), 0, 0, 3 * 44100); });
    // Here and there in the media, a few bytes at a time, so that the samples still look like samples.
    const auto size = std::filesystem::file_size(movie_->path());
    for (int where = 2; where < 7; ++where) {
        const std::string damaged = path("damaged" + std::to_string(where) + ".mp4");
        std::filesystem::copy_file(movie_->path(), damaged);
        {
            std::fstream file(damaged, std::ios::in | std::ios::out | std::ios::binary);
            for (std::uint64_t at = size * static_cast<unsigned>(where) / 10; at < size * 8 / 10; at += 97) {
                file.seekp(static_cast<std::streamoff>(at));
                file.put('\xA7');
            }
        }
        const auto made = job("mixed.mp4", damaged);
        made->run();
        EXPECT_EQ(made->wait(), ExportStatus::Failed) << where;
        EXPECT_FALSE(exists());
    }

    const std::string cut = path("cut.mp4");
    std::filesystem::copy_file(movie_->path(), cut);
    std::filesystem::resize_file(cut, std::filesystem::file_size(cut) / 2);
    const auto shorter = job("mixed.mp4", cut);
    shorter->run();
    EXPECT_EQ(shorter->wait(), ExportStatus::Failed);
    EXPECT_FALSE(exists());

    const std::string text = path("text.mp4");
    std::ofstream(text) << "no movie at all";
    const auto asset = exporters_.openMovie(URL::file(text));
    EXPECT_EQ(asset->duration().value, 0);
    EXPECT_TRUE(asset->audioTracks().empty());
}

TEST_F(Mix, OfADamagedPictureFails) {
    movie_ = std::make_unique<RecordedMovie>(320, 240);
    movie_->start();
    std::uint32_t noise = 1;
    for (int i = 0; i < 20; ++i) {
        auto plane = std::make_shared<PaintedPlane>(320, 240, static_cast<std::uint64_t>(i));
        for (std::int32_t pixel = 0; pixel < 320 * 240; ++pixel) {
            noise = noise * 1664525 + 1013904223;
            const auto grey = static_cast<std::uint8_t>(noise >> 24u);
            plane->setPixel(pixel % 320, pixel / 320, grey, grey, grey);
        }
        ASSERT_TRUE(movie_->append(picture(std::move(plane), atNanoseconds(i * kSecond / kRate))));
    }
    movie_->clock.advance(std::chrono::seconds(1));
    ASSERT_EQ(movie_->finish(), ContainerStatus::Completed);
    const std::string damaged = path("damaged.mp4");
    std::filesystem::copy_file(movie_->path(), damaged);
    {
        std::fstream file(damaged, std::ios::in | std::ios::out | std::ios::binary);
        const std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
        // Within the first key frame's data, where no length stands.
        const std::size_t media = bytes.find("mdat", bytes.find("moof"));
        ASSERT_LT(media, bytes.size() - 4000);
        file.clear();
        for (std::size_t at = media + 3000; at < media + 3100; at += 11) {
            file.seekp(static_cast<std::streamoff>(at));
            file.put(static_cast<char>(bytes.at(at) ^ 0x5A));
        }
    }
    const auto made = job("mixed.mp4", damaged);
    made->run();
    EXPECT_EQ(made->wait(), ExportStatus::Failed);
    EXPECT_FALSE(exists());
    const auto whole = job();
    whole->run();
    EXPECT_EQ(whole->wait(), ExportStatus::Completed);
}

TEST_F(Mix, ThatIsCancelledInTheMiddleEndsSoonWithoutAFile) {
    record(30, [](RecordedMovie& movie) { appendTone(*movie.sound, tapFormat(), 0, 0, 44100); }, 640, 480);
    const auto made = job();
    made->run();
    double last = 0;
    ASSERT_TRUE(eventually([&] {
        const double now = made->exporter->progress();
        EXPECT_GE(now, last);
        last = now;
        return now > 0 || made->done.count() > 0;
    }));
    last = made->exporter->progress();
    const double taken = secondsTaken([&] {
        made->exporter->cancel();
        EXPECT_EQ(made->wait(), ExportStatus::Cancelled) << (made->error ? made->error->code() : 0);
    });
    EXPECT_LT(taken, 5.0);
    EXPECT_LT(made->exporter->progress(), std::min(last + 0.3, 1.0));
    EXPECT_FALSE(exists());
}

TEST_F(Mix, RunsAfterTheOneBefore) {
    record(5, [](RecordedMovie&) {});
    const auto disk = std::make_shared<FaultyFiles>();
    LinuxMovieExporters exporters(disk, media::EncodingPriority::AsUsual);
    disk->freeze();
    const auto first = job("first.mp4", "", &exporters), second = job("second.mp4", "", &exporters),
               third = job("third.mp4", "", &exporters);
    first->run();
    second->run();
    third->run();
    third->exporter->cancel();
    EXPECT_EQ(third->wait(), ExportStatus::Cancelled) << "without its turn";
    EXPECT_EQ(first->done.count() + second->done.count(), 0);
    disk->thaw();
    EXPECT_EQ(second->wait(), ExportStatus::Completed);
    EXPECT_EQ(first->done.count(), 1) << "in the order they were asked for";
}

TEST_F(Mix, OfALongMovieDoesNotHoldUpACopy) {
    record(30, [](RecordedMovie&) {}, 640, 480);
    const auto slow = job();
    slow->run();
    ASSERT_TRUE(eventually([&] { return slow->exporter->progress() > 0 || slow->done.count() > 0; }));
    Job copy;
    copy.exporter = exporters_.makeExporter(exporters_.openMovie(URL::file(movie_->path())), ExportPreset::PassThrough,
                                            URL::file(path("copy.mp4")));
    copy.run();
    EXPECT_EQ(copy.wait(), ExportStatus::Completed);
    EXPECT_EQ(copy.exporter->progress(), 1.0);
    EXPECT_EQ(slow->done.count(), 0);
    slow->exporter.reset();
    EXPECT_EQ(slow->wait(), ExportStatus::Cancelled);
}

TEST_F(Mix, ThatRunsWhenTheExportersGoIsCancelled) {
    record(30, [](RecordedMovie&) {}, 640, 480);
    auto exporters = std::make_unique<LinuxMovieExporters>(std::make_shared<media::PosixMovieFiles>(),
                                                           media::EncodingPriority::AsUsual);
    const auto first = job("first.mp4", "", exporters.get()), second = job("second.mp4", "", exporters.get());
    first->run();
    second->run();
    ASSERT_TRUE(eventually([&] { return first->exporter->progress() > 0 || first->done.count() > 0; }));
    first->exporter.reset();
    second->exporter.reset();
    exporters.reset();
    EXPECT_EQ(first->status, static_cast<int>(ExportStatus::Cancelled));
    EXPECT_EQ(second->status, static_cast<int>(ExportStatus::Cancelled));
    EXPECT_FALSE(exists("first.mp4") || exists("second.mp4"));
}

/// How far behind the others the calling thread stands.
int niceValue() { return ::getpriority(PRIO_PROCESS, 0); }

TEST(LowPriority, IsTakenAndInheritedAndIsNotIdle) {
    const int own = niceValue(), behind = std::min(own + 10, 19);
    int taken = -1, inherited = -1, policy = -1;
    std::thread([&] {
        runAtLowPriority();
        taken = niceValue();
        policy = ::sched_getscheduler(0);
        std::thread([&] { inherited = niceValue(); }).join();
    }).join();
    EXPECT_EQ(taken, behind);
    EXPECT_EQ(inherited, behind);
    // Idle threads on a busy machine neither work nor end.
    EXPECT_EQ(policy, SCHED_OTHER);
    EXPECT_EQ(niceValue(), own);
}

/// Notes how the thread that makes the file stands with the scheduler.
class WatchingFiles final : public media::MovieFiles {
public:
    std::variant<std::unique_ptr<media::MovieFile>, int> create(const std::string&) override {
        nice = niceValue();
        return ENOSPC;
    }
    std::atomic<int> nice = -1;
};

TEST_F(Mix, IsMadeBehindTheOthersAndACopyIsNot) {
    record(1, [](RecordedMovie&) {});
    const auto files = std::make_shared<WatchingFiles>();
    LinuxMovieExporters exporters(files);
    const auto made = job("mixed.mp4", "", &exporters);
    made->run();
    EXPECT_EQ(made->wait(), ExportStatus::Failed);
    EXPECT_EQ(files->nice, std::min(niceValue() + 10, 19));
    Job copy;
    copy.exporter = exporters.makeExporter(exporters.openMovie(URL::file(movie_->path())), ExportPreset::PassThrough,
                                           URL::file(path()));
    copy.run();
    EXPECT_EQ(copy.wait(), ExportStatus::Failed);
    EXPECT_EQ(files->nice, niceValue());
}

}  // namespace
}  // namespace lumacast::testing
