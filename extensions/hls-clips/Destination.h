#pragma once
// Where the stream goes.

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include "base/Value.h"

namespace lumacast::extensions {

/// Takes files. Each call blocks, within its own bounds; one thread at a time.
class Destination {
public:
    virtual ~Destination() = default;
    /// Puts a file there, whole or not at all: nobody sees half of it under its name. The reason when that failed, else
    /// empty.
    virtual std::string put(const std::string& name, const Data& contents, std::string_view contentType) = 0;
    /// Takes one away; failures are of no account.
    virtual void remove(const std::string& name) = 0;
};

/// A folder, made if need be.
std::unique_ptr<Destination> makeFolder(std::string path);

/// A web server that takes PUT and DELETE below `url`. `isGivenUp` is asked during a transfer; when it says so the
/// transfer ends as a failure. Certificates are checked.
std::unique_ptr<Destination> makeUpload(std::string url, std::function<bool()> isGivenUp);

}  // namespace lumacast::extensions
