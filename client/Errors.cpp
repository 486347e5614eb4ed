#include "client/Errors.h"

#include <array>

namespace lumacast::client {

namespace {

struct Row {
    std::string_view key, text;
};

/// By code, from 1 on.
constexpr std::array kRows{
    Row{"CONNECTION_ERROR_NOT_REACHED", "The recording service can't be reached."},
    Row{"CONNECTION_ERROR_LOST", "The connection to the recording service was lost."},
    Row{"CONNECTION_ERROR_NO_ANSWER", "The recording service did not answer in time."},
    Row{"CONNECTION_ERROR_BUSY", "Too many requests wait for the recording service."},
    Row{"CONNECTION_ERROR_UNSENDABLE", "The request is not one that can be sent."},
    Row{"CONNECTION_ERROR_BAD_ANSWER", "The recording service's answer can't be understood."},
    Row{"CONNECTION_ERROR_CLOSED", "The recorder was closed before the answer came."},
    Row{"CONNECTION_ERROR_WOULD_BLOCK", "A handler can't wait for an answer."},
};
static_assert(kRows.size() == static_cast<std::size_t>(ConnectionError::WouldBlock));

bool isKnown(std::int64_t code) { return code >= 1 && code <= static_cast<std::int64_t>(kRows.size()); }

const Row& rowOf(std::int64_t code) { return kRows[isKnown(code) ? static_cast<std::size_t>(code - 1) : 0]; }

}  // namespace

std::string_view connectionErrorKey(std::int64_t code) { return rowOf(code).key; }

Error connectionError(ConnectionError code) {
    const auto number = static_cast<std::int64_t>(code);
    return Error(std::string(kConnectionErrorDomain), number,
                 {{std::string(kLocalizedDescriptionKey), rowOf(number).text}});
}

std::optional<RecordingErrorCode> recordingCodeOf(const Error& error) {
    if (error.domain() != kRecordingErrorDomain) return std::nullopt;
    return RecordingErrorCode{error.code()};
}

std::optional<ConnectionError> connectionCodeOf(const Error& error) {
    if (error.domain() != kConnectionErrorDomain || !isKnown(error.code())) return std::nullopt;
    return ConnectionError{error.code()};
}

std::string_view keyOf(const Error& error) {
    if (error.domain() == kRecordingErrorDomain) return recordingErrorKey(error.code());
    if (error.domain() == kConnectionErrorDomain) return connectionErrorKey(error.code());
    return {};
}

std::string textOf(const Error& error) {
    if (const std::string* text = error.localizedDescription(); text && !text->empty()) return *text;
    const std::string_view key = keyOf(error);
    return (key.empty() ? error.domain() : std::string(key)) + " (" + std::to_string(error.code()) + ")";
}

}  // namespace lumacast::client
