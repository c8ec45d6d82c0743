#pragma once

// User errors of the recording framework: errors made from a negative numeric code and an optional
// user-info dictionary, in the framework's own error domain.

#include "platform/error.h"

#include <QVariantMap>

inline constexpr const char *ZafUserErrorDomain = "ZafRecordingUserErrorDomain";

// Codes used by this system.
enum ZafUserErrorCode : int {
    ZafUserErrorCodeExportFailed = -5812,   // an export failed or was cancelled
    ZafUserErrorCodeNoMovie = -5818,        // no movie was given
};

struct ZafUserError {
    // The error for a code; userInfo may carry a "description" text that replaces the default one.
    static zaf::Error _zafUserErrorForCode(int code, const QVariantMap &userInfo = {});
};
