#include "linux/audio/ServerReader.h"

#include <string_view>

namespace lumacast::sound {

ListedClient listedClient(const pa_client_info& info) {
    return readClient(info.index, [&info](std::string_view name) -> std::optional<std::string_view> {
        const char* const text = info.proplist ? pa_proplist_gets(info.proplist, std::string(name).c_str()) : nullptr;
        return text ? std::optional<std::string_view>(text) : std::nullopt;
    });
}

ListedPlayback listedPlayback(const pa_sink_input_info& info) {
    const bool isUsable =
        pa_channel_map_valid(&info.channel_map) != 0 && info.channel_map.channels == info.sample_spec.channels;
    ListedPlayback playback{info.index, info.client, info.sink, {}};
    if (isUsable)
        for (std::uint8_t channel = 0; channel < info.channel_map.channels; ++channel)
            playback.positions.push_back(static_cast<std::int32_t>(info.channel_map.map[channel]));
    return playback;
}

void ServerReader::start() {
    listing_ = {};
    listing_.ownClient = pa_context_get_index(&context_);
    failed_ = false;
    operations_.clear();
    // The server answers in this order. One more, so that no answer is the last one before all are asked.
    open_ = 1;
    ask(pa_context_get_server_info(&context_, takeServer, this));
    ask(pa_context_get_client_info_list(&context_, takeClient, this));
    ask(pa_context_get_sink_info_list(&context_, takeSink, this));
    ask(pa_context_get_sink_input_info_list(&context_, takePlayback, this));
    ask(pa_context_get_source_output_info_list(&context_, takeRecording, this));
    answered(true);
}

void ServerReader::ask(pa_operation* operation) {
    ++open_;
    if (operation)
        operations_.emplace_back(operation);
    else
        answered(false);
}

void ServerReader::answered(bool succeeded) {
    if (!succeeded) failed_ = true;
    if (--open_ > 0) return;
    done_(failed_ ? nullptr : &listing_);
}

void ServerReader::takeServer(pa_context*, const pa_server_info* info, void* self) {
    auto& reader = *static_cast<ServerReader*>(self);
    reader.listing_.isPipeWire =
        info && info->server_name && std::string_view(info->server_name).find("PipeWire") != std::string_view::npos;
    reader.answered(info != nullptr);
}

void ServerReader::takeClient(pa_context*, const pa_client_info* info, int end, void* self) {
    auto& reader = *static_cast<ServerReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    if (info && reader.listing_.clients.size() < kMostListed) reader.listing_.clients.push_back(listedClient(*info));
}

void ServerReader::takeSink(pa_context*, const pa_sink_info* info, int end, void* self) {
    auto& reader = *static_cast<ServerReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    if (info && reader.listing_.sinks.size() < kMostListed)
        reader.listing_.sinks.push_back({info->index, info->monitor_source});
}

void ServerReader::takePlayback(pa_context*, const pa_sink_input_info* info, int end, void* self) {
    auto& reader = *static_cast<ServerReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    if (info && reader.listing_.playbacks.size() < kMostListed)
        reader.listing_.playbacks.push_back(listedPlayback(*info));
}

void ServerReader::takeRecording(pa_context*, const pa_source_output_info* info, int end, void* self) {
    auto& reader = *static_cast<ServerReader*>(self);
    if (end != 0) return reader.answered(end > 0);
    if (info && reader.listing_.recordings.size() < kMostListed)
        reader.listing_.recordings.push_back({info->index, info->client, info->source});
}

}  // namespace lumacast::sound
