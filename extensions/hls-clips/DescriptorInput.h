#pragma once
// libav reading from a descriptor, so that no path is needed where there is none.

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>

#include "extensions/media/Av.h"

namespace lumacast::extensions {

/// A demuxer over a file's descriptor, which it borrows and does not move.
class DescriptorInput final {
public:
    explicit DescriptorInput(int descriptor) : descriptor_(descriptor) {
        struct stat status {};
        if (::fstat(descriptor, &status) == 0) size_ = status.st_size;
        auto* const buffer = static_cast<unsigned char*>(av_malloc(kBufferBytes));
        io_ = avio_alloc_context(buffer, kBufferBytes, 0, this, &read, nullptr, &seek);
        if (!io_) av_free(buffer);
        format_ = avformat_alloc_context();
        if (format_ && io_) format_->pb = io_;
    }
    DescriptorInput(const DescriptorInput&) = delete;
    DescriptorInput& operator=(const DescriptorInput&) = delete;
    ~DescriptorInput() {
        avformat_close_input(&format_);
        if (!io_) return;
        av_freep(&io_->buffer);
        avio_context_free(&io_);
    }

    /// Opens the file as one of `format` and finds its tracks. Negative when that fails, as libav says it.
    int open(const char* format) {
        if (!format_ || !io_) return AVERROR(ENOMEM);
        const int status = avformat_open_input(&format_, nullptr, av_find_input_format(format), nullptr);
        return status < 0 ? status : avformat_find_stream_info(format_, nullptr);
    }
    /// After open() has succeeded.
    AVFormatContext& format() { return *format_; }

private:
    static constexpr int kBufferBytes = 1 << 16;

    static int read(void* opaque, std::uint8_t* bytes, int count) {
        auto& self = *static_cast<DescriptorInput*>(opaque);
        const auto done = ::pread(self.descriptor_, bytes, static_cast<std::size_t>(count), self.at_);
        if (done < 0) return AVERROR(errno);
        self.at_ += done;
        return done == 0 ? AVERROR_EOF : static_cast<int>(done);
    }
    static std::int64_t seek(void* opaque, std::int64_t offset, int whence) {
        auto& self = *static_cast<DescriptorInput*>(opaque);
        switch (whence & ~AVSEEK_FORCE) {
            case AVSEEK_SIZE: return self.size_;
            case SEEK_SET: self.at_ = offset; break;
            case SEEK_CUR: self.at_ += offset; break;
            case SEEK_END: self.at_ = self.size_ + offset; break;
            default: return AVERROR(EINVAL);
        }
        return self.at_;
    }

    const int descriptor_;
    std::int64_t size_ = 0, at_ = 0;
    AVIOContext* io_ = nullptr;
    AVFormatContext* format_ = nullptr;
};

}  // namespace lumacast::extensions
