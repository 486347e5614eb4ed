#pragma once
#include <cstdint>
#include <optional>
#include <span>
#include <utility>

#include "linux/media/MovieFile.h"
#include "linux/media/mp4/BoxSink.h"

namespace lumacast::media {

/// Writes at once, and brings the file onto the disk only where the box writer asks for it, which for a copy is before and
/// after it is switched to its index: one that is lost can be made again, but what looks finished is.
class ExportSink final : public mp4::BoxSink {
public:
    explicit ExportSink(MovieFile& file) : file_(file) {}
    bool append(std::span<const std::uint8_t> bytes) override {
        const std::uint64_t offset = std::exchange(end_, end_ + bytes.size());
        return overwrite(offset, bytes);
    }
    bool overwrite(std::uint64_t offset, std::span<const std::uint8_t> bytes) override {
        if (error_ == 0) error_ = file_.write(offset, bytes);
        return error_ == 0;
    }
    bool sync() override {
        if (error_ == 0) error_ = file_.sync();
        return error_ == 0;
    }
    /// The system's number of the first failure; 0: none.
    int error() const { return error_; }

private:
    MovieFile& file_;
    std::uint64_t end_ = 0;
    int error_ = 0;
};

}  // namespace lumacast::media
