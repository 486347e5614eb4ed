// Encodes a broadcast's samples and pushes them to a media server.

#include "extensions/live-push/LivePush.h"

int main() {
    avformat_network_init();
    av_log_set_level(AV_LOG_ERROR);
    lumacast::extensions::LivePush handler;
    return lumacast::extension::run(handler);
}
