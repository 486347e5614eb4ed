// What becomes of a mirrored screen in a movie: a player that heeds the movie's rotation shows it upright.

#include <gtest/gtest.h>

#include <array>
#include <cstdio>

#include "linux/media/LinuxContainerWriters.h"
#include "tests/contract/MediaWorld.h"
#include "tests/contract/MirrorWorld.h"

namespace lumacast::test {
namespace {

std::string outputOf(const std::string& command) {
    std::string output;
    std::FILE* const pipe = ::popen(command.c_str(), "r");
    if (pipe == nullptr) return output;
    std::array<char, 65536> part{};
    while (const std::size_t got = std::fread(part.data(), 1, part.size(), pipe)) output.append(part.data(), got);
    ::pclose(pipe);
    return output;
}

/// The transform that goes into the movie for these flags.
AffineTransform transformOf(std::uint32_t flags) {
    return flags == kRotateClockwise ? AffineTransform{0, 1, -1, 0, 0, 0} : AffineTransform{};
}

class X11MirrorMovie : public ::testing::TestWithParam<std::pair<int, int>> {};

TEST_P(X11MirrorMovie, IsUprightForAPlayer) {
    const int width = GetParam().first, height = GetParam().second;
    MirrorWorld world(width, height);
    const TestWindow back(world.display.name(), {.place = {0, 0, width, height}, .colour = 0xC01020});
    const TestWindow topLeft(world.display.name(), {.place = {0, 0, 80, 60}, .colour = 0x10B030});
    const TestWindow bottomLeft(world.display.name(), {.place = {0, height - 60, 80, 60}, .colour = 0x2030D0});
    const TestScreen::PointerLook look = TestScreen::square(40, 0xFFFFFFFF);
    world.screen.setPointer(look);
    world.screen.movePointer(width - 60, 20);
    const auto made = world.start(width, height);
    ASSERT_TRUE(world.shows(world.screen.withPointer(look, width - 60, 20)));
    made->stop();
    const CapturedFrame frame = world.frames->frames().back();

    const ScratchDirectory directory;
    const std::string file = directory.path("mirror.mp4");
    LinuxContainerWriters writers(world.clock);
    auto writer = std::get<0>(writers.make(URL::file(file), ContainerType::Mpeg4));
    const auto input = writer->addVideoInput(
        lumacast::testing::videoSettings(static_cast<int>(frame.width), static_cast<int>(frame.height)));
    ASSERT_TRUE(input);
    input->setTransform(transformOf(frame.transformFlags));
    ASSERT_TRUE(writer->startWriting());
    writer->startSession(MediaTime::make(0, 600));
    for (int i = 0; i < 3; ++i)
        ASSERT_TRUE(input->append(SampleBuffer::makeVideo(PixelBuffer(frame.plane), MediaTime::make(i * 200, 600),
                                                          MediaTime::make(200, 600))));
    lumacast::testing::Happening done;
    writer->finishWriting([&] { done.happen(); });
    ASSERT_TRUE(done.waitFor());

    const std::string coded = outputOf("ffprobe -v error -show_entries stream=width,height -of default=nw=1 " + file);
    EXPECT_EQ(coded.substr(0, 21), "width=300\nheight=400\n") << "portrait as it is coded";
    const std::string picture =
        outputOf("ffmpeg -v error -i " + file + " -frames:v 1 -f rawvideo -pix_fmt rgb24 - </dev/null");
    ASSERT_EQ(picture.size(), static_cast<std::size_t>(width) * static_cast<std::size_t>(height) * 3);
    const auto expectAt = [&](int x, int y, std::uint32_t colour) {
        for (int byte = 0; byte < 3; ++byte)
            EXPECT_NEAR(static_cast<std::uint8_t>(picture[static_cast<std::size_t>((y * width + x) * 3 + byte)]),
                        static_cast<int>(colour >> (16 - 8 * byte) & 0xFF), 12)
                << x << "," << y;
    };
    expectAt(20, 20, 0x10B030);
    expectAt(20, height - 20, 0x2030D0);
    expectAt(width - 40, 40, 0xFFFFFF);
    expectAt(width - 40, 80, 0xC01020);
    expectAt(width - 20, height - 20, 0xC01020);
    expectAt(width / 2, height / 2, 0xC01020);
}

INSTANTIATE_TEST_SUITE_P(Shapes, X11MirrorMovie, ::testing::Values(std::pair{400, 300}, std::pair{300, 400}));

}  // namespace
}  // namespace lumacast::test
