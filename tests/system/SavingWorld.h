#pragma once
// A daemon with a library of the test's own, and movies to be saved to it.

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "client/Recorder.h"
#include "tests/checkers/tests/MovieMaker.h"
#include "tests/system/World.h"

namespace lumacast::test {

/// For a save: what mixes has the time that the machine's other work leaves, which may be little.
inline constexpr std::chrono::seconds kPatience{300};

inline constexpr std::int64_t kFailedToSave = -5812;
inline constexpr char kNotMixed[] = "Error Mixing video Audio tracks";  // in the log

/// Whether it goes: a save is answered once the removals are asked for.
bool becomesGone(const std::string& path);

/// A tone of a sound track.
std::function<float(double seconds)> tone(double frequency);

/// A machine whose user keeps videos in `path("videos")`. This process is an application on it.
class SavingWorld : public World {
public:
    SavingWorld();

    /// Starts the daemon, and the recorder that saves.
    void startDaemon(std::vector<std::string> variables = {});
    client::Recorder& recorder() { return *recorder_; }
    /// Has it saved over the socket; the error's code, 0 for none.
    std::int64_t save(const std::string& movie);

    /// Makes a movie "movies/<name>" of the scene's frames from kFirst, with these sound tracks. Its path.
    std::string makeMovie(const std::string& name, const std::vector<double>& tones);
    static constexpr std::uint32_t kFirst = 100;
    static constexpr int kFrames = 45;

    /// All files and folders in the library, hidden ones too.
    std::vector<std::string> library() const;
    /// The one that is there; fails the test when there is not exactly one.
    std::string onlySaved() const;
    /// What is in the daemon's temporary directory.
    std::vector<std::string> temporaryFiles() const;
    std::string temporaryDirectory() const;
    std::size_t countInLog(const std::string& text) const;
    /// The state of each save ("mixing", "adding", ...), in their order.
    std::vector<std::string> saveStates();

private:
    std::unique_ptr<client::Recorder> recorder_;
};

/// Every frame of a movie that makeMovie has made is there, in order, once.
void expectAllFrames(const std::string& movie);

}  // namespace lumacast::test
