#include "tests/unit/linux_mp4/Tools.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <sstream>
#include <stdexcept>

namespace lumacast::mp4::test {
namespace {

std::string readAll(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

std::vector<std::string> linesOf(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
        if (!line.empty()) {
            lines.push_back(line);
        }
    }
    return lines;
}

// Decodes every track; a line "0, dts, pts, ..." of the output is a picture.
Played playWith(const std::vector<std::string>& options, const std::filesystem::path& movie) {
    std::vector<std::string> arguments{"ffmpeg", "-nostdin", "-v", "error"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    for (const char* argument : {"-threads", "1", "-copyts", "-i"}) {
        arguments.emplace_back(argument);
    }
    arguments.push_back(movie.string());
    for (const char* argument : {"-map", "0", "-vsync", "passthrough", "-enc_time_base", "-1", "-f", "framecrc", "-"}) {
        arguments.emplace_back(argument);
    }
    const ToolResult result = runTool(arguments);
    Played played{result.status, result.errors, {}};
    for (const std::string& line : linesOf(result.output)) {
        long long dts = 0;
        long long pts = 0;
        if (std::sscanf(line.c_str(), "0, %lld, %lld,", &dts, &pts) == 2) {
            played.pictures.push_back(pts);
        }
    }
    return played;
}

}  // namespace

TemporaryDirectory::TemporaryDirectory() {
    std::string name = (std::filesystem::temp_directory_path() / "mp4_tests.XXXXXX").string();
    if (mkdtemp(name.data()) == nullptr) {
        throw std::runtime_error("no temporary directory");
    }
    root_ = name;
}

TemporaryDirectory::~TemporaryDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
}

std::filesystem::path TemporaryDirectory::write(const std::string& name, std::span<const std::uint8_t> bytes) const {
    std::ofstream file(path(name), std::ios::binary | std::ios::trunc);
    file.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) {
        throw std::runtime_error("can't write " + name);
    }
    return path(name);
}

ToolResult runTool(const std::vector<std::string>& arguments) {
    const TemporaryDirectory scratch;
    const std::string output = scratch.path("out").string();
    const std::string errors = scratch.path("err").string();
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, output.c_str(), O_WRONLY | O_CREAT, 0600);
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, errors.c_str(), O_WRONLY | O_CREAT, 0600);
    std::vector<char*> argv;
    for (const std::string& argument : arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    ToolResult result;
    pid_t pid = 0;
    const int failure = posix_spawnp(&pid, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (failure != 0) {
        return result;
    }
    int status = 0;
    if (waitpid(pid, &status, 0) == pid && WIFEXITED(status)) {
        result.status = WEXITSTATUS(status);
    }
    result.output = readAll(output);
    result.errors = readAll(errors);
    return result;
}

Played playStrictly(const std::filesystem::path& movie) {
    return playWith({"-xerror", "-err_detect", "explode"}, movie);
}

Played playStrictlyFrom(int seconds, const std::filesystem::path& movie) {
    return playWith({"-xerror", "-err_detect", "explode", "-ss", std::to_string(seconds)}, movie);
}

Played play(const std::filesystem::path& movie) {
    return playWith({}, movie);
}

std::vector<std::string> probe(const std::filesystem::path& movie, const std::string& entries) {
    const ToolResult result =
        runTool({"ffprobe", "-v", "error", "-show_entries", entries, "-of", "compact=p=0", movie.string()});
    return linesOf(result.output);
}

}  // namespace lumacast::mp4::test
