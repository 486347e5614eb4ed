// Every frame that must be refused.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "tests/contract/IpcHostileWorld.h"

namespace lumacast {
namespace {

struct BadFrame {
    const char* name;
    Data bytes;
    const char* reason;
    std::vector<int> (*descriptors)(std::vector<Fd>& owned) = [](std::vector<Fd>&) { return std::vector<int>(); };
    bool closes = false;  ///< the peer hangs up after it
};

void PrintTo(const BadFrame& frame, std::ostream* out) { *out << frame.name; }

class IpcBadFrameTest : public IpcHostileTest, public ::testing::WithParamInterface<BadFrame> {};

TEST_P(IpcBadFrameTest, DropsItsSenderWithOneLineAndReachesNobody) {
    ASSERT_TRUE(isServed());
    RawPeer peer(path());
    ASSERT_TRUE(peer.hello());
    ASSERT_TRUE(peer.send(message(DaemonMessage::SetMicrophoneEnabled, {true}, 1)));
    ASSERT_TRUE(until([&] { return object->count() == 2; })) << "what came before is delivered";
    std::vector<Fd> owned;
    ASSERT_TRUE(peer.send(GetParam().bytes, GetParam().descriptors(owned)));
    if (GetParam().closes) shutdown(peer.descriptor(), SHUT_WR);
    expectDropped(peer, GetParam().reason);
    EXPECT_EQ(object->count(), 3u) << "but for the friendly client's";
}

Data withByte(Data bytes, std::size_t at, std::uint8_t byte) {
    bytes[at] = byte;
    return bytes;
}

/// A message whose one descriptor has this record.
Data withRecord(const HandleRecord& record) {
    Data records;
    appendRecord(records, record);
    return rawFrame(messageHeader(FrameKind::Request, id(DaemonMessage::SaveVideoToCameraRoll), 2, 1),
                    arguments({13, 0}), records);
}

Data shortened(Data bytes) {
    bytes.pop_back();
    return bytes;
}

std::vector<BadFrame> badFrames() {
    FrameHeader huge = setMicrophone();
    huge.valueBytes = static_cast<std::uint32_t>(limitOf(Limit::MessageBytes));
    FrameHeader overflowing = setMicrophone();
    overflowing.valueBytes = 0xFFFFFFFF;
    overflowing.recordBytes = 0xFFFFFFFF;
    FrameHeader recordsOnly = setMicrophone();
    const auto memory = [](std::vector<Fd>& owned) { return keep(owned, planeMemory(4096, kAllSeals)); };
    const Data good = rawFrame(setMicrophone(), kTrue);
    return {
        {"UnknownKind", withByte(good, 8, 77), "unknown kind"},
        {"KindZero", withByte(good, 8, 0), "unknown kind"},
        {"ReservedBits", withByte(good, 13, 1), "reserved"},
        {"TooBig", rawFrame(huge, {}, {}, true), "over the size limit"},
        {"SizesThatOverflow", rawFrame(overflowing, {}, {}, true), "over the size limit"},
        {"UnknownMessage", rawFrame(messageHeader(FrameKind::Message, 20, 2), kTrue), "unknown message"},
        {"RequestOfAMessageWithoutReply", withByte(good, 8, 2), "declared otherwise"},
        {"MessageThatShouldAskForAReply",
         rawFrame(messageHeader(FrameKind::Message, id(DaemonMessage::StopRecording), 2), encoded(Array{})),
         "declared otherwise"},
        {"OtherTypes", rawFrame(setMicrophone(), encoded(Array{1})), "other types"},
        {"TooFewArguments", rawFrame(setMicrophone(), encoded(Array{})), "other types"},
        {"TooManyArguments", rawFrame(setMicrophone(), encoded(Array{true, true})), "other types"},
        {"NoList", rawFrame(setMicrophone(), encoded(Value(true))), "malformed message"},
        {"NoValue", rawFrame(setMicrophone(), {}), "malformed message"},
        {"TrailingBytes", rawFrame(setMicrophone(), encoded(Array{true}).size() ? arguments({1, 1, 0}) : Data()),
         "malformed"},
        {"UnknownTag", rawFrame(setMicrophone(), arguments({14})), "malformed"},
        {"BoolOfTwo", rawFrame(setMicrophone(), arguments({1, 2})), "malformed"},
        {"TruncatedValue", rawFrame(setMicrophone(), shortened(kTrue)), "malformed"},
        {"BadUtf8", rawFrame(setMicrophone(), arguments({5, 2, 0, 0, 0, 0xC0, 0x80})), "malformed"},
        {"CountBeyondItsBytes", rawFrame(setMicrophone(), {9, 0xFF, 0xFF, 0xFF, 0xFF, 1, 1}), "malformed"},
        {"LengthBeyondItsBytes", rawFrame(setMicrophone(), arguments({5, 0xFF, 0xFF, 0xFF, 0x7F})), "malformed"},
        {"KeyGivenTwice",
         rawFrame(setMicrophone(), arguments({10, 2, 0, 0, 0, 1, 0, 0, 0, 'k', 0, 1, 0, 0, 0, 'k', 0})), "malformed"},
        {"TooDeep", rawFrame(setMicrophone(), nestedArrays(limitOf(Limit::MessageDepth) + 1)), "malformed"},
        {"VeryDeep", rawFrame(setMicrophone(), nestedArrays(200'000)), "malformed"},
        {"HandleWithoutDescriptor", rawFrame(setMicrophone(), arguments({12, 0})), "malformed"},
        {"Replayed", rawFrame(setMicrophone(1), kTrue), "out of sequence"},
        {"Skipped", rawFrame(setMicrophone(3), kTrue), "out of sequence"},
        {"ReplyToNothing", rawFrame(messageHeader(FrameKind::Reply, 0, 1), encoded(Array{})), "a reply to nothing"},
        {"ReplyWithMessageNumber", rawFrame(messageHeader(FrameKind::Reply, 1, 1), encoded(Array{})), "message number"},
        {"NoReplyToNothing", rawFrame(messageHeader(FrameKind::NoReply, 5, 1), {}), "a reply to nothing"},
        {"PlaneThatWasNotLent", rawFrame(messageHeader(FrameKind::PlaneReturned, 0, 1), {}), "not lent"},
        {"TransportFrameWithContents", rawFrame(messageHeader(FrameKind::PlaneReturned, 0, 1), kTrue), "contents"},
        {"Truncated", shortened(good), "truncated", [](std::vector<Fd>&) { return std::vector<int>(); }, true},
        {"TruncatedHeader", Data(5), "truncated", [](std::vector<Fd>&) { return std::vector<int>(); }, true},
        {"TooManyDeclaredDescriptors",
         rawFrame(setMicrophone(2, limitOf(Limit::HandlesPerMessage) + 1), kTrue, Data{1}), "too many descriptors"},
        {"TooManyDescriptors", good, "too many descriptors",
         [](std::vector<Fd>&) { return std::vector<int>(limitOf(Limit::HandlesPerMessage) + 1, 0); }},
        {"VeryManyDescriptors", good, "too many descriptors",
         [](std::vector<Fd>&) { return std::vector<int>(253, 0); }},
        {"StrayDescriptor", good, "descriptors and their records",
         [](std::vector<Fd>&) { return std::vector<int>{0}; }},
        {"StrayDescriptorsOfAnUnfinishedFrame", Data(good.begin(), good.begin() + 24), "descriptors and their records",
         [](std::vector<Fd>&) {
             return std::vector<int>{0, 0};
         }},
        {"RecordWithoutDescriptor", rawFrame(setMicrophone(2, 1), kTrue, Data{1}), "descriptors and their records"},
        {"RecordsWithoutCount", rawFrame(recordsOnly, kTrue, Data{1}), "descriptors and their records"},
        {"CountWithoutRecords", rawFrame(setMicrophone(2, 1), kTrue), "descriptors and their records",
         [](std::vector<Fd>&) { return std::vector<int>{0}; }},
        {"UnknownRecord", rawFrame(setMicrophone(2, 1), kTrue, Data{3}), "malformed descriptor record",
         [](std::vector<Fd>&) { return std::vector<int>{0}; }},
        {"TrailingRecordBytes", rawFrame(setMicrophone(2, 1), kTrue, Data{1, 1}), "malformed descriptor record",
         [](std::vector<Fd>&) { return std::vector<int>{0}; }},
        {"EndpointThatIsAFile", withRecord(EndpointRecord{}), "not what its record says", memory},
        {"EndpointThatIsAStream", withRecord(EndpointRecord{}), "not what its record says",
         [](std::vector<Fd>& owned) { return keep(owned, Fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0))); }},
        {"PlaneThatIsNoMemory", withRecord(plane(16, 16, 64)), "not what its record says",
         [](std::vector<Fd>& owned) { return keep(owned, Fd(open("/dev/null", O_RDONLY | O_CLOEXEC))); }},
        {"PlaneThatCouldShrink", withRecord(plane(16, 16, 64)), "not what its record says",
         [](std::vector<Fd>& owned) { return keep(owned, planeMemory(4096, F_SEAL_GROW)); }},
        {"PlaneBeyondItsMemory", withRecord(plane(16, 65, 64)), "not what its record says", memory},
        {"PlaneOfNoWidth", withRecord(plane(0, 16, 64)), "malformed descriptor record", memory},
        {"PlaneOfNegativeHeight", withRecord(plane(16, -16, 64)), "malformed descriptor record", memory},
        {"PlaneWithAShortStride", withRecord(plane(16, 16, 63)), "malformed descriptor record", memory},
        {"PlaneWithAHugeStride", withRecord(plane(16, 16, std::uint64_t{1} << 62)), "malformed descriptor record",
         memory},
        {"PlaneWithDamageOutside", withRecord(plane(16, 16, 64, {{8, 8, 9, 1}})), "malformed descriptor record",
         memory},
        {"PlaneWithDamageThatOverflows", withRecord(plane(16, 16, 64, {{1, 0, 0x7FFFFFFF, 1}})),
         "malformed descriptor record", memory},
        {"PlaneWhereNoneIsDeclared", withRecord(plane(16, 16, 64)), "other types", memory},
    };
}

INSTANTIATE_TEST_SUITE_P(All, IpcBadFrameTest, ::testing::ValuesIn(badFrames()),
                         [](const auto& test) { return std::string(test.param.name); });

}  // namespace
}  // namespace lumacast
