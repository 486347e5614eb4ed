// Device information: the user's `device.conf` and the administrator's, with a zero byte between, read from the disk.

#include <chrono>

#include "fuzz/Input.h"
#include "fuzz/Property.h"
#include "fuzz/Settings.h"
#include "linux/system/LinuxDeviceInfo.h"

namespace lumacast::fuzz {

namespace {

using Entries = std::vector<std::pair<std::string, std::string>>;

/// A whole number written out digit by digit, one plus sign allowed.
std::optional<std::int64_t> plainNumber(std::string_view text) {
    const bool negative = text.starts_with('-');
    if (negative || text.starts_with('+')) text.remove_prefix(1);
    if (text.empty()) return std::nullopt;
    std::int64_t value = 0;
    for (const char c : text) {
        if (c < '0' || c > '9') return std::nullopt;
        const int digit = negative ? '0' - c : c - '0';
        if (__builtin_mul_overflow(value, 10, &value) || __builtin_add_overflow(value, digit, &value))
            return std::nullopt;
    }
    return value;
}

/// The first file that has the key decides, even with a text that is no number.
std::optional<std::int64_t> expected(const Entries& users, const Entries& administrators, std::string_view key) {
    const std::string* text = lastOf(users, key);
    if (!text) text = lastOf(administrators, key);
    return text ? plainNumber(*text) : std::nullopt;
}

struct Reader {
    SettingsFolder folder{"device.conf"};
    LinuxDeviceInfo device{folder.directories(), std::chrono::minutes(1)};
};

}  // namespace

void deviceInfo(Bytes input) {
    static Reader reader;
    const auto [users, administrators] = twoFiles(input);
    reader.folder.write(users, administrators);
    const Entries usersEntries = plainEntries(users), administratorsEntries = plainEntries(administrators);
    const auto expect = [&](std::optional<std::int64_t> number, std::string_view key) {
        require(number == expected(usersEntries, administratorsEntries, key),
                "a number is the last one of the first file that has it");
    };
    expect(reader.device.userInterfaceIdiom(), "Idiom");
    expect(reader.device.chipID(), "ChipID");
    expect(reader.device.reducedCaptureChipID(), "ReducedCaptureChipID");
}

}  // namespace lumacast::fuzz
