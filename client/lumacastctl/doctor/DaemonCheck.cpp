#include "client/lumacastctl/doctor/Daemon.h"

namespace lumacast::ctl {

namespace {

using Socket = DaemonFacts::Socket;

constexpr char kSubject[] = "daemon";

Finding checkService(const DaemonFacts& facts) {
    switch (facts.service) {
        case Socket::Answers: return ok(kSubject, "applications can connect at " + facts.servicePath + ".");
        case Socket::Silent:
            return problem(kSubject,
                           "somebody listens at " + facts.servicePath +
                               " but does not greet, so applications can't connect; when lumacastd hangs, end it and "
                               "start it anew, and see its log.");
        case Socket::Closed: break;
    }
    return problem(kSubject, "nobody listens at " + facts.servicePath +
                                 ", so applications can't connect; see lumacastd's log, or start it anew.");
}

Finding checkAdmin(const DaemonFacts& facts) {
    switch (facts.admin) {
        case Socket::Answers: return ok(kSubject, "it answers at " + facts.adminPath + ".");
        case Socket::Silent:
            return problem(kSubject, "it has no answer at " + facts.adminPath +
                                         ", so it is busy or hangs; try again, then end it and start it anew.");
        case Socket::Closed: break;
    }
    return warning(kSubject, "nobody listens at " + facts.adminPath +
                                 ", so lumacastctl status has nobody to ask; see lumacastd's log, or start it anew.");
}

}  // namespace

Findings checkDaemon(const DaemonFacts& facts) {
    Findings findings;
    if (!facts.pathFits)
        return {problem(kSubject, "the runtime directory's path is too long for sockets: " + facts.runtimeDirectory +
                                      "; set XDG_RUNTIME_DIR to a shorter one.")};
    if (!facts.runtimeVariableIsSet)
        findings.push_back(
            warning(kSubject, "XDG_RUNTIME_DIR is not set, so " + facts.runtimeDirectory +
                                  " is taken; set it as the session has it, for the daemon, the applications and "
                                  "this tool alike."));
    if (facts.admin == Socket::Closed && facts.service == Socket::Closed) {
        findings.push_back(problem(kSubject, "it isn't running: nobody listens in " + facts.runtimeDirectory +
                                                 "; start lumacastd as this user, with the same XDG_RUNTIME_DIR."));
        return findings;
    }
    findings.push_back(checkAdmin(facts));
    findings.push_back(checkService(facts));
    return findings;
}

}  // namespace lumacast::ctl
