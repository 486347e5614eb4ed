#include "linux/media/openh264/OpenH264Encoder.h"

#include <utility>

#include "linux/media/AvHandles.h"
#include "linux/media/SoftwareEncoder.h"

namespace lumacast::media {

namespace {

constexpr unsigned short kThreads = 2;
/// Nothing is coded finer than this: what is simple takes less than the average, which is a ceiling.
constexpr int kFinest = 20, kCoarsest = 51;

void describe(SEncParamExt& parameters, const VideoTrackSettings& settings) {
    parameters.iUsageType = CAMERA_VIDEO_REAL_TIME;
    parameters.iPicWidth = settings.width;
    parameters.iPicHeight = settings.height;
    parameters.fMaxFrameRate = static_cast<float>(settings.frameRate);
    parameters.iTargetBitrate = static_cast<int>(settings.bitRate);
    parameters.iMaxBitrate = UNSPECIFIED_BIT_RATE;
    // By the stamps: pictures come at irregular times, and each gets what the time since the last one allows.
    parameters.iRCMode = RC_TIMESTAMP_MODE;
    parameters.iMinQp = kFinest;
    parameters.iMaxQp = kCoarsest;
    // The library's own skipping leaves out most of a page that scrolls; RateCeiling decides instead.
    parameters.bEnableFrameSkip = false;
    // Key frames stand where they are asked for, all with the same parameter sets.
    parameters.bEnableSceneChangeDetect = false;
    parameters.uiIntraPeriod = static_cast<unsigned>(settings.maxKeyFrameInterval);
    parameters.eSpsPpsIdStrategy = CONSTANT_ID;
    parameters.iEntropyCodingModeFlag = 1;
    parameters.iMultipleThreadIdc = kThreads;
    parameters.iSpatialLayerNum = 1;
    SSpatialLayerConfig& layer = parameters.sSpatialLayers[0];
    layer.uiProfileIdc = PRO_HIGH;
    layer.iVideoWidth = settings.width;
    layer.iVideoHeight = settings.height;
    layer.fFrameRate = parameters.fMaxFrameRate;
    layer.iSpatialBitrate = parameters.iTargetBitrate;
    layer.iMaxSpatialBitrate = UNSPECIFIED_BIT_RATE;
    layer.sSliceArgument.uiSliceMode = SM_FIXEDSLCNUM_SLICE;
    layer.sSliceArgument.uiSliceNum = kThreads;
    layer.bVideoSignalTypePresent = true;
    layer.uiVideoFormat = VF_UNDEF;
    layer.bFullRange = false;
    layer.bColorDescriptionPresent = true;
    layer.uiColorPrimaries = CP_SMPTE170M;
    layer.uiTransferCharacteristics = TRC_SMPTE170M;
    layer.uiColorMatrix = CM_SMPTE170M;
}

enum class Layers { All, PicturesOnly };

/// The byte stream of a frame, put together. Parameter sets stand in the movie's header, and not before each key frame.
void collect(const SFrameBSInfo& frame, Layers wanted, std::vector<std::uint8_t>& bytes) {
    bytes.clear();
    for (int number = 0; number < frame.iLayerNum; ++number) {
        const SLayerBSInfo& layer = frame.sLayerInfo[number];
        if (wanted == Layers::PicturesOnly && layer.uiLayerType == NON_VIDEO_CODING_LAYER) continue;
        std::size_t length = 0;
        for (int unit = 0; unit < layer.iNalCount; ++unit) length += static_cast<std::size_t>(layer.pNalLengthInByte[unit]);
        bytes.insert(bytes.end(), layer.pBsBuf, layer.pBsBuf + length);
    }
}

}  // namespace

VideoEncoder::Opened OpenH264Encoder::open(const VideoTrackSettings& settings) {
    ISVCEncoder* made = nullptr;
    if (WelsCreateSVCEncoder(&made) != 0 || !made) return systemError(ENOMEM);
    Handle encoder(made);
    int level = WELS_LOG_QUIET;
    encoder->SetOption(ENCODER_OPTION_TRACE_LEVEL, &level);
    SEncParamExt parameters{};
    encoder->GetDefaultParams(&parameters);
    describe(parameters, settings);
    if (encoder->InitializeExt(&parameters) != cmResultSuccess) return systemError(EINVAL);
    SFrameBSInfo info{};
    std::vector<std::uint8_t> header;
    if (encoder->EncodeParameterSets(&info) != cmResultSuccess) return systemError(EIO);
    collect(info, Layers::All, header);
    return std::unique_ptr<VideoEncoder>(
        new OpenH264Encoder(std::move(encoder), std::move(header), settings.bitRate));
}

std::optional<Error> OpenH264Encoder::encode(const std::shared_ptr<I420Picture>& picture, std::int64_t stamp, KeyFrame key,
                                             const Output& output) {
    if (!ceiling_.hasRoom(stamp) && key != KeyFrame::Forced) return std::nullopt;
    if (key == KeyFrame::Forced) encoder_->ForceIntraFrame(true);
    SSourcePicture source{};
    source.iColorFormat = videoFormatI420;
    source.iPicWidth = picture->width();
    source.iPicHeight = picture->height();
    source.iStride[0] = picture->lumaStride();
    source.iStride[1] = source.iStride[2] = picture->chromaStride();
    source.pData[0] = picture->y();
    source.pData[1] = picture->u();
    source.pData[2] = picture->v();
    source.uiTimeStamp = stamp / (kTimescale / 1000);
    SFrameBSInfo info{};
    if (encoder_->EncodeFrame(&source, &info) != cmResultSuccess) return systemError(EIO);
    if (info.eFrameType == videoFrameTypeSkip || info.eFrameType == videoFrameTypeInvalid) return systemError(EIO);
    collect(info, Layers::PicturesOnly, bytes_);
    ceiling_.spend(bytes_.size());
    output({bytes_, stamp, info.eFrameType == videoFrameTypeIDR});
    return std::nullopt;
}

VideoEncoder::Opened openSoftwareEncoder(const VideoTrackSettings& settings) { return OpenH264Encoder::open(settings); }

}  // namespace lumacast::media
