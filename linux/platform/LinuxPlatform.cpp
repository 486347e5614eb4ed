#include "linux/platform/LinuxPlatform.h"

#include <signal.h>
#include <sysexits.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "base/Limits.h"
#include "linux/accessibility/LinuxScreenReader.h"
#include "linux/admin/LinuxAdminService.h"
#include "linux/apps/Entitlements.h"
#include "linux/apps/LinuxBundles.h"
#include "linux/extensions/LinuxAppExtensions.h"
#include "linux/ipc/LinuxIpc.h"
#include "linux/ipc/LinuxKeyedArchive.h"
#include "linux/library/LinuxPhotoLibrary.h"
#include "linux/media/LinuxContainerWriters.h"
#include "linux/media/LinuxMovieExporters.h"
#include "linux/media/MoviesCommand.h"
#include "linux/media/UnfinishedMovies.h"
#include "linux/network/LinuxNetworkReachability.h"
#include "linux/storage/LinuxFileSystem.h"
#include "linux/storage/LinuxStoragePurgeService.h"
#include "linux/store/LinuxStoreLookup.h"
#include "linux/system/Allocator.h"
#include "linux/system/ClosedMovieEvent.h"
#include "linux/system/DescriptorLimit.h"
#include "linux/system/LinuxClock.h"
#include "linux/system/LinuxDeviceInfo.h"
#include "linux/system/LinuxEnvironment.h"
#include "linux/system/LinuxKeepAlive.h"
#include "linux/system/LinuxLogSink.h"
#include "linux/system/LinuxPreferences.h"
#include "linux/system/LinuxTelemetry.h"
#include "linux/system/Termination.h"
#include "linux/system/UsageCommand.h"
#include "support/ThreadScheduler.h"

namespace lumacast {

namespace {

/// What the end may take: closing the open movies, and noting them.
constexpr std::chrono::seconds kTimeToEnd = LinuxContainerWriters::kClosingLimit + std::chrono::seconds(5);
constexpr std::chrono::seconds kTimeToNote{1};
/// What an export may take to see that it is cancelled, and to take its file away itself.
constexpr std::chrono::milliseconds kTimeToCancel{500};
/// How much more time the service manager is asked for, and how often.
constexpr std::chrono::seconds kMoreTime{10}, kAskForTimeEvery{2};
/// What a device that is about to sleep waits for the movies: a second less than its login manager lets it.
constexpr std::chrono::seconds kTimeToSecure{4};

/// Two for each connection that one user may have, and as many again for other users and everything else.
constexpr std::uint64_t kDescriptors =
    4 * (limitOf(Limit::ConnectionsPerUser) + limitOf(Limit::ConnectionsBeforeHello));

/// A daemon that nobody can reach must not run on: whoever started it hears of it by its exit status. At once, like
/// every end of this process: other lanes may be in the middle of their work.
[[noreturn]] void endUnreachable() {
    ::_exit(EX_UNAVAILABLE);
}

std::string environmentVariable(const char* name) {
    const char* value = std::getenv(name);
    return value ? value : "";
}

std::string temporaryDirectory(const LinuxEnvironment& environment) {
    return environment.root + std::string(kDeviceTemporaryDirectory);
}

/// Members are made in this order and unmade in the opposite one.
class LinuxPlatform final : public PlatformOwner {
public:
    LinuxPlatform(const LinuxEnvironment& environment, const MakeDesktopRoles& makeDesktop)
        : environment_(environment),
          sink_({.journalStream = environment.journalStream}),
          log_([this](LogLevel level, std::string_view text) { sink_.write(level, text); }),
          reactor_(std::make_shared<Reactor>("com.orvane.lumacastd")),
          scheduler_(reactor_),
          bundles_(LinuxBundles::optionsFrom(environment)),
          entitlements_(bundles_, {.directories = Entitlements::directoriesFrom(environment)}),
          ipc_(*reactor_, log_,
               {.runtimeDirectory = environment.runtimeDirectory,
                .entitlements = [this](ProcessID pid, std::string_view name) { return entitlements_.value(pid, name); },
                .activated = ActivatedSockets::fromEnvironment(),
                .serviceUnavailable = endUnreachable}),
          desktop_(makeDesktop({environment_, log_, clock_, scheduler_, bundles_,
                                [this](ProcessID pid) { return applicationOf(pid); }})),
          sound_(desktop_->makeSound()),
          movieFiles_(std::make_shared<media::PosixMovieFiles>(temporaryDirectory(environment))),
          writers_(clock_, movieFiles_),
          exporters_(movieFiles_),
          unfinishedMovies_(temporaryDirectory(environment), log_),
          photoLibrary_({.home = environment.home,
                         .configHome = environment.configHome,
                         .videosDirectory = environmentVariable("XDG_VIDEOS_DIR")}),
          fileSystem_(fileSystemOptions(environment)),
          preferences_(environment.configDirectories),
          deviceInfo_(environment.systemDirectories),
          telemetry_(environment.stateDirectory + "/telemetry.jsonl"),
          keepAlive_(environment.notifySocket, sleepInhibitor()),
          display_(desktop_->makeDisplay()),
          admin_(scheduler_, environment.runtimeDirectory + "/admin.sock", {},
                 [this](std::string_view reason) {
                     log_.error("the administrator's socket admin.sock is not available: %s", reason);
                     endUnreachable();
                 }),
          storagePurge_(scheduler_, fileSystem_),
          attention_(desktop_->makeAttention()),
          screenReader_({.address = LinuxScreenReader::sessionBus(environmentVariable("DBUS_SESSION_BUS_ADDRESS"),
                                                                  environmentVariable("XDG_RUNTIME_DIR"))}),
          storeLookup_(scheduler_, LinuxStoreLookup::optionsFrom(environment)),
          appExtensions_(*reactor_, scheduler_, ipc_, log_,
                         LinuxAppExtensions::optionsFrom(environment, temporaryDirectory(environment))),
          platform_{log_,
                    scheduler_,
                    clock_,
                    ipc_,
                    bundles_,
                    *display_.renderServer,
                    *display_.appStateMonitor,
                    *display_.displayCapture,
                    *display_.displayCloneControl,
                    *sound_.audioInputQueues,
                    *sound_.deviceCapture,
                    writers_,
                    exporters_,
                    photoLibrary_,
                    fileSystem_,
                    preferences_,
                    deviceInfo_,
                    telemetry_,
                    keepAlive_,
                    admin_,
                    storagePurge_,
                    *attention_.userAlerts,
                    *attention_.systemSounds,
                    screenReader_,
                    storeLookup_,
                    networkReachability_,
                    appExtensions_,
                    keyedArchive_},
          termination_(
              [this] { closeMovies(); }, kTimeToEnd,
              {[this] { keepAlive_.announceStopping(static_cast<int>(kMoreTime.count())); }, kAskForTimeEvery}) {
        admin_.addCommand("usage", usageCommand(telemetry_));
        admin_.addCommand("movies", media::moviesCommand(scheduler_, temporaryDirectory(environment)));
    }

    /// What must be there before the daemon can work; the error when it can't be had.
    std::optional<Error> prepare() {
        if (auto error = fileSystem_.prepare()) return error;
        unfinishedMovies_.remember();
        // The main loop's first task: by then clients are accepted.
        scheduler_.mainQueue().async([this] {
            keepAlive_.announceReady();
            unfinishedMovies_.begin([this] { photoLibrary_.removeUnfinished(); });
        });
        return std::nullopt;
    }

    Platform& platform() override { return platform_; }

private:
    /// At the end of the process, waiting for no lane.
    void closeMovies() {
        exporters_.forgetAll();  // an export can be made again
        // A recording that ended by itself, whose movie nobody has asked for, has had its summary: only the newest ones
        // run.
        const auto running = static_cast<std::size_t>(keepAlive_.openTransactions());
        const auto closed = writers_.closeOpenMovies();
        const auto first = closed.end() - static_cast<std::ptrdiff_t>(std::min(running, closed.size()));
        for (const media::ClosedMovie& movie : std::vector(first, closed.end()))
            reportEndedWithProcess(telemetry_, {movie.seconds, movie.width, movie.height, movie.pictures, movie.bytes});
        telemetry_.flush(kTimeToNote);
        exporters_.removeUnfinished(kTimeToCancel);
        sink_.flush();
    }

    std::optional<BundleIdentifier> applicationOf(ProcessID pid) {
        const auto executable = bundles_.executablePath(pid);
        const auto path = executable ? bundles_.bundlePathForExecutable(*executable) : std::nullopt;
        const auto bundle = path ? bundles_.open(*path) : nullptr;
        return bundle ? bundle->identifier() : std::nullopt;
    }

    SleepInhibitor::Options sleepInhibitor() {
        SleepInhibitor::Options options;
        options.beforeSleep = [this] { writers_.secureOpenMovies(kTimeToSecure); };
        return options;
    }

    LinuxFileSystem::Options fileSystemOptions(const LinuxEnvironment& environment) {
        LinuxFileSystem::Options options;
        options.root = environment.root;
        options.bytesBeingWritten = [this](const std::string& path) { return writers_.bytesBeingWritten(path); };
        return options;
    }

    const LinuxEnvironment environment_;
    LinuxLogSink sink_;
    Log log_;
    LinuxClock clock_;
    const std::shared_ptr<Reactor> reactor_;
    ThreadScheduler scheduler_;
    LinuxBundles bundles_;
    Entitlements entitlements_;
    LinuxIpc ipc_;
    const std::unique_ptr<DesktopRoles> desktop_;
    SoundRoles sound_;
    const std::shared_ptr<media::MovieFiles> movieFiles_;
    LinuxContainerWriters writers_;
    LinuxMovieExporters exporters_;
    media::UnfinishedMovies unfinishedMovies_;
    LinuxPhotoLibrary photoLibrary_;
    LinuxFileSystem fileSystem_;
    LinuxPreferences preferences_;
    LinuxDeviceInfo deviceInfo_;
    LinuxTelemetry telemetry_;
    LinuxKeepAlive keepAlive_;
    DisplayRoles display_;
    LinuxAdminService admin_;
    LinuxStoragePurgeService storagePurge_;
    AttentionRoles attention_;
    LinuxScreenReader screenReader_;
    LinuxStoreLookup storeLookup_;
    LinuxNetworkReachability networkReachability_;
    LinuxAppExtensions appExtensions_;
    LinuxKeyedArchive keyedArchive_;
    Platform platform_;
    Termination termination_;  // last: it touches what is above
};

}  // namespace

std::unique_ptr<PlatformOwner> makePlatformOn(const MakeDesktopRoles& makeDesktop) {
    keepMemoryFlat();
    allowDescriptors(kDescriptors);
    blockTerminationSignals();
    ::signal(SIGXFSZ, SIG_IGN);  // a file that may not grow is an error to its writer, not the end of the process
    const LinuxEnvironment environment = LinuxEnvironment::ofThisProcess();
    if (const auto bad = environment.prepareDirectories()) {
        std::fprintf(stderr, "lumacastd: the directory %s can't be used: %s\n", bad->path.c_str(), bad->why.c_str());
        return nullptr;
    }
    auto platform = std::make_unique<LinuxPlatform>(environment, makeDesktop);
    if (const auto error = platform->prepare()) {
        std::fprintf(stderr, "lumacastd: the temporary directory %s%s can't be used: %s\n", environment.root.c_str(),
                     std::string(kDeviceTemporaryDirectory).c_str(), describe(*error).c_str());
        return nullptr;
    }
    return platform;
}

}  // namespace lumacast
