#include "client/lumacastctl/doctor/Question.h"

#include "linux/desktop/DialogProgram.h"

namespace lumacast::ctl {

namespace {

constexpr char kSubject[] = "question";

}  // namespace

QuestionFacts probeQuestion(const std::vector<std::string>& searchPath) {
    QuestionFacts facts;
    if (const auto program = findDialogProgram(searchPath, ProgramOwner::Administrator))
        facts.program = program->path;
    else if (const auto untrusted = findDialogProgram(searchPath, ProgramOwner::Anybody))
        facts.untrustedProgram = untrusted->path;
    return facts;
}

Findings checkQuestion(const QuestionFacts& facts) {
    if (facts.program) return {ok(kSubject, "the user is asked by " + *facts.program + ".")};
    const std::string refused = "so the user can't be asked, and starts that must be are refused with -5801; ";
    if (facts.untrustedProgram)
        return {problem(kSubject, *facts.untrustedProgram + " is not the administrator's, " + refused +
                                      "it and its folders must belong to root, and nobody else may write there.")};
    return {problem(kSubject, "neither yad nor zenity is in the PATH, " + refused + "install the package yad.")};
}

}  // namespace lumacast::ctl
