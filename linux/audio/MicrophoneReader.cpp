#include "linux/audio/MicrophoneReader.h"

#include <strings.h>

#include <string_view>

namespace lumacast::sound {

namespace {

/// The role of a call as PulseAudio and as PipeWire name it.
bool isOfHigherPriority(const pa_proplist* properties) {
    const char* const role = properties ? pa_proplist_gets(properties, PA_PROP_MEDIA_ROLE) : nullptr;
    return role && (::strcasecmp(role, "phone") == 0 || ::strcasecmp(role, "communication") == 0);
}

}  // namespace

void MicrophoneReader::start() {
    microphone_ = {};
    failed_ = false;
    operations_.clear();
    // The server answers in this order. One more, so that no answer is the last one before all are asked.
    open_ = 1;
    ask(pa_context_get_server_info(&context_, takeServer, this));
    ask(pa_context_get_source_info_list(&context_, takeSource, this));
    ask(pa_context_get_source_output_info_list(&context_, takeRecording, this));
    answered(true);
}

void MicrophoneReader::ask(pa_operation* operation) {
    ++open_;
    if (operation)
        operations_.emplace_back(operation);
    else
        answered(false);
}

void MicrophoneReader::answered(bool succeeded) {
    if (!succeeded) failed_ = true;
    if (--open_ > 0) return;
    done_(failed_ ? nullptr : &microphone_);
}

void MicrophoneReader::takeServer(pa_context*, const pa_server_info* info, void* self) {
    auto& reader = *static_cast<MicrophoneReader*>(self);
    if (info && info->default_source_name) reader.microphone_.name = info->default_source_name;
    reader.microphone_.isPipeWire =
        info && info->server_name && std::string_view(info->server_name).find("PipeWire") != std::string_view::npos;
    reader.answered(info != nullptr);
}

void MicrophoneReader::takeSource(pa_context*, const pa_source_info* info, int end, void* self) {
    auto& reader = *static_cast<MicrophoneReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    ListedMicrophone& microphone = reader.microphone_;
    if (!info || !info->name || microphone.name.empty() || microphone.name != info->name) return;
    if (info->monitor_of_sink != PA_INVALID_INDEX || pa_channel_map_valid(&info->channel_map) == 0) return;
    microphone.index = info->index;
    microphone.channels = info->channel_map;
}

void MicrophoneReader::takeRecording(pa_context*, const pa_source_output_info* info, int end, void* self) {
    auto& reader = *static_cast<MicrophoneReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    // One that is corked holds on to the microphone, but leaves it to others.
    if (!info || info->corked != 0 || !isOfHigherPriority(info->proplist)) return;
    if (info->source == PA_INVALID_INDEX)
        reader.microphone_.isUndecided = true;
    else if (info->source == reader.microphone_.index)
        reader.microphone_.isTaken = true;
}

}  // namespace lumacast::sound
