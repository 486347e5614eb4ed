#pragma once

#include <algorithm>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "linux/media/mp4/BoxSink.h"

namespace lumacast::mp4::test {

using Bytes = std::vector<std::uint8_t>;

// Keeps the file in memory with every operation, so that a test can look at the file after each of them, and fails from
// the operation it is told on.
class MemorySink final : public BoxSink {
public:
    enum class Kind { append, overwrite, sync };
    struct Operation {
        Kind kind = Kind::append;
        std::uint64_t offset = 0;
        Bytes bytes;
    };

    std::size_t failFrom = SIZE_MAX;  // index of the first operation that answers false

    bool append(std::span<const std::uint8_t> bytes) override {
        return record({Kind::append, file_.size(), Bytes(bytes.begin(), bytes.end())});
    }
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        return record({Kind::overwrite, offset, Bytes(bytes.begin(), bytes.end())});
    }
    bool sync() override { return record({Kind::sync, 0, {}}); }

    [[nodiscard]] const Bytes& file() const { return file_; }
    [[nodiscard]] const std::vector<Operation>& operations() const { return operations_; }
    [[nodiscard]] std::size_t attempts() const { return attempts_; }
    [[nodiscard]] bool overwroteBeyondEnd() const { return beyondEnd_; }

    // The file as it was after the first `count` operations.
    [[nodiscard]] Bytes fileAfter(std::size_t count) const {
        Bytes file;
        for (std::size_t i = 0; i < count; ++i) {
            apply(operations_[i], file);
        }
        return file;
    }

    static void apply(const Operation& operation, Bytes& file) {
        if (operation.kind == Kind::append) {
            file.insert(file.end(), operation.bytes.begin(), operation.bytes.end());
        } else if (operation.kind == Kind::overwrite) {
            std::copy(operation.bytes.begin(), operation.bytes.end(),
                      file.begin() + static_cast<std::ptrdiff_t>(operation.offset));
        }
    }

private:
    bool record(Operation operation) {
        if (attempts_++ >= failFrom) {
            return false;
        }
        if (operation.kind == Kind::overwrite && operation.offset + operation.bytes.size() > file_.size()) {
            beyondEnd_ = true;
            return false;
        }
        apply(operation, file_);
        operations_.push_back(std::move(operation));
        return true;
    }

    Bytes file_;
    std::vector<Operation> operations_;
    std::size_t attempts_ = 0;
    bool beyondEnd_ = false;
};

}  // namespace lumacast::mp4::test
