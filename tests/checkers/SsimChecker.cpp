#include "tests/checkers/SsimChecker.h"

namespace lumacast::checkers {
namespace {

constexpr int kWindow = 8;
constexpr int kStep = 4;
constexpr double kMeanConstant = 0.01 * 255 * 0.01 * 255;
constexpr double kVarianceConstant = 0.03 * 255 * 0.03 * 255;

double windowSsim(const LumaView& one, const LumaView& other, int left, int top) {
    long long sumA = 0, sumB = 0, squareA = 0, squareB = 0, product = 0;
    for (int y = top; y < top + kWindow; ++y) {
        for (int x = left; x < left + kWindow; ++x) {
            const int a = one.samples[static_cast<std::size_t>(y) * one.stride + static_cast<std::size_t>(x)];
            const int b = other.samples[static_cast<std::size_t>(y) * other.stride + static_cast<std::size_t>(x)];
            sumA += a;
            sumB += b;
            squareA += a * a;
            squareB += b * b;
            product += a * b;
        }
    }
    constexpr double kCount = kWindow * kWindow;
    const double meanA = sumA / kCount, meanB = sumB / kCount;
    const double varianceA = squareA / kCount - meanA * meanA, varianceB = squareB / kCount - meanB * meanB;
    const double covariance = product / kCount - meanA * meanB;
    return (2 * meanA * meanB + kMeanConstant) * (2 * covariance + kVarianceConstant) /
           ((meanA * meanA + meanB * meanB + kMeanConstant) * (varianceA + varianceB + kVarianceConstant));
}

}  // namespace

std::optional<double> meanSsim(const LumaView& one, const LumaView& other) {
    if (one.width != other.width || one.height != other.height || one.width < kWindow || one.height < kWindow)
        return std::nullopt;
    double sum = 0;
    int windows = 0;
    for (int top = 0; top + kWindow <= one.height; top += kStep)
        for (int left = 0; left + kWindow <= one.width; left += kStep, ++windows)
            sum += windowSsim(one, other, left, top);
    return sum / windows;
}

}  // namespace lumacast::checkers
