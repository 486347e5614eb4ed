#include "examples/scene/FramePattern.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <vector>

namespace lumacast::scene {
namespace {

constexpr int kColumns = 18;
constexpr int kRows = 2;
constexpr std::uint32_t kBlack = 0x000000;
constexpr std::uint32_t kWhite = 0xFFFFFF;

// A reader needs this much luma between the black and the white reference cells.
constexpr double kLeastContrast = 64;
// Where a cell lies between the references (0 black, 1 white): anything between these two is unreadable.
constexpr double kBlackUpTo = 0.35;
constexpr double kWhiteFrom = 0.65;

using Row = std::array<bool, kColumns>;
using Cells = std::array<Row, kRows>;

// Edges of the pattern in pixels, not rounded: a scaled picture has them between pixels.
struct Layout {
    double top, cellWidth, cellHeight;

    Layout(int width, int height)
        : top(height * 4 / 5.0), cellWidth(width / (kColumns + 1.0)), cellHeight(height / 5.0 / (kRows + 1.0)) {}

    [[nodiscard]] double columnEdge(int column) const { return (column + 0.5) * cellWidth; }
    [[nodiscard]] double rowEdge(int row) const { return top + (row + 0.5) * cellHeight; }
};

int rounded(double value) {
    return static_cast<int>(std::lround(value));
}

Cells cellsOf(std::uint32_t number) {
    const std::uint32_t word = (number & kFrameNumberMask) << 8 | frameNumberChecksum(number);
    Cells cells{};
    for (int row = 0; row < kRows; ++row) {
        cells[row].front() = cells[row].back() = row == 0;
        for (int bit = 0; bit < 16; ++bit) cells[row][1 + bit] = (word >> (31 - 16 * row - bit) & 1) != 0;
    }
    return cells;
}

// Mean luma of the middle half of a rectangle, at least one pixel.
double meanOfMiddle(const std::uint8_t* luma, int width, int height, std::size_t stride, double left, double right,
                    double top, double bottom) {
    const auto span = [](double low, double high, int limit) {
        const double quarter = (high - low) / 4;
        int first = rounded(low + quarter);
        int end = rounded(high - quarter);
        if (end <= first) {
            first = static_cast<int>((low + high) / 2);
            end = first + 1;
        }
        return std::pair{std::clamp(first, 0, limit - 1), std::clamp(end, 1, limit)};
    };
    const auto [x0, x1] = span(left, right, width);
    const auto [y0, y1] = span(top, bottom, height);
    std::uint64_t sum = 0;
    for (int y = y0; y < y1; ++y)
        for (int x = x0; x < x1; ++x) sum += luma[static_cast<std::size_t>(y) * stride + static_cast<std::size_t>(x)];
    return static_cast<double>(sum) / (static_cast<double>(x1 - x0) * (y1 - y0));
}

}  // namespace

std::uint8_t frameNumberChecksum(std::uint32_t number) {
    unsigned crc = 0xFF;
    for (int shift = 16; shift >= 0; shift -= 8) {
        crc ^= number >> shift & 0xFF;
        for (int bit = 0; bit < 8; ++bit) crc = (crc & 0x80) != 0 ? (crc << 1 ^ 0x07) & 0xFF : crc << 1;
    }
    return static_cast<std::uint8_t>(crc);
}

Rect framePatternArea(int width, int height) {
    const int top = rounded(Layout(width, height).top);
    return {0, top, width, height - top};
}

Rect framePatternLowerRow(int width, int height) {
    const Layout layout(width, height);
    const int top = rounded(layout.rowEdge(1));
    return {0, top, width, rounded(layout.rowEdge(2)) - top};
}

void drawFrameNumber(const Picture& picture, std::uint32_t number) {
    const Layout layout(picture.width, picture.height);
    const Cells cells = cellsOf(number);
    const auto rowBytes = static_cast<std::size_t>(picture.width) * 4;
    const auto fillRows = [&](int from, int to, const std::vector<std::uint32_t>& line) {
        for (int y = from; y < to; ++y) std::memcpy(picture.row(y), line.data(), rowBytes);
    };
    std::vector<std::uint32_t> line(static_cast<std::size_t>(picture.width), kBlack);
    fillRows(rounded(layout.top), rounded(layout.rowEdge(0)), line);
    fillRows(rounded(layout.rowEdge(kRows)), picture.height, line);
    for (int row = 0; row < kRows; ++row) {
        for (int column = 0; column < kColumns; ++column)
            std::fill(line.begin() + rounded(layout.columnEdge(column)),
                      line.begin() + rounded(layout.columnEdge(column + 1)), cells[row][column] ? kWhite : kBlack);
        fillRows(rounded(layout.rowEdge(row)), rounded(layout.rowEdge(row + 1)), line);
    }
}

std::optional<std::uint32_t> readFrameNumber(const std::uint8_t* luma, int width, int height, std::size_t stride) {
    // Below this a cell is smaller than a pixel.
    if (luma == nullptr || width < kColumns + 1 || height < 5 * (kRows + 1)) return std::nullopt;
    const Layout layout(width, height);
    const auto cell = [&](int row, int column) {
        return meanOfMiddle(luma, width, height, stride, layout.columnEdge(column), layout.columnEdge(column + 1),
                            layout.rowEdge(row), layout.rowEdge(row + 1));
    };
    const double white = std::min(cell(0, 0), cell(0, kColumns - 1));
    const double black = std::max(cell(1, 0), cell(1, kColumns - 1));
    if (white - black < kLeastContrast) return std::nullopt;
    const auto level = [&](double mean) { return (mean - black) / (white - black); };

    // The quiet frame below the cells; above them half a unit touches the scene, so it may be smeared and isn't judged.
    const double quiet = meanOfMiddle(luma, width, height, stride, 0, width, layout.rowEdge(kRows), height);
    if (level(quiet) > kBlackUpTo) return std::nullopt;

    std::uint32_t word = 0;
    for (int row = 0; row < kRows; ++row) {
        for (int column = 1; column < kColumns - 1; ++column) {
            const double value = level(cell(row, column));
            if (value > kBlackUpTo && value < kWhiteFrom) return std::nullopt;
            word = word << 1 | (value >= kWhiteFrom ? 1U : 0U);
        }
    }
    const std::uint32_t number = word >> 8;
    if (frameNumberChecksum(number) != (word & 0xFF)) return std::nullopt;
    return number;
}

}  // namespace lumacast::scene
