#pragma once
// What a daemon with faulty calls (FaultyCalls.cpp) is told and tells, in files of one folder ($LC_FAULTS):
//
//   armed     as long as it is there calls are counted, noted and may fail
//   plan      one line "<call> <target> <number> <fault>": the number-th such call since the daemon began, from 1 on
//   calls     a line for each call while armed: "<host nanoseconds> <call> <target> <result> <error> [fault]"
//   journal   what changed the disk, byte by byte, if the file is there before the daemon starts
//
// A target is the last part of a file's name with each run of digits, and of the hexadecimal ones of a hidden name, as "#";
// "socket" for a client, "channel" for any other peer, "memory" for a file without a disk.

#include <array>
#include <string>
#include <string_view>
#include <vector>

namespace lumacast::test {

/// What may be done to a call.
enum class Fault { NoSpace, InputOutput, Short, Interrupted, BrokenPipe, NoBuffers, WouldBlock, KillBefore, KillAfter };

struct NamedFault {
    Fault fault;
    std::string_view name;
};
inline constexpr std::array kFaultNames{
    NamedFault{Fault::NoSpace, "no-space"},        NamedFault{Fault::InputOutput, "input-output"},
    NamedFault{Fault::Short, "short"},             NamedFault{Fault::Interrupted, "interrupted"},
    NamedFault{Fault::BrokenPipe, "broken-pipe"},  NamedFault{Fault::NoBuffers, "no-buffers"},
    NamedFault{Fault::WouldBlock, "would-block"},  NamedFault{Fault::KillBefore, "kill-before"},
    NamedFault{Fault::KillAfter, "kill-after"}};

inline std::string_view nameOf(Fault fault) {
    for (const auto& each : kFaultNames)
        if (each.fault == fault) return each.name;
    return "?";
}

/// The faults that a call of this name can have on a real system, the process's end before and after it with it. Opening what is there
/// is not interrupted here: that every call is made again then is decided in one place, and seen with all the others.
inline std::vector<Fault> faultsOf(std::string_view call) {
    using enum Fault;
    if (call == "write" || call == "writeAt" || call == "copyRange")
        return {NoSpace, InputOutput, Short, Interrupted, KillBefore, KillAfter};
    if (call == "reserve") return {NoSpace, Interrupted, KillBefore, KillAfter};
    if (call == "openToMake") return {NoSpace, InputOutput, Interrupted, KillBefore, KillAfter};
    if (call == "sendMessage") return {BrokenPipe, NoBuffers, WouldBlock, Short, Interrupted, KillBefore, KillAfter};
    if (call == "makeDirectoryAt" || call == "rename" || call == "renameToNew" || call == "link" || call == "sync" ||
        call == "syncData")
        return {NoSpace, InputOutput, Interrupted, KillBefore, KillAfter};
    if (call == "open") return {InputOutput, KillBefore, KillAfter};
    return {InputOutput, Interrupted, KillBefore, KillAfter};
}

inline bool isKill(Fault fault) { return fault == Fault::KillBefore || fault == Fault::KillAfter; }

/// The last part of `path` as a target.
inline std::string targetOf(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    const std::string_view name = slash == std::string_view::npos ? path : path.substr(slash + 1);
    const bool isHidden = name.starts_with(".lumacast-");
    std::string result;
    for (const char c : name) {
        const bool isDigit = (c >= '0' && c <= '9') || (isHidden && result.size() > 9 && c >= 'a' && c <= 'f');
        if (!isDigit) result += c == ' ' ? '_' : c;
        else if (!result.ends_with('#')) result += '#';
    }
    return result.empty() ? "/" : result;
}

}  // namespace lumacast::test
