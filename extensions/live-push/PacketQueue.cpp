#include "extensions/live-push/PacketQueue.h"

namespace lumacast::extensions {

std::uint64_t PacketQueue::push(OutgoingPacket packet) {
    if (packet.isKeyFrame()) needsKeyFrame_ = false;
    if (needsKeyFrame_) return packet.isVideo ? 1 : 0;
    bytes_ += static_cast<std::size_t>(packet.packet->size);
    packets_.push_back(std::move(packet));
    if (bytes_ <= mostBytes_) return 0;
    std::uint64_t dropped = keepFromLatestKeyFrame();
    if (bytes_ <= mostBytes_) return dropped;
    dropped += dropUntil(packets_.size());
    needsKeyFrame_ = true;
    return dropped;
}

OutgoingPacket PacketQueue::pop() {
    OutgoingPacket first = std::move(packets_.front());
    packets_.pop_front();
    bytes_ -= static_cast<std::size_t>(first.packet->size);
    return first;
}

std::uint64_t PacketQueue::keepFromLatestKeyFrame() {
    for (std::size_t place = packets_.size(); place-- > 0;)
        if (packets_[place].isKeyFrame()) return dropUntil(place);
    const std::uint64_t dropped = dropUntil(packets_.size());
    needsKeyFrame_ = true;
    return dropped;
}

std::uint64_t PacketQueue::dropUntil(std::size_t place) {
    std::uint64_t pictures = 0;
    for (; place > 0; --place) {
        if (packets_.front().isVideo) ++pictures;
        pop();
    }
    return pictures;
}

}  // namespace lumacast::extensions
