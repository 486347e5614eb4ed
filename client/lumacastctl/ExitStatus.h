#pragma once

namespace lumacast::ctl {

/// The tool's exit statuses, for scripts. Also in its --help.
enum ExitStatus : int {
    kGood = 0,
    kNoAnswer = 1,  ///< the daemon isn't running or does not answer, or the answer could not be written
    kWrongUsage = 2,
    kProblemsFound = 3,  ///< by the doctor
};

}  // namespace lumacast::ctl
