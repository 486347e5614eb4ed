// Each check on facts of both kinds: what is well, and each thing that isn't.

#include "client/lumacastctl/doctor/Daemon.h"
#include "client/lumacastctl/doctor/Display.h"
#include "client/lumacastctl/doctor/Encoders.h"
#include "client/lumacastctl/doctor/Resources.h"
#include "client/lumacastctl/doctor/Sound.h"
#include "client/lumacastctl/doctor/Storage.h"
#include "tests/unit/lumacastctl/FindingMatchers.h"

namespace lumacast::ctl {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::Not;

TEST(Findings, AreALineEachWithTheirSeverityFirst) {
    EXPECT_EQ(findingsText({ok("a", "good."), warning("b", "fair."), problem("c", "bad\x1B.")}),
              "ok      a: good.\nwarning b: fair.\nproblem c: bad?.\n");
}

TEST(Findings, HaveAProblemOnlyWhenOneIs) {
    EXPECT_FALSE(hasProblem({}));
    EXPECT_FALSE(hasProblem({ok("a", ""), warning("b", "")}));
    EXPECT_TRUE(hasProblem({ok("a", ""), problem("b", "")}));
}

// --- display ---

DisplayFacts goodDisplay() {
    DisplayFacts facts;
    facts.name = ":1";
    facts.reach = DisplayFacts::Reach::Connected;
    facts.composite = {{0, 4}};
    facts.damage = {{1, 1}};
    facts.fixes = {{5, 0}};
    facts.sharedMemory = {{1, 2}};
    facts.resources = {{1, 2}};
    facts.takesMemoryByDescriptor = true;
    facts.pixelsAreBgrx = true;
    return facts;
}

TEST(DisplayCheck, OfAGoodDisplayIsWell) {
    EXPECT_THAT(checkDisplay(goodDisplay()),
                ElementsAre(Finds(kOk, "DISPLAY=:1 answers"),
                            Finds(kOk, "COMPOSITE 0.4, DAMAGE 1.1, XFIXES 5.0, MIT-SHM 1.2, RES 1.2"),
                            Finds(kOk, "by descriptor")));
}

TEST(DisplayCheck, NamesEachExtensionThatIsMissing) {
    using Missing = std::optional<DisplayFacts::Version> DisplayFacts::*;
    const std::pair<Missing, const char*> extensions[] = {{&DisplayFacts::composite, "COMPOSITE is missing"},
                                                          {&DisplayFacts::damage, "DAMAGE is missing"},
                                                          {&DisplayFacts::fixes, "XFIXES is missing"},
                                                          {&DisplayFacts::sharedMemory, "MIT-SHM is missing"},
                                                          {&DisplayFacts::resources, "RES is missing"}};
    for (const auto& [member, text] : extensions) {
        DisplayFacts facts = goodDisplay();
        facts.*member = std::nullopt;
        EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, text)).Times(1));
        EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "")).Times(1));
    }
}

TEST(DisplayCheck, TellsVersionsThatAreTooOld) {
    DisplayFacts facts = goodDisplay();
    facts.resources = {{1, 1}};
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "RES is of version 1.1, 1.2 is needed")));
    facts = goodDisplay();
    facts.sharedMemory = {{1, 1}};
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "MIT-SHM is of version 1.1, 1.2 is needed")));
    facts = goodDisplay();
    facts.composite = {{0, 1}};
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "COMPOSITE is of version 0.1, 0.2 is needed")));
}

TEST(DisplayCheck, FindsWhatElseKeepsItFromCapturing) {
    DisplayFacts facts = goodDisplay();
    facts.takesMemoryByDescriptor = false;
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "refuses memory")));
    facts = goodDisplay();
    facts.pixelsAreBgrx = false;
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "24-bit colours")));
}

TEST(DisplayCheck, ThatCannotBeReachedIsOneProblem) {
    DisplayFacts facts;
    EXPECT_THAT(checkDisplay(facts), ElementsAre(Finds(kProblem, "DISPLAY is not set")));
    facts.name = ":7";
    facts.reach = DisplayFacts::Reach::NoServer;
    EXPECT_THAT(checkDisplay(facts), ElementsAre(Finds(kProblem, "DISPLAY=:7 can't be reached")));
    facts.reach = DisplayFacts::Reach::NoAnswer;
    EXPECT_THAT(checkDisplay(facts), ElementsAre(Finds(kProblem, "does not answer")));
    facts.name = "far:0";
    facts.reach = DisplayFacts::Reach::NotLocal;
    EXPECT_THAT(checkDisplay(facts), ElementsAre(Finds(kProblem, "no display of this machine")));
}

TEST(DisplayCheck, OfAWaylandSessionSaysWhatWorksAndWhatDoesNot) {
    DisplayFacts facts = goodDisplay();
    facts.isWaylandSession = true;
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kWarning, "windows of Wayland applications can't")));
    EXPECT_FALSE(hasProblem(checkDisplay(facts)));
    facts.name.clear();
    EXPECT_THAT(checkDisplay(facts), Contains(Finds(kProblem, "turn on Xwayland")));
}

// --- sound ---

TEST(SoundCheck, SaysWhereSoundIsRecordedFromOrWhyMoviesAreSilent) {
    SoundFacts facts{{{"PulseAudio", "/p", false}, {"PipeWire", "/w", false}}};
    EXPECT_THAT(checkSound(facts), ElementsAre(Finds(kWarning, "no sound server answers (looked for PulseAudio at /p, PipeWire at "
                                                               "/w), so movies are silent until one does")));
    facts.sockets[1].answers = true;
    EXPECT_THAT(checkSound(facts), ElementsAre(Finds(kWarning, "nobody answers as PulseAudio at /p; start pipewire-pulse")));
    facts.sockets[0].answers = true;
    EXPECT_THAT(checkSound(facts), ElementsAre(Finds(kOk, "recorded through the sound server at /p")));
    facts.sockets[1].answers = false;
    EXPECT_THAT(checkSound(facts), ElementsAre(Finds(kOk, "recorded through the sound server at /p")));
}

// --- encoders ---

/// Of a build with x264, where the library is there.
EncoderFacts encoderFacts(std::vector<std::string> present, std::vector<std::string> devices = {}) {
    EncoderFacts facts;
    facts.library = "libavcodec.so.59";
    facts.isLoaded = true;
    facts.present = std::move(present);
    facts.devices = std::move(devices);
    facts.software = "libx264";
    return facts;
}

/// Of a build with a library of its own for recordings.
EncoderFacts ownEncoderFacts(std::vector<std::string> present, bool ownIsLoaded) {
    EncoderFacts facts = encoderFacts(std::move(present));
    facts.software = "libopenh264";
    facts.ownLibrary = "libopenh264.so.7";
    facts.ownIsLoaded = ownIsLoaded;
    return facts;
}

TEST(EncoderCheck, IsWellWithSoftwareAlone) {
    const EncoderFacts facts = encoderFacts({"h264_vaapi", "libx264"});
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kOk, "encoded by the processor")));
}

TEST(EncoderCheck, SaysWhatHardwareIsTried) {
    const EncoderFacts facts = encoderFacts({"h264_vaapi", "libx264"}, {"/dev/dri/renderD128"});
    EXPECT_THAT(checkEncoders(facts),
                ElementsAre(Finds(kOk, "tries h264_vaapi (there is /dev/dri/renderD128), then libx264")));
}

TEST(EncoderCheck, IsAProblemWithoutAnyAndAWarningWithHardwareAlone) {
    EncoderFacts facts = encoderFacts({"h264_vaapi"});
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kProblem, "no hardware to encode with")));
    facts.devices = {"/dev/dri/renderD128"};
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kWarning, "depends on h264_vaapi")));
}

TEST(EncoderCheck, WarnsOnlyOfSavingWhereRecordingHasALibraryOfItsOwn) {
    EXPECT_THAT(checkEncoders(ownEncoderFacts({"libx264"}, true)), ElementsAre(Finds(kOk, "libopenh264 is there")));
    EXPECT_THAT(checkEncoders(ownEncoderFacts({}, true)),
                ElementsAre(Finds(kOk, "libopenh264 is there"), Finds(kWarning, "movies are saved as they are")));
}

TEST(EncoderCheck, IsAProblemWithoutTheLibraryOfRecordingsThatSavingDoesNotReplace) {
    EncoderFacts facts = ownEncoderFacts({"libx264", "h264_vaapi"}, false);
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kProblem, "libopenh264.so.7 can't be loaded, and")));
    facts.devices = {"/dev/dri/renderD128"};
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kWarning, "recording depends on h264_vaapi")));
}

TEST(EncoderCheck, IsAProblemWithoutTheLibrary) {
    EncoderFacts facts = encoderFacts({});
    facts.isLoaded = false;
    EXPECT_THAT(checkEncoders(facts), ElementsAre(Finds(kProblem, "can't be loaded")));
}

// --- temporary directory ---

StorageFacts goodStorage() {
    StorageFacts facts;
    facts.path = facts.nearest = "/root/tmp";
    facts.state = StorageFacts::State::Directory;
    facts.isWritable = true;
    facts.freeBytes = 5'000'000'000;
    return facts;
}

TEST(StorageCheck, OfAGoodDirectoryIsWell) {
    EXPECT_THAT(checkStorage(goodStorage()),
                ElementsAre(Finds(kOk, "/root/tmp can be written to"), Finds(kOk, "5.0 GB are free")));
}

TEST(StorageCheck, OfAMissingDirectoryIsWellWhereItCanBeMade) {
    StorageFacts facts = goodStorage();
    facts.state = StorageFacts::State::Missing;
    facts.nearest = "/root";
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kOk, "the daemon makes it")));
    facts.isWritable = false;
    EXPECT_THAT(checkStorage(facts),
                Contains(Finds(kProblem, "/root/tmp is missing and can't be made: /root can't be written to")));
}

TEST(StorageCheck, FindsADirectoryThatIsNoneOrCannotBeWrittenTo) {
    StorageFacts facts = goodStorage();
    facts.isWritable = false;
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kProblem, "/root/tmp can't be written to")));
    facts.state = StorageFacts::State::SomethingElse;
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kProblem, "is no directory")));
}

TEST(StorageCheck, WantsStrictlyMoreThanAHundredMegabytes) {
    StorageFacts facts = goodStorage();
    facts.freeBytes = 100'000'000;
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kProblem, "only 100.0 MB are free")));
    facts.freeBytes = 100'000'001;
    EXPECT_THAT(checkStorage(facts), AllAre(kOk));
    facts.freeBytes = std::nullopt;
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kWarning, "can't be told")));
}

TEST(StorageCheck, ComparesWithWhatTheRunningDaemonUses) {
    StorageFacts facts = goodStorage();
    facts.daemonsPath = "/root/tmp";
    EXPECT_THAT(checkStorage(facts), AllAre(kOk));
    facts.daemonsPath = "/other";
    EXPECT_THAT(checkStorage(facts), Contains(Finds(kWarning, "the running daemon uses /other instead")));
}

// --- resources ---

TEST(ResourceCheck, TellsTheLanguage) {
    const ResourceFacts facts{"/b", std::vector<std::string>{"de", "en"}, {"de-AT"}, {"de"}, "/home"};
    EXPECT_THAT(checkResources(facts), ElementsAre(Finds(kOk, "/b has the languages de, en; yours is de.")));
}

TEST(ResourceCheck, WarnsOfTextsThatAreMissing) {
    ResourceFacts facts{"/b", std::nullopt, {"de"}, {}, "/data"};
    EXPECT_THAT(checkResources(facts), ElementsAre(Finds(kWarning, "copy Lumacast.bundle to /data/lumacast/")));
    facts.localizations.emplace();
    EXPECT_THAT(checkResources(facts), ElementsAre(Finds(kWarning, "no texts in any language")));
    facts.localizations = {"en"};
    EXPECT_THAT(checkResources(facts), ElementsAre(Finds(kWarning, "none of yours (de)")));
}

// --- daemon ---

DaemonFacts goodDaemon() {
    DaemonFacts facts;
    facts.runtimeDirectory = "/run/lumacast";
    facts.runtimeVariableIsSet = true;
    facts.adminPath = "/run/lumacast/admin.sock";
    facts.servicePath = "/run/lumacast/service.sock";
    facts.admin = facts.service = DaemonFacts::Socket::Answers;
    return facts;
}

TEST(DaemonCheck, OfARunningDaemonIsWell) {
    EXPECT_THAT(checkDaemon(goodDaemon()),
                ElementsAre(Finds(kOk, "it answers at"), Finds(kOk, "applications can connect")));
}

TEST(DaemonCheck, ThatIsNotRunningIsOneProblem) {
    DaemonFacts facts = goodDaemon();
    facts.admin = facts.service = DaemonFacts::Socket::Closed;
    EXPECT_THAT(checkDaemon(facts), ElementsAre(Finds(kProblem, "it isn't running: nobody listens in /run/lumacast")));
}

TEST(DaemonCheck, TellsEachSocketThatFails) {
    DaemonFacts facts = goodDaemon();
    facts.service = DaemonFacts::Socket::Closed;
    EXPECT_THAT(checkDaemon(facts), Contains(Finds(kProblem, "nobody listens at /run/lumacast/service.sock")));
    facts.service = DaemonFacts::Socket::Silent;
    EXPECT_THAT(checkDaemon(facts), Contains(Finds(kProblem, "does not greet")));
    facts = goodDaemon();
    facts.admin = DaemonFacts::Socket::Silent;
    EXPECT_THAT(checkDaemon(facts), Contains(Finds(kProblem, "it has no answer at")));
    facts.admin = DaemonFacts::Socket::Closed;
    EXPECT_THAT(checkDaemon(facts), Contains(Finds(kWarning, "status has nobody to ask")));
    EXPECT_FALSE(hasProblem(checkDaemon(facts)));
}

TEST(DaemonCheck, MindsTheRuntimeDirectory) {
    DaemonFacts facts = goodDaemon();
    facts.runtimeVariableIsSet = false;
    EXPECT_THAT(checkDaemon(facts), Contains(Finds(kWarning, "XDG_RUNTIME_DIR is not set")));
    facts.pathFits = false;
    EXPECT_THAT(checkDaemon(facts), ElementsAre(Finds(kProblem, "too long for sockets")));
}

}  // namespace
}  // namespace lumacast::ctl
