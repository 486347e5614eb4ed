#include "linux/ipc/Handles.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>

#include <cerrno>
#include <utility>

#include "base/Limits.h"
#include "linux/ipc/LinuxIpcEndpoint.h"
#include "linux/calls/FileCalls.h"

namespace lumacast {

namespace {

constexpr std::size_t kUsualMessage = 512;

/// Sealed memory with the plane's pixels; none with errno set.
Fd copyOf(const SharedPlane& plane) {
    const auto pixels = plane.pixels();
    Fd memory(memfd_create("plane", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!memory || calls::truncate(memory.get(), static_cast<off_t>(pixels.size())) != 0) return Fd();
    for (std::size_t at = 0; at < pixels.size();) {
        const ssize_t count = calls::write(memory.get(), pixels.data() + at, pixels.size() - at);
        if (count <= 0) return Fd();
        at += static_cast<std::size_t>(count);
    }
    fcntl(memory.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE | F_SEAL_SEAL);
    return memory;
}

int addPlane(const std::shared_ptr<SharedPlane>& plane, std::uint64_t number, EncodedFrame& out, Data& records) {
    int descriptor = plane->descriptor();
    if (descriptor < 0) {
        Fd copy = copyOf(*plane);
        if (!copy) return errno;
        descriptor = copy.get();
        out.frame.own.push_back(std::move(copy));
    } else if (const int seals = fcntl(descriptor, F_GET_SEALS); seals < 0 || !(seals & F_SEAL_SHRINK)) {
        return EINVAL;
    }
    const auto damage = plane->damage();
    appendRecord(records, PlaneRecord{number, plane->width(), plane->height(), plane->stride(), plane->pictureNumber(),
                                      {damage.begin(), damage.end()}});
    out.frame.descriptors.push_back(descriptor);
    out.leases.push_back({number, plane});
    return 0;
}

int addEndpoint(const Value::EndpointRef& endpoint, EncodedFrame& out, Data& records) {
    const auto ours = std::dynamic_pointer_cast<LinuxIpcEndpoint>(endpoint);
    if (!ours) return EINVAL;
    appendRecord(records, EndpointRecord{});
    out.frame.descriptors.push_back(ours->descriptor());
    return 0;
}

Value objectFor(Fd descriptor, HandleRecord record, const std::weak_ptr<PlaneLender>& lender) {
    auto* plane = std::get_if<PlaneRecord>(&record);
    if (!plane) return Value(Value::EndpointRef(LinuxIpcEndpoint::make(std::move(descriptor))));
    return Value(Value::PlaneRef(ReceivedPlane::make(std::move(descriptor), std::move(*plane), lender)));
}

}  // namespace

std::shared_ptr<LinuxIpcEndpoint> LinuxIpcEndpoint::make(Fd doorbell) {
    int domain = 0, type = 0;
    socklen_t size = sizeof domain;
    if (getsockopt(doorbell.get(), SOL_SOCKET, SO_DOMAIN, &domain, &size) != 0 || domain != AF_UNIX) return nullptr;
    if (getsockopt(doorbell.get(), SOL_SOCKET, SO_TYPE, &type, &size) != 0 || type != SOCK_SEQPACKET) return nullptr;
    return std::make_shared<LinuxIpcEndpoint>(std::move(doorbell));
}

int encodeFrame(FrameKind kind, std::uint16_t message, const Array& values,
                const std::function<std::uint64_t()>& nextLease, EncodedFrame& out) {
    WireBody body;
    body.bytes.reserve(kUsualMessage);
    body.bytes.resize(kFrameHeaderBytes);
    if (!encodeArray(values, body)) return EMSGSIZE;
    out.header.kind = kind;
    out.header.message = message;
    out.header.valueBytes = static_cast<std::uint32_t>(body.bytes.size() - kFrameHeaderBytes);
    out.header.handles = static_cast<std::uint8_t>(body.handles.size());
    for (const Value& handle : body.handles) {
        const auto* plane = handle.as<Value::PlaneRef>();
        const int error = plane ? addPlane(*plane, nextLease(), out, body.bytes)
                                : addEndpoint(*handle.as<Value::EndpointRef>(), out, body.bytes);
        if (error != 0) return error;
    }
    if (body.bytes.size() > limitOf(Limit::MessageBytes)) return EMSGSIZE;
    out.header.recordBytes = static_cast<std::uint32_t>(body.bytes.size() - kFrameHeaderBytes - out.header.valueBytes);
    out.frame.bytes = std::move(body.bytes);
    out.frame.keep = std::move(body.handles);
    return 0;
}

const char* decodeFrame(IncomingFrames::Frame& frame, const std::weak_ptr<PlaneLender>& lender, Array& values) {
    std::vector<Value> handles;
    if (frame.header.handles > 0) {
        auto records = readRecords(frame.records, frame.header.handles);
        if (!records) return "a malformed descriptor record";
        for (std::size_t i = 0; i < records->size(); ++i) {
            handles.push_back(objectFor(std::move(frame.descriptors[i]), std::move((*records)[i]), lender));
            if (handles.back().isNull()) return "a descriptor that is not what its record says";
        }
    }
    std::optional<Array> decoded = decodeArray(frame.value, handles);
    if (!decoded) return "a malformed message";
    values = std::move(*decoded);
    return nullptr;
}

}  // namespace lumacast
