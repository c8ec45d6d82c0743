#pragma once

#include <QString>
#include <optional>

namespace zaf {

// A platform error: a domain, an integer code and a human-readable message.
// The subsystems read the integer code; the description is what the logs print for "%@".
struct Error {
    QString domain;
    int code = 0;
    QString message;

    // "Error Domain=<domain> Code=<code> "<message>""
    QString description() const;

    // An error in the POSIX domain from an errno value, with strerror's text and an optional path.
    static Error fromErrno(int errnum, const QString &path = {});
};

// "An error or none", as completions and out-parameters carry it.
using OptionalError = std::optional<Error>;

// A value or the error that prevented it.
template <typename T>
struct Result {
    std::optional<T> value;
    OptionalError error;

    static Result success(T v) { return Result{std::move(v), std::nullopt}; }
    static Result failure(Error e) { return Result{std::nullopt, std::move(e)}; }
    bool ok() const { return value.has_value(); }
};

inline constexpr const char *kPosixErrorDomain = "posix";

} // namespace zaf
