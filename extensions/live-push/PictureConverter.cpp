#include "extensions/live-push/PictureConverter.h"

#include <libyuv.h>

#include <algorithm>
#include <cstring>

namespace lumacast::extensions {

namespace {

/// What an EXIF orientation means: mirrored left to right, and then turned clockwise.
struct Turn {
    bool isMirrored;
    libyuv::RotationMode rotation;
};

Turn turnOf(std::uint32_t orientation) {
    switch (orientation) {
        case 2: return {true, libyuv::kRotate0};
        case 3: return {false, libyuv::kRotate180};
        case 4: return {true, libyuv::kRotate180};
        case 5: return {true, libyuv::kRotate270};
        case 6: return {false, libyuv::kRotate90};
        case 7: return {true, libyuv::kRotate90};
        case 8: return {false, libyuv::kRotate270};
        default: return {false, libyuv::kRotate0};
    }
}

bool isAcross(std::uint32_t orientation) {
    return orientation >= 5;
}

}  // namespace

void PictureConverter::Planes::resize(int newWidth, int newHeight) {
    width = newWidth;
    height = newHeight;
    strideY = newWidth;
    strideUV = (newWidth + 1) / 2;
    y.resize(static_cast<std::size_t>(strideY) * static_cast<std::size_t>(newHeight));
    u.resize(static_cast<std::size_t>(strideUV) * static_cast<std::size_t>((newHeight + 1) / 2));
    v.resize(u.size());
}

PictureConverter::Size PictureConverter::sizeWithin(int width, int height, std::uint32_t orientation, int mostWidth,
                                                    int mostHeight) {
    if (isAcross(orientation)) std::swap(width, height);
    const double scale =
        std::min({1.0, static_cast<double>(mostWidth) / width, static_cast<double>(mostHeight) / height});
    const auto even = [scale](int length) { return std::max(2, static_cast<int>(length * scale + 0.5) / 2 * 2); };
    return {even(width), even(height)};
}

const PictureConverter::Planes& PictureConverter::upright(const SharedPlane& plane, std::uint32_t orientation) {
    const int width = plane.width(), height = plane.height();
    source_.resize(width, height);
    libyuv::ARGBToI420(plane.pixels().data(), static_cast<int>(plane.stride()), source_.y.data(), source_.strideY,
                       source_.u.data(), source_.strideUV, source_.v.data(), source_.strideUV, width, height);
    const Turn turn = turnOf(orientation);
    const Planes* result = &source_;
    if (turn.isMirrored) {
        mirrored_.resize(width, height);
        libyuv::I420Mirror(result->y.data(), result->strideY, result->u.data(), result->strideUV, result->v.data(),
                           result->strideUV, mirrored_.y.data(), mirrored_.strideY, mirrored_.u.data(),
                           mirrored_.strideUV, mirrored_.v.data(), mirrored_.strideUV, width, height);
        result = &mirrored_;
    }
    if (turn.rotation == libyuv::kRotate0) return *result;
    turned_.resize(isAcross(orientation) ? height : width, isAcross(orientation) ? width : height);
    libyuv::I420Rotate(result->y.data(), result->strideY, result->u.data(), result->strideUV, result->v.data(),
                       result->strideUV, turned_.y.data(), turned_.strideY, turned_.u.data(), turned_.strideUV,
                       turned_.v.data(), turned_.strideUV, width, height, turn.rotation);
    return turned_;
}

AvOwned<AVFrame> PictureConverter::convert(const SharedPlane& plane, std::uint32_t orientation) {
    AvOwned<AVFrame> frame(av_frame_alloc());
    if (!frame) return nullptr;
    frame->format = AV_PIX_FMT_YUV420P;
    frame->width = width_;
    frame->height = height_;
    if (av_frame_get_buffer(frame.get(), 0) < 0) return nullptr;
    const Planes& picture = upright(plane, orientation);
    const double scale =
        std::min(static_cast<double>(width_) / picture.width, static_cast<double>(height_) / picture.height);
    const auto length = [scale](int of, int most) { return std::clamp(static_cast<int>(of * scale + 0.5), 1, most); };
    int width = length(picture.width, width_), height = length(picture.height, height_);
    // A pixel that is missing for the even size is stretched over, not left black.
    if (width_ - width < 2) width = width_;
    if (height_ - height < 2) height = height_;
    const int left = (width_ - width) / 4 * 2, top = (height_ - height) / 4 * 2;
    if (width < width_ || height < height_)
        libyuv::I420Rect(frame->data[0], frame->linesize[0], frame->data[1], frame->linesize[1], frame->data[2],
                         frame->linesize[2], 0, 0, width_, height_, 16, 128, 128);
    const auto at = [&](int channel, int divisor) {
        return frame->data[channel] + static_cast<std::ptrdiff_t>(top / divisor) * frame->linesize[channel] +
               left / divisor;
    };
    libyuv::I420Scale(picture.y.data(), picture.strideY, picture.u.data(), picture.strideUV, picture.v.data(),
                      picture.strideUV, picture.width, picture.height, at(0, 1), frame->linesize[0], at(1, 2),
                      frame->linesize[1], at(2, 2), frame->linesize[2], width, height, libyuv::kFilterBilinear);
    return frame;
}

}  // namespace lumacast::extensions
