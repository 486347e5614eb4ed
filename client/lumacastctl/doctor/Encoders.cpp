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
#ifdef LC_CTL_OPENH264
    // A daemon without it doesn't even start: it is linked to it.
    facts.ownLibrary = LC_CTL_OPENH264;
    facts.ownIsLoaded = std::unique_ptr<void, Unload>(::dlopen(LC_CTL_OPENH264, RTLD_LAZY | RTLD_LOCAL)) != nullptr;
#endif
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

namespace {

constexpr char kSubject[] = "encoder";

bool has(const std::vector<std::string>& names, const std::string& name) {
    return std::find(names.begin(), names.end(), name) != names.end();
}

/// What pictures are encoded with while they are recorded.
Finding checkRecording(const EncoderFacts& facts) {
    std::vector<std::string> hardware = facts.present;
    std::erase(hardware, kSavingSoftware);
    const bool mayHaveHardware = !hardware.empty() && !facts.devices.empty();
    const std::string tried = listText(hardware) + " (there is " + listText(facts.devices) + ")";
    const bool isItsOwn = !facts.ownLibrary.empty();
    if (isItsOwn ? !facts.ownIsLoaded : !has(facts.present, facts.software)) {
        const std::string lacking =
            isItsOwn ? facts.ownLibrary + " can't be loaded" : facts.library + " has no " + facts.software;
        const std::string remedy =
            isItsOwn ? "install it." : "install a " + facts.library + " with " + facts.software + ".";
        if (!mayHaveHardware)
            return problem(kSubject, lacking + ", and there is no hardware to encode with; " + remedy);
        return warning(kSubject,
                       lacking + ": recording depends on " + tried + ", which only a recording can try; " + remedy);
    }
    if (mayHaveHardware)
        return ok(kSubject, "a recording tries " + tried + ", then " + facts.software + ", which is there.");
    return ok(kSubject, facts.software + " is there; no hardware was found, so pictures are encoded by the processor.");
}

}  // namespace

Findings checkEncoders(const EncoderFacts& facts) {
    if (!facts.isLoaded)
        return {problem(kSubject, facts.library + " can't be loaded, so nothing can be encoded; install it.")};
    Findings findings{checkRecording(facts)};
    if (facts.software != kSavingSoftware && !has(facts.present, kSavingSoftware))
        findings.push_back(
            warning(kSubject, facts.library + " has no " + kSavingSoftware +
                                  ", which saving with the sound mixed encodes with: movies are saved as "
                                  "they are; install a " +
                                  facts.library + " with " + kSavingSoftware + "."));
    return findings;
}

}  // namespace lumacast::ctl
