#pragma once

// The version of the host protocol, MAJOR.MINOR, carried as the string "protocolVersion" in
// beginExtensionRequest (the host's) and in its answer (the extension's).
//
// A minor version only adds what an older peer may ignore; anything else takes a new major version.
// The extension accepts a request whose major version is its own, whatever its minor; a request
// without a version is taken as 1.0, which is what hosts written before the version existed speak.
//
// Threads: none; pure functions.

#include <QString>

#include <optional>

namespace zaf::extensionkit {

struct ProtocolVersion {
    int major = 0;
    int minor = 0;

    // "MAJOR.MINOR".
    QString toString() const;
    friend bool operator==(const ProtocolVersion &, const ProtocolVersion &) = default;
};

// The version this build speaks.
inline constexpr ProtocolVersion kProtocolVersion{1, 0};
// The version of a request that names none.
inline constexpr ProtocolVersion kUnversionedProtocolVersion{1, 0};
// The key in beginExtensionRequest's params and in its result.
inline constexpr char kProtocolVersionKey[] = "protocolVersion";

// "MAJOR.MINOR": two decimal numbers of at most 4 digits each, joined by one dot, nothing else.
// nullopt for anything else.
std::optional<ProtocolVersion> parseProtocolVersion(const QString &text);

// Whether a peer speaking `theirs` can be served by one speaking `ours`: the same major version.
bool isCompatibleProtocolVersion(const ProtocolVersion &ours, const ProtocolVersion &theirs);

} // namespace zaf::extensionkit
