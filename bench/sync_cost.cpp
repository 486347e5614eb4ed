// What it costs to bring a movie onto the disk as it grows: fragments of half a second at a given bit rate are written as a recording
// writes them (the samples, a sync, the name of the fragment), with a sync at each, at every second, at every fourth, and with none.
//
//   sync_cost [--folder DIR] [--megabits 5] [--fragments 40] [--rounds 3]
//
// Time passes as it does in a recording, at a tenth: a fragment each 50 ms. One line for each way, the median of its rounds.

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "linux/media/MovieFile.h"

namespace {

using Clock = std::chrono::steady_clock;
using Milliseconds = std::chrono::duration<double, std::milli>;

struct Run {
    std::vector<double> syncs;  ///< ms each
    double processor = 0;       ///< ms per fragment
    double deviceBytes = 0;     ///< per byte of the movie
};

double processorMilliseconds() {
    rusage usage{};
    ::getrusage(RUSAGE_SELF, &usage);
    const auto of = [](const timeval& time) { return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_usec) / 1e3; };
    return of(usage.ru_utime) + of(usage.ru_stime);
}

/// Bytes that this process has caused to be written to a device.
double writtenBytes() {
    std::ifstream file("/proc/self/io");
    for (std::string name; file >> name;) {
        double bytes = 0;
        file >> bytes;
        if (name == "write_bytes:") return bytes;
    }
    return 0;
}

double at(std::vector<double> values, double part) {
    if (values.empty()) return 0;
    std::sort(values.begin(), values.end());
    return values[std::min(values.size() - 1, static_cast<std::size_t>(part * static_cast<double>(values.size())))];
}

Run record(const std::string& path, std::size_t bytes, int fragments, int syncEach) {
    lumacast::media::PosixMovieFiles files;
    std::filesystem::remove(path);
    auto made = files.create(path);
    auto* const file = std::get_if<0>(&made);
    if (!file) return {};
    std::vector<std::uint8_t> samples(bytes);
    std::uint32_t random = 1;
    for (auto& byte : samples) byte = static_cast<std::uint8_t>((random = random * 1664525 + 1013904223) >> 24);
    Run run;
    const double processor = processorMilliseconds(), written = writtenBytes();
    std::uint64_t offset = 0;
    auto next = Clock::now();
    for (int i = 0; i < fragments; ++i) {
        std::this_thread::sleep_until(next += std::chrono::milliseconds(50));
        (void)(*file)->write(offset, samples);
        if (syncEach > 0 && i % syncEach == 0) {
            const auto begin = Clock::now();
            (void)(*file)->sync();
            run.syncs.push_back(Milliseconds(Clock::now() - begin).count());
        }
        (void)(*file)->write(offset + 4, std::span(samples).first(4));
        offset += bytes;
    }
    (void)(*file)->sync();  // the end, in each way
    run.processor = (processorMilliseconds() - processor) / fragments;
    run.deviceBytes = (writtenBytes() - written) / static_cast<double>(offset);
    std::filesystem::remove(path);
    return run;
}

}  // namespace

int main(int count, char** arguments) {
    CLI::App options("What syncing a movie as it grows costs.");
    std::string folder = ".";
    double megabits = 5;
    int fragments = 40, rounds = 3;
    options.add_option("--folder", folder, "where the movie is written");
    options.add_option("--megabits", megabits, "a second");
    options.add_option("--fragments", fragments, "a round");
    options.add_option("--rounds", rounds, "of each way");
    CLI11_PARSE(options, count, arguments);
    const auto bytes = static_cast<std::size_t>(megabits * 1e6 / 8 / 2);
    std::printf("%-22s %9s %9s %9s %14s %16s\n", "a sync", "p50 ms", "p99 ms", "worst", "processor ms", "device bytes");
    for (const auto& [name, each] : {std::pair{"each half second", 1}, {"each second", 2}, {"every two seconds", 4}, {"at the end only", 0}}) {
        std::vector<double> syncs, processor, device;
        for (int i = 0; i < rounds; ++i) {
            const Run run = record(folder + "/sync-cost.mp4", bytes, fragments, each);
            syncs.insert(syncs.end(), run.syncs.begin(), run.syncs.end());
            processor.push_back(run.processor);
            device.push_back(run.deviceBytes);
        }
        std::printf("%-22s %9.2f %9.2f %9.2f %14.3f %16.3f\n", name, at(syncs, 0.5), at(syncs, 0.99), at(syncs, 1), at(processor, 0.5), at(device, 0.5));
    }
}
