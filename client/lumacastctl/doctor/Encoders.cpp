#include "client/lumacastctl/doctor/Encoders.h"

#include <dlfcn.h>
#include <unistd.h>

#include <algorithm>
#include <memory>

extern "C" {
#include <libavcodec/avcodec.h>
}

namespace lumacast::ctl {

namespace {

constexpr std::array kDevices{"/dev/nvidia0", "/dev/dri/renderD128", "/dev/dri/renderD129"};

struct Unload {
    void operator()(void* library) const { ::dlclose(library); }
};

}  // namespace

EncoderFacts probeEncoders() {
    EncoderFacts facts;
    facts.library = "libavcodec.so." + std::to_string(LIBAVCODEC_VERSION_MAJOR);
    // It stays loaded: what it keeps for itself is not ours to free.
    const std::unique_ptr<void, Unload> library(
        ::dlopen(facts.library.c_str(), RTLD_LAZY | RTLD_LOCAL | RTLD_NODELETE));
    void* const symbol = library ? ::dlsym(library.get(), "avcodec_find_encoder_by_name") : nullptr;
    if (!symbol) return facts;
    facts.isLoaded = true;
    const auto find = reinterpret_cast<decltype(&avcodec_find_encoder_by_name)>(symbol);
    for (const char* name : kEncoders)
        if (find(name)) facts.present.emplace_back(name);
    for (const char* device : kDevices)
        if (::access(device, R_OK | W_OK) == 0) facts.devices.emplace_back(device);
    return facts;
}

Findings checkEncoders(const EncoderFacts& facts) {
    constexpr char kSubject[] = "encoder";
    if (!facts.isLoaded)
        return {problem(kSubject, facts.library + " can't be loaded, so nothing can be encoded; install it.")};
    const std::string software = kEncoders.back();
    std::vector<std::string> hardware = facts.present;
    std::erase(hardware, software);
    const bool hasSoftware = hardware.size() != facts.present.size();
    const bool mayHaveHardware = !hardware.empty() && !facts.devices.empty();
    const std::string tried = listText(hardware) + " (there is " + listText(facts.devices) + ")";
    if (!hasSoftware)
        return {mayHaveHardware ? warning(kSubject, facts.library + " has no " + software + ": recording depends on " +
                                                        tried + ", which only a recording can try; install a " +
                                                        facts.library + " with " + software + ".")
                                : problem(kSubject, facts.library + " has no " + software +
                                                        ", and there is no hardware to encode with; install a " +
                                                        facts.library + " with " + software + ".")};
    if (mayHaveHardware)
        return {ok(kSubject, "a recording tries " + tried + ", then " + software + ", which is there.")};
    return {ok(kSubject, software + " is there; no hardware was found, so pictures are encoded by the processor.")};
}

}  // namespace lumacast::ctl
