#include "daemon/LCClientProxy.h"

#include "base/Log.h"

namespace lumacast {

void LCClientProxy::send(ClientMessage message, Array arguments, IpcConnection::ErrorHandler errorHandler) {
    if (const auto reached = connection())
        reached->remoteProxy(std::move(errorHandler))->send(static_cast<std::uint16_t>(message), std::move(arguments));
}

void LCClientProxy::updateScreenRecordingState(bool on) {
    log_.line("LCClientProxy:updateScreenRecordingState:");
    send(ClientMessage::UpdateScreenRecordingState, {on}, [&log = log_](const Error& error) {
        log.line("LCClientProxy:updateScreenRecordingState: error getting remote proxy: %d", error.code());
    });
}

void LCClientProxy::stopRecordingWithError(const std::optional<Error>& error, const std::optional<URL>& movieURL) {
    log_.line("LCClientProxy:stopRecordingWithError:movieURL:");
    send(ClientMessage::StopRecordingWithError, {Value(error), Value(movieURL)}, [&log = log_](const Error& failure) {
        // Deliberately not this message's name.
        log.line("LCClientProxy:recordingDidStopWithError: error getting remote proxy: %d", failure.code());
    });
}

void LCClientProxy::updateBroadcastServiceInfo(const Value& info) {
    log_.line("LCClientProxy:updateBroadcastServiceInfo:");
    send(ClientMessage::UpdateBroadcastServiceInfo, {info}, [&log = log_](const Error& error) {
        log.line("LCClientProxy:updateBroadcastServiceInfo: error getting remote proxy: %d", error.code());
    });
}

void LCClientProxy::updateBroadcastURL(const URL& url) {
    log_.line("LCClientProxy:updateBroadcastURL:");
    send(ClientMessage::UpdateBroadcastURL, {url}, [&log = log_](const Error& error) {
        log.line("LCClientProxy:updateBroadcastURL: error getting remote proxy: %d", error.code());
    });
}

void LCClientProxy::captureHandlerWithSample(const std::shared_ptr<SharedPlane>& plane, const Data& timingData) {
    log_.sample("LCClientProxy:captureHandlerWithSample:");
    send(ClientMessage::CaptureHandlerWithSample, {Value(plane), timingData}, [&log = log_](const Error& error) {
        log.line("LCClientProxy:captureHandlerWithSample: error getting remote proxy: %d", error.code());
    });
}

void LCClientProxy::captureHandlerWithAudioSample(const Data& sample, const Data& absdData, std::int64_t itemCount,
                                                  std::int64_t bufferType, const Data& timingData) {
    log_.sample("LCClientProxy:captureHandlerWithAudioSample:");
    send(ClientMessage::CaptureHandlerWithAudioSample, {sample, absdData, itemCount, bufferType, timingData},
         [&log = log_](const Error& error) {
             log.line("LCClientProxy:captureHandlerWithAudioSample: error getting remote proxy: %d", error.code());
         });
}

void LCClientProxy::recordingLockInterrupted(const Value& object) {
    log_.line("LCClientProxy:recordingLockInterrupted:");
    send(ClientMessage::RecordingLockInterrupted, {object}, [&log = log_](const Error& error) {
        // Deliberately the text of another notice, misspelling included.
        log.line("LCClientProxy:recodingDidStopAndSavedToCameraRoll: video saved to camera roll: %d", error.code());
    });
}

void LCClientProxy::recordingTimerDidUpdate(const Value& object) {
    log_.line("LCClientProxy:recordingTimerDidUpdate:");
    send(ClientMessage::RecordingTimerDidUpdate, {object}, [&log = log_](const Error& error) {
        log.line("LCClientProxy:recordingTimerDidUpdate: error getting remote proxy: %d", error.code());
    });
}

}  // namespace lumacast
