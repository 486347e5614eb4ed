#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>

#include "tests/unit/linux_mp4/BoxParser.h"
#include "tests/unit/linux_mp4/Media.h"
#include "tests/unit/linux_mp4/Times.h"
#include "tests/unit/linux_mp4/Tools.h"

namespace lumacast::mp4 {
namespace {

constexpr std::uint64_t kFourGibibytes = 1ULL << 32U;

// A file in which pages of zeros take no room.
class SparseFileSink final : public BoxSink {
public:
    explicit SparseFileSink(const std::filesystem::path& path)
        : descriptor_(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)) {}
    ~SparseFileSink() override { close(descriptor_); }
    SparseFileSink(const SparseFileSink&) = delete;
    SparseFileSink& operator=(const SparseFileSink&) = delete;

    bool append(std::span<const std::uint8_t> bytes) override {
        constexpr std::size_t kPage = 4096;
        for (std::size_t at = 0; at < bytes.size(); at += kPage) {
            const auto page = bytes.subspan(at, std::min(kPage, bytes.size() - at));
            const bool isEmpty = page[0] == 0 && std::equal(page.begin() + 1, page.end(), page.begin());
            if (!isEmpty && !overwrite(size_ + at, page)) {
                return false;
            }
        }
        size_ += bytes.size();
        return ftruncate(descriptor_, static_cast<off_t>(size_)) == 0;
    }
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        return pwrite(descriptor_, bytes.data(), bytes.size(), static_cast<off_t>(offset)) ==
               static_cast<ssize_t>(bytes.size());
    }
    bool sync() override { return true; }

    [[nodiscard]] test::Bytes read(std::uint64_t offset, std::size_t count) const {
        test::Bytes bytes(count);
        const ssize_t got = pread(descriptor_, bytes.data(), count, static_cast<off_t>(offset));
        bytes.resize(got < 0 ? 0 : static_cast<std::size_t>(got));
        return bytes;
    }

private:
    int descriptor_;
    std::uint64_t size_ = 0;
};

// Real pictures, each made 48 MiB larger by a filler NAL unit of zeros (ISO/IEC 14496-10 clause 7.3.2.7), which
// decoders skip.
TEST(LargeFile, BeyondFourGibibytesPlaysWhileRecordingAndAfter) {
    constexpr std::size_t kFiller = 48U << 20U;
    const auto stamps = test::steadyStamps(92, 30);
    const auto video = test::encodeVideo(stamps);
    const test::TemporaryDirectory directory;
    const auto path = directory.path("large.mp4");
    SparseFileSink sink(path);
    MovieBoxWriter writer(sink);
    const auto track = writer.addVideoTrack(video.description);
    ASSERT_EQ(writer.start(), MovieError::none);
    test::Bytes bytes;
    for (const auto& sample : video.samples) {
        bytes = sample.bytes;
        for (unsigned shift = 32; shift > 0; shift -= 8) {
            bytes.push_back(static_cast<std::uint8_t>((kFiller + 1) >> (shift - 8)));
        }
        bytes.push_back(0x0C);
        bytes.resize(bytes.size() + kFiller, 0);
        ASSERT_EQ(writer.addSample(*track, sample.info, bytes), MovieError::none);
    }
    ASSERT_EQ(writer.flushFragment(), MovieError::none);
    ASSERT_GT(writer.bytesWritten(), kFourGibibytes);
    // The key frame at three seconds and the picture after it lie beyond 4 GiB; reading all of the file takes too long.
    const std::vector<std::int64_t> beyond(stamps.end() - 2, stamps.end());
    const auto recording = test::playStrictlyFrom(3, path);
    EXPECT_EQ(recording.errors, "");
    EXPECT_EQ(recording.pictures, beyond);

    const std::uint64_t indexOffset = writer.bytesWritten() + 8;
    ASSERT_EQ(writer.finish(4 * kSecond), MovieError::none);
    const auto header = sink.read(32, 16);
    test::Fields fields(header);
    EXPECT_EQ(fields.u32(), 1U);
    fields.skip(4);
    EXPECT_EQ(fields.u64(), indexOffset - 32);
    const auto movie = sink.read(indexOffset, static_cast<std::size_t>(writer.bytesWritten() - indexOffset));
    const auto boxes = test::parseBoxes(movie);
    ASSERT_EQ(test::typesOf(boxes), "moov");
    EXPECT_TRUE(boxes[0].has("trak/mdia/minf/stbl/co64"));
    EXPECT_FALSE(boxes[0].has("trak/mdia/minf/stbl/stco"));
    const auto parsed = test::parseTrack(boxes[0].at("trak"));
    ASSERT_EQ(parsed.samples.size(), video.samples.size());
    EXPECT_GT(parsed.samples[90].offset, kFourGibibytes);
    for (std::size_t i = 0; i < parsed.samples.size(); ++i) {
        const auto& expected = video.samples[i].bytes;
        EXPECT_EQ(sink.read(parsed.samples[i].offset, expected.size()), expected) << "sample " << i;
    }
    const auto finished = test::playStrictlyFrom(3, path);
    EXPECT_EQ(finished.errors, "");
    EXPECT_EQ(finished.pictures, beyond);
}

// The last offset alone decides: one chunk below 4 GiB, one beyond.
TEST(LargeFile, TakesWideOffsetsOnlyWhenTheLastNeedsThem) {
    for (const std::uint64_t last : {kFourGibibytes - 1, kFourGibibytes}) {
        SampleIndex index;
        index.add({10, 1, 5});
        index.addChunk(48, 1);
        index.add({10, 1, 5});
        index.addChunk(last, 1);
        BoxBuffer out;
        writeTrack(out, test::encodeVideo({0}).description, {}, index);
        const auto boxes = test::parseBoxes(out.view());
        EXPECT_EQ(boxes[0].has("mdia/minf/stbl/co64"), last == kFourGibibytes);
        EXPECT_EQ(test::parseTrack(boxes[0]).samples[1].offset, last);
    }
}

}  // namespace
}  // namespace lumacast::mp4
