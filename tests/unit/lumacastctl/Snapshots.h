#pragma once
// Snapshots as the daemon gives them to its admin service.

#include "base/Value.h"
#include "linux/system/Json.h"

namespace lumacast::ctl {

inline Dictionary emptySnapshot() {
    return {{"service", "com.orvane.lumacastd"},
            {"temporaryDirectory", "/root/private/var/mobile/Library/Lumacast/"},
            {"freeBytes", std::uint64_t{0}},
            {"sessions", Array()}};
}

inline Dictionary snapshotOfARecording() {
    const Dictionary current{{"paused", false},
                             {"elapsedSeconds", 62.5},
                             {"path", "/root/private/var/mobile/Library/Lumacast//Player.mp4"},
                             {"width", 1280.0},
                             {"height", 720.0},
                             {"bytes", std::uint64_t{12'345'678}},
                             {"frames", std::int64_t{1876}},
                             {"framesRecorded", std::uint64_t{1874}},
                             {"framesDelivered", std::uint64_t{1880}},
                             {"framesDropped", std::uint64_t{6}}};
    const Dictionary player{{"bundleID", "org.example.Player"}, {"connected", true}, {"recording", true},
                            {"transactionOpen", true},          {"pid", 4711},       {"current", current}};
    const Dictionary tea{{"bundleID", "org.example.Tea"},
                         {"connected", true},
                         {"recording", false},
                         {"transactionOpen", false},
                         {"pid", 12}};
    const Dictionary gone{
        {"bundleID", "org.example.Gone"}, {"connected", false}, {"recording", false}, {"transactionOpen", false}};
    Dictionary snapshot = emptySnapshot();
    snapshot.set("freeBytes", std::uint64_t{81'600'000'000});
    snapshot.set("sessions", Array{Value(player), Value(tea), Value(gone)});
    return snapshot;
}

}  // namespace lumacast::ctl
