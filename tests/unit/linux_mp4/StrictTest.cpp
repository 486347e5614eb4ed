// What the writer writes, judged box by box at every moment of its life.

#include <gtest/gtest.h>

#include "tests/checkers/BoxChecker.h"
#include "tests/unit/linux_mp4/Media.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

using checkers::BoxShape;
using checkers::Findings;
using test::Bytes;
using test::MemorySink;

constexpr std::size_t kReserveOffset = 32;

struct Movie {
    MemorySink sink;
    std::size_t beforeFinish = 0;  // operations
};

// Three seconds of pictures at odd distances, sound from before the first picture on, and a sound that begins late.
void write(Movie& movie, const MovieOptions& options = {}, std::optional<std::int64_t> end = std::nullopt) {
    std::vector<std::int64_t> stamps;
    for (std::int64_t pts = 20'001; pts < 3'000'000; pts += 29'983 + pts % 7'001) stamps.push_back(pts);
    const auto everywhere = [](std::int64_t) { return true; };
    const auto sound = test::encodeAudio(0, 3 * 48000, everywhere, "sound");
    const auto late = test::encodeAudio(50'003, 2 * 48000, everywhere, "late");
    MovieBoxWriter writer(movie.sink, options);
    ASSERT_EQ(test::writeMovie(writer, test::encodeVideo(stamps), {&sound, &late}), MovieError::none);
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    movie.beforeFinish = movie.sink.operations().size();
    ASSERT_EQ(writer.finish(3'100'000, end), MovieError::none);
}

// A file whose first fragment is whole is one in fragments until the reserve becomes the header of all media.
Findings findingsOf(const test::TemporaryDirectory& folder, const Bytes& file) {
    const bool isFinished = file[kReserveOffset + 3] == 1;
    const auto path = folder.write("movie.mp4", file);
    return checkers::checkBoxes(path, isFinished ? BoxShape::Finished : BoxShape::Fragmented).findings;
}

TEST(StrictBoxes, NothingIsWrongAfterAnyOperationNorWithinAnyOfThem) {
    Movie movie;
    write(movie);
    const test::TemporaryDirectory folder;
    const auto& operations = movie.sink.operations();
    std::size_t judged = 0;
    Bytes file;
    for (std::size_t count = 0; count < operations.size(); ++count) {
        const auto& operation = operations[count];
        // The first fragment brings moov: before it is whole there is no movie.
        const bool hasMovie = count >= 2;
        if (hasMovie && operation.kind == MemorySink::Kind::append) {
            for (const std::size_t kept : {std::size_t{1}, std::size_t{9}, operation.bytes.size() / 2}) {
                Bytes torn = file;
                torn.insert(torn.end(), operation.bytes.begin(),
                            operation.bytes.begin() + static_cast<std::ptrdiff_t>(std::min(kept, operation.bytes.size())));
                EXPECT_EQ(findingsOf(folder, torn), Findings{}) << kept << " bytes of operation " << count;
            }
        }
        MemorySink::apply(operation, file);
        if (!hasMovie) continue;
        EXPECT_EQ(findingsOf(folder, file), Findings{}) << "after operation " << count;
        ++judged;
    }
    EXPECT_GT(judged, 20U);
    EXPECT_EQ(findingsOf(folder, movie.sink.fileAfter(movie.beforeFinish)), Findings{});
}

TEST(StrictBoxes, NothingIsWrongWithAMovieThatBeginsLaterAndEndsSooner) {
    MovieOptions options;
    options.presentationStart = 1'250'000'000;
    Movie movie;
    write(movie, options, 2'400'000'001);
    const test::TemporaryDirectory folder;
    EXPECT_EQ(findingsOf(folder, movie.sink.fileAfter(movie.beforeFinish)), Findings{});
    EXPECT_EQ(findingsOf(folder, movie.sink.file()), Findings{});
}

}  // namespace
}  // namespace lumacast::mp4
