#include "tests/checkers/ContactSheet.h"

#include <png.h>

#include <algorithm>
#include <cstring>

namespace lumacast::checkers {
namespace {
constexpr int kColumns = 4;
constexpr int kCellWidth = 320;
constexpr int kGap = 4;
}  // namespace

std::string writePng(const RgbPicture& picture, const std::string& path) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    image.width = static_cast<png_uint_32>(picture.width);
    image.height = static_cast<png_uint_32>(picture.height);
    image.format = PNG_FORMAT_RGB;
    if (png_image_write_to_file(&image, path.c_str(), 0, picture.samples.data(), 0, nullptr) != 0) return "";
    return path + ": " + image.message;
}

std::string writeContactSheet(MovieReader& reader, const std::string& path, int count) {
    if (reader.videoTracks().empty()) return "there is no video track";
    const VideoTrack& track = reader.videoTracks().front();
    const int cellHeight = std::max(1, kCellWidth * track.height / std::max(1, track.width));
    const nanoseconds apart = std::max(nanoseconds(1), reader.duration() / count);
    std::vector<RgbPicture> cells;
    const bool complete = reader.readPictures([&](const DecodedPicture& picture) {
        if (static_cast<int>(cells.size()) < count && picture.time >= apart * static_cast<int>(cells.size()))
            cells.push_back(toRgb(picture, kCellWidth, cellHeight));
    });
    if (!complete && cells.empty()) return reader.error();
    if (cells.empty()) return "there are no pictures";

    const int rows = (static_cast<int>(cells.size()) + kColumns - 1) / kColumns;
    RgbPicture sheet{kColumns * (kCellWidth + kGap) + kGap, rows * (cellHeight + kGap) + kGap, {}};
    sheet.samples.assign(static_cast<std::size_t>(sheet.width) * static_cast<std::size_t>(sheet.height) * 3, 0x40);
    for (int index = 0; index < static_cast<int>(cells.size()); ++index) {
        const int left = kGap + index % kColumns * (kCellWidth + kGap);
        const int top = kGap + index / kColumns * (cellHeight + kGap);
        for (int y = 0; y < cellHeight; ++y)
            std::memcpy(
                sheet.samples.data() + static_cast<std::size_t>(((top + y) * sheet.width + left) * 3),
                cells[static_cast<std::size_t>(index)].samples.data() + static_cast<std::size_t>(y * kCellWidth * 3),
                kCellWidth * 3);
    }
    return writePng(sheet, path);
}

}  // namespace lumacast::checkers
