#pragma once

#include <cstdint>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>

#include "examples/scene/Scene.h"
#include "examples/self_recorder/Loop.h"
#include "examples/self_recorder/MarkPlan.h"
#include "examples/self_recorder/SceneWindow.h"
#include "examples/self_recorder/UniqueFd.h"

namespace lumacast::example {

/// Draws the scene into the window at a steady rate and numbers the frames. A number is given only once the display has
/// taken the frame before, so each number that was drawn was really shown; a tick that finds the display busy or the
/// window hidden draws nothing and costs no number. Lives on the loop.
class Painter final {
public:
    struct Options {
        int framesPerSecond = 60;
        scene::Motion motion = scene::Motion::Everywhere;
        bool still = false;
        std::uint32_t markEvery = 0;                         ///< frames from one mark to the next; 0: none
        std::function<void(std::int64_t hostTime)> onMark;  ///< a mark will be on the window at that time
        std::string framesLog;  ///< empty: none
    };

    /// Borrows loop and window, whose `shown`, `exposed` and `resized` events it takes. On failure `error()` says why.
    Painter(Loop& loop, SceneWindow& window, const Options& options);
    ~Painter();
    Painter(const Painter&) = delete;
    Painter& operator=(const Painter&) = delete;

    [[nodiscard]] const std::string& error() const { return error_; }

    /// The number of the last frame the display has shown; 0 before the first, which is 1.
    [[nodiscard]] std::uint32_t frame() const { return shownNumber_; }

    /// A still painter shows its last frame and changes nothing on the window.
    void setStill(bool still) { still_ = still; }

private:
    struct CloseFile {
        void operator()(std::FILE* file) const { std::fclose(file); }
    };

    void startTimer();
    void tick();
    void draw(std::uint32_t number, scene::Mark mark);
    void shown();
    void redraw();

    Loop& loop_;
    SceneWindow& window_;
    UniqueFd timer_;
    std::unique_ptr<std::FILE, CloseFile> log_;
    std::unique_ptr<scene::Scene> scene_;
    scene::Motion motion_;
    bool still_;
    bool redrawWhenShown_ = false;
    const std::int64_t interval_;
    std::int64_t tickAt_ = 0;         ///< the nominal time of the last tick
    std::int64_t showingTakes_ = 0;   ///< from a tick to its frame being on the window, lately
    MarkPlan marks_;
    const std::function<void(std::int64_t)> onMark_;
    scene::Mark drawnMark_ = scene::Mark::None;
    bool isFirstMarked_ = false;
    std::uint32_t drawnNumber_ = 0;
    std::uint32_t shownNumber_ = 0;
    std::int64_t sentAt_ = 0;
    std::string error_;
};

}  // namespace lumacast::example
