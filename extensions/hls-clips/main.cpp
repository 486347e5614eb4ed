// Makes a live stream that any web server can carry out of a broadcast's clips.

#include <curl/curl.h>

#include "extensions/hls-clips/HlsClips.h"

int main() {
    curl_global_init(CURL_GLOBAL_DEFAULT);
    av_log_set_level(AV_LOG_ERROR);
    lumacast::extensions::HlsClips handler;
    return lumacast::extension::run(handler);
}
