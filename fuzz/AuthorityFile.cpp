// The user's keys to display servers. First a host and a display number (each a length byte and its text), then the
// file.

#include "linux/display/AuthorityFile.h"

#include "base/Value.h"

#include "fuzz/Input.h"
#include "fuzz/Property.h"

namespace lumacast::fuzz {

namespace {

void append(Data& file, std::string_view text) {
    file.push_back(static_cast<std::uint8_t>(text.size() >> 8));
    file.push_back(static_cast<std::uint8_t>(text.size()));
    file.insert(file.end(), text.begin(), text.end());
}

}  // namespace

void authorityFile(Bytes input) {
    Input in(input);
    const std::string host(textOf(in.bytes(in.byte())));
    const std::string number(textOf(in.bytes(in.byte())));
    const Bytes file = in.rest();
    const auto key = x11::findKey(file, host, number);
    if (key) {
        require(key->method == "MIT-MAGIC-COOKIE-1", "a key is of the method that is understood");
        require(key->secret.size() <= file.size(), "a secret is a part of the file");
    }

    // The first key that fits counts, whatever follows it; and one put in front is found.
    Data more(file.begin(), file.end());
    more.insert(more.end(), 3, 0xFF);
    require(!key || x11::findKey(more, host, number) == key, "what follows a key makes no difference");
    Data front{0x01, 0x00};  // this machine
    append(front, host);
    append(front, number);
    append(front, "MIT-MAGIC-COOKIE-1");
    append(front, "secret");
    front.insert(front.end(), file.begin(), file.end());
    const auto found = x11::findKey(front, host, number);
    require(found && textOf(found->secret) == "secret", "a key of this machine and display is found");
}

}  // namespace lumacast::fuzz
