// What a comparison of recorders needs to know of the recorded scene:
//   scene_pictures numbers MOVIE     each decoded picture: its time in ns and the frame number in it, "-" when none
//   scene_pictures redraw WxH [--part] N...
//                                    frames as they were drawn, raw B, G, R, X, one after the other, without the lines
//                                    from the clock on: the time it showed is not known any more

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "examples/scene/Scene.h"
#include "tests/checkers/FrameNumberChecker.h"
#include "tests/checkers/LibAv.h"
#include "tests/checkers/MovieReader.h"

namespace {

using namespace lumacast;

int fail(const char* why) {
    std::fprintf(stderr, "scene_pictures: %s\n", why);
    return 2;
}

int printNumbers(const char* movie) {
    av_log_set_level(AV_LOG_QUIET);
    checkers::MovieReader reader(movie);
    std::vector<checkers::NumberedPicture> pictures;
    if (!reader.error().empty() || !checkers::readFrameNumbers(reader, pictures)) return fail(reader.error().c_str());
    for (const auto& picture : pictures) {
        std::printf("%" PRId64 " ", static_cast<std::int64_t>(picture.time.count()));
        if (picture.number)
            std::printf("%" PRIu32 "\n", *picture.number);
        else
            std::printf("-\n");
    }
    return 0;
}

/// A frame buffer of its own for each drawing: the scene draws whole then.
class Drawing final {
public:
    Drawing(int width, int height, scene::Motion motion, std::uint32_t number, const scene::WallTime& time)
        : pixels_(static_cast<std::size_t>(width) * static_cast<std::size_t>(height)) {
        const scene::Picture picture{reinterpret_cast<std::uint8_t*>(pixels_.data()), width, height,
                                     static_cast<std::size_t>(width) * 4};
        scene::Scene(width, height, motion).draw(picture, number, time);
    }
    const std::vector<std::uint32_t>& pixels() const { return pixels_; }

private:
    std::vector<std::uint32_t> pixels_;
};

/// The rows above the first one that depends on the time, an even number.
std::size_t rowsAboveClock(int width, int height, scene::Motion motion) {
    const Drawing one(width, height, motion, 1, {}), other(width, height, motion, 1, {11, 11, 11, 111});
    std::size_t pixel = 0;
    while (pixel < one.pixels().size() && one.pixels()[pixel] == other.pixels()[pixel]) ++pixel;
    return pixel / static_cast<std::size_t>(width) / 2 * 2;
}

int redraw(const char* size, scene::Motion motion, int count, char** numbers) {
    int width = 0, height = 0;
    if (std::sscanf(size, "%dx%d", &width, &height) != 2 || width < scene::kMinimumWidth ||
        height < scene::kMinimumHeight || width > 16384 || height > 16384)
        return fail("the size is not usable");
    const std::size_t pixels = rowsAboveClock(width, height, motion) * static_cast<std::size_t>(width);
    for (int index = 0; index < count; ++index) {
        const auto number = static_cast<std::uint32_t>(std::strtoul(numbers[index], nullptr, 10));
        const Drawing drawing(width, height, motion, number, {});
        if (std::fwrite(drawing.pixels().data(), sizeof(std::uint32_t), pixels, stdout) != pixels)
            return fail("writing failed");
    }
    return std::fflush(stdout) == 0 ? 0 : fail("writing failed");
}

}  // namespace

int main(int argc, char** argv) {
    const std::string_view what = argc > 1 ? argv[1] : "";
    if (what == "numbers" && argc == 3) return printNumbers(argv[2]);
    const bool part = argc > 4 && std::string_view(argv[3]) == "--part";
    if (what == "redraw" && part) return redraw(argv[2], scene::Motion::SmallPart, argc - 4, argv + 4);
    if (what == "redraw" && argc > 3) return redraw(argv[2], scene::Motion::Everywhere, argc - 3, argv + 3);
    return fail("numbers MOVIE | redraw WxH [--part] N...");
}
